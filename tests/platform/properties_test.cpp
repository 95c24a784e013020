// The property store's limits and atomicity: the daemon's range checks and its
// answers to a refused set are only tested if the stand-in refuses what the
// device's store refuses and never shows a half-written value.
#include <cutils/properties.h>

#include <gtest/gtest.h>

#include <stdlib.h>

#include <atomic>
#include <map>
#include <string>
#include <thread>

#include "test_root.h"

namespace {

std::string get(const char *key, const char *def = "") {
    char value[PROPERTY_VALUE_MAX];
    property_get(key, value, def);
    return value;
}

std::map<std::string, std::string> all() {
    std::map<std::string, std::string> out;
    property_list([](const char *k, const char *v, void *m) { (*static_cast<decltype(out) *>(m))[k] = v; }, &out);
    return out;
}

// Run once against the file store and once in memory.
void checkLimits() {
    char value[PROPERTY_VALUE_MAX];
    // Unset: the default is copied (cut to 91 characters) and its length returned.
    EXPECT_EQ(property_get("persist.operator.optr", value, "OM"), 2);
    EXPECT_STREQ(value, "OM");
    EXPECT_EQ(property_get("persist.operator.optr", value, nullptr), 0);
    EXPECT_EQ(property_get("unset.key", value, std::string(200, 'd').c_str()), 91);
    // 91 characters fit, 92 do not and leave the old value; empty reads as unset.
    std::string v91(91, 'v'), v92(92, 'w');
    EXPECT_EQ(property_set("persist.service.tolk.sim", v91.c_str()), 0);
    EXPECT_EQ(property_get("persist.service.tolk.sim", value, "0"), 91);
    EXPECT_EQ(property_set("persist.service.tolk.sim", v92.c_str()), -1);
    EXPECT_EQ(get("persist.service.tolk.sim"), v91);
    EXPECT_EQ(property_set("persist.service.tolk.sim", ""), 0);
    EXPECT_EQ(get("persist.service.tolk.sim", "0"), "0");
    // Names of 31 characters are fine, 32 are not.
    std::string n31 = "persist." + std::string(23, 'n'), n32 = n31 + "x";
    EXPECT_EQ(property_set(n31.c_str(), "a"), 0);
    EXPECT_EQ(property_set(n32.c_str(), "a"), -1);
    EXPECT_EQ(get(n32.c_str(), "def"), "def");
    // ro. properties are written once.
    EXPECT_EQ(property_set("ro.boot.atm", "enable"), 0);
    EXPECT_EQ(property_set("ro.boot.atm", "disable"), -1);
    EXPECT_EQ(all()["ro.boot.atm"], "enable");
    EXPECT_EQ(all()[n31], "a");
}

}  // namespace

TEST(Properties, LimitsOnTheFileStoreAndInMemory) {
    {
        TestRoot root;
        checkLimits();
        EXPECT_EQ(root.read("/properties/ro.boot.atm"), "enable");
        // Names cannot leave the store.
        EXPECT_EQ(property_set("../escape", "1"), -1);
        EXPECT_EQ(property_set(".hidden", "1"), -1);
        EXPECT_FALSE(root.exists("/escape"));
    }
    const char *saved = getenv("TOLKD_ROOT");
    std::string keep = saved != nullptr ? saved : "";
    unsetenv("TOLKD_ROOT");
    checkLimits();
    if (!keep.empty()) setenv("TOLKD_ROOT", keep.c_str(), 1);
}

TEST(Properties, ReadersNeverSeeTornValues) {
    TestRoot root;
    const std::string a(91, 'a'), b(91, 'b');
    ASSERT_EQ(property_set("persist.torn", a.c_str()), 0);
    // What a writer killed halfway leaves behind: a temporary file, never the value.
    root.write("/properties/.persist.torn.tmp.1.1.0", "bbbb");
    std::atomic<bool> stop{false};
    std::thread writer([&] {
        for (int i = 0; i < 400; i++) property_set("persist.torn", (i % 2 != 0 ? a : b).c_str());
        stop = true;
    });
    int reads = 0, bad = 0;
    while (!stop || reads < 100) {
        std::string v = get("persist.torn", "unset");
        if (v != a && v != b) bad++;
        reads++;
    }
    writer.join();
    EXPECT_EQ(bad, 0) << "of " << reads << " reads";
    EXPECT_EQ(all().size(), 1u);
}

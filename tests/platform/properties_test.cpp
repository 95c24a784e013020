// The property store's limits and atomicity: the daemon's range checks and its
// answers to a refused set are only tested if the stand-in refuses what the
// device's store refuses and never shows a half-written value.
#include <cutils/properties.h>

#include <gtest/gtest.h>

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
    property_list([](const char *k, const char *v, void *m) { (*static_cast<decltype(out) *>(m))[k] = v; },
                  &out);
    return out;
}

}  // namespace

TEST(Properties, LimitsOfTheStore) {
    TestRoot root;
    char value[PROPERTY_VALUE_MAX];
    // Unset: the default is copied and its length returned.
    EXPECT_EQ(property_get("persist.operator.optr", value, "OM"), 2);
    EXPECT_STREQ(value, "OM");
    // A refused set changes nothing: values over 91 characters, names over 31, names
    // that are no file name in the store, a second set of a ro. property.
    const std::string v91(91, 'v'), n31 = "persist." + std::string(23, 'n');
    const struct {
        std::string name, value;
        int result;
    } sets[] = {
        {"persist.service.tolk.sim", v91, 0}, {"persist.service.tolk.sim", v91 + "w", -1},
        {n31, "a", 0},                        {n31 + "x", "a", -1},
        {"ro.boot.atm", "enable", 0},         {"ro.boot.atm", "disable", -1},
        {"../escape", "1", -1},               {".hidden", "1", -1},
    };
    for (const auto &s : sets) EXPECT_EQ(s.result, property_set(s.name.c_str(), s.value.c_str())) << s.name;
    EXPECT_EQ(property_get("persist.service.tolk.sim", value, "0"), 91);
    EXPECT_EQ(all(), (std::map<std::string, std::string>{
                         {"persist.service.tolk.sim", v91}, {n31, "a"}, {"ro.boot.atm", "enable"}}));
    EXPECT_FALSE(root.exists("/escape"));
    // Empty reads as unset.
    EXPECT_EQ(property_set("persist.service.tolk.sim", ""), 0);
    EXPECT_EQ(get("persist.service.tolk.sim", "0"), "0");
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

// Single flags of the product-information record through the NVRAM store.
#include <gtest/gtest.h>

#include <string>

#include "cit/pro_info.h"
#include "test_root.h"

namespace {

const char kStore[] = "/nvram/PRODUCT_INFO";

TEST(ProInfo, UnusableStoreGivesFallbacksAndIsNeverWritten) {
    TestRoot root;
    EXPECT_EQ(0, getFlag(FLAG_MMI1_RESULT)) << "no store";
    EXPECT_EQ(-1, setFlag(FLAG_MMI1_RESULT, 1));
    EXPECT_FALSE(root.exists(kStore));

    const std::string twoRecords(2 * PRODUCT_INFO_SIZE, '\x01');
    root.write(kStore, twoRecords);
    EXPECT_EQ(255, getFlag(FLAG_MMI1_RESULT));
    EXPECT_EQ(255, getFlag(0));
    EXPECT_EQ(-1, setFlag(FLAG_MMI1_RESULT, 0));
    EXPECT_EQ(twoRecords, root.read(kStore));

    // One record of the wrong size, declared through the store's shape file.
    root.write(kStore, std::string(2048, '\x01'));
    root.write("/nvram/PRODUCT_INFO.shape", "2048 1");
    EXPECT_EQ(255, getFlag(0));
    EXPECT_EQ(-1, setFlag(0, 0));
    EXPECT_EQ(std::string(2048, '\x01'), root.read(kStore));
}

TEST(ProInfo, IndexesOutsideTheRecordAreRefused) {
    TestRoot root;
    const std::string r(PRODUCT_INFO_SIZE, '\x11');
    root.write(kStore, r);
    for (int index : {-1, PRODUCT_INFO_SIZE, PRODUCT_INFO_SIZE + 1, -2147483647 - 1, 2147483647}) {
        EXPECT_EQ(255, getFlag(index)) << index;
        setFlag(index, 0x22);
    }
    EXPECT_EQ(r, root.read(kStore));
}

}  // namespace

// The NVRAM stand-in replaces a record whole at the close of the handle that
// wrote it, as the device's store does: a half-written record seen by a reader
// would hide a daemon that writes flags back in pieces.
#include <libnvram.h>

#include <gtest/gtest.h>

#include <unistd.h>

#include <filesystem>
#include <iterator>
#include <string>

#include "test_root.h"

TEST(Nvram, WritesReplaceTheRecordWhole) {
    const int kProductInfo = 61;
    TestRoot root;
    std::string record(1024, '\0');
    record[202] = 1;
    root.write("/nvram/PRODUCT_INFO", record);

    // Read, modify, write back through a second handle, as the flag code does.
    int size = 0, count = 0;
    F_ID rd = NVM_GetFileDesc(kProductInfo, &size, &count, false);
    ASSERT_GE(rd.iFileDesc, 0);
    ASSERT_EQ(size, 1024);
    ASSERT_EQ(count, 1);
    char buf[1024];
    ASSERT_EQ(read(rd.iFileDesc, buf, sizeof(buf)), 1024);
    EXPECT_TRUE(NVM_CloseFileDesc(rd));
    buf[209] = 1;
    F_ID wr = NVM_GetFileDesc(kProductInfo, &size, &count, false);
    ASSERT_GE(wr.iFileDesc, 0);
    ASSERT_EQ(write(wr.iFileDesc, buf, 512), 512);
    // Until the close, the store holds the old record, not half of the new one.
    EXPECT_EQ(root.read("/nvram/PRODUCT_INFO"), record);
    ASSERT_EQ(write(wr.iFileDesc, buf + 512, 512), 512);
    EXPECT_TRUE(NVM_CloseFileDesc(wr));
    std::string after = root.read("/nvram/PRODUCT_INFO");
    ASSERT_EQ(after.size(), 1024u);
    EXPECT_EQ(after[209], 1);
    EXPECT_EQ(after[202], 1);

    // A handle that only read leaves the store alone, even if it changed meanwhile.
    F_ID idle = NVM_GetFileDesc(kProductInfo, &size, &count, false);
    ASSERT_GE(idle.iFileDesc, 0);
    after[0] = 'z';
    root.write("/nvram/PRODUCT_INFO", after);
    EXPECT_TRUE(NVM_CloseFileDesc(idle));
    EXPECT_EQ(root.read("/nvram/PRODUCT_INFO"), after);

    // A read-only handle cannot write, and no half-done replace is left behind.
    F_ID ro = NVM_GetFileDesc(kProductInfo, &size, &count, true);
    ASSERT_GE(ro.iFileDesc, 0);
    EXPECT_EQ(write(ro.iFileDesc, "x", 1), -1);
    EXPECT_TRUE(NVM_CloseFileDesc(ro));
    namespace fs = std::filesystem;
    EXPECT_EQ(std::distance(fs::directory_iterator(root.at("/nvram")), fs::directory_iterator()), 1);
}

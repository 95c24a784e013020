// The NVRAM stand-in replaces a record whole at the close of the handle that
// wrote it, as the device's store does: a half-written record seen by a reader
// would hide a daemon that writes flags back in pieces.
#include <libnvram.h>

#include <gtest/gtest.h>

#include <unistd.h>

#include <filesystem>
#include <iterator>
#include <string>
#include <utility>

#include "test_root.h"

TEST(Nvram, WritesReplaceTheRecordWhole) {
    const int kProductInfo = 61;
    TestRoot root;
    std::string record(1024, '\0');
    record[202] = 1;
    root.write("/nvram/PRODUCT_INFO", record);
    int size = 0, count = 0;
    auto handle = [&](bool readOnly) {
        F_ID h = NVM_GetFileDesc(kProductInfo, &size, &count, readOnly);
        EXPECT_GE(h.iFileDesc, 0);
        return h;
    };

    // Read, modify, write back through a second handle, as the flag code does.
    F_ID rd = handle(false);
    EXPECT_EQ(std::make_pair(1024, 1), std::make_pair(size, count)) << "size and count";
    char buf[1024];
    ASSERT_EQ(read(rd.iFileDesc, buf, sizeof(buf)), 1024);
    EXPECT_TRUE(NVM_CloseFileDesc(rd));
    buf[209] = 1;
    F_ID wr = handle(false);
    ASSERT_EQ(write(wr.iFileDesc, buf, 512), 512);
    // Until the close, the store holds the old record, not half of the new one.
    EXPECT_EQ(root.read("/nvram/PRODUCT_INFO"), record);
    ASSERT_EQ(write(wr.iFileDesc, buf + 512, 512), 512);
    EXPECT_TRUE(NVM_CloseFileDesc(wr));
    std::string after(buf, sizeof(buf));
    EXPECT_EQ(root.read("/nvram/PRODUCT_INFO"), after);

    // A handle that only read leaves the store alone, even if it changed meanwhile.
    F_ID idle = handle(false);
    after[0] = 'z';
    root.write("/nvram/PRODUCT_INFO", after);
    EXPECT_TRUE(NVM_CloseFileDesc(idle));
    EXPECT_EQ(root.read("/nvram/PRODUCT_INFO"), after);

    // A read-only handle cannot write, and no half-done replace is left behind.
    F_ID ro = handle(true);
    EXPECT_EQ(write(ro.iFileDesc, "x", 1), -1);
    EXPECT_TRUE(NVM_CloseFileDesc(ro));
    namespace fs = std::filesystem;
    EXPECT_EQ(std::distance(fs::directory_iterator(root.at("/nvram")), fs::directory_iterator()), 1);
}

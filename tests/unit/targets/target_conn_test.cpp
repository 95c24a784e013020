// Opening the target links.
#include "targets_fixture.h"

#include <fcntl.h>

#include <cutils/properties.h>

#include "hal/tolkd_adaptation_impl.h"

TEST_F(TargetLinks, ServiceLinksConnectToTheirSocketsOnlyWhenServed) {
    connectTarget(GENERIC_TYPE);
    EXPECT_LT(s_fdService_command, 0);
    connectTarget(AUDIO_TYPE);
    EXPECT_LT(s_fdAudio_command, 0);
    connectTarget(AUDIO_EXT_TYPE);
    EXPECT_LT(s_fdAudioExt_command, 0);

    int generic = listenOn(TOLK_SERVICE_SOCKET);
    int audio = listenOn(TOLK_AUDIO_SOCKET);
    int ext = listenOn(TOLK_AUDIO_EXT_SOCKET);

    connectTarget(GENERIC_TYPE);
    ASSERT_GE(s_fdService_command, 0);
    int g = acceptFrom(generic);
    ASSERT_GE(g, 0);
    sendAll(g, "hi");
    EXPECT_EQ("hi", drainFd(s_fdService_command));

    connectTarget(AUDIO_EXT_TYPE);
    ASSERT_GE(s_fdAudioExt_command, 0);
    EXPECT_GE(acceptFrom(ext), 0);

    // Both audio kinds share one socket and one global.
    connectTarget(BELVO_AUDIO_TYPE);
    ASSERT_GE(s_fdAudio_command, 0);
    int a = acceptFrom(audio);
    ASSERT_GE(a, 0);
    sendAll(a, "AUD");
    EXPECT_EQ("AUD", drainFd(s_fdAudio_command));
    closeIfOpen(s_fdAudio_command);
    connectTarget(AUDIO_TYPE);
    ASSERT_GE(s_fdAudio_command, 0);
    EXPECT_GE(acceptFrom(audio), 0);
}

TEST_F(TargetLinks, TargetsWithoutALinkOpenNothing) {
    int before = dup(0);
    close(before);
    for (int target : {3, TOLK_TYPE, BAT_TYPE, 8, BELVO_AUTIOCIT_TYPE, 0, -1, 99}) connectTarget(target);
    EXPECT_EQ(-1, s_fdRild_command);
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_EQ(-1, s_fdAudio_command);
    EXPECT_EQ(-1, s_fdAudioExt_command);
    int after = dup(0);
    close(after);
    EXPECT_EQ(before, after);  // no descriptor left open
}

TEST_F(TargetLinks, ModemPairIsMadeOnlyWhenTheLinkIsClosed) {
    connectTarget(RIL_TYPE);
    ASSERT_GE(s_fdRild_command, 0);
    int first = s_fdRild_command;
    connectTarget(RIL_TYPE);
    EXPECT_EQ(first, s_fdRild_command);

    // The bridge writes into the far end of the current pair.
    gTolkdAdaptation->sendResponse("\r\nRING\r\n", 8);
    EXPECT_EQ("\r\nRING\r\n", drainFd(s_fdRild_command));

    close(s_fdRild_command);
    s_fdRild_command = -1;
    connectTarget(RIL_TYPE);
    ASSERT_GE(s_fdRild_command, 0);
    gTolkdAdaptation->sendResponse("OK", 2);
    EXPECT_EQ("OK", drainFd(s_fdRild_command));
}

TEST(TargetConn, CdmaLteDualConnectionFollowsItsBootProperty) {
    {
        TestRoot root;
        EXPECT_FALSE(isCdmaLteDcSupport());
    }
    {
        TestRoot root;
        ASSERT_EQ(0, property_set("ro.boot.opt_c2k_lte_mode", "1"));
        EXPECT_TRUE(isCdmaLteDcSupport());
    }
    {
        TestRoot root;
        ASSERT_EQ(0, property_set("ro.boot.opt_c2k_lte_mode", "lte"));
        EXPECT_FALSE(isCdmaLteDcSupport());
    }
}

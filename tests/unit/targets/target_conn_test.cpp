// Opening the target links.
#include "targets_fixture.h"

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

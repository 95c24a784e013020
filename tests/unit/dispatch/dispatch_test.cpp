// The dispatcher: which stage claims a line and the CommandType it returns, where
// name matching, case, table order and properties decide (the local answers
// themselves are checked end to end); and the battery ADC commands against the
// simulated PMIC ADC device, whose file lists "CHANNEL SUM [STATUS]" per line.
#include "dispatch/bat_cmd.h"
#include "handler_state.h"

namespace {

using DispatcherTest = HandlerTest;
using BatCmdTest = HandlerTest;

// Exact names of the battery table, and the local table before the generic one
// where both have a name (AT%WLAN?), are checked in local_commands.tx.
TEST_F(DispatcherTest, ExactStagesNeedTheWholeNameAudioStagesAPrefix) {
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CCLKX?"));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT%ECALLX"));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("at+cclk?")) << "names compare case-sensitively";
    EXPECT_EQ(AUDIO_EXT_TYPE, process_cmd_line("AT+EADPX"));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("aud+1")) << "audio rows are case-sensitive";
    EXPECT_EQ(BELVO_AUDIO_TYPE, process_cmd_line("at^mmitestenable=1"));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("at^tmmi?")) << "device-maker rows other than at^mmitest are upper case";
    EXPECT_EQ(RIL_TYPE, process_cmd_line(""));
    EXPECT_EQ(RIL_TYPE, process_cmd_line(nullptr));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT^IINLIMIT=0")) << "the row includes its value";
    EXPECT_EQ(RIL_TYPE, process_cmd_line("=AT+CCLK")) << "an empty name matches nothing";
    EXPECT_EQ(GENERIC_TYPE, process_cmd_line("AT%SUPPLEMENTARYSERVICE=1"));
    // A name longer than the name buffer is no match, never a truncated one.
    EXPECT_EQ(RIL_TYPE, process_cmd_line((std::string("AT%SUPPLEMENTARYSERVICE") + std::string(20, ' ') + "=1").c_str()));
    EXPECT_EQ(RIL_TYPE, process_cmd_line((std::string("AT%ECALL") + std::string(40, 'X')).c_str()));
    EXPECT_EQ("", host.take()) << "nothing above is answered locally";
}

// The SMS storage commands stay on the modem in PCT mode (unset means PCT mode);
// the APN settings go to the framework until AT+VZWTOLKCFG=1.
TEST_F(DispatcherTest, PctModeAndVzwTolkCfgMoveCommandsBetweenModemAndFramework) {
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CMGF=1"));
    EXPECT_EQ(GENERIC_TYPE, process_cmd_line("AT+CBC")) << "only the five SMS commands are affected";
    ASSERT_EQ(0, property_set("persist.service.pct.mode", "0"));
    EXPECT_EQ(GENERIC_TYPE, process_cmd_line("AT+CMGR=3"));

    EXPECT_EQ(GENERIC_TYPE, process_cmd_line("AT+VZWAPNE=1,3,\"vzwims\""));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+VZWAPNE?"));
    EXPECT_EQ(TOLK_TYPE, process_cmd_line("AT+VZWTOLKCFG=1"));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+VZWAPNETMR=1,2"));
}

TEST_F(DispatcherTest, MmiTextSlotsWrapAndStayInStepWhenTheQueueIsFull) {
    gMmiCmdSeq.EIdx = MMI_QUEUE_SIZE;  // a damaged index takes no slot at all
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CPIN=1"));
    EXPECT_EQ(MMI_QUEUE_SIZE, gMmiCmdSeq.EIdx);
    gMmiCmdSeq.cusMmiCmdPending = 0;
    gMmiCmdSeq.EIdx = 9;
    gMmiCmdSeq.enSeqIdx = 9;
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CPIN=1"));
    EXPECT_STREQ("AT+CPIN=+ORVTOLKJ", gMmiCmdSeq.cmd[9]);
    EXPECT_EQ(0, gMmiCmdSeq.EIdx);

    // Every entry waiting: no text slot is taken (the answers that then stay in
    // step: MmiQueue.FullQueueStoresNothingAndKeepsTextsInStep). Once the oldest
    // entry is answered its slot is the next to be filled.
    for (int &s : gMmiCmdSeq.seq) s = 3;
    gMmiCmdSeq.enSeqIdx = 0;
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CPIN=2"));
    EXPECT_EQ(0, gMmiCmdSeq.EIdx);
    gMmiCmdSeq.seq[0] = -1;
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CPIN=3"));
    EXPECT_STREQ("AT+CPIN=+ORVTOLKJ", gMmiCmdSeq.cmd[0]);
    EXPECT_EQ(1, gMmiCmdSeq.EIdx);
}

TEST_F(BatCmdTest, DriverFailuresAndNegativeReadings) {
    // A bad status, and a channel the driver does not know.
    for (const char *device : {"1 1000 -5\n66 12 3\n", "66 -7\n"}) {
        root.write(PMIC_ADC_DEV, device);
        EXPECT_EQ(-1, get_ADC_channel(1, ADC_COUNT)) << device;
        EXPECT_EQ(-1, handleBatCmd("AT@GBV", 1)) << device;
        EXPECT_EQ("\r\nERROR\r\n", host.take()) << device;
        EXPECT_EQ(1, handleBatCmd("AT@GCSF", 0)) << device;
        EXPECT_EQ("\r\n1\r\nOK\r\n", host.take()) << device;
    }
    // An average of -1 cannot be told from a failure; the fraction is dropped.
    root.write(PMIC_ADC_DEV, "1 -5\n");
    EXPECT_EQ(-1, handleBatCmd("AT@GBV", 1));
    root.write(PMIC_ADC_DEV, "1 -4\n");
    EXPECT_EQ(0, handleBatCmd("AT@GBV", 1));
    EXPECT_EQ("\r\nERROR\r\n\r\n0\r\nOK\r\n", host.take());
}

}  // namespace

// AT^WI... against the simulated Wi-Fi test library (its journal and control file
// under the device root) and a generic service played by the test.
#include <fcntl.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"
#include "targets/target_conn.h"

namespace {

// The generic service is played by the test through a socket pair.
class WifiTestCmdTest : public HandlerTest {
protected:
    void SetUp() override {
        HandlerTest::SetUp();
        signal(SIGPIPE, SIG_IGN);  // as the daemon does: a lost send is only lost
        savedService_ = s_fdService_command;
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, service_));
        fcntl(service_[1], F_SETFL, O_NONBLOCK);
        s_fdService_command = service_[0];
    }
    void TearDown() override {
        if (s_fdService_command == service_[0]) close(service_[0]);  // else closed by the daemon
        s_fdService_command = savedService_;
        if (service_[1] >= 0) close(service_[1]);
        HandlerTest::TearDown();
    }
    void control(const std::string &text) { root.write("/wifitest/control", text); }
    std::string journal() { return root.read("/journal/wifitest.log"); }
    void serviceAnswers(const std::string &answer) {
        ASSERT_EQ(static_cast<ssize_t>(answer.size()), write(service_[1], answer.data(), answer.size()));
    }
    std::string serviceReceived() { return readAvailable(service_[1]); }
    void serviceGone() {
        close(service_[1]);
        service_[1] = -1;
    }

private:
    int service_[2] = {-1, -1};
    int savedService_ = -1;
};

TEST_F(WifiTestCmdTest, StartValuesAndUnservedForms) {
    EXPECT_EQ(0, call(pas_wienable_handler, "", AT_READ_OP));
    EXPECT_STREQ("-1", response);
    EXPECT_EQ(4, call(pas_wiband_handler, "", AT_READ_OP));
    EXPECT_EQ(0, call(pas_wifreq_handler, "", AT_READ_OP));
    EXPECT_STREQ("0", response);
    EXPECT_EQ(4, call(pas_wienable_handler, "", AT_TEST_OP));
    EXPECT_EQ(4, call(pas_wimode_handler, "", AT_READ_OP));
    for (CmdHandler h : {pas_wienable_handler, pas_wimode_handler, pas_wiband_handler, pas_wifreq_handler,
                         pas_widatarate_handler, pas_wipow_handler, pas_witx_handler, pas_wirx_handler}) {
        EXPECT_EQ(-1, call(h, "x", AT_SET_OP));
    }
    EXPECT_EQ("", journal()) << "nothing reached the library";
}

TEST_F(WifiTestCmdTest, TestModeOpensAndClosesTheDeviceUnderTest) {
    EXPECT_EQ(0, call(pas_wienable_handler, "2", AT_SET_OP));
    EXPECT_EQ(2, wifiEnableState);
    EXPECT_EQ(0, call(pas_wienable_handler, "0", AT_SET_OP));
    EXPECT_EQ(0, wifiEnableState);
    EXPECT_EQ(4, call(pas_wienable_handler, "3", AT_SET_OP));
    EXPECT_EQ("WIFI_TEST_OpenDUT\nWIFI_TEST_CloseDUT\n", journal());
    EXPECT_EQ("", serviceReceived());

    control("fail OpenDUT\nfail CloseDUT\n");
    EXPECT_EQ(4, call(pas_wienable_handler, "2", AT_SET_OP));
    EXPECT_EQ(0, wifiEnableState);
    wifiEnableState = 2;
    EXPECT_EQ(4, call(pas_wienable_handler, "0", AT_SET_OP));
    EXPECT_EQ(2, wifiEnableState);
}

TEST_F(WifiTestCmdTest, NormalWifiGoesThroughTheFramework) {
    serviceAnswers("\r\nOK\r\n");
    EXPECT_EQ(0, call(pas_wienable_handler, "1", AT_SET_OP));
    EXPECT_EQ(1, wifiEnableState);
    EXPECT_EQ("AT+WITOF=2", serviceReceived());
    EXPECT_EQ("\r\nOK\r\n", host.take()) << "the service's answer is relayed";

    serviceAnswers("\r\nERROR\r\n");
    EXPECT_EQ(4, call(pas_wienable_handler, "0", AT_SET_OP));
    EXPECT_EQ(1, wifiEnableState);
    // OK after an information line still counts.
    serviceAnswers("\r\n+WITOF: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(0, call(pas_wienable_handler, "0", AT_SET_OP));
    EXPECT_EQ(0, wifiEnableState);
    EXPECT_EQ("AT+WITOF=1AT+WITOF=1", serviceReceived());
    EXPECT_EQ("", journal()) << "the library is not involved";

    serviceGone();
    EXPECT_EQ(4, call(pas_wienable_handler, "1", AT_SET_OP));
    EXPECT_EQ(0, wifiEnableState);
}

TEST_F(WifiTestCmdTest, ModeAndBand) {
    control("mode 3\n");
    EXPECT_EQ(0, call(pas_wimode_handler, "", AT_TEST_OP));
    EXPECT_STREQ("3", response);
    control("mode 3\nfail GetSupportedMode\n");
    EXPECT_EQ(4, call(pas_wimode_handler, "", AT_TEST_OP));
    EXPECT_STREQ("0", response) << "the mode is written even when the call fails";
    control("");
    EXPECT_EQ(4, call(pas_wimode_handler, "5", AT_SET_OP));
    EXPECT_EQ(4, call(pas_wimode_handler, "-1", AT_SET_OP));
    EXPECT_EQ(0, call(pas_wimode_handler, "4", AT_SET_OP));
    EXPECT_EQ("WIFI_TEST_GetSupportedMode\nWIFI_TEST_GetSupportedMode\nWIFI_TEST_SetMode 4\n", journal());

    EXPECT_EQ(0, call(pas_wiband_handler, "1", AT_SET_OP));
    EXPECT_STREQ("40MHZ", response);
    EXPECT_EQ(0, call(pas_wiband_handler, "", AT_READ_OP));
    EXPECT_STREQ("40MHZ", response);
    EXPECT_EQ(4, call(pas_wiband_handler, "2", AT_SET_OP));
    control("fail SetBandwidth\n");
    EXPECT_EQ(4, call(pas_wiband_handler, "0", AT_SET_OP));
    EXPECT_STREQ("", response);
    EXPECT_EQ(1, wifiBand) << "a refused band keeps the previous one";
}

TEST_F(WifiTestCmdTest, FrequencyRateAndPowerReadBackTheLastAcceptedValue) {
    struct {
        CmdHandler handler;
        const char *call;
        const char *failName;
    } params[] = {
        {pas_wifreq_handler, "WIFI_TEST_SetFrequency 2412 0\n", "SetFrequency"},
        {pas_widatarate_handler, "WIFI_TEST_SetRate 2412\n", "SetRate"},
        {pas_wipow_handler, "WIFI_TEST_SetTXPower 2412\n", "SetTXPower"},
    };
    for (const auto &p : params) {
        root.write("/journal/wifitest.log", "");
        control("");
        EXPECT_EQ(0, call(p.handler, "2412", AT_SET_OP));
        EXPECT_EQ(p.call, journal());
        EXPECT_EQ(-1, call(p.handler, "", AT_SET_OP));
        EXPECT_EQ(0, call(p.handler, "", AT_READ_OP));
        EXPECT_STREQ("2412", response) << "an unreadable value is not a refusal";
        control(std::string("fail ") + p.failName + "\n");
        EXPECT_EQ(4, call(p.handler, "2437", AT_SET_OP));
        EXPECT_EQ(0, call(p.handler, "", AT_READ_OP));
        EXPECT_STREQ("-1", response);
    }
}

TEST_F(WifiTestCmdTest, TransmitAndReceive) {
    EXPECT_EQ(0, call(pas_witx_handler, "5", AT_SET_OP));
    EXPECT_EQ(0, call(pas_wirx_handler, "0", AT_SET_OP));
    // The six low bytes of each number, least significant first.
    EXPECT_EQ(0, call(pas_wirx_handler, "1,72623859790382856,1", AT_SET_OP));
    EXPECT_EQ(0, call(pas_wirx_handler, "1,-1,281474976710656", AT_SET_OP));
    EXPECT_EQ("WIFI_TEST_SetTX 1\n"
              "WIFI_TEST_SetRX 0 000000000000 000000000000\n"
              "WIFI_TEST_SetRX 1 080706050403 010000000000\n"
              "WIFI_TEST_SetRX 1 ffffffffffff 000000000000\n",
              journal());
    EXPECT_EQ(-1, call(pas_wirx_handler, "1,5", AT_SET_OP));
    EXPECT_EQ(-1, call(pas_wirx_handler, "1,5,x", AT_SET_OP));
    EXPECT_EQ(4, call(pas_wirx_handler, "2,5,6", AT_SET_OP));
    control("fail SetRX\n");
    EXPECT_EQ(4, call(pas_wirx_handler, "1,5,6", AT_SET_OP));
}

TEST_F(WifiTestCmdTest, ReceptionCountsCarryTheirOwnOk) {
    control("result 17 4\n");
    EXPECT_EQ(TOLK_TYPE, process_cmd_line("AT^WIRPCKG?"));
    EXPECT_EQ("\r\n17,4 OK\r\n\r\nOK\r\n", host.take());
    EXPECT_EQ(0, call(pas_wirpckg_handler, "anything", AT_SET_OP));
    EXPECT_NE(std::string::npos, journal().find("WIFI_TEST_ClearResult\n"));
    control("fail GetResult\n");
    EXPECT_EQ(4, call(pas_wirpckg_handler, "", AT_READ_OP));
    EXPECT_STREQ("0,0 OK", response) << "the counts are written even when the call fails";
}

}  // namespace

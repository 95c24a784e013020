// Routing of command lines: the user-mode gate in front of the modem, the numeric
// switch, the SMS hook, and the services that answer synchronously. No radio HAL
// service runs under the test root, so a line that reaches the modem route is
// answered "ERROR:No Modem" by the bridge; that is how these tests see it arrive.
#include <atomic>

#include <cutils/properties.h>
#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "host_links.h"
#include "targets/target_conn.h"

class RoutingTest : public HostLinks {
protected:
    void SetUp() override {
        HostLinks::SetUp();
        s_fdAudio_command = -1;
    }
    void TearDown() override {
        if (s_fdAudio_command >= 0) close(s_fdAudio_command);
        s_fdAudio_command = -1;
        HostLinks::TearDown();
    }
    // Routes text as if the reader had just produced it from the serial port.
    std::string route(const std::string &text) {
        memset(gSerialDevice.cmdBuf, 0, sizeof(gSerialDevice.cmdBuf));
        memcpy(gSerialDevice.cmdBuf, text.data(), text.size());
        gSerialDevice.cmdLen = (int)text.size() + 1;
        gSerialDevice.currDevice = DEVICE_SERIAL;
        routeCommandLine(&gSerialDevice, gSerialDevice.cmdBuf);
        return drain(serial.master);
    }
};

static std::string prop(const char *name) {
    char v[PROPERTY_VALUE_MAX] = {0};
    property_get(name, v, "");
    return v;
}

static const char kRefused[] = "\r\nNot access to modem in User Mode.\r\n";
static const char kNoModem[] = "\r\nERROR:No Modem\r\n";

TEST_F(RoutingTest, UserBuildLetsOnlyBareAtReachTheModem) {
    property_set("ro.build.type", "user");
    EXPECT_EQ(kNoModem, route("AT"));
    EXPECT_EQ(kRefused, route("AT+CSQ"));
    EXPECT_EQ(kRefused, route("at+cpin?"));
    // Local commands are not gated.
    EXPECT_EQ(std::string::npos, route("AT+CCLK?").find("Not access"));

    property_set("persist.service.tolk.usermode", "1");
    EXPECT_EQ(kNoModem, route("AT+CSQ"));
}

TEST_F(RoutingTest, EngBuildIsNotGated) {
    property_set("ro.build.type", "eng");
    EXPECT_EQ(kNoModem, route("AT+CSQ"));
}

TEST_F(RoutingTest, NumericSwitchFollowsTheLinePrefixAfterUpperCasing) {
    property_set("persist.service.tolk.usermode", "1");
    route("atv0");
    EXPECT_TRUE(gNumericMode);
    route("ATV");
    EXPECT_TRUE(gNumericMode);
    route("ATV1");
    EXPECT_FALSE(gNumericMode);
    route("ATV0E1");
    EXPECT_TRUE(gNumericMode);
    gNumericMode = false;
}

TEST_F(RoutingTest, Op12HoldsTheSmsCommandAndPromptsItself) {
    property_set("persist.service.tolk.usermode", "1");
    property_set("persist.operator.optr", "OP12");
    readerLoopPreamble();
    EXPECT_EQ("1", prop("persist.service.pct.mode"));
    msgCmdMode = 1;

    EXPECT_EQ(kNoModem, route("AT+CMGS=?"));  // test form: an ordinary modem command
    EXPECT_FALSE(isMsgCmdInput);

    EXPECT_EQ("\r\n> \r\n", route("at+cmgs=\"123\""));
    EXPECT_TRUE(isMsgCmdInput);
    EXPECT_TRUE(isNeedMergeMsgCmdInput);
    EXPECT_STREQ("AT+CMGS=\"123\",,\"", gSerialDevice.cmdBuf);
}

TEST_F(RoutingTest, OtherOperatorsSendTheSmsCommandAndRelayTheText) {
    property_set("persist.service.tolk.usermode", "1");
    property_set("persist.operator.optr", "OP07");
    readerLoopPreamble();
    EXPECT_EQ("0", prop("persist.service.pct.mode"));
    msgCmdMode = 1;

    EXPECT_EQ(kNoModem, route("AT+CMGS=\"123\""));
    EXPECT_TRUE(isMsgCmdInput);
    EXPECT_FALSE(isNeedMergeMsgCmdInput);

    // The text line goes to the modem raw; its Ctrl-Z ends the text phase.
    writeAll(serial.master, "hello\x1A");
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    routeCommandLine(&gSerialDevice, line);
    EXPECT_EQ(kNoModem, drain(serial.master));
    EXPECT_FALSE(isMsgCmdInput);
}

// A service peer on a reserved-namespace socket that answers each command it gets.
struct FakeService {
    int server = -1;
    std::thread thread;
    std::string received[2];
    unsigned char eraseAtReceipt[2] = {0xFF, 0xFF};

    FakeService(const char *name, int commands, int serialFd, int delayMs, const char *answer) {
        server = tolk_local_server(name, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 2);
        thread = std::thread([=] {
            int conn = accept(server, nullptr, nullptr);
            for (int i = 0; i < commands && conn >= 0; i++) {
                char buf[256];
                ssize_t n = read(conn, buf, sizeof(buf));
                if (n <= 0) break;
                received[i].assign(buf, n);
                struct termios t;
                if (tcgetattr(serialFd, &t) == 0) eraseAtReceipt[i] = t.c_cc[VERASE];
                std::this_thread::sleep_for(std::chrono::milliseconds(delayMs));
                if (answer != nullptr && write(conn, answer, strlen(answer)) < 0) break;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(200));
            if (conn >= 0) close(conn);
        });
    }
    void finish() {
        if (thread.joinable()) thread.join();
    }
    ~FakeService() {
        finish();
        if (server >= 0) close(server);
    }
};

TEST_F(RoutingTest, MmiTestSettingsWrapTheEnableAndDisableCommands) {
    struct termios before;
    ASSERT_EQ(0, tcgetattr(serial.slave, &before));
    ASSERT_NE(0, before.c_cc[VERASE]);
    FakeService audio(TOLK_AUDIO_SOCKET, 2, serial.slave, 0, "AUDOK");

    writeAll(serial.master, "at^mmitestenable=1\n");
    routeCommandLine(&gSerialDevice, readline(&gSerialDevice));
    writeAll(serial.master, "AT^MMITESTENABLE=0\n");
    routeCommandLine(&gSerialDevice, readline(&gSerialDevice));

    struct termios after;
    ASSERT_EQ(0, tcgetattr(serial.slave, &after));
    EXPECT_EQ(before.c_cc[VERASE], after.c_cc[VERASE]);
    EXPECT_EQ("AUDOKAUDOK", drain(serial.master));

    audio.finish();
    // Sent as typed, delimiter and case kept; both saw the test settings in force.
    EXPECT_EQ("at^mmitestenable=1\n", audio.received[0]);
    EXPECT_EQ("AT^MMITESTENABLE=0\n", audio.received[1]);
    EXPECT_EQ(0, audio.eraseAtReceipt[0]);
    EXPECT_EQ(0, audio.eraseAtReceipt[1]);
}

TEST_F(RoutingTest, PowerKeyWaitsForTheGenericServiceOtherCommandsDoNot) {
    FakeService generic(TOLK_SERVICE_SOCKET, 1, serial.slave, 300, "OK");
    auto start = std::chrono::steady_clock::now();
    gSerialDevice.currDevice = DEVICE_SERIAL;
    strcpy(gSerialDevice.cmdBuf, "AT+POWERKEY");
    routeCommandLine(&gSerialDevice, gSerialDevice.cmdBuf);
    auto waited = std::chrono::steady_clock::now() - start;
    EXPECT_GE(waited, std::chrono::milliseconds(250));
    EXPECT_EQ("\r\nOK\r\n", drain(serial.master, 20));

    // The answer to any other generic command is left to the reader.
    strcpy(gSerialDevice.cmdBuf, "AT%GPS");
    start = std::chrono::steady_clock::now();
    routeCommandLine(&gSerialDevice, gSerialDevice.cmdBuf);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(250));
}

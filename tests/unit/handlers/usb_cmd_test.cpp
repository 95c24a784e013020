// AT%USBTETHERING and AT@USBCONFIG against the property store of the device root.
#include <cctype>
#include <filesystem>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

class UsbCmdTest : public HandlerTest {
protected:
    int usbconfig(const char *param, int op) { return call(pas_usbconfig_handler, param, op); }
    int tethering(const char *param, int op) { return call(pas_usbTethering_handler, param, op); }
};

TEST_F(UsbCmdTest, ConfigValueIsCleanedLowerCasedAndCapped) {
    EXPECT_EQ(0, usbconfig("\"RNDIS, Adb\"\n", AT_SET_OP));
    EXPECT_EQ("rndis,adb", prop("sys.usb.config"));
    EXPECT_STREQ("\r\n@USBCONFIG=\"rndis,adb\"\r\n\r\nOK\r\n", response);
    EXPECT_EQ(0, usbconfig("", AT_READ_OP));
    EXPECT_STREQ("\r\n@USBCONFIG: \"rndis,adb\"\r\n\r\nOK\r\n", response);

    // At most the first 91 characters count; those dropped are not made up for.
    std::string param;
    for (int i = 0; i < 100; i++) param += static_cast<char>('A' + i % 26);
    std::string lower = param;
    for (char &c : lower) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    EXPECT_EQ(0, usbconfig(param.c_str(), AT_SET_OP));
    EXPECT_EQ(lower.substr(0, 91), prop("sys.usb.config"));
    EXPECT_EQ(0, usbconfig(("'" + param.substr(0, 89) + "'XYZ").c_str(), AT_SET_OP));
    EXPECT_EQ(lower.substr(0, 89), prop("sys.usb.config"));
}

TEST_F(UsbCmdTest, EmptyOrRefusedConfig) {
    EXPECT_EQ(4, usbconfig("", AT_READ_OP));
    EXPECT_STREQ("\r\n@USBCONFIG: \"\"\r\n\r\nERROR\r\n", response);
    EXPECT_EQ(4, usbconfig(" \"\" ' \n", AT_SET_OP));
    EXPECT_STREQ("\r\n-1\r\nERROR\r\n\r\n", response);
    EXPECT_EQ("(unset)", prop("sys.usb.config"));

    // A property store that cannot take the value: ERROR with the value echoed.
    std::filesystem::remove_all(root.at("/properties"));
    root.write("/properties", "not a folder");
    EXPECT_EQ(4, usbconfig("adb", AT_SET_OP));
    EXPECT_STREQ("\r\n@USBCONFIG=\"adb\"\r\n\r\nERROR\r\n", response);
}

TEST_F(UsbCmdTest, Tethering) {
    EXPECT_EQ(0, tethering("", AT_READ_OP));
    EXPECT_STREQ("+USBTETHERING:0\r\n", response);
    EXPECT_EQ(0, tethering("1", AT_SET_OP));
    EXPECT_EQ(0, tethering("", AT_READ_OP));
    EXPECT_STREQ("+USBTETHERING:1\r\n", response);
    EXPECT_EQ(4, tethering("2", AT_SET_OP));
    EXPECT_EQ(-1, tethering("on", AT_SET_OP));
    EXPECT_EQ("1", prop("persist.service.usbtethering"));
    EXPECT_EQ(0, tethering("0", AT_SET_OP));
    EXPECT_EQ("0", prop("persist.service.usbtethering"));
    ASSERT_EQ(0, property_set("persist.service.usbtethering", "5"));
    EXPECT_EQ(0, tethering("", AT_READ_OP));
    EXPECT_STREQ("+USBTETHERING:0\r\n", response);
}

}  // namespace

// AT%USBTETHERING and AT@USBCONFIG against the property store of the device root.
#include <cutils/properties.h>
#include <gtest/gtest.h>

#include <cstring>

#include <cctype>
#include <filesystem>
#include <string>

#include "attok/at_tok.h"
#include "dispatch/dispatcher.h"
#include "handlers/handlers.h"
#include "test_root.h"

namespace {

class UsbCmdTest : public ::testing::Test {
protected:
    int usbconfig(const char *param, int op) {
        std::memset(response, 0, sizeof(response));
        return pas_usbconfig_handler(param, op, response);
    }
    int tethering(const char *param, int op) {
        std::memset(response, 0, sizeof(response));
        return pas_usbTethering_handler(param, op, response);
    }
    std::string prop(const char *name) {
        char value[PROPERTY_VALUE_MAX];
        property_get(name, value, "(unset)");
        return value;
    }

    TestRoot root;
    char response[RESPONSE_BUF_SIZE];
};

TEST_F(UsbCmdTest, ConfigValueIsCleanedAndLowerCased) {
    EXPECT_EQ(0, usbconfig("RNDIS,ADB", AT_SET_OP));
    EXPECT_EQ("rndis,adb", prop("sys.usb.config"));
    EXPECT_STREQ("\r\n@USBCONFIG=\"rndis,adb\"\r\n\r\nOK\r\n", response);

    EXPECT_EQ(0, usbconfig("\"MTP, Adb\"\n", AT_SET_OP));
    EXPECT_EQ("mtp,adb", prop("sys.usb.config"));
    EXPECT_EQ(0, usbconfig("'Mass_Storage'", AT_SET_OP));
    EXPECT_EQ("mass_storage", prop("sys.usb.config"));

    EXPECT_EQ(0, usbconfig("", AT_READ_OP));
    EXPECT_STREQ("\r\n@USBCONFIG: \"mass_storage\"\r\n\r\nOK\r\n", response);
}

TEST_F(UsbCmdTest, ConfigTakesAtMost91CharactersOfTheParameter) {
    std::string param;
    for (int i = 0; i < 100; i++) param += static_cast<char>('A' + i % 26);
    EXPECT_EQ(0, usbconfig(param.c_str(), AT_SET_OP));
    std::string expect = param.substr(0, 91);
    for (char &c : expect) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    EXPECT_EQ(expect, prop("sys.usb.config"));

    // Dropped characters within the first 91 shorten the value; nothing after
    // the 91st is taken to make up for them.
    std::string quoted = "\"" + param.substr(0, 89) + "\"XYZ";
    EXPECT_EQ(0, usbconfig(quoted.c_str(), AT_SET_OP));
    EXPECT_EQ(expect.substr(0, 89), prop("sys.usb.config"));
}

TEST_F(UsbCmdTest, EmptyOrRefusedConfig) {
    EXPECT_EQ(4, usbconfig("", AT_READ_OP));
    EXPECT_STREQ("\r\n@USBCONFIG: \"\"\r\n\r\nERROR\r\n", response);

    EXPECT_EQ(4, usbconfig(" \"\" ' \n", AT_SET_OP));
    EXPECT_STREQ("\r\n-1\r\nERROR\r\n\r\n", response);
    EXPECT_EQ("(unset)", prop("sys.usb.config"));

    // A property store that cannot take the value: ERROR with the value echoed.
    std::filesystem::create_directories(root.at("/"));
    std::filesystem::remove_all(root.at("/properties"));
    root.write("/properties", "not a folder");
    EXPECT_EQ(4, usbconfig("adb", AT_SET_OP));
    EXPECT_STREQ("\r\n@USBCONFIG=\"adb\"\r\n\r\nERROR\r\n", response);
}

TEST_F(UsbCmdTest, Tethering) {
    EXPECT_EQ(0, tethering("", AT_READ_OP));
    EXPECT_STREQ("+USBTETHERING:0\r\n", response);
    EXPECT_EQ(0, tethering("1", AT_SET_OP));
    EXPECT_EQ("1", prop("persist.service.usbtethering"));
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

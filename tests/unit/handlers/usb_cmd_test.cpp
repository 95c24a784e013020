// AT@USBCONFIG against the property store of the device root: the cut at what a
// property holds and a store that refuses the value.
#include <filesystem>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

using UsbCmdTest = HandlerTest;

TEST_F(UsbCmdTest, ConfigCutAndRefusedByTheStore) {
    // At most the first 91 characters count; quotes dropped from them are not
    // made up for by later characters.
    const std::string param(89, 'a');
    EXPECT_EQ(0, call(pas_usbconfig_handler, ("'" + param + "'XYZ").c_str(), AT_SET_OP));
    EXPECT_EQ(param, prop("sys.usb.config"));

    // A property store that cannot take the value: ERROR with the value echoed.
    std::filesystem::remove_all(root.at("/properties"));
    root.write("/properties", "not a folder");
    EXPECT_EQ(4, call(pas_usbconfig_handler, "adb", AT_SET_OP));
    EXPECT_STREQ("\r\n@USBCONFIG=\"adb\"\r\n\r\nERROR\r\n", response);
}

}  // namespace

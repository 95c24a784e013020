// Properties at their limits or holding nonsense where a number is read: every
// command still gets a defined answer (the device root's files missing or
// misshaped: transcripts/root_faults.tx).
#include "fault_checks.h"

TEST(FaultRoot, PropertiesAtTheirLimitsAndNonNumeric) {
    SimDevice d({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    const std::string v91(91, '7'), noModem = "\r\nERROR:No Modem\r\n";

    // The SIM choice names a slot; anything else finds no modem, never a wrong slot
    // (4 and -1 against their answers: modem.tx).
    const std::string slots[][3] = {  // SIM choice, CDMA slot, answer
        {"abc", "1", "\r\n350000000000001\r\n\r\nOK\r\n"},  // no number reads as 0: slot 1
        {"3", "1", "\r\n350000000000004\r\n\r\nOK\r\n"},
        {"9", "2", "\r\n350000000000002\r\n\r\nOK\r\n"},
        {"9", "1", "\r\n350000000000001\r\n\r\nOK\r\n"},
        {"9", "0", noModem},
        {"9", "xyz", noModem},
        {"9", "5", noModem},
        {"9", "-2147483648", noModem},  // one below would overflow
        {"9", "2147483647", noModem},
        {v91, "1", noModem},
    };
    // Twice: each slot's service link, once made, is kept; the second pass must
    // not add any.
    int fds = -1;
    for (int pass = 0; pass < 2; pass++) {
        for (const auto &c : slots) {
            SCOPED_TRACE("sim " + c[0] + " cdma " + c[1]);
            d.setprop("persist.service.tolk.sim", c[0]);
            d.setprop("persist.radio.cdma_slot", c[1]);
            EXPECT_EQ(visible(c[2]), visible(d.at("AT+CGSN", true)));
        }
        if (pass == 0) fds = settledFds(d);
    }
    d.setprop("persist.service.tolk.sim", "0");

    // A switch holding a 91-character value or text is reported, not misread.
    d.setprop("persist.service.tolk_urc.enable", v91);
    EXPECT_EQ("\r\n+EURC:invalid value.\r\n\r\nOK\r\n", d.at("AT%EURC?", true));
    d.setprop("persist.service.tolk_urc.enable", "abc");
    EXPECT_EQ("\r\n+EURC:0\r\n\r\nOK\r\n", d.at("AT%EURC?", true));
    // The longest USB configuration is echoed whole, in the handler's result and
    // the final one (maybe in two writes: the query after it gathers both).
    d.setprop("sys.usb.config", std::string(91, 'm'));
    EXPECT_EQ("\r\n@USBCONFIG: \"" + std::string(91, 'm') + "\"\r\n\r\nOK\r\n\r\nOK\r\n" + kCsdfAnswer,
              d.at(std::vector<std::string>{"AT@USBCONFIG?", "AT+CSDF?"}, true));
    EXPECT_EQ(fds, settledFds(d, fds));
}

// The device around the daemon in a bad state: properties at their limits or
// holding nonsense where a number is read, and the device root's files missing,
// unreadable or of the wrong shape. Every command still gets a defined answer.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "fault_checks.h"

using namespace fault_checks;

namespace {

const std::string kNoModem = "\r\nERROR:No Modem\r\n";

// Still serving on the connection of the test, with the descriptors it had.
void expectAnswering(SimDevice &d, HostLink &adb, int fds) {
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.ask("AT+CSDF?")));
    EXPECT_EQ(fds, settledFdCount(d, fds)) << tolkdFdList(d);
}

TEST(FaultRoot, PropertiesAtTheirLimitsAndNonNumeric) {
    SimDevice d({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    HostLink adb(d, true);
    const std::string v91(91, '7');

    // The SIM choice names a slot; anything else finds no modem, never a wrong slot.
    struct SlotCase {
        const char *sim, *cdma;
        std::string answer;
    } slots[] = {
        {"abc", "1", "\r\n350000000000001\r\n\r\nOK\r\n"},  // no number reads as 0: slot 1
        {"3", "1", "\r\n350000000000004\r\n\r\nOK\r\n"},
        {"9", "2", "\r\n350000000000002\r\n\r\nOK\r\n"},
        {"9", "1", "\r\n350000000000001\r\n\r\nOK\r\n"},
        {"4", "1", kNoModem},
        {"-1", "1", kNoModem},
        {"9", "0", kNoModem},
        {"9", "xyz", kNoModem},
        {"9", "5", kNoModem},
        {"9", "-2147483648", kNoModem},  // one below would overflow
        {"9", "2147483647", kNoModem},
    };
    // Twice: each slot's service link, once made, is kept; the second pass must
    // not add any.
    int fds = -1;
    for (int pass = 0; pass < 2; pass++) {
        for (const SlotCase &c : slots) {
            SCOPED_TRACE(std::string("sim ") + c.sim + " cdma " + c.cdma);
            d.setprop("persist.service.tolk.sim", c.sim);
            d.setprop("persist.radio.cdma_slot", c.cdma);
            EXPECT_EQ(visible(c.answer), visible(adb.ask("AT+CGSN")));
        }
        if (pass == 0) fds = stableFdCount(d);
    }
    d.setprop("persist.service.tolk.sim", v91);
    EXPECT_EQ(visible(kNoModem), visible(adb.ask("AT+CGSN")));
    d.setprop("persist.service.tolk.sim", "0");

    // A switch holding a 91-character value or text is reported, not misread.
    d.setprop("persist.service.tolk_urc.enable", v91);
    EXPECT_EQ("\r\n+EURC:invalid value.\r\n\r\nOK\r\n", adb.ask("AT%EURC?"));
    d.setprop("persist.service.tolk_urc.enable", "abc");
    EXPECT_EQ("\r\n+EURC:0\r\n\r\nOK\r\n", adb.ask("AT%EURC?"));
    // The longest USB configuration is echoed whole.
    d.setprop("sys.usb.config", std::string(91, 'm'));
    // Two results, the handler's and the final one, maybe in two writes.
    const std::string usb = "\r\n@USBCONFIG: \"" + std::string(91, 'm') + "\"\r\n\r\nOK\r\n\r\nOK\r\n";
    writeAll(adb.fd(), "AT@USBCONFIG?\r");
    EXPECT_EQ(usb, readUntil(adb.fd(), usb, 3000));
    expectAnswering(d, adb, fds);
}

TEST(FaultRoot, StoresAndDeviceFilesMissingOrMisshaped) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);
    HostLink adb(d, true);
    fds++;  // its connection
    const std::string root = d.root();
    const std::string store = root + "/nvram/PRODUCT_INFO";

    // The product-information store: missing, too short, a folder. Reads give the
    // documented fallbacks; a write that cannot be stored answers an error.
    struct StoreCase {
        const char *what;
        std::string userAt;
    } stores[] = {{"missing", "\r\nUserAT =0\r\nOK\r\n"},
                  {"short", "\r\nUserAT =\r\nOK\r\n"},
                  {"folder", "\r\nUserAT =0\r\nOK\r\n"}};
    for (const StoreCase &c : stores) {
        SCOPED_TRACE(c.what);
        unlink(store.c_str());
        rmdir(store.c_str());
        if (std::string(c.what) == "short") d.writeFile("/nvram/PRODUCT_INFO", std::string(10, '\0'));
        if (std::string(c.what) == "folder") mkdir(store.c_str(), 0755);
        EXPECT_EQ(visible(c.userAt), visible(adb.ask("AT*CIT_ReadUserAT")));
        EXPECT_EQ("\r\nERROR\r\n", adb.ask("AT*CIT_WriteUserAT"));
        EXPECT_EQ(visible(c.userAt), visible(adb.ask("AT*CIT_ReadUserAT"))) << "nothing was written";
    }
    rmdir(store.c_str());
    d.writeFile("/nvram/PRODUCT_INFO", std::string(1024, '\0'));
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", adb.ask("AT*CIT_WriteUserAT"));
    EXPECT_EQ("\r\nUserAT =0\r\nOK\r\n", adb.ask("AT*CIT_ReadUserAT"));

    // The CIT result file: a folder, too long, too short, unreadable.
    const std::string citf = root + "/data/prod/citf";
    mkdir((root + "/data").c_str(), 0755);
    mkdir((root + "/data/prod").c_str(), 0755);
    unlink(citf.c_str());
    mkdir(citf.c_str(), 0755);
    EXPECT_EQ("\r\nOK\r\n", adb.ask("AT*CIT_GACITF"));
    EXPECT_EQ("\r\nERROR\r\n", adb.ask("AT*CIT_WCITF")) << "a result that cannot be stored is no success";
    rmdir(citf.c_str());
    d.writeFile("/data/prod/citf", std::string(100, 'Z'));
    EXPECT_EQ("\r\n" + std::string(32, 'Z') + "\r\nOK\r\n", adb.ask("AT*CIT_GACITF"));
    d.writeFile("/data/prod/citf", "ab");
    EXPECT_EQ("\r\nOK\r\n", adb.ask("AT*CIT_WCITF"));
    EXPECT_EQ("x0000001", d.readFile("/data/prod/citf")) << "a short file is written whole";

    // The PMIC ADC device: missing, junk, extreme values, a folder.
    struct AdcCase {
        const char *what, *content;
        std::string gcsf, gbv;
    } adcs[] = {
        {"missing", nullptr, "\r\n1\r\nOK\r\n", "\r\nERROR\r\n"},
        {"junk", "hello\n\x01\x02 zz\n", "\r\n1\r\nOK\r\n", "\r\nERROR\r\n"},
        {"lowest", "1 -2147483648 0\n66 5 0\n", "\r\n0\r\nOK\r\n", "\r\n-429496729\r\nOK\r\n"},
        {"highest", "1 2147483647 0\n", "\r\n1\r\nOK\r\n", "\r\n429496729\r\nOK\r\n"},
        {"folder", "", "\r\n1\r\nOK\r\n", "\r\nERROR\r\n"},
    };
    const std::string adc = root + "/dev/OV_pmic_adc_cali";
    for (const AdcCase &c : adcs) {
        SCOPED_TRACE(c.what);
        unlink(adc.c_str());
        rmdir(adc.c_str());
        if (c.content && *c.content) d.writeFile("/dev/OV_pmic_adc_cali", c.content);
        if (c.content && !*c.content) mkdir(adc.c_str(), 0755);
        EXPECT_EQ(visible(c.gcsf), visible(adb.ask("AT@GCSF")));
        EXPECT_EQ(visible(c.gbv), visible(adb.ask("AT@GBV")));
    }
    rmdir(adc.c_str());
    EXPECT_EQ("\r\n0\r\nOK\r\n", adb.ask("AT@SCC")) << "the charger switch without the device";
    expectAnswering(d, adb, fds);
}

}  // namespace

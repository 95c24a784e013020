// The device root that `up` prepares: the folders a phone has, the boot mode
// file, the ADC device, the NVRAM store and the preset properties.
#include <errno.h>
#include <unistd.h>

#include <cstring>

#include <cutils/properties.h>

#include "sim_supervisor.h"

namespace sim {

namespace {

// Folders that exist on every up. data/prod is the phone's persistent
// production folder (the CIT result file lives there); the others hold the
// simulator's own sockets, logs and state.
const char *const kRootFolders[] = {"dev/socket", "host", "run", "log", "journal", "nvram",
                                    "sys/class/BOOT/BOOT/boot", "data/prod"};

}  // namespace

void prepareRoot(const UpOptions &opt, std::string *err) {
    RootLayout L{opt.root};
    for (const char *d : kRootFolders) {
        if (!makeDirs(L.path(d))) {
            *err = "cannot create " + L.path(d) + ": " + strerror(errno);
            return;
        }
    }
    std::string bootFile = L.path("sys/class/BOOT/BOOT/boot/boot_mode");
    if (opt.writeBootMode) {
        if (!writeFile(bootFile, opt.bootMode)) {
            *err = "cannot write " + bootFile;
            return;
        }
    } else {
        unlink(bootFile.c_str());
    }
    if (!opt.adcLines.empty()) {
        std::string content;
        for (const auto &l : opt.adcLines) content += l + "\n";
        if (!writeFile(L.path("dev/OV_pmic_adc_cali"), content)) {
            *err = "cannot write the ADC device file";
            return;
        }
    }
    std::string store = L.path("nvram/PRODUCT_INFO");
    std::string shape = store + ".shape";
    if (!opt.nvram) {
        unlink(store.c_str());
        unlink(shape.c_str());
    } else if (opt.nvramShapeGiven) {
        if (!writeFile(store, std::string(static_cast<size_t>(opt.nvramSize * opt.nvramCount), '\0')) ||
            !writeFile(shape, std::to_string(opt.nvramSize) + " " + std::to_string(opt.nvramCount) + "\n")) {
            *err = "cannot write the NVRAM store";
            return;
        }
    } else if (!fileExists(store)) {
        // NVRAM outlives the daemon: an existing store of this root is kept.
        unlink(shape.c_str());
        if (!writeFile(store, std::string(1024, '\0'))) {
            *err = "cannot write the NVRAM store";
            return;
        }
    }
    for (const auto &p : opt.props) {
        char cur[PROP_VALUE_MAX];
        property_get(p.first.c_str(), cur, "\x01");
        if (p.second == cur) continue;  // a write-once ro. value set again
        if (property_set(p.first.c_str(), p.second.c_str()) != 0) {
            *err = "the property " + p.first + "=" + p.second + " was refused";
            return;
        }
    }
}


}  // namespace sim

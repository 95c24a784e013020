// tolkd as the phone runs it: the service user, groups and capabilities of its
// init service definition (device/tolkd.rc), and the owners and modes that
// init, ueventd and the peers' own services give the files, device nodes and
// sockets it uses (device/ueventd.rc and the table in sim_privilege.cpp).
// Applied only when tolk-sim runs as root; otherwise everything runs as the
// caller, as before.
#ifndef TOLK_SIM_PRIVILEGE_H
#define TOLK_SIM_PRIVILEGE_H

#include <sys/types.h>

#include <string>
#include <vector>

#include "sim_util.h"

namespace sim {

// The uid the simulated CIT test application runs under when tolk-sim is root:
// an installed app's uid, distinct from the daemon's, so that the daemon's check
// of its peer is exercised by every CIT exchange.
const uid_t kSimCitAppUid = 10050;

struct ServiceUser {
    uid_t uid = 0;
    gid_t gid = 0;
    std::vector<gid_t> groups;  // supplementary groups, the primary one included
    std::vector<int> caps;      // CAP_* numbers
};

// Whether devices are run with the phone's users (tolk-sim is root).
bool runsWithPhoneUsers();

// Parses the service definition "tolkd" of an init .rc file; false with err.
bool parseServiceUser(const std::string &rcText, ServiceUser *user, std::string *err);

// Before the peers start: reads the service definition, gives the root's
// files, folders and sockets their owners, and presets the CIT application's
// uid property unless `up` was given one. False with err when the definitions
// cannot be read.
bool prepareDeviceUsers(const RootLayout &L, std::string *err);
// Applies the owners again to whatever exists now (peer sockets after a start).
void ownDeviceRoot(const RootLayout &L);
// Gives one device path ("/data/prod/citf") the owner the phone would give it;
// for files that a test put into the root.
void ownDevicePath(const RootLayout &L, const std::string &devicePath);
// The gadget serial port's owner and mode, on a fresh pseudo-terminal slave.
void ownSerialPort(int slaveFd);

// In the child that becomes tolkd, before exec: the service's groups, uid and
// capabilities (bounding, permitted, effective, inheritable and ambient sets
// reduced to them). Needs prepareDeviceUsers first. False with err.
bool becomeServiceUser(std::string *err);
// In the child that becomes the CIT peer, before exec: the app's uid, no
// groups, no capabilities; logFd (its output, opened as root) becomes its own.
bool becomeTestApp(int logFd, std::string *err);

}  // namespace sim

#endif

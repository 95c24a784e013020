// Process start-up: boot-mode gating, opening the host links, entering the main loop.
#ifndef TOLKD_CORE_STARTUP_H
#define TOLKD_CORE_STARTUP_H

#define BOOT_MODE_FILE "/sys/class/BOOT/BOOT/boot/boot_mode"
#define ADB_CONTROL_SOCKET "adb_tolk_socket"
// The engineering boot mode, in which the daemon must not run.
#define BOOT_MODE_ADVANCED_VEMO 5

// Runs the daemon: idles in the engineering boot mode, returns 1 when a host link
// cannot be set up, and otherwise never returns.
int tolkdMain(void);

#endif

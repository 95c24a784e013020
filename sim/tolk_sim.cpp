// tolk-sim: a simulated phone around tolkd, for development, demos and the
// end-to-end tests. See `tolk-sim --help` and docs/SIMULATOR.md.
#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include <cutils/properties.h>
#include <tolk_platform/device_root.h>

#include "peers.h"
#include "sim_client.h"
#include "sim_device.h"
#include "sim_host_tools.h"
#include "sim_text.h"
#include "sim_util.h"

namespace {

// SIM slots of the radio service (slot1 to slot4).
const int kRadioSlots = 4;

const char kUsage[] =
    "tolk-sim: a simulated phone around the tolkd daemon.\n"
    "\n"
    "The device lives in a folder, the device root DIR: every absolute path the\n"
    "daemon opens (/dev/ttyGS0, /sys/class/BOOT/BOOT/boot/boot_mode, /data/...) is\n"
    "resolved under DIR, system properties are files in DIR/properties (a reboot\n"
    "is the property sys.powerctl; nothing touches the host), shell commands are\n"
    "never run (DIR/journal/shell.log records any), and the clock it sets is a\n"
    "simulated one. A supervisor process holds the device:\n"
    "  - the USB serial link: the daemon's port DIR/dev/ttyGS0 is wired to the\n"
    "    host's port DIR/host/ttyACM0 (two pseudo-terminals and a relay);\n"
    "  - the adb control socket DIR/dev/socket/adb_tolk_socket, handed to tolkd as\n"
    "    init does; a host connects to it to send AT lines ended by CR;\n"
    "  - the peer services tolkd forwards commands to: radio (the modem, through\n"
    "    the radio HAL), generic (the framework service), audio, cit (the CIT test\n"
    "    application); their logs are DIR/log/<name>.log;\n"
    "  - tolkd itself, logging to DIR/log/tolkd.log.\n"
    "\n"
    "Quick start:  tolk-sim run            (a fresh device and a console on it)\n"
    "\n"
    "Commands (DIR is always given with --root DIR):\n"
    "  up --root DIR [options]   prepare DIR, start the device and tolkd; returns\n"
    "                            once tolkd is serving. Options:\n"
    "      --prop NAME=VALUE       preset a system property (repeatable)\n"
    "      --boot-mode TEXT        content of the boot mode file (default \"0\";\n"
    "                              \"5\" is the engineering mode: tolkd idles)\n"
    "      --no-boot-mode          no boot mode file at all\n"
    "      --no-control-socket     no adb control socket\n"
    "      --log-tags TAGS         ANDROID_LOG_TAGS for tolkd (default \"*:i\";\n"
    "                              \"*:d\" shows debug lines)\n"
    "      --adc CH=VALUE[,STATUS] a PMIC ADC channel reading (repeatable)\n"
    "      --modem-tty PATH        the radio peer talks to a real modem there\n"
    "      --nvram-shape SIZE,COUNT  PRODUCT_INFO of COUNT records of SIZE bytes\n"
    "      --no-nvram              no PRODUCT_INFO store\n"
    "      --tolkd PATH            the daemon binary to run\n"
    "      -q, --quiet             print nothing when tolkd serves\n"
    "      --hostile[=SEED]        peers with hostile timing: answers coalesced,\n"
    "                              split, interleaved with \"+TSIM: NOISE\" (seeded)\n"
    "  down --root DIR           stop tolkd, the peers and the supervisor (DIR stays)\n"
    "  at --root DIR [--adb] [--timeout SEC] [--quiet-ms MS] [--numeric] [--no-cr]\n"
    "     LINE...\n"
    "                            send each LINE (followed by CR) on the host serial\n"
    "                            port, or on one adb connection, and print exactly\n"
    "                            the bytes that come back. Escapes in LINE: \\r \\n\n"
    "                            \\b \\e \\t \\0 \\\\ \\xNN. Each LINE waits up to SEC\n"
    "                            seconds (default 60; fractions allowed) for a\n"
    "                            complete answer: a final result (OK, ERROR, +CME\n"
    "                            ERROR..., +CMS ERROR..., ERROR:No Modem, ERROR:UE is\n"
    "                            not ready, a digit 0-8 after ATV0, the SMS prompt\n"
    "                            \"> \"...), the user-mode refusal, or any answer to an\n"
    "                            audio or device-maker test command (AUD+, MM+,\n"
    "                            AT^BSN? ...: relayed raw). Then MS ms of quiet end\n"
    "                            it (default 50; at least 300 after a raw answer,\n"
    "                            which has no end mark). --numeric: the daemon is\n"
    "                            in numeric mode already (ATV0 sent earlier).\n"
    "  console --root DIR [--adb]  an interactive terminal on the link (Ctrl-] quits)\n"
    "  run [up options] [--adb] [--keep]  up on a fresh folder (or --root DIR),\n"
    "                            console, down (also at SIGINT, SIGTERM, SIGHUP).\n"
    "                            usermode is on unless --prop says.\n"
    "  getprop --root DIR [NAME] print a property (all: \"[name]: [value]\" lines)\n"
    "  setprop --root DIR NAME VALUE\n"
    "  replug --root DIR         pull the USB cable and plug it in again at once\n"
    "  unplug --root DIR         pull the USB cable for good\n"
    "  tty-settings --root DIR   the daemon port's c_iflag, c_oflag, c_lflag, VERASE,\n"
    "                            VEOL, VEOL2\n"
    "  pause-host --root DIR MS  stop delivering device output to the host for MS ms\n"
    "  stop|start --root DIR NAME  stop or restart a peer (radio generic audio cit)\n"
    "  urc --root DIR [--slot N] TEXT  unsolicited modem output from SIM slot N\n"
    "                            (default 1; escapes as for at)\n"
    "  host --root DIR -- CMD [ARGS...]  run a host program with the host port\n"
    "                            behaving as a USB ACM port: DTR and RTS can be set\n"
    "                            and read, DSR, CTS and CD follow the cable\n"
    "  forward --root DIR [--background] tcp:PORT  relay each connection to\n"
    "                            127.0.0.1:PORT to the adb control socket, as\n"
    "                            `adb forward` does (tcp:0 picks and prints a port);\n"
    "                            runs until SIGINT or SIGTERM. Take a PORT outside\n"
    "                            5555-5585: adb probes those for emulators and\n"
    "                            would take tolkd's one adb connection\n"
    "  peer NAME --root DIR [ARGS]  run one peer in the foreground (the supervisor\n"
    "                            does this)\n"
    "\n"
    "DIR/sim.env holds TOLKD_ROOT, TOLKD_PID, TOLK_SIM_PID, TOLK_HOST_TTY,\n"
    "TOLK_ADB_SOCKET and TOLKD_LOG in shell syntax (`. DIR/sim.env`).\n"
    "\n"
    "Every command but up, down, run, peer, getprop and setprop needs the device\n"
    "up on DIR; on a root that is down it does nothing and exits with status 1.\n"
    "\n"
    "Exit status:\n"
    "  0  done (at: every LINE got a complete answer)\n"
    "  1  failed: no device is up on DIR, tolkd is not running, a link could not\n"
    "     be opened or was closed, the device did not come up, a value was refused\n"
    "  2  wrong invocation: unknown command or option, missing or bad argument\n"
    "  3  at: a LINE got no complete answer within --timeout (what came is printed)\n"
    "  host: the exit status of CMD; run: that of the console, or 128 + the signal\n"
    "     (SIGINT, SIGTERM, SIGHUP) that ended it after the device was brought down\n";

struct Args {
    std::string root;
    std::vector<std::string> rest;  // everything else, in order
};

// The subcommands, and which of them talk to a running device.
struct Command {
    const char *name;
    bool needsDevice;
};
const Command kCommands[] = {
    {"up", false},       {"down", false},    {"run", false},    {"peer", false},
    {"getprop", false},  {"setprop", false}, {"at", true},      {"console", true},
    {"host", true},      {"forward", true},  {"urc", true},     {"replug", true},
    {"unplug", true},    {"tty-settings", true}, {"pause-host", true}, {"stop", true},
    {"start", true},
};

const Command *findCommand(const std::string &name) {
    for (const Command &c : kCommands)
        if (name == c.name) return &c;
    return nullptr;
}

// Pulls --root DIR out of the arguments after the subcommand.
bool splitRoot(const std::vector<std::string> &in, size_t from, Args *a) {
    for (size_t i = from; i < in.size(); i++) {
        if (in[i] == "--root") {
            if (i + 1 >= in.size()) return false;
            a->root = in[++i];
        } else {
            a->rest.push_back(in[i]);
        }
    }
    return true;
}

// The root must be given and be an existing folder; it is made absolute.
bool resolveRoot(const std::string &cmd, std::string *root) {
    if (root->empty()) {
        fprintf(stderr, "tolk-sim %s: --root DIR is required\n", cmd.c_str());
        return false;
    }
    struct stat st;
    if (stat(root->c_str(), &st) != 0) {
        fprintf(stderr, "tolk-sim %s: no device root at %s\n", cmd.c_str(), root->c_str());
        return false;
    }
    if (!S_ISDIR(st.st_mode)) {
        fprintf(stderr, "tolk-sim %s: %s is not a directory\n", cmd.c_str(), root->c_str());
        return false;
    }
    char real[4096];
    if (!realpath(root->c_str(), real)) {
        fprintf(stderr, "tolk-sim %s: %s: %s\n", cmd.c_str(), root->c_str(), strerror(errno));
        return false;
    }
    *root = real;
    setenv(TOLKD_ROOT_ENV, real, 1);
    return true;
}

// A device is up when its supervisor answers on the control socket. Links and
// sockets of a root that is down (or whose supervisor was killed) may name
// another device's terminal by now: nothing may use them.
bool requireUp(const std::string &cmd, const std::string &root, bool tolkdToo) {
    std::string answer;
    if (!sim::controlRequest(root, "status", &answer, 5000) || answer.compare(0, 3, "ok\n") != 0) {
        fprintf(stderr, "tolk-sim %s: no simulated device is up on %s (tolk-sim up --root %s)\n", cmd.c_str(),
                root.c_str(), root.c_str());
        return false;
    }
    if (tolkdToo && answer.find("\ntolkd -1\n") != std::string::npos) {
        std::string status = sim::readFileOr(sim::RootLayout{root}.tolkdStatus());
        while (!status.empty() && status.back() == '\n') status.pop_back();
        std::string how = status.compare(0, 7, "signal ") == 0 ? "was killed by " + status
                          : status.empty()                     ? "has ended"
                                                               : "exited with status " + status;
        fprintf(stderr, "tolk-sim %s: tolkd is not running on %s: it %s\n", cmd.c_str(), root.c_str(), how.c_str());
        return false;
    }
    return true;
}

// Runs one command of the supervisor and prints its data lines.
int control(const std::string &root, const std::string &command) {
    std::string answer;
    if (!sim::controlRequest(root, command, &answer)) {
        fprintf(stderr, "tolk-sim: no simulated device is up on %s\n", root.c_str());
        return sim::kExitFailed;
    }
    size_t nl = answer.find('\n');
    std::string head = answer.substr(0, nl);
    std::string data = nl == std::string::npos ? "" : answer.substr(nl + 1);
    if (head != "ok") {
        fprintf(stderr, "tolk-sim: %s\n", head.c_str());
        return sim::kExitFailed;
    }
    fputs(data.c_str(), stdout);
    return sim::kExitOk;
}

// `run` ends its device at these as at Ctrl-]: closing the terminal window
// (SIGHUP) is how many quit.
int gRunSignalPipe[2] = {-1, -1};
volatile sig_atomic_t gRunSignal = 0;

void onRunSignal(int sig) {
    int saved = errno;
    gRunSignal = sig;
    char b = 1;
    ssize_t r = write(gRunSignalPipe[1], &b, 1);
    (void)r;
    errno = saved;
}

void catchRunSignals() {
    if (pipe2(gRunSignalPipe, O_CLOEXEC | O_NONBLOCK) != 0) return;
    struct sigaction sa;
    memset(&sa, 0, sizeof sa);
    sa.sa_handler = onRunSignal;  // no SA_RESTART: a blocking wait returns
    for (int s : {SIGINT, SIGTERM, SIGHUP}) sigaction(s, &sa, nullptr);
    signal(SIGPIPE, SIG_IGN);  // a closed terminal must not end run before its clean-up
    sim::setInterruptFd(gRunSignalPipe[0]);
}

int cmdRun(const std::vector<std::string> &argv) {
    sim::UpOptions opt;
    std::string err;
    std::vector<std::string> extra;
    if (!sim::parseUpOptions(argv, 2, &opt, &err, &extra)) {
        fprintf(stderr, "tolk-sim run: %s\n", err.c_str());
        return sim::kExitUsage;
    }
    bool adb = false, keep = false;
    for (const auto &e : extra) {
        if (e == "--adb")
            adb = true;
        else if (e == "--keep")
            keep = true;
        else {
            fprintf(stderr, "tolk-sim run: unknown option '%s'\n", e.c_str());
            return sim::kExitUsage;
        }
    }
    catchRunSignals();
    bool temporary = false;
    if (opt.root.empty()) {
        char tmpl[] = "/tmp/tolk-sim.XXXXXX";
        if (!mkdtemp(tmpl)) {
            perror("tolk-sim run: mkdtemp");
            return sim::kExitFailed;
        }
        opt.root = tmpl;
        temporary = true;
    }
    bool userModeGiven = false;
    for (const auto &p : opt.props)
        if (p.first == "persist.service.tolk.usermode") userModeGiven = true;
    // A demo wants modem commands through on a "user" build.
    if (!userModeGiven) opt.props.emplace_back("persist.service.tolk.usermode", "1");
    opt.quiet = true;
    bool started = false;
    int rc = sim::cmdUp(opt, &started);
    if (rc == 0 && !gRunSignal) {
        char real[4096];
        std::string root = realpath(opt.root.c_str(), real) ? real : opt.root;
        sim::RootLayout L{root};
        printf("tolkd is serving on the simulated device %s\n", root.c_str());
        printf("  host serial port: %s\n", L.hostTty().c_str());
        printf("  adb socket:       %s\n", opt.controlSocket ? L.adbSocket().c_str() : "(none)");
        printf("  tolkd log:        %s\n", L.tolkdLog().c_str());
        printf("  peers' logs:      %s/log/\n", root.c_str());
        fflush(stdout);
        rc = sim::cmdConsole(root, adb);
    }
    // Only a device this run brought up is taken down: `run --root DIR` on a
    // device that is already up leaves it alone.
    if (started) sim::cmdDown(opt.root);
    if (temporary && !keep) {
        sim::removeTree(opt.root);
    } else if (started) {
        printf("the device root stays at %s\n", opt.root.c_str());
    }
    if (gRunSignal) {
        fprintf(stderr, "tolk-sim run: stopped by signal %d; the device is down\n", static_cast<int>(gRunSignal));
        return 128 + gRunSignal;
    }
    return rc;
}

// "--timeout 1.5": seconds, fractions allowed, more than 0 and at most a day.
bool parseSeconds(const std::string &text, int *ms) {
    char *end = nullptr;
    errno = 0;
    double v = strtod(text.c_str(), &end);
    if (text.empty() || *end != '\0' || errno != 0 || !(v > 0) || v > 86400) return false;
    *ms = std::max(1, static_cast<int>(v * 1000 + 0.5));
    return true;
}

int cmdAt(const Args &a) {
    sim::AtOptions opt;
    opt.root = a.root;
    bool onlyLines = false;
    for (size_t i = 0; i < a.rest.size(); i++) {
        const std::string &s = a.rest[i];
        if (!onlyLines && s == "--") {
            onlyLines = true;
        } else if (!onlyLines && s == "--adb") {
            opt.adb = true;
        } else if (!onlyLines && s == "--no-cr") {
            opt.noCr = true;
        } else if (!onlyLines && s == "--numeric") {
            opt.numeric = true;
        } else if (!onlyLines && s == "--timeout") {
            if (i + 1 >= a.rest.size() || !parseSeconds(a.rest[i + 1], &opt.timeoutMs)) {
                fprintf(stderr, "tolk-sim at: --timeout needs seconds above 0 (up to 86400), got '%s'\n",
                        i + 1 < a.rest.size() ? a.rest[i + 1].c_str() : "");
                return sim::kExitUsage;
            }
            i++;
        } else if (!onlyLines && s == "--quiet-ms") {
            long ms = 0;
            if (i + 1 >= a.rest.size() || !sim::parseBoundedNumber(a.rest[i + 1], 3600 * 1000, &ms)) {
                fprintf(stderr, "tolk-sim at: --quiet-ms needs milliseconds (0 to 3600000), got '%s'\n",
                        i + 1 < a.rest.size() ? a.rest[i + 1].c_str() : "");
                return sim::kExitUsage;
            }
            opt.quietMs = static_cast<int>(ms);
            i++;
        } else if (!onlyLines && s.size() > 1 && s.compare(0, 2, "--") == 0) {
            fprintf(stderr, "tolk-sim at: unknown option '%s' (a LINE that begins with -- goes after --)\n",
                    s.c_str());
            return sim::kExitUsage;
        } else {
            opt.lines.push_back(s);
        }
    }
    if (opt.lines.empty()) {
        fprintf(stderr, "tolk-sim at: no LINE to send\n");
        return sim::kExitUsage;
    }
    for (const auto &l : opt.lines) {
        std::string bytes, err;
        if (!sim::decodeEscapes(l, &bytes, &err)) {
            fprintf(stderr, "tolk-sim at: %s\n", err.c_str());
            return sim::kExitUsage;
        }
    }
    if (!requireUp("at", a.root, true)) return sim::kExitFailed;
    return sim::cmdAt(opt);
}

void collectProp(const char *key, const char *value, void *cookie) {
    static_cast<std::vector<std::pair<std::string, std::string>> *>(cookie)->emplace_back(key, value);
}

int noExtra(const std::string &cmd, const Args &a) {
    if (a.rest.empty()) return sim::kExitOk;
    fprintf(stderr, "tolk-sim %s: unexpected argument '%s'\n", cmd.c_str(), a.rest[0].c_str());
    return sim::kExitUsage;
}

int dispatch(const std::vector<std::string> &argv) {
    if (argv.size() < 2 || argv[1] == "--help" || argv[1] == "-h" || argv[1] == "help") {
        fputs(kUsage, argv.size() < 2 ? stderr : stdout);
        return argv.size() < 2 ? sim::kExitUsage : sim::kExitOk;
    }
    const std::string &cmd = argv[1];
    const Command *known = findCommand(cmd);
    if (!known) {
        fprintf(stderr, "tolk-sim: unknown %s '%s' (tolk-sim --help lists the commands)\n",
                cmd.compare(0, 1, "-") == 0 ? "option" : "command", cmd.c_str());
        return sim::kExitUsage;
    }
    if (cmd == "up") {
        sim::UpOptions opt;
        std::string err;
        if (!sim::parseUpOptions(argv, 2, &opt, &err)) {
            fprintf(stderr, "tolk-sim up: %s\n", err.c_str());
            return sim::kExitUsage;
        }
        return sim::cmdUp(opt);
    }
    if (cmd == "run") return cmdRun(argv);
    if (cmd == "peer") {
        if (argv.size() < 3 || !sim::isPeerName(argv[2])) {
            fprintf(stderr, "tolk-sim peer: NAME is one of radio, generic, audio, cit\n");
            return sim::kExitUsage;
        }
        Args a;
        if (!splitRoot(argv, 3, &a) || !resolveRoot("peer", &a.root)) return sim::kExitUsage;
        const std::string &name = argv[2];
        if (name == "radio") return run_radio_peer(a.root, a.rest);
        if (name == "generic") return run_generic_peer(a.root, a.rest);
        if (name == "audio") return run_audio_peer(a.root, a.rest);
        return run_cit_peer(a.root, a.rest);
    }

    if (cmd == "host") {
        // Only the options before "--" are tolk-sim's: the command may have a
        // --root of its own.
        Args a;
        size_t i = 2;
        for (; i < argv.size() && argv[i] != "--"; i++) {
            if (argv[i] == "--root" && i + 1 < argv.size()) {
                a.root = argv[++i];
            } else {
                fprintf(stderr, "tolk-sim host: unexpected '%s' (tolk-sim host --root DIR -- CMD ARGS...)\n",
                        argv[i].c_str());
                return sim::kExitUsage;
            }
        }
        if (!resolveRoot(cmd, &a.root)) return sim::kExitUsage;
        std::vector<std::string> command(argv.begin() + static_cast<long>(std::min(i + 1, argv.size())), argv.end());
        if (command.empty()) return sim::cmdHost(a.root, command);  // its usage message
        if (!requireUp(cmd, a.root, false)) return sim::kExitFailed;
        return sim::cmdHost(a.root, command);
    }

    Args a;
    if (!splitRoot(argv, 2, &a)) {
        fprintf(stderr, "tolk-sim %s: --root needs a folder\n", cmd.c_str());
        return sim::kExitUsage;
    }
    if (cmd == "down") {
        if (a.root.empty()) {
            fprintf(stderr, "tolk-sim down: --root DIR is required\n");
            return sim::kExitUsage;
        }
        if (int rc = noExtra(cmd, a)) return rc;
        return sim::cmdDown(a.root);
    }
    if (!resolveRoot(cmd, &a.root)) return sim::kExitUsage;
    if (cmd == "at") return cmdAt(a);
    if (cmd == "forward") {
        std::string err;
        if (!sim::checkForwardArgs(a.rest, &err)) {
            fprintf(stderr, "tolk-sim forward: %s\n", err.c_str());
            return sim::kExitUsage;
        }
        if (!requireUp(cmd, a.root, false)) return sim::kExitFailed;
        return sim::cmdForward(a.root, a.rest);
    }
    if (cmd == "console") {
        for (const auto &r : a.rest) {
            if (r != "--adb") {
                fprintf(stderr, "tolk-sim console: unknown option '%s'\n", r.c_str());
                return sim::kExitUsage;
            }
        }
        if (!requireUp(cmd, a.root, true)) return sim::kExitFailed;
        return sim::cmdConsole(a.root, !a.rest.empty());
    }
    if (cmd == "getprop") {
        if (a.rest.size() > 1) {
            fprintf(stderr, "tolk-sim getprop: at most one NAME\n");
            return sim::kExitUsage;
        }
        if (a.rest.size() == 1) {
            char value[PROP_VALUE_MAX];
            property_get(a.rest[0].c_str(), value, "");
            printf("%s\n", value);
            return sim::kExitOk;
        }
        std::vector<std::pair<std::string, std::string>> all;
        property_list(collectProp, &all);
        std::sort(all.begin(), all.end());
        for (const auto &p : all) printf("[%s]: [%s]\n", p.first.c_str(), p.second.c_str());
        return sim::kExitOk;
    }
    if (cmd == "setprop") {
        if (a.rest.size() != 2) {
            fprintf(stderr, "tolk-sim setprop: NAME VALUE\n");
            return sim::kExitUsage;
        }
        if (property_set(a.rest[0].c_str(), a.rest[1].c_str()) != 0) {
            fprintf(stderr, "tolk-sim setprop: %s=%s was refused\n", a.rest[0].c_str(), a.rest[1].c_str());
            return sim::kExitFailed;
        }
        return sim::kExitOk;
    }
    if (cmd == "replug" || cmd == "unplug" || cmd == "tty-settings") {
        if (int rc = noExtra(cmd, a)) return rc;
        return control(a.root, cmd);
    }
    if (cmd == "pause-host") {
        long ms = 0;
        if (a.rest.size() != 1 || !sim::parseBoundedNumber(a.rest[0], 3600 * 1000, &ms)) {
            fprintf(stderr, "tolk-sim pause-host: MS (milliseconds, 0 to 3600000)\n");
            return sim::kExitUsage;
        }
        return control(a.root, "pause-host " + a.rest[0]);
    }
    if (cmd == "stop" || cmd == "start") {
        if (a.rest.size() != 1 || !sim::isPeerName(a.rest[0])) {
            fprintf(stderr, "tolk-sim %s: NAME is one of radio, generic, audio, cit\n", cmd.c_str());
            return sim::kExitUsage;
        }
        return control(a.root, cmd + " " + a.rest[0]);
    }
    // urc
    long slot = 1;
    std::string text;
    bool haveText = false;
    for (size_t i = 0; i < a.rest.size(); i++) {
        if (a.rest[i] == "--slot") {
            if (i + 1 >= a.rest.size() || !sim::parseBoundedNumber(a.rest[i + 1], kRadioSlots, &slot) || slot < 1) {
                fprintf(stderr, "tolk-sim urc: --slot needs a slot from 1 to %d\n", kRadioSlots);
                return sim::kExitUsage;
            }
            i++;
        } else if (!haveText) {
            text = a.rest[i];
            haveText = true;
        } else {
            fprintf(stderr, "tolk-sim urc: one TEXT only (quote it)\n");
            return sim::kExitUsage;
        }
    }
    std::string bytes, err;
    if (!haveText || !sim::decodeEscapes(text, &bytes, &err)) {
        fprintf(stderr, "tolk-sim urc: %s\n", haveText ? err.c_str() : "TEXT is missing");
        return sim::kExitUsage;
    }
    if (!requireUp(cmd, a.root, false)) return sim::kExitFailed;
    return send_radio_urc(a.root, static_cast<int>(slot), bytes);
}

}  // namespace

int main(int argc, char **argv) {
    std::vector<std::string> args(argv, argv + argc);
    return dispatch(args);
}

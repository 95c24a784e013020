// End-to-end test harness: one simulated device per test, driven through tolk-sim
// exactly as a factory host would, byte for byte.
#ifndef TOLK_TESTS_E2E_SIM_DEVICE_H
#define TOLK_TESTS_E2E_SIM_DEVICE_H

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

// Runs the tolk-sim binary built beside the tests; returns its exit status and
// fills out with its standard output (and standard error when errToo).
int runSim(const std::vector<std::string> &args, std::string *out = nullptr, bool errToo = false);
// Starts tolk-sim with stdin and stdout on the given descriptors and returns
// its pid at once (the caller waits for it).
pid_t startSim(const std::vector<std::string> &args, int in, int out);

class SimDevice {
public:
    // `tolk-sim up --root <fresh temporary folder> <upArgs...>`. started() tells
    // whether tolkd is serving; upStatus()/upOutput() give what up reported.
    // beforeUp may put files into the root (scripts, NVRAM content) before up.
    explicit SimDevice(const std::vector<std::string> &upArgs = {},
                       const std::function<void(SimDevice &)> &beforeUp = nullptr);
    // `tolk-sim down`, then the root folder is removed.
    ~SimDevice();
    SimDevice(const SimDevice &) = delete;
    SimDevice &operator=(const SimDevice &) = delete;

    bool started() const { return upStatus_ == 0; }
    int upStatus() const { return upStatus_; }
    const std::string &upOutput() const { return upOutput_; }
    const std::string &root() const { return root_; }

    // `tolk-sim at [--adb] --timeout SEC LINE...`: the exact bytes the host
    // received. A line without a complete answer ends the call after timeoutMs
    // (give a short one where silence is a right answer); the status is ignored.
    std::string at(const std::vector<std::string> &lines, bool adb = false, int timeoutMs = 30000);
    std::string at(const std::string &line, bool adb = false, int timeoutMs = 30000) {
        return at(std::vector<std::string>{line}, adb, timeoutMs);
    }
    // Any other subcommand: `tolk-sim <args...> --root <root>`; returns its stdout.
    std::string sim(const std::vector<std::string> &args, int *status = nullptr);

    std::string getprop(const std::string &name);
    void setprop(const std::string &name, const std::string &value);

    // Files of the device root, by device path ("/data/prod/citf").
    std::string readFile(const std::string &devicePath) const;
    void writeFile(const std::string &devicePath, const std::string &content) const;
    bool fileExists(const std::string &devicePath) const;
    // The daemon's log so far.
    std::string log() const;
    // A value from <root>/sim.env (TOLKD_PID, TOLK_HOST_TTY, TOLK_ADB_SOCKET, TOLKD_LOG...).
    std::string env(const std::string &key) const;
    pid_t tolkdPid() const;
    // Exit status of tolkd once it has ended (waits up to timeoutMs); -1 while running.
    int tolkdExitStatus(int timeoutMs = 3000) const;
    // Open descriptors of tolkd right now (count of /proc/PID/fd entries).
    int tolkdFdCount() const;

    // Raw links for tests that need more control than `at`:
    int openSerial() const;  // the host tty, raw, read-write, non-blocking off
    int connectAdb() const;  // a new connection to the adb control socket

private:
    std::string root_;
    int upStatus_ = -1;
    std::string upOutput_;
};

// Writes all of data to fd.
bool writeAll(int fd, const std::string &data);
// Reads from fd until the bytes read contain needle (or timeoutMs has passed).
std::string readUntil(int fd, const std::string &needle, int timeoutMs = 5000);
// Byte-exact, readable rendering for assertion messages ("\r\n" shown as \r\n).
std::string visible(const std::string &bytes);

#endif

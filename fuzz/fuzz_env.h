// Shared pieces of the fuzz targets: a throw-away device root, the host end of the
// link the daemon answers on, and the few knobs that keep one run fast and alike.
#ifndef TOLK_FUZZ_FUZZ_ENV_H
#define TOLK_FUZZ_FUZZ_ENV_H

#include <stddef.h>
#include <stdint.h>

#include <string>

namespace fuzzenv {

// Creates the device root under /tmp once per process (removed at exit) and
// silences the daemon's log. Every target calls it from LLVMFuzzerInitialize.
void init();

// Absolute host path of the device root.
const std::string &root();

// Points TOLKD_ROOT at the root while an object of this type lives. The fuzzing
// engine itself opens corpus and crash files through the same wrapped open/fopen,
// so the root is named only while daemon code runs.
class InRoot {
public:
    InRoot();
    ~InRoot();
    InRoot(const InRoot &) = delete;
    InRoot &operator=(const InRoot &) = delete;
};

// Writes a file under the root (device path), creating its folders.
void writeFile(const char *devicePath, const void *data, size_t len);
// Removes the journals the platform keeps growing (shell commands, ADC writes), so a
// campaign of millions of runs does not fill the disk.
void trimJournals();

// The host end of the link: gSerialDevice's slot `slot` is one end of a socket pair;
// everything the daemon writes can be taken back from the other end.
class HostSide {
public:
    explicit HostSide(int slot);
    ~HostSide();
    HostSide(const HostSide &) = delete;
    HostSide &operator=(const HostSide &) = delete;
    // Reads (and so discards) everything written so far; returns the byte count.
    size_t drain(std::string *out = nullptr);
    int deviceFd() const { return device_; }

private:
    int slot_;
    int host_ = -1;
    int device_ = -1;
};

// Splits input into pieces at the separator "\xfe\xfe\xfe"; calls fn(data, len) for
// each piece (empty pieces included). Used where the fuzzer picks packet boundaries.
template <typename Fn>
void forEachPiece(const uint8_t *data, size_t size, Fn fn) {
    size_t start = 0;
    for (size_t i = 0; i + 2 < size; i++) {
        if (data[i] == 0xfe && data[i + 1] == 0xfe && data[i + 2] == 0xfe) {
            fn(data + start, i - start);
            start = i + 3;
            i += 2;
        }
    }
    fn(data + start, size - start);
}

}  // namespace fuzzenv

#endif

// The response writers with arbitrary data and byte counts, in both result-code
// modes and on both host links. The host end is a socket pair; what arrives there is
// checked against what each writer promises:
//   writeDataToSerial: the data raw (audio answers) or one "\r\n" ... "\r\n" frame,
//     and the count it returns is what was written;
//   writeDataToserialByResponseType: one frame;
//   writeDataToSerialByAudioType: exactly the bytes given, none lost, none added.
//
// Input: [mode byte] [2 bytes: count] data
//   mode bit 0: numeric result codes; bit 1: adb link (else serial);
//   bits 2-3: 0/1 writeDataToSerial, 2 by response type, 3 audio type;
//   bit 4: the count is negated.
#include <stdint.h>
#include <stdlib.h>
#include <string.h>

#include <string>

#include "fuzz_env.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"

namespace {

void check(bool ok) {
    if (!ok) abort();
}

bool framed(const std::string &out) {
    return out.size() >= 4 && out.compare(0, 2, "\r\n") == 0 && out.compare(out.size() - 2, 2, "\r\n") == 0;
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    fuzzenv::init();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size < 3) return 0;
    fuzzenv::InRoot in;
    const uint8_t mode = data[0];
    const size_t avail = size - 3;
    // The count never claims more bytes than the caller has: the writers trust it.
    int len = (int)((data[1] | (data[2] << 8)) % (avail + 1));
    if (mode & 0x10) len = -len;
    // An exact-size heap copy: any read past the given bytes is caught.
    char *buf = static_cast<char *>(malloc(avail > 0 ? avail : 1));
    memcpy(buf, data + 3, avail);

    gNumericMode = (mode & 1) != 0;
    const int slot = (mode & 2) ? DEVICE_ADB : DEVICE_SERIAL;
    gSerialDevice.fd[DEVICE_SERIAL] = gSerialDevice.fd[DEVICE_ADB] = -1;
    std::string out;
    {
        fuzzenv::HostSide host(slot);
        switch ((mode >> 2) & 3) {
        case 0:
        case 1: {
            int written = writeDataToSerial(buf, len);
            host.drain(&out);
            check(written == (int)out.size());
            const bool raw = (len >= 3 && (memcmp(buf, "AUD", 3) == 0 || memcmp(buf, "aud", 3) == 0)) ||
                             (len >= 2 && (memcmp(buf, "MM", 2) == 0 || memcmp(buf, "mm", 2) == 0));
            if (raw) {
                check(out == std::string(buf, (size_t)len));
            } else {
                check(framed(out) || out == "\r\n\r\n");
            }
            break;
        }
        case 2: {
            int type = (int)(int8_t)(len & 0xff);
            if (avail >= 4) memcpy(&type, buf, sizeof(type));
            writeDataToserialByResponseType(type);
            host.drain(&out);
            check(framed(out) || out == "\r\n\r\n");
            break;
        }
        case 3:
            writeDataToSerialByAudioType(buf, len);
            host.drain(&out);
            check(out == (len > 0 ? std::string(buf, (size_t)len) : std::string()));
            break;
        }
    }
    gSerialDevice.currDevice = DEVICE_SERIAL;
    gNumericMode = false;
    free(buf);
    return 0;
}

// The dispatcher with every local handler behind it, fed command lines as routing
// hands them over (upper-cased up to "=", blanks trimmed). The host end is a socket
// pair, so every answer is really written; the generic service, which the Wi-Fi
// switch waits for, answers with bytes the fuzzer chose and then hangs up.
//
// Input: [settings byte] line [\xfe\xfe\xfe generic service answer]
//   settings bit 0: operator OP12 (else OM); bit 1: PCT mode 0 (else 1);
//   bit 2: numeric result codes; bit 3: a generic service link exists.
#include <fcntl.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include <cutils/properties.h>

#include "attok/at_tok.h"
#include "dispatch/dispatcher.h"
#include "fuzz_env.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"

namespace {

void resetHandlerState() {
    for (int &v : gCmecConfig) v = 2;
    gVzwTolkCfg = 0;
    gCsdfMode = 1;
    gCsdfAuxmode = 1;
    gCclkTz = 65535;
    wifiEnableState = -1;
    wifiBand = -1;
    wifiFrequency = wifiDataRate = wifiTxPower = 0;
    mmiCmdSeqReset();
}

// Property writes are files under the root: only rewrite them when they change.
void applySettings(uint8_t settings) {
    static int last = -1;
    if (last == (settings & 3)) return;
    last = settings & 3;
    property_set("persist.operator.optr", (settings & 1) ? "OP12" : "OM");
    property_set("persist.service.pct.mode", (settings & 2) ? "0" : "1");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    fuzzenv::init();
    fuzzenv::InRoot in;
    // A product-information record and the Wi-Fi test library's state live here.
    static const char zeros[1024] = {0};
    fuzzenv::writeFile("/nvram/PRODUCT_INFO", zeros, sizeof(zeros));
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0) return 0;
    fuzzenv::InRoot in;
    const uint8_t settings = data[0];
    std::string line, answer;
    int piece = 0;
    fuzzenv::forEachPiece(data + 1, size - 1, [&](const uint8_t *p, size_t n) {
        if (piece == 0) line.assign(reinterpret_cast<const char *>(p), n);
        else if (piece == 1) answer.assign(reinterpret_cast<const char *>(p), n);
        piece++;
    });
    // Routing sees at most one line of the command buffer, up to its first NUL.
    if (line.size() > MAX_DATA_LEN) line.resize(MAX_DATA_LEN);
    line.resize(strlen(line.c_str()));

    resetHandlerState();
    applySettings(settings);
    gNumericMode = (settings & 4) != 0;
    fuzzenv::HostSide host(DEVICE_SERIAL);

    int service[2] = {-1, -1};
    if (settings & 8) {
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, service) != 0) abort();
        // Written in full before the command, then the service hangs up: the daemon
        // can read all of it and then sees the end, never a wait for more.
        fcntl(service[1], F_SETFL, O_NONBLOCK);
        if (!answer.empty() && write(service[1], answer.data(), answer.size()) < 0) { /* buffer full: less is fine */
        }
        shutdown(service[1], SHUT_WR);
        s_fdService_command = service[0];
    }

    // A heap copy of exactly the line's size, so reads past its end are caught.
    char *buf = static_cast<char *>(malloc(line.size() + 1));
    memcpy(buf, line.c_str(), line.size() + 1);
    char *cursor = buf;
    convertToUpperCase(cursor, '=');
    trim_string(&cursor);

    int type = process_cmd_line(cursor);
    if (type != RIL_TYPE && type != AUDIO_TYPE && type != TOLK_TYPE && type != GENERIC_TYPE && type != BAT_TYPE &&
        type != AUDIO_EXT_TYPE && type != BELVO_AUDIO_TYPE && type != BELVO_AUTIOCIT_TYPE) {
        abort();
    }
    free(buf);
    host.drain();

    if (service[0] >= 0) {
        if (s_fdService_command == service[0]) close(service[0]);
        close(service[1]);
    }
    s_fdService_command = -1;
    fuzzenv::trimJournals();
    return 0;
}

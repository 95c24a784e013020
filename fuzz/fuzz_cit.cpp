// The CIT command processor with arbitrary lines and arbitrary test-application
// answers, on a throw-away root with a product-information record and a result file
// whose contents the fuzzer chooses too. The test application is one end of a socket
// pair that already holds its whole answer and has hung up, so the processor's one
// receive never waits.
//
// Input: [flags] line [\xfe\xfe\xfe answer [\xfe\xfe\xfe record [\xfe\xfe\xfe result file]]]
//   flags bit 0: the test application is reachable (else the connection fails);
//   bit 1: it hangs up without a word; bit 2: no result file.
#include <fcntl.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include "cit/cit_cmd.h"
#include "cit/pro_info.h"
#include "fuzz_env.h"
#include "serial/serial_device.h"

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    fuzzenv::init();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0) return 0;
    fuzzenv::InRoot in;
    const uint8_t flags = data[0];
    std::string pieces[4];
    int count = 0;
    fuzzenv::forEachPiece(data + 1, size - 1, [&](const uint8_t *p, size_t n) {
        if (count < 4) pieces[count].assign(reinterpret_cast<const char *>(p), n);
        count++;
    });
    std::string &line = pieces[0];
    if (line.size() > MAX_DATA_LEN) line.resize(MAX_DATA_LEN);
    line.resize(strlen(line.c_str()));

    // The record as the NVRAM store keeps it: the fuzzer's bytes, padded or cut to
    // the record size.
    std::string record = pieces[2];
    record.resize(PRODUCT_INFO_SIZE, '\0');
    fuzzenv::writeFile("/nvram/PRODUCT_INFO", record.data(), record.size());
    if (flags & 4) {
        unlink((fuzzenv::root() + CIT_RESULT_FILE).c_str());
    } else {
        fuzzenv::writeFile(CIT_RESULT_FILE, pieces[3].data(), pieces[3].size());
    }

    fuzzenv::HostSide host(DEVICE_SERIAL);
    int app[2] = {-1, -1};
    sock_id = -1;
    if (flags & 1) {
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, app) != 0) abort();
        fcntl(app[1], F_SETFL, O_NONBLOCK);
        if (!(flags & 2) && !pieces[1].empty() && write(app[1], pieces[1].data(), pieces[1].size()) < 0) {
            // A full socket buffer only shortens the answer.
        }
        shutdown(app[1], SHUT_WR);
        sock_id = app[0];
    }

    // An exact-size heap copy: the processor writes into the line (it cuts at ",").
    char *buf = static_cast<char *>(malloc(line.size() + 1));
    memcpy(buf, line.c_str(), line.size() + 1);
    cit_test_pase(buf);
    free(buf);
    host.drain();

    // A forwarded command closes its connection; a local one leaves it alone.
    if (sock_id >= 0 && sock_id != app[0]) abort();
    if (sock_id == app[0] && app[0] >= 0) close(app[0]);
    if (app[1] >= 0) close(app[1]);
    sock_id = -1;
    fuzzenv::trimJournals();
    return 0;
}

// The audio services: "tolk-audio" (audio and device-maker test commands) and the
// second modem's audio link "rild-tolk-md2", both reserved-namespace sockets of the
// device root. Every receive is journalled with its exact length and answered with
// raw bytes: from the link's script when a rule matches, with a binary answer
// frame for an MMI test request frame, and "\r\nOK\r\n" otherwise.
#include <errno.h>
#include <poll.h>
#include <stdio.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "cit_audio_script.h"
#include "hostile.h"
#include "peers.h"
#include "sim_text.h"
#include "sim_util.h"

namespace {

const char kMmiTestPrefix[] = "at^mmitest=";
const char kDefaultAnswer[] = "\r\nOK\r\n";

struct AudioLink {
    const char *socketName;
    std::string root;
    std::string journalPath;
    peerscript::Script script;
    std::atomic<unsigned> connections{0};

    AudioLink(const char *name, const std::string &rootDir, const std::string &journal, const std::string &scriptPath)
        : socketName(name), root(rootDir), journalPath(journal), script(scriptPath) {}
};

// The answer to an MMI test request frame: it carries bytes 11 to 14 of the request
// (where the link repair puts its two bytes) and the request's length, so a test
// can see what arrived, and it holds NUL, CR and LF bytes on purpose.
std::string mmiTestAnswer(const std::string &request) {
    std::string out("\xff\x99", 2);
    for (size_t i = 11; i < 15; i++) out.push_back(i < request.size() ? request[i] : '\0');
    out.append("\x00\x0d\x0a\x00", 4);
    out.push_back(static_cast<char>(request.size() & 0xff));
    out.append("\r\n");
    return out;
}

void serveConnection(AudioLink *link, int conn) {
    // Hostile timing: every answer in a few pieces, a few ms apart (each
    // connection draws its own choices, in the order connections come).
    sim::Hostile hostile(link->root, std::string(link->socketName) + "#" + std::to_string(link->connections++));
    std::vector<char> buf(64 * 1024);
    for (;;) {
        ssize_t n = read(conn, buf.data(), buf.size());
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        std::string request(buf.data(), static_cast<size_t>(n));
        sim::journalLine(link->journalPath, std::to_string(n) + " " + sim::visibleBytes(request));

        peerscript::Answer answer;
        if (!link->script.lookup(sim::stripRequestEnd(request), &answer)) {
            if (request.compare(0, sizeof(kMmiTestPrefix) - 1, kMmiTestPrefix) == 0)
                answer.bytes = mmiTestAnswer(request);
            else
                answer.bytes = kDefaultAnswer;
        }
        sim::sleepMs(answer.delayMs);
        if (answer.close) break;
        if (answer.none) continue;
        bool sent = true;
        std::vector<std::string> pieces = hostile.split(answer.bytes);
        for (size_t i = 0; sent && i < pieces.size(); i++) {
            if (i > 0) sim::sleepMs(hostile.gapMs());
            sent = sim::sendAll(conn, pieces[i]);
        }
        if (!sent) break;
    }
    close(conn);
}

}  // namespace

int run_audio_peer(const std::string &root, const std::vector<std::string> &) {
    // Lives as long as the process, which ends at SIGTERM.
    AudioLink *links[2] = {
        new AudioLink("tolk-audio", root, root + "/journal/audio.log", root + "/sim/audio/script"),
        new AudioLink("rild-tolk-md2", root, root + "/journal/audio-md2.log", root + "/sim/audio/md2.script"),
    };
    pollfd fds[2];
    for (int i = 0; i < 2; i++) {
        fds[i].fd = tolk_local_server(links[i]->socketName, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 8);
        fds[i].events = POLLIN;
        if (fds[i].fd < 0) {
            fprintf(stderr, "audio peer: cannot serve \"%s\": %s\n", links[i]->socketName, strerror(errno));
            return 1;
        }
    }
    fprintf(stderr, "audio peer: serving \"tolk-audio\" and \"rild-tolk-md2\" for %s\n", root.c_str());
    for (;;) {
        if (poll(fds, 2, -1) < 0) {
            if (errno == EINTR) continue;
            fprintf(stderr, "audio peer: poll failed: %s\n", strerror(errno));
            return 1;
        }
        for (int i = 0; i < 2; i++) {
            if ((fds[i].revents & POLLIN) == 0) continue;
            int conn = accept(fds[i].fd, nullptr, nullptr);
            if (conn < 0) continue;
            AudioLink *link = links[i];
            std::thread([link, conn] { serveConnection(link, conn); }).detach();
        }
    }
}

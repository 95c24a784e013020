// The on-device CIT test application: serves the abstract socket "auto_cit" of
// the device root. Each connection carries NUL-terminated words; every word is
// journalled in DIR/journal/cit.log and answered from DIR/sim/cit/script
// (default "OK"). A connection lives until the daemon closes it, so several words
// may arrive on one connection.
#include <errno.h>
#include <poll.h>
#include <stdio.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>
#include <thread>
#include <vector>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "cit_audio_script.h"
#include "peers.h"
#include "sim_text.h"
#include "sim_util.h"

namespace {

const char kSocketName[] = "auto_cit";
const char kDefaultAnswer[] = "OK";

struct CitPeer {
    std::string journalPath;
    peerscript::Script script;

    explicit CitPeer(const std::string &root)
        : journalPath(root + "/journal/cit.log"), script(root + "/sim/cit/script") {}

    // Answers one word; false when the connection is to be closed.
    bool answerWord(int conn, const std::string &word) {
        sim::journalLine(journalPath, sim::visibleBytes(word));
        peerscript::Answer answer;
        if (!script.lookup(word, &answer)) answer.bytes = kDefaultAnswer;
        sim::sleepMs(answer.delayMs);
        if (answer.close) return false;
        if (answer.none) return true;
        return sim::sendAll(conn, answer.bytes);
    }

    void serveConnection(int conn) {
        std::string pending;
        char buf[1024];
        for (;;) {
            ssize_t n = read(conn, buf, sizeof(buf));
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) break;
            pending.append(buf, static_cast<size_t>(n));
            size_t nul;
            bool open = true;
            while (open && (nul = pending.find('\0')) != std::string::npos) {
                std::string word = pending.substr(0, nul);
                pending.erase(0, nul + 1);
                open = answerWord(conn, word);
            }
            if (!open) break;
        }
        close(conn);
    }
};

}  // namespace

int run_cit_peer(const std::string &root, const std::vector<std::string> &) {
    int listener = tolk_local_server(kSocketName, ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM, 8);
    if (listener < 0) {
        fprintf(stderr, "cit peer: cannot serve \"%s\": %s\n", kSocketName, strerror(errno));
        return 1;
    }
    fprintf(stderr, "cit peer: serving \"%s\" for %s\n", kSocketName, root.c_str());
    // Lives as long as the process, which ends at SIGTERM.
    CitPeer *peer = new CitPeer(root);
    for (;;) {
        int conn = accept(listener, nullptr, nullptr);
        if (conn < 0) {
            if (errno == EINTR || errno == ECONNABORTED) continue;
            fprintf(stderr, "cit peer: accept failed: %s\n", strerror(errno));
            return 1;
        }
        std::thread([peer, conn] { peer->serveConnection(conn); }).detach();
    }
}

#include "hostile.h"

#include <algorithm>

#include "sim_util.h"

namespace sim {

const char kNoiseLine[] = "\r\n+TSIM: NOISE\r\n";
const char kNoiseText[] = "+TSIM: NOISE";

std::string removeNoise(const std::string &raw, size_t *held) {
    const std::string noise = kNoiseLine;
    std::string out;
    size_t from = 0;
    for (size_t at; (at = raw.find(noise, from)) != std::string::npos; from = at + noise.size())
        out.append(raw, from, at - from);
    out.append(raw, from, std::string::npos);
    *held = 0;
    for (size_t n = std::min(out.size(), noise.size() - 1); n >= 3; n--) {
        if (out.compare(out.size() - n, n, noise, 0, n) == 0) {
            *held = n;
            out.resize(out.size() - n);
            break;
        }
    }
    return out;
}

std::string hostileSeedFile(const std::string &root) { return root + "/sim/hostile"; }

bool parseHostileSeed(const std::string &text, uint64_t *seed) {
    if (text.empty() || text.size() > 20) return false;
    uint64_t v = 0;
    for (char c : text) {
        if (c < '0' || c > '9') return false;
        uint64_t d = static_cast<uint64_t>(c - '0');
        if (v > (UINT64_MAX - d) / 10) return false;
        v = v * 10 + d;
    }
    *seed = v;
    return true;
}

Hostile::Hostile(const std::string &root, const std::string &who) {
    std::string text;
    uint64_t seed = 0;
    bool on = readFile(hostileSeedFile(root), &text);
    while (!text.empty() && (text.back() == '\n' || text.back() == ' ')) text.pop_back();
    start(on && parseHostileSeed(text, &seed), seed, who);
}

void Hostile::start(bool on, uint64_t seed, const std::string &who) {
    on_ = on;
    seed_ = seed;
    // FNV-1a of the user's name: each peer draws its own stream from one seed.
    uint64_t h = 1469598103934665603ULL;
    for (unsigned char c : who) h = (h ^ c) * 1099511628211ULL;
    rng_.seed(seed ^ h);
}

int Hostile::below(int n) {
    if (n < 2) return 0;
    std::lock_guard<std::mutex> lock(mutex_);
    return static_cast<int>(rng_() % static_cast<uint64_t>(n));
}

std::vector<std::string> Hostile::split(const std::string &bytes) {
    if (!on_ || bytes.size() < 2) return {bytes};
    int cuts = 1 + below(3);
    std::vector<size_t> at;
    for (int i = 0; i < cuts; i++) at.push_back(1 + static_cast<size_t>(below(static_cast<int>(bytes.size()) - 1)));
    std::sort(at.begin(), at.end());
    at.erase(std::unique(at.begin(), at.end()), at.end());
    std::vector<std::string> out;
    size_t from = 0;
    for (size_t a : at) out.push_back(bytes.substr(from, a - from)), from = a;
    out.push_back(bytes.substr(from));
    return out;
}

void Outbox::push(int fd, const std::string &bytes, long long now, Hostile &h) {
    if (bytes.empty()) return;
    long long due = now;
    for (const Piece &p : pieces_)
        if (p.fd == fd) due = std::max(due, p.due);
    std::vector<std::string> parts = h.split(bytes);
    for (size_t i = 0; i < parts.size(); i++) {
        if (i > 0) due += h.gapMs();
        pieces_.push_back(Piece{fd, due, parts[i]});
    }
}

std::string Outbox::take(int fd) {
    std::string all;
    for (const Piece &p : pieces_)
        if (p.fd == fd) all += p.bytes;
    pieces_.erase(std::remove_if(pieces_.begin(), pieces_.end(), [fd](const Piece &p) { return p.fd == fd; }),
                  pieces_.end());
    return all;
}

int Outbox::timeoutMs(long long now, int idleMs) const {
    long long t = idleMs;
    for (const Piece &p : pieces_) t = std::min(t, std::max(0LL, p.due - now));
    return static_cast<int>(t);
}

}  // namespace sim

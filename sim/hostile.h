// Hostile timing: the way a real phone's peers and a real station's host stack
// deliver bytes, which a polite simulator hides. With `tolk-sim up --hostile[=SEED]`
// the peers coalesce answers that are due close together into one write, split
// answers at arbitrary byte boundaries into several writes a few milliseconds
// apart, release held answers together and interleave one unsolicited line (the
// noise line below) around modem answers. Every choice comes from the seed, so a
// failure can be replayed; the gaps are a few milliseconds, so it costs little
// time. The transcript runner uses the same generator to split what it sends.
#ifndef TOLK_SIM_HOSTILE_H
#define TOLK_SIM_HOSTILE_H

#include <cstdint>
#include <mutex>
#include <random>
#include <string>
#include <vector>

namespace sim {

// The unsolicited line a hostile radio service interleaves. No answer of any
// table holds it, so a reader can remove each whole occurrence; one that arrives
// torn, or with its framing merged into an answer, is a fault of the daemon.
extern const char kNoiseLine[];
// Its text alone, to find a torn one.
extern const char kNoiseText[];

// raw with each whole noise line taken out; *held is the length of a tail that
// may still grow into one ("\r\n+" and more: "\r\n" alone ends every answer),
// left out of the result until more bytes decide.
std::string removeNoise(const std::string &raw, size_t *held);

// The longest gap between two pieces of a split write, and the longest wait that
// lets answers due close together leave in one write.
const int kHostileMaxGapMs = 3;
const int kHostileGatherMs = 4;

// The file `up --hostile` leaves in the device root: the seed, in decimal.
std::string hostileSeedFile(const std::string &root);
// A seed written by hand or given on a command line: decimal, 0 .. 2^64-1.
bool parseHostileSeed(const std::string &text, uint64_t *seed);

class Hostile {
public:
    // Off, unless the root holds the seed file; each user (a peer's name, a
    // connection's number) gets its own stream of choices from the same seed.
    Hostile() = default;
    Hostile(const std::string &root, const std::string &who);
    Hostile(bool on, uint64_t seed, const std::string &who) { start(on, seed, who); }

    bool on() const { return on_; }
    uint64_t seed() const { return seed_; }
    // 0 .. n-1 (0 when n < 2).
    int below(int n);
    bool chance(int percent) { return below(100) < percent; }
    // 1 .. kHostileMaxGapMs.
    int gapMs() { return 1 + below(kHostileMaxGapMs); }
    // bytes cut at one to three seeded places (never an empty piece); one piece
    // when off or too short to cut.
    std::vector<std::string> split(const std::string &bytes);

private:
    void start(bool on, uint64_t seed, const std::string &who);
    bool on_ = false;
    uint64_t seed_ = 0;
    std::mt19937_64 rng_;
    std::mutex mutex_;  // peers with a thread per connection share one
};

// Bytes waiting to go out on a descriptor in timed pieces, in order: what is
// queued later never overtakes what is queued earlier on the same descriptor.
class Outbox {
public:
    // Queues bytes for fd: in hostile mode split, the pieces a few ms apart;
    // otherwise as one piece due at once (behind what is already queued).
    void push(int fd, const std::string &bytes, long long now, Hostile &h);
    // Writes every piece that is due; send returns false for a descriptor that
    // is gone, whose pieces are then dropped.
    template <typename Send>
    void flush(long long now, Send send) {
        std::vector<int> dead;
        std::vector<Piece> keep;
        for (Piece &p : pieces_) {
            bool gone = false;
            for (int d : dead) gone |= d == p.fd;
            if (gone) continue;
            if (p.due > now || blocked(keep, p.fd)) {
                keep.push_back(p);
            } else if (!send(p.fd, p.bytes)) {
                dead.push_back(p.fd);
            }
        }
        pieces_.swap(keep);
    }
    // Takes what is queued for fd at once (all of it, in order), or drops it.
    std::string take(int fd);
    void drop(int fd) { take(fd); }
    // How long a poll may sleep: until the next due piece, at most idleMs.
    int timeoutMs(long long now, int idleMs) const;

private:
    struct Piece {
        int fd;
        long long due;
        std::string bytes;
    };
    static bool blocked(const std::vector<Piece> &kept, int fd) {
        for (const Piece &k : kept)
            if (k.fd == fd) return true;
        return false;
    }
    std::vector<Piece> pieces_;
};

}  // namespace sim

#endif

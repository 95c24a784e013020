// Waiting for something another thread or process brings about, within a bound.
#ifndef TOLK_TESTS_SUPPORT_EVENTUALLY_H
#define TOLK_TESTS_SUPPORT_EVENTUALLY_H

#include <chrono>
#include <functional>
#include <thread>

// True as soon as cond holds, checked every 5 ms; false when it still does not
// hold after ms milliseconds.
inline bool eventually(const std::function<bool()> &cond, int ms = 3000) {
    auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);
    while (std::chrono::steady_clock::now() < end) {
        if (cond()) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return cond();
}

#endif

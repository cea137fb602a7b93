#include "b_lock.h"

#include <sched.h>
#include <time.h>

namespace base {

namespace {
constexpr std::uint32_t kWriter = 0x80000000u;
constexpr std::uint32_t kWaiting = 0x40000000u;
constexpr std::uint32_t kReaders = 0x3FFFFFFFu;
} // namespace

void spinBackOff(std::uint32_t& spins) noexcept {
    if (spins < 60) {
    } else if (spins < 105) {
        sched_yield();
    } else {
        timespec ms{0, 1000000};
        nanosleep(&ms, nullptr);
        spins = 0;
        return;
    }
    ++spins;
}

void readLock(LockWord& word) noexcept {
    std::uint32_t spins = 0;
    for (;;) {
        std::uint32_t w = word.load(std::memory_order_relaxed);
        if (w < kWaiting && word.compare_exchange_weak(w, w + 1, std::memory_order_acquire))
            return;
        spinBackOff(spins);
    }
}

void readUnlock(LockWord& word) noexcept {
    std::uint32_t spins = 0;
    for (;;) {
        std::uint32_t w = word.load(std::memory_order_relaxed);
        std::uint32_t count = w & kReaders;
        if (count == 0)
            return;
        if (word.compare_exchange_weak(w, (w & kWaiting) | (count - 1), std::memory_order_release))
            return;
        spinBackOff(spins);
    }
}

void writeLock(LockWord& word) noexcept {
    std::uint32_t spins = 0;
    for (;;) {
        std::uint32_t w = word.load(std::memory_order_relaxed);
        if ((w & ~kWaiting) == 0) {
            if (word.compare_exchange_weak(w, kWriter, std::memory_order_acquire))
                return;
        } else if (!(w & kWaiting)) {
            word.compare_exchange_weak(w, w | kWaiting, std::memory_order_relaxed);
        }
        spinBackOff(spins);
    }
}

void writeUnlock(LockWord& word) noexcept {
    word.store(word.load(std::memory_order_relaxed) & kWaiting, std::memory_order_release);
}

} // namespace base

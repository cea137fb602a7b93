// Reader-writer spin lock over a 32-bit word: bit 31 writer, bit 30 writer
// waiting, bits 0-29 reader count. Attributes, plug-ins and factories each
// carry one such word.
#pragma once

#include <atomic>
#include <cstdint>

namespace base {

using LockWord = std::atomic<std::uint32_t>;

// Back-off after a failed attempt: spin, then yield, then sleep 1 ms.
void spinBackOff(std::uint32_t& spins) noexcept;

void readLock(LockWord& word) noexcept;
void readUnlock(LockWord& word) noexcept;
void writeLock(LockWord& word) noexcept;
void writeUnlock(LockWord& word) noexcept;

class ReadGuard {
public:
    explicit ReadGuard(LockWord& word) noexcept : m_word(&word) { readLock(word); }
    ~ReadGuard() {
        if (m_word)
            readUnlock(*m_word);
    }
    ReadGuard(const ReadGuard&) = delete;
    ReadGuard& operator=(const ReadGuard&) = delete;

private:
    LockWord* m_word;
};

class WriteGuard {
public:
    explicit WriteGuard(LockWord& word) noexcept : m_word(&word) { writeLock(word); }
    ~WriteGuard() { writeUnlock(*m_word); }
    WriteGuard(const WriteGuard&) = delete;
    WriteGuard& operator=(const WriteGuard&) = delete;

private:
    LockWord* m_word;
};

} // namespace base

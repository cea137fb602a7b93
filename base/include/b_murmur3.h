// MurmurHash3, x86 128-bit variant, fed in pieces: array attributes hash the
// binary form of their items, which for strings and padded matrices is not one
// contiguous block. Feeding the same bytes in any split gives the one-shot hash.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace base {

class Murmur3x86_128 {
public:
    explicit Murmur3x86_128(std::uint32_t seed = 0) noexcept : m_h{seed, seed, seed, seed} {}

    void update(const void* data, std::size_t bytes) noexcept;
    // h1..h4 of the reference implementation (its output words in order).
    std::array<std::uint32_t, 4> finish() const noexcept;
    // The first 64 bits of the digest: h1 in the low half, h2 in the high half.
    std::uint64_t finish64() const noexcept;

private:
    void block(const unsigned char* p) noexcept;

    std::uint32_t m_h[4];
    unsigned char m_tail[16] = {};
    std::size_t m_tailSize = 0;
    std::uint64_t m_length = 0;
};

// One-shot form: writes the 16 digest bytes (h1..h4 little-endian) to 'out'.
void murmur3_x86_128(const void* data, std::size_t bytes, std::uint32_t seed, void* out) noexcept;

} // namespace base

#include "b_murmur3.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace base {
namespace {

constexpr std::uint32_t c1 = 0x239b961b;
constexpr std::uint32_t c2 = 0xab0e9789;
constexpr std::uint32_t c3 = 0x38b34ae5;
constexpr std::uint32_t c4 = 0xa1e38b93;

std::uint32_t load32(const unsigned char* p) noexcept {
    // Bytes are combined explicitly so the digest is the same on any endianness.
    return std::uint32_t(p[0]) | std::uint32_t(p[1]) << 8 | std::uint32_t(p[2]) << 16 |
           std::uint32_t(p[3]) << 24;
}

std::uint32_t fmix32(std::uint32_t h) noexcept {
    h ^= h >> 16;
    h *= 0x85ebca6b;
    h ^= h >> 13;
    h *= 0xc2b2ae35;
    h ^= h >> 16;
    return h;
}

} // namespace

void Murmur3x86_128::block(const unsigned char* p) noexcept {
    std::uint32_t k1 = load32(p), k2 = load32(p + 4), k3 = load32(p + 8), k4 = load32(p + 12);
    auto& [h1, h2, h3, h4] = m_h;

    k1 *= c1, k1 = std::rotl(k1, 15), k1 *= c2, h1 ^= k1;
    h1 = std::rotl(h1, 19), h1 += h2, h1 = h1 * 5 + 0x561ccd1b;
    k2 *= c2, k2 = std::rotl(k2, 16), k2 *= c3, h2 ^= k2;
    h2 = std::rotl(h2, 17), h2 += h3, h2 = h2 * 5 + 0x0bcaa747;
    k3 *= c3, k3 = std::rotl(k3, 17), k3 *= c4, h3 ^= k3;
    h3 = std::rotl(h3, 15), h3 += h4, h3 = h3 * 5 + 0x96cd1c35;
    k4 *= c4, k4 = std::rotl(k4, 18), k4 *= c1, h4 ^= k4;
    h4 = std::rotl(h4, 13), h4 += h1, h4 = h4 * 5 + 0x32ac3b17;
}

void Murmur3x86_128::update(const void* data, std::size_t bytes) noexcept {
    if (!bytes)
        return; // an empty vector's data may be null
    auto* p = static_cast<const unsigned char*>(data);
    m_length += bytes;
    if (m_tailSize) {
        std::size_t n = std::min(bytes, sizeof(m_tail) - m_tailSize);
        std::memcpy(m_tail + m_tailSize, p, n);
        m_tailSize += n;
        p += n;
        bytes -= n;
        if (m_tailSize < sizeof(m_tail))
            return;
        block(m_tail);
        m_tailSize = 0;
    }
    for (; bytes >= 16; p += 16, bytes -= 16)
        block(p);
    std::memcpy(m_tail, p, bytes);
    m_tailSize = bytes;
}

std::array<std::uint32_t, 4> Murmur3x86_128::finish() const noexcept {
    std::uint32_t h1 = m_h[0], h2 = m_h[1], h3 = m_h[2], h4 = m_h[3];
    std::uint32_t k[4] = {0, 0, 0, 0};
    for (std::size_t i = 0; i < m_tailSize; ++i)
        k[i / 4] |= std::uint32_t(m_tail[i]) << (8 * (i % 4));
    // Only the words the tail reaches are mixed in, as in the reference.
    if (m_tailSize > 12)
        k[3] *= c4, k[3] = std::rotl(k[3], 18), k[3] *= c1, h4 ^= k[3];
    if (m_tailSize > 8)
        k[2] *= c3, k[2] = std::rotl(k[2], 17), k[2] *= c4, h3 ^= k[2];
    if (m_tailSize > 4)
        k[1] *= c2, k[1] = std::rotl(k[1], 16), k[1] *= c3, h2 ^= k[1];
    if (m_tailSize > 0)
        k[0] *= c1, k[0] = std::rotl(k[0], 15), k[0] *= c2, h1 ^= k[0];

    // The reference takes the length as a 32-bit int.
    const auto len = std::uint32_t(m_length);
    h1 ^= len, h2 ^= len, h3 ^= len, h4 ^= len;
    h1 += h2, h1 += h3, h1 += h4;
    h2 += h1, h3 += h1, h4 += h1;
    h1 = fmix32(h1), h2 = fmix32(h2), h3 = fmix32(h3), h4 = fmix32(h4);
    h1 += h2, h1 += h3, h1 += h4;
    h2 += h1, h3 += h1, h4 += h1;
    return {h1, h2, h3, h4};
}

std::uint64_t Murmur3x86_128::finish64() const noexcept {
    auto h = finish();
    return std::uint64_t(h[0]) | std::uint64_t(h[1]) << 32;
}

void murmur3_x86_128(const void* data, std::size_t bytes, std::uint32_t seed, void* out) noexcept {
    Murmur3x86_128 hasher(seed);
    hasher.update(data, bytes);
    auto h = hasher.finish();
    auto* o = static_cast<unsigned char*>(out);
    for (int i = 0; i < 4; ++i)
        for (int b = 0; b < 4; ++b)
            o[i * 4 + b] = static_cast<unsigned char>(h[i] >> (8 * b));
}

} // namespace base

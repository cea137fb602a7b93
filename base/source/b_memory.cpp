#include "b_memory.h"

#include <cstdio>
#include <cstdlib>

namespace base {
namespace {

// Every block carries a 16-byte header with its size, so frees can be counted
// without asking the C library, and blocks stay 16-byte aligned.
constexpr std::size_t kHeader = 16;

std::atomic<std::size_t> g_live{0};
std::atomic<std::size_t> g_peak{0};
std::atomic<std::uint64_t> g_count{0};

void account(std::size_t size) {
    std::size_t live = g_live.fetch_add(size, std::memory_order_relaxed) + size;
    std::size_t peak = g_peak.load(std::memory_order_relaxed);
    while (live > peak && !g_peak.compare_exchange_weak(peak, live, std::memory_order_relaxed)) {
    }
    g_count.fetch_add(1, std::memory_order_relaxed);
}

} // namespace

HeapStats heapStats() {
    return {g_live.load(), g_peak.load(), g_count.load()};
}

void resetHeapPeak() {
    g_peak.store(g_live.load());
}

void* StdAllocPolicy::allocateBytes(std::size_t size, const char*, int, const char*,
                                    std::uint32_t) {
    if (size > SIZE_MAX - kHeader)
        return nullptr;
    auto* block = static_cast<unsigned char*>(std::malloc(size + kHeader));
    if (!block)
        return nullptr;
    *reinterpret_cast<std::size_t*>(block) = size;
    account(size);
    return block + kHeader;
}

void StdAllocPolicy::deallocateBytes(void* pointer, std::uint32_t) {
    if (!pointer)
        return;
    auto* block = static_cast<unsigned char*>(pointer) - kHeader;
    g_live.fetch_sub(*reinterpret_cast<std::size_t*>(block), std::memory_order_relaxed);
    std::free(block);
}

namespace detail {

// Header: [size][offset to the malloc'ed block], placed right before the
// aligned pointer.
void* alignedAllocate(std::size_t size, std::size_t alignment) {
    if (size > SIZE_MAX - alignment - kHeader)
        return nullptr;
    auto* raw = static_cast<unsigned char*>(std::malloc(size + alignment + kHeader));
    if (!raw)
        return nullptr;
    auto address = reinterpret_cast<std::uintptr_t>(raw) + kHeader;
    address = (address + alignment - 1) & ~(std::uintptr_t(alignment) - 1);
    auto* aligned = reinterpret_cast<unsigned char*>(address);
    auto* header = reinterpret_cast<std::size_t*>(aligned - kHeader);
    header[0] = size;
    header[1] = static_cast<std::size_t>(aligned - raw);
    account(size);
    return aligned;
}

void alignedDeallocate(void* pointer) {
    if (!pointer)
        return;
    auto* aligned = static_cast<unsigned char*>(pointer);
    auto* header = reinterpret_cast<std::size_t*>(aligned - kHeader);
    g_live.fetch_sub(header[0], std::memory_order_relaxed);
    std::free(aligned - header[1]);
}

} // namespace detail

void reportAllocationFailure(std::size_t size) {
    std::fprintf(stderr, "Unable to allocate %zu bytes!\n", size);
    throw std::bad_alloc();
}

void* guardedAllocate(std::size_t size) {
    void* p = StdAllocPolicy::allocateBytes(size);
    if (!p)
        reportAllocationFailure(size);
    return p;
}

} // namespace base

// Host heap: every block of the core, its containers and its objects goes
// through StdAllocPolicy so that a host can account for and cap memory.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <map>
#include <new>
#include <string>
#include <vector>

namespace base {

// Live and peak bytes handed out by the host heap (both policies together).
struct HeapStats {
    std::size_t liveBytes = 0;
    std::size_t peakBytes = 0;
    std::uint64_t allocations = 0;
};
HeapStats heapStats();
// Restarts the peak at the current live count, so a caller can measure one phase.
void resetHeapPeak();

struct StdAllocPolicy {
    static void* allocateBytes(std::size_t size, const char* file = nullptr, int line = 0,
                               const char* function = nullptr, std::uint32_t flags = 0);
    static void deallocateBytes(void* pointer, std::uint32_t flags = 0);
};

template <std::size_t Alignment>
struct StdAlignAllocPolicy {
    static_assert((Alignment & (Alignment - 1)) == 0 && Alignment >= 16);
    static void* allocateBytes(std::size_t size, const char* file = nullptr, int line = 0,
                               const char* function = nullptr, std::uint32_t flags = 0);
    static void deallocateBytes(void* pointer, std::uint32_t flags = 0);
};

namespace detail {
void* alignedAllocate(std::size_t size, std::size_t alignment);
void alignedDeallocate(void* pointer);
} // namespace detail

template <std::size_t Alignment>
void* StdAlignAllocPolicy<Alignment>::allocateBytes(std::size_t size, const char*, int, const char*,
                                                    std::uint32_t) {
    return detail::alignedAllocate(size, Alignment);
}
template <std::size_t Alignment>
void StdAlignAllocPolicy<Alignment>::deallocateBytes(void* pointer, std::uint32_t) {
    detail::alignedDeallocate(pointer);
}

// Allocation that must not fail: prints "Unable to allocate %zu bytes!" and
// throws std::bad_alloc when the heap answers null.
void* guardedAllocate(std::size_t size);
[[noreturn]] void reportAllocationFailure(std::size_t size);

// Base of objects created one by one on the host heap.
template <class Policy = StdAllocPolicy>
class AllocObject {
public:
    static void* operator new(std::size_t size) {
        void* p = Policy::allocateBytes(size, nullptr, 0, nullptr, 0);
        if (!p)
            reportAllocationFailure(size);
        return p;
    }
    static void operator delete(void* p) noexcept { Policy::deallocateBytes(p, 0); }
    static void* operator new(std::size_t, void* where) noexcept { return where; }
    static void operator delete(void*, void*) noexcept {}
};

class NonCopyable {
protected:
    NonCopyable() = default;
    ~NonCopyable() = default;

public:
    NonCopyable(const NonCopyable&) = delete;
    NonCopyable& operator=(const NonCopyable&) = delete;
};

// Standard-container allocator over the host heap.
template <class T>
struct StdAllocator {
    using value_type = T;
    StdAllocator() noexcept = default;
    template <class U>
    StdAllocator(const StdAllocator<U>&) noexcept {}
    T* allocate(std::size_t n) {
        void* p = StdAllocPolicy::allocateBytes(n * sizeof(T), __FILE__, __LINE__, __func__, 0);
        if (!p)
            reportAllocationFailure(n * sizeof(T));
        return static_cast<T*>(p);
    }
    void deallocate(T* p, std::size_t) noexcept { StdAllocPolicy::deallocateBytes(p, 0); }
    template <class U>
    bool operator==(const StdAllocator<U>&) const noexcept {
        return true;
    }
};

using string = std::basic_string<char, std::char_traits<char>, StdAllocator<char>>;
using u16string = std::basic_string<char16_t, std::char_traits<char16_t>, StdAllocator<char16_t>>;
template <class T>
using vector = std::vector<T, StdAllocator<T>>;
template <class K, class V, class Compare = std::less<K>>
using map = std::map<K, V, Compare, StdAllocator<std::pair<const K, V>>>;

} // namespace base

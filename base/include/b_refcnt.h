// Intrusive reference counting. RefCntAtomic is the base of descriptors,
// plug-ins and factories (atomic strong count plus a list of weak nodes that
// are nulled when the object dies); RefCnt is the single-threaded variant.
// ref<T> is the strong pointer used everywhere.
#pragma once

#include "b_lock.h"
#include "b_memory.h"

#include <atomic>
#include <cstdint>
#include <utility>

namespace base {

// A weak reference: 'watched' turns null when the object it points to dies.
struct WeakNode {
    void* watched = nullptr;
    WeakNode* next = nullptr;
};

class RefCntAtomic {
public:
    virtual ~RefCntAtomic();
    // Deletes the object; called by the release that takes the count to zero.
    virtual void destroy();

    void addRef() const noexcept { m_count.fetch_add(1, std::memory_order_seq_cst); }
    // Answers whether the object was destroyed.
    bool release() const;
    std::uint32_t refCount() const noexcept { return m_count.load(); }

    void addWeak(WeakNode& node) const;
    void removeWeak(WeakNode& node) const;

protected:
    RefCntAtomic() = default;
    RefCntAtomic(const RefCntAtomic&) : RefCntAtomic() {}
    RefCntAtomic& operator=(const RefCntAtomic&) { return *this; }

private:
    mutable std::atomic<std::uint32_t> m_count{0};
    mutable std::atomic<std::uint32_t> m_weakLock{0};
    mutable WeakNode* m_weak = nullptr;
};

class IRefCnt {
public:
    virtual ~IRefCnt() = default;
};

class RefCnt : public virtual IRefCnt {
public:
    void addRef() const noexcept { ++m_count; }
    bool release() const;
    std::uint32_t refCount() const noexcept { return m_count; }

    void addWeak(WeakNode& node) const;
    void removeWeak(WeakNode& node) const;

protected:
    RefCnt() = default;
    ~RefCnt() override;
    RefCnt(const RefCnt&) : RefCnt() {}
    RefCnt& operator=(const RefCnt&) { return *this; }

private:
    mutable std::uint32_t m_count = 0;
    mutable WeakNode* m_weak = nullptr;
};

template <class T>
class ref {
public:
    ref() noexcept = default;
    ref(std::nullptr_t) noexcept {}
    // Takes a new strong reference.
    ref(T* object) noexcept : m_p(object) {
        if (m_p)
            m_p->addRef();
    }
    ref(const ref& other) noexcept : ref(other.m_p) {}
    ref(ref&& other) noexcept : m_p(std::exchange(other.m_p, nullptr)) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> ref(const ref<U>& other)
    noexcept : ref(static_cast<T*>(other.get())) {}
    template <class U>
    requires std::is_convertible_v<U*, T*> ref(ref<U>&& other)
    noexcept : m_p(other.detach()) {}
    ~ref() { reset(); }

    ref& operator=(const ref& other) noexcept {
        ref(other).swap(*this);
        return *this;
    }
    ref& operator=(ref&& other) noexcept {
        ref(std::move(other)).swap(*this);
        return *this;
    }
    ref& operator=(T* object) noexcept {
        ref(object).swap(*this);
        return *this;
    }

    void reset() noexcept {
        if (T* p = std::exchange(m_p, nullptr))
            p->release();
    }
    // Gives up ownership without releasing.
    T* detach() noexcept { return std::exchange(m_p, nullptr); }
    // Takes ownership of an already counted pointer.
    static ref adopt(T* object) noexcept {
        ref r;
        r.m_p = object;
        return r;
    }
    void swap(ref& other) noexcept { std::swap(m_p, other.m_p); }

    T* get() const noexcept { return m_p; }
    T* operator->() const noexcept { return m_p; }
    T& operator*() const noexcept { return *m_p; }
    explicit operator bool() const noexcept { return m_p != nullptr; }

    template <class U>
    bool operator==(const ref<U>& other) const noexcept {
        return m_p == other.get();
    }
    bool operator==(std::nullptr_t) const noexcept { return m_p == nullptr; }
    template <class U>
    auto operator<=>(const ref<U>& other) const noexcept {
        return static_cast<const void*>(m_p) <=> static_cast<const void*>(other.get());
    }

private:
    T* m_p = nullptr;
};

} // namespace base

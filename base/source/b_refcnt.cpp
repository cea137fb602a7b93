#include "b_refcnt.h"

namespace base {

namespace {
void clearWeakList(WeakNode*& head) noexcept {
    while (WeakNode* node = head) {
        head = node->next;
        node->watched = nullptr;
        node->next = nullptr;
    }
}

void unlinkWeak(WeakNode*& head, WeakNode& node) noexcept {
    for (WeakNode** p = &head; *p; p = &(*p)->next) {
        if (*p == &node) {
            *p = node.next;
            node.next = nullptr;
            return;
        }
    }
}
} // namespace

RefCntAtomic::~RefCntAtomic() {
    WriteGuard guard(m_weakLock);
    clearWeakList(m_weak);
}

void RefCntAtomic::destroy() {
    delete this;
}

bool RefCntAtomic::release() const {
    if (m_count.fetch_sub(1, std::memory_order_seq_cst) != 1)
        return false;
    {
        WriteGuard guard(m_weakLock);
        clearWeakList(m_weak);
    }
    const_cast<RefCntAtomic*>(this)->destroy();
    return true;
}

void RefCntAtomic::addWeak(WeakNode& node) const {
    WriteGuard guard(m_weakLock);
    node.watched = const_cast<RefCntAtomic*>(this);
    node.next = m_weak;
    m_weak = &node;
}

void RefCntAtomic::removeWeak(WeakNode& node) const {
    WriteGuard guard(m_weakLock);
    unlinkWeak(m_weak, node);
    node.watched = nullptr;
}

RefCnt::~RefCnt() {
    clearWeakList(m_weak);
}

bool RefCnt::release() const {
    if (--m_count != 0)
        return false;
    clearWeakList(m_weak);
    delete this;
    return true;
}

void RefCnt::addWeak(WeakNode& node) const {
    node.watched = const_cast<RefCnt*>(this);
    node.next = m_weak;
    m_weak = &node;
}

void RefCnt::removeWeak(WeakNode& node) const {
    unlinkWeak(m_weak, node);
    node.watched = nullptr;
}

} // namespace base

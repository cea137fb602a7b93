#include "b_data_io.h"

#include <cstring>

namespace base::data_io_detail {

// Linear probing over a power-of-two table kept at most half full; texts live
// in one block, so the index costs two growing allocations.
std::size_t NameIndex::probe(std::string_view name, std::size_t hash) const noexcept {
    const std::size_t mask = m_slots.size() - 1;
    for (std::size_t i = hash & mask;; i = (i + 1) & mask) {
        const Slot& slot = m_slots[i];
        if (slot.id == none)
            return i;
        if (slot.hash == hash && slot.length == name.size() &&
            std::memcmp(m_text.data() + slot.offset, name.data(), name.size()) == 0)
            return i;
    }
}

bool NameIndex::insert(std::string_view name, std::uint32_t id) {
    if ((m_count + 1) * 2 > m_slots.size()) {
        vector<Slot> old(std::move(m_slots));
        m_slots.assign(old.empty() ? 64 : old.size() * 2, Slot{0, 0, 0, none});
        for (const Slot& slot : old)
            if (slot.id != none)
                m_slots[probe(std::string_view(m_text.data() + slot.offset, slot.length),
                              slot.hash)] = slot;
    }
    const std::size_t hash = TextHash()(name);
    Slot& slot = m_slots[probe(name, hash)];
    if (slot.id != none)
        return false;
    slot = Slot{hash, m_text.size(), std::uint32_t(name.size()), id};
    m_text.insert(m_text.end(), name.begin(), name.end());
    ++m_count;
    return true;
}

std::uint32_t NameIndex::find(std::string_view name) const noexcept {
    if (m_slots.empty())
        return none;
    const Slot& slot = m_slots[probe(name, TextHash()(name))];
    return slot.id;
}

} // namespace base::data_io_detail

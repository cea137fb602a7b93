#include "b_name.h"

namespace base {

name_id NameServer::intern(std::string_view text) {
    std::lock_guard lock(m_mutex);
    // The map is keyed by NUL-terminated texts; a view needs its own terminator
    // for the lookup. Names are short, so a stack buffer covers nearly all.
    char small[128];
    string large;
    const char* key;
    if (text.size() < sizeof(small)) {
        std::memcpy(small, text.data(), text.size());
        small[text.size()] = 0;
        key = small;
    } else {
        large.assign(text);
        key = large.c_str();
    }
    auto it = m_names.lower_bound(key);
    if (it != m_names.end() && std::strcmp(it->first, key) == 0)
        return it->second;
    // Records are never freed: a name_id stays valid for the life of the process.
    auto* record = new (guardedAllocate(sizeof(NameRecord))) NameRecord{string(text), 0};
    m_names.emplace_hint(it, record->text.c_str(), name_id(record));
    return name_id(record);
}

name_id NameServer::find(std::string_view text) const {
    string key(text);
    std::lock_guard lock(m_mutex);
    auto it = m_names.find(key.c_str());
    return it == m_names.end() ? name_id() : it->second;
}

std::size_t NameServer::size() const {
    std::lock_guard lock(m_mutex);
    return m_names.size();
}

NameServer::~NameServer() = default;

NameServer& nameServer() {
    // Never destroyed: names must stay valid during static destruction of
    // every library that holds name_id constants.
    static NameServer* server = new NameServer();
    return *server;
}

} // namespace base

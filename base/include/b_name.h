// Interned names. A name_id is the address of a name record that lives for the
// whole process: equality and ordering are pointer comparisons, so sorted
// containers keyed by name_id are ordered by address, not alphabetically.
#pragma once

#include "b_memory.h"

#include <cstdint>
#include <cstring>
#include <mutex>
#include <string_view>

namespace base {

struct NameRecord {
    string text;
    // Zero at creation; a binary writer may keep a string-table id here.
    std::uint32_t word = 0;
};

class name_id {
public:
    constexpr name_id() noexcept = default;
    constexpr explicit name_id(const NameRecord* record) noexcept : m_record(record) {}
    // Interns the text through the name server.
    explicit name_id(std::string_view text);
    explicit name_id(const char* text) : name_id(std::string_view(text ? text : "")) {}

    const NameRecord* record() const noexcept { return m_record; }
    // The text; "" for the null name.
    const char* c_str() const noexcept { return m_record ? m_record->text.c_str() : ""; }
    std::string_view view() const noexcept {
        return m_record ? std::string_view(m_record->text) : std::string_view();
    }
    std::size_t size() const noexcept { return m_record ? m_record->text.size() : 0; }
    bool empty() const noexcept { return !m_record || m_record->text.empty(); }
    explicit operator bool() const noexcept { return m_record != nullptr; }

    friend constexpr bool operator==(name_id a, name_id b) noexcept {
        return a.m_record == b.m_record;
    }
    friend constexpr auto operator<=>(name_id a, name_id b) noexcept {
        return a.m_record <=> b.m_record;
    }

private:
    const NameRecord* m_record = nullptr;
};

class NameServer : NonCopyable {
public:
    struct pchar_compare {
        bool operator()(const char* a, const char* b) const noexcept {
            return std::strcmp(a, b) < 0;
        }
    };

    // Finds the record of the text or creates it. Safe to call from any thread.
    name_id intern(std::string_view text);
    // The record of the text, or the null name when it was never interned.
    name_id find(std::string_view text) const;
    std::size_t size() const;

    ~NameServer();

private:
    // Keys point at the records' own texts, so they live as long as the records.
    map<const char*, name_id, pchar_compare> m_names;
    mutable std::mutex m_mutex;
};

NameServer& nameServer();

inline name_id::name_id(std::string_view text) : m_record(nameServer().intern(text).m_record) {}

} // namespace base

template <>
struct std::hash<base::name_id> {
    std::size_t operator()(base::name_id n) const noexcept {
        return std::hash<const void*>()(n.record());
    }
};

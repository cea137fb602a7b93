// Attributes that refer to other plug-in objects ("plugin" and "plugin[]").
//
// A reference is a strong ref<IPlugin>. Stored forms carry instance ids
// instead: the binary form of a PluginAttribute is its flags byte and a 32-bit
// id (invalidPluginId for no object); a PluginVectorAttribute writes its flags
// byte, the id count and the ids. Reading keeps the ids as pending and leaves
// the references empty until PluginFactory::restoreReferences points them at
// the factory's objects. Writing uses the referenced object's id, or the
// pending id of an empty reference.
//
// Text form: the object's display name (type name when it has no "name"), its
// id in decimal when even that is empty, and "null" for no object; a vector
// separates its items by one blank. fromString takes a decimal id or an object
// name ("null" clears the reference) and looks it up in a factory: the one
// given, else the factory of the object currently referenced. Without any
// factory a decimal id is kept as pending and a name fails. Text that starts
// with a digit must be a whole unsigned 32-bit number.
#pragma once

#include "b_attribute.h"
#include "b_factory.h"
#include "b_plugin.h"

#include <cstdint>
#include <cstring>
#include <string_view>

namespace base {

class PluginFactory;

// The value operations of a plug-in reference: ordered by address, stored as
// the object's instance id.
template <>
struct ValueOps<ref<IPlugin>> {
    using T = ref<IPlugin>;
    static constexpr std::uint32_t itemSize = TypeTraits<T>::itemSize;
    static constexpr bool rawWrite = false;
    static constexpr bool rawRead = false;

    static std::uint32_t idOf(const T& v) noexcept { return v ? v->instanceId() : invalidPluginId; }
    static int compare(const T& a, const T& b) noexcept {
        const auto c = static_cast<const void*>(a.get()) <=> static_cast<const void*>(b.get());
        return c < 0 ? -1 : c > 0 ? 1 : 0;
    }
    static std::uint32_t binarySize(const T&) noexcept { return itemSize; }
    static void pack(const T& v, unsigned char* out) noexcept {
        const std::uint64_t id = idOf(v);
        std::memcpy(out, &id, sizeof(id));
    }
    // An id alone cannot be turned back into an object here.
    static void unpack(const unsigned char*, T& v) noexcept { v.reset(); }
    static bool write(Stream& stream, const T& v) {
        unsigned char bytes[itemSize];
        pack(v, bytes);
        return stream.writeAll(bytes, itemSize);
    }
    static bool read(Stream& stream, T& v) {
        unsigned char bytes[itemSize];
        if (!stream.readAll(bytes, itemSize))
            return false;
        unpack(bytes, v);
        return true;
    }
    static void hash(Murmur3x86_128& hasher, const T& v) noexcept {
        const std::uint32_t id = idOf(v);
        hasher.update(&id, sizeof(id));
    }
    static void appendText(string& out, const T& v);
    static bool fromText(std::string_view, T&) { return false; }
    static const char* scanText(const char*&, const char*, T&) noexcept {
        return "Can't convert string to plugin reference!";
    }
};

extern template class TypedAttribute<ref<IPlugin>>;
extern template class TypedVectorAttribute<ref<IPlugin>>;

class PluginAttribute : public TypedAttribute<ref<IPlugin>> {
public:
    PluginAttribute() = default;
    explicit PluginAttribute(ref<IPlugin> value) : TypedAttribute(std::move(value)) {}

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    Attribute* clone() const override;
    // Structured form: the object's name, its id, or null (b_json.h).
    bool write(DataWriter& writer, std::uint32_t index = wholeValue) const override;
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    // A reference the reader's resolver cannot reach is left empty with the id
    // pending, as by the binary form.
    bool read(DataReader& reader, std::uint32_t index = wholeValue) override;
    // Leaves the reference empty with the id pending.
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    std::uint32_t binarySize() const override { return 4; }
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    bool fromString(std::string_view text) override;
    bool fromString(std::string_view text, PluginFactory* factory);
    void setData(const void* value, std::uint32_t index = wholeValue) override;

    void setValue(ref<IPlugin> value);
    // The referenced object's id, else the pending id (invalidPluginId: none).
    std::uint32_t id() const noexcept;
    // Set by stored forms; cleared when a value is set.
    std::uint32_t pendingId() const noexcept { return m_id; }
    void setPendingId(std::uint32_t id) noexcept { m_id = id; }

protected:
    std::uint32_t m_id = invalidPluginId;
};

class PluginVectorAttribute : public TypedVectorAttribute<ref<IPlugin>> {
public:
    PluginVectorAttribute() { m_flags |= flagPluginVector; }
    explicit PluginVectorAttribute(vector_type items) : TypedVectorAttribute(std::move(items)) {
        m_flags |= flagPluginVector;
    }

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    Attribute* clone() const override;
    bool write(DataWriter& writer, std::uint32_t index = wholeValue) const override;
    // wholeValue: id count and ids; an index: that item's id.
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    bool read(DataReader& reader, std::uint32_t index = wholeValue) override;
    // Leaves the read items empty with their ids pending.
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    bool removeItem(std::uint32_t index) override;
    std::uint32_t binarySize() const override { return 4 + 4 * size(); }
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    // Blank-separated ids or names.
    bool fromString(std::string_view text) override;
    bool fromString(std::string_view text, PluginFactory* factory);
    void setData(const void* value, std::uint32_t index = wholeValue) override;

    // Item i's object id, else its pending id.
    std::uint32_t id(std::uint32_t index) const noexcept;
    // Pending ids by item (may be shorter than the items).
    const vector<std::uint32_t>& pendingIds() const noexcept { return m_ids; }
    vector<std::uint32_t>& pendingIds() noexcept { return m_ids; }

protected:
    vector<std::uint32_t> m_ids;
};

// Adds the "plugin" and "plugin[]" creators to an attribute factory.
void registerPluginAttributeTypes(AttribFactory& factory);

} // namespace base

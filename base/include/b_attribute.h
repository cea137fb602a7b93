// Attribute values: the polymorphic holder every object state is made of.
//
// Attribute is the base of single values (TypedAttribute<T>), arrays
// (TypedVectorAttribute<T>) and the containers (maps, arrays of attributes and
// links). Each carries a flags word, a reader-writer spin lock and the head of a
// list of watch nodes: non-owning pointers to it held by inheriting maps and
// link paths, which the destructor nulls so that a watcher never dereferences a
// dead attribute.
//
// Item indices: wholeValue (0xFFFFFFFF) means the whole value; single values
// ignore the index; arrays address one item with it.
//
// Binary form: one byte with the low 8 flag bits, then the value: a single value
// as its binarySize() bytes of little-endian memory (bool one byte, mat43 its
// matrix then its translation, 60 bytes, a string a 32-bit length and the bytes),
// an array as a 32-bit item count and the items in the same form. A read that
// fails leaves the attribute unchanged: strict streams throw the stream's
// message, others answer false. Array counts and string lengths are checked
// against the bytes left when the stream knows its size, and read in bounded
// chunks otherwise, so a corrupt count never allocates more than the data that
// actually arrives; strings over 256 MB are refused.
//
// Text form: see b_string_convert.h; array items are separated by one blank
// ("1,2,3 4,5,6"). String arrays have no text form to read back.
//
// The structured (JSON) form plugs in through write(DataWriter&) and
// read(DataReader&); the base class answers those with unsupported_interface,
// the value classes delegate to ValueJson<T> (b_data_io.h).
#pragma once

#include "b_data_io.h"
#include "b_exception.h"
#include "b_lock.h"
#include "b_memory.h"
#include "b_murmur3.h"
#include "b_name.h"
#include "b_string_convert.h"
#include "b_type_traits.h"
#include "stream/b_stream.h"

#include <algorithm>
#include <bit>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string_view>
#include <type_traits>
#include <utility>

namespace base {

static_assert(std::endian::native == std::endian::little,
              "the binary attribute form is the little-endian memory of the values");

class Attribute;
class AttribLink;
class AttribArray;
class AttribMap;
class DataWriter;
class DataReader;

inline constexpr std::uint32_t wholeValue = 0xFFFFFFFFu;

// A non-owning pointer to an attribute that the attribute nulls when it dies.
// The node belongs to 'owner' (a map or a link path record) and sits in the
// watched attribute's list while 'watched' is set.
struct WatchNode {
    void* owner = nullptr;
    Attribute* watched = nullptr;
    WatchNode* next = nullptr;
};

class Attribute : public AllocObject<StdAllocPolicy>, NonCopyable {
public:
    // Flag bits the core interprets; the others travel untouched (clone keeps all
    // 32, the binary form the low 8).
    static constexpr std::uint32_t flagNoWatch = 1u << 0;       // takes no watch nodes
    static constexpr std::uint32_t flagSilentLink = 1u << 7;    // unresolved link is absent
    static constexpr std::uint32_t flagPluginBit10 = 1u << 10;  // set by setFlagBit10
    static constexpr std::uint32_t flagPluginVector = 1u << 28; // every PluginVectorAttribute
    static constexpr std::uint32_t flagMarked = 1u << 30;       // reported by isMarked
    static constexpr std::uint32_t flagTransient = 1u << 31;    // left out of stored forms

    // Nulls the watched pointer of every watch node, under the write lock.
    virtual ~Attribute();

    virtual name_id typeName() const = 0;
    virtual AttribLink* asLink() { return nullptr; }
    virtual AttribArray* asArray() { return nullptr; }
    virtual AttribMap* asMap() { return nullptr; }
    // A new attribute of the same class, value and whole flags word.
    virtual Attribute* clone() const = 0;
    // Code of the stored scalar (b_type_traits.h); containers answer -1.
    virtual std::int8_t componentType() const = 0;
    // Structured form; the attribute classes that support it override these.
    virtual bool write(DataWriter& writer, std::uint32_t index = wholeValue) const;
    // Writes the low flags byte.
    virtual bool write(Stream& stream, std::uint32_t index = wholeValue) const;
    virtual bool read(DataReader& reader, std::uint32_t index = wholeValue);
    // Reads the flags byte into the low 8 flag bits.
    virtual bool read(Stream& stream, std::uint32_t index = wholeValue);
    // The stored value (arrays: the item, or the vector object for wholeValue).
    virtual void* data(std::uint32_t index = wholeValue) = 0;
    virtual std::uint32_t size() const { return 1; }
    virtual bool removeItem(std::uint32_t) { return false; }
    // Bytes of the value in the binary form, without the flags byte.
    virtual std::uint32_t binarySize() const = 0;
    // Copies the value of an attribute of the same type when mode bit 0 is set;
    // false (and nothing changed) otherwise.
    virtual bool copyFrom(const Attribute& source, std::uint32_t mode,
                          std::uint32_t index = wholeValue) = 0;
    virtual string toString() const { return {}; }
    // False (value unchanged) when the text does not hold a value of the type.
    virtual bool fromString(std::string_view) { return false; }
    virtual bool isMarked() const { return (m_flags & flagMarked) != 0; }
    // Copies from a value of the stored type (arrays: an item, or the whole
    // vector for wholeValue).
    virtual void setData(const void* value, std::uint32_t index = wholeValue) = 0;
    // -1, 0 or 1: the stored value against the one at 'value'.
    virtual int compare(const void* value, std::uint32_t index = wholeValue) const = 0;
    virtual std::uint64_t hash() const { return 0; }

    const void* data(std::uint32_t index = wholeValue) const {
        return const_cast<Attribute*>(this)->data(index);
    }

    std::uint32_t flags() const noexcept { return m_flags; }
    void setFlags(std::uint32_t flags) noexcept { m_flags = flags; }
    void setFlag(std::uint32_t bits, bool on = true) noexcept {
        m_flags = on ? m_flags | bits : m_flags & ~bits;
    }
    bool hasFlag(std::uint32_t bits) const noexcept { return (m_flags & bits) != 0; }

    // Links 'node' into the watch list and points it here, under the write lock.
    // Refused (false, node untouched) when the attribute has flagNoWatch.
    bool addWatch(WatchNode& node);
    // Unlinks 'node' if it is in the list and clears its pointers; answers
    // whether it was found. Takes the write lock.
    bool removeWatch(WatchNode& node);
    // First watch node; read it under the lock.
    WatchNode* watchList() const noexcept { return m_watch; }
    // The reader-writer spin lock (b_lock.h): readers are lookups crossing this
    // attribute, writers change its watch list.
    LockWord& lockWord() const noexcept { return m_lock; }

protected:
    Attribute() = default;

    // Reads the flags byte without applying it, so that a failed value read can
    // leave the whole attribute unchanged.
    static bool readFlagsByte(Stream& stream, std::uint8_t& byte) {
        return stream.readAll(&byte, 1);
    }
    void applyFlagsByte(std::uint8_t byte) noexcept { m_flags = (m_flags & ~0xFFu) | byte; }

    WatchNode* m_watch = nullptr;
    std::uint32_t m_flags = 0;
    mutable LockWord m_lock{0};
};

// One bool of an array. std::vector<bool> packs bits and has no item addresses,
// which data(index) must answer; this is one byte that converts both ways.
struct BoolItem {
    bool value = false;
    constexpr BoolItem() noexcept = default;
    constexpr BoolItem(bool v) noexcept : value(v) {}
    constexpr operator bool() const noexcept { return value; }
};
static_assert(sizeof(BoolItem) == sizeof(bool) && std::is_trivially_copyable_v<BoolItem>);

template <class T>
using ArrayItem = std::conditional_t<std::is_same_v<T, bool>, BoolItem, T>;
// The vector held by TypedVectorAttribute<T>: data(wholeValue) points to one.
template <class T>
using ArrayOf = vector<ArrayItem<T>>;

namespace attr_detail {

// The stream's bytes after its position, when it knows its size.
std::optional<std::uint64_t> bytesLeft(Stream& stream);
// A read that cannot be satisfied: throws the stream message on a strict stream.
bool shortRead(Stream& stream, std::uint64_t requested, std::uint64_t available);
// Checks a string length read from a stream (256 MB at most).
void checkStringLength(std::uint32_t length);
// Reads 'bytes' into a string in bounded steps.
bool readStringBytes(Stream& stream, std::uint32_t bytes, string& out);

// Bytes per step of a read whose size the stream cannot vouch for.
inline constexpr std::uint64_t chunkBytes = 64 * 1024;

template <class T>
constexpr T& itemValue(ArrayItem<T>& item) noexcept {
    if constexpr (std::is_same_v<T, bool>)
        return item.value;
    else
        return item;
}
template <class T>
constexpr const T& itemValue(const ArrayItem<T>& item) noexcept {
    if constexpr (std::is_same_v<T, bool>)
        return item.value;
    else
        return item;
}

} // namespace attr_detail

// Per-type operations of the value classes. The generic form covers the whole
// vocabulary of b_type_traits.h; reference types specialise it.
template <class T>
struct ValueOps {
    // Bytes of one value in the binary form; 0 when variable (strings).
    static constexpr std::uint32_t itemSize = TypeTraits<T>::itemSize;
    // The binary form is the memory of the value, so arrays move as one block.
    // Reading a bool byte goes through a conversion: a byte other than 0 or 1 is
    // no valid bool.
    static constexpr bool rawWrite =
        itemSize == sizeof(T) && std::is_trivially_copyable_v<T> && !std::is_same_v<T, string>;
    static constexpr bool rawRead = rawWrite && !std::is_same_v<T, bool>;

    static int compare(const T& a, const T& b) noexcept {
        if constexpr (std::is_same_v<T, string>) {
            const int r = a.compare(b);
            return r < 0 ? -1 : r > 0 ? 1 : 0;
        } else if constexpr (CompoundValue<T>) {
            int r = 0;
            ValueFields<T>::apply(a, [&](const auto&... x) {
                ValueFields<T>::apply(b,
                                      [&](const auto&... y) { (void)((r = less(x, y)) || ...); });
            });
            return r;
        } else {
            return less(a, b);
        }
    }

    static std::uint32_t binarySize(const T& v) noexcept {
        if constexpr (std::is_same_v<T, string>)
            return 4 + std::uint32_t(v.size());
        else
            return itemSize;
    }

    // Fixed-size values: the binary form to / from 'itemSize' bytes.
    static void pack(const T& v, unsigned char* out) noexcept {
        if constexpr (CompoundValue<T> && !rawWrite) {
            ValueFields<T>::apply(v, [&](const auto&... c) {
                ((std::memcpy(out, &c, sizeof(c)), out += sizeof(c)), ...);
            });
        } else if constexpr (std::is_same_v<T, TimeCode>) {
            const std::int64_t ticks = v.ticks();
            std::memcpy(out, &ticks, 8);
        } else {
            std::memcpy(out, &v, sizeof(T));
        }
    }
    static void unpack(const unsigned char* in, T& v) noexcept {
        if constexpr (std::is_same_v<T, bool>) {
            v = *in != 0;
        } else if constexpr (CompoundValue<T> && !rawRead) {
            ValueFields<T>::apply(
                v, [&](auto&... c) { ((std::memcpy(&c, in, sizeof(c)), in += sizeof(c)), ...); });
        } else if constexpr (std::is_same_v<T, TimeCode>) {
            std::int64_t ticks;
            std::memcpy(&ticks, in, 8);
            v = TimeCode(ticks);
        } else {
            std::memcpy(&v, in, sizeof(T));
        }
    }

    static bool write(Stream& stream, const T& v) {
        if constexpr (std::is_same_v<T, string>) {
            const auto length = std::uint32_t(v.size());
            return stream.writeValue(length) && stream.writeAll(v.data(), length);
        } else {
            unsigned char bytes[itemSize];
            pack(v, bytes);
            return stream.writeAll(bytes, itemSize);
        }
    }
    // Leaves 'v' unchanged when the read fails.
    static bool read(Stream& stream, T& v) {
        if constexpr (std::is_same_v<T, string>) {
            std::uint32_t length;
            if (!stream.readValue(length))
                return false;
            attr_detail::checkStringLength(length);
            return attr_detail::readStringBytes(stream, length, v);
        } else {
            unsigned char bytes[itemSize];
            if (!stream.readAll(bytes, itemSize))
                return false;
            unpack(bytes, v);
            return true;
        }
    }

    // Feeds the binary form (without a count) to the hash.
    static void hash(Murmur3x86_128& hasher, const T& v) noexcept {
        if constexpr (std::is_same_v<T, string>) {
            const auto length = std::uint32_t(v.size());
            hasher.update(&length, 4);
            hasher.update(v.data(), v.size());
        } else {
            unsigned char bytes[itemSize];
            pack(v, bytes);
            hasher.update(bytes, itemSize);
        }
    }

    static void appendText(string& out, const T& v) { appendValue(out, v); }
    static bool fromText(std::string_view text, T& v) { return valueFromString(text, v); }
    // One value of a blank-separated list; nullptr on success.
    static const char* scanText(const char*& cursor, const char* end, T& v) noexcept {
        if constexpr (std::is_same_v<T, string>)
            return "";
        else
            return scanValue(cursor, end, 0, v);
    }

private:
    template <class C>
    static int less(const C& a, const C& b) noexcept {
        return a < b ? -1 : b < a ? 1 : 0;
    }
};

// One value of type T stored inline.
template <class T>
class TypedAttribute : public Attribute {
public:
    using value_type = T;
    using Ops = ValueOps<T>;

    TypedAttribute() = default;
    explicit TypedAttribute(const T& value) : m_value(value) {}

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    name_id typeName() const override { return TypeTraits<T>::n_name; }
    Attribute* clone() const override;
    std::int8_t componentType() const override { return TypeTraits<T>::componentType; }
    bool write(DataWriter& writer, std::uint32_t = wholeValue) const override {
        return ValueJson<T>::write(writer, m_value);
    }
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    bool read(DataReader& reader, std::uint32_t = wholeValue) override {
        return ValueJson<T>::read(reader, m_value);
    }
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    void* data(std::uint32_t = wholeValue) override { return &m_value; }
    std::uint32_t binarySize() const override { return Ops::binarySize(m_value); }
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    string toString() const override;
    bool fromString(std::string_view text) override { return Ops::fromText(text, m_value); }
    void setData(const void* value, std::uint32_t = wholeValue) override {
        m_value = *static_cast<const T*>(value);
    }
    int compare(const void* value, std::uint32_t = wholeValue) const override {
        return Ops::compare(m_value, *static_cast<const T*>(value));
    }

    const T& value() const noexcept { return m_value; }
    T& value() noexcept { return m_value; }
    void setValue(const T& value) { m_value = value; }

protected:
    T m_value{};
};

// A growable array of T.
template <class T>
class TypedVectorAttribute : public Attribute {
public:
    using value_type = T;
    using item_type = ArrayItem<T>;
    using vector_type = ArrayOf<T>;
    using Ops = ValueOps<T>;

    TypedVectorAttribute() = default;
    explicit TypedVectorAttribute(vector_type items) : m_items(std::move(items)) {}

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    name_id typeName() const override { return TypeTraits<T>::n_array_name; }
    Attribute* clone() const override;
    std::int8_t componentType() const override { return TypeTraits<T>::componentType; }
    bool write(DataWriter& writer, std::uint32_t index = wholeValue) const override {
        return ValueJson<T>::writeItems(writer, *this, index);
    }
    bool read(DataReader& reader, std::uint32_t index = wholeValue) override {
        return ValueJson<T>::readItems(reader, *this, index);
    }
    // wholeValue: count and items; an index: that item alone (false when absent).
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    // Null for an index at or past the count.
    void* data(std::uint32_t index = wholeValue) override;
    std::uint32_t size() const override { return std::uint32_t(m_items.size()); }
    bool removeItem(std::uint32_t index) override;
    std::uint32_t binarySize() const override;
    // wholeValue copies the vector; an index copies that item of the source into
    // the same item here (false when either lacks it).
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    string toString() const override;
    bool fromString(std::string_view text) override;
    // An index past the last item throws invalid_argument.
    void setData(const void* value, std::uint32_t index = wholeValue) override;
    // Whole arrays: the count decides first, then the first differing item. An
    // item index past the last item compares as less (-1).
    int compare(const void* value, std::uint32_t index = wholeValue) const override;
    // First 64 bits of MurmurHash3 x86-128 (seed 0) over the items' binary form.
    std::uint64_t hash() const override;

    const vector_type& items() const noexcept { return m_items; }
    vector_type& items() noexcept { return m_items; }

protected:
    vector_type m_items;
};

namespace attr_detail {

template <class T>
bool writeItems(Stream& stream, const ArrayItem<T>* items, std::size_t count) {
    using Ops = ValueOps<T>;
    if constexpr (Ops::rawWrite) {
        return stream.writeAll(items, std::uint64_t(count) * sizeof(T));
    } else if constexpr (Ops::itemSize == 0) {
        for (std::size_t i = 0; i < count; ++i)
            if (!Ops::write(stream, itemValue<T>(items[i])))
                return false;
        return true;
    } else {
        unsigned char buffer[4096];
        constexpr std::size_t perStep = sizeof(buffer) / Ops::itemSize;
        while (count) {
            const std::size_t n = std::min(count, perStep);
            for (std::size_t i = 0; i < n; ++i)
                Ops::pack(itemValue<T>(items[i]), buffer + i * Ops::itemSize);
            if (!stream.writeAll(buffer, n * Ops::itemSize))
                return false;
            items += n;
            count -= n;
        }
        return true;
    }
}

// Fixed-size items into storage that already holds 'count' items.
template <class T>
bool readFixedItems(Stream& stream, ArrayItem<T>* items, std::size_t count) {
    using Ops = ValueOps<T>;
    if constexpr (Ops::rawRead) {
        return stream.readAll(items, std::uint64_t(count) * sizeof(T));
    } else {
        unsigned char buffer[4096];
        constexpr std::size_t perStep = sizeof(buffer) / Ops::itemSize;
        while (count) {
            const std::size_t n = std::min(count, perStep);
            if (!stream.readAll(buffer, n * Ops::itemSize))
                return false;
            for (std::size_t i = 0; i < n; ++i)
                Ops::unpack(buffer + i * Ops::itemSize, itemValue<T>(items[i]));
            items += n;
            count -= n;
        }
        return true;
    }
}

// 'count' items into 'out' (replaced). Never allocates for more items than the
// stream holds (known size) or than have arrived so far (unknown size).
template <class T>
bool readItems(Stream& stream, std::uint32_t count, ArrayOf<T>& out) {
    using Ops = ValueOps<T>;
    const std::optional<std::uint64_t> left = bytesLeft(stream);
    // Every item takes at least its size (a string at least its length word).
    const std::uint64_t leastBytes = std::uint64_t(count) * (Ops::itemSize ? Ops::itemSize : 4);
    if (left && leastBytes > *left)
        return shortRead(stream, leastBytes, *left);
    out.clear();
    if constexpr (Ops::itemSize == 0) {
        for (std::uint32_t i = 0; i < count; ++i) {
            T item{};
            if (!Ops::read(stream, item))
                return false;
            out.push_back(std::move(item));
        }
        return true;
    } else {
        const std::size_t perStep =
            left ? count : std::max<std::size_t>(1, chunkBytes / Ops::itemSize);
        for (std::size_t done = 0; done < count;) {
            const std::size_t n = std::min<std::size_t>(count - done, perStep);
            out.resize(done + n);
            if (!readFixedItems<T>(stream, out.data() + done, n))
                return false;
            done += n;
        }
        return true;
    }
}

} // namespace attr_detail

// ---- TypedAttribute ---------------------------------------------------------

template <class T>
Attribute* TypedAttribute<T>::clone() const {
    auto* copy = new TypedAttribute<T>(m_value);
    copy->m_flags = m_flags;
    return copy;
}

template <class T>
bool TypedAttribute<T>::write(Stream& stream, std::uint32_t index) const {
    return Attribute::write(stream, index) && Ops::write(stream, m_value);
}

template <class T>
bool TypedAttribute<T>::read(Stream& stream, std::uint32_t) {
    std::uint8_t flagsByte;
    T value = m_value;
    if (!readFlagsByte(stream, flagsByte) || !Ops::read(stream, value))
        return false;
    m_value = std::move(value);
    applyFlagsByte(flagsByte);
    return true;
}

template <class T>
bool TypedAttribute<T>::copyFrom(const Attribute& source, std::uint32_t mode, std::uint32_t) {
    if (!(mode & 1) || source.typeName() != typeName())
        return false;
    m_value = *static_cast<const T*>(source.data(wholeValue));
    return true;
}

template <class T>
string TypedAttribute<T>::toString() const {
    string out;
    Ops::appendText(out, m_value);
    return out;
}

// ---- TypedVectorAttribute ---------------------------------------------------

template <class T>
Attribute* TypedVectorAttribute<T>::clone() const {
    auto* copy = new TypedVectorAttribute<T>(m_items);
    copy->m_flags = m_flags;
    return copy;
}

template <class T>
bool TypedVectorAttribute<T>::write(Stream& stream, std::uint32_t index) const {
    if (index != wholeValue) {
        return index < m_items.size() && Attribute::write(stream, index) &&
               Ops::write(stream, attr_detail::itemValue<T>(m_items[index]));
    }
    const auto count = std::uint32_t(m_items.size());
    return Attribute::write(stream, index) && stream.writeValue(count) &&
           attr_detail::writeItems<T>(stream, m_items.data(), count);
}

template <class T>
bool TypedVectorAttribute<T>::read(Stream& stream, std::uint32_t index) {
    std::uint8_t flagsByte;
    if (index != wholeValue) {
        if (index >= m_items.size())
            return false;
        T item = attr_detail::itemValue<T>(m_items[index]);
        if (!readFlagsByte(stream, flagsByte) || !Ops::read(stream, item))
            return false;
        attr_detail::itemValue<T>(m_items[index]) = std::move(item);
    } else {
        std::uint32_t count;
        vector_type items;
        if (!readFlagsByte(stream, flagsByte) || !stream.readValue(count) ||
            !attr_detail::readItems<T>(stream, count, items))
            return false;
        m_items.swap(items);
    }
    applyFlagsByte(flagsByte);
    return true;
}

template <class T>
void* TypedVectorAttribute<T>::data(std::uint32_t index) {
    if (index == wholeValue)
        return &m_items;
    return index < m_items.size() ? &attr_detail::itemValue<T>(m_items[index]) : nullptr;
}

template <class T>
bool TypedVectorAttribute<T>::removeItem(std::uint32_t index) {
    if (index >= m_items.size())
        return false;
    m_items.erase(m_items.begin() + index);
    return true;
}

template <class T>
std::uint32_t TypedVectorAttribute<T>::binarySize() const {
    std::uint64_t bytes = 4;
    if constexpr (Ops::itemSize == 0) {
        for (const auto& item : m_items)
            bytes += Ops::binarySize(attr_detail::itemValue<T>(item));
    } else {
        bytes += std::uint64_t(m_items.size()) * Ops::itemSize;
    }
    return std::uint32_t(bytes);
}

template <class T>
bool TypedVectorAttribute<T>::copyFrom(const Attribute& source, std::uint32_t mode,
                                       std::uint32_t index) {
    if (!(mode & 1) || source.typeName() != typeName())
        return false;
    if (index == wholeValue) {
        m_items = *static_cast<const vector_type*>(source.data(wholeValue));
        return true;
    }
    const void* item = source.data(index);
    if (!item || index >= m_items.size())
        return false;
    attr_detail::itemValue<T>(m_items[index]) = *static_cast<const T*>(item);
    return true;
}

template <class T>
string TypedVectorAttribute<T>::toString() const {
    string out;
    for (std::size_t i = 0; i < m_items.size(); ++i) {
        if (i)
            out += ' ';
        Ops::appendText(out, attr_detail::itemValue<T>(m_items[i]));
    }
    return out;
}

template <class T>
bool TypedVectorAttribute<T>::fromString(std::string_view text) {
    if constexpr (Ops::itemSize == 0) {
        return false; // blank-separated texts cannot be told apart from their blanks
    } else {
        vector_type items;
        const char* p = text.data();
        const char* end = p + text.size();
        while ((p = convert_detail::skipBlanks(p, end)) != end) {
            T item{};
            if (Ops::scanText(p, end, item))
                return false;
            items.push_back(item);
        }
        m_items.swap(items);
        return true;
    }
}

template <class T>
void TypedVectorAttribute<T>::setData(const void* value, std::uint32_t index) {
    if (index == wholeValue) {
        m_items = *static_cast<const vector_type*>(value);
        return;
    }
    if (index >= m_items.size())
        BASE_THROW(invalid_argument, "Item index {} is out of range, the array has {} items.",
                   index, m_items.size());
    attr_detail::itemValue<T>(m_items[index]) = *static_cast<const T*>(value);
}

template <class T>
int TypedVectorAttribute<T>::compare(const void* value, std::uint32_t index) const {
    if (index != wholeValue) {
        if (index >= m_items.size())
            return -1;
        return Ops::compare(attr_detail::itemValue<T>(m_items[index]),
                            *static_cast<const T*>(value));
    }
    const auto& other = *static_cast<const vector_type*>(value);
    if (m_items.size() != other.size())
        return m_items.size() < other.size() ? -1 : 1;
    for (std::size_t i = 0; i < m_items.size(); ++i)
        if (int r = Ops::compare(attr_detail::itemValue<T>(m_items[i]),
                                 attr_detail::itemValue<T>(other[i])))
            return r;
    return 0;
}

template <class T>
std::uint64_t TypedVectorAttribute<T>::hash() const {
    Murmur3x86_128 hasher;
    if constexpr (Ops::rawWrite) {
        hasher.update(m_items.data(), m_items.size() * sizeof(T));
    } else {
        for (const auto& item : m_items)
            Ops::hash(hasher, attr_detail::itemValue<T>(item));
    }
    return hasher.finish64();
}

// Compiled once, in base1.
#define BASE_EXTERN_ATTRIBUTES(T, label, code)                                                     \
    extern template class TypedAttribute<T>;                                                       \
    extern template class TypedVectorAttribute<T>;
BASE_VALUE_TYPES(BASE_EXTERN_ATTRIBUTES)
#undef BASE_EXTERN_ATTRIBUTES

} // namespace base

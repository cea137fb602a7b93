// Structured serialization: the abstract writer and reader that attributes
// serialize themselves through (Attribute::write(DataWriter&) and
// read(DataReader&)), the resolvers that let references to plug-in objects
// travel by name, and the progress interface that long writes report to.
//
// A writer or reader lives for one document. The JSON implementations are in
// b_json.h; attribute classes know only these interfaces.
//
// References: an attribute that refers to a plug-in object asks the writer's
// resolver for the object's name and writes the name when there is one, the
// instance id otherwise. Reading asks the reader's resolver for the id of a
// name. The default resolvers know no names, so references travel as ids.
#pragma once

#include "b_memory.h"

#include <cstdint>
#include <functional>
#include <string_view>

namespace base {

class DataReader;
class IPlugin;
class PluginFactory;
template <class T>
class TypedVectorAttribute;

// Receives the progress of long operations (the host draws a progress bar).
class IProgress {
public:
    virtual ~IProgress() = default;
    // 'percent' is 0..100 and never decreases during one operation.
    virtual void progress(const char* text, int percent) = 0;
};

namespace data_io_detail {

// Hashes stored strings and looked-up views alike.
struct TextHash {
    using is_transparent = void;
    std::size_t operator()(std::string_view text) const noexcept {
        return std::hash<std::string_view>()(text);
    }
};

// Name -> id where the first insertion of a name wins: one block of text and
// one open-addressed slot table, so a large factory costs two allocations
// that grow, not one per name.
class NameIndex {
public:
    static constexpr std::uint32_t none = 0xFFFFFFFFu;
    // False (and nothing changed) when the name is there already.
    bool insert(std::string_view name, std::uint32_t id);
    // The id of the name, or none.
    std::uint32_t find(std::string_view name) const noexcept;

private:
    struct Slot {
        std::size_t hash;
        std::size_t offset;
        std::uint32_t length;
        std::uint32_t id; // none: free
    };
    std::size_t probe(std::string_view name, std::size_t hash) const noexcept;

    vector<char> m_text;
    vector<Slot> m_slots;
    std::size_t m_count = 0;
};

} // namespace data_io_detail

// Object id to name. The default knows no names.
class DataWriterResolveStringId {
public:
    virtual ~DataWriterResolveStringId() = default;
    // The name the object is written under; empty writes the id. The text stays
    // valid while the objects it names are left unchanged.
    virtual std::string_view resolve(std::uint32_t id);
};

// Name to object id. The default knows no names.
class DataReaderResolveStringId {
public:
    static constexpr std::uint32_t noId = 0xFFFFFFFFu;
    // Ids from here up are never taken from a document: resolvers hand them out
    // as placeholders for names they learn later. No factory gets this large.
    static constexpr std::uint32_t firstReservedId = 0xF0000000u;

    virtual ~DataReaderResolveStringId() = default;
    // The id of the named object, or noId. 'reader' tells where the name was
    // read, for messages.
    virtual std::uint32_t resolve(std::string_view name, const DataReader& reader);
    // The object with the id when the resolver can reach objects; null leaves
    // the reference empty with the id pending (see b_plugin_attribute.h).
    virtual IPlugin* plugin(std::uint32_t id);
};

// Names of the objects of a factory. Only the first object (by id) that carries
// a name is written under it; the others are written by id, so that a reader
// never confuses two objects of the same name.
class PluginWriterResolveStringId : public DataWriterResolveStringId {
public:
    explicit PluginWriterResolveStringId(PluginFactory& factory) : m_factory(factory) {}
    std::string_view resolve(std::uint32_t id) override;

private:
    PluginFactory& m_factory;
};

// Ids of the objects of a factory by name (the first object carrying it).
//
// While a whole factory document is read (readFactory), objects may name
// objects that come later in the document. The resolver then answers a
// placeholder id (from firstReservedId up) for a name it does not know yet,
// and readFactory replaces the placeholders once every object is read; names
// that are still unknown then are reported as when read.
class PluginReaderResolveStringId : public DataReaderResolveStringId {
public:
    explicit PluginReaderResolveStringId(PluginFactory& factory) : m_factory(factory) {}

    std::uint32_t resolve(std::string_view name, const DataReader& reader) override;
    IPlugin* plugin(std::uint32_t id) override;

    // ---- used by readFactory ----
    // Placeholders for unknown names from now on.
    void deferUnknownNames();
    // Makes the object's name known (objects finished reading).
    void learn(IPlugin& plugin);
    // The id a placeholder stands for now: the named object's id, or noId after
    // the "Unable to find plugin with name" message. Other ids are answered
    // unchanged.
    std::uint32_t settle(std::uint32_t id);
    // Names that settle() could not find.
    std::size_t unknownNames() const noexcept { return m_unknown; }

private:
    // A name not known when it was read, kept with where it was read.
    struct Deferred {
        string name;
        string stream;
        std::uint32_t line = 0;
        std::uint32_t id = noId;
        bool settled = false;
    };
    PluginFactory& m_factory;
    data_io_detail::NameIndex m_names;
    data_io_detail::NameIndex m_pending; // name -> placeholder id
    vector<Deferred> m_deferred;         // by placeholder id - firstReservedId
    std::size_t m_unknown = 0;
    bool m_defer = false;
};

// Writes one document. Every operation answers true on success; false when the
// call does not fit the document's structure or the output failed.
class DataWriter : NonCopyable {
public:
    // Arrays opened with a hint of 1 to this value stay on one line.
    static constexpr std::uint32_t oneLineHint = 4;

    // Null: the default resolver (references by id). The resolver must outlive
    // the writer.
    explicit DataWriter(DataWriterResolveStringId* resolver = nullptr);
    virtual ~DataWriter() = default;

    virtual bool beginObject() = 0;
    virtual bool endObject() = 0;
    // 'hint' is the number of items that follow, and drives the layout: 1 to
    // oneLineHint keep the array on one line (compound values of more
    // components pass oneLineHint), more wrap, 0 means unknown.
    virtual bool beginArray(std::uint32_t hint) = 0;
    virtual bool endArray() = 0;
    virtual bool key(std::string_view text) = 0;
    virtual bool writeString(std::string_view text) = 0;
    virtual bool writeDouble(double value) = 0;
    virtual bool writeFloat(float value) = 0;
    virtual bool writeUInt64(std::uint64_t value) = 0;
    virtual bool writeInt64(std::int64_t value) = 0;
    virtual bool writeUInt32(std::uint32_t value) = 0;
    virtual bool writeInt32(std::int32_t value) = 0;
    virtual bool writeBool(bool value) = 0;
    // No output: the name of an object id through the resolver ("" for none).
    virtual std::string_view resolveStringId(std::uint32_t id);
    // A reference to no object.
    virtual bool writeNull() = 0;

    DataWriterResolveStringId& resolver() const noexcept { return *m_resolver; }

private:
    DataWriterResolveStringId* m_resolver;
};

// Reads one document. The reading operations answer false and consume nothing
// when the next token is not of the asked kind (or a number does not fit the
// asked type); syntax errors throw (JSONException for the JSON reader).
class DataReader : NonCopyable {
public:
    // Null: the default resolver. The resolver must outlive the reader.
    explicit DataReader(DataReaderResolveStringId* resolver = nullptr);
    virtual ~DataReader() = default;

    // For messages.
    virtual const char* streamName() const = 0;
    virtual bool beginObject() = 0;
    virtual bool endObject() = 0;
    virtual bool beginArray() = 0;
    virtual bool endArray() = 0;
    // A member name; the view stays valid until the next call on the reader.
    virtual bool key(std::string_view& text) = 0;
    virtual bool readString(string& text) = 0;
    virtual bool readDouble(double& value) = 0;
    // Integers only: a number with a fraction or an exponent, or out of the
    // type's range, answers false.
    virtual bool readInt64(std::int64_t& value) = 0;
    virtual bool readUInt64(std::uint64_t& value) = 0;
    virtual bool readBool(bool& value) = 0;
    // The id of a name through the resolver (noId when unknown).
    virtual std::uint32_t resolveStringId(std::string_view text);
    // The line of the next token, for messages.
    virtual std::uint32_t line() const = 0;
    // One whole value of any kind; false when no value follows.
    virtual bool skipValue() = 0;

    // A number as the nearest float (not through double, which could round
    // twice). The default reads a double.
    virtual bool readFloat(float& value);
    // A null value.
    virtual bool readNull() = 0;
    // Number of containers open around the position.
    virtual std::uint32_t depth() const = 0;
    // After a value that failed to read: skips whatever is left of it, so that
    // reading goes on after it. 'depth' is depth() from before the value.
    virtual void skipRest(std::uint32_t depth) = 0;

    DataReaderResolveStringId& resolver() const noexcept { return *m_resolver; }

private:
    DataReaderResolveStringId* m_resolver;
};

// The structured form of one value type, for the attribute vocabulary
// (b_type_traits.h) and plug-in references. Compound values (vectors,
// quaternions, boxes, matrices, colours) are one-line arrays of their
// components in storage order; TimeCode is its tick count; bool, numbers and
// strings are themselves. A read that fails leaves the value unchanged.
template <class T>
struct ValueJson {
    static bool write(DataWriter& writer, const T& value);
    static bool read(DataReader& reader, T& value);
    // The whole array (an array of items), or one item for an index; a read of
    // the whole array replaces every item and leaves the array unchanged when
    // it fails.
    static bool writeItems(DataWriter& writer, const TypedVectorAttribute<T>& attribute,
                           std::uint32_t index);
    static bool readItems(DataReader& reader, TypedVectorAttribute<T>& attribute,
                          std::uint32_t index);
};

} // namespace base

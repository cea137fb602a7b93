// Containers of attributes: maps, arrays and links.
//
// An AttribMap is the in-memory form of every object: a flat vector of
// (name, owned attribute) entries kept sorted by the address of the name record,
// so a lookup is a binary search over pointers and never allocates. A map may
// inherit missing entries from a base map; the base is held through a watch
// node, so inheritance silently stops when the base dies.
//
// An AttribArray is an ordered list of owned attributes (usually maps of one
// element class). An AttribLink holds an AttribPath: a walk from a plug-in
// through members, array items and components to another attribute. Reading an
// entry that holds a link reads the attribute at the end of the walk. Every step
// of the walk caches the attribute it reached in a SerializeRec, which is also a
// watch node in that attribute's list, so a dead target clears the cache and the
// next access walks again. Targets that take no watch nodes (flag bit 0) are
// never cached and are walked on every access. A chain of links that does not
// end within linkChainLimit hops (a cycle) is treated as unresolvable.
//
// Typed lookups (findAttribute<T>, findVecAttribute<T>) never throw for a missing
// or mismatched entry: a mismatch or a broken link logs a warning (system channel,
// level 3) and answers null. Empty or null names throw.
//
// Binary form of a map: flags byte, entry count (u32), then per entry the name
// and the type name (each a u32 length and the bytes), the byte count of the
// value (u32) and the value's own binary form. The byte count is exactly the
// number of bytes the value's write(Stream&) emits, its flags byte included, so a
// reader skips an entry of an unknown type by that count (and checks known types
// against it). Arrays use the same per-item layout without the name. A link
// writes its flags byte, the record count (u32) and per record its kind (u8), its
// index (u32; for the plug-in step the plug-in's instance id) and its member name
// (u32 length and bytes). Entries and items with flag bit 31 and links whose path
// starts at a plug-in with flag bit 31 are left out. Reading never trusts a count
// or a length further than the bytes the stream holds, refuses strings over
// 256 MB, and leaves the container unchanged when the data is corrupt.
//
// Concurrency: lookups take read locks only on the objects they cross (the base
// map while inheriting, the root plug-in while a path resolves); watch-list
// changes take the write lock of the watched attribute. A map is modified by one
// thread at a time and not read meanwhile.
#pragma once

#include "b_attribute.h"
#include "b_factory.h"
#include "b_lock.h"
#include "b_memory.h"
#include "b_name.h"
#include "b_type_traits.h"

#include <cstdint>
#include <functional>
#include <utility>

namespace base {

class AttribPath;

// The attribute name "name" (an object's own name), interned once.
name_id nameAttributeName();

// Adds the "map", "array" and "link" creators to an attribute factory.
void registerContainerTypes(AttribFactory& factory);

// Hops after which a chain of links counts as a cycle.
inline constexpr unsigned linkChainLimit = 64;

// One step of an AttribPath. The first three words are a WatchNode (owner,
// watched = the cached target, next), so the record sits in its target's watch
// list and the target's death nulls the cache.
struct SerializeRec : WatchNode {
    enum Kind : std::uint8_t { plugin = 0, member = 1, item = 2, component = 3 };

    name_id name;               // member steps
    std::uint32_t index = 0;    // item / component index; the instance id for plugin steps
    std::uint8_t kind = member; //
    bool linked = false;        // the record is in watched's list

    Attribute* target() const noexcept { return watched; }
};
static_assert(sizeof(SerializeRec) == 40);

// Maps a plug-in instance id to the name used in texts ("" when unknown).
using PathNameResolver = std::function<string(std::uint32_t id)>;

// A walk from a plug-in to an attribute. Copies take the root and the steps but
// no cached targets; they walk again on first use.
class AttribPath {
public:
    using Records = vector<SerializeRec>;

    AttribPath() = default;
    AttribPath(const AttribPath& other);
    AttribPath(AttribPath&& other) noexcept;
    AttribPath& operator=(const AttribPath& other);
    AttribPath& operator=(AttribPath&& other) noexcept;
    // Leaves every target's watch list.
    ~AttribPath();

    // Builders. The plug-in step comes first and only there; a component step
    // ends the path. Misplaced steps throw invalid_argument.
    AttribPath& addPlugin(AttribMap* plugin);
    // A plug-in step known only by its instance id (structured forms; see
    // setRoot).
    AttribPath& addPluginId(std::uint32_t id);
    AttribPath& addMember(name_id name);
    AttribPath& addItem(std::uint32_t index);
    AttribPath& addComponent(std::uint32_t index);
    // Drops every record.
    void clear();

    bool empty() const noexcept { return m_records.empty(); }
    std::size_t size() const noexcept { return m_records.size(); }
    const Records& records() const noexcept { return m_records; }
    const SerializeRec& operator[](std::size_t i) const noexcept { return m_records[i]; }

    // The plug-in the walk starts at (null when the path does not start at a
    // plug-in or the plug-in died), and its instance id as stored.
    AttribMap* root() const noexcept;
    std::uint32_t rootId() const noexcept;
    // Sets the plug-in of the first step (a reader restoring paths by id).
    void setRoot(AttribMap* plugin);
    // The component index of a final component step, or wholeValue.
    std::uint32_t component() const noexcept;
    // Sets the owner word of the last record (the link that owns the path).
    void setOwner(Attribute* owner) noexcept;
    // Forgets every cached target except the root.
    void invalidate() const;

    // The attribute at the end of the walk (before a final component step), or
    // null. Uses the cached targets; read-locks the root plug-in while walking.
    Attribute* resolve() const;

    // "Node.children[2].translate,1". Plug-in steps render as the resolver's
    // name for the id when one is given and knows it, else as the plug-in's
    // "name" string attribute.
    string toString(const PathNameResolver& resolver = {}) const;

    // Record by record: count, kind, root, name, index.
    int compare(const AttribPath& other) const;

    bool write(Stream& stream) const;
    // Replaces the records; the plug-in step keeps only its id (see setRoot).
    // False, path unchanged, on corrupt data.
    bool read(Stream& stream);

private:
    friend class AttribLink;
    void push(const SerializeRec& record);
    Attribute* resolveAt(std::size_t i) const;
    void cache(SerializeRec& record, Attribute* target) const;
    void detachAll() const;
    static void detach(SerializeRec& record);
    static void attach(SerializeRec& record, Attribute* target);

    // Cached targets change inside const lookups.
    mutable Records m_records;
    // Serialises cache updates of concurrent lookups.
    mutable LockWord m_cacheLock{0};
};

class AttribMap : public Attribute {
public:
    using Entry = std::pair<name_id, Attribute*>;
    using Entries = vector<Entry>;

    explicit AttribMap(AttribFactory* factory = &::base::attribFactory(), name_id className = {});
    // Destroys the entries in order, then leaves the base's watch list.
    ~AttribMap() override;

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    // ---- Attribute ----
    name_id typeName() const override;
    AttribMap* asMap() override { return this; }
    // Same factory, class, flags and base; clones of the entries in order.
    Attribute* clone() const override;
    std::int8_t componentType() const override { return -1; }
    // Structured form: see b_json.h.
    bool write(DataWriter& writer, std::uint32_t index = wholeValue) const override;
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    bool read(DataReader& reader, std::uint32_t index = wholeValue) override;
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    // The Entries vector.
    void* data(std::uint32_t index = wholeValue) override;
    std::uint32_t size() const override { return std::uint32_t(m_entries.size()); }
    // 4 plus the entries' binarySize.
    std::uint32_t binarySize() const override;
    // Mode bit 0 or 1: entries present here copy from the source's (bit 0
    // replaces those that refuse with a clone), absent ones are cloned in.
    // Otherwise only absent entries are cloned in. False when the source is no map.
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    // Own mark bit or any entry's.
    bool isMarked() const override;
    // Replaces the entries by clones of those of an Entries vector.
    void setData(const void* value, std::uint32_t index = wholeValue) override;
    // Against an Entries vector: count first, then pair by pair ("name" pairs
    // ignored; equal keys compare type then value, other keys their texts).
    int compare(const void* value, std::uint32_t index = wholeValue) const override;

    // The map's class (null for an anonymous map); plug-ins answer their type.
    virtual name_id className() const { return m_className; }

    // ---- Hooks for plug-ins (plain maps: the defaults) ----
    // Whether a path starting at this plug-in is marked.
    virtual bool isPathMarked(const AttribPath&) const { return false; }
    // Asked when a path starting here does not resolve or reaches a transient
    // target; may rebuild the path for the expected type.
    virtual void refreshPath(AttribPath&, name_id /*expectedType*/) {}
    // The lock that paths starting at this plug-in read-lock while they
    // resolve. Must not be lockWord(), which guards the watch list.
    virtual LockWord* pluginLock() const { return nullptr; }
    // Told by findAttributeMutable (flags bit 1) that an entry will change.
    virtual void attributeChanged(name_id /*name*/, Attribute* /*attribute*/,
                                  std::uint32_t /*flags*/) {}
    // Instance id within the owning plug-in factory; wholeValue for plain maps.
    virtual std::uint32_t instanceId() const { return wholeValue; }

    // ---- Entries ----
    const Entries& entries() const noexcept { return m_entries; }
    AttribFactory* attribFactory() const noexcept { return m_factory; }
    void setAttribFactory(AttribFactory* factory) noexcept { m_factory = factory; }
    void setClassName(name_id className) noexcept { m_className = className; }

    // This map's own entry: no links followed, no inheritance.
    Attribute* findEntry(name_id name) noexcept;
    const Attribute* findEntry(name_id name) const noexcept;
    // The entry here or, when absent, in the base chain (read-locking each base;
    // a base with an empty watch list counts as absent). No links followed.
    Attribute* findInherited(name_id name) const;

    // Typed lookups with links and inheritance; null (after a warning for a
    // mismatch or a broken link) when there is no such value.
    template <class T>
    const T* findAttribute(name_id name) const {
        const Attribute* found = findOfType(name, TypeTraits<T>::n_name);
        return found ? static_cast<const T*>(found->data(wholeValue)) : nullptr;
    }
    template <class T>
    const ArrayOf<T>* findVecAttribute(name_id name) const {
        const Attribute* found = findOfType(name, TypeTraits<T>::n_array_name, true);
        return found ? static_cast<const ArrayOf<T>*>(found->data(wholeValue)) : nullptr;
    }
    // The attribute of that type, with the same rules (maps and arrays by
    // mapTypeName() / arrayTypeName()). 'arrayMessage' selects the "Expected
    // type" wording of findVecAttribute.
    const Attribute* findOfType(name_id name, name_id type, bool arrayMessage = false) const;
    const AttribMap* findMap(name_id name) const;
    const AttribArray* findArray(name_id name) const;

    // Prepares an own entry for modification: flags bit 0 unlinks it (bit 2:
    // also silent links, bit 3: also links into this plug-in, bit 4: the caller
    // holds pluginLock() for reading), bit 1 then calls attributeChanged.
    // Answers whether anything was unlinked; false for an absent name.
    bool findAttributeMutable(name_id name, std::uint32_t flags);

    // Sets an entry, taking ownership of 'value'. A present entry of the same
    // type takes the value through setData (and 'value' is destroyed); one of
    // another type is replaced.
    void attribute(name_id name, Attribute* value);

    // Get-or-create: the entry of the type (not a link), else a new one made by
    // the attribute factory replaces whatever was there. Null (after the
    // factory's warning) for an unregistered type.
    Attribute* attributeOfType(name_id name, name_id type);
    template <class T>
    TypedAttribute<T>* attribute(name_id name) {
        return static_cast<TypedAttribute<T>*>(attributeOfType(name, TypeTraits<T>::n_name));
    }
    template <class T>
    TypedVectorAttribute<T>* vecAttribute(name_id name) {
        return static_cast<TypedVectorAttribute<T>*>(
            attributeOfType(name, TypeTraits<T>::n_array_name));
    }
    // Get-or-create for containers; a new map gets this map's attribute factory.
    AttribMap* mapAttribute(name_id name, name_id className = {});
    AttribArray* arrayAttribute(name_id name, name_id elementClass = {});
    AttribLink* linkAttribute(name_id name);

    // Get-or-create, then set. Does nothing for an unregistered type.
    template <class T>
    void setAttribute(name_id name, const T& value) {
        if (TypedAttribute<T>* a = attribute<T>(name))
            a->setValue(value);
    }
    // Appends to the array entry of T, creating it when absent. Throws for an
    // entry of another type and for a type the factory does not know.
    template <class T>
    void appendAttributeItem(name_id name, const T& item) {
        auto* a = static_cast<TypedVectorAttribute<T>*>(
            access(name, TypeTraits<T>::n_array_name, "base::AttribMap::appendAttributeItem"));
        a->items().push_back(item);
    }
    // Keeps the entry of T equal to 'value', creating it when absent. Throws
    // like appendAttributeItem.
    template <class T>
    void syncAttribute(name_id name, const T& value) {
        auto* a = static_cast<TypedAttribute<T>*>(
            access(name, TypeTraits<T>::n_name, "base::AttribMap::syncAttribute"));
        a->setValue(value);
    }

    // Destroys the entry; false when absent.
    bool removeAttribute(name_id name);
    // Destroys every entry.
    void clear();

    // Inheritance. Throws base::exception "The object can't inherit itself!"
    // when 'base' is this map or inherits from it.
    void setBase(AttribMap* base);
    AttribMap* base() const noexcept { return static_cast<AttribMap*>(m_base.watched); }

private:
    friend struct AttribMapAccess;

    Entries::iterator lowerBound(name_id name) noexcept;
    Entries::const_iterator lowerBound(name_id name) const noexcept;
    // Inserts or replaces (destroying the old attribute); takes ownership.
    void put(name_id name, Attribute* value);
    const Attribute* lookup(name_id name, name_id type, bool arrayMessage) const;
    Attribute* access(name_id name, name_id type, const char* function);
    void linkBase(AttribMap* base);
    void unlinkBase();

    name_id m_className;
    Entries m_entries;
    AttribFactory* m_factory;
    // owner = this, watched = the base map.
    WatchNode m_base;
    bool m_baseLinked = false;
};

class AttribArray : public Attribute {
public:
    using Items = vector<Attribute*>;

    explicit AttribArray(name_id elementClass = {},
                         AttribFactory* factory = &::base::attribFactory());
    ~AttribArray() override;

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    name_id typeName() const override;
    AttribArray* asArray() override { return this; }
    Attribute* clone() const override;
    std::int8_t componentType() const override { return -1; }
    // Structured form: see b_json.h.
    bool write(DataWriter& writer, std::uint32_t index = wholeValue) const override;
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    bool read(DataReader& reader, std::uint32_t index = wholeValue) override;
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    // wholeValue: the Items vector; an index: that item (an Attribute*), or null.
    void* data(std::uint32_t index = wholeValue) override;
    std::uint32_t size() const override { return std::uint32_t(m_items.size()); }
    bool removeItem(std::uint32_t index) override;
    // 4 plus the items' binarySize.
    std::uint32_t binarySize() const override;
    // Mode bit 0 or 1 with an array source: the items become clones of the
    // source's. False otherwise.
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    bool isMarked() const override;
    // wholeValue: clones of the attributes of an Items vector; an index: that
    // item becomes a clone of the Attribute at 'value'.
    void setData(const void* value, std::uint32_t index = wholeValue) override;
    // Against an Items vector (count, then type and value item by item) or, with
    // an index, item against the Attribute at 'value'.
    int compare(const void* value, std::uint32_t index = wholeValue) const override;

    // The element class given to the maps the array makes.
    virtual name_id className() const { return m_elementClass; }
    void setClassName(name_id elementClass) noexcept { m_elementClass = elementClass; }
    AttribFactory* attribFactory() const noexcept { return m_factory; }
    void setAttribFactory(AttribFactory* factory) noexcept { m_factory = factory; }

    const Items& items() const noexcept { return m_items; }
    Attribute* item(std::uint32_t index) const noexcept {
        return index < m_items.size() ? m_items[index] : nullptr;
    }
    // Takes ownership; answers the new item's index. A null item throws.
    std::uint32_t append(Attribute* item);
    // A new map of the element class, appended.
    AttribMap* appendMap();
    // Takes ownership; an index past the end appends.
    void insertItem(std::uint32_t index, Attribute* item);
    // Takes ownership and destroys the old item; throws for a bad index.
    void setItem(std::uint32_t index, Attribute* item);
    void clear();

private:
    friend struct AttribMapAccess;

    Items m_items;
    name_id m_elementClass;
    AttribFactory* m_factory;
};

class AttribLink : public Attribute {
public:
    AttribLink() = default;
    explicit AttribLink(const AttribPath& path) { setPath(path); }

    using Attribute::data;
    using Attribute::read;
    using Attribute::write;

    name_id typeName() const override;
    AttribLink* asLink() override { return this; }
    Attribute* clone() const override;
    std::int8_t componentType() const override { return -1; }
    // Structured form: see b_json.h.
    bool write(DataWriter& writer, std::uint32_t index = wholeValue) const override;
    bool write(Stream& stream, std::uint32_t index = wholeValue) const override;
    bool read(DataReader& reader, std::uint32_t index = wholeValue) override;
    bool read(Stream& stream, std::uint32_t index = wholeValue) override;
    // The AttribPath.
    void* data(std::uint32_t = wholeValue) override { return &m_path; }
    std::uint32_t binarySize() const override { return 24; }
    // Copies the path of another link when mode bit 0 is set.
    bool copyFrom(const Attribute& source, std::uint32_t mode,
                  std::uint32_t index = wholeValue) override;
    // The path text.
    string toString() const override { return m_path.toString(); }
    // From an AttribPath.
    void setData(const void* value, std::uint32_t index = wholeValue) override;
    // Against an AttribPath.
    int compare(const void* value, std::uint32_t index = wholeValue) const override;

    const AttribPath& path() const noexcept { return m_path; }
    AttribPath& path() noexcept { return m_path; }
    // Copies the path and owns its last record.
    void setPath(const AttribPath& path);
    // Kept with the path; the core does not interpret it.
    vector<SerializeRec>& auxiliary() noexcept { return m_auxiliary; }

    // Follows the path and any links it reaches, asking the root plug-in to
    // refresh a path that does not resolve or reaches a transient target. Null
    // when the chain breaks or does not end within linkChainLimit hops.
    Attribute* resolve(name_id expectedType = {}) const;

private:
    AttribPath m_path;
    vector<SerializeRec> m_auxiliary;
};

} // namespace base

// The JSON form of every attribute kind, the plug-in resolvers and whole
// factories.
#include "b_attrib_map.h"
#include "b_attribute.h"
#include "b_format.h"
#include "b_json.h"
#include "b_log.h"
#include "b_plugin.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <memory>

namespace base {

namespace {

constexpr std::uint32_t noId = DataReaderResolveStringId::noId;

// ---- Scalars ------------------------------------------------------------------------

template <class C>
bool writeScalar(DataWriter& w, const C& v) {
    if constexpr (std::is_same_v<C, bool>)
        return w.writeBool(v);
    else if constexpr (std::is_same_v<C, float>)
        return w.writeFloat(v);
    else if constexpr (std::is_same_v<C, double>)
        return w.writeDouble(v);
    else if constexpr (std::is_same_v<C, std::int64_t>)
        return w.writeInt64(v);
    else if constexpr (std::is_same_v<C, std::uint64_t>)
        return w.writeUInt64(v);
    else if constexpr (std::is_signed_v<C>)
        return w.writeInt32(v);
    else
        return w.writeUInt32(v);
}

template <class C>
bool readScalar(DataReader& r, C& v) {
    if constexpr (std::is_same_v<C, bool>) {
        return r.readBool(v);
    } else if constexpr (std::is_same_v<C, float>) {
        return r.readFloat(v);
    } else if constexpr (std::is_same_v<C, double>) {
        return r.readDouble(v);
    } else if constexpr (std::is_signed_v<C>) {
        std::int64_t n;
        if (!r.readInt64(n) || n < std::numeric_limits<C>::min() ||
            n > std::numeric_limits<C>::max())
            return false;
        v = C(n);
        return true;
    } else {
        std::uint64_t n;
        if (!r.readUInt64(n) || n > std::numeric_limits<C>::max())
            return false;
        v = C(n);
        return true;
    }
}

template <class T>
constexpr std::uint32_t componentCount() {
    T v{};
    return ValueFields<T>::apply(v, [](auto&... c) { return std::uint32_t(sizeof...(c)); });
}

// ---- References ---------------------------------------------------------------------

bool writeReference(DataWriter& w, std::uint32_t id) {
    if (id == noId)
        return w.writeNull();
    const std::string_view name = w.resolveStringId(id);
    return name.empty() ? w.writeUInt32(id) : w.writeString(name);
}

// A reference as null, an id or a name. Answers the id (noId for none) and the
// object when the resolver reaches it; a name the resolver does not know is
// reported and reads as no object.
bool readReference(DataReader& r, std::uint32_t& id, IPlugin*& object) {
    object = nullptr;
    if (r.readNull()) {
        id = noId;
        return true;
    }
    std::uint64_t number;
    if (r.readUInt64(number)) {
        if (number > 0xFFFFFFFFu)
            return false;
        // The reserved range belongs to resolvers, never to a document.
        id = number < DataReaderResolveStringId::firstReservedId ? std::uint32_t(number) : noId;
    } else {
        const std::uint32_t line = r.line();
        string name;
        if (!r.readString(name))
            return false;
        id = r.resolveStringId(name);
        if (id == noId)
            logFormatted(logSystem, logWarning,
                         "json parser {}({})| Unable to find plugin with name '{}'!",
                         r.streamName(), line, name);
    }
    if (id != noId)
        object = r.resolver().plugin(id);
    return true;
}

} // namespace

// ---- ValueJson ------------------------------------------------------------------------

template <class T>
bool ValueJson<T>::write(DataWriter& w, const T& value) {
    if constexpr (std::is_same_v<T, string>) {
        return w.writeString(value);
    } else if constexpr (std::is_same_v<T, TimeCode>) {
        return w.writeInt64(value.ticks());
    } else if constexpr (std::is_same_v<T, ref<IPlugin>>) {
        return writeReference(w, value ? value->instanceId() : noId);
    } else if constexpr (CompoundValue<T>) {
        return w.beginArray(std::min(componentCount<T>(), DataWriter::oneLineHint)) &&
               ValueFields<T>::apply(
                   value, [&](const auto&... c) { return (writeScalar(w, c) && ...); }) &&
               w.endArray();
    } else {
        return writeScalar(w, value);
    }
}

template <class T>
bool ValueJson<T>::read(DataReader& r, T& value) {
    if constexpr (std::is_same_v<T, string>) {
        return r.readString(value);
    } else if constexpr (std::is_same_v<T, TimeCode>) {
        std::int64_t ticks;
        if (!r.readInt64(ticks))
            return false;
        value = TimeCode(ticks);
        return true;
    } else if constexpr (std::is_same_v<T, ref<IPlugin>>) {
        std::uint32_t id;
        IPlugin* object;
        if (!readReference(r, id, object))
            return false;
        value = ref<IPlugin>(object);
        return true;
    } else if constexpr (CompoundValue<T>) {
        T read = value;
        if (!r.beginArray() ||
            !ValueFields<T>::apply(read, [&](auto&... c) { return (readScalar(r, c) && ...); }) ||
            !r.endArray())
            return false;
        value = read;
        return true;
    } else {
        return readScalar(r, value);
    }
}

template <class T>
bool ValueJson<T>::writeItems(DataWriter& w, const TypedVectorAttribute<T>& attribute,
                              std::uint32_t index) {
    const auto& items = attribute.items();
    if (index != wholeValue)
        return index < items.size() && write(w, attr_detail::itemValue<T>(items[index]));
    if (!w.beginArray(std::uint32_t(items.size())))
        return false;
    for (const auto& item : items)
        if (!write(w, attr_detail::itemValue<T>(item)))
            return false;
    return w.endArray();
}

template <class T>
bool ValueJson<T>::readItems(DataReader& r, TypedVectorAttribute<T>& attribute,
                             std::uint32_t index) {
    auto& items = attribute.items();
    if (index != wholeValue)
        return index < items.size() && read(r, attr_detail::itemValue<T>(items[index]));
    if (!r.beginArray())
        return false;
    // Grows with what arrives: a document cannot announce a size to reserve.
    typename TypedVectorAttribute<T>::vector_type read;
    while (!r.endArray()) {
        T item{};
        if (!ValueJson<T>::read(r, item))
            return false;
        read.push_back(std::move(item));
    }
    items.swap(read);
    return true;
}

#define BASE_INSTANTIATE_JSON(T, label, code) template struct ValueJson<T>;
BASE_VALUE_TYPES(BASE_INSTANTIATE_JSON)
BASE_REFERENCE_TYPES(BASE_INSTANTIATE_JSON)
#undef BASE_INSTANTIATE_JSON

// ---- AttribPath -----------------------------------------------------------------------

AttribPath& AttribPath::addPluginId(std::uint32_t id) {
    if (!m_records.empty())
        BASE_THROW(invalid_argument, "The plugin step must start the path.");
    SerializeRec record;
    record.kind = SerializeRec::plugin;
    record.index = id;
    push(record);
    return *this;
}

// ---- Messages -------------------------------------------------------------------------

namespace {

// A member without its key: usually a trailing ','. Answers false.
bool logMissingKey(DataReader& r, std::uint32_t line) {
    logFormatted(logSystem, logError,
                 "json parser {}| Unable to read end of object at line {}! Check for extra ','.",
                 r.streamName(), line);
    return false;
}

void logUnknownType(DataReader& r, name_id className, std::string_view name, std::string_view type,
                    std::uint32_t line) {
    logFormatted(logSystem, logWarning,
                 "json parser {}| Trying to create an attribute '{}::{}' from unknown type '{}' at "
                 "line {}!",
                 r.streamName(), className, name, type, line);
}

void logUnreadable(DataReader& r, name_id className, std::string_view name, std::string_view type,
                   std::uint32_t line) {
    logFormatted(logSystem, logWarning,
                 "json parser {}| Unable to read the value of attribute '{}::{}' with type '{}' at "
                 "line {}!",
                 r.streamName(), className, name, type, line);
}

void logPath(DataReader& r, const char* what, std::uint32_t line) {
    logFormatted(logSystem, logWarning, "json parser {}| Expected {} at line {}!", r.streamName(),
                 what, line);
}

// Names and type names must not hold a NUL: the name server compares texts as
// C strings and would take the name for its prefix.
bool usableName(std::string_view text) {
    return !text.empty() && text.find('\0') == std::string_view::npos;
}

// The registered attribute type of a type name, without interning names that
// arrive from a document (a type never interned is no registered type).
name_id registeredType(const AttribFactory* factory, std::string_view type) {
    if (!factory || !usableName(type))
        return {};
    const name_id found = nameServer().find(type);
    return found && factory->contains(found) ? found : name_id();
}

// Keys repeat from object to object. What a key resolves to (the interned
// attribute name and the registered type) is remembered per thread, so the
// name server, a locked ordered map, is asked once per distinct key. Only
// registered types are remembered: a registration is never taken back.
class KeyCache {
public:
    struct Resolved {
        name_id name;
        name_id type;
    };

    // 'split': whether the key is "name^type" (maps) or a type alone (arrays).
    // False when the key names no registered type or no usable name; 'name'
    // and 'type' then hold the texts for the message.
    bool resolve(const AttribFactory* factory, std::string_view key, bool split, Resolved& resolved,
                 std::string_view& name, std::string_view& type) {
        const std::size_t at = split ? key.rfind('^') : std::string_view::npos;
        name = !split ? std::string_view() : at == key.npos ? key : key.substr(0, at);
        type = !split ? key : at == key.npos ? std::string_view() : key.substr(at + 1);
        Slot& slot = m_slots[data_io_detail::TextHash()(key) % slotCount];
        if (slot.factory == factory && slot.split == split && slot.key == key) {
            resolved = slot.resolved;
            return true;
        }
        resolved.type = registeredType(factory, type);
        if (!resolved.type || (split && !usableName(name)))
            return false;
        resolved.name = split ? name_id(name) : name_id();
        slot.key.assign(key.data(), key.size());
        slot.factory = factory;
        slot.split = split;
        slot.resolved = resolved;
        return true;
    }

private:
    static constexpr std::size_t slotCount = 509;
    struct Slot {
        string key;
        const AttribFactory* factory = nullptr;
        bool split = false;
        Resolved resolved;
    };
    Slot m_slots[slotCount];
};

KeyCache& keyCache() {
    thread_local KeyCache cache;
    return cache;
}

using Owned = std::unique_ptr<Attribute>;

// A new attribute of a registered type; containers share the owner's
// attribute factory, maps made by arrays get the element class.
Owned createAttribute(AttribFactory* factory, name_id type, name_id elementClass = {}) {
    Owned made(factory->create(type));
    if (!made)
        return made;
    if (AttribMap* map = made->asMap()) {
        map->setAttribFactory(factory);
        if (elementClass)
            map->setClassName(elementClass);
    } else if (AttribArray* array = made->asArray()) {
        array->setAttribFactory(factory);
    }
    return made;
}

// "name^type" without a heap block for the usual lengths.
class EntryKey {
public:
    std::string_view of(name_id name, name_id type) {
        const std::size_t length = name.size() + 1 + type.size();
        char* out = m_inline;
        if (length > sizeof(m_inline)) {
            m_long.resize(length);
            out = m_long.data();
        }
        std::memcpy(out, name.c_str(), name.size());
        out[name.size()] = '^';
        std::memcpy(out + name.size() + 1, type.c_str(), type.size());
        return {out, length};
    }

private:
    char m_inline[256];
    string m_long;
};

} // namespace

// ---- AttribMap ------------------------------------------------------------------------

bool AttribMap::write(DataWriter& w, std::uint32_t) const {
    if (!w.beginObject())
        return false;
    EntryKey key;
    for (const auto& [name, value] : m_entries) {
        if (!value || value->hasFlag(flagTransient))
            continue;
        if (!w.key(key.of(name, value->typeName())) || !value->write(w))
            return false;
    }
    return w.endObject();
}

bool AttribMap::read(DataReader& r, std::uint32_t) {
    if (!r.beginObject())
        return false;
    const name_id owner = className();
    for (;;) {
        if (r.endObject())
            return true;
        const std::uint32_t line = r.line();
        std::string_view key;
        if (!r.key(key))
            return logMissingKey(r, line);
        // The key is only valid until the next call on the reader.
        KeyCache::Resolved resolved;
        std::string_view nameText, typeText;
        if (!keyCache().resolve(m_factory, key, true, resolved, nameText, typeText)) {
            if (registeredType(m_factory, typeText))
                logUnreadable(r, owner, nameText, typeText, line);
            else
                logUnknownType(r, owner, nameText, typeText, line);
            r.skipValue();
            continue;
        }
        const name_id name = resolved.name, type = resolved.type;
        const std::uint32_t depth = r.depth();
        Owned value = createAttribute(m_factory, type);
        if (!value || !value->read(r)) {
            logUnreadable(r, owner, name.view(), type.view(), line);
            r.skipRest(depth);
            continue;
        }
        // An entry of the same value type takes the value in place (links to it
        // stay valid, pending references travel with copyFrom); containers and
        // other types are replaced.
        Attribute* existing = findEntry(name);
        if (existing && existing->typeName() == type && !existing->asMap() &&
            !existing->asArray() && existing->copyFrom(*value, 1))
            continue;
        attribute(name, value.release());
    }
}

// ---- AttribArray ----------------------------------------------------------------------

bool AttribArray::write(DataWriter& w, std::uint32_t index) const {
    if (index != wholeValue) {
        const Attribute* one = item(index);
        return one && one->write(w);
    }
    // Items are keyed by their type, so keys repeat; the list layout has none.
    const auto* json = dynamic_cast<const JSONAttrWriter*>(&w);
    if (json && json->layout() == JSONLayout::list) {
        if (!w.beginArray(0))
            return false;
        for (const Attribute* one : m_items) {
            if (!one || one->hasFlag(flagTransient))
                continue;
            if (!w.beginObject() || !w.key("type") || !w.writeString(one->typeName().view()) ||
                !w.key("value") || !one->write(w) || !w.endObject())
                return false;
        }
        return w.endArray();
    }
    if (!w.beginObject())
        return false;
    for (const Attribute* one : m_items) {
        if (!one || one->hasFlag(flagTransient))
            continue;
        if (!w.key(one->typeName().view()) || !one->write(w))
            return false;
    }
    return w.endObject();
}

bool AttribArray::read(DataReader& r, std::uint32_t index) {
    if (index != wholeValue) {
        Attribute* one = item(index);
        return one && one->read(r);
    }
    const bool listed = r.beginArray();
    if (!listed && !r.beginObject())
        return false;
    const name_id owner = className();
    vector<Owned> read;
    // One item's value, next in the reader.
    const auto readItem = [&](std::string_view key, std::uint32_t line) {
        const auto position = std::uint32_t(read.size());
        KeyCache::Resolved resolved;
        std::string_view nameText, typeText;
        if (!keyCache().resolve(m_factory, key, false, resolved, nameText, typeText)) {
            logUnknownType(r, owner, format("{}", position), key, line);
            r.skipValue();
            return;
        }
        const name_id type = resolved.type;
        const std::uint32_t depth = r.depth();
        Owned value = createAttribute(m_factory, type, m_elementClass);
        if (!value || !value->read(r)) {
            logUnreadable(r, owner, format("{}", position), type.view(), line);
            r.skipRest(depth);
            return;
        }
        read.push_back(std::move(value));
    };
    for (;;) {
        if (listed ? r.endArray() : r.endObject())
            break;
        const std::uint32_t line = r.line();
        std::string_view key;
        if (!listed) {
            if (!r.key(key))
                return logMissingKey(r, line);
            readItem(key, line);
            continue;
        }
        // {"type": T, "value": V}
        const std::uint32_t depth = r.depth();
        string type;
        if (!r.beginObject()) {
            logUnreadable(r, owner, format("{}", read.size()), type, line);
            r.skipValue();
            continue;
        }
        if (!r.key(key) || key != "type" || !r.readString(type) || !r.key(key) || key != "value") {
            logUnreadable(r, owner, format("{}", read.size()), type, line);
            r.skipRest(depth);
            continue;
        }
        readItem(type, line);
        if (!r.endObject())
            return logMissingKey(r, r.line());
    }
    clear();
    for (Owned& one : read)
        append(one.release());
    return true;
}

// ---- AttribLink -----------------------------------------------------------------------

bool AttribLink::write(DataWriter& w, std::uint32_t) const {
    const auto& records = m_path.records();
    if (!w.beginArray(
            std::min<std::uint32_t>(std::uint32_t(records.size() * 2), DataWriter::oneLineHint)))
        return false;
    for (std::size_t i = 0; i < records.size(); ++i) {
        const SerializeRec& record = records[i];
        if (!w.writeUInt32(record.kind))
            return false;
        bool ok;
        switch (record.kind) {
        case SerializeRec::plugin: {
            const AttribMap* root = m_path.root();
            const std::uint32_t id =
                root && root->instanceId() != wholeValue ? root->instanceId() : record.index;
            const std::string_view name = id == noId ? std::string_view() : w.resolveStringId(id);
            ok = name.empty() ? w.writeUInt32(id) : w.writeString(name);
            break;
        }
        case SerializeRec::member:
            ok = w.writeString(record.name.view());
            break;
        default:
            ok = w.writeUInt32(record.index);
            break;
        }
        if (!ok)
            return false;
    }
    return w.endArray();
}

bool AttribLink::read(DataReader& r, std::uint32_t) {
    if (!r.beginArray()) {
        logPath(r, "an array value", r.line());
        return false;
    }
    AttribPath path;
    string text;
    for (bool first = true;; first = false) {
        if (r.endArray())
            break;
        std::uint64_t kind;
        std::uint32_t line = r.line();
        // A kind out of place (a plug-in step after the first, any step after a
        // component) cannot be built into a path.
        if (!r.readUInt64(kind) || (kind == SerializeRec::plugin && !first) ||
            (kind <= SerializeRec::component && path.component() != wholeValue)) {
            logPath(r, "path entry type", line);
            return false;
        }
        if (kind > SerializeRec::component) {
            // Ends the path; the rest of the array carries nothing for it.
            while (!r.endArray())
                if (!r.skipValue())
                    return false;
            break;
        }
        line = r.line();
        if (kind == SerializeRec::plugin) {
            std::uint32_t id;
            IPlugin* object;
            // Written as the plug-in's id when the writer knew no name for it.
            if (!readReference(r, id, object)) {
                logPath(r, "path entry name", line);
                return false;
            }
            if (object)
                path.addPlugin(object);
            else
                path.addPluginId(id);
        } else if (kind == SerializeRec::member) {
            if (!r.readString(text) || !usableName(text)) {
                logPath(r, "path entry name", line);
                return false;
            }
            path.addMember(name_id(text));
        } else {
            std::uint64_t index;
            if (!r.readUInt64(index) || index > 0xFFFFFFFFu) {
                logPath(r, "path entry index", line);
                return false;
            }
            if (kind == SerializeRec::item)
                path.addItem(std::uint32_t(index));
            else
                path.addComponent(std::uint32_t(index));
        }
    }
    setPath(path);
    return true;
}

// ---- Plug-in references ---------------------------------------------------------------

bool PluginAttribute::write(DataWriter& w, std::uint32_t) const {
    return writeReference(w, id());
}

bool PluginAttribute::read(DataReader& r, std::uint32_t) {
    std::uint32_t id;
    IPlugin* object;
    if (!readReference(r, id, object))
        return false;
    setValue(ref<IPlugin>(object));
    if (!object)
        m_id = id;
    return true;
}

bool PluginVectorAttribute::write(DataWriter& w, std::uint32_t index) const {
    if (index != wholeValue)
        return index < m_items.size() && writeReference(w, id(index));
    const auto count = std::uint32_t(m_items.size());
    if (!w.beginArray(count))
        return false;
    for (std::uint32_t i = 0; i < count; ++i)
        if (!writeReference(w, id(i)))
            return false;
    return w.endArray();
}

bool PluginVectorAttribute::read(DataReader& r, std::uint32_t index) {
    std::uint32_t id;
    IPlugin* object;
    if (index != wholeValue) {
        if (index >= m_items.size() || !readReference(r, id, object))
            return false;
        m_ids.resize(m_items.size(), noId);
        m_items[index] = ref<IPlugin>(object);
        m_ids[index] = object ? noId : id;
        return true;
    }
    if (!r.beginArray())
        return false;
    vector_type items;
    vector<std::uint32_t> ids;
    while (!r.endArray()) {
        if (!readReference(r, id, object))
            return false;
        items.emplace_back(object);
        ids.push_back(object ? noId : id);
    }
    m_items.swap(items);
    m_ids.swap(ids);
    return true;
}

// ---- Resolvers ------------------------------------------------------------------------

namespace {

const string* objectName(const IPlugin& plugin) {
    const string* name = plugin.findAttribute<string>(nameAttributeName());
    return name && !name->empty() ? name : nullptr;
}

} // namespace

std::string_view PluginWriterResolveStringId::resolve(std::uint32_t id) {
    const ref<IPlugin> plugin = m_factory.plugin(id);
    // An object that is not written cannot be found by name.
    if (!plugin || plugin->hasFlag(Attribute::flagTransient))
        return {};
    const string* name = objectName(*plugin);
    // Read back, a name finds the first object carrying it (the factory's
    // name service answers the same): any other carrier travels by id. The
    // factory keeps the object, and so its name, alive.
    return name && m_factory.findPlugin(*name) == plugin ? std::string_view(*name)
                                                         : std::string_view();
}

std::uint32_t PluginReaderResolveStringId::resolve(std::string_view name,
                                                   const DataReader& reader) {
    if (!m_defer) {
        const ref<IPlugin> plugin = m_factory.findPlugin(name);
        return plugin ? plugin->instanceId() : noId;
    }
    if (const std::uint32_t id = m_names.find(name); id != noId)
        return id;
    if (const std::uint32_t id = m_pending.find(name); id != noId)
        return id;
    if (m_deferred.size() >= noId - firstReservedId)
        return noId;
    const auto id = std::uint32_t(firstReservedId + m_deferred.size());
    m_deferred.push_back({string(name), string(reader.streamName()), reader.line()});
    m_pending.insert(name, id);
    return id;
}

IPlugin* PluginReaderResolveStringId::plugin(std::uint32_t id) {
    if (id >= firstReservedId)
        return nullptr;
    // The factory's table keeps the object alive.
    return m_factory.plugin(id).get();
}

void PluginReaderResolveStringId::deferUnknownNames() {
    m_defer = true;
    const std::uint32_t count = m_factory.pluginCount();
    for (std::uint32_t i = 0; i < count; ++i)
        if (const ref<IPlugin> plugin = m_factory.plugin(i))
            learn(*plugin);
}

void PluginReaderResolveStringId::learn(IPlugin& plugin) {
    if (plugin.instanceId() == noId)
        return;
    if (const string* name = objectName(plugin))
        m_names.insert(*name, plugin.instanceId());
}

std::uint32_t PluginReaderResolveStringId::settle(std::uint32_t id) {
    if (id < firstReservedId || id - firstReservedId >= m_deferred.size())
        return id;
    Deferred& deferred = m_deferred[id - firstReservedId];
    if (!deferred.settled) {
        deferred.settled = true;
        deferred.id = m_names.find(deferred.name);
        if (deferred.id == noId) {
            ++m_unknown;
            logFormatted(logSystem, logWarning,
                         "json parser {}({})| Unable to find plugin with name '{}'!",
                         deferred.stream, deferred.line, deferred.name);
        }
    }
    return deferred.id;
}

// ---- Factories ------------------------------------------------------------------------

bool writeFactory(PluginFactory& factory, Stream& stream, std::uint32_t maxWidth,
                  IProgress* progress, JSONLayout layout) {
    struct FlagsGuard {
        Stream& stream;
        std::uint32_t flags;
        ~FlagsGuard() { stream.setFlags(flags); }
    } guard{stream, stream.flags()};
    stream.setFlags(guard.flags | streamStrictWrite);

    PluginWriterResolveStringId resolver(factory);
    JSONAttrWriter writer(stream, maxWidth, &resolver);
    writer.setLayout(layout);
    const bool listed = layout == JSONLayout::list;
    const std::uint32_t count = factory.pluginCount();
    int reported = -1;
    const auto report = [&](std::uint64_t done) {
        const int percent = count ? int((done * 100 + count / 2) / count) : 100;
        if (progress && percent != reported)
            progress->progress("Writing plugins", percent);
        reported = percent;
    };
    report(0);
    bool ok = listed ? writer.beginArray(0) : writer.beginObject();
    for (std::uint32_t id = 0; ok && id < count; ++id) {
        const ref<IPlugin> plugin = factory.plugin(id);
        if (plugin && !plugin->hasFlag(Attribute::flagTransient)) {
            const std::string_view type = plugin->className().view();
            if (listed)
                ok = writer.beginObject() && writer.key("type") && writer.writeString(type) &&
                     writer.key("attributes") && plugin->write(writer) && writer.endObject();
            else
                ok = writer.key(type) && plugin->write(writer);
        }
        report(id + 1);
    }
    return ok && (listed ? writer.endArray() : writer.endObject()) && writer.good();
}

namespace {

// Replaces the placeholders of forward names by the objects' ids and points
// links at their root objects, through nested maps and arrays.
void settleReferences(Attribute& attribute, PluginReaderResolveStringId& resolver,
                      PluginFactory& factory) {
    const name_id type = attribute.typeName();
    if (type == TypeTraits<ref<IPlugin>>::n_name) {
        if (auto* single = dynamic_cast<PluginAttribute*>(&attribute))
            if (!single->value())
                single->setPendingId(resolver.settle(single->pendingId()));
    } else if (type == TypeTraits<ref<IPlugin>>::n_array_name) {
        if (auto* items = dynamic_cast<PluginVectorAttribute*>(&attribute))
            for (std::uint32_t& id : items->pendingIds())
                id = resolver.settle(id);
    } else if (AttribLink* link = attribute.asLink()) {
        const AttribPath& path = link->path();
        const std::uint32_t stored = path.rootId();
        if (stored == noId || path.root())
            return;
        const std::uint32_t id = resolver.settle(stored);
        if (const ref<IPlugin> root = factory.plugin(id)) {
            AttribPath rooted(path);
            rooted.setRoot(root.get());
            link->setPath(rooted);
        } else if (id != stored) {
            // The name stays unknown: the path keeps no id that could point at
            // an unrelated object.
            AttribPath unrooted;
            unrooted.addPluginId(noId);
            for (std::size_t i = 1; i < path.size(); ++i) {
                const SerializeRec& record = path[i];
                if (record.kind == SerializeRec::member)
                    unrooted.addMember(record.name);
                else if (record.kind == SerializeRec::item)
                    unrooted.addItem(record.index);
                else
                    unrooted.addComponent(record.index);
            }
            link->setPath(unrooted);
        }
    } else if (AttribMap* map = attribute.asMap()) {
        for (const auto& entry : map->entries())
            settleReferences(*entry.second, resolver, factory);
    } else if (AttribArray* array = attribute.asArray()) {
        for (Attribute* item : array->items())
            if (item)
                settleReferences(*item, resolver, factory);
    }
}

} // namespace

bool readFactory(PluginFactory& factory, Stream& stream) {
    PluginReaderResolveStringId resolver(factory);
    resolver.deferUnknownNames();
    vector<ref<IPlugin>> objects;
    name_id lastType;
    bool ok = true;
    {
        JSONAttrReader reader(stream, &resolver);
        const auto complain = [&](const char* text, std::uint32_t line) {
            logFormatted(logSystem, logError, "json parser {}({})| {}", reader.streamName(), line,
                         text);
            ok = false;
        };
        // One object of the type, its attributes next in the reader.
        const auto readObject = [&](std::string_view type, std::uint32_t line) {
            // Objects come in runs of one type: intern each run once, before
            // the next call on the reader ends the key. Only an object makes an
            // object: nothing is created for a member that could not be read
            // into one.
            const bool named = usableName(type);
            if (named && type != lastType.view())
                lastType = name_id(type);
            ref<IPlugin> plugin;
            if (named && reader.objectFollows())
                plugin = factory.create(lastType, PluginFactory::createReportUnknown |
                                                      PluginFactory::createLocked);
            const std::uint32_t depth = reader.depth();
            if (!plugin) {
                complain("Error reading plugin!", line);
                reader.skipValue();
                return;
            }
            objects.push_back(plugin);
            if (!plugin->read(reader)) {
                complain("Error reading plugin!", line);
                reader.skipRest(depth);
            }
            resolver.learn(*plugin);
        };
        try {
            const bool listed = reader.beginArray();
            if (listed)
                reader.setLayout(JSONLayout::list);
            if (!listed && !reader.beginObject()) {
                complain("Missing object opening bracket!", reader.line());
            } else {
                for (;;) {
                    if (listed ? reader.endArray() : reader.endObject())
                        break;
                    const std::uint32_t line = reader.line();
                    std::string_view key;
                    if (!listed) {
                        if (!reader.key(key)) {
                            complain("Missing closing bracket or extra comma before the bracket!",
                                     line);
                            break;
                        }
                        readObject(key, line);
                        continue;
                    }
                    // {"type": T, "attributes": {...}}
                    const std::uint32_t depth = reader.depth();
                    string type;
                    if (!reader.beginObject()) {
                        complain("Error reading plugin!", line);
                        reader.skipValue();
                        continue;
                    }
                    if (!reader.key(key) || key != "type" || !reader.readString(type) ||
                        !reader.key(key) || key != "attributes") {
                        complain("Error reading plugin!", line);
                        reader.skipRest(depth);
                        continue;
                    }
                    readObject(type, line);
                    if (!reader.endObject()) {
                        complain("Missing closing bracket or extra comma before the bracket!",
                                 reader.line());
                        break;
                    }
                }
            }
        } catch (const JSONException& e) {
            logFormatted(logSystem, logError, "{}", e.message());
            ok = false;
        } catch (const std::exception& e) {
            logFormatted(logSystem, logError, "{} Unhandled exception has occurred!", e.what());
            ok = false;
        }
    }
    // What was read stays, with every reference that can be restored.
    for (const ref<IPlugin>& plugin : objects)
        settleReferences(*plugin, resolver, factory);
    if (resolver.unknownNames())
        ok = false;
    for (const ref<IPlugin>& plugin : objects)
        if (!factory.restoreReferences(*plugin))
            ok = false;
    for (const ref<IPlugin>& plugin : objects)
        plugin->postLoad();
    return ok;
}

} // namespace base

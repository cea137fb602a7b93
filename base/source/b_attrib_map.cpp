// Attribute maps and arrays: lookups, inheritance, copies and binary forms.
#include "b_attrib_map.h"

#include "b_attrib_map_internal.h"
#include "b_format.h"
#include "b_log.h"

#include <limits>
#include <memory>

namespace base {

namespace {

constexpr const char* emptyNameMessage = "The attribute name can't be an empty string.";
constexpr const char* mapEntryCorrupt =
    "map attribute: Unable to read the map entries! Probably a corrupted file!";
constexpr const char* mapValueCorrupt =
    "map attribute: Unable to read attribute '{}'! Probably a corrupted file!";
constexpr const char* arrayCorrupt =
    "array attribute: Unable to read the attribute type inside! Probably a corrupted file!";

// Owns attributes until they are handed over (exception paths of reads and clones).
using Owned = std::unique_ptr<Attribute>;

// A name's text for messages; a missing text prints as "(null)".
const char* textOf(name_id name) noexcept {
    return name.record() ? name.c_str() : "(null)";
}

bool wouldLog(int level) {
    return level <= log().maxLevel();
}

// Whether an entry or item travels in the binary form.
bool stored(const Attribute* value) {
    if (!value || value->hasFlag(Attribute::flagTransient))
        return false;
    if (const AttribLink* link = const_cast<Attribute*>(value)->asLink())
        if (const AttribMap* plugin = link->path().root())
            return !plugin->hasFlag(Attribute::flagTransient);
    return true;
}

// Containers made while reading take their parent's attribute factory; maps
// made by an array take its element class.
void adopt(Attribute& child, AttribFactory* factory, name_id elementClass = {}) {
    if (AttribMap* map = child.asMap()) {
        map->setAttribFactory(factory);
        if (elementClass)
            map->setClassName(elementClass);
    } else if (AttribArray* array = child.asArray()) {
        array->setAttribFactory(factory);
    }
}

template <class Range>
std::uint32_t sumBinarySize(const Range& values) {
    std::uint64_t bytes = 4;
    for (const Attribute* value : values)
        if (value)
            bytes += value->binarySize();
    return std::uint32_t(std::min<std::uint64_t>(bytes, std::numeric_limits<std::uint32_t>::max()));
}

// Counts the bytes written to it. Seekable, so the sized writes nested inside a
// counted value patch their counts instead of counting again.
class CountingWorker final : public StreamWorker {
public:
    CountingWorker() : StreamWorker("count", capWrite | capSeek) {}
    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    std::uint64_t write(const void*, std::uint64_t bytes) override {
        m_position += bytes;
        m_size = std::max(m_size, m_position);
        return bytes;
    }
    std::uint64_t setPosition(std::int64_t offset, std::uint32_t origin) override {
        const std::int64_t from = origin == seekBegin     ? 0
                                  : origin == seekCurrent ? std::int64_t(m_position)
                                                          : std::int64_t(m_size);
        m_position = std::uint64_t(std::max<std::int64_t>(0, from + offset));
        return m_position;
    }
    std::uint64_t getPosition() override { return m_position; }
    std::uint64_t getSize() override { return m_size; }
    void setSize(std::uint64_t size) override { m_size = size; }
    void flush(std::uint32_t) override {}

private:
    std::uint64_t m_position = 0;
    std::uint64_t m_size = 0;
};

thread_local unsigned readDepth = 0;

} // namespace

name_id nameAttributeName() {
    static const name_id name("name");
    return name;
}

void registerContainerTypes(AttribFactory& factory) {
    factory.registerType(mapTypeName(), &AttribFactory::make<AttribMap>);
    factory.registerType(arrayTypeName(), &AttribFactory::make<AttribArray>);
    factory.registerType(linkTypeName(), &AttribFactory::make<AttribLink>);
}

// ---- binary helpers -------------------------------------------------------------

#pragma GCC visibility push(hidden)
namespace attrib_map_detail {

ReadDepth::ReadDepth() noexcept {
    ++readDepth;
}
ReadDepth::~ReadDepth() {
    --readDepth;
}
bool ReadDepth::ok() const noexcept {
    return readDepth <= limit;
}

bool fits(Stream& stream, std::uint64_t bytes) {
    const std::optional<std::uint64_t> left = attr_detail::bytesLeft(stream);
    return !left || bytes <= *left;
}

bool usableName(std::string_view text) noexcept {
    return !text.empty() && text.find('\0') == std::string_view::npos;
}

bool writeText(Stream& stream, std::string_view text) {
    return stream.writeValue(std::uint32_t(text.size())) &&
           stream.writeAll(text.data(), text.size());
}

bool readText(Stream& stream, string& out, const char* function) {
    std::uint32_t length;
    if (!stream.readValue(length))
        return false;
    if (length > 256u * 1024 * 1024)
        BASE_THROW_IN(exception, function,
                      "Trying to read a string bigger then 256MB, aborting...");
    return attr_detail::readStringBytes(stream, length, out);
}

bool skipBytes(Stream& stream, std::uint32_t bytes) {
    if (stream.caps() & capSeek) {
        if (!fits(stream, bytes))
            return false;
        const std::uint64_t target = stream.getPosition() + bytes;
        return stream.setPosition(std::int64_t(target)) == target;
    }
    unsigned char discard[1024];
    while (bytes) {
        const std::uint32_t n = std::min<std::uint32_t>(bytes, sizeof(discard));
        if (stream.read(discard, n) != n)
            return false;
        bytes -= n;
    }
    return true;
}

bool writeSized(Stream& stream, const Attribute& value) {
    constexpr std::uint64_t maxBytes = std::numeric_limits<std::uint32_t>::max();
    if (stream.caps() & capSeek) {
        const std::uint64_t start = stream.getPosition();
        if (!stream.writeValue(std::uint32_t(0)) || !value.write(stream))
            return false;
        const std::uint64_t end = stream.getPosition();
        const std::uint64_t bytes = end - start - 4;
        if (bytes > maxBytes)
            return false;
        stream.setPosition(std::int64_t(start));
        const bool patched = stream.writeValue(std::uint32_t(bytes));
        stream.setPosition(std::int64_t(end));
        return patched;
    }
    Stream counter(ref<StreamWorker>(new CountingWorker()));
    if (!value.write(counter) || counter.getSize() > maxBytes)
        return false;
    return stream.writeValue(std::uint32_t(counter.getSize())) && value.write(stream);
}

bool readSized(Stream& stream, Attribute& value, std::uint32_t bytes) {
    if (!fits(stream, bytes))
        return false;
    const bool seekable = stream.caps() & capSeek;
    const std::uint64_t start = seekable ? stream.getPosition() : 0;
    if (!value.read(stream))
        return false;
    return !seekable || stream.getPosition() - start == bytes;
}

} // namespace attrib_map_detail
#pragma GCC visibility pop

using namespace attrib_map_detail;

// ---- unlinking ----------------------------------------------------------------

struct AttribMapAccess {
    // Replaces links inside 'slot' (recursively) by clones of their targets.
    static bool unlink(Attribute*& slot, AttribMap& plugin, std::uint32_t flags) {
        if (AttribMap* map = slot->asMap()) {
            bool any = false;
            for (auto& entry : map->m_entries)
                any |= unlink(entry.second, plugin, flags);
            return any;
        }
        if (AttribArray* array = slot->asArray()) {
            bool any = false;
            for (Attribute*& item : array->m_items)
                any |= unlink(item, plugin, flags);
            return any;
        }
        AttribLink* link = slot->asLink();
        if (!link || link->hasFlag(1u << 1) ||
            (link->hasFlag(Attribute::flagSilentLink) && !(flags & 4)) ||
            (link->path().root() == &plugin && !(flags & 8)))
            return false;
        Attribute* target = link->path().empty() ? nullptr : link->resolve();
        if (!target) {
            logFormatted(logSystem, logWarning, "Unable to unlink an empty attribute link!");
            return false;
        }
        // Rendered before the write lock: the text may look up the plug-in's
        // name, and a path into the plug-in itself would read-lock it.
        const string text = link->path().toString();
        LockWord* lock = plugin.pluginLock();
        if (lock) {
            if (flags & 16)
                readUnlock(*lock);
            writeLock(*lock);
        }
        Attribute* local = nullptr;
        try {
            local = target->clone();
        } catch (...) {
            if (lock) {
                writeUnlock(*lock);
                if (flags & 16)
                    readLock(*lock);
            }
            throw;
        }
        delete link;
        slot = local;
        if (lock) {
            writeUnlock(*lock);
            if (flags & 16)
                readLock(*lock);
        }
        logFormatted(logSystem, logDebug, "Unlinked attribute pointing to {}!", text);
        return true;
    }
};

// ---- AttribMap ----------------------------------------------------------------

AttribMap::AttribMap(AttribFactory* factory, name_id className)
    : m_className(className), m_factory(factory) {
    m_base.owner = this;
}

AttribMap::~AttribMap() {
    clear();
    unlinkBase();
}

name_id AttribMap::typeName() const {
    return mapTypeName();
}

AttribMap::Entries::iterator AttribMap::lowerBound(name_id name) noexcept {
    return std::lower_bound(m_entries.begin(), m_entries.end(), name,
                            [](const Entry& e, name_id n) { return e.first < n; });
}

AttribMap::Entries::const_iterator AttribMap::lowerBound(name_id name) const noexcept {
    return std::lower_bound(m_entries.begin(), m_entries.end(), name,
                            [](const Entry& e, name_id n) { return e.first < n; });
}

Attribute* AttribMap::findEntry(name_id name) noexcept {
    auto it = lowerBound(name);
    return it != m_entries.end() && it->first == name ? it->second : nullptr;
}

const Attribute* AttribMap::findEntry(name_id name) const noexcept {
    auto it = lowerBound(name);
    return it != m_entries.end() && it->first == name ? it->second : nullptr;
}

Attribute* AttribMap::findInherited(name_id name) const {
    auto it = lowerBound(name);
    if (it != m_entries.end() && it->first == name)
        return it->second;
    AttribMap* base = this->base();
    if (!base)
        return nullptr;
    ReadGuard guard(base->lockWord());
    // A base nobody watches any more is on its way out.
    return base->watchList() ? base->findInherited(name) : nullptr;
}

const Attribute* AttribMap::findOfType(name_id name, name_id type, bool arrayMessage) const {
    if (name.empty())
        BASE_THROW_IN(exception,
                      arrayMessage ? "base::AttribMap::findVecAttribute"
                                   : "base::AttribMap::findAttribute",
                      emptyNameMessage);
    return lookup(name, type, arrayMessage);
}

const Attribute* AttribMap::lookup(name_id name, name_id type, bool arrayMessage) const {
    auto it = lowerBound(name);
    if (it == m_entries.end() || it->first != name) {
        AttribMap* base = this->base();
        if (!base)
            return nullptr;
        ReadGuard guard(base->lockWord());
        return base->watchList() ? base->lookup(name, type, arrayMessage) : nullptr;
    }
    const Attribute* found = it->second;
    if (const AttribLink* link = const_cast<Attribute*>(found)->asLink()) {
        found = link->resolve(type);
        if (!found) {
            if (!link->hasFlag(flagSilentLink) && wouldLog(logWarning))
                logFormatted(
                    logSystem, logWarning,
                    "map attribute| Detected invalid link attribute! Cannot resolve '{}' with "
                    "value '{}'!",
                    name, link->path().toString());
            return nullptr;
        }
    }
    const name_id actual = found->typeName();
    if (actual == type)
        return found;
    logFormatted(logSystem, logWarning,
                 arrayMessage ? "map attribute| Detected invalid access to attribute '{}'. "
                                "Expected type '{}', actual attribute type - '{}'!"
                              : "map attribute| Detected invalid access to attribute '{}'. "
                                "Expected '{}', actual attribute type - '{}'",
                 name, textOf(type), textOf(actual));
    return nullptr;
}

const AttribMap* AttribMap::findMap(name_id name) const {
    const Attribute* found = findOfType(name, mapTypeName());
    return found ? const_cast<Attribute*>(found)->asMap() : nullptr;
}

const AttribArray* AttribMap::findArray(name_id name) const {
    const Attribute* found = findOfType(name, arrayTypeName());
    return found ? const_cast<Attribute*>(found)->asArray() : nullptr;
}

bool AttribMap::findAttributeMutable(name_id name, std::uint32_t flags) {
    if (name.empty())
        BASE_THROW_IN(exception, "base::AttribMap::findAttributeMutable", emptyNameMessage);
    auto it = lowerBound(name);
    if (it == m_entries.end() || it->first != name)
        return false;
    const bool unlinked = (flags & 1) && AttribMapAccess::unlink(it->second, *this, flags);
    if (flags & 2)
        attributeChanged(name, it->second, flags);
    return unlinked;
}

void AttribMap::put(name_id name, Attribute* value) {
    Owned owned(value);
    auto it = lowerBound(name);
    if (it != m_entries.end() && it->first == name) {
        Attribute* old = it->second;
        it->second = owned.release();
        if (old != value)
            delete old;
    } else {
        m_entries.insert(it, Entry(name, value));
        owned.release();
    }
}

void AttribMap::attribute(name_id name, Attribute* value) {
    Owned owned(value);
    if (name.empty())
        BASE_THROW_IN(exception, "base::AttribMap::attribute", emptyNameMessage);
    if (!value)
        BASE_THROW_IN(exception, "base::AttribMap::attribute", "Can't set invalid attribute");
    auto it = lowerBound(name);
    if (it == m_entries.end() || it->first != name) {
        m_entries.insert(it, Entry(name, value));
        owned.release();
        return;
    }
    Attribute* existing = it->second;
    if (existing == value) {
        owned.release(); // already stored here
        return;
    }
    if (existing->typeName() == value->typeName()) {
        existing->setData(value->data(wholeValue));
        return; // 'value' is destroyed by 'owned'
    }
    it->second = owned.release();
    delete existing;
}

Attribute* AttribMap::attributeOfType(name_id name, name_id type) {
    if (name.empty())
        BASE_THROW_IN(exception, "base::AttribMap::attribute", emptyNameMessage);
    if (Attribute* existing = findEntry(name); existing && existing->typeName() == type)
        return existing;
    // Created before the old entry goes, so an unknown type loses nothing.
    Attribute* created = m_factory->create(type);
    if (!created)
        return nullptr;
    adopt(*created, m_factory);
    put(name, created);
    return created;
}

AttribMap* AttribMap::mapAttribute(name_id name, name_id className) {
    if (Attribute* existing = findEntry(name); existing && existing->typeName() == mapTypeName())
        return existing->asMap();
    Attribute* created = attributeOfType(name, mapTypeName());
    AttribMap* map = created ? created->asMap() : nullptr;
    if (map)
        map->setClassName(className);
    return map;
}

AttribArray* AttribMap::arrayAttribute(name_id name, name_id elementClass) {
    if (Attribute* existing = findEntry(name); existing && existing->typeName() == arrayTypeName())
        return existing->asArray();
    Attribute* created = attributeOfType(name, arrayTypeName());
    AttribArray* array = created ? created->asArray() : nullptr;
    if (array)
        array->setClassName(elementClass);
    return array;
}

AttribLink* AttribMap::linkAttribute(name_id name) {
    Attribute* link = attributeOfType(name, linkTypeName());
    return link ? link->asLink() : nullptr;
}

Attribute* AttribMap::access(name_id name, name_id type, const char* function) {
    if (name.empty())
        BASE_THROW_IN(exception, function, emptyNameMessage);
    if (Attribute* existing = findEntry(name)) {
        if (existing->typeName() != type)
            BASE_THROW_IN(exception, function,
                          "Detected invalid access to attribute '{}'. Expected type '{}', actual "
                          "attribute type - '{}'",
                          name, textOf(type), textOf(existing->typeName()));
        return existing;
    }
    Attribute* created = m_factory->create(type);
    if (!created)
        BASE_THROW_IN(exception, function, "Trying to access not registered attribute type '{}'.",
                      textOf(type));
    put(name, created);
    return created;
}

bool AttribMap::removeAttribute(name_id name) {
    auto it = lowerBound(name);
    if (it == m_entries.end() || it->first != name)
        return false;
    Attribute* old = it->second;
    m_entries.erase(it);
    delete old;
    return true;
}

void AttribMap::clear() {
    Entries entries;
    entries.swap(m_entries);
    for (Entry& entry : entries)
        delete entry.second;
}

void AttribMap::setBase(AttribMap* base) {
    for (const AttribMap* b = base; b; b = b->base())
        if (b == this)
            BASE_THROW_IN(exception, "base::AttribMap::setBase",
                          "The object can't inherit itself!");
    if (base == this->base())
        return;
    unlinkBase();
    linkBase(base);
}

void AttribMap::linkBase(AttribMap* base) {
    if (!base)
        return;
    if (base->addWatch(m_base)) {
        m_baseLinked = true;
    } else {
        // The base takes no watch nodes: held unwatched.
        m_base.watched = base;
        m_baseLinked = false;
    }
}

void AttribMap::unlinkBase() {
    if (m_baseLinked && m_base.watched)
        m_base.watched->removeWatch(m_base);
    m_base.watched = nullptr;
    m_base.next = nullptr;
    m_baseLinked = false;
}

Attribute* AttribMap::clone() const {
    auto copy = std::make_unique<AttribMap>(m_factory, m_className);
    copy->m_flags = m_flags;
    copy->linkBase(base());
    copy->m_entries.reserve(m_entries.size());
    for (const Entry& entry : m_entries) {
        Owned value(entry.second->clone());
        copy->m_entries.emplace_back(entry.first, value.get());
        value.release();
    }
    return copy.release();
}

void* AttribMap::data(std::uint32_t) {
    return &m_entries;
}

std::uint32_t AttribMap::binarySize() const {
    std::uint64_t bytes = 4;
    for (const Entry& entry : m_entries)
        bytes += entry.second->binarySize();
    return std::uint32_t(std::min<std::uint64_t>(bytes, std::numeric_limits<std::uint32_t>::max()));
}

bool AttribMap::copyFrom(const Attribute& source, std::uint32_t mode, std::uint32_t) {
    const AttribMap* other = const_cast<Attribute&>(source).asMap();
    if (!other)
        return false;
    if (other == this)
        return true;
    for (const Entry& entry : other->m_entries) {
        auto it = lowerBound(entry.first);
        const bool present = it != m_entries.end() && it->first == entry.first;
        if (present) {
            if ((mode & 3) && !it->second->copyFrom(*entry.second, mode, wholeValue) &&
                (mode & 1)) {
                Attribute* old = it->second;
                it->second = entry.second->clone();
                delete old;
            }
        } else {
            Owned value(entry.second->clone());
            m_entries.insert(it, Entry(entry.first, value.get()));
            value.release();
        }
    }
    return true;
}

bool AttribMap::isMarked() const {
    if (hasFlag(flagMarked))
        return true;
    for (const Entry& entry : m_entries)
        if (entry.second->isMarked())
            return true;
    return false;
}

void AttribMap::setData(const void* value, std::uint32_t) {
    const auto& source = *static_cast<const Entries*>(value);
    if (&source == &m_entries)
        return;
    AttribMap copies(m_factory);
    copies.m_entries.reserve(source.size());
    for (const Entry& entry : source) {
        Owned item(entry.second->clone());
        copies.m_entries.emplace_back(entry.first, item.get());
        item.release();
    }
    m_entries.swap(copies.m_entries); // the old entries die with 'copies'
}

int AttribMap::compare(const void* value, std::uint32_t) const {
    const auto& other = *static_cast<const Entries*>(value);
    if (m_entries.size() != other.size())
        return m_entries.size() < other.size() ? -1 : 1;
    const name_id objectName = nameAttributeName();
    for (std::size_t i = 0; i < m_entries.size(); ++i) {
        const Entry& a = m_entries[i];
        const Entry& b = other[i];
        if (a.first == objectName && b.first == objectName)
            continue;
        if (a.first != b.first) {
            const int r = a.first.view().compare(b.first.view());
            return r < 0 ? -1 : 1;
        }
        if (a.second->typeName() != b.second->typeName())
            return 1;
        if (int r = a.second->compare(b.second->data(wholeValue), wholeValue))
            return r;
    }
    return 0;
}

bool AttribMap::write(Stream& stream, std::uint32_t index) const {
    std::uint32_t count = 0;
    for (const Entry& entry : m_entries)
        count += stored(entry.second);
    if (!Attribute::write(stream, index) || !stream.writeValue(count))
        return false;
    for (const Entry& entry : m_entries) {
        if (!stored(entry.second))
            continue;
        if (!writeText(stream, entry.first.view()) ||
            !writeText(stream, entry.second->typeName().view()) ||
            !writeSized(stream, *entry.second))
            return false;
    }
    return true;
}

bool AttribMap::read(Stream& stream, std::uint32_t) {
    // name and type lengths, byte count, flags byte
    constexpr std::uint64_t leastEntryBytes = 4 + 4 + 4 + 1;
    const auto corrupt = [] {
        logFormatted(logSystem, logError, mapEntryCorrupt);
        return false;
    };
    ReadDepth depth;
    std::uint8_t flagsByte;
    std::uint32_t count;
    if (!depth.ok() || !readFlagsByte(stream, flagsByte) || !stream.readValue(count) ||
        !fits(stream, std::uint64_t(count) * leastEntryBytes))
        return corrupt();
    AttribMap entries(m_factory); // owns what is read until it is complete
    string nameText, typeText;
    for (std::uint32_t i = 0; i < count; ++i) {
        std::uint32_t bytes;
        if (!readText(stream, nameText, "base::AttribMap::read") ||
            !readText(stream, typeText, "base::AttribMap::read") || !stream.readValue(bytes) ||
            !usableName(nameText))
            return corrupt();
        // Looked up, not interned: a corrupt file must not fill the name server.
        const name_id type = usableName(typeText) ? nameServer().find(typeText) : name_id();
        AttribFactory::Creator create = type ? m_factory->creator(type) : nullptr;
        if (!create) {
            logFormatted(logSystem, logError,
                         "map attribute: Attribute '{}' has unknown type. This may be caused by "
                         "newer version or corrupted file. Trying to skip...",
                         nameText);
            if (!skipBytes(stream, bytes))
                return corrupt();
            continue;
        }
        Owned value(create());
        adopt(*value, m_factory);
        if (!readSized(stream, *value, bytes)) {
            logFormatted(logSystem, logError, mapValueCorrupt, nameText);
            return false;
        }
        entries.put(name_id(nameText), value.release());
    }
    m_entries.swap(entries.m_entries); // the old entries die with 'entries'
    applyFlagsByte(flagsByte);
    return true;
}

// ---- AttribArray --------------------------------------------------------------

AttribArray::AttribArray(name_id elementClass, AttribFactory* factory)
    : m_elementClass(elementClass), m_factory(factory) {}

AttribArray::~AttribArray() {
    clear();
}

name_id AttribArray::typeName() const {
    return arrayTypeName();
}

Attribute* AttribArray::clone() const {
    auto copy = std::make_unique<AttribArray>(m_elementClass, m_factory);
    copy->m_flags = m_flags;
    copy->m_items.reserve(m_items.size());
    for (const Attribute* item : m_items)
        copy->append(item->clone());
    return copy.release();
}

void* AttribArray::data(std::uint32_t index) {
    if (index == wholeValue)
        return &m_items;
    return item(index);
}

bool AttribArray::removeItem(std::uint32_t index) {
    if (index >= m_items.size())
        return false;
    Attribute* old = m_items[index];
    m_items.erase(m_items.begin() + index);
    delete old;
    return true;
}

std::uint32_t AttribArray::binarySize() const {
    return sumBinarySize(m_items);
}

bool AttribArray::copyFrom(const Attribute& source, std::uint32_t mode, std::uint32_t) {
    const AttribArray* other = const_cast<Attribute&>(source).asArray();
    if (!other || !(mode & 3))
        return false;
    setData(&other->m_items, wholeValue);
    return true;
}

bool AttribArray::isMarked() const {
    if (hasFlag(flagMarked))
        return true;
    for (const Attribute* item : m_items)
        if (item->isMarked())
            return true;
    return false;
}

void AttribArray::setData(const void* value, std::uint32_t index) {
    if (index != wholeValue) {
        setItem(index, static_cast<const Attribute*>(value)->clone());
        return;
    }
    const auto& source = *static_cast<const Items*>(value);
    if (&source == &m_items)
        return;
    AttribArray copies(m_elementClass, m_factory);
    copies.m_items.reserve(source.size());
    for (const Attribute* item : source)
        copies.append(item->clone());
    m_items.swap(copies.m_items);
}

int AttribArray::compare(const void* value, std::uint32_t index) const {
    const auto compareItems = [](const Attribute* a, const Attribute* b) {
        if (a->typeName() != b->typeName())
            return 1;
        return a->compare(b->data(wholeValue), wholeValue);
    };
    if (index != wholeValue) {
        if (index >= m_items.size())
            return -1;
        return compareItems(m_items[index], static_cast<const Attribute*>(value));
    }
    const auto& other = *static_cast<const Items*>(value);
    if (m_items.size() != other.size())
        return m_items.size() < other.size() ? -1 : 1;
    for (std::size_t i = 0; i < m_items.size(); ++i)
        if (int r = compareItems(m_items[i], other[i]))
            return r;
    return 0;
}

std::uint32_t AttribArray::append(Attribute* item) {
    Owned owned(item);
    if (!item)
        BASE_THROW_IN(exception, "base::AttribArray::append", "Can't set invalid attribute");
    m_items.push_back(item);
    owned.release();
    return std::uint32_t(m_items.size() - 1);
}

AttribMap* AttribArray::appendMap() {
    auto* map = new AttribMap(m_factory, m_elementClass);
    append(map);
    return map;
}

void AttribArray::insertItem(std::uint32_t index, Attribute* item) {
    Owned owned(item);
    if (!item)
        BASE_THROW_IN(exception, "base::AttribArray::insertItem", "Can't set invalid attribute");
    m_items.insert(m_items.begin() + std::min<std::size_t>(index, m_items.size()), item);
    owned.release();
}

void AttribArray::setItem(std::uint32_t index, Attribute* item) {
    Owned owned(item);
    if (!item)
        BASE_THROW_IN(exception, "base::AttribArray::setItem", "Can't set invalid attribute");
    if (index >= m_items.size())
        BASE_THROW(invalid_argument, "Item index {} is out of range, the array has {} items.",
                   index, m_items.size());
    Attribute* old = m_items[index];
    m_items[index] = owned.release();
    if (old != item)
        delete old;
}

void AttribArray::clear() {
    Items items;
    items.swap(m_items);
    for (Attribute* item : items)
        delete item;
}

bool AttribArray::write(Stream& stream, std::uint32_t index) const {
    std::uint32_t count = 0;
    for (const Attribute* item : m_items)
        count += stored(item);
    if (!Attribute::write(stream, index) || !stream.writeValue(count))
        return false;
    for (const Attribute* item : m_items) {
        if (!stored(item))
            continue;
        if (!writeText(stream, item->typeName().view()) || !writeSized(stream, *item))
            return false;
    }
    return true;
}

bool AttribArray::read(Stream& stream, std::uint32_t) {
    // type length, byte count, flags byte
    constexpr std::uint64_t leastItemBytes = 4 + 4 + 1;
    const auto corrupt = [] {
        logFormatted(logSystem, logError, arrayCorrupt);
        return false;
    };
    ReadDepth depth;
    std::uint8_t flagsByte;
    std::uint32_t count;
    if (!depth.ok() || !readFlagsByte(stream, flagsByte) || !stream.readValue(count) ||
        !fits(stream, std::uint64_t(count) * leastItemBytes))
        return corrupt();
    AttribArray items(m_elementClass, m_factory);
    string typeText;
    for (std::uint32_t i = 0; i < count; ++i) {
        std::uint32_t bytes;
        if (!readText(stream, typeText, "base::AttribArray::read") || !usableName(typeText) ||
            !stream.readValue(bytes))
            return corrupt();
        const name_id type = nameServer().find(typeText);
        AttribFactory::Creator create = type ? m_factory->creator(type) : nullptr;
        if (!create) {
            logFormatted(logSystem, logWarning,
                         "array attribute: Unknown attribute type '{}'. Ignoring...", typeText);
            if (!skipBytes(stream, bytes))
                return corrupt();
            continue;
        }
        Owned item(create());
        adopt(*item, m_factory, m_elementClass);
        if (!readSized(stream, *item, bytes))
            return corrupt();
        items.append(item.release());
    }
    m_items.swap(items.m_items);
    applyFlagsByte(flagsByte);
    return true;
}

} // namespace base

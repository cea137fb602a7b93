// Attribute paths and links.
#include "b_attrib_map.h"

#include "b_attrib_map_internal.h"
#include "b_format.h"
#include "b_log.h"

namespace base {

namespace {

// Read-locks an optional lock word for a scope.
class OptionalReadGuard {
public:
    explicit OptionalReadGuard(LockWord* word) noexcept : m_word(word) {
        if (m_word)
            readLock(*m_word);
    }
    ~OptionalReadGuard() {
        if (m_word)
            readUnlock(*m_word);
    }
    OptionalReadGuard(const OptionalReadGuard&) = delete;
    OptionalReadGuard& operator=(const OptionalReadGuard&) = delete;

private:
    LockWord* m_word;
};

SerializeRec makeRecord(SerializeRec::Kind kind, name_id name, std::uint32_t index) {
    SerializeRec record;
    record.kind = kind;
    record.name = name;
    record.index = index;
    return record;
}

} // namespace

// ---- AttribPath ---------------------------------------------------------------

AttribPath::AttribPath(const AttribPath& other) {
    m_records.reserve(other.m_records.size());
    for (const SerializeRec& record : other.m_records)
        m_records.push_back(makeRecord(SerializeRec::Kind(record.kind), record.name, record.index));
    if (!m_records.empty())
        attach(m_records[0], other.m_records[0].watched);
}

// The records' buffer moves with the vector, so watch lists stay valid.
AttribPath::AttribPath(AttribPath&& other) noexcept : m_records(std::move(other.m_records)) {}

AttribPath& AttribPath::operator=(const AttribPath& other) {
    if (this != &other)
        *this = AttribPath(other);
    return *this;
}

AttribPath& AttribPath::operator=(AttribPath&& other) noexcept {
    if (this != &other) {
        detachAll();
        m_records = std::move(other.m_records);
        other.m_records.clear();
    }
    return *this;
}

AttribPath::~AttribPath() {
    detachAll();
}

void AttribPath::attach(SerializeRec& record, Attribute* target) {
    record.linked = false;
    record.watched = nullptr;
    record.next = nullptr;
    if (!target)
        return;
    if (target->addWatch(record))
        record.linked = true;
    else
        record.watched = target; // takes no watch nodes: held unwatched
}

void AttribPath::detach(SerializeRec& record) {
    if (record.linked && record.watched)
        record.watched->removeWatch(record);
    record.linked = false;
    record.watched = nullptr;
    record.next = nullptr;
}

void AttribPath::detachAll() const {
    for (SerializeRec& record : m_records)
        detach(record);
}

void AttribPath::push(const SerializeRec& record) {
    if (m_records.size() < m_records.capacity()) {
        m_records.push_back(record);
        return;
    }
    // Growing moves the records: take them out of every watch list first.
    Attribute* root = m_records.empty() ? nullptr : m_records[0].watched;
    detachAll();
    m_records.push_back(record);
    if (root)
        attach(m_records[0], root);
}

AttribPath& AttribPath::addPlugin(AttribMap* plugin) {
    if (!m_records.empty())
        BASE_THROW(invalid_argument, "The plugin step must start the path.");
    push(makeRecord(SerializeRec::plugin, {}, plugin ? plugin->instanceId() : wholeValue));
    attach(m_records[0], plugin);
    return *this;
}

AttribPath& AttribPath::addMember(name_id name) {
    if (name.empty())
        BASE_THROW(invalid_argument, "The attribute name can't be an empty string.");
    if (component() != wholeValue)
        BASE_THROW(invalid_argument, "The component step must end the path.");
    push(makeRecord(SerializeRec::member, name, 0));
    return *this;
}

AttribPath& AttribPath::addItem(std::uint32_t index) {
    if (component() != wholeValue)
        BASE_THROW(invalid_argument, "The component step must end the path.");
    push(makeRecord(SerializeRec::item, {}, index));
    return *this;
}

AttribPath& AttribPath::addComponent(std::uint32_t index) {
    if (component() != wholeValue)
        BASE_THROW(invalid_argument, "The component step must end the path.");
    push(makeRecord(SerializeRec::component, {}, index));
    return *this;
}

void AttribPath::clear() {
    detachAll();
    m_records.clear();
}

AttribMap* AttribPath::root() const noexcept {
    if (m_records.empty() || m_records[0].kind != SerializeRec::plugin || !m_records[0].watched)
        return nullptr;
    return m_records[0].watched->asMap();
}

std::uint32_t AttribPath::rootId() const noexcept {
    return !m_records.empty() && m_records[0].kind == SerializeRec::plugin ? m_records[0].index
                                                                           : wholeValue;
}

void AttribPath::setRoot(AttribMap* plugin) {
    if (m_records.empty()) {
        addPlugin(plugin);
        return;
    }
    if (m_records[0].kind != SerializeRec::plugin)
        BASE_THROW(invalid_argument, "The path does not start at a plugin.");
    invalidate();
    detach(m_records[0]);
    if (plugin && plugin->instanceId() != wholeValue)
        m_records[0].index = plugin->instanceId();
    attach(m_records[0], plugin);
}

std::uint32_t AttribPath::component() const noexcept {
    return !m_records.empty() && m_records.back().kind == SerializeRec::component
               ? m_records.back().index
               : wholeValue;
}

void AttribPath::setOwner(Attribute* owner) noexcept {
    if (!m_records.empty())
        m_records.back().owner = owner;
}

void AttribPath::invalidate() const {
    WriteGuard guard(m_cacheLock);
    for (std::size_t i = 1; i < m_records.size(); ++i)
        detach(m_records[i]);
}

void AttribPath::cache(SerializeRec& record, Attribute* target) const {
    // Transient targets are never cached: nothing would tell the record that
    // they died.
    if (target && !target->hasFlag(Attribute::flagNoWatch))
        attach(record, target);
    else
        detach(record);
}

Attribute* AttribPath::resolveAt(std::size_t i) const {
    SerializeRec& record = m_records[i];
    if (i == 0 || record.watched)
        return record.watched;
    Attribute* parent = resolveAt(i - 1);
    Attribute* result = nullptr;
    if (parent) {
        switch (record.kind) {
        case SerializeRec::plugin:
        case SerializeRec::member:
            if (AttribMap* map = parent->asMap())
                result = map->findInherited(record.name);
            break;
        case SerializeRec::item:
            if (AttribArray* array = parent->asArray())
                result = array->item(record.index);
            break;
        default:
            break;
        }
    }
    cache(record, result);
    return result;
}

Attribute* AttribPath::resolve() const {
    if (m_records.empty())
        return nullptr;
    std::size_t last = m_records.size() - 1;
    if (m_records[last].kind == SerializeRec::component && last > 0)
        --last;
    if (last == 0)
        return nullptr;
    if (Attribute* cached = m_records[last].watched)
        return cached;
    AttribMap* plugin = root();
    OptionalReadGuard pluginGuard(plugin ? plugin->pluginLock() : nullptr);
    WriteGuard cacheGuard(m_cacheLock);
    return resolveAt(last);
}

string AttribPath::toString(const PathNameResolver& resolver) const {
    string out;
    for (std::size_t i = 0; i < m_records.size(); ++i) {
        const SerializeRec& record = m_records[i];
        switch (record.kind) {
        case SerializeRec::plugin: {
            if (i)
                out += '.';
            string name;
            if (resolver && record.index != wholeValue)
                name = resolver(record.index);
            if (name.empty() && i == 0) {
                if (AttribMap* plugin = root())
                    if (const string* own = plugin->findAttribute<string>(nameAttributeName()))
                        name = *own;
            }
            out += name;
            break;
        }
        case SerializeRec::member:
            if (i)
                out += '.';
            out += record.name.view();
            break;
        case SerializeRec::item:
            out += format("[{}]", record.index);
            break;
        default:
            out += format(",{}", record.index);
            break;
        }
    }
    return out;
}

int AttribPath::compare(const AttribPath& other) const {
    const auto order = [](auto a, auto b) { return a < b ? -1 : b < a ? 1 : 0; };
    if (int r = order(m_records.size(), other.m_records.size()))
        return r;
    for (std::size_t i = 0; i < m_records.size(); ++i) {
        const SerializeRec& a = m_records[i];
        const SerializeRec& b = other.m_records[i];
        if (int r = order(a.kind, b.kind))
            return r;
        if (i == 0)
            if (int r = order(std::uintptr_t(a.watched), std::uintptr_t(b.watched)))
                return r;
        if (a.name != b.name) {
            const int r = a.name.view().compare(b.name.view());
            return r < 0 ? -1 : 1;
        }
        if (int r = order(a.index, b.index))
            return r;
    }
    return 0;
}

bool AttribPath::write(Stream& stream) const {
    using attrib_map_detail::writeText;
    if (!stream.writeValue(std::uint32_t(m_records.size())))
        return false;
    for (std::size_t i = 0; i < m_records.size(); ++i) {
        const SerializeRec& record = m_records[i];
        std::uint32_t index = record.index;
        if (record.kind == SerializeRec::plugin)
            if (AttribMap* plugin = root(); plugin && plugin->instanceId() != wholeValue)
                index = plugin->instanceId();
        if (!stream.writeValue(record.kind) || !stream.writeValue(index) ||
            !writeText(stream, record.kind == SerializeRec::member ? record.name.view()
                                                                   : std::string_view()))
            return false;
    }
    return true;
}

bool AttribPath::read(Stream& stream) {
    // kind, index and the name's length word
    constexpr std::uint64_t leastRecordBytes = 1 + 4 + 4;
    std::uint32_t count;
    if (!stream.readValue(count) ||
        !attrib_map_detail::fits(stream, std::uint64_t(count) * leastRecordBytes))
        return false;
    Records records;
    string text;
    for (std::uint32_t i = 0; i < count; ++i) {
        std::uint8_t kind;
        std::uint32_t index;
        if (!stream.readValue(kind) || !stream.readValue(index) ||
            !attrib_map_detail::readText(stream, text, "base::AttribLink::read"))
            return false;
        const bool placed = kind == SerializeRec::plugin      ? i == 0
                            : kind == SerializeRec::member    ? attrib_map_detail::usableName(text)
                            : kind == SerializeRec::component ? i + 1 == count
                                                              : kind == SerializeRec::item;
        if (!placed)
            return false;
        records.push_back(makeRecord(SerializeRec::Kind(kind),
                                     kind == SerializeRec::member ? name_id(text) : name_id(),
                                     index));
    }
    detachAll();
    m_records.swap(records);
    return true;
}

// ---- AttribLink ---------------------------------------------------------------

name_id AttribLink::typeName() const {
    return linkTypeName();
}

Attribute* AttribLink::clone() const {
    auto* copy = new AttribLink(m_path);
    copy->m_flags = m_flags;
    copy->m_auxiliary = m_auxiliary;
    return copy;
}

bool AttribLink::write(Stream& stream, std::uint32_t index) const {
    return Attribute::write(stream, index) && m_path.write(stream);
}

bool AttribLink::read(Stream& stream, std::uint32_t) {
    std::uint8_t flagsByte;
    if (!readFlagsByte(stream, flagsByte) || !m_path.read(stream))
        return false;
    m_path.setOwner(this);
    applyFlagsByte(flagsByte);
    return true;
}

bool AttribLink::copyFrom(const Attribute& source, std::uint32_t mode, std::uint32_t) {
    const AttribLink* other = const_cast<Attribute&>(source).asLink();
    if (!other || !(mode & 1))
        return false;
    setPath(other->m_path);
    return true;
}

void AttribLink::setData(const void* value, std::uint32_t) {
    setPath(*static_cast<const AttribPath*>(value));
}

int AttribLink::compare(const void* value, std::uint32_t) const {
    return m_path.compare(*static_cast<const AttribPath*>(value));
}

void AttribLink::setPath(const AttribPath& path) {
    if (&path != &m_path)
        m_path = path;
    m_path.setOwner(this);
}

Attribute* AttribLink::resolve(name_id expectedType) const {
    const AttribLink* link = this;
    for (unsigned hop = 0; hop < linkChainLimit; ++hop) {
        AttribPath& path = const_cast<AttribPath&>(link->m_path);
        if (path.empty())
            return nullptr;
        Attribute* result = path.resolve();
        if (!result || result->hasFlag(flagNoWatch)) {
            if (AttribMap* plugin = path.root()) {
                plugin->refreshPath(path, expectedType);
                result = path.resolve();
            }
        }
        if (!result)
            return nullptr;
        AttribLink* next = result->asLink();
        if (!next)
            return result;
        link = next;
    }
    return nullptr; // a cycle, or a chain too long to be anything else
}

} // namespace base

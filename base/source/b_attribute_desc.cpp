#include "b_attribute_desc.h"

#include "b_format.h"
#include "b_log.h"

#include <pugixml.hpp>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstring>
#include <exception>
#include <optional>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace base {

bool AttribMapDesc::addAttribute(ref<AttribDesc> attribute) {
    if (!attribute || attribute->name.empty())
        return false;
    if (!m_index.emplace(attribute->name, m_attributes.size()).second)
        return false;
    m_attributes.push_back(std::move(attribute));
    return true;
}

AttribDesc* AttribMapDesc::findAttribute(name_id name) const {
    auto it = m_index.find(name);
    return it == m_index.end() ? nullptr : m_attributes[it->second].get();
}

void AttribMapDesc::registerInstance(AttribMap* instance) {
    if (!instance)
        return;
    std::lock_guard lock(m_instanceMutex);
    m_instances.insert(instance);
}

void AttribMapDesc::unregisterInstance(AttribMap* instance) {
    std::lock_guard lock(m_instanceMutex);
    m_instances.erase(instance);
}

bool AttribMapDesc::hasInstance(const AttribMap* instance) const {
    std::lock_guard lock(m_instanceMutex);
    return m_instances.find(instance) != m_instances.end();
}

std::size_t AttribMapDesc::instanceCount() const {
    std::lock_guard lock(m_instanceMutex);
    return m_instances.size();
}

ref<AttribMapDesc> AttribDescManager::find(name_id className) const {
    std::shared_lock lock(m_mutex);
    auto it = m_classes.find(className);
    return it == m_classes.end() ? ref<AttribMapDesc>() : it->second;
}

bool AttribDescManager::add(ref<AttribMapDesc> desc) {
    if (!desc || desc->className().empty())
        return false;
    const name_id className = desc->className();
    std::unique_lock lock(m_mutex);
    return m_classes.emplace(className, std::move(desc)).second;
}

std::size_t AttribDescManager::size() const {
    std::shared_lock lock(m_mutex);
    return m_classes.size();
}

namespace {

std::string_view trim(std::string_view text) {
    constexpr std::string_view blanks = " \t\r\n";
    const auto first = text.find_first_not_of(blanks);
    if (first == std::string_view::npos)
        return {};
    return text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

bool equalsNoCase(std::string_view a, std::string_view b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) {
        return (x >= 'A' && x <= 'Z' ? x - 'A' + 'a' : x) == y;
    });
}

std::optional<bool> parseBool(std::string_view text) {
    text = trim(text);
    for (std::string_view yes : {"true", "1", "yes"})
        if (equalsNoCase(text, yes))
            return true;
    for (std::string_view no : {"false", "0", "no"})
        if (equalsNoCase(text, no))
            return false;
    return std::nullopt;
}

// Decimal, or hexadecimal after "0x". No sign, nothing after the digits, and
// nothing beyond 32 bits: a "-1" must not turn into 4294967295.
std::optional<std::uint32_t> parseUInt32(std::string_view text, bool allowHex) {
    text = trim(text);
    int base = 10;
    if (allowHex && text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X')) {
        text.remove_prefix(2);
        base = 16;
    }
    std::uint32_t value = 0;
    const char* end = text.data() + text.size();
    auto [ptr, ec] = std::from_chars(text.data(), end, value, base);
    if (text.empty() || ec != std::errc() || ptr != end)
        return std::nullopt;
    return value;
}

// Files write "quat" for the float quaternion.
string typeLabel(std::string_view text) {
    text = trim(text);
    const bool isArray = text.ends_with("[]");
    if (isArray)
        text.remove_suffix(2);
    string label(text == "quat" ? std::string_view("quatf") : text);
    if (isArray)
        label += "[]";
    return label;
}

struct TextField {
    const char* xml;
    string AttribDesc::*member;
};
const TextField attribTextFields[] = {
    {"label", &AttribDesc::label},
    {"control", &AttribDesc::control},
    {"initialisator", &AttribDesc::initialisator},
    {"action", &AttribDesc::action},
    {"default", &AttribDesc::defaultValue},
    {"soft_min", &AttribDesc::softMin},
    {"soft_max", &AttribDesc::softMax},
    {"units", &AttribDesc::units},
    {"enum", &AttribDesc::enumValues},
    {"help", &AttribDesc::help},
    {"precision", &AttribDesc::precision},
};

struct FlagField {
    const char* xml;
    AttribDesc::Flag flag;
};
const FlagField attribFlagFields[] = {
    {"visible", AttribDesc::visible},   {"resource", AttribDesc::resource},
    {"optional", AttribDesc::optional}, {"read-only", AttribDesc::readOnly},
    {"cmdline", AttribDesc::cmdline},   {"state", AttribDesc::state},
    {"keyable", AttribDesc::keyable},
};

struct MapTextField {
    const char* xml;
    string AttribMapDesc::*member;
};
const MapTextField mapTextFields[] = {
    {"friend", &AttribMapDesc::friendClasses},
    {"namespace", &AttribMapDesc::nameSpace},
    {"destination", &AttribMapDesc::destination},
    {"constructor", &AttribMapDesc::constructor},
    {"customDescriptor", &AttribMapDesc::customDescriptor},
};

struct MapBoolField {
    const char* xml;
    bool AttribMapDesc::*member;
};
const MapBoolField mapBoolFields[] = {
    {"abstract", &AttribMapDesc::abstract},
    {"singleInstance", &AttribMapDesc::singleInstance},
};

// Turns one parsed document into descriptors. Bad values are logged and the
// rest of the document is still read.
class DescReader {
public:
    explicit DescReader(std::string_view origin) : m_origin(origin) {}

    vector<ref<AttribMapDesc>> read(pugi::xml_node document) {
        vector<ref<AttribMapDesc>> classes;
        for (pugi::xml_node node : document.children("AttributeMap"))
            if (ref<AttribMapDesc> desc = readMap(node))
                classes.push_back(std::move(desc));
        return classes;
    }

private:
    ref<AttribMapDesc> readMap(pugi::xml_node node) {
        const char* className = node.attribute("class").value();
        if (!*className) {
            logFormatted(logSystem, logWarning,
                         "attribute descriptors| Skipping an AttributeMap without a class in '{}'.",
                         m_origin);
            return {};
        }
        ref<AttribMapDesc> desc(new AttribMapDesc(name_id(className)));
        const string where = format("class '{}' in '{}'", className, m_origin);

        if (const char* inherit = node.attribute("inherit").value(); *inherit)
            desc->inherit = name_id(inherit);
        for (const MapTextField& field : mapTextFields)
            (*desc).*field.member = node.attribute(field.xml).value();
        for (const MapBoolField& field : mapBoolFields)
            if (pugi::xml_attribute a = node.attribute(field.xml))
                if (std::optional<bool> value = readBool(a, where))
                    (*desc).*field.member = *value;
        if (pugi::xml_attribute a = node.attribute("flags")) {
            if (std::optional<std::uint32_t> value = parseUInt32(a.value(), true))
                desc->flags = *value;
            else
                logFormatted(logSystem, logWarning,
                             "attribute descriptors| Ignoring flags=\"{}\" ({}): not a number.",
                             a.value(), where);
        }

        for (pugi::xml_node child : node.children("Attribute"))
            readAttribute(*desc, child, where);
        return desc;
    }

    void readAttribute(AttribMapDesc& desc, pugi::xml_node node, const string& mapWhere) {
        const char* name = node.attribute("name").value();
        if (!*name) {
            logFormatted(
                logSystem, logWarning,
                "attribute descriptors| Skipping an Attribute without a name (class '{}' in '{}').",
                desc.className(), m_origin);
            return;
        }
        const name_id id(name);
        if (desc.findAttribute(id)) {
            // The first one stays, as for classes.
            logFormatted(logSystem, logWarning,
                         "attribute descriptors| Skipping a second attribute '{}' (class '{}' in "
                         "'{}').",
                         id, desc.className(), m_origin);
            return;
        }
        const string where = format("attribute '{}' of {}", id, mapWhere);

        ref<AttribDesc> attribute(new AttribDesc());
        attribute->name = id;
        attribute->type = readType(node);
        for (const TextField& field : attribTextFields)
            (*attribute).*field.member = node.attribute(field.xml).value();
        if (pugi::xml_attribute a = node.attribute("control-lines"))
            attribute->controlLines = parseUInt32(a.value(), false).value_or(6);
        for (const FlagField& field : attribFlagFields) {
            if (pugi::xml_attribute a = node.attribute(field.xml)) {
                if (std::optional<bool> value = readBool(a, where)) {
                    if (*value)
                        attribute->flags |= field.flag;
                    else
                        attribute->flags &= ~std::uint32_t(field.flag);
                }
            }
        }
        desc.addAttribute(std::move(attribute));
    }

    // "arrayof" names the item type (arrayof="vec3f"); a boolean arrayof marks
    // the "type" given beside it as the item type instead. An item name wins
    // over "type".
    name_id readType(pugi::xml_node node) const {
        const std::string_view type = trim(node.attribute("type").value());
        const std::string_view arrayOf = trim(node.attribute("arrayof").value());
        string label;
        if (arrayOf.empty()) {
            label = typeLabel(type);
        } else if (std::optional<bool> isArray = parseBool(arrayOf)) {
            label = typeLabel(type);
            if (*isArray && !label.empty() && !label.ends_with("[]"))
                label += "[]";
        } else {
            label = typeLabel(arrayOf);
            if (!label.ends_with("[]"))
                label += "[]";
        }
        return label.empty() ? name_id() : name_id(label);
    }

    std::optional<bool> readBool(pugi::xml_attribute a, const string& where) const {
        std::optional<bool> value = parseBool(a.value());
        if (!value)
            logFormatted(logSystem, logWarning,
                         "attribute descriptors| Ignoring {}=\"{}\" ({}): not a boolean.", a.name(),
                         a.value(), where);
        return value;
    }

    std::string_view m_origin;
};

std::size_t addParsed(AttribDescManager& manager, const pugi::xml_document& xml,
                      std::string_view origin) {
    pugi::xml_node document = xml.child("Document");
    if (!document.child("AttributeMap")) {
        logFormatted(logSystem, logError,
                     "attribute descriptors| No Document/AttributeMap element in '{}'.", origin);
        return 0;
    }
    std::size_t added = 0;
    for (ref<AttribMapDesc>& desc : DescReader(origin).read(document)) {
        const name_id className = desc->className();
        if (manager.add(std::move(desc)))
            ++added;
        else
            logFormatted(logSystem, logWarning,
                         "attribute descriptors| Class '{}' is already described; ignoring the "
                         "one in '{}'.",
                         className, origin);
    }
    return added;
}

std::size_t parseAndAdd(AttribDescManager& manager, std::string_view text,
                        std::string_view origin) {
    pugi::xml_document xml;
    const pugi::xml_parse_result result = xml.load_buffer(text.data(), text.size());
    if (!result) {
        logFormatted(logSystem, logError,
                     "attribute descriptors| Unable to load '{}': {} at offset {}.", origin,
                     result.description(), std::int64_t(result.offset));
        return 0;
    }
    return addParsed(manager, xml, origin);
}

// Reads a whole file; answers null, or why it could not. Only regular files
// are read: pugixml's own file reader sizes its buffer with ftell, which
// answers nonsense for a directory, and a FIFO would block the caller.
const char* readFile(std::string_view path, string& text) {
    if (path.find('\0') != std::string_view::npos)
        return "The path contains a NUL character"; // open() would stop at the NUL
    const string nativePath(path);
    const int fd = ::open(nativePath.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0)
        return errno == ENOENT ? "File was not found" : std::strerror(errno);
    struct Closer {
        int fd;
        ~Closer() { ::close(fd); }
    } closer{fd};
    struct stat info;
    if (::fstat(fd, &info) != 0)
        return std::strerror(errno);
    if (!S_ISREG(info.st_mode))
        return "Not a regular file";
    text.reserve(std::size_t(info.st_size));
    char chunk[65536];
    for (;;) {
        const ssize_t n = ::read(fd, chunk, sizeof(chunk));
        if (n == 0)
            return nullptr;
        if (n < 0) {
            if (errno == EINTR)
                continue;
            return std::strerror(errno);
        }
        text.append(chunk, std::size_t(n));
    }
}

// Nothing may escape a load: the host calls it while starting up.
template <class Load>
std::size_t guardedLoad(std::string_view origin, Load&& load) {
    try {
        return load();
    } catch (const std::exception& e) {
        logFormatted(logSystem, logError, "attribute descriptors| Unable to load '{}': {}.", origin,
                     e.what());
    } catch (...) {
        logFormatted(logSystem, logError,
                     "attribute descriptors| Unable to load '{}': unknown exception.", origin);
    }
    return 0;
}

} // namespace

std::size_t AttribDescManager::load(std::string_view path) {
    return guardedLoad(path, [&]() -> std::size_t {
        string text;
        if (const char* failure = readFile(path, text)) {
            logFormatted(logSystem, logError, "attribute descriptors| Unable to load '{}': {}.",
                         path, failure);
            return 0;
        }
        return parseAndAdd(*this, text, path);
    });
}

std::size_t AttribDescManager::loadFromString(std::string_view text, std::string_view origin) {
    return guardedLoad(origin, [&] { return parseAndAdd(*this, text, origin); });
}

AttribDescManager& attribDescManager() {
    // Never destroyed: descriptors are looked up while other libraries tear
    // down their statics.
    static AttribDescManager* manager = new AttribDescManager();
    return *manager;
}

} // namespace base

#include "b_plugin_factory.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "b_string_convert.h"

#include <limits>

namespace base {

namespace {

constexpr bool isDigit(char c) noexcept {
    return c >= '0' && c <= '9';
}

} // namespace

PluginFactory::PluginFactory(std::string_view name, AttribFactory* attributes)
    : m_settings(attributes), m_attributes(attributes), m_name(name) {
    m_patches.emplace_back(new PluginPatch("root"));
}

PluginFactory::~PluginFactory() {
    vector<IPlugin*> instances;
    {
        std::lock_guard guard(m_critical);
        instances.swap(m_instances);
        // From here on no object reaches back into the dying factory.
        for (IPlugin* plugin : instances)
            if (plugin)
                plugin->m_factory = nullptr;
        for (IPlugin* plugin : m_unregistered)
            plugin->m_factory = nullptr;
        m_unregistered.clear();
    }
    // Emptying every map first breaks the cycles formed through plug-in
    // references; objects released on the way (unregistered ones, references
    // out of the table) are freed here without recursing through the table.
    for (IPlugin* plugin : instances)
        if (plugin)
            plugin->clear();
    for (IPlugin* plugin : instances)
        if (plugin)
            plugin->release();
}

// ---- Descriptors ------------------------------------------------------------------

bool PluginFactory::registerPlugin(ref<IPluginDesc> descriptor) {
    if (!descriptor)
        return false;
    WriteGuard guard(m_lock);
    return m_descriptors.try_emplace(descriptor->typeName(), std::move(descriptor)).second;
}

ref<IPluginDesc> PluginFactory::descriptor(name_id type) const {
    ReadGuard guard(m_lock);
    auto it = m_descriptors.find(type);
    return it == m_descriptors.end() ? ref<IPluginDesc>() : it->second;
}

vector<name_id> PluginFactory::types() const {
    ReadGuard guard(m_lock);
    vector<name_id> out;
    out.reserve(m_descriptors.size());
    for (const auto& entry : m_descriptors)
        out.push_back(entry.first);
    return out;
}

vector<ref<IPluginDesc>> PluginFactory::placeholders() const {
    ReadGuard guard(m_lock);
    return m_placeholders;
}

ref<IPluginDesc> PluginFactory::placeholder(name_id type) {
    ref<IPluginDesc> made(new DummyPluginDesc(type));
    WriteGuard guard(m_lock);
    // Another thread may have made it meanwhile.
    auto [it, inserted] = m_descriptors.try_emplace(type, made);
    if (inserted) {
        try {
            m_placeholders.push_back(made);
        } catch (...) {
            m_descriptors.erase(it);
            throw;
        }
    }
    return it->second;
}

// ---- Objects ------------------------------------------------------------------------

ref<IPlugin> PluginFactory::create(name_id type, std::uint32_t flags) {
    ref<IPluginDesc> desc = descriptor(type);
    if (!desc) {
        if (flags & (createNullIfUnknown | createReportUnknown))
            logFormatted(logSystem, logError,
                         "plugin factory {}| Unable to create plugin of type {}!{}", m_name, type,
                         (flags & createNullIfUnknown)
                             ? ""
                             : " Creating a general plugin with limited functionality...");
        if (flags & createNullIfUnknown)
            return {};
        desc = placeholder(type);
    }

    if (flags & createUnregistered) {
        ref<IPlugin> plugin(desc->create(*this, invalidPluginId));
        if (plugin)
            bind(*plugin, invalidPluginId);
        return plugin;
    }

    std::lock_guard guard(m_critical);
    // The slot is taken before the object exists, so that objects a descriptor
    // creates on the way get the following ids.
    const auto id = std::uint32_t(m_instances.size());
    if (id == invalidPluginId)
        BASE_THROW(exception, "plugin factory {}| The instance table is full!", m_name);
    m_instances.push_back(nullptr);
    IPlugin* plugin;
    try {
        plugin = desc->create(*this, id);
    } catch (...) {
        dropSlot(id);
        throw;
    }
    if (!plugin) {
        dropSlot(id);
        return {};
    }
    bind(*plugin, id); // cannot throw for a table id
    plugin->addRef();
    m_instances[id] = plugin;
    return ref<IPlugin>(plugin);
}

void PluginFactory::dropSlot(std::uint32_t id) noexcept {
    // A slot that later objects already follow stays as an empty slot.
    if (id + 1 == m_instances.size())
        m_instances.pop_back();
}

void PluginFactory::bind(IPlugin& plugin, std::uint32_t id) {
    // Descriptors store factory and id themselves; this only corrects one
    // that stored something else, so the bookkeeping stays exact.
    const bool tracked = plugin.m_factory && plugin.m_instanceId == invalidPluginId;
    if (plugin.m_factory == this && plugin.m_instanceId == id)
        return;
    if (tracked)
        plugin.m_factory->forgetUnregistered(&plugin);
    plugin.m_factory = this;
    plugin.m_instanceId = id;
    if (id == invalidPluginId)
        trackUnregistered(&plugin);
}

void PluginFactory::trackUnregistered(IPlugin* plugin) {
    std::lock_guard guard(m_critical);
    m_unregistered.insert(plugin);
}

void PluginFactory::forgetUnregistered(IPlugin* plugin) noexcept {
    std::lock_guard guard(m_critical);
    m_unregistered.erase(plugin);
}

std::uint32_t PluginFactory::pluginCount() const {
    std::lock_guard guard(m_critical);
    return std::uint32_t(m_instances.size());
}

ref<IPlugin> PluginFactory::plugin(std::uint32_t id) const {
    std::lock_guard guard(m_critical);
    return id < m_instances.size() ? ref<IPlugin>(m_instances[id]) : ref<IPlugin>();
}

// ---- Names --------------------------------------------------------------------------

void PluginFactory::updateNames() {
    const name_id nameKey = nameAttributeName();
    const auto count = std::uint32_t(m_instances.size());
    std::uint32_t next = m_nameCursor;
    for (std::uint32_t id = m_nameCursor; id < count; ++id) {
        const IPlugin* plugin = m_instances[id];
        if (!plugin)
            continue;
        const string* name = plugin->findAttribute<string>(nameKey);
        if (!name || name->empty())
            continue;
        m_names.try_emplace(*name, id);
        next = id + 1;
    }
    // Unnamed objects after the last named one are looked at again next time:
    // they are usually named right after they were made.
    m_nameCursor = next;
}

IPlugin* PluginFactory::scanForName(std::string_view name) const {
    const name_id nameKey = nameAttributeName();
    for (IPlugin* plugin : m_instances) {
        if (!plugin)
            continue;
        const string* own = plugin->findAttribute<string>(nameKey);
        if (own && *own == name)
            return plugin;
    }
    return nullptr;
}

ref<IPlugin> PluginFactory::findPlugin(std::string_view name) {
    std::lock_guard guard(m_critical);
    updateNames();
    if (auto it = m_names.find(name); it != m_names.end()) {
        IPlugin* plugin = m_instances[it->second];
        const string* own = plugin ? plugin->findAttribute<string>(nameAttributeName()) : nullptr;
        if (own && *own == name)
            return ref<IPlugin>(plugin);
    }
    // The index keeps only first sightings; a renamed object needs the scan.
    return ref<IPlugin>(scanForName(name));
}

string PluginFactory::uniqueName(std::string_view base) {
    std::lock_guard guard(m_critical);
    updateNames();
    if (!m_names.contains(base))
        return string(base);

    std::size_t cut = base.size();
    while (cut && isDigit(base[cut - 1]))
        --cut;
    std::string_view stem = base.substr(0, cut);
    std::uint64_t start = 1;
    if (cut < base.size()) {
        std::uint64_t value = 0;
        bool fits = true;
        for (char c : base.substr(cut)) {
            const unsigned digit = unsigned(c - '0');
            if (value > (std::numeric_limits<std::uint64_t>::max() - 1 - digit) / 10) {
                fits = false;
                break;
            }
            value = value * 10 + digit;
        }
        // Digits too long for a counter stay part of the stem.
        if (fits)
            start = value + 1;
        else
            stem = base;
    }

    string key;
    appendUnsigned(key, start);
    key += '|';
    key.append(stem.data(), stem.size());
    std::uint64_t& counter = m_counters.try_emplace(std::move(key), start).first->second;

    // Names are never taken out of the set, so every counter below the one
    // where the last search stopped is still taken.
    string candidate(stem);
    for (;; ++counter) {
        candidate.resize(stem.size());
        appendUnsigned(candidate, counter);
        if (!m_names.contains(std::string_view(candidate)))
            return candidate;
    }
}

// ---- References ---------------------------------------------------------------------

bool PluginFactory::restoreReferences(Attribute& attribute, name_id name) {
    // The object with the id, or null after the message for 'name' (and the
    // item index of an array item).
    auto lookup = [&](std::uint32_t id, const std::uint32_t* item) -> ref<IPlugin> {
        ref<IPlugin> found = plugin(id);
        if (found)
            return found;
        const bool outOfBounds = id >= pluginCount();
        if (item && outOfBounds)
            logFormatted(logSystem, logError,
                         "plugin factory| Invalid plugin attribute detected for '{},{}'! Id {} out "
                         "of bounds!",
                         name, *item, id);
        else if (item)
            logFormatted(logSystem, logError,
                         "plugin factory| Invalid plugin attribute detected for '{},{}'! Plugin "
                         "not set!",
                         name, *item);
        else if (outOfBounds)
            logFormatted(logSystem, logError,
                         "plugin factory| Invalid plugin attribute detected for '{}'! Id {} out of "
                         "bounds!",
                         name, id);
        else
            logFormatted(logSystem, logError,
                         "plugin factory| Invalid plugin attribute detected for '{}'! Plugin not "
                         "set!",
                         name);
        return found;
    };

    if (auto* single = dynamic_cast<PluginAttribute*>(&attribute)) {
        if (single->value() || single->pendingId() == invalidPluginId)
            return true;
        ref<IPlugin> found = lookup(single->pendingId(), nullptr);
        if (found)
            single->setValue(std::move(found));
        return bool(single->value());
    }
    if (auto* items = dynamic_cast<PluginVectorAttribute*>(&attribute)) {
        bool all = true;
        auto& values = items->items();
        const auto& ids = items->pendingIds();
        for (std::uint32_t i = 0; i < values.size() && i < ids.size(); ++i) {
            if (values[i] || ids[i] == invalidPluginId)
                continue;
            values[i] = lookup(ids[i], &i);
            all = all && values[i];
        }
        return all;
    }
    bool all = true;
    if (AttribMap* map = attribute.asMap()) {
        for (const auto& [key, value] : map->entries())
            all = restoreReferences(*value, key) && all;
    } else if (AttribArray* array = attribute.asArray()) {
        for (Attribute* item : array->items())
            if (item)
                all = restoreReferences(*item, name) && all;
    }
    return all;
}

// ---- Change notification ------------------------------------------------------------

void PluginFactory::attributeChanged(IPlugin& plugin, name_id attribute) {
    plugin.notify(attribute, PluginCallback::changeKind, PluginCallback::nextChangeStamp());
}

} // namespace base

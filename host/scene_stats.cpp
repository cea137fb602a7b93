#include "scene_stats.h"

#include "b_format.h"
#include "b_type_traits.h"
#include "scene_schema.h"

#include <algorithm>
#include <cstdio>

namespace host {

namespace {

template <class T>
bool holds(const base::Attribute& attribute) {
    return attribute.typeName() == base::TypeTraits<T>::n_name;
}

template <class T>
bool holdsArray(const base::Attribute& attribute) {
    return attribute.typeName() == base::TypeTraits<T>::n_array_name;
}

std::uint32_t itemCount(const base::AttribMap& map, base::name_id name) {
    const base::Attribute* attribute = resolvedAttribute(map, name);
    return attribute ? attribute->size() : 0;
}

std::uint64_t primitiveFaces(const base::AttribMap& primitive, std::uint32_t indexTotal) {
    const base::Attribute* vcounts = resolvedAttribute(primitive, scene::names::vcounts);
    if (!vcounts)
        return 0;
    if (holdsArray<std::uint16_t>(*vcounts))
        return vcounts->size();
    if (!holds<std::uint16_t>(*vcounts))
        return 0;
    const std::uint16_t faceSize = *static_cast<const std::uint16_t*>(vcounts->data());
    if (faceSize == 0)
        return 0;
    std::uint32_t indices = indexTotal;
    const base::Attribute* count = resolvedAttribute(primitive, scene::names::indexCount);
    if (count && holds<std::uint32_t>(*count))
        indices = *static_cast<const std::uint32_t*>(count->data());
    return indices / faceSize;
}

} // namespace

const base::Attribute* resolvedAttribute(const base::AttribMap& map, base::name_id name) {
    base::Attribute* attribute = map.findInherited(name);
    if (attribute)
        if (base::AttribLink* link = attribute->asLink())
            return link->resolve();
    return attribute;
}

std::uint64_t faceCount(const base::AttribMap& mesh) {
    const base::Attribute* primitives = resolvedAttribute(mesh, scene::names::primitives);
    if (!primitives)
        return 0;
    auto* array = const_cast<base::Attribute*>(primitives)->asArray();
    if (!array)
        return 0;
    const std::uint32_t indexTotal = itemCount(mesh, scene::names::indices);
    std::uint64_t faces = 0;
    for (base::Attribute* item : array->items())
        if (const base::AttribMap* primitive = item ? item->asMap() : nullptr)
            faces += primitiveFaces(*primitive, indexTotal);
    return faces;
}

SceneStats collectStats(const base::PluginFactory& factory) {
    SceneStats stats;
    const std::uint32_t count = factory.pluginCount();
    for (std::uint32_t id = 0; id < count; ++id) {
        base::ref<base::IPlugin> plugin = factory.plugin(id);
        if (!plugin)
            continue;
        const base::name_id type = plugin->className();
        const std::string_view typeText = type.view().empty() ? "?" : type.view();
        auto slot = std::find_if(stats.types.begin(), stats.types.end(),
                                 [&](const auto& entry) { return entry.first == typeText; });
        if (slot == stats.types.end())
            stats.types.emplace_back(base::string(typeText), 1);
        else
            ++slot->second;

        if (type == scene::names::mesh) {
            MeshCounts mesh{plugin->name(), itemCount(*plugin, scene::names::positions),
                            faceCount(*plugin)};
            stats.vertices += mesh.vertices;
            stats.faces += mesh.faces;
            stats.meshes.push_back(std::move(mesh));
        } else if (type == scene::names::skin) {
            stats.joints += itemCount(*plugin, scene::names::joints);
        }
    }
    return stats;
}

base::string formatSummary(const SceneStats& stats, double seconds) {
    base::string out;
    auto line = [&](std::string_view label, std::uint64_t value) {
        char buffer[96];
        std::snprintf(buffer, sizeof buffer, "%-20.*s %12llu\n", int(label.size()), label.data(),
                      static_cast<unsigned long long>(value));
        out += buffer;
    };
    for (const auto& [type, count] : stats.types)
        line(type, count);
    line("vertices", stats.vertices);
    line("faces", stats.faces);
    line("joints", stats.joints);
    char buffer[64];
    std::snprintf(buffer, sizeof buffer, "%-20s %12.3f s\n", "time", seconds);
    out += buffer;
    return out;
}

} // namespace host

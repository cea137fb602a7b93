#include "listing.h"

#include "b_format.h"
#include "b_type_traits.h"
#include "scene_getter.h"
#include "scene_interfaces.h"
#include "scene_schema.h"

#include <algorithm>
#include <charconv>
#include <initializer_list>

namespace host {

namespace {

using Children = base::ArrayOf<base::ref<base::IPlugin>>;

const Children* childrenOf(const base::IPlugin& node) {
    const base::Attribute* found = node.findEntry(scene::names::children);
    if (!found || found->typeName() != base::TypeTraits<base::ref<base::IPlugin>>::n_array_name)
        return nullptr;
    return static_cast<const Children*>(
        const_cast<base::Attribute*>(found)->data(base::wholeValue));
}

// Walks a scene's node tree once, depth first, placing every object of the
// type met on the way. A node met again on the current path (a cycle) is not
// entered; an object keeps the first place it was met at.
class Walker {
public:
    Walker(base::name_id type, base::map<const base::IPlugin*, Placement*>& slots)
        : m_type(type), m_slots(slots) {}

    void walk(base::IPlugin& node, const base::mat43& parent, const base::string& parentPath) {
        const auto* hierarchical = scene::query<scene::IHierarchical>(node);
        if (!hierarchical || m_onPath.contains(&node))
            return;
        const Children* children = childrenOf(node);
        if (!children)
            return;
        const base::mat43 world = parent * hierarchical->localTransformation();
        const base::string path = parentPath.empty() ? node.name() : parentPath + "/" + node.name();
        m_onPath.emplace(&node, true);
        for (const base::ref<base::IPlugin>& child : *children) {
            if (!child)
                continue;
            if (child->className() == m_type) {
                place(*child, world, path);
                continue;
            }
            walk(*child, world, path);
        }
        m_onPath.erase(&node);
    }

private:
    void place(const base::IPlugin& object, const base::mat43& world, const base::string& path) {
        const auto slot = m_slots.find(&object);
        if (slot == m_slots.end() || !slot->second->path.empty())
            return;
        Placement& placement = *slot->second;
        placement.path = path;
        placement.position = world.t;
        placement.direction = world.transformVector({0, 0, -1}).normalized();
    }

    base::name_id m_type;
    base::map<const base::IPlugin*, Placement*>& m_slots;
    base::map<const base::IPlugin*, bool> m_onPath;
};

// Never the locale's decimal comma: the lines are read back by scripts.
// Positions keep nine significant digits, float attributes seven.
void appendNumbers(base::string& line, std::string_view label, std::initializer_list<double> values,
                   int digits = 7) {
    line += label;
    for (const double value : values) {
        char buffer[32];
        const auto end =
            std::to_chars(buffer, buffer + sizeof buffer, value, std::chars_format::general, digits)
                .ptr;
        line += ' ';
        line.append(buffer, end);
    }
}

std::string_view lightTypeName(const base::IPlugin& light) {
    using L = scene::light_schema;
    if (!light.findEntry(L::lightType()))
        return "unset";
    switch (SCENE_GET(light, L, lightType)) {
    case 0:
        return "directional";
    case 1:
        return "point";
    case 2:
        return "spot";
    case 3:
        return "area";
    default:
        return "other";
    }
}

base::string line(const Placement& placement) {
    const base::IPlugin& object = *placement.object;
    base::string out = base::format("{}\t{}\t{}", object.className().view(), object.name(),
                                    placement.path.empty() ? base::string("-") : placement.path);
    const base::vec3d& p = placement.position;
    const base::vec3d& d = placement.direction;
    if (!placement.path.empty()) {
        appendNumbers(out, "\tposition", {p.x, p.y, p.z}, 9);
        appendNumbers(out, "\tdirection", {d.x, d.y, d.z}, 9);
    }
    if (object.className() == scene::names::camera) {
        using C = scene::camera_schema;
        const base::vec2f sensor = SCENE_GET(object, C, sensor);
        appendNumbers(out, "\tfocalLength", {SCENE_GET(object, C, focalLength)});
        appendNumbers(out, "\tsensor", {sensor.x, sensor.y});
    } else {
        using L = scene::light_schema;
        const std::string_view type = lightTypeName(object);
        const base::vec3f color = SCENE_GET(object, L, color);
        out += "\ttype ";
        out += type;
        appendNumbers(out, "\tcolor", {color.x, color.y, color.z});
        if (type == "spot") {
            appendNumbers(out, "\tcone", {SCENE_GET(object, L, spotConeAngle)});
            appendNumbers(out, " penumbra", {SCENE_GET(object, L, spotPenumbraAngle)});
        } else if (type == "area") {
            appendNumbers(out, "\tsize", {SCENE_GET(object, L, size)});
            appendNumbers(out, " ratio", {SCENE_GET(object, L, sizeRatio)});
        }
    }
    out += '\n';
    return out;
}

} // namespace

constexpr std::pair<std::string_view, ListKind> kindNames[] = {{"cameras", ListKind::cameras},
                                                               {"lights", ListKind::lights},
                                                               {"nodes", ListKind::nodes},
                                                               {"poses", ListKind::poses}};

bool parseListKinds(std::string_view text, base::vector<ListKind>& kinds, base::string& error) {
    kinds.clear();
    while (true) {
        const auto comma = text.find(',');
        const std::string_view word = text.substr(0, comma);
        const auto* known = std::find_if(std::begin(kindNames), std::end(kindNames),
                                         [&](const auto& entry) { return entry.first == word; });
        if (known == std::end(kindNames)) {
            error = base::format(
                "--list takes cameras, lights, nodes or poses (several separated by commas), "
                "not '{}'",
                word);
            return false;
        }
        kinds.push_back(known->second);
        if (comma == std::string_view::npos)
            return true;
        text.remove_prefix(comma + 1);
    }
}

base::vector<Placement> placements(const base::PluginFactory& factory, base::name_id type) {
    base::vector<Placement> out;
    base::vector<base::ref<base::IPlugin>> scenes;
    const std::uint32_t count = factory.pluginCount();
    for (std::uint32_t id = 0; id < count; ++id) {
        base::ref<base::IPlugin> object = factory.plugin(id);
        if (!object)
            continue;
        if (object->className() == type)
            out.push_back(Placement{object.get(), {}, {}, {}});
        else if (object->className() == scene::names::scene)
            scenes.push_back(object);
    }
    if (out.empty())
        return out;

    base::map<const base::IPlugin*, Placement*> slots;
    for (Placement& placement : out)
        slots.emplace(placement.object, &placement);
    Walker walker(type, slots);
    for (const base::ref<base::IPlugin>& sceneObject : scenes)
        if (const auto* root =
                sceneObject->findAttribute<base::ref<base::IPlugin>>(scene::scene_schema::root());
            root && *root)
            walker.walk(**root, base::mat43::identity(), {});
    return out;
}

base::vector<NodeWorld> nodeWorlds(const base::PluginFactory& factory) {
    base::vector<NodeWorld> out;
    // A node listed under its own subtree is walked once.
    base::map<const base::IPlugin*, bool> seen;
    struct Pending {
        const base::IPlugin* node;
        base::mat43 parent;
    };
    base::vector<Pending> pending;
    for (std::uint32_t id = 0; id < factory.pluginCount(); ++id) {
        base::ref<base::IPlugin> object = factory.plugin(id);
        if (!object || object->className() != scene::names::scene)
            continue;
        const auto* root = object->findAttribute<base::ref<base::IPlugin>>(scene::names::root);
        if (!root || !*root)
            continue;
        pending.push_back({root->get(), base::mat43::identity()});
        while (!pending.empty()) {
            const Pending next = pending.back();
            pending.pop_back();
            if (!seen.emplace(next.node, true).second)
                continue;
            const auto* hierarchical = scene::query<scene::IHierarchical>(*next.node);
            const base::mat43 world =
                hierarchical ? next.parent * hierarchical->localTransformation() : next.parent;
            out.push_back({next.node, world});
            if (const Children* children = childrenOf(*next.node))
                for (std::size_t c = children->size(); c-- > 0;)
                    if ((*children)[c] && (*children)[c]->className() == scene::names::node)
                        pending.push_back({(*children)[c].get(), world});
        }
    }
    return out;
}

base::string formatListing(const base::PluginFactory& factory,
                           const base::vector<ListKind>& kinds) {
    base::string out;
    const auto asked = [&](ListKind kind) {
        return std::find(kinds.begin(), kinds.end(), kind) != kinds.end();
    };
    for (const ListKind kind : {ListKind::cameras, ListKind::lights}) {
        if (!asked(kind))
            continue;
        const base::name_id type =
            kind == ListKind::cameras ? scene::names::camera : scene::names::light;
        for (const Placement& placement : placements(factory, type))
            out += line(placement);
    }
    if (!asked(ListKind::nodes) && !asked(ListKind::poses))
        return out;
    const base::vector<NodeWorld> worlds = nodeWorlds(factory);
    if (asked(ListKind::nodes))
        for (const NodeWorld& n : worlds) {
            out += n.node->name(true);
            appendNumbers(out, "", {n.world.t.x, n.world.t.y, n.world.t.z}, 9);
            out += '\n';
        }
    if (asked(ListKind::poses))
        for (const NodeWorld& n : worlds) {
            const auto t = scene::get(*n.node, scene::names::translate, base::vec3d{});
            const auto r = scene::get(*n.node, scene::names::rotate, base::quatf::identity());
            const auto s = scene::get(*n.node, scene::names::scale, base::vec3f{1, 1, 1});
            out += n.node->name(true);
            appendNumbers(out, "",
                          {t.x, t.y, t.z, double(r.w), double(r.x), double(r.y), double(r.z),
                           double(s.x), double(s.y), double(s.z)},
                          9);
            out += '\n';
        }
    return out;
}

} // namespace host

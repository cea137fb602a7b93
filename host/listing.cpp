#include "listing.h"

#include "b_cmdline.h"
#include "b_format.h"
#include "b_plugin_attribute.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include <cstdio>

namespace host {

base::CmdLineValue<base::string>* registerListing(base::CmdLineOptions& options) {
    return options.addValue<base::string>(
        "--list", {},
        "Print one line per object of a kind after the import: nodes (world "
        "position of every node).");
}

base::vector<NodeWorld> nodeWorlds(const base::PluginFactory& factory) {
    base::vector<NodeWorld> out;
    base::map<const base::IPlugin*, bool>
        seen; // a node listed under its own subtree is walked once
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
            if (const auto* children =
                    next.node->findVecAttribute<base::ref<base::IPlugin>>(scene::names::children))
                for (std::size_t c = children->size(); c-- > 0;)
                    if ((*children)[c] && (*children)[c]->className() == scene::names::node)
                        pending.push_back({(*children)[c].get(), world});
        }
    }
    return out;
}

namespace {

void listNodes(const base::PluginFactory& factory, base::string& out) {
    for (const NodeWorld& n : nodeWorlds(factory)) {
        char line[160];
        std::snprintf(line, sizeof line, " %.9g %.9g %.9g\n", n.world.t.x, n.world.t.y,
                      n.world.t.z);
        out += n.node->name(true);
        out += line;
    }
}

// Every node's local "translate", "rotate" and "scale" as read through the
// node (so animated ones show the played values): name, then 3 + 4 + 3 numbers.
void listPoses(const base::PluginFactory& factory, base::string& out) {
    for (const NodeWorld& n : nodeWorlds(factory)) {
        const auto t = scene::get(*n.node, scene::names::translate, base::vec3d{});
        const auto r = scene::get(*n.node, scene::names::rotate, base::quatf::identity());
        const auto s = scene::get(*n.node, scene::names::scale, base::vec3f{1, 1, 1});
        char line[320];
        std::snprintf(line, sizeof line, " %.9g %.9g %.9g %.9g %.9g %.9g %.9g %.9g %.9g %.9g\n",
                      t.x, t.y, t.z, double(r.w), double(r.x), double(r.y), double(r.z),
                      double(s.x), double(s.y), double(s.z));
        out += n.node->name(true);
        out += line;
    }
}

struct Listing {
    const char* kind;
    void (*list)(const base::PluginFactory&, base::string&);
};
constexpr Listing listings[] = {{"nodes", &listNodes}, {"poses", &listPoses}};

} // namespace

bool listObjects(const base::PluginFactory& factory, const base::string& kind, base::string& out,
                 base::string& error) {
    for (const Listing& l : listings)
        if (kind == l.kind) {
            l.list(factory, out);
            return true;
        }
    error = base::format("--list: unknown kind '{}' (known: nodes, poses)", kind);
    return false;
}

} // namespace host

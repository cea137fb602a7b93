// Imports a model through the installed importer module and prints the node
// tree: each node's path and world position, and each mesh's vertex count.
//
// usage: embed_import MODEL
#include "b_attrib_map.h"
#include "b_plugin_factory.h"
#include "scene_importer.h"
#include "scene_interfaces.h"
#include "scene_module.h"

#include <cstdio>

namespace {

// One line per node, indented by its depth: "node NAME X Y Z"; one per mesh
// below it: "mesh NAME N vertices".
void printNode(base::IPlugin& node, const base::mat43& parentWorld, int depth) {
    auto* hierarchical = static_cast<scene::IHierarchical*>(
        node.queryInterface(scene::IHierarchical::interfaceName()));
    const base::mat43 world =
        hierarchical ? parentWorld * hierarchical->localTransformation() : parentWorld;
    const base::vec3d position = world.t;
    std::printf("%*snode %s %.9g %.9g %.9g\n", 2 * depth, "", node.name(true).c_str(), position.x,
                position.y, position.z);

    const auto* children = node.findVecAttribute<base::ref<base::IPlugin>>(scene::names::children);
    if (!children)
        return;
    for (const base::ref<base::IPlugin>& child : *children) {
        if (!child)
            continue;
        if (child->className() == scene::names::node) {
            printNode(*child, world, depth + 1);
        } else if (const auto* positions =
                       child->findVecAttribute<base::vec3f>(scene::names::positions)) {
            std::printf("%*smesh %s %zu vertices\n", 2 * depth + 2, "", child->name(true).c_str(),
                        positions->size());
        }
    }
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: %s MODEL\n", argv[0]);
        return 2;
    }
    // 1. A factory that knows the scene types, and the importer module in it.
    base::ref<base::PluginFactory> factory(new base::PluginFactory("embed"));
    scene::register_scene_schema(*factory);
    scene::ModuleLoader module;
    base::string error;
    if (!module.load(scene::ModuleLoader::defaultPath(), *factory, error)) {
        std::fprintf(stderr, "%s\n", error.c_str());
        return 1;
    }
    // 2. An importer object with its default options.
    base::ref<base::IPlugin> importer =
        factory->create("AssimpImporter", base::PluginFactory::createNullIfUnknown |
                                              base::PluginFactory::createReportUnknown |
                                              base::PluginFactory::createUnregistered);
    auto* sceneImporter = importer ? static_cast<scene::ISceneImporter*>(importer->queryInterface(
                                         scene::ISceneImporter::interfaceName()))
                                   : nullptr;
    if (!sceneImporter) {
        std::fprintf(stderr, "the module offers no AssimpImporter\n");
        return 1;
    }
    sceneImporter->describeOptions(*importer);
    // 3. The import: scene objects land in the factory.
    if (!sceneImporter->import(*factory, argv[1])) {
        std::fprintf(stderr, "cannot import '%s'\n", argv[1]);
        return 1;
    }

    for (std::uint32_t id = 0; id < factory->pluginCount(); ++id) {
        base::ref<base::IPlugin> object = factory->plugin(id);
        if (!object || object->className() != scene::names::scene)
            continue;
        if (const auto* root = object->findAttribute<base::ref<base::IPlugin>>(scene::names::root);
            root && *root)
            printNode(**root, base::mat43::identity(), 0);
    }
    return 0;
}

#include "scene_importer.h"

namespace scene {

base::name_id ISceneImporter::interfaceName() {
    static const ::base::name_id name("ISceneImporter");
    return name;
}

SceneImportPlugin::SceneImportPlugin(::base::IPluginDesc* descriptor,
                                     ::base::PluginFactory* factory, std::uint32_t id)
    : ::base::IPlugin(descriptor, factory, id) {
    addInterface(static_cast<ISceneImporter*>(this));
}

} // namespace scene

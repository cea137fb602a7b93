// Loads an importer module (a shared object exporting loadScenePlugin and
// unloadScenePlugin) and runs its entry point against a factory. This is how
// a host, or a program embedding the importer, brings "AssimpImporter" into
// its factory:
//
//     base::PluginFactory factory;
//     scene::register_scene_schema(factory);
//     scene::ModuleLoader module;
//     module.load(scene::ModuleLoader::defaultPath(), factory, error);
//
// The loader must outlive every factory the entry registered types in (their
// descriptors' code lives in the module); the module itself stays mapped until
// the process ends.
#pragma once

#include "b_memory.h"
#include "b_plugin_factory.h"

#include <string_view>

namespace scene {

class ModuleLoader : base::NonCopyable {
public:
    // The environment variable that names the module file, ahead of every
    // other place.
    static constexpr const char* pathVariable = "SCENE_ASSIMP_MODULE";

    ModuleLoader() = default;
    // Calls the module's unload entry and drops the handle.
    ~ModuleLoader();

    // Where the importer module is looked for, first match wins:
    //   1. the file named by $SCENE_ASSIMP_MODULE;
    //   2. the installed layout: scene_assimp/plugins/scene_assimp.so in the
    //      folder this library was loaded from (lib/ of the prefix);
    //   3. scene_assimp.so beside the running executable (a build tree).
    // When none exists, the last candidate is answered, so the load names it.
    static base::string defaultPath();

    // Maps the module and calls loadScenePlugin(factory). False with a
    // one-line reason in 'error' when the file does not load, lacks the entry
    // points or the entry answers non-zero.
    bool load(std::string_view path, base::PluginFactory& factory, base::string& error);

private:
    void* m_handle = nullptr;
    int (*m_unload)() = nullptr;
};

} // namespace scene

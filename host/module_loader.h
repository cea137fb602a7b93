// Loads the importer module with dlopen and runs its entry point against a
// factory. The loader must outlive every factory the entry registered types
// in (their descriptors' code lives in the module); the module itself stays
// mapped until the process ends.
#pragma once

#include "b_memory.h"
#include "b_plugin_factory.h"

#include <string_view>

namespace host {

class ModuleLoader : base::NonCopyable {
public:
    ModuleLoader() = default;
    // Calls the module's unload entry and drops the handle.
    ~ModuleLoader();

    // The module's file beside the running executable.
    static base::string defaultPath();

    // Maps the module and calls loadScenePlugin(factory). False with a
    // one-line reason in 'error' when the file does not load, lacks the entry
    // points or the entry answers non-zero.
    bool load(std::string_view path, base::PluginFactory& factory, base::string& error);

private:
    void* m_handle = nullptr;
    int (*m_unload)() = nullptr;
};

} // namespace host

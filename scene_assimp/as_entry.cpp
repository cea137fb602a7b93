// The module's two exported entry points; everything else is hidden.
#include "as_plugin_desc.h"

#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"
#include "scene_schema.h"

#include <cstdint>
#include <exception>

#define AS_EXPORT extern "C" __attribute__((visibility("default")))

// Registers the "AssimpImporter" type with 'factory', which must already hold
// the scene types. A factory that has the type keeps its descriptor. Always 0:
// nothing is thrown into the host, failures are logged.
AS_EXPORT std::int32_t loadScenePlugin(base::PluginFactory& factory) {
    try {
        try {
            scene::init_schema_names();
            scene::init_importer_schema_names();
            base::ref<base::IPluginDesc> descriptor(new AssimpPluginDesc());
            factory.registerPlugin(descriptor);
        } catch (const base::exception& e) {
            e.log(base::log());
        } catch (const std::exception& e) {
            base::logFormatted(base::logSystem, base::logCritical,
                               "assimp| Unable to register the importer: {}", e.what());
        }
    } catch (...) {
        // Even the failure report failed; the host still must not see it.
    }
    return 0;
}

// The factory owns the descriptor and every importer; nothing to release.
AS_EXPORT std::int32_t unloadScenePlugin() {
    return 0;
}

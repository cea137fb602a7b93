// The descriptor of the "AssimpImporter" type: makes importer objects and
// answers the file extensions assimp reads.
#pragma once

#include "b_memory.h"
#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "scene_importer.h"

#include <cstdint>
#include <string_view>

class AssimpPluginDesc final : public scene::IScenePluginDesc {
public:
    // Type "AssimpImporter", with assimp's legal notice as its legal text.
    AssimpPluginDesc();

    base::IPlugin* create(base::PluginFactory& factory, std::uint32_t id) override;
    // "3ds;obj;..." for the whole run of the module; asked of assimp on the
    // first request (and again while assimp answers nothing).
    const base::string& supportedExtensions() override;
    const base::string& secondaryText() override;
};

namespace as {

// assimp's "*.3ds;*.obj" form without its '*' and '.' characters: "3ds;obj".
base::string stripExtensionList(std::string_view list);

} // namespace as

// The interfaces of scene importers and of their descriptors.
//
// A host creates an importer by its type name, asks the object for its
// ISceneImporter interface, lets it write its option defaults, sets the
// options it wants as attributes of the object and imports files into a
// factory. The importer's descriptor also answers the file extensions it
// reads.
#pragma once

#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "scene_schema.h"

namespace scene {

// The operations every scene importer answers; the options are attributes
// of the importer object itself (sceneImporter_schema names them).
class ISceneImporter : public ::base::IPluginInterface, public sceneImporter_schema {
public:
    static ::base::name_id interfaceName();
    ::base::name_id typeName() const final { return interfaceName(); }

    // Reserved query of the interface; always 0.
    virtual std::uintptr_t reserved() const { return 0; }
    // Whether the importer can run in this process.
    virtual bool available() const { return true; }
    // Writes every option the importer understands with its default into
    // 'options' and names the map's type "sceneImporter".
    virtual void describeOptions(::base::AttribMap& options) = 0;
    // Reads the file at 'path' into objects created in 'factory'. False when
    // nothing could be read; true otherwise, also when the conversion stopped
    // early (what was built stays in the factory).
    virtual bool import(::base::PluginFactory& factory, const ::base::string& path) = 0;
};

// A plug-in object that is an importer: queries for "ISceneImporter" answer
// its ISceneImporter part.
class SceneImportPlugin : public ::base::IPlugin, public ISceneImporter {
public:
    SceneImportPlugin(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                      std::uint32_t id);
    using ::base::IPlugin::data;
    using ::base::IPlugin::name;
    using ::base::IPlugin::size;
    using ::base::IPlugin::typeName;

    ::base::IPlugin* interfaceOwner() const override {
        return const_cast<SceneImportPlugin*>(this);
    }
};

// The descriptor of an importer type.
class IScenePluginDesc : public ::base::IPluginDesc {
public:
    // The extensions the importer reads, without "*" and ".", separated by
    // ";" ("3ds;obj"). The string lives as long as the module.
    virtual const ::base::string& supportedExtensions() = 0;
    // A second text of the descriptor; empty unless the importer has one.
    virtual const ::base::string& secondaryText() = 0;
};

} // namespace scene

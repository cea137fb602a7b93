#include "preview_switches.h"

#include "b_format.h"
#include "scene_preview.h"
#include "scene_schema.h"

#include <cstdio>

namespace host::preview {

PreviewSwitches registerSwitches(base::CmdLineOptions& options) {
    PreviewSwitches s;
    s.output = options.addValue<base::string>("--preview", {},
                                              "Render the imported scene to this PNG file.");
    s.size = options.addValue<int>(
        "--size", {},
        base::format("Width and height of the preview in pixels ({} to {}, default {}).",
                     minPreviewSize, maxPreviewSize, PreviewOptions{}.size));
    s.camera = options.addValue<bool>(
        "--preview-camera", {},
        "Look through the scene's first camera instead of framing the whole scene.", 0, 1);
    return s;
}

bool readSwitches(const PreviewSwitches& switches, const base::string& model,
                  PreviewRequest& request, base::string& error) {
    request = {};
    if (!switches.output->isSet()) {
        if (switches.size->isSet() || switches.camera->isSet()) {
            error = "--size and --preview-camera need --preview";
            return false;
        }
        return true;
    }
    request.path = switches.output->value();
    if (request.path.empty()) {
        error = "--preview needs a file name";
        return false;
    }
    if (switches.size->isSet()) {
        const int size = switches.size->value();
        if (size < int(minPreviewSize) || size > int(maxPreviewSize)) {
            error =
                base::format("--size must lie between {} and {}", minPreviewSize, maxPreviewSize);
            return false;
        }
        request.options.size = std::uint32_t(size);
    }
    request.options.sceneCamera = switches.camera->isSet() && switches.camera->value();
    const std::size_t slash = model.find_last_of('/');
    request.options.modelFolder = slash == base::string::npos ? "./" : model.substr(0, slash + 1);
    return true;
}

int previewFeature(const base::PluginFactory& factory, const PreviewRequest& request) {
    const base::IPlugin* sceneObject = nullptr;
    for (std::uint32_t id = factory.pluginCount(); id-- > 0 && !sceneObject;)
        if (base::ref<base::IPlugin> object = factory.plugin(id);
            object && object->className() == scene::names::scene)
            sceneObject = object.get();
    base::string error = "the model gave no scene to preview";
    if (sceneObject && writePreview(factory, *sceneObject, request.path, request.options, error))
        return 0;
    std::fprintf(stderr, "scene-import: %s\n", error.c_str());
    return 1;
}

} // namespace host::preview

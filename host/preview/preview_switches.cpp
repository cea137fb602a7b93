#include "preview_switches.h"

#include "b_format.h"

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

} // namespace host::preview

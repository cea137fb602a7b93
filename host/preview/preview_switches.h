// The host's preview switches: --preview OUT.png, --size N, --preview-camera.
#pragma once

#include "b_cmdline.h"
#include "scene_preview.h"

namespace host::preview {

struct PreviewSwitches {
    base::CmdLineValue<base::string>* output = nullptr;
    base::CmdLineValue<int>* size = nullptr;
    base::CmdLineValue<bool>* camera = nullptr;
};

PreviewSwitches registerSwitches(base::CmdLineOptions& options);

struct PreviewRequest {
    base::string path; // empty: no preview asked for
    PreviewOptions options;
};

// The request the parsed switches make for 'model'; false with a usage message when
// --size or --preview-camera come without --preview, the path is empty or
// the size is out of range.
bool readSwitches(const PreviewSwitches& switches, const base::string& model,
                  PreviewRequest& request, base::string& error);

// Writes the preview of the factory's newest scene; 0, or 1 after printing
// the reason on standard error.
int previewFeature(const base::PluginFactory& factory, const PreviewRequest& request);

} // namespace host::preview

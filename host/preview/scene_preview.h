// Preview images of an imported scene: every mesh drawn through its node's
// world transform (a skin's base mesh as it is stored, which is its bind
// pose), coloured by the "color" of its primitive's first material (grey
// without one, tinted by the mean colour of a readable PNG "colorMap"), seen
// from the front-right-top diagonal of the scene's up axis so that the whole
// scene fits, or through the scene's first camera. Faces are lit and
// outlined; the points and lines of meshes, and the vertices of meshes
// without faces, are drawn one pixel wide. When nothing can be drawn (no
// geometry, or none with a finite visible face) the nodes show as dots.
//
// The scene is only read; the images are written as PNG files.
#pragma once

#include "b_memory.h"
#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "png_image.h"
#include "raster.h"

#include <cstdint>

namespace host::preview {

struct PreviewOptions {
    std::uint32_t size = 512; // width and height in pixels
    // Look through the scene's first camera; without a usable one the framed
    // view is taken and a warning logged.
    bool sceneCamera = false;
    // Texture files named by a relative path are looked for in this folder
    // (the model's, ending in '/'), then in the factory's.
    base::string modelFolder;
};

// Accepted image sizes.
constexpr std::uint32_t minPreviewSize = 16;
constexpr std::uint32_t maxPreviewSize = 4096;

// The view a preview of 'scene' is rendered with.
View previewView(const base::IPlugin& scene, const PreviewOptions& options);

// Renders 'scene'; 'stats' receives the rasteriser's counts when given.
RgbImage renderPreview(const base::PluginFactory& factory, const base::IPlugin& scene,
                       const PreviewOptions& options, RasterStats* stats = nullptr);

// Renders 'scene' and writes the PNG to 'path' through the master file
// system. False with a one-line reason in 'error'.
bool writePreview(const base::PluginFactory& factory, const base::IPlugin& scene,
                  const base::string& path, const PreviewOptions& options, base::string& error);

} // namespace host::preview

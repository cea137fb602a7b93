// scene-import --extract-textures DIR: writes the images an imported model
// carries inside itself, so an artist can look at them. A compressed image
// (a "fileTexture" with "embeddedFile") is written as it came, under its
// "file" name; raw texels (an "embeddedTexture") become a PNG named after the
// texture. An image that several textures show is written once.
#pragma once

#include "b_cmdline.h"
#include "b_memory.h"
#include "b_plugin_factory.h"

#include <cstdint>
#include <cstdio>

namespace host {

struct ExtractResult {
    std::uint32_t written = 0;
    // Images whose data does not match their size, or that could not be written.
    std::uint32_t failed = 0;
    base::vector<base::string> files;
    base::string error;
};

// Creates 'folder' when needed and writes the images into it.
ExtractResult extractTextures(const base::PluginFactory& factory, const base::string& folder);

// The switch and its run: registers "--extract-textures"; runExtractTextures
// does nothing (answers 0) when the switch was not given, else extracts,
// prints one line to 'report' and answers 1 when an image failed.
base::CmdLineValue<base::string>* registerExtractTextures(base::CmdLineOptions& options);
int runExtractTextures(const base::CmdLineValue<base::string>* option,
                       const base::PluginFactory& factory, std::FILE* report);

} // namespace host

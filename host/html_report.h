// The HTML page of a batch: one self-contained file (styles inline, each
// thumbnail a data: URI, no scripts) that any browser shows from disk. A
// header line with the totals, then a grid of cards, one per file, failures
// first and highlighted: thumbnail, file name, status, counts, seconds, the
// reason of a failure and the first warning.
#pragma once

#include "b_memory.h"
#include "b_plugin_factory.h"
#include "import_record.h"

#include <cstdint>
#include <span>
#include <string_view>

namespace host {

// Thumbnail edge in pixels.
constexpr std::uint32_t thumbnailSize = 192;

// 'text' with &, <, >, " and ' replaced by their entities.
base::string escapeHtml(std::string_view text);
// Standard base64 with padding.
base::string base64(std::span<const std::uint8_t> bytes);

// 'names' holds the file shown for each record and 'thumbnails' its PNG
// (empty when there is none); both are as long as 'records'.
base::string reportHtml(std::span<const ImportRecord> records, std::span<const base::string> names,
                        std::span<const base::vector<std::uint8_t>> thumbnails, double seconds);

// Writes the thumbnail of the factory's newest scene, imported from 'model',
// to 'path'. Always 0: a scene that cannot be drawn still imported, and its
// card shows no picture.
int thumbnailFeature(const base::PluginFactory& factory, const base::string& model,
                     const base::string& path);

// The PNG a child left at 'path' (removed after reading); empty when none.
base::vector<std::uint8_t> takeThumbnail(const base::string& path);

} // namespace host

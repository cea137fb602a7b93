// PNG encoding and decoding of 8-bit RGB images through libpng.
#pragma once

#include "b_memory.h"

#include <cstdint>
#include <span>

namespace host::preview {

struct RgbImage {
    std::uint32_t width = 0;
    std::uint32_t height = 0;
    base::vector<std::uint8_t> rgb; // three bytes per pixel, rows top to bottom
};

// The PNG file of an image; false with libpng's reason in 'error'.
bool encodePng(const RgbImage& image, base::vector<std::uint8_t>& png, base::string& error);
// Any PNG libpng reads, converted to 8-bit RGB (alpha composited on black).
bool decodePng(std::span<const std::uint8_t> png, RgbImage& image, base::string& error);

} // namespace host::preview

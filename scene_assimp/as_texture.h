// Texture conversion support: the path rules and value tables that turn one
// texture reference of an assimp material into a texture object. Kept apart
// from the converter so each rule can be checked on its own.
#pragma once

#include "b_memory.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace as {

// Whether a texture path names its file absolutely: a drive letter and ':',
// two backslashes, "file://", or a leading '/'.
bool isAbsolutePath(std::string_view path);

// 'path' relative to the folder 'base' when it lies under it (both normalised
// first: separators, "." and ".." steps, letter case ignored); otherwise
// 'path' unchanged, so a file outside the base keeps its whole name.
base::string relativeToBase(std::string_view path, std::string_view base);

// The stem a texture object is named after: the file name without its
// extension, or without its last two when it has two or more dots
// (brick.diffuse.png gives brick). "texture" when nothing is left.
std::string_view textureBaseName(std::string_view path);

// The number of an embedded reference ("*N" without the star): digits only,
// within 32 bits. Anything else names no embedded texture.
std::optional<std::uint32_t> embeddedNumber(std::string_view digits);

// The bytes an embedded texture holds: width × height × 4 for raw texels,
// width for a compressed image (height 0). Null when that size does not fit
// 32 bits, so assimp's own texel count cannot have wrapped, or when there is
// no data to read.
std::optional<std::uint32_t> embeddedByteCount(std::uint32_t width, std::uint32_t height,
                                               bool hasData);

// The scene's values for assimp's mapping and map mode numbers (map modes
// accept the OpenGL wrap constants too); unknown values give 0.
std::uint8_t textureMapping(int source);
std::uint8_t textureWrapMode(int source);
// The wrap mode that leaves the border transparent.
inline constexpr std::uint8_t wrapDecal = 3;

} // namespace as

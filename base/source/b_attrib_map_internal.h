// Helpers shared by the binary forms of maps, arrays and links.
#pragma once

#include "b_attribute.h"

#include <cstdint>
#include <string_view>

// Shared by the library's sources only: kept out of its exported symbols.
#pragma GCC visibility push(hidden)
namespace base::attrib_map_detail {

// Nesting guard for container reads: a corrupt stream could otherwise nest maps
// deep enough to exhaust the stack.
class ReadDepth {
public:
    static constexpr unsigned limit = 256;
    ReadDepth() noexcept;
    ~ReadDepth();
    ReadDepth(const ReadDepth&) = delete;
    ReadDepth& operator=(const ReadDepth&) = delete;
    bool ok() const noexcept;
};

// A u32 length and the bytes.
bool writeText(Stream& stream, std::string_view text);
// Reads a text written by writeText. Lengths over 256 MB throw base::exception
// from 'function'; a length past the stream's end answers false.
bool readText(Stream& stream, string& out, const char* function);
// Whether a text read from a stream can name something: not empty and free of
// NUL bytes (the name server compares texts as C strings, so "a\0b" would
// alias "a").
bool usableName(std::string_view text) noexcept;
// Skips 'bytes': seeks when the stream can, else reads and discards in chunks of
// at most 1024 bytes. False when the stream ends first.
bool skipBytes(Stream& stream, std::uint32_t bytes);
// Writes the value's byte count (u32, its flags byte included) and then the
// value's binary form.
bool writeSized(Stream& stream, const Attribute& value);
// Reads a value written by writeSized into 'value' after its count has been
// read: false when the count runs past the stream's end, the value does not
// read, or (seekable streams) the value does not take exactly 'bytes'.
bool readSized(Stream& stream, Attribute& value, std::uint32_t bytes);
// Whether 'bytes' more bytes can be in the stream (true when its size is unknown).
bool fits(Stream& stream, std::uint64_t bytes);

} // namespace base::attrib_map_detail
#pragma GCC visibility pop

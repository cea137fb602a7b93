// Shared pieces of the archive file systems: the decoder interface each format
// implements, the read-only stream over a decoder, member-path rules and the
// file system that presents a single compressed file.
#pragma once

#include "stream/b_fs_archive.h"

#include "b_exception.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string_view>

namespace base::fs::archive {

// One format's decompressor over one compressed source. Failures throw
// base::exception with the format's message prefix.
class Decoder : public AllocObject<> {
public:
    virtual ~Decoder() = default;
    // Starts again at the first byte of the content.
    virtual void restart() = 0;
    // Up to 'bytes' of content; 0 only at its end.
    virtual std::uint64_t decode(std::uint8_t* out, std::uint64_t bytes) = 0;
    // The content size the container states, when it states one (it may lie).
    virtual std::optional<std::uint64_t> declaredSize() const { return std::nullopt; }
    // A likely size for reserving memory, when nothing is declared.
    virtual std::uint64_t sizeHint() const { return 0; }
};

using DecoderPtr = std::unique_ptr<Decoder>;

// A read-only stream over a decoder (strategy in b_fs_archive.h). 'prefix' is
// the format's message prefix ("zip fs| ").
ref<StreamWorker> decodedStream(std::string_view name, DecoderPtr decoder, const char* prefix);

[[noreturn]] void fail(const char* function, string message);

// Opening for writing, creating or emptying is refused on archive content.
void refuseWrite(std::uint32_t flags, const char* prefix, std::string_view path);

// The path with '\' as '/', "." and empty components dropped and ".."
// applied; nullopt when ".." climbs above the start or the path holds a NUL.
std::optional<string> normalise(std::string_view path);

// Counts how deep archive resolution has gone on this thread; an archive
// file system declines (or throws, when opening) past archiveMaxNesting.
class NestingGuard {
public:
    NestingGuard();
    ~NestingGuard();
    NestingGuard(const NestingGuard&) = delete;
    NestingGuard& operator=(const NestingGuard&) = delete;
    bool tooDeep() const noexcept;
};

// A file system presenting "x.gz" as "x": one row per single-stream format.
struct CompressedFormat {
    const char* name;        // "gzip"
    const char* description; // shown by descriptors
    const char* extensions;  // "gz"
    const char* prefix;      // "gzip fs| "
    // Opens a decoder over the compressed file; throws when it is not of the format.
    DecoderPtr (*open)(Stream source, std::string_view path);
};

// The format's descriptor, kept for the whole process.
PluginDesc& compressedFileSystem(const CompressedFormat& format);

// The compressed input of a single-stream decoder, read in blocks.
class SourceBuffer {
public:
    SourceBuffer(Stream source, std::uint64_t start = 0);
    // More input when none is left; false at the source's end.
    bool refill();
    void consume(std::size_t n) noexcept {
        next += n;
        avail -= n;
    }
    void rewind();
    Stream& stream() noexcept { return m_source; }

    const std::uint8_t* next = nullptr;
    std::size_t avail = 0;

private:
    Stream m_source;
    std::uint64_t m_start;
    vector<std::uint8_t> m_block;
};

// The failures every single-stream format reports.
[[noreturn]] void failNotOfFormat(const char* prefix, std::string_view path);
[[noreturn]] void failTruncated(const char* prefix, std::string_view path);
[[noreturn]] void failCorrupt(const char* prefix, std::string_view path, std::string_view detail);

} // namespace base::fs::archive

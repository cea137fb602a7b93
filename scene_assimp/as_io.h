// The file access of assimp: every path assimp opens, the model and the files
// it refers to, is resolved through the host's master file system, so imports
// see the host's aliases, archives and virtual files.
#pragma once

#include "b_memory.h"
#include "stream/b_stream.h"

#include <assimp/IOStream.hpp>
#include <assimp/IOSystem.hpp>

#include <cstdint>

namespace as {

// Both classes are allocated with plain new: their assimp bases bring
// assimp's heap operators, and assimp deletes them there.
class AssimpIO final : public Assimp::IOSystem {
public:
    bool Exists(const char* path) const override;
    char getOsSeparator() const override;
    // Null, without a log line, for a file no file system has: assimp probes
    // for optional files this way.
    Assimp::IOStream* Open(const char* path, const char* mode = "rb") override;
    void Close(Assimp::IOStream* stream) override;

    // The master file system's open flags for an assimp mode ("rb", "wb", ...).
    static std::uint32_t openFlags(const char* mode) noexcept;
};

class AssimpStream final : public Assimp::IOStream {
public:
    explicit AssimpStream(base::Stream stream) : m_stream(std::move(stream)) {}

    // Whole elements; 0 on a short read of a strict stream (logged).
    size_t Read(void* buffer, size_t size, size_t count) override;
    // Whole elements; a short write of a strict stream is logged.
    size_t Write(const void* buffer, size_t size, size_t count) override;
    aiReturn Seek(size_t offset, aiOrigin origin) override;
    size_t Tell() const override;
    size_t FileSize() const override;
    void Flush() override;

private:
    base::Stream m_stream;
};

} // namespace as

#include "as_io.h"

#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"
#include "stream/b_fs.h"

#include <exception>
#include <limits>

namespace as {

namespace {

// The byte count of size × count elements, in 64 bits so that large requests
// are not cut short. False when it overflows: no buffer can be that big, so
// such a request is refused rather than served into memory it does not have.
bool byteCount(size_t size, size_t count, std::uint64_t& bytes) noexcept {
    return !__builtin_mul_overflow(std::uint64_t(size), std::uint64_t(count), &bytes);
}

void logUnexpected(const char* operation, const char* name, const std::exception& e) noexcept {
    try {
        base::logFormatted(base::logIO, base::logError, "assimp io| {} of '{}' failed: {}",
                           operation, name, e.what());
    } catch (...) {
    }
}

} // namespace

// ---- AssimpIO -------------------------------------------------------------------

bool AssimpIO::Exists(const char* path) const {
    try {
        return path && base::fs::master().exists(base::string(path));
    } catch (...) {
        return false;
    }
}

char AssimpIO::getOsSeparator() const {
    return '/';
}

std::uint32_t AssimpIO::openFlags(const char* mode) noexcept {
    if (mode && mode[0] == 'w')
        return base::fs::openWrite;
    return base::fs::openRead | base::fs::openShareRead | base::fs::openShareWrite;
}

Assimp::IOStream* AssimpIO::Open(const char* path, const char* mode) {
    const char* shown = path ? path : "";
    try {
        base::Stream stream = base::fs::master().open(base::string(shown), openFlags(mode));
        return new AssimpStream(std::move(stream));
    } catch (const base::fs::file_not_found&) {
        return nullptr;
    } catch (const base::exception& e) {
        e.log(base::log());
        return nullptr;
    } catch (const std::exception& e) {
        // assimp's callers do not expect exceptions from here.
        logUnexpected("open", shown, e);
        return nullptr;
    } catch (...) {
        return nullptr;
    }
}

void AssimpIO::Close(Assimp::IOStream* stream) {
    delete stream;
}

// ---- AssimpStream -----------------------------------------------------------------

size_t AssimpStream::Read(void* buffer, size_t size, size_t count) {
    try {
        std::uint64_t asked = 0;
        if (size == 0 || !byteCount(size, count, asked))
            return 0;
        const std::uint64_t read = m_stream.read(buffer, asked);
        if (m_stream.strictRead() && read < asked) {
            base::exception e(base::format("stream '{}': trying to read {} bytes, read {} bytes",
                                           m_stream.name(), asked, read),
                              __FILE__, __LINE__, "base::Stream::read");
            e.log(base::log());
            return 0;
        }
        return size_t(read / size);
    } catch (const base::exception& e) {
        e.log(base::log());
        return 0;
    } catch (...) {
        return 0;
    }
}

size_t AssimpStream::Write(const void* buffer, size_t size, size_t count) {
    try {
        std::uint64_t asked = 0;
        if (size == 0 || !byteCount(size, count, asked))
            return 0;
        const std::uint64_t written = m_stream.write(buffer, asked);
        if (m_stream.strictWrite() && written < asked) {
            // Thrown through assimp this would unwind code that does not
            // expect it; the short count tells the caller instead.
            base::exception e(
                base::format("stream '{}': trying to write {} bytes, written {} bytes",
                             m_stream.name(), asked, written),
                __FILE__, __LINE__, "base::Stream::write");
            e.log(base::log());
        }
        return size_t(written / size);
    } catch (const base::exception& e) {
        e.log(base::log());
        return 0;
    } catch (...) {
        return 0;
    }
}

aiReturn AssimpStream::Seek(size_t offset, aiOrigin origin) {
    try {
        // assimp passes backward moves as wrapped negative offsets.
        const std::int64_t delta = std::int64_t(offset);
        std::int64_t from = 0;
        if (origin == aiOrigin_CUR)
            from = std::int64_t(m_stream.getPosition());
        else if (origin != aiOrigin_SET)
            from = std::int64_t(m_stream.getSize());
        std::int64_t expected;
        if (__builtin_add_overflow(from, delta, &expected) || expected < 0)
            expected = -1; // a target before the start is never reached
        const std::uint64_t reached = m_stream.setPosition(delta, std::uint32_t(origin));
        return expected >= 0 && reached == std::uint64_t(expected) ? aiReturn_SUCCESS
                                                                   : aiReturn_FAILURE;
    } catch (const base::exception& e) {
        e.log(base::log());
        return aiReturn_FAILURE;
    } catch (...) {
        return aiReturn_FAILURE;
    }
}

size_t AssimpStream::Tell() const {
    try {
        return size_t(m_stream.getPosition());
    } catch (const base::exception& e) {
        e.log(base::log());
        return 0;
    } catch (...) {
        return 0;
    }
}

size_t AssimpStream::FileSize() const {
    try {
        return size_t(m_stream.getSize());
    } catch (const base::exception& e) {
        e.log(base::log());
        return 0;
    } catch (...) {
        return 0;
    }
}

void AssimpStream::Flush() {
    try {
        m_stream.flush(0);
    } catch (const base::exception& e) {
        e.log(base::log());
    } catch (...) {
    }
}

} // namespace as

#include "stream/b_stream.h"

#include "b_exception.h"

#include <algorithm>
#include <cstring>
#include <limits>

namespace base {

std::uint64_t Stream::read(void* buffer, std::uint64_t bytes) {
    return m_worker && bytes ? m_worker->read(buffer, bytes) : 0;
}

std::uint64_t Stream::write(const void* buffer, std::uint64_t bytes) {
    return m_worker && bytes ? m_worker->write(buffer, bytes) : 0;
}

bool Stream::readAll(void* buffer, std::uint64_t bytes) {
    std::uint64_t got = read(buffer, bytes);
    if (got == bytes)
        return true;
    if (strictRead())
        BASE_THROW(exception, "stream '{}': trying to read {} bytes, read {} bytes", name(), bytes,
                   got);
    return false;
}

bool Stream::writeAll(const void* buffer, std::uint64_t bytes) {
    std::uint64_t put = write(buffer, bytes);
    if (put == bytes)
        return true;
    if (strictWrite())
        BASE_THROW(exception, "stream '{}': trying to write {} bytes, written {} bytes", name(),
                   bytes, put);
    return false;
}

std::uint64_t Stream::setPosition(std::int64_t offset, std::uint32_t origin) {
    return m_worker ? m_worker->setPosition(offset, origin) : 0;
}
std::uint64_t Stream::getPosition() const {
    return m_worker ? m_worker->getPosition() : 0;
}
std::uint64_t Stream::getSize() const {
    return m_worker ? m_worker->getSize() : 0;
}
void Stream::setSize(std::uint64_t size) {
    if (m_worker)
        m_worker->setSize(size);
}
bool Stream::atEnd() const {
    return !m_worker || m_worker->atEnd();
}
void Stream::flush(std::uint32_t mode) {
    if (m_worker)
        m_worker->flush(mode);
}
void Stream::close() {
    if (m_worker)
        m_worker->close();
}

MemoryStreamWorker::MemoryStreamWorker(std::string_view name, vector<std::uint8_t> bytes)
    : StreamWorker(name, capRead | capWrite | capSeek | capResize), m_bytes(std::move(bytes)) {}

std::uint64_t MemoryStreamWorker::read(void* buffer, std::uint64_t bytes) {
    if (!(m_caps & capRead) || m_position >= m_bytes.size())
        return 0;
    std::uint64_t n = std::min<std::uint64_t>(bytes, m_bytes.size() - m_position);
    std::memcpy(buffer, m_bytes.data() + m_position, n);
    m_position += n;
    return n;
}

std::uint64_t MemoryStreamWorker::write(const void* buffer, std::uint64_t bytes) {
    if (!(m_caps & capWrite))
        return 0;
    if (m_position + bytes > m_bytes.size())
        m_bytes.resize(m_position + bytes);
    std::memcpy(m_bytes.data() + m_position, buffer, bytes);
    m_position += bytes;
    return bytes;
}

std::uint64_t MemoryStreamWorker::setPosition(std::int64_t offset, std::uint32_t origin) {
    std::int64_t base = origin == seekBegin     ? 0
                        : origin == seekCurrent ? std::int64_t(m_position)
                                                : std::int64_t(m_bytes.size());
    std::int64_t target;
    if (__builtin_add_overflow(base, offset, &target))
        target = offset < 0 ? 0 : std::numeric_limits<std::int64_t>::max();
    // Positions before the start clamp to it; past the end is allowed (a later
    // write fills the gap with zeros).
    m_position = target < 0 ? 0 : std::uint64_t(target);
    return m_position;
}

void MemoryStreamWorker::setSize(std::uint64_t size) {
    if (m_caps & capResize)
        m_bytes.resize(size);
}

void MemoryStreamWorker::close() {
    StreamWorker::close();
    m_bytes.clear();
    m_bytes.shrink_to_fit();
    m_position = 0;
}

Stream memoryStream(std::string_view name, vector<std::uint8_t> bytes, std::uint32_t flags) {
    return Stream(ref<StreamWorker>(new MemoryStreamWorker(name, std::move(bytes))), flags);
}

} // namespace base

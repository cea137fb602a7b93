#include "b_attribute.h"

namespace base {

Attribute::~Attribute() {
    WriteGuard guard(m_lock);
    while (WatchNode* node = m_watch) {
        m_watch = node->next;
        node->watched = nullptr;
        node->next = nullptr;
    }
}

bool Attribute::write(DataWriter&, std::uint32_t) const {
    throw unsupported_interface(__FILE__, __LINE__, __PRETTY_FUNCTION__);
}

bool Attribute::write(Stream& stream, std::uint32_t) const {
    const auto byte = std::uint8_t(m_flags & 0xFF);
    return stream.writeAll(&byte, 1);
}

bool Attribute::read(DataReader&, std::uint32_t) {
    throw unsupported_interface(__FILE__, __LINE__, __PRETTY_FUNCTION__);
}

bool Attribute::read(Stream& stream, std::uint32_t) {
    std::uint8_t byte;
    if (!readFlagsByte(stream, byte))
        return false;
    applyFlagsByte(byte);
    return true;
}

bool Attribute::addWatch(WatchNode& node) {
    if (m_flags & flagNoWatch)
        return false;
    WriteGuard guard(m_lock);
    node.watched = this;
    node.next = m_watch;
    m_watch = &node;
    return true;
}

bool Attribute::removeWatch(WatchNode& node) {
    WriteGuard guard(m_lock);
    for (WatchNode** link = &m_watch; *link; link = &(*link)->next) {
        if (*link == &node) {
            *link = node.next;
            node.watched = nullptr;
            node.next = nullptr;
            return true;
        }
    }
    return false;
}

namespace attr_detail {

std::optional<std::uint64_t> bytesLeft(Stream& stream) {
    // Only a seekable stream can answer its size without reading.
    if (!(stream.caps() & capSeek))
        return std::nullopt;
    const std::uint64_t size = stream.getSize();
    const std::uint64_t position = stream.getPosition();
    return position < size ? size - position : 0;
}

bool shortRead(Stream& stream, std::uint64_t requested, std::uint64_t available) {
    if (stream.strictRead())
        BASE_THROW(exception, "stream '{}': trying to read {} bytes, read {} bytes", stream.name(),
                   requested, available);
    return false;
}

void checkStringLength(std::uint32_t length) {
    if (length > 256u * 1024 * 1024)
        BASE_THROW(exception, "Trying to read a string bigger then 256MB, aborting...");
}

bool readStringBytes(Stream& stream, std::uint32_t bytes, string& out) {
    const std::optional<std::uint64_t> left = bytesLeft(stream);
    if (left && bytes > *left)
        return shortRead(stream, bytes, *left);
    string text;
    const std::uint64_t perStep = left ? bytes : chunkBytes;
    for (std::uint64_t done = 0; done < bytes;) {
        const std::uint64_t n = std::min<std::uint64_t>(bytes - done, perStep);
        text.resize(done + n);
        if (!stream.readAll(text.data() + done, n))
            return false;
        done += n;
    }
    out = std::move(text);
    return true;
}

} // namespace attr_detail

} // namespace base

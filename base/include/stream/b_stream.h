// Streams: a Stream value holds a counted StreamWorker that does the work
// (native file, memory, ...). Strict streams throw on short transfers; others
// report the count and let the caller decide.
#pragma once

#include "b_refcnt.h"

#include <cstdint>
#include <string_view>

namespace base {

// Capability bits of a worker.
enum StreamCaps : std::uint32_t {
    capRead = 1u << 0,
    capWrite = 1u << 1,
    capSeek = 1u << 2,
    capResize = 1u << 4,
};

// Origins of setPosition: 0 from the start, 1 from the current position, any
// other value from the end.
enum SeekOrigin : std::uint32_t { seekBegin = 0, seekCurrent = 1, seekEnd = 2 };

class StreamWorker : public RefCntAtomic, public AllocObject<> {
public:
    explicit StreamWorker(std::string_view name, std::uint32_t caps) : m_caps(caps), m_name(name) {}

    virtual std::uint64_t read(void* buffer, std::uint64_t bytes) = 0;
    virtual std::uint64_t write(const void* buffer, std::uint64_t bytes) = 0;
    // Answers the absolute position reached.
    virtual std::uint64_t setPosition(std::int64_t offset, std::uint32_t origin) = 0;
    virtual std::uint64_t getPosition() = 0;
    virtual std::uint64_t getSize() = 0;
    virtual void setSize(std::uint64_t size) = 0;
    virtual bool atEnd() { return getPosition() >= getSize(); }
    virtual void flush(std::uint32_t mode) = 0;
    virtual void close() { m_caps = 0; }
    // A new worker on the same name with the same open mode, or null.
    virtual ref<StreamWorker> reopen() { return {}; }

    std::uint32_t caps() const noexcept { return m_caps; }
    const string& name() const noexcept { return m_name; }

protected:
    std::uint32_t m_caps;
    string m_name;
};

// Stream flags.
enum StreamFlags : std::uint32_t {
    streamStrictRead = 1u << 0,
    streamStrictWrite = 1u << 1,
    streamOpened = 1u << 2,
};

class Stream {
public:
    Stream() = default;
    explicit Stream(ref<StreamWorker> worker, std::uint32_t flags = 0)
        : m_worker(std::move(worker)), m_flags(flags) {}

    explicit operator bool() const noexcept { return bool(m_worker); }
    StreamWorker* worker() const noexcept { return m_worker.get(); }
    const char* name() const noexcept { return m_worker ? m_worker->name().c_str() : ""; }
    std::uint32_t caps() const noexcept { return m_worker ? m_worker->caps() : 0; }

    std::uint32_t flags() const noexcept { return m_flags; }
    void setFlags(std::uint32_t flags) noexcept { m_flags = flags; }
    bool strictRead() const noexcept { return m_flags & streamStrictRead; }
    bool strictWrite() const noexcept { return m_flags & streamStrictWrite; }
    std::uint64_t& userWord() noexcept { return m_word; }

    // Raw transfers: the count moved (0 without a worker).
    std::uint64_t read(void* buffer, std::uint64_t bytes);
    std::uint64_t write(const void* buffer, std::uint64_t bytes);

    // Checked transfers for binary forms: true when every byte moved. A short
    // transfer throws base::exception on a strict stream ("stream '{}': trying
    // to read {} bytes, read {} bytes"), else answers false.
    bool readAll(void* buffer, std::uint64_t bytes);
    bool writeAll(const void* buffer, std::uint64_t bytes);

    template <class T>
    bool readValue(T& value) {
        T tmp;
        if (!readAll(&tmp, sizeof(T)))
            return false;
        value = tmp;
        return true;
    }
    template <class T>
    bool writeValue(const T& value) {
        return writeAll(&value, sizeof(T));
    }

    std::uint64_t setPosition(std::int64_t offset, std::uint32_t origin = seekBegin);
    std::uint64_t getPosition() const;
    std::uint64_t getSize() const;
    void setSize(std::uint64_t size);
    bool atEnd() const;
    void flush(std::uint32_t mode = 0);
    void close();

private:
    ref<StreamWorker> m_worker;
    std::uint64_t m_word = 0;
    std::uint32_t m_flags = 0;
};

// A growable in-memory stream, readable, writable, seekable and resizable.
class MemoryStreamWorker : public StreamWorker {
public:
    explicit MemoryStreamWorker(std::string_view name = "memory", vector<std::uint8_t> bytes = {});

    std::uint64_t read(void* buffer, std::uint64_t bytes) override;
    std::uint64_t write(const void* buffer, std::uint64_t bytes) override;
    std::uint64_t setPosition(std::int64_t offset, std::uint32_t origin) override;
    std::uint64_t getPosition() override { return m_position; }
    std::uint64_t getSize() override { return m_bytes.size(); }
    void setSize(std::uint64_t size) override;
    void flush(std::uint32_t) override {}
    void close() override;

    const vector<std::uint8_t>& bytes() const noexcept { return m_bytes; }

private:
    vector<std::uint8_t> m_bytes;
    std::uint64_t m_position = 0;
};

Stream memoryStream(std::string_view name = "memory", vector<std::uint8_t> bytes = {},
                    std::uint32_t flags = 0);

} // namespace base

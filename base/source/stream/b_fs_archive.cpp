// The read-only stream over a decoder, the member-path rules and the file
// system that presents single compressed files by their inner names.
#include "b_fs_decoded.h"

#include "b_log.h"

#include <algorithm>
#include <atomic>
#include <cstring>
#include <limits>

#include <fnmatch.h>

namespace base::fs {

namespace {
std::atomic<std::uint64_t> g_memoryLimit{std::uint64_t(4) << 30};
thread_local std::uint32_t t_nesting = 0;
// Set while a single-stream file system looks for its container, so that
// "a.gz" is never looked for as "a.gz.gz", "a.gz.lz4", ... in turn.
thread_local bool t_findingContainer = false;

constexpr std::uint64_t chunk = std::uint64_t(1) << 16;

std::string_view extensionOf(std::string_view path) {
    const std::size_t slash = path.find_last_of("/\\");
    const std::string_view leaf = slash == std::string_view::npos ? path : path.substr(slash + 1);
    const std::size_t dot = leaf.rfind('.');
    return dot == std::string_view::npos || dot == 0 ? std::string_view() : leaf.substr(dot + 1);
}

bool inList(std::string_view list, std::string_view extension) {
    if (extension.empty())
        return false;
    while (!list.empty()) {
        const std::size_t end = list.find(';');
        const std::string_view item = list.substr(0, end);
        if (item.size() == extension.size() &&
            std::equal(item.begin(), item.end(), extension.begin(),
                       [](char a, char b) { return a == (b >= 'A' && b <= 'Z' ? b + 32 : b); }))
            return true;
        if (end == std::string_view::npos)
            break;
        list.remove_prefix(end + 1);
    }
    return false;
}

} // namespace

std::uint64_t archiveMemoryLimit() noexcept {
    return g_memoryLimit.load(std::memory_order_relaxed);
}

void setArchiveMemoryLimit(std::uint64_t bytes) noexcept {
    g_memoryLimit.store(bytes, std::memory_order_relaxed);
}

void attachArchiveFileSystems(MasterFS& master) {
    for (PluginDesc* kind : {&zipFileSystem(), &gzipFileSystem(), &lz4FileSystem(),
                             &lzmaFileSystem(), &zstFileSystem()}) {
        master.registerFS(ref<PluginDesc>(kind));
        master.attachFS(kind->name());
    }
}

string innerName(std::string_view path) {
    const std::string_view extension = extensionOf(path);
    for (const PluginDesc* kind :
         {&gzipFileSystem(), &lz4FileSystem(), &lzmaFileSystem(), &zstFileSystem()}) {
        if (!inList(kind->extensions(), extension))
            continue;
        const std::string_view inner = path.substr(0, path.size() - extension.size() - 1);
        // "dir/.gz" has no inner name to present.
        if (!inner.empty() && inner.back() != '/' && inner.back() != '\\')
            return string(inner);
    }
    return string(path);
}

bool hasExtensionIn(std::string_view path, std::string_view list) {
    return inList(list, extensionOf(path));
}

bool isArchiveName(std::string_view path) {
    return inList(zipFileSystem().extensions(), extensionOf(path));
}

std::uint32_t archivesOnTheWay(std::string_view path) {
    std::uint32_t count = 0;
    for (std::size_t end = path.find_first_of("/\\"); end != std::string_view::npos;
         end = path.find_first_of("/\\", end + 1)) {
        const std::string_view folder = path.substr(0, end);
        if (isArchiveName(folder) || innerName(folder).size() != folder.size())
            ++count;
    }
    return count;
}

vector<string> listFilesBelow(std::string_view folder) {
    vector<string> files;
    vector<std::pair<string, std::uint32_t>> pending{{string(folder), 0}};
    while (!pending.empty()) {
        auto [dir, depth] = std::move(pending.back());
        pending.pop_back();
        const string stem = dir.empty() || dir.back() == '/' ? dir : dir + '/';
        for (string& name : master().findFiles(dir, "*"))
            files.push_back(stem + name);
        // Bounded: a folder tree (or a link loop) deeper than this is not a model's.
        if (depth < 32)
            for (string& name : master().findFolders(dir, "*"))
                pending.push_back({stem + name, depth + 1});
    }
    std::sort(files.begin(), files.end());
    return files;
}

namespace archive {

[[noreturn]] void fail(const char* function, string message) {
    throw exception(std::move(message), __FILE__, __LINE__, function);
}

void refuseWrite(std::uint32_t flags, const char* prefix, std::string_view path) {
    if (flags & (openWrite | openCreate | openTruncate))
        fail("base::fs::ArchivePlugin::open",
             format("{}'{}' is inside an archive and cannot be written", prefix, path));
}

std::optional<string> normalise(std::string_view path) {
    vector<std::string_view> parts;
    while (!path.empty()) {
        const std::size_t end = path.find_first_of("/\\");
        const std::string_view part = path.substr(0, end);
        if (part.find('\0') != std::string_view::npos)
            return std::nullopt;
        if (part == "..") {
            if (parts.empty())
                return std::nullopt;
            parts.pop_back();
        } else if (!part.empty() && part != ".") {
            parts.push_back(part);
        }
        if (end == std::string_view::npos)
            break;
        path.remove_prefix(end + 1);
    }
    string joined;
    for (std::string_view part : parts) {
        if (!joined.empty())
            joined += '/';
        joined += part;
    }
    return joined;
}

NestingGuard::NestingGuard() {
    ++t_nesting;
}
NestingGuard::~NestingGuard() {
    --t_nesting;
}
bool NestingGuard::tooDeep() const noexcept {
    return t_nesting > archiveMaxNesting;
}

SourceBuffer::SourceBuffer(Stream source, std::uint64_t start)
    : m_source(std::move(source)), m_start(start) {
    rewind();
}

bool SourceBuffer::refill() {
    if (avail)
        return true;
    if (m_block.empty())
        m_block.resize(std::size_t(1) << 18);
    avail = std::size_t(m_source.read(m_block.data(), m_block.size()));
    next = m_block.data();
    return avail != 0;
}

void SourceBuffer::rewind() {
    m_source.setPosition(std::int64_t(m_start));
    next = nullptr;
    avail = 0;
}

void failNotOfFormat(const char* prefix, std::string_view path) {
    fail("base::fs::ArchivePlugin::open", format("{}Can't open file! '{}'", prefix, path));
}
void failTruncated(const char* prefix, std::string_view path) {
    fail("base::fs::ArchivePlugin::read", format("{}'{}' is truncated", prefix, path));
}
void failCorrupt(const char* prefix, std::string_view path, std::string_view detail) {
    fail("base::fs::ArchivePlugin::read", format("{}'{}' is corrupt: {}", prefix, path, detail));
}

namespace {

class DecodedWorker final : public StreamWorker {
public:
    DecodedWorker(std::string_view name, DecoderPtr decoder, const char* prefix)
        : StreamWorker(name, capRead | capSeek), m_decoder(std::move(decoder)), m_prefix(prefix),
          m_declared(m_decoder->declaredSize()), m_limit(archiveMemoryLimit()) {
        if (m_declared && *m_declared > m_limit)
            overLimit();
        m_streaming = m_declared && *m_declared > archiveStreamThreshold;
    }

    std::uint64_t read(void* buffer, std::uint64_t bytes) override {
        if (!(m_caps & capRead))
            return 0;
        return guarded([&] {
            const std::uint64_t size = contentSize();
            const std::uint64_t n = m_position < size ? std::min(bytes, size - m_position) : 0;
            if (!n)
                return std::uint64_t(0);
            if (!m_streaming) {
                std::memcpy(buffer, m_buffer.data() + m_position, n);
            } else {
                moveDecoderTo(m_position);
                decodeExactly(static_cast<std::uint8_t*>(buffer), n);
            }
            m_position += n;
            return n;
        });
    }

    std::uint64_t write(const void*, std::uint64_t) override { return 0; }

    std::uint64_t setPosition(std::int64_t offset, std::uint32_t origin) override {
        if (!(m_caps & capRead))
            return m_position;
        return guarded([&] {
            const std::uint64_t size = contentSize();
            const std::int64_t from = origin == seekBegin     ? 0
                                      : origin == seekCurrent ? std::int64_t(m_position)
                                                              : std::int64_t(size);
            std::int64_t target;
            if (__builtin_add_overflow(from, offset, &target))
                target = offset < 0 ? 0 : std::numeric_limits<std::int64_t>::max();
            // Content cannot grow, so a move past its end stops there.
            m_position = std::min<std::uint64_t>(target < 0 ? 0 : std::uint64_t(target), size);
            return m_position;
        });
    }

    std::uint64_t getPosition() override { return m_position; }

    std::uint64_t getSize() override {
        if (!(m_caps & capRead))
            return 0;
        return guarded([&] { return contentSize(); });
    }

    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}

    void close() override {
        StreamWorker::close();
        m_decoder.reset();
        m_buffer = {};
    }

private:
    // After a failure the stream reads as ended: the failure was reported once.
    template <class F>
    std::uint64_t guarded(F&& work) {
        try {
            return work();
        } catch (...) {
            close();
            throw;
        }
    }

    std::uint64_t contentSize() {
        if (m_streaming)
            return *m_declared;
        extract();
        return m_buffer.size();
    }

    [[noreturn]] void overLimit() const {
        fail("base::fs::ArchivePlugin::read",
             format("{}'{}' expands to more than the memory limit of {} bytes", m_prefix, m_name,
                    m_limit));
    }
    [[noreturn]] void liesAboutSize(std::uint64_t actual) const {
        fail("base::fs::ArchivePlugin::read",
             format("{}'{}' does not hold the {} bytes it declares ({}{} bytes)", m_prefix, m_name,
                    *m_declared, actual > *m_declared ? "more than " : "", actual));
    }

    void extract() {
        if (m_extracted)
            return;
        // One byte over the declared size shows a member that holds more.
        // A hint is unchecked (a damaged trailer may claim gigabytes), so it
        // only sets the first block, never more than a streamed member's size.
        std::uint64_t capacity =
            m_declared ? *m_declared + 1
                       : std::clamp<std::uint64_t>(m_decoder->sizeHint() + 1, chunk,
                                                   std::min(m_limit + 1, archiveStreamThreshold));
        std::uint64_t have = 0;
        for (;;) {
            if (have == m_buffer.size()) {
                if (have > m_limit)
                    overLimit();
                m_buffer.resize(std::size_t(std::min(std::max(capacity, have * 2), m_limit + 1)));
            }
            const std::uint64_t n =
                m_decoder->decode(m_buffer.data() + have, m_buffer.size() - have);
            if (!n)
                break;
            have += n;
            if (m_declared && have > *m_declared)
                liesAboutSize(have);
        }
        if (have > m_limit)
            overLimit();
        if (m_declared && have != *m_declared)
            liesAboutSize(have);
        m_buffer.resize(std::size_t(have));
        if (m_buffer.capacity() - have > have / 8)
            m_buffer.shrink_to_fit();
        m_decoder.reset();
        m_extracted = true;
    }

    // Streaming: the decoder continues from where it stopped, or starts again.
    void moveDecoderTo(std::uint64_t target) {
        if (target < m_decoded) {
            m_decoder->restart();
            m_decoded = 0;
        }
        vector<std::uint8_t> scratch;
        while (m_decoded < target) {
            if (scratch.empty())
                scratch.resize(std::size_t(chunk));
            decodeExactly(scratch.data(), std::min(target - m_decoded, chunk));
        }
    }

    void decodeExactly(std::uint8_t* out, std::uint64_t bytes) {
        while (bytes) {
            const std::uint64_t n = m_decoder->decode(out, bytes);
            if (!n)
                liesAboutSize(m_decoded);
            out += n;
            bytes -= n;
            m_decoded += n;
        }
        if (m_decoded == *m_declared) {
            std::uint8_t extra;
            if (m_decoder->decode(&extra, 1))
                liesAboutSize(m_decoded + 1);
        }
    }

    DecoderPtr m_decoder;
    const char* m_prefix;
    std::optional<std::uint64_t> m_declared;
    std::uint64_t m_limit;
    bool m_streaming = false;
    bool m_extracted = false;
    vector<std::uint8_t> m_buffer;
    std::uint64_t m_position = 0;
    std::uint64_t m_decoded = 0;
};

// Presents "x.gz" as "x". Nothing is cached: each open reads the container
// anew through the master file system, so any container the master reaches
// (inside a zip, behind an alias) works.
class CompressedPlugin final : public IPlugin {
public:
    CompressedPlugin(const PluginDesc& desc, const CompressedFormat& format)
        : m_desc(desc), m_format(format) {}

    const PluginDesc& pluginDesc() const override { return m_desc; }
    bool isArchive() const override { return true; }

    bool exists(std::string_view path) override { return !container(path).empty(); }
    bool isFolder(std::string_view) override { return false; }

    Stream open(std::string_view path, std::uint32_t flags) override {
        const string found = container(path);
        if (found.empty())
            return {};
        refuseWrite(flags, m_format.prefix, path);
        NestingGuard guard;
        Stream source;
        {
            Searching searching;
            source = master().open(found, openRead | openShareRead);
        }
        DecoderPtr decoder = m_format.open(std::move(source), found);
        return Stream(decodedStream(path, std::move(decoder), m_format.prefix), streamOpened);
    }

    vector<string> findFiles(std::string_view folder, std::string_view pattern) override {
        vector<string> names;
        if (t_findingContainer)
            return names;
        Searching searching;
        const string glob(pattern.empty() ? std::string_view("*") : pattern);
        for (string& name : master().findFiles(folder, "*")) {
            const string inner = innerName(name);
            if (inner.size() != name.size() && inList(m_format.extensions, extensionOf(name)) &&
                ::fnmatch(glob.c_str(), inner.c_str(), 0) == 0)
                names.push_back(inner);
        }
        return names;
    }
    vector<string> findFolders(std::string_view, std::string_view) override { return {}; }

private:
    // Marks the search for a container on this thread.
    struct Searching {
        bool previous = t_findingContainer;
        Searching() { t_findingContainer = true; }
        ~Searching() { t_findingContainer = previous; }
    };

    // The compressed file presented as 'path', or empty.
    string container(std::string_view path) {
        if (t_findingContainer || path.empty() || path.back() == '/' || path.back() == '\\' ||
            path.find('\0') != std::string_view::npos)
            return {};
        NestingGuard guard;
        if (guard.tooDeep())
            return {};
        Searching searching;
        std::string_view list = m_format.extensions;
        while (!list.empty()) {
            const std::size_t end = list.find(';');
            string candidate = string(path) + '.' + string(list.substr(0, end));
            if (master().exists(candidate))
                return candidate;
            if (end == std::string_view::npos)
                break;
            list.remove_prefix(end + 1);
        }
        return {};
    }

    const PluginDesc& m_desc;
    const CompressedFormat& m_format;
};

class CompressedDesc final : public PluginDesc {
public:
    explicit CompressedDesc(const CompressedFormat& format) : m_format(format) {}
    const char* name() const override { return m_format.name; }
    const char* description() const override { return m_format.description; }
    const char* extensions() const override { return m_format.extensions; }
    ref<IPlugin> create() const override {
        return ref<IPlugin>(new CompressedPlugin(*this, m_format));
    }

private:
    const CompressedFormat& m_format;
};

} // namespace

ref<StreamWorker> decodedStream(std::string_view name, DecoderPtr decoder, const char* prefix) {
    return ref<StreamWorker>(new DecodedWorker(name, std::move(decoder), prefix));
}

PluginDesc& compressedFileSystem(const CompressedFormat& format) {
    auto* desc = new CompressedDesc(format);
    desc->addRef();
    return *desc;
}

} // namespace archive

} // namespace base::fs

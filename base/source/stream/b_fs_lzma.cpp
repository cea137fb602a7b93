// Single LZMA-alone files (".lzma") on liblzma. A ".lzma86" file is the same
// stream behind one filter byte; only the unfiltered kind is read.
#include "b_fs_decoded.h"

#include <lzma.h>

#include <algorithm>

namespace base::fs {

namespace {

constexpr const char* prefix = "lzma fs| ";

class LzmaDecoder final : public archive::Decoder {
public:
    LzmaDecoder(Stream source, std::string_view path, std::uint64_t start)
        : m_path(path), m_in(std::move(source), start) {
        // Properties byte, dictionary size, then the size (all ones: unknown).
        if (!m_in.refill() || m_in.avail < 13 || m_in.next[0] >= 9 * 5 * 5)
            archive::failNotOfFormat(prefix, path);
        std::uint64_t size = 0;
        for (int i = 12; i >= 5; --i)
            size = size << 8 | m_in.next[i];
        if (size != ~std::uint64_t(0))
            m_hint = size;
        begin();
    }
    ~LzmaDecoder() override { lzma_end(&m_stream); }

    void restart() override {
        m_in.rewind();
        begin();
    }

    std::uint64_t decode(std::uint8_t* out, std::uint64_t bytes) override {
        m_stream.next_out = out;
        m_stream.avail_out = std::size_t(bytes);
        while (m_stream.avail_out && !m_ended) {
            const bool more = m_in.avail || m_in.refill();
            m_stream.next_in = m_in.next;
            m_stream.avail_in = m_in.avail;
            const lzma_ret result = lzma_code(&m_stream, more ? LZMA_RUN : LZMA_FINISH);
            m_in.consume(m_in.avail - m_stream.avail_in);
            if (result == LZMA_STREAM_END)
                m_ended = true;
            else if (result == LZMA_BUF_ERROR)
                archive::failTruncated(prefix, m_path);
            else if (result == LZMA_MEMLIMIT_ERROR)
                archive::failCorrupt(prefix, m_path, "its dictionary is over the memory limit");
            else if (result != LZMA_OK)
                archive::failCorrupt(prefix, m_path,
                                     result == LZMA_DATA_ERROR ? "bad data" : "bad header");
        }
        return bytes - m_stream.avail_out;
    }

    std::uint64_t sizeHint() const override { return m_hint; }

private:
    void begin() {
        lzma_end(&m_stream);
        m_stream = LZMA_STREAM_INIT;
        m_ended = false;
        if (lzma_alone_decoder(&m_stream, archiveMemoryLimit()) != LZMA_OK)
            archive::fail("base::fs::LzmaPlugin::open", format("{}out of memory", prefix));
    }

    string m_path;
    archive::SourceBuffer m_in;
    lzma_stream m_stream = LZMA_STREAM_INIT;
    std::uint64_t m_hint = 0;
    bool m_ended = false;
};

bool endsWith86(std::string_view path) {
    return path.size() >= 2 && path.substr(path.size() - 2) == "86";
}

archive::DecoderPtr openLzma(Stream source, std::string_view path) {
    std::uint64_t start = 0;
    if (endsWith86(path)) {
        std::uint8_t filter = 0xff;
        if (source.read(&filter, 1) != 1)
            archive::failNotOfFormat(prefix, path);
        if (filter != 0)
            archive::fail("base::fs::LzmaPlugin::open",
                          format("{}Unsupported filter in '{}'", prefix, path));
        start = 1;
    }
    return archive::DecoderPtr(new LzmaDecoder(std::move(source), path, start));
}

constexpr archive::CompressedFormat lzmaFormat{"lzma", "LZMA files", "lzma;lzma86", prefix,
                                               openLzma};

} // namespace

PluginDesc& lzmaFileSystem() {
    static PluginDesc& desc = archive::compressedFileSystem(lzmaFormat);
    return desc;
}

} // namespace base::fs

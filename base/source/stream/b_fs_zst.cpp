// Single Zstandard files on libzstd; frames written one after another read as
// one content. The library's default window limit (128 MiB) bounds what a
// frame header can make it allocate.
#include "b_fs_decoded.h"

#include <zstd.h>

#include <algorithm>

namespace base::fs {

namespace {

constexpr const char* prefix = "zst fs| ";

class ZstDecoder final : public archive::Decoder {
public:
    ZstDecoder(Stream source, std::string_view path) : m_path(path), m_in(std::move(source)) {
        if (!m_in.refill() || m_in.avail < 4 ||
            (m_in.next[0] | m_in.next[1] << 8 | m_in.next[2] << 16 |
             unsigned(m_in.next[3]) << 24) != 0xFD2FB528u)
            archive::failNotOfFormat(prefix, path);
        const unsigned long long size = ZSTD_getFrameContentSize(m_in.next, m_in.avail);
        if (size != ZSTD_CONTENTSIZE_UNKNOWN && size != ZSTD_CONTENTSIZE_ERROR)
            m_hint = size;
        m_stream = ZSTD_createDStream();
        if (!m_stream)
            archive::fail("base::fs::ZstPlugin::open", format("{}out of memory", prefix));
    }
    ~ZstDecoder() override { ZSTD_freeDStream(m_stream); }

    void restart() override {
        ZSTD_DCtx_reset(m_stream, ZSTD_reset_session_only);
        m_in.rewind();
        m_pending = 1;
    }

    std::uint64_t decode(std::uint8_t* out, std::uint64_t bytes) override {
        ZSTD_outBuffer output{out, std::size_t(bytes), 0};
        while (output.pos < output.size) {
            if (!m_in.avail && !m_in.refill()) {
                if (m_pending)
                    archive::failTruncated(prefix, m_path);
                break;
            }
            ZSTD_inBuffer input{m_in.next, m_in.avail, 0};
            const std::size_t result = ZSTD_decompressStream(m_stream, &output, &input);
            if (ZSTD_isError(result))
                archive::failCorrupt(prefix, m_path, ZSTD_getErrorName(result));
            m_in.consume(input.pos);
            m_pending = result;
            // A full output buffer may still hold back flushed bytes: ask again.
            if (output.pos == output.size)
                break;
        }
        return output.pos;
    }

    std::uint64_t sizeHint() const override { return m_hint; }

private:
    string m_path;
    archive::SourceBuffer m_in;
    ZSTD_DStream* m_stream = nullptr;
    std::uint64_t m_hint = 0;
    // 0 when a frame is complete.
    std::size_t m_pending = 1;
};

archive::DecoderPtr openZst(Stream source, std::string_view path) {
    return archive::DecoderPtr(new ZstDecoder(std::move(source), path));
}

constexpr archive::CompressedFormat zstFormat{"zst", "Zstandard files", "zst", prefix, openZst};

} // namespace

PluginDesc& zstFileSystem() {
    static PluginDesc& desc = archive::compressedFileSystem(zstFormat);
    return desc;
}

} // namespace base::fs

// Single LZ4 frame files on liblz4; frames written one after another read as
// one content.
#include "b_fs_decoded.h"

#include <lz4frame.h>

#include <algorithm>

namespace base::fs {

namespace {

constexpr const char* prefix = "lz4 fs| ";

class Lz4Decoder final : public archive::Decoder {
public:
    Lz4Decoder(Stream source, std::string_view path) : m_path(path), m_in(std::move(source)) {
        if (!m_in.refill() || m_in.avail < 4 ||
            (m_in.next[0] | m_in.next[1] << 8 | m_in.next[2] << 16 |
             unsigned(m_in.next[3]) << 24) != 0x184D2204u)
            archive::failNotOfFormat(prefix, path);
        if (LZ4F_isError(LZ4F_createDecompressionContext(&m_context, LZ4F_VERSION)))
            archive::fail("base::fs::Lz4Plugin::open", format("{}out of memory", prefix));
        // The frame's content size, when its writer stored one: only a hint,
        // since more frames may follow.
        LZ4F_frameInfo_t info{};
        std::size_t headerBytes = m_in.avail;
        if (!LZ4F_isError(LZ4F_getFrameInfo(m_context, &info, m_in.next, &headerBytes)))
            m_hint = info.contentSize;
        LZ4F_resetDecompressionContext(m_context);
    }
    ~Lz4Decoder() override { LZ4F_freeDecompressionContext(m_context); }

    void restart() override {
        LZ4F_resetDecompressionContext(m_context);
        m_in.rewind();
        m_pending = 1;
    }

    std::uint64_t decode(std::uint8_t* out, std::uint64_t bytes) override {
        std::uint64_t produced = 0;
        while (produced < bytes) {
            if (!m_in.avail && !m_in.refill()) {
                // Between frames the content may end; inside one it may not.
                if (m_pending)
                    archive::failTruncated(prefix, m_path);
                break;
            }
            std::size_t outBytes = std::size_t(std::min<std::uint64_t>(bytes - produced, 1u << 30));
            std::size_t inBytes = m_in.avail;
            const std::size_t result =
                LZ4F_decompress(m_context, out + produced, &outBytes, m_in.next, &inBytes, nullptr);
            if (LZ4F_isError(result))
                archive::failCorrupt(prefix, m_path, LZ4F_getErrorName(result));
            m_in.consume(inBytes);
            produced += outBytes;
            m_pending = result;
        }
        return produced;
    }

    std::uint64_t sizeHint() const override { return m_hint; }

private:
    string m_path;
    archive::SourceBuffer m_in;
    LZ4F_dctx* m_context = nullptr;
    std::uint64_t m_hint = 0;
    // What LZ4F still expects of the current frame; 0 between frames.
    std::size_t m_pending = 1;
};

archive::DecoderPtr openLz4(Stream source, std::string_view path) {
    return archive::DecoderPtr(new Lz4Decoder(std::move(source), path));
}

constexpr archive::CompressedFormat lz4Format{"lz4", "LZ4 frame files", "lz4", prefix, openLz4};

} // namespace

PluginDesc& lz4FileSystem() {
    static PluginDesc& desc = archive::compressedFileSystem(lz4Format);
    return desc;
}

} // namespace base::fs

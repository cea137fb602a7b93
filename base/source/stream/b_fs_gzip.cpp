// Single gzip files on zlib. Members written one after another (as "cat a.gz
// b.gz" makes them) read as one content, as gzip itself reads them.
#include "b_fs_decoded.h"

#include <zlib.h>

#include <algorithm>
#include <climits>

namespace base::fs {

namespace {

constexpr const char* prefix = "gzip fs| ";

class GzipDecoder final : public archive::Decoder {
public:
    GzipDecoder(Stream source, std::string_view path) : m_path(path), m_in(std::move(source)) {
        if (!m_in.refill() || m_in.avail < 2 || m_in.next[0] != 0x1f || m_in.next[1] != 0x8b)
            archive::failNotOfFormat(prefix, path);
        // The trailer's size (modulo 4 GiB) of the last member: only a hint.
        const std::uint64_t size = m_in.stream().getSize();
        std::uint8_t tail[4] = {};
        if (size >= 18) {
            m_in.stream().setPosition(std::int64_t(size - 4));
            if (m_in.stream().read(tail, 4) == 4)
                m_hint = tail[0] | tail[1] << 8 | tail[2] << 16 | std::uint64_t(tail[3]) << 24;
            m_in.rewind();
        }
        // 16 + window bits: gzip wrapping only, with its CRC and size checked.
        if (inflateInit2(&m_z, 16 + MAX_WBITS) != Z_OK)
            archive::fail("base::fs::GzipPlugin::open", format("{}out of memory", prefix));
    }
    ~GzipDecoder() override { inflateEnd(&m_z); }

    void restart() override {
        inflateReset(&m_z);
        m_in.rewind();
        m_memberEnded = false;
    }

    std::uint64_t decode(std::uint8_t* out, std::uint64_t bytes) override {
        m_z.next_out = out;
        m_z.avail_out = uInt(std::min<std::uint64_t>(bytes, UINT_MAX));
        const uInt asked = m_z.avail_out;
        while (m_z.avail_out) {
            if (m_memberEnded) {
                // Another member follows, or the content is complete.
                if (!m_in.refill())
                    break;
                inflateReset(&m_z);
                m_memberEnded = false;
            }
            if (!m_in.avail && !m_in.refill())
                archive::failTruncated(prefix, m_path);
            m_z.next_in = const_cast<Bytef*>(m_in.next);
            m_z.avail_in = uInt(m_in.avail);
            const int result = inflate(&m_z, Z_NO_FLUSH);
            m_in.consume(m_in.avail - m_z.avail_in);
            if (result == Z_STREAM_END)
                m_memberEnded = true;
            else if (result != Z_OK && result != Z_BUF_ERROR)
                archive::failCorrupt(prefix, m_path, m_z.msg ? m_z.msg : zError(result));
        }
        return asked - m_z.avail_out;
    }

    std::uint64_t sizeHint() const override { return m_hint; }

private:
    string m_path;
    archive::SourceBuffer m_in;
    z_stream m_z{};
    std::uint64_t m_hint = 0;
    bool m_memberEnded = false;
};

archive::DecoderPtr openGzip(Stream source, std::string_view path) {
    return archive::DecoderPtr(new GzipDecoder(std::move(source), path));
}

constexpr archive::CompressedFormat gzipFormat{"gzip", "gzip files", "gz", prefix, openGzip};

} // namespace

PluginDesc& gzipFileSystem() {
    static PluginDesc& desc = archive::compressedFileSystem(gzipFormat);
    return desc;
}

} // namespace base::fs

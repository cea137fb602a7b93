// Builds archives and compressed files at test time with the same libraries
// the archive file systems read them with.
#pragma once

#include <lz4frame.h>
#include <lzma.h>
#include <zip.h>
#include <zlib.h>
#include <zstd.h>

#include <cstdint>
#include <cstring>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace archive_maker {

using Bytes = std::vector<std::uint8_t>;

inline Bytes readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

inline void writeFile(const std::string& path, const Bytes& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
}

inline Bytes textBytes(std::string_view text) {
    return Bytes(text.begin(), text.end());
}

struct Member {
    std::string name;
    Bytes data;
    bool store = false;
    const char* password = nullptr;
};

inline void writeZip(const std::string& path, const std::vector<Member>& members) {
    int error = 0;
    zip_t* zip = zip_open(path.c_str(), ZIP_CREATE | ZIP_TRUNCATE, &error);
    if (!zip)
        throw std::runtime_error("zip_open failed");
    for (const Member& m : members) {
        zip_source_t* src = zip_source_buffer(zip, m.data.data(), m.data.size(), 0);
        const zip_int64_t index = zip_file_add(zip, m.name.c_str(), src, ZIP_FL_ENC_RAW);
        if (index < 0)
            throw std::runtime_error("zip_file_add failed: " + m.name);
        zip_set_file_compression(zip, zip_uint64_t(index), m.store ? ZIP_CM_STORE : ZIP_CM_DEFLATE,
                                 0);
        if (m.password &&
            zip_file_set_encryption(zip, zip_uint64_t(index), ZIP_EM_AES_256, m.password) != 0)
            throw std::runtime_error("zip_file_set_encryption failed");
    }
    if (zip_close(zip) != 0)
        throw std::runtime_error("zip_close failed");
}

inline Bytes gzip(const Bytes& in) {
    z_stream z{};
    deflateInit2(&z, 6, Z_DEFLATED, 16 + MAX_WBITS, 8, Z_DEFAULT_STRATEGY);
    Bytes out(deflateBound(&z, uLong(in.size())) + 32);
    z.next_in = const_cast<Bytef*>(in.data());
    z.avail_in = uInt(in.size());
    z.next_out = out.data();
    z.avail_out = uInt(out.size());
    deflate(&z, Z_FINISH);
    out.resize(z.total_out);
    deflateEnd(&z);
    return out;
}

inline Bytes lz4(const Bytes& in) {
    LZ4F_preferences_t prefs{};
    prefs.frameInfo.contentSize = in.size();
    prefs.frameInfo.contentChecksumFlag = LZ4F_contentChecksumEnabled;
    Bytes out(LZ4F_compressFrameBound(in.size(), &prefs));
    out.resize(LZ4F_compressFrame(out.data(), out.size(), in.data(), in.size(), &prefs));
    return out;
}

inline Bytes lzma(const Bytes& in) {
    lzma_options_lzma options;
    lzma_lzma_preset(&options, 6);
    lzma_stream s = LZMA_STREAM_INIT;
    if (lzma_alone_encoder(&s, &options) != LZMA_OK)
        throw std::runtime_error("lzma_alone_encoder failed");
    Bytes out(in.size() + in.size() / 2 + 4096);
    s.next_in = in.data();
    s.avail_in = in.size();
    s.next_out = out.data();
    s.avail_out = out.size();
    while (lzma_code(&s, LZMA_FINISH) == LZMA_OK) {
    }
    out.resize(s.total_out);
    lzma_end(&s);
    return out;
}

inline Bytes zstd(const Bytes& in) {
    Bytes out(ZSTD_compressBound(in.size()));
    out.resize(ZSTD_compress(out.data(), out.size(), in.data(), in.size(), 3));
    return out;
}

// By the file extension: "gz", "lz4", "lzma", "zst".
inline Bytes compress(std::string_view extension, const Bytes& in) {
    if (extension == "gz")
        return gzip(in);
    if (extension == "lz4")
        return lz4(in);
    if (extension == "lzma")
        return lzma(in);
    return zstd(in);
}

} // namespace archive_maker

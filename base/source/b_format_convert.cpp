// Text conversions between the formatter's narrow (UTF-8 or a named code page)
// and wide (UTF-16) variants. They stream through small stack buffers so that
// arbitrarily long arguments need no heap.
#include "b_format_internal.h"

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <iconv.h>

#pragma GCC visibility push(hidden)
namespace base::format_detail {
namespace {

constexpr char16_t replacement = 0xFFFD;
constexpr std::size_t chunk = 256;

bool isUtf8(std::uint32_t codePage) {
    return codePage == 0 || codePage == 65001;
}

bool isContinuation(unsigned char c) {
    return (c & 0xC0) == 0x80;
}

const char* utf16Name() {
    return std::endian::native == std::endian::little ? "UTF-16LE" : "UTF-16BE";
}

// iconv's names for the code pages whose number is not "CP<n>" there.
const char* codePageName(std::uint32_t codePage, char (&buffer)[24]) {
    switch (codePage) {
    case 20127:
        return "ASCII";
    case 20866:
        return "KOI8-R";
    case 21866:
        return "KOI8-U";
    case 28603:
        return "ISO-8859-13";
    case 28605:
        return "ISO-8859-15";
    case 51932:
        return "EUC-JP";
    case 51949:
        return "EUC-KR";
    case 54936:
        return "GB18030";
    case 65000:
        return "UTF-7";
    default:
        break;
    }
    if (codePage >= 28591 && codePage <= 28599)
        std::snprintf(buffer, sizeof(buffer), "ISO-8859-%u", unsigned(codePage - 28590));
    else
        std::snprintf(buffer, sizeof(buffer), "CP%u", unsigned(codePage));
    return buffer;
}

class Iconv {
public:
    Iconv(const char* to, const char* from) : m_cd(iconv_open(to, from)) {}
    ~Iconv() {
        if (ok())
            iconv_close(m_cd);
    }
    Iconv(const Iconv&) = delete;
    Iconv& operator=(const Iconv&) = delete;
    bool ok() const { return m_cd != reinterpret_cast<iconv_t>(-1); }
    iconv_t get() const { return m_cd; }

private:
    iconv_t m_cd;
};

// Runs iconv over the input in chunks; an unconvertible input unit of
// 'unitBytes' (a whole surrogate pair for UTF-16) is replaced by 'bad'.
template <class Out>
bool runIconv(iconv_t cd, const char* in, std::size_t inLeft, std::size_t unitBytes,
              bool utf16Input, const Out& bad, FormatOut<Out>& sink) {
    Out buffer[chunk];
    char* input = const_cast<char*>(in);
    while (inLeft) {
        char* output = reinterpret_cast<char*>(buffer);
        std::size_t outLeft = sizeof(buffer);
        const std::size_t r = iconv(cd, &input, &inLeft, &output, &outLeft);
        const int error = r == static_cast<std::size_t>(-1) ? errno : 0;
        const std::size_t produced = (sizeof(buffer) - outLeft) / sizeof(Out);
        if (produced && !sink.write(buffer, produced))
            return false;
        if (error == E2BIG)
            continue;
        if (error != EILSEQ && error != EINVAL)
            break;
        std::size_t skip = unitBytes;
        if (utf16Input && inLeft >= 4) {
            char16_t units[2];
            std::memcpy(units, input, 4);
            if (units[0] >= 0xD800 && units[0] <= 0xDBFF && units[1] >= 0xDC00 &&
                units[1] <= 0xDFFF)
                skip = 4;
        }
        skip = std::min(skip, inLeft);
        input += skip;
        inLeft -= skip;
        if (!sink.write(&bad, 1))
            return false;
    }
    // Ends any shift state of the target.
    char* output = reinterpret_cast<char*>(buffer);
    std::size_t outLeft = sizeof(buffer);
    iconv(cd, nullptr, nullptr, &output, &outLeft);
    const std::size_t tail = (sizeof(buffer) - outLeft) / sizeof(Out);
    return tail == 0 || sink.write(buffer, tail);
}

} // namespace

std::size_t utf8ToUtf16(const char* text, std::size_t n, char16_t* out) {
    const auto* s = reinterpret_cast<const unsigned char*>(text);
    std::size_t i = 0;
    std::size_t o = 0;
    while (i < n) {
        const unsigned char c = s[i];
        if (c < 0x80) {
            out[o++] = c;
            ++i;
            continue;
        }
        std::size_t len;
        std::uint32_t cp;
        std::uint32_t least;
        if (c >= 0xC2 && c <= 0xDF) {
            len = 2;
            cp = c & 0x1F;
            least = 0x80;
        } else if (c >= 0xE0 && c <= 0xEF) {
            len = 3;
            cp = c & 0x0F;
            least = 0x800;
        } else if (c >= 0xF0 && c <= 0xF4) {
            len = 4;
            cp = c & 0x07;
            least = 0x10000;
        } else {
            out[o++] = replacement;
            ++i;
            continue;
        }
        bool good = i + len <= n;
        for (std::size_t k = 1; good && k < len; ++k) {
            good = isContinuation(s[i + k]);
            cp = (cp << 6) | (s[i + k] & 0x3F);
        }
        if (!good || cp < least || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) {
            out[o++] = replacement;
            ++i;
            continue;
        }
        if (cp >= 0x10000) {
            cp -= 0x10000;
            out[o++] = static_cast<char16_t>(0xD800 + (cp >> 10));
            out[o++] = static_cast<char16_t>(0xDC00 + (cp & 0x3FF));
        } else {
            out[o++] = static_cast<char16_t>(cp);
        }
        i += len;
    }
    return o;
}

std::size_t utf16ToUtf8(const char16_t* text, std::size_t n, char* out) {
    std::size_t o = 0;
    for (std::size_t i = 0; i < n; ++i) {
        std::uint32_t cp = text[i];
        if (cp >= 0xD800 && cp <= 0xDFFF) {
            if (cp <= 0xDBFF && i + 1 < n && text[i + 1] >= 0xDC00 && text[i + 1] <= 0xDFFF) {
                cp = 0x10000 + ((cp - 0xD800) << 10) + (text[i + 1] - 0xDC00);
                ++i;
            } else {
                cp = replacement;
            }
        }
        if (cp < 0x80) {
            out[o++] = static_cast<char>(cp);
        } else if (cp < 0x800) {
            out[o++] = static_cast<char>(0xC0 | (cp >> 6));
            out[o++] = static_cast<char>(0x80 | (cp & 0x3F));
        } else if (cp < 0x10000) {
            out[o++] = static_cast<char>(0xE0 | (cp >> 12));
            out[o++] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
            out[o++] = static_cast<char>(0x80 | (cp & 0x3F));
        } else {
            out[o++] = static_cast<char>(0xF0 | (cp >> 18));
            out[o++] = static_cast<char>(0x80 | ((cp >> 12) & 0x3F));
            out[o++] = static_cast<char>(0x80 | ((cp >> 6) & 0x3F));
            out[o++] = static_cast<char>(0x80 | (cp & 0x3F));
        }
    }
    return o;
}

bool narrowToWide(const char* text, std::size_t n, std::uint32_t codePage,
                  FormatOut<char16_t>& sink) {
    if (isUtf8(codePage)) {
        char16_t buffer[chunk];
        while (n) {
            std::size_t take = std::min(n, chunk);
            // Cut at a character boundary so a sequence is decoded whole.
            if (take < n) {
                std::size_t cut = take;
                while (cut > 0 && take - cut < 3 &&
                       isContinuation(static_cast<unsigned char>(text[cut])))
                    --cut;
                if (cut > 0)
                    take = cut;
            }
            const std::size_t units = utf8ToUtf16(text, take, buffer);
            if (!sink.write(buffer, units))
                return false;
            text += take;
            n -= take;
        }
        return true;
    }
    char name[24];
    Iconv cd(utf16Name(), codePageName(codePage, name));
    if (!cd.ok() || n == 0)
        return true;
    return runIconv<char16_t>(cd.get(), text, n, 1, false, replacement, sink);
}

bool wideToNarrow(const char16_t* text, std::size_t n, std::uint32_t codePage,
                  FormatOut<char>& sink) {
    if (isUtf8(codePage)) {
        char buffer[3 * chunk];
        while (n) {
            std::size_t take = std::min(n, chunk);
            if (take < n && text[take - 1] >= 0xD800 && text[take - 1] <= 0xDBFF)
                --take; // keep a surrogate pair together
            const std::size_t bytes = utf16ToUtf8(text, take, buffer);
            if (!sink.write(buffer, bytes))
                return false;
            text += take;
            n -= take;
        }
        return true;
    }
    char name[24];
    Iconv cd(codePageName(codePage, name), utf16Name());
    if (!cd.ok() || n == 0)
        return true;
    return runIconv<char>(cd.get(), reinterpret_cast<const char*>(text), n * sizeof(char16_t),
                          sizeof(char16_t), true, '?', sink);
}

} // namespace base::format_detail
#pragma GCC visibility pop

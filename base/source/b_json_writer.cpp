// The JSON writer: layout on top of rapidjson's pretty writer (which supplies
// the string escaping and the indentation settings), numbers through
// std::to_chars straight into the output buffer.
#include "b_json.h"

#include "b_exception.h"

#include <rapidjson/prettywriter.h>

#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>

namespace base {

// ---- Resolvers and defaults -------------------------------------------------------

std::string_view DataWriterResolveStringId::resolve(std::uint32_t) {
    return {};
}

namespace {

DataWriterResolveStringId& defaultWriterResolver() {
    static DataWriterResolveStringId resolver;
    return resolver;
}

// Length of the valid UTF-8 sequence at 'p' (overlong forms, surrogates and
// code points beyond U+10FFFF are invalid, as strict decoders hold), 0 if none.
std::size_t utf8Sequence(const unsigned char* p, std::size_t left) {
    const unsigned c = p[0];
    std::size_t n;
    unsigned low = 0x80, high = 0xBF;
    if (c < 0x80)
        return 1;
    if (c >= 0xC2 && c <= 0xDF) {
        n = 2;
    } else if (c >= 0xE0 && c <= 0xEF) {
        n = 3;
        if (c == 0xE0)
            low = 0xA0;
        else if (c == 0xED)
            high = 0x9F;
    } else if (c >= 0xF0 && c <= 0xF4) {
        n = 4;
        if (c == 0xF0)
            low = 0x90;
        else if (c == 0xF4)
            high = 0x8F;
    } else {
        return 0;
    }
    if (left < n || p[1] < low || p[1] > high)
        return 0;
    for (std::size_t i = 2; i < n; ++i)
        if (p[i] < 0x80 || p[i] > 0xBF)
            return 0;
    return n;
}

} // namespace

namespace json_detail {

// rapidjson's allocator concept over the host heap.
class HostJsonAllocator {
public:
    static const bool kNeedFree = true;
    void* Malloc(std::size_t size) { return size ? StdAllocPolicy::allocateBytes(size) : nullptr; }
    void* Realloc(void* block, std::size_t oldSize, std::size_t newSize) {
        if (!newSize) {
            Free(block);
            return nullptr;
        }
        void* grown = StdAllocPolicy::allocateBytes(newSize);
        if (grown && block)
            std::memcpy(grown, block, std::min(oldSize, newSize));
        Free(block);
        return grown;
    }
    static void Free(void* block) {
        if (block)
            StdAllocPolicy::deallocateBytes(block);
    }
};

} // namespace json_detail

DataWriter::DataWriter(DataWriterResolveStringId* resolver)
    : m_resolver(resolver ? resolver : &defaultWriterResolver()) {}

std::string_view DataWriter::resolveStringId(std::uint32_t id) {
    return m_resolver->resolve(id);
}

// ---- JSONWriteStream --------------------------------------------------------------

JSONWriteStream::JSONWriteStream(Stream& stream) : m_stream(stream) {
    m_buffer = static_cast<char*>(guardedAllocate(bufferBytes));
    m_cursor = m_buffer;
    m_end = m_buffer + bufferBytes;
}

JSONWriteStream::~JSONWriteStream() {
    try {
        drain();
    } catch (...) {
        // A destructor must not throw; the writer reported the document's end
        // (or the caller abandoned it) before this.
    }
    StdAllocPolicy::deallocateBytes(m_buffer);
}

void JSONWriteStream::drain() {
    const auto bytes = std::size_t(m_cursor - m_buffer);
    m_cursor = m_buffer;
    if (!bytes)
        return;
    m_drained += bytes;
    // After a failure nothing more is handed over: the document is broken anyway.
    if (!m_failed && !m_stream.writeAll(m_buffer, bytes))
        m_failed = true;
}

void JSONWriteStream::write(const char* text, std::size_t bytes) {
    while (bytes) {
        if (m_cursor == m_end)
            drain();
        const std::size_t n = std::min(bytes, std::size_t(m_end - m_cursor));
        std::memcpy(m_cursor, text, n);
        m_cursor += n;
        text += n;
        bytes -= n;
    }
}

// ---- JSONAttrWriter -----------------------------------------------------------------

struct JSONAttrWriter::Impl
    : rapidjson::PrettyWriter<JSONWriteStream, rapidjson::UTF8<>, rapidjson::UTF8<>,
                              json_detail::HostJsonAllocator> {
    using Base = rapidjson::PrettyWriter<JSONWriteStream, rapidjson::UTF8<>, rapidjson::UTF8<>,
                                         json_detail::HostJsonAllocator>;

    struct Level {
        std::uint32_t count;
        std::uint32_t hint;
        bool array;
    };

    Impl(Stream& stream, std::uint32_t width)
        : Base(out, &allocator), out(stream), maxWidth(width ? width : 1) {
        SetIndent('\t', 1);
        levels.reserve(32);
    }

    void newline(std::size_t depth) {
        out.Put('\n');
        lineStart = out.tell();
        for (std::size_t i = depth * indentCharCount_; i; --i)
            out.Put(indentChar_);
    }

    // Separator and line break before a value; false when no value fits here.
    bool beforeValue() {
        if (levels.empty())
            return !rootDone;
        Level& top = levels.back();
        if (!top.array) {
            if (!keyPending)
                return false;
            keyPending = false;
            return true;
        }
        if (top.count)
            out.Put(',');
        if (top.hint > DataWriter::oneLineHint &&
            (top.count == 0 || out.tell() - lineStart >= maxWidth))
            newline(levels.size());
        ++top.count;
        return true;
    }

    bool afterValue() {
        if (levels.empty()) {
            rootDone = true;
            out.Flush();
        }
        return !out.failed();
    }

    bool open(char bracket, std::uint32_t hint, bool array) {
        if (!beforeValue())
            return false;
        out.Put(bracket);
        levels.push_back({0, hint, array});
        return !out.failed();
    }

    bool close(bool array) {
        if (levels.empty() || levels.back().array != array || keyPending)
            return false;
        const Level level = levels.back();
        levels.pop_back();
        if (level.count && (!array || level.hint > DataWriter::oneLineHint || level.hint == 0))
            newline(levels.size());
        out.Put(array ? ']' : '}');
        return afterValue();
    }

    // Texts without characters to escape (nearly all names) are copied in one
    // go; the others take rapidjson's escaping.
    void quoted(std::string_view text) {
        bool high = false;
        for (const char c : text) {
            const auto u = static_cast<unsigned char>(c);
            high |= u >= 0x80;
            if (u < 0x20 || c == '"' || c == '\\') {
                if (strict)
                    return strictQuoted(text);
                WriteString(text.data(), rapidjson::SizeType(text.size()));
                return;
            }
        }
        if (high && strict)
            return strictQuoted(text);
        out.Put('"');
        out.write(text.data(), text.size());
        out.Put('"');
    }

    // Escapes what strict parsers refuse: control characters and bytes outside
    // valid UTF-8 (as \u00XX of the byte, which the reader turns back into it).
    void strictQuoted(std::string_view text) {
        static constexpr char hex[] = "0123456789abcdef";
        const auto* p = reinterpret_cast<const unsigned char*>(text.data());
        const auto* last = p + text.size();
        out.Put('"');
        while (p != last) {
            const unsigned c = *p;
            const std::size_t n = utf8Sequence(p, std::size_t(last - p));
            if (n > 1 || (n == 1 && c >= 0x20 && c != '"' && c != '\\')) {
                out.write(reinterpret_cast<const char*>(p), n);
                p += n;
                continue;
            }
            ++p;
            out.Put('\\');
            switch (c) {
            case '"':
            case '\\':
                out.Put(char(c));
                break;
            case '\n':
                out.Put('n');
                break;
            case '\t':
                out.Put('t');
                break;
            case '\r':
                out.Put('r');
                break;
            default:
                out.write("u00", 3);
                out.Put(hex[c >> 4]);
                out.Put(hex[c & 15]);
            }
        }
        out.Put('"');
    }

    bool key(std::string_view text) {
        if (levels.empty() || levels.back().array || keyPending ||
            text.size() > std::numeric_limits<rapidjson::SizeType>::max())
            return false;
        Level& top = levels.back();
        if (top.count)
            out.Put(',');
        newline(levels.size());
        quoted(text);
        out.Put(':');
        out.Put(' ');
        ++top.count;
        keyPending = true;
        return !out.failed();
    }

    bool string(std::string_view text) {
        if (text.size() > std::numeric_limits<rapidjson::SizeType>::max() || !beforeValue())
            return false;
        quoted(text);
        return afterValue();
    }

    bool literal(std::string_view text) {
        if (!beforeValue())
            return false;
        out.write(text.data(), text.size());
        return afterValue();
    }

    template <class N>
    bool number(N value) {
        if constexpr (std::is_floating_point_v<N>) {
            // JSON has no spelling for these; rapidjson's extension does, and
            // strict documents carry them as strings.
            if (!std::isfinite(value)) {
                const std::string_view text = std::isnan(value) ? "NaN"
                                              : value < 0       ? "-Infinity"
                                                                : "Infinity";
                return strict ? string(text) : literal(text);
            }
        }
        if (!beforeValue())
            return false;
        // Enough for the longest shortest double (24 characters) and any integer.
        constexpr std::size_t room = 32;
        char* at = out.reserve(room);
        if constexpr (std::is_floating_point_v<N>) {
            // Whole numbers of up to five digits (positions on a grid, unit
            // normals, texture borders) print as integers, several times
            // faster: the shortest form is the plain digits there too, as
            // the exponent form is never shorter. -0 keeps its sign.
            if (value > -1e5 && value < 1e5 && value == N(std::int32_t(value)) &&
                (value != 0 || !std::signbit(value))) {
                out.commit(std::to_chars(at, at + room, std::int32_t(value)).ptr);
                return afterValue();
            }
        }
        out.commit(std::to_chars(at, at + room, value).ptr);
        return afterValue();
    }

    json_detail::HostJsonAllocator allocator;
    JSONWriteStream out;
    vector<Level> levels;
    std::uint64_t lineStart = 0;
    std::uint32_t maxWidth;
    bool keyPending = false;
    bool rootDone = false;
    bool strict = false;
};

JSONAttrWriter::JSONAttrWriter(Stream& stream, std::uint32_t maxWidth,
                               DataWriterResolveStringId* resolver)
    : DataWriter(resolver), m_impl(new (guardedAllocate(sizeof(Impl))) Impl(stream, maxWidth)) {}

JSONAttrWriter::~JSONAttrWriter() {
    m_impl->~Impl();
    StdAllocPolicy::deallocateBytes(m_impl);
}

bool JSONAttrWriter::beginObject() {
    return m_impl->open('{', 0, false);
}
bool JSONAttrWriter::endObject() {
    return m_impl->close(false);
}
bool JSONAttrWriter::beginArray(std::uint32_t hint) {
    return m_impl->open('[', hint, true);
}
bool JSONAttrWriter::endArray() {
    return m_impl->close(true);
}
void JSONAttrWriter::setLayout(JSONLayout layout) noexcept {
    m_impl->strict = layout == JSONLayout::list;
}
JSONLayout JSONAttrWriter::layout() const noexcept {
    return m_impl->strict ? JSONLayout::list : JSONLayout::keyed;
}

bool JSONAttrWriter::key(std::string_view text) {
    return m_impl->key(text);
}
bool JSONAttrWriter::writeString(std::string_view text) {
    return m_impl->string(text);
}
bool JSONAttrWriter::writeDouble(double value) {
    return m_impl->number(value);
}
bool JSONAttrWriter::writeFloat(float value) {
    return m_impl->number(value);
}
bool JSONAttrWriter::writeUInt64(std::uint64_t value) {
    return m_impl->number(value);
}
bool JSONAttrWriter::writeInt64(std::int64_t value) {
    return m_impl->number(value);
}
bool JSONAttrWriter::writeUInt32(std::uint32_t value) {
    return m_impl->number(value);
}
bool JSONAttrWriter::writeInt32(std::int32_t value) {
    return m_impl->number(value);
}
bool JSONAttrWriter::writeBool(bool value) {
    return m_impl->literal(value ? "true" : "false");
}
bool JSONAttrWriter::writeNull() {
    return m_impl->literal("null");
}
bool JSONAttrWriter::good() const noexcept {
    return !m_impl->out.failed();
}

} // namespace base

// The placeholder engine, shared by the narrow and wide variants, and the
// sinks behind the public entry points. The fixed-buffer and output-object paths
// work on the stack only; the string path builds short texts on the stack and
// allocates once.
#include "b_format_internal.h"

#include <algorithm>
#include <array>
#include <climits>
#include <cstring>
#include <new>

namespace base {
namespace {

using namespace format_detail;

// Placeholder texts of this length or more end the output.
constexpr std::size_t maxPlaceholder = 256;

template <class C>
bool isDigit(C c) {
    return c >= C('0') && c <= C('9');
}

// Saturates well inside int64 so alignments and indexes never overflow.
template <class C>
std::int64_t parseDigits(const C*& p, const C* end) {
    std::int64_t v = 0;
    while (p < end && isDigit(*p)) {
        v = std::min<std::int64_t>(v * 10 + (*p - C('0')), INT32_MAX);
        ++p;
    }
    return v;
}

// Length up to the first NUL, within 'limit' when the argument carries one.
template <class C>
std::size_t textLength(const C* s, std::uint32_t limit) {
    if (!s)
        return 0;
    if (limit == FormatArg::nulTerminated)
        return std::char_traits<C>::length(s);
    const C* nul = std::char_traits<C>::find(s, limit, C());
    return nul ? static_cast<std::size_t>(nul - s) : limit;
}

std::size_t argCount(const FormatArg* args, std::size_t count) {
    if (!args)
        return 0;
    count = std::min(count, formatMaxArgs);
    for (std::size_t i = 0; i < count; ++i)
        if (args[i].tag == FormatArg::tagEnd)
            return i;
    return count;
}

template <class C>
constexpr std::array<C, 64> blanks = [] {
    std::array<C, 64> a{};
    a.fill(C(' '));
    return a;
}();

template <class C>
class Engine {
public:
    Engine(FormatOut<C>& out, const FormatArg* args, std::size_t count)
        : m_out(out), m_args(args), m_count(argCount(args, count)) {}

    // False when the sink refused.
    bool run(const C* format) {
        if (!format)
            return true;
        if (m_count == 0)
            return put(format, std::char_traits<C>::length(format));
        std::size_t counter = 0;
        const C* p = format;
        for (;;) {
            const C* q = p;
            while (*q && *q != C('{') && *q != C('}'))
                ++q;
            if (!put(p, static_cast<std::size_t>(q - p)))
                return false;
            p = q;
            if (!*p)
                return true;
            if (*p == C('}')) {
                if (p[1] == C('}') && !put(p, 1))
                    return false;
                p += p[1] == C('}') ? 2 : 1;
                continue;
            }
            if (p[1] == C('{')) {
                if (!put(p, 1))
                    return false;
                p += 2;
                continue;
            }
            const C* body = p + 1;
            const C* end = body;
            while (*end && *end != C('}') && static_cast<std::size_t>(end - body) < maxPlaceholder)
                ++end;
            if (*end != C('}') || static_cast<std::size_t>(end - body) >= maxPlaceholder)
                return true;
            if (!placeholder(body, end, counter++))
                return false;
            p = end + 1;
        }
    }

    std::size_t produced() const { return m_produced; }

private:
    class Forward final : public FormatOut<C> {
    public:
        explicit Forward(Engine& engine) : m_engine(engine) {}
        bool write(const C* text, std::size_t count) override { return m_engine.put(text, count); }

    private:
        Engine& m_engine;
    };

    bool put(const C* text, std::size_t n) {
        if (n == 0)
            return true;
        if (!m_out.write(text, n))
            return false;
        m_produced += n;
        return true;
    }

    bool pad(std::int64_t n) {
        while (n > 0) {
            const auto take = static_cast<std::size_t>(std::min<std::int64_t>(n, 64));
            if (!put(blanks<C>.data(), take))
                return false;
            n -= static_cast<std::int64_t>(take);
        }
        return true;
    }

    bool aligned(std::size_t length, std::int64_t align, auto&& writeText) {
        const auto len = static_cast<std::int64_t>(length);
        if (align > len && !pad(align - len))
            return false;
        if (!writeText())
            return false;
        return align >= -len || pad(-align - len);
    }

    bool emit(const C* text, std::size_t n, std::int64_t align) {
        return aligned(n, align, [&] { return put(text, n); });
    }

    bool emitUtf8(const char* text, std::size_t n, std::int64_t align) {
        if constexpr (std::is_same_v<C, char>) {
            return emit(text, n, align);
        } else {
            char16_t wide[numberBuffer];
            return emit(wide, utf8ToUtf16(text, n, wide), align);
        }
    }

    // A string of the other width, converted with the code page.
    template <class S>
    bool emitConverted(const S* text, std::size_t n, std::uint32_t codePage, std::int64_t align) {
        auto convert = [&](FormatOut<C>& out) {
            if constexpr (std::is_same_v<C, char>)
                return wideToNarrow(text, n, codePage, out);
            else
                return narrowToWide(text, n, codePage, out);
        };
        std::size_t length = 0;
        if (align > 0) {
            CountingOut<C> counter;
            convert(counter);
            length = counter.total;
        }
        Forward forward(*this);
        if (align > 0)
            return aligned(length, align, [&] { return convert(forward); });
        const std::size_t before = m_produced;
        if (!convert(forward))
            return false;
        const auto written = static_cast<std::int64_t>(m_produced - before);
        return align >= -written || pad(-align - written);
    }

    bool emitString(const FormatArg& arg, std::uint32_t codePage, std::int64_t align) {
        if (arg.tag == FormatArg::tagString) {
            const char* s = arg.asString();
            const std::size_t n = textLength(s, arg.length);
            if constexpr (std::is_same_v<C, char>)
                return emit(s, n, align);
            else
                return emitConverted(s, n, codePage, align);
        }
        const char16_t* s = arg.asWString();
        const std::size_t n = textLength(s, arg.length);
        if constexpr (std::is_same_v<C, char16_t>)
            return emit(s, n, align);
        else
            return emitConverted(s, n, codePage, align);
    }

    bool placeholder(const C* p, const C* end, std::size_t counter) {
        std::size_t index = counter;
        if (p < end && isDigit(*p))
            index = static_cast<std::size_t>(parseDigits(p, end));
        std::int64_t align = 0;
        if (p < end && *p == C(',')) {
            ++p;
            if (p < end && *p == C('*')) {
                ++p;
                std::int32_t value;
                if (!argInt32(m_args, m_count, static_cast<std::size_t>(parseDigits(p, end)),
                              value))
                    return true; // no such argument: nothing at all
                align = value;
            } else {
                const bool negative = p < end && *p == C('-');
                if (p < end && (*p == C('-') || *p == C('+')))
                    ++p;
                align = parseDigits(p, end);
                if (negative)
                    align = -align;
            }
        }
        while (p < end && *p != C(':'))
            ++p;
        const C* style = p < end ? p + 1 : end;
        const C* styleEnd = style;
        while (styleEnd < end && *styleEnd != C('@'))
            ++styleEnd;
        if (index >= m_count)
            return emit(nullptr, 0, align);
        const FormatArg& arg = m_args[index];

        // The style as NUL-terminated UTF-8 (strftime layouts need the NUL).
        char style8[3 * maxPlaceholder + 1];
        std::size_t styleLength;
        if constexpr (std::is_same_v<C, char>) {
            styleLength = static_cast<std::size_t>(styleEnd - style);
            std::memcpy(style8, style, styleLength);
        } else {
            styleLength = utf16ToUtf8(style, static_cast<std::size_t>(styleEnd - style), style8);
        }
        style8[styleLength] = 0;
        const std::string_view styleText(style8, styleLength);

        switch (arg.tag) {
        case FormatArg::tagString:
        case FormatArg::tagWString: {
            std::int64_t codePage = 0;
            if (!styleText.empty() && styleText[0] == '*') {
                const char* digits = style8 + 1;
                std::int32_t value;
                if (!argInt32(m_args, m_count,
                              static_cast<std::size_t>(parseDigits(digits, style8 + styleLength)),
                              value))
                    return emit(nullptr, 0, align);
                codePage = static_cast<std::uint32_t>(value);
            } else {
                const char* digits = style8;
                codePage = parseDigits(digits, style8 + styleLength);
            }
            return emitString(arg, static_cast<std::uint32_t>(codePage), align);
        }
        case FormatArg::tagInt32:
        case FormatArg::tagUInt32:
        case FormatArg::tagInt64:
        case FormatArg::tagUInt64:
            if (!styleText.empty() && styleText[0] == 'c') {
                const C c = static_cast<C>(arg.slot & 0xFF);
                return emit(&c, 1, align);
            }
            [[fallthrough]];
        case FormatArg::tagDouble:
        case FormatArg::tagTime: {
            char text[numberBuffer];
            const std::size_t n = formatValue(arg, styleText, m_args, m_count, align, text);
            return emitUtf8(text, n, align);
        }
        default:
            return emit(nullptr, 0, align);
        }
    }

    FormatOut<C>& m_out;
    const FormatArg* m_args;
    std::size_t m_count;
    std::size_t m_produced = 0;
};

int toResult(std::size_t n) {
    return static_cast<int>(std::min<std::size_t>(n, INT_MAX));
}

// Keeps at most 'limit' characters; the cut never splits a character.
template <class C>
class FixedOut final : public FormatOut<C> {
public:
    FixedOut(C* buffer, std::size_t limit) : m_buffer(buffer), m_limit(limit) {}

    bool write(const C* text, std::size_t n) override {
        const std::size_t room = m_limit - m_used;
        if (n <= room) {
            std::memcpy(m_buffer + m_used, text, n * sizeof(C));
            m_used += n;
            return true;
        }
        std::memcpy(m_buffer + m_used, text, room * sizeof(C));
        m_used += room;
        dropPartial(text[room]);
        return false; // full: stop formatting
    }

    std::size_t used() const { return m_used; }

private:
    // 'next' is the first character that did not fit.
    void dropPartial(C next) {
        if constexpr (std::is_same_v<C, char>) {
            if ((static_cast<unsigned char>(next) & 0xC0) != 0x80)
                return;
            for (std::size_t back = 1; back <= 3 && back <= m_used; ++back) {
                const auto c = static_cast<unsigned char>(m_buffer[m_used - back]);
                if ((c & 0xC0) == 0xC0) {
                    m_used -= back;
                    return;
                }
                if ((c & 0xC0) != 0x80)
                    return;
            }
        } else {
            if (next >= 0xDC00 && next <= 0xDFFF && m_used && m_buffer[m_used - 1] >= 0xD800 &&
                m_buffer[m_used - 1] <= 0xDBFF)
                --m_used;
        }
    }

    C* m_buffer;
    std::size_t m_limit;
    std::size_t m_used = 0;
};

template <class C>
int fixedFormat(C* buffer, std::size_t capacity, const C* format, const FormatArg* args,
                std::size_t count) noexcept {
    if (!buffer || capacity == 0)
        return 0;
    FixedOut<C> out(buffer, capacity - 1);
    Engine<C>(out, args, count).run(format);
    buffer[out.used()] = C();
    return toResult(out.used());
}

template <class C>
int sinkFormat(FormatOut<C>& sink, const C* format, const FormatArg* args, std::size_t count) {
    Engine<C> engine(sink, args, count);
    if (!engine.run(format))
        return -1;
    return toResult(engine.produced());
}

// The allocator-callback buffer: grows to the needed length plus 4 (plus the NUL).
template <class C>
class GrowOut final : public FormatOut<C> {
public:
    GrowOut(C*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user)
        : m_buffer(buffer), m_capacity(capacity), m_alloc(alloc), m_user(user) {
        if (!m_buffer)
            m_capacity = 0;
    }

    bool write(const C* text, std::size_t n) override {
        if (!reserve(m_used + n))
            return false;
        std::memcpy(m_buffer + m_used, text, n * sizeof(C));
        m_used += n;
        return true;
    }

    bool reserve(std::size_t needed) {
        if (m_buffer && needed <= m_capacity)
            return true;
        if (!m_alloc)
            return false;
        const std::size_t capacity = needed + 4;
        if (capacity >= SIZE_MAX / sizeof(C) - 1)
            return false;
        const std::size_t oldBytes = m_buffer ? (m_capacity + 1) * sizeof(C) : 0;
        void* block = m_alloc(m_user, m_buffer, oldBytes, (capacity + 1) * sizeof(C));
        if (!block) { // the allocator has freed the old block
            m_buffer = nullptr;
            m_capacity = 0;
            return false;
        }
        m_buffer = static_cast<C*>(block);
        m_capacity = capacity;
        return true;
    }

    std::size_t used() const { return m_used; }

private:
    C*& m_buffer;
    std::size_t& m_capacity;
    FormatAllocator m_alloc;
    void* m_user;
    std::size_t m_used = 0;
};

template <class C>
int growFormat(C*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
               const C* format, const FormatArg* args, std::size_t count) {
    GrowOut<C> out(buffer, capacity, alloc, user);
    if (!Engine<C>(out, args, count).run(format) || !out.reserve(out.used()))
        return -1;
    buffer[out.used()] = C();
    return toResult(out.used());
}

// Short texts stay on the stack; longer ones spill into a string of their own,
// so that the caller's string may also be an argument.
template <class C, std::size_t Local>
class StringOut final : public FormatOut<C> {
public:
    using String = std::basic_string<C, std::char_traits<C>, StdAllocator<C>>;

    bool write(const C* text, std::size_t n) override {
        try {
            if (!m_spilled) {
                if (n <= Local - m_used) {
                    std::memcpy(m_local + m_used, text, n * sizeof(C));
                    m_used += n;
                    return true;
                }
                m_spill.reserve(std::max<std::size_t>(2 * (m_used + n), 2 * Local));
                m_spill.assign(m_local, m_used);
                m_spilled = true;
            }
            m_spill.append(text, n);
            return true;
        } catch (const std::exception&) {
            return false;
        }
    }

    std::basic_string_view<C> view() const {
        return m_spilled ? std::basic_string_view<C>(m_spill)
                         : std::basic_string_view<C>(m_local, m_used);
    }

    // Moves the text into 'out'; false when that failed.
    bool moveTo(String& out) {
        try {
            if (m_spilled)
                out = std::move(m_spill);
            else
                out.assign(m_local, m_used);
            return true;
        } catch (const std::exception&) {
            return false;
        }
    }

private:
    C m_local[Local];
    std::size_t m_used = 0;
    bool m_spilled = false;
    String m_spill;
};

template <class C, class String>
std::size_t stringFormat(String& out, const C* format, const FormatArg* args,
                         std::size_t count) noexcept {
    StringOut<C, 256> text;
    if (!Engine<C>(text, args, count).run(format) || !text.moveTo(out)) {
        out.clear();
        return 0;
    }
    return out.size();
}

} // namespace

void* formatHostAllocator(void*, void* block, std::size_t oldBytes, std::size_t newBytes) {
    void* fresh = StdAllocPolicy::allocateBytes(newBytes, __FILE__, __LINE__, __func__, 0);
    if (fresh && block)
        std::memcpy(fresh, block, std::min(oldBytes, newBytes));
    StdAllocPolicy::deallocateBytes(block, 0);
    return fresh;
}

int vformatBuffer(char* buffer, std::size_t capacity, const char* format, const FormatArg* args,
                  std::size_t count) noexcept {
    return fixedFormat(buffer, capacity, format, args, count);
}
int vformatBuffer(char16_t* buffer, std::size_t capacity, const char16_t* format,
                  const FormatArg* args, std::size_t count) noexcept {
    return fixedFormat(buffer, capacity, format, args, count);
}

std::size_t vformatString(string& out, const char* format, const FormatArg* args,
                          std::size_t count) noexcept {
    return stringFormat(out, format, args, count);
}
std::size_t vformatString(u16string& out, const char16_t* format, const FormatArg* args,
                          std::size_t count) noexcept {
    return stringFormat(out, format, args, count);
}

int vformatOut(FormatOutA& sink, const char* format, const FormatArg* args, std::size_t count) {
    return sinkFormat(sink, format, args, count);
}
int vformatOut(FormatOutW& sink, const char16_t* format, const FormatArg* args, std::size_t count) {
    return sinkFormat(sink, format, args, count);
}

int vformatGrow(char*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
                const char* format, const FormatArg* args, std::size_t count) {
    return growFormat(buffer, capacity, alloc, user, format, args, count);
}
int vformatGrow(char16_t*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
                const char16_t* format, const FormatArg* args, std::size_t count) {
    return growFormat(buffer, capacity, alloc, user, format, args, count);
}

void vlogFormatted(ILog& log, name_id channel, int level, const char* format, const FormatArg* args,
                   std::size_t count) {
    // Most lines fit the stack part; what was built is logged even if memory ran out.
    StringOut<char, 1024> text;
    Engine<char>(text, args, count).run(format);
    log.log(channel, level, text.view());
}

} // namespace base

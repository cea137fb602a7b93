// The message formatter behind every log line and exception text.
//
// A format string holds brace placeholders "{[index][,alignment][:style]}" that
// take up to ten typed arguments. Output goes to a fixed buffer, a growable
// buffer, a string or an output object, in a narrow (UTF-8) and a wide (UTF-16)
// variant with the same grammar:
//
//   "{{" and "}}" give "{" and "}"; a lone "}" is dropped; an unclosed "{" or a
//   placeholder of 256 or more characters ends the output there.
//   index      decimal; absent -> the running counter, which advances at every
//              placeholder, explicit index or not. An index past the arguments
//              gives an empty text.
//   alignment  [-|+]digits or "*N" (argument N as a 32-bit integer). Positive pads
//              with blanks on the left, negative on the right.
//   style      up to "}"; text from "@" on is ignored.
//
// Integers: d u x X (default d / u by signedness), "d+" forces a sign, a "0" after
// the letter (after "+") pads with zeros to the alignment (at most 255); c the low
// byte; f bytes in B/KB/MB/GB ("1.50 KB", "2 KB", "100  B"); k kilobytes rounded
// ("3 KB"); n the C library locale's grouping; tN a millisecond interval in words
// with N significant digits (1..6, default 6): "250 milliseconds", "1.5 seconds",
// "2 minutes 3 seconds", "1 hour 5 seconds" (English words, locale decimal point).
// Doubles: e E f g G with precision digits or "*N" (default f, precision 6; the
// precision is capped at 100), n the locale's grouping with the precision (2 when
// none). Apart from n and t, numbers never depend on the locale.
// Narrow strings are copied; a null pointer is empty. UTF-16 strings are converted
// with the code page in the style (0 and 65001 UTF-8, others through iconv as
// "CP<n>", unconvertible characters become '?'); in the wide variant narrow strings
// are decoded with the same rule.
// Times (FormatTime): a second style character 'l' or 'f' selects local time,
// otherwise UTC. "D" long date "%A, %B %-d, %Y", "T" long time "%-I:%M:%S %p",
// "d" (and an empty style) short date "%x", "t" short time "%-I:%M %p"; any other
// first character followed by text uses that text as the strftime layout
// ("{:u%Y-%m-%d}"). Layouts are glibc strftime's.
//
// A fixed buffer never overflows and is always NUL-terminated when its capacity is
// not 0; the cut never splits a UTF-8 sequence or a UTF-16 surrogate pair.
// Results count characters without the NUL; -1 when a sink or allocator failed.
#pragma once

#include "b_log.h"
#include "b_memory.h"
#include "b_name.h"

#include <bit>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <type_traits>

namespace base {

// A time value in seconds since 1970, formatted as a date or time.
struct FormatTime {
    std::int64_t seconds;
};

// One argument: a 64-bit value slot and a type tag. Strings may carry a length
// (views are not NUL-terminated); they are read up to that length or their first
// NUL, whichever comes first.
struct FormatArg {
    enum Tag : std::uint32_t {
        tagEnd = 0,
        tagInt32 = 1,
        tagUInt32 = 2,
        tagInt64 = 3,
        tagUInt64 = 4,
        tagDouble = 5,
        tagString = 6,
        tagWString = 7,
        tagTime = 8,
    };
    static constexpr std::uint32_t nulTerminated = 0xFFFFFFFFu;

    std::uint64_t slot = 0;
    std::uint32_t tag = tagEnd;
    std::uint32_t length = nulTerminated;

    constexpr FormatArg() noexcept = default;

    FormatArg(bool v) noexcept : slot(v ? 1 : 0), tag(tagUInt32) {}
    template <class T>
    requires(std::is_integral_v<T> && !std::is_same_v<T, bool>) FormatArg(T v)
    noexcept {
        if constexpr (std::is_signed_v<T>) {
            tag = sizeof(T) <= 4 ? tagInt32 : tagInt64;
            slot = static_cast<std::uint64_t>(static_cast<std::int64_t>(v));
        } else {
            tag = sizeof(T) <= 4 ? tagUInt32 : tagUInt64;
            slot = static_cast<std::uint64_t>(v);
        }
    }
    template <class T>
    requires std::is_enum_v<T> FormatArg(T v)
    noexcept : FormatArg(static_cast<std::underlying_type_t<T>>(v)) {}
    template <std::floating_point T>
    FormatArg(T v) noexcept
        : slot(std::bit_cast<std::uint64_t>(static_cast<double>(v))), tag(tagDouble) {}

    FormatArg(const char* s) noexcept : slot(bits(s)), tag(tagString) {}
    FormatArg(const char16_t* s) noexcept : slot(bits(s)), tag(tagWString) {}
    FormatArg(std::nullptr_t) noexcept : tag(tagString) {}
    FormatArg(std::string_view s) noexcept
        : slot(bits(s.data())), tag(tagString), length(clampLength(s.size())) {}
    FormatArg(std::u16string_view s) noexcept
        : slot(bits(s.data())), tag(tagWString), length(clampLength(s.size())) {}
    template <class Traits, class Alloc>
    FormatArg(const std::basic_string<char, Traits, Alloc>& s) noexcept
        : slot(bits(s.c_str())), tag(tagString) {}
    template <class Traits, class Alloc>
    FormatArg(const std::basic_string<char16_t, Traits, Alloc>& s) noexcept
        : slot(bits(s.c_str())), tag(tagWString) {}
    FormatArg(name_id n) noexcept : slot(bits(n.c_str())), tag(tagString) {}
    FormatArg(FormatTime t) noexcept : slot(static_cast<std::uint64_t>(t.seconds)), tag(tagTime) {}
    // Other pointers print their address.
    FormatArg(const void* p) noexcept : slot(bits(p)), tag(tagUInt64) {}

    std::int64_t asInt64() const noexcept { return static_cast<std::int64_t>(slot); }
    double asDouble() const noexcept { return std::bit_cast<double>(slot); }
    const char* asString() const noexcept { return reinterpret_cast<const char*>(slot); }
    const char16_t* asWString() const noexcept { return reinterpret_cast<const char16_t*>(slot); }

private:
    static std::uint64_t bits(const void* p) noexcept {
        return reinterpret_cast<std::uintptr_t>(p);
    }
    static constexpr std::uint32_t clampLength(std::size_t n) noexcept {
        return n < nulTerminated ? static_cast<std::uint32_t>(n) : nulTerminated - 1;
    }
};

inline constexpr std::size_t formatMaxArgs = 10;

// Output object: receives runs of characters; answering false aborts the call.
template <class C>
class FormatOut {
public:
    virtual ~FormatOut() = default;
    virtual bool write(const C* text, std::size_t count) = 0;
};
using FormatOutA = FormatOut<char>;
using FormatOutW = FormatOut<char16_t>;

// Reallocates a growable buffer: answers a block of newBytes that keeps the
// content of 'block' (null at first; oldBytes long) and frees 'block'. On failure
// it frees 'block' as well and answers null.
using FormatAllocator = void* (*)(void* user, void* block, std::size_t oldBytes,
                                  std::size_t newBytes);
// A FormatAllocator over the host heap; free its blocks with
// StdAllocPolicy::deallocateBytes.
void* formatHostAllocator(void* user, void* block, std::size_t oldBytes, std::size_t newBytes);

// Non-template cores. 'count' is capped at formatMaxArgs and ends at the first
// tagEnd argument; with no arguments the format is copied verbatim.
int vformatBuffer(char* buffer, std::size_t capacity, const char* format, const FormatArg* args,
                  std::size_t count) noexcept;
int vformatBuffer(char16_t* buffer, std::size_t capacity, const char16_t* format,
                  const FormatArg* args, std::size_t count) noexcept;
std::size_t vformatString(string& out, const char* format, const FormatArg* args,
                          std::size_t count) noexcept;
std::size_t vformatString(u16string& out, const char16_t* format, const FormatArg* args,
                          std::size_t count) noexcept;
int vformatOut(FormatOutA& sink, const char* format, const FormatArg* args, std::size_t count);
int vformatOut(FormatOutW& sink, const char16_t* format, const FormatArg* args, std::size_t count);
// 'capacity' counts characters without the NUL: a non-null buffer holds capacity + 1.
// On allocator failure the buffer is gone: buffer becomes null and capacity 0.
int vformatGrow(char*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
                const char* format, const FormatArg* args, std::size_t count);
int vformatGrow(char16_t*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
                const char16_t* format, const FormatArg* args, std::size_t count);
// Formats and hands the message to log.log(); the level check is the caller's.
void vlogFormatted(ILog& log, name_id channel, int level, const char* format, const FormatArg* args,
                   std::size_t count);

namespace detail {
template <std::size_t N>
struct FormatArgs {
    static_assert(N <= formatMaxArgs, "the formatter takes at most 10 arguments");
    FormatArg list[N == 0 ? 1 : N];
    const FormatArg* data() const noexcept { return N == 0 ? nullptr : list; }
};
template <class... A>
FormatArgs<sizeof...(A)> makeFormatArgs(const A&... args) noexcept {
    return {{FormatArg(args)...}};
}
} // namespace detail

template <class... A>
int formatBuffer(char* buffer, std::size_t capacity, const char* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatBuffer(buffer, capacity, format, pack.data(), sizeof...(A));
}
template <class... A>
int formatBuffer(char16_t* buffer, std::size_t capacity, const char16_t* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatBuffer(buffer, capacity, format, pack.data(), sizeof...(A));
}

// Replaces 'out' (which may also be an argument); answers its new length, 0 on failure.
template <class... A>
std::size_t formatString(string& out, const char* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatString(out, format, pack.data(), sizeof...(A));
}
template <class... A>
std::size_t formatString(u16string& out, const char16_t* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatString(out, format, pack.data(), sizeof...(A));
}

template <class... A>
int formatOut(FormatOutA& sink, const char* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatOut(sink, format, pack.data(), sizeof...(A));
}
template <class... A>
int formatOut(FormatOutW& sink, const char16_t* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatOut(sink, format, pack.data(), sizeof...(A));
}

template <class... A>
int formatGrow(char*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
               const char* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatGrow(buffer, capacity, alloc, user, format, pack.data(), sizeof...(A));
}
template <class... A>
int formatGrow(char16_t*& buffer, std::size_t& capacity, FormatAllocator alloc, void* user,
               const char16_t* format, const A&... args) {
    const auto pack = detail::makeFormatArgs(args...);
    return vformatGrow(buffer, capacity, alloc, user, format, pack.data(), sizeof...(A));
}

// The formatted text as a string (exception messages).
template <class... A>
string format(const char* fmt, const A&... args) {
    string out;
    formatString(out, fmt, args...);
    return out;
}

// The one way to write to the host log. Nothing is converted or formatted when
// the level is above the log's maximum or the format is null or empty; without
// arguments the format is the message as it stands.
template <class... A>
void logFormatted(ILog& log, name_id channel, int level, const char* fmt, const A&... args) {
    if (level > log.maxLevel() || !fmt || !*fmt)
        return;
    if constexpr (sizeof...(A) == 0) {
        log.log(channel, level, fmt);
    } else {
        const auto pack = detail::makeFormatArgs(args...);
        vlogFormatted(log, channel, level, fmt, pack.data(), sizeof...(A));
    }
}
template <class... A>
void logFormatted(name_id channel, int level, const char* fmt, const A&... args) {
    logFormatted(::base::log(), channel, level, fmt, args...);
}

} // namespace base

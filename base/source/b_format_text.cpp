// Value texts of the formatter: integers, doubles, byte counts, locale numbers,
// intervals and times. Everything is produced as UTF-8 into a caller's buffer;
// only n, t and the date layouts consult the C library locale.
#include "b_format_internal.h"

#include <algorithm>
#include <charconv>
#include <climits>
#include <clocale>
#include <cmath>
#include <cstring>
#include <ctime>

#pragma GCC visibility push(hidden)
namespace base::format_detail {
namespace {

std::size_t writeUnsigned(char* out, std::uint64_t v, unsigned radix, bool upper) {
    const char* digits = upper ? "0123456789ABCDEF" : "0123456789abcdef";
    char reversed[24];
    std::size_t n = 0;
    do {
        reversed[n++] = digits[v % radix];
        v /= radix;
    } while (v);
    for (std::size_t i = 0; i < n; ++i)
        out[i] = reversed[n - 1 - i];
    return n;
}

// A printf field: blanks or zeros up to width; the sign goes before the zeros.
std::size_t writeField(char* out, char sign, const char* body, std::size_t n, std::size_t width,
                       bool zeros) {
    const std::size_t len = n + (sign ? 1 : 0);
    const std::size_t fill = width > len ? width - len : 0;
    std::size_t pos = 0;
    if (!zeros) {
        std::memset(out, ' ', fill);
        pos = fill;
    }
    if (sign)
        out[pos++] = sign;
    if (zeros) {
        std::memset(out + pos, '0', fill);
        pos += fill;
    }
    std::memmove(out + pos, body, n);
    return pos + n;
}

// Takes the field width out of a positive alignment; the part above 255 stays.
std::size_t takeWidth(std::int64_t& align) {
    if (align <= 0)
        return 0;
    const std::int64_t width = std::min(align, maxWidth);
    align -= width;
    return static_cast<std::size_t>(width);
}

bool isDigit(char c) {
    return c >= '0' && c <= '9';
}

// Saturates far above any meaningful precision or digit count.
std::size_t parseDigits(std::string_view s, std::size_t& pos) {
    std::size_t v = 0;
    while (pos < s.size() && isDigit(s[pos])) {
        v = std::min<std::size_t>(v * 10 + static_cast<std::size_t>(s[pos] - '0'), 1u << 30);
        ++pos;
    }
    return v;
}

// Inserts the locale's thousands separator into a run of digits.
std::size_t groupDigits(const char* digits, std::size_t n, const lconv& lc, char* out) {
    const char* sep = lc.thousands_sep ? lc.thousands_sep : "";
    const char* grouping = lc.grouping ? lc.grouping : "";
    const std::size_t sepLen = std::strlen(sep);
    if (sepLen == 0 || grouping[0] <= 0 || grouping[0] == CHAR_MAX) {
        std::memcpy(out, digits, n);
        return n;
    }
    // Built from the right; separators are at most a few bytes in any locale.
    char work[numberBuffer - 128];
    char* p = work + sizeof(work);
    int group = grouping[0];
    int inGroup = 0;
    for (std::size_t i = n; i-- > 0;) {
        *--p = digits[i];
        if (++inGroup == group && i > 0 && group > 0) {
            if (static_cast<std::size_t>(p - work) < sepLen + i)
                break; // cannot happen with real locales; keep the buffer safe
            p -= sepLen;
            std::memcpy(p, sep, sepLen);
            inGroup = 0;
            if (grouping[1] != 0) {
                ++grouping;
                group = grouping[0] == CHAR_MAX || grouping[0] <= 0 ? 0 : grouping[0];
            }
        }
    }
    const std::size_t len = static_cast<std::size_t>(work + sizeof(work) - p);
    std::memcpy(out, p, len);
    return len;
}

std::size_t localeInteger(char* out, bool negative, std::uint64_t magnitude) {
    char digits[24];
    const std::size_t n = writeUnsigned(digits, magnitude, 10, false);
    std::size_t pos = 0;
    if (negative)
        out[pos++] = '-';
    return pos + groupDigits(digits, n, *std::localeconv(), out + pos);
}

std::size_t localeDouble(char* out, double v, std::size_t precision) {
    char text[numberBuffer];
    const bool negative = std::signbit(v);
    const auto r = std::to_chars(text, text + sizeof(text), std::fabs(v), std::chars_format::fixed,
                                 static_cast<int>(precision));
    const std::size_t n = static_cast<std::size_t>(r.ptr - text);
    std::size_t pos = 0;
    if (negative)
        out[pos++] = '-';
    if (!std::isfinite(v)) {
        std::memcpy(out + pos, text, n);
        return pos + n;
    }
    const lconv& lc = *std::localeconv();
    const char* dot = static_cast<const char*>(std::memchr(text, '.', n));
    const std::size_t whole = dot ? static_cast<std::size_t>(dot - text) : n;
    pos += groupDigits(text, whole, lc, out + pos);
    if (dot) {
        const char* point = lc.decimal_point && *lc.decimal_point ? lc.decimal_point : ".";
        const std::size_t pointLen = std::min<std::size_t>(std::strlen(point), 8);
        std::memcpy(out + pos, point, pointLen);
        pos += pointLen;
        std::memcpy(out + pos, dot + 1, n - whole - 1);
        pos += n - whole - 1;
    }
    return pos;
}

// "%.*f %s": whole bytes below 1 KB, else two decimals unless the count is an
// exact multiple of the unit.
std::size_t byteUnits(char* out, bool negative, std::uint64_t v) {
    struct Unit {
        std::uint64_t size;
        const char* name;
    };
    static constexpr Unit units[] = {{1ull << 30, "GB"}, {1ull << 20, "MB"}, {1ull << 10, "KB"}};
    std::size_t pos = 0;
    if (negative)
        out[pos++] = '-';
    for (const Unit& unit : units) {
        if (v < unit.size)
            continue;
        const int decimals = v % unit.size == 0 ? 0 : 2;
        const double number = static_cast<double>(v) / static_cast<double>(unit.size);
        const auto r = std::to_chars(out + pos, out + numberBuffer, number,
                                     std::chars_format::fixed, decimals);
        pos = static_cast<std::size_t>(r.ptr - out);
        out[pos++] = ' ';
        std::memcpy(out + pos, unit.name, 2);
        return pos + 2;
    }
    pos += writeUnsigned(out + pos, v, 10, false);
    std::memcpy(out + pos, "  B", 3);
    return pos + 3;
}

std::size_t appendText(char* out, std::size_t pos, std::string_view text) {
    std::memcpy(out + pos, text.data(), text.size());
    return pos + text.size();
}

// "<n> <unit>[s]"; the fraction is in thousandths, trailing zeros dropped.
std::size_t intervalPart(char* out, std::size_t pos, std::uint64_t whole, unsigned thousandths,
                         std::string_view unit) {
    pos += writeUnsigned(out + pos, whole, 10, false);
    if (thousandths) {
        const lconv& lc = *std::localeconv();
        pos = appendText(out, pos, lc.decimal_point && *lc.decimal_point ? lc.decimal_point : ".");
        char frac[3] = {char('0' + thousandths / 100), char('0' + thousandths / 10 % 10),
                        char('0' + thousandths % 10)};
        std::size_t n = 3;
        while (frac[n - 1] == '0')
            --n;
        pos = appendText(out, pos, std::string_view(frac, n));
    }
    out[pos++] = ' ';
    pos = appendText(out, pos, unit);
    if (whole != 1 || thousandths)
        out[pos++] = 's';
    return pos;
}

// A millisecond interval in words, rounded to 'digits' significant digits:
// "250 milliseconds", "1.5 seconds", "2 minutes 3 seconds", "1 hour 5 seconds".
std::size_t interval(char* out, bool negative, std::uint64_t ms, unsigned digits) {
    unsigned __int128 v = ms;
    unsigned __int128 limit = 1;
    for (unsigned i = 0; i < digits; ++i)
        limit *= 10;
    unsigned __int128 scale = 1;
    while (v >= limit * scale)
        scale *= 10;
    if (scale > 1)
        v = (v + scale / 2) / scale * scale;
    if (v > UINT64_MAX)
        v = UINT64_MAX;
    ms = static_cast<std::uint64_t>(v);

    std::size_t pos = 0;
    if (negative && ms)
        out[pos++] = '-';
    if (ms == 0)
        return appendText(out, pos, "0 seconds");
    if (ms < 1000)
        return intervalPart(out, pos, ms, 0, "millisecond");
    if (ms < 60000)
        return intervalPart(out, pos, ms / 1000, static_cast<unsigned>(ms % 1000), "second");
    const std::uint64_t hours = ms / 3600000;
    const std::uint64_t minutes = ms / 60000 % 60;
    const std::uint64_t rest = ms % 60000;
    const std::size_t start = pos;
    if (hours)
        pos = intervalPart(out, pos, hours, 0, "hour");
    if (minutes) {
        if (pos > start)
            out[pos++] = ' ';
        pos = intervalPart(out, pos, minutes, 0, "minute");
    }
    if (rest) {
        if (pos > start)
            out[pos++] = ' ';
        pos = intervalPart(out, pos, rest / 1000, static_cast<unsigned>(rest % 1000), "second");
    }
    return pos;
}

std::size_t formatInteger(const FormatArg& arg, std::string_view style, std::int64_t& align,
                          char* out) {
    const bool wide = arg.tag == FormatArg::tagInt64 || arg.tag == FormatArg::tagUInt64;
    const bool isSigned = arg.tag == FormatArg::tagInt32 || arg.tag == FormatArg::tagInt64;
    // The value as the printf conversions see it at the argument's width.
    const std::int64_t asSigned =
        wide ? arg.asInt64() : static_cast<std::int32_t>(static_cast<std::uint32_t>(arg.slot));
    const std::uint64_t asUnsigned = wide ? arg.slot : static_cast<std::uint32_t>(arg.slot);
    const bool negative = isSigned && asSigned < 0;
    const std::uint64_t magnitude = negative   ? 0 - static_cast<std::uint64_t>(asSigned)
                                    : isSigned ? static_cast<std::uint64_t>(asSigned)
                                               : asUnsigned;

    const char letter = style.empty() ? (isSigned ? 'd' : 'u') : style[0];
    switch (letter) {
    case 'd':
    case 'u':
    case 'x':
    case 'X': {
        std::size_t pos = 1;
        const bool plus = letter == 'd' && pos < style.size() && style[pos] == '+';
        if (plus)
            ++pos;
        const bool zeros = pos < style.size() && style[pos] == '0';
        const std::size_t width = takeWidth(align);
        char digits[24];
        std::size_t n;
        char sign = 0;
        if (letter == 'd') {
            const std::uint64_t m = asSigned < 0 ? 0 - static_cast<std::uint64_t>(asSigned)
                                                 : static_cast<std::uint64_t>(asSigned);
            n = writeUnsigned(digits, m, 10, false);
            sign = asSigned < 0 ? '-' : (plus ? '+' : 0);
        } else {
            n = writeUnsigned(digits, asUnsigned, letter == 'u' ? 10 : 16, letter == 'X');
        }
        return writeField(out, sign, digits, n, width, zeros);
    }
    case 'f':
        return byteUnits(out, negative, magnitude);
    case 'k': {
        std::size_t pos = 0;
        if (negative)
            out[pos++] = '-';
        // (value + 511) >> 10 without overflowing at the top of the range.
        const std::uint64_t kb = (magnitude >> 10) + (((magnitude & 1023) + 511) >> 10);
        pos += writeUnsigned(out + pos, kb, 10, false);
        return appendText(out, pos, " KB");
    }
    case 'n':
        return localeInteger(out, negative, magnitude);
    case 't': {
        unsigned digits = style.size() > 1 && style[1] >= '1' && style[1] <= '6'
                              ? static_cast<unsigned>(style[1] - '0')
                              : 6;
        return interval(out, negative, magnitude, digits);
    }
    default:
        return 0;
    }
}

std::size_t formatDouble(const FormatArg& arg, std::string_view style, const FormatArg* args,
                         std::size_t count, std::int64_t& align, char* out) {
    const char letter = style.empty() ? 'f' : style[0];
    std::chars_format form;
    switch (letter) {
    case 'e':
    case 'E':
        form = std::chars_format::scientific;
        break;
    case 'f':
    case 'n':
        form = std::chars_format::fixed;
        break;
    case 'g':
    case 'G':
        form = std::chars_format::general;
        break;
    default:
        return 0;
    }
    std::size_t precision = letter == 'n' ? 2 : 6;
    std::size_t pos = 1;
    if (pos < style.size() && style[pos] == '*') {
        ++pos;
        std::int32_t p;
        if (!argInt32(args, count, parseDigits(style, pos), p))
            return 0;
        if (p >= 0) // a negative precision means none, as in printf
            precision = static_cast<std::size_t>(p);
    } else if (pos < style.size() && isDigit(style[pos])) {
        precision = parseDigits(style, pos);
    }
    precision = std::min(precision, maxPrecision);

    const double v = arg.asDouble();
    if (letter == 'n')
        return localeDouble(out, v, precision);
    const std::size_t width = takeWidth(align);
    char text[numberBuffer];
    const auto r = std::to_chars(text, text + sizeof(text), v, form, static_cast<int>(precision));
    std::size_t n = static_cast<std::size_t>(r.ptr - text);
    if (letter == 'E' || letter == 'G')
        for (std::size_t i = 0; i < n; ++i)
            if (text[i] >= 'a' && text[i] <= 'z')
                text[i] = static_cast<char>(text[i] - 'a' + 'A');
    return writeField(out, 0, text, n, width, false);
}

std::size_t formatTime(const FormatArg& arg, std::string_view style, char* out) {
    const char letter = style.empty() ? 'd' : style[0];
    bool local = false;
    std::string_view rest;
    if (style.size() >= 2 && (style[1] == 'l' || style[1] == 'f')) {
        local = true;
        rest = style.substr(2);
    } else if (!style.empty()) {
        rest = style.substr(1);
    }
    // The style is NUL-terminated by the caller, so 'rest' can go to strftime as is.
    const char* layout = rest.data();
    if (rest.empty()) {
        switch (letter) {
        case 'D':
            layout = "%A, %B %-d, %Y";
            break;
        case 'T':
            layout = "%-I:%M:%S %p";
            break;
        case 'd':
            layout = "%x";
            break;
        case 't':
            layout = "%-I:%M %p";
            break;
        default:
            return 0;
        }
    }
    const std::time_t t = static_cast<std::time_t>(arg.asInt64());
    std::tm tm{};
    if (!(local ? localtime_r(&t, &tm) : gmtime_r(&t, &tm)))
        return 0;
    return std::strftime(out, numberBuffer, layout, &tm);
}

} // namespace

bool argInt32(const FormatArg* args, std::size_t count, std::size_t n, std::int32_t& value) {
    if (n >= count)
        return false;
    const FormatArg& a = args[n];
    switch (a.tag) {
    case FormatArg::tagDouble: {
        const double d = a.asDouble();
        value = std::isnan(d)    ? 0
                : d <= INT32_MIN ? INT32_MIN
                : d >= INT32_MAX ? INT32_MAX
                                 : static_cast<std::int32_t>(d);
        return true;
    }
    case FormatArg::tagString:
    case FormatArg::tagWString:
        value = 0;
        return true;
    default:
        value = static_cast<std::int32_t>(static_cast<std::uint32_t>(a.slot));
        return true;
    }
}

std::size_t formatValue(const FormatArg& arg, std::string_view style, const FormatArg* args,
                        std::size_t count, std::int64_t& align, char* out) {
    switch (arg.tag) {
    case FormatArg::tagInt32:
    case FormatArg::tagUInt32:
    case FormatArg::tagInt64:
    case FormatArg::tagUInt64:
        return formatInteger(arg, style, align, out);
    case FormatArg::tagDouble:
        return formatDouble(arg, style, args, count, align, out);
    case FormatArg::tagTime:
        return formatTime(arg, style, out);
    default:
        return 0;
    }
}

} // namespace base::format_detail
#pragma GCC visibility pop

#include "b_string_convert.h"

#include <charconv>
#include <cmath>
#include <system_error>

namespace base {

// to_chars instead of printf: the host sets the C locale from the environment,
// and a decimal comma would make "1,5" of a vector unreadable.
namespace {
void appendFloatText(string& out, double value, bool outOfRange) {
    char buffer[512];
    std::to_chars_result r;
    if (outOfRange) {
        r = std::to_chars(buffer, buffer + sizeof(buffer), value, std::chars_format::general, 3);
    } else {
        r = std::to_chars(buffer, buffer + sizeof(buffer), value, std::chars_format::fixed, 6);
        if (r.ec == std::errc()) {
            while (r.ptr[-1] == '0')
                --r.ptr;
            if (r.ptr[-1] == '.')
                --r.ptr;
        }
    }
    out.append(buffer, r.ptr);
}
} // namespace

void appendFloat(string& out, double value) {
    appendFloatText(out, value, value < -1e30 || value > 1e30 || std::isnan(value));
}

// The limits are taken in the value's own precision: 1e30f widens to slightly
// more than 1e30 as a double, yet it is the float 1e30 and keeps the fixed form.
void appendFloat(string& out, float value) {
    appendFloatText(out, value, value < -1e30f || value > 1e30f || std::isnan(value));
}

string floatToString(double value) {
    string out;
    appendFloat(out, value);
    return out;
}

void appendInteger(string& out, std::int64_t value) {
    char buffer[24];
    auto r = std::to_chars(buffer, buffer + sizeof(buffer), value);
    out.append(buffer, r.ptr);
}

void appendUnsigned(string& out, std::uint64_t value) {
    char buffer[24];
    auto r = std::to_chars(buffer, buffer + sizeof(buffer), value);
    out.append(buffer, r.ptr);
}

namespace convert_detail {
namespace {

bool isDigit(char c) noexcept {
    return c >= '0' && c <= '9';
}

// What may follow a value: the end of the text, a blank or the separator.
bool endsValue(const char* p, const char* end, char separator) noexcept {
    return p == end || isBlank(*p) || (separator && *p == separator);
}

template <class F>
const char* scanReal(const char*& cursor, const char* end, char separator, F& out,
                     const char* message) noexcept {
    const char* p = skipBlanks(cursor, end);
    bool negative = false;
    if (p < end && (*p == '+' || *p == '-'))
        negative = *p++ == '-';
    const char* number = p;
    std::size_t digits = 0;
    std::ptrdiff_t magnitude = 0; // decimal exponent of the leading digit, roughly
    bool leading = true;
    for (; p < end && isDigit(*p); ++p, ++digits) {
        leading = leading && *p == '0';
        magnitude += !leading;
    }
    if (p < end && *p == '.') {
        for (++p; p < end && isDigit(*p); ++p, ++digits) {
            if (leading && *p == '0')
                --magnitude;
            leading = leading && *p == '0';
        }
    }
    if (!digits)
        return message;
    std::int64_t exponent = 0;
    if (p < end && (*p == 'e' || *p == 'E')) {
        const char* q = p + 1;
        bool negativeExponent = false;
        if (q < end && (*q == '+' || *q == '-'))
            negativeExponent = *q++ == '-';
        if (q == end || !isDigit(*q))
            return message;
        for (; q < end && isDigit(*q); ++q)
            exponent = std::min<std::int64_t>(exponent * 10 + (*q - '0'), 1'000'000'000);
        exponent = negativeExponent ? -exponent : exponent;
        p = q;
    }
    if (!endsValue(p, end, separator))
        return message;

    F value{};
    auto r = std::from_chars(number, p, value, std::chars_format::general);
    if (r.ec == std::errc::result_out_of_range) {
        // Beyond the type's range: infinity or zero, as the IEEE conversion gives.
        value = magnitude + exponent > 0 ? std::numeric_limits<F>::infinity() : F(0);
    } else if (r.ec != std::errc() || r.ptr != p) {
        return message;
    }
    out = negative ? -value : value;
    cursor = p;
    return nullptr;
}

} // namespace

const char* scanFloat(const char*& cursor, const char* end, char separator, float& out) noexcept {
    return scanReal(cursor, end, separator, out, floatMessage);
}

const char* scanDouble(const char*& cursor, const char* end, char separator, double& out) noexcept {
    return scanReal(cursor, end, separator, out, doubleMessage);
}

const char* scanSigned(const char*& cursor, const char* end, char separator, std::int64_t min,
                       std::int64_t max, std::int64_t& out) noexcept {
    const char* p = skipBlanks(cursor, end);
    bool negative = false;
    if (p < end && (*p == '+' || *p == '-'))
        negative = *p++ == '-';
    // Accumulated as a negative number, whose range holds the most negative value.
    std::int64_t value = 0;
    const char* digits = p;
    for (; p < end && isDigit(*p); ++p) {
        if (__builtin_mul_overflow(value, 10, &value) ||
            __builtin_sub_overflow(value, *p - '0', &value))
            return integerMessage;
    }
    if (p == digits || !endsValue(p, end, separator))
        return integerMessage;
    if (!negative) {
        if (value == std::numeric_limits<std::int64_t>::min())
            return integerMessage;
        value = -value;
    }
    if (value < min || value > max)
        return integerMessage;
    out = value;
    cursor = p;
    return nullptr;
}

const char* scanUnsigned(const char*& cursor, const char* end, char separator, std::uint64_t max,
                         std::uint64_t& out) noexcept {
    const char* p = skipBlanks(cursor, end);
    if (p < end && *p == '+')
        ++p;
    std::uint64_t value = 0;
    const char* digits = p;
    for (; p < end && isDigit(*p); ++p) {
        if (__builtin_mul_overflow(value, 10u, &value) ||
            __builtin_add_overflow(value, std::uint64_t(*p - '0'), &value))
            return unsignedMessage;
    }
    if (p == digits || !endsValue(p, end, separator) || value > max)
        return unsignedMessage;
    out = value;
    cursor = p;
    return nullptr;
}

const char* scanBool(const char*& cursor, const char* end, char separator, bool& out) noexcept {
    const char* p = skipBlanks(cursor, end);
    const std::string_view rest(p, std::size_t(end - p));
    for (auto [text, value] :
         {std::pair{std::string_view("true"), true}, {"false", false}, {"1", true}, {"0", false}}) {
        if (rest.starts_with(text) && endsValue(p + text.size(), end, separator)) {
            out = value;
            cursor = p + text.size();
            return nullptr;
        }
    }
    return boolMessage;
}

void throwConversion(const char* message) {
    throw string_conversion_exception(string(message), __FILE__, __LINE__, __PRETTY_FUNCTION__);
}

} // namespace convert_detail

namespace {

template <class T, class Scan>
T scanOrThrow(const char*& cursor, const char* end, Scan scan) {
    T value{};
    if (const char* error = scan(cursor, end, value))
        convert_detail::throwConversion(error);
    return value;
}

const char* textEnd(const char* cursor) noexcept {
    return cursor ? cursor + std::strlen(cursor) : cursor;
}

} // namespace

float stringToFloat(const char*& cursor, const char* end, char separator) {
    return scanOrThrow<float>(cursor, end, [&](auto& c, auto e, float& v) {
        return convert_detail::scanFloat(c, e, separator, v);
    });
}
float stringToFloat(const char*& cursor) {
    return stringToFloat(cursor, textEnd(cursor));
}

double stringToDouble(const char*& cursor, const char* end, char separator) {
    return scanOrThrow<double>(cursor, end, [&](auto& c, auto e, double& v) {
        return convert_detail::scanDouble(c, e, separator, v);
    });
}
double stringToDouble(const char*& cursor) {
    return stringToDouble(cursor, textEnd(cursor));
}

std::int64_t stringToInteger(const char*& cursor, const char* end, char separator) {
    return scanOrThrow<std::int64_t>(cursor, end, [&](auto& c, auto e, std::int64_t& v) {
        return convert_detail::scanSigned(c, e, separator, std::numeric_limits<std::int64_t>::min(),
                                          std::numeric_limits<std::int64_t>::max(), v);
    });
}
std::int64_t stringToInteger(const char*& cursor) {
    return stringToInteger(cursor, textEnd(cursor));
}

std::uint64_t stringToUnsigned(const char*& cursor, const char* end, char separator) {
    return scanOrThrow<std::uint64_t>(cursor, end, [&](auto& c, auto e, std::uint64_t& v) {
        return convert_detail::scanUnsigned(c, e, separator,
                                            std::numeric_limits<std::uint64_t>::max(), v);
    });
}
std::uint64_t stringToUnsigned(const char*& cursor) {
    return stringToUnsigned(cursor, textEnd(cursor));
}

bool stringToBool(const char*& cursor, const char* end, char separator) {
    return scanOrThrow<bool>(cursor, end, [&](auto& c, auto e, bool& v) {
        return convert_detail::scanBool(c, e, separator, v);
    });
}
bool stringToBool(const char*& cursor) {
    return stringToBool(cursor, textEnd(cursor));
}

} // namespace base

// Text forms of attribute values, shared by toString/fromString, the structured
// readers and writers and the schema defaults.
//
// Writing: a floating-point component below -1e30, above 1e30 or NaN prints as
// "%.3g" ("2e+30"); any other prints as "%.6f" with trailing zeros and then a
// trailing '.' removed ("0.5", "2", "-0"). Integers print in decimal, booleans as
// "true"/"false", strings as they are. The components of a compound value
// (vectors, quaternions w,x,y,z, boxes min then max, matrices row by row, mat43's
// rows then its translation) are joined by ',' without blanks: "1,0.5,-2". A
// TimeCode prints its tick count. The text never depends on the C locale.
//
// Reading: a number is an optional sign, digits, an optional '.' with fraction
// digits and an optional exponent ('e' or 'E', optional sign, digits); at least
// one digit is needed before the exponent. Leading blanks (space, tab, LF, CR)
// are skipped; the number must reach the end of the text or be followed by a
// blank (or by the caller's separator). Integers take no fraction or exponent
// and must fit their type; unsigned ones take no '-'. Booleans are true, false,
// 1 or 0. A compound value needs every component, separated by ',' with optional
// blanks around it. A failed scan throws string_conversion_exception with
// "Can't convert string to float!" (double, integer, unsigned integer, boolean).
#pragma once

#include "b_exception.h"
#include "b_type_traits.h"

#include <concepts>
#include <cstdint>
#include <cstring>
#include <limits>
#include <string_view>
#include <type_traits>

namespace base {

constexpr bool isBlank(char c) noexcept {
    return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

void appendFloat(string& out, double value);
void appendFloat(string& out, float value);
string floatToString(double value);
void appendInteger(string& out, std::int64_t value);
void appendUnsigned(string& out, std::uint64_t value);

// Throwing scanners: read one value at 'cursor' and move 'cursor' past it (left
// unchanged on failure). 'end' bounds the text; the one-argument forms read a
// NUL-terminated text. 'separator' (when not NUL) may follow the value as well as
// a blank.
float stringToFloat(const char*& cursor, const char* end, char separator = 0);
float stringToFloat(const char*& cursor);
double stringToDouble(const char*& cursor, const char* end, char separator = 0);
double stringToDouble(const char*& cursor);
std::int64_t stringToInteger(const char*& cursor, const char* end, char separator = 0);
std::int64_t stringToInteger(const char*& cursor);
std::uint64_t stringToUnsigned(const char*& cursor, const char* end, char separator = 0);
std::uint64_t stringToUnsigned(const char*& cursor);
bool stringToBool(const char*& cursor, const char* end, char separator = 0);
bool stringToBool(const char*& cursor);

namespace convert_detail {

// Non-throwing cores: nullptr on success, else the failure message.
const char* scanFloat(const char*& cursor, const char* end, char separator, float& out) noexcept;
const char* scanDouble(const char*& cursor, const char* end, char separator, double& out) noexcept;
const char* scanSigned(const char*& cursor, const char* end, char separator, std::int64_t min,
                       std::int64_t max, std::int64_t& out) noexcept;
const char* scanUnsigned(const char*& cursor, const char* end, char separator, std::uint64_t max,
                         std::uint64_t& out) noexcept;
const char* scanBool(const char*& cursor, const char* end, char separator, bool& out) noexcept;

[[noreturn]] void throwConversion(const char* message);

inline constexpr const char* floatMessage = "Can't convert string to float!";
inline constexpr const char* doubleMessage = "Can't convert string to double!";
inline constexpr const char* integerMessage = "Can't convert string to integer!";
inline constexpr const char* unsignedMessage = "Can't convert string to unsigned integer!";
inline constexpr const char* boolMessage = "Can't convert string to boolean!";

template <class T>
constexpr const char* conversionMessage() noexcept {
    if constexpr (std::is_same_v<T, bool>)
        return boolMessage;
    else if constexpr (std::is_same_v<T, float>)
        return floatMessage;
    else if constexpr (std::is_same_v<T, double>)
        return doubleMessage;
    else if constexpr (std::is_same_v<T, TimeCode> || std::is_signed_v<T>)
        return integerMessage;
    else
        return unsignedMessage;
}

template <class T>
const char* scanScalar(const char*& cursor, const char* end, char separator, T& out) noexcept {
    if constexpr (std::is_same_v<T, bool>) {
        return scanBool(cursor, end, separator, out);
    } else if constexpr (std::is_same_v<T, float>) {
        return scanFloat(cursor, end, separator, out);
    } else if constexpr (std::is_same_v<T, double>) {
        return scanDouble(cursor, end, separator, out);
    } else if constexpr (std::is_same_v<T, TimeCode>) {
        std::int64_t ticks = 0;
        const char* error =
            scanSigned(cursor, end, separator, std::numeric_limits<std::int64_t>::min(),
                       std::numeric_limits<std::int64_t>::max(), ticks);
        if (!error)
            out = TimeCode(ticks);
        return error;
    } else if constexpr (std::is_signed_v<T>) {
        std::int64_t v = 0;
        const char* error = scanSigned(cursor, end, separator, std::numeric_limits<T>::min(),
                                       std::numeric_limits<T>::max(), v);
        if (!error)
            out = static_cast<T>(v);
        return error;
    } else {
        static_assert(std::is_unsigned_v<T>, "not a scalar of the vocabulary");
        std::uint64_t v = 0;
        const char* error = scanUnsigned(cursor, end, separator, std::numeric_limits<T>::max(), v);
        if (!error)
            out = static_cast<T>(v);
        return error;
    }
}

inline const char* skipBlanks(const char* p, const char* end) noexcept {
    while (p < end && isBlank(*p))
        ++p;
    return p;
}

template <class T>
void appendScalar(string& out, const T& v) {
    if constexpr (std::is_same_v<T, bool>)
        out += v ? "true" : "false";
    else if constexpr (std::is_floating_point_v<T>)
        appendFloat(out, v);
    else if constexpr (std::is_same_v<T, TimeCode>)
        appendInteger(out, v.ticks());
    else if constexpr (std::is_signed_v<T>)
        appendInteger(out, v);
    else
        appendUnsigned(out, v);
}

} // namespace convert_detail

// Appends the text form of a value of the vocabulary.
template <class T>
void appendValue(string& out, const T& value) {
    if constexpr (std::is_same_v<T, string>) {
        out += value;
    } else if constexpr (CompoundValue<T>) {
        bool first = true;
        ValueFields<T>::apply(value, [&](const auto&... c) {
            ((out += first ? "" : ",", first = false, convert_detail::appendScalar(out, c)), ...);
        });
    } else {
        convert_detail::appendScalar(out, value);
    }
}

template <class T>
string valueToString(const T& value) {
    string out;
    appendValue(out, value);
    return out;
}

// Non-throwing scan of one value (compound values whole): nullptr on success,
// else the failure message; 'value' and 'cursor' change only on success.
template <class T>
const char* scanValue(const char*& cursor, const char* end, char separator, T& value) noexcept {
    static_assert(!std::is_same_v<T, string>, "strings have no delimited text form");
    if constexpr (CompoundValue<T>) {
        T tmp = value;
        const char* p = cursor;
        const char* error = nullptr;
        ValueFields<T>::apply(tmp, [&](auto&... c) {
            constexpr std::size_t count = sizeof...(c);
            std::size_t index = 0;
            auto one = [&](auto& component) {
                const bool last = ++index == count;
                error = convert_detail::scanScalar(p, end, last ? separator : ',', component);
                if (error || last)
                    return;
                p = convert_detail::skipBlanks(p, end);
                if (p < end && *p == ',')
                    ++p;
                else
                    error = convert_detail::conversionMessage<
                        std::remove_cvref_t<decltype(component)>>();
            };
            ((error ? void() : one(c)), ...);
        });
        if (error)
            return error;
        value = tmp;
        cursor = p;
        return nullptr;
    } else {
        return convert_detail::scanScalar(cursor, end, separator, value);
    }
}

// Throwing form of scanValue.
template <class T>
void stringToValue(const char*& cursor, const char* end, T& value, char separator = 0) {
    if (const char* error = scanValue(cursor, end, separator, value))
        convert_detail::throwConversion(error);
}

// The whole text as one value: blanks may surround it, nothing else. False
// leaves 'value' unchanged. A string takes the text as it is.
template <class T>
bool valueFromString(std::string_view text, T& value) {
    if constexpr (std::is_same_v<T, string>) {
        value.assign(text.data(), text.size());
        return true;
    } else {
        const char* p = text.data();
        const char* end = p + text.size();
        T tmp = value;
        if (scanValue(p, end, 0, tmp) || convert_detail::skipBlanks(p, end) != end)
            return false;
        value = tmp;
        return true;
    }
}

} // namespace base

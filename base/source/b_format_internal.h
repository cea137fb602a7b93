// Pieces of the formatter shared by its sources: value texts (numbers, times) as
// UTF-8, and the conversions between the narrow and the wide variant.
#pragma once

#include "b_format.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

// Shared by the library's sources only: kept out of its exported symbols.
#pragma GCC visibility push(hidden)
namespace base::format_detail {

// Room for any numeric or time text: a 309-digit double with 100 decimals and
// locale separators, or a long strftime result.
inline constexpr std::size_t numberBuffer = 1536;
inline constexpr std::size_t maxPrecision = 100;
inline constexpr std::int64_t maxWidth = 255;

// Argument n read as a 32-bit integer; false when n is not an argument.
bool argInt32(const FormatArg* args, std::size_t count, std::size_t n, std::int32_t& value);

// The text of an integer, double or time argument for 'style' (already cut at '@'),
// written to out (numberBuffer bytes). A positive alignment that becomes the field
// width is taken out of 'align'. Answers the length; 0 for an empty text.
std::size_t formatValue(const FormatArg& arg, std::string_view style, const FormatArg* args,
                        std::size_t count, std::int64_t& align, char* out);

// UTF-8 to UTF-16 into out (at least n units); ill-formed input becomes U+FFFD.
std::size_t utf8ToUtf16(const char* text, std::size_t n, char16_t* out);
// UTF-16 to UTF-8 into out (at least 3 * n bytes); lone surrogates become U+FFFD.
std::size_t utf16ToUtf8(const char16_t* text, std::size_t n, char* out);

// Code-page conversions (0 and 65001 UTF-8, others iconv "CP<n>"). They write to
// sink in runs and answer false when the sink refused; an unknown code page gives
// no text.
bool narrowToWide(const char* text, std::size_t n, std::uint32_t codePage,
                  FormatOut<char16_t>& sink);
bool wideToNarrow(const char16_t* text, std::size_t n, std::uint32_t codePage,
                  FormatOut<char>& sink);

// Counts what a conversion would produce (for left alignment).
template <class C>
class CountingOut final : public FormatOut<C> {
public:
    bool write(const C*, std::size_t n) override {
        total += n;
        return true;
    }
    std::size_t total = 0;
};

} // namespace base::format_detail
#pragma GCC visibility pop

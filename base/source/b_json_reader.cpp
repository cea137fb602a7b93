// The JSON reader: a pull tokenizer over a buffered stream.
//
// rapidjson 1.1.0 (the packaged version) offers its parser only as a push
// (SAX) interface, which cannot stop between tokens. The tokenizer below keeps
// rapidjson's grammar, error codes and error texts, and yields one token per
// call: strings are decoded into a reused buffer, numbers are kept as text and
// converted exactly on request, commas and colons are checked and consumed
// between tokens.
#include "b_json.h"

#include "b_exception.h"

#include <rapidjson/error/en.h>

#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>

namespace base {

// ---- Resolvers and defaults -------------------------------------------------------

std::uint32_t DataReaderResolveStringId::resolve(std::string_view, const DataReader&) {
    return noId;
}

IPlugin* DataReaderResolveStringId::plugin(std::uint32_t) {
    return nullptr;
}

namespace {

DataReaderResolveStringId& defaultReaderResolver() {
    static DataReaderResolveStringId resolver;
    return resolver;
}

} // namespace

DataReader::DataReader(DataReaderResolveStringId* resolver)
    : m_resolver(resolver ? resolver : &defaultReaderResolver()) {}

std::uint32_t DataReader::resolveStringId(std::string_view text) {
    return m_resolver->resolve(text, *this);
}

bool DataReader::readFloat(float& value) {
    double d;
    if (!readDouble(d))
        return false;
    value = float(d);
    return true;
}

// ---- JSONException -----------------------------------------------------------------

JSONException::JSONException(std::string_view streamName, std::size_t offset, int code)
    : m_message(format("json parser {}({})| {}", streamName, offset,
                       rapidjson::GetParseError_En(rapidjson::ParseErrorCode(code)))),
      m_offset(offset), m_code(code) {}

// ---- Tokenizer -----------------------------------------------------------------------

namespace {

enum class Token : std::uint8_t {
    none,
    beginObject,
    endObject,
    beginArray,
    endArray,
    key,
    string,
    number,
    trueValue,
    falseValue,
    nullValue,
    end,
};

// Where the tokenizer stands; what may come next.
enum class Place : std::uint8_t {
    start,       // the document's value
    objectFirst, // a member name or '}'
    objectNext,  // a member name (after ',')
    memberValue, // a value (the ':' is consumed with the name)
    afterMember, // ',' or '}'
    arrayFirst,  // a value or ']'
    arrayNext,   // a value (after ',')
    afterItem,   // ',' or ']'
    done,        // after the document's value
};

constexpr bool isDigit(int c) noexcept {
    return c >= '0' && c <= '9';
}

int hexValue(int c) noexcept {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

void appendUtf8(string& out, std::uint32_t cp) {
    if (cp < 0x80) {
        out += char(cp);
    } else if (cp < 0x800) {
        out += char(0xC0 | (cp >> 6));
        out += char(0x80 | (cp & 0x3F));
    } else if (cp < 0x10000) {
        out += char(0xE0 | (cp >> 12));
        out += char(0x80 | ((cp >> 6) & 0x3F));
        out += char(0x80 | (cp & 0x3F));
    } else {
        out += char(0xF0 | (cp >> 18));
        out += char(0x80 | ((cp >> 12) & 0x3F));
        out += char(0x80 | ((cp >> 6) & 0x3F));
        out += char(0x80 | (cp & 0x3F));
    }
}

} // namespace

struct JSONAttrReader::Impl {
    static constexpr std::size_t bufferBytes = 64 * 1024;

    explicit Impl(Stream& s) : stream(s) {
        buffer = static_cast<char*>(guardedAllocate(bufferBytes));
        cursor = end = buffer;
        containers.reserve(32);
    }
    ~Impl() { StdAllocPolicy::deallocateBytes(buffer); }

    // ---- input ----

    bool refill() {
        if (eof)
            return false;
        consumed += std::uint64_t(end - buffer);
        const std::uint64_t got = stream.read(buffer, bufferBytes);
        cursor = buffer;
        end = buffer + got;
        if (!got)
            eof = true;
        return got != 0;
    }
    // 0 at the end of the input, as in rapidjson (so a NUL byte ends it too).
    int peek() {
        if (cursor == end && !refill())
            return 0;
        return static_cast<unsigned char>(*cursor);
    }
    void take() { ++cursor; }
    std::size_t tell() const { return std::size_t(consumed + std::uint64_t(cursor - buffer)); }

    [[noreturn]] void fail(rapidjson::ParseErrorCode code, std::size_t offset) {
        throw JSONException(stream.name(), offset, int(code));
    }
    [[noreturn]] void fail(rapidjson::ParseErrorCode code) { fail(code, tell()); }

    void skipWhitespace() {
        for (;;) {
            if (cursor == end && !refill())
                return;
            const char c = *cursor;
            if (c == '\n')
                ++lineNumber;
            else if (c != ' ' && c != '\t' && c != '\r')
                return;
            ++cursor;
        }
    }

    // ---- tokens ----

    void parseString() {
        text.clear();
        take(); // '"'
        for (;;) {
            if (cursor == end && !refill())
                fail(rapidjson::kParseErrorStringMissQuotationMark);
            // The run up to the next quote, escape or control character.
            const char* run = cursor;
            while (cursor != end) {
                const auto c = static_cast<unsigned char>(*cursor);
                if (c == '"' || c == '\\' || c < 0x20)
                    break;
                ++cursor;
            }
            text.append(run, std::size_t(cursor - run));
            if (cursor == end)
                continue;
            const auto c = static_cast<unsigned char>(*cursor);
            if (c == '"') {
                take();
                return;
            }
            if (c == '\\') {
                escape();
                continue;
            }
            fail(c == 0 ? rapidjson::kParseErrorStringMissQuotationMark
                        : rapidjson::kParseErrorStringInvalidEncoding);
        }
    }

    unsigned hex4() {
        unsigned value = 0;
        for (int i = 0; i < 4; ++i) {
            const int digit = hexValue(peek());
            if (digit < 0)
                fail(rapidjson::kParseErrorStringUnicodeEscapeInvalidHex);
            take();
            value = value << 4 | unsigned(digit);
        }
        return value;
    }

    void escape() {
        const std::size_t at = tell();
        take(); // '\'
        const int c = peek();
        char plain = 0;
        switch (c) {
        case '"':
            plain = '"';
            break;
        case '\\':
            plain = '\\';
            break;
        case '/':
            plain = '/';
            break;
        case 'b':
            plain = '\b';
            break;
        case 'f':
            plain = '\f';
            break;
        case 'n':
            plain = '\n';
            break;
        case 'r':
            plain = '\r';
            break;
        case 't':
            plain = '\t';
            break;
        case 'u': {
            take();
            std::uint32_t cp = hex4();
            if (cp >= 0xD800 && cp <= 0xDBFF) {
                if (peek() != '\\')
                    fail(rapidjson::kParseErrorStringUnicodeSurrogateInvalid);
                take();
                if (peek() != 'u')
                    fail(rapidjson::kParseErrorStringUnicodeSurrogateInvalid);
                take();
                const std::uint32_t low = hex4();
                if (low < 0xDC00 || low > 0xDFFF)
                    fail(rapidjson::kParseErrorStringUnicodeSurrogateInvalid);
                cp = 0x10000 + ((cp - 0xD800) << 10) + (low - 0xDC00);
            } else if (cp >= 0xDC00 && cp <= 0xDFFF) {
                fail(rapidjson::kParseErrorStringUnicodeSurrogateInvalid);
            }
            // The list layout's spelling of a byte outside valid UTF-8.
            if (list && cp >= 0x80 && cp <= 0xFF)
                text += char(cp);
            else
                appendUtf8(text, cp);
            return;
        }
        default:
            fail(rapidjson::kParseErrorStringEscapeInvalid, at);
        }
        take();
        text += plain;
    }

    void literal(const char* rest) {
        for (; *rest; ++rest) {
            if (peek() != *rest)
                fail(rapidjson::kParseErrorValueInvalid);
            take();
        }
    }

    void digits() {
        // Runs within the buffer go in one append.
        while (isDigit(peek())) {
            const char* run = cursor;
            while (cursor != end && isDigit(*cursor))
                ++cursor;
            text.append(run, std::size_t(cursor - run));
        }
    }

    // The number's text, checked against the grammar (and NaN / Infinity).
    void parseNumber() {
        text.clear();
        if (peek() == '-') {
            text += '-';
            take();
        }
        int c = peek();
        if (c == 'N' || c == 'I') {
            if (c == 'N') {
                literal("NaN");
                text += "NaN";
            } else {
                literal("Inf");
                text += "Infinity";
                if (peek() == 'i')
                    literal("inity");
            }
            return;
        }
        if (c == '0') {
            text += '0';
            take();
        } else if (isDigit(c)) {
            digits();
        } else {
            fail(rapidjson::kParseErrorValueInvalid);
        }
        if (peek() == '.') {
            text += '.';
            take();
            if (!isDigit(peek()))
                fail(rapidjson::kParseErrorNumberMissFraction);
            digits();
        }
        c = peek();
        if (c == 'e' || c == 'E') {
            text += 'e';
            take();
            c = peek();
            if (c == '+' || c == '-') {
                text += char(c);
                take();
            }
            if (!isDigit(peek()))
                fail(rapidjson::kParseErrorNumberMissExponent);
            digits();
        }
    }

    Token value(Place after) {
        switch (peek()) {
        case '{':
            return open(Place::objectFirst, Token::beginObject);
        case '[':
            return open(Place::arrayFirst, Token::beginArray);
        case '"':
            parseString();
            place = after;
            return Token::string;
        case 't':
            literal("true");
            place = after;
            return Token::trueValue;
        case 'f':
            literal("false");
            place = after;
            return Token::falseValue;
        case 'n':
            literal("null");
            place = after;
            return Token::nullValue;
        default:
            parseNumber();
            place = after;
            return Token::number;
        }
    }

    Token open(Place inside, Token token) {
        if (containers.size() >= maxDepth)
            fail(rapidjson::kParseErrorTermination);
        take();
        containers.push_back(token == Token::beginObject);
        place = inside;
        return token;
    }

    Token close(Token token) {
        take();
        containers.pop_back();
        place = containers.empty()  ? Place::done
                : containers.back() ? Place::afterMember
                                    : Place::afterItem;
        return token;
    }

    Token memberName() {
        parseString();
        skipWhitespace();
        if (peek() != ':')
            fail(rapidjson::kParseErrorObjectMissColon);
        take();
        place = Place::memberValue;
        return Token::key;
    }

    // Reads the next token into 'token'.
    void lex() {
        skipWhitespace();
        tokenLine = lineNumber;
        const int c = peek();
        switch (place) {
        case Place::start:
            if (!c)
                fail(rapidjson::kParseErrorDocumentEmpty);
            token = value(Place::done);
            return;
        case Place::done:
            token = Token::end;
            return;
        case Place::objectFirst:
            if (c == '}') {
                token = close(Token::endObject);
                return;
            }
            [[fallthrough]];
        case Place::objectNext:
            if (c != '"')
                fail(rapidjson::kParseErrorObjectMissName);
            token = memberName();
            return;
        case Place::memberValue:
            token = value(Place::afterMember);
            return;
        case Place::afterMember:
            if (c == '}') {
                token = close(Token::endObject);
                return;
            }
            if (c != ',')
                fail(rapidjson::kParseErrorObjectMissCommaOrCurlyBracket);
            take();
            place = Place::objectNext;
            lex();
            return;
        case Place::arrayFirst:
            if (c == ']') {
                token = close(Token::endArray);
                return;
            }
            token = value(Place::afterItem);
            return;
        case Place::arrayNext:
            if (c == ']')
                fail(rapidjson::kParseErrorValueInvalid);
            token = value(Place::afterItem);
            return;
        case Place::afterItem:
            if (c == ']') {
                token = close(Token::endArray);
                return;
            }
            if (c != ',')
                fail(rapidjson::kParseErrorArrayMissCommaOrSquareBracket);
            take();
            place = Place::arrayNext;
            lex();
            return;
        }
    }

    // ---- pull interface ----

    Token next() {
        if (token == Token::none)
            lex();
        return token;
    }

    // Consumes the next token, keeping the reader's own depth and whether a
    // member name waits for its value.
    void consume() {
        switch (token) {
        case Token::beginObject:
        case Token::beginArray:
            ++depth;
            break;
        case Token::endObject:
        case Token::endArray:
            --depth;
            break;
        default:
            break;
        }
        afterKey = token == Token::key;
        token = Token::none;
    }

    bool accept(Token wanted) {
        if (next() != wanted)
            return false;
        consume();
        return true;
    }

    bool skipValue() {
        const Token t = next();
        if (t == Token::none || t == Token::end || t == Token::key || t == Token::endObject ||
            t == Token::endArray)
            return false;
        const std::uint32_t outer = depth;
        consume();
        while (depth > outer) {
            next();
            consume();
        }
        return true;
    }

    // A number beyond its type's range reads as a double parser reads it:
    // too small becomes the nearest value (0 or a denormal), too large for
    // a float becomes infinite; beyond the double range it is an error.
    template <class N>
    N outOfRange(const char* first, const char* last) {
        long double wide = 0;
        const auto w = std::from_chars(first, last, wide);
        if (w.ec == std::errc() && std::fabs(wide) <= std::numeric_limits<double>::max())
            return N(double(wide));
        if (w.ec != std::errc()) {
            const std::string_view digits(first, std::size_t(last - first));
            const std::size_t e = digits.find_first_of("eE");
            if (e != std::string_view::npos && e + 1 < digits.size() && digits[e + 1] == '-')
                return N(*first == '-' ? -0.0 : 0.0);
        }
        fail(rapidjson::kParseErrorNumberTooBig);
    }

    template <class N>
    bool number(N& value) {
        if constexpr (std::is_floating_point_v<N>) {
            if (list && next() == Token::string) {
                using limits = std::numeric_limits<N>;
                if (text == "NaN")
                    value = limits::quiet_NaN();
                else if (text == "Infinity" || text == "-Infinity")
                    value = text[0] == '-' ? -limits::infinity() : limits::infinity();
                else
                    return false;
                consume();
                return true;
            }
        }
        if (next() != Token::number)
            return false;
        const char* first = text.data();
        const char* last = first + text.size();
        N parsed;
        std::from_chars_result r;
        if constexpr (std::is_floating_point_v<N>) {
            r = std::from_chars(first, last, parsed);
            if (r.ec == std::errc::result_out_of_range && r.ptr == last) {
                parsed = outOfRange<N>(first, last);
                r.ec = std::errc();
            }
        } else {
            // from_chars takes no sign for unsigned types and would take the
            // leading digits of "1.5"; integers must be the whole text.
            if (std::is_unsigned_v<N> && *first == '-')
                return false;
            r = std::from_chars(first, last, parsed);
        }
        if (r.ec != std::errc() || r.ptr != last)
            return false;
        value = parsed;
        consume();
        return true;
    }

    Stream& stream;
    char* buffer;
    const char* cursor;
    const char* end;
    std::uint64_t consumed = 0;
    bool eof = false;

    string text;
    vector<bool> containers; // true: object
    Place place = Place::start;
    Token token = Token::none;
    std::uint32_t lineNumber = 1;
    std::uint32_t tokenLine = 1;
    std::uint32_t depth = 0;
    bool afterKey = false;
    bool list = false;
};

JSONAttrReader::JSONAttrReader(Stream& stream, DataReaderResolveStringId* resolver)
    : DataReader(resolver), m_impl(new (guardedAllocate(sizeof(Impl))) Impl(stream)) {}

JSONAttrReader::~JSONAttrReader() {
    // Only the bytes up to the current token belong to the document.
    Impl& r = *m_impl;
    const auto ahead = std::int64_t(r.end - r.cursor);
    if (ahead && (r.stream.caps() & capSeek))
        r.stream.setPosition(-ahead, seekCurrent);
    r.~Impl();
    StdAllocPolicy::deallocateBytes(m_impl);
}

const char* JSONAttrReader::streamName() const {
    return m_impl->stream.name();
}

bool JSONAttrReader::beginObject() {
    return m_impl->accept(Token::beginObject);
}
bool JSONAttrReader::endObject() {
    return m_impl->accept(Token::endObject);
}
bool JSONAttrReader::beginArray() {
    return m_impl->accept(Token::beginArray);
}
bool JSONAttrReader::endArray() {
    return m_impl->accept(Token::endArray);
}

bool JSONAttrReader::key(std::string_view& text) {
    if (m_impl->next() != Token::key)
        return false;
    text = m_impl->text;
    m_impl->consume();
    return true;
}

bool JSONAttrReader::readString(string& text) {
    if (m_impl->next() != Token::string)
        return false;
    text = m_impl->text;
    m_impl->consume();
    return true;
}

bool JSONAttrReader::readDouble(double& value) {
    return m_impl->number(value);
}
bool JSONAttrReader::readFloat(float& value) {
    return m_impl->number(value);
}
bool JSONAttrReader::readInt64(std::int64_t& value) {
    return m_impl->number(value);
}
bool JSONAttrReader::readUInt64(std::uint64_t& value) {
    return m_impl->number(value);
}

bool JSONAttrReader::readBool(bool& value) {
    const Token t = m_impl->next();
    if (t != Token::trueValue && t != Token::falseValue)
        return false;
    value = t == Token::trueValue;
    m_impl->consume();
    return true;
}

bool JSONAttrReader::readNull() {
    return m_impl->accept(Token::nullValue);
}

std::uint32_t JSONAttrReader::line() const {
    return m_impl->token == Token::none ? m_impl->lineNumber : m_impl->tokenLine;
}

bool JSONAttrReader::skipValue() {
    return m_impl->skipValue();
}

std::uint32_t JSONAttrReader::depth() const {
    return m_impl->depth;
}

void JSONAttrReader::skipRest(std::uint32_t depth) {
    Impl& r = *m_impl;
    while (r.depth > depth) {
        r.next();
        r.consume();
    }
    if (r.depth == depth && r.afterKey)
        r.skipValue();
}

bool JSONAttrReader::atEnd() {
    return m_impl->next() == Token::end;
}

bool JSONAttrReader::objectFollows() {
    return m_impl->next() == Token::beginObject;
}

void JSONAttrReader::setLayout(JSONLayout layout) noexcept {
    m_impl->list = layout == JSONLayout::list;
}
JSONLayout JSONAttrReader::layout() const noexcept {
    return m_impl->list ? JSONLayout::list : JSONLayout::keyed;
}

} // namespace base

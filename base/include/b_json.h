// The JSON form of attributes, plug-ins and factories.
//
// JSONAttrWriter is a DataWriter that writes pretty-printed JSON through a
// JSONWriteStream (a 64 KB buffer in front of a base::Stream). Layout: one tab
// per nesting level; every object member on its own line as "name": value; an
// empty object is {}. Arrays follow the hint given to beginArray: 1 to 4 keep
// every item on the line of '[' ([1,0.5,-2]); above 4 the items start on the
// next line and wrap once a line has reached the maximum width, and ']' gets a
// line of its own; 0 keeps the items on the line of '[' and puts ']' on a new
// line when there were any. Floats print as the shortest text that reads back
// as the same float (0.1f prints 0.1), doubles as the shortest that reads back
// as the same double; NaN and infinities print as NaN, Infinity and -Infinity,
// which the reader accepts. Closing the outermost container hands the buffered
// text to the stream.
//
// JSONAttrReader is a DataReader that pulls one token at a time from a stream
// (buffered, so the stream may be a pipe). Syntax errors throw JSONException
// with the standard English parse-error texts. Containers nest at most
// JSONAttrReader::maxDepth deep; deeper input is refused as a syntax error, so
// no input can exhaust the stack of the recursive attribute readers. Numbers
// are converted exactly (shortest texts read back bit for bit).
//
// Attributes (b_attribute_json.cpp): single values and arrays per ValueJson<T>
// (b_data_io.h); a map is an object with one member "name^type" per entry
// (entries with flag bit 31 left out), read back through the map's attribute
// factory, the key split at its last '^'; an AttribArray is an object with one
// member per item keyed by the item's type (keys repeat); a link is a one-line
// array of kind, value pairs (plug-in name or id, member name, item or
// component index); a plug-in reference is the object's name, its id when the
// writer's resolver knows no name, or null.
//
// Factories: writeFactory writes one object with a member per object of the
// instance table, in id order, keyed by the object's type name; readFactory
// creates the objects in document order and restores their references.
//
// The list layout (JSONLayout::list) is for general JSON tools, which keep only
// the last of repeated keys and refuse NaN: no key repeats and the text is
// strict JSON. The factory is an array of {"type": T, "attributes": {...}} in
// the same order; an AttribArray is an array of {"type": T, "value": V}; NaN and
// infinities are the strings "NaN", "Infinity" and "-Infinity"; a byte that is
// not part of valid UTF-8 (Latin-1 texts of old files) is written as \u00XX of
// its value. A reader told the layout takes those strings as numbers and
// \u0080 to \u00FF as single bytes, so the bytes read back unchanged; a text
// that a tool re-escaped that way (\u00e9 for e-acute) therefore reads back as
// a Latin-1 byte. readFactory tells the layouts apart by the first token ('{'
// or '['); AttribArray reads both forms in either layout.
#pragma once

#include "b_data_io.h"
#include "b_memory.h"
#include "stream/b_stream.h"

#include <cstddef>
#include <cstdint>
#include <exception>

namespace base {

class PluginFactory;

enum class JSONLayout : std::uint8_t { keyed, list };

// A syntax error in a JSON document. Message: "json parser {stream}({offset})|
// {text}" where offset counts the bytes before the error.
class JSONException : public std::exception {
public:
    // 'code' is a parse-error code of the standard table; codes outside it
    // read "Unknown error.".
    JSONException(std::string_view streamName, std::size_t offset, int code);

    const char* what() const noexcept override { return m_message.c_str(); }
    const string& message() const noexcept { return m_message; }
    std::size_t offset() const noexcept { return m_offset; }
    int code() const noexcept { return m_code; }

private:
    string m_message;
    std::size_t m_offset;
    int m_code;
};

// Buffered output to a base::Stream, in the shape of a rapidjson output stream.
// A short write throws on a strict stream; otherwise the stream is marked as
// failed and later output is dropped.
class JSONWriteStream : NonCopyable {
public:
    using Ch = char;
    static constexpr std::size_t bufferBytes = 64 * 1024;

    explicit JSONWriteStream(Stream& stream);
    // Hands what is left to the stream; a failure is dropped here.
    ~JSONWriteStream();

    void Put(char c) {
        if (m_cursor == m_end)
            drain();
        *m_cursor++ = c;
    }
    // Hands the buffered text to the stream.
    void Flush() { drain(); }
    void write(const char* text, std::size_t bytes);
    // Room for 'bytes' (at most bufferBytes) contiguous bytes; commit() the end
    // of what was written there.
    char* reserve(std::size_t bytes) {
        if (std::size_t(m_end - m_cursor) < bytes)
            drain();
        return m_cursor;
    }
    void commit(char* end) noexcept { m_cursor = end; }

    // Bytes written so far, buffered ones included.
    std::uint64_t tell() const noexcept { return m_drained + std::uint64_t(m_cursor - m_buffer); }
    bool failed() const noexcept { return m_failed; }
    Stream& stream() const noexcept { return m_stream; }

    // The input half of the stream concept; unused.
    char Peek() const { return 0; }
    char Take() { return 0; }
    std::size_t Tell() const { return std::size_t(tell()); }
    char* PutBegin() { return nullptr; }
    std::size_t PutEnd(char*) { return 0; }

private:
    void drain();

    Stream& m_stream;
    char* m_buffer;
    char* m_cursor;
    char* m_end;
    std::uint64_t m_drained = 0;
    bool m_failed = false;
};

class JSONAttrWriter final : public DataWriter {
public:
    // 'maxWidth': the column from which wrapped arrays continue on a new line.
    JSONAttrWriter(Stream& stream, std::uint32_t maxWidth = 120,
                   DataWriterResolveStringId* resolver = nullptr);
    ~JSONAttrWriter() override;

    bool beginObject() override;
    bool endObject() override;
    bool beginArray(std::uint32_t hint) override;
    bool endArray() override;
    bool key(std::string_view text) override;
    bool writeString(std::string_view text) override;
    bool writeDouble(double value) override;
    bool writeFloat(float value) override;
    bool writeUInt64(std::uint64_t value) override;
    bool writeInt64(std::int64_t value) override;
    bool writeUInt32(std::uint32_t value) override;
    bool writeInt32(std::int32_t value) override;
    bool writeBool(bool value) override;
    bool writeNull() override;

    // Whether every byte so far reached the stream (or its buffer).
    bool good() const noexcept;
    // Set before the first value.
    void setLayout(JSONLayout layout) noexcept;
    JSONLayout layout() const noexcept;

private:
    struct Impl;
    Impl* m_impl;
};

class JSONAttrReader final : public DataReader {
public:
    static constexpr std::uint32_t maxDepth = 256;

    explicit JSONAttrReader(Stream& stream, DataReaderResolveStringId* resolver = nullptr);
    // Gives the bytes read ahead back to a seekable stream.
    ~JSONAttrReader() override;

    const char* streamName() const override;
    bool beginObject() override;
    bool endObject() override;
    bool beginArray() override;
    bool endArray() override;
    bool key(std::string_view& text) override;
    bool readString(string& text) override;
    bool readDouble(double& value) override;
    bool readInt64(std::int64_t& value) override;
    bool readUInt64(std::uint64_t& value) override;
    bool readBool(bool& value) override;
    std::uint32_t line() const override;
    bool skipValue() override;
    bool readFloat(float& value) override;
    bool readNull() override;
    std::uint32_t depth() const override;
    void skipRest(std::uint32_t depth) override;

    // Whether the document's root value has been read completely.
    bool atEnd();
    // Whether an object comes next (nothing is consumed).
    bool objectFollows();
    // The list layout's spellings of non-finite numbers and raw bytes.
    void setLayout(JSONLayout layout) noexcept;
    JSONLayout layout() const noexcept;

private:
    struct Impl;
    Impl* m_impl;
};

// Writes every object of the factory that exists and lacks flag bit 31, in id
// order, with references by name (PluginWriterResolveStringId). Progress goes
// to 'progress' as "Writing plugins" with whole percentages. The stream is
// strict for the duration (short writes throw base::exception) and gets its
// flags back afterwards. Answers whether the whole document was written.
bool writeFactory(PluginFactory& factory, Stream& stream, std::uint32_t maxWidth = 120,
                  IProgress* progress = nullptr, JSONLayout layout = JSONLayout::keyed);

// Either layout. Creates an object per member (or item) of the document (unknown types as
// placeholders) and reads it; references by name may point forward. Problems are logged: a syntax
// error ends the reading, and everything read until then is kept (with its references restored).
// Answers whether the document read without problems.
bool readFactory(PluginFactory& factory, Stream& stream);

} // namespace base

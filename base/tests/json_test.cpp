// The JSON form: layout, numbers, every value type both ways, map keys and
// their messages, syntax errors, plug-in references and whole factories.
#include "b_attrib_map.h"
#include "b_json.h"
#include "b_plugin.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstring>
#include <functional>
#include <limits>

using namespace base;

namespace {

// ---- helpers ------------------------------------------------------------------

// Hands out at most a few bytes per read, so every token crosses buffer refills.
class TrickleWorker final : public StreamWorker {
public:
    explicit TrickleWorker(std::string_view text)
        : StreamWorker("trickle", capRead), m_text(text) {}
    std::uint64_t read(void* buffer, std::uint64_t bytes) override {
        bytes = std::min<std::uint64_t>({bytes, 1 + m_position % 3, m_text.size() - m_position});
        std::memcpy(buffer, m_text.data() + m_position, bytes);
        m_position += bytes;
        return bytes;
    }
    std::uint64_t write(const void*, std::uint64_t) override { return 0; }
    std::uint64_t setPosition(std::int64_t, std::uint32_t) override { return m_position; }
    std::uint64_t getPosition() override { return m_position; }
    std::uint64_t getSize() override { return 0; }
    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}

private:
    string m_text;
    std::size_t m_position = 0;
};

// Accepts a fixed number of bytes, then refuses.
class FullWorker final : public StreamWorker {
public:
    explicit FullWorker(std::uint64_t room) : StreamWorker("full", capWrite), m_room(room) {}
    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    std::uint64_t write(const void*, std::uint64_t bytes) override {
        bytes = std::min(bytes, m_room);
        m_room -= bytes;
        return bytes;
    }
    std::uint64_t setPosition(std::int64_t, std::uint32_t) override { return 0; }
    std::uint64_t getPosition() override { return 0; }
    std::uint64_t getSize() override { return 0; }
    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}

private:
    std::uint64_t m_room;
};

string textOf(const Stream& stream) {
    const auto& bytes = static_cast<MemoryStreamWorker*>(stream.worker())->bytes();
    return string(bytes.begin(), bytes.end());
}

Stream streamOf(std::string_view text) {
    return memoryStream("memory", vector<std::uint8_t>(text.begin(), text.end()));
}

string toJson(const Attribute& attribute, std::uint32_t width = 120,
              DataWriterResolveStringId* resolver = nullptr) {
    Stream stream = memoryStream();
    {
        JSONAttrWriter writer(stream, width, resolver);
        EXPECT_TRUE(attribute.write(writer));
    }
    return textOf(stream);
}

bool fromJson(Attribute& attribute, std::string_view text,
              DataReaderResolveStringId* resolver = nullptr) {
    Stream stream = streamOf(text);
    JSONAttrReader reader(stream, resolver);
    return attribute.read(reader);
}

// A value of T that differs from the default and between seeds, with
// fractions that need every digit of the type.
template <class T>
T sample(int seed) {
    if constexpr (std::is_same_v<T, string>) {
        return string("t\"\\\n\x01") + char('a' + seed) + "\xc3\xa9";
    } else if constexpr (std::is_same_v<T, bool>) {
        return seed % 2 == 0;
    } else if constexpr (std::is_same_v<T, TimeCode>) {
        return TimeCode(std::numeric_limits<std::int64_t>::min() + seed);
    } else if constexpr (std::is_floating_point_v<T>) {
        return T(seed + 1) / T(3) * (seed % 2 ? -1 : 1);
    } else if constexpr (std::is_integral_v<T>) {
        return seed % 2 ? std::numeric_limits<T>::max() - T(seed) : std::numeric_limits<T>::min();
    } else {
        T v{};
        int k = seed;
        ValueFields<T>::apply(
            v, [&](auto&... c) { ((c = sample<std::remove_cvref_t<decltype(c)>>(k++)), ...); });
        return v;
    }
}

template <class T>
bool sameValue(const T& a, const T& b) {
    return ValueOps<T>::compare(a, b) == 0;
}

// A plug-in factory with a few registered types.
ref<PluginFactory> makeFactory() {
    ref<PluginFactory> factory(new PluginFactory("test"));
    for (const char* type : {"node", "mesh", "scene"})
        factory->registerPlugin(ref<IPluginDesc>(new PluginDescOf<IPlugin>(type)));
    return factory;
}

ref<IPlugin> makeNode(PluginFactory& factory, const char* type, const char* name) {
    ref<IPlugin> plugin = factory.create(type, 0);
    if (name)
        plugin->setAttribute(name_id("name"), string(name));
    return plugin;
}

string writeAll(PluginFactory& factory, std::uint32_t width = 120, IProgress* progress = nullptr,
                JSONLayout layout = JSONLayout::keyed) {
    Stream stream = memoryStream();
    EXPECT_TRUE(writeFactory(factory, stream, width, progress, layout));
    return textOf(stream);
}

// ---- layout ---------------------------------------------------------------------

struct LayoutCase {
    const char* name;
    std::function<void(DataWriter&)> script;
    const char* expected;
};

class JsonLayout : public testing::TestWithParam<LayoutCase> {};

TEST_P(JsonLayout, MatchesTheRules) {
    Stream stream = memoryStream();
    {
        JSONAttrWriter writer(stream, 12);
        GetParam().script(writer);
    }
    EXPECT_EQ(textOf(stream), GetParam().expected);
}

void numbers(DataWriter& w, int count) {
    for (int i = 0; i < count; ++i)
        w.writeInt32(i * 100);
}

INSTANTIATE_TEST_SUITE_P(
    Rules, JsonLayout,
    testing::Values(
        LayoutCase{"EmptyObject", [](DataWriter& w) { w.beginObject(), w.endObject(); }, "{}"},
        LayoutCase{"ShortArrayInObject",
                   [](DataWriter& w) {
                       w.beginObject(), w.key("v^vec3f"), w.beginArray(3);
                       w.writeFloat(1), w.writeFloat(0.5f), w.writeFloat(-2);
                       w.endArray(), w.key("n"), w.writeInt32(-7), w.endObject();
                   },
                   "{\n\t\"v^vec3f\": [1,0.5,-2],\n\t\"n\": -7\n}"},
        LayoutCase{"NestedObjects",
                   [](DataWriter& w) {
                       w.beginObject(), w.key("a"), w.beginObject(), w.key("b"), w.writeBool(true),
                           w.endObject(), w.key("c"), w.beginObject(), w.endObject(), w.endObject();
                   },
                   "{\n\t\"a\": {\n\t\t\"b\": true\n\t},\n\t\"c\": {}\n}"},
        LayoutCase{"WrappedAtWidth",
                   [](DataWriter& w) { w.beginArray(7), numbers(w, 7), w.endArray(); },
                   "[\n\t0,100,200,300,\n\t400,500,600\n]"},
        LayoutCase{"HintZeroWithItems",
                   [](DataWriter& w) { w.beginArray(0), numbers(w, 2), w.endArray(); },
                   "[0,100\n]"},
        LayoutCase{"HintZeroEmpty", [](DataWriter& w) { w.beginArray(0), w.endArray(); }, "[]"},
        LayoutCase{"LongHintEmpty", [](DataWriter& w) { w.beginArray(9), w.endArray(); }, "[]"},
        LayoutCase{"StringsEscaped",
                   [](DataWriter& w) {
                       w.beginArray(2), w.writeString("a\"b\\c\n\x01"), w.writeNull(), w.endArray();
                   },
                   "[\"a\\\"b\\\\c\\n\\u0001\",null]"}),
    [](const auto& info) { return info.param.name; });

TEST(JsonWriter, RefusesCallsThatBreakTheDocument) {
    Stream stream = memoryStream();
    JSONAttrWriter writer(stream);
    EXPECT_FALSE(writer.endObject());
    ASSERT_TRUE(writer.beginObject());
    EXPECT_FALSE(writer.writeInt32(1)); // a member needs its name first
    EXPECT_FALSE(writer.endArray());
    ASSERT_TRUE(writer.key("k"));
    EXPECT_FALSE(writer.key("again"));
    EXPECT_FALSE(writer.endObject());
    ASSERT_TRUE(writer.writeInt32(1));
    ASSERT_TRUE(writer.endObject());
    EXPECT_FALSE(writer.beginObject()); // one root per document
    EXPECT_EQ(textOf(stream), "{\n\t\"k\": 1\n}");
}

TEST(JsonWriter, ThousandIndicesWrapAtTheWidthAndCloseOnTheirOwnLine) {
    TypedVectorAttribute<std::uint32_t> indices;
    for (std::uint32_t i = 0; i < 1000; ++i)
        indices.items().push_back(i * 7);
    AttribMap map;
    map.attribute(name_id("indices"), indices.clone());
    constexpr std::size_t width = 60;
    const string text = toJson(map, width);

    vector<string> lines;
    for (std::size_t start = 0; start <= text.size();) {
        const std::size_t end = std::min(text.find('\n', start), text.size());
        lines.emplace_back(text.substr(start, end - start));
        start = end + 1;
    }
    ASSERT_GE(lines.size(), 5u);
    EXPECT_EQ(lines[1], "\t\"indices^uint32[]\": [");
    EXPECT_EQ(lines[lines.size() - 2], "\t]");
    EXPECT_EQ(lines.back(), "}");
    for (std::size_t i = 2; i + 2 < lines.size(); ++i) {
        EXPECT_EQ(lines[i].rfind("\t\t", 0), 0u) << lines[i];
        // A line ends where it reached the width: one more item would have
        // followed on it otherwise.
        if (i + 3 < lines.size()) {
            EXPECT_GE(lines[i].size(), width) << lines[i];
            EXPECT_LT(lines[i].size(), width + 8) << lines[i];
        }
    }
    AttribMap back;
    ASSERT_TRUE(fromJson(back, text));
    EXPECT_EQ(*back.findVecAttribute<std::uint32_t>(name_id("indices")), indices.items());
}

// ---- numbers ----------------------------------------------------------------------

template <class T>
string numberText(T value) {
    TypedAttribute<T> a(value);
    return toJson(a);
}

TEST(JsonNumbers, FloatsPrintShortestAndReadBackExactly) {
    struct Row {
        float value;
        const char* text;
    };
    const Row rows[] = {{0.1f, "0.1"},
                        {1.0f, "1"},
                        {0.0f, "0"},
                        {-0.0f, "-0"},
                        {-2.5f, "-2.5"},
                        {1e30f, "1e+30"},
                        {16777216.0f, "16777216"},
                        {3.4028235e38f, "3.4028235e+38"},
                        {1e-45f, "1e-45"},
                        {std::numeric_limits<float>::infinity(), "Infinity"},
                        {-std::numeric_limits<float>::infinity(), "-Infinity"}};
    for (const Row& row : rows) {
        EXPECT_EQ(numberText(row.value), row.text);
        TypedAttribute<float> back(7.0f);
        ASSERT_TRUE(fromJson(back, row.text)) << row.text;
        EXPECT_EQ(std::bit_cast<std::uint32_t>(back.value()),
                  std::bit_cast<std::uint32_t>(row.value))
            << row.text;
    }
    EXPECT_EQ(numberText(std::numeric_limits<float>::quiet_NaN()), "NaN");
    TypedAttribute<float> nan;
    ASSERT_TRUE(fromJson(nan, "NaN"));
    EXPECT_TRUE(std::isnan(nan.value()));
}

TEST(JsonNumbers, WholeNumbersPrintAsTheShortestFormDoes) {
    // Around the border of five digits, where the exponent form becomes the
    // shorter one, and every whole number below it.
    TypedVectorAttribute<float> floats;
    TypedVectorAttribute<double> doubles;
    for (int i = -100002; i <= 100002; ++i) {
        floats.items().push_back(float(i));
        doubles.items().push_back(double(i));
    }
    for (double d : {1e5, 1e6, 123456.0, 16777216.0, 99999.5, -0.0, 2147483648.0}) {
        floats.items().push_back(float(d));
        doubles.items().push_back(d);
    }
    auto expected = [](const auto& items) {
        string text;
        char buffer[32];
        for (const auto& value : items) {
            text.append(buffer, std::to_chars(buffer, buffer + sizeof buffer, value).ptr);
            text += ' ';
        }
        return text;
    };
    // The items as written, one blank after each.
    auto written = [](const Attribute& attribute) {
        string text;
        for (char c : toJson(attribute))
            if (c == ',')
                text += ' ';
            else if (c != '[' && c != ']' && c != '\t' && c != '\n')
                text += c;
        return text + ' ';
    };
    EXPECT_EQ(written(floats), expected(floats.items()));
    EXPECT_EQ(written(doubles), expected(doubles.items()));
}

TEST(JsonNumbers, DoublesAndIntegersReadBackExactly) {
    const double doubles[] = {0.1,
                              1.0 / 3,
                              -1e-310,
                              2.2250738585072014e-308,
                              1.7976931348623157e308,
                              123456789012345678.0};
    for (double d : doubles) {
        const string text = numberText(d);
        TypedAttribute<double> back;
        ASSERT_TRUE(fromJson(back, text)) << text;
        EXPECT_EQ(std::bit_cast<std::uint64_t>(back.value()), std::bit_cast<std::uint64_t>(d))
            << text;
    }
    EXPECT_EQ(numberText(0.1), "0.1");
    EXPECT_EQ(numberText(std::numeric_limits<std::int64_t>::min()), "-9223372036854775808");
    EXPECT_EQ(numberText(std::numeric_limits<std::uint64_t>::max()), "18446744073709551615");
    EXPECT_EQ(numberText(TimeCode(-46186158000)), "-46186158000");
}

// Beyond a type's range a number reads as a double parser reads it: too
// small is the nearest value, too large for a float is infinite; beyond the
// double range it is a syntax error, not a silently dropped value.
TEST(JsonNumbers, FloatingValuesOutOfRangeReadAsTheNearest) {
    struct Row {
        const char* text;
        double asDouble, asFloat;
    };
    const double inf = std::numeric_limits<double>::infinity();
    const Row rows[] = {{"1e-50", 1e-50, 0.0},   {"-1e-50", -1e-50, -0.0}, {"1e-400", 0.0, 0.0},
                        {"-1e-400", -0.0, -0.0}, {"1e-310", 1e-310, 0.0},  {"1e-5000", 0.0, 0.0},
                        {"1e39", 1e39, inf},     {"1.5e300", 1.5e300, inf}};
    for (const Row& row : rows) {
        SCOPED_TRACE(row.text);
        TypedAttribute<double> d(9);
        TypedAttribute<float> f(9);
        ASSERT_TRUE(fromJson(d, row.text));
        ASSERT_TRUE(fromJson(f, row.text));
        EXPECT_EQ(std::bit_cast<std::uint64_t>(d.value()),
                  std::bit_cast<std::uint64_t>(row.asDouble));
        EXPECT_EQ(std::bit_cast<std::uint32_t>(f.value()),
                  std::bit_cast<std::uint32_t>(float(row.asFloat)));
    }
    for (const char* text : {"1e400", "-1e400", "1e5000"}) {
        TypedAttribute<double> d(9);
        EXPECT_THROW(fromJson(d, text), JSONException) << text;
        EXPECT_EQ(d.value(), 9);
    }
}

TEST(JsonNumbers, IntegersOutOfRangeOrWithFractionsDoNotRead) {
    struct Row {
        std::function<bool()> read;
        const char* what;
    };
    TypedAttribute<std::uint8_t> u8(9);
    TypedAttribute<std::int32_t> i32(9);
    TypedAttribute<std::uint64_t> u64(9);
    const Row rows[] = {
        {[&] { return fromJson(u8, "256"); }, "uint8 256"},
        {[&] { return fromJson(u8, "-1"); }, "uint8 -1"},
        {[&] { return fromJson(i32, "2147483648"); }, "int 2^31"},
        {[&] { return fromJson(i32, "1.5"); }, "int 1.5"},
        {[&] { return fromJson(i32, "1e2"); }, "int 1e2"},
        {[&] { return fromJson(u64, "18446744073709551616"); }, "uint64 2^64"},
        {[&] { return fromJson(u64, "-0"); }, "uint64 -0"},
    };
    for (const Row& row : rows)
        EXPECT_FALSE(row.read()) << row.what;
    EXPECT_EQ(u8.value(), 9);
    EXPECT_EQ(i32.value(), 9);
    EXPECT_EQ(u64.value(), 9u);
}

// ---- every value type ----------------------------------------------------------------

template <class T>
void roundTripType(const char* label) {
    SCOPED_TRACE(label);
    TypedAttribute<T> single(sample<T>(1));
    TypedAttribute<T> singleBack(sample<T>(4));
    ASSERT_TRUE(fromJson(singleBack, toJson(single)));
    EXPECT_TRUE(sameValue(singleBack.value(), single.value()));

    TypedVectorAttribute<T> items;
    for (int i = 0; i < 6; ++i)
        items.items().push_back(sample<T>(i));
    TypedVectorAttribute<T> itemsBack;
    itemsBack.items().push_back(sample<T>(9));
    // Through a trickling stream, so values cross every buffer boundary.
    const string text = toJson(items, 20);
    Stream trickle(ref<StreamWorker>(new TrickleWorker(text)));
    JSONAttrReader reader(trickle);
    ASSERT_TRUE(itemsBack.read(reader)) << text;
    EXPECT_EQ(itemsBack.compare(&items.items()), 0) << text;

    // One item alone.
    TypedVectorAttribute<T> oneBack;
    oneBack.items().resize(6);
    const string item = [&] {
        Stream stream = memoryStream();
        JSONAttrWriter writer(stream);
        EXPECT_TRUE(items.write(writer, 2));
        EXPECT_FALSE(items.write(writer, 6));
        return textOf(stream);
    }();
    Stream stream = streamOf(item);
    JSONAttrReader itemReader(stream);
    ASSERT_TRUE(oneBack.read(itemReader, 2)) << item;
    EXPECT_TRUE(sameValue<T>(oneBack.items()[2], items.items()[2]));
}

TEST(JsonValues, EveryVocabularyTypeRoundTrips) {
#define BASE_ROUND_TRIP(T, label, code) roundTripType<T>(label);
    BASE_VALUE_TYPES(BASE_ROUND_TRIP)
#undef BASE_ROUND_TRIP
}

TEST(JsonValues, CompoundsAreOneLineArraysInStorageOrder) {
    AttribMap map;
    map.setAttribute(name_id("q"), base_quat<float>{1, 2, 3, 4});
    map.setAttribute(name_id("box"), base_box<base_vec3<double>>{{-1, -2, -3}, {1, 2, 3}});
    map.setAttribute(name_id("t"), TimeCode(46186158000));
    const string text = toJson(map);
    EXPECT_NE(text.find("\"q^quatf\": [1,2,3,4]"), string::npos) << text;
    EXPECT_NE(text.find("\"box^box3d\": [-1,-2,-3,1,2,3]"), string::npos) << text;
    EXPECT_NE(text.find("\"t^TimeCode\": 46186158000"), string::npos) << text;
}

TEST(JsonValues, FailedReadsLeaveValuesUnchanged) {
    TypedAttribute<base_vec3<float>> v(base_vec3<float>{1, 2, 3});
    EXPECT_FALSE(fromJson(v, "[4,5]"));
    EXPECT_FALSE(fromJson(v, "[4,5,6,7]"));
    EXPECT_FALSE(fromJson(v, "[4,\"5\",6]"));
    EXPECT_TRUE(sameValue(v.value(), base_vec3<float>{1, 2, 3}));
    TypedVectorAttribute<std::uint16_t> items;
    items.items() = {1, 2};
    EXPECT_FALSE(fromJson(items, "[3,4,70000]"));
    EXPECT_EQ(items.items(), (ArrayOf<std::uint16_t>{1, 2}));
}

// ---- maps: keys and messages ---------------------------------------------------------

struct KeyCase {
    const char* name;
    const char* document;
    const char* message; // "" for none
    const char* entries; // the names read, in document order, separated by blanks
};

class JsonMapKeys : public testing::TestWithParam<KeyCase> {};

TEST_P(JsonMapKeys, ReadTheRestAfterAProblem) {
    CaptureLog log;
    ScopedLog scoped(log);
    AttribMap map;
    ASSERT_TRUE(fromJson(map, GetParam().document));
    const auto messages = log.messages();
    if (*GetParam().message) {
        ASSERT_EQ(messages.size(), 1u);
        EXPECT_EQ(messages[0], GetParam().message);
    } else {
        EXPECT_TRUE(messages.empty());
    }
    vector<string> names;
    for (std::string_view rest = GetParam().entries; !rest.empty();) {
        const std::size_t blank = std::min(rest.find(' '), rest.size());
        names.emplace_back(rest.substr(0, blank));
        rest.remove_prefix(std::min(blank + 1, rest.size()));
    }
    EXPECT_EQ(map.size(), names.size());
    for (const string& name : names)
        EXPECT_NE(map.findEntry(name_id(name)), nullptr) << name;
}

INSTANTIATE_TEST_SUITE_P(
    Keys, JsonMapKeys,
    testing::Values(
        KeyCase{"SplitAtLastCaret", "{\"a^b^vec3f\": [1,2,3], \"n^int\": 1}", "", "a^b n"},
        KeyCase{"UnknownTypeSkipsTheWholeValue",
                "{\"x^nosuchtype\": {\"deep\": [1, {\"k\": [2]}]},\n\"n^int\": 1}",
                "json parser memory| Trying to create an attribute '::x' from unknown type "
                "'nosuchtype' at line 1!",
                "n"},
        KeyCase{"NoCaretIsUnknownType", "{\n\"plain\": 5, \"n^int\": 1}",
                "json parser memory| Trying to create an attribute '::plain' from unknown type '' "
                "at line 2!",
                "n"},
        KeyCase{"TrailingCaretIsUnknownType", "{\"a^\": 5, \"n^int\": 1}",
                "json parser memory| Trying to create an attribute '::a' from unknown type '' at "
                "line 1!",
                "n"},
        KeyCase{"EmptyNameIsUnreadable", "{\"^int\": 5, \"n^int\": 1}",
                "json parser memory| Unable to read the value of attribute '::' with type 'int' at "
                "line 1!",
                "n"},
        KeyCase{"WrongValueKind", "{\"v^vec3f\": \"text\",\n\"n^int\": 1}",
                "json parser memory| Unable to read the value of attribute '::v' with type 'vec3f' "
                "at line 1!",
                "n"},
        KeyCase{"PartlyReadValueIsSkipped", "{\"v^vec3f\": [1, 2, {\"a\": [3]}, 4], \"n^int\": 1}",
                "json parser memory| Unable to read the value of attribute '::v' with type 'vec3f' "
                "at line 1!",
                "n"},
        KeyCase{"BadItemInArrayOfMaps",
                "{\"list^array\": {\"map\": {\"a^int\": 1}, \"int\": \"x\", \"map\": {}}, "
                "\"n^int\": 1}",
                "json parser memory| Unable to read the value of attribute '::1' with type 'int' "
                "at line 1!",
                "list n"}),
    [](const auto& info) { return info.param.name; });

TEST(JsonMap, NestedContainersAndTransientEntries) {
    AttribMap map;
    AttribArray* list = map.arrayAttribute(name_id("list"));
    AttribMap* item = list->appendMap();
    item->setAttribute(name_id("w"), 2.5);
    list->append(new TypedAttribute<std::int32_t>(4));
    list->append(new TypedAttribute<std::int32_t>(5));
    list->item(2)->setFlag(Attribute::flagTransient);
    map.setAttribute(name_id("gone"), 1.0f);
    map.findEntry(name_id("gone"))->setFlag(Attribute::flagTransient);
    map.mapAttribute(name_id("empty"));

    const string text = toJson(map);
    EXPECT_EQ(text.find("gone"), string::npos) << text;
    EXPECT_NE(text.find("\"list^array\": {\n\t\t\"map\": {\n\t\t\t\"w^double\": "
                        "2.5\n\t\t},\n\t\t\"int\": 4\n\t}"),
              string::npos)
        << text;
    EXPECT_NE(text.find("\"empty^map\": {}"), string::npos) << text;

    AttribMap back;
    ASSERT_TRUE(fromJson(back, text));
    EXPECT_EQ(toJson(back), text);
    EXPECT_EQ(back.findArray(name_id("list"))->size(), 2u);
}

// ---- syntax errors ---------------------------------------------------------------------

struct SyntaxCase {
    const char* document;
    const char* message;
};

class JsonSyntax : public testing::TestWithParam<SyntaxCase> {};

TEST_P(JsonSyntax, ThrowsWithOffsetAndText) {
    AttribMap map;
    try {
        fromJson(map, GetParam().document);
        ADD_FAILURE() << "no exception for " << GetParam().document;
    } catch (const JSONException& e) {
        EXPECT_STREQ(e.what(), GetParam().message);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Errors, JsonSyntax,
    testing::Values(
        SyntaxCase{"", "json parser memory(0)| The document is empty."},
        SyntaxCase{"{", "json parser memory(1)| Missing a name for object member."},
        SyntaxCase{"{\"a^int\": 1,}", "json parser memory(12)| Missing a name for object member."},
        SyntaxCase{"{\"a^int\" 1}",
                   "json parser memory(9)| Missing a colon after a name of object member."},
        SyntaxCase{"{\"a^int\": 1 \"b\"}",
                   "json parser memory(12)| Missing a comma or '}' after an object member."},
        SyntaxCase{"{\"a^int[]\": [1 2]}",
                   "json parser memory(15)| Missing a comma or ']' after an array element."},
        SyntaxCase{"{\"a^int[]\": [1,]}", "json parser memory(15)| Invalid value."},
        SyntaxCase{"{\"a^int\": tru}", "json parser memory(13)| Invalid value."},
        SyntaxCase{"{\"a^float\": 1.}", "json parser memory(14)| Miss fraction part in number."},
        SyntaxCase{"{\"a^float\": 1e}", "json parser memory(14)| Miss exponent in number."},
        SyntaxCase{"{\"a^string\": \"x\\q\"}",
                   "json parser memory(15)| Invalid escape character in string."},
        SyntaxCase{"{\"a^string\": \"\\u12G4\"}",
                   "json parser memory(18)| Incorrect hex digit after \\u escape in string."},
        SyntaxCase{"{\"a^string\": \"\\ud800x\"}",
                   "json parser memory(20)| The surrogate pair in string is invalid."},
        SyntaxCase{"{\"a^string\": \"ab",
                   "json parser memory(16)| Missing a closing quotation mark in string."},
        SyntaxCase{"{\"a^string\": \"a\tb\"}",
                   "json parser memory(15)| Invalid encoding in string."}));

TEST(JsonSyntax, NestingIsBounded) {
    struct Row {
        const char* name;
        string document;
    };
    string maps = "{";
    for (int i = 0; i < 1000; ++i)
        maps += "\"m^map\": {";
    const Row rows[] = {{"SkippedArrays", "{\"x^nosuch\": " + string(100000, '[')},
                        {"NestedMaps", maps}};
    for (const Row& row : rows) {
        CaptureLog log;
        ScopedLog scoped(log);
        AttribMap map;
        try {
            fromJson(map, row.document);
            ADD_FAILURE() << row.name;
        } catch (const JSONException& e) {
            EXPECT_NE(string(e.what()).find("| Terminate parsing due to Handler error."),
                      string::npos)
                << row.name;
        }
    }
}

// ---- plug-in references ----------------------------------------------------------------

TEST(JsonReferences, ByIdWithTheDefaultResolverByNameThroughTheFactory) {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> a = makeNode(*factory, "node", "alpha");
    ref<IPlugin> b = makeNode(*factory, "node", nullptr);
    PluginAttribute toA(a), toB(b), none;
    EXPECT_EQ(toJson(toA), "0");
    EXPECT_EQ(toJson(none), "null");

    PluginWriterResolveStringId names(*factory);
    EXPECT_EQ(toJson(toA, 120, &names), "\"alpha\"");
    EXPECT_EQ(toJson(toB, 120, &names), "1"); // no name: by id

    PluginReaderResolveStringId ids(*factory);
    PluginAttribute back;
    ASSERT_TRUE(fromJson(back, "\"alpha\"", &ids));
    EXPECT_EQ(back.value().get(), a.get());
    ASSERT_TRUE(fromJson(back, "1", &ids));
    EXPECT_EQ(back.value().get(), b.get());
    ASSERT_TRUE(fromJson(back, "null", &ids));
    EXPECT_FALSE(back.value());
    EXPECT_EQ(back.id(), invalidPluginId);
    // Without a factory an id stays pending, as after the binary form.
    ASSERT_TRUE(fromJson(back, "1"));
    EXPECT_FALSE(back.value());
    EXPECT_EQ(back.pendingId(), 1u);
}

TEST(JsonReferences, UnknownNameLogsAndLeavesTheReferenceEmpty) {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> a = makeNode(*factory, "node", "alpha");
    CaptureLog log;
    ScopedLog scoped(log);
    PluginReaderResolveStringId ids(*factory);
    PluginAttribute back(a);
    ASSERT_TRUE(fromJson(back, "\n\"beta\"", &ids));
    EXPECT_FALSE(back.value());
    EXPECT_EQ(back.id(), invalidPluginId);
    EXPECT_EQ(log.messages(),
              vector<string>{"json parser memory(2)| Unable to find plugin with name 'beta'!"});

    PluginVectorAttribute items;
    ASSERT_TRUE(fromJson(items, "[\"alpha\", null, 0, \"beta\"]", &ids));
    ASSERT_EQ(items.size(), 4u);
    EXPECT_EQ(items.items()[0].get(), a.get());
    EXPECT_EQ(items.items()[2].get(), a.get());
    EXPECT_EQ(items.id(1), invalidPluginId);
    EXPECT_EQ(items.id(3), invalidPluginId);
}

TEST(JsonReferences, DuplicateNamesTravelById) {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> first = makeNode(*factory, "node", "twin");
    ref<IPlugin> second = makeNode(*factory, "node", "twin");
    PluginWriterResolveStringId names(*factory);
    PluginVectorAttribute both;
    both.items() = {first, second};
    EXPECT_EQ(toJson(both, 120, &names), "[\"twin\",1]");
}

TEST(JsonLinks, FlatArrayOnOneLineBothWays) {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> node = makeNode(*factory, "node", "arm");
    ref<IPlugin> unnamed = makeNode(*factory, "node", nullptr);
    AttribPath path;
    path.addPlugin(node.get())
        .addMember(name_id("children"))
        .addItem(2)
        .addMember(name_id("translate"))
        .addComponent(1);
    AttribLink link(path);
    PluginWriterResolveStringId names(*factory);
    const string text = toJson(link, 120, &names);
    EXPECT_EQ(text, "[0,\"arm\",1,\"children\",2,2,1,\"translate\",3,1]");

    PluginReaderResolveStringId ids(*factory);
    AttribLink back;
    ASSERT_TRUE(fromJson(back, text, &ids));
    EXPECT_EQ(back.path().root(), node.get());
    EXPECT_EQ(back.compare(&link.path()), 0);
    EXPECT_EQ(back.toString(), "arm.children[2].translate,1");

    // A plug-in without a name is written and read by id.
    AttribPath byId;
    byId.addPlugin(unnamed.get()).addMember(name_id("scale"));
    const string idText = toJson(AttribLink(byId), 120, &names);
    EXPECT_EQ(idText, "[0,1,1,\"scale\"]");
    ASSERT_TRUE(fromJson(back, idText, &ids));
    EXPECT_EQ(back.path().root(), unnamed.get());
}

TEST(JsonLinks, BrokenPathsAreReported) {
    struct Row {
        const char* document;
        const char* message;
    };
    const Row rows[] = {
        {"5", "json parser memory| Expected an array value at line 1!"},
        {"[\"x\"]", "json parser memory| Expected path entry type at line 1!"},
        {"[1, \"a\", 0, 0]", "json parser memory| Expected path entry type at line 1!"},
        {"[1, 5]", "json parser memory| Expected path entry name at line 1!"},
        {"[1, \"\"]", "json parser memory| Expected path entry name at line 1!"},
        {"[1, \"a\", 2, \"x\"]", "json parser memory| Expected path entry index at line 1!"},
        {"[1, \"a\", 3, 0, 1, \"b\"]", "json parser memory| Expected path entry type at line 1!"},
    };
    for (const Row& row : rows) {
        CaptureLog log;
        ScopedLog scoped(log);
        AttribLink link;
        EXPECT_FALSE(fromJson(link, row.document)) << row.document;
        EXPECT_EQ(log.messages(), vector<string>{row.message}) << row.document;
    }
    // A kind above 3 ends the path.
    AttribLink link;
    ASSERT_TRUE(fromJson(link, "[1, \"a\", 9, \"ignored\", [1]]"));
    EXPECT_EQ(link.toString(), "a");
}

// ---- factories ---------------------------------------------------------------------------

// Every attribute kind, links, nested arrays of maps, references forward and
// backward, by name and (unnamed, duplicate) by id.
ref<PluginFactory> richFactory() {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> scene = makeNode(*factory, "scene", "scene");
    ref<IPlugin> root = makeNode(*factory, "node", "root");
    ref<IPlugin> child = makeNode(*factory, "node", "child");
    ref<IPlugin> unnamed = makeNode(*factory, "mesh", nullptr);
    ref<IPlugin> twin1 = makeNode(*factory, "mesh", "twin");
    ref<IPlugin> twin2 = makeNode(*factory, "mesh", "twin");
    ref<IPlugin> odd = factory->create("unregisteredType", 0);

    auto* rootRef = new PluginAttribute(root);
    scene->attribute(name_id("root"), rootRef);
    auto* kids = new PluginVectorAttribute();
    kids->items() = {child, unnamed, twin2, {}};
    root->attribute(name_id("children"), kids);
    child->attribute(name_id("parent"), new PluginAttribute(root));
    child->attribute(name_id("self"), new PluginAttribute(child));
    odd->setAttribute(name_id("text"), string("a \"quoted\" \\ text\n"));
    odd->attribute(name_id("scene"), new PluginAttribute(scene));

    int seed = 0;
#define BASE_FILL(T, label, code)                                                                  \
    child->setAttribute(name_id("v_" label), sample<T>(seed++));                                   \
    {                                                                                              \
        auto* items = new TypedVectorAttribute<T>();                                               \
        for (int i = 0; i < 6; ++i)                                                                \
            items->items().push_back(sample<T>(seed + i));                                         \
        child->attribute(name_id("a_" label), items);                                              \
    }
    BASE_VALUE_TYPES(BASE_FILL)
#undef BASE_FILL

    AttribArray* layers = child->arrayAttribute(name_id("layers"), name_id("layer"));
    for (int i = 0; i < 3; ++i) {
        AttribMap* layer = layers->appendMap();
        layer->setAttribute(name_id("weight"), float(i) / 10);
        AttribArray* keys = layer->arrayAttribute(name_id("keys"));
        keys->appendMap()->setAttribute(name_id("t"), TimeCode(i));
        keys->append(new PluginAttribute(twin1));
    }
    AttribPath toChild;
    toChild.addPlugin(child.get())
        .addMember(name_id("layers"))
        .addItem(1)
        .addMember(name_id("weight"));
    root->attribute(name_id("weight"), new AttribLink(toChild));
    AttribPath toUnnamed;
    toUnnamed.addPlugin(unnamed.get()).addMember(name_id("v_vec3f")).addComponent(2);
    scene->attribute(name_id("pick"), new AttribLink(toUnnamed));
    // A link into an object written later in the document.
    AttribPath forward;
    forward.addPlugin(twin1.get()).addMember(name_id("name"));
    scene->attribute(name_id("forward"), new AttribLink(forward));
    return factory;
}

class RecordingProgress final : public IProgress {
public:
    void progress(const char* text, int percent) override {
        EXPECT_STREQ(text, "Writing plugins");
        percents.push_back(percent);
    }
    vector<int> percents;
};

TEST(JsonFactory, RoundTripIsByteForByte) {
    ref<PluginFactory> factory = richFactory();
    const string first = writeAll(*factory, 50);
    EXPECT_NE(first.find("\"root^plugin\": \"root\""), string::npos);
    EXPECT_NE(first.find("\"children^plugin[]\": [\"child\",3,5,null]"), string::npos) << first;
    EXPECT_NE(first.find("\"unregisteredType\": {"), string::npos);

    ref<PluginFactory> copy = makeFactory();
    CaptureLog log;
    {
        ScopedLog scoped(log);
        Stream stream = streamOf(first);
        EXPECT_TRUE(readFactory(*copy, stream));
    }
    // Only the placeholder type is reported.
    EXPECT_EQ(log.messages(), vector<string>{"plugin factory test| Unable to create plugin of type "
                                             "unregisteredType! Creating a general plugin with "
                                             "limited functionality..."});
    ASSERT_EQ(copy->pluginCount(), factory->pluginCount());
    EXPECT_EQ(writeAll(*copy, 50), first);

    // References point at the new objects, forward ones included.
    ref<IPlugin> scene = copy->plugin(0), root = copy->plugin(1), child = copy->plugin(2);
    EXPECT_EQ(scene->findAttribute<ref<IPlugin>>(name_id("root"))->get(), root.get());
    EXPECT_EQ((*root->findVecAttribute<ref<IPlugin>>(name_id("children")))[0].get(), child.get());
    EXPECT_EQ(child->findAttribute<ref<IPlugin>>(name_id("self"))->get(), child.get());
    EXPECT_EQ(*scene->findAttribute<string>(name_id("forward")), "twin");
    EXPECT_FLOAT_EQ(*root->findAttribute<float>(name_id("weight")), 0.1f);
}

TEST(JsonFactory, ProgressStrictWritesAndRestoredFlags) {
    ref<PluginFactory> factory = makeFactory();
    for (int i = 0; i < 7; ++i)
        makeNode(*factory, "node", nullptr);
    ref<IPlugin> hidden = makeNode(*factory, "node", "hidden");
    hidden->setFlag(Attribute::flagTransient);
    RecordingProgress progress;
    Stream stream = memoryStream();
    stream.setFlags(streamStrictRead);
    ASSERT_TRUE(writeFactory(*factory, stream, 120, &progress));
    EXPECT_EQ(stream.flags(), streamStrictRead);
    EXPECT_EQ(progress.percents, (vector<int>{0, 13, 25, 38, 50, 63, 75, 88, 100}));
    EXPECT_EQ(textOf(stream).find("hidden"), string::npos);

    Stream full(ref<StreamWorker>(new FullWorker(10)));
    try {
        writeFactory(*factory, full);
        ADD_FAILURE();
    } catch (const base::exception& e) {
        EXPECT_EQ(e.message(), format("stream 'full': trying to write {} bytes, written 10 bytes",
                                      textOf(stream).size()));
    }
    EXPECT_EQ(full.flags(), 0u);
}

TEST(JsonFactory, ReadingKeepsWhatWasReadBeforeAnError) {
    struct Row {
        const char* name;
        const char* document;
        std::uint32_t objects;
        const char* message;
    };
    const Row rows[] = {
        {"SyntaxError",
         "{\"node\": {\"name^string\": \"a\"},\n\"node\": {\"ref^plugin\": \"a\"},\n\"node\": "
         "{\"x^int\": }}",
         3, "json parser memory(78)| Invalid value."},
        {"NotAnObject", "5", 0, "json parser memory(1)| Missing object opening bracket!"},
        {"MemberNotAnObject", "{\"node\": 5, \"node\": {}}", 1,
         "json parser memory(1)| Error reading plugin!"},
        {"ForwardNameNeverDefined", "{\"node\": {\"ref^plugin\": \"nobody\"}}", 1,
         "json parser memory(1)| Unable to find plugin with name 'nobody'!"},
        {"LinkToNameNeverDefined", "{\"node\": {\"l^link\": [0, \"nobody\", 1, \"x\"]}}", 1,
         "json parser memory(1)| Unable to find plugin with name 'nobody'!"},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        ref<PluginFactory> factory = makeFactory();
        CaptureLog log;
        ScopedLog scoped(log);
        Stream stream = streamOf(row.document);
        EXPECT_FALSE(readFactory(*factory, stream));
        EXPECT_EQ(factory->pluginCount(), row.objects);
        EXPECT_EQ(log.messages(), vector<string>{row.message});
    }
    // The object read before the error keeps its reference.
    ref<PluginFactory> factory = makeFactory();
    CaptureLog log;
    ScopedLog scoped(log);
    Stream stream = streamOf(rows[0].document);
    readFactory(*factory, stream);
    EXPECT_EQ(factory->plugin(1)->findAttribute<ref<IPlugin>>(name_id("ref"))->get(),
              factory->plugin(0).get());
}

// Walks one value, failing on a key that repeats within its object or on a
// non-finite number outside a string.
void expectUniqueKeys(JSONAttrReader& r, const string& where) {
    if (r.beginObject()) {
        vector<string> keys;
        std::string_view key;
        while (!r.endObject()) {
            ASSERT_TRUE(r.key(key));
            const string name(key);
            EXPECT_EQ(std::count(keys.begin(), keys.end(), name), 0) << where << "/" << name;
            keys.push_back(name);
            expectUniqueKeys(r, where + "/" + name);
        }
    } else if (r.beginArray()) {
        while (!r.endArray())
            expectUniqueKeys(r, where + "[]");
    } else {
        string text;
        double number = 0;
        if (!r.readString(text) && r.readDouble(number)) {
            EXPECT_TRUE(std::isfinite(number)) << where;
        } else if (text.empty()) {
            r.skipValue();
        }
    }
}

TEST(JsonFactory, ListLayoutRepeatsNoKeyAndReadsBackExactly) {
    ref<PluginFactory> factory = richFactory();
    ref<IPlugin> child = factory->plugin(2);
    child->setAttribute(name_id("nan"), std::numeric_limits<float>::quiet_NaN());
    child->setAttribute(name_id("low"), -std::numeric_limits<double>::infinity());
    child->setAttribute(name_id("high"), std::numeric_limits<float>::infinity());
    // Latin-1 bytes of an old file, valid UTF-8, a byte cut from a sequence.
    const string latin = "caf\xe9 \xff / \xc3\xa9 / \xe2\x82 / \"q\"\t";
    child->setAttribute(name_id("latin"), latin);
    AttribArray* points = child->arrayAttribute(name_id("points"));
    points->append(new TypedAttribute<vec3d>(vec3d(1, 2, 3)));
    points->append(new TypedAttribute<vec3d>(vec3d(4, 5, 6)));
    points->append(new TypedAttribute<float>(std::numeric_limits<float>::quiet_NaN()));

    const string keyed = writeAll(*factory, 50);
    const string list = writeAll(*factory, 50, nullptr, JSONLayout::list);
    ASSERT_EQ(list.front(), '[');
    EXPECT_NE(list.find("\"type\": \"node\""), string::npos);
    EXPECT_NE(list.find("\"nan^float\": \"NaN\""), string::npos) << list;
    EXPECT_NE(list.find("\"low^double\": \"-Infinity\""), string::npos);
    EXPECT_NE(list.find("caf\\u00e9 \\u00ff / \xc3\xa9 / \\u00e2\\u0082 / \\\"q\\\"\\t"),
              string::npos);
    EXPECT_NE(keyed.find("\"nan^float\": NaN"), string::npos);
    EXPECT_NE(keyed.find("\"points^array\": {"), string::npos);
    {
        Stream stream = streamOf(list);
        JSONAttrReader reader(stream);
        reader.setLayout(JSONLayout::list);
        expectUniqueKeys(reader, "");
        EXPECT_TRUE(reader.atEnd());
    }

    // Either layout reads into the same objects; each writes back as it was.
    for (const string* document : {&keyed, &list}) {
        ref<PluginFactory> copy = makeFactory();
        CaptureLog log;
        ScopedLog scoped(log);
        Stream stream = streamOf(*document);
        readFactory(*copy, stream);
        EXPECT_EQ(writeAll(*copy, 50), keyed);
        EXPECT_EQ(writeAll(*copy, 50, nullptr, JSONLayout::list), list);
        ref<IPlugin> read = copy->plugin(2);
        EXPECT_TRUE(std::isnan(*read->findAttribute<float>(name_id("nan"))));
        EXPECT_EQ(*read->findAttribute<double>(name_id("low")),
                  -std::numeric_limits<double>::infinity());
        EXPECT_EQ(*read->findAttribute<string>(name_id("latin")), latin);
    }
}

TEST(JsonFactory, ListLayoutReadingKeepsWhatWasRead) {
    struct Row {
        const char* name;
        const char* document;
        std::uint32_t objects;
        const char* message;
    };
    const Row rows[] = {
        {"ItemNotAnObject", "[5, {\"type\": \"node\", \"attributes\": {}}]", 1,
         "json parser memory(1)| Error reading plugin!"},
        {"AttributesBeforeType", "[{\"attributes\": {}, \"type\": \"node\"}, {\"type\": \"mesh\", "
         "\"attributes\": {}}]", 1, "json parser memory(1)| Error reading plugin!"},
        {"ExtraMember", "[{\"type\": \"node\", \"attributes\": {}, \"x\": 1}]", 1,
         "json parser memory(1)| Missing closing bracket or extra comma before the bracket!"},
        // A bare NaN is still a number to the reader, and the strings only
        // stand for numbers where a number is read.
        {"Values", "[{\"type\": \"node\", \"attributes\": {\"a^float\": NaN, \"b^string\": "
         "\"NaN\", \"c^double\": \"Infinity\"}}]", 1, nullptr},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        ref<PluginFactory> factory = makeFactory();
        CaptureLog log;
        ScopedLog scoped(log);
        Stream stream = streamOf(row.document);
        EXPECT_EQ(readFactory(*factory, stream), row.message == nullptr);
        EXPECT_EQ(factory->pluginCount(), row.objects);
        EXPECT_EQ(log.messages(), row.message ? vector<string>{row.message} : vector<string>{});
    }
    ref<PluginFactory> factory = makeFactory();
    Stream stream = streamOf(rows[3].document);
    ASSERT_TRUE(readFactory(*factory, stream));
    ref<IPlugin> node = factory->plugin(0);
    EXPECT_TRUE(std::isnan(*node->findAttribute<float>(name_id("a"))));
    EXPECT_EQ(*node->findAttribute<string>(name_id("b")), "NaN");
    EXPECT_EQ(*node->findAttribute<double>(name_id("c")), std::numeric_limits<double>::infinity());

    // Array items that are not {"type", "value"} objects are dropped, the rest kept.
    ref<PluginFactory> arrays = makeFactory();
    CaptureLog log;
    ScopedLog scoped(log);
    Stream items = streamOf("[{\"type\": \"node\", \"attributes\": {\"p^array\": [7, {\"value\": "
                            "1, \"type\": \"int\"}, {\"type\": \"int\", \"value\": 2}]}}]");
    readFactory(*arrays, items);
    const AttribArray* p = arrays->plugin(0)->findArray(name_id("p"));
    ASSERT_NE(p, nullptr);
    ASSERT_EQ(p->size(), 1u);
    EXPECT_EQ(log.messages().size(), 2u);
}

} // namespace

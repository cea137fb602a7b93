// Attribute values: the vocabulary against an independent list, the factory, the
// binary form (round trips, truncation, hostile counts), comparison, hashing,
// copying and the watch list.
#include "b_attribute.h"
#include "b_factory.h"
#include "b_murmur3.h"

#include <gtest/gtest.h>

#include <array>
#include <cstring>
#include <set>

using namespace base;

namespace {

// ---- helpers ------------------------------------------------------------------

// A readable stream that cannot tell its size or seek (a pipe, a decoder).
class PipeWorker final : public StreamWorker {
public:
    explicit PipeWorker(vector<std::uint8_t> bytes)
        : StreamWorker("pipe", capRead), m_bytes(std::move(bytes)) {}
    std::uint64_t read(void* buffer, std::uint64_t bytes) override {
        bytes = std::min<std::uint64_t>(bytes, m_bytes.size() - m_position);
        if (bytes)
            std::memcpy(buffer, m_bytes.data() + m_position, bytes);
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
    vector<std::uint8_t> m_bytes;
    std::size_t m_position = 0;
};

Stream pipeStream(vector<std::uint8_t> bytes, std::uint32_t flags = 0) {
    return Stream(ref<StreamWorker>(new PipeWorker(std::move(bytes))), flags);
}

vector<std::uint8_t> binaryOf(const Attribute& a) {
    Stream s = memoryStream();
    EXPECT_TRUE(a.write(s));
    return static_cast<MemoryStreamWorker*>(s.worker())->bytes();
}

// A value of T that differs from the default and between seeds.
template <class T>
T sample(int seed) {
    if constexpr (std::is_same_v<T, string>) {
        return string("text ") + char('a' + seed);
    } else if constexpr (std::is_same_v<T, bool>) {
        return seed % 2 == 0;
    } else if constexpr (std::is_same_v<T, TimeCode>) {
        return TimeCode(-46186158000 * 3 + seed);
    } else if constexpr (std::is_arithmetic_v<T>) {
        return T(seed + 1.25);
    } else {
        T v{};
        int i = seed + 1;
        ValueFields<T>::apply(
            v, [&](auto&... c) { ((c = std::remove_reference_t<decltype(c)>(i++ + 0.25)), ...); });
        return v;
    }
}

struct TypeCase {
    const char* label;
    name_id single;
    name_id array;
    std::int8_t componentType;
    void (*fillSingle)(Attribute&);
    void (*fillArray)(Attribute&);
};

template <class T>
TypeCase typeCase(const char* label) {
    return {label,
            TypeTraits<T>::n_name,
            TypeTraits<T>::n_array_name,
            TypeTraits<T>::componentType,
            [](Attribute& a) {
                const T v = sample<T>(0);
                a.setData(&v);
            },
            [](Attribute& a) {
                const ArrayOf<T> items{sample<T>(0), sample<T>(1), sample<T>(2)};
                a.setData(&items);
            }};
}

const vector<TypeCase>& vocabulary() {
    static const vector<TypeCase> cases = {
#define BASE_TEST_CASE(T, label, code) typeCase<T>(label),
        BASE_VALUE_TYPES(BASE_TEST_CASE)
#undef BASE_TEST_CASE
    };
    return cases;
}

// ---- vocabulary ------------------------------------------------------------------

TEST(TypeVocabulary, NamesAndCodesMatchTheHandWrittenList) {
    // Independent of the X-macro: the labels and codes the documents give.
    const std::pair<const char*, int> expected[] = {
        {"bool", 4},    {"int8", 0},   {"uint8", 1},    {"int16", 2},   {"uint16", 3},
        {"int", 6},     {"uint32", 5}, {"int64", 7},    {"uint64", 8},  {"float", 10},
        {"double", 11}, {"vec2f", 10}, {"vec3f", 10},   {"vec4f", 10},  {"vec2d", 11},
        {"vec3d", 11},  {"vec4d", 11}, {"vec2b", 0},    {"vec3b", 0},   {"vec4b", 0},
        {"vec2ub", 1},  {"vec3ub", 1}, {"vec4ub", 1},   {"vec2s", 2},   {"vec3s", 2},
        {"vec4s", 2},   {"vec2us", 3}, {"vec3us", 3},   {"vec4us", 3},  {"vec2i", 6},
        {"vec3i", 6},   {"vec4i", 6},  {"vec2ui", 5},   {"vec3ui", 5},  {"vec4ui", 5},
        {"quatf", 10},  {"quatd", 11}, {"box3f", 10},   {"box3d", 11},  {"mat22f", 10},
        {"mat22d", 11}, {"mat43", 10}, {"color4f", 10}, {"normal", 10}, {"TimeCode", 7},
        {"string", 12}};
    ASSERT_EQ(vocabulary().size(), std::size(expected));
    for (std::size_t i = 0; i < std::size(expected); ++i) {
        const TypeCase& c = vocabulary()[i];
        EXPECT_STREQ(c.single.c_str(), expected[i].first);
        EXPECT_EQ(c.array.view(), std::string(expected[i].first) + "[]");
        EXPECT_EQ(c.componentType, expected[i].second) << c.label;
    }
    EXPECT_STREQ(TypeTraits<ref<IPlugin>>::n_name.c_str(), "plugin");
    EXPECT_STREQ(TypeTraits<ref<IPlugin>>::n_array_name.c_str(), "plugin[]");
    EXPECT_EQ(TypeTraits<ref<IPlugin>>::componentType, 5);
    EXPECT_EQ(mapTypeName(), name_id("map"));
    EXPECT_EQ(arrayTypeName(), name_id("array"));
    EXPECT_EQ(linkTypeName(), name_id("link"));
}

TEST(TypeVocabulary, BinarySizesOfSingleValues) {
    EXPECT_EQ(TypedAttribute<bool>().binarySize(), 1u);
    EXPECT_EQ(TypedAttribute<vec3d>().binarySize(), 24u);
    EXPECT_EQ(TypedAttribute<quatd>().binarySize(), 32u);
    EXPECT_EQ(TypedAttribute<mat43>().binarySize(), 60u); // no padding
    EXPECT_EQ(TypedAttribute<box3d>().binarySize(), 48u);
    EXPECT_EQ(TypedAttribute<TimeCode>().binarySize(), 8u);
    EXPECT_EQ(TypedAttribute<string>(string("abc")).binarySize(), 7u);
    TypedVectorAttribute<mat43> matrices(ArrayOf<mat43>(2));
    EXPECT_EQ(matrices.binarySize(), 4u + 120u);
    TypedVectorAttribute<string> texts(ArrayOf<string>{string("ab"), string("")});
    EXPECT_EQ(texts.binarySize(), 4u + 6u + 4u);
}

TEST(TypeFactory, HoldsEveryTypeAndCreatesItByName) {
    std::set<name_id> registered;
    for (name_id type : attribFactory().types())
        registered.insert(type);
    for (const TypeCase& c : vocabulary()) {
        for (name_id type : {c.single, c.array}) {
            ASSERT_TRUE(registered.count(type)) << type.c_str();
            std::unique_ptr<Attribute> a(attribFactory().create(type));
            ASSERT_TRUE(a);
            EXPECT_EQ(a->typeName(), type);
            EXPECT_EQ(a->componentType(), c.componentType);
            EXPECT_EQ(a->flags(), 0u);
        }
    }
}

TEST(TypeFactory, UnknownTypeIsLoggedAndAnswersNull) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    EXPECT_EQ(attribFactory().create(name_id("noSuchType")), nullptr);
    EXPECT_FALSE(attribFactory().contains(name_id("noSuchType")));
    EXPECT_EQ(capture.count("factory: Trying to create am item with unknown type noSuchType."), 1u);
}

// ---- binary form ---------------------------------------------------------------

class AttrBinary : public testing::TestWithParam<TypeCase> {};

TEST_P(AttrBinary, EveryTypeRoundTripsThroughTheFactory) {
    const TypeCase& c = GetParam();
    for (bool array : {false, true}) {
        std::unique_ptr<Attribute> a(attribFactory().create(array ? c.array : c.single));
        std::unique_ptr<Attribute> b(attribFactory().create(array ? c.array : c.single));
        ASSERT_TRUE(a && b);
        (array ? c.fillArray : c.fillSingle)(*a);
        ASSERT_NE(a->compare(b->data()), 0) << "the sample must differ from the default";
        a->setFlags(0xABCD0025);
        b->setFlags(0x00001100);

        const auto bytes = binaryOf(*a);
        EXPECT_EQ(bytes.size(), 1 + a->binarySize()) << a->typeName().c_str();
        Stream in = memoryStream("in", bytes);
        ASSERT_TRUE(b->read(in)) << a->typeName().c_str();
        EXPECT_TRUE(in.atEnd());
        EXPECT_EQ(b->compare(a->data()), 0) << a->typeName().c_str();
        EXPECT_EQ(b->toString(), a->toString());
        EXPECT_EQ(b->hash(), a->hash());
        EXPECT_EQ(b->flags(), 0x00001125u); // only the low byte travels
    }
}

INSTANTIATE_TEST_SUITE_P(AttrEveryType, AttrBinary, testing::ValuesIn(vocabulary()),
                         [](const auto& info) { return std::string(info.param.label); });

TEST(AttrBinaryForm, IsLittleEndianMemoryWithCountsAndLengths) {
    TypedAttribute<float> f(1.0f);
    f.setFlags(0x102);
    EXPECT_EQ(binaryOf(f), (vector<std::uint8_t>{0x02, 0x00, 0x00, 0x80, 0x3F}));
    TypedVectorAttribute<std::uint16_t> shorts(ArrayOf<std::uint16_t>{1, 0x203});
    EXPECT_EQ(binaryOf(shorts), (vector<std::uint8_t>{0, 2, 0, 0, 0, 1, 0, 3, 2}));
    TypedAttribute<string> s(string("hi"));
    EXPECT_EQ(binaryOf(s), (vector<std::uint8_t>{0, 2, 0, 0, 0, 'h', 'i'}));
    // mat43: 36 matrix bytes, then the translation; never the padding.
    mat43 m{};
    std::memset(&m, 0xEE, sizeof(m));
    m = mat43::identity();
    m.t = {1, 2, 3};
    const auto bytes = binaryOf(TypedAttribute<mat43>(m));
    ASSERT_EQ(bytes.size(), 61u);
    double tx;
    std::memcpy(&tx, bytes.data() + 1 + 36, 8);
    EXPECT_EQ(tx, 1.0);
}

TEST(AttrBinaryForm, BoolBytesOtherThanOneStillReadAsTrue) {
    TypedAttribute<bool> b;
    Stream in = memoryStream("in", {0, 7});
    ASSERT_TRUE(b.read(in));
    EXPECT_TRUE(b.value());
    TypedVectorAttribute<bool> v;
    Stream arrayIn = memoryStream("in", {0, 2, 0, 0, 0, 0xFF, 0});
    ASSERT_TRUE(v.read(arrayIn));
    EXPECT_EQ(v.toString(), "true false");
}

TEST(AttrBinaryForm, StrictShortReadThrowsTheStreamMessage) {
    TypedAttribute<float> f(5.0f);
    Stream strict = memoryStream("short", {0x01, 0x00, 0x00}, streamStrictRead);
    try {
        f.read(strict);
        ADD_FAILURE() << "no exception";
    } catch (const base::exception& e) {
        EXPECT_STREQ(e.what(), "stream 'short': trying to read 4 bytes, read 2 bytes");
    }
    EXPECT_EQ(f.value(), 5.0f);
    EXPECT_EQ(f.flags(), 0u);

    Stream lenient = memoryStream("short", {0x01, 0x00, 0x00});
    EXPECT_FALSE(f.read(lenient));
    EXPECT_EQ(f.value(), 5.0f);
    EXPECT_EQ(f.flags(), 0u);
}

TEST(AttrBinaryForm, EveryTruncationFailsCleanlyAndKeepsTheValue) {
    // Each prefix goes into a fresh heap block so the sanitizer sees overruns.
    std::unique_ptr<Attribute> sources[] = {
        std::make_unique<TypedVectorAttribute<float>>(ArrayOf<float>{1, 2, 3}),
        std::make_unique<TypedVectorAttribute<mat43>>(ArrayOf<mat43>{mat43::identity()}),
        std::make_unique<TypedVectorAttribute<string>>(
            ArrayOf<string>{string("one"), string(""), string("three")}),
        std::make_unique<TypedVectorAttribute<bool>>(ArrayOf<bool>{true, false}),
        std::make_unique<TypedAttribute<string>>(string("a longer text")),
    };
    for (const auto& source : sources) {
        const auto bytes = binaryOf(*source);
        for (std::size_t n = 0; n < bytes.size(); ++n) {
            for (bool seekable : {true, false}) {
                vector<std::uint8_t> prefix(bytes.begin(), bytes.begin() + n);
                Stream in = seekable ? memoryStream("prefix", std::move(prefix))
                                     : pipeStream(std::move(prefix));
                std::unique_ptr<Attribute> target(attribFactory().create(source->typeName()));
                target->setFlags(0x40);
                const string before = target->toString();
                EXPECT_FALSE(target->read(in)) << source->typeName().c_str() << " " << n;
                EXPECT_EQ(target->toString(), before);
                EXPECT_EQ(target->flags(), 0x40u);
            }
        }
    }
}

TEST(AttrBinaryForm, HugeCountsFailWithoutAllocatingForThem) {
    const vector<std::uint8_t> hostile = {0, 0xFF, 0xFF, 0xFF, 0xFF, 1, 2, 3, 4, 5, 6, 7, 8};
    for (bool seekable : {true, false}) {
        for (name_id type : {TypeTraits<double>::n_array_name, TypeTraits<string>::n_array_name,
                             TypeTraits<mat43>::n_array_name}) {
            std::unique_ptr<Attribute> a(attribFactory().create(type));
            Stream in = seekable ? memoryStream("huge", hostile) : pipeStream(hostile);
            resetHeapPeak();
            const std::size_t live = heapStats().liveBytes;
            EXPECT_FALSE(a->read(in)) << type.c_str();
            EXPECT_LT(heapStats().peakBytes - live, 1u << 20) << type.c_str();
            EXPECT_EQ(a->size(), 0u);
        }
    }
    TypedVectorAttribute<double> a;
    Stream strict = memoryStream("huge", hostile, streamStrictRead);
    EXPECT_THROW(a.read(strict), base::exception);
}

TEST(AttrBinaryForm, RefusesStringsOver256MB) {
    for (const vector<std::uint8_t>& bytes :
         {vector<std::uint8_t>{0, 0x01, 0x00, 0x00, 0x10, 'x'},                // single value
          vector<std::uint8_t>{0, 1, 0, 0, 0, 0x01, 0x00, 0x00, 0x10, 'x'}}) { // array item
        const bool array = bytes.size() > 6;
        std::unique_ptr<Attribute> a(array
                                         ? static_cast<Attribute*>(new TypedVectorAttribute<string>)
                                         : new TypedAttribute<string>);
        Stream in = pipeStream(bytes);
        try {
            a->read(in);
            ADD_FAILURE() << "no exception";
        } catch (const base::exception& e) {
            EXPECT_STREQ(e.what(), "Trying to read a string bigger then 256MB, aborting...");
        }
    }
}

TEST(AttrBinaryForm, SingleItemsOfArrays) {
    TypedVectorAttribute<int> a(ArrayOf<int>{1, 2, 3});
    Stream out = memoryStream();
    ASSERT_TRUE(a.write(out, 1));
    EXPECT_FALSE(a.write(out, 3));
    EXPECT_EQ(static_cast<MemoryStreamWorker*>(out.worker())->bytes().size(), 5u);
    TypedVectorAttribute<int> b(ArrayOf<int>{7, 7});
    out.setPosition(0);
    ASSERT_TRUE(b.read(out, 0));
    EXPECT_EQ(b.toString(), "2 7");
}

// ---- values ----------------------------------------------------------------------

TEST(AttrCompare, ScalarsAndCompoundsInStorageOrder) {
    struct Case {
        int expected, actual;
    };
    const float f = 2;
    const quatf q{1, 0, 0, 0};
    const string s("abc");
    const Case cases[] = {
        {0, TypedAttribute<float>(2).compare(&f)},
        {-1, TypedAttribute<float>(1).compare(&f)},
        {1, TypedAttribute<float>(3).compare(&f)},
        {0, TypedAttribute<float>(std::nanf("")).compare(&f)},      // neither is less
        {-1, TypedAttribute<quatf>(quatf{0, 9, 9, 9}).compare(&q)}, // w decides first
        {1, TypedAttribute<quatf>(quatf{1, 0, 0, 1}).compare(&q)},
        {-1, TypedAttribute<string>(string("abb")).compare(&s)},
        {1, TypedAttribute<string>(string("abcd")).compare(&s)},
    };
    for (std::size_t i = 0; i < std::size(cases); ++i)
        EXPECT_EQ(cases[i].actual, cases[i].expected) << "case " << i;
}

TEST(AttrCompare, ArraysByCountThenFirstDifference) {
    struct Case {
        ArrayOf<int> stored, given;
        int expected;
    };
    const Case cases[] = {{{1, 2}, {1, 3}, -1}, {{1, 3}, {1, 2}, 1}, {{1}, {1, 0}, -1},
                          {{9, 9}, {1}, 1},     {{}, {}, 0},         {{4, 5}, {4, 5}, 0}};
    for (const auto& c : cases)
        EXPECT_EQ(TypedVectorAttribute<int>(c.stored).compare(&c.given), c.expected);
    TypedVectorAttribute<int> a(ArrayOf<int>{1, 2});
    const int two = 2;
    EXPECT_EQ(a.compare(&two, 1), 0);
    EXPECT_EQ(a.compare(&two, 5), -1);
}

TEST(AttrHash, MurmurMatchesTheReferenceVerification) {
    // The reference check: hash keys 0..i-1 with seed 256-i, then hash the digests.
    unsigned char key[256], digests[256 * 16];
    for (int i = 0; i < 256; ++i) {
        key[i] = static_cast<unsigned char>(i);
        murmur3_x86_128(key, i, 256 - i, digests + i * 16);
    }
    unsigned char final[16];
    murmur3_x86_128(digests, sizeof(digests), 0, final);
    const std::uint32_t verification =
        final[0] | final[1] << 8 | final[2] << 16 | std::uint32_t(final[3]) << 24;
    EXPECT_EQ(verification, 0xB3ECE62Au);

    // Split feeding equals one piece.
    Murmur3x86_128 pieces;
    for (int i = 0; i < 256; i += 7)
        pieces.update(key + i, std::min(7, 256 - i));
    Murmur3x86_128 whole;
    whole.update(key, 256);
    EXPECT_EQ(pieces.finish(), whole.finish());
}

TEST(AttrHash, ArraysHashTheirItemBytes) {
    TypedVectorAttribute<std::uint8_t> abc(ArrayOf<std::uint8_t>{'a', 'b', 'c'});
    Murmur3x86_128 expected;
    expected.update("abc", 3);
    EXPECT_EQ(abc.hash(), expected.finish64());
    EXPECT_EQ(TypedVectorAttribute<std::uint8_t>().hash(), 0u);
    EXPECT_EQ(TypedAttribute<int>(5).hash(), 0u);

    // Padding of mat43 never reaches the hash.
    ArrayOf<mat43> dirty(1), clean(1);
    std::memset(dirty.data(), 0xEE, sizeof(mat43));
    std::memset(clean.data(), 0x00, sizeof(mat43));
    dirty[0] = clean[0] = mat43::identity();
    EXPECT_EQ(TypedVectorAttribute<mat43>(dirty).hash(), TypedVectorAttribute<mat43>(clean).hash());

    // Lengths keep differently split texts apart.
    TypedVectorAttribute<string> ab_c(ArrayOf<string>{string("ab"), string("c")});
    TypedVectorAttribute<string> a_bc(ArrayOf<string>{string("a"), string("bc")});
    EXPECT_NE(ab_c.hash(), a_bc.hash());
    EXPECT_EQ(ab_c.hash(), std::unique_ptr<Attribute>(ab_c.clone())->hash());
}

TEST(AttrCopy, NeedsModeBitZeroAndTheSameType) {
    TypedAttribute<float> f(1), f2(2);
    TypedAttribute<double> d(3);
    TypedVectorAttribute<float> v(ArrayOf<float>{1, 2}), v2(ArrayOf<float>{5});
    EXPECT_FALSE(f.copyFrom(d, 1));
    EXPECT_FALSE(d.copyFrom(f, 1));
    EXPECT_FALSE(f.copyFrom(f2, 0));
    EXPECT_FALSE(f.copyFrom(f2, 2));
    EXPECT_FALSE(f.copyFrom(v, 1));
    EXPECT_EQ(f.value(), 1.0f);
    EXPECT_TRUE(f.copyFrom(f2, 1));
    EXPECT_EQ(f.value(), 2.0f);
    EXPECT_TRUE(v.copyFrom(v2, 3));
    EXPECT_EQ(v.toString(), "5");
}

TEST(AttrCopy, CloneKeepsValueAndAllFlagBits) {
    TypedAttribute<vec3f> a(vec3f{1, 2, 3});
    a.setFlags(0xFFFFFFFF);
    std::unique_ptr<Attribute> c(a.clone());
    EXPECT_EQ(c->flags(), 0xFFFFFFFFu);
    EXPECT_EQ(c->compare(a.data()), 0);
    TypedVectorAttribute<string> v(ArrayOf<string>{string("x")});
    v.setFlags(0x90000401);
    std::unique_ptr<Attribute> cv(v.clone());
    EXPECT_EQ(cv->flags(), 0x90000401u);
    EXPECT_EQ(cv->toString(), "x");
    EXPECT_TRUE(cv->isMarked() == false && TypedAttribute<int>().isMarked() == false);
}

TEST(AttrText, ToAndFromString) {
    TypedAttribute<vec3f> v(vec3f{1, 0.5f, -2});
    EXPECT_EQ(v.toString(), "1,0.5,-2");
    EXPECT_FALSE(v.fromString("1,2"));
    EXPECT_EQ(v.toString(), "1,0.5,-2");
    TypedAttribute<float> f(3);
    EXPECT_FALSE(f.fromString("1,5"));
    EXPECT_EQ(f.value(), 3.0f);
    EXPECT_TRUE(f.fromString("12.5e2"));
    EXPECT_EQ(f.value(), 1250.0f);
    EXPECT_EQ(TypedAttribute<float>(2e30f).toString(), "2e+30");
    TypedAttribute<bool> b;
    EXPECT_TRUE(b.fromString("1"));
    EXPECT_EQ(b.toString(), "true");
    TypedAttribute<string> s;
    EXPECT_TRUE(s.fromString(" as is "));
    EXPECT_EQ(s.toString(), " as is ");

    TypedVectorAttribute<vec2i> items;
    EXPECT_TRUE(items.fromString(" 1,2  3, 4\n"));
    EXPECT_EQ(items.toString(), "1,2 3,4");
    EXPECT_FALSE(items.fromString("1,2 3"));
    EXPECT_EQ(items.size(), 2u);
    TypedVectorAttribute<string> texts(ArrayOf<string>{string("a b")});
    EXPECT_FALSE(texts.fromString("c d"));
    EXPECT_EQ(texts.toString(), "a b");
}

TEST(AttrItems, IndexedAccessStaysInBounds) {
    TypedVectorAttribute<double> a(ArrayOf<double>{1, 2, 3});
    EXPECT_EQ(*static_cast<double*>(a.data(2)), 3.0);
    EXPECT_EQ(a.data(3), nullptr);
    EXPECT_EQ(a.data(wholeValue), &a.items());
    const double nine = 9;
    a.setData(&nine, 0);
    EXPECT_THROW(a.setData(&nine, 3), invalid_argument);
    EXPECT_TRUE(a.removeItem(1));
    EXPECT_FALSE(a.removeItem(2));
    EXPECT_EQ(a.toString(), "9 3");
    TypedVectorAttribute<bool> flags(ArrayOf<bool>{true, false});
    EXPECT_EQ(*static_cast<bool*>(flags.data(0)), true);
    EXPECT_EQ(a.size(), 2u);
    EXPECT_EQ(TypedAttribute<double>().size(), 1u);
    EXPECT_FALSE(TypedAttribute<double>().removeItem(0));
}

// ---- watch list ------------------------------------------------------------------

TEST(AttrWatch, DestructionNullsEveryWatcher) {
    WatchNode first{}, second{}, third{};
    auto* a = new TypedAttribute<int>(1);
    ASSERT_TRUE(a->addWatch(first));
    ASSERT_TRUE(a->addWatch(second));
    ASSERT_TRUE(a->addWatch(third));
    EXPECT_EQ(second.watched, a);
    EXPECT_TRUE(a->removeWatch(second));
    EXPECT_FALSE(a->removeWatch(second));
    EXPECT_EQ(second.watched, nullptr);
    EXPECT_EQ(a->watchList(), &third);
    EXPECT_EQ(third.next, &first);
    delete a;
    EXPECT_EQ(first.watched, nullptr);
    EXPECT_EQ(third.watched, nullptr);
    EXPECT_EQ(third.next, nullptr);
}

TEST(AttrWatch, NoWatchFlagRefusesNodes) {
    TypedAttribute<int> a;
    a.setFlag(Attribute::flagNoWatch);
    WatchNode node{};
    EXPECT_FALSE(a.addWatch(node));
    EXPECT_EQ(node.watched, nullptr);
    EXPECT_EQ(a.watchList(), nullptr);
}

} // namespace

// Binary form of maps, arrays and links: round trips over seekable and forward-only
// streams, skipping of unknown types, and hostile input (every truncation, random
// mutations, huge counts and lengths, deep nesting).
#include "b_attrib_map.h"

#include <gtest/gtest.h>

#include <cstring>
#include <random>

using namespace base;

namespace {

const name_id nName("name");
const name_id nValue("value");
const name_id nItems("items");
const name_id nLink("link");
const name_id nNested("nested");

// A stream that can neither seek nor tell its size (a pipe, a decoder).
class ForwardWorker final : public StreamWorker {
public:
    explicit ForwardWorker(vector<std::uint8_t> bytes = {})
        : StreamWorker("forward", capRead | capWrite), m_bytes(std::move(bytes)) {}
    std::uint64_t read(void* buffer, std::uint64_t bytes) override {
        bytes = std::min<std::uint64_t>(bytes, m_bytes.size() - m_position);
        if (bytes)
            std::memcpy(buffer, m_bytes.data() + m_position, bytes);
        m_position += bytes;
        return bytes;
    }
    std::uint64_t write(const void* buffer, std::uint64_t bytes) override {
        const auto* p = static_cast<const std::uint8_t*>(buffer);
        m_bytes.insert(m_bytes.end(), p, p + bytes);
        return bytes;
    }
    std::uint64_t setPosition(std::int64_t, std::uint32_t) override { return m_position; }
    std::uint64_t getPosition() override { return m_position; }
    std::uint64_t getSize() override { return 0; }
    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}
    const vector<std::uint8_t>& bytes() const { return m_bytes; }

private:
    vector<std::uint8_t> m_bytes;
    std::size_t m_position = 0;
};

enum class Kind { seekable, forward };

Stream streamOver(Kind kind, vector<std::uint8_t> bytes = {}) {
    if (kind == Kind::seekable)
        return memoryStream("memory", std::move(bytes));
    return Stream(ref<StreamWorker>(new ForwardWorker(std::move(bytes))));
}

vector<std::uint8_t> bytesOf(const Stream& s) {
    if (auto* m = dynamic_cast<MemoryStreamWorker*>(s.worker()))
        return m->bytes();
    return static_cast<ForwardWorker*>(s.worker())->bytes();
}

vector<std::uint8_t> binaryOf(const Attribute& a, Kind kind = Kind::seekable) {
    Stream s = streamOver(kind);
    EXPECT_TRUE(a.write(s));
    return bytesOf(s);
}

// Hand-made binary forms.
struct Bytes {
    vector<std::uint8_t> data;
    Bytes& u8(std::uint8_t v) {
        data.push_back(v);
        return *this;
    }
    Bytes& u32(std::uint32_t v) {
        for (int i = 0; i < 4; ++i)
            data.push_back(std::uint8_t(v >> (8 * i)));
        return *this;
    }
    Bytes& text(std::string_view t) {
        u32(std::uint32_t(t.size()));
        data.insert(data.end(), t.begin(), t.end());
        return *this;
    }
    Bytes& raw(const vector<std::uint8_t>& bytes) {
        data.insert(data.end(), bytes.begin(), bytes.end());
        return *this;
    }
};

class Root : public AttribMap {
public:
    std::uint32_t instanceId() const override { return 7; }
};

// A scene-like record: values, an array of maps, a nested map with a link.
std::unique_ptr<AttribMap> sample(Root& root) {
    root.setAttribute(nValue, base_vec3<double>{1, 2, 3});
    auto map = std::make_unique<AttribMap>(&attribFactory(), name_id("node"));
    map->setAttribute<string>(nName, string("node1"));
    map->setAttribute(nValue, 2.5f);
    map->appendAttributeItem<std::uint32_t>(name_id("indices"), 9);
    AttribArray* items = map->arrayAttribute(nItems, name_id("item"));
    for (int i = 0; i < 3; ++i)
        items->appendMap()->setAttribute(nValue, i);
    items->append(new TypedAttribute<double>(0.25));
    AttribMap* nested = map->mapAttribute(nNested);
    AttribPath path;
    path.addPlugin(&root).addMember(nValue).addComponent(2);
    nested->attribute(nLink, new AttribLink(path));
    nested->setFlags(0x05);
    return map;
}

class AttribBinary : public testing::TestWithParam<Kind> {
protected:
    CaptureLog capture;
    ScopedLog scoped{capture};
};

TEST_P(AttribBinary, NestedMapRoundTrips) {
    Root root;
    auto map = sample(root);
    const vector<std::uint8_t> bytes = binaryOf(*map, GetParam());
    EXPECT_EQ(bytes, binaryOf(*map, Kind::seekable)); // counted and patched agree

    AttribMap copy;
    Stream in = streamOver(GetParam(), bytes);
    ASSERT_TRUE(copy.read(in));
    const AttribArray* items = copy.findArray(nItems);
    ASSERT_NE(items, nullptr);
    const AttribMap* nested = copy.findMap(nNested);
    ASSERT_NE(nested, nullptr);
    EXPECT_EQ(nested->flags(), 0x05u);
    auto* link = const_cast<Attribute*>(nested->findEntry(nLink))->asLink();
    ASSERT_NE(link, nullptr);
    EXPECT_EQ(link->path().rootId(), 7u);
    EXPECT_EQ(link->path().component(), 2u);
    link->path().setRoot(&root); // what the plug-in factory does by id
    EXPECT_EQ(copy.compare(map->data()), 0);
    EXPECT_EQ(nested->findAttribute<base_vec3<double>>(nLink)->z, 3.0);
    EXPECT_TRUE(capture.entries().empty());

    // Classes are not stored: an array gives its own to the maps it reads.
    AttribArray classed(name_id("item"));
    Stream itemsIn = streamOver(GetParam(), binaryOf(*items, GetParam()));
    ASSERT_TRUE(classed.read(itemsIn));
    EXPECT_EQ(classed.item(0)->asMap()->className(), name_id("item"));
}

TEST_P(AttribBinary, UnknownTypesAreSkippedByTheirByteCount) {
    const vector<std::uint8_t> one = binaryOf(TypedAttribute<int>(11));
    const Bytes bytes = Bytes()
                            .u8(0)
                            .u32(3)
                            .text("a")
                            .text("int")
                            .u32(5)
                            .raw(one)
                            .text("b")
                            .text("futureType")
                            .u32(1500)
                            .raw(vector<std::uint8_t>(1500, 0xEE))
                            .text("c")
                            .text("int")
                            .u32(5)
                            .raw(one);
    AttribMap map;
    Stream in = streamOver(GetParam(), bytes.data);
    ASSERT_TRUE(map.read(in));
    EXPECT_EQ(map.size(), 2u);
    EXPECT_EQ(*map.findAttribute<int>(name_id("c")), 11);
    EXPECT_EQ(capture.messages(),
              vector<string>{"map attribute: Attribute 'b' has unknown type. This may be caused "
                             "by newer version or corrupted file. Trying to skip..."});
    EXPECT_EQ(capture.entries()[0].level, logError);

    const Bytes array =
        Bytes().u8(0).u32(2).text("futureType").u32(3).raw({1, 2, 3}).text("int").u32(5).raw(one);
    AttribArray items;
    Stream arrayIn = streamOver(GetParam(), array.data);
    ASSERT_TRUE(items.read(arrayIn));
    EXPECT_EQ(items.size(), 1u);
    EXPECT_EQ(capture.count("array attribute: Unknown attribute type 'futureType'. Ignoring..."),
              1u);
}

TEST_P(AttribBinary, EveryTruncationIsRejected) {
    Root root;
    auto map = sample(root);
    const vector<std::uint8_t> bytes = binaryOf(*map);
    for (std::size_t n = 0; n < bytes.size(); ++n) {
        // A fresh buffer per try, so the sanitizer sees any overrun.
        vector<std::uint8_t> prefix(bytes.begin(), bytes.begin() + n);
        Stream in = streamOver(GetParam(), std::move(prefix));
        AttribMap copy;
        copy.setAttribute(nValue, 1);
        EXPECT_FALSE(copy.read(in)) << n;
        EXPECT_EQ(copy.size(), 1u) << n; // unchanged
    }
}

TEST_P(AttribBinary, MutationsNeverCrash) {
    Root root;
    auto map = sample(root);
    const vector<std::uint8_t> bytes = binaryOf(*map);
    std::mt19937 random(1234);
    for (int round = 0; round < 3000; ++round) {
        vector<std::uint8_t> mutated = bytes;
        for (int k = 1 + int(random() % 4); k > 0; --k)
            mutated[random() % mutated.size()] = std::uint8_t(random());
        Stream in = streamOver(GetParam(), std::move(mutated));
        AttribMap copy;
        try {
            if (copy.read(in))
                (void)copy.compare(map->data()); // what was read is usable
        } catch (const exception&) {
            // a 256 MB string length: refused by throwing
        }
    }
}

TEST_P(AttribBinary, HugeCountsAndLengthsAllocateNothing) {
    struct Case {
        Bytes bytes;
        const char* thrown;
    };
    const Case cases[] = {
        {Bytes().u8(0).u32(0x80000000u), nullptr}, // entry count 2^31
        {Bytes().u8(0).u32(1).u32(300u << 20).raw(vector<std::uint8_t>(16)),
         "Trying to read a string bigger then 256MB, aborting..."},
        {Bytes().u8(0).u32(1).u32(200u << 20).raw({'a', 'b'}), nullptr}, // length past the end
        {Bytes().u8(0).u32(1).text("a").text("int").u32(0xFFFFFFF0u), nullptr},
        {Bytes()
             .u8(0)
             .u32(1)
             .text(std::string_view("\0a", 2))
             .text("int")
             .u32(5)
             .raw({0, 1, 0, 0, 0}),
         nullptr},
        {Bytes().u8(0).u32(1).text("a").text("array").u32(9).u8(0).u32(0x7FFFFFFF), nullptr},
        {Bytes().u8(0).u32(1).text("a").text("link").u32(9).u8(0).u32(0x7FFFFFFF), nullptr},
    };
    for (const Case& c : cases) {
        resetHeapPeak();
        const std::size_t before = heapStats().liveBytes;
        AttribMap map;
        Stream in = streamOver(GetParam(), c.bytes.data);
        if (c.thrown) {
            try {
                map.read(in);
                ADD_FAILURE() << c.thrown;
            } catch (const exception& e) {
                EXPECT_STREQ(e.what(), c.thrown);
                EXPECT_EQ(e.function(), "base::AttribMap::read");
            }
        } else {
            EXPECT_FALSE(map.read(in));
        }
        EXPECT_LT(heapStats().peakBytes - before, 1u << 20);
        EXPECT_EQ(map.size(), 0u);
    }
    EXPECT_TRUE(name_id("").empty()); // the NUL-bearing name was not interned
}

TEST_P(AttribBinary, DeepNestingIsRejected) {
    // 1000 maps, each the only entry of the next.
    vector<std::uint8_t> inner = Bytes().u8(0).u32(0).data;
    for (int i = 0; i < 1000; ++i)
        inner = Bytes()
                    .u8(0)
                    .u32(1)
                    .text("m")
                    .text("map")
                    .u32(std::uint32_t(inner.size()))
                    .raw(inner)
                    .data;
    AttribMap map;
    Stream in = streamOver(GetParam(), std::move(inner));
    EXPECT_FALSE(map.read(in));
    EXPECT_GE(
        capture.count("map attribute: Unable to read the map entries! Probably a corrupted file!"),
        1u);
}

INSTANTIATE_TEST_SUITE_P(AttribBinaryStreams, AttribBinary,
                         testing::Values(Kind::seekable, Kind::forward), [](const auto& info) {
                             return std::string(info.param == Kind::seekable ? "Seekable"
                                                                             : "Forward");
                         });

TEST(AttribBinaryTransient, EntriesAndLinksOfTransientObjectsAreLeftOut) {
    Root live, transient;
    transient.setFlags(Attribute::flagTransient | Attribute::flagNoWatch);
    AttribMap map;
    map.setAttribute(nValue, 1);
    map.setAttribute(name_id("skipped"), 2);
    map.findEntry(name_id("skipped"))->setFlag(Attribute::flagTransient);
    AttribPath toLive, toTransient;
    toLive.addPlugin(&live).addMember(nValue);
    toTransient.addPlugin(&transient).addMember(nValue);
    map.attribute(nLink, new AttribLink(toLive));
    map.attribute(name_id("gone"), new AttribLink(toTransient));
    AttribArray* items = map.arrayAttribute(nItems);
    items->append(new TypedAttribute<int>(1));
    items->append(new TypedAttribute<int>(2));
    items->item(0)->setFlag(Attribute::flagTransient);

    AttribMap copy;
    Stream in = memoryStream("memory", binaryOf(map));
    ASSERT_TRUE(copy.read(in));
    EXPECT_EQ(copy.size(), 3u);
    EXPECT_NE(copy.findEntry(nLink), nullptr);
    EXPECT_EQ(copy.findArray(nItems)->size(), 1u);
}

} // namespace

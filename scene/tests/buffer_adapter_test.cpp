// Buffer adapters: clamped ranges, typed outputs, messages and re-runs on the
// buffer's change notifications.
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_log.h"
#include "b_plugin_attribute.h"

#include <gtest/gtest.h>

#include <cstring>
#include <numeric>
#include <string>
#include <vector>

namespace {

using namespace scene;
using base::ref, base::IPlugin, base::PluginFactory, base::name_id;

// Counts the notifications an adapter sends, by attribute.
struct Recorder : base::PluginCallback {
    std::vector<std::pair<name_id, std::uint64_t>> seen;
    void pluginChanged(IPlugin&, name_id attribute, std::uint32_t, std::uint64_t id) override {
        seen.emplace_back(attribute, id);
    }
};

struct Adapter : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("test")};
    ref<IPlugin> buffer;
    ref<IBufferAdapter> adapter;

    Adapter() {
        register_scene_schema(*factory);
        buffer = factory->create("buffer", PluginFactory::createNullIfUnknown);
        buffer->setAttribute(names::name, base::string("buf"));
        auto& bytes = buffer->vecAttribute<std::uint8_t>(names::data)->items();
        bytes.resize(10);
        std::iota(bytes.begin(), bytes.end(), std::uint8_t(0));
        ref<IPlugin> made = factory->create("bufferAdapter", PluginFactory::createNullIfUnknown);
        adapter = ref<IBufferAdapter>(dynamic_cast<IBufferAdapter*>(made.get()));
        adapter->setAttribute(names::name, base::string("ad"));
        for (name_id output : outputs())
            adapter->attributeOfType(output, arrayType(output));
    }

    static std::vector<name_id> outputs() {
        return {names::outputUint8,  names::outputUint16, names::outputUint32, names::outputFloat,
                names::outputFloat2, names::outputFloat3, names::outputFloat4};
    }
    static name_id arrayType(name_id output) {
        using base::TypeTraits;
        if (output == names::outputUint8)
            return TypeTraits<std::uint8_t>::n_array_name;
        if (output == names::outputUint16)
            return TypeTraits<std::uint16_t>::n_array_name;
        if (output == names::outputUint32)
            return TypeTraits<std::uint32_t>::n_array_name;
        if (output == names::outputFloat)
            return TypeTraits<float>::n_array_name;
        if (output == names::outputFloat2)
            return TypeTraits<base::vec2f>::n_array_name;
        if (output == names::outputFloat3)
            return TypeTraits<base::vec3f>::n_array_name;
        return TypeTraits<base::vec4f>::n_array_name;
    }
    // Item counts as readers see them (the byte view followed to the buffer).
    std::vector<std::uint32_t> counts() const {
        std::vector<std::uint32_t> out;
        for (name_id output : outputs()) {
            const base::Attribute* found = adapter->findOfType(output, arrayType(output));
            out.push_back(found ? found->size() : 0);
        }
        return out;
    }
    std::vector<std::uint32_t> copiedCounts() const {
        std::vector<std::uint32_t> all = counts();
        return std::vector<std::uint32_t>(all.begin() + 1, all.end());
    }
    const base::ArrayOf<std::uint8_t>& bytesOut() const {
        return *adapter->findVecAttribute<std::uint8_t>(names::outputUint8);
    }
};

struct ClampCase {
    const char* name;
    std::uint32_t offset;
    std::uint32_t length; // 0: not set
    std::vector<std::uint32_t> counts;
    std::uint8_t first;
};

class Clamping : public Adapter, public ::testing::WithParamInterface<ClampCase> {};

TEST_P(Clamping, OutputsCoverTheClampedRange) {
    const ClampCase& c = GetParam();
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->setAttribute(names::inputOffset, c.offset);
    if (c.length)
        adapter->setAttribute(names::inputLength, c.length);
    adapter->update();
    EXPECT_TRUE(log.messages().empty());
    EXPECT_EQ(counts(), c.counts);
    if (!bytesOut().empty()) {
        EXPECT_EQ(bytesOut()[0], c.first);
    }
}
INSTANTIATE_TEST_SUITE_P(
    Adapter, Clamping,
    ::testing::Values(ClampCase{"whole", 0, 0, {10, 5, 2, 2, 1, 0, 0}, 0},
                      ClampCase{"tailPastEnd", 4, 100, {6, 3, 1, 1, 0, 0, 0}, 4},
                      ClampCase{"offsetPastEnd", 20, 0, {0, 0, 0, 0, 0, 0, 0}, 0},
                      ClampCase{"window", 1, 8, {8, 4, 2, 2, 1, 0, 0}, 1}),
    [](const auto& info) { return std::string(info.param.name); });

TEST_F(Adapter, MissingInputsLogOnceAndKeepTheOutputs) {
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->update();
    const std::vector<std::uint32_t> before = counts();

    adapter->removeAttribute(names::inputBuffer);
    log.clear();
    adapter->update();
    EXPECT_EQ(log.messages(),
              (base::vector<base::string>{"bufferAdapter |ad| Missing `inputBuffer` attribute!"}));
    EXPECT_EQ(counts(), before);

    adapter->setAttribute(names::inputBuffer, buffer);
    buffer->removeAttribute(names::data);
    log.clear();
    adapter->update();
    EXPECT_EQ(log.messages(),
              (base::vector<base::string>{"bufferAdapter |ad| Missing `data` attribute in buf!"}));
    // The copies stay; the byte view shows the buffer, which has no data now.
    EXPECT_EQ(copiedCounts(), std::vector<std::uint32_t>(before.begin() + 1, before.end()));
    EXPECT_EQ(adapter->findVecAttribute<std::uint8_t>(names::outputUint8), nullptr);
}

TEST_F(Adapter, BufferChangesRunTheAdapterOncePerStamp) {
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->update();
    Recorder recorder;
    adapter->addListener(recorder);

    auto& bytes = buffer->vecAttribute<std::uint8_t>(names::data)->items();
    bytes.assign(16, 0xAB); // reallocates: the outputs must not point at the old block
    const std::uint64_t stamp = base::PluginCallback::nextChangeStamp();
    buffer->notify(names::data, base::PluginCallback::changeKind, stamp);
    ASSERT_EQ(bytesOut().size(), 16u);
    EXPECT_EQ(bytesOut()[15], 0xAB);
    EXPECT_EQ(copiedCounts()[0], 8u);
    // One notification per output, carrying the buffer's stamp on.
    ASSERT_EQ(recorder.seen.size(), outputs().size());
    EXPECT_EQ(recorder.seen[0], std::make_pair(names::outputUint8, stamp));

    // The same change arriving a second way is not run again: the copies
    // keep the run's bytes while the byte view shows the buffer as it is.
    bytes.resize(3);
    buffer->notify(names::data, base::PluginCallback::changeKind, stamp);
    EXPECT_EQ(copiedCounts()[0], 8u);
    EXPECT_EQ(bytesOut().size(), 3u);
    buffer->notify(names::data, base::PluginCallback::changeKind,
                   base::PluginCallback::nextChangeStamp());
    EXPECT_EQ(copiedCounts()[0], 1u);
}

TEST_F(Adapter, AnotherBufferReplacesTheOldOneSafely) {
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->update();
    ref<IPlugin> other = factory->create("buffer", PluginFactory::createUnregistered);
    other->vecAttribute<std::uint8_t>(names::data)->items() = {1, 2};
    adapter->setAttribute(names::inputBuffer, other);
    adapter->update();
    EXPECT_FALSE(buffer->hasListener(*adapter));
    EXPECT_TRUE(other->hasListener(*adapter));
    EXPECT_EQ(bytesOut().size(), 2u);

    // The copies own their bytes; the byte view of a dead buffer resolves
    // to nothing rather than to freed memory.
    adapter->removeAttribute(names::inputBuffer);
    other.reset();
    EXPECT_EQ(copiedCounts()[0], 1u);
    EXPECT_EQ(adapter->findVecAttribute<std::uint8_t>(names::outputUint8), nullptr);
}

// The byte output over a whole buffer holds no copy: it reads the buffer's
// own array, also after the array is replaced; over part of the buffer it
// is a copy, and a view again once the range covers everything.
TEST_F(Adapter, ByteOutputIsAViewOfAWholeBuffer) {
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->update();
    ASSERT_NE(adapter->findEntry(names::outputUint8)->asLink(), nullptr);
    EXPECT_EQ(bytesOut().data(), buffer->findVecAttribute<std::uint8_t>(names::data)->data());

    buffer->removeAttribute(names::data);
    buffer->vecAttribute<std::uint8_t>(names::data)->items() = {5, 6, 7};
    EXPECT_EQ(bytesOut(), (base::ArrayOf<std::uint8_t>{5, 6, 7}));

    adapter->setAttribute(names::inputOffset, 1u);
    adapter->update();
    EXPECT_EQ(adapter->findEntry(names::outputUint8)->asLink(), nullptr);
    EXPECT_EQ(bytesOut(), (base::ArrayOf<std::uint8_t>{6, 7}));
    adapter->setAttribute(names::inputOffset, 0u);
    adapter->setAttribute(names::inputLength, 3u);
    adapter->update();
    EXPECT_NE(adapter->findEntry(names::outputUint8)->asLink(), nullptr);
    EXPECT_TRUE(log.messages().empty());
}

// A listener of the first output that shrinks the buffer: the copies after
// it still hold the bytes of the run that announced them.
TEST_F(Adapter, ListenersChangingTheBufferDoNotDisturbTheRun) {
    struct Shrinker : base::PluginCallback {
        IPlugin* buffer = nullptr;
        void pluginChanged(IPlugin&, name_id attribute, std::uint32_t, std::uint64_t) override {
            if (attribute == names::outputUint8 && buffer) {
                auto& bytes = buffer->vecAttribute<std::uint8_t>(names::data)->items();
                bytes.clear();
                bytes.shrink_to_fit();
                buffer = nullptr;
            }
        }
    } shrinker;
    shrinker.buffer = buffer.get();
    adapter->addListener(shrinker);
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->update();
    adapter->removeListener(shrinker);
    // The byte view shows the shrunk buffer; the copies hold the run's bytes.
    EXPECT_EQ(counts(), (std::vector<std::uint32_t>{0, 5, 2, 2, 1, 0, 0}));
    const auto& floats = *adapter->findVecAttribute<base::vec2f>(names::outputFloat2);
    float expected;
    const std::uint8_t bytes[] = {0, 1, 2, 3};
    std::memcpy(&expected, bytes, 4);
    EXPECT_EQ(floats[0].x, expected);
}

} // namespace

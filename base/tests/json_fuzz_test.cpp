// Bad JSON never crashes the reader: every truncation of a valid factory
// document and a few thousand seeded random mutations of it are read into a
// fresh factory (under the sanitizers in CI). Each try reads from its own
// exactly sized copy, so an overrun is seen at once.
#include "b_attrib_map.h"
#include "b_json.h"
#include "b_plugin.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"

#include <gtest/gtest.h>

#include <random>

using namespace base;

namespace {

ref<PluginFactory> makeFactory() {
    ref<PluginFactory> factory(new PluginFactory("fuzz"));
    for (const char* type : {"node", "mesh"})
        factory->registerPlugin(ref<IPluginDesc>(new PluginDescOf<IPlugin>(type)));
    return factory;
}

// A document with every container kind, references and escapes.
string seedDocument() {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> root = factory->create("node", 0);
    ref<IPlugin> mesh = factory->create("mesh", 0);
    root->setAttribute(name_id("name"), string("root \"\\u\xc3\xa9"));
    mesh->setAttribute(name_id("name"), string("mesh"));
    root->setAttribute(name_id("translate"), base_vec3<double>{1.5, -2, 1e-300});
    root->setAttribute(name_id("rotate"), base_quat<float>{1, 0, 0.25f, 0});
    root->setAttribute(name_id("visible"), true);
    root->setAttribute(name_id("time"), TimeCode(-123456789));
    root->attribute(name_id("mesh"), new PluginAttribute(mesh));
    auto* indices = new TypedVectorAttribute<std::uint32_t>();
    for (std::uint32_t i = 0; i < 40; ++i)
        indices->items().push_back(i * 977);
    mesh->attribute(name_id("indices"), indices);
    AttribArray* layers = mesh->arrayAttribute(name_id("layers"));
    layers->appendMap()->setAttribute(name_id("weight"), 0.5f);
    layers->append(new PluginAttribute(root));
    AttribPath path;
    path.addPlugin(root.get()).addMember(name_id("translate")).addComponent(1);
    mesh->attribute(name_id("link"), new AttribLink(path));
    Stream stream = memoryStream();
    EXPECT_TRUE(writeFactory(*factory, stream, 40));
    const auto& bytes = static_cast<MemoryStreamWorker*>(stream.worker())->bytes();
    return string(bytes.begin(), bytes.end());
}

// Reads the bytes into a fresh factory; answers readFactory's result.
bool readBytes(const vector<std::uint8_t>& bytes) {
    ref<PluginFactory> factory = makeFactory();
    Stream stream = memoryStream("fuzz", bytes);
    return readFactory(*factory, stream);
}

class QuietLog {
public:
    QuietLog() : m_scoped(m_log) {}

private:
    CaptureLog m_log;
    ScopedLog m_scoped;
};

TEST(JsonFuzz, EveryTruncationFailsCleanly) {
    const string document = seedDocument();
    ASSERT_GT(document.size(), 400u);
    QuietLog quiet;
    for (std::size_t length = 0; length < document.size(); ++length) {
        const vector<std::uint8_t> prefix(document.begin(), document.begin() + length);
        EXPECT_FALSE(readBytes(prefix)) << "prefix of " << length << " bytes";
    }
    EXPECT_TRUE(readBytes(vector<std::uint8_t>(document.begin(), document.end())));
}

TEST(JsonFuzz, RandomMutationsNeverCrash) {
    const string document = seedDocument();
    // Bytes that steer the tokenizer into its other branches.
    static constexpr char interesting[] = "{}[],:\"\\0123456789-+.eEtfnulNaI^ \n\x01\xff";
    std::mt19937 random(20240611);
    QuietLog quiet;
    for (int round = 0; round < 3000; ++round) {
        vector<std::uint8_t> bytes(document.begin(), document.end());
        const int edits = 1 + int(random() % 4);
        for (int e = 0; e < edits && !bytes.empty(); ++e) {
            const std::size_t at = random() % bytes.size();
            const auto pick = std::uint8_t(
                random() % 2 ? interesting[random() % (sizeof(interesting) - 1)] : random() % 256);
            switch (random() % 3) {
            case 0:
                bytes[at] = pick;
                break;
            case 1:
                bytes.insert(bytes.begin() + std::ptrdiff_t(at), pick);
                break;
            default:
                bytes.erase(bytes.begin() + std::ptrdiff_t(at));
                break;
            }
        }
        bytes.shrink_to_fit();
        readBytes(bytes);
    }
}

} // namespace

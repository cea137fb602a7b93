// Writing and reading a factory as JSON, next to rapidjson's plain Writer and
// Reader on the same document. The factory holds 100,000 node objects (name,
// transform, flags, a reference to their parent by name) and one mesh with a
// 1,000,000-item index array, the shape of a large imported scene.
//
// Throughput is in bytes of JSON text per second. The rapidjson writer is
// driven through the same attribute traversal (a DataWriter adapter), so the
// difference is the writer itself; it writes compact JSON and prints floats
// as doubles, so its text differs in size (reported as "bytes").
#include "b_attrib_map.h"
#include "b_json.h"
#include "b_plugin.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"

#include <benchmark/benchmark.h>
#include <rapidjson/reader.h>
#include <rapidjson/writer.h>

#include <cstring>

namespace {

using namespace base;

constexpr std::uint32_t nodeCount = 100000;
constexpr std::uint32_t indexCount = 1000000;

ref<PluginFactory> makeFactory() {
    ref<PluginFactory> factory(new PluginFactory("bench"));
    for (const char* type : {"node", "mesh"})
        factory->registerPlugin(ref<IPluginDesc>(new PluginDescOf<IPlugin>(type)));
    return factory;
}

ref<PluginFactory> sceneFactory() {
    ref<PluginFactory> factory = makeFactory();
    const name_id name("name"), translate("translate"), rotate("rotate"), scale("scale"),
        visible("visible"), parent("parent");
    ref<IPlugin> previous;
    for (std::uint32_t i = 0; i < nodeCount; ++i) {
        ref<IPlugin> node = factory->create("node", 0);
        node->setAttribute(name, format("node{}", i));
        node->setAttribute(translate, base_vec3<double>{i * 0.25, -1.5, i / 3.0});
        node->setAttribute(rotate, base_quat<float>{0.7071068f, 0, 0.7071068f, 0});
        node->setAttribute(scale, base_vec3<float>{1, 1, 0.1f * float(i % 10)});
        node->setAttribute(visible, i % 7 != 0);
        node->attribute(parent, new PluginAttribute(previous));
        if (i % 16 == 0)
            previous = node;
    }
    ref<IPlugin> mesh = factory->create("mesh", 0);
    mesh->setAttribute(name, string("mesh"));
    auto* indices = new TypedVectorAttribute<std::uint32_t>();
    indices->items().resize(indexCount);
    for (std::uint32_t i = 0; i < indexCount; ++i)
        indices->items()[i] = (i * 2654435761u) % 600000;
    mesh->attribute(name_id("indices"), indices);
    return factory;
}

PluginFactory& scene() {
    static ref<PluginFactory> factory = sceneFactory();
    return *factory;
}

const string& sceneText() {
    static const string text = [] {
        Stream stream = memoryStream();
        writeFactory(scene(), stream);
        const auto& bytes = static_cast<MemoryStreamWorker*>(stream.worker())->bytes();
        return string(bytes.begin(), bytes.end());
    }();
    return text;
}

// Counts and drops what is written.
class SinkWorker final : public StreamWorker {
public:
    SinkWorker() : StreamWorker("sink", capWrite) {}
    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    std::uint64_t write(const void* buffer, std::uint64_t bytes) override {
        benchmark::DoNotOptimize(buffer);
        m_size += bytes;
        return bytes;
    }
    std::uint64_t setPosition(std::int64_t, std::uint32_t) override { return m_size; }
    std::uint64_t getPosition() override { return m_size; }
    std::uint64_t getSize() override { return m_size; }
    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}

private:
    std::uint64_t m_size = 0;
};

// rapidjson's output stream concept, counting and dropping.
struct NullOut {
    using Ch = char;
    void Put(char c) {
        benchmark::DoNotOptimize(c);
        ++size;
    }
    void Flush() {}
    std::size_t size = 0;
};

// The same traversal, written by rapidjson's plain Writer.
class RapidWriter final : public DataWriter {
public:
    explicit RapidWriter(DataWriterResolveStringId* resolver)
        : DataWriter(resolver), m_writer(out) {}
    bool beginObject() override { return m_writer.StartObject(); }
    bool endObject() override { return m_writer.EndObject(); }
    bool beginArray(std::uint32_t) override { return m_writer.StartArray(); }
    bool endArray() override { return m_writer.EndArray(); }
    bool key(std::string_view text) override {
        return m_writer.Key(text.data(), rapidjson::SizeType(text.size()));
    }
    bool writeString(std::string_view text) override {
        return m_writer.String(text.data(), rapidjson::SizeType(text.size()));
    }
    bool writeDouble(double value) override { return m_writer.Double(value); }
    bool writeFloat(float value) override { return m_writer.Double(value); }
    bool writeUInt64(std::uint64_t value) override { return m_writer.Uint64(value); }
    bool writeInt64(std::int64_t value) override { return m_writer.Int64(value); }
    bool writeUInt32(std::uint32_t value) override { return m_writer.Uint(value); }
    bool writeInt32(std::int32_t value) override { return m_writer.Int(value); }
    bool writeBool(bool value) override { return m_writer.Bool(value); }
    bool writeNull() override { return m_writer.Null(); }

    NullOut out;

private:
    rapidjson::Writer<NullOut> m_writer;
};

void jsonWriteFactory(benchmark::State& state) {
    PluginFactory& factory = scene();
    std::uint64_t bytes = 0;
    for (auto _ : state) {
        Stream sink(ref<StreamWorker>(new SinkWorker()));
        writeFactory(factory, sink);
        bytes = sink.getSize();
    }
    state.SetBytesProcessed(std::int64_t(state.iterations() * bytes));
    state.counters["bytes"] = double(bytes);
}

void rapidjsonWriteFactory(benchmark::State& state) {
    PluginFactory& factory = scene();
    std::uint64_t bytes = 0;
    for (auto _ : state) {
        PluginWriterResolveStringId resolver(factory);
        RapidWriter writer(&resolver);
        writer.beginObject();
        for (std::uint32_t id = 0; id < factory.pluginCount(); ++id) {
            const ref<IPlugin> plugin = factory.plugin(id);
            writer.key(plugin->className().view());
            plugin->write(writer);
        }
        writer.endObject();
        bytes = writer.out.size;
    }
    state.SetBytesProcessed(std::int64_t(state.iterations() * bytes));
    state.counters["bytes"] = double(bytes);
}

void jsonReadFactory(benchmark::State& state) {
    const string& text = sceneText();
    const vector<std::uint8_t> bytes(text.begin(), text.end());
    for (auto _ : state) {
        state.PauseTiming();
        ref<PluginFactory> factory = makeFactory();
        Stream stream = memoryStream("scene", bytes);
        state.ResumeTiming();
        benchmark::DoNotOptimize(readFactory(*factory, stream));
        state.PauseTiming();
        factory.reset();
        state.ResumeTiming();
    }
    state.SetBytesProcessed(std::int64_t(state.iterations() * text.size()));
}

// The tokenizer alone: one skipValue over the whole document.
void jsonTokenize(benchmark::State& state) {
    const string& text = sceneText();
    const vector<std::uint8_t> bytes(text.begin(), text.end());
    for (auto _ : state) {
        state.PauseTiming();
        Stream stream = memoryStream("scene", bytes);
        state.ResumeTiming();
        JSONAttrReader reader(stream);
        benchmark::DoNotOptimize(reader.skipValue());
    }
    state.SetBytesProcessed(std::int64_t(state.iterations() * text.size()));
}

void rapidjsonRead(benchmark::State& state) {
    const string& text = sceneText();
    for (auto _ : state) {
        rapidjson::Reader reader;
        rapidjson::BaseReaderHandler<> handler;
        rapidjson::StringStream in(text.c_str());
        benchmark::DoNotOptimize(reader.Parse<rapidjson::kParseFullPrecisionFlag>(in, handler));
    }
    state.SetBytesProcessed(std::int64_t(state.iterations() * text.size()));
}

BENCHMARK(jsonWriteFactory)->Unit(benchmark::kMillisecond);
BENCHMARK(rapidjsonWriteFactory)->Unit(benchmark::kMillisecond);
BENCHMARK(jsonReadFactory)->Unit(benchmark::kMillisecond);
BENCHMARK(jsonTokenize)->Unit(benchmark::kMillisecond);
BENCHMARK(rapidjsonRead)->Unit(benchmark::kMillisecond);

} // namespace

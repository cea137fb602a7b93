// Naming many objects alike through the factory's unique-name service, as an
// import of a large node tree does: each object is made, asks for a name based
// on "node" and then carries the answer. The time per run must grow linearly
// with the object count.
#include "b_plugin.h"
#include "b_plugin_factory.h"

#include <benchmark/benchmark.h>

namespace {

void uniqueNodeNames(benchmark::State& state) {
    const auto count = std::uint32_t(state.range(0));
    const base::name_id nodeType("node");
    const base::name_id nameKey = base::nameAttributeName();
    for (auto _ : state) {
        base::ref<base::PluginFactory> factory(new base::PluginFactory("bench"));
        factory->registerPlugin(
            base::ref<base::IPluginDesc>(new base::PluginDescOf<base::IPlugin>(nodeType)));
        for (std::uint32_t i = 0; i < count; ++i) {
            base::ref<base::IPlugin> node = factory->create(nodeType, 3);
            node->setAttribute<base::string>(nameKey, factory->uniqueName("node"));
        }
        benchmark::DoNotOptimize(factory->pluginCount());
        state.PauseTiming();
        factory.reset();
        state.ResumeTiming();
    }
    state.SetItemsProcessed(std::int64_t(state.iterations()) * count);
}
BENCHMARK(uniqueNodeNames)->Arg(20000)->Arg(200000)->Unit(benchmark::kMillisecond);

} // namespace

// Keyframe evaluation: 10,000 channels of 1,000 linear keys each, evaluated at
// 1,000 times spread over the key range: in playback order, either frame by
// frame (every channel at one time, then the next time, as a layer plays) or
// channel by channel (each channel through all times in turn), or at the same
// times in a shuffled order (random access). Items are single evaluations.
#include "scene_interfaces.h"

#include "b_log.h"
#include "b_plugin_attribute.h"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <random>
#include <vector>

namespace {

using base::TimeCode;

constexpr int timeCount = 1000;
constexpr std::int64_t keyStep = TimeCode::ticksPerSecond / 30;

template <class T, int channelCount, int keyCount>
struct Channels {
    base::ref<base::PluginFactory> factory{new base::PluginFactory("bench")};
    std::vector<base::ref<scene::IKeyframeChannel>> channels;
    std::vector<TimeCode> times;

    Channels() {
        scene::register_scene_schema(*factory);
        std::mt19937 random(7);
        std::uniform_real_distribution<float> value(-10, 10);
        channels.reserve(channelCount);
        for (int c = 0; c < channelCount; ++c) {
            base::ref<base::IPlugin> made = factory->create("keyframeChannel", 3);
            base::ref<scene::IKeyframeChannel> channel(
                dynamic_cast<scene::IKeyframeChannel*>(made.get()));
            base::AttribMap* curve = channel->arrayAttribute(scene::names::curves)->appendMap();
            auto& t = curve->vecAttribute<TimeCode>(scene::names::times)->items();
            auto& v = curve->vecAttribute<T>(scene::names::values)->items();
            t.resize(keyCount);
            v.resize(keyCount);
            for (int k = 0; k < keyCount; ++k) {
                t[k] = TimeCode(k * keyStep);
                if constexpr (std::is_arithmetic_v<T>)
                    v[k] = T(value(random));
                else
                    v[k] = T{value(random), value(random), value(random)};
            }
            channels.push_back(channel);
        }
        const std::int64_t span = (keyCount - 1) * keyStep;
        for (int i = 0; i < timeCount; ++i)
            times.emplace_back(span * i / (timeCount - 1) + (i % 7) * 1000003);
        times.back() = TimeCode(span);
    }
};

template <class T, int channelCount, int keyCount>
Channels<T, channelCount, keyCount>& channelsOf() {
    static Channels<T, channelCount, keyCount> data;
    return data;
}

// 10,000 channels of 1,000 keys hold 200 MB of keys, far beyond the caches;
// 500 channels of 100 keys stay in them and show the cost of the work alone.
template <class T, int channelCount = 10000, int keyCount = 1000>
void playback(benchmark::State& state) {
    auto& data = channelsOf<T, channelCount, keyCount>();
    for (auto _ : state)
        for (TimeCode t : data.times)
            for (const auto& channel : data.channels)
                benchmark::DoNotOptimize(channel->template computeValue<T>(0, t));
    state.SetItemsProcessed(std::int64_t(state.iterations()) * channelCount * timeCount);
}

template <class T, int channelCount = 10000, int keyCount = 1000>
void playbackPerChannel(benchmark::State& state) {
    auto& data = channelsOf<T, channelCount, keyCount>();
    for (auto _ : state)
        for (const auto& channel : data.channels)
            for (TimeCode t : data.times)
                benchmark::DoNotOptimize(channel->template computeValue<T>(0, t));
    state.SetItemsProcessed(std::int64_t(state.iterations()) * channelCount * timeCount);
}

template <class T, int channelCount = 10000, int keyCount = 1000>
void randomAccess(benchmark::State& state) {
    auto& data = channelsOf<T, channelCount, keyCount>();
    std::vector<TimeCode> times = data.times;
    std::shuffle(times.begin(), times.end(), std::mt19937(11));
    for (auto _ : state)
        for (TimeCode t : times)
            for (const auto& channel : data.channels)
                benchmark::DoNotOptimize(channel->template computeValue<T>(0, t));
    state.SetItemsProcessed(std::int64_t(state.iterations()) * channelCount * timeCount);
}

BENCHMARK(playback<base::vec3f>)->Unit(benchmark::kMillisecond)->Iterations(2);
BENCHMARK(playbackPerChannel<base::vec3f>)->Unit(benchmark::kMillisecond)->Iterations(2);
BENCHMARK(randomAccess<base::vec3f>)->Unit(benchmark::kMillisecond)->Iterations(2);
BENCHMARK(playback<float>)->Unit(benchmark::kMillisecond)->Iterations(2);
BENCHMARK(playback<base::vec3f, 500, 100>)->Unit(benchmark::kMillisecond)->Iterations(20);

} // namespace

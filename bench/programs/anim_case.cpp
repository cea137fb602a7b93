// Animation import and playback: writes a glTF model with NODES animated
// nodes, each with translation, rotation and scale samplers of KEYS keys
// (one animation), imports it through the module, then plays FRAMES frames
// evenly over the animation: each frame sets the scene's time, lets every
// layer evaluate and reads every node's local transformation.
//
//   anim_case DIR [--nodes N] [--keys K] [--frames F] [--module PATH]
//
// Prints one line: import seconds (and its CPU), playback frames per second
// (and per CPU second), the channel count.
#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "scene_importer.h"
#include "scene_interfaces.h"

#include <dlfcn.h>
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#ifndef SCENE_ASSIMP_MODULE
#define SCENE_ASSIMP_MODULE "scene_assimp.so"
#endif

namespace {

using Clock = std::chrono::steady_clock;

double cpuSeconds() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    auto seconds = [](const timeval& t) { return double(t.tv_sec) + t.tv_usec / 1e6; };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

[[noreturn]] void fail(const std::string& message) {
    std::fprintf(stderr, "anim_case: %s\n", message.c_str());
    std::exit(1);
}

// The model: a binary buffer with one shared time accessor and three output
// accessors per node.
std::string writeModel(const std::string& dir, int nodes, int keys) {
    std::vector<float> data;
    data.reserve(std::size_t(keys) * (1 + nodes * 10));
    for (int k = 0; k < keys; ++k)
        data.push_back(float(k) / 30.0f);
    std::string views, accessors, nodeList, channels, samplers, sceneNodes;
    auto view = [&](std::size_t offset, std::size_t floats) {
        const int index = int(std::count(views.begin(), views.end(), '{'));
        views += (index ? "," : "") + std::string("{\"buffer\":0,\"byteOffset\":") +
                 std::to_string(offset * 4) + ",\"byteLength\":" + std::to_string(floats * 4) + "}";
        return index;
    };
    auto accessor = [&](int viewIndex, const char* type, const std::string& extra = "") {
        const int index = int(std::count(accessors.begin(), accessors.end(), '{'));
        accessors += (index ? "," : "") + std::string("{\"bufferView\":") +
                     std::to_string(viewIndex) +
                     ",\"componentType\":5126,\"count\":" + std::to_string(keys) + ",\"type\":\"" +
                     type + "\"" + extra + "}";
        return index;
    };
    const int timeAccessor =
        accessor(view(0, std::size_t(keys)), "SCALAR",
                 ",\"min\":[0],\"max\":[" + std::to_string(float(keys - 1) / 30.0f) + "]");
    for (int n = 0; n < nodes; ++n) {
        const std::size_t t = data.size();
        for (int k = 0; k < keys; ++k) {
            data.push_back(std::sin(k * 0.01f + n));
            data.push_back(float(k) * 0.1f);
            data.push_back(float(n));
        }
        const std::size_t r = data.size();
        for (int k = 0; k < keys; ++k) {
            const float a = (k * 0.02f + n) * 0.5f;
            data.insert(data.end(), {0, std::sin(a), 0, std::cos(a)});
        }
        const std::size_t s = data.size();
        for (int k = 0; k < keys; ++k)
            data.insert(data.end(), {1 + 0.001f * k, 1, 1});
        const int at = accessor(view(t, std::size_t(keys) * 3), "VEC3");
        const int ar = accessor(view(r, std::size_t(keys) * 4), "VEC4");
        const int as = accessor(view(s, std::size_t(keys) * 3), "VEC3");
        nodeList += (n ? "," : "") + std::string("{\"name\":\"n") + std::to_string(n) + "\"}";
        sceneNodes += (n ? "," : "") + std::to_string(n);
        const char* paths[] = {"translation", "rotation", "scale"};
        const int outputs[] = {at, ar, as};
        for (int c = 0; c < 3; ++c) {
            const int sampler = n * 3 + c;
            channels += (sampler ? "," : "") + std::string("{\"sampler\":") +
                        std::to_string(sampler) + ",\"target\":{\"node\":" + std::to_string(n) +
                        ",\"path\":\"" + paths[c] + "\"}}";
            samplers += (sampler ? "," : "") + std::string("{\"input\":") +
                        std::to_string(timeAccessor) + ",\"output\":" + std::to_string(outputs[c]) +
                        "}";
        }
    }
    std::ofstream(dir + "/anim.bin", std::ios::binary)
        .write(reinterpret_cast<const char*>(data.data()), std::streamsize(data.size() * 4));
    const std::string path = dir + "/anim.gltf";
    std::ofstream(path) << "{\"asset\":{\"version\":\"2.0\"},\"scene\":0,\"scenes\":[{\"nodes\":["
                        << sceneNodes << "]}],\"nodes\":[" << nodeList
                        << "],\"buffers\":[{\"byteLength\":" << data.size() * 4
                        << ",\"uri\":\"anim.bin\"}],\"bufferViews\":[" << views
                        << "],\"accessors\":[" << accessors
                        << "],\"animations\":[{\"name\":\"bench\",\"channels\":[" << channels
                        << "],\"samplers\":[" << samplers << "]}]}";
    return path;
}

} // namespace

int main(int argc, char** argv) {
    if (argc < 2)
        fail("usage: anim_case DIR [--nodes N] [--keys K] [--frames F] [--module PATH]");
    std::string dir = argv[1], modulePath = SCENE_ASSIMP_MODULE;
    int nodes = 1000, keys = 1000, frames = 1000;
    for (int i = 2; i + 1 < argc; i += 2) {
        const std::string flag = argv[i];
        if (flag == "--nodes")
            nodes = std::atoi(argv[i + 1]);
        else if (flag == "--keys")
            keys = std::atoi(argv[i + 1]);
        else if (flag == "--frames")
            frames = std::atoi(argv[i + 1]);
        else if (flag == "--module")
            modulePath = argv[i + 1];
        else
            fail("unknown switch " + flag);
    }
    const std::string model = writeModel(dir, nodes, keys);

    using LoadEntry = std::int32_t (*)(base::PluginFactory&);
    void* module = dlopen(modulePath.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!module)
        fail("cannot load '" + modulePath + "': " + dlerror());
    auto load = reinterpret_cast<LoadEntry>(dlsym(module, "loadScenePlugin"));
    if (!load)
        fail("no entry point");
    {
        base::ref<base::PluginFactory> factory(new base::PluginFactory("bench"));
        scene::register_scene_schema(*factory);
        if (load(*factory) != 0)
            fail("the module refused to load");
        base::ref<base::IPlugin> importer =
            factory->create("AssimpImporter", base::PluginFactory::createNullIfUnknown);
        auto* sceneImporter = static_cast<scene::ISceneImporter*>(
            importer->queryInterface(scene::ISceneImporter::interfaceName()));
        sceneImporter->describeOptions(*importer);

        const double cpu0 = cpuSeconds();
        const auto start = Clock::now();
        if (!sceneImporter->import(*factory, base::string(model.c_str())))
            fail("import failed");
        const double importSeconds = std::chrono::duration<double>(Clock::now() - start).count();
        const double importCpu = cpuSeconds() - cpu0;

        base::vector<base::ref<base::IPlugin>> scenes, layers, animatedNodes;
        std::size_t channels = 0;
        for (std::uint32_t id = 0; id < factory->pluginCount(); ++id) {
            base::ref<base::IPlugin> object = factory->plugin(id);
            if (!object)
                continue;
            const std::string_view type = object->className().view();
            if (type == "scene")
                scenes.push_back(object);
            else if (type == "animLayer")
                layers.push_back(object);
            else if (type == "keyframeChannel")
                ++channels;
            else if (type == "node")
                animatedNodes.push_back(object);
        }
        if (scenes.empty())
            fail("no scene");
        const std::int64_t end =
            scenes.back()->findAttribute<base::TimeCode>(scene::names::endTime)->ticks();

        double checksum = 0;
        const double cpu1 = cpuSeconds();
        const auto playStart = Clock::now();
        for (int f = 0; f < frames; ++f) {
            const base::TimeCode time(frames > 1 ? end / (frames - 1) * f : 0);
            scenes.back()->setAttribute(scene::names::time, time);
            for (const auto& layer : layers)
                static_cast<scene::IAnimLayer*>(layer.get())->evaluate();
            for (const auto& node : animatedNodes)
                if (auto* h = scene::query<scene::IHierarchical>(*node))
                    checksum += h->localTransformation().t.x;
        }
        const double playSeconds = std::chrono::duration<double>(Clock::now() - playStart).count();
        const double playCpu = cpuSeconds() - cpu1;
        std::printf("nodes=%d keys=%d channels=%zu import_seconds=%.3f import_cpu=%.3f "
                    "frames=%d fps=%.1f fps_cpu=%.1f checksum=%g\n",
                    nodes, keys, channels, importSeconds, importCpu, frames, frames / playSeconds,
                    frames / playCpu, checksum);
        importer.reset();
    }
    return 0;
}

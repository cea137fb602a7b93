// Runs one case of the import benchmark in this process and prints its wall
// time and the process's peak resident memory, so every case is measured in a
// fresh process:
//
//   read        assimp's ReadFile alone with assimp's own vertex join (the
//               flags the importer used before it welded vertices itself)
//   read-plain  assimp's ReadFile alone with the importer's default flags,
//               which leave the join out
//   import      the whole import: scene types, module load, importer
//               creation, option defaults, import into a factory
//   json        the whole import, then the factory written as JSON to a file
//   preview     the whole import, then a preview image of the scene written
//               as PNG (--preview OUT, default <model>.png); its time is
//               printed apart
//   unchecked   the whole import with assimp's structure validation switched
//               off ("importValidate" false), to price the validation step
//
//   import_case <read|read-plain|import|json|preview|unchecked> <model> [--module PATH]
//               [--json OUT] [--preview OUT] [--size N] [--trace MS]
//
// Output, one line: "<case> seconds=<wall> cpu=<user+sys> peak_kib=<VmHWM> ..."
// then counts that show what was read (assimp's vertices and faces, or the
// factory's objects and meshes) and, for the import, the peak of the host
// heap over the import (what the conversion allocates at most).
// --trace samples the resident memory every MS milliseconds on a second
// thread and prints "trace <seconds> <kib>" lines to standard error, which
// shows the phase where the peak is reached.
#include "b_json.h"
#include "b_memory.h"
#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "scene_importer.h"
#include "scene_interfaces.h"
#include "scene_preview.h"
#include "scene_schema.h"
#include "stream/b_fs.h"

#include <assimp/Importer.hpp>
#include <assimp/postprocess.h>
#include <assimp/scene.h>

#include <dlfcn.h>
#include <sys/resource.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <thread>

#ifndef SCENE_ASSIMP_MODULE
#define SCENE_ASSIMP_MODULE "scene_assimp.so"
#endif

namespace {

using Clock = std::chrono::steady_clock;

// The flag word the importer reads with when no option changes it, and the
// same with assimp's vertex join.
constexpr unsigned importerDefaultFlags =
    aiProcess_GenSmoothNormals | aiProcess_FindInstances | aiProcess_ValidateDataStructure;
constexpr unsigned joinedFlags = importerDefaultFlags | aiProcess_JoinIdenticalVertices;
static_assert(joinedFlags == 0x100442);

long statusKib(const char* field) {
    std::ifstream status("/proc/self/status");
    std::string line;
    const std::size_t length = std::strlen(field);
    while (std::getline(status, line))
        if (line.compare(0, length, field) == 0 && line.size() > length && line[length] == ':')
            return std::strtol(line.c_str() + length + 1, nullptr, 10);
    return -1;
}

// User plus system time of the process: far less disturbed than the wall
// time when other work shares the cores.
double cpuSeconds() {
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    auto seconds = [](const timeval& t) { return double(t.tv_sec) + t.tv_usec / 1e6; };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

double since(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

// Samples VmRSS until stopped; the samples are printed at the end so the
// printing does not disturb the run.
class RssTrace {
public:
    RssTrace(int periodMs, Clock::time_point start) : m_start(start) {
        if (periodMs > 0)
            m_thread = std::thread([this, periodMs] {
                while (!m_stop.load(std::memory_order_relaxed)) {
                    m_samples.emplace_back(since(m_start), statusKib("VmRSS"));
                    std::this_thread::sleep_for(std::chrono::milliseconds(periodMs));
                }
            });
    }
    ~RssTrace() { stop(); }
    void stop() {
        if (!m_thread.joinable())
            return;
        m_stop = true;
        m_thread.join();
        for (const auto& [seconds, kib] : m_samples)
            std::fprintf(stderr, "trace %.3f %ld\n", seconds, kib);
    }
    void mark(const char* what) {
        if (m_thread.joinable())
            std::fprintf(stderr, "mark %.3f %s\n", since(m_start), what);
    }

private:
    Clock::time_point m_start;
    std::atomic<bool> m_stop{false};
    std::vector<std::pair<double, long>> m_samples;
    std::thread m_thread;
};

[[noreturn]] void fail(const std::string& message) {
    std::fprintf(stderr, "import_case: %s\n", message.c_str());
    std::exit(1);
}

std::size_t countOfType(base::PluginFactory& factory, std::string_view type) {
    const base::name_id wanted(type);
    std::size_t count = 0;
    for (std::uint32_t id = 0; id < factory.pluginCount(); ++id)
        if (base::ref<base::IPlugin> object = factory.plugin(id);
            object && object->className() == wanted)
            ++count;
    return count;
}

// Cases "read" and "read-plain".
void runRead(const std::string& which, const std::string& model, unsigned flags, int tracePeriod) {
    const Clock::time_point start = Clock::now();
    RssTrace trace(tracePeriod, start);
    Assimp::Importer importer;
    const aiScene* scene = importer.ReadFile(model.c_str(), flags);
    const double seconds = since(start), cpu = cpuSeconds();
    const long peak = statusKib("VmHWM");
    trace.stop();
    if (!scene)
        fail("assimp cannot read '" + model + "': " + importer.GetErrorString());
    std::size_t vertices = 0, faces = 0;
    for (unsigned i = 0; i < scene->mNumMeshes; ++i) {
        vertices += scene->mMeshes[i]->mNumVertices;
        faces += scene->mMeshes[i]->mNumFaces;
    }
    std::printf("%s seconds=%.4f cpu=%.4f peak_kib=%ld meshes=%u vertices=%zu faces=%zu\n",
                which.c_str(), seconds, cpu, peak, scene->mNumMeshes, vertices, faces);
}

struct PreviewCase {
    std::string path; // empty: no preview
    std::uint32_t size = 512;
};

// Cases "import", "json" and "preview".
void runImport(const std::string& model, const std::string& modulePath, const std::string& json,
               int tracePeriod, const PreviewCase& preview = {}, bool validate = true) {
    using LoadEntry = int (*)(base::PluginFactory&);
    using UnloadEntry = int (*)();

    const Clock::time_point start = Clock::now();
    RssTrace trace(tracePeriod, start);
    void* module = nullptr;
    UnloadEntry unload = nullptr;
    std::size_t objects = 0, meshes = 0;
    double seconds = 0, cpu = 0, importSeconds = 0, previewSeconds = 0;
    long peak = 0;
    std::size_t heapPeak = 0;
    {
        base::ref<base::PluginFactory> factory(new base::PluginFactory("bench"));
        scene::register_scene_schema(*factory);

        module = dlopen(modulePath.c_str(), RTLD_NOW | RTLD_LOCAL);
        if (!module)
            fail("cannot load '" + modulePath + "': " + dlerror());
        auto load = reinterpret_cast<LoadEntry>(dlsym(module, "loadScenePlugin"));
        unload = reinterpret_cast<UnloadEntry>(dlsym(module, "unloadScenePlugin"));
        if (!load || !unload)
            fail("'" + modulePath + "' has no importer entry points");
        if (load(*factory) != 0)
            fail("the module refused to load");

        base::ref<base::IPlugin> importer =
            factory->create("AssimpImporter", base::PluginFactory::createNullIfUnknown);
        auto* sceneImporter =
            importer ? static_cast<scene::ISceneImporter*>(
                           importer->queryInterface(scene::ISceneImporter::interfaceName()))
                     : nullptr;
        if (!sceneImporter)
            fail("the module offers no AssimpImporter");
        sceneImporter->describeOptions(*importer);
        if (!validate)
            importer->setAttribute(base::name_id("importValidate"), false);

        trace.mark("import");
        // The host heap holds everything the conversion makes (assimp's own
        // memory is not in it): its peak over the import is what the
        // conversion adds.
        base::resetHeapPeak();
        const std::size_t heapBefore = base::heapStats().liveBytes;
        const Clock::time_point importStart = Clock::now();
        if (!sceneImporter->import(*factory, base::string(model)))
            fail("the import of '" + model + "' failed");
        importSeconds = since(importStart);
        heapPeak = base::heapStats().peakBytes - heapBefore;

        if (!preview.path.empty()) {
            trace.mark("preview");
            const base::IPlugin* sceneObject = nullptr;
            for (std::uint32_t id = 0; id < factory->pluginCount(); ++id)
                if (base::ref<base::IPlugin> object = factory->plugin(id);
                    object && object->className() == scene::names::scene)
                    sceneObject = object.get();
            if (!sceneObject)
                fail("the import made no scene");
            const Clock::time_point previewStart = Clock::now();
            base::string error;
            host::preview::PreviewOptions options;
            options.size = preview.size;
            if (!host::preview::writePreview(*factory, *sceneObject, base::string(preview.path),
                                             options, error))
                fail(std::string(error));
            previewSeconds = since(previewStart);
        }

        if (!json.empty()) {
            trace.mark("json");
            base::Stream stream = base::fs::master().open(
                json, base::fs::openWrite | base::fs::openCreate | base::fs::openTruncate);
            const bool written = base::writeFactory(*factory, stream);
            stream.close();
            if (!written)
                fail("writing '" + json + "' failed");
        }
        seconds = since(start);
        cpu = cpuSeconds();
        peak = statusKib("VmHWM");
        trace.stop();
        objects = factory->pluginCount();
        meshes = countOfType(*factory, "mesh");
        // The factory goes before the module: its descriptors live in the module.
        importer.reset();
        factory.reset();
    }
    unload();
    dlclose(module);
    std::printf("%s seconds=%.4f cpu=%.4f peak_kib=%ld objects=%zu meshes=%zu import_seconds=%.4f "
                "preview_seconds=%.4f heap_peak_kib=%zu\n",
                !preview.path.empty() ? "preview"
                : !json.empty()       ? "json"
                : validate            ? "import"
                                      : "unchecked",
                seconds, cpu, peak, objects, meshes, importSeconds, previewSeconds,
                heapPeak / 1024);
}

} // namespace

int main(int argc, char** argv) {
    if (argc < 3) {
        std::fprintf(
            stderr,
            "usage: %s <read|read-plain|import|json|preview|unchecked> <model> [--module PATH] "
            "[--json OUT] [--preview OUT] [--size N] [--trace MS]\n",
            argv[0]);
        return 2;
    }
    const std::string which = argv[1], model = argv[2];
    std::string modulePath = SCENE_ASSIMP_MODULE, json;
    PreviewCase preview;
    int tracePeriod = 0;
    for (int i = 3; i + 1 < argc; i += 2) {
        const std::string option = argv[i];
        if (option == "--module")
            modulePath = argv[i + 1];
        else if (option == "--json")
            json = argv[i + 1];
        else if (option == "--preview")
            preview.path = argv[i + 1];
        else if (option == "--size")
            preview.size = std::uint32_t(std::atoi(argv[i + 1]));
        else if (option == "--trace")
            tracePeriod = std::atoi(argv[i + 1]);
        else
            fail("unknown option '" + option + "'");
    }
    if ((argc - 3) % 2 != 0)
        fail("an option lacks its value");

    try {
        if (which == "read")
            runRead(which, model, joinedFlags, tracePeriod);
        else if (which == "read-plain")
            runRead(which, model, importerDefaultFlags, tracePeriod);
        else if (which == "import")
            runImport(model, modulePath, {}, tracePeriod);
        else if (which == "preview") {
            if (preview.path.empty())
                preview.path = model + ".png";
            runImport(model, modulePath, {}, tracePeriod, preview);
        } else if (which == "unchecked")
            runImport(model, modulePath, {}, tracePeriod, {}, false);
        else if (which == "json")
            runImport(model, modulePath, json.empty() ? model + ".json" : json, tracePeriod);
        else
            fail("unknown case '" + which + "'");
    } catch (const std::exception& e) {
        fail(e.what());
    }
    return 0;
}

// The module's entry points, its descriptor and what the built module exports.
#include "as_importer.h"
#include "as_plugin_desc.h"
#include "b_log.h"
#include "b_plugin_factory.h"
#include "scene_interfaces.h"

#include <assimp/version.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <dlfcn.h>
#include <set>
#include <string>

extern "C" std::int32_t loadScenePlugin(base::PluginFactory& factory);
extern "C" std::int32_t unloadScenePlugin();

namespace {

base::ref<base::PluginFactory> loadedFactory() {
    base::ref<base::PluginFactory> factory(new base::PluginFactory("test"));
    scene::register_scene_schema(*factory);
    EXPECT_EQ(loadScenePlugin(*factory), 0);
    return factory;
}

const base::name_id importerType() {
    return base::name_id("AssimpImporter");
}

TEST(AssimpEntry, RegistersOneDescriptorWithTheLegalText) {
    base::ref<base::PluginFactory> factory = loadedFactory();
    base::ref<base::IPluginDesc> desc = factory->descriptor(importerType());
    ASSERT_TRUE(desc);
    // The factory's table and our local ref.
    EXPECT_EQ(desc->refCount(), 2u);
    EXPECT_EQ(desc->legalText(), aiGetLegalString());
    auto* sceneDesc = dynamic_cast<scene::IScenePluginDesc*>(desc.get());
    ASSERT_NE(sceneDesc, nullptr);
    EXPECT_TRUE(sceneDesc->secondaryText().empty());
    EXPECT_EQ(unloadScenePlugin(), 0);
    EXPECT_EQ(factory->descriptor(importerType()).get(), desc.get());
}

TEST(AssimpEntry, SecondLoadKeepsTheFirstDescriptor) {
    base::ref<base::PluginFactory> factory = loadedFactory();
    base::IPluginDesc* first = factory->descriptor(importerType()).get();
    EXPECT_EQ(loadScenePlugin(*factory), 0);
    base::ref<base::IPluginDesc> after = factory->descriptor(importerType());
    EXPECT_EQ(after.get(), first);
    EXPECT_EQ(after->refCount(), 2u);
}

TEST(AssimpEntry, CreatesImportersBoundToTheirFactory) {
    base::ref<base::PluginFactory> factory = loadedFactory();
    base::ref<base::IPlugin> object = factory->create(importerType(), 0);
    auto* importer = dynamic_cast<as::AssimpImporter*>(object.get());
    ASSERT_NE(importer, nullptr);
    EXPECT_EQ(importer->factory(), factory.get());
    EXPECT_EQ(importer->descriptor(), factory->descriptor(importerType()).get());
    EXPECT_EQ(factory->plugin(importer->instanceId()).get(), object.get());
    EXPECT_EQ(scene::query<scene::ISceneImporter>(*object),
              static_cast<scene::ISceneImporter*>(importer));
}

TEST(AssimpEntry, DescribesItsOptionsWithTheirDefaults) {
    base::ref<base::PluginFactory> factory = loadedFactory();
    base::ref<base::IPlugin> object = factory->create(importerType(), 0);
    auto* importer = scene::query<scene::ISceneImporter>(*object);
    ASSERT_NE(importer, nullptr);

    base::AttribMap options;
    // An entry of another type is replaced.
    options.setAttribute(base::name_id("importNormals"), true);
    importer->describeOptions(options);

    struct Expected {
        const char* name;
        bool isBool;
        int value;
    };
    const Expected expected[] = {
        {"importMeshes", true, 1},    {"importTriangulateMeshes", true, 0},
        {"importColors", true, 1},    {"importTextureCoordinates", true, 1},
        {"importNormals", false, 2},  {"importTangents", false, 1},
        {"importSkeletons", true, 1}, {"importLights", true, 1},
        {"importMaterials", true, 1}, {"importCameras", true, 1},
        {"importHair", true, 1},      {"importAnimations", true, 1},
    };
    EXPECT_EQ(options.size(), std::size(expected));
    for (const Expected& row : expected) {
        SCOPED_TRACE(row.name);
        if (row.isBool) {
            const bool* value = options.findAttribute<bool>(base::name_id(row.name));
            ASSERT_NE(value, nullptr);
            EXPECT_EQ(*value, row.value != 0);
        } else {
            const std::uint8_t* value =
                options.findAttribute<std::uint8_t>(base::name_id(row.name));
            ASSERT_NE(value, nullptr);
            EXPECT_EQ(*value, row.value);
        }
    }
    EXPECT_EQ(options.className(), base::name_id("sceneImporter"));
}

TEST(AssimpEntry, StripsAsterisksAndDots) {
    const std::pair<const char*, const char*> rows[] = {
        {"*.3ds;*.obj", "3ds;obj"},
        {"", ""},
        {"*.tar.gz;*.x", "targz;x"},
        {"**..;;", ";;"},
    };
    for (const auto& [in, out] : rows)
        EXPECT_EQ(as::stripExtensionList(in), out) << in;
}

TEST(AssimpEntry, ExtensionListIsComputedOnceAndKept) {
    AssimpPluginDesc desc;
    const base::string& first = desc.supportedExtensions();
    ASSERT_FALSE(first.empty());
    EXPECT_EQ(first.find_first_of("*."), base::string::npos);
    const std::string list = ";" + std::string(first.data(), first.size()) + ";";
    EXPECT_NE(list.find(";obj;"), std::string::npos);
    EXPECT_NE(list.find(";blend;"), std::string::npos);
    EXPECT_EQ(list.find(";;"), std::string::npos);
    // Another descriptor shares the module's one string.
    AssimpPluginDesc other;
    EXPECT_EQ(&other.supportedExtensions(), &first);
}

TEST(AssimpModule, ExportsOnlyTheEntryPoints) {
    std::string command = "nm -D --defined-only '" SCENE_ASSIMP_MODULE "' 2>/dev/null";
    FILE* pipe = popen(command.c_str(), "r");
    if (!pipe)
        GTEST_SKIP() << "nm is not available";
    std::set<std::string> symbols;
    char line[1024];
    while (std::fgets(line, sizeof line, pipe)) {
        std::string text(line);
        while (!text.empty() && (text.back() == '\n' || text.back() == '\r'))
            text.pop_back();
        const std::size_t blank = text.rfind(' ');
        const std::string kind = blank >= 2 ? text.substr(blank - 1, 1) : "";
        // Absolute symbols are the version nodes of the script, not code.
        if (kind == "A")
            continue;
        symbols.insert(text.substr(blank + 1));
    }
    const int status = pclose(pipe);
    if (status != 0 && symbols.empty())
        GTEST_SKIP() << "nm is not available";
    EXPECT_EQ(symbols, (std::set<std::string>{"loadScenePlugin", "unloadScenePlugin"}));
}

TEST(AssimpModule, LoadsThroughDlopen) {
    void* module = dlopen(SCENE_ASSIMP_MODULE, RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(module, nullptr) << dlerror();
    using Load = std::int32_t (*)(base::PluginFactory&);
    using Unload = std::int32_t (*)();
    auto load = reinterpret_cast<Load>(dlsym(module, "loadScenePlugin"));
    auto unload = reinterpret_cast<Unload>(dlsym(module, "unloadScenePlugin"));
    ASSERT_NE(load, nullptr);
    ASSERT_NE(unload, nullptr);
    // Nothing but the entry points is reachable.
    EXPECT_EQ(
        dlsym(module, "_ZN2as17stripExtensionListESt17basic_string_viewIcSt11char_traitsIcEE"),
        nullptr);

    base::ref<base::PluginFactory> factory(new base::PluginFactory("dl"));
    scene::register_scene_schema(*factory);
    EXPECT_EQ(load(*factory), 0);
    base::ref<base::IPlugin> object = factory->create(importerType(), 0);
    ASSERT_TRUE(object);
    EXPECT_NE(scene::query<scene::ISceneImporter>(*object), nullptr);
    EXPECT_EQ(unload(), 0);
    // The module stays loaded: the factory's descriptor and object run its code.
}

} // namespace

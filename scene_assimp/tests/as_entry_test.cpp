// The module's entry points, its descriptor and what the built module exports.
#include "as_mesh_fixture.h"
#include "as_plugin_desc.h"

#include <assimp/version.h>

#include <cstdio>
#include <dlfcn.h>
#include <set>
#include <string>

extern "C" std::int32_t unloadScenePlugin();

namespace {

using as::meshtest::loadedFactory;

const base::name_id importerType() {
    return base::name_id("AssimpImporter");
}

TEST(AssimpEntry, RegistersOneDescriptorOnceAndCreatesBoundImporters) {
    base::ref<base::PluginFactory> factory = loadedFactory();
    base::ref<base::IPluginDesc> desc = factory->descriptor(importerType());
    ASSERT_TRUE(desc);
    EXPECT_EQ(desc->legalText(), aiGetLegalString());
    auto* sceneDesc = dynamic_cast<scene::IScenePluginDesc*>(desc.get());
    ASSERT_NE(sceneDesc, nullptr);
    EXPECT_TRUE(sceneDesc->secondaryText().empty());
    // A second load keeps the first descriptor: the factory's table and our ref.
    EXPECT_EQ(loadScenePlugin(*factory), 0);
    EXPECT_EQ(factory->descriptor(importerType()).get(), desc.get());
    EXPECT_EQ(desc->refCount(), 2u);

    base::ref<base::IPlugin> object = factory->create(importerType(), 0);
    auto* importer = dynamic_cast<as::AssimpImporter*>(object.get());
    ASSERT_NE(importer, nullptr);
    EXPECT_EQ(importer->factory(), factory.get());
    EXPECT_EQ(importer->descriptor(), desc.get());
    EXPECT_EQ(factory->plugin(importer->instanceId()).get(), object.get());
    EXPECT_EQ(scene::query<scene::ISceneImporter>(*object),
              static_cast<scene::ISceneImporter*>(importer));
    EXPECT_EQ(unloadScenePlugin(), 0);
    EXPECT_EQ(factory->descriptor(importerType()).get(), desc.get());
}

TEST(AssimpEntry, DescribesItsOptionsWithTheirDefaults) {
    base::ref<base::PluginFactory> factory = loadedFactory();
    base::ref<base::IPlugin> object = factory->create(importerType(), 0);
    base::AttribMap options;
    // An entry of another type is replaced.
    options.setAttribute(base::name_id("importNormals"), true);
    scene::query<scene::ISceneImporter>(*object)->describeOptions(options);
    EXPECT_EQ(options.className(), base::name_id("sceneImporter"));

    EXPECT_EQ(options.size(), 13u);
    EXPECT_TRUE(scene::get<bool>(options, base::name_id("importValidate"), false));
    // The values reach the flag word (see the Options cases); hair has no flag.
    EXPECT_EQ(scene::get<std::uint8_t>(options, base::name_id("importNormals"), 9), 2);
    EXPECT_TRUE(scene::get<bool>(options, base::name_id("importHair"), false));
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
    FILE* pipe = popen("nm -D --defined-only '" SCENE_ASSIMP_MODULE "' 2>/dev/null", "r");
    if (!pipe)
        GTEST_SKIP() << "nm is not available";
    std::set<std::string> symbols;
    char address[64], kind[8], name[512];
    while (std::fscanf(pipe, "%63s %7s %511s", address, kind, name) == 3)
        if (std::string_view(kind) != "A") // Absolute symbols are the script's version nodes.
            symbols.insert(name);
    const int status = pclose(pipe);
    if (status != 0 && symbols.empty())
        GTEST_SKIP() << "nm is not available";
    EXPECT_EQ(symbols, (std::set<std::string>{"loadScenePlugin", "unloadScenePlugin"}));
}

TEST(AssimpModule, LoadsThroughDlopen) {
    void* module = dlopen(SCENE_ASSIMP_MODULE, RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(module, nullptr) << dlerror();
    auto load = reinterpret_cast<decltype(&loadScenePlugin)>(dlsym(module, "loadScenePlugin"));
    auto unload =
        reinterpret_cast<decltype(&unloadScenePlugin)>(dlsym(module, "unloadScenePlugin"));
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
    ASSERT_TRUE(object && scene::query<scene::ISceneImporter>(*object));
    EXPECT_EQ(unload(), 0);
    // The module stays loaded: the factory's descriptor and object run its code.
}

} // namespace

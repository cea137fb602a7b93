// The import driver: options to assimp, the scene it builds, and bad input.
#include "as_importer.h"
#include "as_io.h"
#include "b_exception.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_getter.h"
#include "scene_interfaces.h"
#include "stream/b_fs.h"

#include <assimp/DefaultLogger.hpp>
#include <assimp/Importer.hpp>
#include <assimp/scene.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <functional>

extern "C" std::int32_t loadScenePlugin(base::PluginFactory& factory);

namespace {

namespace fsys = std::filesystem;

// ---- Flags ----

struct FlagRow {
    const char* label;
    std::function<void(base::AttribMap&)> set;
    std::uint32_t flags;
    std::uint32_t components; // 0: "PP_RVC_FLAGS" stays unset
};

void defaults(base::AttribMap& options) {
    base::ref<base::PluginFactory> factory(new base::PluginFactory());
    scene::register_scene_schema(*factory);
    loadScenePlugin(*factory);
    base::ref<base::IPlugin> importer = factory->create("AssimpImporter", 0);
    scene::query<scene::ISceneImporter>(*importer)->describeOptions(options);
}

template <class T>
std::function<void(base::AttribMap&)> with(std::initializer_list<std::pair<const char*, T>> values,
                                           bool fromDefaults = true) {
    std::vector<std::pair<const char*, T>> list(values);
    return [list, fromDefaults](base::AttribMap& options) {
        if (fromDefaults)
            defaults(options);
        for (const auto& [name, value] : list)
            options.setAttribute(base::name_id(name), value);
    };
}

class FlagTest : public testing::TestWithParam<FlagRow> {
protected:
    // The option names are interned by the module's entry; a row that sets
    // nothing must not depend on an earlier test having loaded it.
    void SetUp() override {
        scene::init_schema_names();
        scene::init_importer_schema_names();
    }
};

TEST_P(FlagTest, ReachesAssimp) {
    base::AttribMap options;
    GetParam().set(options);
    const as::ImportFlags got = as::importFlags(options);
    EXPECT_EQ(got.flags, GetParam().flags) << std::hex << got.flags;
    EXPECT_EQ(got.removesComponents(), GetParam().components != 0);
    if (got.removesComponents()) {
        EXPECT_EQ(got.components, GetParam().components) << std::hex << got.components;
    }

    // What readScene hands to assimp's importer for these options.
    Assimp::Importer importer;
    importer.SetIOHandler(new as::AssimpIO());
    EXPECT_EQ(as::readScene(importer, options, "/no/such/model.obj"), nullptr);
    EXPECT_EQ(importer.GetPropertyInteger("PP_RVC_FLAGS", -1),
              GetParam().components ? int(GetParam().components) : -1);
}

INSTANTIATE_TEST_SUITE_P(
    Options, FlagTest,
    testing::Values(
        FlagRow{"Defaults", with<bool>({}), 0x100042, 0},
        FlagRow{"Nothing", [](base::AttribMap&) {}, 0x100002, 0},
        FlagRow{"NoMaterialsNoCameras",
                with<bool>({{"importMaterials", false}, {"importCameras", false}}), 0x100052,
                0xA00},
        FlagRow{"NoNormalsComputedTangents",
                with<std::uint8_t>({{"importNormals", 0}, {"importTangents", 2}}), 0x100013, 0x2},
        FlagRow{"FileNormalsNoTangents",
                with<std::uint8_t>({{"importNormals", 1}, {"importTangents", 0}}), 0x100012, 0x4},
        FlagRow{"UnknownEnumerationValue", with<std::uint8_t>({{"importNormals", 7}}), 0x100002, 0},
        FlagRow{"FlipAndTriangulate",
                with<bool>({{"importFlipTextureCoordinates", true},
                            {"importFlipFaceWinding", true},
                            {"importTriangulateMeshes", true}}),
                0x190004A, 0},
        FlagRow{"FlipStoredAsInteger", with<std::int32_t>({{"importFlipTextureCoordinates", 1}}),
                0x100042, 0},
        FlagRow{"NormalsStoredAsBool", with<bool>({{"importNormals", true}}, false), 0x100002, 0},
        FlagRow{"EverythingRemoved",
                with<bool>({{"importMeshes", false},
                            {"importTextureCoordinates", false},
                            {"importColors", false},
                            {"importLights", false},
                            {"importSkeletons", false},
                            {"importMaterials", false},
                            {"importCameras", false},
                            {"importAnimations", false}}),
                0x100052, 0xF78}),
    [](const testing::TestParamInfo<FlagRow>& info) { return info.param.label; });

// ---- upAxis ----

TEST(AssimpImport, UpAxisFollowsTheExtensionOfTheFileName) {
    const std::pair<const char*, int> rows[] = {
        {"model.blend", 2},
        {"model.BLEND", 2},
        {"model.old.blend", 2},
        {"dir.old/model.blend", 2},
        {"C:\\a.b\\model.Blend", 2},
        {"/x/y.blend/model", 1},
        {"model.fbx", 1},
        {"model", 1},
        {"model.blend1", 1},
        {"dir/model.blend.fbx", 1},
        {"", 1},
    };
    for (const auto& [path, axis] : rows)
        EXPECT_EQ(as::upAxisForPath(path), axis) << path;
}

// ---- Whole imports ----

constexpr const char* objWithNormals = "v 0 0 0\nv 1 0 0\nv 0 1 0\nv 0 0 1\n"
                                       "vn 0 0 1\n"
                                       "o tri\nf 1//1 2//1 3//1\nf 1//1 3//1 4//1\n";
constexpr const char* objWithoutNormals = "v 0 0 0\nv 1 0 0\nv 0 1 0\nf 1 2 3\n";

struct ImportFixture : testing::Test {
    void SetUp() override {
        folder = fsys::path(testing::TempDir()) /
                 ("as_import_" + std::to_string(::getpid()) + "_" +
                  testing::UnitTest::GetInstance()->current_test_info()->name());
        fsys::create_directories(folder);
        factory = makeFactory();
    }
    void TearDown() override {
        std::error_code ignored;
        fsys::remove_all(folder, ignored);
    }

    static base::ref<base::PluginFactory> makeFactory() {
        base::ref<base::PluginFactory> made(new base::PluginFactory("import"));
        scene::register_scene_schema(*made);
        loadScenePlugin(*made);
        return made;
    }

    std::string write(const std::string& name, std::string_view contents) {
        const fsys::path path = folder / name;
        std::ofstream(path, std::ios::binary) << contents;
        return path.string();
    }

    bool import(const std::string& path, const base::AttribMap* options = nullptr) {
        base::ref<base::IPlugin> object = factory->create("AssimpImporter", 0);
        if (options)
            object->copyFrom(*options, 1);
        return scene::query<scene::ISceneImporter>(*object)->import(*factory,
                                                                    base::string(path.c_str()));
    }

    std::vector<base::ref<base::IPlugin>> objectsOf(std::string_view type) const {
        std::vector<base::ref<base::IPlugin>> found;
        for (std::uint32_t id = 0; id < factory->pluginCount(); ++id)
            if (base::ref<base::IPlugin> object = factory->plugin(id))
                if (object->className() == base::name_id(type))
                    found.push_back(object);
        return found;
    }

    fsys::path folder;
    base::ref<base::PluginFactory> factory;
};

TEST_F(ImportFixture, BuildsTheSceneAndNamesTheSecondOneScene1) {
    const std::string path = write("tri.obj", objWithNormals);
    base::CaptureLog capture;
    base::ScopedLog scoped(capture);
    ASSERT_TRUE(import(path));
    EXPECT_TRUE(Assimp::DefaultLogger::isNullLogger());
    ASSERT_TRUE(import(path));

    const auto scenes = objectsOf("scene");
    ASSERT_EQ(scenes.size(), 2u);
    using SS = scene::scene_schema;
    EXPECT_EQ(scenes[0]->name(), "scene");
    EXPECT_EQ(scenes[1]->name(), "scene1");
    for (const auto& sceneObject : scenes) {
        EXPECT_EQ(scene::get(*sceneObject, SS::upAxis(), std::uint8_t(0)), 1);
        const base::TimeCode* time = sceneObject->findAttribute<base::TimeCode>(SS::time());
        ASSERT_NE(time, nullptr);
        EXPECT_EQ(time->ticks(), 0);
        const base::ref<base::IPlugin>* root =
            sceneObject->findAttribute<base::ref<base::IPlugin>>(SS::root());
        ASSERT_TRUE(root && *root);
        EXPECT_EQ((*root)->className(), scene::node_schema::type());
        EXPECT_TRUE(scene::get(**root, scene::node_schema::isLayer(), false));
    }
    EXPECT_EQ(capture.count("assimp import |" + base::string(path.c_str()) +
                            "| Fatal error during the scene loading!"),
              0u);
}

TEST_F(ImportFixture, ReadsThroughTheHostFileSystem) {
    write("tri.obj", objWithNormals);
    base::fs::aliases().set("asimporttest", folder.string() + "/");
    const bool imported = import("asimporttest:tri.obj");
    base::fs::aliases().remove("asimporttest");
    EXPECT_TRUE(imported);
    EXPECT_EQ(objectsOf("scene").size(), 1u);
}

TEST_F(ImportFixture, NormalsOptionDecidesWhatAssimpDelivers) {
    struct Row {
        const char* file;
        const char* contents;
        int importNormals; // -1: unset
        bool expectNormals;
    };
    const Row rows[] = {
        {"with.obj", objWithNormals, -1, true},
        {"with.obj", objWithNormals, 0, false},
        {"without.obj", objWithoutNormals, 2, true},
        {"without.obj", objWithoutNormals, 1, false},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(testing::Message() << row.file << " " << row.importNormals);
        base::AttribMap options;
        if (row.importNormals >= 0)
            options.setAttribute(scene::sceneImporter_schema::importNormals(),
                                 std::uint8_t(row.importNormals));
        Assimp::Importer importer;
        importer.SetIOHandler(new as::AssimpIO());
        const std::string path = write(row.file, row.contents);
        const aiScene* source = as::readScene(importer, options, base::string(path.c_str()));
        ASSERT_NE(source, nullptr);
        ASSERT_GE(source->mNumMeshes, 1u);
        EXPECT_EQ(source->mMeshes[0]->HasNormals(), row.expectNormals);

        // And through a whole import, on the importer's own attributes.
        factory = makeFactory();
        ASSERT_TRUE(import(path, &options));
        const auto meshes = objectsOf("mesh");
        ASSERT_EQ(meshes.size(), 1u);
        EXPECT_EQ(meshes[0]->findEntry(base::name_id("normals")) != nullptr, row.expectNormals);
    }
}

TEST_F(ImportFixture, BadInputAnswersFalseAndLeavesNoLogger) {
    const std::string rows[] = {
        (folder / "missing.obj").string(),
        write("empty.obj", ""),
        write("garbage.xyz", std::string(200, '\x01')),
        [&] {
            fsys::create_directories(folder / "dir.obj");
            return (folder / "dir.obj").string();
        }(),
        "",
    };
    for (const std::string& path : rows) {
        SCOPED_TRACE(path);
        base::CaptureLog capture;
        base::ScopedLog scoped(capture);
        EXPECT_FALSE(import(path));
        EXPECT_TRUE(Assimp::DefaultLogger::isNullLogger());
        EXPECT_EQ(capture.count("assimp import |" + base::string(path.c_str()) +
                                "| Fatal error during the scene loading!"),
                  0u);
    }
    EXPECT_TRUE(objectsOf("scene").empty());
    EXPECT_TRUE(objectsOf("node").empty());
}

// A "node" type whose objects cannot be made: the conversion fails midway.
class FailingNodeDesc final : public base::IPluginDesc {
public:
    FailingNodeDesc() { setTypeName(base::name_id("node")); }
    base::IPlugin* create(base::PluginFactory&, std::uint32_t) override {
        BASE_THROW(base::exception, "no nodes today");
    }
};

TEST_F(ImportFixture, FailureDuringConversionIsLoggedOnceAndAnswersTrue) {
    factory = new base::PluginFactory("failing");
    factory->registerPlugin(base::ref<base::IPluginDesc>(new FailingNodeDesc()));
    scene::register_scene_schema(*factory);
    loadScenePlugin(*factory);

    const std::string path = write("tri.obj", objWithNormals);
    base::CaptureLog capture;
    base::ScopedLog scoped(capture);
    EXPECT_TRUE(import(path));
    EXPECT_TRUE(Assimp::DefaultLogger::isNullLogger());
    const auto entries = capture.entries();
    std::size_t fatal = 0;
    for (const auto& e : entries) {
        if (e.message == "assimp import |" + base::string(path.c_str()) +
                             "| Fatal error during the scene loading!") {
            ++fatal;
            EXPECT_EQ(e.level, base::logCritical);
            EXPECT_EQ(e.channel, base::logScene);
        }
    }
    EXPECT_EQ(fatal, 1u);
    // Nothing after the failing step was built.
    EXPECT_TRUE(objectsOf("scene").empty());

    // The importer runs again normally afterwards.
    factory = makeFactory();
    EXPECT_TRUE(import(path));
    EXPECT_EQ(objectsOf("scene").size(), 1u);
}

} // namespace

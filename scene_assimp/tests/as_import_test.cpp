// The import driver: options to assimp, the scene it builds, and bad input.
#include "as_io.h"
#include "as_mesh_fixture.h"
#include "b_exception.h"
#include "stream/b_fs.h"

#include <assimp/DefaultLogger.hpp>
#include <assimp/Importer.hpp>

#include <filesystem>
#include <fstream>
#include <functional>

namespace {

namespace fsys = std::filesystem;
namespace names = scene::names;

// ---- Flags ----

struct FlagRow {
    const char* label;
    std::function<void(base::AttribMap&)> set;
    std::uint32_t flags;
    std::uint32_t components; // 0: "PP_RVC_FLAGS" stays unset
};

void defaults(base::AttribMap& options) {
    base::ref<base::PluginFactory> factory = as::meshtest::loadedFactory();
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
    EXPECT_EQ(as::importFlags(options).flags, GetParam().flags)
        << std::hex << as::importFlags(options).flags;
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
        FlagRow{"Defaults", with<bool>({}), 0x100440, 0},
        FlagRow{"Nothing", [](base::AttribMap&) {}, 0x100400, 0},
        FlagRow{"NoMaterialsNoCameras",
                with<bool>({{"importMaterials", false}, {"importCameras", false}}), 0x100450,
                0xA00},
        FlagRow{"NoNormalsComputedTangents",
                with<std::uint8_t>({{"importNormals", 0}, {"importTangents", 2}}), 0x100411, 0x2},
        FlagRow{"FileNormalsNoTangents",
                with<std::uint8_t>({{"importNormals", 1}, {"importTangents", 0}}), 0x100410, 0x4},
        FlagRow{"UnknownEnumerationValue", with<std::uint8_t>({{"importNormals", 7}}), 0x100400, 0},
        FlagRow{"FlipAndTriangulate",
                with<bool>({{"importFlipTextureCoordinates", true},
                            {"importFlipFaceWinding", true},
                            {"importTriangulateMeshes", true}}),
                0x1900448, 0},
        FlagRow{"FlipStoredAsInteger", with<std::int32_t>({{"importFlipTextureCoordinates", 1}}),
                0x100440, 0},
        FlagRow{"NormalsStoredAsBool", with<bool>({{"importNormals", true}}, false), 0x100400, 0},
        FlagRow{"ValidationOff", with<bool>({{"importValidate", false}}), 0x100040, 0},
        FlagRow{"ValidateStoredAsInteger", with<std::int32_t>({{"importValidate", 0}}, false),
                0x100400, 0},
        FlagRow{"EverythingRemoved",
                with<bool>({{"importMeshes", false},
                            {"importTextureCoordinates", false},
                            {"importColors", false},
                            {"importLights", false},
                            {"importSkeletons", false},
                            {"importMaterials", false},
                            {"importCameras", false},
                            {"importAnimations", false}}),
                0x100450, 0xF78}),
    [](const testing::TestParamInfo<FlagRow>& info) { return info.param.label; });

// ---- upAxis ----

TEST(AssimpImport, UpAxisFollowsTheExtensionOfTheFileName) {
    for (const char* path : {"model.blend", "model.BLEND", "model.old.blend", "dir.old/model.blend",
                             "C:\\a.b\\model.Blend"})
        EXPECT_EQ(as::upAxisForPath(path), 2) << path;
    for (const char* path :
         {"/x/y.blend/model", "model.fbx", "model", "model.blend1", "dir/model.blend.fbx", ""})
        EXPECT_EQ(as::upAxisForPath(path), 1) << path;
}

// ---- Whole imports ----

constexpr const char* objWithNormals = "v 0 0 0\nv 1 0 0\nv 0 1 0\nv 0 0 1\n"
                                       "vn 0 0 1\n"
                                       "o tri\nf 1//1 2//1 3//1\nf 1//1 3//1 4//1\n";

struct ImportFixture : testing::Test {
    void SetUp() override {
        folder = as::meshtest::testFolder("as_import_");
        factory = as::meshtest::loadedFactory("import");
    }
    void TearDown() override {
        std::error_code ignored;
        fsys::remove_all(folder, ignored);
    }

    std::string write(const std::string& name, std::string_view contents) {
        const fsys::path path = folder / name;
        std::ofstream(path, std::ios::binary) << contents;
        return path.string();
    }

    bool import(const std::string& path, base::ref<base::IPlugin> object = {}) {
        if (!object)
            object = factory->create("AssimpImporter", 0);
        return scene::query<scene::ISceneImporter>(*object)->import(*factory,
                                                                    base::string(path.c_str()));
    }

    std::vector<base::ref<base::IPlugin>> objectsOf(const char* type) const {
        return as::meshtest::objectsOf(*factory, base::name_id(type));
    }

    static base::string fatal(const std::string& path) {
        return "assimp import |" + base::string(path.c_str()) +
               "| Fatal error during the scene loading!";
    }

    fsys::path folder;
    base::ref<base::PluginFactory> factory;
};

// One importer object importing twice: the second scene is "scene1", and the
// array pool emptied per import keeps the second mesh from linking into the first.
TEST_F(ImportFixture, SecondImportIsScene1AndNeverLinksIntoTheFirst) {
    const std::string path = write("tri.obj", objWithNormals);
    base::CaptureLog capture;
    base::ScopedLog scoped(capture);
    base::ref<base::IPlugin> importer = factory->create("AssimpImporter", 0);
    ASSERT_TRUE(import(path, importer));
    EXPECT_TRUE(Assimp::DefaultLogger::isNullLogger());
    ASSERT_TRUE(import(path, importer));

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
        const auto root = scene::get(*sceneObject, SS::root(), base::ref<base::IPlugin>());
        ASSERT_TRUE(root);
        EXPECT_EQ(root->className(), scene::node_schema::type());
        EXPECT_TRUE(scene::get(*root, scene::node_schema::isLayer(), false));
    }
    const auto meshes = objectsOf("mesh");
    ASSERT_EQ(meshes.size(), 2u);
    for (const auto& mesh : meshes) {
        auto* positions = const_cast<base::Attribute*>(mesh->findEntry(names::positions));
        ASSERT_NE(positions, nullptr);
        EXPECT_EQ(positions->asLink(), nullptr);
        EXPECT_GE(positions->size(), 3u);
    }
    EXPECT_EQ(capture.count(fatal(path)), 0u);
}

TEST_F(ImportFixture, ReadsThroughTheHostFileSystem) {
    write("tri.obj", objWithNormals);
    base::fs::aliases().set("asimporttest", folder.string() + "/");
    const bool imported = import("asimporttest:tri.obj");
    base::fs::aliases().remove("asimporttest");
    EXPECT_TRUE(imported);
    EXPECT_EQ(objectsOf("scene").size(), 1u);
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
        EXPECT_EQ(capture.count(fatal(path)), 0u);
    }
    EXPECT_TRUE(objectsOf("scene").empty());
    EXPECT_TRUE(objectsOf("node").empty());
}

// The structure check rejects shapes that valid files have (a point cloud
// has no faces); those files are read again without it and still import,
// while an inconsistent scene stays rejected.
TEST_F(ImportFixture, StructureCheckLosesNoValidScene) {
    const std::string points = write("points.obj", "v 0 0 0\nv 1 0 0\nv 0 1 0\n");
    EXPECT_TRUE(import(points));
    EXPECT_EQ(objectsOf("scene").size(), 1u);
    struct Row {
        const char* reason;
        bool tolerable;
    };
    const Row rows[] = {
        {"Validation failed: aiScene::mNumMeshes is 0. At least one mesh must be there", true},
        {"Validation failed: Mesh  contains no faces", true},
        {"Validation failed: The mesh emptySolid contains no vertices", true},
        {"Validation failed: aiScene::mLights[1] has no corresponding node in the scene graph "
         "(light1)",
         true},
        {"Validation failed: A node of the scene-graph is nullptr", true},
        {"Validation failed: aiMesh::mFaces[0]::mIndices[0] is out of range", false},
        {"Validation failed: aiMesh::mBones[0] is nullptr", false},
        {"", false},
    };
    for (const Row& row : rows)
        EXPECT_EQ(as::structureCheckIsTolerable(row.reason), row.tolerable) << row.reason;
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
    std::size_t logged = 0;
    for (const auto& e : capture.entries())
        if (e.message == fatal(path)) {
            ++logged;
            EXPECT_EQ(e.level, base::logCritical);
            EXPECT_EQ(e.channel, base::logScene);
        }
    EXPECT_EQ(logged, 1u);
    // Nothing after the failing step was built.
    EXPECT_TRUE(objectsOf("scene").empty());

    // The importer runs again normally afterwards.
    factory = as::meshtest::loadedFactory("import");
    EXPECT_TRUE(import(path));
    EXPECT_EQ(objectsOf("scene").size(), 1u);
}

} // namespace

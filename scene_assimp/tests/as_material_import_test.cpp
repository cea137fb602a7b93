// Materials and textures through whole imports of models the tests write
// (glTF, OBJ with MTL) and of a corpus FBX that embeds its image.
#include "as_material_fixture.h"
#include "b_json.h"
#include "stream/b_stream.h"

#include <filesystem>
#include <fstream>

namespace {

namespace fsys = std::filesystem;
using namespace as::materialtest;

// One triangle with texture coordinates: 3 positions, then 3 UVs.
std::string triangleBytes() {
    const float values[] = {0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 1};
    return std::string(reinterpret_cast<const char*>(values), sizeof values);
}

// Every map of a metal-rough material, plus an image held in the file that
// two materials share.
constexpr const char* gltfWithEveryMap = R"({
  "asset": {"version": "2.0"},
  "scene": 0, "scenes": [{"nodes": [0]}], "nodes": [{"mesh": 0}],
  "meshes": [{"primitives": [{"attributes": {"POSITION": 0, "TEXCOORD_0": 1}, "material": 0},
                             {"attributes": {"POSITION": 0, "TEXCOORD_0": 1}, "material": 1},
                             {"attributes": {"POSITION": 0, "TEXCOORD_0": 1}, "material": 2}]}],
  "buffers": [{"uri": "tri.bin", "byteLength": 60}],
  "bufferViews": [{"buffer": 0, "byteOffset": 0, "byteLength": 36},
                  {"buffer": 0, "byteOffset": 36, "byteLength": 24}],
  "accessors": [{"bufferView": 0, "componentType": 5126, "count": 3, "type": "VEC3",
                 "min": [0, 0, 0], "max": [1, 1, 0]},
                {"bufferView": 1, "componentType": 5126, "count": 3, "type": "VEC2"}],
  "samplers": [{"wrapS": 33071, "wrapT": 33648}],
  "images": [{"uri": "base.png"}, {"uri": "mr.png"}, {"uri": "normal.png"},
             {"uri": "occlusion.png"}, {"uri": "emissive.png"},
             {"uri": "data:image/png;base64,iVBORw0KGgoAAAANSUhEUg=="}],
  "textures": [{"source": 0, "sampler": 0}, {"source": 1}, {"source": 2}, {"source": 3},
               {"source": 4}, {"source": 5}],
  "materials": [
    {"name": "Full",
     "pbrMetallicRoughness": {"baseColorTexture": {"index": 0}, "baseColorFactor": [0, 0, 0, 1],
                              "metallicRoughnessTexture": {"index": 1},
                              "metallicFactor": 0.25, "roughnessFactor": 0.6},
     "normalTexture": {"index": 2}, "occlusionTexture": {"index": 3},
     "emissiveTexture": {"index": 4}, "emissiveFactor": [1, 1, 1], "alphaMode": "BLEND"},
    {"name": "EmbeddedA", "pbrMetallicRoughness": {"baseColorTexture": {"index": 5}}},
    {"name": "EmbeddedB", "pbrMetallicRoughness": {"baseColorTexture": {"index": 5}},
     "alphaMode": "mask"}]
})";

constexpr const char* objWithMaterials = "mtllib look.mtl\n"
                                         "v 0 0 0\nv 1 0 0\nv 0 1 0\nv 0 0 1\n"
                                         "vt 0 0\nvt 1 0\nvt 0 1\n"
                                         "f 1/1 2/2 3/3\n" // no material: assimp's default
                                         "usemtl shiny\nf 1/1 3/3 4/3\n"
                                         "usemtl glass\nf 1/1 2/2 4/3\n";

constexpr const char* mtl = "newmtl shiny\n"
                            "Kd 0 0 0\nKs 0.3 0.6 0.9\nNs 98\nNi 1.5\n"
                            "map_Kd -clamp on textures/brick.png\n"
                            "map_bump textures/brick.normal.png\n"
                            "newmtl glass\n"
                            "Kd 0.2 0.4 0.6\nd 0.25\nKe 0 0 0\n"
                            "map_Ks /nowhere/spec.png\n";

struct MaterialImport : testing::Test {
    void SetUp() override {
        folder = as::meshtest::testFolder("as_material_");
        factory = as::meshtest::loadedFactory((folder.string() + "/").c_str());
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
    bool import(const std::string& path) {
        base::ref<base::IPlugin> object = factory->create("AssimpImporter", 0);
        return scene::query<scene::ISceneImporter>(*object)->import(*factory,
                                                                    base::string(path.c_str()));
    }
    std::vector<PluginRef> objectsOf(base::name_id type) const {
        return as::meshtest::objectsOf(*factory, type);
    }
    PluginRef material(std::string_view name) const {
        for (const PluginRef& m : objectsOf(names::principalMaterial))
            if (m->name() == name)
                return m;
        return {};
    }
    // The material on item 0 of a mesh's primitives.
    static PluginRef meshMaterial(const base::IPlugin& mesh) {
        const base::AttribMap* primitive = as::meshtest::item(mesh, names::primitives, 0);
        const auto refs = primitive ? as::meshtest::items<PluginRef>(*primitive, names::materials)
                                    : std::vector<PluginRef>();
        return refs.size() == 1 ? refs[0] : PluginRef();
    }

    base::CaptureLog captured;
    base::ScopedLog scopedLog{captured};
    fsys::path folder;
    base::ref<base::PluginFactory> factory;
};

TEST_F(MaterialImport, GltfMetalRoughWithEveryMap) {
    write("tri.bin", triangleBytes());
    ASSERT_TRUE(import(write("every.gltf", gltfWithEveryMap)));

    // assimp adds an unnamed material for glTF, which comes in as "Material".
    EXPECT_EQ(objectsOf(names::principalMaterial).size(), 4u);
    EXPECT_TRUE(material("Material"));
    const PluginRef full = material("Full");
    ASSERT_TRUE(full);
    std::vector<std::string> meshMaterials;
    for (const PluginRef& mesh : objectsOf(names::mesh))
        if (const PluginRef m = meshMaterial(*mesh))
            meshMaterials.push_back(m->name().c_str());
    std::sort(meshMaterials.begin(), meshMaterials.end());
    EXPECT_EQ(meshMaterials, (std::vector<std::string>{"EmbeddedA", "EmbeddedB", "Full"}));

    expectPackedMaps(*full, "mr.png", 0.25f);
    EXPECT_NEAR(value<float>(*full, names::roughness), 0.6f, 1e-6);

    const PluginRef base = plugin(*full, names::colorMap);
    ASSERT_TRUE(base);
    EXPECT_EQ(text(*base, names::file), "base.png");
    EXPECT_EQ(value<std::uint8_t>(*base, names::wrapModeU), 2);
    EXPECT_EQ(value<std::uint8_t>(*base, names::wrapModeV), 1);
    // A black base colour under a texture comes in white.
    EXPECT_EQ(value<base::vec3f>(*full, names::color).x, 1.0f);
    EXPECT_TRUE(value<bool>(*full, names::visibilityFromColorMap));
    EXPECT_EQ(text(*plugin(*full, names::bumpMap), names::file), "normal.png");
    EXPECT_EQ(text(*plugin(*full, names::emissionMap), names::file), "emissive.png");
    const PluginRef occlusion = plugin(*full, names::ambientMap);
    ASSERT_TRUE(occlusion);
    EXPECT_EQ(text(*occlusion, names::file), "occlusion.png");
    EXPECT_EQ(value<std::uint8_t>(*occlusion, names::colorChannels), 3);
    EXPECT_EQ(value<std::uint8_t>(*full, names::ambientType), 1);
    EXPECT_FALSE(holds(*full, names::model));

    // One image held in the file, two materials: one buffer, two textures.
    const PluginRef a = plugin(*material("EmbeddedA"), names::colorMap);
    const PluginRef b = plugin(*material("EmbeddedB"), names::colorMap);
    ASSERT_TRUE(a && b);
    EXPECT_NE(a.get(), b.get());
    EXPECT_EQ(text(*a, names::file), "0.png");
    EXPECT_EQ(a->findVecAttribute<std::uint8_t>(names::embeddedFile)->size(), 16u);
    EXPECT_EQ(b->findVecAttribute<std::uint8_t>(names::embeddedFile)->size(), 16u);
    EXPECT_EQ(objectsOf(names::buffer).size(), 1u);
    EXPECT_EQ(objectsOf(names::bufferAdapter).size(), 1u);
    EXPECT_FALSE(holds(*material("EmbeddedA"), names::visibilityFromColorMap));
    EXPECT_TRUE(value<bool>(*material("EmbeddedB"), names::visibilityFromColorMap));
}

TEST_F(MaterialImport, ObjWithMtl) {
    write("look.mtl", mtl);
    ASSERT_TRUE(import(write("look.obj", objWithMaterials)));

    // The faces without a material use assimp's default material: not converted.
    EXPECT_EQ(objectsOf(names::principalMaterial).size(), 2u);
    const PluginRef shiny = material("shiny");
    const PluginRef glass = material("glass");
    ASSERT_TRUE(shiny && glass);

    const PluginRef brick = plugin(*shiny, names::colorMap);
    ASSERT_TRUE(brick);
    EXPECT_EQ(text(*brick, names::file), "textures/brick.png");
    EXPECT_EQ(text(*brick, names::name), "brick");
    EXPECT_EQ(value<std::uint8_t>(*brick, names::wrapModeU), 2);
    const PluginRef bump = plugin(*shiny, names::bumpMap);
    ASSERT_TRUE(bump);
    EXPECT_EQ(text(*bump, names::name), "brick1");
    EXPECT_EQ(value<base::vec3f>(*shiny, names::color).y, 1.0f);
    EXPECT_NEAR(value<float>(*shiny, names::reflectionAmount), 0.599994f, 1e-6);
    EXPECT_NEAR(value<float>(*shiny, names::roughness), 0.1414f, 1e-4);
    EXPECT_NEAR(value<float>(*shiny, names::reflectivity), 0.2353f, 1e-4);

    const base::vec3f see = value<base::vec3f>(*glass, names::transparency);
    EXPECT_NEAR(see.x, 0.75f, 1e-6);
    EXPECT_NEAR(value<base::vec3f>(*glass, names::color).z, 0.6f, 1e-6);
    // A file outside the model's folder keeps its whole path.
    EXPECT_EQ(text(*plugin(*glass, names::reflectionAmountMap), names::file), "/nowhere/spec.png");
    // Ke 0 0 0 is still an emissive colour.
    EXPECT_FALSE(holds(*glass, names::model));

    for (const PluginRef& mesh : objectsOf(names::mesh)) {
        if (mesh->name() == "shiny") {
            EXPECT_EQ(meshMaterial(*mesh).get(), shiny.get());
        }
    }
}

TEST_F(MaterialImport, FbxEmbedsItsImageByFileName) {
    const fsys::path model = "/usr/share/assimp/models/FBX/box_orphant_embedded_texture.fbx";
    if (!fsys::exists(model))
        GTEST_SKIP() << "assimp's model corpus is not installed";
    ASSERT_TRUE(import(model.string()));
    const auto materials = objectsOf(names::principalMaterial);
    ASSERT_EQ(materials.size(), 1u);
    const PluginRef grid = plugin(*materials[0], names::colorMap);
    ASSERT_TRUE(grid);
    EXPECT_EQ(grid->className(), names::fileTexture);
    EXPECT_EQ(text(*grid, names::name), "GridGrey");
    EXPECT_EQ(text(*grid, names::file), "GridGrey.tga");
    const auto* bytes = grid->findVecAttribute<std::uint8_t>(names::embeddedFile);
    ASSERT_NE(bytes, nullptr);
    EXPECT_EQ(bytes->size(), 9026u);
    EXPECT_EQ(objectsOf(names::buffer).size(), 1u);
    // Shininess 2 with strength 1: sqrt(2 / 4).
    EXPECT_NEAR(value<float>(*materials[0], names::roughness), 0.7071f, 1e-4);

    // Written as JSON and read back, the texture reaches the image again
    // through the adapter's view of the buffer.
    base::Stream out = base::memoryStream();
    ASSERT_TRUE(base::writeFactory(*factory, out));
    const auto& document = static_cast<base::MemoryStreamWorker*>(out.worker())->bytes();
    base::ref<base::PluginFactory> copy = as::meshtest::loadedFactory("copy");
    base::Stream in = base::memoryStream("doc", document);
    ASSERT_TRUE(base::readFactory(*copy, in));
    const auto read = as::meshtest::objectsOf(*copy, names::fileTexture);
    ASSERT_EQ(read.size(), 1u);
    const auto* readBytes = read[0]->findVecAttribute<std::uint8_t>(names::embeddedFile);
    ASSERT_NE(readBytes, nullptr);
    EXPECT_EQ(*readBytes, *bytes);
}

} // namespace

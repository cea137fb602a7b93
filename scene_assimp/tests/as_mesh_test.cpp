// Mesh conversion: streams, faces, channels, naming, the once-per-mesh rule and
// the shared-array pool.
#include "as_mesh_fixture.h"

#include "scene_importer.h"

#include <unistd.h>

#include <cfloat>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <limits>

extern "C" std::int32_t loadScenePlugin(base::PluginFactory& factory);

namespace as::meshtest {
namespace {

using Face = std::vector<unsigned>;

TEST_F(MeshTest, SharedMeshIsConvertedOnceAndSourceArraysAreReleased) {
    aiMesh* mesh =
        makeMesh("quad", {{0, 0, 0}, {1, 0, 0}, {1, 1, 0}, {0, 1, 0}}, {{0, 1, 2}, {0, 2, 3}});
    mesh->mNormals = new aiVector3D[4];
    mesh->mColors[0] = new aiColor4D[4];
    mesh->mTextureCoords[0] = new aiVector3D[4];
    mesh->mNumUVComponents[0] = 2;
    begin(makeScene({mesh}));

    base::ref<scene::IGeometry> first = convert(0);
    base::ref<scene::IGeometry> second = convert(0);
    ASSERT_TRUE(first);
    EXPECT_EQ(first.get(), second.get());
    EXPECT_EQ(countOfType(names::mesh), 1u);
    EXPECT_EQ(first->name(), "quad");

    EXPECT_EQ(mesh->mVertices, nullptr);
    EXPECT_EQ(mesh->mNormals, nullptr);
    EXPECT_EQ(mesh->mFaces, nullptr);
    EXPECT_EQ(mesh->mNumFaces, 0u);
    EXPECT_EQ(mesh->mColors[0], nullptr);
    EXPECT_EQ(mesh->mTextureCoords[0], nullptr);
    // The vertex count stays: it still describes the converted streams.
    EXPECT_EQ(mesh->mNumVertices, 4u);
}

TEST_F(MeshTest, NodesSharingAMeshListTheSameObjectAfterTheirChildren) {
    aiScene* scene =
        makeScene({makeMesh("shared", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}})});
    scene->mRootNode = new aiNode("root");
    auto* left = new aiNode("left");
    auto* right = new aiNode("right");
    auto* leaf = new aiNode("leaf");
    left->addChildren(1, &leaf);
    aiNode* children[] = {left, right};
    scene->mRootNode->addChildren(2, children);
    for (aiNode* node : {left, right}) {
        node->mNumMeshes = 1;
        node->mMeshes = new unsigned[1]{0};
    }
    begin(scene);
    base::ref<scene::INode> root =
        ImporterTestAccess::meshImportNode(*importer, *source, *scene->mRootNode);
    ASSERT_TRUE(root);

    const auto top = items<base::ref<base::IPlugin>>(*root, names::children);
    ASSERT_EQ(top.size(), 2u);
    const auto leftChildren = items<base::ref<base::IPlugin>>(*top[0], names::children);
    const auto rightChildren = items<base::ref<base::IPlugin>>(*top[1], names::children);
    ASSERT_EQ(leftChildren.size(), 2u);
    ASSERT_EQ(rightChildren.size(), 1u);
    EXPECT_EQ(leftChildren[0]->name(), "leaf");
    EXPECT_EQ(leftChildren[1]->name(), "shared");
    EXPECT_EQ(leftChildren[1].get(), rightChildren[0].get());
    EXPECT_EQ(countOfType(names::mesh), 1u);
}

TEST_F(MeshTest, BadValuesAreImportedAsTheyCome) {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    const float inf = std::numeric_limits<float>::infinity();
    aiMesh* mesh = makeMesh("bad", {{nan, 0, 0}, {inf, -inf, 0}, {0, 1, 0}},
                            {{0, 1, 99}, {7, 0xFFFFFFFFu, 2}});
    addBone(*mesh, "j", {{1, 1}, {2, 0.5f}});
    begin(makeScene({mesh}));
    auto answer = convert(0);
    ASSERT_TRUE(answer);
    EXPECT_EQ(items<std::uint32_t>(*meshOf(answer), names::indices).size(), 6u);
    EXPECT_EQ(items<base::vec3f>(*meshOf(answer), names::positions).size(), 3u);
}

TEST_F(MeshTest, EmptyNamesBecomeUniqueMeshNames) {
    begin(makeScene({makeLine("", 1), makeLine("", 1), makeLine("part", 1)}));
    EXPECT_EQ(convert(0)->name(), "mesh");
    EXPECT_EQ(convert(1)->name(), "mesh1");
    EXPECT_EQ(convert(2)->name(), "part");
}

// ---- Faces ----

struct FaceCase {
    const char* label;
    std::vector<Face> faces;
    // One value: a single "vcounts"; several: the per-face array.
    std::vector<std::uint16_t> vcounts;
    // As stored, after the face reordering and differences.
    std::vector<std::uint32_t> indices;
};

class Faces : public MeshTest, public ::testing::WithParamInterface<FaceCase> {};

TEST_P(Faces, SizesAndIndicesAreStoredAsTheReaderExpects) {
    const FaceCase& c = GetParam();
    aiMesh* mesh = makeLine("m", 12);
    mesh->mNumFaces = unsigned(c.faces.size());
    mesh->mFaces = new aiFace[c.faces.size()];
    for (std::size_t f = 0; f < c.faces.size(); ++f) {
        mesh->mFaces[f].mNumIndices = unsigned(c.faces[f].size());
        mesh->mFaces[f].mIndices = new unsigned[c.faces[f].size()];
        std::copy(c.faces[f].begin(), c.faces[f].end(), mesh->mFaces[f].mIndices);
    }
    begin(makeScene({mesh}));
    auto answer = convert(0);
    ASSERT_TRUE(answer);

    const base::AttribMap* primitive = item(*answer, names::primitives, 0);
    ASSERT_NE(primitive, nullptr);
    if (c.vcounts.size() == 1) {
        const auto* vcounts = primitive->findAttribute<std::uint16_t>(names::vcounts);
        ASSERT_NE(vcounts, nullptr);
        EXPECT_EQ(*vcounts, c.vcounts[0]);
    } else {
        EXPECT_EQ(items<std::uint16_t>(*primitive, names::vcounts), c.vcounts);
    }
    EXPECT_EQ(items<std::uint32_t>(*answer, names::indices), c.indices);
    EXPECT_EQ(scene::get<std::uint8_t>(*answer, names::indicesDeltaCompression, 0), 1);
}

INSTANTIATE_TEST_SUITE_P(
    Mesh, Faces,
    ::testing::Values(
        FaceCase{"rotatedSortedDifferences", {{4, 2, 3}, {0, 1, 2}}, {3}, {0, 1, 2, 2, 1, 2}},
        // Faces in canonical order keep their order; the sizes are per face.
        FaceCase{"trianglesAndQuads",
                 {{0, 1, 2}, {1, 2, 3, 4}, {5, 6, 7}},
                 {3, 4, 3},
                 {0, 1, 2, 1, 1, 2, 3, 4, 1, 2}},
        FaceCase{"pentagonsAndHexagons",
                 {{0, 1, 2, 3, 4}, {5, 6, 7, 8, 9, 10}},
                 {5, 6},
                 {0, 1, 2, 3, 4, 5, 1, 2, 3, 4, 5}},
        // Single sizes above 4 and one-index faces keep plain indices.
        FaceCase{"pentagonsStayPlain",
                 {{4, 3, 2, 1, 0}, {0, 1, 2, 3, 4}},
                 {5},
                 {4, 3, 2, 1, 0, 0, 1, 2, 3, 4}},
        FaceCase{"pointsStayPlain", {{2}, {0}, {1}}, {1}, {2, 0, 1}}),
    [](const auto& info) { return info.param.label; });

// ---- Texture coordinates and colours ----

struct UVCase {
    const char* label;
    unsigned components;
    bool twoD;
};

class UVComponents : public MeshTest, public ::testing::WithParamInterface<UVCase> {};

TEST_P(UVComponents, TwoComponentsFillUVOthersUVW) {
    aiMesh* mesh = makeLine("m", 2);
    mesh->mTextureCoords[0] = new aiVector3D[2]{{0.25f, 0.5f, 0.75f}, {1, 2, 3}};
    mesh->mNumUVComponents[0] = GetParam().components;
    begin(makeScene({mesh}));
    auto answer = convert(0);
    const base::AttribMap* set = item(*answer, names::uvSets, 0);
    ASSERT_NE(set, nullptr);
    EXPECT_EQ(scene::get<base::string>(*set, names::name, ""), "uvset0");
    if (GetParam().twoD) {
        EXPECT_EQ(items<base::vec2f>(*set, names::UV),
                  (std::vector<base::vec2f>{{0.25f, 0.5f}, {1, 2}}));
        EXPECT_EQ(set->findEntry(names::UVW), nullptr);
    } else {
        EXPECT_EQ(items<base::vec3f>(*set, names::UVW),
                  (std::vector<base::vec3f>{{0.25f, 0.5f, 0.75f}, {1, 2, 3}}));
        EXPECT_EQ(set->findEntry(names::UV), nullptr);
    }
}

INSTANTIATE_TEST_SUITE_P(Mesh, UVComponents,
                         ::testing::Values(UVCase{"one", 1, false}, UVCase{"two", 2, true},
                                           UVCase{"three", 3, false}),
                         [](const auto& info) { return info.param.label; });

TEST_F(MeshTest, ChannelsWithGapsFillItemsInOrderAndKeepTheirNumber) {
    aiMesh* mesh = makeLine("m", 1);
    mesh->mTextureCoords[1] = new aiVector3D[1]{{1, 1, 0}};
    mesh->mNumUVComponents[1] = 2;
    mesh->mTextureCoords[7] = new aiVector3D[1]{{7, 7, 7}};
    mesh->mNumUVComponents[7] = 3;
    mesh->mColors[5] = new aiColor4D[1]{{1, 0.5f, 0, 0.25f}};
    begin(makeScene({mesh}));
    auto answer = convert(0);

    const auto* uvSets = answer->findEntry(names::uvSets);
    ASSERT_NE(uvSets, nullptr);
    EXPECT_EQ(uvSets->size(), 2u);
    const base::AttribMap* first = item(*answer, names::uvSets, 0);
    const base::AttribMap* second = item(*answer, names::uvSets, 1);
    ASSERT_TRUE(first && second);
    EXPECT_EQ(scene::get<base::string>(*first, names::name, ""), "uvset1");
    EXPECT_EQ(items<base::vec2f>(*first, names::UV), (std::vector<base::vec2f>{{1, 1}}));
    EXPECT_EQ(scene::get<base::string>(*second, names::name, ""), "uvset7");
    EXPECT_EQ(items<base::vec3f>(*second, names::UVW), (std::vector<base::vec3f>{{7, 7, 7}}));

    EXPECT_EQ(answer->findEntry(names::colorSets)->size(), 1u);
    const base::AttribMap* colours = item(*answer, names::colorSets, 0);
    ASSERT_NE(colours, nullptr);
    EXPECT_EQ(items<base::vec3f>(*colours, names::RGB), (std::vector<base::vec3f>{{1, 0.5f, 0}}));
    EXPECT_EQ(mesh->mTextureCoords[7], nullptr);
    EXPECT_EQ(mesh->mColors[5], nullptr);
}

// ---- Shared arrays ----

TEST_F(MeshTest, RepeatedArraysBecomeLinksToTheFirst) {
    begin(makeScene({makeMesh("a", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}}),
                     makeMesh("b", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}}),
                     makeMesh("c", {{5, 5, 5}, {6, 6, 6}}, {}),
                     makeMesh("d", {{5, 5, 5}, {6, 6, 6}}, {})}));
    auto a = convert(0);
    auto b = convert(1);
    auto c = convert(2);
    auto d = convert(3);

    const base::Attribute* positions = b->findEntry(names::positions);
    ASSERT_NE(positions, nullptr);
    ASSERT_NE(const_cast<base::Attribute*>(positions)->asLink(), nullptr);
    auto* link = const_cast<base::Attribute*>(positions)->asLink();
    EXPECT_EQ(link->resolve(), a->findEntry(names::positions));
    EXPECT_EQ(link->path().root(), a.get());
    // The index list is shared as well; reading through the link sees the values.
    EXPECT_NE(const_cast<base::Attribute*>(b->findEntry(names::indices))->asLink(), nullptr);
    const auto* read = b->findVecAttribute<base::vec3f>(names::positions);
    ASSERT_NE(read, nullptr);
    EXPECT_EQ(read->size(), 3u);

    // Two items are never pooled.
    EXPECT_EQ(const_cast<base::Attribute*>(d->findEntry(names::positions))->asLink(), nullptr);
    EXPECT_EQ(const_cast<base::Attribute*>(c->findEntry(names::positions))->asLink(), nullptr);
}

// Through the driver: one importer object importing the same file twice into
// one factory. Without the pool emptied per import, the second mesh would link
// into the first import's mesh.
TEST(MeshImport, SecondImportNeverLinksIntoTheFirst) {
    const std::string path = (std::filesystem::path(testing::TempDir()) /
                              ("as_mesh_" + std::to_string(::getpid()) + ".obj"))
                                 .string();
    std::ofstream(path) << "v 0 0 0\nv 1 0 0\nv 1 1 0\nv 0 1 0\nf 1 2 3\nf 1 3 4\n";
    base::CaptureLog captured;
    base::ScopedLog scoped(captured);
    base::ref<base::PluginFactory> factory(new base::PluginFactory("import"));
    scene::register_scene_schema(*factory);
    loadScenePlugin(*factory);
    base::ref<base::IPlugin> importer = factory->create("AssimpImporter", 0);
    ASSERT_TRUE(importer);
    auto* run = scene::query<scene::ISceneImporter>(*importer);
    ASSERT_TRUE(run->import(*factory, base::string(path.c_str())));
    ASSERT_TRUE(run->import(*factory, base::string(path.c_str())));
    std::remove(path.c_str());

    std::vector<base::IPlugin*> meshes;
    for (std::uint32_t id = 0; id < factory->pluginCount(); ++id)
        if (auto object = factory->plugin(id); object && object->className() == names::mesh)
            meshes.push_back(object.get());
    ASSERT_EQ(meshes.size(), 2u);
    for (base::IPlugin* mesh : meshes) {
        base::Attribute* positions =
            const_cast<base::Attribute*>(mesh->findEntry(names::positions));
        ASSERT_NE(positions, nullptr);
        EXPECT_EQ(positions->asLink(), nullptr);
        EXPECT_GE(positions->size(), 3u);
    }
}

} // namespace
} // namespace as::meshtest

// Mesh conversion: streams, faces, channels, naming, the once-per-mesh rule and
// the shared-array pool.
#include "as_mesh_fixture.h"

#include <limits>

namespace as::meshtest {
namespace {

TEST_F(MeshTest, SharedMeshIsConvertedOnceAfterTheChildrenAndReleasesItsSource) {
    aiMesh* mesh =
        makeMesh("quad", {{0, 0, 0}, {1, 0, 0}, {1, 1, 0}, {0, 1, 0}}, {{0, 1, 2}, {0, 2, 3}});
    mesh->mNormals = new aiVector3D[4];
    mesh->mColors[0] = new aiColor4D[4];
    mesh->mTextureCoords[0] = new aiVector3D[4];
    mesh->mNumUVComponents[0] = 2;
    aiNode* left = withChildren("left", {new aiNode("leaf")});
    aiNode* right = new aiNode("right");
    for (aiNode* node : {left, right}) {
        node->mNumMeshes = 1;
        node->mMeshes = new unsigned[1]{0};
    }
    aiScene* scene = makeScene({mesh});
    scene->mRootNode = withChildren("root", {left, right});
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
    EXPECT_EQ(leftChildren[1]->name(), "quad");
    EXPECT_EQ(leftChildren[1].get(), rightChildren[0].get());
    EXPECT_EQ(convert(0).get(), rightChildren[0].get());
    EXPECT_EQ(objectsOf(*factory, names::mesh).size(), 1u);

    for (const void* released :
         {(const void*)mesh->mVertices, (const void*)mesh->mNormals, (const void*)mesh->mFaces,
          (const void*)mesh->mColors[0], (const void*)mesh->mTextureCoords[0]})
        EXPECT_EQ(released, nullptr);
    EXPECT_EQ(mesh->mNumFaces, 0u);
    // The vertex count stays: it still describes the converted streams.
    EXPECT_EQ(mesh->mNumVertices, 4u);
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
    Faces faces;
    // One value: a single "vcounts"; several: the per-face array.
    std::vector<std::uint16_t> vcounts;
    // As stored, after the face reordering and differences.
    std::vector<std::uint32_t> indices;
};

class FaceSizes : public MeshTest, public ::testing::WithParamInterface<FaceCase> {};

TEST_P(FaceSizes, SizesAndIndicesAreStoredAsTheReaderExpects) {
    const FaceCase& c = GetParam();
    aiMesh* mesh = makeLine("m", 12);
    setFaces(*mesh, c.faces);
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
    Mesh, FaceSizes,
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

// Two components fill "UV", others "UVW"; channels with gaps fill the items in
// order and keep their number in the name; colours drop alpha.
TEST_F(MeshTest, TextureCoordinateAndColourChannels) {
    aiMesh* mesh = makeLine("m", 2);
    const unsigned channels[] = {1, 3, 7}, components[] = {2, 1, 3};
    for (unsigned c = 0; c < 3; ++c) {
        mesh->mTextureCoords[channels[c]] = new aiVector3D[2]{{0.25f, 0.5f, 0.75f}, {1, 2, 3}};
        mesh->mNumUVComponents[channels[c]] = components[c];
    }
    mesh->mColors[5] = new aiColor4D[2]{{1, 0.5f, 0, 0.25f}, {0, 0, 1, 1}};
    begin(makeScene({mesh}));
    auto answer = convert(0);

    ASSERT_NE(answer->findEntry(names::uvSets), nullptr);
    EXPECT_EQ(answer->findEntry(names::uvSets)->size(), 3u);
    for (unsigned c = 0; c < 3; ++c) {
        SCOPED_TRACE(channels[c]);
        const base::AttribMap* set = item(*answer, names::uvSets, c);
        ASSERT_NE(set, nullptr);
        EXPECT_EQ(scene::get<base::string>(*set, names::name, ""),
                  base::string("uvset") + char('0' + channels[c]));
        const bool twoD = components[c] == 2;
        EXPECT_EQ(items<base::vec2f>(*set, names::UV),
                  twoD ? (std::vector<base::vec2f>{{0.25f, 0.5f}, {1, 2}})
                       : std::vector<base::vec2f>{});
        EXPECT_EQ(items<base::vec3f>(*set, names::UVW),
                  twoD ? std::vector<base::vec3f>{}
                       : (std::vector<base::vec3f>{{0.25f, 0.5f, 0.75f}, {1, 2, 3}}));
        EXPECT_EQ(set->findEntry(twoD ? names::UVW : names::UV), nullptr);
        EXPECT_EQ(mesh->mTextureCoords[channels[c]], nullptr);
    }
    EXPECT_EQ(answer->findEntry(names::colorSets)->size(), 1u);
    const base::AttribMap* colours = item(*answer, names::colorSets, 0);
    ASSERT_NE(colours, nullptr);
    EXPECT_EQ(items<base::vec3f>(*colours, names::RGB),
              (std::vector<base::vec3f>{{1, 0.5f, 0}, {0, 0, 1}}));
    EXPECT_EQ(mesh->mColors[5], nullptr);
}

// ---- Shared arrays ----

base::AttribLink* linkOf(const base::IPlugin& object, base::name_id name) {
    auto* entry = const_cast<base::Attribute*>(object.findEntry(name));
    return entry ? entry->asLink() : nullptr;
}

TEST_F(MeshTest, RepeatedArraysBecomeLinksToTheFirst) {
    begin(
        makeScene({makeMesh("a", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}}),
                   makeMesh("b", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}}, {{0, 1, 2}}),
                   makeMesh("c", {{5, 5, 5}, {6, 6, 6}}), makeMesh("d", {{5, 5, 5}, {6, 6, 6}})}));
    auto a = convert(0);
    auto b = convert(1);
    auto c = convert(2);
    auto d = convert(3);

    auto* link = linkOf(*b, names::positions);
    ASSERT_NE(link, nullptr);
    EXPECT_EQ(link->resolve(), a->findEntry(names::positions));
    EXPECT_EQ(link->path().root(), a.get());
    // The index list is shared as well; reading through the link sees the values.
    EXPECT_NE(linkOf(*b, names::indices), nullptr);
    const auto* read = b->findVecAttribute<base::vec3f>(names::positions);
    ASSERT_NE(read, nullptr);
    EXPECT_EQ(read->size(), 3u);

    // Two items are never pooled.
    EXPECT_NE(c->findEntry(names::positions), nullptr);
    EXPECT_EQ(linkOf(*c, names::positions), nullptr);
    EXPECT_EQ(linkOf(*d, names::positions), nullptr);
}

} // namespace
} // namespace as::meshtest

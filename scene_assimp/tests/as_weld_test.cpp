// Vertex welding: which records merge, how faces and bone weights follow,
// and a mesh of 16M vertices.
#include "as_mesh_fixture.h"
#include "as_weld.h"

#include <assimp/Importer.hpp>
#include <assimp/postprocess.h>

#include <cmath>
#include <filesystem>
#include <functional>
#include <limits>
#include <memory>

namespace as::meshtest {
namespace {

constexpr float nan = std::numeric_limits<float>::quiet_NaN();

// Vertex 3 repeats vertex 0 in every stream the welder reads: positions,
// normals, tangents, bitangents, texture-coordinate sets 0 and 7, colour sets
// 0 and 7, a morph target, and the weights of two bones.
std::unique_ptr<aiMesh> recordMesh() {
    std::unique_ptr<aiMesh> mesh(
        makeMesh("m", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {0, 0, 0}}, {{0, 1, 2}, {3, 2, 1}}));
    auto vectors = [](float offset) {
        auto* values = new aiVector3D[4];
        for (unsigned v = 0; v < 4; ++v)
            values[v] = aiVector3D(offset + float(v % 3), offset, -offset);
        return values;
    };
    mesh->mNormals = vectors(0.25f);
    mesh->mTangents = vectors(0.5f);
    mesh->mBitangents = vectors(0.75f);
    for (unsigned i : {0u, 7u}) {
        mesh->mTextureCoords[i] = vectors(float(i));
        mesh->mNumUVComponents[i] = 2;
        mesh->mColors[i] = new aiColor4D[4];
        for (unsigned v = 0; v < 4; ++v)
            mesh->mColors[i][v] = aiColor4D(float(v % 3), 0.5f, float(i), 1);
    }
    auto* target = new aiAnimMesh;
    target->mNumVertices = 4;
    target->mVertices = vectors(2);
    mesh->mAnimMeshes = new aiAnimMesh* [1] { target };
    mesh->mNumAnimMeshes = 1;
    addBone(*mesh, "a", {{0, 0.25f}, {1, 1}, {3, 0.25f}});
    addBone(*mesh, "b", {{3, 0.75f}, {0, 0.75f}, {2, 1}});
    return mesh;
}

struct RecordCase {
    const char* label;
    std::function<void(aiMesh&)> change; // applied to vertex 3
    bool merges;
};

class WeldRecord : public testing::TestWithParam<RecordCase> {};

TEST_P(WeldRecord, MergesOnlyTheSameRecordAndRemapsFacesAndWeights) {
    std::unique_ptr<aiMesh> mesh = recordMesh();
    GetParam().change(*mesh);
    const std::uint32_t kept = weldMesh(*mesh);

    const std::vector<std::vector<unsigned>> faces = {
        {mesh->mFaces[0].mIndices[0], mesh->mFaces[0].mIndices[1], mesh->mFaces[0].mIndices[2]},
        {mesh->mFaces[1].mIndices[0], mesh->mFaces[1].mIndices[1], mesh->mFaces[1].mIndices[2]}};
    if (GetParam().merges) {
        EXPECT_EQ(kept, 3u);
        EXPECT_EQ(faces, (std::vector<std::vector<unsigned>>{{0, 1, 2}, {0, 2, 1}}));
        // The repeat's weights go with it; every other weight stays.
        EXPECT_EQ(mesh->mBones[0]->mNumWeights, 2u);
        EXPECT_EQ(mesh->mBones[1]->mNumWeights, 2u);
    } else {
        EXPECT_EQ(kept, 4u);
        EXPECT_EQ(faces, (std::vector<std::vector<unsigned>>{{0, 1, 2}, {3, 2, 1}}));
        EXPECT_EQ(mesh->mBones[0]->mNumWeights, 3u);
    }
    EXPECT_EQ(mesh->mNumVertices, kept);
    EXPECT_EQ(mesh->mAnimMeshes[0]->mNumVertices, kept);
    // The kept vertices keep their order and values.
    EXPECT_EQ(mesh->mVertices[2], aiVector3D(0, 1, 0));
    EXPECT_EQ(mesh->mColors[7][2], aiColor4D(2, 0.5f, 7, 1));
}

INSTANTIATE_TEST_SUITE_P(
    Weld, WeldRecord,
    testing::Values(
        RecordCase{"Identical", [](aiMesh&) {}, true},
        RecordCase{"WithinTheTolerance",
                   [](aiMesh& m) {
                       m.mNormals[3].y -= 2e-6f;
                       m.mTextureCoords[7][3].x += 5e-6f;
                       m.mBones[1]->mWeights[0].mWeight += 1e-6f;
                   },
                   true},
        RecordCase{"MinusZero", [](aiMesh& m) { m.mVertices[3].y = -0.0f; }, true},
        // Positions are compared exactly.
        RecordCase{"Position", [](aiMesh& m) { m.mVertices[3].z = 1e-7f; }, false},
        RecordCase{"Normal", [](aiMesh& m) { m.mNormals[3].z = 1; }, false},
        RecordCase{"Tangent", [](aiMesh& m) { m.mTangents[3].x = 0; }, false},
        RecordCase{"Bitangent", [](aiMesh& m) { m.mBitangents[3].y = 0; }, false},
        RecordCase{"LastUVSet", [](aiMesh& m) { m.mTextureCoords[7][3].y += 0.001f; }, false},
        // A component the conversion does not write still belongs to the record.
        RecordCase{"ThirdComponentOfATwoComponentSet",
                   [](aiMesh& m) { m.mTextureCoords[0][3].z = 1; }, false},
        RecordCase{"LastColourSetAlpha", [](aiMesh& m) { m.mColors[7][3].a = 0; }, false},
        RecordCase{"MorphTarget", [](aiMesh& m) { m.mAnimMeshes[0]->mVertices[3].x = 9; }, false},
        RecordCase{"BoneWeight", [](aiMesh& m) { m.mBones[1]->mWeights[0].mWeight = 0.5f; }, false},
        RecordCase{"MissingInfluence", [](aiMesh& m) { m.mBones[0]->mWeights[2].mVertexId = 2; },
                   false},
        RecordCase{"NaNInBoth", [](aiMesh& m) { m.mNormals[0].x = m.mNormals[3].x = nan; }, false},
        RecordCase{"NaNWeightInBoth",
                   [](aiMesh& m) {
                       m.mBones[1]->mWeights[0].mWeight = m.mBones[1]->mWeights[1].mWeight = nan;
                   },
                   false}),
    [](const testing::TestParamInfo<RecordCase>& info) { return info.param.label; });

TEST(Weld, FacesOfEverySizeFollowTheirVerticesAndUnusedVerticesGo) {
    // 3, 4 and 6 repeat 0, 1 and 2; 5 is used by no face; index 99 is out of range.
    std::unique_ptr<aiMesh> mesh(
        makeMesh("m", {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {0, 0, 0}, {1, 0, 0}, {5, 5, 5}, {0, 1, 0}},
                 {{3}, {4, 3}, {0, 4, 6}, {6, 3, 4, 1}, {6, 3, 4, 1, 0}, {99, 3, 1}}));
    addBone(*mesh, "a", {{5, 1}, {4, 0.5f}, {1, 0.5f}, {42, 1}});
    EXPECT_EQ(weldMesh(*mesh), 3u);

    std::vector<std::vector<unsigned>> faces;
    for (unsigned f = 0; f < mesh->mNumFaces; ++f)
        faces.emplace_back(mesh->mFaces[f].mIndices,
                           mesh->mFaces[f].mIndices + mesh->mFaces[f].mNumIndices);
    EXPECT_EQ(faces, (std::vector<std::vector<unsigned>>{
                         {0}, {1, 0}, {0, 1, 2}, {2, 0, 1, 1}, {2, 0, 1, 1, 0}, {99, 0, 1}}));
    // The unused vertex's weight goes; a weight past the vertices stays for
    // the skin construction to report.
    const aiBone& bone = *mesh->mBones[0];
    ASSERT_EQ(bone.mNumWeights, 2u);
    EXPECT_EQ(bone.mWeights[0].mVertexId, 1u);
    EXPECT_EQ(bone.mWeights[1].mVertexId, 42u);
}

TEST(Weld, MeshesItCannotWeldAreLeftAlone) {
    // Without faces nothing says which vertices belong together.
    std::unique_ptr<aiMesh> points(makeMesh("p", {{0, 0, 0}, {0, 0, 0}}));
    EXPECT_EQ(weldMesh(*points), 2u);
    // A morph target of another size cannot follow the remap.
    std::unique_ptr<aiMesh> morphed(makeMesh("m", {{0, 0, 0}, {0, 0, 0}}, {{0, 1, 0}}));
    auto* target = new aiAnimMesh;
    target->mNumVertices = 1;
    target->mVertices = new aiVector3D[1];
    morphed->mAnimMeshes = new aiAnimMesh* [1] { target };
    morphed->mNumAnimMeshes = 1;
    EXPECT_EQ(weldMesh(*morphed), 2u);
    EXPECT_EQ(morphed->mFaces[0].mIndices[1], 1u);
    // Every vertex NaN: nothing merges, nothing breaks.
    std::unique_ptr<aiMesh> broken(makeMesh("n", {{nan, 0, 0}, {nan, 0, 0}}, {{0, 1, 1}}));
    EXPECT_EQ(weldMesh(*broken), 2u);
}

TEST(Weld, AVertexCloseToTwoRecordsJoinsTheEarlierOne) {
    // One position; normals 0, 1.8e-5 (apart from the first) and 9e-6 (within
    // the tolerance of both).
    std::vector<float> positions(9, 1.0f);
    std::vector<float> normals = {0, 0, 1, 1.8e-5f, 0, 1, 9e-6f, 0, 1};
    const WeldStream streams[] = {{positions.data(), 3, 3}, {normals.data(), 3, 3}};
    std::vector<std::uint32_t> remap(3, 0);
    EXPECT_EQ(findDistinctVertices(streams, {}, 3, remap.data()), 2u);
    EXPECT_EQ(remap, (std::vector<std::uint32_t>{0, 1, 0 | weldRepeat}));
}

TEST(Weld, SixteenMillionVerticesInOnePass) {
    // Two copies of 8M distinct positions; the copy's vertices merge into the
    // first. Indices beyond 2^24 catch any narrowing through floats.
    constexpr std::uint32_t half = 1u << 23, count = 2 * half;
    std::vector<float> positions(std::size_t(count) * 3);
    for (std::uint32_t v = 0; v < count; ++v) {
        const std::uint32_t i = v % half;
        positions[3 * std::size_t(v)] = float(i & 4095);
        positions[3 * std::size_t(v) + 1] = float(i >> 12) * 0.25f;
        positions[3 * std::size_t(v) + 2] = float(i % 7) * 1e-3f;
    }
    std::vector<std::uint32_t> remap(count, 0);
    remap[half - 1] = weldUnused;
    const WeldStream stream{positions.data(), 3, 3};
    ASSERT_EQ(findDistinctVertices({&stream, 1}, {}, count, remap.data()), half);

    std::uint32_t wrong = 0;
    for (std::uint32_t v = 0; v < half - 1; ++v)
        wrong += remap[v] != v || remap[half + v] != (v | weldRepeat);
    EXPECT_EQ(wrong, 0u);
    // The unused vertex's record is taken by its copy, kept last.
    EXPECT_EQ(remap[half - 1], weldUnused);
    EXPECT_EQ(remap[count - 1], half - 1);

    compactStream(stream, remap);
    EXPECT_EQ(positions[3 * std::size_t(half - 1)], float((half - 1) & 4095));
    EXPECT_EQ(positions[3 * std::size_t(half - 1) + 1], float((half - 1) >> 12) * 0.25f);
}

// assimp generates smooth normals across positions, before its own join
// would run, so welding an unjoined read must give the vertices of its joined
// read exactly, generated normals included, in the same order.
TEST(Weld, GivesAssimpsJoinedVerticesOnModelsWithoutNormals) {
    const std::filesystem::path corpus = SCENE_CORPUS_DIR;
    if (!std::filesystem::is_directory(corpus))
        GTEST_SKIP() << corpus << " is missing";
    constexpr unsigned smooth = aiProcess_GenSmoothNormals | aiProcess_FindInstances;
    for (const char* file : {"AC/SphereWithLight.ac", "COB/dwarf.cob", "DXF/PinkEggFromLW.dxf",
                             "OFF/Wuson.off", "OBJ/regr01.obj", "X3D/HelloX3dTrademark.x3d"}) {
        SCOPED_TRACE(file);
        Assimp::Importer plainImporter, joinedImporter;
        const std::string path = (corpus / file).string();
        const aiScene* plain = plainImporter.ReadFile(path, smooth);
        const aiScene* joined =
            joinedImporter.ReadFile(path, smooth | aiProcess_JoinIdenticalVertices);
        ASSERT_TRUE(plain && joined);
        ASSERT_EQ(plain->mNumMeshes, joined->mNumMeshes);
        for (unsigned m = 0; m < plain->mNumMeshes; ++m) {
            aiMesh& ours = *plain->mMeshes[m];
            const aiMesh& theirs = *joined->mMeshes[m];
            ASSERT_EQ(weldMesh(ours), theirs.mNumVertices);
            ASSERT_TRUE(ours.mNormals && theirs.mNormals);
            unsigned differing = 0;
            for (unsigned v = 0; v < ours.mNumVertices; ++v)
                differing += !(ours.mVertices[v] == theirs.mVertices[v]) ||
                             !(ours.mNormals[v] == theirs.mNormals[v]);
            EXPECT_EQ(differing, 0u) << "mesh " << m;
        }
    }
}

TEST_F(MeshTest, TheConversionWeldsBeforeItCopies) {
    aiMesh* mesh =
        makeMesh("quad", {{0, 0, 0}, {1, 0, 0}, {1, 1, 0}, {0, 0, 0}, {1, 1, 0}, {0, 1, 0}},
                 {{0, 1, 2}, {3, 4, 5}});
    addBone(*mesh, "j", {{0, 1}, {3, 1}, {5, 0.5f}});
    begin(makeScene({mesh}));
    const base::IPlugin* converted = meshOf(convert(0));
    ASSERT_NE(converted, nullptr);
    EXPECT_EQ(items<base::vec3f>(*converted, names::positions).size(), 4u);
    EXPECT_EQ(items<std::uint32_t>(*converted, names::indices).size(), 6u);
    const base::AttribMap* joints = item(*converted, names::jointsSets, 0);
    ASSERT_NE(joints, nullptr);
    EXPECT_EQ(items<std::uint8_t>(*joints, names::jointCounts),
              (std::vector<std::uint8_t>{1, 0, 0, 1}));
}

} // namespace
} // namespace as::meshtest

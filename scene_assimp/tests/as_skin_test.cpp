// Skin construction and joint resolution.
#include "as_mesh_fixture.h"

#include <cfloat>

namespace as::meshtest {
namespace {

const base::AttribMap& jointsSet(const base::ref<scene::IGeometry>& answer) {
    const base::AttribMap* set = item(*MeshTest::meshOf(answer)->asMap(), names::jointsSets, 0);
    EXPECT_NE(set, nullptr);
    static const base::AttribMap empty;
    return set ? *set : empty;
}

TEST_F(MeshTest, InfluencesAreSortedPerVertexHeaviestFirst) {
    aiMesh* mesh = makeMesh("m", {{1, 2, 3}, {-1, 5, 0}, {9, 9, 9}});
    // A pure translation and a turn keep their rows and translation.
    aiMatrix4x4::Translation(aiVector3D(2, 3, 4),
                             addBone(*mesh, "b0", {{0, 0.25f}, {1, 1.0f}})->mOffsetMatrix);
    addBone(*mesh, "b1", {{0, 0.75f}})->mOffsetMatrix =
        aiMatrix4x4(0, -1, 0, 5, 1, 0, 0, 6, 0, 0, 1, 7, 9, 9, 9, 9);
    addBone(*mesh, "unused", {});
    begin(makeScene({mesh}));
    auto answer = convert(0);
    ASSERT_TRUE(answer);

    auto* skin = dynamic_cast<scene::ISkin*>(answer.get());
    ASSERT_NE(skin, nullptr);
    EXPECT_EQ(skin->name(), "m.skin");
    base::IPlugin* base = meshOf(answer);
    ASSERT_NE(base, nullptr);
    EXPECT_EQ(base->name(), "m");

    const base::AttribMap& set = jointsSet(answer);
    EXPECT_EQ(scene::get<base::string>(set, names::name, ""), "defaultJointWeights");
    EXPECT_EQ(items<std::uint16_t>(set, names::indices), (std::vector<std::uint16_t>{1, 0, 0}));
    EXPECT_EQ(items<float>(set, names::weights), (std::vector<float>{0.75f, 0.25f, 1.0f}));
    // Vertex 2 has no influence: a count of 0 and nothing in the lists.
    EXPECT_EQ(items<std::uint8_t>(set, names::jointCounts), (std::vector<std::uint8_t>{2, 1, 0}));
    EXPECT_EQ(scene::get<std::uint8_t>(set, names::maxVertexJoints, 0), 2);

    const auto boxes = items<base::box3f>(set, names::jointBounds);
    ASSERT_EQ(boxes.size(), 3u);
    EXPECT_EQ(boxes[0], (base::box3f{{-1, 2, 0}, {1, 5, 3}}));
    EXPECT_EQ(boxes[1], (base::box3f{{1, 2, 3}, {1, 2, 3}}));
    EXPECT_EQ(boxes[2], (base::box3f{{FLT_MAX, FLT_MAX, FLT_MAX}, {-FLT_MAX, -FLT_MAX, -FLT_MAX}}));

    const base::AttribMap* pose = item(*base, names::bindPoseSets, 0);
    ASSERT_NE(pose, nullptr);
    EXPECT_EQ(scene::get<base::string>(*pose, names::name, ""), "defaultBindPose");
    const auto transforms = items<base::mat43>(*pose, names::transforms);
    ASSERT_EQ(transforms.size(), 3u);
    EXPECT_EQ(transforms[0].m, base::mat33f::identity());
    EXPECT_EQ(transforms[0].t, (base::vec3d{2, 3, 4}));
    EXPECT_EQ(transforms[1].m, (base::mat33f::fromRows({0, -1, 0}, {1, 0, 0}, {0, 0, 1})));
    EXPECT_EQ(transforms[1].t, (base::vec3d{5, 6, 7}));
}

TEST_F(MeshTest, WeightOnMissingVertexCountsOnVertexZero) {
    aiMesh* mesh = makeLine("m", 8);
    mesh->mVertices[0] = aiVector3D(-4, 0, 0);
    addBone(*mesh, "hand", {{10, 0.5f}, {3, 0.5f}});
    begin(makeScene({mesh}));
    auto answer = convert(0);

    EXPECT_EQ(captured.count("assimp import m| Invalid vertex '10' used by joint hand!"), 1u);
    const base::AttribMap& set = jointsSet(answer);
    EXPECT_EQ(items<std::uint8_t>(set, names::jointCounts),
              (std::vector<std::uint8_t>{1, 0, 0, 1, 0, 0, 0, 0}));
    const auto boxes = items<base::box3f>(set, names::jointBounds);
    ASSERT_EQ(boxes.size(), 1u);
    EXPECT_EQ(boxes[0], (base::box3f{{-4, 0, 0}, {3, 0, 0}}));
}

struct CountCase {
    const char* label;
    unsigned influences;
    // 1: 8-bit counts, 2: 16-bit counts, 0: none written.
    int width;
};

class InfluenceCounts : public MeshTest, public ::testing::WithParamInterface<CountCase> {};

TEST_P(InfluenceCounts, CountWidthFollowsTheLargestVertex) {
    const CountCase& c = GetParam();
    aiMesh* mesh = makeLine("crowd", 2);
    // One bone per influence on vertex 1, built directly: thousands of bones.
    mesh->mNumBones = c.influences;
    mesh->mBones = new aiBone*[c.influences];
    for (unsigned b = 0; b < c.influences; ++b) {
        auto* bone = new aiBone;
        bone->mNumWeights = 1;
        bone->mWeights = new aiVertexWeight[1]{aiVertexWeight(1, 1.0f / float(b + 1))};
        mesh->mBones[b] = bone;
    }
    begin(makeScene({mesh}));
    auto answer = convert(0);
    const base::AttribMap& set = jointsSet(answer);

    const auto joints = items<std::uint16_t>(set, names::indices);
    ASSERT_EQ(joints.size(), c.influences);
    EXPECT_EQ(joints.front(), 0);
    EXPECT_EQ(joints.back(), std::uint16_t(c.influences - 1));
    const char* tooMany = "assimp import crowd| Can't support more then 65536 joints per vertex!";
    EXPECT_EQ(captured.count(tooMany), c.width == 0 ? 1u : 0u);
    auto expectCounts = [&](auto zero) {
        using Count = decltype(zero);
        EXPECT_EQ(scene::get<Count>(set, names::maxVertexJoints, 0), c.influences);
        EXPECT_EQ(items<Count>(set, names::jointCounts),
                  (std::vector<Count>{0, Count(c.influences)}));
    };
    if (c.width == 1)
        expectCounts(std::uint8_t(0));
    else if (c.width == 2)
        expectCounts(std::uint16_t(0));
    else
        EXPECT_TRUE(!set.findEntry(names::jointCounts) && !set.findEntry(names::maxVertexJoints));
}

INSTANTIATE_TEST_SUITE_P(Skin, InfluenceCounts,
                         ::testing::Values(CountCase{"max8bit", 254, 1},
                                           CountCase{"min16bit", 255, 2},
                                           CountCase{"max16bit", 65534, 2},
                                           CountCase{"tooMany", 65535, 0}),
                         [](const auto& info) { return info.param.label; });

TEST_F(MeshTest, SkinNameFollowsTheUniqueMeshNameAndBonesNeedNoPositions) {
    auto taken = factory->create(names::node, 3);
    taken->setAttribute<base::string>(names::name, "arm");
    aiMesh* mesh = makeLine("arm", 2);
    delete[] mesh->mVertices;
    mesh->mVertices = nullptr;
    addBone(*mesh, "j", {{1, 1}});
    begin(makeScene({mesh}));
    auto answer = convert(0);
    EXPECT_EQ(meshOf(answer)->name(), "arm1");
    EXPECT_EQ(answer->name(), "arm1.skin");
    const auto boxes = items<base::box3f>(jointsSet(answer), names::jointBounds);
    ASSERT_EQ(boxes.size(), 1u);
    EXPECT_EQ(boxes[0], base::box3f::empty());
}

TEST_F(MeshTest, UnresolvedJointKeepsItsPlace) {
    aiMesh* mesh = makeLine("m", 1);
    addBone(*mesh, "a", {{0, 0.5f}});
    addBone(*mesh, "b", {});
    addBone(*mesh, "c", {{0, 0.5f}});
    aiMesh* unconverted = makeLine("n", 1);
    addBone(*unconverted, "a", {});
    begin(makeScene({mesh, unconverted}));
    auto answer = convert(0);

    ImporterTestAccess::MeshNodeMap nodes;
    for (const char* name : {"a", "c", "other"}) {
        auto node = factory->create(names::node, 3);
        node->setAttribute<base::string>(names::name, name);
        nodes.emplace(name, base::ref<scene::INode>(static_cast<scene::INode*>(node.get())));
    }
    ImporterTestAccess::meshResolveJoints(*importer, *source, nodes);

    const auto joints = items<base::ref<base::IPlugin>>(*answer, names::joints);
    ASSERT_EQ(joints.size(), 3u);
    EXPECT_EQ(joints[0].get(), nodes["a"].get());
    EXPECT_EQ(joints[1].get(), nullptr);
    EXPECT_EQ(joints[2].get(), nodes["c"].get());
    EXPECT_EQ(
        captured.count("assimp import m.skin| Unable to resolve joint 'b'! No such node found."),
        1u);
    EXPECT_EQ(captured.messages().size(), 1u);

    // Resolving again replaces the list instead of growing it.
    ImporterTestAccess::meshResolveJoints(*importer, *source, nodes);
    EXPECT_EQ(items<base::ref<base::IPlugin>>(*answer, names::joints).size(), 3u);
}

} // namespace
} // namespace as::meshtest

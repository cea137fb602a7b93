// The node conversion: names, the decomposed transforms and the tree.
#include "as_mesh_fixture.h"
#include "as_node.h"

#include <array>
#include <cmath>
#include <random>

namespace as {

struct NodeTestAccess {
    static base::ref<scene::INode> importNode(AssimpImporter& importer,
                                              base::PluginFactory& factory, const aiScene* scene,
                                              const aiNode* node) {
        importer.beginImport(factory, scene);
        AssimpImporter::TextureList textures;
        return importer.importNode(scene, node, textures);
    }
};

} // namespace as

namespace {

using S = scene::node_schema;
using as::meshtest::withChildren;

struct NodeFixture : testing::Test {
    void SetUp() override {
        factory = as::meshtest::loadedFactory("nodes");
        object = factory->create("AssimpImporter", 0);
        importer = dynamic_cast<as::AssimpImporter*>(object.get());
        ASSERT_NE(importer, nullptr);
    }

    base::ref<scene::INode> convert(const aiNode* root) {
        return as::NodeTestAccess::importNode(*importer, *factory, &source, root);
    }
    base::ref<scene::INode> convertMatrix(const aiMatrix4x4& m) {
        aiNode node("n");
        node.mTransformation = m;
        return convert(&node);
    }
    static std::vector<base::ref<base::IPlugin>> children(scene::INode& node) {
        return as::meshtest::items<base::ref<base::IPlugin>>(node, S::children());
    }

    base::ref<base::PluginFactory> factory;
    base::ref<base::IPlugin> object;
    as::AssimpImporter* importer = nullptr;
    aiScene source;
};

TEST_F(NodeFixture, NamesAreMadeUniqueAndChildrenKeepOrder) {
    base::ref<base::IPlugin> earlier = factory->create(S::type(), 0);
    earlier->setAttribute(S::name(), base::string("Leg"));
    aiNode* root =
        withChildren("", {new aiNode(""), new aiNode("Arm"), new aiNode("Arm"), new aiNode("Leg")});
    base::ref<scene::INode> node = convert(root);
    ASSERT_TRUE(node);
    EXPECT_EQ(node->name(), "node");
    const auto kids = children(*node);
    ASSERT_EQ(kids.size(), 4u);
    EXPECT_EQ(kids[0]->name(), "node1");
    EXPECT_EQ(kids[1]->name(), "Arm");
    EXPECT_EQ(kids[2]->name(), "Arm1");
    EXPECT_EQ(kids[3]->name(), "Leg1");

    // The first holder of a name keeps it in the name-to-node map, including
    // nodes made before the import.
    auto byName = as::nodesByName(*factory);
    EXPECT_EQ(byName.at("Arm").get(), kids[1].get());
    EXPECT_EQ(byName.at("Arm1").get(), kids[2].get());
    EXPECT_EQ(byName.at("Leg").get(), earlier.get());
    EXPECT_EQ(byName.at("Leg1").get(), kids[3].get());
    delete root;
}

TEST_F(NodeFixture, NodeReachedTwiceYieldsOneObject) {
    aiNode* root = new aiNode("root");
    aiNode* shared = new aiNode("shared");
    root->mNumChildren = 2;
    root->mChildren = new aiNode* [2] { shared, shared };
    base::ref<scene::INode> node = convert(root);
    const auto kids = children(*node);
    ASSERT_EQ(kids.size(), 2u);
    EXPECT_EQ(kids[0].get(), kids[1].get());
    EXPECT_EQ(kids[0]->name(), "shared");
    root->mChildren[1] = nullptr;
    delete root;
}

// Identity, mirror and translation.
struct Fixed {
    const char* label;
    aiMatrix4x4 matrix;
    base::vec3d translate;
    base::quatf rotate;
    base::vec3f scale;
};

TEST_F(NodeFixture, FixedMatrices) {
    const float x = 0.1f, y = -123456.789f;
    const Fixed rows[] = {
        {"identity", aiMatrix4x4(), {0, 0, 0}, {1, 0, 0, 0}, {1, 1, 1}},
        {"mirror",
         aiMatrix4x4(-1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1),
         {0, 0, 0},
         {0, 1, 0, 0},
         {-1, -1, -1}},
        // Stored as the doubles of the source floats, not rounded again.
        {"translation",
         aiMatrix4x4(1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, 3, 0, 0, 0, 1),
         {double(x), double(y), 3},
         {1, 0, 0, 0},
         {1, 1, 1}},
    };
    for (const Fixed& row : rows) {
        SCOPED_TRACE(row.label);
        base::ref<scene::INode> node = convertMatrix(row.matrix);
        EXPECT_EQ(scene::get(*node, S::translate(), base::vec3d{9, 9, 9}), row.translate);
        const base::quatf q = scene::get(*node, S::rotate(), base::quatf{9, 9, 9, 9});
        for (auto part : {&base::quatf::w, &base::quatf::x, &base::quatf::y, &base::quatf::z})
            EXPECT_FLOAT_EQ(q.*part, row.rotate.*part);
        EXPECT_EQ(scene::get(*node, S::scale(), base::vec3f{9, 9, 9}), row.scale);
        EXPECT_EQ(node->findEntry(S::shear()), nullptr);
    }
}

TEST_F(NodeFixture, RandomMatricesRoundTrip) {
    std::mt19937 random(1234);
    std::uniform_real_distribution<float> element(-2, 2);
    int mirrored = 0, sheared = 0;
    for (int i = 0; i < 300; ++i) {
        aiMatrix4x4 m;
        for (unsigned row = 0; row < 3; ++row)
            for (unsigned column = 0; column < 4; ++column)
                m[row][column] = element(random);
        const float det = m.a1 * (m.b2 * m.c3 - m.b3 * m.c2) - m.a2 * (m.b1 * m.c3 - m.b3 * m.c1) +
                          m.a3 * (m.b1 * m.c2 - m.b2 * m.c1);
        // Nearly singular matrices amplify float rounding beyond any fixed bound.
        if (std::fabs(det) < 0.25f)
            continue;
        mirrored += det < 0;
        base::ref<scene::INode> node = convertMatrix(m);
        sheared += node->findEntry(S::shear()) != nullptr;
        // The node's own composition of what it holds.
        const base::mat43 back = node->localTransformation();
        const double t[] = {back.t.x, back.t.y, back.t.z};
        for (unsigned row = 0; row < 3; ++row)
            for (unsigned column = 0; column < 4; ++column)
                ASSERT_NEAR(column < 3 ? back.m.m[row][column] : t[row], m[row][column], 1e-5)
                    << "matrix " << i << " element " << row << "," << column;
    }
    EXPECT_GT(mirrored, 20);
    EXPECT_GT(sheared, 20);
}

// A degenerate axis writes a finite shear and is reported at debug level only;
// a sound decomposition with shear reports nothing.
TEST_F(NodeFixture, DecompositionErrorsAreReportedAtDebugLevel) {
    // The second axis repeats the first: its scale is 0.
    const aiMatrix4x4 degenerate(1, 1, 0, 0, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1);
    aiMatrix4x4 sheared;
    aiMatrix4x4::RotationX(0.7f, sheared);
    sheared.a2 = 0.5f;
    sheared.c4 = 2;
    for (const aiMatrix4x4* m : std::array<const aiMatrix4x4*, 2>{&degenerate, &sheared}) {
        for (int level : {base::logWarning, base::logDebug}) {
            SCOPED_TRACE(testing::Message() << (m == &degenerate) << " " << level);
            base::CaptureLog capture;
            capture.setMaxLevel(level);
            base::ScopedLog scoped(capture);
            base::ref<scene::INode> node = convertMatrix(*m);
            const base::vec3f h = scene::get(*node, S::shear(), base::vec3f{0, 0, 0});
            EXPECT_TRUE(std::isfinite(h.x) && std::isfinite(h.y) && std::isfinite(h.z));
            const auto entries = capture.entries();
            if (level < base::logDebug || m != &degenerate) {
                EXPECT_TRUE(entries.empty());
                continue;
            }
            EXPECT_EQ(scene::get(*node, S::scale(), base::vec3f{9, 9, 9}).y, 0.f);
            ASSERT_EQ(entries.size(), 1u);
            EXPECT_EQ(entries[0].channel, base::logAll);
            EXPECT_EQ(entries[0].level, base::logDebug);
            EXPECT_EQ(capture.count("assimp import " + node->name() +
                                    "| Matrix decomposition error detected of magnitude "
                                    "1.0000000000!"),
                      1u);
        }
    }
}

} // namespace

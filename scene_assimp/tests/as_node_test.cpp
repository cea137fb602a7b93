// The node conversion: names, the decomposed transforms and the tree.
#include "as_importer.h"
#include "as_node.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include <assimp/scene.h>
#include <gtest/gtest.h>

#include <cmath>
#include <random>

extern "C" std::int32_t loadScenePlugin(base::PluginFactory& factory);

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

struct NodeFixture : testing::Test {
    void SetUp() override {
        factory = new base::PluginFactory("nodes");
        scene::register_scene_schema(*factory);
        loadScenePlugin(*factory);
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
    static std::string nameOf(const base::IPlugin* node) {
        const base::string* name = node->findAttribute<base::string>(S::name());
        return name ? std::string(name->data(), name->size()) : "";
    }
    static const base::vector<base::ref<base::IPlugin>>& children(scene::INode& node) {
        static const base::vector<base::ref<base::IPlugin>> none;
        const auto* items = node.findVecAttribute<base::ref<base::IPlugin>>(S::children());
        return items ? *items : none;
    }

    base::ref<base::PluginFactory> factory;
    base::ref<base::IPlugin> object;
    as::AssimpImporter* importer = nullptr;
    aiScene source;
};

aiNode* withChildren(const char* name, std::initializer_list<aiNode*> kids) {
    auto* node = new aiNode(name);
    std::vector<aiNode*> list(kids);
    node->addChildren(unsigned(list.size()), list.data());
    return node;
}

TEST_F(NodeFixture, NamesAreMadeUniqueAndChildrenKeepOrder) {
    aiNode* root = withChildren("", {new aiNode(""), new aiNode("Arm"), new aiNode("Arm")});
    base::ref<scene::INode> node = convert(root);
    ASSERT_TRUE(node);
    EXPECT_EQ(nameOf(node.get()), "node");
    const auto& kids = children(*node);
    ASSERT_EQ(kids.size(), 3u);
    EXPECT_EQ(nameOf(kids[0].get()), "node1");
    EXPECT_EQ(nameOf(kids[1].get()), "Arm");
    EXPECT_EQ(nameOf(kids[2].get()), "Arm1");

    // The first Arm keeps the name in the name-to-node map.
    auto byName = as::nodesByName(*factory);
    ASSERT_TRUE(byName.count("Arm1"));
    EXPECT_EQ(byName.at("Arm").get(), kids[1].get());
    delete root;
}

TEST_F(NodeFixture, NameMapIncludesNodesMadeBeforeTheImport) {
    base::ref<base::IPlugin> earlier = factory->create(S::type(), 0);
    earlier->setAttribute(S::name(), base::string("Arm"));
    aiNode* root = withChildren("Arm", {});
    base::ref<scene::INode> node = convert(root);
    EXPECT_EQ(nameOf(node.get()), "Arm1");
    auto byName = as::nodesByName(*factory);
    EXPECT_EQ(byName.at("Arm").get(), earlier.get());
    EXPECT_EQ(byName.at("Arm1").get(), node.get());
    delete root;
}

TEST_F(NodeFixture, NodeReachedTwiceYieldsOneObject) {
    aiNode* root = new aiNode("root");
    aiNode* shared = new aiNode("shared");
    root->mNumChildren = 2;
    root->mChildren = new aiNode* [2] { shared, shared };
    base::ref<scene::INode> node = convert(root);
    const auto& kids = children(*node);
    ASSERT_EQ(kids.size(), 2u);
    EXPECT_EQ(kids[0].get(), kids[1].get());
    EXPECT_EQ(nameOf(kids[0].get()), "shared");
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
    aiMatrix4x4 mirror;
    mirror.a1 = -1;
    aiMatrix4x4 moved;
    moved.a4 = 0.1f;
    moved.b4 = -123456.789f;
    moved.c4 = 3;
    const Fixed rows[] = {
        {"identity", aiMatrix4x4(), {0, 0, 0}, {1, 0, 0, 0}, {1, 1, 1}},
        {"mirror", mirror, {0, 0, 0}, {0, 1, 0, 0}, {-1, -1, -1}},
        // Stored as the doubles of the source floats, not rounded again.
        {"translation", moved, {double(0.1f), double(-123456.789f), 3}, {1, 0, 0, 0}, {1, 1, 1}},
    };
    for (const Fixed& row : rows) {
        SCOPED_TRACE(row.label);
        base::ref<scene::INode> node = convertMatrix(row.matrix);
        const base::vec3d* t = node->findAttribute<base::vec3d>(S::translate());
        ASSERT_NE(t, nullptr);
        EXPECT_EQ(t->x, row.translate.x);
        EXPECT_EQ(t->y, row.translate.y);
        EXPECT_EQ(t->z, row.translate.z);
        const base::quatf q = scene::get(*node, S::rotate(), base::quatf{9, 9, 9, 9});
        EXPECT_FLOAT_EQ(q.w, row.rotate.w);
        EXPECT_FLOAT_EQ(q.x, row.rotate.x);
        EXPECT_FLOAT_EQ(q.y, row.rotate.y);
        EXPECT_FLOAT_EQ(q.z, row.rotate.z);
        const base::vec3f s = scene::get(*node, S::scale(), base::vec3f{9, 9, 9});
        EXPECT_EQ(s.x, row.scale.x);
        EXPECT_EQ(s.y, row.scale.y);
        EXPECT_EQ(s.z, row.scale.z);
        EXPECT_EQ(node->findEntry(S::shear()), nullptr);
    }
}

// The node's own composition of what it holds, back in assimp's layout.
aiMatrix4x4 composed(const scene::INode& node) {
    const base::mat43 local = node.localTransformation();
    aiMatrix4x4 out;
    for (unsigned row = 0; row < 3; ++row)
        for (unsigned column = 0; column < 3; ++column)
            out[row][column] = local.m.m[row][column];
    out.a4 = float(local.t.x);
    out.b4 = float(local.t.y);
    out.c4 = float(local.t.z);
    return out;
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
        const aiMatrix4x4 back = composed(*node);
        for (unsigned row = 0; row < 3; ++row)
            for (unsigned column = 0; column < 4; ++column)
                ASSERT_NEAR(back[row][column], m[row][column], 1e-5)
                    << "matrix " << i << " element " << row << "," << column;
    }
    EXPECT_GT(mirrored, 20);
    EXPECT_GT(sheared, 20);
}

TEST_F(NodeFixture, DegenerateAxisWritesFiniteShearAndIsReportedAtDebugLevel) {
    // The second axis repeats the first: its scale is 0.
    aiMatrix4x4 m(1, 1, 0, 0, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1);
    for (int level : {base::logWarning, base::logDebug}) {
        SCOPED_TRACE(level);
        base::CaptureLog capture;
        capture.setMaxLevel(level);
        base::ScopedLog scoped(capture);
        base::ref<scene::INode> node = convertMatrix(m);
        const base::vec3f h = scene::get(*node, S::shear(), base::vec3f{0, 0, 0});
        EXPECT_TRUE(std::isfinite(h.x) && std::isfinite(h.y) && std::isfinite(h.z));
        const base::vec3f s = scene::get(*node, S::scale(), base::vec3f{9, 9, 9});
        EXPECT_EQ(s.y, 0.f);
        const auto entries = capture.entries();
        if (level < base::logDebug) {
            EXPECT_TRUE(entries.empty());
            continue;
        }
        ASSERT_EQ(entries.size(), 1u);
        EXPECT_EQ(entries[0].channel, base::logAll);
        EXPECT_EQ(entries[0].level, base::logDebug);
        EXPECT_EQ(std::string(entries[0].message),
                  "assimp import " + nameOf(node.get()) +
                      "| Matrix decomposition error detected of magnitude "
                      "1.0000000000!");
    }
}

TEST_F(NodeFixture, SoundDecompositionLogsNothingAtDebugLevel) {
    base::CaptureLog capture;
    base::ScopedLog scoped(capture);
    aiMatrix4x4 m;
    aiMatrix4x4::RotationX(0.7f, m);
    m.a2 = 0.5f; // shear
    m.c4 = 2;
    convertMatrix(m);
    EXPECT_TRUE(capture.entries().empty());
}

} // namespace

// Animation import: clips, channels, layers and rest clips from assimp's node
// animations, the nodes they drive, bad keys, and playback of a glTF file the
// test writes.
#include "as_mesh_fixture.h"

#include "b_format.h"

#include <assimp/anim.h>

#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <limits>
#include <string>
#include <vector>

namespace as {

struct AnimationTestAccess {
    // The driver's conversion steps for a hand-made source scene.
    static void convert(AssimpImporter& importer, base::PluginFactory& factory,
                        const aiScene& scene) {
        importer.beginImport(factory, &scene);
        importer.convert(&scene, "model.test");
        importer.releaseImportState();
    }
};

namespace animtest {

namespace names = scene::names;
using base::ref, base::IPlugin, base::TimeCode;
using meshtest::items;
using meshtest::objectsOf;

constexpr std::int64_t second = TimeCode::ticksPerSecond;

struct Key {
    double time;
    float x, y, z, w = 0;
};

aiNodeAnim* channel(const char* node, std::vector<Key> positions, std::vector<Key> rotations = {},
                    std::vector<Key> scalings = {}) {
    auto* c = new aiNodeAnim;
    c->mNodeName = aiString(node);
    auto vectors = [](const std::vector<Key>& keys, aiVectorKey*& out, unsigned& count) {
        count = unsigned(keys.size());
        out = keys.empty() ? nullptr : new aiVectorKey[keys.size()];
        for (std::size_t k = 0; k < keys.size(); ++k)
            out[k] = aiVectorKey(keys[k].time, aiVector3D(keys[k].x, keys[k].y, keys[k].z));
    };
    vectors(positions, c->mPositionKeys, c->mNumPositionKeys);
    vectors(scalings, c->mScalingKeys, c->mNumScalingKeys);
    c->mNumRotationKeys = unsigned(rotations.size());
    c->mRotationKeys = rotations.empty() ? nullptr : new aiQuatKey[rotations.size()];
    for (std::size_t k = 0; k < rotations.size(); ++k)
        c->mRotationKeys[k] =
            aiQuatKey(rotations[k].time,
                      aiQuaternion(rotations[k].w, rotations[k].x, rotations[k].y, rotations[k].z));
    return c;
}

aiAnimation* animation(const char* name, double ticksPerSecond, std::vector<aiNodeAnim*> channels) {
    auto* a = new aiAnimation;
    a->mName = aiString(name);
    a->mTicksPerSecond = ticksPerSecond;
    a->mNumChannels = unsigned(channels.size());
    a->mChannels = new aiNodeAnim*[channels.size()];
    std::copy(channels.begin(), channels.end(), a->mChannels);
    return a;
}

struct Animations : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<base::PluginFactory> factory = meshtest::loadedFactory("anim");
    ref<IPlugin> importerObject = factory->create("AssimpImporter", 0);
    aiScene source;

    // Root "root" with children "Arm" (translated 1, 2, 3) and one without a name.
    Animations() {
        source.mRootNode = new aiNode("root");
        auto* arm = new aiNode("Arm");
        arm->mTransformation =
            aiMatrix4x4(aiVector3D(1, 1, 1), aiQuaternion(), aiVector3D(1, 2, 3));
        auto* unnamed = new aiNode("");
        source.mRootNode->addChildren(2, std::vector<aiNode*>{arm, unnamed}.data());
    }
    ~Animations() override { importerObject.reset(); }

    void animate(std::vector<aiAnimation*> list) {
        source.mNumAnimations = unsigned(list.size());
        source.mAnimations = new aiAnimation*[list.size()];
        std::copy(list.begin(), list.end(), source.mAnimations);
        AnimationTestAccess::convert(static_cast<AssimpImporter&>(*importerObject), *factory,
                                     source);
    }

    ref<IPlugin> named(const char* type, const char* name) {
        for (auto& object : objectsOf(*factory, base::name_id(type)))
            if (object->name() == name)
                return object;
        return {};
    }
    // The curve of a channel by name.
    const base::AttribMap* curve(const char* channelName) {
        ref<IPlugin> c = named("keyframeChannel", channelName);
        if (!c)
            return nullptr;
        const base::AttribArray* curves = c->findArray(names::curves);
        return curves && curves->size() == 1 ? curves->item(0)->asMap() : nullptr;
    }
    std::vector<std::int64_t> times(const char* channelName) {
        std::vector<std::int64_t> out;
        if (const base::AttribMap* c = curve(channelName))
            for (TimeCode t : items<TimeCode>(*c, names::times))
                out.push_back(t.ticks());
        return out;
    }
    ref<scene::INode> node(const char* name) {
        ref<IPlugin> n = named("node", name);
        return ref<scene::INode>(dynamic_cast<scene::INode*>(n.get()));
    }
    void setSceneTime(double seconds) {
        objectsOf(*factory, names::scene)[0]->setAttribute(names::time,
                                                           TimeCode::fromSeconds(seconds));
    }
};

TEST_F(Animations, ClipsLayersChannelsAndRestValues) {
    animate({animation("", 24,
                       {channel("Arm", {{0, 0, 0, 0}, {48, 24, 48, 72}}, {},
                                {{0, 1, 1, 1}, {48, 1, 1, 1}})}),
             animation("", 24, {channel("Arm", {{24, 5, 5, 5}, {72, 7, 7, 7}})})});

    // Unnamed animations count from 1; the tick rate converts key 48 to 2 s.
    ref<IPlugin> clip = named("animClip", "animClip1");
    ASSERT_TRUE(clip);
    EXPECT_TRUE(named("animLayer", "animLayer1"));
    EXPECT_TRUE(named("animLayer", "animLayer2"));
    EXPECT_EQ(times("Arm_Translate"), (std::vector<std::int64_t>{0, 92372316000}));
    EXPECT_EQ(scene::get(*clip, names::endTime, TimeCode()).ticks(), 92372316000);
    // A constant scale is one value without times.
    ASSERT_TRUE(curve("Arm_Scale"));
    EXPECT_EQ(items<base::vec3f>(*curve("Arm_Scale"), names::values),
              (std::vector<base::vec3f>{{1, 1, 1}}));
    EXPECT_FALSE(curve("Arm_Scale")->findEntry(names::times));
    // The translation values are doubles, and the rest clip keeps the old value.
    EXPECT_EQ(items<base::vec3d>(*curve("Arm_Translate"), names::values).size(), 2u);
    ASSERT_TRUE(curve("Arm_translate_off"));
    EXPECT_EQ(items<base::vec3d>(*curve("Arm_translate_off"), names::values),
              (std::vector<base::vec3d>{{1, 2, 3}}));
    EXPECT_TRUE(named("animClip", "animClip1_off"));
    // The second animation's rest value is the value before any animation.
    ASSERT_TRUE(named("animClip", "animClip2_off"));
    const auto rest2 =
        items<ref<IPlugin>>(*named("animClip", "animClip2_off"), names::keyframeChannels);
    ASSERT_EQ(rest2.size(), 1u);
    EXPECT_EQ(
        items<base::vec3d>(*rest2[0]->findArray(names::curves)->item(0)->asMap(), names::values),
        (std::vector<base::vec3d>{{1, 2, 3}}));

    // Scene range and layers; the last layer drives "translate", the first "scale".
    ref<IPlugin> sceneObject = objectsOf(*factory, names::scene)[0];
    EXPECT_EQ(scene::get(*sceneObject, names::startTime, TimeCode(-1)).ticks(), 0);
    EXPECT_EQ(scene::get(*sceneObject, names::endTime, TimeCode(-1)).ticks(), 3 * second);
    EXPECT_EQ(items<ref<IPlugin>>(*sceneObject, names::animLayers).size(), 2u);
    ref<scene::INode> arm = node("Arm");
    const auto* link = arm->findEntry(names::translate)->asLink();
    ASSERT_TRUE(link);
    EXPECT_EQ(link->path().root(), named("animLayer", "animLayer2").get());
    ASSERT_TRUE(arm->findEntry(names::rotate));
    EXPECT_FALSE(arm->findEntry(names::rotate)->asLink()); // not animated: kept

    // Playing: layer 2 at 1.5 s is halfway between its keys at 1 s and 3 s.
    setSceneTime(2);
    base::vec3d t = scene::get(*arm, names::translate, base::vec3d{});
    EXPECT_NEAR(t.x, 6, 1e-9);
    setSceneTime(0);
    EXPECT_NEAR(scene::get(*arm, names::translate, base::vec3d{}).x, 5, 1e-9); // constant before
    EXPECT_EQ(log.count("assimp import animClip1| Losing the value of Arm.translate"), 0u);
}

TEST_F(Animations, BadChannelsAndKeys) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    const double inf = std::numeric_limits<double>::infinity();
    aiAnimation* first = animation(
        "walk", 0,
        {channel("Nowhere", {{0, 1, 1, 1}, {5, 2, 2, 2}}),
         // Unsorted and invalid times; the unnamed node is found by its source name.
         channel("", {{50, 3, 0, 0}, {nan, 9, 9, 9}, {0, 1, 0, 0}, {25, 2, 0, 0}, {inf, 8, 8, 8}}),
         channel("Arm", {}, {}, {}), nullptr});
    first->mNumMeshChannels = 1;
    first->mMeshChannels = new aiMeshAnim* [1] { new aiMeshAnim };
    aiAnimation* lost = animation("lost", 10, {channel("Nowhere", {{0, 1, 1, 1}, {5, 2, 2, 2}})});
    std::vector<Key> many(100000);
    for (std::size_t k = 0; k < many.size(); ++k)
        many[k] = {double(k), float(k), 0, 0};
    aiAnimation* big = animation("big", 1000, {channel("Arm", many)});
    animate({first, lost, big});

    EXPECT_EQ(log.count("assimp import Nowhere| Unable to find node used by animation walk!"), 1u);
    EXPECT_EQ(log.count("assimp import Nowhere| Unable to find node used by animation lost!"), 1u);
    EXPECT_EQ(log.count("assimp import walk| No tick rate given; using 25 ticks per second."), 1u);
    EXPECT_EQ(log.count("assimp import walk| Mesh and morph animation channels are not imported."),
              1u);
    EXPECT_EQ(log.count("assimp import walk| Dropping keys with invalid times from the channel of "
                        "!"),
              1u);
    // Sorted, at 25 ticks per second: 0, 1 s and 2 s.
    EXPECT_EQ(times("_Translate"), (std::vector<std::int64_t>{0, second, 2 * second}));
    EXPECT_EQ(items<ref<IPlugin>>(*named("animClip", "walk"), names::keyframeChannels).size(), 1u);
    // A clip none of whose channels found its node spans 0..0.
    ref<IPlugin> lostClip = named("animClip", "lost");
    EXPECT_EQ(scene::get(*lostClip, names::startTime, TimeCode(-1)).ticks(), 0);
    EXPECT_EQ(scene::get(*lostClip, names::endTime, TimeCode(-1)).ticks(), 0);
    // 100,000 keys convert and play.
    EXPECT_EQ(times("Arm_Translate").size(), 100000u);
    setSceneTime(12.3456);
    EXPECT_NEAR(scene::get(*node("Arm"), names::translate, base::vec3d{}).x, 12345.6, 1e-3);
}

// ---- A glTF file ----

std::string base64(const std::vector<unsigned char>& bytes) {
    static const char* digits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string out;
    for (std::size_t i = 0; i < bytes.size(); i += 3) {
        const unsigned v = (bytes[i] << 16) | (i + 1 < bytes.size() ? bytes[i + 1] << 8 : 0) |
                           (i + 2 < bytes.size() ? bytes[i + 2] : 0);
        out += digits[(v >> 18) & 63];
        out += digits[(v >> 12) & 63];
        out += i + 1 < bytes.size() ? digits[(v >> 6) & 63] : '=';
        out += i + 2 < bytes.size() ? digits[v & 63] : '=';
    }
    return out;
}

// Two nodes; an unnamed animation moving and turning them, and a second one
// that moves the first node again.
std::string animatedGltf() {
    const std::vector<std::vector<float>> blocks = {
        {0, 1, 2},                                              // times
        {0, 0, 0, 10, 0, 0, 10, 10, 0},                         // translation
        {0, 0, 0, 1, 0, 0, 0.7071068f, 0.7071068f, 0, 0, 1, 0}, // rotation x y z w
        {2, 2, 2, 2, 2, 2, 2, 2, 2},                            // scale, constant
        {0, 0, 0, 0, 0, 4, 0, 0, 8},                            // second translation
    };
    std::vector<unsigned char> bytes;
    std::string views, accessors;
    const char* types[] = {"SCALAR", "VEC3", "VEC4", "VEC3", "VEC3"};
    const int counts[] = {3, 3, 3, 3, 3};
    for (std::size_t b = 0; b < blocks.size(); ++b) {
        const std::size_t offset = bytes.size();
        bytes.resize(offset + blocks[b].size() * 4);
        std::memcpy(bytes.data() + offset, blocks[b].data(), blocks[b].size() * 4);
        views += (b ? "," : "") + std::string("{\"buffer\":0,\"byteOffset\":") +
                 std::to_string(offset) +
                 ",\"byteLength\":" + std::to_string(blocks[b].size() * 4) + "}";
        accessors += (b ? "," : "") + std::string("{\"bufferView\":") + std::to_string(b) +
                     ",\"componentType\":5126,\"count\":" + std::to_string(counts[b]) +
                     ",\"type\":\"" + types[b] + "\"" + (b == 0 ? ",\"min\":[0],\"max\":[2]" : "") +
                     "}";
    }
    return R"({"asset":{"version":"2.0"},"scene":0,"scenes":[{"nodes":[0,1]}],
"nodes":[{"name":"Mover","translation":[1,2,3]},{"name":"Spinner"}],
"buffers":[{"byteLength":)" +
           std::to_string(bytes.size()) + R"(,"uri":"data:application/octet-stream;base64,)" +
           base64(bytes) + R"("}],
"bufferViews":[)" +
           views + R"(],"accessors":[)" + accessors + R"(],
"animations":[
 {"channels":[{"sampler":0,"target":{"node":0,"path":"translation"}},
              {"sampler":1,"target":{"node":1,"path":"rotation"}},
              {"sampler":2,"target":{"node":1,"path":"scale"}}],
  "samplers":[{"input":0,"output":1},{"input":0,"output":2},{"input":0,"output":3}]},
 {"name":"second","channels":[{"sampler":0,"target":{"node":0,"path":"translation"}}],
  "samplers":[{"input":0,"output":4}]}]})";
}

TEST_F(Animations, GltfPlaysAndASecondImportKeepsTheFirstScene) {
    namespace fsys = std::filesystem;
    const fsys::path path =
        fsys::path(testing::TempDir()) / ("as_anim_" + std::to_string(::getpid()) + ".gltf");
    std::ofstream(path) << animatedGltf();
    auto import = [&] {
        return scene::query<scene::ISceneImporter>(*importerObject)
            ->import(*factory, base::string(path.string().c_str()));
    };
    ASSERT_TRUE(import());
    ASSERT_TRUE(named("animLayer", "animLayer1"));
    ASSERT_TRUE(named("animLayer", "second"));
    ASSERT_TRUE(curve("Spinner_Scale"));
    EXPECT_FALSE(curve("Spinner_Scale")->findEntry(names::times));

    ref<scene::INode> mover = node("Mover"), spinner = node("Spinner");
    setSceneTime(0.5);
    const base::vec3d t = scene::get(*mover, names::translate, base::vec3d{});
    EXPECT_NEAR(t.z, 2, 1e-5); // the second animation wins
    const base::quatf q = scene::get(*spinner, names::rotate, base::quatf{});
    EXPECT_NEAR(std::abs(q.w), std::cos(M_PI / 8), 1e-5); // halfway to a quarter turn
    setSceneTime(1.5);
    EXPECT_NEAR(scene::get(*mover, names::translate, base::vec3d{}).z, 6, 1e-5);
    EXPECT_NEAR(scene::get(*spinner, names::scale, base::vec3f{}).x, 2, 1e-6);

    ref<IPlugin> firstScene = objectsOf(*factory, names::scene)[0];
    const auto layers = items<ref<IPlugin>>(*firstScene, names::animLayers);
    ASSERT_TRUE(import());
    ASSERT_EQ(objectsOf(*factory, names::scene).size(), 2u);
    EXPECT_EQ(items<ref<IPlugin>>(*firstScene, names::animLayers), layers);
    ref<IPlugin> secondScene = objectsOf(*factory, names::scene)[1];
    EXPECT_EQ(items<ref<IPlugin>>(*secondScene, names::animLayers).size(), 2u);
    EXPECT_EQ(scene::get(*secondScene, names::endTime, TimeCode()).ticks(), 2 * second);
    std::error_code ignored;
    fsys::remove(path, ignored);
}

// A Collada node animated through its matrix: assimp splits it into
// translation, rotation and scale keys in seconds.
TEST_F(Animations, ColladaMatrixAnimationPlays) {
    namespace fsys = std::filesystem;
    const fsys::path path =
        fsys::path(testing::TempDir()) / ("as_anim_" + std::to_string(::getpid()) + ".dae");
    std::ofstream(path) << R"(<?xml version="1.0" encoding="utf-8"?>
<COLLADA xmlns="http://www.collada.org/2005/11/COLLADASchema" version="1.4.1">
  <asset><unit name="meter" meter="1"/><up_axis>Y_UP</up_axis></asset>
  <library_animations>
    <animation id="move">
      <source id="move-in"><float_array id="move-in-array" count="2">0 2</float_array>
        <technique_common><accessor source="#move-in-array" count="2" stride="1"><param name="TIME" type="float"/></accessor></technique_common></source>
      <source id="move-out"><float_array id="move-out-array" count="32">1 0 0 0 0 1 0 0 0 0 1 0 0 0 0 1 1 0 0 4 0 1 0 0 0 0 1 0 0 0 0 1</float_array>
        <technique_common><accessor source="#move-out-array" count="2" stride="16"><param name="TRANSFORM" type="float4x4"/></accessor></technique_common></source>
      <source id="move-interp"><Name_array id="move-interp-array" count="2">LINEAR LINEAR</Name_array>
        <technique_common><accessor source="#move-interp-array" count="2" stride="1"><param name="INTERPOLATION" type="name"/></accessor></technique_common></source>
      <sampler id="move-sampler"><input semantic="INPUT" source="#move-in"/><input semantic="OUTPUT" source="#move-out"/><input semantic="INTERPOLATION" source="#move-interp"/></sampler>
      <channel source="#move-sampler" target="Box/transform"/>
    </animation>
  </library_animations>
  <library_visual_scenes>
    <visual_scene id="Scene" name="Scene">
      <node id="Box" name="Box" type="NODE"><matrix sid="transform">1 0 0 0 0 1 0 0 0 0 1 0 0 0 0 1</matrix></node>
      <node id="Still" name="Still" type="NODE"><matrix sid="transform">1 0 0 5 0 1 0 0 0 0 1 0 0 0 0 1</matrix></node>
    </visual_scene>
  </library_visual_scenes>
  <scene><instance_visual_scene url="#Scene"/></scene>
</COLLADA>
)";
    ASSERT_TRUE(scene::query<scene::ISceneImporter>(*importerObject)
                    ->import(*factory, base::string(path.string().c_str())));
    EXPECT_EQ(times("Box_Translate"), (std::vector<std::int64_t>{0, 2 * second}));
    // The rotation never changes: one value, no times.
    ASSERT_TRUE(curve("Box_Rotate"));
    EXPECT_FALSE(curve("Box_Rotate")->findEntry(names::times));
    ref<scene::INode> box = node("Box"), still = node("Still");
    EXPECT_FALSE(still->findEntry(names::translate)->asLink());
    setSceneTime(1);
    EXPECT_NEAR(scene::get(*box, names::translate, base::vec3d{}).x, 2, 1e-6);
    setSceneTime(5);
    EXPECT_NEAR(scene::get(*box, names::translate, base::vec3d{}).x, 4, 1e-6);
    EXPECT_EQ(scene::get(*objectsOf(*factory, names::scene)[0], names::endTime, TimeCode()).ticks(),
              2 * second);
    std::error_code ignored;
    fsys::remove(path, ignored);
}

} // namespace animtest
} // namespace as

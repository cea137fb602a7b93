// Cameras and lights: their values, the node that carries them and where they
// end up in the world, compared with the frame assimp's own scene implies.
#include "as_mesh_fixture.h"

#include <cmath>
#include <limits>
#include <map>
#include <memory>
#include <numbers>
#include <optional>
#include <set>

namespace as {

struct CameraLightTestAccess {
    static void convert(AssimpImporter& importer, base::PluginFactory& factory,
                        const aiScene& scene, const char* path) {
        importer.beginImport(factory, &scene);
        importer.convert(&scene, path);
        importer.releaseImportState();
    }
};

} // namespace as

namespace {

using as::meshtest::items;
using as::meshtest::objectsOf;
using as::meshtest::withChildren;
namespace names = scene::names;
using Children = std::vector<base::ref<base::IPlugin>>;

constexpr float nan = std::numeric_limits<float>::quiet_NaN();
constexpr float inf = std::numeric_limits<float>::infinity();
constexpr float twoPi = float(2 * std::numbers::pi);

template <class T>
T* append(T**& list, unsigned& count, T* item) {
    auto** grown = new T*[count + 1];
    std::copy_n(list, count, grown);
    grown[count++] = item;
    delete[] list;
    list = grown;
    return item;
}

aiLight* addLight(aiScene& scene, const char* name, aiLightSourceType type = aiLightSource_POINT) {
    auto* light = append(scene.mLights, scene.mNumLights, new aiLight);
    light->mName = aiString(name);
    light->mType = type;
    return light;
}

aiCamera* addCamera(aiScene& scene, const char* name) {
    auto* camera = append(scene.mCameras, scene.mNumCameras, new aiCamera);
    camera->mName = aiString(name);
    return camera;
}

aiNode* node(const char* name, const aiMatrix4x4& transform,
             std::initializer_list<aiNode*> kids = {}) {
    aiNode* made = withChildren(name, kids);
    made->mTransformation = transform;
    return made;
}

aiMatrix4x4 placed(aiVector3D translation, aiVector3D axis = {0, 0, 1}, float angle = 0,
                   float scale = 1) {
    aiMatrix4x4 rotation, scaling, moving;
    aiMatrix4x4::Rotation(angle, axis, rotation);
    aiMatrix4x4::Scaling(aiVector3D(scale), scaling);
    aiMatrix4x4::Translation(translation, moving);
    return moving * rotation * scaling;
}

struct Frame {
    base::vec3d position, direction;
};

void expectFrame(const Frame& found, const Frame& expected, const std::string& what) {
    for (std::size_t i = 0; i < 3; ++i) {
        EXPECT_NEAR(found.position[i], expected.position[i], 1e-4) << what << " position " << i;
        EXPECT_NEAR(found.direction[i], expected.direction[i], 1e-5) << what << " direction " << i;
    }
}

// What assimp's scene implies: the global transform of the object's node
// applied to its local frame.
Frame assimpFrame(const aiScene& scene, const aiVector3D& position, const aiVector3D& direction,
                  const aiString& name) {
    aiMatrix4x4 global;
    for (const aiNode* at = scene.mRootNode->FindNode(name); at; at = at->mParent)
        global = at->mTransformation * global;
    const aiVector3D p = global * position;
    aiVector3D d = aiMatrix3x3(global) * direction;
    d.Normalize();
    return {{p.x, p.y, p.z}, {d.x, d.y, d.z}};
}

class CameraLightTest : public testing::Test {
protected:
    CameraLightTest() { scene::register_scene_schema(*factory); }

    aiScene& newScene(aiNode* root) {
        sources.emplace_back(new aiScene);
        sources.back()->mRootNode = root;
        return *sources.back();
    }
    void run(const aiScene& scene, const char* path = "model.dae") {
        as::CameraLightTestAccess::convert(*importer, *factory, scene, path);
    }

    base::ref<base::IPlugin> named(base::name_id type, std::string_view name) const {
        for (auto& object : objectsOf(*factory, type))
            if (object->name() == name)
                return object;
        ADD_FAILURE() << "no " << type.view() << " named " << name;
        return {};
    }
    base::IPlugin* sceneRoot(std::size_t index) const {
        const auto scenes = objectsOf(*factory, names::scene);
        const auto* root = scenes.at(index)->findAttribute<base::ref<base::IPlugin>>(names::root);
        return root ? root->get() : nullptr;
    }
    std::string warning(const base::IPlugin& object) const {
        const base::string name = object.name();
        return "assimp import " + std::string(name.data(), name.size()) +
               "| Invalid values were left at their defaults!";
    }

    struct Placed {
        Frame frame;
        base::IPlugin* carrier;
    };
    using Placements = std::map<const base::IPlugin*, Placed>;

    // Every object's frame through our node transforms, walking down from the
    // root of scene 'index': its node's world transform applied to the
    // node's origin and to its -Z axis. The first place met counts.
    Placements placements(std::size_t index = 0) const {
        Placements out;
        walk(*sceneRoot(index), base::mat43::identity(), out, 0);
        return out;
    }
    Frame world(const base::IPlugin& object, std::size_t index = 0,
                base::IPlugin** carrier = nullptr) const {
        const Placements all = placements(index);
        const auto found = all.find(&object);
        EXPECT_NE(found, all.end()) << object.name() << " is not in the scene";
        if (carrier)
            *carrier = found == all.end() ? nullptr : found->second.carrier;
        return found == all.end() ? Frame{} : found->second.frame;
    }

    base::CaptureLog captured;
    base::ScopedLog scopedLog{captured};
    base::ref<base::PluginFactory> factory{new base::PluginFactory("cameras")};
    base::ref<as::AssimpImporter> importer{
        new as::AssimpImporter(nullptr, nullptr, base::invalidPluginId)};
    std::vector<std::unique_ptr<aiScene>> sources;

private:
    static void walk(base::IPlugin& at, const base::mat43& parent, Placements& out, int depth) {
        const auto* hierarchical = scene::query<scene::IHierarchical>(at);
        if (!hierarchical || depth > 100)
            return;
        const base::mat43 transform = parent * hierarchical->localTransformation();
        const Frame frame{transform.transformPoint({0, 0, 0}),
                          transform.transformVector({0, 0, -1}).normalized()};
        for (const auto& child : items<base::ref<base::IPlugin>>(at, names::children))
            if (child) {
                out.try_emplace(child.get(), Placed{frame, &at});
                walk(*child, transform, out, depth + 1);
            }
    }
};

// ---- Cameras ----

struct CameraRow {
    const char* label;
    float halfAngle, aspect, orthographicWidth;
    float focalLength;
    base::vec2f sensor;
    const char* warning; // 0: none, "o": orthographic, "i": invalid values
};

TEST_F(CameraLightTest, CameraLensAndSensor) {
    const float quarter = float(std::numbers::pi / 4);
    const CameraRow rows[] = {
        {"QuarterTurn", quarter, 1.5f, 0, 18, {36, 24}, nullptr},
        {"Wide", quarter, 2, 0, 18, {36, 18}, nullptr},
        {"NoAspect", quarter, 0, 0, 18, {36, 24}, nullptr},
        {"Tele", float(std::atan(0.1)), 0, 0, 180, {36, 24}, nullptr},
        // Nothing here may divide by tan(0) or write infinity.
        {"Orthographic", 0, 1, 5, 50, {36, 36}, "o"},
        {"ZeroAngle", 0, 0, 0, 50, {36, 24}, "i"},
        {"StraightAngle", float(std::numbers::pi / 2), 0, 0, 50, {36, 24}, "i"},
        {"NaNAngle", nan, 0, 0, 50, {36, 24}, "i"},
        {"InfiniteAspect", quarter, inf, 0, 18, {36, 24}, "i"},
        {"NegativeAspect", quarter, -2, 0, 18, {36, 24}, "i"},
    };
    aiScene& source = newScene(new aiNode("root"));
    for (const CameraRow& row : rows) {
        aiCamera* camera = addCamera(source, row.label);
        camera->mHorizontalFOV = row.halfAngle;
        camera->mAspect = row.aspect;
        camera->mOrthographicWidth = row.orthographicWidth;
    }
    run(source);

    using C = scene::camera_schema;
    for (const CameraRow& row : rows) {
        SCOPED_TRACE(row.label);
        base::ref<base::IPlugin> camera = named(C::type(), row.label);
        ASSERT_TRUE(camera);
        EXPECT_NEAR(SCENE_GET(*camera, C, focalLength), row.focalLength, 1e-4);
        EXPECT_EQ(SCENE_GET(*camera, C, sensor), row.sensor);
        EXPECT_TRUE(SCENE_GET(*camera, C, locked));
        const std::string orthographic =
            "assimp import " + std::string(row.label) +
            "| The orthographic projection is not carried; the camera keeps its default focal "
            "length!";
        const bool o = row.warning && *row.warning == 'o', i = row.warning && *row.warning == 'i';
        EXPECT_EQ(captured.count(orthographic), o ? 1u : 0u);
        EXPECT_EQ(captured.count(warning(*camera)), i ? 1u : 0u);
    }
}

// ---- Lights ----

struct LightRow {
    const char* label;
    aiLightSourceType type;
    float inner, outer;
    aiVector2D size;
    aiColor3D diffuse, specular;
    std::optional<std::uint8_t> lightType;
    std::optional<float> size_, cone, penumbra, ratio;
    std::optional<base::vec3f> color;
    bool reflections;
    bool warns;
};

TEST_F(CameraLightTest, LightTypesAndValues) {
    const aiColor3D white(1, 1, 1), black(0, 0, 0);
    const std::optional<float> none;
    const std::optional<base::vec3f> unit = base::vec3f{1, 1, 1};
    // clang-format off
    const LightRow rows[] = {
        // label, type, inner, outer, size, diffuse, specular,
        //   expected lightType, size, cone, penumbra, sizeRatio, color, reflections, warns
        {"Sun", aiLightSource_DIRECTIONAL, twoPi, twoPi, {}, white, white,
         0, 0, none, none, none, unit, true, false},
        // A point light's 2 pi cones are not written.
        {"Bulb", aiLightSource_POINT, twoPi, twoPi, {}, {0.5f, 0.25f, 1}, white,
         1, 0, none, none, none, base::vec3f{0.5f, 0.25f, 1}, true, false},
        // Radians in, degrees out: 0.5 rad is 28.6 degrees, not a pin-point.
        {"Spot", aiLightSource_SPOT, 0.5f, 0.7f, {}, white, white,
         2, 0, 28.647890f, 11.459156f, none, unit, true, false},
        {"Panel", aiLightSource_AREA, twoPi, twoPi, {2, 1}, white, white,
         3, 2, none, none, 2.0f, unit, true, false},
        {"Ambient", aiLightSource_AMBIENT, twoPi, twoPi, {}, {0.2f, 0.3f, 0.4f}, black,
         none, none, none, none, none, base::vec3f{0.2f, 0.3f, 0.4f}, false, false},
        {"Undefined", aiLightSource_UNDEFINED, 0, 0, {}, white, {1e-6f, 0, 0},
         none, none, none, none, none, unit, false, false},
        // Bad values keep their defaults, with one warning per light.
        {"NaNSpot", aiLightSource_SPOT, nan, 0.7f, {}, white, white,
         2, 0, none, none, none, unit, true, true},
        {"NarrowingSpot", aiLightSource_SPOT, 0.7f, 0.5f, {}, white, white,
         2, 0, 40.107044f, none, none, unit, true, true},
        {"FlatPanel", aiLightSource_AREA, 0, 0, {2, 0}, white, white,
         3, 2, none, none, none, unit, true, true},
        {"BadColours", aiLightSource_POINT, 0, 0, {}, {nan, 1, 1}, {inf, 0, 0},
         1, 0, none, none, none, std::nullopt, true, true},
    };
    // clang-format on
    aiScene& source = newScene(new aiNode("root"));
    for (const LightRow& row : rows) {
        aiLight* light = addLight(source, row.label, row.type);
        light->mAngleInnerCone = row.inner;
        light->mAngleOuterCone = row.outer;
        light->mSize = row.size;
        light->mColorDiffuse = row.diffuse;
        light->mColorSpecular = row.specular;
    }
    run(source);

    using L = scene::light_schema;
    for (const LightRow& row : rows) {
        SCOPED_TRACE(row.label);
        base::ref<base::IPlugin> light = named(L::type(), row.label);
        ASSERT_TRUE(light);
        std::size_t written = 1; // the name
        auto expectValue = [&](base::name_id name, const auto& expected) {
            using T = typename std::decay_t<decltype(expected)>::value_type;
            const T* value = light->findEntry(name) ? light->findAttribute<T>(name) : nullptr;
            ASSERT_EQ(value != nullptr, expected.has_value()) << name.view();
            if (!value)
                return;
            ++written;
            if constexpr (std::is_same_v<T, float>)
                EXPECT_NEAR(*value, *expected, 1e-4) << name.view();
            else
                EXPECT_EQ(*value, *expected) << name.view();
        };
        expectValue(L::lightType(), row.lightType);
        expectValue(L::size(), row.size_);
        expectValue(L::spotConeAngle(), row.cone);
        expectValue(L::spotPenumbraAngle(), row.penumbra);
        expectValue(L::sizeRatio(), row.ratio);
        expectValue(L::color(), row.color);
        expectValue(L::visibleInReflections(),
                    row.reflections ? std::nullopt : std::optional<bool>(false));
        // Nothing else is written.
        EXPECT_EQ(light->entries().size(), written);
        EXPECT_EQ(captured.count(warning(*light)), row.warns ? 1u : 0u);
    }
}

// ---- Placement ----

TEST_F(CameraLightTest, ObjectsLandOnTheirNodesWhereAssimpPutsThem) {
    // The lamp's node is a rotated, scaled leaf: the light's own offset turns
    // and scales with it. The camera's node has a child, so the camera gets a
    // node of its own below it.
    aiNode* root =
        node("root", placed({10, 0, 0}, {0, 0, 1}, 1.0f),
             {node("Lamp", placed({1, 2, 3}, {1, 0, 0}, 0.5f, 2)),
              node("Rig", placed({0, 5, 0}, {0, 1, 0}, -0.7f),
                   {node("Cam", placed({0, 0, 4}, {0, 1, 1}, 0.3f), {new aiNode("Lens")})})});
    aiScene& source = newScene(root);
    aiLight* lamp = addLight(source, "Lamp", aiLightSource_SPOT);
    lamp->mPosition = {0, 1, 0};
    lamp->mDirection = {1, 0, -1};
    lamp->mUp = {0, 0, 1};
    aiCamera* cam = addCamera(source, "Cam");
    cam->mPosition = {1, -1, 2};
    cam->mLookAt = {0, -1, -1};
    aiCamera* free = addCamera(source, "Free");
    free->mPosition = {7, 8, 9};
    free->mLookAt = {0, 0, -1};
    run(source);

    // The node kept its name until it took the light's, so the light's own
    // name is the next free one.
    base::ref<base::IPlugin> light = named(names::light, "Lamp1");
    ASSERT_TRUE(light);
    base::IPlugin* carrier = nullptr;
    expectFrame(world(*light, 0, &carrier),
                assimpFrame(source, lamp->mPosition, lamp->mDirection, lamp->mName), "lamp");
    ASSERT_NE(carrier, nullptr);
    // The converted leaf itself carries the light, renamed after it.
    EXPECT_EQ(carrier->name(), "LampNode");
    EXPECT_EQ(objectsOf(*factory, names::node).size(), 7u);
    EXPECT_EQ(items<base::ref<base::IPlugin>>(*carrier, names::children), Children{light});

    base::ref<base::IPlugin> camera = named(names::camera, "Cam1");
    ASSERT_TRUE(camera);
    expectFrame(world(*camera, 0, &carrier),
                assimpFrame(source, cam->mPosition, cam->mLookAt, cam->mName), "camera");
    EXPECT_EQ(carrier->name(), "CamNode");
    EXPECT_EQ(SCENE_GET(*carrier, scene::node_schema, translate), (base::vec3d{1, -1, 2}));
    base::ref<base::IPlugin> camNode = named(names::node, "Cam");
    const Children camChildren = items<base::ref<base::IPlugin>>(*camNode, names::children);
    ASSERT_EQ(camChildren.size(), 2u);
    EXPECT_EQ(camChildren[1].get(), carrier);

    // No node of its name: a node below the scene's root with its own frame.
    base::ref<base::IPlugin> freeCamera = named(names::camera, "Free");
    ASSERT_TRUE(freeCamera);
    world(*freeCamera, 0, &carrier);
    EXPECT_EQ(carrier->name(), "FreeNode");
    EXPECT_EQ(SCENE_GET(*carrier, scene::node_schema, translate), (base::vec3d{7, 8, 9}));
    EXPECT_EQ(items<base::ref<base::IPlugin>>(*sceneRoot(0), names::children).back().get(),
              carrier);
    EXPECT_TRUE(captured.messages().empty()) << captured.messages().front();
}

TEST_F(CameraLightTest, SharedNameGoesToTheFirstConvertedNode) {
    // Depth first: the lamp below "Arm" is converted before its sibling.
    aiNode* root = node("root", aiMatrix4x4(),
                        {node("Arm", aiMatrix4x4(), {node("Lamp", placed({1, 0, 0}))}),
                         node("Lamp", placed({2, 0, 0}))});
    aiScene& source = newScene(root);
    addLight(source, "Lamp")->mPosition = {0, 0, 1};
    run(source);
    expectFrame(world(*objectsOf(*factory, names::light).at(0)), {{1, 0, 1}, {0, 0, -1}}, "lamp");
}

TEST_F(CameraLightTest, SecondImportUsesItsOwnScene) {
    for (int i = 0; i < 2; ++i) {
        aiScene& source = newScene(new aiNode("root"));
        addLight(source, "Free")->mPosition = {float(i), 0, 0};
        run(source);
    }
    base::IPlugin* carrier = nullptr;
    base::ref<base::IPlugin> second = named(names::light, "Free1");
    ASSERT_TRUE(second);
    world(*second, 1, &carrier);
    ASSERT_NE(carrier, nullptr);
    EXPECT_EQ(SCENE_GET(*carrier, scene::node_schema, translate), (base::vec3d{1, 0, 0}));
    EXPECT_EQ(items<base::ref<base::IPlugin>>(*sceneRoot(0), names::children).size(), 1u);
}

TEST_F(CameraLightTest, ManyObjectsOfOneNameAllKeepTheirPlace) {
    // A thousand lights on one leaf: the first folds into it, the others hang
    // below it relative to its new frame. The camera shares its name with a
    // node and a mesh.
    aiNode* root =
        node("root", placed({0, 0, 5}, {1, 1, 0}, 0.4f),
             {node("Lamp", placed({3, 0, 0}, {0, 0, 1}, 1.2f, 0.5f)), new aiNode("Arm")});
    root->mChildren[1]->mNumMeshes = 1;
    root->mChildren[1]->mMeshes = new unsigned[1]{0};
    aiScene& source = newScene(root);
    source.mNumMeshes = 1;
    source.mMeshes = new aiMesh* [1] { as::meshtest::makeMesh("Arm", {{0, 0, 0}}) };
    constexpr unsigned count = 1000;
    for (unsigned i = 0; i < count; ++i) {
        aiLight* light = addLight(source, "Lamp", aiLightSource_DIRECTIONAL);
        light->mPosition = {float(i % 7), float(i % 3), 1};
        light->mDirection = {std::cos(float(i)), std::sin(float(i)), 0.5f};
    }
    addCamera(source, "Arm");
    run(source);

    const auto lights = objectsOf(*factory, names::light);
    ASSERT_EQ(lights.size(), count);
    std::set<base::string> seen;
    for (const auto& type : {names::node, names::light, names::camera, names::mesh})
        for (const auto& object : objectsOf(*factory, type))
            EXPECT_TRUE(seen.insert(object->name()).second) << object->name();
    const Placements placed = placements();
    for (unsigned i = 0; i < count; ++i) {
        const aiLight* light = source.mLights[i];
        ASSERT_TRUE(placed.contains(lights[i].get()));
        expectFrame(placed.at(lights[i].get()).frame,
                    assimpFrame(source, light->mPosition, light->mDirection, light->mName),
                    "light " + std::to_string(i));
        if (HasFailure())
            break;
    }
    const auto cameras = objectsOf(*factory, names::camera);
    ASSERT_EQ(cameras.size(), 1u);
    world(*cameras[0]);
}

TEST_F(CameraLightTest, GltfCameraPositionIsNotCountedTwice) {
    struct Row {
        const char* path;
        aiVector3D position;
        base::vec3d expected;
    };
    const Row rows[] = {
        {"model.gltf", {0.5f, 0.5f, 3}, {0.5, 0.5, 3}},
        {"dir.dae/model.GLB", {0.5f, 0.5f, 3}, {0.5, 0.5, 3}},
        // Another reader, or a position of its own: both count.
        {"model.dae", {0.5f, 0.5f, 3}, {1, 1, 6}},
        {"model.gltf", {0.5f, 0.5f, 2}, {1, 1, 5}},
    };
    for (std::size_t i = 0; i < std::size(rows); ++i) {
        SCOPED_TRACE(rows[i].path);
        aiScene& source = newScene(node(
            "root", aiMatrix4x4(), {node("Camera", placed({0.5f, 0.5f, 3})), new aiNode("x")}));
        aiCamera* camera = addCamera(source, "Camera");
        camera->mPosition = rows[i].position;
        camera->mLookAt = {0, 0, -1};
        run(source, rows[i].path);
        const auto cameras = objectsOf(*factory, names::camera);
        ASSERT_EQ(cameras.size(), i + 1);
        expectFrame(world(*cameras.back(), i), {rows[i].expected, {0, 0, -1}}, rows[i].path);
    }
}

TEST_F(CameraLightTest, NonFiniteFramesKeepTheNodesTransform) {
    aiNode* root = node("root", aiMatrix4x4(),
                        {node("Lamp", placed({1, 2, 3}, {0, 0, 1}, 0.5f)), new aiNode("x")});
    aiScene& source = newScene(root);
    aiLight* lamp = addLight(source, "Lamp");
    lamp->mPosition = {nan, 0, 0};
    lamp->mDirection = {0, inf, 0};
    aiLight* free = addLight(source, "Free", aiLightSource_SPOT);
    free->mPosition = {1, 1, 1};
    free->mDirection = {0, -1, 0};
    free->mUp = {nan, 1, 0};
    run(source);

    using N = scene::node_schema;
    base::IPlugin* carrier = nullptr;
    const auto lights = objectsOf(*factory, names::light);
    ASSERT_EQ(lights.size(), 2u);
    const base::ref<base::IPlugin>& light = lights[0];
    expectFrame(world(*light, 0, &carrier), assimpFrame(source, {0, 0, 0}, {0, 0, -1}, lamp->mName),
                "lamp");
    EXPECT_EQ(SCENE_GET(*carrier, N, translate), (base::vec3d{1, 2, 3}));
    EXPECT_EQ(captured.count(warning(*light)), 1u);

    // An unusable up vector still gives a finite frame looking the right way.
    const base::ref<base::IPlugin>& spot = lights[1];
    expectFrame(world(*spot, 0, &carrier), {{1, 1, 1}, {0, -1, 0}}, "spot");
    const base::quatf rotate = SCENE_GET(*carrier, N, rotate);
    EXPECT_NEAR(rotate.lengthSquared(), 1.0f, 1e-6f);
    EXPECT_EQ(captured.count(warning(*spot)), 1u);
}

} // namespace

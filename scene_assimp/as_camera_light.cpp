// Cameras and lights: each becomes a "camera" or "light" object hung below the
// node that carries its frame. assimp gives the frame (position, direction,
// up) in the space of the node named like the object; the placement step
// folds it into that node when the node is a leaf, and otherwise gives the
// object a node of its own below it.
#include "as_importer.h"
#include "as_node.h"
#include "b_format.h"
#include "b_frame.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_getter.h"
#include "scene_schema.h"

#include <assimp/scene.h>

#include <cmath>
#include <numbers>

namespace as {

namespace {

using N = scene::node_schema;
using Children = base::ref<base::IPlugin>;

constexpr std::uint32_t createFlags =
    base::PluginFactory::createNullIfUnknown | base::PluginFactory::createReportUnknown;
constexpr double degreesPerRadian = 180.0 / std::numbers::pi;

// Non-finite source values are replaced by zero and remembered, so that every
// attribute they feed keeps its default and the object gets one warning.
struct Checked {
    bool invalid = false;

    base::vec3d vector(const aiVector3D& v) {
        if (std::isfinite(v.x) && std::isfinite(v.y) && std::isfinite(v.z))
            return {v.x, v.y, v.z};
        invalid = true;
        return {};
    }
    bool finite(std::initializer_list<float> values) {
        for (float v : values)
            if (!std::isfinite(v)) {
                invalid = true;
                return false;
            }
        return true;
    }
};

void warnInvalid(const base::IPlugin& object) {
    base::logFormatted(base::logScene, base::logWarning,
                       "assimp import {}| Invalid values were left at their defaults!",
                       object.name());
}

std::size_t childCount(const scene::INode& node) {
    const base::Attribute* children = node.findEntry(N::children());
    return children ? children->size() : 0;
}

// A camera or light named 'name', appended to the children of its carrier.
template <class I>
base::ref<I> createCarried(base::PluginFactory& factory, base::name_id type,
                           const base::string& name, scene::INode* carrier) {
    base::ref<base::IPlugin> object = factory.create(type, createFlags);
    base::ref<I> made(dynamic_cast<I*>(object.get()));
    if (!made)
        return made;
    made->setAttribute(scene::names::name, name);
    if (carrier)
        carrier->appendAttributeItem(N::children(), Children(made.get()));
    return made;
}

base::string stem(const aiString& name, const char* fallback) {
    return name.length ? base::string(name.C_Str()) : base::string(fallback);
}

} // namespace

void AssimpImporter::indexSourceNodes(const aiScene* scene) {
    m_sourceNodes.clear();
    forEachSourceNode(scene->mRootNode, [this](const aiNode& node) {
        if (node.mName.length)
            m_sourceNodes.emplace(std::string_view(node.mName.C_Str(), node.mName.length), &node);
    });
}

base::string AssimpImporter::freshName(const base::string& base) {
    base::string name = m_factory->uniqueName(base);
    while (m_givenNames.contains(name))
        name = m_factory->uniqueName(name + "1");
    return name;
}

const aiNode* AssimpImporter::sourceNode(const aiString& name) const {
    const auto found = m_sourceNodes.find(std::string_view(name.C_Str(), name.length));
    return found == m_sourceNodes.end() ? nullptr : found->second;
}

base::ref<scene::INode> AssimpImporter::placeObject(const aiScene* /*scene*/, const aiString& name,
                                                    const base::vec3d& position,
                                                    const base::vec3d& direction,
                                                    const base::vec3d& up) {
    const base::string nodeName = freshName(stem(name, "object") + "Node");
    base::base_camera<double> camera;
    camera.setUp(up, true);
    camera.setViewDirection(direction);
    const base::quatd q = camera.orientation();

    scene::INode* sourceCarrier = nullptr;
    if (const aiNode* source = name.length ? sourceNode(name) : nullptr)
        if (const auto made = m_nodeMemo.find(source); made != m_nodeMemo.end())
            sourceCarrier = made->second;

    if (sourceCarrier && childCount(*sourceCarrier) == 0) {
        // The position is in the node's space: it moves with the node's
        // rotation and scale, not by a plain sum.
        const base::vec3d translate = SCENE_GET(*sourceCarrier, N, translate);
        const base::quatf rotate = SCENE_GET(*sourceCarrier, N, rotate);
        const base::vec3d moved =
            translate + sourceCarrier->localTransformation().transformVector(position);
        const base::quatd turned = base::quatd{rotate.w, rotate.x, rotate.y, rotate.z} * q;
        sourceCarrier->setAttribute(N::translate(), moved);
        sourceCarrier->setAttribute(N::rotate(), base::quatf{float(turned.w), float(turned.x),
                                                             float(turned.y), float(turned.z)});
        sourceCarrier->setAttribute(N::name(), nodeName);
        m_givenNames.emplace(nodeName, true);
        m_foldedFrames[sourceCarrier] = {position, q};
        return base::ref<scene::INode>(sourceCarrier);
    }

    base::ref<base::IPlugin> object = m_factory->create(N::type(), createFlags);
    base::ref<scene::INode> node(dynamic_cast<scene::INode*>(object.get()));
    if (!node)
        return node;

    // Below the node of the object's name, so that it follows that node's
    // place in the scene; below the root when there is none.
    base::IPlugin* parent = sourceCarrier;
    base::vec3d local = position;
    base::quatd turn = q;
    if (const auto folded = m_foldedFrames.find(sourceCarrier); folded != m_foldedFrames.end()) {
        // That node already carries another object's frame: undo it.
        const base::quatd back = folded->second.rotation.conjugate();
        local = back.rotate(position - folded->second.position);
        turn = back * q;
    }
    if (!parent && m_scene)
        if (const auto* root =
                m_scene->findAttribute<base::ref<base::IPlugin>>(scene::scene_schema::root()))
            parent = root->get();

    node->setAttribute(N::name(), nodeName);
    node->setAttribute(N::translate(), local);
    node->setAttribute(N::rotate(),
                       base::quatf{float(turn.w), float(turn.x), float(turn.y), float(turn.z)});
    if (parent)
        parent->appendAttributeItem(N::children(), Children(node.get()));
    return node;
}

base::ref<scene::ICamera> AssimpImporter::importCamera(const aiScene* scene,
                                                       const aiCamera* source) {
    using C = scene::camera_schema;
    Checked checked;
    base::vec3d position = checked.vector(source->mPosition);
    // The glTF reader also copies the camera node's translation into the
    // camera's own position; taking both would put the camera at twice its
    // distance.
    if (m_cameraPositionInNode)
        if (const aiNode* node = sourceNode(source->mName);
            node &&
            source->mPosition == aiVector3D(node->mTransformation.a4, node->mTransformation.b4,
                                            node->mTransformation.c4))
            position = {};
    base::ref<scene::INode> carrier =
        placeObject(scene, source->mName, position, checked.vector(source->mLookAt),
                    checked.vector(source->mUp));

    base::ref<scene::ICamera> camera = createCarried<scene::ICamera>(
        *m_factory, C::type(), freshName(stem(source->mName, "camera")), carrier.get());
    if (!camera)
        return camera;

    base::vec2f sensor = C::sensorDefault();
    if (checked.finite({source->mAspect}) && source->mAspect != 0) {
        if (source->mAspect > 0)
            sensor.y = float(double(sensor.x) / source->mAspect);
        else
            checked.invalid = true;
    }
    const double halfAngle = source->mHorizontalFOV;
    if (source->mOrthographicWidth > 0 && halfAngle == 0) {
        base::logFormatted(base::logScene, base::logWarning,
                           "assimp import {}| The orthographic projection is not carried; the "
                           "camera keeps its default focal length!",
                           camera->name());
    } else if (checked.finite({source->mHorizontalFOV}) && halfAngle > 0 &&
               halfAngle < std::numbers::pi / 2) {
        camera->setAttribute(C::focalLength(), float(0.5 / std::tan(halfAngle) * double(sensor.x)));
    } else {
        // No lens has a zero or straight field of view: 0.5 / tan would be
        // infinite or negative.
        checked.invalid = true;
    }
    camera->setAttribute(C::sensor(), sensor);
    camera->setAttribute(C::locked(), true);
    if (checked.invalid)
        warnInvalid(*camera);
    return camera;
}

base::ref<scene::ILight> AssimpImporter::importLight(const aiScene* scene, const aiLight* source) {
    using L = scene::light_schema;
    Checked checked;
    base::ref<scene::INode> carrier =
        placeObject(scene, source->mName, checked.vector(source->mPosition),
                    checked.vector(source->mDirection), checked.vector(source->mUp));

    base::ref<scene::ILight> light = createCarried<scene::ILight>(
        *m_factory, L::type(), freshName(stem(source->mName, "light")), carrier.get());
    if (!light)
        return light;

    switch (source->mType) {
    case aiLightSource_DIRECTIONAL:
    case aiLightSource_POINT:
        light->setAttribute(L::lightType(),
                            std::uint8_t(source->mType == aiLightSource_DIRECTIONAL ? 0 : 1));
        light->setAttribute(L::size(), 0.0f);
        break;
    case aiLightSource_SPOT: {
        light->setAttribute(L::lightType(), std::uint8_t(2));
        light->setAttribute(L::size(), 0.0f);
        // assimp's cones are radians; the attributes are degrees like
        // their defaults (90 and 5).
        const double inner = source->mAngleInnerCone, outer = source->mAngleOuterCone;
        if (checked.finite({source->mAngleInnerCone}))
            light->setAttribute(L::spotConeAngle(), float(inner * degreesPerRadian));
        if (checked.finite({source->mAngleInnerCone, source->mAngleOuterCone})) {
            if (outer >= inner)
                light->setAttribute(L::spotPenumbraAngle(),
                                    float((outer - inner) * degreesPerRadian));
            else
                checked.invalid = true;
        }
        break;
    }
    case aiLightSource_AREA:
        light->setAttribute(L::lightType(), std::uint8_t(3));
        if (checked.finite({source->mSize.x}))
            light->setAttribute(L::size(), source->mSize.x);
        if (checked.finite({source->mSize.x, source->mSize.y})) {
            if (source->mSize.y != 0)
                light->setAttribute(L::sizeRatio(), source->mSize.x / source->mSize.y);
            else
                checked.invalid = true;
        }
        break;
    default:
        // Undefined and ambient lights have no type of the scene model.
        break;
    }

    const aiColor3D& diffuse = source->mColorDiffuse;
    if (checked.finite({diffuse.r, diffuse.g, diffuse.b}))
        light->setAttribute(L::color(), base::vec3f{diffuse.r, diffuse.g, diffuse.b});
    const aiColor3D& specular = source->mColorSpecular;
    if (checked.finite({specular.r, specular.g, specular.b}) && specular.r < 1e-5f &&
        specular.g < 1e-5f && specular.b < 1e-5f)
        light->setAttribute(L::visibleInReflections(), false);
    if (checked.invalid)
        warnInvalid(*light);
    return light;
}

void AssimpImporter::importCamerasAndLights(const aiScene* scene) {
    if (!scene->mNumLights && !scene->mNumCameras)
        return;
    indexSourceNodes(scene);
    for (unsigned i = 0; scene->mLights && i < scene->mNumLights; ++i)
        if (scene->mLights[i])
            importLight(scene, scene->mLights[i]);
    for (unsigned i = 0; scene->mCameras && i < scene->mNumCameras; ++i)
        if (scene->mCameras[i])
            importCamera(scene, scene->mCameras[i]);
}

} // namespace as

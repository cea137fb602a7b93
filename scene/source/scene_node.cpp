// What a node computes from its attributes: its local transformation from the
// transform attributes, and its bounding box gathered from its children and
// kept in "bounds".
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <numbers>
#include <optional>

namespace scene {

namespace {

using ::base::box3d;
using ::base::mat33d;
using ::base::quatd;
using ::base::vec3d;
using ::base::vec3f;

constexpr double degrees = std::numbers::pi / 180.0;

vec3d toDouble(const vec3f& v) {
    return {v.x, v.y, v.z};
}

quatd axisQuat(int axis, double radians) {
    quatd q{std::cos(radians / 2), 0, 0, 0};
    const double s = std::sin(radians / 2);
    (axis == 0 ? q.x : axis == 1 ? q.y : q.z) = s;
    return q;
}

// Per "rotateOrder": the axes in the order they are applied.
constexpr int eulerOrders[6][3] = {{0, 1, 2}, {1, 2, 0}, {2, 0, 1},
                                   {0, 2, 1}, {1, 0, 2}, {2, 1, 0}};

quatd eulerRotation(const vec3f& anglesInDegrees, std::uint8_t order) {
    // An order we do not know reads as the default rather than dropping the
    // angles altogether.
    const int* axes = eulerOrders[order < 6 ? order : 0];
    const vec3d angles = toDouble(anglesInDegrees) * degrees;
    quatd q = axisQuat(axes[0], angles[std::size_t(axes[0])]);
    for (int i = 1; i < 3; ++i)
        q = axisQuat(axes[i], angles[std::size_t(axes[i])]) * q;
    return q;
}

// The Euler angles of mode 0. Older data keeps them in "rotate" as three
// floats; a quaternion there (the usual case) is not a mismatch worth a warning.
vec3f eulerAngles(const INode& node) {
    if (node.findInherited(names::rotateEuler))
        return SCENE_GET(node, node_schema, rotateEuler);
    const ::base::Attribute* rotate = node.findInherited(names::rotate);
    if (rotate && rotate->typeName() != ::base::TypeTraits<::base::quatf>::n_name)
        if (const vec3f* angles = node.findAttribute<vec3f>(names::rotate))
            return *angles;
    return node_schema::rotateEulerDefault();
}

// The rotation chosen by "rotateMode"; none for a mode we do not know.
std::optional<quatd> rotationOf(const INode& node) {
    switch (SCENE_GET(node, node_schema, rotateMode)) {
    case 2: {
        const ::base::quatf stored = SCENE_GET(node, node_schema, rotate);
        const quatd q{stored.w, stored.x, stored.y, stored.z};
        const double lengthSquared = q.lengthSquared();
        if (lengthSquared <= 1e-12)
            return quatd::identity();
        if (std::abs(lengthSquared - 1.0) >= 1e-8)
            return q.normalized();
        return q;
    }
    case 1: {
        const ::base::vec4f axisAngle = SCENE_GET(node, node_schema, rotateAxisAngle);
        return quatd::fromAxisAngle({axisAngle.x, axisAngle.y, axisAngle.z},
                                    double(axisAngle.w) * degrees);
    }
    case 0:
        return eulerRotation(eulerAngles(node), SCENE_GET(node, node_schema, rotateOrder));
    default:
        return std::nullopt;
    }
}

// Target-driven placement: the node orbits "targetPosition" at "distance",
// turned by "azimuth" about +Y and raised by "altitude" (degrees), and looks
// at the target along its -Z axis. "rotationAxes" is not used.
::base::mat43 orbitTransformation(const INode& node) {
    const vec3d target = SCENE_GET(node, node_schema, targetPosition);
    const double distance = SCENE_GET(node, node_schema, distance);
    const double azimuth = double(SCENE_GET(node, node_schema, azimuth)) * degrees;
    const double altitude = double(SCENE_GET(node, node_schema, altitude)) * degrees;
    const quatd turn = axisQuat(1, azimuth) * axisQuat(0, -altitude);
    const vec3d offset{std::cos(altitude) * std::sin(azimuth), std::sin(altitude),
                       std::cos(altitude) * std::cos(azimuth)};
    const mat33d r = turn.rotationMatrix();
    ::base::mat43 out = ::base::mat43::identity();
    for (std::size_t i = 0; i < 3; ++i)
        for (std::size_t j = 0; j < 3; ++j)
            out.m.m[i][j] = float(r.m[i][j]);
    out.t = target + offset * distance;
    return out;
}

// A box that must not enter a union: an empty one (transforming it would span
// all space) and one reaching the far end of the number range (what stored
// data uses for "unbounded").
bool leftOut(const box3d& box) {
    constexpr double big = std::numeric_limits<double>::max();
    if (box.isEmpty())
        return true;
    for (std::size_t i = 0; i < 3; ++i)
        if (box.min[i] == -big || box.max[i] == big)
            return true;
    return false;
}

// The nodes whose bounds this thread is computing, outermost first. A child
// found here lists one of its own ancestors; recursing into it would never end.
thread_local ::base::vector<const ::base::IPlugin*> t_boundsWalk;

struct BoundsWalkEntry {
    explicit BoundsWalkEntry(const ::base::IPlugin* node) { t_boundsWalk.push_back(node); }
    ~BoundsWalkEntry() { t_boundsWalk.pop_back(); }
    BoundsWalkEntry(const BoundsWalkEntry&) = delete;
    BoundsWalkEntry& operator=(const BoundsWalkEntry&) = delete;
};

bool onBoundsWalk(const ::base::IPlugin* node) {
    return std::find(t_boundsWalk.begin(), t_boundsWalk.end(), node) != t_boundsWalk.end();
}

} // namespace

INode::INode(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory, std::uint32_t id)
    : ::base::IPlugin(descriptor, factory, id) {
    addInterface(static_cast<IBounded*>(this));
    addInterface(static_cast<IHierarchical*>(this));
}

base::box3d INode::cachedBounds() const {
    return get(*this, names::bounds, box3d::empty());
}

void INode::computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) {
    if (mode == 3)
        if (const box3d* stored = findAttribute<box3d>(names::bounds)) {
            result = *stored;
            return;
        }

    const BoundsWalkEntry walking(this);
    box3d box = box3d::empty();
    if (const auto* children = findVecAttribute<::base::ref<::base::IPlugin>>(names::children)) {
        for (const auto& entry : *children) {
            const ::base::IPlugin* child = entry.get();
            if (!child)
                continue;
            auto* bounded = query<IBounded>(*child);
            if (!bounded)
                continue;
            if (onBoundsWalk(child)) {
                ::base::logFormatted(::base::logScene, ::base::logWarning,
                                     "bounds |{}| The child '{}' is also an ancestor and is left "
                                     "out!",
                                     name(true), child->name(true));
                continue;
            }
            box3d childBox;
            if (recurse)
                bounded->computeBounds(childBox, mode, recurse);
            else
                childBox = bounded->cachedBounds();
            if (leftOut(childBox))
                continue;
            // Geometry has no transform of its own: it lives in the node's space.
            if (const auto* hierarchical = query<IHierarchical>(*child))
                childBox = childBox.transformed(hierarchical->localTransformation());
            box.unite(childBox);
        }
    }

    // Other modes compute without touching what is stored.
    if (mode == 2 || mode == 3)
        syncAttribute(names::bounds, box);
    result = box;
}

base::mat43 INode::localTransformation() const {
    if (SCENE_GET(*this, node_schema, transformation) == 1)
        return orbitTransformation(*this);

    const std::optional<quatd> rotation = rotationOf(*this);
    const mat33d r = rotation ? rotation->rotationMatrix() : mat33d::identity();
    vec3d t = SCENE_GET(*this, node_schema, translate);
    if (const vec3d* pivot = findAttribute<vec3d>(names::rotatePivot))
        t += *pivot - r * *pivot;

    // E(hyz)·E(hxz)·E(hxy) has no cross terms: it is the unit upper triangle
    // holding the three factors.
    const vec3f shear = SCENE_GET(*this, node_schema, shear);
    const vec3f scale = SCENE_GET(*this, node_schema, scale);
    const mat33d hs = mat33d{{{1, shear.x, shear.y}, {0, 1, shear.z}, {0, 0, 1}}} *
                      mat33d::diagonal(toDouble(scale));
    // Shear and scale act about the pivot: it stays put before the rotation.
    if (const vec3d* pivot = findAttribute<vec3d>(names::scalePivot))
        t += r * (*pivot - hs * *pivot);

    const mat33d linear = r * hs;
    ::base::mat43 out{};
    for (std::size_t i = 0; i < 3; ++i)
        for (std::size_t j = 0; j < 3; ++j)
            out.m.m[i][j] = float(linear.m[i][j]);
    out.t = t;
    return out;
}

} // namespace scene

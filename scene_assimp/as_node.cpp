#include "as_node.h"

#include "as_importer.h"
#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_schema.h"

#include <assimp/scene.h>

#include <algorithm>
#include <cmath>

namespace as {

namespace {

using Vec = base::vec3d;

double dot(const Vec& a, const Vec& b) {
    return a.x * b.x + a.y * b.y + a.z * b.z;
}
Vec cross(const Vec& a, const Vec& b) {
    return {a.y * b.z - a.z * b.y, a.z * b.x - a.x * b.z, a.x * b.y - a.y * b.x};
}
Vec scaled(const Vec& a, double s) {
    return {a.x * s, a.y * s, a.z * s};
}
Vec minus(const Vec& a, const Vec& b) {
    return {a.x - b.x, a.y - b.y, a.z - b.z};
}

constexpr double scaleEpsilon = 1e-12;
constexpr float shearEpsilon = 1e-7f;
constexpr double checkShearEpsilon = 1e-6;
constexpr double checkTolerance = 1e-6;

// The rotation as a row-major 3x3 matrix; the quaternion is used as stored,
// without normalising it.
void rotationMatrix(const base::quatf& q, double r[3][3]) {
    const double w = q.w, x = q.x, y = q.y, z = q.z;
    r[0][0] = 1 - 2 * (y * y + z * z);
    r[0][1] = 2 * (x * y - w * z);
    r[0][2] = 2 * (x * z + w * y);
    r[1][0] = 2 * (x * y + w * z);
    r[1][1] = 1 - 2 * (x * x + z * z);
    r[1][2] = 2 * (y * z - w * x);
    r[2][0] = 2 * (x * z - w * y);
    r[2][1] = 2 * (y * z + w * x);
    r[2][2] = 1 - 2 * (x * x + y * y);
}

// Rebuilds the matrix from the float values the node received and logs the
// largest deviation of the 3x3 part when anything is off by more than 1e-6.
void checkDecomposition(scene::INode& node, const aiMatrix4x4& m, const base::vec3d& t,
                        const base::vec3f& shear, const base::quatf& rotate,
                        const base::vec3f& scale) {
    double r[3][3] = {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}};
    if (!(rotate.w == 1 && rotate.x == 0 && rotate.y == 0 && rotate.z == 0))
        rotationMatrix(rotate, r);
    double h[3][3] = {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}};
    if (std::fabs(double(shear.x)) > checkShearEpsilon)
        h[0][1] = shear.x;
    if (std::fabs(double(shear.y)) > checkShearEpsilon)
        h[0][2] = shear.y;
    if (std::fabs(double(shear.z)) > checkShearEpsilon)
        h[1][2] = shear.z;
    const double s[3] = {scale.x, scale.y, scale.z};

    bool off = std::fabs(t.x - double(m.a4)) > checkTolerance ||
               std::fabs(t.y - double(m.b4)) > checkTolerance ||
               std::fabs(t.z - double(m.c4)) > checkTolerance;
    double largest = 0;
    for (unsigned row = 0; row < 3; ++row) {
        for (unsigned column = 0; column < 3; ++column) {
            double value = 0;
            for (unsigned k = 0; k < 3; ++k)
                value += r[row][k] * h[k][column];
            value *= s[column];
            const double difference = std::fabs(value - double(m[row][column]));
            // A NaN difference counts as off as well.
            if (!(difference <= checkTolerance))
                off = true;
            largest = std::max(largest, difference);
        }
    }
    if (off)
        base::logFormatted(base::logAll, base::logDebug,
                           "assimp import {}| Matrix decomposition error detected of magnitude "
                           "{:f10}!",
                           node.name(), largest);
}

} // namespace

void setTransform(scene::INode& node, const aiMatrix4x4& m) {
    const base::vec3d t{m.a4, m.b4, m.c4};
    Vec c0{m.a1, m.b1, m.c1};
    Vec c1{m.a2, m.b2, m.c2};
    Vec c2{m.a3, m.b3, m.c3};

    double sx = std::sqrt(dot(c0, c0));
    if (sx > scaleEpsilon)
        c0 = scaled(c0, 1 / sx);

    double hxy = dot(c0, c1);
    c1 = minus(c1, scaled(c0, hxy));
    double sy = std::sqrt(dot(c1, c1));
    // A degenerate axis keeps its shear undivided: dividing by a zero scale
    // would store an infinite or NaN factor.
    if (sy > scaleEpsilon) {
        c1 = scaled(c1, 1 / sy);
        hxy /= sy;
    }

    double hxz = dot(c0, c2);
    c2 = minus(c2, scaled(c0, hxz));
    double hyz = dot(c1, c2);
    c2 = minus(c2, scaled(c1, hyz));
    double sz = std::sqrt(dot(c2, c2));
    if (sz > scaleEpsilon) {
        c2 = scaled(c2, 1 / sz);
        hxz /= sz;
        hyz /= sz;
    }

    // A mirroring matrix: flip every axis so the columns form a rotation.
    if (!(dot(c0, cross(c1, c2)) >= 0)) {
        sx = -sx;
        sy = -sy;
        sz = -sz;
        c0 = scaled(c0, -1);
        c1 = scaled(c1, -1);
        c2 = scaled(c2, -1);
    }

    // R[r][c] is component r of column c.
    const double r00 = c0.x, r10 = c0.y, r20 = c0.z;
    const double r01 = c1.x, r11 = c1.y, r21 = c1.z;
    const double r02 = c2.x, r12 = c2.y, r22 = c2.z;
    double w, x, y, z;
    const double trace = r00 + r11 + r22 + 1;
    if (trace > 0.0001) {
        const double s = 0.5 / std::sqrt(trace);
        w = 0.25 / s;
        x = (r21 - r12) * s;
        y = (r02 - r20) * s;
        z = (r10 - r01) * s;
    } else if (r00 > r11 && r00 > r22) {
        const double root = std::sqrt(1 + r00 - r11 - r22), k = 0.5 / root;
        x = root / 2;
        y = (r01 + r10) * k;
        z = (r02 + r20) * k;
        w = (r21 - r12) * k;
    } else if (r11 > r22) {
        const double root = std::sqrt(1 + r11 - r00 - r22), k = 0.5 / root;
        x = (r01 + r10) * k;
        y = root / 2;
        z = (r12 + r21) * k;
        w = (r02 - r20) * k;
    } else {
        const double root = std::sqrt(1 + r22 - r00 - r11), k = 0.5 / root;
        x = (r02 + r20) * k;
        y = (r12 + r21) * k;
        z = root / 2;
        w = (r10 - r01) * k;
    }

    const base::vec3f shear{float(hxy), float(hxz), float(hyz)};
    const base::quatf rotate{float(w), float(x), float(y), float(z)};
    const base::vec3f scale{float(sx), float(sy), float(sz)};
    const bool sheared = std::fabs(shear.x) > shearEpsilon || std::fabs(shear.y) > shearEpsilon ||
                         std::fabs(shear.z) > shearEpsilon;

    node.setAttribute(scene::node_schema::translate(), t);
    if (sheared)
        node.setAttribute(scene::node_schema::shear(), shear);
    node.setAttribute(scene::node_schema::rotate(), rotate);
    node.setAttribute(scene::node_schema::scale(), scale);

    if (base::log().maxLevel() >= base::logDebug)
        checkDecomposition(node, m, t, sheared ? shear : base::vec3f{0, 0, 0}, rotate, scale);
}

base::ref<scene::INode> AssimpImporter::importNode(const aiScene* scene, const aiNode* node,
                                                   TextureList& embeddedTextures) {
    if (auto found = m_nodeMemo.find(node); found != m_nodeMemo.end())
        return base::ref<scene::INode>(found->second);

    base::ref<base::IPlugin> object =
        m_factory->create(scene::node_schema::type(), base::PluginFactory::createNullIfUnknown |
                                                          base::PluginFactory::createReportUnknown);
    base::ref<scene::INode> result(dynamic_cast<scene::INode*>(object.get()));
    if (!result)
        return result;
    m_nodeMemo[node] = result.get();

    const char* sourceName = node->mName.length ? node->mName.C_Str() : "node";
    result->setAttribute(scene::node_schema::name(), m_factory->uniqueName(sourceName));

    setTransform(*result, node->mTransformation);

    auto* children = result->vecAttribute<base::ref<base::IPlugin>>(scene::node_schema::children());
    if (!children)
        return result;
    children->items().clear();
    children->items().reserve((node->mChildren ? std::size_t(node->mNumChildren) : 0) +
                              (node->mMeshes ? node->mNumMeshes : 0));
    // Some readers leave holes in the child list (the raw format does): a
    // missing child is skipped, not followed.
    for (unsigned i = 0; node->mChildren && i < node->mNumChildren; ++i) {
        if (!node->mChildren[i])
            continue;
        base::ref<scene::INode> child = importNode(scene, node->mChildren[i], embeddedTextures);
        children->items().push_back(base::ref<base::IPlugin>(child.get()));
    }

    // Meshes follow the child nodes; a mesh index outside the scene's list is skipped.
    for (unsigned i = 0; node->mMeshes && i < node->mNumMeshes; ++i) {
        const unsigned index = node->mMeshes[i];
        if (!scene->mMeshes || index >= scene->mNumMeshes)
            continue;
        if (base::ref<scene::IGeometry> mesh =
                importMesh(scene, scene->mMeshes[index], embeddedTextures))
            children->items().push_back(base::ref<base::IPlugin>(mesh.get()));
    }

    return result;
}

} // namespace as

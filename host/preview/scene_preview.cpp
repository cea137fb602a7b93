#include "scene_preview.h"

#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"
#include "b_type_traits.h"
#include "scene_geometry.h"
#include "scene_getter.h"
#include "scene_interfaces.h"
#include "scene_schema.h"
#include "stream/b_fs.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <unordered_map>
#include <unordered_set>

namespace host::preview {

namespace {

using base::IPlugin;
using base::mat43;
using base::vec3d;
using base::vec3f;
using PluginRef = base::ref<IPlugin>;
namespace names = scene::names;

const vec3f background{0.05f, 0.06f, 0.08f};
const vec3f grey{0.8f, 0.8f, 0.8f};
const vec3f dotColor{0.95f, 0.75f, 0.2f};
// Vertical field of view of the framed view.
constexpr double framedFov = 40 * std::numbers::pi / 180;
// Texture files read for a tint are refused beyond this size.
constexpr std::uint64_t maxTextureBytes = std::uint64_t(64) << 20;

struct MeshInstance {
    const IPlugin* mesh;
    mat43 world;
};

struct CameraInstance {
    const IPlugin* camera;
    mat43 world;
};

// What a walk from the scene's root finds.
struct SceneContent {
    base::vector<MeshInstance> meshes;
    base::vector<vec3d> nodes;
    base::vector<CameraInstance> cameras;
    base::box3d meshBounds = base::box3d::empty();
};

const IPlugin* pluginOf(const base::AttribMap& map, base::name_id name) {
    const PluginRef* value = map.findAttribute<PluginRef>(name);
    return value ? value->get() : nullptr;
}

bool isNode(const IPlugin& plugin) {
    return scene::query<scene::IHierarchical>(plugin);
}

// Each mesh's own box, asked once however many nodes use the mesh.
using MeshBoxes = std::unordered_map<const IPlugin*, base::box3d>;

void addMesh(SceneContent& content, MeshBoxes& boxes, const IPlugin& mesh, const mat43& world) {
    content.meshes.push_back({&mesh, world});
    auto [slot, fresh] = boxes.try_emplace(&mesh, base::box3d::empty());
    if (fresh)
        if (auto* bounded = scene::query<scene::IBounded>(mesh))
            // Mode 1 answers a stored box as it is; the importer stores one.
            bounded->computeBounds(slot->second, 1, false);
    content.meshBounds.unite(slot->second.transformed(world));
}

// Depth first, without recursion (imported hierarchies can be very deep); a
// node that is its own ancestor is not entered again.
SceneContent walkScene(const IPlugin& sceneObject) {
    SceneContent content;
    const IPlugin* root = pluginOf(sceneObject, names::root);
    if (!root || !isNode(*root))
        return content;

    struct Frame {
        const IPlugin* node;
        mat43 world;
        const base::ArrayOf<PluginRef>* children;
        std::size_t next;
    };
    base::vector<Frame> stack;
    std::unordered_set<const IPlugin*> onPath;
    MeshBoxes boxes;
    auto enter = [&](const IPlugin& node, const mat43& parent) {
        if (!SCENE_GET(node, scene::node_schema, visible) || onPath.count(&node))
            return;
        const mat43 local = scene::query<scene::IHierarchical>(node)->localTransformation();
        const mat43 world =
            SCENE_GET(node, scene::node_schema, inheritsTransform) ? parent * local : local;
        content.nodes.push_back(world.t);
        onPath.insert(&node);
        stack.push_back(
            {&node, world, node.findVecAttribute<PluginRef>(names::children), std::size_t(0)});
    };
    enter(*root, mat43::identity());
    while (!stack.empty()) {
        Frame& frame = stack.back();
        if (!frame.children || frame.next >= frame.children->size()) {
            onPath.erase(frame.node);
            stack.pop_back();
            continue;
        }
        const IPlugin* child = (*frame.children)[frame.next++].get();
        if (!child)
            continue;
        const base::name_id type = child->className();
        if (type == names::mesh) {
            addMesh(content, boxes, *child, frame.world);
        } else if (type == names::skin) {
            const IPlugin* base = pluginOf(*child, names::baseMesh);
            if (base && base->className() == names::mesh)
                addMesh(content, boxes, *base, frame.world);
        } else if (type == names::camera) {
            content.cameras.push_back({child, frame.world});
        } else if (isNode(*child)) {
            const mat43 world = frame.world; // enter() may reallocate the stack
            enter(*child, world);
        }
    }
    return content;
}

View framedView(const base::box3d& bounds, std::uint8_t upAxis, std::uint32_t size) {
    vec3d center{0, 0, 0};
    double radius = 1;
    if (!bounds.isEmpty()) {
        center = (bounds.min + bounds.max) * 0.5;
        const double half = ((bounds.max - bounds.min) * 0.5).length();
        if (half > 0 && std::isfinite(half))
            radius = half;
    }
    // Up, front and right of each up axis; right = up x front.
    static const vec3d ups[3] = {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}};
    static const vec3d fronts[3] = {{0, 0, 1}, {0, 0, 1}, {0, -1, 0}};
    const vec3d& up = ups[std::min<std::uint8_t>(upAxis, 2)];
    const vec3d& front = fronts[std::min<std::uint8_t>(upAxis, 2)];
    const vec3d right = cross(up, front);
    const vec3d back = (up + front + right).normalized();
    const vec3d x = cross(up, back).normalized();
    const vec3d y = cross(back, x);

    View view;
    const double distance = radius / std::sin(framedFov / 2);
    view.eye = center + back * distance;
    view.toCamera = base::mat33d::fromRows(x, y, back);
    view.focal = 0.5 * size / std::tan(framedFov / 2);
    view.nearDistance = std::max(distance - radius, distance * 1e-4) * 0.5;
    return view;
}

// The view through a camera object carried by a node with 'world': its local
// -Z, with the horizontal field of view of its sensor width and focal length.
bool cameraView(const IPlugin& camera, const mat43& world, std::uint32_t size, double near,
                View& view) {
    auto column = [&](int c) { return vec3d{world.m.m[0][c], world.m.m[1][c], world.m.m[2][c]}; };
    const vec3d back = column(2).normalized();
    const vec3d x = cross(column(1), back).normalized();
    const vec3d y = cross(back, x);
    const float focal = SCENE_GET(camera, scene::camera_schema, focalLength);
    const base::vec2f sensor = SCENE_GET(camera, scene::camera_schema, sensor);
    const double tangent = 0.5 * double(sensor.x) / double(focal);
    const double check =
        x.lengthSquared() + back.lengthSquared() + tangent + world.t.lengthSquared();
    if (!(tangent > 0) || !std::isfinite(check) || std::abs(x.lengthSquared() - 1) > 1e-6 ||
        std::abs(back.lengthSquared() - 1) > 1e-6)
        return false;
    view.eye = world.t;
    view.toCamera = base::mat33d::fromRows(x, y, back);
    view.focal = 0.5 * size / tangent;
    view.nearDistance = near;
    return true;
}

View chooseView(const IPlugin& sceneObject, const SceneContent& content,
                const PreviewOptions& options) {
    // Meshes without a finite position are framed like a scene without any.
    base::box3d frame = content.meshBounds;
    if (frame.isEmpty())
        for (const vec3d& p : content.nodes)
            frame.extend(p);
    const std::uint8_t upAxis = SCENE_GET(sceneObject, scene::scene_schema, upAxis);
    View view = framedView(frame, upAxis, options.size);
    if (!options.sceneCamera)
        return view;
    const double near = std::max(view.nearDistance * 1e-3, 1e-6);
    if (!content.cameras.empty()) {
        const CameraInstance& first = content.cameras.front();
        if (cameraView(*first.camera, first.world, options.size, near, view))
            return view;
        base::logFormatted(base::logScene, base::logWarning,
                           "preview |{}| The camera cannot be looked through; the view is "
                           "framed from the scene's bounds instead.",
                           first.camera->name(true));
    } else {
        base::logFormatted(base::logScene, base::logWarning,
                           "preview| The scene has no camera; the view is framed from the "
                           "scene's bounds instead.");
    }
    return view;
}

// ---- Colours ----

// The mean colour of a texture's image, or (1, 1, 1) when it has none that
// can be read: raw pixels (stored b, g, r, a) or a PNG file, held in the
// scene or read relative to the factory's folder. Other image formats give
// no tint.
class TintCache {
public:
    TintCache(const base::PluginFactory& factory, const base::string& modelFolder)
        : m_folders{modelFolder, factory.name()} {}

    vec3f tint(const IPlugin& texture) {
        auto [slot, fresh] = m_tints.try_emplace(&texture, vec3f{1, 1, 1});
        if (fresh)
            slot->second = measure(texture);
        return slot->second;
    }

private:
    static float linear(std::uint8_t v) { return std::pow(v / 255.0f, 2.2f); }

    static vec3f mean(const std::uint8_t* bytes, std::size_t texels, std::size_t stride,
                      const int order[3]) {
        double sum[3] = {0, 0, 0};
        for (std::size_t i = 0; i < texels; ++i)
            for (int k = 0; k < 3; ++k)
                sum[k] += linear(bytes[i * stride + order[k]]);
        if (!texels)
            return {1, 1, 1};
        return {float(sum[0] / texels), float(sum[1] / texels), float(sum[2] / texels)};
    }

    static vec3f meanOfPng(std::span<const std::uint8_t> bytes) {
        static const std::uint8_t signature[8] = {0x89, 'P', 'N', 'G', '\r', '\n', 0x1a, '\n'};
        RgbImage image;
        base::string error;
        if (bytes.size() < 8 || !std::equal(signature, signature + 8, bytes.begin()) ||
            !decodePng(bytes, image, error))
            return {1, 1, 1};
        static const int rgb[3] = {0, 1, 2};
        return mean(image.rgb.data(), std::size_t(image.width) * image.height, 3, rgb);
    }

    vec3f measure(const IPlugin& texture) const {
        const base::name_id type = texture.className();
        if (type == names::embeddedTexture) {
            const auto* pixels = texture.findVecAttribute<std::uint8_t>(names::pixelData);
            static const int bgra[3] = {2, 1, 0};
            return pixels ? mean(pixels->data(), pixels->size() / 4, 4, bgra) : vec3f{1, 1, 1};
        }
        if (type != names::fileTexture)
            return {1, 1, 1};
        if (texture.findInherited(names::embeddedFile)) {
            const auto* bytes = texture.findVecAttribute<std::uint8_t>(names::embeddedFile);
            return bytes ? meanOfPng(*bytes) : vec3f{1, 1, 1};
        }
        const base::string* file = texture.findAttribute<base::string>(names::file);
        if (!file || file->empty())
            return {1, 1, 1};
        for (const base::string& folder : m_folders) {
            if (file->front() != '/' && folder.empty())
                continue;
            const base::string path = file->front() == '/' ? *file : folder + *file;
            try {
                base::Stream stream = base::fs::master().open(path, base::fs::openRead);
                const std::uint64_t size = stream.getSize();
                if (size > maxTextureBytes)
                    return {1, 1, 1};
                base::vector<std::uint8_t> bytes(size);
                bytes.resize(stream.read(bytes.data(), size));
                return meanOfPng(bytes);
            } catch (const base::exception&) {
                // Not there: an unreadable texture only loses its tint.
            }
        }
        return {1, 1, 1};
    }

    base::string m_folders[2];
    std::unordered_map<const IPlugin*, vec3f> m_tints;
};

vec3f primitiveColor(const base::AttribMap& primitive, TintCache& tints) {
    const auto* materials = primitive.findVecAttribute<PluginRef>(names::materials);
    if (!materials)
        return grey;
    for (const PluginRef& entry : *materials) {
        const IPlugin* material = entry.get();
        if (!material)
            continue;
        vec3f color = scene::get(*material, names::color, grey);
        if (material->findInherited(names::colorMap))
            if (const IPlugin* map = pluginOf(*material, names::colorMap)) {
                const vec3f t = tints.tint(*map);
                color = {color.x * t.x, color.y * t.y, color.z * t.z};
            }
        return color;
    }
    return grey;
}

// ---- Drawing ----

// The single face size of a primitive, or its per-face sizes.
struct FaceSizes {
    std::uint16_t single = 0;
    const base::ArrayOf<std::uint16_t>* each = nullptr;
};

FaceSizes faceSizes(const base::AttribMap& primitive) {
    FaceSizes sizes;
    base::Attribute* vcounts = primitive.findInherited(names::vcounts);
    if (vcounts)
        if (base::AttribLink* link = vcounts->asLink())
            vcounts = link->resolve();
    if (!vcounts)
        return sizes;
    if (vcounts->typeName() == base::TypeTraits<std::uint16_t>::n_name)
        sizes.single = *static_cast<const std::uint16_t*>(vcounts->data());
    else if (vcounts->typeName() == base::TypeTraits<std::uint16_t>::n_array_name)
        sizes.each = static_cast<const base::ArrayOf<std::uint16_t>*>(vcounts->data());
    return sizes;
}

// Faces of 'sizes' over indices[begin, end): polygons as fans, then lines
// and points. A face that would run past the range ends the primitive.
void drawFaces(Raster& raster, std::span<const std::uint32_t> indices, std::size_t begin,
               std::size_t end, const FaceSizes& sizes, const vec3f& color, std::uint32_t object) {
    auto face = [&](std::size_t at, std::size_t corners) {
        if (corners == 1)
            raster.point(indices[at], color, object);
        else if (corners == 2)
            raster.line(indices[at], indices[at + 1], color, object);
        for (std::size_t k = 1; k + 1 < corners; ++k)
            raster.triangle(indices[at], indices[at + k], indices[at + k + 1], color, object);
    };
    if (sizes.each) {
        for (std::uint16_t corners : *sizes.each) {
            if (corners > end - begin)
                return;
            face(begin, corners);
            begin += corners;
        }
    } else if (sizes.single) {
        for (; sizes.single <= end - begin; begin += sizes.single)
            face(begin, sizes.single);
    }
}

void drawMesh(Raster& raster, const IPlugin& mesh, std::span<const std::uint32_t> indices,
              const mat43& world, std::uint32_t object, TintCache& tints) {
    const auto* positions = mesh.findVecAttribute<vec3f>(names::positions);
    if (!positions || positions->empty())
        return;
    raster.setVertices({positions->data(), positions->size()}, world);
    const base::AttribArray* primitives = mesh.findArray(names::primitives);
    if (indices.empty()) {
        // A point cloud: vertices without faces, in the first primitive's colour.
        base::Attribute* first =
            primitives && primitives->size() ? primitives->items().front() : nullptr;
        const base::AttribMap* primitive = first ? first->asMap() : nullptr;
        const vec3f color = primitive ? primitiveColor(*primitive, tints) : grey;
        for (std::uint32_t i = 0; i < positions->size(); ++i)
            raster.point(i, color, object);
        return;
    }
    if (!primitives) {
        drawFaces(raster, indices, 0, indices.size(), FaceSizes{3, nullptr}, grey, object);
        return;
    }
    for (base::Attribute* item : primitives->items()) {
        const base::AttribMap* primitive = item ? item->asMap() : nullptr;
        if (!primitive || SCENE_GET(*primitive, scene::meshPrimitive_schema, invisible))
            continue;
        const std::size_t start =
            std::min<std::size_t>(scene::get(*primitive, names::indexStart, 0u), indices.size());
        const std::size_t count = std::min<std::size_t>(
            scene::get(*primitive, names::indexCount, std::uint32_t(indices.size() - start)),
            indices.size() - start);
        drawFaces(raster, indices, start, start + count, faceSizes(*primitive),
                  primitiveColor(*primitive, tints), object);
    }
}

} // namespace

View previewView(const IPlugin& scene, const PreviewOptions& options) {
    return chooseView(scene, walkScene(scene), options);
}

RgbImage renderPreview(const base::PluginFactory& factory, const IPlugin& sceneObject,
                       const PreviewOptions& options, RasterStats* stats) {
    const SceneContent content = walkScene(sceneObject);
    Raster raster(options.size, options.size, chooseView(sceneObject, content, options),
                  background);
    TintCache tints(factory, options.modelFolder);
    std::uint32_t object = 0;

    // Instances of one mesh are drawn together, so coded indices are decoded
    // once per mesh.
    std::unordered_map<const IPlugin*, base::vector<std::size_t>> byMesh;
    base::vector<const IPlugin*> order;
    for (std::size_t i = 0; i < content.meshes.size(); ++i) {
        auto& list = byMesh[content.meshes[i].mesh];
        if (list.empty())
            order.push_back(content.meshes[i].mesh);
        list.push_back(i);
    }
    for (const IPlugin* mesh : order) {
        base::ArrayOf<std::uint32_t> decoded;
        std::span<const std::uint32_t> indices;
        if (SCENE_GET(*mesh, scene::mesh_schema, indicesDeltaCompression)) {
            decoded = scene::decodeMeshIndices(*mesh);
            indices = {decoded.data(), decoded.size()};
        } else if (const auto* plain = mesh->findVecAttribute<std::uint32_t>(names::indices)) {
            indices = {plain->data(), plain->size()};
        }
        for (std::size_t i : byMesh[mesh])
            drawMesh(raster, *mesh, indices, content.meshes[i].world, ++object, tints);
    }
    // Nothing drawn (no meshes, or none with a visible face): the nodes show
    // where the scene's content is.
    if (raster.stats().pixelsWritten == 0) {
        const int radius = int(std::max<std::uint32_t>(2, options.size / 128));
        for (const vec3d& p : content.nodes)
            raster.dot(p, radius, dotColor, ++object);
    }
    raster.finish();
    if (stats)
        *stats = raster.stats();
    return {raster.width(), raster.height(), raster.pixels()};
}

bool writePreview(const base::PluginFactory& factory, const IPlugin& scene,
                  const base::string& path, const PreviewOptions& options, base::string& error) {
    const RgbImage image = renderPreview(factory, scene, options);
    base::vector<std::uint8_t> png;
    if (!encodePng(image, png, error)) {
        error = base::format("cannot encode the preview: {}", error);
        return false;
    }
    try {
        base::Stream stream = base::fs::master().open(
            path, base::fs::openWrite | base::fs::openCreate | base::fs::openTruncate);
        const bool written = stream.write(png.data(), png.size()) == png.size();
        stream.close();
        if (!written) {
            error = base::format("cannot write '{}'", path);
            return false;
        }
    } catch (const base::exception& e) {
        error = base::format("cannot write '{}': {}", path, e.message());
        return false;
    }
    return true;
}

} // namespace host::preview

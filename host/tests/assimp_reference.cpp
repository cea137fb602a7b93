// assimp's own answer for the corpus sweep, independent of the host and the
// module: reads MODEL with Assimp::Importer::ReadFile and the importer's
// default options (structure validation included), with assimp's own vertex
// join, and answers 0 when assimp returns a scene with a root node, 1
// otherwise.
//
// Given the host's JSON document as well, it checks the document: it must
// parse, and when it holds "mesh" objects, the meshes referenced by assimp's
// nodes must appear in it once each with assimp's vertex and face counts
// (arrays the shared-array pool replaced by links are followed). The host
// reads without assimp's join and welds vertices itself, so this is where its
// welding is compared with assimp's: the first line of the answer is
// "meshes: N compared, D differ", D counting assimp's meshes whose counts the
// document does not hold, followed by the counts on each side. Every
// material but assimp's default one must be a "principalMaterial", with the
// textures of its classic slots present.
//
// Given the host's listing of cameras and lights as well (scene-import --list
// cameras,lights), it checks that each camera and light of assimp's scene is
// listed, in order, at the world position and view direction assimp's scene
// implies: the global transform of the node named like the object applied to
// its local frame (the root's transform for an object without a node), to
// 1e-4 relative. A glTF camera whose position repeats its node's translation
// counts from the node's origin, as the importer takes it.
//
// With a document it also prints "playback-times: T..." when the scene has
// node animations: five times spread over each animation, ends included.
// Given the host's "--time T... --list poses" output for those times, it
// checks that every animated node (with a name that is unique in the tree)
// has the translation, rotation and scale that linear interpolation and
// slerp of assimp's keys give, to 1e-4.
//
//   assimp-reference MODEL [DOCUMENT.json [LISTING]]
//   assimp-reference --poses MODEL POSES.txt
//   exit 0 read (and the document matches), 1 assimp rejects MODEL,
//        4 mesh counts differ, 5 the document does not parse, 2 usage,
//        6 a camera or light is missing or misplaced (or, with --poses,
//        a played pose differs), 7 materials or textures differ
//
// It links nothing of the project and is built without the sanitizers, so
// it can run under an address-space cap.
#include <assimp/Importer.hpp>
#include <assimp/material.h>
#include <assimp/postprocess.h>
#include <assimp/scene.h>
#include <rapidjson/document.h>
#include <rapidjson/error/en.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

namespace {

// What the importer asks of assimp with every option at its default, with
// assimp's vertex join, which the importer replaced by its own welding.
constexpr unsigned defaultFlags = aiProcess_JoinIdenticalVertices | aiProcess_GenSmoothNormals |
                                  aiProcess_FindInstances | aiProcess_ValidateDataStructure;
static_assert(defaultFlags == 0x100442);

// ASSIMP_REFERENCE_FLAGS (a number, 0x for hex) replaces the flag word, to
// compare the corpus under other options.
unsigned readFlags() {
    const char* text = std::getenv("ASSIMP_REFERENCE_FLAGS");
    return text && *text ? unsigned(std::strtoul(text, nullptr, 0)) : defaultFlags;
}

// The rejections of the structure check that the importer tolerates: a
// scene without meshes, a point cloud, an empty mesh, a light or camera
// without a node, a hole in the node tree.
bool tolerable(std::string_view reason) {
    for (std::string_view text :
         {"aiScene::mNumMeshes is 0", "contains no faces", "contains no vertices",
          "has no corresponding node in the scene graph", "A node of the scene-graph is nullptr"})
        if (reason.find(text) != std::string_view::npos)
            return true;
    return false;
}

using Counts = std::pair<std::uint64_t, std::uint64_t>; // vertices, faces
using Value = rapidjson::Value;

void collectMeshes(const aiNode* node, std::set<unsigned>& used, int depth = 0) {
    if (!node || depth > 10000)
        return;
    for (unsigned i = 0; i < node->mNumMeshes; ++i)
        used.insert(node->mMeshes[i]);
    for (unsigned i = 0; i < node->mNumChildren; ++i)
        collectMeshes(node->mChildren[i], used, depth + 1);
}

// The document's structure: { "type": { "attribute^type": value, ... }, ... };
// an attribute array is an object with one member per item; a link is
// [kind, value, ...] with kinds 0 object (name or id), 1 member, 2 item,
// 3 component.
class Document {
public:
    explicit Document(const Value& root) : m_root(root) {}

    const Value* attribute(const Value& object, std::string_view name, int hops = 0) const {
        if (!object.IsObject() || hops > 64)
            return nullptr;
        for (auto m = object.MemberBegin(); m != object.MemberEnd(); ++m) {
            std::string_view key(m->name.GetString(), m->name.GetStringLength());
            const std::size_t caret = key.rfind('^');
            if (caret == std::string_view::npos || key.substr(0, caret) != name)
                continue;
            if (key.substr(caret + 1) == "link")
                return follow(m->value, hops + 1);
            return &m->value;
        }
        return nullptr;
    }

    std::vector<const Value*> objectsOfType(std::string_view type) const {
        std::vector<const Value*> out;
        for (auto m = m_root.MemberBegin(); m != m_root.MemberEnd(); ++m)
            if (std::string_view(m->name.GetString(), m->name.GetStringLength()) == type)
                out.push_back(&m->value);
        return out;
    }

private:
    const Value* objectNamed(const Value& key) const {
        std::size_t index = 0;
        for (auto m = m_root.MemberBegin(); m != m_root.MemberEnd(); ++m, ++index) {
            if (key.IsUint() && index == key.GetUint())
                return &m->value;
            if (!key.IsString())
                continue;
            const Value* name = attribute(m->value, "name");
            if (name && name->IsString() && std::string_view(name->GetString()) == key.GetString())
                return &m->value;
        }
        return nullptr;
    }

    const Value* follow(const Value& link, int hops) const {
        if (!link.IsArray() || link.Size() % 2)
            return nullptr;
        const Value* at = nullptr;
        for (rapidjson::SizeType i = 0; i + 1 < link.Size(); i += 2) {
            if (!link[i].IsUint())
                return nullptr;
            const Value& step = link[i + 1];
            switch (link[i].GetUint()) {
            case 0:
                at = objectNamed(step);
                break;
            case 1:
                at = at && step.IsString() ? attribute(*at, step.GetString(), hops) : nullptr;
                break;
            case 2:
                at = at ? item(*at, step) : nullptr;
                break;
            default:
                return at;
            }
            if (!at)
                return nullptr;
        }
        return at;
    }

    static const Value* item(const Value& array, const Value& index) {
        if (!index.IsUint())
            return nullptr;
        if (array.IsArray())
            return index.GetUint() < array.Size() ? &array[index.GetUint()] : nullptr;
        if (!array.IsObject() || index.GetUint() >= array.MemberCount())
            return nullptr;
        return &(array.MemberBegin() + index.GetUint())->value;
    }

    const Value& m_root;
};

std::uint64_t itemCount(const Value* value) {
    if (!value)
        return 0;
    if (value->IsArray())
        return value->Size();
    if (value->IsObject())
        return value->MemberCount();
    return 1;
}

std::uint64_t faceCount(const Document& doc, const Value& mesh) {
    const std::uint64_t indexTotal = itemCount(doc.attribute(mesh, "indices"));
    const Value* primitives = doc.attribute(mesh, "primitives");
    if (!primitives || !primitives->IsObject())
        return 0;
    std::uint64_t faces = 0;
    for (auto p = primitives->MemberBegin(); p != primitives->MemberEnd(); ++p) {
        const Value* vcounts = doc.attribute(p->value, "vcounts");
        if (!vcounts)
            continue;
        if (vcounts->IsArray()) {
            faces += vcounts->Size();
        } else if (vcounts->IsUint() && vcounts->GetUint() > 0) {
            const Value* range = doc.attribute(p->value, "indexCount");
            const std::uint64_t indices = range && range->IsUint() ? range->GetUint() : indexTotal;
            faces += indices / vcounts->GetUint();
        }
    }
    return faces;
}

int checkMeshes(const Document& doc, const aiScene& scene);

// Every material but assimp's default one comes in as a "principalMaterial",
// and every texture at index 0 of the classic slot types is there: a file
// reference as a "fileTexture" naming that file (or its tail, once made
// relative), each embedded image with a "buffer". Answers 6 otherwise.
int checkMaterials(const Document& doc, const aiScene& scene) {
    std::size_t expected = 0;
    std::set<std::string> files;
    std::set<unsigned> embedded;
    const auto isEmbedded = [&scene](std::string_view path, unsigned& index) {
        if (path.size() > 1 && path[0] == '*') {
            if (path.find_first_not_of("0123456789", 1) != std::string_view::npos ||
                path.size() > 11)
                return false;
            index = unsigned(std::stoul(std::string(path.substr(1))));
            return index < scene.mNumTextures && scene.mTextures[index];
        }
        const auto [found, at] = scene.GetEmbeddedTextureAndIndex(std::string(path).c_str());
        index = unsigned(at);
        return found != nullptr;
    };
    for (unsigned m = 0; scene.mMaterials && m < scene.mNumMaterials; ++m) {
        const aiMaterial* material = scene.mMaterials[m];
        if (!material)
            continue;
        aiString name;
        if (material->Get(AI_MATKEY_NAME, name) == aiReturn_SUCCESS &&
            std::string_view(name.C_Str()) == AI_DEFAULT_MATERIAL_NAME)
            continue;
        ++expected;
        for (const aiTextureType type :
             {aiTextureType_DIFFUSE, aiTextureType_SPECULAR, aiTextureType_AMBIENT,
              aiTextureType_EMISSIVE, aiTextureType_HEIGHT, aiTextureType_NORMALS,
              aiTextureType_SHININESS, aiTextureType_OPACITY, aiTextureType_LIGHTMAP,
              aiTextureType_REFLECTION}) {
            aiString path;
            if (material->GetTexture(type, 0, &path) != aiReturn_SUCCESS || path.length == 0)
                continue;
            const std::string_view text(path.data, path.length);
            unsigned index = 0;
            if (isEmbedded(text, index)) {
                const aiTexture& image = *scene.mTextures[index];
                const bool readable = image.pcData || (image.mWidth == 0 && image.mHeight == 0);
                if (readable && std::uint64_t(image.mWidth) * image.mHeight < (1u << 30))
                    embedded.insert(index);
            } else if (!(text.size() > 1 && text[0] == '*')) {
                files.emplace(text);
            }
        }
    }

    const std::size_t found = doc.objectsOfType("principalMaterial").size();
    std::set<std::string> documented;
    for (const Value* texture : doc.objectsOfType("fileTexture"))
        if (const Value* file = doc.attribute(*texture, "file"); file && file->IsString())
            documented.emplace(file->GetString(), file->GetStringLength());
    std::size_t missing = 0;
    for (std::string file : files) {
        std::replace(file.begin(), file.end(), '\\', '/');
        const bool there = std::any_of(documented.begin(), documented.end(), [&](auto& d) {
            std::string tail = d;
            std::replace(tail.begin(), tail.end(), '\\', '/');
            return tail == file || (file.size() > tail.size() && file.ends_with("/" + tail));
        });
        if (!there) {
            std::printf("texture missing: %s; ", file.c_str());
            ++missing;
        }
    }
    const std::size_t buffers = doc.objectsOfType("buffer").size();
    std::printf("materials: %zu expected, %zu found; textures: %zu files, %zu missing; embedded "
                "images: %zu referenced, %zu buffers\n",
                expected, found, files.size(), missing, embedded.size(), buffers);
    // Images reached only through other texture types (glTF's packed image,
    // displacement maps) have buffers too, but never more than the scene holds.
    const bool imagesThere = buffers >= embedded.size() && buffers <= scene.mNumTextures;
    return expected == found && missing == 0 && imagesThere ? 0 : 7;
}

int checkDocument(const char* path, const aiScene& scene) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    const std::string json = text.str();
    rapidjson::Document parsed;
    parsed.Parse<rapidjson::kParseNanAndInfFlag>(json.c_str(), json.size());
    if (parsed.HasParseError() || !parsed.IsObject()) {
        std::fprintf(stderr, "%s: JSON error at %zu: %s\n", path, parsed.GetErrorOffset(),
                     rapidjson::GetParseError_En(parsed.GetParseError()));
        return 5;
    }
    const Document doc(parsed);
    const int meshes = checkMeshes(doc, scene);
    const int materials = checkMaterials(doc, scene);
    return meshes ? meshes : materials;
}

int checkMeshes(const Document& doc, const aiScene& scene) {
    const std::vector<const Value*> meshes = doc.objectsOfType("mesh");
    if (meshes.empty()) {
        std::puts("meshes: none in the document, not compared");
        return 0;
    }
    std::set<unsigned> used;
    collectMeshes(scene.mRootNode, used);
    std::vector<Counts> expected, found;
    for (unsigned index : used)
        if (index < scene.mNumMeshes)
            expected.emplace_back(scene.mMeshes[index]->mNumVertices,
                                  scene.mMeshes[index]->mNumFaces);
    for (const Value* mesh : meshes)
        found.emplace_back(itemCount(doc.attribute(*mesh, "positions")), faceCount(doc, *mesh));
    std::sort(expected.begin(), expected.end());
    std::sort(found.begin(), found.end());
    std::vector<Counts> missing, extra;
    std::set_difference(expected.begin(), expected.end(), found.begin(), found.end(),
                        std::back_inserter(missing));
    std::set_difference(found.begin(), found.end(), expected.begin(), expected.end(),
                        std::back_inserter(extra));
    // Each of assimp's meshes without its counts in the document differs,
    // also one the document lacks altogether.
    std::printf("meshes: %zu compared, %zu differ", expected.size(), missing.size());
    if (found.size() != expected.size())
        std::printf("; %zu in the document", found.size());
    for (const auto& [v, f] : missing)
        std::printf("; missing %llu/%llu", (unsigned long long)v, (unsigned long long)f);
    for (const auto& [v, f] : extra)
        std::printf("; unexpected %llu/%llu", (unsigned long long)v, (unsigned long long)f);
    std::puts("");
    return missing.empty() && extra.empty() ? 0 : 4;
}

// ---- Cameras and lights ----

struct Listed {
    std::string kind, name, path;
    double position[3] = {}, direction[3] = {};
    bool placed = false;
};

std::vector<Listed> readListing(const char* path) {
    std::vector<Listed> out;
    std::ifstream in(path);
    for (std::string line; std::getline(in, line);) {
        std::vector<std::string> fields;
        std::istringstream split(line);
        for (std::string field; std::getline(split, field, '\t');)
            fields.push_back(field);
        if (fields.size() < 3)
            continue;
        Listed entry{fields[0], fields[1], fields[2]};
        for (std::size_t i = 3; i < fields.size(); ++i) {
            std::istringstream values(fields[i]);
            std::string label;
            values >> label;
            double* target = label == "position"    ? entry.position
                             : label == "direction" ? entry.direction
                                                    : nullptr;
            if (target && values >> target[0] >> target[1] >> target[2])
                entry.placed = true;
        }
        out.push_back(entry);
    }
    return out;
}

aiMatrix4x4 globalTransform(const aiScene& scene, const aiString& name) {
    const aiNode* node = name.length ? scene.mRootNode->FindNode(name) : nullptr;
    if (!node)
        return scene.mRootNode->mTransformation;
    aiMatrix4x4 global;
    for (int depth = 0; node && depth < 10000; node = node->mParent, ++depth)
        global = node->mTransformation * global;
    return global;
}

bool isGltf(std::string path) {
    std::transform(path.begin(), path.end(), path.begin(),
                   [](unsigned char c) { return char(std::tolower(c)); });
    return path.ends_with(".gltf") || path.ends_with(".glb");
}

bool finite(const aiVector3D& v) {
    return std::isfinite(v.x) && std::isfinite(v.y) && std::isfinite(v.z);
}

// Within 1e-4 of the expected vector's length (at least 1e-4 absolute).
bool near(const double (&found)[3], const aiVector3D& expected) {
    const double tolerance = 1e-4 * std::max(1.0, double(expected.Length()));
    return std::fabs(found[0] - expected.x) <= tolerance &&
           std::fabs(found[1] - expected.y) <= tolerance &&
           std::fabs(found[2] - expected.z) <= tolerance;
}

// Objects whose node or an ancestor of it an animation channel drives.
std::size_t animatedFrames = 0;

bool animated(const aiScene& scene, const aiString& name) {
    const aiNode* node = name.length ? scene.mRootNode->FindNode(name) : nullptr;
    for (int depth = 0; node && depth < 10000; node = node->mParent, ++depth)
        for (unsigned a = 0; scene.mAnimations && a < scene.mNumAnimations; ++a)
            if (const aiAnimation* animation = scene.mAnimations[a])
                for (unsigned c = 0; animation->mChannels && c < animation->mNumChannels; ++c)
                    if (animation->mChannels[c] &&
                        animation->mChannels[c]->mNodeName == node->mName)
                        return true;
    return false;
}

// Compares one object; appends what differs to 'problems'.
void checkFrame(const aiScene& scene, const Listed* listed, const char* kind, const aiString& name,
                aiVector3D position, const aiVector3D& direction, std::string& problems) {
    const std::string label = std::string(kind) + " '" + name.C_Str() + "'";
    if (!listed || listed->kind != kind) {
        problems += "; " + label + " not listed";
        return;
    }
    if (!listed->placed) {
        problems += "; " + label + " not in the scene";
        return;
    }
    // Under an animated node the scene stands at its played pose, not at the
    // nodes' rest transforms: the playback check judges those.
    if (animated(scene, name)) {
        ++animatedFrames;
        return;
    }
    const aiMatrix4x4 global = globalTransform(scene, name);
    char text[200];
    if (finite(position)) {
        const aiVector3D p = global * position;
        if (!near(listed->position, p)) {
            std::snprintf(text, sizeof text, "; %s at (%g, %g, %g), assimp (%g, %g, %g)",
                          label.c_str(), listed->position[0], listed->position[1],
                          listed->position[2], p.x, p.y, p.z);
            problems += text;
        }
    }
    aiVector3D d = aiMatrix3x3(global) * direction;
    // A point light has no direction; a degenerate node none either.
    if (finite(d) && d.Length() > 1e-12f) {
        d.Normalize();
        if (!near(listed->direction, d)) {
            std::snprintf(text, sizeof text, "; %s looks (%g, %g, %g), assimp (%g, %g, %g)",
                          label.c_str(), listed->direction[0], listed->direction[1],
                          listed->direction[2], d.x, d.y, d.z);
            problems += text;
        }
    }
}

int checkCamerasAndLights(const char* model, const char* listingPath, const aiScene& scene) {
    // Each kind in its source order; the listing prints cameras first.
    std::vector<Listed> listedCameras, listedLights;
    for (Listed& entry : readListing(listingPath))
        (entry.kind == "camera" ? listedCameras : listedLights).push_back(std::move(entry));
    std::string problems;
    std::size_t lights = 0, cameras = 0;
    auto at = [](const std::vector<Listed>& list, std::size_t i) {
        return i < list.size() ? &list[i] : nullptr;
    };
    for (unsigned i = 0; scene.mLights && i < scene.mNumLights; ++i)
        if (const aiLight* light = scene.mLights[i]) {
            checkFrame(scene, at(listedLights, lights++), "light", light->mName, light->mPosition,
                       light->mDirection, problems);
        }
    const bool gltf = isGltf(model);
    for (unsigned i = 0; scene.mCameras && i < scene.mNumCameras; ++i)
        if (const aiCamera* camera = scene.mCameras[i]) {
            aiVector3D position = camera->mPosition;
            // The glTF reader repeats the node's translation in the camera.
            const aiNode* node =
                camera->mName.length ? scene.mRootNode->FindNode(camera->mName) : nullptr;
            if (gltf && node &&
                position == aiVector3D(node->mTransformation.a4, node->mTransformation.b4,
                                       node->mTransformation.c4))
                position = aiVector3D();
            checkFrame(scene, at(listedCameras, cameras++), "camera", camera->mName, position,
                       camera->mLookAt, problems);
        }
    if (listedCameras.size() + listedLights.size() != cameras + lights)
        problems += "; " + std::to_string(listedCameras.size()) + " cameras and " +
                    std::to_string(listedLights.size()) + " lights listed";
    std::printf("frames: cameras %zu lights %zu (%zu on animated nodes)%s\n", cameras, lights,
                animatedFrames, problems.empty() ? " match" : problems.c_str());
    return problems.empty() ? 0 : 6;
}

// ---- Playback ----

constexpr double ticksPerSecond = 46186158000.0;

double rateOf(const aiAnimation& a) {
    return a.mTicksPerSecond > 0 && std::isfinite(a.mTicksPerSecond) ? a.mTicksPerSecond : 25.0;
}

std::int64_t sceneTicks(double ticks, double rate) {
    const double t = ticks / rate * ticksPerSecond;
    if (t >= 9223372036854775807.0)
        return INT64_MAX;
    if (!(t > -9223372036854775807.0))
        return INT64_MIN;
    return std::int64_t(t);
}

// One animated attribute: key times in scene ticks and values (x, y, z or
// w, x, y, z), sorted by time, keys at non-finite times left out.
struct Track {
    std::vector<std::int64_t> times;
    std::vector<std::array<double, 4>> values;
    bool rotation = false;
};

template <class Key>
Track trackOf(const Key* keys, unsigned count, double rate, bool rotation) {
    std::vector<const Key*> sorted;
    for (unsigned k = 0; keys && k < count; ++k)
        if (std::isfinite(keys[k].mTime))
            sorted.push_back(&keys[k]);
    std::stable_sort(sorted.begin(), sorted.end(),
                     [](const Key* a, const Key* b) { return a->mTime < b->mTime; });
    Track track;
    track.rotation = rotation;
    for (const Key* k : sorted) {
        track.times.push_back(sceneTicks(k->mTime, rate));
        if constexpr (std::is_same_v<Key, aiQuatKey>)
            track.values.push_back({k->mValue.w, k->mValue.x, k->mValue.y, k->mValue.z});
        else
            track.values.push_back({k->mValue.x, k->mValue.y, k->mValue.z, 0});
    }
    return track;
}

// The last animation's track wins for each (node, attribute 0/1/2).
std::map<std::pair<std::string, int>, Track> animatedTracks(const aiScene& scene) {
    std::map<std::pair<std::string, int>, Track> tracks;
    for (unsigned a = 0; scene.mAnimations && a < scene.mNumAnimations; ++a) {
        const aiAnimation* anim = scene.mAnimations[a];
        for (unsigned c = 0; anim && anim->mChannels && c < anim->mNumChannels; ++c) {
            const aiNodeAnim* ch = anim->mChannels[c];
            if (!ch || !scene.mRootNode->FindNode(ch->mNodeName))
                continue;
            const std::string name(ch->mNodeName.C_Str());
            const double rate = rateOf(*anim);
            Track lists[3] = {trackOf(ch->mPositionKeys, ch->mNumPositionKeys, rate, false),
                              trackOf(ch->mRotationKeys, ch->mNumRotationKeys, rate, true),
                              trackOf(ch->mScalingKeys, ch->mNumScalingKeys, rate, false)};
            for (int i = 0; i < 3; ++i)
                if (!lists[i].times.empty())
                    tracks[{name, i}] = std::move(lists[i]);
        }
    }
    return tracks;
}

std::vector<double> playbackTimes(const aiScene& scene) {
    std::set<double> times;
    for (unsigned a = 0; scene.mAnimations && a < scene.mNumAnimations; ++a) {
        const aiAnimation* anim = scene.mAnimations[a];
        double lo = INFINITY, hi = -INFINITY;
        for (unsigned c = 0; anim && anim->mChannels && c < anim->mNumChannels; ++c) {
            const aiNodeAnim* ch = anim->mChannels[c];
            if (!ch || !scene.mRootNode->FindNode(ch->mNodeName))
                continue;
            auto widen = [&](const auto* keys, unsigned n) {
                for (unsigned k = 0; keys && k < n; ++k)
                    if (std::isfinite(keys[k].mTime)) {
                        lo = std::min(lo, keys[k].mTime);
                        hi = std::max(hi, keys[k].mTime);
                    }
            };
            widen(ch->mPositionKeys, ch->mNumPositionKeys);
            widen(ch->mRotationKeys, ch->mNumRotationKeys);
            widen(ch->mScalingKeys, ch->mNumScalingKeys);
        }
        if (lo > hi)
            continue;
        // The host's switch parser would read a negative time as a switch.
        for (int i = 0; i < 5; ++i)
            if (const double t = (lo + (hi - lo) * i / 4) / rateOf(*anim); t >= 0)
                times.insert(t);
    }
    // Enough to cover many animations without one file dominating the sweep.
    std::vector<double> all(times.begin(), times.end());
    if (all.size() > 40) {
        std::vector<double> picked;
        for (std::size_t i = 0; i < 40; ++i)
            picked.push_back(all[i * (all.size() - 1) / 39]);
        all = picked;
    }
    return all;
}

// The value a track plays at 'ticks': constant before and after its keys,
// a key's own value within a microsecond after it, otherwise linear (slerp
// along the shorter arc for rotations) between the keys around the time.
std::array<double, 4> play(const Track& track, std::int64_t ticks) {
    const auto& t = track.times;
    const std::size_t k = std::size_t(std::upper_bound(t.begin(), t.end(), ticks) - t.begin());
    if (k == 0)
        return track.values.front();
    const std::size_t s = k - 1;
    if (k == t.size() || double(ticks) - double(t[s]) <= 46186)
        return track.values[s];
    const double u = (double(ticks) - double(t[s])) / (double(t[k]) - double(t[s]));
    std::array<double, 4> a = track.values[s], b = track.values[k], out{};
    double ka = 1 - u, kb = u;
    if (track.rotation) {
        double dot = a[0] * b[0] + a[1] * b[1] + a[2] * b[2] + a[3] * b[3];
        if (dot < 0) {
            dot = -dot;
            for (double& x : b)
                x = -x;
        }
        if (dot < 1) {
            const double angle = std::acos(dot), sine = std::sin(angle);
            if (sine > 1e-6) {
                ka = std::sin((1 - u) * angle) / sine;
                kb = std::sin(u * angle) / sine;
            }
        }
    }
    for (int i = 0; i < 4; ++i)
        out[i] = a[i] * ka + b[i] * kb;
    return out;
}

bool close(const std::array<double, 4>& expected, const double* found, int n, bool rotation) {
    std::array<double, 4> e = expected, f{};
    std::copy(found, found + n, f.begin());
    if (rotation) {
        double le = 0, lf = 0, dot = 0;
        for (int i = 0; i < 4; ++i)
            le += e[i] * e[i], lf += f[i] * f[i], dot += e[i] * f[i];
        if (!(le > 0) || !(lf > 0))
            return le == lf;
        for (int i = 0; i < 4; ++i)
            e[i] /= std::sqrt(le), f[i] /= std::sqrt(lf) * (dot < 0 ? -1 : 1);
    }
    for (int i = 0; i < n; ++i)
        if (!(std::abs(e[i] - f[i]) <= 1e-4 * std::max(1.0, std::abs(e[i]))))
            return std::isnan(e[i]) && std::isnan(f[i]);
    return true;
}

int checkPoses(const char* path, const aiScene& scene) {
    // Names that more than one source node carries cannot be told apart.
    std::map<std::string, int> nameCount;
    std::vector<const aiNode*> pending{scene.mRootNode};
    for (std::size_t i = 0; i < pending.size() && pending.size() < 1000000; ++i) {
        ++nameCount[pending[i]->mName.C_Str()];
        for (unsigned c = 0; pending[i]->mChildren && c < pending[i]->mNumChildren; ++c)
            if (pending[i]->mChildren[c])
                pending.push_back(pending[i]->mChildren[c]);
    }
    const auto tracks = animatedTracks(scene);
    std::ifstream in(path);
    std::string line;
    std::int64_t ticks = 0;
    std::map<std::string, std::array<double, 10>> poses;
    std::size_t checked = 0, failed = 0;
    auto judge = [&] {
        for (const auto& [key, track] : tracks) {
            const auto& [name, attribute] = key;
            const auto pose = poses.find(name);
            if (name.empty() || nameCount[name] != 1 || pose == poses.end())
                continue;
            static const int offset[] = {0, 3, 7}, width[] = {3, 4, 3};
            ++checked;
            if (!close(play(track, ticks), pose->second.data() + offset[attribute],
                       width[attribute], track.rotation)) {
                if (++failed <= 5)
                    std::printf("playback: %s attribute %d differs at %.9g s\n", name.c_str(),
                                attribute, double(ticks) / ticksPerSecond);
            }
        }
        poses.clear();
    };
    bool started = false;
    while (std::getline(in, line)) {
        if (line.rfind("time ", 0) == 0) {
            if (started)
                judge();
            started = true;
            ticks = std::llround(std::stod(line.substr(5)) * ticksPerSecond);
            continue;
        }
        const std::size_t space = line.find(' ');
        if (space == std::string::npos)
            continue;
        std::array<double, 10> values{};
        std::istringstream numbers(line.substr(space + 1));
        for (double& v : values)
            numbers >> v;
        // A name listed twice (made unique by the host) is not compared.
        const std::string name = line.substr(0, space);
        if (!poses.emplace(name, values).second)
            nameCount[name] = 2;
    }
    if (started)
        judge();
    std::printf("playback: %zu checked, %zu differ\n", checked, failed);
    return failed ? 6 : 0;
}

} // namespace

int main(int argc, char** argv) {
    const bool poses = argc == 4 && std::string_view(argv[1]) == "--poses";
    if (!poses && (argc < 2 || argc > 4)) {
        std::fputs("usage: assimp-reference MODEL [DOCUMENT.json [LISTING]]\n"
                   "       assimp-reference --poses MODEL POSES.txt\n",
                   stderr);
        return 2;
    }
    try {
        Assimp::Importer importer;
        const unsigned flags = readFlags();
        const char* model = argv[poses ? 2 : 1];
        const aiScene* scene = importer.ReadFile(model, flags);
        // The importer reads again without the structure check when it
        // rejects a shape that valid files have; so does the reference.
        Assimp::Importer unchecked;
        if (!scene && (flags & aiProcess_ValidateDataStructure) &&
            tolerable(importer.GetErrorString()))
            scene = unchecked.ReadFile(model, flags & ~aiProcess_ValidateDataStructure);
        if (!scene || !scene->mRootNode)
            return 1;
        if (poses)
            return checkPoses(argv[3], *scene);
        if (argc < 3)
            return 0;
        const int document = checkDocument(argv[2], *scene);
        const int frames = argc == 4 ? checkCamerasAndLights(argv[1], argv[3], *scene) : 0;
        if (const std::vector<double> times = playbackTimes(*scene); !times.empty()) {
            std::fputs("playback-times:", stdout);
            for (double t : times)
                std::printf(" %.17g", t);
            std::fputs("\n", stdout);
        }
        return document ? document : frames;
    } catch (const std::bad_alloc&) {
        // An allocation cap hit counts as a rejection, as assimp's own would.
        return 1;
    } catch (const std::exception& e) {
        std::fprintf(stderr, "assimp-reference: %s\n", e.what());
        return 1;
    }
}

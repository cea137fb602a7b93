// Skins: the bind pose and per-vertex joint weights of a mesh with bones, and
// the binding of each skin's joints to the nodes of the scene.
//
// A weight's joint index is the bone's position in the mesh's bone list, so
// "joints" keeps one entry per bone in that order, even for a bone that names
// no node.
#include "as_importer.h"
#include "as_mesh.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"
#include "scene_schema.h"

#include <assimp/mesh.h>
#include <assimp/scene.h>

#include <algorithm>
#include <cfloat>

namespace as {

namespace names = scene::names;

namespace {

struct VertexJointData {
    std::uint16_t joint;
    float weight;
};

base::mat43 bindTransform(const aiMatrix4x4& offset) {
    base::mat43 transform{};
    const ai_real* rows[3] = {offset[0], offset[1], offset[2]};
    for (int r = 0; r < 3; ++r) {
        for (int c = 0; c < 3; ++c)
            transform.m.m[r][c] = float(rows[r][c]);
        transform.t[r] = double(rows[r][3]);
    }
    return transform;
}

std::string_view boneName(const aiBone* bone) {
    return bone ? std::string_view(bone->mName.data, bone->mName.length) : std::string_view();
}

template <class Count>
void writeCounts(base::AttribMap& set, const base::vector<std::uint32_t>& counts,
                 std::uint32_t maximum) {
    set.setAttribute<Count>(names::maxVertexJoints, Count(maximum));
    if (auto* attribute = set.vecAttribute<Count>(names::jointCounts)) {
        auto& items = attribute->items();
        items.resize(counts.size());
        for (std::size_t v = 0; v < counts.size(); ++v)
            items[v] = Count(counts[v]);
    }
}

} // namespace

base::ref<scene::IGeometry> buildSkin(base::PluginFactory& factory, scene::IMesh& mesh,
                                      std::string_view meshName, aiMesh& source) {
    const std::uint32_t vertexCount = source.mNumVertices;
    const std::uint32_t boneCount = source.mBones ? source.mNumBones : 0;
    // Without positions the joint boxes keep their start values.
    const base::ArrayOf<base::vec3f>* positions = nullptr;
    if (base::Attribute* found = mesh.findEntry(names::positions);
        found && found->typeName() == base::TypeTraits<base::vec3f>::n_array_name)
        positions = static_cast<const base::ArrayOf<base::vec3f>*>(found->data());

    // Influences are gathered into one flat list, vertex after vertex: a first
    // pass counts them per vertex, a second places them.
    base::vector<std::uint32_t> counts(vertexCount, 0);
    std::size_t total = 0;
    for (std::uint32_t b = 0; b < boneCount; ++b) {
        aiBone* bone = source.mBones[b];
        if (!bone || !bone->mWeights)
            continue;
        for (std::uint32_t w = 0; w < bone->mNumWeights; ++w) {
            aiVertexWeight& weight = bone->mWeights[w];
            if (weight.mVertexId >= vertexCount) {
                base::logFormatted(base::logScene, base::logError,
                                   "assimp import {}| Invalid vertex '{}' used by joint {}!",
                                   meshName, weight.mVertexId, boneName(bone));
                weight.mVertexId = 0;
            }
            ++counts[weight.mVertexId];
            ++total;
        }
    }
    base::vector<std::size_t> starts(std::size_t(vertexCount) + 1, 0);
    for (std::uint32_t v = 0; v < vertexCount; ++v)
        starts[v + 1] = starts[v] + counts[v];
    base::vector<VertexJointData> influences(total);
    base::vector<std::size_t> fill(starts.begin(), starts.end() - 1);

    base::vector<base::mat43> transforms(boneCount);
    base::vector<base::box3f> boxes(boneCount);
    for (std::uint32_t b = 0; b < boneCount; ++b) {
        const aiBone* bone = source.mBones[b];
        transforms[b] = bindTransform(bone ? bone->mOffsetMatrix : aiMatrix4x4());
        base::box3f box = base::box3f::empty();
        if (bone && bone->mWeights) {
            for (std::uint32_t w = 0; w < bone->mNumWeights; ++w) {
                const aiVertexWeight& weight = bone->mWeights[w];
                const std::uint32_t v = weight.mVertexId;
                influences[fill[v]++] = {std::uint16_t(b), weight.mWeight};
                if (positions && v < positions->size())
                    box.extend((*positions)[v]);
            }
        }
        boxes[b] = box;
    }

    base::vector<std::uint16_t> jointIndices(total);
    base::vector<float> weights(total);
    std::uint32_t maximum = 0;
    for (std::uint32_t v = 0; v < vertexCount; ++v) {
        if (counts[v] == 0)
            continue;
        maximum = std::max(maximum, counts[v]);
        auto first = influences.begin() + std::ptrdiff_t(starts[v]);
        auto last = influences.begin() + std::ptrdiff_t(starts[v + 1]);
        std::sort(first, last, [](const VertexJointData& a, const VertexJointData& b) {
            return a.weight > b.weight || (a.weight == b.weight && a.joint < b.joint);
        });
        for (std::size_t i = starts[v]; i < starts[v + 1]; ++i) {
            jointIndices[i] = influences[i].joint;
            weights[i] = influences[i].weight;
        }
    }

    base::AttribArray* poses = mesh.arrayAttribute(names::bindPoseSets, names::meshBindPoseSet);
    if (poses->size() == 0)
        poses->appendMap();
    base::AttribMap& pose = *poses->item(0)->asMap();
    pose.setAttribute<base::string>(names::name, "defaultBindPose");
    if (auto* attribute = pose.vecAttribute<base::mat43>(names::transforms))
        attribute->items() = std::move(transforms);

    base::AttribArray* sets = mesh.arrayAttribute(names::jointsSets, names::meshJointsSet);
    if (sets->size() == 0)
        sets->appendMap();
    base::AttribMap& set = *sets->item(0)->asMap();
    set.setAttribute<base::string>(names::name, "defaultJointWeights");
    if (auto* attribute = set.vecAttribute<std::uint16_t>(names::indices))
        attribute->items() = std::move(jointIndices);
    if (auto* attribute = set.vecAttribute<float>(names::weights))
        attribute->items() = std::move(weights);
    if (auto* attribute = set.vecAttribute<base::box3f>(names::jointBounds))
        attribute->items() = std::move(boxes);
    if (maximum < 255)
        writeCounts<std::uint8_t>(set, counts, maximum);
    else if (maximum < 65535)
        writeCounts<std::uint16_t>(set, counts, maximum);
    else
        base::logFormatted(base::logScene, base::logError,
                           "assimp import {}| Can't support more then 65536 joints per vertex!",
                           meshName);

    base::ref<base::IPlugin> created =
        factory.create(names::skin, base::PluginFactory::createNullIfUnknown |
                                        base::PluginFactory::createReportUnknown);
    auto* skin = dynamic_cast<scene::ISkin*>(created.get());
    if (!skin)
        return {};
    base::string skinName(meshName);
    skinName += ".skin";
    skin->setAttribute<base::string>(names::name, skinName);
    skin->setAttribute<base::ref<base::IPlugin>>(names::baseMesh, base::ref<base::IPlugin>(&mesh));
    return base::ref<scene::IGeometry>(skin);
}

void AssimpImporter::resolveJoints(const aiScene* scene, const NodeMap& nodesByName) {
    if (!scene || !scene->mMeshes)
        return;
    const std::uint32_t count = std::min<std::size_t>(scene->mNumMeshes, m_meshSlots.size());
    for (std::uint32_t i = 0; i < count; ++i) {
        const aiMesh* source = scene->mMeshes[i];
        if (!source || source->mNumBones == 0 || !source->mBones || !m_meshSlots[i])
            continue;
        scene::IGeometry& object = *m_meshSlots[i];
        auto* joints = object.vecAttribute<base::ref<base::IPlugin>>(names::joints);
        if (!joints)
            continue;
        auto& items = joints->items();
        items.clear();
        items.reserve(source->mNumBones);
        for (std::uint32_t b = 0; b < source->mNumBones; ++b) {
            const base::string name(boneName(source->mBones[b]));
            auto found = nodesByName.find(name);
            if (found != nodesByName.end()) {
                items.emplace_back(found->second);
            } else {
                base::logFormatted(base::logScene, base::logError,
                                   "assimp import {}| Unable to resolve joint '{}'! No such "
                                   "node found.",
                                   object.name(true), name);
                // The weights address joints by bone position: keep the place.
                items.emplace_back();
            }
        }
    }
}

} // namespace as

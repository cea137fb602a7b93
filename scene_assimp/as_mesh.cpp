// Mesh conversion: one source mesh becomes a "mesh" object (and a "skin"
// around it when the mesh has bones).
//
// Meshes are most of the bytes of an import, so every stream is copied once
// into an array sized beforehand and the source array is released right
// after, which keeps the peak close to one copy of the geometry.
#include "as_mesh.h"
#include "as_importer.h"
#include "as_weld.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_schema.h"

#include <assimp/material.h>
#include <assimp/mesh.h>
#include <assimp/scene.h>

#include <cstring>

namespace as {

namespace names = scene::names;

namespace {

static_assert(sizeof(aiVector3D) == sizeof(base::vec3f), "positions are copied as blocks");
static_assert(sizeof(aiVector3D) == sizeof(base::normal), "normals are copied as blocks");
static_assert(sizeof(aiColor4D) == 4 * sizeof(float));

// Copies a 3-float stream into the array attribute 'name' and releases it.
template <class T>
void takeStream(base::AttribMap& target, base::name_id name, aiVector3D*& source,
                std::uint32_t count) {
    if (!source)
        return;
    if (auto* attribute = target.vecAttribute<T>(name)) {
        auto& items = attribute->items();
        items.resize(count);
        std::memcpy(static_cast<void*>(items.data()), source, std::size_t(count) * sizeof(T));
    }
    delete[] source;
    source = nullptr;
}

void takeFaces(scene::IMesh& mesh, base::AttribMap& primitive, aiMesh& source) {
    const std::uint32_t faceCount = source.mNumFaces;
    aiFace* faces = source.mFaces;

    std::size_t total = 0;
    bool uniform = true;
    for (std::uint32_t f = 0; f < faceCount; ++f) {
        total += faces[f].mNumIndices;
        uniform = uniform && faces[f].mNumIndices == faces[0].mNumIndices;
    }

    if (uniform) {
        primitive.setAttribute<std::uint16_t>(names::vcounts, std::uint16_t(faces[0].mNumIndices));
    } else if (auto* vcounts = primitive.vecAttribute<std::uint16_t>(names::vcounts)) {
        auto& items = vcounts->items();
        items.resize(faceCount);
        for (std::uint32_t f = 0; f < faceCount; ++f)
            items[f] = std::uint16_t(faces[f].mNumIndices);
    }

    auto* indices = mesh.vecAttribute<std::uint32_t>(names::indices);
    std::uint32_t* out = nullptr;
    if (indices) {
        indices->items().resize(total);
        out = indices->items().data();
    }
    for (std::uint32_t f = 0; f < faceCount; ++f) {
        aiFace& face = faces[f];
        if (out) {
            // A face without its list still takes its place, so later faces stay aligned.
            if (face.mIndices)
                std::memcpy(out, face.mIndices,
                            std::size_t(face.mNumIndices) * sizeof(std::uint32_t));
            else
                std::memset(out, 0, std::size_t(face.mNumIndices) * sizeof(std::uint32_t));
            out += face.mNumIndices;
        }
        delete[] face.mIndices;
        face.mIndices = nullptr;
        face.mNumIndices = 0;
    }
    delete[] faces;
    source.mFaces = nullptr;
    source.mNumFaces = 0;
}

void takeUVSets(scene::IMesh& mesh, aiMesh& source) {
    const std::uint32_t vertexCount = source.mNumVertices;
    std::uint32_t present = 0;
    for (std::uint32_t i = 0; i < AI_MAX_NUMBER_OF_TEXTURECOORDS; ++i)
        present += source.mTextureCoords[i] != nullptr;
    if (present == 0 || vertexCount == 0)
        return;

    base::AttribArray* sets = mesh.arrayAttribute(names::uvSets, names::meshUVSet);
    while (sets->size() < present)
        sets->appendMap();
    // Present channels fill the items in order; the name keeps the channel number.
    std::uint32_t item = 0;
    for (std::uint32_t i = 0; i < AI_MAX_NUMBER_OF_TEXTURECOORDS; ++i) {
        aiVector3D*& channel = source.mTextureCoords[i];
        if (!channel)
            continue;
        base::AttribMap* set = sets->item(item++)->asMap();
        set->setAttribute<base::string>(names::name, base::format("uvset{}", i));
        if (source.mNumUVComponents[i] == 2) {
            if (auto* uv = set->vecAttribute<base::vec2f>(names::UV)) {
                auto& items = uv->items();
                items.resize(vertexCount);
                for (std::uint32_t v = 0; v < vertexCount; ++v)
                    items[v] = {channel[v].x, channel[v].y};
            }
            delete[] channel;
            channel = nullptr;
        } else {
            takeStream<base::vec3f>(*set, names::UVW, channel, vertexCount);
        }
        source.mNumUVComponents[i] = 0;
    }
}

void takeColorSets(scene::IMesh& mesh, aiMesh& source) {
    const std::uint32_t vertexCount = source.mNumVertices;
    std::uint32_t present = 0;
    for (std::uint32_t c = 0; c < AI_MAX_NUMBER_OF_COLOR_SETS; ++c)
        present += source.mColors[c] != nullptr;
    if (present == 0 || vertexCount == 0)
        return;

    base::AttribArray* sets = mesh.arrayAttribute(names::colorSets, names::meshColorSet);
    while (sets->size() < present)
        sets->appendMap();
    std::uint32_t item = 0;
    for (std::uint32_t c = 0; c < AI_MAX_NUMBER_OF_COLOR_SETS; ++c) {
        aiColor4D*& channel = source.mColors[c];
        if (!channel)
            continue;
        base::AttribMap* set = sets->item(item++)->asMap();
        if (auto* rgb = set->vecAttribute<base::vec3f>(names::RGB)) {
            auto& items = rgb->items();
            items.resize(vertexCount);
            for (std::uint32_t v = 0; v < vertexCount; ++v)
                items[v] = {channel[v].r, channel[v].g, channel[v].b};
        }
        delete[] channel;
        channel = nullptr;
    }
}

} // namespace

base::ref<scene::IGeometry> AssimpImporter::importMesh(const aiScene* scene, aiMesh* source,
                                                       TextureList& embeddedTextures) {
    if (!source || !m_factory)
        return {};
    const auto indexed = m_meshIndex.find(source);
    const std::uint32_t slot = indexed != m_meshIndex.end() ? indexed->second : base::wholeValue;
    if (slot < m_meshSlots.size() && m_meshSlots[slot])
        return m_meshSlots[slot];

    base::ref<base::IPlugin> created =
        m_factory->create(names::mesh, base::PluginFactory::createNullIfUnknown |
                                           base::PluginFactory::createReportUnknown);
    auto* mesh = dynamic_cast<scene::IMesh*>(created.get());
    if (!mesh)
        return {};

    const std::string_view sourceName(source->mName.data, source->mName.length);
    const base::string meshName = m_factory->uniqueName(sourceName.empty() ? "mesh" : sourceName);
    mesh->setAttribute<base::string>(names::name, meshName);

    base::AttribArray* primitives = mesh->arrayAttribute(names::primitives, names::meshPrimitive);
    if (primitives->size() == 0)
        primitives->appendMap();
    base::AttribMap& primitive = *primitives->item(0)->asMap();

    const std::uint32_t materialIndex = source->mMaterialIndex;
    if (materialIndex < m_materials.size() && m_materials[materialIndex]) {
        if (auto* materials = primitive.vecAttribute<base::ref<base::IPlugin>>(names::materials))
            materials->items().assign(1, base::ref<base::IPlugin>(m_materials[materialIndex]));
        const aiMaterial* material =
            scene && scene->mMaterials && materialIndex < scene->mNumMaterials
                ? scene->mMaterials[materialIndex]
                : nullptr;
        if (material && aiGetMaterialTextureCount(material, aiTextureType_DISPLACEMENT) > 0) {
            if (base::ref<base::IPlugin> map = importTexture(
                    scene, material, aiTextureType_DISPLACEMENT, 0, embeddedTextures)) {
                mesh->setAttribute(names::displace, true);
                mesh->setAttribute(names::displaceMap, map);
            }
        }
    }

    // assimp reads without joining identical vertices; they are joined here,
    // before anything is copied.
    weldMesh(*source);
    const std::uint32_t vertexCount = source->mNumVertices;
    if (vertexCount != 0) {
        takeStream<base::vec3f>(*mesh, names::positions, source->mVertices, vertexCount);
        takeStream<base::normal>(*mesh, names::normals, source->mNormals, vertexCount);
        takeStream<base::normal>(*mesh, names::tangents, source->mTangents, vertexCount);
        takeStream<base::normal>(*mesh, names::bitangents, source->mBitangents, vertexCount);
    }
    if (source->mFaces && source->mNumFaces != 0)
        takeFaces(*mesh, primitive, *source);
    takeUVSets(*mesh, *source);
    takeColorSets(*mesh, *source);

    base::ref<scene::IGeometry> answer(mesh);
    if (source->mNumBones > 0 && source->mBones && vertexCount != 0) {
        if (base::ref<scene::IGeometry> skin = buildSkin(*m_factory, *mesh, meshName, *source))
            answer = skin;
    }

    base::box3d bounds;
    static_cast<scene::IBounded&>(*mesh).computeBounds(bounds, 3, true);
    mesh->deltaCompressIndices();
    m_arrayPool.share(*mesh);

    if (slot < m_meshSlots.size())
        m_meshSlots[slot] = answer;
    return answer;
}

} // namespace as

// Shared set-up of the mesh and skin conversion tests: a factory with the scene
// types, an importer object, and hand-built assimp meshes.
#pragma once

#include "as_importer.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"
#include "scene_getter.h"
#include "scene_interfaces.h"
#include "scene_schema.h"

#include <assimp/mesh.h>
#include <assimp/scene.h>
#include <gtest/gtest.h>

#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <initializer_list>
#include <string>
#include <vector>

extern "C" std::int32_t loadScenePlugin(base::PluginFactory& factory);

namespace as {

// Reaches the private conversion steps of the importer. The member names carry
// a "mesh" prefix so they cannot collide with other tests' use of this struct.
struct ImporterTestAccess {
    using MeshNodeMap = AssimpImporter::NodeMap;

    static void meshBeginImport(AssimpImporter& importer, base::PluginFactory& factory,
                                const aiScene& scene) {
        importer.beginImport(factory, &scene);
    }
    static base::ref<scene::INode> meshImportNode(AssimpImporter& importer, const aiScene& scene,
                                                  const aiNode& node) {
        AssimpImporter::TextureList textures;
        return importer.importNode(&scene, &node, textures);
    }
    static base::ref<scene::IGeometry> meshImport(AssimpImporter& importer, const aiScene& scene,
                                                  std::uint32_t index) {
        AssimpImporter::TextureList textures;
        return importer.importMesh(&scene, scene.mMeshes[index], textures);
    }
    static void meshResolveJoints(AssimpImporter& importer, const aiScene& scene,
                                  const AssimpImporter::NodeMap& nodes) {
        importer.resolveJoints(&scene, nodes);
    }
    static base::vector<base::ref<scene::IMaterial>>& meshMaterials(AssimpImporter& importer) {
        return importer.m_materials;
    }
    static SharedArrayPool& meshPool(AssimpImporter& importer) { return importer.m_arrayPool; }
};

namespace meshtest {

// A factory with the scene types and the module's importer registered.
inline base::ref<base::PluginFactory> loadedFactory(const char* name = "test") {
    base::ref<base::PluginFactory> factory(new base::PluginFactory(name));
    scene::register_scene_schema(*factory);
    EXPECT_EQ(loadScenePlugin(*factory), 0);
    return factory;
}

// A fresh folder for the files of the running test, named after the process
// and the test, so parallel test processes never share one.
inline std::filesystem::path testFolder(const std::string& prefix) {
    const std::filesystem::path folder =
        std::filesystem::path(testing::TempDir()) /
        (prefix + std::to_string(::getpid()) + "_" +
         testing::UnitTest::GetInstance()->current_test_info()->name());
    std::filesystem::create_directories(folder);
    return folder;
}

namespace names = scene::names;

using Faces = std::vector<std::vector<unsigned>>;

inline void setFaces(aiMesh& mesh, const Faces& faces) {
    mesh.mNumFaces = unsigned(faces.size());
    mesh.mFaces = faces.empty() ? nullptr : new aiFace[faces.size()];
    for (std::size_t f = 0; f < faces.size(); ++f) {
        mesh.mFaces[f].mNumIndices = unsigned(faces[f].size());
        mesh.mFaces[f].mIndices = new unsigned[faces[f].size()];
        std::copy(faces[f].begin(), faces[f].end(), mesh.mFaces[f].mIndices);
    }
}

// A source mesh with the given positions and faces (each face a list of indices).
inline aiMesh* makeMesh(const char* name, std::initializer_list<aiVector3D> positions,
                        const Faces& faces = {}) {
    auto* mesh = new aiMesh;
    mesh->mName = aiString(name);
    mesh->mNumVertices = unsigned(positions.size());
    mesh->mVertices = new aiVector3D[positions.size()];
    std::copy(positions.begin(), positions.end(), mesh->mVertices);
    setFaces(*mesh, faces);
    return mesh;
}

// n vertices on the x axis, no faces.
inline aiMesh* makeLine(const char* name, unsigned n) {
    auto* mesh = new aiMesh;
    mesh->mName = aiString(name);
    mesh->mNumVertices = n;
    mesh->mVertices = new aiVector3D[n];
    for (unsigned i = 0; i < n; ++i)
        mesh->mVertices[i] = aiVector3D(float(i), 0, 0);
    return mesh;
}

inline aiBone* addBone(aiMesh& mesh, const char* name,
                       std::initializer_list<std::pair<unsigned, float>> weights) {
    auto* bone = new aiBone;
    bone->mName = aiString(name);
    bone->mNumWeights = unsigned(weights.size());
    bone->mWeights = new aiVertexWeight[weights.size() ? weights.size() : 1];
    unsigned i = 0;
    for (const auto& [vertex, weight] : weights)
        bone->mWeights[i++] = aiVertexWeight(vertex, weight);
    auto** bones = new aiBone*[mesh.mNumBones + 1];
    std::copy_n(mesh.mBones, mesh.mNumBones, bones);
    bones[mesh.mNumBones++] = bone;
    delete[] mesh.mBones;
    mesh.mBones = bones;
    return bone;
}

inline aiNode* withChildren(const char* name, std::initializer_list<aiNode*> kids) {
    auto* node = new aiNode(name);
    std::vector<aiNode*> list(kids);
    node->addChildren(unsigned(list.size()), list.data());
    return node;
}

// The meshes in a scene that owns them.
inline aiScene* makeScene(std::initializer_list<aiMesh*> meshes) {
    auto* scene = new aiScene;
    scene->mNumMeshes = unsigned(meshes.size());
    scene->mMeshes = new aiMesh*[meshes.size()];
    std::copy(meshes.begin(), meshes.end(), scene->mMeshes);
    return scene;
}

// The objects of 'type' in 'factory', in creation order.
inline std::vector<base::ref<base::IPlugin>> objectsOf(const base::PluginFactory& factory,
                                                       base::name_id type) {
    std::vector<base::ref<base::IPlugin>> found;
    for (std::uint32_t id = 0; id < factory.pluginCount(); ++id)
        if (base::ref<base::IPlugin> object = factory.plugin(id);
            object && object->className() == type)
            found.push_back(object);
    return found;
}

template <class T>
std::vector<T> items(const base::AttribMap& map, base::name_id name) {
    const base::Attribute* found = map.findEntry(name);
    if (!found || found->typeName() != base::TypeTraits<T>::n_array_name)
        return {};
    const auto* values = static_cast<const base::ArrayOf<T>*>(
        const_cast<base::Attribute*>(found)->data(base::wholeValue));
    return std::vector<T>(values->begin(), values->end());
}

inline const base::AttribMap* item(const base::AttribMap& map, base::name_id name,
                                   std::uint32_t index) {
    auto* found = const_cast<base::Attribute*>(map.findEntry(name));
    auto* array = found ? found->asArray() : nullptr;
    return array && array->item(index) ? array->item(index)->asMap() : nullptr;
}

// A factory with the scene types, an importer bound to it, and a captured log.
class MeshTest : public ::testing::Test {
protected:
    MeshTest() {
        scene::register_scene_schema(*factory);
        importer =
            base::ref<AssimpImporter>(new AssimpImporter(nullptr, nullptr, base::invalidPluginId));
    }
    ~MeshTest() override { delete source; }

    // Takes 'scene' and starts an import of it.
    void begin(aiScene* scene) {
        delete source;
        source = scene;
        ImporterTestAccess::meshBeginImport(*importer, *factory, *source);
    }
    base::ref<scene::IGeometry> convert(std::uint32_t index) {
        return ImporterTestAccess::meshImport(*importer, *source, index);
    }

public:
    // The mesh behind an answer (the answer itself, or a skin's base mesh).
    static base::IPlugin* meshOf(const base::ref<scene::IGeometry>& answer) {
        auto* skin = dynamic_cast<scene::ISkin*>(answer.get());
        if (!skin)
            return answer.get();
        const auto* base = skin->findAttribute<base::ref<base::IPlugin>>(names::baseMesh);
        return base ? base->get() : nullptr;
    }

protected:
    base::CaptureLog captured;
    base::ScopedLog scopedLog{captured};
    base::ref<base::PluginFactory> factory{new base::PluginFactory("test")};
    base::ref<AssimpImporter> importer;
    aiScene* source = nullptr;
};

} // namespace meshtest
} // namespace as

// The importer object of the module: turns its option attributes into the
// post-processing flags of assimp, reads one file through the host's file
// system and converts the result into scene objects created in the factory
// it is given.
//
// One import runs on the calling thread from start to end. assimp's logger is
// process-wide, so the host runs one import at a time; the importer takes no
// lock.
#pragma once

#include "as_mesh.h"
#include "b_memory.h"
#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "b_refcnt.h"
#include "scene_importer.h"
#include "scene_interfaces.h"

#include <cstdint>
#include <string_view>

struct aiScene;
struct aiNode;
struct aiMesh;
struct aiCamera;
struct aiLight;
struct aiString;
struct aiMaterial;
namespace Assimp {
class Importer;
}

namespace as {

// What ReadFile and the component-removal step receive for a set of options.
struct ImportFlags {
    std::uint32_t flags = 0;
    // The components removed when flags holds aiProcess_RemoveComponent.
    std::uint32_t components = 0;

    bool removesComponents() const noexcept;
};

// The flag word and component mask for the options held by 'options'. An
// option that is absent or of another type changes nothing.
ImportFlags importFlags(const base::AttribMap& options);

// Whether a rejection by assimp's structure check names a shape that the
// conversion handles and that the readers produce for valid files: a scene
// without meshes, a mesh without faces (a point cloud) or without vertices,
// a light or camera without a node, a hole in the node tree.
bool structureCheckIsTolerable(std::string_view reason) noexcept;

// Sets up 'importer' for the options held by 'options' (flag word and
// removed components) and reads the file: what the import runs. 'check'
// false leaves assimp's structure check out whatever the options say.
const aiScene* readScene(Assimp::Importer& importer, const base::AttribMap& options,
                         const base::string& path, bool check = true);

// The "node" objects of 'factory' by name, in registration order: a name
// already taken keeps its first node.
base::map<base::string, base::ref<scene::INode>> nodesByName(const base::PluginFactory& factory);

// The value of the scene's "upAxis" for a model at 'path': 2 (Z up) for
// Blender files, 1 otherwise.
std::uint8_t upAxisForPath(const base::string& path);

// Whether assimp's reader for the model at 'path' also copies a camera node's
// translation into the camera's own position (glTF and GLB files).
bool cameraPositionInNode(const base::string& path);

class AssimpImporter : public scene::SceneImportPlugin {
public:
    AssimpImporter(base::IPluginDesc* descriptor, base::PluginFactory* factory, std::uint32_t id);
    ~AssimpImporter() override;

    void describeOptions(base::AttribMap& options) override;
    bool import(base::PluginFactory& factory, const base::string& path) override;

private:
    friend struct ImporterTestAccess;
    // The node conversion's tests; a second name so that each test file's
    // accessor stays the only definition of its struct.
    friend struct NodeTestAccess;
    friend struct CameraLightTestAccess;
    friend struct AnimationTestAccess;
    friend struct MaterialTestAccess;

    using TextureList = base::vector<base::ref<scene::IBufferAdapter>>;
    using NodeMap = base::map<base::string, base::ref<scene::INode>>;

    // Converts 'node' and everything below it (as_node.cpp).
    base::ref<scene::INode> importNode(const aiScene* scene, const aiNode* node,
                                       TextureList& embeddedTextures);
    // Converts one mesh, once per import; a mesh with bones becomes a skin (as_mesh.cpp).
    base::ref<scene::IGeometry> importMesh(const aiScene* scene, aiMesh* mesh,
                                           TextureList& embeddedTextures);
    // One source material as a "principalMaterial" with its textures; null
    // for assimp's default material (as_material.cpp).
    base::ref<scene::IMaterial> importMaterial(const aiScene* scene, const aiMaterial* material,
                                               TextureList& embeddedTextures);
    // The texture of 'material' at (type, index) as a new texture object, or
    // null when there is none or it cannot be read (as_texture.cpp).
    base::ref<base::IPlugin> importTexture(const aiScene* scene, const aiMaterial* material,
                                           unsigned type, unsigned index,
                                           TextureList& embeddedTextures);
    // Binds the joints of every skin to the nodes of the scene (as_skin.cpp).
    void resolveJoints(const aiScene* scene, const NodeMap& nodesByName);
    // Also keys each node converted by this import under its source name,
    // where that differs from its unique name (first node wins), so joints
    // and animation channels find nodes as assimp does.
    void addSourceNames(const aiNode* root, NodeMap& nodesByName) const;
    // Clips, layers and channels for the source animations, driving the
    // nodes of 'nodesByName'; the scene-wide range and layer list go to
    // 'sceneObject', this import's scene (as_animation.cpp).
    void importAnimations(const aiScene* scene, const NodeMap& nodesByName,
                          base::IPlugin* sceneObject);

    // Cameras and lights (as_camera_light.cpp): every light, then every
    // camera, each below the node that carries its frame.
    void importCamerasAndLights(const aiScene* scene);
    base::ref<scene::ICamera> importCamera(const aiScene* scene, const aiCamera* camera);
    base::ref<scene::ILight> importLight(const aiScene* scene, const aiLight* light);
    // Folds the frame into the leaf node of the object's name, or makes a
    // node for it; answers the node that carries the object.
    base::ref<scene::INode> placeObject(const aiScene* scene, const aiString& name,
                                        const base::vec3d& position, const base::vec3d& direction,
                                        const base::vec3d& up);
    void indexSourceNodes(const aiScene* scene);
    // A unique name that is also none of the names given to converted nodes
    // in this import: the factory's name service learns names only from
    // objects registered after it last looked, not from renamed ones.
    base::string freshName(const base::string& base);
    // The first source node of the name, in conversion order; null if none.
    const aiNode* sourceNode(const aiString& name) const;

    // Points the per-import state (factory, material list, mesh slots, pool,
    // node memo) at a new import of 'scene' into 'factory'.
    void beginImport(base::PluginFactory& factory, const aiScene* scene);
    // Steps 6 to 15 of an import, after assimp has read the file.
    void convert(const aiScene* scene, const base::string& path);
    // Forgets what refers to the objects of the import that just ended.
    void releaseImportState() noexcept;

    base::PluginFactory* m_factory = nullptr;
    // By source material index (empty until materials are converted).
    base::vector<base::ref<scene::IMaterial>> m_materials;
    // The converted object per source mesh; the driver sizes it at the start of each import.
    base::vector<base::ref<scene::IGeometry>> m_meshSlots;
    // The position of each source mesh in the scene's list, for its slot.
    base::map<const aiMesh*, std::uint32_t> m_meshIndex;
    SharedArrayPool m_arrayPool;
    // The node made for each source node during the running import; a node
    // reached twice yields the same object. Uncounted: the factory holds them.
    base::map<const aiNode*, scene::INode*> m_nodeMemo;
    // The scene object of the running import (uncounted: the factory holds it).
    base::IPlugin* m_scene = nullptr;
    // Source nodes by name, first of each name; the names live in assimp's scene.
    base::map<std::string_view, const aiNode*> m_sourceNodes;
    // The camera or light frame folded into a leaf node, so that a second
    // object of that node's name can be placed relative to the node as it was.
    struct FoldedFrame {
        base::vec3d position;
        base::quatd rotation;
    };
    base::map<const scene::INode*, FoldedFrame> m_foldedFrames;
    base::map<base::string, bool> m_givenNames;
    // The reader stores a camera node's translation in the camera too (glTF).
    bool m_cameraPositionInNode = false;
};

} // namespace as

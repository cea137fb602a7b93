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

    using TextureList = base::vector<base::ref<scene::IBufferAdapter>>;
    using NodeMap = base::map<base::string, base::ref<scene::INode>>;

    // Converts 'node' and everything below it (as_node.cpp).
    base::ref<scene::INode> importNode(const aiScene* scene, const aiNode* node,
                                       TextureList& embeddedTextures);
    // Converts one mesh, once per import; a mesh with bones becomes a skin (as_mesh.cpp).
    base::ref<scene::IGeometry> importMesh(const aiScene* scene, aiMesh* mesh,
                                           TextureList& embeddedTextures);
    // Binds the joints of every skin to the nodes of the scene (as_skin.cpp).
    void resolveJoints(const aiScene* scene, const NodeMap& nodesByName);

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
};

} // namespace as

#include "as_importer.h"
#include "as_node.h"

#include "as_io.h"
#include "as_logger.h"
#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_schema.h"
#include "stream/b_fs_archive.h"

#include <assimp/DefaultLogger.hpp>
#include <assimp/Importer.hpp>
#include <assimp/config.h>
#include <assimp/postprocess.h>
#include <assimp/scene.h>

#include <cctype>
#include <optional>
#include <string_view>

namespace as {

namespace {

// Options only this importer reads; the host sets them when it wants them.
base::name_id flipTextureCoordinatesName() {
    static const base::name_id name("importFlipTextureCoordinates");
    return name;
}
base::name_id flipFaceWindingName() {
    static const base::name_id name("importFlipFaceWinding");
    return name;
}

// An option counts only when present with the expected type.
template <class T>
bool optionIs(const base::AttribMap& options, base::name_id name, const T& value) {
    const T* found = options.findAttribute<T>(name);
    return found && *found == value;
}

// Removes the assimp logger on every way out of an import, so no logger
// outlives the import that installed it.
struct InstalledLogger {
    InstalledLogger() { Assimp::DefaultLogger::set(new AssimpLogger()); }
    ~InstalledLogger() { Assimp::DefaultLogger::kill(); }
    InstalledLogger(const InstalledLogger&) = delete;
    InstalledLogger& operator=(const InstalledLogger&) = delete;
};

// Whether the text after the last '.' of the path's last component (split
// on '/' and '\\') is 'extension', in any letter case.
bool extensionIs(std::string_view path, std::string_view extension) noexcept {
    if (const auto slash = path.find_last_of("/\\"); slash != std::string_view::npos)
        path.remove_prefix(slash + 1);
    const auto dot = path.rfind('.');
    if (dot == std::string_view::npos || path.size() - dot - 1 != extension.size())
        return false;
    for (std::size_t i = 0; i < extension.size(); ++i)
        if (std::tolower(static_cast<unsigned char>(path[dot + 1 + i])) != extension[i])
            return false;
    return true;
}

void logFatal(const base::string& path) noexcept {
    try {
        base::logFormatted(base::logScene, base::logCritical,
                           "assimp import |{}| Fatal error during the scene loading!", path);
    } catch (...) {
    }
}

} // namespace

bool ImportFlags::removesComponents() const noexcept {
    return (flags & aiProcess_RemoveComponent) != 0;
}

ImportFlags importFlags(const base::AttribMap& options) {
    using S = scene::sceneImporter_schema;
    ImportFlags out;
    // Identical vertices are joined by the mesh conversion, far faster than by assimp.
    out.flags = aiProcess_FindInstances;
    auto remove = [&out](std::uint32_t component) {
        out.flags |= aiProcess_RemoveComponent;
        out.components |= component;
    };

    if (optionIs(options, S::importMeshes(), false))
        remove(aiComponent_MESHES);
    if (optionIs(options, flipTextureCoordinatesName(), true))
        out.flags |= aiProcess_FlipUVs;
    if (optionIs(options, flipFaceWindingName(), true))
        out.flags |= aiProcess_FlipWindingOrder;
    if (optionIs(options, S::importTriangulateMeshes(), true))
        out.flags |= aiProcess_Triangulate;
    if (const std::uint8_t* normals = options.findAttribute<std::uint8_t>(S::importNormals())) {
        if (*normals == 0)
            remove(aiComponent_NORMALS);
        else if (*normals == 2)
            out.flags |= aiProcess_GenSmoothNormals;
    }
    if (const std::uint8_t* tangents = options.findAttribute<std::uint8_t>(S::importTangents())) {
        if (*tangents == 0)
            remove(aiComponent_TANGENTS_AND_BITANGENTS);
        else if (*tangents == 2)
            out.flags |= aiProcess_CalcTangentSpace;
    }
    if (optionIs(options, S::importTextureCoordinates(), false))
        remove(aiComponent_TEXCOORDS);
    if (optionIs(options, S::importColors(), false))
        remove(aiComponent_COLORS);
    if (optionIs(options, S::importLights(), false))
        remove(aiComponent_LIGHTS);
    if (optionIs(options, S::importSkeletons(), false))
        remove(aiComponent_BONEWEIGHTS);
    if (optionIs(options, S::importMaterials(), false))
        remove(aiComponent_MATERIALS);
    if (optionIs(options, S::importCameras(), false))
        remove(aiComponent_CAMERAS);
    if (optionIs(options, S::importAnimations(), false))
        remove(aiComponent_ANIMATIONS);
    // On unless switched off: assimp's checker turns many inconsistent scenes,
    // which its later steps would crash on, into a clean rejection.
    if (!optionIs(options, S::importValidate(), false))
        out.flags |= aiProcess_ValidateDataStructure;
    return out;
}

bool structureCheckIsTolerable(std::string_view reason) noexcept {
    constexpr std::string_view tolerable[] = {
        "aiScene::mNumMeshes is 0",
        "contains no faces",
        "contains no vertices",
        "has no corresponding node in the scene graph",
        "A node of the scene-graph is nullptr",
    };
    for (std::string_view text : tolerable)
        if (reason.find(text) != std::string_view::npos)
            return true;
    return false;
}

const aiScene* readScene(Assimp::Importer& importer, const base::AttribMap& options,
                         const base::string& path, bool check) {
    const ImportFlags flags = importFlags(options);
    if (flags.removesComponents())
        importer.SetPropertyInteger(AI_CONFIG_PP_RVC_FLAGS, int(flags.components));
    // A compressed file is read by the name of its content ("a.ply.gz" as
    // "a.ply"), so assimp picks its reader by the real extension.
    return importer.ReadFile(base::fs::innerName(path).c_str(),
                             check ? flags.flags : flags.flags & ~aiProcess_ValidateDataStructure);
}

std::uint8_t upAxisForPath(const base::string& path) {
    return extensionIs(path, "blend") ? 2 : 1;
}

bool cameraPositionInNode(const base::string& path) {
    return extensionIs(path, "gltf") || extensionIs(path, "glb");
}

base::map<base::string, base::ref<scene::INode>> nodesByName(const base::PluginFactory& factory) {
    base::map<base::string, base::ref<scene::INode>> nodes;
    const std::uint32_t count = factory.pluginCount();
    for (std::uint32_t id = 0; id < count; ++id) {
        base::ref<base::IPlugin> object = factory.plugin(id);
        if (!object || object->className() != scene::node_schema::type())
            continue;
        auto* node = dynamic_cast<scene::INode*>(object.get());
        if (!node)
            continue;
        // A "name" of another type is skipped, not reported: the map takes
        // what it can use.
        const base::Attribute* name = node->findEntry(scene::node_schema::name());
        if (name && name->typeName() == base::TypeTraits<base::string>::n_name)
            nodes.emplace(*static_cast<const base::string*>(name->data()),
                          base::ref<scene::INode>(node));
    }
    return nodes;
}

// ---- AssimpImporter ---------------------------------------------------------------

void AssimpImporter::addSourceNames(const aiNode* root, NodeMap& nodes) const {
    // In conversion order, so the first node of a name is the one a unique
    // name would have kept.
    forEachSourceNode(root, [&](const aiNode& node) {
        if (auto found = m_nodeMemo.find(&node); found != m_nodeMemo.end()) {
            base::string source(node.mName.C_Str(), node.mName.length);
            if (found->second->name() != source)
                nodes.emplace(std::move(source), base::ref<scene::INode>(found->second));
        }
    });
}

AssimpImporter::AssimpImporter(base::IPluginDesc* descriptor, base::PluginFactory* factory,
                               std::uint32_t id)
    : scene::SceneImportPlugin(descriptor, factory, id) {}

AssimpImporter::~AssimpImporter() = default;

void AssimpImporter::describeOptions(base::AttribMap& options) {
    using S = scene::sceneImporter_schema;
    // Called by the host: a failure of the attribute core is logged here.
    try {
        options.setAttribute(S::importMeshes(), S::importMeshesDefault());
        options.setAttribute(S::importTriangulateMeshes(), S::importTriangulateMeshesDefault());
        options.setAttribute(S::importColors(), S::importColorsDefault());
        options.setAttribute(S::importTextureCoordinates(), S::importTextureCoordinatesDefault());
        options.setAttribute(S::importNormals(), S::importNormalsDefault());
        options.setAttribute(S::importTangents(), S::importTangentsDefault());
        options.setAttribute(S::importSkeletons(), S::importSkeletonsDefault());
        options.setAttribute(S::importLights(), S::importLightsDefault());
        options.setAttribute(S::importMaterials(), S::importMaterialsDefault());
        options.setAttribute(S::importCameras(), S::importCamerasDefault());
        options.setAttribute(S::importHair(), S::importHairDefault());
        options.setAttribute(S::importAnimations(), S::importAnimationsDefault());
        options.setAttribute(S::importValidate(), S::importValidateDefault());
        options.setClassName(S::type());
    } catch (const base::exception& e) {
        e.log(base::log());
    } catch (...) {
        base::logFormatted(base::logScene, base::logError,
                           "assimp import {}| Unable to describe the options!", name(true));
    }
}

bool AssimpImporter::import(base::PluginFactory& factory, const base::string& path) {
    // Nothing may unwind into the host: every failure ends here with the
    // fatal line.
    try {
        Assimp::Importer importer;
        std::optional<Assimp::Importer> unchecked;
        importer.SetIOHandler(new AssimpIO());
        InstalledLogger logger;

        const aiScene* source = nullptr;
        try {
            source = readScene(importer, *this, path);
            // A file the structure check rejects for a shape valid files
            // have is read again without it, so no valid scene is lost. A
            // fresh importer: one whose check failed keeps freed state.
            if (!source && (importFlags(*this).flags & aiProcess_ValidateDataStructure) &&
                structureCheckIsTolerable(importer.GetErrorString())) {
                base::logFormatted(
                    base::logScene, base::logInfo,
                    "assimp import |{}| Reading again without the structure check: {}", path,
                    importer.GetErrorString());
                unchecked.emplace();
                unchecked->SetIOHandler(new AssimpIO());
                source = readScene(*unchecked, *this, path, false);
            }
        } catch (...) {
            // Nothing was read (assimp gave up, for instance out of memory):
            // a failure, not an empty success.
            logFatal(path);
            return false;
        }
        if (!source || !source->mRootNode)
            return false;

        try {
            beginImport(factory, source);
            convert(source, path);
        } catch (...) {
            logFatal(path);
        }
        releaseImportState();
        (unchecked ? *unchecked : importer).FreeScene();
        return true;
    } catch (...) {
        releaseImportState();
        logFatal(path);
        return false;
    }
}

void AssimpImporter::releaseImportState() noexcept {
    // The slots and the pool refer to this import's objects: holding them
    // past it would keep a dropped factory's meshes alive.
    m_nodeMemo.clear();
    m_meshIndex.clear();
    m_meshSlots.clear();
    m_arrayPool.clear();
    m_scene = nullptr;
    m_sourceNodes.clear();
    m_foldedFrames.clear();
    m_givenNames.clear();
}

void AssimpImporter::beginImport(base::PluginFactory& factory, const aiScene* source) {
    m_factory = &factory;
    // Cleared rather than only resized: a mesh must never pick up a material
    // left by an earlier import, possibly made in another factory.
    m_materials.assign(source->mNumMaterials, {});
    m_meshSlots.assign(source->mNumMeshes, {});
    m_meshIndex.clear();
    for (std::uint32_t i = 0; source->mMeshes && i < source->mNumMeshes; ++i)
        m_meshIndex.emplace(source->mMeshes[i], i);
    m_arrayPool.clear();
    m_nodeMemo.clear();
    m_scene = nullptr;
    m_sourceNodes.clear();
    m_foldedFrames.clear();
    m_givenNames.clear();
}

void AssimpImporter::convert(const aiScene* source, const base::string& path) {
    using base::IPlugin;
    constexpr std::uint32_t createFlags =
        base::PluginFactory::createNullIfUnknown | base::PluginFactory::createReportUnknown;

    TextureList embeddedTextures(source->mNumTextures);

    // Before the nodes: the meshes read the materials by source index.
    for (std::uint32_t i = 0; source->mMaterials && i < source->mNumMaterials; ++i)
        m_materials[i] = importMaterial(source, source->mMaterials[i], embeddedTextures);

    base::ref<scene::INode> root = importNode(source, source->mRootNode, embeddedTextures);
    if (root) {
        root->setAttribute(scene::node_schema::isLayer(), true);
        if (scene::IBounded* bounded = scene::query<scene::IBounded>(*root)) {
            base::box3d bounds;
            bounded->computeBounds(bounds, 3, true);
        }
    }

    base::ref<IPlugin> sceneObject = m_factory->create(scene::scene_schema::type(), createFlags);
    if (sceneObject) {
        sceneObject->setAttribute(scene::scene_schema::name(), m_factory->uniqueName("scene"));
        sceneObject->setAttribute(scene::scene_schema::root(), base::ref<IPlugin>(root.get()));
        sceneObject->setAttribute(scene::scene_schema::upAxis(),
                                  upAxisForPath(base::fs::innerName(path)));
        sceneObject->setAttribute(scene::scene_schema::time(), base::TimeCode());
    }
    m_scene = sceneObject.get();

    NodeMap nodes = nodesByName(*m_factory);
    addSourceNames(source->mRootNode, nodes);
    resolveJoints(source, nodes);
    importAnimations(source, nodes, sceneObject.get());

    m_cameraPositionInNode = cameraPositionInNode(path);
    importCamerasAndLights(source);
}

} // namespace as

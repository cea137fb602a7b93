// The classes of the scene objects and their registration with a factory.
//
// Every scene object is a ::base::IPlugin whose state lives in its attributes;
// the class of a type adds the type's schema struct (so INode::visible() and
// INode::visibleDefault() name the attribute and its default) and the
// interfaces the type answers for. register_scene_schema() enters one
// descriptor per registered type into a factory; the factory then creates
// objects of the class by type name ("node" makes an INode).
//
// Schema structs declare name(), data() and size() functions for attributes
// of those names; each class brings the plug-in's own members of those names
// (and typeName()) back into scope, so node->name() is the object's name. The
// attribute's name constant is still node_schema::name() or names::name.
//
// Read attributes with scene::get (scene_getter.h).
#pragma once

#include "b_math.h"
#include "b_plugin.h"
#include "b_plugin_factory.h"
#include "scene_schema.h"

#include <cstdint>
#include <span>
#include <string_view>

namespace base {
class CmdLineOptions;
}

namespace scene {

// The registered types in registration order: X(type, Interface). The
// descriptor of each is named _<Interface>Desc.
#define SCENE_REGISTERED_TYPES(X)                                                                  \
    X(scene, IScene)                                                                               \
    X(light, ILight)                                                                               \
    X(bufferAdapter, IBufferAdapter)                                                               \
    X(buffer, IBuffer)                                                                             \
    X(texture, ITexture)                                                                           \
    X(randomTexture, IRandomTexture)                                                               \
    X(noiseTexture, INoiseTexture)                                                                 \
    X(vertColorTexture, IVertColorTexture)                                                         \
    X(cellularTexture, ICellularTexture)                                                           \
    X(checkerTexture, ICheckerTexture)                                                             \
    X(embeddedTexture, IEmbeddedTexture)                                                           \
    X(curvatureTexture, ICurvatureTexture)                                                         \
    X(fileTexture, IFileTexture)                                                                   \
    X(cubistTexture, ICubistTexture)                                                               \
    X(dotsTexture, IDotsTexture)                                                                   \
    X(mixTexture, IMixTexture)                                                                     \
    X(principalMaterial, IPrincipalMaterial)                                                       \
    X(hairMaterial, IHairMaterial)                                                                 \
    X(toonMaterial, IToonMaterial)                                                                 \
    X(lightGroup, ILightGroup)                                                                     \
    X(node, INode)                                                                                 \
    X(keyframeChannel, IKeyframeChannel)                                                           \
    X(animLayer, IAnimLayer)                                                                       \
    X(instancer, IInstancer)                                                                       \
    X(animClip, IAnimClip)                                                                         \
    X(lines, ILines)                                                                               \
    X(points, IPoints)                                                                             \
    X(hair, IHair)                                                                                 \
    X(fur, IFur)                                                                                   \
    X(mesh, IMesh)                                                                                 \
    X(skin, ISkin)                                                                                 \
    X(morph, IMorph)                                                                               \
    X(environment, IEnvironment)                                                                   \
    X(camera, ICamera)                                                                             \
    X(clipPlane, IClipPlane)                                                                       \
    X(renderOutput, IRenderOutput)                                                                 \
    X(sceneReference, ISceneReference)                                                             \
    X(metadata, IMetadata)

// Interns the schema names, then enters the descriptor of every registered
// type into 'factory', in the order above. The descriptors are made once per
// process and shared by every factory; a factory that already holds a
// descriptor for a type name keeps it.
void register_scene_schema(::base::PluginFactory& factory);

// A registered type: its name and its class's name ("node", "INode").
struct SceneType {
    const ::base::name_id* typeSlot;
    std::string_view typeText;
    std::string_view interfaceText;

    ::base::name_id type() const noexcept { return *typeSlot; }
};
// The registered types in registration order.
std::span<const SceneType> sceneTypes() noexcept;

// The descriptor of every scene type: type name, empty description, kind 1.
class SceneTypeDesc : public ::base::IPluginDesc {
public:
    static constexpr std::uint32_t sceneKind = 1;

    std::uint32_t kind() const noexcept { return m_kind; }
    const ::base::string& description() const noexcept { return extraText(); }

protected:
    explicit SceneTypeDesc(::base::name_id type) { setTypeName(type); }

private:
    std::uint32_t m_kind = sceneKind;
};

// ---- Interfaces ---------------------------------------------------------------

// The interface 'plugin' attached under I's name, or null.
template <class I>
I* query(const ::base::IPlugin& plugin) {
    return static_cast<I*>(plugin.queryInterface(I::interfaceName()));
}

// Answers for an object's bounding box (nodes and geometry).
class IBounded : public ::base::IPluginInterface {
public:
    static ::base::name_id interfaceName();
    ::base::name_id typeName() const final { return interfaceName(); }

    // The stored "bounds", or the empty box.
    virtual ::base::box3d cachedBounds() const = 0;
    // The box in the parent's space, into 'result'. Modes 2 and 3 keep
    // "bounds" up to date; mode 3 answers a stored box as it is.
    virtual void computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) = 0;
};

// Answers for an object's place in the hierarchy (nodes).
class IHierarchical : public ::base::IPluginInterface {
public:
    static ::base::name_id interfaceName();
    ::base::name_id typeName() const final { return interfaceName(); }

    // The transformation from the object's space to its parent's.
    virtual ::base::mat43 localTransformation() const = 0;
};

// See the note at the top on name(), data(), size() and typeName().
#define SCENE_INTERFACE_MEMBERS(Base)                                                              \
public:                                                                                            \
    using Super = Base;                                                                            \
    using Super::Super;                                                                            \
    using ::base::IPlugin::name;                                                                   \
    using ::base::IPlugin::data;                                                                   \
    using ::base::IPlugin::size;                                                                   \
    using ::base::IPlugin::typeName;

// A class that adds nothing to its base and its schema struct.
#define SCENE_PLAIN_INTERFACE(Class, Base, schema)                                                 \
    class Class : public Base, public schema {                                                     \
        SCENE_INTERFACE_MEMBERS(Base)                                                              \
    };

// ---- Core objects ----

class IScene : public ::base::IPlugin, public scene_schema {
    SCENE_INTERFACE_MEMBERS(::base::IPlugin)
    // Adds "-upAxis" (scene_cmdline.cpp); the scene's descriptor calls it.
    static void registerOptions(::base::CmdLineOptions& options);
};

class INode : public ::base::IPlugin, public IBounded, public IHierarchical, public node_schema {
public:
    INode(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory, std::uint32_t id);
    using ::base::IPlugin::data;
    using ::base::IPlugin::name;
    using ::base::IPlugin::size;
    using ::base::IPlugin::typeName;

    ::base::IPlugin* interfaceOwner() const override { return const_cast<INode*>(this); }
    ::base::box3d cachedBounds() const override;
    void computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) override;
    ::base::mat43 localTransformation() const override;
};

// Abstract. The kinds carry geometry_schema through their own structs;
// deriving it here as well would give the mesh kinds, whose struct derives
// it virtually, a second copy that lookups could not tell apart.
class IGeometry : public ::base::IPlugin, public IBounded {
public:
    IGeometry(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory, std::uint32_t id);
    using ::base::IPlugin::data;
    using ::base::IPlugin::name;
    using ::base::IPlugin::size;
    using ::base::IPlugin::typeName;

    ::base::IPlugin* interfaceOwner() const override { return const_cast<IGeometry*>(this); }
    ::base::box3d cachedBounds() const override;
    void computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) override;
};

SCENE_PLAIN_INTERFACE(IPoints, IGeometry, points_schema)

// Stored lines keep "linesStart" as differences while "indicesDeltaCompression"
// is set; postLoad turns them back into start indices and clears the byte.
class ILines : public IGeometry, public lines_schema {
    SCENE_INTERFACE_MEMBERS(IGeometry)
    void postLoad() override;
};

// The same for the "curvesStart" of hair.
class IHair : public IGeometry, public hair_schema {
    SCENE_INTERFACE_MEMBERS(IGeometry)
    void postLoad() override;
};

SCENE_PLAIN_INTERFACE(IFur, IGeometry, fur_schema)
SCENE_PLAIN_INTERFACE(ISubdividable, IGeometry, subdividable_schema)

// A polygon mesh. Index coding and decoding: scene_geometry.h.
class IMesh : public ISubdividable, public mesh_schema {
    SCENE_INTERFACE_MEMBERS(ISubdividable)

    // Puts the faces of every primitive in a canonical order and rewrites
    // "indices" as differences (see scene_geometry.h), then sets
    // "indicesDeltaCompression" to 1. Answers whether it ran: a linked or
    // mismatched index array, or indices that are already coded, leave the
    // mesh unchanged and answer false.
    bool deltaCompressIndices();
    // Checks the vertex arrays, primitives and indices and reports every
    // finding to the scene log; never changes the mesh. False only when a
    // vertex array's count differs from the positions count.
    bool validate() const;

    // Modes 1 to 3 answer a stored "bounds" as it is. Otherwise the box of the
    // positions the primitives select (each primitive's box kept in its
    // "bounds"); modes 2 and 3 store the result in the mesh's "bounds".
    void computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) override;
};

// Bounded by its "baseMesh"; a stored "bounds" is honoured like a mesh's.
class ISkin : public ISubdividable, public skin_schema {
    SCENE_INTERFACE_MEMBERS(ISubdividable)
    void computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) override;
};

SCENE_PLAIN_INTERFACE(IMorph, ISubdividable, morph_schema)
SCENE_PLAIN_INTERFACE(IInstancer, ::base::IPlugin, instancer_schema)
SCENE_PLAIN_INTERFACE(IBuffer, ::base::IPlugin, buffer_schema)

// Presents the byte range [inputOffset, inputOffset + inputLength) of the
// "data" of its "inputBuffer" through the outputs that exist on it
// (outputUint8 ... outputFloat4); it creates none. Over a whole buffer,
// outputUint8 is a view (a link to the buffer's "data", never dangling); the
// other outputs and partial ranges hold copies of the bytes. Each run
// listens to the buffer it read; a change the buffer reports (or one of the
// adapter's inputs reported to pluginChanged) runs it again. Whoever sets the
// inputs calls update().
class IBufferAdapter : public ::base::IPlugin,
                       public ::base::PluginCallback,
                       public bufferAdapter_schema {
public:
    IBufferAdapter(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                   std::uint32_t id);
    ~IBufferAdapter() override;
    using ::base::IPlugin::data;
    using ::base::IPlugin::name;
    using ::base::IPlugin::size;
    using ::base::IPlugin::typeName;

    // Refills every existing output from the current inputs and notifies the
    // listeners once per output. Problems are logged; the outputs then keep
    // what they held.
    void update();

    void pluginChanged(::base::IPlugin& plugin, ::base::name_id attribute, std::uint32_t kind,
                       std::uint64_t identifier) override;
    void postLoad() override { update(); }
    // The copy presents the same range and listens to the same buffer.
    ::base::Attribute* clone() const override;

private:
    void update(std::uint64_t stamp);
    void watchBuffer(::base::IPlugin* buffer);

    // The buffer listened to; nulled by the buffer's death.
    ::base::WeakNode m_buffer;
    std::uint64_t m_lastStamp = 0;
};

SCENE_PLAIN_INTERFACE(ISceneReference, ::base::IPlugin, sceneReference_schema)
SCENE_PLAIN_INTERFACE(IMetadata, ::base::IPlugin, metadata_schema)

// ---- Textures ----

SCENE_PLAIN_INTERFACE(ITexture, ::base::IPlugin, texture_schema)
SCENE_PLAIN_INTERFACE(IBitmapTexture, ITexture, bitmapTexture_schema)
SCENE_PLAIN_INTERFACE(IEmbeddedTexture, IBitmapTexture, embeddedTexture_schema)
SCENE_PLAIN_INTERFACE(IFileTexture, IBitmapTexture, fileTexture_schema)
SCENE_PLAIN_INTERFACE(IRandomTexture, ITexture, randomTexture_schema)
SCENE_PLAIN_INTERFACE(INoiseTexture, ITexture, noiseTexture_schema)
SCENE_PLAIN_INTERFACE(IVertColorTexture, ITexture, vertColorTexture_schema)
SCENE_PLAIN_INTERFACE(ICellularTexture, ITexture, cellularTexture_schema)
SCENE_PLAIN_INTERFACE(ICheckerTexture, ITexture, checkerTexture_schema)
SCENE_PLAIN_INTERFACE(ICurvatureTexture, ITexture, curvatureTexture_schema)
SCENE_PLAIN_INTERFACE(ICubistTexture, ITexture, cubistTexture_schema)
SCENE_PLAIN_INTERFACE(IDotsTexture, ITexture, dotsTexture_schema)
SCENE_PLAIN_INTERFACE(IMixTexture, ITexture, mixTexture_schema)

// ---- Materials ----

// A material may inherit from another: the attributes it does not hold are
// read from the material in its "inherit" attribute (map inheritance, which
// stops by itself when that material dies).
class IMaterial : public ::base::IPlugin, public material_schema {
    SCENE_INTERFACE_MEMBERS(::base::IPlugin)

    // Sets "inherit" to 'material' and takes it as the base of this map in
    // place of the previous one; null drops both. This material itself, or one
    // that already inherits from it, is refused: the scene log gets "The object
    // can't inherit itself!" (error), nothing changes and the answer is false.
    bool inheritFrom(IMaterial* material);
    // Takes the base from "inherit" as it stands, for an attribute set
    // directly or read from a stored form; refuses like inheritFrom. An
    // "inherit" that holds no material drops the base.
    bool updateInheritance();
    // The material inherited from, or null.
    IMaterial* inherited() const;

    // Clones inherit from the same material.
    ::base::Attribute* clone() const override;
    void postLoad() override { updateInheritance(); }

private:
    bool refusesBase(const IMaterial* material) const;
};

SCENE_PLAIN_INTERFACE(IPrincipalMaterial, IMaterial, principalMaterial_schema)
SCENE_PLAIN_INTERFACE(IHairMaterial, IMaterial, hairMaterial_schema)
SCENE_PLAIN_INTERFACE(IToonMaterial, IMaterial, toonMaterial_schema)

// ---- Cameras, lights, environment, render output ----

SCENE_PLAIN_INTERFACE(ICamera, ::base::IPlugin, camera_schema)
SCENE_PLAIN_INTERFACE(ILight, ::base::IPlugin, light_schema)
SCENE_PLAIN_INTERFACE(ILightGroup, ::base::IPlugin, lightGroup_schema)
SCENE_PLAIN_INTERFACE(IEnvironment, ::base::IPlugin, environment_schema)
SCENE_PLAIN_INTERFACE(IClipPlane, ::base::IPlugin, clipPlane_schema)
SCENE_PLAIN_INTERFACE(IRenderOutput, ::base::IPlugin, renderOutput_schema)

// ---- Animation ----

SCENE_PLAIN_INTERFACE(IAnimClip, ::base::IPlugin, animClip_schema)

// Plays the clips of its "actions" at its "time" (scene_animation.cpp): item j
// of "outputs" holds the value of channel j (the channels of all actions
// counted in order), so an attribute linked to that item reads the animated
// value. Reading an output through a link evaluates the layer when its time
// or its clips changed since the last evaluation; evaluate() forces one. The
// layer listens to the clips and channels it plays and rebuilds its clip list
// when one of them, or its "actions", reports a change.
class IAnimLayer : public ::base::IPlugin, public ::base::PluginCallback, public animLayer_schema {
public:
    IAnimLayer(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory, std::uint32_t id);
    ~IAnimLayer() override;
    using ::base::IPlugin::data;
    using ::base::IPlugin::name;
    using ::base::IPlugin::size;
    using ::base::IPlugin::typeName;

    // Computes every channel at the current "time" and stores the results in
    // "outputs". Problems are logged; their outputs keep their last value.
    void evaluate();

    void pluginChanged(::base::IPlugin& plugin, ::base::name_id attribute, std::uint32_t kind,
                       std::uint64_t identifier) override;
    void attributeChanged(::base::name_id name, ::base::Attribute* attribute,
                          std::uint32_t flags) override;
    void refreshPath(::base::AttribPath& path, ::base::name_id expectedType) override;

    struct Playback;

private:
    Playback* m_playback;
};

// One animated value. Each curve of "curves" holds keys whose "values" are of
// the value type T the channel is evaluated for: int, float, double, quatf,
// quatd and the float and double vectors of 2 to 4 components
// (scene_animation.cpp instantiates exactly these).
class IKeyframeChannel : public ::base::IPlugin, public keyframeChannel_schema {
public:
    IKeyframeChannel(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                     std::uint32_t id);
    ~IKeyframeChannel() override;
    using ::base::IPlugin::data;
    using ::base::IPlugin::name;
    using ::base::IPlugin::size;
    using ::base::IPlugin::typeName;

    // The value of curve 'curve' at 'time'; the zero value when nothing can be
    // computed (the reason is logged). An interpolation mode outside 0..3
    // throws base::switch_exception.
    template <class T>
    T computeValue(std::uint32_t curve, ::base::TimeCode time) const;

    // Puts a key into curve 'curve' (replacing the value of a key at the same
    // time), creating "times" and "values" when absent. False, logged, when
    // the channel has no curves or the curve holds values of another type.
    template <class T>
    bool setKey(std::uint32_t curve, ::base::TimeCode time, const T& value);

    // Forgets what was learnt about the curves (their order checks).
    void attributeChanged(::base::name_id name, ::base::Attribute* attribute,
                          std::uint32_t flags) override;

    struct Memo;

private:
    // Per curve: whether its "times" were found ascending, and the last
    // segment found (playback reads neighbouring times).
    Memo* m_memo;
};

#undef SCENE_PLAIN_INTERFACE

} // namespace scene

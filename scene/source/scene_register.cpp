// The descriptors of the scene types and their registration.
#include "scene_cmdline.h"
#include "scene_interfaces.h"

#include <new>

namespace scene {

namespace {

// The descriptor of the type whose objects are of class I. A class with a
// static registerOptions(CmdLineOptions&) adds its options through it.
template <class I>
class InterfaceDesc final : public SceneTypeDesc {
public:
    explicit InterfaceDesc(::base::name_id type) : SceneTypeDesc(type) {}

    ::base::IPlugin* create(::base::PluginFactory& factory, std::uint32_t id) override {
        try {
            return new I(this, &factory, id);
        } catch (const std::bad_alloc&) {
            return nullptr;
        }
    }

    void registerOptions(::base::CmdLineOptions& options) override {
        if constexpr (requires { I::registerOptions(options); })
            I::registerOptions(options);
    }
};

// Made once and never released: factories of every lifetime share it, and
// the one reference kept here outlives them all. Null when out of memory.
template <class I>
InterfaceDesc<I>* makeDescriptor(::base::name_id type) {
    try {
        auto* desc = new InterfaceDesc<I>(type);
        desc->addRef();
        return desc;
    } catch (const std::bad_alloc&) {
        return nullptr;
    }
}

void registerDescriptor(::base::PluginFactory& factory, ::base::IPluginDesc* desc) {
    if (desc)
        factory.registerPlugin(::base::ref<::base::IPluginDesc>(desc));
}

#define SCENE_TYPE_ROW(type, Interface) SceneType{&names::type, #type, #Interface},
constexpr SceneType kSceneTypes[] = {SCENE_REGISTERED_TYPES(SCENE_TYPE_ROW)};
#undef SCENE_TYPE_ROW

} // namespace

void register_scene_schema(::base::PluginFactory& factory) {
    init_schema_names();
    // One function-local descriptor per type, _<Interface>Desc.
#define SCENE_REGISTER_TYPE(type, Interface)                                                       \
    static InterfaceDesc<Interface>* const _##Interface##Desc =                                    \
        makeDescriptor<Interface>(names::type);                                                    \
    registerDescriptor(factory, _##Interface##Desc);
    SCENE_REGISTERED_TYPES(SCENE_REGISTER_TYPE)
#undef SCENE_REGISTER_TYPE
}

std::span<const SceneType> sceneTypes() noexcept {
    return kSceneTypes;
}

void IScene::registerOptions(::base::CmdLineOptions& options) {
    register_scene_options(options);
}

} // namespace scene

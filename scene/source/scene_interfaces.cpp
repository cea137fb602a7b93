// What the scene classes do beyond holding attributes: interface attachment
// and material inheritance. Bounds, transforms and change handling are
// minimal here; nodes compute theirs in scene_node.cpp.
#include "scene_interfaces.h"
#include "scene_getter.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

namespace scene {

base::name_id IBounded::interfaceName() {
    static const ::base::name_id name("IBounded");
    return name;
}

base::name_id IHierarchical::interfaceName() {
    static const ::base::name_id name("IHierarchical");
    return name;
}

// INode lives in scene_node.cpp.

// IAnimLayer and IKeyframeChannel live in scene_animation.cpp.

// ---- IMaterial ----

bool IMaterial::refusesBase(const IMaterial* material) const {
    // Walking the candidate's bases catches a cycle as well as the material
    // itself: either would make every lookup of a missing name go round.
    for (const ::base::AttribMap* b = material; b; b = b->base())
        if (b == this) {
            ::base::logFormatted(::base::logScene, ::base::logError,
                                 "The object can't inherit itself!");
            return true;
        }
    return false;
}

bool IMaterial::inheritFrom(IMaterial* material) {
    if (refusesBase(material))
        return false;
    if (material)
        setAttribute(names::inherit, ::base::ref<::base::IPlugin>(material));
    else
        removeAttribute(names::inherit);
    setBase(material);
    return true;
}

IMaterial* IMaterial::inherited() const {
    // The own entry only: a typed lookup would find the base's "inherit" once
    // this one is gone and skip a generation.
    using Ref = ::base::ref<::base::IPlugin>;
    const ::base::Attribute* entry = findEntry(names::inherit);
    if (!entry || entry->typeName() != ::base::TypeTraits<Ref>::n_name)
        return nullptr;
    return dynamic_cast<IMaterial*>(static_cast<const Ref*>(entry->data())->get());
}

bool IMaterial::updateInheritance() {
    IMaterial* material = inherited();
    if (refusesBase(material))
        return false;
    setBase(material);
    return true;
}

base::Attribute* IMaterial::clone() const {
    ::base::Attribute* copy = ::base::IPlugin::clone();
    if (auto* material = dynamic_cast<IMaterial*>(copy))
        material->updateInheritance();
    return copy;
}

} // namespace scene

#include "b_factory.h"

#include "b_attrib_map.h"
#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

namespace base {

Attribute* AttribFactory::create(name_id type) const {
    if (Creator make = creator(type))
        return make();
    logFormatted(logSystem, logWarning, "factory: Trying to create am item with unknown type {}.",
                 type);
    return nullptr;
}

void AttribFactory::registerType(name_id type, Creator creator) {
    WriteGuard guard(m_lock);
    m_creators.insert_or_assign(type, creator);
}

bool AttribFactory::contains(name_id type) const {
    return creator(type) != nullptr;
}

AttribFactory::Creator AttribFactory::creator(name_id type) const {
    ReadGuard guard(m_lock);
    auto it = m_creators.find(type);
    return it == m_creators.end() ? nullptr : it->second;
}

vector<name_id> AttribFactory::types() const {
    ReadGuard guard(m_lock);
    vector<name_id> out;
    out.reserve(m_creators.size());
    for (const auto& entry : m_creators)
        out.push_back(entry.first);
    return out;
}

AttribFactory& attribFactory() {
    // Never destroyed: maps being torn down during static destruction of other
    // libraries may still create or look up types.
    static AttribFactory* factory = [] {
        auto* f = new (guardedAllocate(sizeof(AttribFactory))) AttribFactory();
#define BASE_REGISTER_ATTRIBUTES(T, label, code)                                                   \
    f->registerType(TypeTraits<T>::n_name, &AttribFactory::make<TypedAttribute<T>>);               \
    f->registerType(TypeTraits<T>::n_array_name, &AttribFactory::make<TypedVectorAttribute<T>>);
        BASE_VALUE_TYPES(BASE_REGISTER_ATTRIBUTES)
#undef BASE_REGISTER_ATTRIBUTES
        registerContainerTypes(*f);
        registerPluginAttributeTypes(*f);
        return f;
    }();
    return *factory;
}

} // namespace base

// The attribute factory: creates empty attributes by type name. Maps, arrays and
// the structured and binary readers recreate their entries through it, so every
// type that can be stored must be registered here. The process-wide factory
// behind attribFactory() holds every single and array type of the vocabulary
// (b_type_traits.h); the containers and plug-in references register theirs.
#pragma once

#include "b_attribute.h"
#include "b_lock.h"
#include "b_memory.h"
#include "b_name.h"

namespace base {

class AttribFactory : NonCopyable {
public:
    using Creator = Attribute* (*)();

    // A new empty attribute of the type, owned by the caller. An unregistered
    // type logs the warning "factory: Trying to create am item with unknown type
    // {}." and answers null; callers with their own message test contains().
    Attribute* create(name_id type) const;
    // Adds or replaces the creator of a type.
    void registerType(name_id type, Creator creator);
    bool contains(name_id type) const;
    // The creator of a type, or null.
    Creator creator(name_id type) const;
    // Registered types in the order of their name_ids.
    vector<name_id> types() const;

    // The creator of an attribute class.
    template <class A>
    static Attribute* make() {
        return new A();
    }

private:
    map<name_id, Creator> m_creators;
    // Lookups read, registration writes.
    mutable LockWord m_lock{0};
};

// The process-wide factory, filled with the vocabulary on first use. Must not
// be called during the static initialisation of base1.
AttribFactory& attribFactory();

} // namespace base

// The shared-array pool: equal arrays of one import become links to the first.
#include "as_mesh.h"

#include "b_plugin.h"

namespace as {

// The position of the attribute being offered, as steps from the object.
struct SharedArrayPool::Walk {
    struct Step {
        base::name_id member; // null for an item step
        std::uint32_t index;
    };

    base::IPlugin* root;
    base::vector<Step> steps;

    base::AttribPath path() const {
        base::AttribPath result;
        result.addPlugin(root);
        for (const Step& step : steps) {
            if (step.member)
                result.addMember(step.member);
            else
                result.addItem(step.index);
        }
        return result;
    }
};

std::uint32_t SharedArrayPool::share(base::IPlugin& object) {
    Walk walk{&object, {}};
    return offerMembers(walk, object);
}

std::uint32_t SharedArrayPool::offerMembers(Walk& walk, base::AttribMap& map) {
    std::uint32_t linked = 0;
    // By index: replacing an entry by a link keeps the entry's place.
    for (std::size_t i = 0; i < map.entries().size(); ++i) {
        const base::AttribMap::Entry entry = map.entries()[i];
        walk.steps.push_back({entry.first, 0});
        if (base::Attribute* link = offer(walk, *entry.second, linked)) {
            map.attribute(entry.first, link);
            ++linked;
        }
        walk.steps.pop_back();
    }
    return linked;
}

base::Attribute* SharedArrayPool::offer(Walk& walk, base::Attribute& attribute,
                                        std::uint32_t& linked) {
    if (attribute.asLink())
        return nullptr;
    if (base::AttribMap* map = attribute.asMap()) {
        linked += offerMembers(walk, *map);
        return nullptr;
    }
    if (base::AttribArray* array = attribute.asArray()) {
        for (std::uint32_t i = 0; i < array->size(); ++i) {
            walk.steps.push_back({base::name_id(), i});
            if (base::Attribute* link = offer(walk, *array->item(i), linked)) {
                array->setItem(i, link);
                ++linked;
            }
            walk.steps.pop_back();
        }
        return nullptr;
    }

    if (attribute.size() < 3 || !attribute.data(base::wholeValue))
        return nullptr;

    Shape& shape = m_shapes[{attribute.typeName(), attribute.size()}];
    if (!shape.hasUnhashed && shape.byHash.empty()) {
        shape.unhashed = walk.path();
        shape.hasUnhashed = true;
        ++m_size;
        return nullptr;
    }
    const std::uint64_t hash = attribute.hash();
    if (hash == 0)
        return nullptr;
    if (shape.hasUnhashed) {
        // An attribute that hashes to 0 (or is gone) never matches.
        if (const base::Attribute* first = shape.unhashed.resolve())
            if (const std::uint64_t firstHash = first->hash())
                shape.byHash.emplace(firstHash, shape.unhashed);
        shape.unhashed = base::AttribPath();
        shape.hasUnhashed = false;
    }

    const void* value = attribute.data(base::wholeValue);
    auto [first, last] = shape.byHash.equal_range(hash);
    for (auto it = first; it != last; ++it) {
        const base::Attribute* pooled = it->second.resolve();
        if (!pooled || pooled == &attribute || pooled->typeName() != attribute.typeName())
            continue;
        if (pooled->compare(value) == 0)
            return new base::AttribLink(it->second);
    }
    shape.byHash.emplace(hash, walk.path());
    ++m_size;
    return nullptr;
}

} // namespace as

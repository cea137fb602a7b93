// Typed reads of schema attributes: the one rule every reader of a scene
// object follows.
//
// The attribute is looked up with the map's typed lookup (links and map
// inheritance apply). When it holds a T, that value is answered; otherwise the
// default is. An attribute of another type, or a link that does not resolve,
// is reported by the lookup (one warning per read) and also answers the
// default. Nothing here throws for a missing or mistyped attribute; an empty
// name throws, as the lookup does.
//
//   bool visible = scene::get(node, node_schema::visible, node_schema::visibleDefault);
//   bool visible = SCENE_GET(node, node_schema, visible);
//   base::box3d box = scene::get(node, names::bounds, base::box3d::empty());
#pragma once

#include "b_attrib_map.h"
#include "b_name.h"

namespace scene {

template <class T>
T get(const base::AttribMap& object, base::name_id name, const T& fallback) {
    if (const T* value = object.findAttribute<T>(name))
        return *value;
    return fallback;
}

// Schema-bound form: the name and default functions of a schema struct. The
// default is built only when it is answered.
template <class T>
T get(const base::AttribMap& object, base::name_id (*name)(), T (*fallback)()) {
    if (const T* value = object.findAttribute<T>(name()))
        return *value;
    return fallback();
}

} // namespace scene

// get() with the schema struct and the attribute's name.
#define SCENE_GET(object, schema, attr)                                                            \
    ::scene::get((object), &schema::attr, &schema::attr##Default)

// The host's listing of cameras and lights: one line per object with its
// name, the path of the node that carries it, its world position and view
// direction, and the values of its kind. A user checks a camera rig at a
// glance this way; the corpus sweep compares the lines with assimp's scene.
//
// World frames are composed through the nodes' own local transformations
// from each scene's root down, so the listing shows what the scene model
// computes, not what the importer was given.
//
// Line layout, fields separated by tabs:
//   camera NAME PATH  position X Y Z  direction X Y Z  focalLength F  sensor W H
//   light  NAME PATH  position X Y Z  direction X Y Z  type T  color R G B
//          [cone DEGREES penumbra DEGREES] [size S ratio R]
// PATH is the node names from the scene's root joined by '/'; an object no
// scene reaches has the path "-" and no position or direction.
#pragma once

#include "b_math.h"
#include "b_memory.h"
#include "b_plugin_factory.h"

#include <string_view>

namespace host {

enum class ListKind { cameras, lights };

// Kinds from "cameras", "lights" or both separated by commas; false with the
// reason in 'error' for anything else.
bool parseListKinds(std::string_view text, base::vector<ListKind>& kinds, base::string& error);

// Where an object sits in the world.
struct Placement {
    base::IPlugin* object = nullptr;
    base::string path; // empty when no scene reaches the object
    base::vec3d position{};
    base::vec3d direction{};
};

// Every object of 'type' in registration order, placed through the first
// path from a scene's root that reaches it.
base::vector<Placement> placements(const base::PluginFactory& factory, base::name_id type);

// The listing lines of the kinds asked for, cameras first.
base::string formatListing(const base::PluginFactory& factory, const base::vector<ListKind>& kinds);

} // namespace host

// The host's `--list KINDS` (printed after the import, and after each --time):
// cameras and lights, one line per object with its name, the path of the node
// that carries it, its world position and view direction, and the values of
// its kind, so a user checks a camera rig at a glance; nodes, with each node's
// world position; poses, with each node's local translate, rotate and scale
// as read through the node (animated ones show the played values). The
// corpus sweep compares these lines with assimp's scene.
//
// World frames are composed through the nodes' own local transformations
// from each scene's root down, so the listing shows what the scene model
// computes, not what the importer was given.
//
// Line layout, fields separated by tabs:
//   camera NAME PATH  position X Y Z  direction X Y Z  focalLength F  sensor W H
//   light  NAME PATH  position X Y Z  direction X Y Z  type T  color R G B
//          [cone DEGREES penumbra DEGREES] [size S ratio R]
//   NAME X Y Z                              (nodes, separated by blanks)
//   NAME TX TY TZ RW RX RY RZ SX SY SZ      (poses, separated by blanks)
// PATH is the node names from the scene's root joined by '/'; an object no
// scene reaches has the path "-" and no position or direction.
#pragma once

#include "b_math.h"
#include "b_memory.h"
#include "b_plugin_factory.h"

#include <string_view>

namespace host {

enum class ListKind { cameras, lights, nodes, poses };

// Kinds from "cameras", "lights", "nodes" and "poses", separated by commas;
// false with the reason in 'error' for anything else.
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

// The world transform of every node reachable from the roots of the
// factory's scenes, by node, parents composed before children.
struct NodeWorld {
    const base::IPlugin* node;
    base::mat43 world;
};
base::vector<NodeWorld> nodeWorlds(const base::PluginFactory& factory);

// The listing lines of the kinds asked for, in the order of ListKind.
base::string formatListing(const base::PluginFactory& factory, const base::vector<ListKind>& kinds);

} // namespace host

// Counts of what an import left in a factory: objects per type, vertices,
// faces and joints, and the counts of every mesh. The host prints them as its
// summary; the corpus sweep compares the per-mesh counts with assimp's own.
//
// Arrays that the importer's shared-array pool replaced by links are counted
// through the link, so a mesh that shares its positions with another still
// reports its own vertex count.
#pragma once

#include "b_attrib_map.h"
#include "b_memory.h"
#include "b_plugin_factory.h"

#include <cstdint>
#include <utility>

namespace host {

struct MeshCounts {
    base::string name;
    std::uint64_t vertices = 0;
    std::uint64_t faces = 0;
};

struct SceneStats {
    // Type name and object count, in the order the types first occur.
    base::vector<std::pair<base::string, std::uint32_t>> types;
    std::uint64_t vertices = 0;
    std::uint64_t faces = 0;
    std::uint64_t joints = 0;
    // One entry per "mesh" object, in instance-id order.
    base::vector<MeshCounts> meshes;
};

// The attribute under 'name' (inherited entries included) with a link
// followed to its target; null when absent or when the link does not resolve.
const base::Attribute* resolvedAttribute(const base::AttribMap& map, base::name_id name);

// Faces of a mesh: per primitive, a single face size V counts indexCount / V
// (the whole index array when the primitive has no range), a per-face array
// counts its items.
std::uint64_t faceCount(const base::AttribMap& mesh);

SceneStats collectStats(const base::PluginFactory& factory);

// One line per type with its count, then vertices, faces, joints and the time.
base::string formatSummary(const SceneStats& stats, double seconds);

} // namespace host

// Vertex welding: vertices whose whole record is the same (every stream, and
// the joint influences of skinned meshes) become one vertex, and the faces and
// bone weights are remapped to the vertices kept.
//
// assimp reads without its own join, which costs several times the read
// itself on large meshes; the mesh conversion welds each mesh instead, in
// O(n): one pass looks every vertex up in an open-addressing table keyed by
// its position and writes its new index into one remap array, a second pass
// moves the kept vertices down in place. The first vertex of each record is
// kept, and the kept vertices keep their order.
//
// "The same" is what the join our files were made with before meant: equal
// positions, and every other vector (normal, tangent, bitangent, each
// texture-coordinate and colour set, each morph target's vectors) within
// 1e-5 of the other's, so that rounding noise in computed normals does not
// keep vertices apart. Unlike that join, colours and joint influences (the
// same joints, weights within 1e-5) do take part: merging vertices of another
// colour or weight would lose data. -0 and +0 are the same (they compare
// equal, and every consumer treats them alike); NaN is the same as nothing,
// not even itself, so a vertex holding a NaN stays on its own.
#pragma once

#include <cstdint>
#include <span>

struct aiMesh;

namespace as {

// One per-vertex stream of floats: vertex v starts at data + v * stride, and
// its first 'width' floats take part in the comparison (all 'stride' move).
struct WeldStream {
    float* data = nullptr;
    std::uint32_t stride = 0;
    std::uint32_t width = 0;
};

// One joint influence of a vertex.
struct WeldInfluence {
    std::uint32_t joint = 0;
    float weight = 0;
};

// The influences of each vertex: vertex v's are entries[starts[v]] up to
// entries[starts[v + 1]], sorted by joint, then weight.
struct WeldInfluences {
    const std::uint32_t* starts = nullptr;
    const WeldInfluence* entries = nullptr;
};

// How far apart two vectors of one record other than the positions may lie
// and still be the same.
inline constexpr float weldTolerance = 1e-5f;

// Set in a remap entry when the vertex is not kept: it repeats an earlier
// record, or it is unused (the whole entry is then weldUnused).
inline constexpr std::uint32_t weldRepeat = 0x80000000u;
inline constexpr std::uint32_t weldUnused = 0xFFFFFFFFu;

// Finds the distinct records among 'count' vertices (count below weldRepeat).
// streams[0] holds the positions, compared exactly. On entry remap[v] is weldUnused for a vertex
// to leave out, anything else for the others; on return it holds the new
// index of each vertex kept, or the new index of the record it repeats with
// weldRepeat set. Answers the number of vertices kept.
std::uint32_t findDistinctVertices(std::span<const WeldStream> streams,
                                   const WeldInfluences& influences, std::uint32_t count,
                                   std::uint32_t* remap);

// Moves each vertex of 'stream' that is kept to its new index; 'remap' is
// what findDistinctVertices wrote.
void compactStream(const WeldStream& stream, std::span<const std::uint32_t> remap);

// Welds 'mesh' in place: its streams (those of its morph targets too), face
// indices and bone weights; vertices that no face uses are dropped. Answers
// the new vertex count. A mesh without positions or faces is left as it is;
// face indices and bone weights that point past the vertices stay as they
// are, for the conversion to report.
std::uint32_t weldMesh(aiMesh& mesh);

} // namespace as

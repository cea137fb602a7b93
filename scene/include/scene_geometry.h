// Index delta coding of meshes.
//
// IMesh::deltaCompressIndices() stores a mesh's "indices" in a form that
// compresses well: within each primitive every face is rotated so that its
// smallest index comes first, the faces are sorted by their indices, and each
// face is written relative to the face before it (and its later indices
// relative to its first). The mesh's "indicesDeltaCompression" byte marks the
// coded form. Every reader of "indices" (bounds, validation, writers that want
// plain indices) goes through decodeMeshIndices, so coder and decoder agree
// on one rule for which primitives are coded:
//
//   - "vcounts" is a single value of 2, 3 or 4, or an array whose values are
//     all at least 3 (points, lines of one size and larger single sizes stay
//     plain);
//   - its range "indexStart" / "indexCount" (absent: from 0 / to the end) lies
//     within "indices" and its faces fill the range exactly;
//   - the range does not overlap the range of an earlier coded primitive.
//
// Other primitives keep plain indices although the mesh carries the flag.
#pragma once

#include "b_attrib_map.h"

#include <cstdint>
#include <span>

namespace scene {

// Decodes in place 'indices' coded by IMesh::deltaCompressIndices, with the
// primitives the coder saw (the mesh's "primitives"; null means none).
void decodeMeshIndices(std::span<std::uint32_t> indices, const ::base::AttribArray* primitives);

// The plain indices of a mesh: its "indices" (links followed), decoded when
// "indicesDeltaCompression" is set. Empty when the mesh has no "indices".
::base::ArrayOf<std::uint32_t> decodeMeshIndices(const ::base::AttribMap& mesh);

} // namespace scene

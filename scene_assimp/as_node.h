// The node conversion's transform decomposition, shared with its tests.
#pragma once

#include "scene_interfaces.h"

#include <assimp/matrix4x4.h>

namespace as {

// Writes 'matrix' into the node's "translate", "shear" (only when one factor
// is not negligible), "rotate" and "scale" attributes so that its 3x3 part is
// rotation x shear x scale. At debug level the result is checked against the
// source and a mismatch is logged.
void setTransform(scene::INode& node, const aiMatrix4x4& matrix);

} // namespace as

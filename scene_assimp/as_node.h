// The node conversion's transform decomposition, shared with its tests.
#pragma once

#include "b_memory.h"
#include "scene_interfaces.h"

#include <assimp/matrix4x4.h>
#include <assimp/scene.h>

namespace as {

// Visits the source tree below 'root' in conversion order (pre-order,
// children in order), so the first node of a name met is the one assimp's
// own search answers and the one converted first. A node listing one of its
// ancestors is visited once.
template <class Visit>
void forEachSourceNode(const aiNode* root, Visit&& visit) {
    base::vector<const aiNode*> pending{root};
    base::map<const aiNode*, bool> seen;
    while (!pending.empty()) {
        const aiNode* node = pending.back();
        pending.pop_back();
        if (!node || !seen.emplace(node, true).second)
            continue;
        visit(*node);
        for (unsigned i = node->mChildren ? node->mNumChildren : 0; i-- > 0;)
            pending.push_back(node->mChildren[i]);
    }
}

// Writes 'matrix' into the node's "translate", "shear" (only when one factor
// is not negligible), "rotate" and "scale" attributes so that its 3x3 part is
// rotation x shear x scale. At debug level the result is checked against the
// source and a mismatch is logged.
void setTransform(scene::INode& node, const aiMatrix4x4& matrix);

} // namespace as

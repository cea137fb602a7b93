// Mesh conversion support: the pool that stores identical arrays of one import
// once, and the skin construction that the mesh conversion runs for meshes
// with bones.
//
// After a mesh is converted, every value attribute of it (descending into maps
// and arrays) is offered to the pool. An array equal to one offered earlier in
// the same import is replaced by a link to that earlier attribute, so repeated
// positions, index lists or texture coordinates are held once. The importer
// empties the pool at the start of every import: a link never points into an
// object of an earlier import, which may live in another factory or be gone.
#pragma once

#include "b_attrib_map.h"
#include "b_memory.h"
#include "b_refcnt.h"

#include <cstdint>
#include <map>
#include <string_view>

struct aiMesh;

namespace base {
class IPlugin;
class PluginFactory;
} // namespace base

namespace scene {
class IGeometry;
class IMesh;
} // namespace scene

namespace as {

class SharedArrayPool {
public:
    SharedArrayPool() = default;
    SharedArrayPool(const SharedArrayPool&) = delete;
    SharedArrayPool& operator=(const SharedArrayPool&) = delete;

    // Forgets every pooled path.
    void clear() noexcept {
        m_shapes.clear();
        m_size = 0;
    }
    std::size_t size() const noexcept { return m_size; }

    // Offers the attributes of 'object': arrays of at least 3 items equal to a
    // pooled one become links to it, the others are pooled. Answers the number
    // of attributes replaced by links.
    std::uint32_t share(base::IPlugin& object);

private:
    struct Walk;
    std::uint32_t offerMembers(Walk& walk, base::AttribMap& map);
    // The link that replaces 'attribute', or null; counts links made below it.
    base::Attribute* offer(Walk& walk, base::Attribute& attribute, std::uint32_t& linked);

    using ByHash =
        std::multimap<std::uint64_t, base::AttribPath, std::less<std::uint64_t>,
                      base::StdAllocator<std::pair<const std::uint64_t, base::AttribPath>>>;
    // The arrays of one type and item count. Only arrays of the same shape
    // can be equal, so an array is hashed once a second one of its shape
    // arrives: a mesh whose arrays all differ pays no hashing.
    struct Shape {
        base::AttribPath unhashed; // the first of its shape, until a second comes
        bool hasUnhashed = false;
        ByHash byHash;
    };
    using ShapeKey = std::pair<base::name_id, std::uint32_t>;
    std::map<ShapeKey, Shape, std::less<ShapeKey>,
             base::StdAllocator<std::pair<const ShapeKey, Shape>>>
        m_shapes;
    std::size_t m_size = 0;
};

// Writes the bind pose and the joint weights of 'source's bones on 'mesh'
// (whose "positions" are already converted) and wraps it in a new "skin" of
// 'factory'. 'meshName' is the mesh's unique name, used for the skin's name
// and in log lines. Reassigns weights on missing vertices to vertex 0 in
// 'source'. Answers null when the skin type cannot be created.
base::ref<scene::IGeometry> buildSkin(base::PluginFactory& factory, scene::IMesh& mesh,
                                      std::string_view meshName, aiMesh& source);

} // namespace as

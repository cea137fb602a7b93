// Geometry behaviour: bounds of meshes and skins, the index delta coding of
// meshes, mesh validation, and the decoding of stored line and hair starts.
#include "scene_geometry.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>

namespace scene {

namespace {

using ::base::AttribArray;
using ::base::AttribMap;
using ::base::Attribute;
using ::base::name_id;
using Indices = ::base::ArrayOf<std::uint32_t>;
using Counts = ::base::ArrayOf<std::uint16_t>;
using IndexAttribute = ::base::TypedVectorAttribute<std::uint32_t>;

// The entry here or inherited, its link followed. Unlike the typed lookups
// this logs nothing, for attributes that may hold one of several types.
const Attribute* findResolved(const AttribMap& map, name_id name) {
    Attribute* found = map.findInherited(name);
    if (found)
        if (::base::AttribLink* link = found->asLink())
            found = link->resolve();
    return found;
}

template <class T>
const T* valueOf(const AttribMap& map, name_id name) {
    const Attribute* found = findResolved(map, name);
    return found && found->typeName() == ::base::TypeTraits<T>::n_name
               ? static_cast<const T*>(found->data())
               : nullptr;
}

template <class T>
const ::base::ArrayOf<T>* arrayOf(const AttribMap& map, name_id name) {
    const Attribute* found = findResolved(map, name);
    return found && found->typeName() == ::base::TypeTraits<T>::n_array_name
               ? static_cast<const ::base::ArrayOf<T>*>(found->data())
               : nullptr;
}

const AttribArray* mapArray(const AttribMap& map, name_id name) {
    const Attribute* found = findResolved(map, name);
    return found ? const_cast<Attribute*>(found)->asArray() : nullptr;
}

// Whether 'map' holds the array 'name' itself: not through a link and not
// inherited from a base map.
bool ownsArray(const AttribMap& map, name_id name) {
    Attribute* entry = const_cast<AttribMap&>(map).findEntry(name);
    return entry && !entry->asLink() && entry->asArray();
}

const AttribMap* itemMap(Attribute* item) {
    return item ? item->asMap() : nullptr;
}

// ---- Index delta coding ----

// The faces of one coded primitive: either every face has 'size' indices or
// 'perFace' lists them.
struct Layout {
    const AttribMap* primitive = nullptr;
    std::uint32_t start = 0;
    std::uint32_t count = 0;
    std::uint16_t size = 0;
    const Counts* perFace = nullptr;

    std::size_t faceCount() const { return size ? count / size : perFace->size(); }

    template <class F>
    void forEachFace(F&& f) const {
        std::uint32_t at = start;
        if (size) {
            for (std::uint32_t i = 0; i < count / size; ++i, at += size)
                f(at, std::uint32_t(size));
        } else {
            for (std::uint16_t n : *perFace) {
                f(at, std::uint32_t(n));
                at += n;
            }
        }
    }
};

// Whether the primitive's faces are coded (see scene_geometry.h), and where
// they lie in an index array of 'total' entries.
bool codedLayout(const AttribMap& primitive, std::size_t total, Layout& out) {
    const Attribute* vcounts = findResolved(primitive, names::vcounts);
    if (!vcounts)
        return false;
    if (vcounts->typeName() == ::base::TypeTraits<std::uint16_t>::n_name) {
        out.size = *static_cast<const std::uint16_t*>(vcounts->data());
        // A point has no second index to code against, and a size of 0 would
        // never leave its first face.
        if (out.size < 2 || out.size > 4)
            return false;
    } else if (vcounts->typeName() == ::base::TypeTraits<std::uint16_t>::n_array_name) {
        out.perFace = static_cast<const Counts*>(vcounts->data());
        if (out.perFace->empty())
            return false;
        for (std::uint16_t n : *out.perFace)
            if (n < 3)
                return false;
    } else {
        return false;
    }

    const std::uint32_t* start = valueOf<std::uint32_t>(primitive, names::indexStart);
    const std::uint32_t* count = valueOf<std::uint32_t>(primitive, names::indexCount);
    out.start = start ? *start : 0;
    if (out.start > total)
        return false;
    out.count = count ? *count : std::uint32_t(total - out.start);
    if (out.count > total - out.start)
        return false;
    // Faces that run past the range (or stop short of it) would code indices
    // of another primitive or of nothing.
    if (out.size)
        return out.count % out.size == 0;
    std::uint64_t sum = 0;
    for (std::uint16_t n : *out.perFace)
        sum += n;
    return sum == out.count;
}

// The coded primitives in order. A range that overlaps one coded before stays
// plain, so that decoding primitive by primitive undoes the coding exactly.
::base::vector<Layout> codedPrimitives(const AttribArray* primitives, std::size_t total) {
    ::base::vector<Layout> out;
    if (!primitives)
        return out;
    for (Attribute* item : primitives->items()) {
        const AttribMap* primitive = itemMap(item);
        Layout layout;
        if (!primitive || !codedLayout(*primitive, total, layout))
            continue;
        const bool overlaps = std::any_of(out.begin(), out.end(), [&](const Layout& l) {
            return layout.count && l.count && layout.start < l.start + l.count &&
                   l.start < layout.start + layout.count;
        });
        if (overlaps)
            continue;
        layout.primitive = primitive;
        out.push_back(layout);
    }
    return out;
}

// How far to rotate a face left so that its smallest index comes first. A
// face of 3 or 4 stays as it is only when its first index is strictly the
// smallest; otherwise the earliest later position holding the minimum leads.
std::uint32_t rotation(const std::uint32_t* c, std::uint32_t n) {
    if (n == 2)
        return c[1] < c[0] ? 1 : 0;
    const std::uint32_t* least = std::min_element(c, c + n);
    if (n > 4)
        return std::uint32_t(least - c);
    for (std::uint32_t j = 1; j < n; ++j)
        if (c[j] == *least)
            return j;
    return 0;
}

struct Face {
    std::uint32_t at;
    std::uint32_t n;
};

// Faces in ascending order of their channel-0 key (first, second, third,
// fourth index; a missing one counts as the largest value), stable. After the
// rotation the first index is the face's smallest, so it is bounded by the
// vertex count: a counting pass on it leaves only short runs to order by the
// rest of the key, which keeps big meshes linear. Keys spread far beyond the
// face count (stray indices) take the comparison sort.
void sortFaces(::base::vector<Face>& faces, const Indices& c0) {
    constexpr std::uint32_t missing = std::numeric_limits<std::uint32_t>::max();
    auto key = [&](const Face& f) {
        const std::uint32_t* c = c0.data() + f.at;
        return std::array<std::uint32_t, 4>{c[0], c[1], f.n > 2 ? c[2] : missing,
                                            f.n > 3 ? c[3] : missing};
    };
    auto less = [&](const Face& a, const Face& b) { return key(a) < key(b); };

    std::uint32_t largest = 0;
    for (const Face& f : faces)
        largest = std::max(largest, c0[f.at]);
    if (faces.size() < 64 || largest / 4 > faces.size()) {
        std::stable_sort(faces.begin(), faces.end(), less);
        return;
    }

    ::base::vector<std::uint32_t> next(std::size_t(largest) + 2, 0);
    for (const Face& f : faces)
        ++next[std::size_t(c0[f.at]) + 1];
    for (std::size_t i = 1; i < next.size(); ++i)
        next[i] += next[i - 1];
    ::base::vector<Face> sorted(faces.size());
    for (const Face& f : faces)
        sorted[next[c0[f.at]]++] = f;

    for (std::size_t i = 0; i < sorted.size();) {
        std::size_t j = i + 1;
        while (j < sorted.size() && c0[sorted[j].at] == c0[sorted[i].at])
            ++j;
        const auto first = sorted.begin() + std::ptrdiff_t(i);
        const auto last = sorted.begin() + std::ptrdiff_t(j);
        if (j - i > 32) {
            std::stable_sort(first, last, less);
        } else {
            // Runs are a handful of faces around one vertex: an insertion
            // sort, stable and without the merge buffer of a general sort.
            for (auto k = first + 1; k < last; ++k)
                for (auto m = k; m > first && less(*m, *(m - 1)); --m)
                    std::iter_swap(m, m - 1);
        }
        i = j;
    }
    faces.swap(sorted);
}

void encodePrimitive(const Layout& layout, const ::base::vector<Indices*>& channels,
                     Counts* perFace) {
    Indices& c0 = *channels.front();
    ::base::vector<Face> faces;
    faces.reserve(layout.faceCount());
    layout.forEachFace([&](std::uint32_t at, std::uint32_t n) { faces.push_back({at, n}); });

    for (const Face& f : faces)
        if (std::uint32_t r = rotation(c0.data() + f.at, f.n))
            for (Indices* channel : channels)
                std::rotate(channel->begin() + f.at, channel->begin() + f.at + r,
                            channel->begin() + f.at + f.n);

    sortFaces(faces, c0);

    Indices scratch;
    scratch.reserve(layout.count);
    for (Indices* channel : channels) {
        scratch.clear();
        for (const Face& f : faces)
            scratch.insert(scratch.end(), channel->begin() + f.at, channel->begin() + f.at + f.n);
        std::copy(scratch.begin(), scratch.end(), channel->begin() + layout.start);
    }
    if (perFace)
        for (std::size_t i = 0; i < faces.size(); ++i)
            (*perFace)[i] = std::uint16_t(faces[i].n);

    // Back to front, so that each face still sees its predecessor's plain
    // indices.
    std::uint32_t at = layout.start + layout.count;
    for (std::size_t f = faces.size(); f-- > 0;) {
        const std::uint32_t n = faces[f].n;
        at -= n;
        std::uint32_t* c = c0.data() + at;
        const std::uint32_t* p = f ? c - faces[f - 1].n : nullptr;
        const std::uint32_t base = p && c[0] == p[0] ? p[1] : c[0];
        c[1] -= base;
        for (std::uint32_t j = 2; j < n; ++j)
            c[j] -= c[0];
        if (p)
            c[0] -= p[0];
    }
}

void decodePrimitive(const Layout& layout, std::span<std::uint32_t> indices) {
    const std::uint32_t* p = nullptr;
    layout.forEachFace([&](std::uint32_t at, std::uint32_t n) {
        std::uint32_t* c = indices.data() + at;
        if (p)
            c[0] += p[0];
        for (std::uint32_t j = 2; j < n; ++j)
            c[j] += c[0];
        c[1] += p && c[0] == p[0] ? p[1] : c[0];
        p = c;
    });
}

void logChannelFailure(const IMesh& mesh) {
    ::base::logFormatted(::base::logScene, ::base::logDebug,
                         "Failed to encode delta channel for mesh '{}'! Shared or verbose index "
                         "channel detected.",
                         mesh.name());
}

bool isCoded(const AttribMap& mesh) {
    const std::uint8_t* flag = valueOf<std::uint8_t>(mesh, names::indicesDeltaCompression);
    return flag && *flag;
}

// ---- Bounds ----

bool finite(const ::base::vec3f& p) {
    return std::isfinite(p.x) && std::isfinite(p.y) && std::isfinite(p.z);
}

void extend(::base::box3d& box, const ::base::vec3f& p) {
    // NaN would stick to a min/max comparison; an infinite point would make
    // the box cover all space.
    if (finite(p))
        box.extend(::base::vec3d{p.x, p.y, p.z});
}

bool cachingMode(std::uint32_t mode) {
    return mode == 2 || mode == 3;
}

bool honoursStored(std::uint32_t mode) {
    return mode >= 1 && mode <= 3;
}

// Skins may name each other as base meshes; a cycle must not recurse forever.
thread_local unsigned g_boundsDepth = 0;
constexpr unsigned boundsDepthLimit = 32;

// ---- Validation ----

// One log line of the validation of 'mesh'.
struct Report {
    const ::base::string name;

    template <class... A>
    void operator()(int level, const char* fmt, const A&... args) const {
        ::base::logFormatted(::base::logScene, level, fmt, name, args...);
    }
};

template <class V>
std::array<float, 4> components(const V& v, std::size_t& n) {
    if constexpr (std::is_same_v<V, ::base::vec2f>) {
        n = 2;
        return {v.x, v.y, 0, 0};
    } else if constexpr (std::is_same_v<V, ::base::vec4f>) {
        n = 4;
        return {v.x, v.y, v.z, v.w};
    } else {
        n = 3;
        return {v.x, v.y, v.z, 0};
    }
}

template <class Items>
void checkVectors(const Report& report, const Items& items, const char* label, std::size_t expected,
                  bool zeroTest, bool unitTest, bool& result) {
    for (const auto& item : items) {
        std::size_t n = 0;
        const std::array<float, 4> c = components(item, n);
        if (std::any_of(c.begin(), c.begin() + n, [](float x) { return std::isnan(x); })) {
            report(::base::logError, "validate |{}| Nan detected in the {}!", label);
            continue;
        }
        if (std::any_of(c.begin(), c.begin() + n, [](float x) { return std::isinf(x); })) {
            report(::base::logError, "validate |{}| Inf detected in the {}!", label);
        } else if (zeroTest &&
                   std::all_of(c.begin(), c.begin() + n, [](float x) { return x == 0; })) {
            report(::base::logWarning, "validate |{}| Zero length detected in the {}!", label);
            continue;
        } else if (unitTest) {
            const float lengthSq = c[0] * c[0] + c[1] * c[1] + c[2] * c[2];
            if (std::fabs(lengthSq - 1.0f) > 1e-5f)
                report(::base::logWarning, "validate |{}| Unnormalized detected in the {}!", label);
        }
    }
    if (expected && items.size() != expected) {
        report(::base::logError, "validate |{}| The {} and positions count doesn't match!", label);
        result = false;
    }
}

// Every entry of 'indices' at or past 'limit' is reported with its position.
void checkRange(const Report& report, const Indices& indices, std::size_t limit, const char* fmt) {
    for (std::size_t i = 0; i < indices.size(); ++i)
        if (indices[i] >= limit)
            report(::base::logError, fmt, i);
}

} // namespace

// ---- Decoding ----

void decodeMeshIndices(std::span<std::uint32_t> indices, const AttribArray* primitives) {
    for (const Layout& layout : codedPrimitives(primitives, indices.size()))
        decodePrimitive(layout, indices);
}

Indices decodeMeshIndices(const AttribMap& mesh) {
    const Indices* stored = arrayOf<std::uint32_t>(mesh, names::indices);
    if (!stored)
        return {};
    Indices plain(*stored);
    if (isCoded(mesh))
        decodeMeshIndices(plain, mapArray(mesh, names::primitives));
    return plain;
}

// ---- IGeometry ----

IGeometry::IGeometry(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                     std::uint32_t id)
    : ::base::IPlugin(descriptor, factory, id) {
    addInterface(static_cast<IBounded*>(this));
}

base::box3d IGeometry::cachedBounds() const {
    return get(*this, names::bounds, ::base::box3d::empty());
}

void IGeometry::computeBounds(::base::box3d& result, std::uint32_t, bool) {
    result = cachedBounds();
}

// ---- IMesh ----

bool IMesh::deltaCompressIndices() {
    if (isCoded(*this))
        return false;

    // Channel 0 is "indices"; every other per-corner index array must follow
    // its faces through rotation and sorting.
    Indices none;
    ::base::vector<Indices*> channels;
    bool takeable = true;
    auto take = [&](AttribMap& owner, name_id name) {
        Attribute* entry = owner.findEntry(name);
        if (!entry) {
            // An array seen only through a base map is another object's: it
            // could not follow the reordered faces.
            if (owner.findInherited(name))
                takeable = false;
            return;
        }
        if (entry->asLink() || entry->typeName() != ::base::TypeTraits<std::uint32_t>::n_array_name)
            takeable = false;
        else
            channels.push_back(&static_cast<IndexAttribute*>(entry)->items());
    };
    take(*this, names::indices);
    if (channels.empty())
        channels.push_back(&none);
    for (name_id name : {names::positionIndices, names::normalIndices, names::tangentIndices})
        take(*this, name);
    for (name_id sets : {names::uvSets, names::colorSets})
        if (Attribute* entry = findEntry(sets)) {
            if (entry->asLink())
                takeable = false;
            else if (AttribArray* array = entry->asArray())
                for (Attribute* item : array->items())
                    if (AttribMap* set = item ? item->asMap() : nullptr)
                        take(*set, names::indices);
        }
    const std::size_t total = channels.front()->size();
    for (const Indices* channel : channels)
        if (channel->size() != total)
            takeable = false;

    const AttribArray* primitives = mapArray(*this, names::primitives);
    if (primitives && !ownsArray(*this, names::primitives))
        takeable = false;
    const ::base::vector<Layout> layouts =
        takeable ? codedPrimitives(primitives, total) : ::base::vector<Layout>();
    // Per-face counts are reordered with the faces, so they must be the
    // primitive's own.
    for (const Layout& layout : layouts)
        if (layout.perFace) {
            const Attribute* own = layout.primitive->findEntry(names::vcounts);
            if (!own || own->data() != layout.perFace)
                takeable = false;
        }
    if (!takeable) {
        logChannelFailure(*this);
        return false;
    }

    for (const Layout& layout : layouts) {
        Counts* perFace = nullptr;
        if (layout.perFace)
            perFace = const_cast<Counts*>(layout.perFace);
        encodePrimitive(layout, channels, perFace);
    }
    setAttribute(names::indicesDeltaCompression, std::uint8_t(1));
    return true;
}

void IMesh::computeBounds(::base::box3d& result, std::uint32_t mode, bool) {
    using ::base::box3d;
    if (honoursStored(mode))
        if (const box3d* stored = findAttribute<box3d>(names::bounds)) {
            result = *stored;
            return;
        }
    result = box3d::empty();
    if (!get(*this, names::visible, true))
        return;

    const ::base::ArrayOf<::base::vec3f>* found = findVecAttribute<::base::vec3f>(names::positions);
    const auto& positions = found ? *found : ::base::ArrayOf<::base::vec3f>();
    Indices decoded;
    const Indices* indices = findVecAttribute<std::uint32_t>(names::positionIndices);
    if (!indices || indices->empty()) {
        indices = findVecAttribute<std::uint32_t>(names::indices);
        if (indices && isCoded(*this)) {
            decoded = *indices;
            decodeMeshIndices(decoded, mapArray(*this, names::primitives));
            indices = &decoded;
        }
    }

    box3d everything = box3d::empty();
    for (const ::base::vec3f& p : positions)
        extend(everything, p);

    const AttribArray* primitives = mapArray(*this, names::primitives);
    // Primitive boxes are kept only in this mesh's own primitives: a linked or
    // inherited list belongs to another mesh, whose geometry may differ.
    const bool keepPrimitiveBoxes = cachingMode(mode) && ownsArray(*this, names::primitives);
    if (!primitives || !indices) {
        result = everything;
    } else {
        for (Attribute* item : primitives->items()) {
            AttribMap* primitive = item ? item->asMap() : nullptr;
            if (!primitive)
                continue;
            box3d box = box3d::empty();
            const box3d* stored =
                honoursStored(mode) ? valueOf<box3d>(*primitive, names::bounds) : nullptr;
            const std::uint8_t* topology = valueOf<std::uint8_t>(*primitive, names::topology);
            if (stored) {
                box = *stored;
            } else if (topology && *topology != 1 && *topology != 2 && *topology != 4 &&
                       *topology != 6) {
                box = everything;
            } else {
                const std::uint32_t* start = valueOf<std::uint32_t>(*primitive, names::indexStart);
                const std::uint32_t* count = valueOf<std::uint32_t>(*primitive, names::indexCount);
                const std::size_t from = std::min<std::size_t>(start ? *start : 0, indices->size());
                const std::size_t to =
                    count ? std::min<std::size_t>(from + *count, indices->size()) : indices->size();
                for (std::size_t i = from; i < to; ++i)
                    if ((*indices)[i] < positions.size())
                        extend(box, positions[(*indices)[i]]);
                if (keepPrimitiveBoxes)
                    primitive->setAttribute(names::bounds, box);
            }
            result.unite(box);
        }
    }
    if (cachingMode(mode))
        setAttribute(names::bounds, result);
}

bool IMesh::validate() const {
    const Report report{name()};
    bool result = true;

    const auto* positions = findVecAttribute<::base::vec3f>(names::positions);
    if (!positions)
        report(::base::logError, "validate |{}| The vertex positions are missing!");
    else
        checkVectors(report, *positions, "positions", 0, false, false, result);
    const std::size_t P = positions ? positions->size() : 0;

    if (const auto* normals = findVecAttribute<::base::normal>(names::normals))
        checkVectors(report, *normals, "normals", P, true, true, result);
    if (const auto* tangents = findVecAttribute<::base::normal>(names::tangents))
        checkVectors(report, *tangents, "tangents", P, true, true, result);
    if (const auto* velocities = findVecAttribute<::base::vec3f>(names::velocities))
        checkVectors(report, *velocities, "velocities", P, false, false, result);
    // The per-vertex arrays of every colour and UV set; the last argument
    // only carries the item type.
    auto checkSetArray = [&](const AttribMap& set, name_id name, const char* label, auto item) {
        if (const auto* items = set.findVecAttribute<decltype(item)>(name))
            checkVectors(report, *items, label, P, false, false, result);
    };
    auto forEachSet = [&](name_id sets, auto&& check) {
        if (const AttribArray* array = findArray(sets))
            for (Attribute* item : array->items())
                if (const AttribMap* set = itemMap(item))
                    check(*set);
    };
    forEachSet(names::colorSets, [&](const AttribMap& set) {
        checkSetArray(set, names::RGB, "rgb colors", ::base::vec3f{});
        checkSetArray(set, names::RGBA, "rgba colors", ::base::vec4f{});
    });
    forEachSet(names::uvSets, [&](const AttribMap& set) {
        checkSetArray(set, names::UV, "uv coordinates", ::base::vec2f{});
        checkSetArray(set, names::UVW, "uvw coordinates", ::base::vec3f{});
        checkSetArray(set, names::UVWQ, "uvwq coordinates", ::base::vec4f{});
    });

    const AttribArray* primitives = findArray(names::primitives);
    // Coded indices would report their differences as out of range.
    const Indices* indices = findVecAttribute<std::uint32_t>(names::indices);
    Indices decoded;
    if (indices && isCoded(*this)) {
        decoded = *indices;
        decodeMeshIndices(decoded, primitives);
        indices = &decoded;
    }
    const Indices* triIndices = findVecAttribute<std::uint32_t>(names::triIndices);
    const Indices* positionIndices = findVecAttribute<std::uint32_t>(names::positionIndices);
    const Indices* normalIndices = findVecAttribute<std::uint32_t>(names::normalIndices);
    const Indices* tangentIndices = findVecAttribute<std::uint32_t>(names::tangentIndices);

    bool knownSeen = false;
    bool separate = false;
    if (!primitives) {
        report(::base::logWarning, "validate |{}| Mesh doesn't contain any primitives!");
    } else {
        const std::size_t N = primitives->size();
        auto checkRangeOf = [&](const AttribMap& primitive, name_id startName, name_id countName,
                                const Indices* array, const char* missingStart,
                                const char* missingCount) {
            const auto* start = primitive.findAttribute<std::uint32_t>(startName);
            const auto* count = primitive.findAttribute<std::uint32_t>(countName);
            if (N >= 2) {
                if (!start)
                    report(::base::logError, missingStart);
                if (!count)
                    report(::base::logError, missingCount);
            }
            if (start && count && array && std::uint64_t(*start) + *count > array->size())
                report(::base::logError,
                       "validate |{}| Index offset/count out of bounds {}-{} out of {}!", *start,
                       *count, array->size());
        };
        for (Attribute* item : primitives->items()) {
            const AttribMap* primitive = itemMap(item);
            if (!primitive)
                continue;
            const auto* topology = primitive->findAttribute<std::uint8_t>(names::topology);
            const bool known =
                !topology || *topology == 1 || *topology == 2 || *topology == 4 || *topology == 6;
            if (known) {
                knownSeen = true;
                checkRangeOf(*primitive, names::indexStart, names::indexCount, indices,
                             "validate |{}| Missing start index!",
                             "validate |{}| Missing index count!");
                if (triIndices)
                    checkRangeOf(*primitive, names::triIndexStart, names::triIndexCount, triIndices,
                                 "validate |{}| Missing triangle start index!",
                                 "validate |{}| Missing triangle index count!");
                if (topology && *topology == 2)
                    separate = true;
            }
            const Attribute* vcounts = findResolved(*primitive, names::vcounts);
            if (vcounts && vcounts->typeName() == ::base::TypeTraits<std::uint16_t>::n_name) {
                const std::uint16_t v = *static_cast<const std::uint16_t*>(vcounts->data());
                if (indices && (v == 0 || indices->size() % v))
                    report(::base::logError, "validate |{}| Invalid face vertex count {}!", v);
            } else if (vcounts &&
                       vcounts->typeName() == ::base::TypeTraits<std::uint16_t>::n_array_name) {
                std::uint64_t sum = 0;
                for (std::uint16_t n : *static_cast<const Counts*>(vcounts->data()))
                    sum += n;
                if (indices && sum != indices->size())
                    report(::base::logError,
                           "validate |{}| Invalid face vertex counts. Expected {}, got {}!",
                           indices->size(), sum);
            } else {
                report(::base::logWarning, "validate |{}| Found primitive from unknown type!!");
            }
        }
    }

    if (knownSeen) {
        if (!indices || indices->empty())
            report(::base::logWarning, "validate |{}| Missing indices!");
        if (indices && triIndices && indices->size() != triIndices->size())
            report(::base::logWarning, "validate |{}| Triangulated indices mismatch!");
        if (!separate && positions && indices)
            checkRange(report, *indices, P,
                       "validate |{}| Found face index out of range at position {}!");
    }
    if (!separate)
        return result;

    if (!positionIndices || positionIndices->empty())
        report(::base::logWarning, "validate |{}| Missing position indices!");
    if (positionIndices)
        checkRange(report, *positionIndices, P,
                   "validate |{}| Found position index out of range at position {}!");
    const auto* normals = findVecAttribute<::base::normal>(names::normals);
    if (normals && normalIndices)
        checkRange(report, *normalIndices, normals->size(),
                   "validate |{}| Found normal index out of range at position {}!");
    const auto* tangents = findVecAttribute<::base::normal>(names::tangents);
    if (tangents && tangentIndices)
        checkRange(report, *tangentIndices, tangents->size(),
                   "validate |{}| Found tangent index out of range at position {}!");
    return result;
}

// ---- ISkin ----

void ISkin::computeBounds(::base::box3d& result, std::uint32_t mode, bool recurse) {
    using ::base::box3d;
    if (honoursStored(mode))
        if (const box3d* stored = findAttribute<box3d>(names::bounds)) {
            result = *stored;
            return;
        }
    result = box3d::empty();
    using Ref = ::base::ref<::base::IPlugin>;
    const Ref* baseMesh = findAttribute<Ref>(names::baseMesh);
    IBounded* bounded =
        baseMesh && *baseMesh && baseMesh->get() != this ? query<IBounded>(**baseMesh) : nullptr;
    if (bounded && g_boundsDepth < boundsDepthLimit) {
        ++g_boundsDepth;
        try {
            bounded->computeBounds(result, mode, recurse);
        } catch (...) {
            --g_boundsDepth;
            throw;
        }
        --g_boundsDepth;
    }
    if (cachingMode(mode))
        setAttribute(names::bounds, result);
}

// ---- Lines and hair ----

namespace {

// Stored starts are differences; a running sum restores them. A linked array
// belongs to its owner, which decodes it itself.
void decodeStarts(AttribMap& object, name_id startsName) {
    Attribute* starts = object.findEntry(startsName);
    Attribute* flag = object.findEntry(names::indicesDeltaCompression);
    if (!starts || !flag || starts->asLink() ||
        starts->typeName() != ::base::TypeTraits<std::uint32_t>::n_array_name ||
        flag->typeName() != ::base::TypeTraits<std::uint8_t>::n_name)
        return;
    auto& value = *static_cast<std::uint8_t*>(flag->data());
    if (!value)
        return;
    Indices& a = static_cast<IndexAttribute*>(starts)->items();
    for (std::size_t i = 1; i < a.size(); ++i)
        a[i] += a[i - 1];
    value = 0;
}

} // namespace

void ILines::postLoad() {
    IGeometry::postLoad();
    decodeStarts(*this, names::linesStart);
}

void IHair::postLoad() {
    IGeometry::postLoad();
    decodeStarts(*this, names::curvesStart);
}

} // namespace scene

// Mesh index coding and decoding, mesh and skin bounds, mesh validation and the
// start decoding of stored lines and hair.
#include "scene_geometry.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_log.h"
#include "b_plugin_attribute.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <random>
#include <string>
#include <vector>

namespace {

using namespace scene;
using base::ref, base::IPlugin, base::PluginFactory;
using Faces = std::vector<std::vector<std::uint32_t>>;

struct Geometry : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("test")};

    Geometry() { register_scene_schema(*factory); }

    template <class I>
    ref<I> make(std::string_view type, std::string_view name = {}) {
        ref<IPlugin> object = factory->create(type, PluginFactory::createNullIfUnknown);
        if (!name.empty())
            object->setAttribute(names::name, base::string(name));
        return ref<I>(dynamic_cast<I*>(object.get()));
    }

    // A mesh named "m" with 'faces' in "indices" and one primitive: a single
    // "vcounts" when all faces have one size, else one per face.
    ref<IMesh> meshOf(const Faces& faces, std::size_t positions = 0) {
        ref<IMesh> mesh = make<IMesh>("mesh", "m");
        auto& indices = mesh->vecAttribute<std::uint32_t>(names::indices)->items();
        std::vector<std::uint16_t> counts;
        for (const auto& f : faces) {
            indices.insert(indices.end(), f.begin(), f.end());
            counts.push_back(std::uint16_t(f.size()));
        }
        base::AttribMap* primitive = mesh->arrayAttribute(names::primitives)->appendMap();
        if (std::all_of(counts.begin(), counts.end(), [&](auto c) { return c == counts[0]; }))
            primitive->setAttribute(names::vcounts, counts.empty() ? std::uint16_t(3) : counts[0]);
        else
            primitive->vecAttribute<std::uint16_t>(names::vcounts)
                ->items()
                .assign(counts.begin(), counts.end());
        auto& p = mesh->vecAttribute<base::vec3f>(names::positions)->items();
        for (std::size_t i = 0; i < positions; ++i)
            p.push_back({float(i), float(i % 3), -float(i)});
        return mesh;
    }

    static const base::ArrayOf<std::uint32_t>& indicesOf(IMesh& mesh) {
        return *mesh.findVecAttribute<std::uint32_t>(names::indices);
    }
};

// Every face rotated to its lexicographically least rotation, then all faces
// sorted: the mesh's shape regardless of face order and starting corner.
Faces canonical(Faces faces) {
    for (auto& f : faces) {
        auto best = f;
        for (std::size_t r = 1; r < f.size(); ++r) {
            std::rotate(f.begin(), f.begin() + 1, f.end());
            best = std::min(best, f);
        }
        f = best;
    }
    std::sort(faces.begin(), faces.end());
    return faces;
}

// The faces of 'indices' as laid out by the mesh's only primitive.
Faces facesOf(const base::ArrayOf<std::uint32_t>& indices, const IMesh& mesh) {
    const auto* primitive = mesh.findArray(names::primitives)->item(0)->asMap();
    std::vector<std::uint16_t> sizes;
    if (const auto* one = primitive->findEntry(names::vcounts);
        one->typeName() == base::TypeTraits<std::uint16_t>::n_name)
        sizes.assign(indices.size() / *static_cast<const std::uint16_t*>(one->data()),
                     *static_cast<const std::uint16_t*>(one->data()));
    else
        sizes.assign(static_cast<const base::ArrayOf<std::uint16_t>*>(one->data())->begin(),
                     static_cast<const base::ArrayOf<std::uint16_t>*>(one->data())->end());
    Faces faces;
    std::size_t at = 0;
    for (auto n : sizes) {
        faces.emplace_back(indices.begin() + at, indices.begin() + at + n);
        at += n;
    }
    return faces;
}

// ---- Coding ----

struct CodingCase {
    const char* name;
    Faces faces;
    std::vector<std::uint32_t> coded;
    std::vector<std::uint32_t> decoded; // rotated and sorted faces
};

class Coding : public Geometry, public ::testing::WithParamInterface<CodingCase> {};

TEST_P(Coding, WritesTheExactCodedForm) {
    const CodingCase& c = GetParam();
    ref<IMesh> mesh = meshOf(c.faces);
    ASSERT_TRUE(mesh->deltaCompressIndices());
    EXPECT_EQ(get(*mesh, names::indicesDeltaCompression, std::uint8_t(0)), 1);
    const auto& coded = indicesOf(*mesh);
    EXPECT_EQ(std::vector<std::uint32_t>(coded.begin(), coded.end()), c.coded);
    const auto decoded = decodeMeshIndices(*mesh);
    EXPECT_EQ(std::vector<std::uint32_t>(decoded.begin(), decoded.end()), c.decoded);
}
INSTANTIATE_TEST_SUITE_P(
    Geometry, Coding,
    ::testing::Values(
        CodingCase{"twoTriangles", {{4, 2, 3}, {0, 1, 2}}, {0, 1, 2, 2, 1, 2}, {0, 1, 2, 2, 3, 4}},
        // Equal first indices: the second index codes against the previous second.
        CodingCase{"sharedFirst", {{0, 5, 6}, {3, 0, 1}}, {0, 1, 3, 0, 4, 6}, {0, 1, 3, 0, 5, 6}},
        // A tied minimum at a later corner leads.
        CodingCase{"tieTriangle", {{1, 2, 1}}, {1, 0, 1}, {1, 1, 2}},
        CodingCase{"tieQuad", {{5, 1, 7, 1}}, {1, 6, 0, 4}, {1, 7, 1, 5}},
        CodingCase{"mixed",
                   {{3, 1, 4, 1, 5}, {2, 0, 9}},
                   {0, 9, 2, 1, 3, 0, 4, 2},
                   {0, 9, 2, 1, 4, 1, 5, 3}},
        CodingCase{"lines", {{5, 2}, {1, 3}}, {1, 2, 1, 3}, {1, 3, 2, 5}}),
    [](const auto& info) { return std::string(info.param.name); });

// Single sizes the coder leaves plain; the mesh is still marked.
class PlainSizes : public Geometry, public ::testing::WithParamInterface<std::uint32_t> {};

TEST_P(PlainSizes, KeepPlainIndicesButSetTheFlag) {
    const std::uint32_t n = GetParam();
    Faces faces = {{}, {}};
    for (std::uint32_t i = 0; i < n; ++i) {
        faces[0].push_back(9 - i);
        faces[1].push_back(i + 3);
    }
    ref<IMesh> mesh = meshOf(faces);
    const base::ArrayOf<std::uint32_t> before = indicesOf(*mesh);
    ASSERT_TRUE(mesh->deltaCompressIndices());
    EXPECT_EQ(indicesOf(*mesh), before);
    EXPECT_EQ(get(*mesh, names::indicesDeltaCompression, std::uint8_t(0)), 1);
    EXPECT_EQ(decodeMeshIndices(*mesh), before);
}
INSTANTIATE_TEST_SUITE_P(Geometry, PlainSizes, ::testing::Values(1u, 5u, 6u),
                         [](const auto& info) { return "size" + std::to_string(info.param); });

struct RandomMesh {
    const char* name;
    std::vector<std::uint16_t> sizes; // drawn per face
};

class RoundTrip : public Geometry, public ::testing::WithParamInterface<RandomMesh> {};

TEST_P(RoundTrip, DecodesToTheSameFacesAndKeepsChannelsAligned) {
    std::mt19937 rng(1234);
    for (int trial = 0; trial < 40; ++trial) {
        const auto& sizes = GetParam().sizes;
        // Up to 150 faces: big primitives take the counting sort, small ones
        // the comparison sort.
        Faces faces(1 + rng() % 150);
        for (auto& f : faces) {
            f.resize(sizes[rng() % sizes.size()]);
            // A small range gives repeated indices and ties.
            for (auto& i : f)
                i = rng() % 12;
        }
        ref<IMesh> mesh = meshOf(faces);
        // A per-corner channel must follow its corners through the reordering.
        auto& corners = mesh->vecAttribute<std::uint32_t>(names::positionIndices)->items();
        for (std::uint32_t i : indicesOf(*mesh))
            corners.push_back(i + 1000);

        ASSERT_TRUE(mesh->deltaCompressIndices());
        const base::ArrayOf<std::uint32_t> plain = decodeMeshIndices(*mesh);
        ASSERT_EQ(plain.size(), corners.size());
        for (std::size_t i = 0; i < plain.size(); ++i)
            ASSERT_EQ(plain[i] + 1000, corners[i]) << "corner " << i;
        const Faces decoded = facesOf(plain, *mesh);
        EXPECT_EQ(canonical(decoded), canonical(faces));
        // Coded faces come in ascending order of their indices, a missing
        // one last (a single size above 4 stays plain and unsorted).
        const bool coded =
            !std::all_of(faces.begin(), faces.end(), [](const auto& f) { return f.size() > 4; }) ||
            std::any_of(faces.begin(), faces.end(),
                        [&](const auto& f) { return f.size() != faces[0].size(); });
        auto key = [](const std::vector<std::uint32_t>& f) {
            constexpr std::uint32_t missing = 0xFFFFFFFFu;
            return std::array<std::uint32_t, 4>{f[0], f[1], f.size() > 2 ? f[2] : missing,
                                                f.size() > 3 ? f[3] : missing};
        };
        for (std::size_t f = 1; coded && f < decoded.size(); ++f)
            ASSERT_LE(key(decoded[f - 1]), key(decoded[f])) << "face " << f;
    }
}
INSTANTIATE_TEST_SUITE_P(Geometry, RoundTrip,
                         ::testing::Values(RandomMesh{"triangles", {3}}, RandomMesh{"quads", {4}},
                                           RandomMesh{"lines", {2}},
                                           RandomMesh{"mixed", {3, 4, 5, 6}},
                                           RandomMesh{"pentagons", {5}}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(Geometry, PrimitivesCodeTheirOwnRangesOnly) {
    ref<IMesh> mesh = meshOf({{4, 2, 3}, {0, 1, 2}, {7, 6, 5}, {9, 8, 7}});
    auto* primitives = mesh->findArray(names::primitives);
    auto* first = primitives->item(0)->asMap();
    first->setAttribute(names::indexStart, 0u);
    first->setAttribute(names::indexCount, 6u);
    base::AttribMap* second = const_cast<base::AttribArray*>(primitives)->appendMap();
    second->setAttribute(names::vcounts, std::uint16_t(3));
    second->setAttribute(names::indexStart, 6u);
    second->setAttribute(names::indexCount, 6u);
    // Overlaps the first: stays plain, or decoding could not undo both.
    base::AttribMap* third = const_cast<base::AttribArray*>(primitives)->appendMap();
    third->setAttribute(names::vcounts, std::uint16_t(3));
    third->setAttribute(names::indexStart, 3u);
    third->setAttribute(names::indexCount, 6u);

    ASSERT_TRUE(mesh->deltaCompressIndices());
    EXPECT_EQ(indicesOf(*mesh), (base::ArrayOf<std::uint32_t>{0, 1, 2, 2, 1, 2, 5, 2, 1, 2, 2, 1}));
    EXPECT_EQ(decodeMeshIndices(*mesh),
              (base::ArrayOf<std::uint32_t>{0, 1, 2, 2, 3, 4, 5, 7, 6, 7, 9, 8}));
}

TEST_F(Geometry, FacesThatDoNotFillTheirRangeStayPlain) {
    ref<IMesh> mesh = meshOf({{4, 2, 3}, {0, 1, 2}});
    mesh->vecAttribute<std::uint32_t>(names::indices)->items().push_back(7);
    const base::ArrayOf<std::uint32_t> before = indicesOf(*mesh);
    ASSERT_TRUE(mesh->deltaCompressIndices());
    EXPECT_EQ(indicesOf(*mesh), before);
}

TEST_F(Geometry, UncodableIndexChannelsLeaveTheMeshUnchanged) {
    const std::string line = "Failed to encode delta channel for mesh 'm'! Shared or verbose "
                             "index channel detected.";
    struct Case {
        const char* name;
        void (*spoil)(IMesh& mesh, IMesh& other);
    };
    const Case cases[] = {
        {"linked indices",
         [](IMesh& mesh, IMesh& other) {
             base::AttribPath path;
             path.addPlugin(&other).addMember(names::indices);
             mesh.attribute(names::indices, new base::AttribLink(path));
         }},
        {"shorter corner channel",
         [](IMesh& mesh, IMesh&) {
             mesh.vecAttribute<std::uint32_t>(names::normalIndices)->items() = {0, 1};
         }},
        {"16-bit indices",
         [](IMesh& mesh, IMesh&) {
             mesh.vecAttribute<std::uint16_t>(names::indices)->items() = {4, 2, 3};
         }},
        // Arrays seen through a base map are the base's: reordering the faces
        // would leave them behind or rewrite them.
        {"inherited corner channel",
         [](IMesh& mesh, IMesh& other) {
             other.vecAttribute<std::uint32_t>(names::normalIndices)->items() = {0, 1, 2, 3, 4, 5};
             mesh.setBase(&other);
         }},
        {"inherited primitives",
         [](IMesh& mesh, IMesh& other) {
             mesh.removeAttribute(names::primitives);
             mesh.setBase(&other);
         }},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        ref<IMesh> other = meshOf({{4, 2, 3}});
        ref<IMesh> mesh = meshOf({{4, 2, 3}, {0, 1, 2}});
        c.spoil(*mesh, *other);
        log.clear();
        EXPECT_FALSE(mesh->deltaCompressIndices());
        ASSERT_EQ(log.entries().size(), 1u);
        EXPECT_EQ(std::string(log.entries()[0].message), line);
        EXPECT_EQ(log.entries()[0].level, base::logDebug);
        EXPECT_EQ(mesh->findEntry(names::indicesDeltaCompression), nullptr);
        EXPECT_EQ(*other->findVecAttribute<std::uint32_t>(names::indices),
                  (base::ArrayOf<std::uint32_t>{4, 2, 3}));
    }
}

TEST_F(Geometry, CodedIndicesAreNotCodedTwice) {
    ref<IMesh> mesh = meshOf({{4, 2, 3}, {0, 1, 2}});
    ASSERT_TRUE(mesh->deltaCompressIndices());
    EXPECT_FALSE(mesh->deltaCompressIndices());
    EXPECT_EQ(decodeMeshIndices(*mesh), (base::ArrayOf<std::uint32_t>{0, 1, 2, 2, 3, 4}));
}

// ---- Bounds ----

TEST_F(Geometry, MeshBoundsCoverTheIndexedPositionsCodedOrNot) {
    for (bool coded : {false, true}) {
        SCOPED_TRACE(coded);
        ref<IMesh> mesh = meshOf({{1, 2, 3}, {3, 2, 4}}, 8); // positions 0 and 5..7 unused
        if (coded) {
            ASSERT_TRUE(mesh->deltaCompressIndices());
        }
        base::box3d box;
        mesh->computeBounds(box, 3, true);
        EXPECT_EQ(box.min, (base::vec3d{1, 0, -4}));
        EXPECT_EQ(box.max, (base::vec3d{4, 2, -1}));
        EXPECT_EQ(get(*mesh, names::bounds, base::box3d::empty()), box);
        const auto* primitive = mesh->findArray(names::primitives)->item(0)->asMap();
        EXPECT_EQ(get(*primitive, names::bounds, base::box3d::empty()), box);
    }
}

TEST_F(Geometry, StoredBoundsAnswerModesOneToThree) {
    ref<IMesh> mesh = meshOf({{0, 1, 2}}, 3);
    const base::box3d stored{{-9, -9, -9}, {9, 9, 9}};
    mesh->setAttribute(names::bounds, stored);
    for (std::uint32_t mode : {1u, 2u, 3u}) {
        base::box3d box;
        mesh->computeBounds(box, mode, true);
        EXPECT_EQ(box, stored) << "mode " << mode;
    }
    base::box3d box;
    mesh->computeBounds(box, 0, true);
    EXPECT_EQ(box.max, (base::vec3d{2, 2, 0}));
    EXPECT_EQ(get(*mesh, names::bounds, base::box3d::empty()), stored);
}

TEST_F(Geometry, BoundsSkipNonFinitePositionsAndIndicesPastThem) {
    ref<IMesh> mesh = meshOf({{0, 1, 2}, {2, 3, 40}}, 4);
    auto& p = mesh->vecAttribute<base::vec3f>(names::positions)->items();
    p[1].x = std::numeric_limits<float>::quiet_NaN();
    p[3].y = std::numeric_limits<float>::infinity();
    base::box3d box;
    mesh->computeBounds(box, 0, false);
    EXPECT_EQ(box.min, (base::vec3d{0, 0, -2}));
    EXPECT_EQ(box.max, (base::vec3d{2, 2, 0}));

    ref<IMesh> empty = make<IMesh>("mesh", "e");
    empty->computeBounds(box, 3, false);
    EXPECT_TRUE(box.isEmpty());
}

TEST_F(Geometry, UnknownTopologyCoversEveryPositionAndSkinsTakeTheirBaseMesh) {
    ref<IMesh> mesh = meshOf({{0, 1, 2}}, 6);
    auto* primitive =
        const_cast<base::AttribArray*>(mesh->findArray(names::primitives))->item(0)->asMap();
    primitive->setAttribute(names::topology, std::uint8_t(3));
    ref<ISkin> skin = make<ISkin>("skin", "s");
    skin->setAttribute(names::baseMesh, ref<IPlugin>(mesh.get()));
    base::box3d box;
    skin->computeBounds(box, 3, true);
    EXPECT_EQ(box.max, (base::vec3d{5, 2, 0}));
    EXPECT_EQ(get(*skin, names::bounds, base::box3d::empty()), box);
}

// ---- Validation ----

struct ValidationCase {
    const char* name;
    void (*build)(IMesh& mesh);
    bool result;
    std::vector<std::string> lines;
};

class Validation : public Geometry, public ::testing::WithParamInterface<ValidationCase> {};

TEST_P(Validation, ReportsExactlyTheFindings) {
    // Two triangles over four positions, one primitive.
    ref<IMesh> mesh = meshOf({{0, 1, 2}, {2, 1, 3}}, 4);
    GetParam().build(*mesh);
    log.clear();
    EXPECT_EQ(mesh->validate(), GetParam().result);
    std::vector<std::string> messages;
    for (const auto& m : log.messages())
        messages.emplace_back(m);
    EXPECT_EQ(messages, GetParam().lines);
}

base::AttribMap& primitive0(IMesh& mesh) {
    return *const_cast<base::AttribArray*>(mesh.findArray(names::primitives))->item(0)->asMap();
}
void setNormals(IMesh& mesh, std::vector<base::normal> normals) {
    mesh.vecAttribute<base::normal>(names::normals)->items().assign(normals.begin(), normals.end());
}

const ValidationCase kValidation[] = {
    {"clean", [](IMesh&) {}, true, {}},
    {"rangeInside",
     [](IMesh& m) {
         primitive0(m).setAttribute(names::indexStart, 0u);
         primitive0(m).setAttribute(names::indexCount, 6u);
     },
     true,
     {}},
    {"rangeOutside",
     [](IMesh& m) {
         primitive0(m).setAttribute(names::indexStart, 0u);
         primitive0(m).setAttribute(names::indexCount, 7u);
     },
     true,
     {"validate |m| Index offset/count out of bounds 0-7 out of 6!"}},
    {"twoPrimitivesWithoutRanges",
     [](IMesh& m) {
         m.arrayAttribute(names::primitives)
             ->appendMap()
             ->setAttribute(names::vcounts, std::uint16_t(3));
     },
     true,
     {"validate |m| Missing start index!", "validate |m| Missing index count!",
      "validate |m| Missing start index!", "validate |m| Missing index count!"}},
    {"tenIndicesOfTriangles",
     [](IMesh& m) {
         auto& i = m.vecAttribute<std::uint32_t>(names::indices)->items();
         i.insert(i.end(), {0, 1, 2, 3});
     },
     true,
     {"validate |m| Invalid face vertex count 3!"}},
    {"perFaceCountsMismatch",
     [](IMesh& m) {
         primitive0(m).vecAttribute<std::uint16_t>(names::vcounts)->items() = {3, 4};
     },
     true,
     {"validate |m| Invalid face vertex counts. Expected 6, got 7!"}},
    {"indexPastPositions",
     [](IMesh& m) { m.vecAttribute<std::uint32_t>(names::indices)->items()[5] = 4; },
     true,
     {"validate |m| Found face index out of range at position 5!"}},
    {"unnormalizedNormal",
     [](IMesh& m) {
         setNormals(m, {{1, 0, 0}, {0, 1, 0}, {1.00002f, 0, 0}, {0, 0, 1}});
     },
     true,
     {"validate |m| Unnormalized detected in the normals!"}},
    {"zeroNormal",
     [](IMesh& m) {
         setNormals(m, {{1, 0, 0}, {0, 0, 0}, {0, 1, 0}, {0, 0, 1}});
     },
     true,
     {"validate |m| Zero length detected in the normals!"}},
    {"fewerNormals",
     [](IMesh& m) {
         setNormals(m, {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}});
     },
     false,
     {"validate |m| The normals and positions count doesn't match!"}},
    {"fewerVelocities",
     [](IMesh& m) { m.vecAttribute<base::vec3f>(names::velocities)->items().resize(3); },
     false,
     {"validate |m| The velocities and positions count doesn't match!"}},
    {"nanPosition",
     [](IMesh& m) {
         m.vecAttribute<base::vec3f>(names::positions)->items()[2].y =
             std::numeric_limits<float>::quiet_NaN();
     },
     true,
     {"validate |m| Nan detected in the positions!"}},
    {"infiniteTangent",
     [](IMesh& m) {
         m.vecAttribute<base::normal>(names::tangents)
             ->items()
             .assign(4, base::normal{0, std::numeric_limits<float>::infinity(), 0});
     },
     true, std::vector<std::string>(4, "validate |m| Inf detected in the tangents!")},
    {"setsCountAgainstPositions",
     [](IMesh& m) {
         m.arrayAttribute(names::uvSets)
             ->appendMap()
             ->vecAttribute<base::vec2f>(names::UV)
             ->items()
             .resize(2);
         m.arrayAttribute(names::colorSets)
             ->appendMap()
             ->vecAttribute<base::vec4f>(names::RGBA)
             ->items()
             .assign(4, base::vec4f{1, 1, 1, 1});
     },
     false,
     {"validate |m| The uv coordinates and positions count doesn't match!"}},
    {"noPositionsNoPrimitives",
     [](IMesh& m) {
         m.removeAttribute(names::positions);
         m.removeAttribute(names::primitives);
     },
     true,
     {"validate |m| The vertex positions are missing!",
      "validate |m| Mesh doesn't contain any primitives!"}},
    {"separateChannels",
     [](IMesh& m) {
         primitive0(m).setAttribute(names::topology, std::uint8_t(2));
         m.vecAttribute<std::uint32_t>(names::positionIndices)->items() = {0, 1, 2, 2, 1, 9};
         setNormals(m, {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}, {0, 0, 1}});
         m.vecAttribute<std::uint32_t>(names::normalIndices)->items() = {0, 4, 2, 2, 1, 3};
     },
     true,
     {"validate |m| Found position index out of range at position 5!",
      "validate |m| Found normal index out of range at position 1!"}},
    {"codedIndicesReadPlain", [](IMesh& m) { ASSERT_TRUE(m.deltaCompressIndices()); }, true, {}},
};
INSTANTIATE_TEST_SUITE_P(Geometry, Validation, ::testing::ValuesIn(kValidation),
                         [](const auto& info) { return std::string(info.param.name); });

// ---- Lines and hair ----

TEST_F(Geometry, StoredStartsAreSummedOnceOnLoad) {
    struct Case {
        const char* type;
        base::name_id (*starts)();
    };
    for (const Case& c :
         {Case{"lines", &lines_schema::linesStart}, Case{"hair", &hair_schema::curvesStart}}) {
        SCOPED_TRACE(c.type);
        ref<IPlugin> object = factory->create(c.type, PluginFactory::createNullIfUnknown);
        object->vecAttribute<std::uint32_t>(c.starts())->items() = {0, 3, 2, 4};
        object->setAttribute(names::indicesDeltaCompression, std::uint8_t(1));
        object->postLoad();
        EXPECT_EQ(*object->findVecAttribute<std::uint32_t>(c.starts()),
                  (base::ArrayOf<std::uint32_t>{0, 3, 5, 9}));
        EXPECT_EQ(get(*object, names::indicesDeltaCompression, std::uint8_t(9)), 0);
        object->postLoad();
        EXPECT_EQ(*object->findVecAttribute<std::uint32_t>(c.starts()),
                  (base::ArrayOf<std::uint32_t>{0, 3, 5, 9}));
    }
}

} // namespace

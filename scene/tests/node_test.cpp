// Node transforms against independent compositions and the importer's matrix
// decomposition, and node bounds gathered from children.
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_log.h"
#include "b_plugin_attribute.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>
#include <numbers>
#include <random>
#include <string>
#include <vector>

namespace {

using namespace scene;
using base::box3d, base::mat33d, base::mat43, base::quatf, base::vec3d, base::vec3f;
using base::ref, base::IPlugin, base::PluginFactory;
using PluginRef = ref<IPlugin>;

constexpr double kDeg = std::numbers::pi / 180.0;

// A child with a fixed box that counts how often it is asked to compute.
struct Probe : IPlugin, IBounded {
    using IPlugin::typeName;
    box3d box;
    int visits = 0;

    explicit Probe(const box3d& b) : box(b) { addInterface(static_cast<IBounded*>(this)); }
    IPlugin* interfaceOwner() const override { return const_cast<Probe*>(this); }
    box3d cachedBounds() const override { return box; }
    void computeBounds(box3d& result, std::uint32_t, bool) override {
        ++visits;
        result = box;
    }
};

struct NodeTest : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("test")};

    NodeTest() { register_scene_schema(*factory); }

    ref<INode> node() {
        PluginRef object = factory->create("node", PluginFactory::createNullIfUnknown);
        return ref<INode>(dynamic_cast<INode*>(object.get()));
    }
    static void adopt(INode& parent, IPlugin* child) {
        parent.appendAttributeItem<PluginRef>(names::children, PluginRef(child));
    }
};

mat33d axisMatrix(int axis, double degrees) {
    const double c = std::cos(degrees * kDeg), s = std::sin(degrees * kDeg);
    switch (axis) {
    case 0:
        return {{{1, 0, 0}, {0, c, -s}, {0, s, c}}};
    case 1:
        return {{{c, 0, s}, {0, 1, 0}, {-s, 0, c}}};
    default:
        return {{{c, -s, 0}, {s, c, 0}, {0, 0, 1}}};
    }
}

void expectLinear(const mat43& actual, const mat33d& expected, double tolerance) {
    for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 3; ++c)
            EXPECT_NEAR(actual.m.m[r][c], expected.m[r][c], tolerance) << "at " << r << "," << c;
}

void expectPoint(const vec3d& actual, const vec3d& expected, double tolerance = 1e-6) {
    EXPECT_NEAR(actual.x, expected.x, tolerance);
    EXPECT_NEAR(actual.y, expected.y, tolerance);
    EXPECT_NEAR(actual.z, expected.z, tolerance);
}

void expectBox(const box3d& actual, const box3d& expected, double tolerance = 1e-6) {
    expectPoint(actual.min, expected.min, tolerance);
    expectPoint(actual.max, expected.max, tolerance);
}

// ---- Rotation sources ----

struct RotationCase {
    const char* name;
    std::function<void(INode&)> setup;
    mat33d expected;
};

struct Rotation : NodeTest, ::testing::WithParamInterface<RotationCase> {};

TEST_P(Rotation, LinearPartMatchesExpected) {
    ref<INode> n = node();
    GetParam().setup(*n);
    expectLinear(n->localTransformation(), GetParam().expected, 1e-6);
}

const mat33d kIdentity = mat33d::identity();

// clang-format off
INSTANTIATE_TEST_SUITE_P(Node, Rotation, ::testing::Values(
    RotationCase{"ZeroQuaternionIsIdentity",
        [](INode& n) { n.setAttribute(names::rotate, quatf{0, 0, 0, 0}); }, kIdentity},
    // Normalising this one would turn it into half a turn about Z.
    RotationCase{"TinyQuaternionIsIdentity",
        [](INode& n) { n.setAttribute(names::rotate, quatf{0, 0, 0, 1e-7f}); }, kIdentity},
    RotationCase{"LongQuaternionIsNormalised",
        [](INode& n) { n.setAttribute(names::rotate, quatf{0, 0, 0, 2}); },
        mat33d::diagonal({-1, -1, 1})},
    RotationCase{"EulerX90",
        [](INode& n) {
            n.setAttribute(names::rotateMode, std::uint8_t(0));
            n.setAttribute(names::rotateEuler, vec3f{90, 0, 0});
        },
        base::quatd{std::cos(45 * kDeg), std::sin(45 * kDeg), 0, 0}.rotationMatrix()},
    RotationCase{"EulerAnglesInRotate",
        [](INode& n) {
            n.setAttribute(names::rotateMode, std::uint8_t(0));
            n.setAttribute(names::rotate, vec3f{0, 0, 90});
        },
        axisMatrix(2, 90)},
    RotationCase{"UnknownOrderReadsAsDefault",
        [](INode& n) {
            n.setAttribute(names::rotateMode, std::uint8_t(0));
            n.setAttribute(names::rotateOrder, std::uint8_t(9));
            n.setAttribute(names::rotateEuler, vec3f{90, 90, 0});
        },
        axisMatrix(1, 90) * axisMatrix(0, 90)},
    RotationCase{"AxisAngle",
        [](INode& n) {
            n.setAttribute(names::rotateMode, std::uint8_t(1));
            n.setAttribute(names::rotateAxisAngle, base::vec4f{0, 0, 1, 90});
        },
        axisMatrix(2, 90)},
    RotationCase{"UnknownModeIgnoresRotation",
        [](INode& n) {
            n.setAttribute(names::rotateMode, std::uint8_t(7));
            n.setAttribute(names::rotate, quatf{0, 0, 0, 1});
        },
        kIdentity}),
    [](const auto& info) { return std::string(info.param.name); });
// clang-format on

// The order names the axis applied first; compare with axis matrices
// multiplied so that the first one acts first.
struct EulerOrder : NodeTest, ::testing::WithParamInterface<std::uint8_t> {};

TEST_P(EulerOrder, MatchesAxisMatricesInNamedOrder) {
    static constexpr int kAxes[6][3] = {{0, 1, 2}, {1, 2, 0}, {2, 0, 1},
                                        {0, 2, 1}, {1, 0, 2}, {2, 1, 0}};
    const double angles[3] = {30, -50, 70};
    const int* axes = kAxes[GetParam()];
    mat33d expected = mat33d::identity();
    for (int i = 0; i < 3; ++i)
        expected = axisMatrix(axes[i], angles[axes[i]]) * expected;

    ref<INode> n = node();
    n->setAttribute(names::rotateMode, std::uint8_t(0));
    n->setAttribute(names::rotateOrder, GetParam());
    n->setAttribute(names::rotateEuler, vec3f{30, -50, 70});
    expectLinear(n->localTransformation(), expected, 1e-6);
}

INSTANTIATE_TEST_SUITE_P(Node, EulerOrder, ::testing::Range<std::uint8_t>(0, 6));

// ---- Pivots ----

struct PivotCase {
    const char* name;
    std::function<void(INode&)> setup;
    vec3d point, expected;
};

struct Pivot : NodeTest, ::testing::WithParamInterface<PivotCase> {};

TEST_P(Pivot, MapsPoint) {
    ref<INode> n = node();
    GetParam().setup(*n);
    expectPoint(n->localTransformation().transformPoint(GetParam().point), GetParam().expected);
}

const quatf kZ90{float(std::cos(45 * kDeg)), 0, 0, float(std::sin(45 * kDeg))};

// clang-format off
INSTANTIATE_TEST_SUITE_P(Node, Pivot, ::testing::Values(
    PivotCase{"RotatePivotStays",
        [](INode& n) {
            n.setAttribute(names::rotate, kZ90);
            n.setAttribute(names::rotatePivot, vec3d{1, 0, 0});
        },
        {1, 0, 0}, {1, 0, 0}},
    PivotCase{"RotatesAboutPivot",
        [](INode& n) {
            n.setAttribute(names::rotate, kZ90);
            n.setAttribute(names::rotatePivot, vec3d{1, 0, 0});
        },
        {2, 0, 0}, {1, 1, 0}},
    PivotCase{"ScalePivotStaysUnderShearAndScale",
        [](INode& n) {
            n.setAttribute(names::scale, vec3f{2, 3, 4});
            n.setAttribute(names::shear, vec3f{0.5f, -0.25f, 0.75f});
            n.setAttribute(names::scalePivot, vec3d{1, 1, 1});
        },
        {1, 1, 1}, {1, 1, 1}},
    // Scaled about (1,0,0) to (4,0,0), turned about (1,0,0) to (1,3,0), moved.
    PivotCase{"BothPivotsThenTranslate",
        [](INode& n) {
            n.setAttribute(names::translate, vec3d{0, 0, 5});
            n.setAttribute(names::rotate, kZ90);
            n.setAttribute(names::rotatePivot, vec3d{1, 0, 0});
            n.setAttribute(names::scale, vec3f{3, 3, 3});
            n.setAttribute(names::scalePivot, vec3d{1, 0, 0});
        },
        {2, 0, 0}, {1, 3, 5}},
    // Orbiting (1,2,3) at distance 5, its -Z axis reaches the target.
    PivotCase{"TargetDrivenLooksAtTarget",
        [](INode& n) {
            n.setAttribute(names::transformation, std::uint8_t(1));
            n.setAttribute(names::targetPosition, vec3d{1, 2, 3});
            n.setAttribute(names::distance, 5.0);
            n.setAttribute(names::azimuth, 90.0f);
            n.setAttribute(names::altitude, 30.0f);
        },
        {0, 0, -5}, {1, 2, 3}}),
    [](const auto& info) { return std::string(info.param.name); });
// clang-format on

// ---- Round trip through the importer's decomposition ----

struct Decomposed {
    vec3d translate;
    quatf rotate;
    vec3f scale;
    vec3f shear;
    bool hasShear;
};

// The importer's decomposition of M = T · R · H · S, step for step.
Decomposed decompose(const double m[3][4]) {
    vec3d c0{m[0][0], m[1][0], m[2][0]}, c1{m[0][1], m[1][1], m[2][1]},
        c2{m[0][2], m[1][2], m[2][2]};
    double sx = c0.length();
    if (sx > 1e-12)
        c0 = c0 / sx;
    double hxy = base::dot(c0, c1);
    c1 -= c0 * hxy;
    double sy = c1.length();
    if (sy > 1e-12)
        c1 = c1 / sy;
    hxy /= sy;
    double hxz = base::dot(c0, c2);
    c2 -= c0 * hxz;
    double hyz = base::dot(c1, c2);
    c2 -= c1 * hyz;
    double sz = c2.length();
    if (sz > 1e-12)
        c2 = c2 / sz;
    hxz /= sz;
    hyz /= sz;
    if (!(base::dot(c0, base::cross(c1, c2)) >= 0)) {
        sx = -sx, sy = -sy, sz = -sz;
        c0 = -c0, c1 = -c1, c2 = -c2;
    }
    const mat33d R = mat33d::fromColumns(c0, c1, c2);
    const auto& r = R.m;
    double w, x, y, z;
    const double trace = r[0][0] + r[1][1] + r[2][2] + 1;
    if (trace > 0.0001) {
        const double s = 0.5 / std::sqrt(trace);
        w = 0.25 / s, x = (r[2][1] - r[1][2]) * s, y = (r[0][2] - r[2][0]) * s,
        z = (r[1][0] - r[0][1]) * s;
    } else if (r[0][0] > r[1][1] && r[0][0] > r[2][2]) {
        const double d = std::sqrt(1 + r[0][0] - r[1][1] - r[2][2]), k = 0.5 / d;
        x = d / 2, y = (r[0][1] + r[1][0]) * k, z = (r[0][2] + r[2][0]) * k,
        w = (r[2][1] - r[1][2]) * k;
    } else if (r[1][1] > r[2][2]) {
        const double d = std::sqrt(1 + r[1][1] - r[0][0] - r[2][2]), k = 0.5 / d;
        x = (r[0][1] + r[1][0]) * k, y = d / 2, z = (r[1][2] + r[2][1]) * k,
        w = (r[0][2] - r[2][0]) * k;
    } else {
        const double d = std::sqrt(1 + r[2][2] - r[0][0] - r[1][1]), k = 0.5 / d;
        x = (r[0][2] + r[2][0]) * k, y = (r[1][2] + r[2][1]) * k, z = d / 2,
        w = (r[1][0] - r[0][1]) * k;
    }
    const vec3f shear{float(hxy), float(hxz), float(hyz)};
    return {{m[0][3], m[1][3], m[2][3]},
            {float(w), float(x), float(y), float(z)},
            {float(sx), float(sy), float(sz)},
            shear,
            std::abs(shear.x) > 1e-7f || std::abs(shear.y) > 1e-7f || std::abs(shear.z) > 1e-7f};
}

TEST_F(NodeTest, ComposesDecomposedMatricesBack) {
    std::mt19937 random(20240611);
    std::uniform_real_distribution<double> element(-2, 2), offset(-1000, 1000);
    struct Matrix {
        double m[3][4];
    };
    std::vector<Matrix> matrices = {
        {{{1, 0, 0, 0}, {0, 1, 0, 0}, {0, 0, 1, 0}}},    // identity
        {{{-1, 0, 0, 3}, {0, 1, 0, 0}, {0, 0, 1, 0}}},   // mirror: half a turn, scales negated
        {{{0, -1, 0, 0}, {-1, 0, 0, 0}, {0, 0, -1, 0}}}, // half a turn: the trace is 0
    };
    while (matrices.size() < 300) {
        Matrix a;
        for (auto& row : a.m) {
            for (int c = 0; c < 3; ++c)
                row[c] = element(random);
            row[3] = offset(random);
        }
        const mat33d linear{{{a.m[0][0], a.m[0][1], a.m[0][2]},
                             {a.m[1][0], a.m[1][1], a.m[1][2]},
                             {a.m[2][0], a.m[2][1], a.m[2][2]}}};
        // Nearly singular matrices make the shear factors explode in float.
        if (std::abs(linear.determinant()) > 0.5)
            matrices.push_back(a);
    }

    int negative = 0;
    for (const Matrix& a : matrices) {
        const auto& m = a.m;
        const Decomposed d = decompose(m);
        ref<INode> n = node();
        n->setAttribute(names::translate, d.translate);
        n->setAttribute(names::rotate, d.rotate);
        n->setAttribute(names::scale, d.scale);
        if (d.hasShear)
            n->setAttribute(names::shear, d.shear);

        const mat43 composed = n->localTransformation();
        mat33d expected{};
        for (int r = 0; r < 3; ++r)
            for (int c = 0; c < 3; ++c)
                expected.m[r][c] = m[r][c];
        negative += expected.determinant() < 0;
        SCOPED_TRACE(::testing::Message() << "matrix " << (&a - matrices.data()));
        expectLinear(composed, expected, 1e-5);
        EXPECT_EQ(composed.t, d.translate);
    }
    EXPECT_GT(negative, 50);
}

// ---- Bounds ----

box3d box(vec3d min, vec3d max) {
    return {min, max};
}

TEST_F(NodeTest, NodeWithoutChildrenIsEmpty) {
    for (std::uint32_t mode : {0u, 2u, 3u}) {
        ref<INode> n = node();
        box3d result = box({0, 0, 0}, {1, 1, 1});
        n->computeBounds(result, mode, true);
        EXPECT_EQ(result, box3d::empty()) << mode;
        // Only the modes that maintain "bounds" store it.
        EXPECT_EQ(n->findEntry(names::bounds) != nullptr, mode != 0) << mode;
    }
}

TEST_F(NodeTest, ModeThreeAnswersStoredBoxWithoutVisitingChildren) {
    ref<INode> root = node();
    ref<Probe> probe(new Probe(box({0, 0, 0}, {1, 1, 1})));
    adopt(*root, probe.get());

    box3d result;
    root->computeBounds(result, 3, true);
    EXPECT_EQ(result, probe->box);
    EXPECT_EQ(probe->visits, 1);

    probe->box = box({-5, -5, -5}, {5, 5, 5});
    root->computeBounds(result, 3, true);
    EXPECT_EQ(result, box({0, 0, 0}, {1, 1, 1}));
    EXPECT_EQ(probe->visits, 1);

    root->computeBounds(result, 2, true);
    EXPECT_EQ(result, probe->box);
    EXPECT_EQ(root->cachedBounds(), probe->box);
    EXPECT_EQ(probe->visits, 2);
}

// Geometry sits in the node's space; a child node's box moves by the child's
// transformation.
TEST_F(NodeTest, ChildNodeBoxIsTransformedGeometryIsNot) {
    ref<INode> root = node(), arm = node();
    ref<Probe> mesh(new Probe(box({0, 0, 0}, {1, 1, 1})));
    ref<Probe> hand(new Probe(box({0, 0, 0}, {1, 2, 3})));
    arm->setAttribute(names::translate, vec3d{10, 0, 0});
    arm->setAttribute(names::rotate, kZ90);
    adopt(*arm, hand.get());
    adopt(*root, mesh.get());
    adopt(*root, arm.get());

    box3d result;
    root->computeBounds(result, 2, true);
    expectBox(result, box({0, 0, 0}, {10, 1, 3}));
    expectBox(arm->cachedBounds(), box({0, 0, 0}, {1, 2, 3}));
}

TEST_F(NodeTest, BoxesThatSpanNothingOrEverythingAreLeftOut) {
    constexpr double big = std::numeric_limits<double>::max();
    ref<INode> root = node();
    const box3d kept = box({1, 2, 3}, {4, 5, 6});
    for (const box3d& b :
         {box3d::empty(), box({-big, 0, 0}, {1, 1, 1}), box({0, 0, 0}, {1, 1, big}), kept}) {
        // Each behind a node, so the empty box meets a transformation.
        ref<INode> holder = node();
        holder->setAttribute(names::rotate, kZ90);
        holder->setAttribute(names::bounds, b);
        adopt(*root, holder.get());
    }
    box3d result;
    root->computeBounds(result, 2, false);
    expectBox(result, box({-5, 1, 3}, {-2, 4, 6}));
}

// Without recursion, and with mode 3 on a child that holds "bounds", the
// stored child box is used; mode 2 with recursion rebuilds it.
TEST_F(NodeTest, RecursionModes) {
    ref<INode> root = node(), child = node();
    ref<Probe> leaf(new Probe(box({0, 0, 0}, {1, 1, 1})));
    adopt(*child, leaf.get());
    adopt(*root, child.get());
    child->setAttribute(names::translate, vec3d{0, 0, 10});
    const box3d stale = box({-1, -1, -1}, {0, 0, 0});
    struct {
        std::uint32_t mode;
        bool recurse;
        box3d expected;
        int visits;
    } const cases[] = {
        {2, false, box({-1, -1, 9}, {0, 0, 10}), 0},
        {3, true, box({-1, -1, 9}, {0, 0, 10}), 0},
        {2, true, box({0, 0, 10}, {1, 1, 11}), 1},
    };
    for (const auto& c : cases) {
        child->setAttribute(names::bounds, stale);
        leaf->visits = 0;
        box3d result;
        root->computeBounds(result, c.mode, c.recurse);
        expectBox(result, c.expected);
        EXPECT_EQ(leaf->visits, c.visits) << c.mode << " " << c.recurse;
    }
}

TEST_F(NodeTest, ChildListingAnAncestorIsLeftOut) {
    ref<INode> root = node(), child = node();
    ref<Probe> leaf(new Probe(box({0, 0, 0}, {1, 1, 1})));
    root->setAttribute(names::name, base::string("root"));
    child->setAttribute(names::name, base::string("child"));
    adopt(*root, child.get());
    adopt(*child, leaf.get());
    adopt(*child, root.get());

    box3d result;
    root->computeBounds(result, 2, true);
    EXPECT_EQ(result, leaf->box);
    EXPECT_EQ(log.count("bounds |child| The child 'root' is also an ancestor and is left out!"),
              1u);
    // The cycle of strong references would outlive the test.
    child->removeAttribute(names::children);
}

} // namespace

#include "b_math.h"
#include "b_timecode.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <numbers>
#include <random>
#include <vector>

using namespace base;

namespace {

constexpr double kPi = std::numbers::pi;

template <class V>
testing::AssertionResult near3(const V& a, const V& b, double tol) {
    for (std::size_t i = 0; i < 3; ++i)
        if (!(std::abs(double(a[i]) - double(b[i])) <= tol))
            return testing::AssertionFailure() << "(" << a.x << "," << a.y << "," << a.z << ") vs ("
                                               << b.x << "," << b.y << "," << b.z << ")";
    return testing::AssertionSuccess();
}

template <class T>
testing::AssertionResult nearMat(const base_mat33<T>& a, const base_mat33<T>& b, double tol) {
    for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 3; ++c)
            if (!(std::abs(double(a.m[r][c]) - double(b.m[r][c])) <= tol))
                return testing::AssertionFailure()
                       << "element " << r << "," << c << ": " << a.m[r][c] << " vs " << b.m[r][c];
    return testing::AssertionSuccess();
}

template <class T>
base_quat<T> randomRotation(std::mt19937& rng) {
    std::normal_distribution<double> n;
    return base_quat<T>{T(n(rng)), T(n(rng)), T(n(rng)), T(n(rng))}.normalized();
}

struct RotationCase {
    const char* name;
    vec3d axis;
    double degrees;
    vec3d in, out;
};

class MathQuatRotation : public testing::TestWithParam<RotationCase> {};

TEST_P(MathQuatRotation, RotateAndMatrixGiveKnownResult) {
    const RotationCase& c = GetParam();
    const quatd q = quatd::fromAxisAngle(c.axis.normalized(), c.degrees * kPi / 180.0);
    EXPECT_TRUE(near3(q.rotate(c.in), c.out, 1e-12));
    EXPECT_TRUE(near3(q.rotationMatrix() * c.in, c.out, 1e-12));
    // The product composes: q*q turns twice as far.
    EXPECT_TRUE(near3((q * q).rotate(c.in), q.rotate(q.rotate(c.in)), 1e-12));
}

INSTANTIATE_TEST_SUITE_P(
    Math, MathQuatRotation,
    testing::Values(RotationCase{"Z90", {0, 0, 1}, 90, {1, 0, 0}, {0, 1, 0}},
                    RotationCase{"X90", {1, 0, 0}, 90, {0, 1, 0}, {0, 0, 1}},
                    RotationCase{"Y90", {0, 1, 0}, 90, {0, 0, 1}, {1, 0, 0}},
                    RotationCase{"Y180", {0, 1, 0}, 180, {1, 0, 0}, {-1, 0, 0}},
                    RotationCase{"Diag120", {1, 1, 1}, 120, {1, 0, 0}, {0, 1, 0}},
                    RotationCase{"NegZ90", {0, 0, -1}, 90, {0, 1, 0}, {1, 0, 0}}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(MathQuat, ProductAppliesRightOperandFirst) {
    const quatd qx = quatd::fromAxisAngle({1, 0, 0}, kPi / 2);
    const quatd qz = quatd::fromAxisAngle({0, 0, 1}, kPi / 2);
    // X first: (0,1,0) -> (0,0,1), which Z leaves alone.
    EXPECT_TRUE(near3((qz * qx).rotate({0, 1, 0}), vec3d{0, 0, 1}, 1e-12));
    // Z first: (0,1,0) -> (-1,0,0), which X leaves alone.
    EXPECT_TRUE(near3((qx * qz).rotate({0, 1, 0}), vec3d{-1, 0, 0}, 1e-12));
}

TEST(MathQuat, MatrixAgreesWithRotateForAnyQuaternion) {
    std::mt19937 rng(7);
    std::uniform_real_distribution<double> scale(0.3, 2.0), coord(-5, 5);
    for (int i = 0; i < 200; ++i) {
        // Non-unit quaternions included: both forms are the same polynomial.
        const quatd q = randomRotation<double>(rng) * scale(rng);
        const vec3d v{coord(rng), coord(rng), coord(rng)};
        ASSERT_TRUE(near3(q.rotationMatrix() * v, q.rotate(v), 1e-9)) << i;
    }
}

template <class T>
void expectFromMatrixRoundTrip(std::mt19937& rng, double tol) {
    std::vector<base_quat<T>> rotations;
    for (int i = 0; i < 500; ++i)
        rotations.push_back(randomRotation<T>(rng));
    // Just short of a half turn the plain trace formula loses float precision.
    const vec3d axis = vec3d{1, -2, 3}.normalized();
    for (double deg = 170; deg <= 180; deg += 0.05) {
        const quatd d = quatd::fromAxisAngle(axis, deg * kPi / 180);
        rotations.push_back({T(d.w), T(d.x), T(d.y), T(d.z)});
    }
    for (base_quat<T> q : rotations) {
        if (q.w < 0)
            q = -q;
        base_quat<T> back = base_quat<T>::fromMatrix(q.rotationMatrix());
        // Away from a half turn the sign is fixed too: w stays positive.
        if (q.w < T(0.01) && dot(back, q) < 0)
            back = -back;
        const double err =
            std::max({std::abs(double(back.w - q.w)), std::abs(double(back.x - q.x)),
                      std::abs(double(back.y - q.y)), std::abs(double(back.z - q.z))});
        ASSERT_LE(err, tol) << q.w << " " << q.x << " " << q.y << " " << q.z;
    }
}

TEST(MathQuat, FromMatrixRoundTripsRandomRotations) {
    std::mt19937 rng(11);
    expectFromMatrixRoundTrip<float>(rng, 1e-6);
    expectFromMatrixRoundTrip<double>(rng, 1e-14);
}

TEST(MathQuat, FromMatrixHandlesEveryHalfTurn) {
    // Trace -1 for each: every branch away from the trace formula is taken.
    const struct {
        vec3d diag;
        quatd expected;
    } rows[] = {{{1, 1, 1}, {1, 0, 0, 0}},
                {{1, -1, -1}, {0, 1, 0, 0}},
                {{-1, 1, -1}, {0, 0, 1, 0}},
                {{-1, -1, 1}, {0, 0, 0, 1}}};
    for (const auto& row : rows)
        EXPECT_EQ(quatd::fromMatrix(mat33d::diagonal(row.diag)), row.expected)
            << row.diag.x << "," << row.diag.y << "," << row.diag.z;
}

TEST(MathQuat, SlerpTakesShortArcAndSurvivesEqualKeys) {
    const quatd a = quatd::identity();
    const quatd b = quatd::fromAxisAngle({0, 0, 1}, kPi / 2);
    const quatd half = quatd::fromAxisAngle({0, 0, 1}, kPi / 4);
    const vec3d v{1, 0, 0};
    EXPECT_TRUE(near3(slerp(a, b, 0.5).rotate(v), half.rotate(v), 1e-12));
    EXPECT_TRUE(near3(slerp(a, -b, 0.5).rotate(v), half.rotate(v), 1e-12));
    const quatd same = slerp(b, b, 0.3);
    EXPECT_TRUE(std::isfinite(same.w) && std::abs(dot(same, b) - 1) < 1e-12);
}

TEST(MathVec, NormalizingZeroGivesNoNaN) {
    EXPECT_EQ(vec3f{}.normalized(), vec3f{});
    EXPECT_EQ(quatd{}.normalized(), quatd::identity());
    EXPECT_TRUE(near3(vec3d{3, 0, 4}.normalized(), vec3d{0.6, 0, 0.8}, 1e-15));
}

TEST(MathMat33, InverseTimesMatrixIsIdentity) {
    std::mt19937 rng(3);
    std::uniform_real_distribution<double> e(-1, 1);
    for (int i = 0; i < 100; ++i) {
        mat33d m;
        for (auto& row : m.m)
            for (auto& x : row)
                x = e(rng);
        for (int d = 0; d < 3; ++d)
            m.m[d][d] += 3; // keeps the matrix well conditioned
        ASSERT_TRUE(nearMat(m.inverse() * m, mat33d::identity(), 1e-12)) << i;
        ASSERT_TRUE(nearMat(m * m.inverse(), mat33d::identity(), 1e-12)) << i;
    }
    const mat33d r = randomRotation<double>(rng).rotationMatrix();
    EXPECT_NEAR(r.determinant(), 1.0, 1e-12);
    EXPECT_TRUE(nearMat(r.inverse(), r.transpose(), 1e-12));
    // Singular: zeros rather than infinities and NaNs.
    EXPECT_EQ(mat33f::fromRows({1, 2, 3}, {2, 4, 6}, {0, 1, 0}).inverse(), mat33f{});
}

TEST(MathMat43, ComposesRightFirstAndKeepsDoubleTranslation) {
    mat43 a{quatf::fromAxisAngle({0, 0, 1}, float(kPi / 2)).rotationMatrix(), {1e10 + 0.5, 0, 0}};
    mat43 b{mat33f::diagonal({2, 3, 4}), {0, 1, 0}};
    const vec3d p{1, 1, 1};
    EXPECT_TRUE(near3((a * b).transformPoint(p), a.transformPoint(b.transformPoint(p)), 1e-6));
    // A far-away translation survives to the half unit: it never passes through float.
    const mat43 far{mat33f::identity(), {1e10 + 0.5, 0, 0}};
    EXPECT_EQ(far.transformPoint({0.25, 0, 0}).x, 1e10 + 0.75);
    EXPECT_EQ(mat43::identity() * b, b);
}

TEST(MathBox, UniteAndExtendTreatEmptyAsNeutral) {
    const box3d b{{-1, 2, 3}, {4, 5, 6}};
    EXPECT_TRUE(box3d::empty().isEmpty());
    EXPECT_FALSE(b.isEmpty());
    EXPECT_EQ(box3d::empty().unite(b), b);
    EXPECT_EQ(box3d(b).unite(box3d::empty()), b);
    EXPECT_EQ(box3d::empty().unite(box3d::empty()), box3d::empty());
    EXPECT_EQ(box3d::empty().extend({1, 2, 3}), (box3d{{1, 2, 3}, {1, 2, 3}}));
    EXPECT_EQ(box3d(b).unite({{0, -7, 3}, {9, 0, 3}}), (box3d{{-1, -7, 3}, {9, 5, 6}}));
    EXPECT_TRUE((box3f{{0, 0, 1}, {1, 1, 0}}).isEmpty()); // one inverted axis is enough
}

TEST(MathBox, TransformedRotatedBox) {
    // 90 degrees about Z: x' = -y, y' = x; then moved by (10, 0, 0).
    const mat43 xf{quatf::fromAxisAngle({0, 0, 1}, float(kPi / 2)).rotationMatrix(), {10, 0, 0}};
    const box3d out = box3d{{0, 0, 0}, {1, 2, 3}}.transformed(xf);
    EXPECT_TRUE(near3(out.min, vec3d{8, 0, 0}, 1e-6));
    EXPECT_TRUE(near3(out.max, vec3d{10, 1, 3}, 1e-6));
}

TEST(MathBox, TransformedBoundsTheMovedCorners) {
    std::mt19937 rng(5);
    std::uniform_real_distribution<double> u(-3, 3);
    for (int i = 0; i < 100; ++i) {
        mat43 xf{};
        for (auto& row : xf.m.m)
            for (auto& x : row)
                x = float(u(rng));
        xf.t = {u(rng), u(rng), u(rng)};
        const box3d box =
            box3d::empty().extend({u(rng), u(rng), u(rng)}).extend({u(rng), u(rng), u(rng)});
        box3d corners = box3d::empty();
        for (int k = 0; k < 8; ++k)
            corners.extend(
                xf.transformPoint({(k & 1 ? box.max : box.min).x, (k & 2 ? box.max : box.min).y,
                                   (k & 4 ? box.max : box.min).z}));
        const box3d got = box.transformed(xf);
        ASSERT_TRUE(near3(got.min, corners.min, 1e-9)) << i;
        ASSERT_TRUE(near3(got.max, corners.max, 1e-9)) << i;
    }
}

TEST(MathBox, EmptyBoxStaysEmptyUnderAnyTransform) {
    const mat43 transforms[] = {
        mat43::identity(),
        {quatf::fromAxisAngle({1, 1, 0}, 0.7f).rotationMatrix(), {5, -2, 1}},
        {mat33f::diagonal({-2, 0.5f, 3}), {}},
        {mat33f{}, {1, 2, 3}},
    };
    for (const mat43& xf : transforms) {
        EXPECT_EQ(box3d::empty().transformed(xf), box3d::empty());
        EXPECT_EQ(box3f::empty().transformed(xf), box3f::empty());
        EXPECT_TRUE((box3d{{0, 0, 1}, {1, 1, 0}}).transformed(xf).isEmpty());
    }
}

TEST(MathTimeCode, SecondsRoundTrip) {
    EXPECT_EQ(TimeCode::fromSeconds(1.0).ticks(), TimeCode::ticksPerSecond);
    EXPECT_EQ(TimeCode::fromSeconds(0.5).ticks(), 23093079000);
    EXPECT_EQ(TimeCode::fromSeconds(1.0 / 24).ticks(), 1924423250); // whole frames are exact
    for (double s : {0.0, 1e-6, 0.1, -2.25, 1.0 / 3, 3600.0 * 24 * 365, -1e5}) {
        const TimeCode t = TimeCode::fromSeconds(s);
        EXPECT_NEAR(t.seconds(), s, 1e-10 + std::abs(s) * 1e-15) << s;
        EXPECT_EQ(TimeCode::fromSeconds(t.seconds()), t) << s;
    }
}

TEST(MathTimeCode, SaturatesInsteadOfOverflowing) {
    constexpr auto kMax = std::numeric_limits<std::int64_t>::max();
    constexpr auto kMin = std::numeric_limits<std::int64_t>::min();
    EXPECT_EQ(TimeCode::fromSeconds(1e300).ticks(), kMax);
    EXPECT_EQ(TimeCode::fromSeconds(-1e300).ticks(), kMin);
    EXPECT_EQ(TimeCode::fromSeconds(std::nan("")).ticks(), 0);
    EXPECT_EQ((TimeCode{kMax} + TimeCode{1}).ticks(), kMax);
    EXPECT_EQ((TimeCode{kMin} - TimeCode{1}).ticks(), kMin);
    EXPECT_EQ((TimeCode{5} - TimeCode{kMin}).ticks(), kMax);
    EXPECT_EQ((-TimeCode{kMin}).ticks(), kMax);
    EXPECT_EQ((TimeCode{7} - TimeCode{10}).ticks(), -3);
    EXPECT_LT(TimeCode{-1}, TimeCode{});
}

} // namespace

// The look-at frame: where the object looks, which way is up, and the
// degenerate directions and up vectors that must never produce NaN.
#include "b_frame.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace {

using base::vec3d;
using Quat = base::base_quat<double>;

constexpr double nan = std::numeric_limits<double>::quiet_NaN();
constexpr double inf = std::numeric_limits<double>::infinity();
const double h = std::sqrt(0.5);

void expectNear(const vec3d& a, const vec3d& b, const char* what) {
    EXPECT_NEAR(a.x, b.x, 1e-12) << what;
    EXPECT_NEAR(a.y, b.y, 1e-12) << what;
    EXPECT_NEAR(a.z, b.z, 1e-12) << what;
}

// A right-handed orthonormal frame: every caller relies on it being a rotation.
void expectRotation(const base::mat33d& r) {
    for (std::size_t i = 0; i < 3; ++i)
        for (std::size_t j = 0; j < 3; ++j)
            EXPECT_NEAR(base::dot(r.column(i), r.column(j)), i == j ? 1.0 : 0.0, 1e-12);
    EXPECT_NEAR(r.determinant(), 1.0, 1e-12);
}

struct FrameRow {
    const char* label;
    vec3d direction, up;
    vec3d looks;  // where local -Z ends up
    vec3d upAxis; // where local Y ends up
};

// Every row through the matrix and through the camera, which answers the same
// frame as a unit quaternion, w first.
TEST(LookAtFrame, LooksAlongDirectionWithUpInPlace) {
    const FrameRow rows[] = {
        {"Identity", {0, 0, -1}, {0, 1, 0}, {0, 0, -1}, {0, 1, 0}},
        {"LongDirectionSlantedUp", {0, 0, -5}, {0, 3, 3}, {0, 0, -1}, {0, 1, 0}},
        {"AlongX", {2, 0, 0}, {0, 1, 0}, {1, 0, 0}, {0, 1, 0}},
        {"ZUpWorld", {0, 1, 0}, {0, 0, 1}, {0, 1, 0}, {0, 0, 1}},
        {"Diagonal", {1, 0, -1}, {0, 1, 0}, {h, 0, -h}, {0, 1, 0}},
        {"TinyAndHugeVectors", {1e-300, 0, 0}, {0, 1e300, 0}, {1, 0, 0}, {0, 1, 0}},
        // Degenerate directions keep the identity.
        {"ZeroDirection", {0, 0, 0}, {0, 1, 0}, {0, 0, -1}, {0, 1, 0}},
        {"NaNDirection", {nan, 0, -1}, {0, 1, 0}, {0, 0, -1}, {0, 1, 0}},
        {"InfiniteDirection", {inf, 0, 0}, {0, 1, 0}, {0, 0, -1}, {0, 1, 0}},
        // Unusable up vectors: the world axis least aligned with the
        // direction (x first on ties) becomes up.
        {"UpParallel", {0, 3, 0}, {0, 1, 0}, {0, 1, 0}, {1, 0, 0}},
        {"UpAntiParallel", {0, -1, 0}, {0, 1, 0}, {0, -1, 0}, {1, 0, 0}},
        {"UpNearlyParallel", {0, 0, -1}, {1e-12, 0, 1}, {0, 0, -1}, {1, 0, 0}},
        {"UpParallelOffAxis", {1, 1, 0}, {-2, -2, 0}, {h, h, 0}, {0, 0, 1}},
        {"ZeroUp", {1, 0, 0}, {0, 0, 0}, {1, 0, 0}, {0, 1, 0}},
        {"NaNUp", {0, 0, -1}, {0, nan, 0}, {0, 0, -1}, {1, 0, 0}},
    };
    for (const FrameRow& row : rows) {
        SCOPED_TRACE(row.label);
        const base::mat33d frame = base::lookAtFrame(row.direction, row.up);
        expectRotation(frame);
        expectNear(frame * vec3d{0, 0, -1}, row.looks, "view direction");
        expectNear(frame * vec3d{0, 1, 0}, row.upAxis, "up");

        base::base_camera<double> camera;
        camera.setUp(row.up, true);
        camera.setViewDirection(row.direction);
        const Quat q = camera.orientation();
        EXPECT_NEAR(q.lengthSquared(), 1.0, 1e-12);
        expectNear(q.rotate({0, 0, -1}), row.looks, "camera view direction");
        expectNear(camera.up(), row.upAxis, "camera up");
    }
}

TEST(LookAtFrameQuaternion, KnownRotations) {
    base::base_camera<double> camera;
    camera.setUp({0, 1, 0}, true);
    camera.setViewDirection({1, 0, 0});
    // A quarter turn about -Y takes -Z onto +X.
    const Quat q = camera.orientation();
    EXPECT_NEAR(q.w, h, 1e-12);
    EXPECT_NEAR(q.x, 0, 1e-12);
    EXPECT_NEAR(q.y, -h, 1e-12);
    EXPECT_NEAR(q.z, 0, 1e-12);

    // Looking back along +Z is a half turn about Y.
    camera.setViewDirection({0, 0, 1});
    EXPECT_NEAR(std::fabs(camera.orientation().y), 1.0, 1e-12);
}

TEST(LookAtFrameQuaternion, FreeUpFollowsTheCamera) {
    // Tilted down by 45 degrees, then straight down: a fixed world up would
    // be parallel and fall back to +X; an up that follows the camera keeps
    // the tilt's plane.
    base::base_camera<double> fixed, free;
    fixed.setUp({0, 1, 0}, true);
    free.setUp({0, 1, 0}, false);
    for (auto* camera : {&fixed, &free}) {
        camera->setViewDirection({0, -1, -1});
        camera->setViewDirection({0, -1, 0});
        expectNear(camera->viewDirection(), {0, -1, 0}, "view direction");
    }
    expectNear(fixed.up(), {1, 0, 0}, "fixed up");
    expectNear(free.up(), {0, 0, -1}, "free up");

    // A zero direction leaves an oriented camera as it was.
    const Quat before = free.orientation();
    free.setViewDirection({0, 0, 0});
    EXPECT_EQ(free.orientation(), before);
}

TEST(LookAtFrameQuaternion, FloatFrameStaysFinite) {
    const base::mat33f frame = base::lookAtFrame<float>({0, 1, 1e-6f}, {0, 1, 0});
    for (std::size_t c = 0; c < 3; ++c)
        for (float v : {frame.column(c).x, frame.column(c).y, frame.column(c).z})
            EXPECT_TRUE(std::isfinite(v));
    EXPECT_NEAR(frame.determinant(), 1.0f, 1e-5f);
}

} // namespace

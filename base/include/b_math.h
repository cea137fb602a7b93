// Value types of the attribute core and the scene model: small vectors,
// quaternions, 3x3 / 2x2 matrices, affine transforms with a double-precision
// translation, axis-aligned boxes, colours and packed-less normals.
//
// All of them are aggregates (brace-initialise them, `{}` zeroes them), standard
// layout and trivially copyable, because attributes store them by value, copy
// them with memcpy and write them to binary streams byte for byte.
//
// Conventions: vectors are x, y, z, w; quaternions are stored w, x, y, z;
// matrices are stored row by row and act on column vectors (p' = M * p).
#pragma once

#include <cmath>
#include <concepts>
#include <cstddef>
#include <limits>
#include <type_traits>

namespace base {

template <class T>
struct base_vec2 {
    using value_type = T;
    T x, y;

    // Indices past the last component answer the last one: never out of bounds.
    constexpr T& operator[](std::size_t i) noexcept { return i == 0 ? x : y; }
    constexpr const T& operator[](std::size_t i) const noexcept { return i == 0 ? x : y; }

    friend constexpr bool operator==(const base_vec2&, const base_vec2&) = default;

    friend constexpr base_vec2 operator+(const base_vec2& a, const base_vec2& b) noexcept {
        return {T(a.x + b.x), T(a.y + b.y)};
    }
    friend constexpr base_vec2 operator-(const base_vec2& a, const base_vec2& b) noexcept {
        return {T(a.x - b.x), T(a.y - b.y)};
    }
    friend constexpr base_vec2 operator-(const base_vec2& a) noexcept { return {T(-a.x), T(-a.y)}; }
    friend constexpr base_vec2 operator*(const base_vec2& a, T s) noexcept {
        return {T(a.x * s), T(a.y * s)};
    }
    friend constexpr base_vec2 operator*(T s, const base_vec2& a) noexcept { return a * s; }
    friend constexpr base_vec2 operator/(const base_vec2& a, T s) noexcept {
        return {T(a.x / s), T(a.y / s)};
    }
    constexpr base_vec2& operator+=(const base_vec2& b) noexcept { return *this = *this + b; }
    constexpr base_vec2& operator-=(const base_vec2& b) noexcept { return *this = *this - b; }
    constexpr base_vec2& operator*=(T s) noexcept { return *this = *this * s; }

    constexpr auto lengthSquared() const noexcept { return x * x + y * y; }
    auto length() const noexcept { return std::sqrt(lengthSquared()); }
    // The zero vector stays zero rather than turning into NaNs.
    base_vec2 normalized() const noexcept requires std::floating_point<T> {
        const T len = length();
        return len == T(0) ? *this : base_vec2{T(x / len), T(y / len)};
    }
};

template <class T>
struct base_vec3 {
    using value_type = T;
    T x, y, z;

    constexpr T& operator[](std::size_t i) noexcept { return i == 0 ? x : i == 1 ? y : z; }
    constexpr const T& operator[](std::size_t i) const noexcept {
        return i == 0 ? x : i == 1 ? y : z;
    }

    friend constexpr bool operator==(const base_vec3&, const base_vec3&) = default;

    friend constexpr base_vec3 operator+(const base_vec3& a, const base_vec3& b) noexcept {
        return {T(a.x + b.x), T(a.y + b.y), T(a.z + b.z)};
    }
    friend constexpr base_vec3 operator-(const base_vec3& a, const base_vec3& b) noexcept {
        return {T(a.x - b.x), T(a.y - b.y), T(a.z - b.z)};
    }
    friend constexpr base_vec3 operator-(const base_vec3& a) noexcept {
        return {T(-a.x), T(-a.y), T(-a.z)};
    }
    friend constexpr base_vec3 operator*(const base_vec3& a, T s) noexcept {
        return {T(a.x * s), T(a.y * s), T(a.z * s)};
    }
    friend constexpr base_vec3 operator*(T s, const base_vec3& a) noexcept { return a * s; }
    friend constexpr base_vec3 operator/(const base_vec3& a, T s) noexcept {
        return {T(a.x / s), T(a.y / s), T(a.z / s)};
    }
    constexpr base_vec3& operator+=(const base_vec3& b) noexcept { return *this = *this + b; }
    constexpr base_vec3& operator-=(const base_vec3& b) noexcept { return *this = *this - b; }
    constexpr base_vec3& operator*=(T s) noexcept { return *this = *this * s; }

    constexpr auto lengthSquared() const noexcept { return x * x + y * y + z * z; }
    auto length() const noexcept { return std::sqrt(lengthSquared()); }
    // The zero vector stays zero rather than turning into NaNs.
    base_vec3 normalized() const noexcept requires std::floating_point<T> {
        const T len = length();
        return len == T(0) ? *this : base_vec3{T(x / len), T(y / len), T(z / len)};
    }
};

template <class T>
struct base_vec4 {
    using value_type = T;
    T x, y, z, w;

    constexpr T& operator[](std::size_t i) noexcept {
        return i == 0 ? x : i == 1 ? y : i == 2 ? z : w;
    }
    constexpr const T& operator[](std::size_t i) const noexcept {
        return i == 0 ? x : i == 1 ? y : i == 2 ? z : w;
    }

    friend constexpr bool operator==(const base_vec4&, const base_vec4&) = default;

    friend constexpr base_vec4 operator+(const base_vec4& a, const base_vec4& b) noexcept {
        return {T(a.x + b.x), T(a.y + b.y), T(a.z + b.z), T(a.w + b.w)};
    }
    friend constexpr base_vec4 operator-(const base_vec4& a, const base_vec4& b) noexcept {
        return {T(a.x - b.x), T(a.y - b.y), T(a.z - b.z), T(a.w - b.w)};
    }
    friend constexpr base_vec4 operator-(const base_vec4& a) noexcept {
        return {T(-a.x), T(-a.y), T(-a.z), T(-a.w)};
    }
    friend constexpr base_vec4 operator*(const base_vec4& a, T s) noexcept {
        return {T(a.x * s), T(a.y * s), T(a.z * s), T(a.w * s)};
    }
    friend constexpr base_vec4 operator*(T s, const base_vec4& a) noexcept { return a * s; }
    friend constexpr base_vec4 operator/(const base_vec4& a, T s) noexcept {
        return {T(a.x / s), T(a.y / s), T(a.z / s), T(a.w / s)};
    }
    constexpr base_vec4& operator+=(const base_vec4& b) noexcept { return *this = *this + b; }
    constexpr base_vec4& operator-=(const base_vec4& b) noexcept { return *this = *this - b; }
    constexpr base_vec4& operator*=(T s) noexcept { return *this = *this * s; }

    constexpr auto lengthSquared() const noexcept { return x * x + y * y + z * z + w * w; }
    auto length() const noexcept { return std::sqrt(lengthSquared()); }
    // The zero vector stays zero rather than turning into NaNs.
    base_vec4 normalized() const noexcept requires std::floating_point<T> {
        const T len = length();
        return len == T(0) ? *this : base_vec4{T(x / len), T(y / len), T(z / len), T(w / len)};
    }
};

// Free functions rather than hidden friends so that `base::dot(a, b)` works too.
template <class T>
constexpr auto dot(const base_vec2<T>& a, const base_vec2<T>& b) noexcept {
    return a.x * b.x + a.y * b.y;
}
template <class T>
constexpr auto dot(const base_vec3<T>& a, const base_vec3<T>& b) noexcept {
    return a.x * b.x + a.y * b.y + a.z * b.z;
}
template <class T>
constexpr auto dot(const base_vec4<T>& a, const base_vec4<T>& b) noexcept {
    return a.x * b.x + a.y * b.y + a.z * b.z + a.w * b.w;
}
template <class T>
constexpr base_vec3<T> cross(const base_vec3<T>& a, const base_vec3<T>& b) noexcept {
    return {T(a.y * b.z - a.z * b.y), T(a.z * b.x - a.x * b.z), T(a.x * b.y - a.y * b.x)};
}

template <class T>
constexpr base_vec2<T> componentMin(const base_vec2<T>& a, const base_vec2<T>& b) noexcept {
    return {b.x < a.x ? b.x : a.x, b.y < a.y ? b.y : a.y};
}
template <class T>
constexpr base_vec2<T> componentMax(const base_vec2<T>& a, const base_vec2<T>& b) noexcept {
    return {a.x < b.x ? b.x : a.x, a.y < b.y ? b.y : a.y};
}
template <class T>
constexpr base_vec3<T> componentMin(const base_vec3<T>& a, const base_vec3<T>& b) noexcept {
    return {b.x < a.x ? b.x : a.x, b.y < a.y ? b.y : a.y, b.z < a.z ? b.z : a.z};
}
template <class T>
constexpr base_vec3<T> componentMax(const base_vec3<T>& a, const base_vec3<T>& b) noexcept {
    return {a.x < b.x ? b.x : a.x, a.y < b.y ? b.y : a.y, a.z < b.z ? b.z : a.z};
}
template <class T>
constexpr base_vec4<T> componentMin(const base_vec4<T>& a, const base_vec4<T>& b) noexcept {
    return {b.x < a.x ? b.x : a.x, b.y < a.y ? b.y : a.y, b.z < a.z ? b.z : a.z,
            b.w < a.w ? b.w : a.w};
}
template <class T>
constexpr base_vec4<T> componentMax(const base_vec4<T>& a, const base_vec4<T>& b) noexcept {
    return {a.x < b.x ? b.x : a.x, a.y < b.y ? b.y : a.y, a.z < b.z ? b.z : a.z,
            a.w < b.w ? b.w : a.w};
}

template <class T>
struct base_mat22 {
    using value_type = T;
    T m[2][2];

    static constexpr base_mat22 identity() noexcept { return {{{T(1), T(0)}, {T(0), T(1)}}}; }

    constexpr T& operator()(std::size_t r, std::size_t c) noexcept { return m[r][c]; }
    constexpr const T& operator()(std::size_t r, std::size_t c) const noexcept { return m[r][c]; }
    constexpr base_vec2<T> row(std::size_t r) const noexcept { return {m[r][0], m[r][1]}; }

    friend constexpr bool operator==(const base_mat22&, const base_mat22&) = default;

    friend constexpr base_mat22 operator*(const base_mat22& a, const base_mat22& b) noexcept {
        base_mat22 out{};
        for (std::size_t r = 0; r < 2; ++r)
            for (std::size_t c = 0; c < 2; ++c)
                out.m[r][c] = T(a.m[r][0] * b.m[0][c] + a.m[r][1] * b.m[1][c]);
        return out;
    }
    friend constexpr base_vec2<T> operator*(const base_mat22& a, const base_vec2<T>& v) noexcept {
        return {T(a.m[0][0] * v.x + a.m[0][1] * v.y), T(a.m[1][0] * v.x + a.m[1][1] * v.y)};
    }
    constexpr base_mat22 transpose() const noexcept {
        return {{{m[0][0], m[1][0]}, {m[0][1], m[1][1]}}};
    }
    constexpr T determinant() const noexcept { return T(m[0][0] * m[1][1] - m[0][1] * m[1][0]); }
};

template <class T>
struct base_mat33 {
    using value_type = T;
    T m[3][3];

    static constexpr base_mat33 identity() noexcept {
        return {{{T(1), T(0), T(0)}, {T(0), T(1), T(0)}, {T(0), T(0), T(1)}}};
    }
    static constexpr base_mat33 diagonal(const base_vec3<T>& d) noexcept {
        return {{{d.x, T(0), T(0)}, {T(0), d.y, T(0)}, {T(0), T(0), d.z}}};
    }
    static constexpr base_mat33 fromRows(const base_vec3<T>& r0, const base_vec3<T>& r1,
                                         const base_vec3<T>& r2) noexcept {
        return {{{r0.x, r0.y, r0.z}, {r1.x, r1.y, r1.z}, {r2.x, r2.y, r2.z}}};
    }
    static constexpr base_mat33 fromColumns(const base_vec3<T>& c0, const base_vec3<T>& c1,
                                            const base_vec3<T>& c2) noexcept {
        return {{{c0.x, c1.x, c2.x}, {c0.y, c1.y, c2.y}, {c0.z, c1.z, c2.z}}};
    }

    // m[r][c] also works through the public member; index bounds are the caller's.
    constexpr T& operator()(std::size_t r, std::size_t c) noexcept { return m[r][c]; }
    constexpr const T& operator()(std::size_t r, std::size_t c) const noexcept { return m[r][c]; }
    constexpr base_vec3<T> row(std::size_t r) const noexcept { return {m[r][0], m[r][1], m[r][2]}; }
    constexpr base_vec3<T> column(std::size_t c) const noexcept {
        return {m[0][c], m[1][c], m[2][c]};
    }

    friend constexpr bool operator==(const base_mat33&, const base_mat33&) = default;

    friend constexpr base_mat33 operator*(const base_mat33& a, const base_mat33& b) noexcept {
        base_mat33 out{};
        for (std::size_t r = 0; r < 3; ++r)
            for (std::size_t c = 0; c < 3; ++c)
                out.m[r][c] =
                    T(a.m[r][0] * b.m[0][c] + a.m[r][1] * b.m[1][c] + a.m[r][2] * b.m[2][c]);
        return out;
    }
    friend constexpr base_vec3<T> operator*(const base_mat33& a, const base_vec3<T>& v) noexcept {
        return {T(a.m[0][0] * v.x + a.m[0][1] * v.y + a.m[0][2] * v.z),
                T(a.m[1][0] * v.x + a.m[1][1] * v.y + a.m[1][2] * v.z),
                T(a.m[2][0] * v.x + a.m[2][1] * v.y + a.m[2][2] * v.z)};
    }

    constexpr base_mat33 transpose() const noexcept {
        return {{{m[0][0], m[1][0], m[2][0]},
                 {m[0][1], m[1][1], m[2][1]},
                 {m[0][2], m[1][2], m[2][2]}}};
    }
    constexpr T determinant() const noexcept {
        return T(m[0][0] * (m[1][1] * m[2][2] - m[1][2] * m[2][1]) -
                 m[0][1] * (m[1][0] * m[2][2] - m[1][2] * m[2][0]) +
                 m[0][2] * (m[1][0] * m[2][1] - m[1][1] * m[2][0]));
    }
    // A singular matrix answers the zero matrix instead of infinities and NaNs,
    // which would spread silently through every transform computed from it.
    constexpr base_mat33 inverse() const noexcept requires std::floating_point<T> {
        const T det = determinant();
        if (det == T(0))
            return {};
        const T inv = T(1) / det;
        return {{{(m[1][1] * m[2][2] - m[1][2] * m[2][1]) * inv,
                  (m[0][2] * m[2][1] - m[0][1] * m[2][2]) * inv,
                  (m[0][1] * m[1][2] - m[0][2] * m[1][1]) * inv},
                 {(m[1][2] * m[2][0] - m[1][0] * m[2][2]) * inv,
                  (m[0][0] * m[2][2] - m[0][2] * m[2][0]) * inv,
                  (m[0][2] * m[1][0] - m[0][0] * m[1][2]) * inv},
                 {(m[1][0] * m[2][1] - m[1][1] * m[2][0]) * inv,
                  (m[0][1] * m[2][0] - m[0][0] * m[2][1]) * inv,
                  (m[0][0] * m[1][1] - m[0][1] * m[1][0]) * inv}}};
    }
};

template <class T>
struct base_quat {
    using value_type = T;
    T w, x, y, z;

    static constexpr base_quat identity() noexcept { return {T(1), T(0), T(0), T(0)}; }

    // The axis is used as given (not normalised): node attributes store axis-angle
    // rotations that way and compose them unchanged.
    static base_quat fromAxisAngle(const base_vec3<T>& axis, T radians) noexcept {
        const T s = std::sin(radians / T(2));
        return {std::cos(radians / T(2)), axis.x * s, axis.y * s, axis.z * s};
    }

    // Trace-based extraction. The trace formula is used only while w dominates
    // (trace > 0), otherwise the largest diagonal element picks the formula, so
    // no small square root amplifies rounding (float input keeps ~1e-7). The sign
    // is then the one the trace formula gives (w > 0) wherever that formula is
    // defined (trace + 1 > 1e-4), so stored rotations keep their sign. The result
    // is not normalised again: for a pure rotation it is a unit quaternion up to
    // rounding.
    static base_quat fromMatrix(const base_mat33<T>& r) noexcept requires std::floating_point<T> {
        const auto& R = r.m;
        const T trace = R[0][0] + R[1][1] + R[2][2];
        base_quat q;
        if (trace > T(0)) {
            const T s = T(0.5) / std::sqrt(trace + T(1));
            q = {T(0.25) / s, (R[2][1] - R[1][2]) * s, (R[0][2] - R[2][0]) * s,
                 (R[1][0] - R[0][1]) * s};
        } else if (R[0][0] > R[1][1] && R[0][0] > R[2][2]) {
            const T d = std::sqrt(T(1) + R[0][0] - R[1][1] - R[2][2]);
            const T k = T(0.5) / d;
            q = {(R[2][1] - R[1][2]) * k, d / T(2), (R[0][1] + R[1][0]) * k,
                 (R[0][2] + R[2][0]) * k};
        } else if (R[1][1] > R[2][2]) {
            const T d = std::sqrt(T(1) + R[1][1] - R[0][0] - R[2][2]);
            const T k = T(0.5) / d;
            q = {(R[0][2] - R[2][0]) * k, (R[0][1] + R[1][0]) * k, d / T(2),
                 (R[1][2] + R[2][1]) * k};
        } else {
            const T d = std::sqrt(T(1) + R[2][2] - R[0][0] - R[1][1]);
            const T k = T(0.5) / d;
            q = {(R[1][0] - R[0][1]) * k, (R[0][2] + R[2][0]) * k, (R[1][2] + R[2][1]) * k,
                 d / T(2)};
        }
        if (trace + T(1) > T(0.0001) && q.w < T(0))
            q = -q;
        return q;
    }

    friend constexpr bool operator==(const base_quat&, const base_quat&) = default;

    // Hamilton product: (a * b) rotates by b first, then by a.
    friend constexpr base_quat operator*(const base_quat& a, const base_quat& b) noexcept {
        return {a.w * b.w - a.x * b.x - a.y * b.y - a.z * b.z,
                a.w * b.x + a.x * b.w + a.y * b.z - a.z * b.y,
                a.w * b.y - a.x * b.z + a.y * b.w + a.z * b.x,
                a.w * b.z + a.x * b.y - a.y * b.x + a.z * b.w};
    }
    // Component-wise arithmetic, for interpolation and curve offsets.
    friend constexpr base_quat operator+(const base_quat& a, const base_quat& b) noexcept {
        return {a.w + b.w, a.x + b.x, a.y + b.y, a.z + b.z};
    }
    friend constexpr base_quat operator-(const base_quat& a, const base_quat& b) noexcept {
        return {a.w - b.w, a.x - b.x, a.y - b.y, a.z - b.z};
    }
    friend constexpr base_quat operator-(const base_quat& a) noexcept {
        return {-a.w, -a.x, -a.y, -a.z};
    }
    friend constexpr base_quat operator*(const base_quat& a, T s) noexcept {
        return {a.w * s, a.x * s, a.y * s, a.z * s};
    }
    friend constexpr base_quat operator*(T s, const base_quat& a) noexcept { return a * s; }

    constexpr base_quat conjugate() const noexcept { return {w, -x, -y, -z}; }
    constexpr T lengthSquared() const noexcept { return w * w + x * x + y * y + z * z; }
    // The zero quaternion has no direction; it answers the identity instead of NaNs.
    base_quat normalized() const noexcept {
        const T len = std::sqrt(lengthSquared());
        return len == T(0) ? identity() : base_quat{w / len, x / len, y / len, z / len};
    }

    // Standard form; exact for unit quaternions, and rotate() below agrees with it
    // for any quaternion.
    constexpr base_mat33<T> rotationMatrix() const noexcept {
        return {{{T(1) - T(2) * (y * y + z * z), T(2) * (x * y - w * z), T(2) * (x * z + w * y)},
                 {T(2) * (x * y + w * z), T(1) - T(2) * (x * x + z * z), T(2) * (y * z - w * x)},
                 {T(2) * (x * z - w * y), T(2) * (y * z + w * x), T(1) - T(2) * (x * x + y * y)}}};
    }
    // v + 2w(u x v) + 2u x (u x v), u the vector part: q v q* without building q v.
    constexpr base_vec3<T> rotate(const base_vec3<T>& v) const noexcept {
        const base_vec3<T> u{x, y, z};
        const base_vec3<T> uv = cross(u, v);
        return v + uv * (T(2) * w) + cross(u, uv) * T(2);
    }
};

template <class T>
constexpr T dot(const base_quat<T>& a, const base_quat<T>& b) noexcept {
    return a.w * b.w + a.x * b.x + a.y * b.y + a.z * b.z;
}

// Spherical interpolation along the shorter arc. Nearly equal rotations fall
// back to a normalised linear blend, where sin(angle) would divide by ~0.
template <class T>
base_quat<T> slerp(const base_quat<T>& a, base_quat<T> b, T u) noexcept {
    T c = dot(a, b);
    if (c < T(0)) {
        b = -b;
        c = -c;
    }
    if (c > T(0.9995))
        return (a * (T(1) - u) + b * u).normalized();
    const T angle = std::acos(c);
    const T s = std::sin(angle);
    return a * T(std::sin((T(1) - u) * angle) / s) + b * T(std::sin(u * angle) / s);
}

// Affine transform: linear part M (3x3 of T) and translation in P, so that world
// positions keep double precision while the matrix stays single precision.
// base_mat43<float, double, base_mat33<float>> is 64 bytes with 4 bytes of padding
// after the matrix (36 + 4 + 24): binary writers write m and t separately
// (60 bytes), and code that hashes or memcmp's whole objects must memset them
// first, since `{}` does not clear padding.
template <class T, class P, class M>
struct base_mat43 {
    using value_type = T;
    using translation_type = P;
    M m;
    base_vec3<P> t;

    static constexpr base_mat43 identity() noexcept { return {M::identity(), {}}; }

    friend constexpr bool operator==(const base_mat43&, const base_mat43&) = default;

    constexpr base_vec3<P> transformVector(const base_vec3<P>& v) const noexcept {
        base_vec3<P> out{};
        for (std::size_t r = 0; r < 3; ++r)
            out[r] = P(m.m[r][0]) * v.x + P(m.m[r][1]) * v.y + P(m.m[r][2]) * v.z;
        return out;
    }
    constexpr base_vec3<P> transformPoint(const base_vec3<P>& p) const noexcept {
        return transformVector(p) + t;
    }
    // a * b applies b first.
    friend constexpr base_mat43 operator*(const base_mat43& a, const base_mat43& b) noexcept {
        return {a.m * b.m, a.transformPoint(b.t)};
    }
};

template <class V>
struct base_box {
    using vector_type = V;
    using value_type = typename V::value_type;
    V min, max;

    // Inverted to the extreme, so that extend() and unite() need no special case.
    static constexpr base_box empty() noexcept {
        constexpr value_type big = std::numeric_limits<value_type>::max();
        base_box b{};
        for (std::size_t i = 0; i < dims(); ++i) {
            b.min[i] = big;
            b.max[i] = value_type(-big);
        }
        return b;
    }

    friend constexpr bool operator==(const base_box&, const base_box&) = default;

    constexpr bool isEmpty() const noexcept {
        for (std::size_t i = 0; i < dims(); ++i)
            if (min[i] > max[i])
                return true;
        return false;
    }
    constexpr base_box& extend(const V& p) noexcept {
        min = componentMin(min, p);
        max = componentMax(max, p);
        return *this;
    }
    constexpr base_box& unite(const base_box& b) noexcept {
        min = componentMin(min, b.min);
        max = componentMax(max, b.max);
        return *this;
    }

    // Per output axis: translation plus, over the input axes, the smaller (larger)
    // of element*min and element*max: the exact bounds of the 8 moved corners.
    // The empty box stays empty; the sums would otherwise overflow to an
    // infinite box covering all space.
    template <class T, class P, class M>
    constexpr base_box transformed(const base_mat43<T, P, M>& xf) const noexcept {
        if (isEmpty())
            return empty();
        using C = std::common_type_t<value_type, P>;
        base_box out{};
        for (std::size_t i = 0; i < 3; ++i) {
            C lo = C(xf.t[i]);
            C hi = lo;
            for (std::size_t j = 0; j < 3; ++j) {
                const C e = C(xf.m.m[i][j]);
                const C a = e * C(min[j]);
                const C b = e * C(max[j]);
                lo += a < b ? a : b;
                hi += a < b ? b : a;
            }
            out.min[i] = value_type(lo);
            out.max[i] = value_type(hi);
        }
        return out;
    }

private:
    static constexpr std::size_t dims() noexcept { return sizeof(V) / sizeof(value_type); }
};

template <class T>
struct base_color4 {
    using value_type = T;
    T r, g, b, a;
    friend constexpr bool operator==(const base_color4&, const base_color4&) = default;
};

// Normal or tangent of a mesh: three floats like vec3f, but a distinct type so
// that attributes of normals carry their own type name.
struct normal {
    float x, y, z;

    static constexpr normal from(const base_vec3<float>& v) noexcept { return {v.x, v.y, v.z}; }
    constexpr operator base_vec3<float>() const noexcept { return {x, y, z}; }
    friend constexpr bool operator==(const normal&, const normal&) = default;
};

using vec2f = base_vec2<float>;
using vec3f = base_vec3<float>;
using vec4f = base_vec4<float>;
using vec2d = base_vec2<double>;
using vec3d = base_vec3<double>;
using vec4d = base_vec4<double>;
using vec2i = base_vec2<int>;
using vec3i = base_vec3<int>;
using vec4i = base_vec4<int>;
using quatf = base_quat<float>;
using quatd = base_quat<double>;
using mat22f = base_mat22<float>;
using mat22d = base_mat22<double>;
using mat33f = base_mat33<float>;
using mat33d = base_mat33<double>;
using mat43 = base_mat43<float, double, base_mat33<float>>;
using box3f = base_box<base_vec3<float>>;
using box3d = base_box<base_vec3<double>>;
using color4f = base_color4<float>;

namespace math_detail {
template <class... T>
constexpr bool plainValues = ((std::is_standard_layout_v<T> &&
                               std::is_trivially_copyable_v<T>)&&...);
}
static_assert(math_detail::plainValues<vec2f, vec3f, vec4f, vec2d, vec3d, vec4d, vec2i, vec3i,
                                       vec4i, quatf, quatd, mat22f, mat22d, mat33f, mat33d, mat43,
                                       box3f, box3d, color4f, normal>);
// Byte layouts that the binary attribute form relies on.
static_assert(sizeof(vec3f) == 12 && sizeof(vec3d) == 24 && sizeof(vec4d) == 32);
static_assert(sizeof(quatf) == 16 && sizeof(quatd) == 32);
static_assert(sizeof(mat22f) == 16 && sizeof(mat22d) == 32 && sizeof(mat33f) == 36);
static_assert(sizeof(box3f) == 24 && sizeof(box3d) == 48);
static_assert(sizeof(color4f) == 16 && sizeof(normal) == 12);
static_assert(sizeof(mat43) == 64 && offsetof(mat43, t) == 40);

} // namespace base

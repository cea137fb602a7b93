// The keyframe algorithm over plain arrays, shared by every value type the
// channels evaluate. Private to the scene library: callers go through
// IKeyframeChannel::computeValue, which finds the arrays and reports bad data.
#pragma once

#include "b_math.h"
#include "b_timecode.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <type_traits>
#include <utility>

// The value types a channel evaluates: X(T).
#define SCENE_CHANNEL_TYPES(X)                                                                     \
    X(int)                                                                                         \
    X(float)                                                                                       \
    X(double)                                                                                      \
    X(::base::base_quat<float>)                                                                    \
    X(::base::base_quat<double>)                                                                   \
    X(::base::base_vec2<float>)                                                                    \
    X(::base::base_vec2<double>)                                                                   \
    X(::base::base_vec3<float>)                                                                    \
    X(::base::base_vec3<double>)                                                                   \
    X(::base::base_vec4<float>)                                                                    \
    X(::base::base_vec4<double>)

namespace scene::anim {

using ::base::TimeCode;

[[noreturn]] void throwMode();

inline constexpr std::int64_t snapTicks = 46186; // one microsecond

// A value as N components of its computation scalar S (single precision for
// int and the float types, double for the double types).
template <class T>
struct Traits {
    using C = typename T::value_type;
    using S = std::conditional_t<std::is_same_v<C, double>, double, float>;
    static constexpr int N = int(sizeof(T) / sizeof(C));
    static constexpr bool quat = std::is_same_v<T, ::base::base_quat<C>>;
};
template <class T>
requires std::is_arithmetic_v<T>
struct Traits<T> {
    using C = T;
    using S = std::conditional_t<std::is_same_v<T, double>, double, float>;
    static constexpr int N = 1;
    static constexpr bool quat = false;
};

template <class T>
using Comps = std::array<typename Traits<T>::S, Traits<T>::N>;

template <class T>
inline Comps<T> load(const T& v) {
    typename Traits<T>::C raw[Traits<T>::N];
    std::memcpy(raw, &v, sizeof(raw));
    Comps<T> out;
    for (int i = 0; i < Traits<T>::N; ++i)
        out[i] = typename Traits<T>::S(raw[i]);
    return out;
}

template <class T>
inline T store(const Comps<T>& c) {
    using C = typename Traits<T>::C;
    C raw[Traits<T>::N];
    for (int i = 0; i < Traits<T>::N; ++i) {
        if constexpr (std::is_integral_v<C>) {
            // Truncation toward zero; out-of-range and NaN saturate rather
            // than being undefined.
            const auto x = c[i];
            raw[i] = x != x                                      ? C(0)
                     : x >= float(std::numeric_limits<C>::max()) ? std::numeric_limits<C>::max()
                     : x <= float(std::numeric_limits<C>::min()) ? std::numeric_limits<C>::min()
                                                                 : C(x);
        } else {
            raw[i] = C(c[i]);
        }
    }
    T out;
    std::memcpy(&out, raw, sizeof(raw));
    return out;
}

// a + (b - a) * u component-wise, or slerp for quaternions along the shorter
// arc. A sine near zero (keys almost equal) falls back to the linear blend
// without dividing by it.
template <class T>
inline Comps<T> blend(const Comps<T>& a, Comps<T> b, double u) {
    using S = typename Traits<T>::S;
    constexpr int N = Traits<T>::N;
    Comps<T> out;
    if constexpr (Traits<T>::quat) {
        S dot = 0;
        for (int i = 0; i < N; ++i)
            dot += a[i] * b[i];
        if (dot < 0) {
            dot = -dot;
            for (auto& x : b)
                x = -x;
        }
        S ka = S(1 - u), kb = S(u);
        if (dot < S(1)) {
            const S angle = std::acos(dot);
            const S sine = std::sin(angle);
            if (sine > S(1e-6)) {
                ka = std::sin(S(1 - u) * angle) / sine;
                kb = std::sin(S(u) * angle) / sine;
            }
        }
        for (int i = 0; i < N; ++i)
            out[i] = a[i] * ka + b[i] * kb;
    } else {
        const S su = S(u), sv = S(1 - u);
        for (int i = 0; i < N; ++i)
            out[i] = a[i] * sv + b[i] * su;
    }
    return out;
}

// The keys of one curve and its settings, as computeValue found them.
template <class T>
struct Curve {
    const TimeCode* times = nullptr;
    const T* values = nullptr;
    std::size_t n = 0;
    const std::uint8_t* modes = nullptr; // per key, when not null
    std::size_t modeCount = 0;
    std::uint8_t mode = 1;
    std::uint8_t pre = 0, post = 0;
    const float* tangents = nullptr; // 2 per key, checked
    const float* weights = nullptr;  // as many as tangents, checked
    bool bezierFallback = false;
    float tension = 1.0f, tightness = 0.5f;
    std::uint32_t hint = 0; // segment start found last

    // The mode of the segment that ends at key k: a per-key entry past the
    // array's end reads as linear.
    std::uint8_t modeOf(std::size_t k) const {
        std::uint8_t m = modes ? (k < modeCount ? modes[k] : std::uint8_t(1)) : mode;
        if (m > 3)
            throwMode();
        return m == 3 && bezierFallback ? std::uint8_t(1) : m;
    }
    bool usesBezier() const {
        if (!modes)
            return mode == 3;
        for (std::size_t k = 0; k < modeCount; ++k)
            if (modes[k] == 3)
                return true;
        return false;
    }
};

inline double seconds(double ticks) {
    return ticks * (1.0 / double(TimeCode::ticksPerSecond));
}

// The first index whose time is greater than t, within [lo, hi): halving while
// the range holds more than 3 keys, then a forward scan.
inline std::size_t upperKey(const TimeCode* times, std::size_t lo, std::size_t hi, TimeCode t) {
    while (hi - lo > 3) {
        const std::size_t mid = lo + (hi - lo) / 2;
        if (times[mid] > t)
            hi = mid + 1;
        else
            lo = mid + 1;
    }
    while (lo < hi && !(times[lo] > t))
        ++lo;
    return lo;
}

// The root in [0, 1] of a·p³ + b·p² + c·p + d = 0 (d already holds minus the
// target) that reproduces the target to 'tolerance'; -1 when there is none.
// The interval is cut at the turning points, so each piece is monotonic and a
// safeguarded Newton iteration converges on it.
inline double cubicRoot(double a, double b, double c, double d, double tolerance) {
    auto f = [&](double p) { return ((a * p + b) * p + c) * p + d; };
    auto df = [&](double p) { return (3 * a * p + 2 * b) * p + c; };
    double cuts[4] = {0, 1, 1, 1};
    int count = 1;
    const double qa = 3 * a, qb = 2 * b, qc = c;
    if (std::abs(qa) > 1e-300) {
        const double disc = qb * qb - 4 * qa * qc;
        if (disc > 0) {
            const double s = std::sqrt(disc);
            double r1 = (-qb - s) / (2 * qa), r2 = (-qb + s) / (2 * qa);
            if (r1 > r2)
                std::swap(r1, r2);
            for (double r : {r1, r2})
                if (r > 0 && r < 1)
                    cuts[count++] = r;
        }
    } else if (std::abs(qb) > 1e-300) {
        const double r = -qc / qb;
        if (r > 0 && r < 1)
            cuts[count++] = r;
    }
    cuts[count++] = 1;
    for (int i = 0; i + 1 < count; ++i) {
        double lo = cuts[i], hi = cuts[i + 1];
        double flo = f(lo), fhi = f(hi);
        if (std::abs(flo) <= tolerance)
            return lo;
        if (std::abs(fhi) <= tolerance)
            return hi;
        if ((flo < 0) == (fhi < 0))
            continue;
        double p = 0.5 * (lo + hi);
        for (int it = 0; it < 100; ++it) {
            const double fp = f(p);
            if (std::abs(fp) <= tolerance)
                return p;
            if ((fp < 0) == (flo < 0))
                lo = p, flo = fp;
            else
                hi = p;
            const double slope = df(p);
            double next = slope != 0 ? p - fp / slope : lo;
            if (!(next > lo && next < hi))
                next = 0.5 * (lo + hi);
            p = next;
        }
        return p;
    }
    return -1;
}

// The parameter of a cubic Hermite segment of the time coordinate (ends 0 and
// 1 as fractions of the segment, end tangents m0 and m1 in the same unit) at
// which time u is reached. With no root (rounding), the nearer end.
inline double hermiteParameter(double m0, double m1, double u) {
    // h(p) = (2p³ − 3p² + 1)·0 + (3p² − 2p³)·1 + (p³ − 2p² + p)·m0 + (p³ − p²)·m1
    const double a = -2 + m0 + m1, b = 3 - 2 * m0 - m1, c = m0;
    const double p = cubicRoot(a, b, c, -u, 1e-9);
    if (p >= 0)
        return p;
    return u < 0.5 ? 0.0 : 1.0;
}

template <class S>
inline S hermite(S a, S b, S s, S e, S p) {
    const S p2 = p * p, p3 = p2 * p;
    return a * (2 * p3 - 3 * p2 + 1) + b * (3 * p2 - 2 * p3) + s * (p3 - 2 * p2 + p) +
           e * (p3 - p2);
}

// The time/value tangents of the smooth mode at key k, per unit of the
// segment parameter of segment [k0, k0 + 1]: time tangent in fractions of that
// segment, value tangents in value units. Without tightness a cardinal spline
// (neighbour differences · tension · 0.5, one-sided at the ends); with it the
// knot spacing of the (time, value) points is their distance raised to the
// tightness (a centripetal spline at 0.5), and the tangents are those of that
// spline converted to the segment.
template <class T>
struct SmoothTangent {
    double time;
    Comps<T> value;
};

template <class T>
inline SmoothTangent<T> smoothTangent(const Curve<T>& c, std::size_t k, double segSeconds) {
    using S = typename Traits<T>::S;
    constexpr int N = Traits<T>::N;
    const std::size_t n = c.n;
    const std::size_t lo = k > 0 ? k - 1 : k, hi = k + 1 < n ? k + 1 : k;
    const Comps<T> vk = load(c.values[k]), vlo = load(c.values[lo]), vhi = load(c.values[hi]);
    const double tk = seconds(double(c.times[k].ticks())),
                 tlo = seconds(double(c.times[lo].ticks())),
                 thi = seconds(double(c.times[hi].ticks()));
    SmoothTangent<T> out{};
    if (c.tightness > 1e-6f && lo != k && hi != k) {
        auto dist = [&](double dt, const Comps<T>& a, const Comps<T>& b) {
            double d2 = dt * dt;
            for (int i = 0; i < N; ++i)
                d2 += double(a[i] - b[i]) * double(a[i] - b[i]);
            return std::max(std::pow(std::sqrt(d2), double(c.tightness)), 1e-10);
        };
        // Knot intervals before and after key k, and the derivative of the
        // spline through (lo, k, hi) at k per unit of the knot parameter.
        const double d0 = dist(tk - tlo, vk, vlo), d1 = dist(thi - tk, vhi, vk);
        auto deriv = [&](double a, double b, double x) {
            return (x - a) / d0 - (b - a) / (d0 + d1) + (b - x) / d1;
        };
        // The segment [k0, k0 + 1] spans the knot interval d0 or d1 depending on
        // whether k is its start or end; the caller scales by that span.
        out.time = deriv(tlo, thi, tk);
        for (int i = 0; i < N; ++i)
            out.value[i] = S(deriv(double(vlo[i]), double(vhi[i]), double(vk[i])));
        (void)segSeconds;
        return out;
    }
    const double f = lo != k && hi != k ? double(c.tension) * 0.5 : double(c.tension);
    out.time = (thi - tlo) * f;
    for (int i = 0; i < N; ++i)
        out.value[i] = S((vhi[i] - vlo[i]) * S(f));
    return out;
}

// Knot span of segment [s, s + 1] in the tightness spline (the scale that turns
// its knot-parameter derivatives into segment-parameter ones).
template <class T>
inline double knotSpan(const Curve<T>& c, std::size_t s) {
    constexpr int N = Traits<T>::N;
    const Comps<T> a = load(c.values[s]), b = load(c.values[s + 1]);
    const double dt = seconds(double((c.times[s + 1] - c.times[s]).ticks()));
    double d2 = dt * dt;
    for (int i = 0; i < N; ++i)
        d2 += double(a[i] - b[i]) * double(a[i] - b[i]);
    return std::max(std::pow(std::sqrt(d2), double(c.tightness)), 1e-10);
}

template <class T>
inline bool knotted(const Curve<T>& c, std::size_t k) {
    return c.tightness > 1e-6f && k > 0 && k + 1 < c.n;
}

// Smooth segment [s, s + 1] at fraction u of its time.
template <class T>
inline Comps<T> smoothSegment(const Curve<T>& c, std::size_t s, double u) {
    using S = typename Traits<T>::S;
    constexpr int N = Traits<T>::N;
    const double dur = seconds(double((c.times[s + 1] - c.times[s]).ticks()));
    SmoothTangent<T> m0 = smoothTangent(c, s, dur), m1 = smoothTangent(c, s + 1, dur);
    // Into segment-parameter units: knotted tangents by the segment's knot
    // span, cardinal ones are already per neighbouring interval.
    const double span = knotSpan(c, s);
    auto scale = [&](SmoothTangent<T>& m, std::size_t k) {
        if (knotted(c, k)) {
            m.time *= span;
            for (auto& x : m.value)
                x = S(x * span);
        }
        m.time /= dur;
    };
    scale(m0, s);
    scale(m1, s + 1);
    const double p = hermiteParameter(m0.time, m1.time, u);
    const Comps<T> a = load(c.values[s]), b = load(c.values[s + 1]);
    Comps<T> out;
    for (int i = 0; i < N; ++i)
        out[i] = hermite<S>(a[i], b[i], m0.value[i], m1.value[i], S(p));
    return out;
}

// Bezier segment [s, s + 1] at fraction u: outgoing tangent of key s and
// incoming tangent of key s + 1 (value per second). With weights the handles
// sit at their weight's fraction of the segment, and the parameter is solved
// from the time coordinate.
template <class T>
inline Comps<T> bezierSegment(const Curve<T>& c, std::size_t s, double u) {
    using S = typename Traits<T>::S;
    constexpr int N = Traits<T>::N;
    const double dur = seconds(double((c.times[s + 1] - c.times[s]).ticks()));
    const double out = c.tangents[2 * s + 1], in = c.tangents[2 * (s + 1)];
    const Comps<T> a = load(c.values[s]), b = load(c.values[s + 1]);
    Comps<T> r;
    if (!c.weights) {
        for (int i = 0; i < N; ++i)
            r[i] = hermite<S>(a[i], b[i], S(out * dur), S(in * dur), S(u));
        return r;
    }
    const double w0 = c.weights[2 * s + 1], w1 = c.weights[2 * (s + 1)];
    // Time handles as fractions of the segment: 0, w0, 1 - w1, 1.
    const double x1 = w0, x2 = 1 - w1;
    // Bernstein to power form of the time coordinate.
    const double ta = 3 * x1 - 3 * x2 + 1, tb = -6 * x1 + 3 * x2, tc = 3 * x1;
    double p = cubicRoot(ta, tb, tc, -u, 1e-9);
    if (p < 0)
        p = u < 0.5 ? 0.0 : 1.0;
    const double q = 1 - p;
    const double b0 = q * q * q, b1 = 3 * q * q * p, b2 = 3 * q * p * p, b3 = p * p * p;
    for (int i = 0; i < N; ++i) {
        const double h1 = double(a[i]) + out * w0 * dur, h2 = double(b[i]) - in * w1 * dur;
        r[i] = S(b0 * double(a[i]) + b1 * h1 + b2 * h2 + b3 * double(b[i]));
    }
    return r;
}

// Value change per second at the curve's first ('start') or last key, for
// linear extrapolation.
template <class T>
inline Comps<T> endSlope(const Curve<T>& c, bool start) {
    using S = typename Traits<T>::S;
    constexpr int N = Traits<T>::N;
    Comps<T> slope{};
    const std::size_t s = start ? 0 : c.n - 2; // the end segment
    const std::int64_t ticks = (c.times[s + 1] - c.times[s]).ticks();
    if (ticks <= 0) // keys at one time: no direction to continue in
        return slope;
    const double dur = seconds(double(ticks));
    const std::size_t key = start ? 0 : c.n - 1;
    switch (c.modeOf(s + 1)) {
    case 0:
        break;
    case 1: {
        const Comps<T> a = load(c.values[s]), b = load(c.values[s + 1]);
        for (int i = 0; i < N; ++i)
            slope[i] = S((b[i] - a[i]) / S(dur));
        break;
    }
    case 2: {
        SmoothTangent<T> m = smoothTangent(c, key, dur);
        if (m.time != 0)
            for (int i = 0; i < N; ++i)
                slope[i] = S(m.value[i] / m.time);
        break;
    }
    case 3: {
        const double t = c.tangents[start ? 0 : 2 * key + 1];
        for (int i = 0; i < N; ++i)
            slope[i] = S(t);
        break;
    }
    }
    return slope;
}

// The value at a time inside [first, last] key time.
template <class T>
inline Comps<T> inside(Curve<T>& c, TimeCode t) {
    const std::size_t n = c.n;
    std::size_t k; // first key later than t
    const std::size_t h = c.hint;
    if (h + 1 < n && !(t < c.times[h]) && t < c.times[h + 1])
        k = h + 1;
    else if (h + 2 < n && !(t < c.times[h + 1]) && t < c.times[h + 2])
        k = h + 2;
    else
        k = upperKey(c.times, 0, n, t);
    const std::size_t s = k - 1; // t >= times[0], so k >= 1
    c.hint = std::uint32_t(s);
    if (k >= n || (t - c.times[s]).ticks() <= snapTicks)
        return load(c.values[s]);
    const double u = double((t - c.times[s]).ticks()) / double((c.times[k] - c.times[s]).ticks());
    switch (c.modeOf(k)) {
    case 0:
        return load(c.values[s]);
    case 1:
        return blend<T>(load(c.values[s]), load(c.values[k]), u);
    case 2:
        return smoothSegment(c, s, u);
    default:
        return bezierSegment(c, s, u);
    }
}

// The whole evaluation: extrapolation, segment search, interpolation.
template <class T>
inline T evaluateCurve(Curve<T>& c, TimeCode t) {
    using S = typename Traits<T>::S;
    constexpr int N = Traits<T>::N;
    const TimeCode tA = c.times[0], tB = c.times[c.n - 1];
    if (!(t < tA) && !(tB < t))
        return store<T>(inside(c, t));
    const bool before = t < tA;
    const std::uint8_t mode = before ? c.pre : c.post;
    if (mode == 0 || (mode >= 2 && tA == tB) || mode > 4)
        return c.values[before ? 0 : c.n - 1];
    if (mode == 1) {
        const Comps<T> slope = endSlope(c, before);
        Comps<T> v = load(c.values[before ? 0 : c.n - 1]);
        const double dt = seconds(double((t - (before ? tA : tB)).ticks()));
        for (int i = 0; i < N; ++i)
            v[i] = S(v[i] + slope[i] * S(dt));
        return store<T>(v);
    }
    // Into the key range with one division, in 128 bits: the distance from a
    // time near one 64-bit limit to a key near the other does not fit 64.
    const __int128 d = __int128(t.ticks()) - tA.ticks();
    const __int128 D = __int128(tB.ticks()) - tA.ticks();
    const __int128 period = mode == 4 ? 2 * D : D;
    __int128 cycles = d / period;
    __int128 r = d - cycles * period;
    if (r < 0)
        r += period, --cycles;
    if (mode == 4 && r > D)
        r = period - r;
    Comps<T> v = inside(c, TimeCode(std::int64_t(tA.ticks() + std::int64_t(r))));
    if (mode == 3) {
        const Comps<T> a = load(c.values[0]), b = load(c.values[c.n - 1]);
        const S k = S(double(cycles));
        for (int i = 0; i < N; ++i)
            v[i] = S(v[i] + (b[i] - a[i]) * k);
    }
    return store<T>(v);
}

} // namespace scene::anim

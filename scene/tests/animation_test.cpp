// Keyframe channels and animation layers: evaluation over every value type,
// interpolation and extrapolation modes, bad curves, and a layer driving a
// node through its outputs.
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_exception.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>
#include <string>
#include <vector>

namespace {

using namespace scene;
using base::ref, base::IPlugin, base::PluginFactory, base::TimeCode;
using quatf = base::base_quat<float>;
using quatd = base::base_quat<double>;

constexpr std::int64_t second = TimeCode::ticksPerSecond;
TimeCode secs(double s) {
    return TimeCode::fromSeconds(s);
}

template <class T>
ref<T> make(PluginFactory& factory, const char* type) {
    ref<IPlugin> made = factory.create(type, PluginFactory::createNullIfUnknown);
    return ref<T>(dynamic_cast<T*>(made.get()));
}

// A value with every component x (int: truncated).
template <class T>
T splat(double x) {
    if constexpr (std::is_arithmetic_v<T>) {
        return T(x);
    } else {
        using C = typename T::value_type;
        T v;
        C* c = reinterpret_cast<C*>(&v);
        for (std::size_t i = 0; i < sizeof(T) / sizeof(C); ++i)
            c[i] = C(x);
        return v;
    }
}
template <class T>
double first(const T& v) {
    if constexpr (std::is_arithmetic_v<T>)
        return double(v);
    else
        return double(*reinterpret_cast<const typename T::value_type*>(&v));
}
template <class T>
bool allEqual(const T& v, double x) {
    if constexpr (std::is_arithmetic_v<T>) {
        return std::abs(double(v) - x) < 1e-4;
    } else {
        using C = typename T::value_type;
        const C* c = reinterpret_cast<const C*>(&v);
        for (std::size_t i = 0; i < sizeof(T) / sizeof(C); ++i)
            if (!(std::abs(double(c[i]) - x) < 1e-4))
                return false;
        return true;
    }
}

struct Channel : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("test")};
    ref<IKeyframeChannel> channel;

    Channel() {
        register_scene_schema(*factory);
        channel = make<IKeyframeChannel>(*factory, "keyframeChannel");
        channel->setAttribute(names::name, base::string("ch"));
    }

    base::AttribMap& curve(std::uint32_t index = 0) {
        base::AttribArray* curves = channel->arrayAttribute(names::curves);
        while (curves->size() <= index)
            curves->appendMap();
        return *curves->item(index)->asMap();
    }
    // Keys at the given seconds; a fresh curve map each time.
    template <class T>
    base::AttribMap& keys(std::vector<double> times, std::vector<T> values) {
        channel->removeAttribute(names::curves);
        base::AttribMap& c = curve();
        for (double t : times)
            c.appendAttributeItem(names::times, secs(t));
        for (const T& v : values)
            c.appendAttributeItem(names::values, v);
        return c;
    }
    template <class T>
    T at(double s) {
        return channel->computeValue<T>(0, secs(s));
    }
    std::size_t logged(const std::string& text) {
        return log.count("keyframeChannel |ch| " + text);
    }
};

// The shared behaviour of the non-rotation types, with keys 0 → 10 over one
// second (2 → 20 for the offset case).
template <class T>
void linearCases(Channel& t) {
    SCOPED_TRACE(base::TypeTraits<T>::n_name.view());
    base::AttribMap& c = t.keys<T>({0, 1}, {splat<T>(0), splat<T>(10)});
    EXPECT_TRUE(allEqual(t.channel->computeValue<T>(0, TimeCode(second / 2)), 5));
    EXPECT_TRUE(allEqual(t.channel->computeValue<T>(0, TimeCode(40000)), 0)); // snap
    EXPECT_TRUE(allEqual(t.at<T>(0.25), 2.5) || std::is_integral_v<T>);
    EXPECT_TRUE(allEqual(t.at<T>(2), 10)); // constant after
    EXPECT_TRUE(allEqual(t.at<T>(-3), 0)); // constant before

    struct Row {
        std::uint8_t pre, post;
        double time, expected;
    };
    const Row rows[] = {
        {0, 1, 2.0, 20},     {0, 2, 1.5, 5},     {0, 3, 1.5, 15},    {0, 3, 3.25, 32.5},
        {0, 4, 1.25, 7.5},   {0, 4, 2.25, 2.5},  {1, 0, -1.0, -10},  {2, 0, -0.25, 7.5},
        {3, 0, -0.75, -7.5}, {4, 0, -0.25, 2.5}, {4, 0, -1.25, 7.5},
    };
    for (const Row& r : rows) {
        c.setAttribute(names::preExtrapolation, r.pre);
        c.setAttribute(names::postExtrapolation, r.post);
        const T v = t.at<T>(r.time);
        EXPECT_TRUE(allEqual(v, std::trunc(r.expected)) || allEqual(v, r.expected))
            << int(r.pre) << "/" << int(r.post) << " at " << r.time << ": " << first(v);
    }
    // One key answers its value whatever the time; step holds the first key.
    t.keys<T>({0.5}, {splat<T>(7)});
    EXPECT_TRUE(allEqual(t.at<T>(-100), 7));
    EXPECT_TRUE(allEqual(t.at<T>(100), 7));
    t.keys<T>({0, 1}, {splat<T>(0), splat<T>(10)})
        .setAttribute(names::interpolation, std::uint8_t(0));
    EXPECT_TRUE(allEqual(t.at<T>(0.99), 0));
}

TEST_F(Channel, EveryValueTypeInterpolatesAndExtrapolates) {
    linearCases<int>(*this);
    linearCases<float>(*this);
    linearCases<double>(*this);
    linearCases<base::vec2f>(*this);
    linearCases<base::vec2d>(*this);
    linearCases<base::vec3f>(*this);
    linearCases<base::vec3d>(*this);
    linearCases<base::vec4f>(*this);
    linearCases<base::vec4d>(*this);
    EXPECT_TRUE(log.entries().empty());
}

// Rotation about z by 'degrees', written independently of the code under test.
template <class Q>
Q aboutZ(double degrees) {
    const double h = degrees * M_PI / 360.0;
    return {typename Q::value_type(std::cos(h)), 0, 0, typename Q::value_type(std::sin(h))};
}

template <class Q>
void slerpCases(Channel& t) {
    SCOPED_TRACE(base::TypeTraits<Q>::n_name.view());
    auto near = [](const Q& q, const Q& r) {
        // q and −q are one rotation.
        const double d = std::abs(double(q.w * r.w + q.x * r.x + q.y * r.y + q.z * r.z));
        return std::abs(d - 1) < 1e-5;
    };
    t.keys<Q>({0, 1}, {aboutZ<Q>(0), aboutZ<Q>(120)});
    EXPECT_TRUE(near(t.at<Q>(0.5), aboutZ<Q>(60)));
    EXPECT_TRUE(near(t.at<Q>(0.25), aboutZ<Q>(30)));
    // The second key stored with the other sign: still the short way.
    Q flipped = aboutZ<Q>(120);
    flipped = {-flipped.w, -flipped.x, -flipped.y, -flipped.z};
    t.keys<Q>({0, 1}, {aboutZ<Q>(0), flipped});
    EXPECT_TRUE(near(t.at<Q>(0.5), aboutZ<Q>(60)));
    // Keys 350° and 10° apart meet at 0°, not at 180°.
    t.keys<Q>({0, 1}, {aboutZ<Q>(-10), aboutZ<Q>(10)});
    EXPECT_TRUE(near(t.at<Q>(0.5), aboutZ<Q>(0)));
    // Equal keys: no division by a zero sine.
    t.keys<Q>({0, 1}, {aboutZ<Q>(33), aboutZ<Q>(33)});
    const Q same = t.at<Q>(0.5);
    EXPECT_TRUE(near(same, aboutZ<Q>(33))) << same.w;
}

TEST_F(Channel, QuaternionsTakeTheShortArc) {
    slerpCases<quatf>(*this);
    slerpCases<quatd>(*this);
}

double deCasteljau(double p0, double p1, double p2, double p3, double u) {
    const double a = p0 + (p1 - p0) * u, b = p1 + (p2 - p1) * u, c = p2 + (p3 - p2) * u;
    const double d = a + (b - a) * u, e = b + (c - b) * u;
    return d + (e - d) * u;
}

TEST_F(Channel, BezierMatchesDeCasteljau) {
    // Two seconds from 1 to 5; outgoing slope 3/s, incoming slope -1/s.
    base::AttribMap& c = keys<double>({0, 2}, {1.0, 5.0});
    c.setAttribute(names::interpolation, std::uint8_t(3));
    auto& tangents = c.vecAttribute<float>(names::tangents)->items();
    tangents = {0, 3, -1, 0};
    const double D = 2;
    for (double u : {0.1, 0.3, 0.5, 0.77, 0.95}) {
        const double expected = deCasteljau(1, 1 + 3 * D / 3, 5 + 1 * D / 3, 5, u);
        EXPECT_NEAR(at<double>(u * D), expected, 1e-9) << u;
    }
    // Weights place the handles; the time curve is solved for the parameter.
    auto& weights = c.vecAttribute<float>(names::weights)->items();
    weights = {0.5f, 0.1f, 0.6f, 0.5f};
    const double w0 = 0.1, w1 = 0.6;
    for (double u : {0.05, 0.3, 0.5, 0.8, 0.97}) {
        double lo = 0, hi = 1;
        for (int i = 0; i < 200; ++i) {
            const double mid = (lo + hi) / 2;
            (deCasteljau(0, w0, 1 - w1, 1, mid) < u ? lo : hi) = mid;
        }
        const double expected = deCasteljau(1, 1 + 3 * w0 * D, 5 + 1 * w1 * D, 5, lo);
        EXPECT_NEAR(at<double>(u * D), expected, 1e-6) << u;
    }
    // Extreme weights bend the time curve back on itself: never NaN.
    for (auto w : std::vector<std::vector<float>>{{0, 0, 0, 0}, {1, 1, 1, 1}, {3, 3, 3, 3}}) {
        weights.assign(w.begin(), w.end());
        for (double u = 0.01; u < 1; u += 0.07)
            EXPECT_FALSE(std::isnan(at<double>(u * D))) << w[1] << " " << u;
    }
    // Linear extrapolation continues along the end tangents.
    c.setAttribute(names::postExtrapolation, std::uint8_t(1));
    c.setAttribute(names::preExtrapolation, std::uint8_t(1));
    EXPECT_NEAR(at<double>(3), 5 + 0 * 1.0, 1e-9);
    EXPECT_NEAR(at<double>(-1), 1 - 0 * 1.0, 1e-9);
    tangents = {2, 3, -1, 4};
    EXPECT_NEAR(at<double>(3), 9, 1e-6);
    EXPECT_NEAR(at<double>(-1), -1, 1e-6);
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Channel, BadTangentsFallBackWithTheirLines) {
    base::AttribMap& c = keys<float>({0, 1}, {0.0f, 10.0f});
    c.setAttribute(names::interpolation, std::uint8_t(3));
    c.vecAttribute<float>(names::tangents)->items() = {1, 1}; // one per key
    EXPECT_FLOAT_EQ(at<float>(0.5), 5);
    EXPECT_EQ(logged("Missing or wrong tangents provided for the Bezier curve! Falling back to "
                     "linear interpolation!"),
              1u);
    c.vecAttribute<float>(names::tangents)->items() = {0, 0, 0, 0};
    c.vecAttribute<float>(names::weights)->items() = {0.3f};
    EXPECT_FLOAT_EQ(at<float>(0.5), 5); // flat tangents, weights ignored
    EXPECT_EQ(logged("Invalid tangent weights provided for the Bezier curve! The curve will not "
                     "work properly!"),
              1u);
}

TEST_F(Channel, SmoothAndPerKeyModes) {
    // Evenly spaced keys on a line: both smooth variants stay on it.
    base::AttribMap& c = keys<double>({0, 1, 2, 3}, {0.0, 10.0, 20.0, 30.0});
    c.setAttribute(names::interpolation, std::uint8_t(2));
    EXPECT_NEAR(at<double>(1.5), 15, 1e-6);
    EXPECT_NEAR(at<double>(0.25), 2.5, 1e-6);
    c.setAttribute(names::tightness, 0.0f);
    EXPECT_NEAR(at<double>(1.5), 15, 1e-6);
    c.setAttribute(names::tightness, 0.5); // stored as double: ignored
    EXPECT_NEAR(at<double>(2.5), 25, 1e-6);
    // A curve through unevenly timed keys passes its keys and stays finite.
    base::AttribMap& u = keys<double>({0, 0.1, 2, 2.05, 4}, {0.0, 5.0, -3.0, 8.0, 1.0});
    u.setAttribute(names::interpolation, std::uint8_t(2));
    for (float tightness : {0.0f, 0.5f, 1.0f}) {
        u.setAttribute(names::tightness, tightness);
        EXPECT_NEAR(at<double>(2.0 + 1e-7), -3, 1e-3);
        for (double s = 0; s <= 4; s += 0.013)
            EXPECT_TRUE(std::isfinite(at<double>(s))) << s;
    }
    // Per-key modes: the key that ends a segment decides it.
    base::AttribMap& k = keys<float>({0, 1, 2}, {0.0f, 10.0f, 20.0f});
    k.vecAttribute<std::uint8_t>(names::interpolation)->items() = {1, 0, 1};
    EXPECT_FLOAT_EQ(at<float>(0.5), 0);
    EXPECT_FLOAT_EQ(at<float>(1.5), 15);
    k.vecAttribute<std::uint8_t>(names::interpolation)->items() = {1, 1}; // short: linear
    EXPECT_FLOAT_EQ(at<float>(1.5), 15);
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Channel, ModesOutsideTheEnumerationThrow) {
    base::AttribMap& c = keys<float>({0, 1}, {0.0f, 10.0f});
    c.setAttribute(names::interpolation, std::uint8_t(4));
    EXPECT_THROW(at<float>(0.5), base::switch_exception);
    keys<float>({0, 1}, {0.0f, 10.0f}).vecAttribute<std::uint8_t>(names::interpolation)->items() = {
        1, 9};
    try {
        at<float>(0.5);
        ADD_FAILURE();
    } catch (const base::switch_exception& e) {
        EXPECT_EQ(std::string(e.function().c_str()), "scene::IKeyframeChannel::computeValue");
    }
}

TEST_F(Channel, DataProblemsAnswerZeroWithTheirLines) {
    struct Row {
        const char* what;
        std::vector<double> times;
        int values; // key count; -1: values absent, -2: values of another type
        const char* line;
    };
    const Row rows[] = {
        {"values of another type", {0, 1}, -2, "Incompatible 'values' type!"},
        {"no values", {0, 1}, -1, "Empty 'values' attribute detected!"},
        {"empty values", {0, 1}, 0, "Empty 'values' attribute detected!"},
        {"no times", {}, 2, "Empty 'times' attribute detected!"},
        {"counts differ", {0, 1, 2}, 2, "Different number of 'keys' and 'values' detected!"},
        {"times backwards", {0, 2, 1}, 3, "The 'times' attribute is not in ascending order!"},
    };
    for (const Row& r : rows) {
        log.clear();
        channel->removeAttribute(names::curves);
        base::AttribMap& c = curve();
        for (double t : r.times)
            c.appendAttributeItem(names::times, secs(t));
        if (r.values == -2)
            c.appendAttributeItem(names::values, 1.0);
        for (int i = 0; i < r.values; ++i)
            c.appendAttributeItem(names::values, float(i + 1));
        if (r.values == 0)
            c.vecAttribute<float>(names::values);
        EXPECT_EQ(at<float>(0.5), 0.0f) << r.what;
        EXPECT_EQ(at<float>(1.5), 0.0f) << r.what;
        // The order check is remembered: one line per curve, not per call.
        const std::size_t expected = std::string(r.what) == "times backwards" ? 1 : 2;
        EXPECT_EQ(logged(r.line), expected) << r.what;
    }
    log.clear();
    EXPECT_EQ(channel->computeValue<float>(7, secs(0)), 0.0f); // no such curve
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Channel, DegenerateTimesNeitherDivideByZeroNorOverflow) {
    // Keys sharing a time: the later key's value holds from then on.
    base::AttribMap& c = keys<double>({0, 1, 1, 2}, {0.0, 10.0, 20.0, 30.0});
    EXPECT_DOUBLE_EQ(at<double>(0.5), 5);
    EXPECT_DOUBLE_EQ(at<double>(1), 20);
    EXPECT_DOUBLE_EQ(at<double>(1.5), 25);
    c.setAttribute(names::interpolation, std::uint8_t(2));
    EXPECT_TRUE(std::isfinite(at<double>(0.9)));
    // A zero-length end segment has no slope to continue along.
    base::AttribMap& e = keys<double>({0, 1, 1}, {0.0, 10.0, 20.0});
    e.setAttribute(names::postExtrapolation, std::uint8_t(1));
    EXPECT_DOUBLE_EQ(at<double>(5), 20);

    const TimeCode extremes[] = {TimeCode(std::numeric_limits<std::int64_t>::max()),
                                 TimeCode(std::numeric_limits<std::int64_t>::min()),
                                 TimeCode(std::numeric_limits<std::int64_t>::min() + 1)};
    // One distinct time: cycling modes hold the value.
    base::AttribMap& one = keys<double>({3, 3}, {4.0, 6.0});
    for (std::uint8_t mode : {2, 3, 4}) {
        one.setAttribute(names::preExtrapolation, mode);
        one.setAttribute(names::postExtrapolation, mode);
        EXPECT_DOUBLE_EQ(at<double>(10), 6);
        EXPECT_DOUBLE_EQ(at<double>(-10), 4);
        for (TimeCode t : extremes)
            EXPECT_TRUE(std::isfinite(channel->computeValue<double>(0, t)));
    }
    // Far outside a short range: one mapping step lands inside it.
    base::AttribMap& range = keys<double>({-1e-3, 7e-3}, {0.0, 8.0});
    for (std::uint8_t mode : {1, 2, 3, 4}) {
        range.setAttribute(names::preExtrapolation, mode);
        range.setAttribute(names::postExtrapolation, mode);
        for (TimeCode t : extremes) {
            const double v = channel->computeValue<double>(0, t);
            EXPECT_FALSE(std::isnan(v)) << int(mode);
            if (mode == 2 || mode == 4) {
                EXPECT_TRUE(v >= 0 && v <= 8) << int(mode) << " " << v;
            }
        }
    }
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Channel, SetKeyKeepsTheCurveOrdered) {
    EXPECT_FALSE(channel->setKey(0, secs(1), 1.0f));
    EXPECT_EQ(logged("Trying to set a key without any curves!"), 1u);
    base::AttribMap& c = curve();
    EXPECT_TRUE(channel->setKey(0, secs(2), 20.0f));
    EXPECT_TRUE(channel->setKey(0, secs(0), 0.0f));
    EXPECT_TRUE(channel->setKey(0, secs(1), 99.0f));
    EXPECT_TRUE(channel->setKey(0, secs(1), 10.0f)); // replaces
    EXPECT_EQ(c.findVecAttribute<TimeCode>(names::times)->size(), 3u);
    EXPECT_FLOAT_EQ(at<float>(1.5), 15);
    EXPECT_FALSE(channel->setKey(0, secs(3), 1.0)); // the curve holds floats
    EXPECT_FALSE(channel->setKey(4, secs(3), 1.0f));
    EXPECT_EQ(logged("Wrong number of components in the curve!"), 2u);
}

// Playback keeps what it found about a curve between evaluations; every kind
// of change to the curve list, a curve map or its arrays must be seen by the
// next evaluation (and, under the sanitizers, never read freed storage).
TEST_F(Channel, EvaluationFollowsEveryChangeToTheCurves) {
    using base::vec3f;
    auto map = [&](std::vector<double> times, std::vector<float> values) {
        auto* m = new base::AttribMap(channel->attribFactory());
        for (double t : times)
            m->appendAttributeItem(names::times, secs(t));
        for (float v : values)
            m->appendAttributeItem(names::values, vec3f{v, v, v});
        return m;
    };
    auto curves = [&] { return channel->arrayAttribute(names::curves); };
    struct Row {
        const char* what;
        std::function<void(base::AttribMap&)> change;
        double time;
        double expected;
    };
    base::AttribMap inherited(channel->attribFactory());
    const Row rows[] = {
        {"times replaced",
         [&](base::AttribMap& c) {
             c.removeAttribute(names::times);
             c.appendAttributeItem(names::times, secs(0));
             c.appendAttributeItem(names::times, secs(2));
         },
         0.5, 2.5},
        {"times storage moved",
         [&](base::AttribMap& c) {
             auto& t = c.vecAttribute<TimeCode>(names::times)->items();
             t.shrink_to_fit();
             t.assign({secs(0), secs(4)});
         },
         1, 2.5},
        {"values replaced",
         [&](base::AttribMap& c) {
             c.removeAttribute(names::values);
             c.appendAttributeItem(names::values, vec3f{0, 0, 0});
             c.appendAttributeItem(names::values, vec3f{20, 20, 20});
         },
         0.5, 10},
        {"values of another type",
         [&](base::AttribMap& c) {
             c.removeAttribute(names::values);
             c.appendAttributeItem(names::values, 1.0);
             c.appendAttributeItem(names::values, 2.0);
         },
         0.5, 0},
        {"key appended",
         [&](base::AttribMap&) {
             channel->setKey(0, secs(2), vec3f{30, 30, 30});
         },
         1.5, 20},
        {"entry added, then changed in place",
         [&](base::AttribMap& c) {
             c.setAttribute(names::postExtrapolation, std::uint8_t(0));
             EXPECT_TRUE(allEqual(at<vec3f>(2), 10));
             c.setAttribute(names::postExtrapolation, std::uint8_t(1));
         },
         2, 20},
        {"unrelated entry swapped for an interpolation",
         [&](base::AttribMap& c) {
             c.removeAttribute(names::name);
             c.setAttribute(names::interpolation, std::uint8_t(0));
         },
         0.5, 0},
        {"curve given a base",
         [&](base::AttribMap& c) {
             inherited.setAttribute(names::postExtrapolation, std::uint8_t(1));
             c.setBase(&inherited);
         },
         3, 30},
        {"curve list replaced",
         [&](base::AttribMap&) {
             channel->removeAttribute(names::curves);
             curves()->append(map({0, 1}, {100, 200}));
         },
         0.5, 150},
        {"curve replaced in its slot",
         [&](base::AttribMap&) {
             curves()->setItem(0, map({0, 1}, {-10, -20}));
         },
         0.5, -15},
        {"curve inserted before",
         [&](base::AttribMap&) {
             curves()->insertItem(0, map({0, 1}, {1, 3}));
         },
         0.5, 2},
        {"curve destroyed, the next moves up", [&](base::AttribMap&) { curves()->removeItem(0); },
         0.25, 5},
        {"every curve destroyed",
         [&](base::AttribMap&) {
             curves()->removeItem(0);
             curves()->removeItem(0);
         },
         0.5, 0},
    };
    for (const Row& r : rows) {
        log.clear();
        channel->removeAttribute(names::curves);
        base::AttribMap& c = keys<vec3f>({0, 1}, {vec3f{0, 0, 0}, vec3f{10, 10, 10}});
        c.setAttribute(names::name, base::string("curve"));
        curves()->append(map({0, 1}, {5, 5})); // curve 1 is remembered apart
        EXPECT_TRUE(allEqual(at<vec3f>(0.5), 5)) << r.what;
        EXPECT_TRUE(allEqual(channel->computeValue<vec3f>(1, secs(0.5)), 5)) << r.what;
        r.change(c);
        EXPECT_TRUE(allEqual(at<vec3f>(r.time), r.expected)) << r.what;
        EXPECT_TRUE(allEqual(at<vec3f>(r.time), r.expected)) << r.what << " (again)";
        EXPECT_EQ(logged("Incompatible 'values' type!"),
                  std::string(r.what) == "values of another type" ? 2u : 0u)
            << r.what;
    }
}

// A layer whose one action plays a clip with a translation channel, linked
// into a node's "translate".
struct Layer : Channel {
    ref<IAnimLayer> layer;
    ref<IAnimClip> clip;
    ref<INode> node;
    base::AttribMap* action = nullptr;

    Layer() {
        keys<base::vec3d>({0, 1}, {base::vec3d{0, 0, 0}, base::vec3d{10, 20, 30}});
        clip = make<IAnimClip>(*factory, "animClip");
        clip->setAttribute(names::name, base::string("walk"));
        clip->vecAttribute<ref<IPlugin>>(names::keyframeChannels)->items().push_back(channel);
        clip->setAttribute(names::endTime, TimeCode(second));
        layer = make<IAnimLayer>(*factory, "animLayer");
        layer->setAttribute(names::name, base::string("L"));
        action = layer->arrayAttribute(names::actions)->appendMap();
        action->setAttribute(names::animClip, ref<IPlugin>(clip));
        layer->arrayAttribute(names::outputs);
        node = make<INode>(*factory, "node");
        base::AttribPath path;
        path.addPlugin(layer.get()).addMember(names::outputs).addItem(0);
        node->linkAttribute(names::translate)->setPath(path);
    }
    base::vec3d translate() { return scene::get(*node, names::translate, base::vec3d{-1, -1, -1}); }
    std::size_t layerLogged(const std::string& text) { return log.count("animLayer |L| " + text); }
};

TEST_F(Layer, NodeReadsTheChannelThroughTheLayer) {
    layer->setAttribute(names::time, secs(0.5));
    EXPECT_NEAR(translate().y, 10, 1e-9);
    layer->setAttribute(names::time, secs(0.25));
    EXPECT_NEAR(translate().z, 7.5, 1e-9);

    // playSpeed 50 and playAt 1 s: layer time 2 s plays the clip at 0.5 s.
    action->setAttribute(names::playSpeed, std::uint8_t(50));
    action->setAttribute(names::playAt, secs(1));
    layer->findAttributeMutable(names::actions, 2);
    layer->setAttribute(names::time, secs(2));
    EXPECT_NEAR(translate().x, 5, 1e-9);

    // A channel added to the clip (announced) becomes output 1.
    auto second = make<IKeyframeChannel>(*factory, "keyframeChannel");
    second->arrayAttribute(names::curves)->appendMap()->appendAttributeItem(names::values, 3.5f);
    clip->vecAttribute<ref<IPlugin>>(names::keyframeChannels)->items().push_back(second);
    clip->findAttributeMutable(names::keyframeChannels, 2);
    layer->evaluate();
    const auto* outputs = layer->findArray(names::outputs);
    ASSERT_EQ(outputs->size(), 2u);
    EXPECT_FLOAT_EQ(*static_cast<const float*>(outputs->item(1)->data()), 3.5f);
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Layer, BrokenClipsAreSkippedWithTheirLines) {
    auto empty = make<IKeyframeChannel>(*factory, "keyframeChannel"); // no curves
    auto noValues = make<IKeyframeChannel>(*factory, "keyframeChannel");
    noValues->setAttribute(names::name, base::string("nv"));
    noValues->arrayAttribute(names::curves)->appendMap();
    auto odd = make<IKeyframeChannel>(*factory, "keyframeChannel");
    odd->setAttribute(names::name, base::string("odd"));
    odd->arrayAttribute(names::curves)
        ->appendMap()
        ->appendAttributeItem(names::values, std::uint8_t(1));
    auto& list = clip->vecAttribute<ref<IPlugin>>(names::keyframeChannels)->items();
    list.push_back(ref<IPlugin>());
    list.push_back(empty);
    list.push_back(noValues);
    list.push_back(odd);
    clip->setAttribute(names::startTime, secs(2));
    layer->findAttributeMutable(names::actions, 2);
    layer->setAttribute(names::time, secs(1));
    EXPECT_NEAR(translate().z, 30, 1e-9); // the good channel still plays
    EXPECT_EQ(layerLogged("Negative animation clip duration!"), 1u);
    EXPECT_EQ(layerLogged("Animation clip 'walk' has no channel at index 1! Skipping calculation."),
              1u);
    EXPECT_EQ(layerLogged("Animation clip 'walk' has no keyframe assigned for channel at index 2! "
                          "Skipping calculation."),
              1u);
    EXPECT_EQ(layerLogged("Keyframe 'nv' has no valid data! Skipping calculation."), 1u);
    EXPECT_EQ(layerLogged("Keyframe 'odd' has unknown type! Skipping calculation."), 1u);

    layer->removeAttribute(names::time);
    layer->evaluate();
    EXPECT_EQ(layerLogged("is missing time attribute!"), 1u);
}

} // namespace

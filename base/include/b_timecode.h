// Scene time: a signed 64-bit tick count at 46186158000 ticks per second. The
// common frame rates (24, 25, 30, 48, 50, 60, 120 fps) divide the rate, so keys
// at whole frames land on whole ticks and compare exactly.
#pragma once

#include <cmath>
#include <compare>
#include <cstdint>
#include <limits>
#include <type_traits>

namespace base {

class TimeCode {
public:
    static constexpr std::int64_t ticksPerSecond = 46186158000;

    constexpr TimeCode() noexcept = default;
    constexpr explicit TimeCode(std::int64_t ticks) noexcept : m_ticks(ticks) {}

    // Rounds to the nearest tick, so seconds() -> fromSeconds() gives back the
    // same tick count. Seconds beyond the 64-bit range saturate; NaN is time 0.
    static TimeCode fromSeconds(double seconds) noexcept {
        const double ticks = std::round(seconds * double(ticksPerSecond));
        if (ticks != ticks)
            return TimeCode{};
        // 2^63 is exact in double; anything from there up does not fit.
        if (ticks >= 9223372036854775808.0)
            return TimeCode{kMax};
        if (ticks < -9223372036854775808.0)
            return TimeCode{kMin};
        return TimeCode{std::int64_t(ticks)};
    }

    constexpr std::int64_t ticks() const noexcept { return m_ticks; }
    // Multiplies by the reciprocal of the rate (not a division): keyframe
    // evaluation depends on this exact rounding.
    constexpr double seconds() const noexcept {
        return double(m_ticks) * (1.0 / double(ticksPerSecond));
    }

    // Saturating, so that times near the limits (the converters use the most
    // negative value for out-of-range source times) never wrap around.
    friend constexpr TimeCode operator+(TimeCode a, TimeCode b) noexcept {
        if (b.m_ticks > 0 && a.m_ticks > kMax - b.m_ticks)
            return TimeCode{kMax};
        if (b.m_ticks < 0 && a.m_ticks < kMin - b.m_ticks)
            return TimeCode{kMin};
        return TimeCode{a.m_ticks + b.m_ticks};
    }
    friend constexpr TimeCode operator-(TimeCode a, TimeCode b) noexcept {
        if (b.m_ticks < 0 && a.m_ticks > kMax + b.m_ticks)
            return TimeCode{kMax};
        if (b.m_ticks > 0 && a.m_ticks < kMin + b.m_ticks)
            return TimeCode{kMin};
        return TimeCode{a.m_ticks - b.m_ticks};
    }
    friend constexpr TimeCode operator-(TimeCode a) noexcept { return TimeCode{} - a; }
    constexpr TimeCode& operator+=(TimeCode b) noexcept { return *this = *this + b; }
    constexpr TimeCode& operator-=(TimeCode b) noexcept { return *this = *this - b; }

    friend constexpr auto operator<=>(const TimeCode&, const TimeCode&) = default;

private:
    static constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
    static constexpr std::int64_t kMin = std::numeric_limits<std::int64_t>::min();

    std::int64_t m_ticks = 0;
};

static_assert(sizeof(TimeCode) == 8 && std::is_standard_layout_v<TimeCode> &&
              std::is_trivially_copyable_v<TimeCode>);

} // namespace base

#include "b_frame.h"

#include <cmath>
#include <limits>

namespace base {

namespace {

template <class T>
bool finite(const base_vec3<T>& v) noexcept {
    return std::isfinite(v.x) && std::isfinite(v.y) && std::isfinite(v.z);
}

// The unit vector of the world axis least aligned with 'z' (x on ties).
template <class T>
base_vec3<T> leastAlignedAxis(const base_vec3<T>& z) noexcept {
    const T ax = std::fabs(z.x), ay = std::fabs(z.y), az = std::fabs(z.z);
    if (ax <= ay && ax <= az)
        return {T(1), T(0), T(0)};
    if (ay <= az)
        return {T(0), T(1), T(0)};
    return {T(0), T(0), T(1)};
}

// Divided by its largest component first, so that neither tiny nor huge
// vectors overflow or underflow on the way to unit length. Zero stays zero.
template <class T>
base_vec3<T> unit(const base_vec3<T>& v) noexcept {
    const T largest = std::fmax(std::fabs(v.x), std::fmax(std::fabs(v.y), std::fabs(v.z)));
    if (!(largest > T(0)))
        return {};
    const base_vec3<T> scaled = v / largest;
    return scaled / scaled.length();
}

} // namespace

template <class T>
base_mat33<T> lookAtFrame(const base_vec3<T>& direction, const base_vec3<T>& up) noexcept {
    if (!finite(direction))
        return base_mat33<T>::identity();
    const base_vec3<T> z = -unit(direction);
    if (z.lengthSquared() == T(0))
        return base_mat33<T>::identity();

    // Below this sine of the angle between up and direction, X would be the
    // normalised rounding noise of a near-zero cross product.
    const T parallel = std::sqrt(std::numeric_limits<T>::epsilon());
    base_vec3<T> x = finite(up) ? cross(unit(up), z) : base_vec3<T>{};
    if (!(x.length() > parallel))
        x = cross(leastAlignedAxis(z), z);
    x = unit(x);
    return base_mat33<T>::fromColumns(x, cross(z, x), z);
}

template <class T>
void base_camera<T>::setUp(const base_vec3<T>& up, bool fixed) noexcept {
    m_up = up;
    m_fixedUp = fixed;
}

template <class T>
void base_camera<T>::setViewDirection(const base_vec3<T>& direction) noexcept {
    // No direction to look along: the camera stays as it is.
    if (!finite(direction) || unit(direction).lengthSquared() == T(0))
        return;
    const base_mat33<T> frame = lookAtFrame(direction, m_up);
    m_orientation = base_quat<T>::fromMatrix(frame).normalized();
    if (!m_fixedUp)
        m_up = frame.column(1);
}

template <class T>
base_vec3<T> base_camera<T>::viewDirection() const noexcept {
    return m_orientation.rotate({T(0), T(0), T(-1)});
}

template <class T>
base_vec3<T> base_camera<T>::up() const noexcept {
    return m_orientation.rotate({T(0), T(1), T(0)});
}

template base_mat33<float> lookAtFrame(const base_vec3<float>&, const base_vec3<float>&) noexcept;
template base_mat33<double> lookAtFrame(const base_vec3<double>&,
                                        const base_vec3<double>&) noexcept;
template class base_camera<float>;
template class base_camera<double>;

} // namespace base

// The orientation of a camera or light from where it looks: a right-handed
// frame whose local -Z axis is the view direction and whose local Y axis is
// the up vector made perpendicular to it. Scene nodes store such frames as
// their rotation, so a camera or light carried by a node looks the right way.
//
// Degenerate input never yields NaN: a zero or non-finite direction keeps the
// identity, and an up vector that is zero, non-finite or parallel to the
// direction is replaced by the world axis least aligned with the direction.
#pragma once

#include "b_math.h"

namespace base {

// The frame's rotation matrix, columns X, Y, Z: Z = -direction / |direction|,
// X = (up x Z) / |up x Z|, Y = Z x X.
template <class T>
base_mat33<T> lookAtFrame(const base_vec3<T>& direction, const base_vec3<T>& up) noexcept;

// A camera's orientation kept while its view direction changes.
template <class T>
class base_camera {
public:
    // With 'fixed' set, every later view direction is framed with this up
    // vector; otherwise the up vector follows the camera (the Y axis of the
    // last frame), as when a user turns it by hand.
    void setUp(const base_vec3<T>& up, bool fixed) noexcept;
    // A zero or non-finite direction leaves the orientation unchanged.
    void setViewDirection(const base_vec3<T>& direction) noexcept;

    // w, x, y, z; the identity looks along -Z with Y up.
    const base_quat<T>& orientation() const noexcept { return m_orientation; }
    base_vec3<T> viewDirection() const noexcept;
    base_vec3<T> up() const noexcept;

private:
    base_quat<T> m_orientation = base_quat<T>::identity();
    base_vec3<T> m_up{T(0), T(1), T(0)};
    bool m_fixedUp = false;
};

extern template class base_camera<float>;
extern template class base_camera<double>;

} // namespace base

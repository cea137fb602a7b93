// The value-type vocabulary of the attribute core.
//
// Every type an attribute can hold is one row of BASE_VALUE_TYPES below: the C++
// type, its type-name text and its component-type code. The rows are expanded into
// TypeTraits<T> (the interned type names, the code and the size of one item in the
// binary form), into the attribute factory's registrations and into the explicit
// instantiations of TypedAttribute<T> / TypedVectorAttribute<T>, so a type is
// added in one place.
//
// Type names: the single value is the label ("vec3f"), the array is the label
// followed by "[]" ("vec3f[]"). The names are interned when base1 loads; nothing
// may read them during the static initialisation of base1 itself. The container
// names "map", "array" and "link" are interned on first use by their accessors.
//
// Component-type codes (componentType()):
//    0 int8     1 uint8    2 int16    3 uint16   4 bool     5 uint32
//    6 int      7 int64    8 uint64  10 float   11 double  12 string
//   -1 containers (map, array, link)
// Vectors, quaternions, boxes, matrices, colours and normals answer the code of
// their component; mat43 (float matrix, double translation) answers 10, the
// code of its matrix part. TimeCode is 7 (64-bit ticks). A plug-in reference
// answers 5.
//
// ValueFields<T> lists the components of a compound value in storage order, so
// text forms, comparisons and binary packing walk every compound the same way.
#pragma once

#include "b_math.h"
#include "b_memory.h"
#include "b_name.h"
#include "b_refcnt.h"
#include "b_timecode.h"

#include <cstdint>
#include <type_traits>

namespace base {

class IPlugin;

// X(type, label, component code). Types whose spelling holds a comma go through
// an alias (mat43).
#define BASE_VALUE_TYPES(X)                                                                        \
    X(bool, "bool", 4)                                                                             \
    X(std::int8_t, "int8", 0)                                                                      \
    X(std::uint8_t, "uint8", 1)                                                                    \
    X(std::int16_t, "int16", 2)                                                                    \
    X(std::uint16_t, "uint16", 3)                                                                  \
    X(std::int32_t, "int", 6)                                                                      \
    X(std::uint32_t, "uint32", 5)                                                                  \
    X(std::int64_t, "int64", 7)                                                                    \
    X(std::uint64_t, "uint64", 8)                                                                  \
    X(float, "float", 10)                                                                          \
    X(double, "double", 11)                                                                        \
    X(base_vec2<float>, "vec2f", 10)                                                               \
    X(base_vec3<float>, "vec3f", 10)                                                               \
    X(base_vec4<float>, "vec4f", 10)                                                               \
    X(base_vec2<double>, "vec2d", 11)                                                              \
    X(base_vec3<double>, "vec3d", 11)                                                              \
    X(base_vec4<double>, "vec4d", 11)                                                              \
    X(base_vec2<std::int8_t>, "vec2b", 0)                                                          \
    X(base_vec3<std::int8_t>, "vec3b", 0)                                                          \
    X(base_vec4<std::int8_t>, "vec4b", 0)                                                          \
    X(base_vec2<std::uint8_t>, "vec2ub", 1)                                                        \
    X(base_vec3<std::uint8_t>, "vec3ub", 1)                                                        \
    X(base_vec4<std::uint8_t>, "vec4ub", 1)                                                        \
    X(base_vec2<std::int16_t>, "vec2s", 2)                                                         \
    X(base_vec3<std::int16_t>, "vec3s", 2)                                                         \
    X(base_vec4<std::int16_t>, "vec4s", 2)                                                         \
    X(base_vec2<std::uint16_t>, "vec2us", 3)                                                       \
    X(base_vec3<std::uint16_t>, "vec3us", 3)                                                       \
    X(base_vec4<std::uint16_t>, "vec4us", 3)                                                       \
    X(base_vec2<std::int32_t>, "vec2i", 6)                                                         \
    X(base_vec3<std::int32_t>, "vec3i", 6)                                                         \
    X(base_vec4<std::int32_t>, "vec4i", 6)                                                         \
    X(base_vec2<std::uint32_t>, "vec2ui", 5)                                                       \
    X(base_vec3<std::uint32_t>, "vec3ui", 5)                                                       \
    X(base_vec4<std::uint32_t>, "vec4ui", 5)                                                       \
    X(base_quat<float>, "quatf", 10)                                                               \
    X(base_quat<double>, "quatd", 11)                                                              \
    X(base_box<base_vec3<float>>, "box3f", 10)                                                     \
    X(base_box<base_vec3<double>>, "box3d", 11)                                                    \
    X(base_mat22<float>, "mat22f", 10)                                                             \
    X(base_mat22<double>, "mat22d", 11)                                                            \
    X(mat43, "mat43", 10)                                                                          \
    X(base_color4<float>, "color4f", 10)                                                           \
    X(normal, "normal", 10)                                                                        \
    X(TimeCode, "TimeCode", 7)                                                                     \
    X(string, "string", 12)

// Reference types: named and coded here, their attribute classes live with the
// plug-in model.
#define BASE_REFERENCE_TYPES(X) X(ref<IPlugin>, "plugin", 5)

// Components of compound values in storage order: apply(v, f) calls f with every
// component as an lvalue (const when v is const) and answers f's result.
template <class T>
struct ValueFields;

template <class C>
struct ValueFields<base_vec2<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.x, v.y);
    }
};
template <class C>
struct ValueFields<base_vec3<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.x, v.y, v.z);
    }
};
template <class C>
struct ValueFields<base_vec4<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.x, v.y, v.z, v.w);
    }
};
template <class C>
struct ValueFields<base_quat<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.w, v.x, v.y, v.z);
    }
};
template <class C>
struct ValueFields<base_color4<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.r, v.g, v.b, v.a);
    }
};
template <>
struct ValueFields<normal> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.x, v.y, v.z);
    }
};
template <class C>
struct ValueFields<base_mat22<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.m[0][0], v.m[0][1], v.m[1][0], v.m[1][1]);
    }
};
template <class C>
struct ValueFields<base_mat33<C>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return f(v.m[0][0], v.m[0][1], v.m[0][2], v.m[1][0], v.m[1][1], v.m[1][2], v.m[2][0],
                 v.m[2][1], v.m[2][2]);
    }
};
// Minimum corner, then maximum corner.
template <class P>
struct ValueFields<base_box<P>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return ValueFields<P>::apply(v.min, [&](auto&... lo) -> decltype(auto) {
            return ValueFields<P>::apply(
                v.max, [&](auto&... hi) -> decltype(auto) { return f(lo..., hi...); });
        });
    }
};
// Matrix rows, then the translation; the padding between them is no component.
template <class T, class P, class M>
struct ValueFields<base_mat43<T, P, M>> {
    template <class V, class F>
    static constexpr decltype(auto) apply(V& v, F&& f) {
        return ValueFields<M>::apply(v.m, [&](auto&... m) -> decltype(auto) {
            return ValueFields<base_vec3<P>>::apply(
                v.t, [&](auto&... t) -> decltype(auto) { return f(m..., t...); });
        });
    }
};

template <class T>
concept CompoundValue = requires(T& v) {
    ValueFields<T>::apply(v, [](auto&...) {});
};

namespace detail {

template <class T>
constexpr std::uint32_t fieldBytes() {
    T v{};
    return ValueFields<T>::apply(v, [](auto&... c) { return std::uint32_t((sizeof(c) + ...)); });
}

// Bytes of one item in the binary form; 0 for variable-length items (strings).
template <class T>
constexpr std::uint32_t itemBinarySize() {
    if constexpr (std::is_same_v<T, string>)
        return 0;
    else if constexpr (std::is_same_v<T, ref<IPlugin>>)
        return 8;
    else if constexpr (CompoundValue<T>)
        return fieldBytes<T>();
    else
        return sizeof(T);
}

} // namespace detail

// Defined only for the vocabulary: any other T fails to compile.
template <class T>
struct TypeTraits;

#define BASE_DECLARE_TYPE_TRAITS(T, label, code)                                                   \
    template <>                                                                                    \
    struct TypeTraits<T> {                                                                         \
        using type = T;                                                                            \
        static const name_id n_name;                                                               \
        static const name_id n_array_name;                                                         \
        static constexpr const char* text = label;                                                 \
        static constexpr std::int8_t componentType = code;                                         \
        static constexpr std::uint32_t itemSize = detail::itemBinarySize<T>();                     \
    };
BASE_VALUE_TYPES(BASE_DECLARE_TYPE_TRAITS)
BASE_REFERENCE_TYPES(BASE_DECLARE_TYPE_TRAITS)
#undef BASE_DECLARE_TYPE_TRAITS

template <class T>
concept VocabularyType = requires {
    TypeTraits<T>::n_name;
};

// Container type names, interned on first use.
name_id mapTypeName();
name_id arrayTypeName();
name_id linkTypeName();

} // namespace base

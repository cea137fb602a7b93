#include "b_type_traits.h"

namespace base {

// Interned while base1 loads, so every later reader finds them set.
#define BASE_DEFINE_TYPE_NAMES(T, label, code)                                                     \
    const name_id TypeTraits<T>::n_name(label);                                                    \
    const name_id TypeTraits<T>::n_array_name(label "[]");
BASE_VALUE_TYPES(BASE_DEFINE_TYPE_NAMES)
BASE_REFERENCE_TYPES(BASE_DEFINE_TYPE_NAMES)
#undef BASE_DEFINE_TYPE_NAMES

// Function-local statics rather than constants: callers may need them while
// other libraries are still being initialised.
name_id mapTypeName() {
    static const name_id name("map");
    return name;
}

name_id arrayTypeName() {
    static const name_id name("array");
    return name;
}

name_id linkTypeName() {
    static const name_id name("link");
    return name;
}

} // namespace base

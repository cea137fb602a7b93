// The value classes of the whole vocabulary, compiled once.
#include "b_attribute.h"

namespace base {

#define BASE_INSTANTIATE_ATTRIBUTES(T, label, code)                                                \
    template class TypedAttribute<T>;                                                              \
    template class TypedVectorAttribute<T>;
BASE_VALUE_TYPES(BASE_INSTANTIATE_ATTRIBUTES)
#undef BASE_INSTANTIATE_ATTRIBUTES

} // namespace base

// The scene schema in C++: the process-wide name constants, the schema structs
// `scene::<type>_schema` and a runtime table of every row, all expanded from
// scene_schema.def and scene_importer_schema.def.
//
// A schema struct holds no data. For its type it answers type(); for each
// attribute it declares, in table order, <attr>() with the attribute's name and,
// when the attribute has a default, <attr>Default() with a fresh value. Structs
// derive from their base struct, so an attribute of a base is reached through
// every derived struct.
//
// Name constants are null until init_schema_names() (and, for the option sets,
// init_importer_schema_names() / init_exporter_schema_names()) has run; the
// module runs them when it loads, before anything reads a schema name.
#pragma once

#include "b_math.h"
#include "b_memory.h"
#include "b_name.h"
#include "b_timecode.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <variant>

// Preprocessor helpers for the row expansions below.
#define SCENE_PP_CAT(a, b) SCENE_PP_CAT_(a, b)
#define SCENE_PP_CAT_(a, b) a##b
#define SCENE_PP_SECOND(...) SCENE_PP_SECOND_(__VA_ARGS__)
#define SCENE_PP_SECOND_(a, b, ...) b
#define SCENE_PP_UNPAREN(...) __VA_ARGS__
// 1 when the argument is parenthesised (a default value), 0 for NODEFAULT.
#define SCENE_PP_HAS_PARENS(x) SCENE_PP_SECOND(SCENE_PP_PAREN_PROBE x, 0, ~)
#define SCENE_PP_PAREN_PROBE(...) ~, 1
// 1 for the base `none`, 0 for a struct name.
#define SCENE_PP_IS_NONE(x) SCENE_PP_SECOND(SCENE_PP_CAT(SCENE_PP_NONE_PROBE_, x), 0, ~)
#define SCENE_PP_NONE_PROBE_none ~, 1
#define SCENE_PP_IF(c, t, f) SCENE_PP_CAT(SCENE_PP_IF_, c)(t, f)
#define SCENE_PP_IF_0(t, f) f
#define SCENE_PP_IF_1(t, f) t

namespace scene {

// Value-type labels of the rows. `name` is the base library's type-name text:
// "" for an untyped attribute, alternatives separated by '|' where a reader must
// accept more than one type. Labels that can carry a default also name the C++
// type that holds the value.
namespace schema_label {

#define SCENE_SCHEMA_LABEL(label, cpp, text)                                                       \
    struct l_##label {                                                                             \
        using type = cpp;                                                                          \
        static constexpr std::string_view name = text;                                             \
    };
#define SCENE_SCHEMA_LABEL_NO_VALUE(label, text)                                                   \
    struct l_##label {                                                                             \
        static constexpr std::string_view name = text;                                             \
    };

SCENE_SCHEMA_LABEL(bool, bool, "bool")
SCENE_SCHEMA_LABEL(byte, std::uint8_t, "uint8")
SCENE_SCHEMA_LABEL(uint8, std::uint8_t, "uint8")
SCENE_SCHEMA_LABEL(uint16, std::uint16_t, "uint16")
SCENE_SCHEMA_LABEL(uint32, std::uint32_t, "uint32")
SCENE_SCHEMA_LABEL(int, std::int32_t, "int")
SCENE_SCHEMA_LABEL(float, float, "float")
SCENE_SCHEMA_LABEL(double, double, "double")
SCENE_SCHEMA_LABEL(vec2f, base::vec2f, "vec2f")
SCENE_SCHEMA_LABEL(vec3f, base::vec3f, "vec3f")
SCENE_SCHEMA_LABEL(vec4f, base::vec4f, "vec4f")
SCENE_SCHEMA_LABEL(vec3d, base::vec3d, "vec3d")
SCENE_SCHEMA_LABEL(vec2i, base::vec2i, "vec2i")
SCENE_SCHEMA_LABEL(quatf, base::quatf, "quatf")
SCENE_SCHEMA_LABEL(box3d, base::box3d, "box3d")
SCENE_SCHEMA_LABEL(string, base::string, "string")
SCENE_SCHEMA_LABEL(TimeCode, base::TimeCode, "TimeCode")

SCENE_SCHEMA_LABEL_NO_VALUE(plugin, "plugin")
SCENE_SCHEMA_LABEL_NO_VALUE(plugin_array, "plugin[]")
SCENE_SCHEMA_LABEL_NO_VALUE(map_array, "array")
SCENE_SCHEMA_LABEL_NO_VALUE(array, "array")
SCENE_SCHEMA_LABEL_NO_VALUE(uint8_array, "uint8[]")
SCENE_SCHEMA_LABEL_NO_VALUE(uint16_array, "uint16[]")
SCENE_SCHEMA_LABEL_NO_VALUE(uint32_array, "uint32[]")
SCENE_SCHEMA_LABEL_NO_VALUE(float_array, "float[]")
SCENE_SCHEMA_LABEL_NO_VALUE(vec2f_array, "vec2f[]")
SCENE_SCHEMA_LABEL_NO_VALUE(vec3f_array, "vec3f[]")
SCENE_SCHEMA_LABEL_NO_VALUE(vec4f_array, "vec4f[]")
SCENE_SCHEMA_LABEL_NO_VALUE(normal_array, "normal[]")
SCENE_SCHEMA_LABEL_NO_VALUE(box3f_array, "box3f[]")
SCENE_SCHEMA_LABEL_NO_VALUE(mat43_array, "mat43[]")
SCENE_SCHEMA_LABEL_NO_VALUE(TimeCode_array, "TimeCode[]")
SCENE_SCHEMA_LABEL_NO_VALUE(uint16_or_uint16_array, "uint16|uint16[]")
SCENE_SCHEMA_LABEL_NO_VALUE(uint8_or_uint16, "uint8|uint16")
SCENE_SCHEMA_LABEL_NO_VALUE(uint8_or_uint16_array, "uint8[]|uint16[]")
// Keyframe values: an array of whichever type the channel evaluates.
SCENE_SCHEMA_LABEL_NO_VALUE(channel_array, "int[]|float[]|double[]|quatf[]|quatd[]|vec2f[]|vec2d[]|"
                                           "vec3f[]|vec3d[]|vec4f[]|vec4d[]")
SCENE_SCHEMA_LABEL_NO_VALUE(untyped, "")

#undef SCENE_SCHEMA_LABEL
#undef SCENE_SCHEMA_LABEL_NO_VALUE

} // namespace schema_label

// One process-wide constant per distinct text; a text that several structs or
// both the core schema and an option set use is one constant.
namespace names {
#define SCHEMA_NAME(ident, text) extern base::name_id ident;
#include "scene_schema.def"
#define SCHEMA_NAME(ident, text) extern base::name_id ident;
#include "scene_importer_schema.def"
} // namespace names

// These build declarations token by token; keep them one per line.
// clang-format off
#define SCENE_SCHEMA_INHERIT_plain public
#define SCENE_SCHEMA_INHERIT_virtual public virtual
#define SCENE_SCHEMA_BASE_CLAUSE(b, inheritance) \
    SCENE_PP_IF(SCENE_PP_IS_NONE(b), , : SCENE_SCHEMA_INHERIT_##inheritance b##_schema)
#define SCENE_SCHEMA_DEFAULT_FN(ident, label, value) \
    SCENE_PP_CAT(SCENE_SCHEMA_DEFAULT_FN_, SCENE_PP_HAS_PARENS(value))(ident, label, value)
#define SCENE_SCHEMA_DEFAULT_FN_0(ident, label, value)
#define SCENE_SCHEMA_DEFAULT_FN_1(ident, label, value) \
    static ::scene::schema_label::l_##label::type ident##Default() { \
        return ::scene::schema_label::l_##label::type{SCENE_PP_UNPAREN value}; \
    }

#define SCENE_SCHEMA_STRUCT_DECL(s, b, inheritance) \
    struct s##_schema SCENE_SCHEMA_BASE_CLAUSE(b, inheritance) { \
        static ::base::name_id type() noexcept { return ::scene::names::s; }
#define SCENE_SCHEMA_ATTR_DECL(s, ident, label, value) \
    static ::base::name_id ident() noexcept { return ::scene::names::ident; } \
    SCENE_SCHEMA_DEFAULT_FN(ident, label, value)
#define SCENE_SCHEMA_END_DECL(s) };
// clang-format on

#define SCHEMA_STRUCT SCENE_SCHEMA_STRUCT_DECL
#define SCHEMA_ATTR SCENE_SCHEMA_ATTR_DECL
#define SCHEMA_END SCENE_SCHEMA_END_DECL
#include "scene_schema.def"
#define SCHEMA_STRUCT SCENE_SCHEMA_STRUCT_DECL
#define SCHEMA_ATTR SCENE_SCHEMA_ATTR_DECL
#define SCHEMA_END SCENE_SCHEMA_END_DECL
#include "scene_importer_schema.def"

// A default value of any label that can carry one.
using SchemaValue =
    std::variant<bool, std::uint8_t, std::uint16_t, std::uint32_t, std::int32_t, float, double,
                 base::vec2f, base::vec3f, base::vec4f, base::vec3d, base::vec2i, base::quatf,
                 base::box3d, base::string, base::TimeCode>;

// One attribute row.
struct SchemaAttr {
    const base::name_id* structSlot;
    const base::name_id* nameSlot;
    std::string_view structText;
    std::string_view nameText;
    // Type-name text (see schema_label); "" when untyped.
    std::string_view label;
    // The label as written in the row ("byte", "int", "map_array", ...).
    std::string_view declared;
    // Builds a fresh default on each call; null when the attribute has none.
    SchemaValue (*makeDefault)();

    base::name_id structType() const noexcept { return *structSlot; }
    base::name_id name() const noexcept { return *nameSlot; }
    bool hasDefault() const noexcept { return makeDefault != nullptr; }
    bool untyped() const noexcept { return label.empty(); }
    // Whether a stored value of this type name fits the attribute; an untyped
    // attribute takes any.
    bool accepts(std::string_view typeName) const noexcept;
};

// One struct with the attributes it declares itself (not those of its base).
struct SchemaStruct {
    const base::name_id* typeSlot;
    std::string_view typeText;
    const base::name_id* baseSlot; // null without a base
    std::string_view baseText;     // "" without a base
    bool virtualBase;
    std::span<const SchemaAttr> attributes;

    base::name_id type() const noexcept { return *typeSlot; }
    base::name_id baseType() const noexcept { return baseSlot ? *baseSlot : base::name_id(); }
};

// A name of a name set and the constant that receives it.
struct SchemaName {
    base::name_id* slot;
    std::string_view text;

    base::name_id id() const noexcept { return *slot; }
};

// A command-line switch of an importer option: "-" and the option's name, one
// value of `valueType`, and its help text.
struct SchemaCommandLine {
    const base::name_id* attrSlot;
    std::string_view option;
    std::string_view valueType;
    std::string_view help;

    base::name_id attribute() const noexcept { return *attrSlot; }
};

// Interns the 584 names of the scene schema. Safe to call again.
void init_schema_names();
// Interns the 34 names of "sceneImporter" (its type and 33 options).
void init_importer_schema_names();
// Interns the names of "sceneExporter" (its type and 16 options).
void init_exporter_schema_names();

// Core schema: every struct of the scene model in table order, and all their
// attribute rows in one table (struct after struct).
std::span<const SchemaStruct> schemaStructs() noexcept;
std::span<const SchemaAttr> schemaTable() noexcept;
// Option sets: "sceneImporter", then "sceneExporter".
std::span<const SchemaStruct> optionSchemaStructs() noexcept;
std::span<const SchemaAttr> optionSchemaTable() noexcept;

// The name sets that the init functions intern.
std::span<const SchemaName> schemaNames() noexcept;
std::span<const SchemaName> importerSchemaNames() noexcept;
std::span<const SchemaName> exporterSchemaNames() noexcept;

// The importer's command-line switches, in registration order.
std::span<const SchemaCommandLine> importerCommandLineOptions() noexcept;

} // namespace scene

#undef SCENE_SCHEMA_BASE_CLAUSE
#undef SCENE_SCHEMA_STRUCT_DECL
#undef SCENE_SCHEMA_ATTR_DECL
#undef SCENE_SCHEMA_END_DECL
#undef SCENE_SCHEMA_DEFAULT_FN
#undef SCENE_SCHEMA_DEFAULT_FN_0
#undef SCENE_SCHEMA_DEFAULT_FN_1
#undef SCENE_SCHEMA_INHERIT_plain
#undef SCENE_SCHEMA_INHERIT_virtual

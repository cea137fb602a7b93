// Expands the schema rows into the name constants, the name sets that the init
// functions intern, and the runtime tables. All tables are constant data built
// at compile time; a struct whose attribute rows are out of place fails the
// build.
#include "scene_schema.h"

#include <array>
#include <mutex>
#include <type_traits>

namespace scene {

namespace names {
#define SCHEMA_NAME(ident, text) base::name_id ident;
#include "scene_schema.def"
#define SCHEMA_NAME(ident, text) base::name_id ident;
#include "scene_importer_schema.def"
} // namespace names

namespace {

// The text of every ident, so rows can name texts that differ from their ident.
namespace text {
#define SCHEMA_NAME(ident, text) constexpr std::string_view ident = text;
#include "scene_schema.def"
#define SCHEMA_NAME(ident, text) constexpr std::string_view ident = text;
#include "scene_importer_schema.def"
} // namespace text

// An ident is its text, or its text and "_" where the text is no usable C++ name.
constexpr bool identMatches(std::string_view ident, std::string_view text) {
    return ident == text ||
           (ident.size() == text.size() + 1 && ident.starts_with(text) && ident.ends_with('_'));
}
#define SCHEMA_NAME(ident, text) static_assert(identMatches(#ident, text));
#include "scene_schema.def"
#define SCHEMA_NAME(ident, text) static_assert(identMatches(#ident, text));
#include "scene_importer_schema.def"

template <auto F>
SchemaValue makeDefault() {
    using T = std::invoke_result_t<decltype(F)>;
    return SchemaValue(std::in_place_type<T>, F());
}

struct StructRow {
    const base::name_id* type;
    std::string_view typeText;
    const base::name_id* base;
    std::string_view baseText;
    bool virtualBase;
};

// A name of a set together with the struct whose rows brought it in.
struct OwnedName {
    std::string_view owner;
    SchemaName name;
};

#define SCENE_SCHEMA_VIRTUAL_plain false
#define SCENE_SCHEMA_VIRTUAL_virtual true
#define SCENE_SCHEMA_STRUCT_ROW(s, b, inheritance)                                                 \
    StructRow{&names::s, text::s, SCENE_PP_IF(SCENE_PP_IS_NONE(b), nullptr, &names::b),            \
              SCENE_PP_IF(SCENE_PP_IS_NONE(b), std::string_view(), text::b),                       \
              SCENE_SCHEMA_VIRTUAL_##inheritance},
#define SCENE_SCHEMA_MAKER_0(s, ident) nullptr
#define SCENE_SCHEMA_MAKER_1(s, ident) &makeDefault<&s##_schema::ident##Default>
#define SCENE_SCHEMA_ATTR_ROW(s, ident, label, value)                                              \
    SchemaAttr{&names::s,                                                                          \
               &names::ident,                                                                      \
               text::s,                                                                            \
               text::ident,                                                                        \
               schema_label::l_##label::name,                                                      \
               #label,                                                                             \
               SCENE_PP_CAT(SCENE_SCHEMA_MAKER_, SCENE_PP_HAS_PARENS(value))(s, ident)},
#define SCENE_SCHEMA_NAME_ROW(ident, text_) SchemaName{&names::ident, text::ident},
#define SCENE_SCHEMA_OWNED_TYPE(s, b, inheritance) OwnedName{text::s, {&names::s, text::s}},
#define SCENE_SCHEMA_OWNED_ATTR(s, ident, label, value)                                            \
    OwnedName{text::s, {&names::ident, text::ident}},

constexpr SchemaName kCoreNames[] = {
#define SCHEMA_NAME SCENE_SCHEMA_NAME_ROW
#include "scene_schema.def"
};

constexpr StructRow kCoreStructRows[] = {
#define SCHEMA_STRUCT SCENE_SCHEMA_STRUCT_ROW
#include "scene_schema.def"
};

constexpr SchemaAttr kCoreAttrs[] = {
#define SCHEMA_ATTR SCENE_SCHEMA_ATTR_ROW
#include "scene_schema.def"
};

constexpr StructRow kOptionStructRows[] = {
#define SCHEMA_STRUCT SCENE_SCHEMA_STRUCT_ROW
#include "scene_importer_schema.def"
};

constexpr SchemaAttr kOptionAttrs[] = {
#define SCHEMA_ATTR SCENE_SCHEMA_ATTR_ROW
#include "scene_importer_schema.def"
};

// The option sets' names are their type and the names of their attributes,
// so they include the texts they share with the core schema.
constexpr OwnedName kOptionNames[] = {
#define SCHEMA_STRUCT SCENE_SCHEMA_OWNED_TYPE
#define SCHEMA_ATTR SCENE_SCHEMA_OWNED_ATTR
#include "scene_importer_schema.def"
};

// The ident of a switch names the option, so its text is "-" and the ident;
// the assertion keeps the two from drifting apart.
#define SCHEMA_CMDLINE(ident, kind, help) static_assert(text::ident == std::string_view(#ident));
#include "scene_importer_schema.def"

constexpr SchemaCommandLine kCommandLine[] = {
#define SCHEMA_CMDLINE(ident, kind, help)                                                          \
    SchemaCommandLine{&names::ident, "-" #ident, schema_label::l_##kind::name, help},
#include "scene_importer_schema.def"
};

#undef SCENE_SCHEMA_VIRTUAL_plain
#undef SCENE_SCHEMA_VIRTUAL_virtual
#undef SCENE_SCHEMA_STRUCT_ROW
#undef SCENE_SCHEMA_MAKER_0
#undef SCENE_SCHEMA_MAKER_1
#undef SCENE_SCHEMA_ATTR_ROW
#undef SCENE_SCHEMA_NAME_ROW
#undef SCENE_SCHEMA_OWNED_TYPE
#undef SCENE_SCHEMA_OWNED_ATTR

// Gives each struct the run of attribute rows that follows it. Rows of one
// struct must be contiguous and in struct order; otherwise the constant
// evaluation reaches the throw and the build fails.
template <std::size_t N, std::size_t M>
constexpr std::array<SchemaStruct, N> bindStructs(const StructRow (&rows)[N],
                                                  const SchemaAttr (&attrs)[M]) {
    std::array<SchemaStruct, N> out{};
    std::size_t next = 0;
    for (std::size_t i = 0; i < N; ++i) {
        const std::size_t first = next;
        while (next < M && attrs[next].structText == rows[i].typeText)
            ++next;
        out[i] = SchemaStruct{
            rows[i].type,        rows[i].typeText,
            rows[i].base,        rows[i].baseText,
            rows[i].virtualBase, std::span<const SchemaAttr>(attrs + first, next - first)};
    }
    if (next != M)
        throw "attribute rows outside their struct";
    return out;
}

template <std::size_t M>
constexpr std::size_t countOwned(const OwnedName (&rows)[M], std::string_view owner) {
    std::size_t n = 0;
    for (const auto& row : rows)
        n += row.owner == owner;
    return n;
}

template <std::size_t N, std::size_t M>
constexpr std::array<SchemaName, N> namesOf(const OwnedName (&rows)[M], std::string_view owner) {
    std::array<SchemaName, N> out{};
    std::size_t n = 0;
    for (const auto& row : rows)
        if (row.owner == owner)
            out[n++] = row.name;
    return out;
}

constexpr auto kCoreStructs = bindStructs(kCoreStructRows, kCoreAttrs);
constexpr auto kOptionStructs = bindStructs(kOptionStructRows, kOptionAttrs);
constexpr auto kImporterNames =
    namesOf<countOwned(kOptionNames, text::sceneImporter)>(kOptionNames, text::sceneImporter);
constexpr auto kExporterNames =
    namesOf<countOwned(kOptionNames, text::sceneExporter)>(kOptionNames, text::sceneExporter);

// Names are interned once per process: interning again would store the same
// records, and doing it once keeps later calls from writing constants that
// other threads may be reading.
void intern(std::span<const SchemaName> set) {
    for (const auto& name : set)
        *name.slot = base::name_id(name.text);
}

std::once_flag coreOnce, importerOnce, exporterOnce;

} // namespace

bool SchemaAttr::accepts(std::string_view typeName) const noexcept {
    if (label.empty())
        return true;
    std::string_view rest = label;
    while (!rest.empty()) {
        const auto bar = rest.find('|');
        if (rest.substr(0, bar) == typeName)
            return true;
        rest = bar == std::string_view::npos ? std::string_view() : rest.substr(bar + 1);
    }
    return false;
}

void init_schema_names() {
    std::call_once(coreOnce, [] { intern(kCoreNames); });
}

void init_importer_schema_names() {
    std::call_once(importerOnce, [] { intern(kImporterNames); });
}

void init_exporter_schema_names() {
    std::call_once(exporterOnce, [] { intern(kExporterNames); });
}

std::span<const SchemaStruct> schemaStructs() noexcept {
    return kCoreStructs;
}
std::span<const SchemaAttr> schemaTable() noexcept {
    return kCoreAttrs;
}
std::span<const SchemaStruct> optionSchemaStructs() noexcept {
    return kOptionStructs;
}
std::span<const SchemaAttr> optionSchemaTable() noexcept {
    return kOptionAttrs;
}
std::span<const SchemaName> schemaNames() noexcept {
    return kCoreNames;
}
std::span<const SchemaName> importerSchemaNames() noexcept {
    return kImporterNames;
}
std::span<const SchemaName> exporterSchemaNames() noexcept {
    return kExporterNames;
}
std::span<const SchemaCommandLine> importerCommandLineOptions() noexcept {
    return kCommandLine;
}

} // namespace scene

#include "scene_cmdline.h"

#include "scene_schema.h"

#include <optional>
#include <utility>
#include <variant>

namespace scene {

namespace {

// The enumerations' texts; see scene_cmdline.h.
void addChoices(base::CmdLineOption& option, base::name_id attribute) {
    if (attribute == names::importNormals || attribute == names::importTangents)
        option.setChoices(
            {{"none", 0}, {"off", 0}, {"file", 1}, {"import", 1}, {"compute", 2}, {"generate", 2}});
    else if (attribute == names::importMultiIndex)
        option.setChoices({{"off", 0}, {"on", 1}, {"auto", 2}});
    else if (attribute == names::computeNormalsMethod || attribute == names::computeTangentsMethod)
        option.setChoices({{"default", 0}});
    else if (attribute == names::upAxis)
        option.setChoices({{"x", 0}, {"y", 1}, {"z", 2}});
}

base::CmdLineOption* addOption(base::CmdLineOptions& options, std::string_view name,
                               std::string_view valueType, std::string_view help) {
    if (valueType == "bool")
        return options.addValue<bool>(name, {}, help);
    if (valueType == "float")
        return options.addValue<float>(name, {}, help);
    return options.addValue<base::string>(name, {}, help);
}

const SchemaStruct* findStruct(base::name_id type) {
    for (auto table : {schemaStructs(), optionSchemaStructs()})
        for (const SchemaStruct& s : table)
            if (s.type() == type)
                return &s;
    return nullptr;
}

// A value of the type a label names, for attributes without a default.
template <std::size_t... I>
std::optional<SchemaValue> sampleOf(std::string_view label, std::index_sequence<I...>) {
    std::optional<SchemaValue> out;
    auto one = [&]<std::size_t Index>(std::integral_constant<std::size_t, Index>) {
        using T = std::variant_alternative_t<Index, SchemaValue>;
        if (!out && base::TypeTraits<T>::n_name.view() == label)
            out.emplace(std::in_place_index<Index>);
    };
    (one(std::integral_constant<std::size_t, I>{}), ...);
    return out;
}

std::optional<SchemaValue> sampleOf(const SchemaAttr& row) {
    if (row.hasDefault())
        return row.makeDefault();
    return sampleOf(row.label, std::make_index_sequence<std::variant_size_v<SchemaValue>>{});
}

} // namespace

void register_importer_options(base::CmdLineOptions& options) {
    init_schema_names();
    init_importer_schema_names();
    for (const SchemaCommandLine& row : importerCommandLineOptions())
        if (base::CmdLineOption* option = addOption(options, row.option, row.valueType, row.help))
            addChoices(*option, row.attribute());
}

void register_scene_options(base::CmdLineOptions& options) {
    init_schema_names();
    if (base::CmdLineOption* option = addOption(options, "-upAxis", "string", "Set the up axis."))
        addChoices(*option, names::upAxis);
}

bool apply_command_line(const base::CmdLineOptions& options, base::AttribMap& object,
                        base::name_id schemaType, base::string& error) {
    base::vector<std::pair<base::name_id, SchemaValue>> values;
    for (const SchemaStruct* s = findStruct(schemaType); s; s = findStruct(s->baseType())) {
        for (const SchemaAttr& row : s->attributes) {
            base::string optionName("-");
            optionName += row.nameText;
            const base::CmdLineOption* option = options.find(optionName);
            if (!option || !option->isSet())
                continue;
            std::optional<SchemaValue> value = sampleOf(row);
            if (!value)
                continue;
            std::string_view text;
            if (!option->texts().empty())
                text = option->texts().front();
            else if (option->valueType() == "bool")
                text = "true";
            else
                continue;
            const bool converted = std::visit(
                [&](auto& v) { return base::convertOptionText(*option, text, v, error); }, *value);
            if (!converted)
                return false;
            values.emplace_back(row.name(), std::move(*value));
        }
        if (!s->baseSlot)
            break;
    }
    for (const auto& [name, value] : values)
        std::visit([&](const auto& v) { object.setAttribute(name, v); }, value);
    return true;
}

} // namespace scene

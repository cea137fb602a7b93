#include "b_plugin_factory.h"

#include "b_exception.h"

#include <array>
#include <utility>

namespace base {

namespace {

using Operation = PluginPatch::Operation;

constexpr std::array<std::pair<const char*, Operation>, 12> operations{{
    {"SetAttr", Operation::SetAttr},
    {"SetOutputAttr", Operation::SetOutputAttr},
    {"RemoveAttr", Operation::RemoveAttr},
    {"SetAttribItem", Operation::SetAttribItem},
    {"InsertAttribItem", Operation::InsertAttribItem},
    {"Clear", Operation::Clear},
    {"RemoveAttribItem", Operation::RemoveAttribItem},
    {"SetAttrFlags", Operation::SetAttrFlags},
    {"ClearAttrFlags", Operation::ClearAttrFlags},
    {"AddPlugin", Operation::AddPlugin},
    {"RemovePlugin", Operation::RemovePlugin},
    {"Defragment", Operation::Defragment},
}};

} // namespace

PluginPatch::PluginPatch(std::string_view name, PluginPatch* parent)
    : m_name(name), m_parent(parent) {}

PluginPatch::Operation PluginPatch::operation(std::string_view name) {
    for (const auto& [text, op] : operations)
        if (name == text)
            return op;
    BASE_THROW(exception, "Invalid patch operation!");
}

const char* PluginPatch::operationName(Operation operation) noexcept {
    for (const auto& [text, op] : operations)
        if (op == operation)
            return text;
    return "";
}

} // namespace base

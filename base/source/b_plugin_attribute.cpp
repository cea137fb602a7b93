#include "b_plugin_attribute.h"

#include "b_plugin_factory.h"
#include "b_string_convert.h"

namespace base {

template class TypedAttribute<ref<IPlugin>>;
template class TypedVectorAttribute<ref<IPlugin>>;

void ValueOps<ref<IPlugin>>::appendText(string& out, const ref<IPlugin>& v) {
    if (!v) {
        out += "null";
        return;
    }
    const string name = v->name(true);
    if (name.empty())
        appendUnsigned(out, v->instanceId());
    else
        out += name;
}

namespace {

// One reference from its text. On success 'value' holds the object (or is
// empty) and 'pending' the id still to restore (invalidPluginId for none).
bool parseReference(std::string_view text, PluginFactory* factory, ref<IPlugin>& value,
                    std::uint32_t& pending) {
    const char* p = text.data();
    const char* end = p + text.size();
    const char* first = convert_detail::skipBlanks(p, end);
    if (first != end && *first >= '0' && *first <= '9') {
        std::uint32_t id;
        try {
            stringToValue(p, end, id);
            if (convert_detail::skipBlanks(p, end) != end)
                return false;
        } catch (const string_conversion_exception&) {
            return false;
        }
        if (!factory) {
            value.reset();
            pending = id;
            return true;
        }
        ref<IPlugin> found = factory->plugin(id);
        if (!found)
            return false;
        value = std::move(found);
        pending = invalidPluginId;
        return true;
    }
    if (factory) {
        if (ref<IPlugin> found = factory->findPlugin(text)) {
            value = std::move(found);
            pending = invalidPluginId;
            return true;
        }
    }
    // The text form of an empty reference.
    if (text == "null") {
        value.reset();
        pending = invalidPluginId;
        return true;
    }
    return false;
}

} // namespace

// ---- PluginAttribute --------------------------------------------------------------

Attribute* PluginAttribute::clone() const {
    auto* copy = new PluginAttribute(m_value);
    copy->m_id = m_id;
    copy->m_flags = m_flags;
    return copy;
}

bool PluginAttribute::write(Stream& stream, std::uint32_t index) const {
    return Attribute::write(stream, index) && stream.writeValue(id());
}

bool PluginAttribute::read(Stream& stream, std::uint32_t) {
    std::uint8_t flagsByte;
    std::uint32_t id;
    if (!readFlagsByte(stream, flagsByte) || !stream.readValue(id))
        return false;
    m_value.reset();
    m_id = id;
    applyFlagsByte(flagsByte);
    return true;
}

bool PluginAttribute::copyFrom(const Attribute& source, std::uint32_t mode, std::uint32_t) {
    if (!(mode & 1) || source.typeName() != typeName())
        return false;
    m_value = *static_cast<const ref<IPlugin>*>(source.data(wholeValue));
    const auto* other = dynamic_cast<const PluginAttribute*>(&source);
    m_id = other ? other->m_id : invalidPluginId;
    return true;
}

bool PluginAttribute::fromString(std::string_view text) {
    return fromString(text, m_value ? m_value->factory() : nullptr);
}

bool PluginAttribute::fromString(std::string_view text, PluginFactory* factory) {
    ref<IPlugin> value;
    std::uint32_t pending = invalidPluginId;
    if (!parseReference(text, factory, value, pending))
        return false;
    m_value = std::move(value);
    m_id = pending;
    return true;
}

void PluginAttribute::setData(const void* value, std::uint32_t) {
    setValue(*static_cast<const ref<IPlugin>*>(value));
}

void PluginAttribute::setValue(ref<IPlugin> value) {
    m_value = std::move(value);
    m_id = invalidPluginId;
}

std::uint32_t PluginAttribute::id() const noexcept {
    return m_value ? m_value->instanceId() : m_id;
}

// ---- PluginVectorAttribute ----------------------------------------------------------

Attribute* PluginVectorAttribute::clone() const {
    auto* copy = new PluginVectorAttribute(m_items);
    copy->m_ids = m_ids;
    copy->m_flags = m_flags;
    return copy;
}

std::uint32_t PluginVectorAttribute::id(std::uint32_t index) const noexcept {
    if (index < m_items.size() && m_items[index])
        return m_items[index]->instanceId();
    return index < m_ids.size() ? m_ids[index] : invalidPluginId;
}

bool PluginVectorAttribute::write(Stream& stream, std::uint32_t index) const {
    if (index != wholeValue)
        return index < m_items.size() && Attribute::write(stream, index) &&
               stream.writeValue(id(index));
    const auto count = std::uint32_t(m_items.size());
    if (!Attribute::write(stream, index) || !stream.writeValue(count))
        return false;
    vector<std::uint32_t> ids(count);
    for (std::uint32_t i = 0; i < count; ++i)
        ids[i] = id(i);
    return stream.writeAll(ids.data(), std::uint64_t(count) * 4);
}

bool PluginVectorAttribute::read(Stream& stream, std::uint32_t index) {
    std::uint8_t flagsByte;
    if (index != wholeValue) {
        std::uint32_t id;
        if (index >= m_items.size() || !readFlagsByte(stream, flagsByte) || !stream.readValue(id))
            return false;
        m_ids.resize(m_items.size(), invalidPluginId);
        m_items[index].reset();
        m_ids[index] = id;
    } else {
        std::uint32_t count;
        ArrayOf<std::uint32_t> ids;
        // The ids arrive before any item is made, so a corrupt count cannot
        // allocate more than the data holds.
        if (!readFlagsByte(stream, flagsByte) || !stream.readValue(count) ||
            !attr_detail::readItems<std::uint32_t>(stream, count, ids))
            return false;
        vector_type items(count);
        m_items.swap(items);
        m_ids.swap(ids);
    }
    applyFlagsByte(flagsByte);
    return true;
}

bool PluginVectorAttribute::removeItem(std::uint32_t index) {
    if (!TypedVectorAttribute::removeItem(index))
        return false;
    if (index < m_ids.size())
        m_ids.erase(m_ids.begin() + index);
    return true;
}

bool PluginVectorAttribute::copyFrom(const Attribute& source, std::uint32_t mode,
                                     std::uint32_t index) {
    if (!TypedVectorAttribute::copyFrom(source, mode, index))
        return false;
    const auto* other = dynamic_cast<const PluginVectorAttribute*>(&source);
    if (index == wholeValue) {
        m_ids = other ? other->m_ids : vector<std::uint32_t>();
    } else if (index < m_ids.size()) {
        m_ids[index] = other && index < other->m_ids.size() ? other->m_ids[index] : invalidPluginId;
    }
    return true;
}

bool PluginVectorAttribute::fromString(std::string_view text) {
    PluginFactory* factory = nullptr;
    for (const auto& item : m_items)
        if (item && (factory = item->factory()))
            break;
    return fromString(text, factory);
}

bool PluginVectorAttribute::fromString(std::string_view text, PluginFactory* factory) {
    vector_type items;
    vector<std::uint32_t> ids;
    const char* p = text.data();
    const char* end = p + text.size();
    while ((p = convert_detail::skipBlanks(p, end)) != end) {
        const char* tokenEnd = p;
        while (tokenEnd != end && !isBlank(*tokenEnd))
            ++tokenEnd;
        ref<IPlugin> value;
        std::uint32_t pending = invalidPluginId;
        if (!parseReference(std::string_view(p, std::size_t(tokenEnd - p)), factory, value,
                            pending))
            return false;
        items.push_back(std::move(value));
        ids.push_back(pending);
        p = tokenEnd;
    }
    m_items.swap(items);
    m_ids.swap(ids);
    return true;
}

void PluginVectorAttribute::setData(const void* value, std::uint32_t index) {
    TypedVectorAttribute::setData(value, index);
    if (index == wholeValue)
        m_ids.clear();
    else if (index < m_ids.size())
        m_ids[index] = invalidPluginId;
}

void registerPluginAttributeTypes(AttribFactory& factory) {
    factory.registerType(TypeTraits<ref<IPlugin>>::n_name, &AttribFactory::make<PluginAttribute>);
    factory.registerType(TypeTraits<ref<IPlugin>>::n_array_name,
                         &AttribFactory::make<PluginVectorAttribute>);
}

} // namespace base

// The buffer adapter: typed outputs over a byte range of a buffer.
//
// The byte output over a whole buffer (the case of every embedded image) is a
// view: a link to the buffer's "data", so the bytes are held once and readers
// always reach the buffer's current array (a replaced or reallocated "data" is
// found again through the link; a dead buffer leaves the link unresolved,
// never dangling). The other outputs, and the byte output over part of a
// buffer, are copies of the range: the base library's arrays always own their
// storage, so a sub-range or a reinterpretation cannot be presented in place.
// Each run replaces the whole copy, so no output keeps bytes of an earlier run.
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"

#include <algorithm>
#include <cstring>
#include <iterator>

namespace scene {

namespace {

using PluginRef = ::base::ref<::base::IPlugin>;

// The bytes one run presents.
struct Range {
    ::base::IPlugin* buffer;
    const std::uint8_t* bytes; // the first byte of the range
    std::size_t length;
    bool whole; // the range is all of the buffer's data
};

// Refills the output 'name' when the adapter holds it as an array of T.
template <class T>
bool present(IBufferAdapter& adapter, ::base::name_id name, const Range& range) {
    ::base::Attribute* output = adapter.findEntry(name);
    if (!output || output->typeName() != ::base::TypeTraits<T>::n_array_name)
        return false;
    ::base::ArrayOf<T> items(range.length / sizeof(T));
    if (!items.empty())
        std::memcpy(static_cast<void*>(items.data()), range.bytes, items.size() * sizeof(T));
    // Swapping gives back the old storage instead of keeping its capacity.
    static_cast<::base::TypedVectorAttribute<T>*>(output)->items().swap(items);
    return true;
}

// The byte output: a view of the whole buffer, else a copy of the range. A
// link found there is the view of an earlier run.
bool presentBytes(IBufferAdapter& adapter, ::base::name_id name, const Range& range) {
    ::base::Attribute* output = adapter.findEntry(name);
    if (!output)
        return false;
    if (range.whole) {
        if (!output->asLink() &&
            output->typeName() != ::base::TypeTraits<std::uint8_t>::n_array_name)
            return false;
        ::base::AttribPath path;
        path.addPlugin(range.buffer).addMember(names::data);
        adapter.attribute(name, new ::base::AttribLink(path));
        return true;
    }
    if (output->asLink())
        adapter.attribute(name, new ::base::TypedVectorAttribute<std::uint8_t>());
    return present<std::uint8_t>(adapter, name, range);
}

// The outputs in the order they are filled and announced.
struct Output {
    const ::base::name_id* name;
    bool (*present)(IBufferAdapter&, ::base::name_id, const Range&);
};
constexpr Output outputs[] = {
    {&names::outputUint8, &presentBytes},
    {&names::outputUint16, &present<std::uint16_t>},
    {&names::outputUint32, &present<std::uint32_t>},
    {&names::outputFloat, &present<float>},
    {&names::outputFloat2, &present<::base::vec2f>},
    {&names::outputFloat3, &present<::base::vec3f>},
    {&names::outputFloat4, &present<::base::vec4f>},
};

bool isInput(::base::name_id attribute) {
    return attribute.empty() || attribute == names::inputBuffer ||
           attribute == names::inputOffset || attribute == names::inputLength;
}

} // namespace

IBufferAdapter::IBufferAdapter(::base::IPluginDesc* descriptor, ::base::PluginFactory* factory,
                               std::uint32_t id)
    : ::base::IPlugin(descriptor, factory, id) {}

IBufferAdapter::~IBufferAdapter() {
    if (auto* watched = static_cast<::base::RefCntAtomic*>(m_buffer.watched))
        watched->removeWeak(m_buffer);
}

void IBufferAdapter::watchBuffer(::base::IPlugin* buffer) {
    auto* watched = static_cast<::base::RefCntAtomic*>(m_buffer.watched);
    ::base::IPlugin* current = watched ? static_cast<::base::IPlugin*>(watched) : nullptr;
    if (current == buffer)
        return;
    if (current) {
        current->removeListener(*this);
        current->removeWeak(m_buffer);
    }
    if (buffer) {
        buffer->addListener(*this);
        buffer->addWeak(m_buffer);
    }
}

void IBufferAdapter::update() {
    update(::base::PluginCallback::nextChangeStamp());
}

void IBufferAdapter::update(std::uint64_t stamp) {
    m_lastStamp = stamp;
    const PluginRef* input = findAttribute<PluginRef>(names::inputBuffer);
    if (!input || !*input) {
        watchBuffer(nullptr);
        ::base::logFormatted(::base::logScene, ::base::logWarning,
                             "bufferAdapter |{}| Missing `inputBuffer` attribute!", name());
        return;
    }
    ::base::IPlugin& buffer = **input;
    watchBuffer(&buffer);
    const auto* data = buffer.findVecAttribute<std::uint8_t>(names::data);
    if (!data) {
        ::base::logFormatted(::base::logScene, ::base::logWarning,
                             "bufferAdapter |{}| Missing `data` attribute in {}!", name(),
                             buffer.name());
        return;
    }

    const std::size_t size = data->size();
    const std::size_t offset = std::min<std::size_t>(get(*this, names::inputOffset, 0u), size);
    const std::size_t length =
        std::min<std::size_t>(get(*this, names::inputLength, 0xFFFFFFFFu), size - offset);
    const Range range{&buffer, data->data() + offset, length, offset == 0 && length == size};

    // Every output is filled before any listener hears of one: a listener
    // may change or drop the buffer, and its bytes must not be read after.
    bool filled[std::size(outputs)];
    for (std::size_t i = 0; i < std::size(outputs); ++i)
        filled[i] = outputs[i].present(*this, *outputs[i].name, range);
    for (std::size_t i = 0; i < std::size(outputs); ++i)
        if (filled[i])
            notify(*outputs[i].name, ::base::PluginCallback::changeKind, stamp);
}

void IBufferAdapter::pluginChanged(::base::IPlugin& plugin, ::base::name_id attribute,
                                   std::uint32_t kind, std::uint64_t identifier) {
    const bool change = kind == ::base::PluginCallback::changeKind;
    // The same change may arrive along two ways; run once for it.
    if (change && identifier == m_lastStamp)
        return;
    // Of its own attributes only the inputs matter; the outputs are its own
    // work.
    if (&plugin == this && !isInput(attribute))
        return;
    update(change && identifier ? identifier : ::base::PluginCallback::nextChangeStamp());
}

base::Attribute* IBufferAdapter::clone() const {
    ::base::Attribute* copy = ::base::IPlugin::clone();
    // A copy must listen to the buffer as well.
    if (auto* adapter = dynamic_cast<IBufferAdapter*>(copy))
        adapter->update();
    return copy;
}

} // namespace scene

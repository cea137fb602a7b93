#include "b_plugin.h"

#include "b_plugin_factory.h"

#include <algorithm>
#include <atomic>
#include <mutex>

namespace base {

namespace {

// One lock for every listener list: registrations change rarely, and a single
// lock cannot deadlock between a plug-in and a listener that die together.
std::mutex g_listenerMutex;

template <class T>
bool eraseOne(vector<T*>& list, const T* item) noexcept {
    auto it = std::find(list.begin(), list.end(), item);
    if (it == list.end())
        return false;
    list.erase(it);
    return true;
}

} // namespace

// ---- PluginCallback -----------------------------------------------------------

std::uint64_t PluginCallback::nextChangeStamp() noexcept {
    static std::atomic<std::uint64_t> stamp{0};
    return stamp.fetch_add(1, std::memory_order_relaxed) + 1;
}

PluginCallback::~PluginCallback() {
    std::lock_guard guard(g_listenerMutex);
    for (IPlugin* source : m_sources)
        eraseOne(source->m_listeners, this);
}

// ---- IPlugin ------------------------------------------------------------------

IPlugin::IPlugin(IPluginDesc* descriptor, PluginFactory* factory, std::uint32_t id)
    : AttribMap(factory ? factory->attributeFactory() : &::base::attribFactory()),
      m_descriptor(descriptor), m_factory(factory), m_instanceId(id) {
    // An object outside the instance table must learn of its factory's death.
    if (factory && id == invalidPluginId)
        factory->trackUnregistered(this);
}

IPlugin::~IPlugin() {
    {
        std::lock_guard guard(g_listenerMutex);
        for (PluginCallback* listener : m_listeners)
            eraseOne(listener->m_sources, this);
        m_listeners.clear();
    }
    while (InterfaceNode* node = m_interfaces) {
        m_interfaces = node->next;
        delete node;
    }
    if (m_factory && m_instanceId == invalidPluginId)
        m_factory->forgetUnregistered(this);
}

Attribute* IPlugin::clone() const {
    if (m_descriptor && m_factory) {
        ref<IPlugin> copy =
            m_factory->create(m_descriptor->typeName(),
                              PluginFactory::createNullIfUnknown | PluginFactory::createLocked);
        if (copy) {
            copy->copyFrom(*this, 0);
            return copy.detach();
        }
    }
    return AttribMap::clone();
}

name_id IPlugin::className() const {
    return m_descriptor ? m_descriptor->typeName() : name_id();
}

void IPlugin::attributeChanged(name_id name, Attribute*, std::uint32_t) {
    if (m_factory)
        m_factory->attributeChanged(*this, name);
    else
        notify(name, PluginCallback::changeKind, PluginCallback::nextChangeStamp());
}

IPluginInterface* IPlugin::queryInterface(name_id type) const {
    ReadGuard guard(m_pluginLock);
    for (const InterfaceNode* node = m_interfaces; node; node = node->next)
        if (node->item->typeName() == type)
            return node->item;
    return nullptr;
}

string IPlugin::name(bool withTypeFallback) const {
    if (const string* own = findAttribute<string>(nameAttributeName()); own && !own->empty())
        return *own;
    if (withTypeFallback && m_descriptor)
        return string(m_descriptor->typeName().view());
    return {};
}

void IPlugin::addInterface(IPluginInterface* item) {
    if (!item)
        return;
    auto* node = new InterfaceNode;
    node->item = item;
    node->next = nullptr;
    WriteGuard guard(m_pluginLock);
    InterfaceNode** tail = &m_interfaces;
    while (*tail)
        tail = &(*tail)->next;
    *tail = node;
}

bool IPlugin::addListener(PluginCallback& listener) {
    std::lock_guard guard(g_listenerMutex);
    if (std::find(m_listeners.begin(), m_listeners.end(), &listener) != m_listeners.end())
        return false;
    m_listeners.push_back(&listener);
    try {
        listener.m_sources.push_back(this);
    } catch (...) {
        m_listeners.pop_back();
        throw;
    }
    return true;
}

bool IPlugin::removeListener(PluginCallback& listener) {
    std::lock_guard guard(g_listenerMutex);
    if (!eraseOne(m_listeners, &listener))
        return false;
    eraseOne(listener.m_sources, this);
    return true;
}

bool IPlugin::hasListener(const PluginCallback& listener) const {
    std::lock_guard guard(g_listenerMutex);
    return std::find(m_listeners.begin(), m_listeners.end(), &listener) != m_listeners.end();
}

void IPlugin::notify(name_id attribute, std::uint32_t kind, std::uint64_t identifier) {
    vector<PluginCallback*> listeners;
    {
        std::lock_guard guard(g_listenerMutex);
        if (m_listeners.empty())
            return;
        listeners = m_listeners;
    }
    // A listener may drop the last reference to this object.
    ref<IPlugin> keepAlive(refCount() ? this : nullptr);
    for (PluginCallback* listener : listeners) {
        // Listeners removed (or destroyed) by an earlier one are skipped.
        {
            std::lock_guard guard(g_listenerMutex);
            if (std::find(m_listeners.begin(), m_listeners.end(), listener) == m_listeners.end())
                continue;
        }
        listener->pluginChanged(*this, attribute, kind, identifier);
    }
}

// ---- IPluginDesc --------------------------------------------------------------

IPluginDesc::IPluginDesc() : m_typeName("Plugin") {}

IPluginDesc::~IPluginDesc() = default;

IPlugin* IPluginDesc::create(PluginFactory& factory, std::uint32_t id) {
    return new IPlugin(this, &factory, id);
}

void IPluginDesc::registerOptions(CmdLineOptions&) {}

} // namespace base

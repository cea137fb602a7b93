// Plug-in objects: everything an import produces is an IPlugin, an attribute
// map with an atomic strong count, the descriptor of its type, the factory that
// made it and its instance id in that factory.
//
// The object's name is its string attribute "name" (found with the map's lookup
// rules, so links and inheritance apply). name(true) falls back to the type
// name when there is none; toString() answers that form.
//
// Interfaces: a plug-in class exposes extra operations by attaching
// IPluginInterface objects (usually itself, through a second base); callers
// find them with queryInterface(type name). The plug-in does not own them.
//
// Change notification: a plug-in keeps a list of listeners (PluginCallback).
// notify(attribute, kind, identifier) calls each of them. The factory sends
// kind changeKind with a fresh stamp from nextChangeStamp() when an attribute
// is prepared for change through findAttributeMutable(name, flags with bit 1);
// listeners that re-run on a change (buffer adapters, animation layers)
// propagate the stamp they received, so a change that reaches a listener along
// two ways can be recognised by its identifier and handled once. Registration
// is two-sided: a listener or a plug-in that dies leaves the other's list, so
// neither ever calls or touches a dead object. Notifications run on the
// caller's thread; a listener may add or remove listeners while it is called.
//
// Lifetime: the descriptor is held with a strong reference, so a plug-in that
// outlives its factory still knows its type. The factory pointer turns null
// when the factory dies (see PluginFactory).
#pragma once

#include "b_attrib_map.h"
#include "b_lock.h"
#include "b_memory.h"
#include "b_name.h"
#include "b_refcnt.h"

#include <cstdint>
#include <string_view>

namespace base {

class CmdLineOptions;
class IPlugin;
class IPluginDesc;
class PluginFactory;

// The instance id of an object that is not in its factory's instance table.
inline constexpr std::uint32_t invalidPluginId = 0xFFFFFFFFu;

class IPluginInterface {
public:
    virtual ~IPluginInterface() = default;
    // The interface's type name, matched by IPlugin::queryInterface.
    virtual name_id typeName() const = 0;
    // The plug-in the interface belongs to, when it knows it.
    virtual IPlugin* interfaceOwner() const { return nullptr; }
};

// Receives the notifications of the plug-ins it listens to. Destroying a
// listener takes it off every plug-in's list.
class PluginCallback {
public:
    // The kind the factory sends when an attribute is about to change.
    static constexpr std::uint32_t changeKind = 2;

    // 'attribute' names what changed (may be null); 'kind' and 'identifier'
    // are the sender's (see changeKind).
    virtual void pluginChanged(IPlugin& plugin, name_id attribute, std::uint32_t kind,
                               std::uint64_t identifier) = 0;

    // A process-wide stamp, never 0 and never repeated.
    static std::uint64_t nextChangeStamp() noexcept;

protected:
    PluginCallback() = default;
    // A copy listens to nothing.
    PluginCallback(const PluginCallback&) : PluginCallback() {}
    PluginCallback& operator=(const PluginCallback&) { return *this; }
    ~PluginCallback();

private:
    friend class IPlugin;
    vector<IPlugin*> m_sources;
};

class IPlugin : public AttribMap, public RefCntAtomic {
public:
    // A plug-in of 'descriptor's type made by 'factory' (its attribute factory
    // creates the entries) under 'id'. Without a factory the process-wide
    // attribute factory is used.
    IPlugin(IPluginDesc* descriptor, PluginFactory* factory, std::uint32_t id);
    // A plug-in without type or factory.
    IPlugin() : IPlugin(nullptr, nullptr, invalidPluginId) {}
    // Leaves every listener and the factory's bookkeeping; frees the interface
    // list (not the interfaces).
    ~IPlugin() override;

    // ---- AttribMap ----
    // With a descriptor and a factory: a new object of the same type from the
    // factory (create flags 1 and 4) holding clones of this object's entries,
    // answered with one strong reference taken. Otherwise a plain map clone.
    Attribute* clone() const override;
    string toString() const override { return name(true); }
    // The descriptor's type name; null without a descriptor.
    name_id className() const override;
    LockWord* pluginLock() const override { return &m_pluginLock; }
    // Hands the change to the factory (or notifies directly without one).
    void attributeChanged(name_id name, Attribute* attribute, std::uint32_t flags) override;
    std::uint32_t instanceId() const override { return m_instanceId; }

    // ---- Plug-in operations ----
    // The first attached interface whose typeName() is 'type', or null.
    virtual IPluginInterface* queryInterface(name_id type) const;
    virtual void setFlagBit10() { setFlag(flagPluginBit10); }
    // Called by whoever filled the object from stored data, once it is
    // complete; classes whose stored form is packed unpack it here.
    virtual void postLoad() {}
    // Reserved for subclasses; nothing in the core calls them.
    virtual void reservedHook1() {}
    virtual void reservedHook2() {}
    virtual void reservedHook3() {}

    // The "name" string attribute; without one, the type name when
    // 'withTypeFallback' is set, else "".
    string name(bool withTypeFallback = false) const;

    IPluginDesc* descriptor() const noexcept { return m_descriptor.get(); }
    // Null when the plug-in was made without a factory or the factory died.
    PluginFactory* factory() const noexcept { return m_factory; }

    // Attaches an interface (kept in attachment order); the caller keeps it
    // alive as long as the plug-in. A null interface is ignored.
    void addInterface(IPluginInterface* item);

    // Listeners. Adding one twice keeps one entry; answers whether it was added.
    bool addListener(PluginCallback& listener);
    // Answers whether it was listening.
    bool removeListener(PluginCallback& listener);
    bool hasListener(const PluginCallback& listener) const;
    // Calls every listener (in the order they were added) with this plug-in.
    void notify(name_id attribute, std::uint32_t kind, std::uint64_t identifier);

private:
    friend class PluginFactory;
    friend class PluginCallback;

    struct InterfaceNode : AllocObject<> {
        IPluginInterface* item;
        InterfaceNode* next;
    };

    InterfaceNode* m_interfaces = nullptr;
    ref<IPluginDesc> m_descriptor;
    PluginFactory* m_factory;
    std::uint32_t m_instanceId;
    mutable LockWord m_pluginLock{0};
    vector<PluginCallback*> m_listeners;
};

// Describes one plug-in type: its name, how to make an object of it and the
// command-line options it adds. Held by the factory's descriptor table.
class IPluginDesc : public RefCntAtomic, public AllocObject<>, NonCopyable {
public:
    // Set on the placeholder descriptors the factory makes for unknown types.
    static constexpr std::uint32_t flagPlaceholder = 0x80000000u;
    static constexpr std::uint32_t signatureValue = 0xBAAD;

    // The type name is "Plugin" until a subclass sets its own.
    IPluginDesc();
    ~IPluginDesc() override;

    // A new object of the type with a zero strong count, storing this
    // descriptor, the factory and the id. The base makes a plain IPlugin.
    virtual IPlugin* create(PluginFactory& factory, std::uint32_t id);
    // Adds the type's command-line options; none by default.
    virtual void registerOptions(CmdLineOptions& options);

    name_id typeName() const noexcept { return m_typeName; }
    std::uint32_t flags() const noexcept { return m_flags; }
    bool isPlaceholder() const noexcept { return (m_flags & flagPlaceholder) != 0; }
    // The legal text of the code behind the type (the importer stores its
    // library's here).
    const string& legalText() const noexcept { return m_legalText; }
    void setLegalText(std::string_view text) { m_legalText.assign(text.data(), text.size()); }
    const string& extraText() const noexcept { return m_extraText; }
    void setExtraText(std::string_view text) { m_extraText.assign(text.data(), text.size()); }
    std::uint32_t signature() const noexcept { return m_signature; }

protected:
    void setTypeName(name_id type) noexcept { m_typeName = type; }
    void setFlags(std::uint32_t flags) noexcept { m_flags = flags; }

private:
    std::uint32_t m_reserved = 0;
    std::uint32_t m_flags = 0;
    name_id m_typeName;
    string m_legalText;
    void* m_reservedPointer = nullptr;
    string m_extraText;
    std::uint32_t m_signature = signatureValue;
};

// The descriptor the factory makes for a type it does not know.
class DummyPluginDesc : public IPluginDesc {
public:
    explicit DummyPluginDesc(name_id type) {
        setTypeName(type);
        setFlags(flagPlaceholder);
    }
};

// A descriptor whose objects are of class P, constructible as
// P(IPluginDesc*, PluginFactory*, std::uint32_t id).
template <class P>
class PluginDescOf : public IPluginDesc {
public:
    explicit PluginDescOf(name_id type) { setTypeName(type); }
    explicit PluginDescOf(std::string_view type) : PluginDescOf(name_id(type)) {}
    IPlugin* create(PluginFactory& factory, std::uint32_t id) override {
        return new P(this, &factory, id);
    }
};

} // namespace base

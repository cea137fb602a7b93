// The plug-in factory: type names to descriptors, and the instance table of the
// objects it made.
//
// create(type, flags):
//   createNullIfUnknown (1)  an unregistered type answers null (after the log line)
//   createReportUnknown (2)  an unregistered type is logged; without bit 1 a
//                            placeholder object is made
//   createLocked        (4)  accepted for callers that create from several
//                            threads; the table is always changed under the
//                            factory's critical section
//   createUnregistered  (8)  the object stays out of the instance table, gets
//                            id invalidPluginId and lives as long as its refs
// An unregistered type is logged (error, system channel) as
// "plugin factory {name}| Unable to create plugin of type {type}!" followed by
// " Creating a general plugin with limited functionality..." when a placeholder
// is made. Placeholder descriptors (DummyPluginDesc) are made once per type.
// Ids are consecutive: the first free slot at the end of the table. A
// descriptor whose create throws or answers null leaves no object behind: its
// slot is given back, or stays empty when objects that the descriptor made on
// the way already follow it. Exceptions of a descriptor propagate.
//
// Lifetime: each table slot holds one strong reference. When the last
// reference to the factory goes, it first forgets itself in every object it
// made (factory() turns null), then empties the attribute maps of the objects
// in its table, then drops its references. Emptying the maps breaks every
// cycle formed through plug-in references (objects referring to each other,
// or to themselves, through their attributes), so destroying the factory frees
// every object that only the factory and its own objects kept alive, in any
// order. An object still referenced from outside survives as an empty map
// that keeps its descriptor and id. Objects made with createUnregistered are
// not emptied (only their owners decide their life); references held in C++
// members of plug-in classes are not seen and must not form cycles.
//
// Unique names: uniqueName(base) answers 'base' when no object of the factory
// carries that name, else the trailing digits of 'base' are cut and a counter
// starting at their value + 1 (1 without digits) is appended until the name is
// free: node, node1, node2; Arm2, Arm3. The answer is not reserved: it counts
// once an object carries it. Only objects in the instance table count. The set
// of names is kept up to date incrementally from the objects registered since
// the last one found named (unnamed objects at the end of the table are looked
// at again on the next request), and a name an object drops stays taken. The
// counter search resumes where the previous search with the same stem and
// start stopped, so naming many objects alike stays linear.
#pragma once

#include "b_attrib_map.h"
#include "b_lock.h"
#include "b_memory.h"
#include "b_name.h"
#include "b_plugin.h"
#include "b_refcnt.h"

#include <cstdint>
#include <mutex>
#include <string_view>
#include <unordered_map>
#include <unordered_set>

namespace base {

// Enumerates objects by instance id (factories and change sets).
class PluginEnum {
public:
    virtual ~PluginEnum() = default;
    // One past the highest id.
    virtual std::uint32_t pluginCount() const = 0;
    // The object with the id, or null (ids past the end and empty slots).
    virtual ref<IPlugin> plugin(std::uint32_t id) const = 0;
};

// A change set: a named list of edits with a parent. Only the root change set
// exists here; edit records are identified by operation name.
class PluginPatch : public RefCnt, public AllocObject<>, NonCopyable, public PluginEnum {
public:
    enum class Operation : std::uint8_t {
        SetAttr,
        SetOutputAttr,
        RemoveAttr,
        SetAttribItem,
        InsertAttribItem,
        Clear,
        RemoveAttribItem,
        SetAttrFlags,
        ClearAttrFlags,
        AddPlugin,
        RemovePlugin,
        Defragment,
    };

    explicit PluginPatch(std::string_view name, PluginPatch* parent = nullptr);

    const string& name() const noexcept { return m_name; }
    PluginPatch* parent() const noexcept { return m_parent; }

    // The operation of a record name; any other name throws base::exception
    // "Invalid patch operation!".
    static Operation operation(std::string_view name);
    static const char* operationName(Operation operation) noexcept;

    // No resolved objects while no edits are recorded.
    std::uint32_t pluginCount() const override { return 0; }
    ref<IPlugin> plugin(std::uint32_t) const override { return {}; }

private:
    string m_name;
    PluginPatch* m_parent;
};

class PluginFactory : public RefCntAtomic, NonCopyable, public PluginEnum, public AllocObject<> {
public:
    enum CreateFlags : std::uint32_t {
        createNullIfUnknown = 1,
        createReportUnknown = 2,
        createLocked = 4,
        createUnregistered = 8,
    };

    // 'name' appears in the factory's messages; every object's map gets
    // 'attributes' as its attribute factory.
    explicit PluginFactory(std::string_view name = {},
                           AttribFactory* attributes = &::base::attribFactory());
    ~PluginFactory() override;

    const string& name() const noexcept { return m_name; }
    AttribFactory* attributeFactory() const noexcept { return m_attributes; }
    // The factory's own settings.
    AttribMap& settings() noexcept { return m_settings; }

    // ---- Descriptors ----
    // Enters the descriptor under its type name. An existing entry stays and
    // the new descriptor is not kept; answers whether it was entered.
    bool registerPlugin(ref<IPluginDesc> descriptor);
    // The descriptor of a type (placeholders included), or null.
    ref<IPluginDesc> descriptor(name_id type) const;
    // Registered type names in the table's order.
    vector<name_id> types() const;
    // The placeholders made so far, oldest first.
    vector<ref<IPluginDesc>> placeholders() const;

    // ---- Objects ----
    ref<IPlugin> create(name_id type, std::uint32_t flags);
    ref<IPlugin> create(std::string_view type, std::uint32_t flags) {
        return create(name_id(type), flags);
    }
    std::uint32_t pluginCount() const override;
    ref<IPlugin> plugin(std::uint32_t id) const override;
    // An object that carries the name, or null (the first registered one when
    // several do).
    ref<IPlugin> findPlugin(std::string_view name);

    string uniqueName(std::string_view base);

    // Points plug-in references read from a stored form (which carry only
    // instance ids) at the objects of this factory, through nested maps and
    // arrays. A bad id is logged ("plugin factory| Invalid plugin attribute
    // detected for '{name}'! Id {id} out of bounds!" or "...! Plugin not
    // set!", and '{name},{index}' for array items) and stays unresolved.
    // Answers whether every pending reference was resolved.
    bool restoreReferences(Attribute& attribute, name_id name = {});

    // Sent by a plug-in of this factory when one of its attributes is about to
    // change: notifies its listeners with PluginCallback::changeKind and a new
    // stamp.
    void attributeChanged(IPlugin& plugin, name_id attribute);

    // ---- Change sets ----
    PluginPatch& rootPatch() const noexcept { return *m_patches.front(); }
    const vector<ref<PluginPatch>>& patches() const noexcept { return m_patches; }

private:
    friend class IPlugin;

    struct TransparentHash {
        using is_transparent = void;
        std::size_t operator()(std::string_view text) const noexcept {
            return std::hash<std::string_view>()(text);
        }
    };
    template <class V>
    using StringMap = std::unordered_map<string, V, TransparentHash, std::equal_to<>,
                                         StdAllocator<std::pair<const string, V>>>;

    ref<IPluginDesc> placeholder(name_id type);
    // Releases a reserved table slot that got no object.
    void dropSlot(std::uint32_t id) noexcept;
    // Makes 'plugin' this factory's object under 'id'.
    void bind(IPlugin& plugin, std::uint32_t id);
    void trackUnregistered(IPlugin* plugin);
    void forgetUnregistered(IPlugin* plugin) noexcept;
    // Adds the names of the objects registered since the last named one.
    void updateNames();
    IPlugin* scanForName(std::string_view name) const;

    AttribMap m_settings;
    map<name_id, ref<IPluginDesc>> m_descriptors;
    vector<IPlugin*> m_instances;
    AttribFactory* m_attributes;
    // Guards the instance table, the unregistered set and the name service;
    // recursive because a descriptor may create further objects.
    mutable std::recursive_mutex m_critical;
    // Guards the descriptor table and the placeholder list.
    mutable LockWord m_lock{0};
    string m_name;
    vector<ref<PluginPatch>> m_patches;
    vector<ref<IPluginDesc>> m_placeholders;
    // Live objects made with createUnregistered, so their factory pointer can
    // be cleared when the factory dies.
    std::unordered_set<IPlugin*, std::hash<IPlugin*>, std::equal_to<>, StdAllocator<IPlugin*>>
        m_unregistered;

    // Unique-name service: each name carried by an object, with the id of the
    // first object found carrying it; the scan position; and for each
    // (start, stem) the counter where the last search stopped.
    StringMap<std::uint32_t> m_names;
    std::uint32_t m_nameCursor = 0;
    StringMap<std::uint64_t> m_counters;
};

} // namespace base

// Attribute descriptors: what a map class looks like to editors and tools.
//
// An AttribMapDesc describes one map class (found by its class name) and lists
// its attributes as AttribDesc records in document order: label, type, UI hints,
// default and limits as texts, and a flags word. The process-wide
// AttribDescManager behind attribDescManager() keeps them; descriptor files are
// XML documents of the form
//
//   <Document>
//     <AttributeMap class="light" inherit="node" abstract="false">
//       <Attribute name="color" type="vec3f" default="1,1,1" keyable="true"/>
//       <Attribute name="samples" arrayof="float" control-lines="3"/>
//     </AttributeMap>
//   </Document>
//
// Descriptors are built completely before they are published with add() or by
// the loader, and are read-only afterwards; only an AttribMapDesc's instance
// list changes later, under its own lock.
#pragma once

#include "b_memory.h"
#include "b_name.h"
#include "b_refcnt.h"

#include <cstdint>
#include <mutex>
#include <set>
#include <shared_mutex>
#include <string_view>

namespace base {

class AttribMap;

// One attribute of a map class. The texts are kept as written in the file;
// their meaning depends on the attribute's type and control.
class AttribDesc : public RefCntAtomic, public AllocObject<>, NonCopyable {
public:
    enum Flag : std::uint32_t {
        visible = 1,
        resource = 2,
        optional = 4,
        readOnly = 8,
        cmdline = 16,
        state = 32,
        keyable = 64,
    };

    bool has(Flag flag) const noexcept { return (flags & flag) != 0; }

    name_id name;
    string label;
    // A type label ("vec3f", "quatf", "plugin[]"); null when the file gives none.
    name_id type;
    string control;
    string initialisator;
    string action;
    string defaultValue;
    string softMin;
    string softMax;
    string units;
    string enumValues;
    string help;
    string precision;
    // Number of lines of the attribute's control; 0 when not given.
    std::uint32_t controlLines = 0;
    std::uint32_t flags = visible;
};

// One map class: its class-level fields, its attributes and the maps created
// from it.
class AttribMapDesc : public RefCntAtomic, public AllocObject<>, NonCopyable {
public:
    explicit AttribMapDesc(name_id className) : m_className(className) {}

    name_id className() const noexcept { return m_className; }

    // Answers false (and keeps the list as it is) for a null or unnamed
    // descriptor and for a name that is already listed.
    bool addAttribute(ref<AttribDesc> attribute);
    // The attribute of that name, or null.
    AttribDesc* findAttribute(name_id name) const;
    // In the order they were added (document order for loaded files).
    const vector<ref<AttribDesc>>& attributes() const noexcept { return m_attributes; }

    // Maps created from this class register here and unregister before they
    // are destroyed; the list holds no references. Instances keep the
    // descriptor alive through their own ref<AttribMapDesc>.
    void registerInstance(AttribMap* instance);
    void unregisterInstance(AttribMap* instance);
    bool hasInstance(const AttribMap* instance) const;
    std::size_t instanceCount() const;

    // Base class whose attributes this class inherits; null for none.
    name_id inherit;
    bool abstract = false;
    bool singleInstance = false;
    string friendClasses;
    string nameSpace;
    string destination;
    string constructor;
    string customDescriptor;
    std::uint32_t flags = 0;

private:
    name_id m_className;
    vector<ref<AttribDesc>> m_attributes;
    // Attribute name -> index into m_attributes.
    map<name_id, std::size_t> m_index;

    mutable std::mutex m_instanceMutex;
    std::set<AttribMap*, std::less<>, StdAllocator<AttribMap*>> m_instances;
};

// Keeper of the map-class descriptors, by class name. A class is described
// once: the first description added or loaded stays, later ones are ignored
// with a warning, so maps already created from it never see their class change.
class AttribDescManager : public AllocObject<>, NonCopyable {
public:
    ref<AttribMapDesc> find(name_id className) const;
    // Answers false for a null descriptor, one without a class name, or a class
    // that is already described.
    bool add(ref<AttribMapDesc> desc);
    std::size_t size() const;

    // Reads a descriptor file and answers how many classes it added. Problems
    // are logged, never thrown: a missing or malformed file, or one without
    // Document/AttributeMap, adds nothing; an AttributeMap without a class and
    // an Attribute without a name are skipped with a warning.
    std::size_t load(std::string_view path);
    // Same, from text; 'origin' names the text in log messages.
    std::size_t loadFromString(std::string_view text, std::string_view origin = "(string)");

private:
    mutable std::shared_mutex m_mutex;
    map<name_id, ref<AttribMapDesc>> m_classes;
};

// The process-wide keeper; never destroyed.
AttribDescManager& attribDescManager();

} // namespace base

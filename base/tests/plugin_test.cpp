// Plug-in objects and their factory: create flags and messages, ids, unique
// names, display names and reference attributes, stored references, interfaces,
// clones, change notification and the teardown of a factory whose objects
// refer to each other.
#include "b_plugin.h"
#include "b_plugin_attribute.h"
#include "b_plugin_factory.h"

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <set>
#include <stdexcept>
#include <thread>

using namespace base;

namespace {

const name_id nNode("node");
const name_id nGhost("ghostType");
const name_id nOther("other");
const name_id nList("list");
const name_id nValue("value");
const name_id nInner("inner");

// Counts live objects, so tests can see exactly what a teardown freed.
class CountedPlugin : public IPlugin {
public:
    CountedPlugin(IPluginDesc* desc, PluginFactory* factory, std::uint32_t id)
        : IPlugin(desc, factory, id) {
        ++live;
    }
    ~CountedPlugin() override { --live; }
    static inline int live = 0;
};

ref<PluginFactory> makeFactory() {
    ref<PluginFactory> factory(new PluginFactory("test"));
    factory->registerPlugin(ref<IPluginDesc>(new PluginDescOf<CountedPlugin>(nNode)));
    return factory;
}

void setName(IPlugin& plugin, std::string_view name) {
    plugin.setAttribute<string>(nameAttributeName(), string(name));
}

void setRef(IPlugin& plugin, name_id name, IPlugin* target) {
    plugin.setAttribute<ref<IPlugin>>(name, ref<IPlugin>(target));
}

ref<IPlugin> adoptClone(const IPlugin& plugin) {
    return ref<IPlugin>::adopt(static_cast<IPlugin*>(plugin.clone()));
}

class PluginTest : public testing::Test {
protected:
    void TearDown() override {
        factory.reset();
        EXPECT_EQ(CountedPlugin::live, 0);
    }
    CaptureLog capture;
    ScopedLog scoped{capture};
    ref<PluginFactory> factory = makeFactory();
};

// ---- create flags -----------------------------------------------------------------

struct UnknownTypeCase {
    const char* label;
    std::uint32_t flags;
    bool yieldsObject;
    const char* message; // null: nothing logged
};

class PluginCreateUnknown : public PluginTest,
                            public testing::WithParamInterface<UnknownTypeCase> {};

TEST_P(PluginCreateUnknown, FollowsTheFlags) {
    const UnknownTypeCase& c = GetParam();
    factory->create(nNode, 0);
    const std::uint32_t before = factory->pluginCount();

    ref<IPlugin> made = factory->create(nGhost, c.flags);

    EXPECT_EQ(bool(made), c.yieldsObject);
    if (c.message)
        EXPECT_EQ(capture.messages(), vector<string>{string(c.message)});
    else
        EXPECT_TRUE(capture.messages().empty());
    if (made) {
        EXPECT_EQ(made->className(), nGhost);
        EXPECT_TRUE(made->descriptor()->isPlaceholder());
        EXPECT_EQ(made->descriptor()->flags(), IPluginDesc::flagPlaceholder);
        EXPECT_EQ(factory->placeholders().size(), 1u);
    }
    const bool registered = made && !(c.flags & PluginFactory::createUnregistered);
    EXPECT_EQ(factory->pluginCount(), before + (registered ? 1 : 0));
    if (made) {
        EXPECT_EQ(made->instanceId(), registered ? before : invalidPluginId);
    }
}

const char* const unknownMessage =
    "plugin factory test| Unable to create plugin of type ghostType!";
const char* const unknownMessageLimited =
    "plugin factory test| Unable to create plugin of type ghostType! Creating a general plugin "
    "with limited functionality...";

INSTANTIATE_TEST_SUITE_P(
    Flags, PluginCreateUnknown,
    testing::Values(UnknownTypeCase{"silentPlaceholder", 0, true, nullptr},
                    UnknownTypeCase{"null", 1, false, unknownMessage},
                    UnknownTypeCase{"reportedPlaceholder", 2, true, unknownMessageLimited},
                    UnknownTypeCase{"reportedNull", 3, false, unknownMessage},
                    UnknownTypeCase{"lockedPlaceholder", 4, true, nullptr},
                    UnknownTypeCase{"unregisteredPlaceholder", 8, true, nullptr},
                    UnknownTypeCase{"unregisteredNull", 9, false, unknownMessage}),
    [](const auto& info) { return info.param.label; });

TEST_F(PluginTest, PlaceholderDescriptorIsMadeOncePerType) {
    ref<IPlugin> a = factory->create(nGhost, 0);
    ref<IPlugin> b = factory->create(nGhost, 2);
    ref<IPlugin> c = factory->create(name_id("otherGhost"), 0);
    EXPECT_EQ(a->descriptor(), b->descriptor());
    EXPECT_EQ(factory->descriptor(nGhost).get(), a->descriptor());
    EXPECT_NE(c->descriptor(), a->descriptor());
    EXPECT_EQ(factory->placeholders().size(), 2u);
}

TEST_F(PluginTest, IdsAreConsecutiveAndUnregisteredObjectsStayOutOfTheTable) {
    factory->create(nGhost, 0);
    ref<IPlugin> a = factory->create(nNode, 0);
    ref<IPlugin> loose = factory->create(nNode, PluginFactory::createUnregistered);
    ref<IPlugin> b = factory->create(nNode, PluginFactory::createLocked);
    EXPECT_EQ(a->instanceId(), 1u);
    EXPECT_EQ(b->instanceId(), 2u);
    EXPECT_EQ(loose->instanceId(), invalidPluginId);
    EXPECT_EQ(factory->pluginCount(), 3u);
    EXPECT_EQ(factory->plugin(2), b);
    EXPECT_EQ(factory->plugin(3), nullptr);
    EXPECT_EQ(a->factory(), factory.get());
    EXPECT_EQ(loose->factory(), factory.get());
    // The table holds one reference of its own; the loose object only ours.
    EXPECT_EQ(a->refCount(), 2u);
    EXPECT_EQ(loose->refCount(), 1u);
    loose.reset();
    EXPECT_EQ(CountedPlugin::live, 2);
}

TEST_F(PluginTest, SecondDescriptorForATypeIsNotKept) {
    ref<IPluginDesc> first = factory->descriptor(nNode);
    ref<IPluginDesc> second(new IPluginDesc);
    EXPECT_FALSE(factory->registerPlugin(ref<IPluginDesc>(new PluginDescOf<IPlugin>(nNode))));
    EXPECT_EQ(factory->descriptor(nNode), first);
    EXPECT_TRUE(factory->registerPlugin(second));
    EXPECT_EQ(factory->descriptor(name_id("Plugin")), second);
    EXPECT_EQ(second->signature(), 0xBAADu);
    EXPECT_EQ(second->refCount(), 2u);
}

// A descriptor that makes another object on the way, then fails.
class FailingDesc : public IPluginDesc {
public:
    explicit FailingDesc(bool throws) : m_throws(throws) { setTypeName(name_id("failing")); }
    IPlugin* create(PluginFactory& factory, std::uint32_t) override {
        if (nested)
            factory.create(nNode, PluginFactory::createLocked);
        if (m_throws)
            throw std::runtime_error("descriptor failed");
        return nullptr;
    }
    bool nested = false;

private:
    bool m_throws;
};

TEST_F(PluginTest, FailingDescriptorLeavesNoObjectBehind) {
    auto* throwing = new FailingDesc(true);
    factory->registerPlugin(ref<IPluginDesc>(throwing));
    EXPECT_THROW(factory->create(name_id("failing"), 0), std::runtime_error);
    EXPECT_EQ(factory->pluginCount(), 0u);

    throwing->nested = true;
    EXPECT_THROW(factory->create(name_id("failing"), 0), std::runtime_error);
    // The nested object keeps its id; the failed one's slot stays empty.
    ASSERT_EQ(factory->pluginCount(), 2u);
    EXPECT_EQ(factory->plugin(0), nullptr);
    EXPECT_EQ(factory->plugin(1)->instanceId(), 1u);
    EXPECT_EQ(factory->create(nNode, 0)->instanceId(), 2u);

    ref<IPluginDesc> nothing(new FailingDesc(false));
    ref<PluginFactory> other(new PluginFactory);
    other->registerPlugin(nothing);
    EXPECT_EQ(other->create(name_id("failing"), 0), nullptr);
    EXPECT_EQ(other->pluginCount(), 0u);
}

TEST_F(PluginTest, ConcurrentLockedCreationGivesDistinctIds) {
    constexpr int perThread = 500;
    std::vector<std::uint32_t> ids[2];
    auto work = [&](int t) {
        for (int i = 0; i < perThread; ++i)
            ids[t].push_back(factory->create(nNode, PluginFactory::createLocked)->instanceId());
    };
    std::thread a(work, 0), b(work, 1);
    a.join();
    b.join();
    std::set<std::uint32_t> all(ids[0].begin(), ids[0].end());
    all.insert(ids[1].begin(), ids[1].end());
    EXPECT_EQ(all.size(), 2u * perThread);
    EXPECT_EQ(factory->pluginCount(), 2u * perThread);
    EXPECT_EQ(*all.rbegin(), 2u * perThread - 1);
}

// ---- unique names -----------------------------------------------------------------

struct UniqueNameCase {
    const char* label;
    std::vector<const char*> taken;
    const char* base;
    const char* expected;
};

class PluginUniqueName : public PluginTest, public testing::WithParamInterface<UniqueNameCase> {};

TEST_P(PluginUniqueName, AnswersTheFirstFreeName) {
    for (const char* name : GetParam().taken)
        setName(*factory->create(nNode, 0), name);
    EXPECT_EQ(factory->uniqueName(GetParam().base), GetParam().expected);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, PluginUniqueName,
    testing::Values(UniqueNameCase{"free", {}, "node", "node"},
                    UniqueNameCase{"second", {"node"}, "node", "node1"},
                    UniqueNameCase{"third", {"node", "node1"}, "node", "node2"},
                    UniqueNameCase{"gap", {"node", "node2"}, "node", "node1"},
                    UniqueNameCase{"digits", {"Arm2"}, "Arm2", "Arm3"},
                    UniqueNameCase{"digitsTaken", {"Arm2", "Arm3"}, "Arm2", "Arm4"},
                    UniqueNameCase{"leadingZeros", {"bone007"}, "bone007", "bone8"},
                    UniqueNameCase{"onlyDigits", {"42"}, "42", "43"},
                    UniqueNameCase{"caseMatters", {"node"}, "Node", "Node"},
                    UniqueNameCase{"hugeDigits",
                                   {"x99999999999999999999"},
                                   "x99999999999999999999",
                                   "x999999999999999999991"},
                    UniqueNameCase{"empty", {}, "", ""}),
    [](const auto& info) { return info.param.label; });

TEST_F(PluginTest, UniqueNamesFollowTheObjectsAsTheyAreNamed) {
    // Made first and named after the question, as converters do.
    for (int i = 0; i < 3; ++i) {
        ref<IPlugin> node = factory->create(nNode, 0);
        setName(*node, factory->uniqueName("node"));
    }
    EXPECT_EQ(factory->plugin(2)->name(), "node2");

    // The answer is not reserved until an object carries it.
    EXPECT_EQ(factory->uniqueName("node"), "node3");
    EXPECT_EQ(factory->uniqueName("node"), "node3");

    // A dropped name stays taken.
    setName(*factory->plugin(0), "renamed");
    EXPECT_EQ(factory->uniqueName("node"), "node3");
    EXPECT_EQ(factory->findPlugin("renamed"), factory->plugin(0));
    EXPECT_EQ(factory->findPlugin("node1"), factory->plugin(1));
    EXPECT_EQ(factory->findPlugin("node"), nullptr);

    // Names of unregistered objects do not count.
    setName(*factory->create(nNode, PluginFactory::createUnregistered), "loose");
    EXPECT_EQ(factory->uniqueName("loose"), "loose");
}

// ---- names and reference texts --------------------------------------------------

TEST_F(PluginTest, DisplayNameFallsBackToTheTypeName) {
    ref<IPlugin> plain = factory->create(nNode, 0);
    EXPECT_EQ(plain->name(), "");
    EXPECT_EQ(plain->name(true), "node");
    EXPECT_EQ(plain->toString(), "node");
    setName(*plain, "Arm");
    EXPECT_EQ(plain->name(), "Arm");
    EXPECT_EQ(plain->toString(), "Arm");
    IPlugin bare;
    EXPECT_EQ(bare.name(true), "");
    EXPECT_EQ(bare.className(), name_id());
}

TEST_F(PluginTest, ReferenceTextForms) {
    ref<IPlugin> named = factory->create(nNode, 0);
    setName(*named, "Arm");
    ref<IPlugin> typed = factory->create(nNode, 0);
    ref<IPlugin> bare(new IPlugin(nullptr, nullptr, 7));

    const struct {
        IPlugin* target;
        const char* text;
    } cases[] = {{named.get(), "Arm"}, {typed.get(), "node"}, {bare.get(), "7"}, {nullptr, "null"}};
    PluginVectorAttribute list;
    for (const auto& c : cases) {
        EXPECT_EQ(PluginAttribute(ref<IPlugin>(c.target)).toString(), c.text);
        list.items().emplace_back(c.target);
    }
    EXPECT_EQ(list.toString(), "Arm node 7 null");
}

struct FromTextCase {
    const char* text;
    bool accepted;
    int target; // index of the object, -1 for an empty reference
};

class PluginFromString : public PluginTest, public testing::WithParamInterface<FromTextCase> {};

TEST_P(PluginFromString, LooksTheObjectUpByIdOrName) {
    ref<IPlugin> objects[2] = {factory->create(nNode, 0), factory->create(nNode, 0)};
    setName(*objects[0], "Arm");
    // The attribute reaches the factory through the object it references.
    PluginAttribute attribute(objects[1]);
    const FromTextCase& c = GetParam();
    EXPECT_EQ(attribute.fromString(c.text), c.accepted);
    const int expected = c.accepted ? c.target : 1;
    EXPECT_EQ(attribute.value().get(), expected < 0 ? nullptr : objects[expected].get());
}

INSTANTIATE_TEST_SUITE_P(Texts, PluginFromString,
                         testing::Values(FromTextCase{"0", true, 0}, FromTextCase{" 0 ", true, 0},
                                         FromTextCase{"Arm", true, 0}, FromTextCase{"1", true, 1},
                                         FromTextCase{"null", true, -1},
                                         FromTextCase{"12x", false, 0}, FromTextCase{"2", false, 0},
                                         FromTextCase{"4294967296", false, 0},
                                         FromTextCase{"Leg", false, 0},
                                         FromTextCase{"", false, 0}));

TEST_F(PluginTest, FromStringWithoutAFactoryKeepsTheId) {
    PluginAttribute attribute;
    EXPECT_TRUE(attribute.fromString("5"));
    EXPECT_EQ(attribute.value(), nullptr);
    EXPECT_EQ(attribute.id(), 5u);
    EXPECT_FALSE(attribute.fromString("Arm"));
    EXPECT_EQ(attribute.id(), 5u);

    ref<IPlugin> arm = factory->create(nNode, 0);
    setName(*arm, "Arm");
    PluginVectorAttribute list;
    EXPECT_TRUE(list.fromString("Arm 0 null", factory.get()));
    ASSERT_EQ(list.size(), 3u);
    EXPECT_EQ(list.items()[0], arm);
    EXPECT_EQ(list.items()[1], arm);
    EXPECT_EQ(list.items()[2], nullptr);
    EXPECT_FALSE(list.fromString("Arm Leg", factory.get()));
    EXPECT_EQ(list.size(), 3u);
}

// ---- stored references ------------------------------------------------------------

TEST_F(PluginTest, BinaryFormCarriesIdsThatTheFactoryRestores) {
    ref<IPlugin> a = factory->create(nNode, 0);
    ref<IPlugin> b = factory->create(nNode, 0);
    AttribMap map;
    map.setAttribute<ref<IPlugin>>(nOther, b);
    map.appendAttributeItem<ref<IPlugin>>(nList, b);
    map.appendAttributeItem<ref<IPlugin>>(nList, ref<IPlugin>());
    map.appendAttributeItem<ref<IPlugin>>(nList, a);
    map.mapAttribute(nInner)->setAttribute<ref<IPlugin>>(nValue, a);
    EXPECT_EQ(map.findEntry(nOther)->binarySize(), 4u);
    EXPECT_EQ(map.findEntry(nList)->binarySize(), 16u);

    Stream stream = memoryStream();
    ASSERT_TRUE(map.write(stream));
    stream.setPosition(0);
    AttribMap copy;
    ASSERT_TRUE(copy.read(stream));

    auto* other = dynamic_cast<PluginAttribute*>(copy.findEntry(nOther));
    auto* list = dynamic_cast<PluginVectorAttribute*>(copy.findEntry(nList));
    ASSERT_TRUE(other && list);
    EXPECT_TRUE(list->hasFlag(Attribute::flagPluginVector));
    EXPECT_EQ(other->value(), nullptr);
    EXPECT_EQ(other->id(), 1u);
    EXPECT_EQ(list->pendingIds(), (vector<std::uint32_t>{1, invalidPluginId, 0}));

    EXPECT_TRUE(factory->restoreReferences(copy));
    EXPECT_EQ(other->value(), b);
    EXPECT_EQ(list->items(), (PluginVectorAttribute::vector_type{b, nullptr, a}));
    EXPECT_EQ(*copy.findMap(nInner)->findAttribute<ref<IPlugin>>(nValue), a);
    EXPECT_EQ(copy.compare(map.data()), 0);
    EXPECT_TRUE(capture.messages().empty());
}

TEST_F(PluginTest, BadStoredIdsAreReported) {
    auto* failing = new FailingDesc(true);
    failing->nested = true;
    factory->registerPlugin(ref<IPluginDesc>(failing));
    EXPECT_THROW(factory->create(name_id("failing"), 0), std::runtime_error); // empty slot 0

    // Ids as a stored form leaves them: no factory to look them up yet.
    AttribMap map;
    auto put = [&](name_id name, Attribute* attribute, const char* text) {
        EXPECT_TRUE(attribute->fromString(text));
        map.attribute(name, attribute);
    };
    put(nOther, new PluginAttribute, "0");
    put(nValue, new PluginAttribute, "9");
    put(nList, new PluginVectorAttribute, "1 9 0");
    EXPECT_FALSE(factory->restoreReferences(map));
    // Entries are visited in name_id order, which is not alphabetical.
    const vector<string> logged = capture.messages();
    EXPECT_EQ(
        std::set<string>(logged.begin(), logged.end()),
        (std::set<string>{
            "plugin factory| Invalid plugin attribute detected for 'other'! Plugin not set!",
            "plugin factory| Invalid plugin attribute detected for 'value'! Id 9 out of bounds!",
            "plugin factory| Invalid plugin attribute detected for 'list,1'! Id 9 out of bounds!",
            "plugin factory| Invalid plugin attribute detected for 'list,2'! Plugin not set!"}));
    EXPECT_EQ(logged.size(), 4u);
    EXPECT_EQ(static_cast<PluginVectorAttribute*>(map.findEntry(nList))->items()[0],
              factory->plugin(1));
}

// ---- interfaces and clones --------------------------------------------------------

struct NamedInterface : IPluginInterface {
    explicit NamedInterface(const char* type) : type(type) {}
    name_id typeName() const override { return type; }
    name_id type;
};

TEST_F(PluginTest, QueryInterfaceAnswersTheFirstAttachedOfTheType) {
    NamedInterface scene("scene"), importer("importer"), secondScene("scene");
    ref<IPlugin> plugin = factory->create(nNode, 0);
    plugin->addInterface(&scene);
    plugin->addInterface(&importer);
    plugin->addInterface(&secondScene);
    plugin->addInterface(nullptr);
    EXPECT_EQ(plugin->queryInterface(name_id("scene")), &scene);
    EXPECT_EQ(plugin->queryInterface(name_id("importer")), &importer);
    EXPECT_EQ(plugin->queryInterface(name_id("camera")), nullptr);
    factory.reset();
    plugin.reset();
}

TEST_F(PluginTest, CloneMakesAnObjectOfTheSameTypeInTheFactory) {
    ref<IPlugin> target = factory->create(nNode, 0);
    ref<IPlugin> original = factory->create(nNode, 0);
    setName(*original, "Arm");
    original->setAttribute<int>(nValue, 5);
    setRef(*original, nOther, target.get());
    original->setFlagBit10();
    EXPECT_TRUE(original->hasFlag(Attribute::flagPluginBit10));

    ref<IPlugin> copy = adoptClone(*original);
    EXPECT_EQ(copy->instanceId(), 2u);
    EXPECT_EQ(copy->refCount(), 2u);
    EXPECT_EQ(dynamic_cast<CountedPlugin*>(copy.get()) != nullptr, true);
    EXPECT_EQ(copy->className(), nNode);
    EXPECT_EQ(copy->compare(original->data()), 0);
    EXPECT_EQ(*copy->findAttribute<ref<IPlugin>>(nOther), target);

    // Without a factory the copy is a plain map.
    ref<IPlugin> loose(new IPlugin(factory->descriptor(nNode).get(), nullptr, invalidPluginId));
    loose->setAttribute<int>(nValue, 3);
    std::unique_ptr<Attribute> plain(loose->clone());
    EXPECT_EQ(dynamic_cast<IPlugin*>(plain.get()), nullptr);
    EXPECT_EQ(*plain->asMap()->findAttribute<int>(nValue), 3);
}

// ---- change notification ----------------------------------------------------------

struct Recorder : PluginCallback {
    struct Call {
        IPlugin* plugin;
        name_id attribute;
        std::uint32_t kind;
        std::uint64_t identifier;
    };
    void pluginChanged(IPlugin& plugin, name_id attribute, std::uint32_t kind,
                       std::uint64_t identifier) override {
        calls.push_back({&plugin, attribute, kind, identifier});
        if (onCall)
            onCall();
    }
    std::vector<Call> calls;
    std::function<void()> onCall;
};

TEST_F(PluginTest, MutableAccessNotifiesTheListeners) {
    ref<IPlugin> plugin = factory->create(nNode, 0);
    plugin->setAttribute<int>(nValue, 1);
    Recorder first, second;
    EXPECT_TRUE(plugin->addListener(first));
    EXPECT_FALSE(plugin->addListener(first));
    EXPECT_TRUE(plugin->addListener(second));

    plugin->findAttributeMutable(nValue, 2);
    plugin->findAttributeMutable(nValue, 0);
    plugin->findAttributeMutable(nValue, 2);
    ASSERT_EQ(first.calls.size(), 2u);
    ASSERT_EQ(second.calls.size(), 2u);
    EXPECT_EQ(first.calls[0].plugin, plugin.get());
    EXPECT_EQ(first.calls[0].attribute, nValue);
    EXPECT_EQ(first.calls[0].kind, PluginCallback::changeKind);
    EXPECT_NE(first.calls[0].identifier, first.calls[1].identifier);
    EXPECT_EQ(second.calls[1].identifier, first.calls[1].identifier);

    EXPECT_TRUE(plugin->removeListener(first));
    EXPECT_FALSE(plugin->removeListener(first));
    plugin->notify(nOther, 7, 42);
    EXPECT_EQ(first.calls.size(), 2u);
    ASSERT_EQ(second.calls.size(), 3u);
    EXPECT_EQ(second.calls[2].kind, 7u);
    EXPECT_EQ(second.calls[2].identifier, 42u);
}

TEST_F(PluginTest, ListenersAndPluginsMayDieInAnyOrder) {
    ref<IPlugin> plugin = factory->create(nNode, 0);
    auto early = std::make_unique<Recorder>();
    Recorder killer, last;
    plugin->addListener(killer);
    plugin->addListener(*early);
    plugin->addListener(last);
    // The first listener destroys the second while the notification runs.
    killer.onCall = [&] { early.reset(); };
    plugin->notify(nValue, 1, 1);
    EXPECT_EQ(last.calls.size(), 1u);
    killer.onCall = nullptr;

    {
        Recorder shortLived;
        plugin->addListener(shortLived);
    }
    plugin->notify(nValue, 1, 2);
    EXPECT_EQ(last.calls.size(), 2u);

    // A plug-in that dies first leaves the listener's list.
    ref<IPlugin> loose = factory->create(nNode, PluginFactory::createUnregistered);
    loose->addListener(last);
    loose.reset();
    // A listener may drop the last reference to the object that notifies it.
    ref<IPlugin> doomed = factory->create(nNode, PluginFactory::createUnregistered);
    Recorder dropper;
    dropper.onCall = [&] { doomed.reset(); };
    doomed->addListener(dropper);
    doomed->addListener(last);
    doomed->notify(nValue, 1, 3);
    EXPECT_EQ(doomed, nullptr);
    EXPECT_EQ(last.calls.size(), 3u);
}

// ---- teardown -----------------------------------------------------------------------

enum class Release { factoryFirst, outsideRefsFirst };

class PluginTeardown : public testing::TestWithParam<Release> {};

TEST_P(PluginTeardown, FreesEveryObjectTheFactoryHolds) {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> a = factory->create(nNode, 0);
    ref<IPlugin> b = factory->create(nNode, 0);
    ref<IPlugin> c = factory->create(nNode, 0);
    ref<IPlugin> d = factory->create(nNode, 0);
    ref<IPlugin> loose = factory->create(nNode, PluginFactory::createUnregistered);
    setName(*a, "a");
    b->setAttribute<int>(nValue, 4);

    setRef(*a, nOther, b.get()); // a <-> b
    setRef(*b, nOther, a.get());
    c->appendAttributeItem<ref<IPlugin>>(nList, c); // self, and a nested cycle
    c->appendAttributeItem<ref<IPlugin>>(nList, a);
    c->mapAttribute(nInner)->setAttribute<ref<IPlugin>>(nOther, c);
    d->setBase(a.get()); // inheritance and a link into b
    AttribPath path;
    path.addPlugin(b.get()).addMember(nValue);
    d->attribute(nValue, new AttribLink(path));
    EXPECT_EQ(*d->findAttribute<int>(nValue), 4);
    setRef(*loose, nOther, a.get()); // an unregistered object in a cycle
    setRef(*a, nInner, loose.get());
    loose.reset();

    // Outside references: kept past the factory in one order, dropped first in
    // the other.
    a.reset();
    b.reset();
    c.reset();
    if (GetParam() == Release::outsideRefsFirst) {
        d.reset();
        factory.reset();
        EXPECT_EQ(CountedPlugin::live, 0);
        return;
    }
    factory.reset();
    ASSERT_EQ(CountedPlugin::live, 1);
    EXPECT_EQ(d->factory(), nullptr);
    EXPECT_EQ(d->className(), nNode);
    EXPECT_EQ(d->size(), 0u);
    d.reset();
    EXPECT_EQ(CountedPlugin::live, 0);
}

INSTANTIATE_TEST_SUITE_P(Orders, PluginTeardown,
                         testing::Values(Release::factoryFirst, Release::outsideRefsFirst),
                         [](const auto& info) {
                             return info.param == Release::factoryFirst ? "factoryFirst"
                                                                        : "outsideRefsFirst";
                         });

TEST(PluginTeardownLoose, UnregisteredObjectOutlivesItsFactory) {
    ref<PluginFactory> factory = makeFactory();
    ref<IPlugin> loose = factory->create(nNode, PluginFactory::createUnregistered);
    ref<IPlugin> held = factory->create(nNode, 0);
    setRef(*loose, nOther, held.get());
    // Made without the factory's create, still outside its table.
    ref<IPlugin> direct(new IPlugin(nullptr, factory.get(), invalidPluginId));
    held.reset();
    factory.reset();
    EXPECT_EQ(loose->factory(), nullptr);
    EXPECT_EQ(direct->factory(), nullptr);
    // The registered object it refers to was emptied, not freed.
    EXPECT_EQ(CountedPlugin::live, 2);
    // Without a factory, a change reaches the listeners directly.
    Recorder recorder;
    loose->addListener(recorder);
    loose->findAttributeMutable(nOther, 2);
    EXPECT_EQ(recorder.calls.size(), 1u);
    loose.reset();
    EXPECT_EQ(CountedPlugin::live, 0);
}

// ---- change sets --------------------------------------------------------------------

TEST(PluginPatchTest, RootChangeSetAndOperationNames) {
    ref<PluginFactory> factory(new PluginFactory);
    ASSERT_EQ(factory->patches().size(), 1u);
    EXPECT_EQ(factory->rootPatch().name(), "root");
    EXPECT_EQ(factory->rootPatch().parent(), nullptr);
    EXPECT_EQ(factory->rootPatch().pluginCount(), 0u);

    EXPECT_EQ(PluginPatch::operation("RemoveAttribItem"), PluginPatch::Operation::RemoveAttribItem);
    EXPECT_STREQ(PluginPatch::operationName(PluginPatch::Operation::Defragment), "Defragment");
    for (const char* bad : {"setAttr", "", "Clear "}) {
        try {
            PluginPatch::operation(bad);
            ADD_FAILURE() << bad;
        } catch (const exception& e) {
            EXPECT_STREQ(e.what(), "Invalid patch operation!");
        }
    }
}

} // namespace

// Attribute maps, arrays and links: typed lookups through links and inheritance,
// broken and cyclic links, unlinking, get-or-create, copies, comparison, path text
// and the name checks.
#include "b_attrib_map.h"

#include <gtest/gtest.h>

#include <functional>

using namespace base;

namespace {

const name_id nTranslate("translate");
const name_id nColor("color");
const name_id nPos("pos");
const name_id nBasePos("basePos");
const name_id nChildren("children");
const name_id nMissing("missing");

// A map standing in for a plug-in: counts refreshPath calls and owns a plug-in lock.
class TestPlugin : public AttribMap {
public:
    explicit TestPlugin(const char* name, std::uint32_t id = wholeValue) : m_id(id) {
        setAttribute<string>(nameAttributeName(), string(name));
    }
    void refreshPath(AttribPath&, name_id expected) override {
        ++refreshes;
        lastExpected = expected;
    }
    LockWord* pluginLock() const override { return &m_lock; }
    void attributeChanged(name_id name, Attribute*, std::uint32_t) override { changed = name; }
    std::uint32_t instanceId() const override { return m_id; }

    int refreshes = 0;
    name_id lastExpected;
    name_id changed;

private:
    std::uint32_t m_id;
    mutable LockWord m_lock{0};
};

AttribLink* linkTo(AttribMap& owner, name_id name, AttribMap* root, name_id member) {
    AttribPath path;
    path.addPlugin(root).addMember(member);
    auto* link = new AttribLink(path);
    owner.attribute(name, link);
    return link;
}

string invalidLink(const char* name, const char* path) {
    return format("map attribute| Detected invalid link attribute! Cannot resolve '{}' with "
                  "value '{}'!",
                  name, path);
}

class AttribMapTest : public testing::Test {
protected:
    CaptureLog capture;
    ScopedLog scoped{capture};
};

// ---- lookups ------------------------------------------------------------------

TEST_F(AttribMapTest, LookupsThroughLinksAndInheritance) {
    TestPlugin scene("Scene");
    scene.setAttribute(nTranslate, base_vec3<double>{1, 2, 3});
    AttribMap base;
    base.setAttribute(nColor, base_vec3<float>{0.5f, 0.5f, 1});
    linkTo(base, nBasePos, &scene, nTranslate);
    AttribMap object;
    object.setBase(&base);
    linkTo(object, nPos, &scene, nTranslate);

    const auto* translate = scene.findAttribute<base_vec3<double>>(nTranslate);
    ASSERT_NE(translate, nullptr);
    EXPECT_EQ(object.findAttribute<base_vec3<double>>(nPos), translate);     // link
    EXPECT_EQ(object.findAttribute<base_vec3<double>>(nBasePos), translate); // base, then link
    ASSERT_NE(object.findAttribute<base_vec3<float>>(nColor), nullptr);      // base
    EXPECT_EQ(object.findAttribute<base_vec3<float>>(nColor)->z, 1.0f);
    EXPECT_EQ(object.findAttribute<float>(nMissing), nullptr);
    EXPECT_TRUE(capture.entries().empty());

    // A double read as a float: one message per call, value untouched.
    EXPECT_EQ(object.findAttribute<base_vec3<float>>(nPos), nullptr);
    EXPECT_EQ(object.findVecAttribute<float>(nColor), nullptr);
    EXPECT_EQ(capture.messages(),
              (vector<string>{"map attribute| Detected invalid access to attribute 'pos'. "
                              "Expected 'vec3f', actual attribute type - 'vec3d'",
                              "map attribute| Detected invalid access to attribute 'color'. "
                              "Expected type 'float[]', actual attribute type - 'vec3f'!"}));
    EXPECT_EQ(capture.entries()[0].level, logWarning);
    EXPECT_EQ(capture.entries()[0].channel, logSystem);
    EXPECT_EQ(translate->y, 2.0);

    // With warnings off nothing is logged (and nothing is formatted).
    capture.clear();
    capture.setMaxLevel(logError);
    EXPECT_EQ(object.findAttribute<float>(nPos), nullptr);
    EXPECT_TRUE(capture.entries().empty());
}

TEST_F(AttribMapTest, InheritanceEndsWithTheBaseAndRefusesCycles) {
    auto* base = new AttribMap;
    base->setAttribute(nColor, 2.0f);
    AttribMap object;
    object.setBase(base);
    Attribute* copy = object.clone();
    EXPECT_NE(copy->asMap()->findAttribute<float>(nColor), nullptr);
    delete base;
    EXPECT_EQ(object.base(), nullptr);
    EXPECT_EQ(object.findAttribute<float>(nColor), nullptr);
    EXPECT_EQ(copy->asMap()->findAttribute<float>(nColor), nullptr); // the clone watched too
    delete copy;

    AttribMap a, b;
    b.setBase(&a);
    for (auto [map, base] : {std::pair{&a, &a}, std::pair{&a, &b}}) {
        try {
            map->setBase(base);
            ADD_FAILURE() << "a cycle was accepted";
        } catch (const exception& e) {
            EXPECT_STREQ(e.what(), "The object can't inherit itself!");
        }
    }
    EXPECT_EQ(a.base(), nullptr);
}

// ---- links ----------------------------------------------------------------------

TEST_F(AttribMapTest, LinkReresolvesAfterItsTargetDies) {
    TestPlugin scene("Scene");
    scene.setAttribute(nTranslate, 1.0);
    AttribMap object;
    AttribLink* link = linkTo(object, nPos, &scene, nTranslate);
    EXPECT_NE(object.findAttribute<double>(nPos), nullptr);
    EXPECT_NE(link->path()[1].target(), nullptr); // cached

    scene.removeAttribute(nTranslate);
    EXPECT_EQ(link->path()[1].target(), nullptr);
    scene.setAttribute(nTranslate, 7.0);
    ASSERT_NE(object.findAttribute<double>(nPos), nullptr);
    EXPECT_EQ(*object.findAttribute<double>(nPos), 7.0);

    scene.removeAttribute(nTranslate);
    EXPECT_EQ(object.findAttribute<double>(nPos), nullptr);
    EXPECT_EQ(scene.refreshes, 1);
    EXPECT_EQ(scene.lastExpected, TypeTraits<double>::n_name);
    EXPECT_EQ(capture.messages(), vector<string>{invalidLink("pos", "Scene.translate")});

    // Bit 7: the same broken link is silently absent.
    capture.clear();
    link->setFlag(Attribute::flagSilentLink);
    EXPECT_EQ(object.findAttribute<double>(nPos), nullptr);
    EXPECT_TRUE(capture.entries().empty());
}

TEST_F(AttribMapTest, TransientTargetsAreNeverCached) {
    TestPlugin scene("Scene");
    scene.setAttribute(nTranslate, 1.0);
    scene.findEntry(nTranslate)->setFlag(Attribute::flagNoWatch | Attribute::flagTransient);
    AttribMap object;
    AttribLink* link = linkTo(object, nPos, &scene, nTranslate);
    EXPECT_NE(object.findAttribute<double>(nPos), nullptr);
    EXPECT_EQ(link->path()[1].target(), nullptr);
    EXPECT_EQ(scene.refreshes, 1); // asked to refresh the transient result
    // The target dies unwatched; the next lookup must not touch it.
    scene.removeAttribute(nTranslate);
    EXPECT_EQ(object.findAttribute<double>(nPos), nullptr);
}

TEST_F(AttribMapTest, LinkCyclesEndAsBrokenLinks) {
    TestPlugin scene("Scene");
    const name_id a("a"), b("b"), self("self");
    linkTo(scene, a, &scene, b);
    linkTo(scene, b, &scene, a);
    linkTo(scene, self, &scene, self);
    AttribMap object;
    linkTo(object, nPos, &scene, a);

    EXPECT_EQ(scene.findAttribute<float>(self), nullptr);
    EXPECT_EQ(object.findAttribute<float>(nPos), nullptr);
    EXPECT_EQ(capture.messages(),
              (vector<string>{invalidLink("self", "Scene.self"), invalidLink("pos", "Scene.a")}));
}

TEST_F(AttribMapTest, AttributeOfTypeReplacesLinksAndOtherTypes) {
    TestPlugin scene("Scene");
    scene.setAttribute(nTranslate, 1.0f);
    AttribMap object;
    linkTo(object, nPos, &scene, nTranslate);
    TypedAttribute<float>* made = object.attribute<float>(nPos);
    ASSERT_NE(made, nullptr);
    EXPECT_EQ(object.findEntry(nPos), made);
    EXPECT_EQ(made->value(), 0.0f);
    EXPECT_EQ(object.attribute<float>(nPos), made); // now found, not remade
    EXPECT_NE(object.attribute<int>(nPos), nullptr);
    EXPECT_EQ(object.findEntry(nPos)->typeName(), TypeTraits<int>::n_name);

    // An unknown type keeps what was there.
    AttribFactory empty;
    AttribMap bare(&empty);
    bare.attribute(nPos, new TypedAttribute<int>(3));
    EXPECT_EQ(bare.attribute<float>(nPos), nullptr);
    EXPECT_EQ(*bare.findAttribute<int>(nPos), 3);
    EXPECT_EQ(capture.count("factory: Trying to create am item with unknown type float."), 1u);
}

TEST_F(AttribMapTest, SetAttributeKeepsSameTypeAndReplacesOthers) {
    AttribMap map;
    map.attribute(nPos, new TypedAttribute<int>(1));
    Attribute* stored = map.findEntry(nPos);
    map.attribute(nPos, new TypedAttribute<int>(2));
    EXPECT_EQ(map.findEntry(nPos), stored);
    EXPECT_EQ(*map.findAttribute<int>(nPos), 2);
    map.attribute(nPos, stored); // itself: kept, not destroyed
    EXPECT_EQ(*map.findAttribute<int>(nPos), 2);
    map.attribute(nPos, new TypedAttribute<float>(3));
    EXPECT_EQ(*map.findAttribute<float>(nPos), 3.0f);
    try {
        map.attribute(nPos, nullptr);
        ADD_FAILURE();
    } catch (const exception& e) {
        EXPECT_STREQ(e.what(), "Can't set invalid attribute");
    }
}

TEST_F(AttribMapTest, AppendAndSyncCheckTypes) {
    AttribMap map;
    map.appendAttributeItem<std::uint32_t>(nPos, 4);
    map.appendAttributeItem<std::uint32_t>(nPos, 5);
    EXPECT_EQ(map.findVecAttribute<std::uint32_t>(nPos)->size(), 2u);
    map.syncAttribute(nColor, 1.5);
    map.syncAttribute(nColor, 2.5);
    EXPECT_EQ(*map.findAttribute<double>(nColor), 2.5);

    AttribFactory empty;
    AttribMap bare(&empty);
    const std::function<void()> misuse[] = {
        [&] { map.appendAttributeItem<float>(nPos, 1.0f); },
        [&] { map.syncAttribute<float>(nColor, 1.0f); },
        [&] { bare.syncAttribute<float>(nColor, 1.0f); },
    };
    const char* expected[] = {
        "Detected invalid access to attribute 'pos'. Expected type 'float[]', actual attribute "
        "type - 'uint32[]'",
        "Detected invalid access to attribute 'color'. Expected type 'float', actual attribute "
        "type - 'double'",
        "Trying to access not registered attribute type 'float'.",
    };
    for (int i = 0; i < 3; ++i) {
        try {
            misuse[i]();
            ADD_FAILURE() << i;
        } catch (const exception& e) {
            EXPECT_STREQ(e.what(), expected[i]);
        }
    }
}

// Every entry point refuses a null and an empty name, naming itself.
struct NameCheck {
    const char* function;
    std::function<void(AttribMap&, name_id)> call;
};

class AttribMapEmptyName : public testing::TestWithParam<NameCheck> {};

TEST_P(AttribMapEmptyName, Throws) {
    AttribMap map;
    for (name_id name : {name_id(), name_id("")}) {
        try {
            GetParam().call(map, name);
            ADD_FAILURE() << GetParam().function;
        } catch (const exception& e) {
            EXPECT_STREQ(e.what(), "The attribute name can't be an empty string.");
            EXPECT_EQ(e.function(), GetParam().function);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(
    AttribMapNames, AttribMapEmptyName,
    testing::Values(NameCheck{"base::AttribMap::findAttribute",
                              [](AttribMap& m, name_id n) { m.findAttribute<float>(n); }},
                    NameCheck{"base::AttribMap::findVecAttribute",
                              [](AttribMap& m, name_id n) { m.findVecAttribute<float>(n); }},
                    NameCheck{
                        "base::AttribMap::attribute",
                        [](AttribMap& m, name_id n) { m.attribute(n, new TypedAttribute<int>()); }},
                    NameCheck{"base::AttribMap::attribute",
                              [](AttribMap& m, name_id n) { m.attribute<int>(n); }},
                    NameCheck{"base::AttribMap::findAttributeMutable",
                              [](AttribMap& m, name_id n) { m.findAttributeMutable(n, 1); }},
                    NameCheck{"base::AttribMap::appendAttributeItem",
                              [](AttribMap& m, name_id n) { m.appendAttributeItem<int>(n, 1); }},
                    NameCheck{"base::AttribMap::syncAttribute",
                              [](AttribMap& m, name_id n) { m.syncAttribute<int>(n, 1); }}));

// ---- unlinking --------------------------------------------------------------------

struct UnlinkCase {
    const char* label;
    std::uint32_t linkFlags;
    bool intoSelf;
    std::uint32_t flags;
    bool unlinked;
};

class AttribMapUnlink : public testing::TestWithParam<UnlinkCase> {};

TEST_P(AttribMapUnlink, FollowsTheFlagRules) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    const UnlinkCase& c = GetParam();
    TestPlugin other("Other");
    other.setAttribute(nTranslate, 4.0);
    TestPlugin plugin("Plugin");
    plugin.setAttribute(nTranslate, 5.0);
    AttribMap* nested = plugin.mapAttribute(nChildren);
    linkTo(*nested, nPos, c.intoSelf ? &plugin : &other, nTranslate)->setFlags(c.linkFlags);

    {
        // Bit 4: the caller holds the plug-in lock for reading.
        ReadGuard held(*plugin.pluginLock());
        EXPECT_EQ(plugin.findAttributeMutable(nChildren, c.flags | 16 | 2), c.unlinked);
    }
    EXPECT_EQ(plugin.changed, nChildren);
    EXPECT_EQ(plugin.pluginLock()->load(), 0u);
    Attribute* slot = nested->findEntry(nPos);
    EXPECT_EQ(slot->asLink() == nullptr, c.unlinked);
    if (c.unlinked) {
        EXPECT_EQ(*static_cast<const double*>(slot->data()), c.intoSelf ? 5.0 : 4.0);
        EXPECT_EQ(capture.count(format("Unlinked attribute pointing to {}.translate!",
                                       c.intoSelf ? "Plugin" : "Other")),
                  1u);
    }
}

INSTANTIATE_TEST_SUITE_P(AttribMapFlags, AttribMapUnlink,
                         testing::Values(UnlinkCase{"plain", 0, false, 1, true},
                                         UnlinkCase{"withoutBit0", 0, false, 0, false},
                                         UnlinkCase{"lockedLink", 2, false, 1 | 4 | 8, false},
                                         UnlinkCase{"silentKept", 0x80, false, 1, false},
                                         UnlinkCase{"silentWithBit2", 0x80, false, 1 | 4, true},
                                         UnlinkCase{"selfKept", 0, true, 1, false},
                                         UnlinkCase{"selfWithBit3", 0, true, 1 | 8, true}),
                         [](const auto& info) { return std::string(info.param.label); });

TEST_F(AttribMapTest, UnlinkingABrokenLinkWarns) {
    TestPlugin plugin("Plugin");
    plugin.attribute(nPos, new AttribLink());
    linkTo(plugin, nColor, &plugin, nMissing);
    EXPECT_FALSE(plugin.findAttributeMutable(nPos, 1));
    EXPECT_FALSE(plugin.findAttributeMutable(nColor, 1 | 8));
    EXPECT_FALSE(plugin.findAttributeMutable(nMissing, 1));
    EXPECT_EQ(capture.count("Unable to unlink an empty attribute link!"), 2u);
}

// ---- copy and compare -------------------------------------------------------------

struct CopyCase {
    std::uint32_t mode;
    float sameType;   // "a": float here 1, source 2
    bool replacedMix; // "b": float here, int in the source
};

class AttribMapCopy : public testing::TestWithParam<CopyCase> {};

TEST_P(AttribMapCopy, MergesByMode) {
    const name_id a("a"), b("b"), c("c");
    AttribMap target, source;
    target.setAttribute(a, 1.0f);
    target.setAttribute(b, 1.0f);
    source.setAttribute(a, 2.0f);
    source.setAttribute(b, 2);
    source.setAttribute(c, 3.0);
    ASSERT_TRUE(target.copyFrom(source, GetParam().mode));
    EXPECT_EQ(*target.findAttribute<float>(a), GetParam().sameType);
    EXPECT_EQ(target.findEntry(b)->typeName() == TypeTraits<int>::n_name, GetParam().replacedMix);
    EXPECT_EQ(*target.findAttribute<double>(c), 3.0); // absent names always arrive
    EXPECT_NE(target.findEntry(c), source.findEntry(c));
    EXPECT_FALSE(target.copyFrom(TypedAttribute<int>(1), 1));
}

INSTANTIATE_TEST_SUITE_P(AttribMapModes, AttribMapCopy,
                         testing::Values(CopyCase{0, 1.0f, false}, // structure merge
                                         CopyCase{1, 2.0f, true},
                                         // values copy only with bit 0
                                         CopyCase{2, 1.0f, false}));

TEST(AttribMapCompare, FollowsTheEntryRules) {
    const name_id a("a"), b("b");
    const auto make = [&](const char* name, float av, std::function<void(AttribMap&)> extra = {}) {
        auto* m = new AttribMap;
        m->setAttribute<string>(nameAttributeName(), string(name));
        m->setAttribute(a, av);
        if (extra)
            extra(*m);
        return std::unique_ptr<AttribMap>(m);
    };
    const auto cmp = [](const AttribMap& x, const AttribMap& y) { return x.compare(y.data()); };
    auto base = make("one", 1);
    EXPECT_EQ(cmp(*base, *make("two", 1)), 0); // object names do not count
    EXPECT_EQ(cmp(*base, *make("one", 2)), -1);
    EXPECT_EQ(cmp(*make("one", 3), *base), 1);
    EXPECT_EQ(cmp(*base, *make("one", 1, [&](AttribMap& m) { m.setAttribute(b, 1); })), -1);
    auto typed = make("one", 1);
    typed->setAttribute(a, 1.0); // replaces the float by a double
    EXPECT_EQ(cmp(*base, *typed), 1);

    // Keys that differ decide by their texts.
    AttribMap onlyA, onlyB;
    onlyA.setAttribute(a, 1.0f);
    onlyB.setAttribute(b, 1.0f);
    EXPECT_EQ(cmp(onlyA, onlyB), -1);
    EXPECT_EQ(cmp(onlyB, onlyA), 1);
}

// ---- paths ----------------------------------------------------------------------

TEST(AttribPathText, RendersStepsAndResolver) {
    TestPlugin node("Node", 12);
    AttribPath path;
    path.addPlugin(&node).addMember(nChildren).addItem(2).addMember(nTranslate).addComponent(1);
    EXPECT_EQ(path.toString(), "Node.children[2].translate,1");
    EXPECT_EQ(path.toString([](std::uint32_t id) { return format("#{}", id); }),
              "#12.children[2].translate,1");
    EXPECT_EQ(path.component(), 1u);
    EXPECT_EQ(AttribPath().toString(), "");
    EXPECT_THROW(path.addMember(nColor), invalid_argument);

    // Resolution walks members and items; the component step is the caller's.
    AttribArray* children = node.arrayAttribute(nChildren);
    for (int i = 0; i < 3; ++i)
        children->appendMap()->setAttribute(nTranslate, base_vec3<double>{double(i), 0, 0});
    Attribute* target = path.resolve();
    ASSERT_NE(target, nullptr);
    EXPECT_EQ(static_cast<const base_vec3<double>*>(target->data())->x, 2.0);
    children->removeItem(2);
    EXPECT_EQ(path.resolve(), nullptr);

    // Copies keep the root and walk again.
    AttribPath copy = path;
    children->appendMap()->setAttribute(nTranslate, base_vec3<double>{5, 0, 0});
    EXPECT_EQ(copy.root(), &node);
    ASSERT_NE(copy.resolve(), nullptr);
    EXPECT_EQ(copy.compare(path), 0);
}

} // namespace

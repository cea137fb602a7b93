// Registration of the scene types, fresh objects against the schema and the
// hand-typed defaults, the typed getter's failure rules and material
// inheritance.
#include "scene_getter.h"
#include "scene_interfaces.h"
#include "schema_expected.h"

#include "b_log.h"
#include "b_plugin_attribute.h"

#include <gtest/gtest.h>

#include <cctype>
#include <string>
#include <type_traits>
#include <variant>

namespace {

using namespace scene;
using base::ref, base::IPlugin, base::PluginFactory;

struct Registered : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("test")};

    Registered() { register_scene_schema(*factory); }

    ref<IPlugin> make(std::string_view type) {
        return factory->create(type, PluginFactory::createNullIfUnknown);
    }
    template <class I>
    ref<I> make(std::string_view type) {
        ref<IPlugin> object = make(type);
        return ref<I>(dynamic_cast<I*>(object.get()));
    }
};

const SchemaStruct* structOf(std::string_view type) {
    for (const SchemaStruct& s : schemaStructs())
        if (s.typeText == type)
            return &s;
    return nullptr;
}

// The row of 'attr' as 'type' sees it: its own or a base struct's.
const SchemaAttr* rowOf(std::string_view type, std::string_view attr) {
    for (const SchemaStruct* s = structOf(type); s; s = structOf(s->baseText))
        for (const SchemaAttr& a : s->attributes)
            if (a.nameText == attr)
                return &a;
    return nullptr;
}

// clang-format off
const std::string_view kTypes[] = {
    "scene", "light", "bufferAdapter", "buffer", "texture", "randomTexture", "noiseTexture",
    "vertColorTexture", "cellularTexture", "checkerTexture", "embeddedTexture",
    "curvatureTexture", "fileTexture", "cubistTexture", "dotsTexture", "mixTexture",
    "principalMaterial", "hairMaterial", "toonMaterial", "lightGroup", "node",
    "keyframeChannel", "animLayer", "instancer", "animClip", "lines", "points", "hair", "fur",
    "mesh", "skin", "morph", "environment", "camera", "clipPlane", "renderOutput",
    "sceneReference", "metadata"};
// clang-format on

TEST_F(Registered, TheTypesInOrderCreateObjectsOfTheirClass) {
    auto types = sceneTypes();
    ASSERT_EQ(types.size(), std::size(kTypes));
    for (std::size_t i = 0; i < types.size(); ++i) {
        SCOPED_TRACE(kTypes[i]);
        EXPECT_EQ(types[i].typeText, kTypes[i]);
        std::string iface = "I" + std::string(kTypes[i]);
        iface[1] = char(std::toupper(iface[1]));
        EXPECT_EQ(types[i].interfaceText, iface);

        auto* desc = dynamic_cast<SceneTypeDesc*>(factory->descriptor(types[i].type()).get());
        ASSERT_NE(desc, nullptr);
        EXPECT_EQ(desc->typeName().view(), kTypes[i]);
        EXPECT_EQ(desc->kind(), 1u);
        EXPECT_TRUE(desc->description().empty());
        ref<IPlugin> object = make(kTypes[i]);
        ASSERT_TRUE(object);
        EXPECT_EQ(object->className().view(), kTypes[i]);
        EXPECT_TRUE(object->entries().empty());
    }
    EXPECT_EQ(factory->types().size(), std::size(kTypes));

    // Classes and their bases.
    EXPECT_TRUE(make<IScene>("scene"));
    EXPECT_TRUE(make<IVertColorTexture>("vertColorTexture"));
    EXPECT_TRUE(make<IBitmapTexture>("fileTexture"));
    EXPECT_TRUE(make<IMaterial>("toonMaterial"));
    EXPECT_TRUE(make<ISubdividable>("morph"));
    EXPECT_TRUE(make<IGeometry>("fur"));
    EXPECT_FALSE(make<ISubdividable>("points"));
    EXPECT_TRUE(dynamic_cast<base::PluginCallback*>(make("bufferAdapter").get()));
    EXPECT_TRUE(dynamic_cast<base::PluginCallback*>(make("animLayer").get()));
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Registered, RegisteringAgainKeepsTheFirstDescriptors) {
    auto keep = [&](PluginFactory& f) {
        std::vector<base::IPluginDesc*> out;
        for (auto type : kTypes)
            out.push_back(f.descriptor(base::name_id(type)).get());
        return out;
    };
    const auto first = keep(*factory);
    register_scene_schema(*factory);
    EXPECT_EQ(keep(*factory), first);

    // Another factory shares the descriptors, except the one it already had.
    ref<PluginFactory> other(new PluginFactory("other"));
    ref<base::IPluginDesc> own(new base::PluginDescOf<IPlugin>("node"));
    other->registerPlugin(own);
    register_scene_schema(*other);
    auto second = keep(*other);
    EXPECT_EQ(second[20], own.get());
    second[20] = first[20];
    EXPECT_EQ(second, first);
}

// Every default of every registered type's struct and its bases, read from a
// fresh object; then written with the schema's type and read back, which
// needs the attribute factory to know every type the rows use.
TEST_F(Registered, FreshObjectsReadEveryDefaultOfTheirStructs) {
    std::size_t defaults = 0;
    for (const SceneType& type : sceneTypes()) {
        ref<IPlugin> object = make(type.typeText);
        ASSERT_TRUE(object);
        for (const SchemaStruct* s = structOf(type.typeText); s; s = structOf(s->baseText)) {
            for (const SchemaAttr& a : s->attributes) {
                if (!a.hasDefault())
                    continue;
                SCOPED_TRACE(std::string(type.typeText) + "." + std::string(a.nameText));
                ++defaults;
                std::visit(
                    [&](const auto& value) {
                        using T = std::decay_t<decltype(value)>;
                        EXPECT_EQ(get<T>(*object, a.name(), value), value);
                        object->setAttribute(a.name(), value);
                        const T* stored = object->findAttribute<T>(a.name());
                        ASSERT_NE(stored, nullptr);
                        EXPECT_EQ(*stored, value);
                    },
                    a.makeDefault());
            }
        }
    }
    EXPECT_GT(defaults, 500u);
    EXPECT_TRUE(log.entries().empty());

    // The published list, through the same reads.
    std::size_t checked = 0;
    for (const auto& e : scene_tests::kExpected) {
        if (!e.value || !factory->descriptor(base::name_id(e.type)))
            continue;
        SCOPED_TRACE(std::string(e.type) + "." + std::string(e.attr));
        ref<IPlugin> object = make(e.type);
        const SchemaAttr* row = rowOf(e.type, e.attr);
        ASSERT_TRUE(row && row->hasDefault());
        std::visit(
            [&](const auto& expected) {
                using T = std::decay_t<decltype(expected)>;
                EXPECT_EQ(get<T>(*object, row->name(), std::get<T>(row->makeDefault())), expected);
            },
            *e.value);
        ++checked;
    }
    EXPECT_GE(checked, 75u);
}

TEST_F(Registered, MistypedOrBrokenAttributesReadTheDefaultAndLogEachRead) {
    ref<INode> node = make<INode>("node");
    node->setAttribute(names::visible, 0.0f);
    EXPECT_TRUE(SCENE_GET(*node, node_schema, visible));
    EXPECT_TRUE(SCENE_GET(*node, node_schema, visible));
    EXPECT_EQ(log.count("map attribute| Detected invalid access to attribute 'visible'. Expected "
                        "'bool', actual attribute type - 'float'"),
              2u);
    EXPECT_EQ(log.entries().size(), 2u);

    log.clear();
    ref<INode> other = make<INode>("node");
    base::AttribPath path;
    path.addPlugin(other.get()).addMember(names::scale);
    node->attribute(names::scale, new base::AttribLink(path));
    EXPECT_EQ(SCENE_GET(*node, node_schema, scale), base::vec3f(1, 1, 1));
    ASSERT_EQ(log.entries().size(), 1u);
    EXPECT_EQ(log.entries()[0].message.rfind("map attribute| Detected invalid link attribute! "
                                             "Cannot resolve 'scale' with value '",
                                             0),
              0u);

    // Once the link resolves, the linked value is read.
    log.clear();
    other->setAttribute(names::scale, base::vec3f(2, 2, 2));
    EXPECT_EQ(SCENE_GET(*node, node_schema, scale), base::vec3f(2, 2, 2));
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(Registered, ClassesAnswerTheirSchemaAndInterfaces) {
    ref<INode> node = make<INode>("node");
    EXPECT_EQ(get(*node, INode::rotate, INode::rotateDefault), base::quatf(1, 0, 0, 0));
    node->setAttribute(names::distance, 4.0);
    EXPECT_EQ(SCENE_GET(*node, INode, distance), 4.0);
    // The plug-in's members, not the schema's name functions of the same names.
    node->setAttribute(names::name, base::string("arm"));
    EXPECT_EQ(node->name(), "arm");
    EXPECT_EQ(node->typeName().view(), "map");
    EXPECT_EQ(make<ILight>("light")->size(), 0u);

    IBounded* bounded = query<IBounded>(*node);
    ASSERT_NE(bounded, nullptr);
    EXPECT_EQ(bounded->interfaceOwner(), node.get());
    EXPECT_EQ(bounded->typeName().view(), "IBounded");
    EXPECT_EQ(bounded->cachedBounds(), base::box3d::empty());
    ASSERT_NE(query<IHierarchical>(*node), nullptr);
    EXPECT_EQ(query<IHierarchical>(*node)->typeName().view(), "IHierarchical");

    ref<IPlugin> mesh = make("mesh");
    EXPECT_NE(query<IBounded>(*mesh), nullptr);
    EXPECT_EQ(query<IHierarchical>(*mesh), nullptr);
    EXPECT_EQ(query<IBounded>(*make("camera")), nullptr);
}

TEST_F(Registered, MaterialsInheritWhatTheyDoNotHold) {
    const auto color = [](const IPlugin& m) {
        return SCENE_GET(m, principalMaterial_schema, color);
    };
    const base::vec3f red(1, 0, 0), blue(0, 0, 1);

    ref<IMaterial> parent = make<IMaterial>("principalMaterial");
    ref<IMaterial> child = make<IMaterial>("principalMaterial");
    parent->setAttribute(names::color, red);
    parent->setAttribute(names::roughness, 0.7f);
    ASSERT_TRUE(child->inheritFrom(parent.get()));
    EXPECT_EQ(child->inherited(), parent.get());
    EXPECT_EQ(color(*child), red);
    child->setAttribute(names::color, blue);
    EXPECT_EQ(color(*child), blue);
    EXPECT_FLOAT_EQ(SCENE_GET(*child, principalMaterial_schema, roughness), 0.7f);

    // Clones inherit from the same material.
    ref<IPlugin> copy = ref<IPlugin>::adopt(static_cast<IPlugin*>(child->clone()));
    EXPECT_FLOAT_EQ(SCENE_GET(*copy, principalMaterial_schema, roughness), 0.7f);

    // Itself, directly or round a cycle, is refused and changes nothing.
    EXPECT_TRUE(log.entries().empty());
    EXPECT_FALSE(child->inheritFrom(child.get()));
    EXPECT_FALSE(parent->inheritFrom(child.get()));
    const auto entries = log.entries();
    ASSERT_EQ(entries.size(), 2u);
    for (const auto& e : entries) {
        EXPECT_EQ(e.message, "The object can't inherit itself!");
        EXPECT_EQ(e.channel, base::logScene);
        EXPECT_EQ(e.level, base::logError);
    }
    EXPECT_EQ(child->base(), parent.get());
    EXPECT_EQ(parent->base(), nullptr);
    EXPECT_EQ(child->inherited(), parent.get());

    // An "inherit" set directly takes effect on update; a self reference does not.
    ref<IMaterial> loaded = make<IMaterial>("hairMaterial");
    loaded->setAttribute(names::inherit, ref<IPlugin>(parent.get()));
    loaded->postLoad();
    EXPECT_EQ(color(*loaded), red);
    loaded->setAttribute(names::inherit, ref<IPlugin>(loaded.get()));
    EXPECT_FALSE(loaded->updateInheritance());
    EXPECT_EQ(loaded->base(), parent.get());
    loaded->removeAttribute(names::inherit);
    EXPECT_TRUE(loaded->updateInheritance());
    EXPECT_EQ(loaded->base(), nullptr);

    // Null drops the inheritance.
    ASSERT_TRUE(child->inheritFrom(nullptr));
    EXPECT_EQ(child->findEntry(names::inherit), nullptr);
    EXPECT_FLOAT_EQ(SCENE_GET(*child, principalMaterial_schema, roughness), 0.2f);
}

TEST_F(Registered, InheritanceEndsWhenTheBaseDies) {
    ref<IMaterial> parent(dynamic_cast<IMaterial*>(
        factory->create("principalMaterial", PluginFactory::createUnregistered).get()));
    ref<IMaterial> child = make<IMaterial>("principalMaterial");
    parent->setAttribute(names::roughness, 0.9f);
    ASSERT_TRUE(child->inheritFrom(parent.get()));
    IMaterial* raw = parent.get();
    parent.reset();
    // "inherit" keeps it alive.
    EXPECT_EQ(child->base(), raw);
    EXPECT_FLOAT_EQ(SCENE_GET(*child, principalMaterial_schema, roughness), 0.9f);
    // Dropping the attribute alone releases it; the base goes with it.
    child->removeAttribute(names::inherit);
    EXPECT_EQ(child->base(), nullptr);
    EXPECT_FLOAT_EQ(SCENE_GET(*child, principalMaterial_schema, roughness), 0.2f);
}

} // namespace

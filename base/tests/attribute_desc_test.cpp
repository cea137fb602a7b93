// Attribute descriptors and their XML loader.
#include "b_attribute_desc.h"
#include "b_log.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>

using namespace base;

namespace {

std::size_t loadText(AttribDescManager& manager, std::string_view xml, CaptureLog& capture) {
    ScopedLog scoped(capture);
    return manager.loadFromString(xml, "test.xml");
}

// The attribute "a" of class "c", described by the XML attributes given.
ref<AttribDesc> loadOne(std::string_view attributes, CaptureLog& capture) {
    AttribDescManager manager;
    std::string xml = "<Document><AttributeMap class='c'><Attribute name='a' ";
    xml.append(attributes).append("/></AttributeMap></Document>");
    if (loadText(manager, xml, capture) != 1)
        return {};
    return ref<AttribDesc>(manager.find(name_id("c"))->findAttribute(name_id("a")));
}

void expectOnly(const CaptureLog& capture, int level, std::string_view message) {
    const auto entries = capture.entries();
    ASSERT_EQ(entries.size(), 1u);
    EXPECT_EQ(entries[0].level, level);
    EXPECT_EQ(entries[0].channel, logSystem);
    EXPECT_EQ(std::string_view(entries[0].message), message);
}

} // namespace

TEST(AttribDescLoad, ReadsEveryFieldAndFlagInDocumentOrder) {
    const char* xml = R"(<?xml version="1.0"?>
<Document>
  <AttributeMap class="descLight" inherit="descNode" abstract="yes" friend="descCamera"
                namespace="scene" destination="render" constructor="makeLight" flags="0x11"
                singleInstance="1" customDescriptor="lightDesc">
    <Attribute name="zeta" label="Zeta" type="vec3f" control="color" initialisator="init"
               action="refresh" default="1,1,1" soft_min="0" soft_max="10" units="cm"
               enum="a|b" help="Some help." precision="3" control-lines="4" visible="no"
               resource="true" optional="TRUE" read-only="1" cmdline="yes" state="Yes"
               keyable="true"/>
    <Attribute name="alpha"/>
  </AttributeMap>
</Document>)";
    AttribDescManager manager;
    CaptureLog capture;
    ASSERT_EQ(loadText(manager, xml, capture), 1u);
    EXPECT_TRUE(capture.entries().empty());

    ref<AttribMapDesc> map = manager.find(name_id("descLight"));
    ASSERT_TRUE(map);
    EXPECT_EQ(map->className(), name_id("descLight"));
    EXPECT_EQ(map->inherit, name_id("descNode"));
    EXPECT_TRUE(map->abstract && map->singleInstance);
    EXPECT_EQ(map->flags, 0x11u);
    for (auto [member, text] : {std::pair{&AttribMapDesc::friendClasses, "descCamera"},
                                {&AttribMapDesc::nameSpace, "scene"},
                                {&AttribMapDesc::destination, "render"},
                                {&AttribMapDesc::constructor, "makeLight"},
                                {&AttribMapDesc::customDescriptor, "lightDesc"}})
        EXPECT_EQ((*map).*member, text);

    ASSERT_EQ(map->attributes().size(), 2u);
    EXPECT_EQ(map->attributes()[0]->name, name_id("zeta"));
    EXPECT_EQ(map->attributes()[1]->name, name_id("alpha"));
    const AttribDesc* full = map->findAttribute(name_id("zeta"));
    ASSERT_EQ(full, map->attributes()[0].get());
    EXPECT_EQ(full->type, name_id("vec3f"));
    EXPECT_EQ(full->controlLines, 4u);
    for (auto [member, text] : {std::pair{&AttribDesc::label, "Zeta"},
                                {&AttribDesc::control, "color"},
                                {&AttribDesc::initialisator, "init"},
                                {&AttribDesc::action, "refresh"},
                                {&AttribDesc::defaultValue, "1,1,1"},
                                {&AttribDesc::softMin, "0"},
                                {&AttribDesc::softMax, "10"},
                                {&AttribDesc::units, "cm"},
                                {&AttribDesc::enumValues, "a|b"},
                                {&AttribDesc::help, "Some help."},
                                {&AttribDesc::precision, "3"}})
        EXPECT_EQ((*full).*member, text);
    // Every bit but visible, by value, so that a swapped constant shows.
    EXPECT_EQ(full->flags, 2u | 4u | 8u | 16u | 32u | 64u);
    EXPECT_TRUE(full->has(AttribDesc::readOnly) && !full->has(AttribDesc::visible));

    const AttribDesc* bare = map->findAttribute(name_id("alpha"));
    ASSERT_TRUE(bare);
    EXPECT_EQ(bare->flags, 1u);
    EXPECT_FALSE(bare->type);
    EXPECT_EQ(bare->controlLines, 0u);
    EXPECT_TRUE(bare->label.empty() && bare->defaultValue.empty() && bare->help.empty());
    EXPECT_EQ(map->findAttribute(name_id("beta")), nullptr);
}

TEST(AttribDescLoad, TypesControlLinesAndFlags) {
    const struct {
        const char* attributes;
        const char* type;
        std::uint32_t controlLines;
        std::uint32_t flags;
    } cases[] = {
        {"type='quat'", "quatf", 0, 1},
        {"type='quat[]'", "quatf[]", 0, 1},
        {"arrayof='vec3f'", "vec3f[]", 0, 1},
        {"arrayof='quat'", "quatf[]", 0, 1},
        {"arrayof='plugin' type='string'", "plugin[]", 0, 1},
        {"arrayof='true' type='float'", "float[]", 0, 1},
        {"control-lines='3'", "", 3, 1},
        {"control-lines='many'", "", 6, 1},
        {"control-lines='3x'", "", 6, 1},
        {"control-lines='-1'", "", 6, 1},
        {"control-lines='4294967296'", "", 6, 1},
        {"visible='false'", "", 0, 0},
        {"visible='0' keyable='1'", "", 0, 64},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.attributes);
        CaptureLog capture;
        ref<AttribDesc> desc = loadOne(c.attributes, capture);
        ASSERT_TRUE(desc);
        EXPECT_STREQ(desc->type.c_str(), c.type);
        EXPECT_EQ(desc->controlLines, c.controlLines);
        EXPECT_EQ(desc->flags, c.flags);
        EXPECT_TRUE(capture.entries().empty());
    }
}

TEST(AttribDescLoad, BadItemsAreSkippedWithAWarning) {
    const char* xml = R"(<Document>
  <AttributeMap class="descDup"><Attribute type="int"/><Attribute name="x" type="int" visible="maybe"/>
    <Attribute name="x" type="float"/></AttributeMap>
  <AttributeMap><Attribute name="orphan"/></AttributeMap>
  <AttributeMap class="descDup"><Attribute name="y"/></AttributeMap>
</Document>)";
    AttribDescManager manager;
    CaptureLog capture;
    EXPECT_EQ(loadText(manager, xml, capture), 1u);
    EXPECT_EQ(manager.size(), 1u);
    ref<AttribMapDesc> map = manager.find(name_id("descDup"));
    ASSERT_TRUE(map);
    ASSERT_EQ(map->attributes().size(), 1u);
    EXPECT_EQ(map->attributes()[0]->type, name_id("int"));
    EXPECT_EQ(map->attributes()[0]->flags, 1u);

    const std::string_view expected[] = {
        "attribute descriptors| Skipping an Attribute without a name (class 'descDup' in "
        "'test.xml').",
        "attribute descriptors| Ignoring visible=\"maybe\" (attribute 'x' of class 'descDup' in "
        "'test.xml'): not a boolean.",
        "attribute descriptors| Skipping a second attribute 'x' (class 'descDup' in 'test.xml').",
        "attribute descriptors| Skipping an AttributeMap without a class in 'test.xml'.",
        "attribute descriptors| Class 'descDup' is already described; ignoring the one in "
        "'test.xml'.",
    };
    const auto entries = capture.entries();
    ASSERT_EQ(entries.size(), std::size(expected));
    for (std::size_t i = 0; i < entries.size(); ++i) {
        EXPECT_EQ(std::string_view(entries[i].message), expected[i]);
        EXPECT_EQ(entries[i].level, logWarning);
    }
}

TEST(AttribDescLoad, UnusableDocumentsLogOneErrorAndLoadNothing) {
    const struct {
        const char* xml;
        const char* message;
    } cases[] = {
        {"<Document><AttributeMap class='descBad'><Attribute name='a'/></Document>",
         "attribute descriptors| Unable to load 'test.xml': Start-end tags mismatch at offset "
         "63."},
        {"", "attribute descriptors| Unable to load 'test.xml': No document element found at "
             "offset 0."},
        {"<AttributeMap class='descBad'/>",
         "attribute descriptors| No Document/AttributeMap element in 'test.xml'."},
        {"<Document><Attribute name='a'/></Document>",
         "attribute descriptors| No Document/AttributeMap element in 'test.xml'."},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.xml);
        AttribDescManager manager;
        CaptureLog capture;
        EXPECT_EQ(loadText(manager, c.xml, capture), 0u);
        EXPECT_EQ(manager.size(), 0u);
        expectOnly(capture, logError, c.message);
    }
}

TEST(AttribDescLoad, ReadsAFileAndReportsUnreadablePaths) {
    const std::string dir = testing::TempDir();
    const std::string path = dir + "attribute_desc_test.xml";
    std::FILE* f = std::fopen(path.c_str(), "wb");
    ASSERT_TRUE(f);
    std::fputs("<Document><AttributeMap class='descFile'><Attribute name='q' type='quat'/>"
               "</AttributeMap></Document>",
               f);
    std::fclose(f);
    AttribDescManager manager;
    CaptureLog capture;
    ScopedLog scoped(capture);
    EXPECT_EQ(manager.load(path), 1u);
    ref<AttribMapDesc> map = manager.find(name_id("descFile"));
    ASSERT_TRUE(map);
    EXPECT_EQ(map->findAttribute(name_id("q"))->type, name_id("quatf"));
    std::remove(path.c_str());

    // A directory must not be read as a file, and a path with a NUL must not
    // open the file named by its first part.
    const std::pair<std::string, const char*> failures[] = {
        {path, "File was not found"},
        {dir, "Not a regular file"},
        {dir + std::string(1, '\0') + "x", "The path contains a NUL character"},
    };
    for (const auto& [bad, reason] : failures) {
        capture.clear();
        EXPECT_EQ(manager.load(bad), 0u);
        expectOnly(capture, logError,
                   "attribute descriptors| Unable to load '" + std::string(bad.c_str()) +
                       "': " + reason + ".");
    }
    EXPECT_EQ(manager.size(), 1u);
}

TEST(AttribDescManager, ProcessWideKeeperAndFirstAddWins) {
    EXPECT_EQ(&attribDescManager(), &attribDescManager());
    AttribDescManager manager;
    ref<AttribMapDesc> first(new AttribMapDesc(name_id("descAdd")));
    EXPECT_TRUE(manager.add(first));
    EXPECT_FALSE(manager.add(ref<AttribMapDesc>(new AttribMapDesc(name_id("descAdd")))));
    EXPECT_EQ(manager.find(name_id("descAdd")), first);
    EXPECT_FALSE(manager.find(name_id("descNeverAdded")));
}

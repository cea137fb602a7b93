// The schema rows against themselves and against a hand-typed list of the
// scene model's published types and defaults.
#include "scene_schema.h"
#include "schema_expected.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace {

using namespace scene;
using base::vec2f, base::vec3f, base::vec4f, base::vec3d, base::vec2i, base::quatf;

struct Schema : ::testing::Test {
    static void SetUpTestSuite() {
        init_schema_names();
        init_importer_schema_names();
        init_exporter_schema_names();
    }
};

std::set<std::string_view> textsOf(std::span<const SchemaName> set) {
    std::set<std::string_view> texts;
    for (const auto& n : set)
        texts.insert(n.text);
    return texts;
}

// The row of `attr` as seen from `type`: declared there or by one of its bases.
const SchemaAttr* findAttr(std::string_view type, std::string_view attr) {
    auto structs = schemaStructs();
    auto options = optionSchemaStructs();
    std::vector<SchemaStruct> all(structs.begin(), structs.end());
    all.insert(all.end(), options.begin(), options.end());
    while (!type.empty()) {
        auto s = std::find_if(all.begin(), all.end(),
                              [&](const SchemaStruct& s) { return s.typeText == type; });
        if (s == all.end())
            return nullptr;
        for (const auto& a : s->attributes)
            if (a.nameText == attr)
                return &a;
        type = s->baseText;
    }
    return nullptr;
}

TEST_F(Schema, NameSetsHaveTheirCountsAndShareConstants) {
    EXPECT_EQ(schemaNames().size(), 584u);
    EXPECT_EQ(textsOf(schemaNames()).size(), 584u);
    EXPECT_EQ(textsOf(importerSchemaNames()).size(), 35u);
    EXPECT_EQ(importerSchemaNames().size(), 35u);
    EXPECT_EQ(textsOf(exporterSchemaNames()).size(), 17u);

    std::map<std::string_view, base::name_id*> core;
    std::set<base::name_id> ids;
    for (const auto& n : schemaNames()) {
        core[n.text] = n.slot;
        EXPECT_EQ(n.id().view(), n.text);
        EXPECT_EQ(n.id(), base::nameServer().find(n.text));
        ids.insert(n.id());
    }
    EXPECT_EQ(ids.size(), 584u);

    // A text of both sets is one constant, not two that happen to be equal.
    std::set<std::string_view> shared;
    for (auto set : {importerSchemaNames(), exporterSchemaNames()})
        for (const auto& n : set) {
            EXPECT_EQ(n.id().view(), n.text);
            if (core.count(n.text)) {
                shared.insert(n.text);
                EXPECT_EQ(core[n.text], n.slot) << n.text;
            }
        }
    EXPECT_EQ(shared, (std::set<std::string_view>{"flipNormals", "computeNormalsMethod",
                                                  "computeNormalsAngle", "computeTangentsMethod",
                                                  "resourcePaths"}));
    EXPECT_EQ(names::flipNormals, mesh_schema::flipNormals());
    EXPECT_EQ(names::flipNormals, sceneImporter_schema::flipNormals());

    // Interning again changes nothing.
    const base::name_id visible = names::visible;
    init_schema_names();
    init_importer_schema_names();
    EXPECT_EQ(names::visible, visible);
    EXPECT_EQ(names::type_.view(), "type");
    EXPECT_EQ(names::private_.view(), "private");
}

TEST_F(Schema, EveryRowUsesNamesOfItsOwnSet) {
    auto core = textsOf(schemaNames());
    std::set<std::string_view> used;
    for (const auto& a : schemaTable()) {
        EXPECT_TRUE(core.count(a.structText) && core.count(a.nameText)) << a.nameText;
        EXPECT_EQ(a.name().view(), a.nameText);
        used.insert(a.structText);
        used.insert(a.nameText);
    }
    for (const auto& s : schemaStructs())
        used.insert(s.typeText);
    // Every core name is a struct or an attribute, except four spare names.
    std::set<std::string_view> unused;
    for (auto t : core)
        if (!used.count(t))
            unused.insert(t);
    EXPECT_EQ(unused, (std::set<std::string_view>{"sphere", "quad", "disk", "cube"}));

    auto importer = textsOf(importerSchemaNames());
    for (const auto& a : optionSchemaTable())
        if (a.structText == "sceneImporter") {
            EXPECT_TRUE(importer.count(a.nameText)) << a.nameText;
        }
}

TEST_F(Schema, StructsAreInTableOrderWithTheirBases) {
    // struct, base ("" for none), number of attributes it declares
    struct Row {
        std::string_view type, base;
        std::size_t count;
    };
    const Row expected[] = {
        {"scene", "", 20},
        {"node", "", 32},
        {"geometry", "", 32},
        {"subdividable", "geometry", 9},
        {"mesh", "subdividable", 27},
        {"meshPrimitive", "", 12},
        {"meshUVSet", "", 6},
        {"meshColorSet", "", 6},
        {"meshJointsSet", "", 6},
        {"meshBindPoseSet", "", 2},
        {"points", "geometry", 3},
        {"lines", "geometry", 7},
        {"hair", "geometry", 10},
        {"fur", "geometry", 13},
        {"geometryLOD", "", 2},
        {"instancer", "", 5},
        {"buffer", "", 3},
        {"bufferAdapter", "", 10},
        {"skin", "subdividable", 5},
        {"morph", "subdividable", 7},
        {"morphTarget", "", 2},
        {"sceneReference", "", 2},
        {"metadata", "", 14},
        {"workflow", "", 10},
        {"script", "", 2},
        {"scriptOutput", "", 2},
        {"historyEvent", "", 2},
        {"texture", "", 20},
        {"bitmapTexture", "texture", 9},
        {"fileTexture", "bitmapTexture", 3},
        {"embeddedTexture", "bitmapTexture", 7},
        {"randomTexture", "texture", 7},
        {"noiseTexture", "texture", 8},
        {"vertColorTexture", "texture", 2},
        {"cellularTexture", "texture", 4},
        {"checkerTexture", "texture", 2},
        {"curvatureTexture", "texture", 7},
        {"cubistTexture", "texture", 4},
        {"dotsTexture", "texture", 6},
        {"mixTexture", "texture", 5},
        {"material", "", 7},
        {"principalMaterial", "material", 41},
        {"customMaterial", "", 2},
        {"hairMaterial", "material", 6},
        {"toonMaterial", "material", 27},
        {"camera", "", 20},
        {"stereoCamera", "", 3},
        {"light", "", 30},
        {"lightGroup", "", 5},
        {"environment", "", 48},
        {"clipPlane", "", 10},
        {"renderOutput", "", 43},
        {"outputJob", "", 41},
        {"compositingChannel", "", 10},
        {"animClip", "", 4},
        {"animLayer", "", 5},
        {"animLayerAction", "", 3},
        {"keyframeChannel", "", 3},
        {"keyframeChannelCurve", "", 9},
    };
    auto structs = schemaStructs();
    ASSERT_EQ(structs.size(), std::size(expected));
    for (std::size_t i = 0; i < structs.size(); ++i) {
        EXPECT_EQ(structs[i].typeText, expected[i].type);
        EXPECT_EQ(structs[i].baseText, expected[i].base) << expected[i].type;
        EXPECT_EQ(structs[i].attributes.size(), expected[i].count) << expected[i].type;
        EXPECT_EQ(structs[i].virtualBase, expected[i].type == "subdividable");
        EXPECT_EQ(structs[i].type(), base::name_id(expected[i].type));
        for (const auto& a : structs[i].attributes)
            EXPECT_EQ(a.structText, expected[i].type);
    }
    static_assert(std::is_base_of_v<geometry_schema, skin_schema>);
    static_assert(std::is_base_of_v<texture_schema, fileTexture_schema>);
    static_assert(!std::is_base_of_v<material_schema, customMaterial_schema>);

    // Whole structs in declaration order.
    const std::vector<std::string_view> sceneOrder = {
        "name",          "root",        "components",       "useLightGroups",
        "environment",   "linearUnits", "framesPerSecond",  "snapOnFrames",
        "loopAnimation", "autoKey",     "resourcePaths",    "animLayers",
        "time",          "startTime",   "endTime",          "playSpeed",
        "upAxis",        "showConsole", "consoleVerbosity", "logVerbosity"};
    const std::vector<std::string_view> importerOrder = {"keepInSync",
                                                         "importMeshes",
                                                         "importTriangulateMeshes",
                                                         "importSurfaces",
                                                         "importTriangulateSurfaces",
                                                         "importSubdivision",
                                                         "importTessellation",
                                                         "importColors",
                                                         "importMultiIndex",
                                                         "importTextureCoordinates",
                                                         "importNormals",
                                                         "computeNormalsMethod",
                                                         "computeNormalsAngle",
                                                         "flipNormals",
                                                         "importTangents",
                                                         "computeTangentsMethod",
                                                         "importVelocities",
                                                         "importSkeletons",
                                                         "importEdges",
                                                         "importMaterials",
                                                         "importLights",
                                                         "importCameras",
                                                         "importAnimations",
                                                         "importBakedAnimations",
                                                         "importHair",
                                                         "importPoints",
                                                         "importFilename",
                                                         "modificationDate",
                                                         "hashMethod",
                                                         "compressionMethod",
                                                         "compressionLevel",
                                                         "includeResources",
                                                         "textColumns",
                                                         "importValidate"};
    const std::vector<std::string_view> nodeOrder = {
        "name",          "children",       "bounds",          "visible",
        "animate",       "motionBlur",     "transformation",  "inheritsTransform",
        "translate",     "translatePivot", "rotateMode",      "rotateOrder",
        "rotate",        "rotateEuler",    "rotateAxisAngle", "rotatePivot",
        "scale",         "scalePivot",     "shear",           "targetPosition",
        "rotationAxes",  "distance",       "azimuth",         "altitude",
        "materialIndex", "cameraIndex",    "geometryIndex",   "color",
        "selectable",    "lock",           "isLayer",         "isJoint"};
    auto order = [](const SchemaStruct& s) {
        std::vector<std::string_view> texts;
        for (const auto& a : s.attributes)
            texts.push_back(a.nameText);
        return texts;
    };
    EXPECT_EQ(order(structs[0]), sceneOrder);
    EXPECT_EQ(order(structs[1]), nodeOrder);
    EXPECT_EQ(order(optionSchemaStructs()[0]), importerOrder);
    EXPECT_EQ(optionSchemaStructs()[1].attributes.size(), 16u);
}

// The type-name text of the value a default holds.
std::string_view typeNameOf(const SchemaValue& v) {
    static constexpr std::string_view texts[] = {
        "bool",  "uint8", "uint16", "uint32", "int",   "float", "double", "vec2f",
        "vec3f", "vec4f", "vec3d",  "vec2i",  "quatf", "box3d", "string", "TimeCode"};
    static_assert(std::size(texts) == std::variant_size_v<SchemaValue>);
    return texts[v.index()];
}

TEST_F(Schema, EveryDefaultHoldsItsLabelsType) {
    const std::set<std::string_view> known = {
        "bool",  "uint8", "uint16", "uint32", "int",    "float",    "double", "vec2f",
        "vec3f", "vec4f", "vec2d",  "vec3d",  "vec4d",  "vec2i",    "quatf",  "quatd",
        "box3f", "box3d", "mat43",  "normal", "string", "TimeCode", "plugin", "array"};
    for (auto table : {schemaTable(), optionSchemaTable()})
        for (const auto& a : table) {
            SCOPED_TRACE(std::string(a.structText) + "." + std::string(a.nameText));
            if (a.declared == "byte") {
                EXPECT_EQ(a.label, "uint8");
            }
            // Every alternative is a base type name or its array form.
            for (std::string_view rest = a.label; !rest.empty();) {
                auto one = rest.substr(0, rest.find('|'));
                rest.remove_prefix(std::min(rest.size(), one.size() + 1));
                if (one.ends_with("[]"))
                    one.remove_suffix(2);
                EXPECT_TRUE(known.count(one)) << one;
            }
            if (!a.hasDefault())
                continue;
            const SchemaValue v = a.makeDefault();
            EXPECT_EQ(typeNameOf(v), a.label);
        }

    // Defaults are built per call: changing one leaves the next untouched.
    auto a = findAttr("sceneImporter", "hashMethod");
    ASSERT_TRUE(a && a->hasDefault());
    SchemaValue first = a->makeDefault();
    std::get<base::string>(first) += "64";
    EXPECT_EQ(a->makeDefault(), SchemaValue(base::string("xx")));
    auto s = sceneImporter_schema::compressionMethodDefault();
    s.clear();
    EXPECT_EQ(sceneImporter_schema::compressionMethodDefault(), "zip");
}

using scene_tests::kExpected;

TEST_F(Schema, DefaultsMatchTheHandTypedList) {
    for (const auto& e : kExpected) {
        SCOPED_TRACE(std::string(e.type) + "." + std::string(e.attr));
        const SchemaAttr* a = findAttr(e.type, e.attr);
        ASSERT_NE(a, nullptr);
        ASSERT_EQ(a->hasDefault(), e.value.has_value());
        if (e.value) {
            EXPECT_EQ(a->makeDefault(), *e.value);
        }
    }
    // The same through the schema structs, bases included.
    EXPECT_EQ(mesh_schema::visibleDefault(), true);
    EXPECT_EQ(morph_schema::visibleDefault(), true);
    EXPECT_EQ(fileTexture_schema::gammaDefault(), 2.2f);
    EXPECT_EQ(fileTexture_schema::borderAlphaDefault(), 1.0f);
    EXPECT_EQ(bufferAdapter_schema::inputLengthDefault(), 0xFFFFFFFFu);
    EXPECT_EQ(embeddedTexture_schema::type_(), names::type_);
}

TEST_F(Schema, LabelsOfDecidedAndMixedTypes) {
    const std::pair<std::pair<std::string_view, std::string_view>, std::string_view> labels[] = {
        {{"embeddedTexture", "format"}, "uint32"},
        {{"embeddedTexture", "type"}, "uint8"},
        {{"embeddedTexture", "pixelData"}, "uint8[]"},
        {{"texture", "rotate"}, "vec3f"},
        {{"node", "bounds"}, "box3d"},
        {{"node", "translatePivot"}, ""},
        {{"scene", "time"}, "TimeCode"},
        {{"sceneImporter", "keepInSync"}, "uint8"},
        {{"metadata", "title"}, ""},
        {{"mesh", "normals"}, "normal[]"},
        {{"mesh", "primitives"}, "array"},
        {{"skin", "joints"}, "plugin[]"},
        {{"meshPrimitive", "triIndexStart"}, "uint32"},
        {{"lines", "linesStart"}, "uint32[]"},
        {{"bufferAdapter", "outputFloat3"}, "vec3f[]"},
        {{"keyframeChannelCurve", "times"}, "TimeCode[]"},
        {{"animLayer", "outputs"}, "array"},
    };
    for (const auto& [where, label] : labels) {
        const SchemaAttr* a = findAttr(where.first, where.second);
        ASSERT_NE(a, nullptr) << where.second;
        EXPECT_EQ(a->label, label) << where.first << "." << where.second;
    }

    const SchemaAttr* vcounts = findAttr("meshPrimitive", "vcounts");
    EXPECT_TRUE(vcounts->accepts("uint16") && vcounts->accepts("uint16[]"));
    EXPECT_FALSE(vcounts->accepts("uint32") || vcounts->accepts("uint16[][]"));
    const SchemaAttr* counts = findAttr("meshJointsSet", "jointCounts");
    EXPECT_TRUE(counts->accepts("uint8[]") && counts->accepts("uint16[]"));
    EXPECT_TRUE(findAttr("metadata", "author")->accepts("string"));
    EXPECT_FALSE(findAttr("node", "visible")->accepts("float"));
}

TEST_F(Schema, CommandLineSwitchesFollowTheOptions) {
    auto rows = importerCommandLineOptions();
    ASSERT_EQ(rows.size(), 26u);
    std::set<std::string_view> enums = {"importMultiIndex", "importNormals", "computeNormalsMethod",
                                        "importTangents", "computeTangentsMethod"};
    for (const auto& r : rows) {
        const std::string_view attr = r.attribute().view();
        EXPECT_EQ(r.option, "-" + std::string(attr));
        ASSERT_NE(findAttr("sceneImporter", attr), nullptr) << attr;
        const std::string_view kind = enums.count(attr)              ? "string"
                                      : attr == "importTessellation" ? "float"
                                                                     : "bool";
        EXPECT_EQ(r.valueType, kind) << attr;
        EXPECT_FALSE(r.help.empty());
    }
    EXPECT_EQ(rows.front().option, "-keepInSync");
    EXPECT_EQ(rows.back().option, "-importValidate");
    EXPECT_NE(rows[2].help.find("done on te fly"), std::string_view::npos);
    EXPECT_EQ(rows[7].help, "Whether to import the mesh vertex colors. ");
}

} // namespace

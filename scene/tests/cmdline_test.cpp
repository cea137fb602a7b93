// The scene library's command-line options: registration, and parsed values
// turned into attributes of the schema's types.
#include "scene_cmdline.h"
#include "scene_getter.h"
#include "scene_interfaces.h"

#include "b_log.h"

#include <gtest/gtest.h>

#include <string>
#include <variant>

namespace {

using namespace scene;
using base::ref, base::IPlugin, base::PluginFactory;

base::vector<std::string_view> split(std::string_view line) {
    base::vector<std::string_view> args;
    while (!line.empty()) {
        const auto blank = line.find(' ');
        args.push_back(line.substr(0, blank));
        line = blank == std::string_view::npos ? std::string_view() : line.substr(blank + 1);
    }
    return args;
}

struct SceneCmdLine : ::testing::Test {
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("test")};
    base::CmdLineOptions options;
    // Stands in for an importer object: the options are its attributes.
    base::AttribMap importer;

    SceneCmdLine() {
        register_scene_schema(*factory);
        init_importer_schema_names();
        register_importer_options(options);
        factory->descriptor(names::scene)->registerOptions(options);
    }

    bool parse(std::string_view line, base::AttribMap& object, base::name_id schema) {
        base::string error;
        options.reset();
        if (!options.parse(split(line), error) ||
            !apply_command_line(options, object, schema, error)) {
            lastError = error;
            return false;
        }
        return true;
    }
    base::string lastError;
};

TEST_F(SceneCmdLine, OneOptionPerSettingInTableOrder) {
    auto rows = importerCommandLineOptions();
    ASSERT_EQ(options.size(), rows.size() + 1);
    for (std::size_t i = 0; i < rows.size(); ++i) {
        const base::CmdLineOption& o = *options.options()[i];
        EXPECT_EQ(o.name(), rows[i].option);
        EXPECT_TRUE(o.altName().empty());
        EXPECT_EQ(o.help(), rows[i].help);
        EXPECT_EQ(o.valueType(), rows[i].valueType);
        EXPECT_EQ(o.minValues(), 1u);
        EXPECT_EQ(o.maxValues(), 1u);
    }
    const base::CmdLineOption& up = *options.options().back();
    EXPECT_EQ(up.name(), "-upAxis");
    EXPECT_EQ(up.help(), "Set the up axis.");
    EXPECT_EQ(up.valueType(), "string");

    // Again, through every descriptor: nothing new, the first options stay.
    const base::CmdLineOption* first = options.options()[0].get();
    register_importer_options(options);
    for (base::name_id type : factory->types())
        factory->descriptor(type)->registerOptions(options);
    EXPECT_EQ(options.size(), rows.size() + 1);
    EXPECT_EQ(options.options()[0].get(), first);
    EXPECT_TRUE(log.entries().empty());
}

struct ApplyCase {
    std::string_view args;
    std::string_view attr;
    SchemaValue value;
};

TEST_F(SceneCmdLine, ValuesBecomeAttributesOfTheSchemaTypes) {
    const ApplyCase cases[] = {
        {"-importNormals 0", "importNormals", std::uint8_t(0)},
        {"-importNormals generate", "importNormals", std::uint8_t(2)},
        {"-importTangents FILE", "importTangents", std::uint8_t(1)},
        {"-importTangents none", "importTangents", std::uint8_t(0)},
        {"-importMultiIndex auto", "importMultiIndex", std::uint8_t(2)},
        {"-computeNormalsMethod 3", "computeNormalsMethod", std::uint8_t(3)},
        {"-computeTangentsMethod default", "computeTangentsMethod", std::uint8_t(0)},
        {"-importMeshes off", "importMeshes", false},
        {"-importSurfaces on", "importSurfaces", std::uint8_t(1)},
        {"-flipNormals 1", "flipNormals", std::uint8_t(1)},
        {"-importTessellation 2.5", "importTessellation", 2.5f},
    };
    for (const ApplyCase& c : cases) {
        SCOPED_TRACE(c.args);
        base::AttribMap object;
        ASSERT_TRUE(parse(c.args, object, sceneImporter_schema::type())) << lastError;
        ASSERT_EQ(object.entries().size(), 1u);
        const base::name_id name(c.attr);
        std::visit(
            [&](const auto& expected) {
                using T = std::decay_t<decltype(expected)>;
                const T* stored = object.findAttribute<T>(name);
                ASSERT_NE(stored, nullptr);
                EXPECT_EQ(*stored, expected);
            },
            c.value);
    }

    // An entry of another type is replaced; readers then see the value.
    importer.setAttribute(names::importNormals, true);
    ASSERT_TRUE(
        parse("-importNormals 1 -importMeshes false", importer, sceneImporter_schema::type()));
    EXPECT_EQ(SCENE_GET(importer, sceneImporter_schema, importNormals), 1);
    EXPECT_FALSE(SCENE_GET(importer, sceneImporter_schema, importMeshes));

    // Only the struct's own options: "-upAxis" goes to a scene, not an importer.
    ref<IPlugin> scene = factory->create("scene", PluginFactory::createNullIfUnknown);
    ASSERT_TRUE(parse("-upAxis Z -importMeshes true", *scene, scene_schema::type()));
    EXPECT_EQ(scene->entries().size(), 1u);
    EXPECT_EQ(SCENE_GET(*scene, scene_schema, upAxis), 2);
    EXPECT_TRUE(log.entries().empty());
}

TEST_F(SceneCmdLine, BadValuesAreReportedAndChangeNothing) {
    importer.setAttribute(names::importNormals, std::uint8_t(1));
    EXPECT_FALSE(
        parse("-importMeshes 0 -importNormals 300", importer, sceneImporter_schema::type()));
    EXPECT_EQ(lastError, "Invalid value '300' for command line option '-importNormals'. Expected "
                         "one of none, off, file, import, compute, generate, or a whole number "
                         "from 0 to 255.");
    EXPECT_EQ(importer.entries().size(), 1u);
    EXPECT_EQ(SCENE_GET(importer, sceneImporter_schema, importNormals), 1);

    EXPECT_FALSE(parse("-importNormals sometimes", importer, sceneImporter_schema::type()));
    EXPECT_FALSE(parse("-importTessellation fine", importer, sceneImporter_schema::type()));
    EXPECT_FALSE(parse("-upAxis w", importer, scene_schema::type()));
    EXPECT_EQ(SCENE_GET(importer, sceneImporter_schema, importNormals), 1);
}

} // namespace

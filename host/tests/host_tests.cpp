// The host as its users see it: scene-import runs as a child process and is
// judged by its exit code, its standard streams and its JSON document. The
// scene counts behind --summary are tested in-process on hand-built meshes.
#include "b_attrib_map.h"
#include "b_math.h"
#include "b_plugin_attribute.h"
#include "scene_interfaces.h"
#include "scene_stats.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <rapidjson/document.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <sstream>
#include <string>
#include <vector>

extern char** environ;

namespace {

namespace fs = std::filesystem;

const std::string sample = std::string(SCENE_SAMPLES_DIR) + "/sample.gltf";

std::string readFile(const fs::path& path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

struct HostRun {
    int code = -1;
    std::string out;
    std::string err;
};

// Runs scene-import with 'args', its standard streams captured in files.
HostRun runHost(const std::vector<std::string>& args, const fs::path& scratch) {
    const fs::path outPath = scratch / "stdout", errPath = scratch / "stderr";
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 1, outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0644);
    posix_spawn_file_actions_addopen(&actions, 2, errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0644);
    std::vector<char*> argv{const_cast<char*>(SCENE_IMPORT_EXE)};
    for (const std::string& a : args)
        argv.push_back(const_cast<char*>(a.c_str()));
    argv.push_back(nullptr);
    HostRun run;
    pid_t pid = 0;
    const int spawned =
        posix_spawn(&pid, SCENE_IMPORT_EXE, &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (spawned != 0)
        return run;
    int status = 0;
    waitpid(pid, &status, 0);
    run.code = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    run.out = readFile(outPath);
    run.err = readFile(errPath);
    return run;
}

class HostTest : public ::testing::Test {
protected:
    void SetUp() override {
        std::string test = ::testing::UnitTest::GetInstance()->current_test_info()->name();
        std::replace(test.begin(), test.end(), '/', '_');
        m_dir =
            fs::temp_directory_path() / ("scene_import_" + std::to_string(::getpid()) + "_" + test);
        fs::remove_all(m_dir);
        fs::create_directories(m_dir / "folder.obj");
        std::ofstream(m_dir / "empty.obj").close();
        std::ofstream(m_dir / "noise.xyz") << "this is not a model of any kind\n";
    }
    void TearDown() override { fs::remove_all(m_dir); }

    HostRun run(std::vector<std::string> args) {
        for (std::string& a : args) {
            if (a.rfind("{tmp}", 0) == 0)
                a = (m_dir / a.substr(6)).string();
            else if (a == "{sample}")
                a = sample;
        }
        return runHost(args, m_dir);
    }

    fs::path m_dir;
};

// ---- Exit codes ----

struct ExitCase {
    const char* name;
    std::vector<std::string> args;
    int code;
    const char* stderrHas;
};

void PrintTo(const ExitCase& c, std::ostream* os) {
    *os << c.name;
}

class HostExitTest : public HostTest, public ::testing::WithParamInterface<ExitCase> {};

TEST_P(HostExitTest, ExitCodeAndReason) {
    const ExitCase& c = GetParam();
    const HostRun r = run(c.args);
    EXPECT_EQ(r.code, c.code) << r.err;
    EXPECT_NE(r.err.find(c.stderrHas), std::string::npos) << r.err;
    EXPECT_TRUE(r.out.empty()) << r.out;
}

INSTANTIATE_TEST_SUITE_P(
    Cases, HostExitTest,
    ::testing::Values(
        ExitCase{"MissingFile", {"{tmp}/missing.obj"}, 1, "No such file"},
        ExitCase{"Directory", {"{tmp}/folder.obj"}, 1, "is a directory"},
        ExitCase{"EmptyFile", {"{tmp}/empty.obj"}, 1, "is empty"},
        ExitCase{"RejectedByAssimp", {"{tmp}/noise.xyz"}, 1, "cannot import"},
        ExitCase{"NoModel", {}, 2, "no model given"},
        ExitCase{"TwoModels", {"{sample}", "{sample}"}, 2, "more than one model"},
        ExitCase{"UnknownSwitch", {"--frobnicate", "{sample}"}, 2, "--help"},
        ExitCase{"BadEnumValue", {"-importNormals", "sometimes", "{sample}"}, 2, "sometimes"},
        ExitCase{"BadBoolValue", {"-importCameras", "maybe", "{sample}"}, 2, "maybe"},
        ExitCase{"UpAxisOutOfRange", {"-upAxis", "300", "{sample}"}, 2, "--help"},
        ExitCase{"OutputWithoutFile", {"{sample}", "-o"}, 2, "--help"},
        ExitCase{"ModuleMissing", {"--plugin", "{tmp}/none.so", "{sample}"}, 1, "none.so"}),
    [](const auto& info) { return std::string(info.param.name); });

// ---- Output ----

std::map<std::string, long long> summaryLines(const std::string& text) {
    std::map<std::string, long long> out;
    std::istringstream lines(text);
    std::string label;
    long long value;
    while (lines >> label >> value) {
        out[label] = value;
        lines.ignore(1 << 20, '\n');
    }
    return out;
}

// Members of the document's objects of 'type' whose key starts with 'prefix'.
int countMembers(const rapidjson::Document& doc, const char* type, const std::string& prefix,
                 int* objects = nullptr) {
    int found = 0, seen = 0;
    for (auto m = doc.MemberBegin(); m != doc.MemberEnd(); ++m) {
        if (std::string(m->name.GetString()) != type || !m->value.IsObject())
            continue;
        ++seen;
        for (auto a = m->value.MemberBegin(); a != m->value.MemberEnd(); ++a)
            if (std::string(a->name.GetString()).rfind(prefix, 0) == 0)
                ++found;
    }
    if (objects)
        *objects = seen;
    return found;
}

bool parse(const std::string& text, rapidjson::Document& doc) {
    doc.Parse<rapidjson::kParseNanAndInfFlag>(text.c_str(), text.size());
    return !doc.HasParseError() && doc.IsObject();
}

TEST_F(HostTest, SummaryOfTheSample) {
    const HostRun r = run({"{sample}"});
    ASSERT_EQ(r.code, 0) << r.err;
    const auto counts = summaryLines(r.out);
    // Cameras and lights join the counts once they are converted.
    const std::map<std::string, long long> expected{{"scene", 1}, {"node", 11},     {"mesh", 2},
                                                    {"skin", 1},  {"vertices", 36}, {"faces", 32},
                                                    {"joints", 2}};
    for (const auto& [label, value] : expected) {
        auto it = counts.find(label);
        ASSERT_TRUE(it != counts.end()) << label << " missing in\n" << r.out;
        EXPECT_EQ(it->second, value) << label;
    }
    EXPECT_NE(r.out.find("time"), std::string::npos);
}

TEST_F(HostTest, JsonToStandardOutputParses) {
    const HostRun r = run({"{sample}", "-o", "-"});
    ASSERT_EQ(r.code, 0) << r.err;
    rapidjson::Document doc;
    ASSERT_TRUE(parse(r.out, doc)) << r.out.substr(0, 400);
    EXPECT_TRUE(doc.HasMember("scene"));
    EXPECT_TRUE(doc.HasMember("node"));
    // The importer object is the host's tool, not part of the scene.
    EXPECT_FALSE(doc.HasMember("AssimpImporter"));
}

TEST_F(HostTest, JsonToFileWithoutSummaryUnlessAsked) {
    HostRun r = run({"{sample}", "-o", "{tmp}/out.json"});
    ASSERT_EQ(r.code, 0) << r.err;
    EXPECT_TRUE(r.out.empty()) << r.out;
    rapidjson::Document doc;
    EXPECT_TRUE(parse(readFile(m_dir / "out.json"), doc));

    r = run({"{sample}", "-o", "{tmp}/out.json", "--summary"});
    ASSERT_EQ(r.code, 0) << r.err;
    EXPECT_EQ(summaryLines(r.out)["mesh"], 2) << r.out;
}

TEST_F(HostTest, UnwritableOutputFails) {
    const HostRun r = run({"{sample}", "-o", "{tmp}/no/such/folder/out.json"});
    EXPECT_EQ(r.code, 1) << r.err;
}

TEST_F(HostTest, UpAxisIsAppliedToTheScene) {
    const HostRun r = run({"-upAxis", "z", "{sample}", "-o", "-"});
    ASSERT_EQ(r.code, 0) << r.err;
    rapidjson::Document doc;
    ASSERT_TRUE(parse(r.out, doc));
    ASSERT_TRUE(doc.HasMember("scene"));
    const auto& scene = doc["scene"];
    ASSERT_TRUE(scene.HasMember("upAxis^uint8")) << r.out.substr(0, 400);
    EXPECT_EQ(scene["upAxis^uint8"].GetInt(), 2);
}

struct NormalsCase {
    const char* name;
    std::vector<std::string> args;
    bool normals;
};

void PrintTo(const NormalsCase& c, std::ostream* os) {
    *os << c.name;
}

class HostNormalsTest : public HostTest, public ::testing::WithParamInterface<NormalsCase> {};

TEST_P(HostNormalsTest, MeshesCarryNormalsAsAsked) {
    std::vector<std::string> args = GetParam().args;
    args.insert(args.end(), {"{sample}", "-o", "-"});
    const HostRun r = run(args);
    ASSERT_EQ(r.code, 0) << r.err;
    rapidjson::Document doc;
    ASSERT_TRUE(parse(r.out, doc));
    int meshes = 0;
    const int withNormals = countMembers(doc, "mesh", "normals^", &meshes);
    ASSERT_EQ(meshes, 2);
    EXPECT_EQ(withNormals, GetParam().normals ? meshes : 0);
}

INSTANTIATE_TEST_SUITE_P(Cases, HostNormalsTest,
                         ::testing::Values(NormalsCase{"Default", {}, true},
                                           NormalsCase{"Number0", {"-importNormals", "0"}, false},
                                           NormalsCase{"None", {"-importNormals", "none"}, false},
                                           NormalsCase{"Generate", {"-importNormals", "2"}, true}),
                         [](const auto& info) { return std::string(info.param.name); });

// The second texture coordinate of the first vertex of the first mesh.
double firstV(const rapidjson::Document& doc) {
    auto startsWith = [](const rapidjson::Value& key, const char* prefix) {
        return std::string(key.GetString()).rfind(prefix, 0) == 0;
    };
    for (auto m = doc.MemberBegin(); m != doc.MemberEnd(); ++m) {
        if (std::string(m->name.GetString()) != "mesh")
            continue;
        for (auto a = m->value.MemberBegin(); a != m->value.MemberEnd(); ++a) {
            if (!startsWith(a->name, "uvSets^") || !a->value.IsObject())
                continue;
            for (auto set = a->value.MemberBegin(); set != a->value.MemberEnd(); ++set)
                for (auto uv = set->value.MemberBegin(); uv != set->value.MemberEnd(); ++uv)
                    if (startsWith(uv->name, "UV^") && uv->value.IsArray() && !uv->value.Empty())
                        return uv->value[0][1].GetDouble();
        }
    }
    return -1;
}

TEST_F(HostTest, FlipTextureCoordinatesOnlyWhenGiven) {
    double v[3];
    const char* flip[3] = {nullptr, "false", "true"};
    for (int i = 0; i < 3; ++i) {
        std::vector<std::string> args{"{sample}", "-o", "-"};
        if (flip[i])
            args.insert(args.begin(), {"-importFlipTextureCoordinates", flip[i]});
        const HostRun r = run(args);
        ASSERT_EQ(r.code, 0) << r.err;
        rapidjson::Document doc;
        ASSERT_TRUE(parse(r.out, doc));
        v[i] = firstV(doc);
        ASSERT_GE(v[i], 0.0) << "no texture coordinates in the document";
    }
    EXPECT_EQ(v[1], v[0]);
    EXPECT_NEAR(v[2], 1.0 - v[0], 1e-6);
}

TEST_F(HostTest, HelpListsTheSwitches) {
    const HostRun r = run({"--help"});
    ASSERT_EQ(r.code, 0) << r.err;
    for (const char* text :
         {"-importNormals", "-importCameras", "-importAnimations", "-importPoints", "-upAxis",
          "-importFlipTextureCoordinates", "-importFlipFaceWinding", "--summary", "--validate",
          "--plugin", "-o", "-v", "-q", "Whether to import the mesh normals.", "compute"})
        EXPECT_NE(r.out.find(text), std::string::npos) << text;
}

TEST_F(HostTest, ValidateReportsTheMeshesOfTheSample) {
    const HostRun r = run({"--validate", "{sample}"});
    EXPECT_EQ(r.code, 0) << r.err;
    EXPECT_NE(r.out.find("validate:"), std::string::npos) << r.out;
}

// ---- Scene counts ----

TEST(SceneStats, CountsFollowLinksAndBothFaceForms) {
    base::ref<base::PluginFactory> factory(new base::PluginFactory("stats"));
    scene::register_scene_schema(*factory);
    namespace n = scene::names;
    auto makeMesh = [&](std::initializer_list<std::uint32_t> indices) {
        base::ref<base::IPlugin> mesh = factory->create(n::mesh, 3);
        for (std::uint32_t i : indices)
            mesh->appendAttributeItem<std::uint32_t>(n::indices, i);
        return mesh;
    };
    auto primitive = [&](base::IPlugin& mesh) {
        return mesh.arrayAttribute(n::primitives)->appendMap();
    };

    // Triangles over the whole index array.
    base::ref<base::IPlugin> a = makeMesh({0, 1, 2, 0, 2, 3});
    for (int i = 0; i < 4; ++i)
        a->appendAttributeItem<base::vec3f>(n::positions, base::vec3f{float(i), 0, 0});
    primitive(*a)->setAttribute<std::uint16_t>(n::vcounts, 3);

    // Positions shared with the first mesh through a link; one count per face.
    base::ref<base::IPlugin> b = makeMesh({0, 1, 2, 0, 1, 2, 3});
    base::AttribPath path;
    path.addPlugin(a.get()).addMember(n::positions);
    b->linkAttribute(n::positions)->setPath(path);
    base::AttribMap* faces = primitive(*b);
    faces->appendAttributeItem<std::uint16_t>(n::vcounts, 3);
    faces->appendAttributeItem<std::uint16_t>(n::vcounts, 4);

    // Quads over a range, and a primitive with a zero face size next to it.
    base::ref<base::IPlugin> c = makeMesh({0, 1, 2, 3, 0, 1, 2, 3, 9, 9, 9, 9});
    base::AttribMap* quads = primitive(*c);
    quads->setAttribute<std::uint16_t>(n::vcounts, 4);
    quads->setAttribute<std::uint32_t>(n::indexCount, 8);
    primitive(*c)->setAttribute<std::uint16_t>(n::vcounts, 0);

    base::ref<base::IPlugin> skin = factory->create(n::skin, 3);
    skin->appendAttributeItem<base::ref<base::IPlugin>>(n::joints, a);
    skin->appendAttributeItem<base::ref<base::IPlugin>>(n::joints, b);

    const host::SceneStats stats = host::collectStats(*factory);
    ASSERT_EQ(stats.meshes.size(), 3u);
    EXPECT_EQ(stats.meshes[0].faces, 2u);
    EXPECT_EQ(stats.meshes[1].vertices, 4u);
    EXPECT_EQ(stats.meshes[1].faces, 2u);
    EXPECT_EQ(stats.meshes[2].faces, 2u);
    EXPECT_EQ(stats.vertices, 8u);
    EXPECT_EQ(stats.faces, 6u);
    EXPECT_EQ(stats.joints, 2u);
    const base::vector<std::pair<base::string, std::uint32_t>> types{{"mesh", 3}, {"skin", 1}};
    EXPECT_EQ(stats.types, types);

    const base::string text = host::formatSummary(stats, 0.25);
    EXPECT_NE(text.find("mesh"), base::string::npos);
    EXPECT_NE(text.find("0.250 s"), base::string::npos);
}

} // namespace

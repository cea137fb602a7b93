// The host as its users see it: scene-import runs as a child process judged by
// its exit code, standard streams and JSON; the --summary counts in-process.
#include "child_run.h"
#include "listing.h"
#include "scene_interfaces.h"
#include "scene_schema.h"
#include "scene_stats.h"

#include <gtest/gtest.h>
#include <rapidjson/document.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

const std::string sample = std::string(SCENE_SAMPLES_DIR) + "/sample.gltf";

std::string readFile(const fs::path& path) {
    return hosttest::readText(path);
}

using HostRun = hosttest::CommandRun;

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
        fs::create_symlink(m_dir / "noise.xyz", m_dir / "symlink.xyz");
        fs::create_hard_link(m_dir / "noise.xyz", m_dir / "hardlink.xyz");
    }
    void TearDown() override { fs::remove_all(m_dir); }

    // Runs scene-import with 'args' through the shell, its standard error captured
    // in a file.
    // 'prefix' and 'suffix' wrap the command line (a limit, a pipe).
    HostRun run(std::vector<std::string> args, const std::string& prefix = {},
                const std::string& suffix = {}) {
        std::string command = prefix + "'" SCENE_IMPORT_EXE "'";
        for (std::string& a : args) {
            if (a.starts_with("{tmp}"))
                a = (m_dir / a.substr(6)).string();
            else if (a == "{sample}")
                a = sample;
            command += " '" + a + "'";
        }
        const fs::path errPath = m_dir / "stderr";
        return hosttest::runCommand(command + " 2>'" + errPath.string() + "' </dev/null" + suffix,
                                    errPath);
    }

    // Runs with 'args' and parses the JSON document it writes to standard output.
    void document(std::vector<std::string> args, rapidjson::Document& doc) {
        args.insert(args.end(), {"-o", "-"});
        const HostRun r = run(args);
        ASSERT_EQ(r.code, 0) << r.err;
        doc.Parse<rapidjson::kParseNanAndInfFlag>(r.out.c_str(), r.out.size());
        ASSERT_TRUE(!doc.HasParseError() && doc.IsObject()) << r.out.substr(0, 400);
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
        ExitCase{"TwoModelsIntoAFile",
                 {"{sample}", "{sample}", "-o", "{tmp}/noise.xyz"},
                 2,
                 "is not a folder"},
        ExitCase{"ReportOfOneModel",
                 {"{sample}", "--report", "{tmp}/report.json"},
                 2,
                 "--report needs a batch"},
        ExitCase{"PageOfOneModel",
                 {"{sample}", "--report-html", "{tmp}/page.html"},
                 2,
                 "--report-html needs a batch"},
        // Found before any child starts.
        ExitCase{"PageIntoAMissingFolder",
                 {"{sample}", "{sample}", "--report-html", "{tmp}/no/such/page.html"},
                 1,
                 "the folder '"},
        ExitCase{"ListInABatch", {"--list", "nodes", "{sample}", "{sample}"}, 2, "single model"},
        ExitCase{"UnknownSwitch", {"--frobnicate", "{sample}"}, 2, "--help"},
        ExitCase{"BadEnumValue", {"-importNormals", "sometimes", "{sample}"}, 2, "sometimes"},
        ExitCase{"BadBoolValue", {"-importCameras", "maybe", "{sample}"}, 2, "maybe"},
        ExitCase{"UpAxisOutOfRange", {"-upAxis", "300", "{sample}"}, 2, "--help"},
        ExitCase{"OutputWithoutFile", {"{sample}", "-o"}, 2, "--help"},
        ExitCase{"BadListKind", {"--list", "planets", "{sample}"}, 2, "planets"},
        ExitCase{"ModuleMissing", {"--plugin", "{tmp}/none.so", "{sample}"}, 1, "none.so"},
        ExitCase{
            "OutputFolderMissing", {"{sample}", "-o", "{tmp}/no/such/out.json"}, 1, "the folder '"},
        ExitCase{"OutputIsAFolder", {"{sample}", "-o", "{tmp}/folder.obj"}, 1, "it is a folder"},
        // Refused before anything is read, whatever the spelling.
        ExitCase{"OutputIsTheModel", {"{tmp}/noise.xyz", "-o", "{tmp}/noise.xyz"}, 2, "itself"},
        ExitCase{"OutputIsTheModelSpelledOtherwise",
                 {"{tmp}/noise.xyz", "-o", "{tmp}/folder.obj/.././noise.xyz"},
                 2,
                 "itself"},
        ExitCase{"OutputIsASymlinkToTheModel",
                 {"{tmp}/noise.xyz", "-o", "{tmp}/symlink.xyz"},
                 2,
                 "itself"},
        ExitCase{"OutputIsAHardLinkToTheModel",
                 {"{tmp}/hardlink.xyz", "-o", "{tmp}/noise.xyz"},
                 2,
                 "itself"},
        // Values outside what a switch allows name the switch and the values.
        ExitCase{
            "UpAxisNotAnAxis", {"-upAxis", "7", "{sample}"}, 2, "'-upAxis'. Expected one of x"},
        ExitCase{"NormalsNotAChoice",
                 {"-importNormals", "9", "{sample}"},
                 2,
                 "'-importNormals'. Expected one of none"},
        ExitCase{"TessellationBeyondFloat",
                 {"-importTessellation", "1e999", "{sample}"},
                 2,
                 "'-importTessellation'. Expected a finite number"},
        ExitCase{"NegativeTimeout",
                 {"--timeout", "-5", "{sample}"},
                 2,
                 "'--timeout'. Expected a whole number from 0"},
        ExitCase{"NegativeMemory", {"--max-memory", "-1", "{sample}"}, 2, "'--max-memory'"},
        ExitCase{"VerbosityTooHigh", {"-v", "9", "{sample}"}, 2, "from 0 to 5"},
        ExitCase{
            "WordAfterVerbose", {"-v", "abc", "{sample}"}, 2, "unexpected value 'abc' after -v"},
        ExitCase{"WordAfterValidate",
                 {"{sample}", "--validate", "abc"},
                 2,
                 "unexpected value 'abc' after --validate"}),
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

// The summary of the sample goes to standard output unless a file is written
// without --summary.
TEST_F(HostTest, SummaryOfTheSampleUnlessWritingAFile) {
    const std::map<std::string, long long> expected{{"scene", 1},     {"node", 11},  {"mesh", 2},
                                                    {"skin", 1},      {"camera", 1}, {"light", 1},
                                                    {"vertices", 36}, {"faces", 32}, {"joints", 2}};
    using Args = std::vector<std::string>;
    for (const Args& args :
         {Args{"{sample}"}, Args{"{sample}", "-o", "{tmp}/out.json", "--summary"}}) {
        const HostRun r = run(args);
        ASSERT_EQ(r.code, 0) << r.err;
        auto counts = summaryLines(r.out);
        for (const auto& [label, value] : expected)
            EXPECT_EQ(counts[label], value) << label << " in\n" << r.out;
        EXPECT_NE(r.out.find("time"), std::string::npos);
    }
    fs::remove(m_dir / "out.json");
    const HostRun r = run({"{sample}", "-o", "{tmp}/out.json"});
    ASSERT_EQ(r.code, 0) << r.err;
    EXPECT_TRUE(r.out.empty()) << r.out;
    rapidjson::Document doc;
    const std::string written = readFile(m_dir / "out.json");
    doc.Parse<rapidjson::kParseNanAndInfFlag>(written.c_str(), written.size());
    EXPECT_TRUE(!doc.HasParseError() && doc.IsObject());
}

// The sample's "Bend" animation lifts Pivot from y 0 to 0.5 and back over 1 s.
TEST_F(HostTest, AnimationPlaysAtTimesAndSamplesFrames) {
    HostRun r = run({"{sample}", "--time", "0.5", "--list", "poses", "--summary"});
    ASSERT_EQ(r.code, 0) << r.err;
    EXPECT_NE(r.out.find("\nPivot 2 0.5 0 "), std::string::npos) << r.out;
    EXPECT_NE(r.err.find("animation: 2 clips, 1 layers, 12 channels, 0 s to 1 s"),
              std::string::npos)
        << r.err;

    r = run({"-q", "{sample}", "--time", "0", "0.25", "--list", "nodes"});
    ASSERT_EQ(r.code, 0) << r.err;
    EXPECT_NE(r.out.find("time 0\n"), std::string::npos);
    EXPECT_NE(r.out.find("time 0.25\nRoot 0 0.5 0\nPivot 2 0.75 0\n"), std::string::npos) << r.out;

    r = run({"-q", "{sample}", "--frames", "3"});
    ASSERT_EQ(r.code, 0) << r.err;
    rapidjson::Document doc;
    doc.Parse(r.out.c_str(), r.out.size());
    ASSERT_TRUE(!doc.HasParseError() && doc.IsObject()) << r.out;
    ASSERT_EQ(doc["frames"].Size(), 3u);
    const auto& middle = doc["frames"][1];
    EXPECT_DOUBLE_EQ(middle["time"].GetDouble(), 0.5);
    EXPECT_NEAR(middle["nodes"]["Pivot"][10].GetDouble(), 1.0, 1e-6); // world y
    EXPECT_TRUE(middle["nodes"].HasMember("Bone1"));
    EXPECT_FALSE(middle["nodes"].HasMember("Box"));

    EXPECT_EQ(run({"{sample}", "--list", "shapes"}).code, 2);
}

TEST_F(HostTest, JsonToStandardOutputParsesAndCarriesTheUpAxis) {
    rapidjson::Document doc;
    ASSERT_NO_FATAL_FAILURE(document({"-upAxis", "z", "{sample}"}, doc));
    EXPECT_TRUE(doc.HasMember("node"));
    // The importer object is the host's tool, not part of the scene.
    EXPECT_FALSE(doc.HasMember("AssimpImporter"));
    ASSERT_TRUE(doc.HasMember("scene"));
    ASSERT_TRUE(doc["scene"].HasMember("upAxis^uint8"));
    EXPECT_EQ(doc["scene"]["upAxis^uint8"].GetInt(), 2);
}

// The value of the first member of 'object' whose key starts with 'prefix'.
const rapidjson::Value* member(const rapidjson::Value& object, std::string_view prefix) {
    if (object.IsObject())
        for (auto a = object.MemberBegin(); a != object.MemberEnd(); ++a)
            if (std::string_view(a->name.GetString()).starts_with(prefix))
                return &a->value;
    return nullptr;
}

// The meshes of the document and how many of them carry normals.
std::pair<int, int> meshesWithNormals(const rapidjson::Document& doc) {
    int meshes = 0, withNormals = 0;
    for (auto m = doc.MemberBegin(); m != doc.MemberEnd(); ++m)
        if (m->name == "mesh" && m->value.IsObject()) {
            ++meshes;
            withNormals += member(m->value, "normals^") != nullptr;
        }
    return {meshes, withNormals};
}

// The second texture coordinate of the first vertex of the first mesh.
double firstV(const rapidjson::Document& doc) {
    for (auto m = doc.MemberBegin(); m != doc.MemberEnd(); ++m)
        if (const auto* sets = m->name == "mesh" ? member(m->value, "uvSets^") : nullptr;
            sets && sets->IsObject())
            for (auto set = sets->MemberBegin(); set != sets->MemberEnd(); ++set)
                if (const auto* uv = member(set->value, "UV^"); uv && uv->IsArray() && !uv->Empty())
                    return (*uv)[0][1].GetDouble();
    return -1;
}

// Normals follow -importNormals; texture coordinates flip only when asked.
TEST_F(HostTest, OptionsReachTheDocument) {
    struct Row {
        std::vector<std::string> args;
        bool normals, flipped;
    };
    const Row rows[] = {{{}, true, false},
                        {{"-importNormals", "0"}, false, false},
                        {{"-importNormals", "none"}, false, false},
                        {{"-importNormals", "2"}, true, false},
                        {{"-importFlipTextureCoordinates", "false"}, true, false},
                        {{"-importFlipTextureCoordinates", "true"}, true, true}};
    double unflipped = -1;
    for (auto [args, normals, flipped] : rows) {
        SCOPED_TRACE(args.empty() ? "default" : args[0] + " " + args[1]);
        args.push_back("{sample}");
        rapidjson::Document doc;
        ASSERT_NO_FATAL_FAILURE(document(args, doc));
        EXPECT_EQ(meshesWithNormals(doc), std::make_pair(2, normals ? 2 : 0));
        const double v = firstV(doc);
        ASSERT_GE(v, 0.0) << "no texture coordinates in the document";
        if (unflipped < 0)
            unflipped = v;
        EXPECT_NEAR(v, flipped ? 1.0 - unflipped : unflipped, 1e-6);
    }
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

// ---- Cameras and lights ----

// The fields of a listing line, split at tabs.
std::vector<std::string> fields(const std::string& line) {
    std::vector<std::string> out;
    std::istringstream split(line);
    for (std::string field; std::getline(split, field, '\t');)
        out.push_back(field);
    return out;
}

std::vector<double> numbers(const std::string& field) {
    std::istringstream in(field.substr(field.find(' ') + 1));
    std::vector<double> out;
    for (double v; in >> v;)
        out.push_back(v);
    return out;
}

void expectNumbers(const std::string& field, std::vector<double> expected) {
    const std::vector<double> found = numbers(field);
    ASSERT_EQ(found.size(), expected.size()) << field;
    for (std::size_t i = 0; i < found.size(); ++i)
        EXPECT_NEAR(found[i], expected[i], 1e-5) << field;
}

// The sample's camera sits on its node 0.5 above the root, tilted 10 degrees
// down; the lamp sits on its own node.
TEST_F(HostTest, ListsTheSampleRig) {
    const HostRun r = run({"--list", "cameras,lights", "{sample}"});
    ASSERT_EQ(r.code, 0) << r.err;
    std::istringstream lines(r.out);
    std::string camera, light, extra;
    ASSERT_TRUE(std::getline(lines, camera) && std::getline(lines, light)) << r.out;
    EXPECT_FALSE(std::getline(lines, extra)) << "the summary is off while listing: " << r.out;

    const auto c = fields(camera);
    ASSERT_EQ(c.size(), 7u) << camera;
    EXPECT_EQ(c[0], "camera");
    EXPECT_TRUE(c[2].ends_with("/CameraNode")) << c[2];
    expectNumbers(c[3], {0, 2.5, 8});
    const double tilt = 10 * 3.14159265358979 / 180;
    expectNumbers(c[4], {0, -std::sin(tilt), -std::cos(tilt)});
    expectNumbers(c[6], {36, 24});

    const auto l = fields(light);
    ASSERT_EQ(l.size(), 7u) << light;
    EXPECT_EQ(l[0], "light");
    EXPECT_TRUE(l[2].ends_with("/LightNode")) << l[2];
    expectNumbers(l[3], {3, 4.5, 2});
    EXPECT_EQ(l[5], "type point");

    const HostRun only = run({"--list", "lights", "{sample}"});
    EXPECT_EQ(only.out, light + "\n");
}

TEST(Listing, WorldFramesThroughTheNodeTree) {
    base::ref<base::PluginFactory> factory(new base::PluginFactory("listing"));
    scene::register_scene_schema(*factory);
    namespace n = scene::names;
    auto make = [&](base::name_id type, const char* name) {
        base::ref<base::IPlugin> object = factory->create(type, 3);
        object->setAttribute(n::name, base::string(name));
        return object;
    };
    auto adopt = [](base::IPlugin& parent, const base::ref<base::IPlugin>& child) {
        parent.appendAttributeItem<base::ref<base::IPlugin>>(n::children, child);
    };
    // root: at (1, 0, 0), a half turn about Z; arm: 2 along its Y.
    base::ref<base::IPlugin> root = make(n::node, "root"), arm = make(n::node, "arm");
    root->setAttribute(n::translate, base::vec3d{1, 0, 0});
    root->setAttribute(n::rotate, base::quatf{0, 0, 0, 1});
    arm->setAttribute(n::translate, base::vec3d{0, 2, 0});
    adopt(*root, arm);
    adopt(*arm, arm); // a cycle is not followed
    base::ref<base::IPlugin> sceneObject = make(n::scene, "scene");
    sceneObject->setAttribute(n::root, root);

    using L = scene::light_schema;
    base::ref<base::IPlugin> spot = make(n::light, "spot"), panel = make(n::light, "panel"),
                             ambient = make(n::light, "ambient"), loose = make(n::light, "loose");
    spot->setAttribute(L::lightType(), std::uint8_t(2));
    spot->setAttribute(L::spotConeAngle(), 30.0f);
    panel->setAttribute(L::lightType(), std::uint8_t(3));
    panel->setAttribute(L::size(), 2.0f);
    panel->setAttribute(L::sizeRatio(), 0.5f);
    adopt(*arm, spot);
    adopt(*root, panel);
    adopt(*arm, ambient);
    adopt(*root, ambient); // listed at the first place met

    const auto placed = host::placements(*factory, n::light);
    ASSERT_EQ(placed.size(), 4u);
    EXPECT_EQ(placed[0].path, "root/arm");
    EXPECT_NEAR(placed[0].position.x, 1, 1e-6);
    EXPECT_NEAR(placed[0].position.y, -2, 1e-6);
    EXPECT_NEAR(placed[0].direction.z, -1, 1e-6);
    EXPECT_EQ(placed[2].path, "root/arm");
    EXPECT_EQ(placed[3].path, "");

    const base::string text = host::formatListing(*factory, {host::ListKind::lights});
    std::istringstream lines{std::string(text.data(), text.size())};
    std::vector<std::string> all;
    for (std::string line; std::getline(lines, line);)
        all.push_back(line);
    ASSERT_EQ(all.size(), 4u) << text;
    EXPECT_EQ(all[0], "light\tspot\troot/arm\tposition 1 -2 0\tdirection 0 0 -1\ttype spot"
                      "\tcolor 1 1 1\tcone 30 penumbra 5");
    EXPECT_NE(all[1].find("\ttype area\tcolor 1 1 1\tsize 2 ratio 0.5"), std::string::npos)
        << all[1];
    EXPECT_NE(all[2].find("\ttype unset\tcolor 1 1 1"), std::string::npos) << all[2];
    EXPECT_EQ(all[3], "light\tloose\t-\ttype unset\tcolor 1 1 1");
    EXPECT_EQ(host::formatListing(*factory, {host::ListKind::cameras}), "");

    base::vector<host::ListKind> kinds;
    base::string error;
    EXPECT_TRUE(host::parseListKinds("lights,cameras", kinds, error));
    EXPECT_EQ(kinds.size(), 2u);
    EXPECT_FALSE(host::parseListKinds("cameras,", kinds, error));
    EXPECT_NE(error.find("''"), base::string::npos) << error;
}

// A failed import states its reason once, in the host's words.
TEST_F(HostTest, FailureReasonOnceWithoutTags) {
    for (const bool isolated : {true, false}) {
        std::vector<std::string> args{"{tmp}/noise.xyz"};
        if (!isolated)
            args.insert(args.begin(), "--no-isolation");
        const HostRun r = run(args);
        EXPECT_EQ(r.code, 1);
        EXPECT_NE(r.err.find("scene-import: cannot import '"), std::string::npos) << r.err;
        EXPECT_EQ(r.err.find("assimp|"), std::string::npos) << r.err;
        EXPECT_EQ(r.err.find("::"), std::string::npos) << r.err;
        const std::size_t reason = r.err.rfind(": ");
        ASSERT_NE(reason, std::string::npos);
        const std::string text = r.err.substr(reason + 2, 30);
        EXPECT_EQ(r.err.find(text), reason + 2) << "the reason is repeated:\n" << r.err;
    }
}

// A document is written whole or not at all: a write that fails part-way
// (here at a file-size limit) leaves the previous file and no temporary one.
TEST_F(HostTest, FailedWriteKeepsThePreviousDocument) {
    const fs::path out = m_dir / "out.json";
    std::ofstream(out) << "previous";
    for (const char* isolation : {"", "--no-isolation"}) {
        std::vector<std::string> args{"{sample}", "-o", "{tmp}/out.json"};
        if (*isolation)
            args.push_back(isolation);
        const HostRun r = run(args, "prlimit --fsize=4096 ");
        EXPECT_EQ(r.code, 1) << r.err;
        EXPECT_NE(r.err.find("File too large"), std::string::npos) << r.err;
        EXPECT_EQ(readFile(out), "previous");
        for (const auto& entry : fs::directory_iterator(m_dir))
            EXPECT_FALSE(entry.path().string().ends_with(".tmp")) << entry.path();
    }
    const HostRun r = run({"{sample}", "-o", "{tmp}/out.json"});
    EXPECT_EQ(r.code, 0) << r.err;
    EXPECT_EQ(readFile(out).front(), '{');
}

// Writing into a pipe that closes early is a write error, not death by SIGPIPE.
TEST_F(HostTest, ClosedPipeIsAWriteError) {
    // A grid big enough that its document outgrows any pipe buffer.
    {
        std::ofstream grid(m_dir / "grid.obj");
        constexpr int n = 150;
        for (int y = 0; y <= n; ++y)
            for (int x = 0; x <= n; ++x)
                grid << "v " << x << ' ' << y << " 0\n";
        for (int y = 0; y < n; ++y)
            for (int x = 0; x < n; ++x) {
                const int a = y * (n + 1) + x + 1;
                grid << "f " << a << ' ' << a + 1 << ' ' << a + n + 2 << ' ' << a + n + 1 << '\n';
            }
    }
    // The host's own status, not head's.
    std::ofstream(m_dir / "pipe.sh")
        << "'" SCENE_IMPORT_EXE "' '" << (m_dir / "grid.obj").string() << "' -o - 2>'"
        << (m_dir / "err").string() << "' | head -c 100 >/dev/null; exit ${PIPESTATUS[0]}\n";
    const int status = std::system(("bash '" + (m_dir / "pipe.sh").string() + "'").c_str());
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_NE(readFile(m_dir / "err").find("Broken pipe"), std::string::npos)
        << readFile(m_dir / "err");
}

// ---- Read-back ----

// Import, write, read, write: the same bytes.
TEST_F(HostTest, ReadBackWritesTheSameDocument) {
    ASSERT_EQ(run({"{sample}", "-o", "{tmp}/first.json"}).code, 0);
    const HostRun r = run({"--read", "{tmp}/first.json", "-o", "{tmp}/second.json"});
    ASSERT_EQ(r.code, 0) << r.err;
    const std::string first = readFile(m_dir / "first.json");
    EXPECT_GT(first.size(), 1000u);
    EXPECT_TRUE(first == readFile(m_dir / "second.json"));
    const HostRun summary = run({"--read", "{tmp}/first.json"});
    EXPECT_EQ(summary.code, 0) << summary.err;
    EXPECT_EQ(summaryLines(summary.out)["node"], 11);
}

// The list layout is what a general JSON tool reads whole: Python's json
// module, refusing NaN tokens, keeps every key. Each list entry stands for one
// key of the default document ("type" plus "attributes" or "value").
TEST_F(HostTest, ListLayoutKeepsEveryKeyForPythonAndReadsBack) {
    ASSERT_EQ(run({"{sample}", "-o", "{tmp}/keyed.json"}).code, 0);
    const HostRun listed = run({"{sample}", "--json-layout", "list", "-o", "{tmp}/list.json"});
    ASSERT_EQ(listed.code, 0) << listed.err;
    std::ofstream(m_dir / "count.py") << R"(import json, sys
def count(path, strict):
    seen = {'pairs': 0, 'lost': 0, 'attributes': 0, 'value': 0}
    def hook(pairs):
        seen['pairs'] += len(pairs)
        seen['lost'] += len(pairs) - len(dict(pairs))
        for k, _ in pairs:
            if k in ('attributes', 'value'):
                seen[k] += 1
        return dict(pairs)
    def refuse(token):
        raise ValueError(token)
    with open(path, encoding='utf-8') as f:
        json.load(f, object_pairs_hook=hook, parse_constant=refuse if strict else None)
    return seen
k = count(sys.argv[1], False)
l = count(sys.argv[2], True)
print(k['pairs'], l['lost'], l['pairs'] - l['attributes'] - l['value'], l['attributes'])
)";
    std::string out;
    FILE* pipe =
        popen(("python3 '" + (m_dir / "count.py").string() + "' '" +
               (m_dir / "keyed.json").string() + "' '" + (m_dir / "list.json").string() + "'")
                  .c_str(),
              "r");
    ASSERT_NE(pipe, nullptr);
    char buffer[256];
    for (std::size_t n; (n = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;)
        out.append(buffer, n);
    ASSERT_EQ(pclose(pipe), 0) << out;
    std::istringstream numbers(out);
    long keyedPairs = -1, lost = -1, listPairs = -2, objects = 0;
    numbers >> keyedPairs >> lost >> listPairs >> objects;
    EXPECT_EQ(lost, 0);
    EXPECT_EQ(listPairs, keyedPairs);
    EXPECT_GT(objects, 10);

    // Either layout reads back into either layout, byte for byte.
    const std::string keyed = readFile(m_dir / "keyed.json"), list = readFile(m_dir / "list.json");
    for (const char* from : {"keyed.json", "list.json"}) {
        SCOPED_TRACE(from);
        ASSERT_EQ(run({"--read", std::string("{tmp}/") + from, "-o", "{tmp}/a.json"}).code, 0);
        const HostRun r = run({"--read", std::string("{tmp}/") + from, "--json-layout", "list",
                               "-o", "{tmp}/b.json"});
        ASSERT_EQ(r.code, 0) << r.err;
        EXPECT_TRUE(readFile(m_dir / "a.json") == keyed);
        EXPECT_TRUE(readFile(m_dir / "b.json") == list);
    }
    const HostRun bad = run({"{sample}", "--json-layout", "tree", "-o", "-"});
    EXPECT_EQ(bad.code, 2);
    EXPECT_NE(bad.err.find("keyed or list"), std::string::npos) << bad.err;
}

// Broken documents: a clear error with its line, exit 1, what can be read is
// read and written.
TEST_F(HostTest, ReadBackOfBrokenDocuments) {
    struct Row {
        const char* name;
        const char* text;
        const char* stderrHas;
        bool written;
    };
    const Row rows[] = {
        {"truncated", "{\n\"node\": {\n\t\"name^string\": \"a\",\n", "json parser", true},
        {"unknown type", "{\n\"node\": {\"name^string\": \"a\"},\n\"frob\": {}\n}\n", "frob", true},
        {"missing reference", "{\n\"scene\": {\n\t\"root^plugin\": \"nowhere\"\n}\n}\n", "nowhere",
         true},
        {"wrong value type", "{\n\"node\": {\n\t\"visible^bool\": \"yes\"\n}\n}\n", "at line 3",
         true},
        {"beyond double", "{\n\"node\": {\n\t\"x^double\": 1e400\n}\n}\n", "json parser", true},
        {"not json", "garbage", "json parser", true},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        std::ofstream(m_dir / "doc.json") << row.text;
        fs::remove(m_dir / "out.json");
        const HostRun r = run({"--read", "{tmp}/doc.json", "-o", "{tmp}/out.json"});
        EXPECT_EQ(r.code, 1) << r.err;
        EXPECT_NE(r.err.find(row.stderrHas), std::string::npos) << r.err;
        EXPECT_EQ(fs::exists(m_dir / "out.json"), row.written);
    }
    // A float below its range reads as the nearest value instead of being dropped.
    std::ofstream(m_dir / "doc.json") << "{\n\"node\": {\n\t\"tiny^float\": 1e-50\n}\n}\n";
    const HostRun r = run({"--read", "{tmp}/doc.json", "-o", "-"});
    EXPECT_EQ(r.code, 0) << r.err;
    EXPECT_NE(r.out.find("\"tiny^float\": 0"), std::string::npos) << r.out;
}

// ---- Scene counts ----

TEST(SceneStats, CountsFollowLinksAndBothFaceForms) {
    base::ref<base::PluginFactory> factory(new base::PluginFactory("stats"));
    scene::register_scene_schema(*factory);
    namespace n = scene::names;
    // A mesh over 'indices' with one primitive: a single face size, or one per face.
    auto makeMesh = [&](std::initializer_list<std::uint32_t> indices,
                        std::initializer_list<std::uint16_t> vcounts) {
        base::ref<base::IPlugin> mesh = factory->create(n::mesh, 3);
        for (std::uint32_t i : indices)
            mesh->appendAttributeItem<std::uint32_t>(n::indices, i);
        base::AttribMap* primitive = mesh->arrayAttribute(n::primitives)->appendMap();
        for (std::uint16_t v : vcounts)
            if (vcounts.size() == 1)
                primitive->setAttribute<std::uint16_t>(n::vcounts, v);
            else
                primitive->appendAttributeItem<std::uint16_t>(n::vcounts, v);
        return std::pair{mesh, primitive};
    };
    // Triangles over the whole index array.
    base::ref<base::IPlugin> a = makeMesh({0, 1, 2, 0, 2, 3}, {3}).first;
    for (int i = 0; i < 4; ++i)
        a->appendAttributeItem<base::vec3f>(n::positions, base::vec3f{float(i), 0, 0});
    // Positions shared with the first mesh through a link; one count per face.
    base::ref<base::IPlugin> b = makeMesh({0, 1, 2, 0, 1, 2, 3}, {3, 4}).first;
    base::AttribPath path;
    path.addPlugin(a.get()).addMember(n::positions);
    b->linkAttribute(n::positions)->setPath(path);
    // Quads over a range, and a primitive with a zero face size next to it.
    auto [c, quads] = makeMesh({0, 1, 2, 3, 0, 1, 2, 3, 9, 9, 9, 9}, {4});
    quads->setAttribute<std::uint32_t>(n::indexCount, 8);
    c->arrayAttribute(n::primitives)->appendMap()->setAttribute<std::uint16_t>(n::vcounts, 0);

    base::ref<base::IPlugin> skin = factory->create(n::skin, 3);
    skin->appendAttributeItem<base::ref<base::IPlugin>>(n::joints, a);
    skin->appendAttributeItem<base::ref<base::IPlugin>>(n::joints, b);

    const host::SceneStats stats = host::collectStats(*factory);
    ASSERT_EQ(stats.meshes.size(), 3u);
    for (const auto& mesh : stats.meshes)
        EXPECT_EQ(mesh.faces, 2u);
    EXPECT_EQ(stats.meshes[1].vertices, 4u);
    EXPECT_EQ(stats.vertices, 8u);
    EXPECT_EQ(stats.faces, 6u);
    EXPECT_EQ(stats.joints, 2u);
    EXPECT_EQ(stats.types,
              (base::vector<std::pair<base::string, std::uint32_t>>{{"mesh", 3}, {"skin", 1}}));

    const base::string text = host::formatSummary(stats, 0.25);
    EXPECT_NE(text.find("mesh"), base::string::npos);
    EXPECT_NE(text.find("0.250 s"), base::string::npos);
}

} // namespace

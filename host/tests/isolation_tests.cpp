// The host's pieces in-process: the isolated child and how its end is told,
// the record it sends back, and the mesh validation feature's verdicts.
#include "import_record.h"
#include "isolation.h"
#include "scene_features.h"
#include "scene_interfaces.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdio>
#include <string>
#include <thread>

namespace {

using host::ChildEnd;

struct ChildCase {
    const char* name;
    host::ChildJob job;
    ChildEnd::Kind kind;
    int code;
};

// Each way a child can end, with the host waiting no more than its limit.
TEST(IsolatedChild, EndsAreToldApart) {
    const ChildCase cases[] = {
        {"exit code", [](int) { return 3; }, ChildEnd::exited, 3},
        // A signal the sanitizers leave alone, as a crashing reader's abort.
        {"abort",
         [](int) {
             std::signal(SIGABRT, SIG_DFL);
             ::raise(SIGABRT);
             return 0;
         },
         ChildEnd::signalled, SIGABRT},
        {"killed",
         [](int) {
             ::raise(SIGKILL);
             return 0;
         },
         ChildEnd::signalled, SIGKILL},
        {"hang",
         [](int) {
             for (;;)
                 std::this_thread::sleep_for(std::chrono::seconds(1));
             return 0;
         },
         ChildEnd::timedOut, 1},
    };
    for (const ChildCase& c : cases) {
        SCOPED_TRACE(c.name);
        host::IsolationLimits limits;
        limits.timeoutSeconds = 1;
        const auto started = std::chrono::steady_clock::now();
        const ChildEnd end = host::runIsolated(limits, c.job);
        EXPECT_EQ(end.kind, c.kind);
        EXPECT_EQ(end.code, c.code);
        EXPECT_LT(std::chrono::steady_clock::now() - started, std::chrono::seconds(4));
    }
    EXPECT_EQ(host::signalText(SIGSEGV), "segmentation fault");
    EXPECT_EQ(host::signalText(SIGABRT), "aborted");
    EXPECT_EQ(host::signalText(64), "signal 64");
}

// The record crosses the process boundary whole, also when it outgrows the
// pipe's buffer and when its texts hold tabs and line breaks.
TEST(IsolatedChild, RecordComesBack) {
    host::ImportRecord sent;
    sent.status = "imported";
    sent.reason = "two\tlines\nof text";
    sent.types = {{"node", 11}, {"mesh", 2}};
    sent.vertices = 1ull << 40;
    sent.faces = 32;
    sent.seconds = 0.25;
    sent.warnings = 3;
    sent.errors = 1;
    sent.firstWarning = std::string(100000, 'w').c_str();
    sent.output = "/out/x.json";
    const ChildEnd end = host::runIsolated({}, [&](int fd) {
        const base::string text = host::encodeRecord(sent);
        for (std::size_t done = 0; done < text.size();) {
            const ssize_t n = ::write(fd, text.data() + done, text.size() - done);
            if (n <= 0)
                return 1;
            done += std::size_t(n);
        }
        return 0;
    });
    ASSERT_EQ(end.kind, ChildEnd::exited);
    host::ImportRecord got;
    host::decodeRecord(end.record, got);
    EXPECT_EQ(got.status, sent.status);
    EXPECT_EQ(got.reason, "two lines of text");
    EXPECT_EQ(got.types, sent.types);
    EXPECT_EQ(got.objects(), 13u);
    EXPECT_EQ(got.vertices, sent.vertices);
    EXPECT_EQ(got.faces, 32u);
    EXPECT_DOUBLE_EQ(got.seconds, 0.25);
    EXPECT_EQ(got.warnings, 3u);
    EXPECT_EQ(got.errors, 1u);
    EXPECT_EQ(got.firstWarning.size(), 100000u);
    EXPECT_EQ(got.output, sent.output);
    EXPECT_GT(end.peakKiB, 0u);
}

// --validate: an error fails the mesh (exit 3), warnings only count, one
// line per kind with its count.
TEST(ValidateFeature, ErrorsFailWarningsCount) {
    namespace n = scene::names;
    struct Row {
        const char* name;
        bool positions;
        int unnormalised;
        std::uint32_t badIndex;
        int code;
        std::vector<std::string> lines;
    };
    const Row rows[] = {
        {"clean", true, 0, 0, 0, {"validate: 1 meshes checked, 0 failed"}},
        {"no positions",
         false,
         0,
         0,
         3,
         {"validate: error: The vertex positions are missing! (1 time)",
          "validate: 1 meshes checked, 1 failed"}},
        {"index out of range",
         true,
         0,
         7,
         3,
         {"validate: error: Found face index out of range at position N! (1 time)"}},
        {"unnormalised normals",
         true,
         3,
         0,
         0,
         {"validate: warning: Unnormalized detected in the normals! (3 times)",
          "validate: 1 meshes checked, 0 failed"}},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        base::ref<base::PluginFactory> factory(new base::PluginFactory("validate"));
        scene::register_scene_schema(*factory);
        base::ref<base::IPlugin> mesh = factory->create(n::mesh, 3);
        mesh->setAttribute(n::name, base::string("m"));
        if (row.positions)
            for (int i = 0; i < 3; ++i)
                mesh->appendAttributeItem<base::vec3f>(n::positions,
                                                       base::vec3f{float(i), float(i * i), 0});
        if (row.unnormalised)
            for (int i = 0; i < 3; ++i)
                mesh->appendAttributeItem<base::normal>(
                    n::normals, base::normal{i < row.unnormalised ? 2.0f : 1.0f, 0, 0});
        for (std::uint32_t i : {0u, 1u, row.badIndex ? row.badIndex : 2u})
            mesh->appendAttributeItem<std::uint32_t>(n::indices, i);
        mesh->arrayAttribute(n::primitives)
            ->appendMap()
            ->setAttribute<std::uint16_t>(n::vcounts, 3);

        std::FILE* text = std::tmpfile();
        ASSERT_NE(text, nullptr);
        host::HostLog log;
        host::ImportRecord record;
        base::CmdLineOptions options;
        const base::string model("m.obj");
        host::ImportedScene scene{*factory, model, options, log, 0, text, record};
        EXPECT_EQ(host::validateMeshes(scene), row.code);
        std::rewind(text);
        std::string printed;
        for (int c; (c = std::fgetc(text)) != EOF;)
            printed += char(c);
        std::fclose(text);
        for (const std::string& line : row.lines)
            EXPECT_NE(printed.find(line + "\n"), std::string::npos) << printed;
        EXPECT_EQ(record.status == "invalid", row.code == 3);
    }
}

} // namespace

// The master file system, aliases and the native file system, over real
// temporary files.
#include "b_exception.h"
#include "b_stack_walker.h"
#include "stream/b_fs.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>

using namespace base;
namespace stdfs = std::filesystem;

namespace {

class FsTemp : public ::testing::Test {
protected:
    void SetUp() override {
        std::string pattern = (stdfs::temp_directory_path() / "fs_test_XXXXXX").string();
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        m_dir = pattern;
    }
    void TearDown() override {
        std::error_code ignored;
        stdfs::remove_all(m_dir, ignored);
    }
    std::string path(const std::string& name) const { return m_dir + "/" + name; }
    std::string make(const std::string& name, const std::string& content) const {
        stdfs::create_directories(stdfs::path(path(name)).parent_path());
        std::ofstream(path(name), std::ios::binary) << content;
        return path(name);
    }
    static std::string contents(const std::string& file) {
        std::ifstream in(file, std::ios::binary);
        return std::string(std::istreambuf_iterator<char>(in), {});
    }

    std::string m_dir;
};

class FsNative : public FsTemp {};
class FsMasterFiles : public FsTemp {};
class FsAliasFiles : public FsTemp {};

std::string readAll(Stream& s) {
    std::string out(std::size_t(s.getSize()), '\0');
    out.resize(std::size_t(s.read(out.data(), out.size())));
    return out;
}

// A file system that records how it is asked and answers as told.
enum class Act { stream, nothing, notFound, notFoundMessage, password, failure };

class FakeFS : public fs::IPlugin {
public:
    struct Desc : fs::PluginDesc {
        const char* ext = "";
        const char* name() const override { return "fake"; }
        const char* extensions() const override { return ext; }
        ref<fs::IPlugin> create() const override { return {}; }
    };

    explicit FakeFS(Act act, const char* extensions = "") : m_act(act) { m_desc.ext = extensions; }

    const fs::PluginDesc& pluginDesc() const override { return m_desc; }
    bool exists(std::string_view) override {
        ++calls;
        act();
        return m_act == Act::stream;
    }
    Stream open(std::string_view, std::uint32_t) override {
        ++calls;
        act();
        return m_act == Act::stream ? memoryStream("fake", {'x'}) : Stream();
    }

    int calls = 0;
    bool captureSeen = true;

private:
    void act() {
        captureSeen = stackWalker().captureEnabled();
        switch (m_act) {
        case Act::notFound:
            throw fs::file_not_found("", __FILE__, __LINE__, "fake");
        case Act::notFoundMessage:
            throw fs::file_not_found("fake fs| path not found!", __FILE__, __LINE__, "fake");
        case Act::password:
            throw fs::wrong_password("fake fs| wrong password", __FILE__, __LINE__, "fake");
        case Act::failure:
            throw api_exception("fake failure", EIO, __FILE__, __LINE__, "fake");
        default:
            break;
        }
    }

    Desc m_desc;
    Act m_act;
};

} // namespace

// ---- Native open and streams ----

TEST_F(FsNative, SharedReadsBothSucceed) {
    std::string file = make("a.txt", "shared");
    Stream first = fs::master().open(file, 13);
    Stream second = fs::master().open(file, 13);
    ASSERT_TRUE(first && second);
    EXPECT_EQ(readAll(first), "shared");
    EXPECT_EQ(readAll(second), "shared");
    EXPECT_TRUE(first.flags() & streamOpened);
    EXPECT_STREQ(first.name(), file.c_str());
}

struct CapsCase {
    std::uint32_t flags;
    std::uint32_t caps;
};
class FsNativeCaps : public FsTemp, public ::testing::WithParamInterface<CapsCase> {};

TEST_P(FsNativeCaps, AccessBitsDecideCapabilitiesAndTransfers) {
    std::string file = make("c.bin", "0123");
    Stream s = fs::master().open(file, GetParam().flags);
    EXPECT_EQ(s.caps(), GetParam().caps);
    bool writable = GetParam().caps & capWrite;
    EXPECT_EQ(s.write("zz", 2), writable ? 2u : 0u);
    s.setPosition(0);
    char c = 0;
    EXPECT_EQ(s.read(&c, 1), (GetParam().caps & capRead) ? 1u : 0u);
    s.close();
    EXPECT_EQ(s.caps(), 0u);
    EXPECT_EQ(contents(file), writable ? "zz23" : "0123");
}

INSTANTIATE_TEST_SUITE_P(Flags, FsNativeCaps,
                         ::testing::Values(CapsCase{0, 652}, CapsCase{1, 653}, CapsCase{13, 653},
                                           CapsCase{2, 670}, CapsCase{3, 671},
                                           CapsCase{3 | 12, 671}));

struct DispositionCase {
    const char* label;
    bool present;
    std::uint32_t flags;
    int sizeAfter; // -1: the open fails with file_not_found
};
class FsNativeDisposition : public FsTemp, public ::testing::WithParamInterface<DispositionCase> {};

TEST_P(FsNativeDisposition, CreationAndEmptyingFollowBits5And6) {
    const DispositionCase& c = GetParam();
    std::string file = c.present ? make("d.txt", "0123456789") : path("d.txt");
    if (c.sizeAfter < 0) {
        EXPECT_THROW(fs::master().open(file, c.flags), fs::file_not_found);
        EXPECT_FALSE(stdfs::exists(file));
        return;
    }
    Stream s = fs::master().open(file, c.flags);
    EXPECT_EQ(s.getSize(), std::uint64_t(c.sizeAfter));
    if (c.present && c.sizeAfter == 10) {
        // Writing over the start keeps the old tail until the size is set.
        EXPECT_EQ(s.write("ab", 2), 2u);
        EXPECT_EQ(s.getSize(), 10u);
        EXPECT_EQ(contents(file), "ab23456789");
        s.setSize(2);
        EXPECT_EQ(contents(file), "ab");
    }
}

INSTANTIATE_TEST_SUITE_P(Flags, FsNativeDisposition,
                         ::testing::Values(DispositionCase{"writeKeeps", true, 2, 10},
                                           DispositionCase{"readWriteKeeps", true, 3, 10},
                                           DispositionCase{"writeEmpties", true, 2 | 64, 0},
                                           DispositionCase{"createNewEmpties", true, 3 | 32 | 64,
                                                           0},
                                           DispositionCase{"writeCreates", false, 2, 0},
                                           DispositionCase{"createCreates", false, 3 | 32, 0},
                                           DispositionCase{"readMissing", false, 1, -1},
                                           DispositionCase{"readWriteMissing", false, 3, -1},
                                           DispositionCase{"emptyMissing", false, 3 | 64, -1}),
                         [](const auto& info) { return std::string(info.param.label); });

TEST_F(FsNative, EmptyingWithoutWriteAccessIsRefused) {
    std::string file = make("e.txt", "keep");
    EXPECT_THROW(fs::master().open(file, 1 | 64), invalid_argument);
    EXPECT_EQ(contents(file), "keep");
}

TEST_F(FsNative, ReopenDoesNotEmptyTheFile) {
    std::string file = path("r.txt");
    Stream s = fs::master().open(file, 3 | 32 | 64);
    ASSERT_EQ(s.write("hello", 5), 5u);
    ref<StreamWorker> again = s.worker()->reopen();
    ASSERT_TRUE(again);
    EXPECT_EQ(again->getSize(), 5u);
    EXPECT_EQ(again->caps(), 671u);
}

TEST_F(FsNative, StrictReadThrowsTheStreamMessage) {
    std::string file = make("s.txt", "0123456789");
    Stream s = fs::master().open(file, 13);
    char buffer[20];
    EXPECT_EQ(s.read(buffer, 20), 10u); // a short count at the end is no error
    s.setPosition(0);
    s.setFlags(s.flags() | streamStrictRead);
    try {
        s.readAll(buffer, 20);
        FAIL() << "a short strict read must throw";
    } catch (const exception& e) {
        EXPECT_EQ(std::string_view(e.message()),
                  "stream '" + file + "': trying to read 20 bytes, read 10 bytes");
    }
}

TEST_F(FsNative, SeeksFromEveryOrigin) {
    Stream s = fs::master().open(make("p.txt", "0123456789"), 13);
    struct Step {
        std::int64_t offset;
        std::uint32_t origin;
        std::uint64_t reached; // the read of one byte then moves one further
    };
    for (Step step :
         {Step{3, 0, 3}, Step{2, 1, 6}, Step{-4, 2, 6}, Step{-1, 7, 9}, Step{0, 1, 10}}) {
        EXPECT_EQ(s.setPosition(step.offset, step.origin), step.reached);
        EXPECT_EQ(s.getPosition(), step.reached);
        char c = 0;
        if (step.reached < 10) {
            ASSERT_EQ(s.read(&c, 1), 1u);
            EXPECT_EQ(c, char('0' + step.reached));
        }
    }
    EXPECT_TRUE(s.atEnd());
}

TEST_F(FsNative, FailingCallsThrowApiExceptionWithErrno) {
    Stream s = fs::master().open(make("f.txt", "abc"), 13);
    struct Case {
        std::function<void()> call;
        const char* function;
    };
    for (const Case& c :
         {Case{[&] { s.setPosition(-1, seekBegin); }, "base::fs::NativePlugin::setFilePosition"},
          Case{[&] { s.setSize(0); }, "base::fs::NativePlugin::fileTrunc"}}) {
        try {
            c.call();
            ADD_FAILURE() << c.function << " did not throw";
        } catch (const api_exception& e) {
            EXPECT_EQ(e.function(), c.function);
            EXPECT_TRUE(e.code() == EINVAL || e.code() == EBADF) << e.code();
        }
    }
    EXPECT_EQ(s.getSize(), 3u);
}

// ---- Paths ----

TEST_F(FsNative, BackslashIsASeparator) {
    make("dir/sub/b.txt", "back");
    std::string windowsStyle = m_dir + "\\dir\\sub\\b.txt";
    EXPECT_TRUE(fs::master().exists(windowsStyle));
    EXPECT_TRUE(fs::master().isFolder(m_dir + "/dir\\sub"));
    Stream s = fs::master().open(windowsStyle, 13);
    EXPECT_EQ(readAll(s), "back");
}

TEST_F(FsMasterFiles, FilesAndFoldersAreTold) {
    make("dir/x.txt", "x");
    struct Case {
        std::string path;
        bool exists, folder;
    };
    for (const Case& c : {Case{path("dir/x.txt"), true, false}, Case{path("dir"), false, true},
                          Case{path("missing.txt"), false, false},
                          Case{path("dir/x.txt/y"), false, false}, Case{"", false, false}}) {
        EXPECT_EQ(fs::master().exists(c.path), c.exists) << c.path;
        EXPECT_EQ(fs::master().isFolder(c.path), c.folder) << c.path;
    }
    EXPECT_THROW(fs::master().open(path("dir"), 13), fs::file_not_found);
    EXPECT_THROW(fs::master().open(path("dir"), 2), fs::file_not_found);
}

TEST(FsAliases, ExpansionReplacesKnownPrefixesAndStopsOnCycles) {
    fs::AliasRegistry r;
    r.set("data", "/srv/data/");
    r.set("models", "data:models/");
    r.set("self", "self:x/");
    r.set("ping", "pong:");
    r.set("pong", "ping:");
    struct Case {
        const char* in;
        const char* out;
    };
    for (Case c :
         {Case{"data:a.obj", "/srv/data/a.obj"}, Case{"models:b.obj", "/srv/data/models/b.obj"},
          Case{"other:c.obj", "other:c.obj"}, Case{"/abs/d.obj", "/abs/d.obj"},
          Case{"self:e", "self:x/e"}, Case{"ping:f", "ping:f"}, Case{":g", ":g"}})
        EXPECT_EQ(r.expand(c.in), c.out) << c.in;
    EXPECT_THROW(r.set("a:b", "x"), invalid_argument);
}

TEST_F(FsAliasFiles, ReachTheNativeFiles) {
    make("m/a.txt", "alias");
    fs::aliases().set("fstestdata", m_dir + "/");
    EXPECT_TRUE(fs::master().exists("fstestdata:m/a.txt"));
    Stream s = fs::master().open("fstestdata:m\\a.txt", 13);
    EXPECT_EQ(readAll(s), "alias");
    fs::aliases().remove("fstestdata");
    EXPECT_FALSE(fs::master().exists("fstestdata:m/a.txt"));
}

// ---- Master rules ----

TEST(FsMaster, EmptyPathIsRefusedBeforeAnyFileSystemIsAsked) {
    fs::MasterFS m;
    ref<FakeFS> fake(new FakeFS(Act::stream));
    m.attach(fake);
    try {
        m.open("", 13);
        FAIL() << "an empty path must throw";
    } catch (const invalid_argument& e) {
        EXPECT_EQ(e.message(), "file name not provided");
        EXPECT_EQ(e.function(), "base::fs::MasterFS::open");
    }
    EXPECT_FALSE(m.exists(""));
    EXPECT_EQ(fake->calls, 0);
}

struct ProbeCase {
    const char* label;
    Act first, second;
    const char* outcome; // "stream", "notFound", "password", "api"
    const char* message; // of the not-found exception, when checked
};
class FsMasterProbe : public ::testing::TestWithParam<std::tuple<ProbeCase, bool>> {};

TEST_P(FsMasterProbe, AnswersByTheRulesAndRestoresCapture) {
    const auto& [c, capture] = GetParam();
    fs::MasterFS m;
    ref<FakeFS> a(new FakeFS(c.first)), b(new FakeFS(c.second));
    m.attach(a);
    m.attach(b);
    ScopedStackCapture setting(capture);

    // exists() never throws: a failing file system counts as not having the file.
    EXPECT_EQ(m.exists("some/file"), c.first == Act::stream || c.second == Act::stream);
    EXPECT_EQ(stackWalker().captureEnabled(), capture);
    EXPECT_FALSE(a->captureSeen);

    std::string outcome = "stream";
    try {
        Stream s = m.open("some/file", 13);
        EXPECT_TRUE(s.flags() & streamOpened);
    } catch (const fs::file_not_found& e) {
        outcome = "notFound";
        if (c.message) {
            EXPECT_EQ(e.message(), c.message);
        }
    } catch (const fs::wrong_password&) {
        outcome = "password";
    } catch (const api_exception&) {
        outcome = "api";
    }
    EXPECT_EQ(outcome, c.outcome);
    EXPECT_EQ(stackWalker().captureEnabled(), capture);
    EXPECT_FALSE(a->captureSeen);
}

INSTANTIATE_TEST_SUITE_P(
    Rules, FsMasterProbe,
    ::testing::Combine(
        ::testing::Values(ProbeCase{"secondOpens", Act::nothing, Act::stream, "stream", nullptr},
                          ProbeCase{"afterNotFound", Act::notFound, Act::stream, "stream", nullptr},
                          ProbeCase{"afterPassword", Act::password, Act::stream, "stream", nullptr},
                          ProbeCase{"noneHasIt", Act::nothing, Act::notFound, "notFound",
                                    "file 'some/file' not found"},
                          ProbeCase{"messageKept", Act::notFoundMessage, Act::nothing, "notFound",
                                    "fake fs| path not found!"},
                          ProbeCase{"passwordOnly", Act::password, Act::nothing, "password",
                                    nullptr},
                          ProbeCase{"messageBeatsPassword", Act::password, Act::notFoundMessage,
                                    "notFound", "fake fs| path not found!"},
                          ProbeCase{"failurePassesOut", Act::failure, Act::stream, "api", nullptr}),
        ::testing::Bool()),
    [](const auto& info) {
        return std::string(std::get<0>(info.param).label) +
               (std::get<1>(info.param) ? "CaptureOn" : "CaptureOff");
    });

TEST_F(FsMasterFiles, RoutesWritesByExtension) {
    fs::MasterFS m;
    m.registerFS(ref<fs::PluginDesc>(&fs::nativeFileSystem()));
    m.attachFS("native");
    ref<FakeFS> archive(new FakeFS(Act::stream, "zip;pak"));
    m.attach(archive);

    Stream routed = m.open(path("out.PAK"), 2 | 128);
    EXPECT_EQ(archive->calls, 1);
    EXPECT_STREQ(routed.name(), "fake");
    // Without bit 7, or for an extension nobody claims, the native one answers.
    EXPECT_STREQ(m.open(path("plain.pak"), 2).name(), path("plain.pak").c_str());
    EXPECT_STREQ(m.open(path("out.txt"), 2 | 128).name(), path("out.txt").c_str());
    EXPECT_EQ(archive->calls, 1);
}

TEST(FsMaster, AttachFSFindsKindsByNameOnce) {
    fs::MasterFS m;
    m.registerFS(ref<fs::PluginDesc>(&fs::nativeFileSystem()));
    fs::IPlugin& native = m.attachFS("native", fs::attachSymLinks);
    EXPECT_EQ(&m.attachFS("native"), &native);
    EXPECT_EQ(m.attached().size(), 1u);
    EXPECT_TRUE(m.symLinksPermitted());
    try {
        m.attachFS("nope");
        FAIL() << "an unknown file system must throw";
    } catch (const invalid_argument& e) {
        EXPECT_EQ(e.message(), "file system with name nope can't be found");
        EXPECT_EQ(e.function(), "base::fs::MasterFS::attachFS");
    }
    EXPECT_STREQ(m.pluginDesc().name(), "master");
    EXPECT_THROW(m.readLink("x"), unsupported_interface);
}

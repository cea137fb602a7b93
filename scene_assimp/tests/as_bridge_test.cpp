// The log and file bridges as assimp sees them.
#include "as_io.h"
#include "as_logger.h"
#include "b_log.h"
#include "stream/b_fs.h"
#include "stream/b_stream.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <string>

namespace {

using base::CaptureLog;
using base::ScopedLog;

std::size_t countWith(const CaptureLog& log, std::string_view text) {
    std::size_t n = 0;
    for (const auto& e : log.entries())
        n += std::string_view(e.message).find(text) != std::string_view::npos;
    return n;
}

// ---- Log bridge ----

struct LoggedLine {
    int level;
    std::string message;
};

std::vector<LoggedLine> lines(const CaptureLog& log) {
    std::vector<LoggedLine> out;
    for (const auto& e : log.entries()) {
        EXPECT_EQ(e.channel, base::logScene);
        out.push_back({e.level, std::string(e.message)});
    }
    return out;
}

constexpr const char* skipping = "Skipping one or more lines with the same contents...";

TEST(AssimpLogger, FoldsRunsOfEqualMessages) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    auto* logger = new as::AssimpLogger();
    logger->warn("same");
    logger->warn("same");
    logger->warn("same");
    logger->OnError("other");
    logger->OnError("other");
    EXPECT_FALSE(logger->attachStream(nullptr, 0));
    EXPECT_FALSE(logger->detachStream(nullptr, 0));
    delete logger;

    const auto got = lines(capture);
    ASSERT_EQ(got.size(), 4u);
    EXPECT_EQ(got[0].level, 3);
    EXPECT_EQ(got[0].message, "assimp| same");
    EXPECT_EQ(got[1].level, 4);
    EXPECT_EQ(got[1].message, skipping);
    EXPECT_EQ(got[2].level, 2);
    EXPECT_EQ(got[2].message, "assimp| other");
    EXPECT_EQ(got[3].message, skipping);
}

TEST(AssimpLogger, AlternatingMessagesAreAllForwarded) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    as::AssimpLogger* logger = new as::AssimpLogger();
    logger->OnInfo("a");
    logger->OnDebug("b");
    logger->OnVerboseDebug("a");
    delete logger;

    const auto got = lines(capture);
    ASSERT_EQ(got.size(), 3u);
    EXPECT_EQ(got[0].level, 4);
    EXPECT_EQ(got[1].level, 5);
    EXPECT_EQ(got[1].message, "assimp| b");
    EXPECT_EQ(got[2].level, 5);
    EXPECT_EQ(got[2].message, "assimp| a");
}

TEST(AssimpLogger, EmptyFirstMessageCountsAsRepeat) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    as::AssimpLogger* logger = new as::AssimpLogger();
    logger->OnError("");
    logger->OnError("");
    delete logger;
    const auto got = lines(capture);
    ASSERT_EQ(got.size(), 1u);
    EXPECT_EQ(got[0].level, 4);
    EXPECT_EQ(got[0].message, skipping);
}

// ---- File bridge ----

// A file system that holds a few virtual files under one prefix and records
// the flags of every open; attached once, after the native one.
class VirtualFS final : public base::fs::IPlugin {
public:
    static constexpr std::string_view prefix = "/as-bridge-virtual/";

    static VirtualFS& instance() {
        static VirtualFS* fs = [] {
            auto* created = new VirtualFS();
            base::fs::master().attach(base::ref<base::fs::IPlugin>(created));
            return created;
        }();
        return *fs;
    }

    const base::fs::PluginDesc& pluginDesc() const override {
        static Desc desc;
        return desc;
    }
    bool exists(std::string_view path) override {
        return path.starts_with(prefix) && path.ends_with(".bin");
    }
    base::Stream open(std::string_view path, std::uint32_t flags) override {
        if (!path.starts_with(prefix))
            return {};
        lastFlags = flags;
        if (!path.ends_with(".bin"))
            return {};
        return base::memoryStream(path, base::vector<std::uint8_t>(30, 7));
    }

    std::uint32_t lastFlags = 0;

private:
    struct Desc final : base::fs::PluginDesc {
        const char* name() const override { return "as-bridge-virtual"; }
        base::ref<base::fs::IPlugin> create() const override { return {}; }
    };
};

TEST(AssimpIO, OpensThroughTheMasterFileSystemWithModeFlags) {
    VirtualFS& fs = VirtualFS::instance();
    as::AssimpIO io;
    const std::string path = std::string(VirtualFS::prefix) + "data.bin";
    EXPECT_TRUE(io.Exists(path.c_str()));
    EXPECT_EQ(io.getOsSeparator(), '/');

    const std::pair<const char*, std::uint32_t> modes[] = {
        {"rb", 13}, {"rt", 13}, {"r", 13}, {"wb", 2}, {"wt", 2}};
    for (const auto& [mode, flags] : modes) {
        fs.lastFlags = 0;
        Assimp::IOStream* stream = io.Open(path.c_str(), mode);
        ASSERT_NE(stream, nullptr) << mode;
        EXPECT_EQ(fs.lastFlags, flags) << mode;
        EXPECT_EQ(stream->FileSize(), 30u);
        io.Close(stream);
    }
    io.Close(nullptr);
}

TEST(AssimpIO, MissingFileAnswersNullSilently) {
    VirtualFS::instance();
    CaptureLog capture;
    ScopedLog scoped(capture);
    as::AssimpIO io;
    const std::string virtualMissing = std::string(VirtualFS::prefix) + "missing.mtl";
    EXPECT_FALSE(io.Exists(virtualMissing.c_str()));
    EXPECT_EQ(io.Open(virtualMissing.c_str(), "rb"), nullptr);
    EXPECT_EQ(io.Open("/no/such/folder/model.obj", "rb"), nullptr);
    EXPECT_TRUE(capture.entries().empty());
}

TEST(AssimpIO, OtherOpenFailuresAreLoggedAndAnswerNull) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    as::AssimpIO io;
    EXPECT_EQ(io.Open("", "rb"), nullptr);
    EXPECT_EQ(countWith(capture, "file name not provided"), 1u);
}

// A worker that accepts at most 'limit' bytes per write.
class ShortWriter final : public base::StreamWorker {
public:
    explicit ShortWriter(std::uint64_t limit)
        : StreamWorker("short", base::capWrite), m_limit(limit) {}
    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    std::uint64_t write(const void*, std::uint64_t bytes) override {
        return std::min(bytes, m_limit);
    }
    std::uint64_t setPosition(std::int64_t, std::uint32_t) override { return 0; }
    std::uint64_t getPosition() override { return 0; }
    std::uint64_t getSize() override { return 0; }
    void setSize(std::uint64_t) override {}
    void flush(std::uint32_t) override {}

private:
    std::uint64_t m_limit;
};

as::AssimpStream* memoryAssimpStream(std::size_t bytes, std::uint32_t flags = 0) {
    base::vector<std::uint8_t> data(bytes);
    for (std::size_t i = 0; i < bytes; ++i)
        data[i] = std::uint8_t(i);
    return new as::AssimpStream(base::memoryStream("mem", std::move(data), flags));
}

TEST(AssimpStream, ReadAnswersWholeElements) {
    struct Row {
        std::uint32_t flags;
        std::size_t size, count, expected;
        std::size_t logged;
    };
    // 30 bytes left in every row.
    const Row rows[] = {
        {0, 4, 10, 7, 0},
        {base::streamStrictRead, 4, 10, 0, 1},
        {base::streamStrictRead, 3, 10, 10, 0},
        {0, 0, 10, 0, 0},
        {0, 1, 0, 0, 0},
        // A request whose byte count overflows is refused before the stream
        // is touched: no buffer can hold it.
        {0, SIZE_MAX / 2, 4, 0, 0},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(testing::Message() << row.flags << " " << row.size << "x" << row.count);
        CaptureLog capture;
        ScopedLog scoped(capture);
        as::AssimpStream* stream = memoryAssimpStream(40, row.flags);
        ASSERT_EQ(stream->Seek(10, aiOrigin_SET), aiReturn_SUCCESS);
        unsigned char buffer[64] = {};
        EXPECT_EQ(stream->Read(buffer, row.size, row.count), row.expected);
        EXPECT_EQ(countWith(capture, "stream 'mem': trying to read 40 bytes, read 30 bytes"),
                  row.logged);
        if (row.expected == 7) {
            EXPECT_EQ(buffer[0], 10);
        }
        if (row.size == SIZE_MAX / 2) {
            EXPECT_EQ(stream->Tell(), 10u);
        }
        delete stream;
    }
}

TEST(AssimpStream, StrictShortWriteIsLoggedNotThrown) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    as::AssimpStream stream(
        base::Stream(base::ref<base::StreamWorker>(new ShortWriter(10)), base::streamStrictWrite));
    const char data[16] = {};
    size_t written = 99;
    EXPECT_NO_THROW(written = stream.Write(data, 4, 4));
    EXPECT_EQ(written, 2u);
    EXPECT_EQ(countWith(capture, "stream 'short': trying to write 16 bytes, written 10 bytes"), 1u);

    as::AssimpStream lenient(base::Stream(base::ref<base::StreamWorker>(new ShortWriter(10))));
    EXPECT_EQ(lenient.Write(data, 4, 4), 2u);
    EXPECT_EQ(lenient.Write(data, 0, 4), 0u);
}

TEST(AssimpStream, SeekReportsWhetherTheImpliedPositionWasReached) {
    struct Row {
        std::int64_t offset;
        aiOrigin origin;
        aiReturn expected;
        std::size_t position;
    };
    // Applied in order to one 100-byte stream.
    const Row rows[] = {
        {10, aiOrigin_SET, aiReturn_SUCCESS, 10},
        {5, aiOrigin_CUR, aiReturn_SUCCESS, 15},
        {-10, aiOrigin_END, aiReturn_SUCCESS, 90},
        {-5, aiOrigin_CUR, aiReturn_SUCCESS, 85},
        {0, aiOrigin_END, aiReturn_SUCCESS, 100},
        {0, aiOrigin_SET, aiReturn_SUCCESS, 0},
        // Before the start: the host clamps to 0, which is not where we asked to go.
        {-200, aiOrigin_CUR, aiReturn_FAILURE, 0},
        {-5, aiOrigin_SET, aiReturn_FAILURE, 0},
        {120, aiOrigin_SET, aiReturn_SUCCESS, 120},
    };
    as::AssimpStream* stream = memoryAssimpStream(100);
    for (const Row& row : rows) {
        SCOPED_TRACE(testing::Message() << row.offset << " from " << int(row.origin));
        EXPECT_EQ(stream->Seek(size_t(row.offset), row.origin), row.expected);
        EXPECT_EQ(stream->Tell(), row.position);
    }
    delete stream;
}

} // namespace

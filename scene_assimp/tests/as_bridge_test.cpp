// The log and file bridges as assimp sees them.
#include "as_io.h"
#include "as_logger.h"
#include "b_log.h"
#include "stream/b_fs.h"
#include "stream/b_stream.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <numeric>
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

constexpr const char* skipping = "Skipping one or more lines with the same contents...";

struct LoggerCase {
    const char* label;
    std::vector<std::pair<void (as::AssimpLogger::*)(const char*), const char*>> calls;
    std::vector<std::pair<int, std::string>> expected; // level, message
};

TEST(AssimpLogger, FoldsRunsOfEqualMessages) {
    using L = as::AssimpLogger;
    const LoggerCase cases[] = {
        {"runs",
         {{&L::OnWarn, "same"},
          {&L::OnWarn, "same"},
          {&L::OnWarn, "same"},
          {&L::OnError, "other"},
          {&L::OnError, "other"}},
         {{3, "assimp| same"}, {4, skipping}, {2, "assimp| other"}, {4, skipping}}},
        // A message that comes back after others is counted, and its count
        // (at its most severe level) closes the import.
        {"interleaved",
         {{&L::OnInfo, "a"},
          {&L::OnDebug, "b"},
          {&L::OnWarn, "a"},
          {&L::OnWarn, "a"},
          {&L::OnDebug, "b"},
          {&L::OnInfo, "c"},
          {&L::OnInfo, "a"}},
         {{4, "assimp| a"},
          {5, "assimp| b"},
          {4, "assimp| c"},
          {3, "assimp| a (repeated 3 more times)"},
          {5, "assimp| b (repeated 1 more time)"}}},
        {"emptyFirst", {{&L::OnError, ""}, {&L::OnError, ""}}, {{4, skipping}}},
    };
    for (const LoggerCase& c : cases) {
        SCOPED_TRACE(c.label);
        CaptureLog capture;
        ScopedLog scoped(capture);
        auto* logger = new as::AssimpLogger();
        for (const auto& [call, message] : c.calls)
            (logger->*call)(message);
        EXPECT_FALSE(logger->attachStream(nullptr, 0));
        EXPECT_FALSE(logger->detachStream(nullptr, 0));
        delete logger;
        std::vector<std::pair<int, std::string>> got;
        for (const auto& e : capture.entries()) {
            EXPECT_EQ(e.channel, base::logScene);
            got.emplace_back(e.level, std::string(e.message));
        }
        EXPECT_EQ(got, c.expected);
    }
}

// ---- File bridge ----

// A file system that holds 30-byte ".bin" files under one prefix and records
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
        return exists(path) ? base::memoryStream(path, base::vector<std::uint8_t>(30, 7))
                            : base::Stream();
    }

    std::uint32_t lastFlags = 0;

private:
    struct Desc final : base::fs::PluginDesc {
        const char* name() const override { return "as-bridge-virtual"; }
        base::ref<base::fs::IPlugin> create() const override { return {}; }
    };
};

TEST(AssimpIO, OpensThroughTheMasterFileSystem) {
    VirtualFS& fs = VirtualFS::instance();
    CaptureLog capture;
    ScopedLog scoped(capture);
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

    // A missing file answers null without a log line; other failures are logged.
    const std::string virtualMissing = std::string(VirtualFS::prefix) + "missing.mtl";
    EXPECT_FALSE(io.Exists(virtualMissing.c_str()));
    EXPECT_EQ(io.Open(virtualMissing.c_str(), "rb"), nullptr);
    EXPECT_EQ(io.Open("/no/such/folder/model.obj", "rb"), nullptr);
    EXPECT_TRUE(capture.entries().empty());
    EXPECT_EQ(io.Open("", "rb"), nullptr);
    EXPECT_EQ(countWith(capture, "file name not provided"), 1u);
}

// A worker that accepts at most 'limit' bytes per write.
class ShortWriter final : public base::StreamWorker {
public:
    explicit ShortWriter(std::uint64_t limit)
        : StreamWorker("short", base::capWrite), m_limit(limit) {}
    std::uint64_t read(void*, std::uint64_t) override { return 0; }
    std::uint64_t write(const void*, std::uint64_t n) override { return std::min(n, m_limit); }
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
    std::iota(data.begin(), data.end(), std::uint8_t(0));
    return new as::AssimpStream(base::memoryStream("mem", std::move(data), flags));
}

TEST(AssimpStream, ReadAnswersWholeElements) {
    struct Row {
        std::uint32_t flags;
        std::size_t size, count, expected, logged;
    };
    // 30 bytes left in every row. A request whose byte count overflows is
    // refused before the stream is touched: no buffer can hold it.
    const Row rows[] = {{0, 4, 10, 7, 0},
                        {base::streamStrictRead, 4, 10, 0, 1},
                        {base::streamStrictRead, 3, 10, 10, 0},
                        {0, 0, 10, 0, 0},
                        {0, 1, 0, 0, 0},
                        {0, SIZE_MAX / 2, 4, 0, 0}};
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

TEST(AssimpStream, ShortWriteAnswersWholeElementsStrictIsLoggedNotThrown) {
    const char data[16] = {};
    for (std::uint32_t flags : {std::uint32_t(base::streamStrictWrite), std::uint32_t(0)}) {
        CaptureLog capture;
        ScopedLog scoped(capture);
        as::AssimpStream stream(
            base::Stream(base::ref<base::StreamWorker>(new ShortWriter(10)), flags));
        size_t written = 99;
        EXPECT_NO_THROW(written = stream.Write(data, 4, 4));
        EXPECT_EQ(written, 2u);
        EXPECT_EQ(stream.Write(data, 0, 4), 0u);
        EXPECT_EQ(countWith(capture, "stream 'short': trying to write 16 bytes, written 10 bytes"),
                  flags ? 1u : 0u);
    }
}

TEST(AssimpStream, SeekReportsWhetherTheImpliedPositionWasReached) {
    struct Row {
        std::int64_t offset;
        aiOrigin origin;
        aiReturn expected;
        std::size_t position;
    };
    // Applied in order to one 100-byte stream. Before the start the host clamps
    // to 0, which is not where we asked to go.
    const Row rows[] = {
        {10, aiOrigin_SET, aiReturn_SUCCESS, 10},  {5, aiOrigin_CUR, aiReturn_SUCCESS, 15},
        {-10, aiOrigin_END, aiReturn_SUCCESS, 90}, {-5, aiOrigin_CUR, aiReturn_SUCCESS, 85},
        {0, aiOrigin_END, aiReturn_SUCCESS, 100},  {0, aiOrigin_SET, aiReturn_SUCCESS, 0},
        {-200, aiOrigin_CUR, aiReturn_FAILURE, 0}, {-5, aiOrigin_SET, aiReturn_FAILURE, 0},
        {120, aiOrigin_SET, aiReturn_SUCCESS, 120}};
    as::AssimpStream* stream = memoryAssimpStream(100);
    for (const Row& row : rows) {
        SCOPED_TRACE(testing::Message() << row.offset << " from " << int(row.origin));
        EXPECT_EQ(stream->Seek(size_t(row.offset), row.origin), row.expected);
        EXPECT_EQ(stream->Tell(), row.position);
    }
    delete stream;
}

} // namespace

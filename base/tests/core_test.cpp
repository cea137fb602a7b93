// Host services: names, heap, reference counts, the spin lock, streams,
// exceptions and the log.
#include "b_exception.h"
#include "b_lock.h"
#include "b_log.h"
#include "b_name.h"
#include "b_refcnt.h"
#include "b_stack_walker.h"
#include "stream/b_stream.h"

#include <gtest/gtest.h>

#include <thread>

using namespace base;

TEST(CoreNames, InterningFindsTheSameRecord) {
    name_id a("someAttributeName");
    name_id b(std::string_view("someAttributeName"));
    EXPECT_EQ(a, b);
    EXPECT_EQ(a.record(), b.record());
    EXPECT_STREQ(a.c_str(), "someAttributeName");
    EXPECT_EQ(nameServer().find("someAttributeName"), a);
    EXPECT_FALSE(nameServer().find("neverInternedText-42"));
}

TEST(CoreNames, TextsDifferingAfterTheInlineLengthAreDistinct) {
    // 15 characters fit inline in the record's string; the 16th must still count.
    name_id a("0123456789abcdefX");
    name_id b("0123456789abcdefY");
    EXPECT_NE(a, b);
    EXPECT_STREQ(b.c_str(), "0123456789abcdefY");
    std::string longText(300, 'n');
    EXPECT_EQ(name_id(longText), name_id(longText.c_str()));
}

TEST(CoreNames, NullNameFormatsEmpty) {
    name_id none;
    EXPECT_FALSE(none);
    EXPECT_TRUE(none.empty());
    EXPECT_STREQ(none.c_str(), "");
    EXPECT_EQ(format("[{}]", none), "[]");
}

TEST(CoreHeap, CountsLiveAndPeakBytes) {
    HeapStats before = heapStats();
    void* p = StdAllocPolicy::allocateBytes(1 << 20);
    void* q = StdAlignAllocPolicy<64>::allocateBytes(1000);
    ASSERT_TRUE(p && q);
    EXPECT_EQ(reinterpret_cast<std::uintptr_t>(q) % 64, 0u);
    HeapStats during = heapStats();
    EXPECT_GE(during.liveBytes, before.liveBytes + (1 << 20) + 1000);
    EXPECT_GE(during.peakBytes, during.liveBytes);
    StdAllocPolicy::deallocateBytes(p);
    StdAlignAllocPolicy<64>::deallocateBytes(q);
    EXPECT_LE(heapStats().liveBytes, during.liveBytes - (1 << 20) - 1000);
    EXPECT_EQ(StdAllocPolicy::allocateBytes(SIZE_MAX), nullptr);
}

namespace {
struct Counted : RefCntAtomic, AllocObject<> {
    explicit Counted(int* deaths) : deaths(deaths) {}
    ~Counted() override { ++*deaths; }
    int* deaths;
};
} // namespace

TEST(CoreRefCount, LastReleaseDestroysAndClearsWeakNodes) {
    int deaths = 0;
    WeakNode weak;
    {
        ref<Counted> a(new Counted(&deaths));
        a->addWeak(weak);
        EXPECT_EQ(weak.watched, a.get());
        ref<Counted> b = a;
        EXPECT_EQ(a->refCount(), 2u);
        a.reset();
        EXPECT_EQ(deaths, 0);
        EXPECT_EQ(weak.watched, b.get());
    }
    EXPECT_EQ(deaths, 1);
    EXPECT_EQ(weak.watched, nullptr);
}

TEST(CoreLock, WritersExcludeEachOtherAndReaders) {
    // Two threads bump a plain counter under the write lock and check under the
    // read lock that no writer is inside; a broken lock loses increments.
    LockWord word{0};
    long counter = 0;
    std::atomic<int> writersInside{0};
    std::atomic<bool> overlap{false};
    auto work = [&] {
        for (int i = 0; i < 20000; ++i) {
            {
                WriteGuard guard(word);
                if (writersInside.fetch_add(1) != 0)
                    overlap = true;
                ++counter;
                writersInside.fetch_sub(1);
            }
            ReadGuard guard(word);
            if (writersInside.load() != 0)
                overlap = true;
        }
    };
    std::thread t1(work), t2(work);
    t1.join();
    t2.join();
    EXPECT_EQ(counter, 40000);
    EXPECT_FALSE(overlap);
    EXPECT_EQ(word.load(), 0u);
}

TEST(CoreLock, ReadersShareAndWaitingWriterBlocksNewReaders) {
    LockWord word{0};
    readLock(word);
    readLock(word);
    EXPECT_EQ(word.load(), 2u);
    word.fetch_or(0x40000000u); // a writer announced itself
    readUnlock(word);
    EXPECT_EQ(word.load(), 0x40000001u);
    readUnlock(word);
    EXPECT_EQ(word.load(), 0x40000000u);
    writeLock(word); // the waiting bit does not keep the writer out
    EXPECT_EQ(word.load(), 0x80000000u);
    writeUnlock(word);
    EXPECT_EQ(word.load(), 0u);
}

TEST(CoreStream, MemoryStreamReadsWritesAndSeeks) {
    Stream s = memoryStream("mem");
    EXPECT_EQ(s.caps(), capRead | capWrite | capSeek | capResize);
    const char text[] = "0123456789";
    EXPECT_EQ(s.write(text, 10), 10u);
    EXPECT_EQ(s.getSize(), 10u);
    EXPECT_TRUE(s.atEnd());
    EXPECT_EQ(s.setPosition(-4, seekEnd), 6u);
    char buf[8] = {};
    EXPECT_EQ(s.read(buf, 8), 4u);
    EXPECT_STREQ(buf, "6789");
    EXPECT_EQ(s.setPosition(2, seekBegin), 2u);
    EXPECT_EQ(s.setPosition(3, seekCurrent), 5u);
    EXPECT_EQ(s.setPosition(-100, seekCurrent), 0u);
    s.setSize(3);
    EXPECT_EQ(s.getSize(), 3u);
    s.close();
    EXPECT_EQ(s.caps(), 0u);
    EXPECT_EQ(s.read(buf, 1), 0u);
}

TEST(CoreStream, StrictShortTransfersThrowAndLaxOnesKeepTheValue) {
    vector<std::uint8_t> two{1, 2};
    Stream lax = memoryStream("lax", two);
    std::uint32_t value = 77;
    EXPECT_FALSE(lax.readValue(value));
    EXPECT_EQ(value, 77u);

    Stream strict = memoryStream("strict", two, streamStrictRead);
    try {
        strict.readValue(value);
        FAIL() << "no exception";
    } catch (const exception& e) {
        EXPECT_STREQ(e.what(), "stream 'strict': trying to read 4 bytes, read 2 bytes");
        EXPECT_EQ(e.function(), "base::Stream::readAll");
    }
    EXPECT_EQ(value, 77u);

    class Full final : public MemoryStreamWorker {
    public:
        Full() : MemoryStreamWorker("full") {}
        std::uint64_t write(const void*, std::uint64_t bytes) override { return bytes / 2; }
    };
    Stream full(ref<StreamWorker>(new Full), streamStrictWrite);
    EXPECT_THROW(
        {
            try {
                full.writeValue(std::uint64_t(1));
            } catch (const exception& e) {
                EXPECT_STREQ(e.what(), "stream 'full': trying to write 8 bytes, written 4 bytes");
                throw;
            }
        },
        exception);
}

TEST(CoreException, LogsMessagePositionAndFunction) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    ScopedStackCapture noStack(false);
    try {
        BASE_THROW(invalid_argument, "file name not provided");
    } catch (const exception& e) {
        EXPECT_TRUE(e.callStack().empty());
        e.log(capture);
        auto lines = capture.messages();
        ASSERT_EQ(lines.size(), 1u);
        string expected = format("file name not provided()\n    File: {} ({})\nFunction: {}\n",
                                 e.file(), e.line(), e.function());
        EXPECT_EQ(lines[0], expected);
        EXPECT_NE(e.function().find("CoreException_LogsMessagePositionAndFunction"), string::npos);
        EXPECT_EQ(e.function().find('('), string::npos);
    }
    capture.clear();
    unsupported_interface u(__FILE__, 7, "fs::Plugin::readLink");
    EXPECT_STREQ(u.what(), "Unsupported interface.");
    u.log(capture);
    ASSERT_EQ(capture.entries().size(), 1u);
    EXPECT_EQ(capture.entries()[0].level, logError);
    EXPECT_EQ(capture.entries()[0].channel, logSystem);
    EXPECT_EQ(capture.messages()[0],
              format("Unsupported interface.\n    File: {} (7)\nFunction: fs::Plugin::readLink",
                     __FILE__));
}

TEST(CoreException, CapturesTheCallStackWhenEnabled) {
    ScopedStackCapture on(true);
    api_exception e("boom", 2, __FILE__, __LINE__, __PRETTY_FUNCTION__);
    EXPECT_EQ(e.code(), 2);
    EXPECT_FALSE(e.callStack().empty());
    CaptureLog capture;
    e.log(capture);
    ASSERT_EQ(capture.entries().size(), 2u);
    EXPECT_EQ(capture.messages()[1].rfind("Call stack:\n", 0), 0u);
}

TEST(CoreLog, MarkersAndCapture) {
    const char* expected[] = {"", "[crit]", "[erro]", "[warn]", "[info]", "[debg]"};
    for (int level = 0; level <= 5; ++level)
        EXPECT_STREQ(levelMarker(level), expected[level]);
    CaptureLog capture;
    {
        ScopedLog scoped(capture);
        log().log(logIO, logWarning, "hello");
    }
    EXPECT_NE(&log(), &capture);
    EXPECT_EQ(capture.count("hello"), 1u);
    EXPECT_EQ(capture.entries()[0].channel, logIO);
}

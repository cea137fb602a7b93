#include "b_format.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

namespace {

using base::FormatArg;
using base::FormatTime;

std::string run(const char* format, const std::vector<FormatArg>& args) {
    base::string out = "previous";
    base::vformatString(out, format, args.data(), args.size());
    return std::string(out);
}

std::u16string runWide(const char16_t* format, const std::vector<FormatArg>& args) {
    base::u16string out;
    base::vformatString(out, format, args.data(), args.size());
    return std::u16string(out);
}

std::string digitsOf(std::string_view text) {
    std::string digits;
    for (char c : text)
        if (c >= '0' && c <= '9')
            digits += c;
    return digits;
}

struct Row {
    const char* format;
    std::vector<FormatArg> args;
    const char* expected;
};

void PrintTo(const Row& row, std::ostream* os) {
    *os << '"' << row.format << '"';
}

class FormatGrammar : public testing::TestWithParam<Row> {};

TEST_P(FormatGrammar, Produces) {
    const Row& row = GetParam();
    EXPECT_EQ(run(row.format, row.args), row.expected);
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(FormatBraces, FormatGrammar, testing::Values(
    Row{"a{{b}}c", {1}, "a{b}c"},
    Row{"a{{b}}c", {}, "a{{b}}c"},
    Row{"{} stays", {}, "{} stays"},
    Row{"a}b", {1}, "ab"},
    Row{"abc{0", {1}, "abc"},
    Row{"x{}y{", {1}, "x1y"},
    Row{"{a{b}", {"s"}, "s"}));

INSTANTIATE_TEST_SUITE_P(FormatIndexes, FormatGrammar, testing::Values(
    Row{"{1} {0}", {"x", "y"}, "y x"},
    Row{"{1} {0} {}", {"x", "y", "z"}, "y x z"},
    Row{"{} {0} {}", {"a", "b", "c"}, "a a c"},
    Row{"[{5}]", {1}, "[]"},
    Row{"[{1,3}]", {1}, "[   ]"},
    Row{"[{0,*7}]", {1}, "[]"},
    Row{"[{99999999999999999999999}]", {1}, "[]"},
    Row{"{0,*1}", {"ab", 5}, "   ab"},
    Row{"{0,*1}|", {"ab", -4}, "ab  |"}));

INSTANTIATE_TEST_SUITE_P(FormatAlignment, FormatGrammar, testing::Values(
    Row{"{,5}", {"ab"}, "   ab"},
    Row{"{,-5}|", {"ab"}, "ab   |"},
    Row{"{,+5}", {"ab"}, "   ab"},
    Row{"{,1}", {"abc"}, "abc"},
    Row{"{,-2}|", {"abc"}, "abc|"}));

INSTANTIATE_TEST_SUITE_P(FormatIntegers, FormatGrammar, testing::Values(
    Row{"{:x}", {255u}, "ff"},
    Row{"{:X}", {255u}, "FF"},
    Row{"{,4:x0}", {255u}, "00ff"},
    Row{"{,4:x}", {255u}, "  ff"},
    Row{"{:x@ignored}", {255u}, "ff"},
    Row{"{:d+}", {5}, "+5"},
    Row{"{:d+}", {-5}, "-5"},
    Row{"{,5:d+0}", {42}, "+0042"},
    Row{"{,5:d0}", {-42}, "-0042"},
    Row{"{,-5:d}|", {42}, "42   |"},
    Row{"{:u}", {-1}, "4294967295"},
    Row{"{:x}", {-1}, "ffffffff"},
    Row{"{:x}", {std::int64_t(-1)}, "ffffffffffffffff"},
    Row{"{:d}", {0xFFFFFFFFu}, "-1"},
    Row{"{}", {INT64_MIN}, "-9223372036854775808"},
    Row{"{}", {UINT64_MAX}, "18446744073709551615"},
    Row{"{} {}", {true, false}, "1 0"},
    Row{"{} {:c}", {'A', 0x141}, "65 A"},
    Row{"[{:z}]", {1}, "[]"},
    Row{"[{:e}]", {1}, "[]"}));

INSTANTIATE_TEST_SUITE_P(FormatByteUnits, FormatGrammar, testing::Values(
    Row{"{:f}", {1536}, "1.50 KB"},
    Row{"{:f}", {2048}, "2 KB"},
    Row{"{:f}", {100}, "100  B"},
    Row{"{:f}", {0}, "0  B"},
    Row{"{:f}", {3u << 20}, "3 MB"},
    Row{"{:f}", {std::uint64_t(5) << 30}, "5 GB"},
    Row{"{:f}", {std::uint64_t(1) << 40}, "1024 GB"},
    Row{"{:k}", {1536}, "1 KB"},
    Row{"{:k}", {1537}, "2 KB"},
    Row{"{:k}", {512}, "0 KB"},
    Row{"{:k}", {513}, "1 KB"},
    Row{"{:k}", {UINT64_MAX}, "18014398509481984 KB"}));

INSTANTIATE_TEST_SUITE_P(FormatDoubles, FormatGrammar, testing::Values(
    Row{"{}", {1.5}, "1.500000"},
    Row{"{:f10}", {1.5}, "1.5000000000"},
    Row{"{:f*2}", {1.5, "x", 3}, "1.500"},
    Row{"[{:f*9}]", {1.5}, "[]"},
    Row{"{:f*1}", {2.0, -1}, "2.000000"},
    Row{"{:e}", {1234.5}, "1.234500e+03"},
    Row{"{:E2}", {1234.5}, "1.23E+03"},
    Row{"{:g}", {0.0001}, "0.0001"},
    Row{"{:G}", {1e-10}, "1E-10"},
    Row{"{:f2}", {-0.005}, "-0.01"},
    Row{"{,8:f2}", {3.14159}, "    3.14"},
    Row{"{,-8:f2}|", {3.14159f}, "3.14    |"},
    Row{"{:f0}", {1e20}, "100000000000000000000"},
    Row{"[{:d}]", {1.0}, "[]"}));

INSTANTIATE_TEST_SUITE_P(FormatStrings, FormatGrammar, testing::Values(
    Row{"[{}]", {static_cast<const char*>(nullptr)}, "[]"},
    Row{"[{}]", {nullptr}, "[]"},
    Row{"[{}]", {std::string_view("abcdef").substr(1, 3)}, "[bcd]"},
    Row{"[{}]", {std::string_view("ab\0cd", 5)}, "[ab]"},
    Row{"{}", {u"h\u00e9llo"}, "h\xc3\xa9llo"},
    Row{"{:65001}", {u"h\u00e9llo"}, "h\xc3\xa9llo"},
    Row{"{:1252}", {u"h\u00e9llo"}, "h\xe9llo"},
    Row{"{:*1}", {u"h\u00e9", 1252}, "h\xe9"},
    Row{"{:1252}", {u"a\u4e00b"}, "a?b"},
    Row{"[{:77777}]", {u"x"}, "[]"},
    Row{"{}", {u"\U0001F600"}, "\xf0\x9f\x98\x80"},
    Row{"{}", {u"a\xd800z"}, "a\xef\xbf\xbdz"},
    Row{"{,4}", {std::u16string_view(u"abcd").substr(0, 2)}, "  ab"}));

INSTANTIATE_TEST_SUITE_P(FormatTimes, FormatGrammar, testing::Values(
    Row{"{:u%Y-%m-%d %H:%M:%S}", {FormatTime{1700000000}}, "2023-11-14 22:13:20"},
    Row{"{:D}", {FormatTime{0}}, "Thursday, January 1, 1970"},
    Row{"{:T}", {FormatTime{13 * 3600 + 5 * 60 + 9}}, "1:05:09 PM"},
    Row{"{:t}", {FormatTime{13 * 3600 + 5 * 60 + 9}}, "1:05 PM"},
    Row{"{:d}", {FormatTime{0}}, "01/01/70"},
    Row{"{}", {FormatTime{0}}, "01/01/70"},
    Row{"[{:q}]", {FormatTime{0}}, "[]"}));

INSTANTIATE_TEST_SUITE_P(FormatIntervals, FormatGrammar, testing::Values(
    Row{"{:t}", {0}, "0 seconds"},
    Row{"{:t}", {250}, "250 milliseconds"},
    Row{"{:t}", {1000}, "1 second"},
    Row{"{:t}", {123000}, "2 minutes 3 seconds"},
    Row{"{:t}", {3605000}, "1 hour 5 seconds"},
    Row{"{:t1}", {1234}, "1 second"},
    Row{"{:t2}", {999999}, "16 minutes 40 seconds"}));
// clang-format on

TEST(FormatGrammarTest, NameIdAndHostStringsPassTheirText) {
    const base::name_id name("format_test_name");
    const base::string text = "host";
    EXPECT_EQ(run("{}:{}", {name, text}), "format_test_name:host");
    EXPECT_EQ(base::format("{} {}", base::name_id(), text), " host");
    EXPECT_EQ(base::format("{}-{}", std::string("std"), std::u16string(u"w")), "std-w");
}

TEST(FormatGrammarTest, PlaceholderOf256CharactersEndsOutput) {
    const std::string body255(255, ' ');
    EXPECT_EQ(run(("<{0" + body255.substr(1) + "}>").c_str(), {7}), "<7>");
    EXPECT_EQ(run(("<{0" + body255 + "}>").c_str(), {7}), "<");
}

TEST(FormatGrammarTest, WidthAbove255StaysAlignment) {
    EXPECT_EQ(run("{,255:d0}", {7}), std::string(254, '0') + "7");
    // 300 = width 255 + alignment 45, which the 255-wide text already exceeds.
    EXPECT_EQ(run("{,300:d}", {7}).size(), 255u);
}

TEST(FormatGrammarTest, ArgumentListEndsAtTheFirstEmptyTagAndAtTen) {
    std::vector<FormatArg> args{"a", FormatArg(), "c"};
    EXPECT_EQ(run("{}|{}|{2}", args), "a||");
    std::vector<FormatArg> many(12, FormatArg(1));
    EXPECT_EQ(run("{9}[{10}]", many), "1[]");
}

TEST(FormatGrammarTest, LocaleLettersGiveTheDigits) {
    EXPECT_EQ(digitsOf(run("{:n}", {1234567})), "1234567");
    EXPECT_EQ(run("{:n}", {-12}).front(), '-');
    EXPECT_EQ(digitsOf(run("{:n}", {1234.5})), "123450");
    EXPECT_EQ(digitsOf(run("{:n3}", {0.25})), "0250");
    EXPECT_EQ(digitsOf(run("{:t}", {1500})), "15");
}

TEST(FormatWide, SameGrammarOnUtf16) {
    EXPECT_EQ(runWide(u"{,5}|{,-3}|", {u"ab", u"c"}), u"   ab|c  |");
    EXPECT_EQ(runWide(u"{:x} {:f}", {255u, 1536}), u"ff 1.50 KB");
    EXPECT_EQ(runWide(u"{}", {"h\xc3\xa9\xf0\x9f\x98\x80"}), u"h\u00e9\U0001F600");
    EXPECT_EQ(runWide(u"{,3:1252}", {"\xe9"}), u"  \u00e9");
    EXPECT_EQ(runWide(u"{:D}", {FormatTime{0}}), u"Thursday, January 1, 1970");
    EXPECT_EQ(runWide(u"{:c}", {0xE9}), u"\u00e9");
    EXPECT_EQ(runWide(u"a{{{0}}}{", {1.25}), u"a{1.250000}");
    char16_t buffer[8];
    EXPECT_EQ(base::formatBuffer(buffer, 8, u"{}-{}", 12, u"x"), 4);
    EXPECT_EQ(std::u16string(buffer), u"12-x");
}

// Every cut of a text with multi-byte characters keeps whole characters only.
TEST(FormatFixedBuffer, TruncatesAtCharacterBoundaries) {
    const std::string full = "a\xf0\x9f\x98\x80"
                             "b\xc3\xa9";
    for (std::size_t capacity = 0; capacity <= full.size() + 2; ++capacity) {
        SCOPED_TRACE(capacity);
        for (bool verbatim : {false, true}) {
            auto buffer = std::make_unique<char[]>(capacity + 1);
            std::memset(buffer.get(), 'Z', capacity + 1);
            const int n = verbatim ? base::formatBuffer(buffer.get(), capacity, full.c_str())
                                   : base::formatBuffer(buffer.get(), capacity, "{}", full);
            if (capacity == 0) {
                EXPECT_EQ(n, 0);
                EXPECT_EQ(buffer[0], 'Z');
                continue;
            }
            EXPECT_EQ(buffer[capacity], 'Z');
            const std::string kept(buffer.get());
            EXPECT_EQ(static_cast<int>(kept.size()), n);
            EXPECT_LT(kept.size(), capacity);
            EXPECT_EQ(full.compare(0, kept.size(), kept), 0);
            const std::size_t whole[] = {0, 1, 5, 6, 8};
            EXPECT_NE(std::find(std::begin(whole), std::end(whole), kept.size()), std::end(whole))
                << kept.size();
            EXPECT_GE(kept.size() + 3, std::min(capacity - 1, full.size()));
        }
    }
}

TEST(FormatFixedBuffer, WideKeepsSurrogatePairs) {
    char16_t buffer[4] = {u'Z', u'Z', u'Z', u'Z'};
    EXPECT_EQ(base::formatBuffer(buffer, 3, u"{}", u"a\U0001F600"), 1);
    EXPECT_EQ(std::u16string(buffer), u"a");
    EXPECT_EQ(base::formatBuffer(buffer, 4, u"{}", u"a\U0001F600"), 3);
    EXPECT_EQ(base::formatBuffer(buffer, 1, u"{}", 5), 0);
    EXPECT_EQ(buffer[0], 0);
}

TEST(FormatFixedBuffer, PlainTruncationAndNoHostHeap) {
    char buffer[8];
    const auto before = base::heapStats().allocations;
    EXPECT_EQ(base::formatBuffer(buffer, sizeof(buffer), "hello {}", "world"), 7);
    EXPECT_STREQ(buffer, "hello w");
    EXPECT_EQ(base::formatBuffer(buffer, sizeof(buffer), "{,30}", 1), 7);
    EXPECT_STREQ(buffer, "       ");
    EXPECT_EQ(base::formatBuffer(nullptr, 5, "x"), 0);
    EXPECT_EQ(base::heapStats().allocations, before);
}

// Records every request and fails from the given call on (freeing the block).
struct TestAllocator {
    std::vector<std::size_t> requests;
    std::size_t failFrom = SIZE_MAX;
    int live = 0;

    static void* callback(void* user, void* block, std::size_t, std::size_t bytes) {
        auto& self = *static_cast<TestAllocator*>(user);
        self.requests.push_back(bytes);
        if (self.requests.size() > self.failFrom) {
            if (block)
                --self.live;
            std::free(block);
            return nullptr;
        }
        if (!block)
            ++self.live;
        return std::realloc(block, bytes);
    }
};

TEST(FormatGrowable, GrowsToNeededPlusFour) {
    TestAllocator alloc;
    char* buffer = nullptr;
    std::size_t capacity = 0;
    EXPECT_EQ(
        base::formatGrow(buffer, capacity, TestAllocator::callback, &alloc, "abc{}", "defghi"), 9);
    EXPECT_STREQ(buffer, "abcdefghi");
    EXPECT_EQ(capacity, 13u);
    EXPECT_EQ(alloc.requests, (std::vector<std::size_t>{8, 14})); // 3+4+1, 9+4+1
    std::free(buffer);

    char16_t* wide = nullptr;
    capacity = 0;
    alloc.requests.clear();
    EXPECT_EQ(base::formatGrow(wide, capacity, TestAllocator::callback, &alloc, u""), 0);
    EXPECT_EQ(wide[0], 0);
    EXPECT_EQ(alloc.requests, (std::vector<std::size_t>{10})); // (0+4+1) * 2 bytes
    std::free(wide);
}

TEST(FormatGrowable, FailingAllocatorGivesMinusOneAndNoBuffer) {
    TestAllocator alloc;
    alloc.failFrom = 1;
    char* buffer = nullptr;
    std::size_t capacity = 0;
    EXPECT_EQ(
        base::formatGrow(buffer, capacity, TestAllocator::callback, &alloc, "abc{}", "defghi"), -1);
    EXPECT_EQ(buffer, nullptr);
    EXPECT_EQ(capacity, 0u);
    EXPECT_EQ(alloc.live, 0);

    char* host = nullptr;
    capacity = 0;
    EXPECT_EQ(base::formatGrow(host, capacity, base::formatHostAllocator, nullptr, "{}{}",
                               std::string(100, 'x'), 1),
              101);
    EXPECT_EQ(std::string(host), std::string(100, 'x') + "1");
    base::StdAllocPolicy::deallocateBytes(host);
}

TEST(FormatString, ReplacesAndMayAliasAnArgument) {
    base::string s = "abc";
    EXPECT_EQ(base::formatString(s, "{}-{}", s, s), 7u);
    EXPECT_EQ(s, "abc-abc");
    base::string longText(300, 'q');
    EXPECT_EQ(base::formatString(longText, "{}{}", longText, longText), 600u);
    EXPECT_EQ(longText, base::string(600, 'q'));
    EXPECT_EQ(base::formatString(s, "{}", ""), 0u);
    EXPECT_TRUE(s.empty());
}

class RefusingOut final : public base::FormatOutA {
public:
    explicit RefusingOut(std::size_t limit) : m_limit(limit) {}
    bool write(const char* text, std::size_t count) override {
        if (received.size() + count > m_limit)
            return false;
        received.append(text, count);
        return true;
    }
    std::string received;

private:
    std::size_t m_limit;
};

TEST(FormatSink, CountsOrFailsWithMinusOne) {
    RefusingOut open(100);
    EXPECT_EQ(base::formatOut(open, "{} and {,3}", "one", 2), 11);
    EXPECT_EQ(open.received, "one and   2");
    RefusingOut tight(4);
    EXPECT_EQ(base::formatOut(tight, "{} and {}", "one", 2), -1);
    RefusingOut verbatim(2);
    EXPECT_EQ(base::formatOut(verbatim, "abc"), -1);
}

// Converting it is observable, so a filtered message proves it was not formatted.
struct Observable {
    mutable int conversions = 0;
    operator std::string_view() const {
        ++conversions;
        return "seen";
    }
};

TEST(FormatLog, LevelFilterComesBeforeFormatting) {
    base::CaptureLog log;
    log.setMaxLevel(base::logWarning);
    Observable value;
    base::logFormatted(log, base::logIO, base::logInfo, "{}", value);
    EXPECT_EQ(value.conversions, 0);
    EXPECT_TRUE(log.entries().empty());
    base::logFormatted(log, base::logIO, base::logWarning, "x {}", value);
    EXPECT_EQ(value.conversions, 1);
    ASSERT_EQ(log.entries().size(), 1u);
    EXPECT_EQ(log.entries()[0].message, "x seen");
    EXPECT_EQ(log.entries()[0].channel, base::logIO);
    EXPECT_EQ(log.entries()[0].level, base::logWarning);
}

TEST(FormatLog, VerbatimEmptyAndLongMessages) {
    base::CaptureLog log;
    base::ScopedLog scoped(log);
    base::logFormatted(base::logAll, base::logError, "{} stays {{");
    base::logFormatted(base::logAll, base::logError, "");
    base::logFormatted(base::logAll, base::logError, nullptr, 1);
    const std::string longText(3000, 'L');
    base::logFormatted(base::logScene, base::logDebug, "<{}>", longText);
    const auto messages = log.messages();
    ASSERT_EQ(messages.size(), 2u);
    EXPECT_EQ(messages[0], "{} stays {{");
    EXPECT_EQ(std::string(messages[1]), "<" + longText + ">");
}

} // namespace

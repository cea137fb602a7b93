// Text forms of values: the float printing rules, the scanners and their
// messages, compound values.
#include "b_string_convert.h"

#include <gtest/gtest.h>

#include <clocale>
#include <cmath>
#include <functional>
#include <limits>

using namespace base;

namespace {

struct FloatText {
    double value;
    const char* text;
};

class ConvertFloatText : public testing::TestWithParam<FloatText> {};

TEST_P(ConvertFloatText, PrintsByTheRules) {
    EXPECT_EQ(floatToString(GetParam().value), GetParam().text);
}

INSTANTIATE_TEST_SUITE_P(ConvertTable, ConvertFloatText,
                         testing::Values(FloatText{2e30, "2e+30"}, FloatText{-2e30, "-2e+30"},
                                         FloatText{0.5, "0.5"}, FloatText{2.0, "2"},
                                         FloatText{-0.0, "-0"}, FloatText{100.0, "100"},
                                         // The boundary itself still takes the fixed form.
                                         FloatText{1e30, "1000000000000000019884624838656"},
                                         FloatText{std::nan(""), "nan"}, FloatText{1e-7, "0"},
                                         FloatText{-1.25, "-1.25"}, FloatText{0.1f, "0.1"},
                                         FloatText{123456.5, "123456.5"}));

TEST(ConvertFloatText, FloatBoundaryKeepsTheFixedForm) {
    // 1e30f widens to 1.0000000150e30 as a double, but the float 1e30 is the
    // limit itself and keeps the fixed form.
    EXPECT_EQ(valueToString(1e30f), "1000000015047466219876688855040");
    EXPECT_EQ(valueToString(2e30f), "2e+30");
}

TEST(ConvertFloatText, IgnoresTheNumericLocale) {
    const std::string previous = std::setlocale(LC_NUMERIC, nullptr);
    if (!std::setlocale(LC_NUMERIC, "de_DE.UTF-8") && !std::setlocale(LC_NUMERIC, "fr_FR.UTF-8"))
        GTEST_SKIP() << "no locale with a decimal comma installed";
    const string text = valueToString(vec3f{1.5f, 0.25f, -2});
    vec3f back{};
    const bool parsed = valueFromString("1.5,0.25,-2", back);
    std::setlocale(LC_NUMERIC, previous.c_str());
    EXPECT_EQ(text, "1.5,0.25,-2");
    EXPECT_TRUE(parsed);
    EXPECT_EQ(back, (vec3f{1.5f, 0.25f, -2}));
}

struct ParseCase {
    const char* text;
    bool ok;
    double value;
};

class ConvertParseFloat : public testing::TestWithParam<ParseCase> {};

TEST_P(ConvertParseFloat, AcceptsOnlyNumbersEndedByBlanks) {
    const auto& c = GetParam();
    float f = 42;
    double d = 42;
    ASSERT_EQ(valueFromString(c.text, f), c.ok) << c.text;
    ASSERT_EQ(valueFromString(c.text, d), c.ok) << c.text;
    EXPECT_EQ(f, c.ok ? float(c.value) : 42.0f);
    EXPECT_EQ(d, c.ok ? c.value : 42.0);
}

INSTANTIATE_TEST_SUITE_P(ConvertTable, ConvertParseFloat,
                         testing::Values(ParseCase{"12.5e2", true, 1250}, ParseCase{"7 ", true, 7},
                                         ParseCase{"+3", true, 3}, ParseCase{"-1e-2", true, -0.01},
                                         ParseCase{"\t 4\r\n", true, 4}, ParseCase{".5", true, 0.5},
                                         ParseCase{"5.", true, 5}, ParseCase{"1E+2", true, 100},
                                         ParseCase{"1,5", false, 0}, ParseCase{"", false, 0},
                                         ParseCase{"abc", false, 0}, ParseCase{"1.5x", false, 0},
                                         ParseCase{"1e", false, 0}, ParseCase{"-", false, 0},
                                         ParseCase{".", false, 0}, ParseCase{"0x10", false, 0},
                                         ParseCase{"nan", false, 0}, ParseCase{"1 2", false, 0}));

TEST(ConvertParseFloat, OutOfRangeGivesInfinityOrZero) {
    float f = 1;
    ASSERT_TRUE(valueFromString("-1e39", f));
    EXPECT_EQ(f, -std::numeric_limits<float>::infinity());
    double d = 1;
    ASSERT_TRUE(valueFromString("1e-400", d));
    EXPECT_EQ(d, 0.0);
    ASSERT_TRUE(valueFromString("0.0000000000000000000000000000000000000000000001e400", d));
    EXPECT_EQ(d, std::numeric_limits<double>::infinity()); // 1e354
}

TEST(ConvertScanners, ThrowTheirOwnMessagesAndKeepTheCursor) {
    struct Case {
        std::function<void(const char*&)> scan;
        const char* message;
    };
    const Case cases[] = {
        {[](const char*& p) { stringToFloat(p); }, "Can't convert string to float!"},
        {[](const char*& p) { stringToDouble(p); }, "Can't convert string to double!"},
        {[](const char*& p) { stringToInteger(p); }, "Can't convert string to integer!"},
        {[](const char*& p) { stringToUnsigned(p); }, "Can't convert string to unsigned integer!"},
        {[](const char*& p) { stringToBool(p); }, "Can't convert string to boolean!"},
    };
    for (const auto& c : cases) {
        const char* text = "1.5x";
        const char* cursor = text;
        try {
            c.scan(cursor);
            ADD_FAILURE() << c.message;
        } catch (const string_conversion_exception& e) {
            EXPECT_STREQ(e.what(), c.message);
        }
        EXPECT_EQ(cursor, text);
    }
}

TEST(ConvertScanners, AdvancePastOneValue) {
    const char* text = "12 -3.5,x";
    const char* p = text;
    EXPECT_EQ(stringToInteger(p), 12);
    EXPECT_EQ(p, text + 2);
    EXPECT_EQ(stringToDouble(p, p + std::strlen(p), ','), -3.5);
    EXPECT_EQ(*p, ',');
}

TEST(ConvertParseIntegers, CheckTheRangeOfTheTarget) {
    std::int8_t i8 = 5;
    EXPECT_TRUE(valueFromString("-128", i8) && i8 == -128);
    EXPECT_FALSE(valueFromString("128", i8));
    std::uint8_t u8 = 5;
    EXPECT_FALSE(valueFromString("-1", u8));
    EXPECT_FALSE(valueFromString("256", u8));
    EXPECT_TRUE(valueFromString("+255", u8) && u8 == 255);
    std::int64_t i64 = 0;
    EXPECT_TRUE(valueFromString("-9223372036854775808", i64) &&
                i64 == std::numeric_limits<std::int64_t>::min());
    EXPECT_FALSE(valueFromString("9223372036854775808", i64));
    std::uint64_t u64 = 0;
    EXPECT_TRUE(valueFromString("18446744073709551615", u64) && u64 == ~0ull);
    EXPECT_FALSE(valueFromString("18446744073709551616", u64));
    int i = 9;
    EXPECT_FALSE(valueFromString("1.5", i));
    EXPECT_FALSE(valueFromString("1e3", i));
    EXPECT_EQ(i, 9);
}

TEST(ConvertParseBool, TakesWordsAndDigits) {
    for (auto [text, expected] :
         {std::pair{"true", true}, {"false", false}, {"1", true}, {"0", false}, {" true ", true}}) {
        bool b = !expected;
        EXPECT_TRUE(valueFromString(text, b)) << text;
        EXPECT_EQ(b, expected) << text;
    }
    bool b = true;
    for (const char* text : {"TRUE", "yes", "2", "truex", "", "10"})
        EXPECT_FALSE(valueFromString(text, b)) << text;
    EXPECT_TRUE(b);
}

TEST(ConvertCompound, JoinsComponentsInStorageOrder) {
    EXPECT_EQ(valueToString(vec3f{1, 0.5f, -2}), "1,0.5,-2");
    EXPECT_EQ(valueToString(quatf{1, 2, 3, 4}), "1,2,3,4"); // w first
    EXPECT_EQ(valueToString(box3d{{1, 2, 3}, {4, 5, 6}}), "1,2,3,4,5,6");
    EXPECT_EQ(valueToString(base_vec3<std::int8_t>{-1, 2, 3}), "-1,2,3");
    EXPECT_EQ(valueToString(base_vec2<std::uint8_t>{255, 0}), "255,0");
    mat43 m = mat43::identity();
    m.t = {7, 8, 9};
    EXPECT_EQ(valueToString(m), "1,0,0,0,1,0,0,0,1,7,8,9");
    EXPECT_EQ(valueToString(TimeCode(-46186158000)), "-46186158000");
}

TEST(ConvertCompound, NeedsEveryComponent) {
    vec3f v{9, 9, 9};
    EXPECT_TRUE(valueFromString(" 1 , 0.5,-2 ", v));
    EXPECT_EQ(v, (vec3f{1, 0.5f, -2}));
    for (const char* text : {"1,2", "1,2,", "1,2,3,4", "1 2 3", "1,,3", "1,2,3x"})
        EXPECT_FALSE(valueFromString(text, v)) << text;
    EXPECT_EQ(v, (vec3f{1, 0.5f, -2}));

    mat43 m{};
    ASSERT_TRUE(valueFromString("1,2,3,4,5,6,7,8,9,10.5,11,12", m));
    EXPECT_EQ(m.m.m[2][2], 9.0f);
    EXPECT_EQ(m.t.x, 10.5);

    const char* text = "1,2,3,4";
    const char* cursor = text;
    EXPECT_THROW(stringToValue(cursor, text + 7, v, 0), string_conversion_exception);
    EXPECT_EQ(cursor, text);
}

} // namespace

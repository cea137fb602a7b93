// Command-line options: value texts of every kind, the argument walk, the
// registration rules and the help text.
#include "b_cmdline.h"
#include "b_log.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

using namespace base;

namespace {

vector<std::string_view> split(std::string_view line) {
    vector<std::string_view> args;
    while (!line.empty()) {
        const auto blank = line.find(' ');
        args.push_back(line.substr(0, blank));
        line = blank == std::string_view::npos ? std::string_view() : line.substr(blank + 1);
    }
    return args;
}

// One option of each kind, as a host would register them.
struct Options {
    CmdLineOptions list;
    CmdLineValue<bool>* flag = list.addValue<bool>("-flag", "--flag", "A switch.");
    CmdLineValue<float>* scale = list.addValue<float>("-scale", {}, "A factor.");
    CmdLineValue<std::uint8_t>* level = list.addValue<std::uint8_t>("-level", {}, "A level.");
    CmdLineValue<string>* mode = list.addValue<string>("-mode", {}, "A mode.");
    CmdLineValue<string>* file = list.addValue<string>("-file", {}, "A file.");
    CmdLineValue<bool>* verbose = list.addValue<bool>("-v", {}, "Talk more.", 0, 1);
    Options() { mode->setChoices({{"none", 0}, {"off", 0}, {"compute", 2}}); }
};

struct ValueCase {
    std::string_view args;
    bool ok;
    // The option's value as text after a success; the message after a failure.
    std::string_view expected;
};

class CmdLineValues : public ::testing::TestWithParam<ValueCase> {};

TEST_P(CmdLineValues, ConvertOrReportTheText) {
    const ValueCase& c = GetParam();
    Options o;
    string error;
    const auto args = split(c.args);
    ASSERT_EQ(o.list.parse(args, error), c.ok) << error;
    if (!c.ok) {
        EXPECT_EQ(error, c.expected);
        return;
    }
    const CmdLineOption* option = o.list.find(args[0]);
    string value;
    if (auto* b = dynamic_cast<const CmdLineValue<bool>*>(option))
        value = b->value() ? "true" : "false";
    else if (auto* f = dynamic_cast<const CmdLineValue<float>*>(option))
        value = valueToString(f->value());
    else if (auto* u = dynamic_cast<const CmdLineValue<std::uint8_t>*>(option))
        value = valueToString(u->value());
    else
        value = dynamic_cast<const CmdLineValue<string>*>(option)->value();
    EXPECT_EQ(value, c.expected);
}

INSTANTIATE_TEST_SUITE_P(
    Kinds, CmdLineValues,
    ::testing::Values(
        ValueCase{"-flag true", true, "true"}, ValueCase{"-flag FALSE", true, "false"},
        ValueCase{"-flag 1", true, "true"}, ValueCase{"-flag 0", true, "false"},
        ValueCase{"-flag On", true, "true"}, ValueCase{"--flag off", true, "false"},
        ValueCase{"-flag yes", false,
                  "Invalid value 'yes' for command line option '-flag'. Expected true, false, 1, "
                  "0, on or off."},
        ValueCase{"-flag 2", false,
                  "Invalid value '2' for command line option '-flag'. Expected true, false, 1, 0, "
                  "on or off."},
        ValueCase{"-v", true, "true"}, ValueCase{"-v off", true, "false"},
        ValueCase{"-scale 2.5", true, "2.5"}, ValueCase{"-scale -1", true, "-1"},
        ValueCase{"-scale 1e3", true, "1000"},
        ValueCase{"-scale 1.5x", false,
                  "Invalid value '1.5x' for command line option '-scale'. Expected a value of "
                  "type float."},
        ValueCase{"-level 255", true, "255"}, ValueCase{"-level on", true, "1"},
        ValueCase{"-level 256", false,
                  "Invalid value '256' for command line option '-level'. Expected a whole number "
                  "from 0 to 255."},
        ValueCase{"-level -1", false,
                  "Invalid value '-1' for command line option '-level'. Expected a whole number "
                  "from 0 to 255."},
        ValueCase{"-mode Compute", true, "Compute"}, ValueCase{"-mode 7", true, "7"},
        ValueCase{"-mode bogus", false,
                  "Invalid value 'bogus' for command line option '-mode'. Expected one of none, "
                  "off, compute, or a number."},
        ValueCase{"-file -odd-name", true, "-odd-name"},
        ValueCase{"-scale", false, "Command line option '-scale' needs 1 value(s)."},
        ValueCase{"-nope 1", false, "Unknown command line option '-nope'."}));

TEST(CmdLine, WalksArgumentsIntoOptionsAndPositionals) {
    Options o;
    string error;
    vector<string> positional;
    ASSERT_TRUE(
        o.list.parse(split("a.obj -scale 2 -v b.obj -scale -0.5 -- -flag c"), error, &positional))
        << error;
    EXPECT_EQ(positional, (vector<string>{"a.obj", "b.obj", "-flag", "c"}));
    // A later occurrence wins; the switch took no value, since b.obj is no bool.
    EXPECT_FLOAT_EQ(o.scale->value(), -0.5f);
    EXPECT_EQ(o.scale->texts(), (vector<string>{"-0.5"}));
    EXPECT_TRUE(o.verbose->isSet() && o.verbose->value());
    EXPECT_FALSE(o.flag->isSet());

    // A failure keeps the values parsed before it and the option's old value.
    EXPECT_FALSE(o.list.parse(split("-flag on -scale x"), error));
    EXPECT_TRUE(o.flag->value());
    EXPECT_FLOAT_EQ(o.scale->value(), -0.5f);

    o.list.reset();
    EXPECT_FALSE(o.scale->isSet() || o.flag->isSet());
    EXPECT_FLOAT_EQ(o.scale->value(), 0.0f);

    const char* argv[] = {"host", "-level", "3", "model.fbx"};
    positional.clear();
    ASSERT_TRUE(o.list.parse(4, argv, error, &positional));
    EXPECT_EQ(o.level->value(), 3);
    EXPECT_EQ(positional, (vector<string>{"model.fbx"}));
}

TEST(CmdLine, AddsEachNameOnceAndSkipsNamelessOptions) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    CmdLineOptions list;
    ref<CmdLineOption> first(new CmdLineValue<int>("-a", "--alpha", "First."));
    EXPECT_TRUE(list.add(first));
    EXPECT_EQ(first->refCount(), 2u);
    EXPECT_FALSE(list.add(ref<CmdLineOption>(new CmdLineValue<int>("-a", {}, "Again."))));
    EXPECT_EQ(list.addValue<int>("--alpha", {}, "By the other name."), nullptr);
    EXPECT_EQ(list.addValue<int>("-b", "-a", "Alternative taken."), nullptr);
    EXPECT_TRUE(capture.entries().empty());

    EXPECT_EQ(list.addValue<int>("", {}, "No name."), nullptr);
    EXPECT_FALSE(list.add(ref<CmdLineOption>(new CmdLineValue<int>("", "-c", "No name."))));
    const auto entries = capture.entries();
    ASSERT_EQ(entries.size(), 2u);
    for (const auto& e : entries) {
        EXPECT_EQ(e.message, "Command line option without a name detected, skipping...");
        EXPECT_EQ(e.channel, logAll);
        EXPECT_EQ(e.level, logError);
    }
    EXPECT_EQ(list.size(), 1u);
    EXPECT_EQ(list.find("--alpha"), first.get());
    EXPECT_EQ(list.findValue<float>("-a"), nullptr);
}

TEST(CmdLine, HelpListsNamesTypesWrappedTextAndChoices) {
    Options o;
    o.list.addValue<string>("-long", {},
                            "Whether to import separate index channels for each vertex attribute "
                            "or use a global index channel.");
    const string wide = o.list.helpText();
    EXPECT_NE(wide.find("  -flag, --flag <bool>\n      A switch.\n"), string::npos) << wide;
    EXPECT_NE(wide.find("  -v [<bool>]\n"), string::npos);
    EXPECT_NE(wide.find("  -mode <string>\n      A mode.\n      Values: none (0), off (0), "
                        "compute (2), or a number.\n"),
              string::npos)
        << wide;
    const string help = o.list.helpText(40);
    EXPECT_NE(help.find("      Whether to import separate index\n      channels for each"),
              string::npos)
        << help;
    std::size_t start = 0;
    for (std::size_t end; (end = help.find('\n', start)) != string::npos; start = end + 1)
        EXPECT_LE(end - start, 40u) << help.substr(start, end - start);
}

} // namespace

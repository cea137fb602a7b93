#include "host_options.h"

#include "b_format.h"
#include "scene_cmdline.h"

#include <sys/stat.h>

#include <charconv>
#include <cmath>
#include <limits>
#include <string_view>

namespace host {

namespace {

// What numeric switches allow, beyond what their value type holds. An
// enumeration's number must name one of its values; counts are not negative.
struct Range {
    std::string_view option;
    double min, max;
    bool whole;
};
constexpr Range ranges[] = {
    {"-upAxis", 0, 2, true},
    {"-importNormals", 0, 2, true},
    {"-importTangents", 0, 2, true},
    {"-importMultiIndex", 0, 2, true},
    {"-computeNormalsMethod", 0, 255, true},
    {"-computeTangentsMethod", 0, 255, true},
    {"-importTessellation", std::numeric_limits<float>::min(), std::numeric_limits<float>::max(),
     false},
    {"-v", 0, 5, true},
    {"--timeout", 0, 7 * 24 * 3600, true},
    {"--max-memory", 16, double(1ull << 40), true},
    {"-j", 1, 256, true},
};

// Switches that take no value: a word right after one is a mistake, not a
// second model, unless that word names a file.
constexpr std::string_view valueless[] = {
    "-v", "--verbose", "-q", "--quiet", "--summary", "--validate", "--no-isolation"};

base::string expected(const base::CmdLineOption& option, const Range& range) {
    base::string out;
    if (!option.choices().empty()) {
        out = "one of ";
        for (const auto& c : option.choices())
            out += base::format("{}, ", c.text);
        out += "or ";
    }
    if (range.whole)
        out += base::format("a whole number from {} to {}", std::int64_t(range.min),
                            std::int64_t(range.max));
    else
        out += "a finite number above 0";
    return out;
}

bool checkRange(const base::CmdLineOption& option, const Range& range, base::string& error) {
    for (const base::string& text : option.texts()) {
        double value = 0;
        if (const auto choice = option.choice(text)) {
            value = double(*choice);
        } else {
            const char* end = text.data() + text.size();
            const auto [stop, failure] = std::from_chars(text.data(), end, value);
            // Out of the double range ("1e999") is out of any range here.
            if (failure == std::errc::result_out_of_range)
                value = std::numeric_limits<double>::infinity();
            else if (failure != std::errc() || stop != end)
                continue; // not a number: the value's own conversion reports it
        }
        if (!std::isfinite(value) || value < range.min || value > range.max ||
            (range.whole && value != std::floor(value))) {
            error = option.invalidValueMessage(text, expected(option, range));
            return false;
        }
    }
    return true;
}

bool exists(std::string_view path) {
    struct stat info {};
    return ::stat(base::string(path).c_str(), &info) == 0;
}

} // namespace

HostSwitches registerHostSwitches(base::CmdLineOptions& options) {
    HostSwitches s;
    s.help = options.addValue<bool>("--help", "-h", "Print this help and exit.", 0, 1);
    s.output = options.addValue<base::string>(
        "-o", "--output",
        "Write the imported scene as JSON to this file; '-' writes it to standard output.");
    s.plugin = options.addValue<base::string>(
        "--plugin", {},
        "Load the importer module from this file instead of scene_assimp.so "
        "beside the executable.");
    s.summary = options.addValue<bool>(
        "--summary", {},
        "Print the object count per type, the vertices, faces and joints and the time taken. "
        "On by default when no -o is given.",
        0, 1);
    s.validate = options.addValue<bool>(
        "--validate", {},
        "Validate every imported mesh, print the findings and exit with 3 when one has an error.",
        0, 1);
    s.verbose = options.addValue<int>("-v", "--verbose",
                                      "Log more: information, or the level given (0 to 5).", 0, 1);
    s.quiet = options.addValue<bool>("-q", "--quiet", "Log errors only.", 0, 1);
    s.timeout = options.addValue<std::int64_t>(
        "--timeout", {},
        "Give up an import after this many seconds (default 600; 0 waits for ever).");
    s.noIsolation = options.addValue<bool>(
        "--no-isolation", {},
        "Import in the host's own process instead of a child process (for debugging: a crash "
        "of the reader then ends the host).",
        0, 1);
    s.maxMemory = options.addValue<std::int64_t>(
        "--max-memory", {},
        "Limit the address space of the import process to this many MiB; a file that needs more "
        "fails to import.");
    s.jsonLayout = options.addValue<base::string>(
        "--json-layout", {},
        "How scene documents are written: 'keyed' (the default: one member per object, keyed "
        "by its type, so keys repeat) or 'list' (an array of {\"type\", \"attributes\"} "
        "objects, strict JSON for general JSON tools). --read takes both.");
    scene::register_importer_options(options);
    scene::register_scene_options(options);
    s.flipTextureCoordinates = options.addValue<bool>(
        "-importFlipTextureCoordinates", {},
        "Whether to flip the texture coordinates vertically (v becomes 1 - v).");
    s.flipFaceWinding = options.addValue<bool>(
        "-importFlipFaceWinding", {}, "Whether to reverse the vertex order of every face.");
    return s;
}

bool parseCommandLine(base::CmdLineOptions& options, int argc, const char* const* argv,
                      base::vector<base::string>& positional, base::string& error) {
    if (!options.parse(argc, argv, error, &positional))
        return false;
    for (const Range& range : ranges)
        if (const base::CmdLineOption* option = options.find(range.option);
            option && option->isSet() && !checkRange(*option, range, error))
            return false;
    if (const base::CmdLineOption* layout = options.find("--json-layout");
        layout && layout->isSet())
        for (const base::string& text : layout->texts())
            if (text != "keyed" && text != "list") {
                error = layout->invalidValueMessage(text, "keyed or list");
                return false;
            }
    if (positional.size() > 1)
        for (int i = 1; i + 1 < argc; ++i) {
            const std::string_view arg = argv[i], next = argv[i + 1];
            if (arg == "--")
                break;
            for (std::string_view name : valueless)
                if (arg == name && !next.starts_with('-') && !exists(next) &&
                    !options.find(arg)->accepts(next)) {
                    error = base::format("unexpected value '{}' after {}", next, arg);
                    return false;
                }
        }
    return true;
}

bool isOn(const base::CmdLineValue<bool>* option) noexcept {
    return option && option->isSet() && option->value();
}

base::JSONLayout jsonLayout(const HostSwitches& switches) noexcept {
    const auto* option = switches.jsonLayout;
    return option && option->isSet() && option->value() == "list" ? base::JSONLayout::list
                                                                  : base::JSONLayout::keyed;
}

} // namespace host

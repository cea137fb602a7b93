#include "b_cmdline.h"

#include "b_format.h"
#include "b_log.h"

#include <algorithm>
#include <exception>

namespace base {

namespace cmdline_detail {

namespace {
char lower(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c;
}
} // namespace

bool equalsNoCase(std::string_view a, std::string_view b) noexcept {
    return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(),
                                              [](char x, char y) { return lower(x) == lower(y); });
}

std::optional<bool> boolWord(std::string_view text) noexcept {
    for (std::string_view word : {"true", "1", "on"})
        if (equalsNoCase(text, word))
            return true;
    for (std::string_view word : {"false", "0", "off"})
        if (equalsNoCase(text, word))
            return false;
    return std::nullopt;
}

std::string_view trimBlanks(std::string_view text) noexcept {
    while (!text.empty() && isBlank(text.front()))
        text.remove_prefix(1);
    while (!text.empty() && isBlank(text.back()))
        text.remove_suffix(1);
    return text;
}

} // namespace cmdline_detail

// ---- CmdLineOption ------------------------------------------------------------

CmdLineOption::CmdLineOption(std::string_view name, std::string_view altName, std::string_view help,
                             std::uint32_t minValues, std::uint32_t maxValues)
    : m_name(name), m_altName(altName), m_help(help), m_minValues(minValues),
      m_maxValues(std::max(minValues, maxValues)) {}

bool CmdLineOption::matches(std::string_view text) const noexcept {
    return !text.empty() && (text == m_name || text == m_altName);
}

void CmdLineOption::setChoices(
    std::initializer_list<std::pair<std::string_view, std::int64_t>> choices) {
    vector<Choice> list;
    for (const auto& [text, value] : choices)
        list.push_back(Choice{string(text), value});
    m_choices.swap(list);
}

std::optional<std::int64_t> CmdLineOption::choice(std::string_view text) const noexcept {
    for (const Choice& c : m_choices)
        if (cmdline_detail::equalsNoCase(c.text, text))
            return c.value;
    return std::nullopt;
}

bool CmdLineOption::assign(std::span<const std::string_view> texts, string& error) {
    if (texts.size() < m_minValues || texts.size() > m_maxValues) {
        error = m_minValues == m_maxValues
                    ? format("Command line option '{}' takes {} value(s), {} given.", m_name,
                             m_minValues, texts.size())
                    : format("Command line option '{}' takes {} to {} values, {} given.", m_name,
                             m_minValues, m_maxValues, texts.size());
        return false;
    }
    vector<string> copies;
    copies.reserve(texts.size());
    for (std::string_view text : texts)
        copies.emplace_back(text);
    if (!parseValues(texts, error))
        return false;
    m_texts.swap(copies);
    m_set = true;
    return true;
}

void CmdLineOption::reset() {
    clearValues();
    m_texts.clear();
    m_set = false;
}

string CmdLineOption::invalidValueMessage(std::string_view text, std::string_view expected) const {
    return format("Invalid value '{}' for command line option '{}'. Expected {}.", text, m_name,
                  expected);
}

// ---- CmdLineOptions -----------------------------------------------------------

CmdLineOptions::CmdLineOptions() = default;
CmdLineOptions::~CmdLineOptions() = default;

bool CmdLineOptions::admits(std::string_view name, std::string_view altName) const {
    if (name.empty()) {
        logFormatted(logAll, logError, "Command line option without a name detected, skipping...");
        return false;
    }
    return !find(name) && (altName.empty() || !find(altName));
}

bool CmdLineOptions::add(ref<CmdLineOption> option) {
    if (!option || !admits(option->name(), option->altName()))
        return false;
    m_options.push_back(std::move(option));
    return true;
}

CmdLineOption* CmdLineOptions::find(std::string_view name) const noexcept {
    for (const auto& option : m_options)
        if (option->matches(name))
            return option.get();
    return nullptr;
}

void CmdLineOptions::reset() {
    for (const auto& option : m_options)
        option->reset();
}

namespace {

// "-5" and "-.5" are values, not option names.
bool looksLikeOption(std::string_view arg) noexcept {
    return arg.size() > 1 && arg[0] == '-' && !(arg[1] >= '0' && arg[1] <= '9') && arg[1] != '.';
}

} // namespace

bool CmdLineOptions::parse(std::span<const std::string_view> args, string& error,
                           vector<string>* positional) {
    // Conversions do not throw; this keeps an exhausted heap from escaping too.
    try {
        return parseArgs(args, error, positional);
    } catch (const std::exception& e) {
        error = e.what();
        return false;
    }
}

bool CmdLineOptions::parse(int argc, const char* const* argv, string& error,
                           vector<string>* positional) {
    vector<std::string_view> args;
    for (int i = 1; i < argc; ++i)
        args.emplace_back(argv[i] ? argv[i] : "");
    return parse(args, error, positional);
}

bool CmdLineOptions::parseArgs(std::span<const std::string_view> args, string& error,
                               vector<string>* positional) {
    std::size_t i = 0;
    while (i < args.size()) {
        const std::string_view arg = args[i++];
        if (arg == "--") {
            for (; i < args.size(); ++i)
                if (positional)
                    positional->emplace_back(args[i]);
            break;
        }
        CmdLineOption* option = find(arg);
        if (!option) {
            if (looksLikeOption(arg)) {
                error = format("Unknown command line option '{}'.", arg);
                return false;
            }
            if (positional)
                positional->emplace_back(arg);
            continue;
        }
        const std::size_t first = i;
        if (args.size() - i < option->minValues()) {
            error = format("Command line option '{}' needs {} value(s).", option->name(),
                           option->minValues());
            return false;
        }
        i += option->minValues();
        while (i - first < option->maxValues() && i < args.size() && args[i] != "--" &&
               !find(args[i]) && !looksLikeOption(args[i]) && option->accepts(args[i]))
            ++i;
        if (!option->assign(args.subspan(first, i - first), error))
            return false;
    }
    return true;
}

namespace {

// Appends 'text' word-wrapped to 'columns', every line indented by 'indent'.
void appendWrapped(string& out, std::string_view text, std::size_t indent, std::size_t columns) {
    const std::size_t width = columns > indent + 20 ? columns - indent : 20;
    std::size_t lineLength = 0;
    bool lineOpen = false;
    while (!text.empty()) {
        while (!text.empty() && isBlank(text.front()))
            text.remove_prefix(1);
        if (text.empty())
            break;
        std::size_t end = 0;
        while (end < text.size() && !isBlank(text[end]))
            ++end;
        const std::string_view word = text.substr(0, end);
        text.remove_prefix(end);
        if (lineOpen && lineLength + 1 + word.size() > width) {
            out += '\n';
            lineOpen = false;
        }
        if (!lineOpen) {
            out.append(indent, ' ');
            lineLength = 0;
            lineOpen = true;
        } else {
            out += ' ';
            ++lineLength;
        }
        out += word;
        lineLength += word.size();
    }
    if (lineOpen)
        out += '\n';
}

} // namespace

string CmdLineOptions::helpText(std::size_t columns) const {
    string out;
    for (const auto& option : m_options) {
        out += "  ";
        out += option->name();
        if (!option->altName().empty()) {
            out += ", ";
            out += option->altName();
        }
        if (option->maxValues() > 0) {
            out += option->minValues() == 0 ? " [<" : " <";
            out += option->valueType();
            out += option->minValues() == 0 ? ">]" : ">";
            if (option->maxValues() > 1)
                out += "...";
        }
        out += '\n';
        appendWrapped(out, option->help(), 6, columns);
        if (!option->choices().empty()) {
            string values = "Values:";
            for (std::size_t c = 0; c < option->choices().size(); ++c) {
                const auto& choice = option->choices()[c];
                values += c ? ", " : " ";
                values += choice.text;
                values += " (";
                appendInteger(values, choice.value);
                values += ')';
            }
            values += ", or a number.";
            appendWrapped(out, values, 6, columns);
        }
    }
    return out;
}

} // namespace base

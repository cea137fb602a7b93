// Command-line options of the host. Libraries and plug-in descriptors add
// their options to one CmdLineOptions list (IPluginDesc::registerOptions); the
// host parses its arguments with that list, prints its help and hands the
// parsed values to whoever applies them.
//
// An option has a name ("-importNormals"), an optional alternative name, a help
// text and takes between minValues and maxValues values per occurrence. Its
// value kind is CmdLineValue<T> for a type T of the attribute vocabulary
// (b_type_traits.h). A later occurrence replaces the values of an earlier one.
//
// Value texts:
//   bool        true, false, 1, 0, on, off (any case); a bool option that may
//               take no value and is given without one is true
//   integers    decimal, in the type's range; the boolean words count as 1 and 0
//   float, ...  the number grammar of b_string_convert.h
//   string      taken as it is
// An option may carry choices: named values of an enumeration ("none" 0,
// "file" 1, ...). Its value is then one of the choice texts (any case) or a
// number; numbers are checked against the receiving type when applied.
//
// Parsing never throws: a value that does not convert, a missing value or an
// unknown option answers false with a message for the user.
#pragma once

#include "b_memory.h"
#include "b_refcnt.h"
#include "b_string_convert.h"
#include "b_type_traits.h"

#include <cstdint>
#include <initializer_list>
#include <limits>
#include <optional>
#include <span>
#include <string_view>
#include <type_traits>
#include <utility>

namespace base {

class CmdLineOption : public RefCntAtomic, public AllocObject<>, NonCopyable {
public:
    struct Choice {
        string text;
        std::int64_t value;
    };

    CmdLineOption(std::string_view name, std::string_view altName, std::string_view help,
                  std::uint32_t minValues, std::uint32_t maxValues);

    const string& name() const noexcept { return m_name; }
    const string& altName() const noexcept { return m_altName; }
    const string& help() const noexcept { return m_help; }
    std::uint32_t minValues() const noexcept { return m_minValues; }
    std::uint32_t maxValues() const noexcept { return m_maxValues; }
    // Whether 'text' is the option's name or alternative name.
    bool matches(std::string_view text) const noexcept;

    // The type name of the values ("bool", "float", "string", ...).
    virtual std::string_view valueType() const = 0;
    // Whether 'text' converts to a value of the option.
    virtual bool accepts(std::string_view text) const = 0;

    // Named values of an enumeration, in the order help lists them.
    void setChoices(std::initializer_list<std::pair<std::string_view, std::int64_t>> choices);
    const vector<Choice>& choices() const noexcept { return m_choices; }
    // The value of a choice text (letter case ignored).
    std::optional<std::int64_t> choice(std::string_view text) const noexcept;

    // Whether the option was given, and the value texts of its last occurrence.
    bool isSet() const noexcept { return m_set; }
    const vector<string>& texts() const noexcept { return m_texts; }

    // Takes the value texts of one occurrence. On failure answers false with a
    // message in 'error' and keeps the previous values.
    bool assign(std::span<const std::string_view> texts, string& error);
    // Back to "not given".
    void reset();

    // "Invalid value '{text}' for command line option '{name}'. Expected {expected}."
    string invalidValueMessage(std::string_view text, std::string_view expected) const;

protected:
    // Converts every text into the option's values; false with 'error' set and
    // nothing changed when one does not convert.
    virtual bool parseValues(std::span<const std::string_view> texts, string& error) = 0;
    virtual void clearValues() = 0;

private:
    string m_name;
    string m_altName;
    string m_help;
    std::uint32_t m_minValues;
    std::uint32_t m_maxValues;
    vector<Choice> m_choices;
    vector<string> m_texts;
    bool m_set = false;
};

namespace cmdline_detail {

// Letter case ignored, ASCII only.
bool equalsNoCase(std::string_view a, std::string_view b) noexcept;
// true/false/1/0/on/off.
std::optional<bool> boolWord(std::string_view text) noexcept;
std::string_view trimBlanks(std::string_view text) noexcept;

// What a value text of 'option' converted to T may be, for messages.
template <class T>
string expectedText(const CmdLineOption& option) {
    string out;
    if (!option.choices().empty() && !std::is_same_v<T, bool>) {
        out = "one of ";
        for (const auto& c : option.choices()) {
            out += c.text;
            out += ", ";
        }
        out += "or ";
    }
    if constexpr (std::is_same_v<T, bool>) {
        out = "true, false, 1, 0, on or off";
    } else if constexpr (std::is_integral_v<T>) {
        out += "a whole number from ";
        appendInteger(out, std::int64_t(std::numeric_limits<T>::min()));
        out += " to ";
        appendUnsigned(out, std::uint64_t(std::numeric_limits<T>::max()));
    } else if constexpr (std::is_same_v<T, string>) {
        out += "a number";
    } else {
        out += "a value of type ";
        out += TypeTraits<T>::n_name.view();
    }
    return out;
}

} // namespace cmdline_detail

// Converts one value text of 'option' into a T with the rules above. False
// with the message in 'error' when it does not convert.
template <class T>
bool convertOptionText(const CmdLineOption& option, std::string_view text, T& out, string& error) {
    const std::string_view trimmed = cmdline_detail::trimBlanks(text);
    bool ok = false;
    if constexpr (std::is_same_v<T, string>) {
        if (option.choices().empty()) {
            out.assign(text.data(), text.size());
            return true;
        }
        std::int64_t number = 0;
        ok = option.choice(trimmed).has_value() || valueFromString(trimmed, number);
        if (ok)
            out.assign(trimmed.data(), trimmed.size());
    } else if constexpr (std::is_same_v<T, bool>) {
        std::optional<bool> word = cmdline_detail::boolWord(trimmed);
        if (!word && !option.choices().empty())
            if (auto c = option.choice(trimmed); c && (*c == 0 || *c == 1))
                word = *c == 1;
        if ((ok = word.has_value()))
            out = *word;
    } else if constexpr (std::is_integral_v<T>) {
        std::optional<std::int64_t> wide = option.choice(trimmed);
        if (!wide)
            if (auto word = cmdline_detail::boolWord(trimmed); word && option.choices().empty())
                wide = *word ? 1 : 0;
        if (wide) {
            ok = std::in_range<T>(*wide);
            if (ok)
                out = static_cast<T>(*wide);
        } else {
            ok = valueFromString(trimmed, out);
        }
    } else {
        ok = valueFromString(trimmed, out);
    }
    if (!ok)
        error = option.invalidValueMessage(text, cmdline_detail::expectedText<T>(option));
    return ok;
}

// An option whose values are of type T.
template <class T>
class CmdLineValue final : public CmdLineOption {
public:
    CmdLineValue(std::string_view name, std::string_view altName, std::string_view help,
                 std::uint32_t minValues = 1, std::uint32_t maxValues = 1, T fallback = T{})
        : CmdLineOption(name, altName, help, minValues, maxValues),
          m_fallback(std::move(fallback)) {}

    std::string_view valueType() const override { return TypeTraits<T>::n_name.view(); }
    bool accepts(std::string_view text) const override {
        T value{};
        string error;
        return convertOptionText(*this, text, value, error);
    }

    const vector<T>& values() const noexcept { return m_values; }
    // The first value given, else the fallback.
    T value() const { return m_values.empty() ? m_fallback : T(m_values.front()); }

protected:
    bool parseValues(std::span<const std::string_view> texts, string& error) override {
        vector<T> parsed;
        if constexpr (std::is_same_v<T, bool>)
            if (texts.empty())
                parsed.push_back(true);
        for (std::string_view text : texts) {
            T one{};
            if (!convertOptionText(*this, text, one, error))
                return false;
            parsed.push_back(std::move(one));
        }
        m_values.swap(parsed);
        return true;
    }
    void clearValues() override { m_values.clear(); }

private:
    T m_fallback;
    vector<T> m_values;
};

class CmdLineOptions : NonCopyable {
public:
    CmdLineOptions();
    ~CmdLineOptions();

    // Appends an option (the list keeps a reference). An option without a name
    // is skipped with the log line "Command line option without a name
    // detected, skipping..." (all channels, error); a name or alternative name
    // that is already taken adds nothing. Answers whether it was added.
    bool add(ref<CmdLineOption> option);
    // Makes and appends a CmdLineValue<T> with the same checks, which run
    // before anything is made. Answers the new option, or null.
    template <class T>
    CmdLineValue<T>* addValue(std::string_view name, std::string_view altName,
                              std::string_view help, std::uint32_t minValues = 1,
                              std::uint32_t maxValues = 1) {
        if (!admits(name, altName))
            return nullptr;
        ref<CmdLineOption> option(new CmdLineValue<T>(name, altName, help, minValues, maxValues));
        m_options.push_back(option);
        return static_cast<CmdLineValue<T>*>(option.get());
    }

    // The option of a name or alternative name, or null.
    CmdLineOption* find(std::string_view name) const noexcept;
    template <class T>
    CmdLineValue<T>* findValue(std::string_view name) const noexcept {
        return dynamic_cast<CmdLineValue<T>*>(find(name));
    }
    const vector<ref<CmdLineOption>>& options() const noexcept { return m_options; }
    std::size_t size() const noexcept { return m_options.size(); }

    // Parses arguments (without the program name). An option takes its
    // minimum number of values whatever they look like, then further values up
    // to its maximum while the next argument is no option and converts ("-v
    // model.obj" leaves the file to the positionals). "--" ends the
    // options; every other argument is positional and is appended to
    // 'positional' when given. Stops at the first failure: false with a
    // message in 'error'. Options given before the failure keep their values.
    bool parse(std::span<const std::string_view> args, string& error,
               vector<string>* positional = nullptr);
    // The same for main()'s arguments; argv[0] is the program and is skipped.
    bool parse(int argc, const char* const* argv, string& error,
               vector<string>* positional = nullptr);
    // Every option back to "not given".
    void reset();

    // One block per option, in list order: its names and value type, then the
    // help text (and the choices) wrapped to 'columns'.
    string helpText(std::size_t columns = 80) const;

private:
    bool admits(std::string_view name, std::string_view altName) const;
    bool parseArgs(std::span<const std::string_view> args, string& error,
                   vector<string>* positional);

    vector<ref<CmdLineOption>> m_options;
};

} // namespace base

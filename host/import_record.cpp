#include "import_record.h"

#include "b_format.h"

#include <unistd.h>

#include <charconv>
#include <cstdlib>

namespace host {

namespace {

void appendLine(base::string& out, std::string_view key, std::string_view value) {
    out += key;
    out += '\t';
    for (char c : value)
        out += (c == '\t' || c == '\n' || c == '\r') ? ' ' : c;
    out += '\n';
}

template <class T>
void number(std::string_view text, T& value) {
    std::from_chars(text.data(), text.data() + text.size(), value);
}

} // namespace

std::uint64_t ImportRecord::objects() const noexcept {
    std::uint64_t total = 0;
    for (const auto& type : types)
        total += type.second;
    return total;
}

base::string encodeRecord(const ImportRecord& r) {
    base::string out;
    appendLine(out, "status", r.status);
    appendLine(out, "reason", r.reason);
    for (const auto& [type, count] : r.types)
        appendLine(out, "type", base::format("{} {}", count, type));
    appendLine(out, "vertices", base::format("{}", r.vertices));
    appendLine(out, "faces", base::format("{}", r.faces));
    appendLine(out, "seconds", base::format("{}", r.seconds));
    appendLine(out, "warnings", base::format("{}", r.warnings));
    appendLine(out, "errors", base::format("{}", r.errors));
    appendLine(out, "firstWarning", r.firstWarning);
    appendLine(out, "output", r.output);
    return out;
}

void sendRecord(int fd, const ImportRecord& record) {
    const base::string text = encodeRecord(record);
    // A host that stopped listening has no use for the record.
    [[maybe_unused]] const ssize_t ignored = ::write(fd, text.data(), text.size());
}

void decodeRecord(std::string_view text, ImportRecord& r) {
    while (!text.empty()) {
        const std::size_t end = text.find('\n');
        std::string_view line = text.substr(0, end);
        text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
        const std::size_t tab = line.find('\t');
        if (tab == std::string_view::npos)
            continue;
        const std::string_view key = line.substr(0, tab), value = line.substr(tab + 1);
        if (key == "status")
            r.status.assign(value);
        else if (key == "reason")
            r.reason.assign(value);
        else if (key == "type") {
            const std::size_t blank = value.find(' ');
            std::uint32_t count = 0;
            number(value.substr(0, blank), count);
            if (blank != std::string_view::npos)
                r.types.emplace_back(base::string(value.substr(blank + 1)), count);
        } else if (key == "vertices")
            number(value, r.vertices);
        else if (key == "faces")
            number(value, r.faces);
        else if (key == "seconds")
            r.seconds = std::strtod(base::string(value).c_str(), nullptr);
        else if (key == "warnings")
            number(value, r.warnings);
        else if (key == "errors")
            number(value, r.errors);
        else if (key == "firstWarning")
            r.firstWarning.assign(value);
        else if (key == "output")
            r.output.assign(value);
    }
}

} // namespace host

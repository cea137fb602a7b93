#include "html_report.h"

#include "b_format.h"
#include "batch_report.h"
#include "preview_switches.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>

namespace host {

namespace {

// Dark cards on a dark page like the previews themselves; a failure's card
// has a red border and comes first.
constexpr std::string_view pageHead = R"(<!DOCTYPE html>
<html lang="en">
<head>
<meta charset="utf-8">
<title>scene-import batch</title>
<style>
body { background: #15171c; color: #dde; font: 14px sans-serif; margin: 16px; }
h1 { font-size: 18px; font-weight: normal; }
.grid { display: grid; grid-template-columns: repeat(auto-fill, minmax(220px, 1fr)); gap: 12px; }
.card { background: #23262e; border: 2px solid #343844; border-radius: 6px; padding: 8px; overflow-wrap: anywhere; }
.card.failed { border-color: #d04040; background: #2e2024; }
.card img, .card .none { display: block; width: 192px; height: 192px; margin: 0 auto 6px; }
.card .none { background: #101114; color: #778; line-height: 192px; text-align: center; }
.name { font-weight: bold; }
.status { color: #8c8; }
.failed .status { color: #f66; }
.counts { color: #aab; font-size: 12px; }
.note { font-size: 12px; color: #dca; margin-top: 4px; }
</style>
</head>
<body>
)";

} // namespace

base::string escapeHtml(std::string_view text) {
    base::string out;
    out.reserve(text.size());
    for (const char c : text)
        switch (c) {
        case '&':
            out += "&amp;";
            break;
        case '<':
            out += "&lt;";
            break;
        case '>':
            out += "&gt;";
            break;
        case '"':
            out += "&quot;";
            break;
        case '\'':
            out += "&#39;";
            break;
        default:
            out += c;
        }
    return out;
}

base::string base64(std::span<const std::uint8_t> bytes) {
    static constexpr char digits[] =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    base::string out;
    out.reserve((bytes.size() + 2) / 3 * 4);
    std::size_t i = 0;
    for (; i + 2 < bytes.size(); i += 3) {
        const std::uint32_t v = bytes[i] << 16 | bytes[i + 1] << 8 | bytes[i + 2];
        for (int shift = 18; shift >= 0; shift -= 6)
            out += digits[v >> shift & 63];
    }
    if (const std::size_t rest = bytes.size() - i; rest > 0) {
        const std::uint32_t v = bytes[i] << 16 | (rest == 2 ? bytes[i + 1] << 8 : 0);
        out += digits[v >> 18 & 63];
        out += digits[v >> 12 & 63];
        out += rest == 2 ? digits[v >> 6 & 63] : '=';
        out += '=';
    }
    return out;
}

base::string reportHtml(std::span<const ImportRecord> records, std::span<const base::string> names,
                        std::span<const base::vector<std::uint8_t>> thumbnails, double seconds) {
    std::size_t failed = 0;
    for (const ImportRecord& r : records)
        failed += imported(r) ? 0 : 1;
    base::string out(pageHead);
    out +=
        base::format("<h1>{} files: {} imported, {} failed, {:f1} s</h1>\n<div class=\"grid\">\n",
                     records.size(), records.size() - failed, failed, seconds);
    for (const std::size_t i : failuresFirst(records)) {
        const ImportRecord& r = records[i];
        const bool ok = imported(r);
        out += ok ? "<div class=\"card\">\n" : "<div class=\"card failed\">\n";
        if (!thumbnails[i].empty())
            out += base::format("<img alt=\"{}\" src=\"data:image/png;base64,{}\">\n",
                                escapeHtml(names[i]), base64(thumbnails[i]));
        else
            out += "<div class=\"none\">no picture</div>\n";
        out += base::format("<div class=\"name\">{}</div>\n<div class=\"status\">{}</div>\n",
                            escapeHtml(names[i]), escapeHtml(r.status));
        out += base::format("<div class=\"counts\">{} objects, {} vertices, {} faces, {:f2} s, "
                            "{} warnings, {} errors</div>\n",
                            r.objects(), r.vertices, r.faces, r.seconds, r.warnings, r.errors);
        if (!r.reason.empty())
            out += base::format("<div class=\"note\">{}</div>\n", escapeHtml(r.reason));
        if (!r.firstWarning.empty() && r.firstWarning != r.reason)
            out += base::format("<div class=\"note\">{}</div>\n", escapeHtml(r.firstWarning));
        out += "</div>\n";
    }
    out += "</div>\n</body>\n</html>\n";
    return out;
}

int thumbnailFeature(const base::PluginFactory& factory, const base::string& model,
                     const base::string& path) {
    preview::PreviewRequest request;
    request.path = path;
    request.options.size = thumbnailSize;
    const std::size_t slash = model.find_last_of('/');
    request.options.modelFolder = slash == base::string::npos ? "./" : model.substr(0, slash + 1);
    preview::previewFeature(factory, request);
    return 0;
}

base::vector<std::uint8_t> takeThumbnail(const base::string& path) {
    base::vector<std::uint8_t> png;
    std::FILE* file = std::fopen(path.c_str(), "rb");
    if (!file)
        return png;
    struct stat info {};
    // The child writes a few kilobytes; anything far larger is not its thumbnail.
    if (::fstat(::fileno(file), &info) == 0 && S_ISREG(info.st_mode) &&
        info.st_size < (std::int64_t(16) << 20)) {
        png.resize(std::size_t(info.st_size));
        if (std::fread(png.data(), 1, png.size(), file) != png.size())
            png.clear();
    }
    std::fclose(file);
    ::unlink(path.c_str());
    return png;
}

} // namespace host

#include "batch_report.h"

#include "b_format.h"

#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <numeric>

namespace host {

namespace {

base::string clock(double seconds) {
    const auto whole = std::uint64_t(std::max(0.0, seconds) + 0.5);
    if (whole >= 3600)
        return base::format("{}:{,2:u0}:{,2:u0}", whole / 3600, whole / 60 % 60, whole % 60);
    return base::format("{}:{,2:u0}", whole / 60, whole % 60);
}

std::size_t terminalWidth(std::FILE* to) {
    winsize size{};
    if (::ioctl(::fileno(to), TIOCGWINSZ, &size) == 0 && size.ws_col > 0)
        return size.ws_col;
    return 80;
}

// What the last column shows: a failure's reason, a success's first warning.
const base::string& note(const ImportRecord& record) {
    return imported(record) ? record.firstWarning : record.reason;
}

} // namespace

bool imported(const ImportRecord& record) noexcept {
    return record.status == "imported" || record.status == "skipped";
}

base::vector<std::size_t> failuresFirst(std::span<const ImportRecord> records) {
    base::vector<std::size_t> order(records.size());
    std::iota(order.begin(), order.end(), std::size_t(0));
    std::stable_sort(order.begin(), order.end(), [&](std::size_t a, std::size_t b) {
        return !imported(records[a]) && imported(records[b]);
    });
    return order;
}

BatchProgress::BatchProgress(std::FILE* to, Mode mode, std::size_t total)
    : m_to(to), m_mode(mode), m_total(total), m_started(std::chrono::steady_clock::now()) {}

BatchProgress::Mode BatchProgress::modeFor(bool quiet) {
    if (quiet)
        return off;
    return ::isatty(STDERR_FILENO) ? live : lines;
}

void BatchProgress::finished(const base::string& name, const ImportRecord& record) {
    ++m_done;
    if (!imported(record))
        ++m_failed;
    if (m_mode != lines)
        return;
    const base::string line = imported(record)
                                  ? base::format("[{}/{}] {} {} ({:f2} s)\n", m_done, m_total,
                                                 record.status, name, record.seconds)
                                  : base::format("[{}/{}] {} {}: {}\n", m_done, m_total,
                                                 record.status, name, record.reason);
    std::fputs(line.c_str(), m_to);
    std::fflush(m_to);
}

void BatchProgress::tick(const base::string& reading) {
    if (m_mode != live)
        return;
    const auto now = std::chrono::steady_clock::now();
    if (m_shown && now - m_drawn < std::chrono::milliseconds(250))
        return;
    m_drawn = now;
    draw(reading);
}

void BatchProgress::draw(const base::string& reading) {
    const double elapsed =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - m_started).count();
    base::string line = base::format("{}/{} done, {} failed, {} elapsed", m_done, m_total, m_failed,
                                     clock(elapsed));
    if (m_done > 0)
        line +=
            base::format(", ~{} left", clock(elapsed / double(m_done) * double(m_total - m_done)));
    if (!reading.empty())
        line += base::format(", reading {}", reading);
    // A line that wraps cannot be redrawn in place.
    const std::size_t width = terminalWidth(m_to);
    if (line.size() >= width)
        line.resize(width - 1);
    std::fprintf(m_to, "\r\033[K%s", line.c_str());
    std::fflush(m_to);
    m_shown = true;
}

void BatchProgress::clear() {
    if (m_mode == live && m_shown) {
        std::fputs("\r\033[K", m_to);
        std::fflush(m_to);
    }
    m_shown = false;
}

base::string formatTable(std::span<const ImportRecord> records, std::span<const base::string> names,
                         double seconds) {
    const base::vector<std::size_t> order = failuresFirst(records);
    std::size_t fileWidth = 4, statusWidth = 6;
    for (std::size_t i = 0; i < records.size(); ++i) {
        fileWidth = std::max(fileWidth, names[i].size());
        statusWidth = std::max(statusWidth, records[i].status.size());
    }
    const int fw = -int(fileWidth), sw = -int(statusWidth);
    // The width placeholders take arguments 0 and 1, so the texts follow them.
    base::string out =
        base::format("{2,*0}  {3,*1}  {4,9}  {5,10}  {6,10}  {7,8}  {8}\n", fw, sw, "file",
                     "status", "objects", "vertices", "faces", "seconds", "first warning / reason");
    std::size_t failed = 0;
    for (std::size_t i : order) {
        const ImportRecord& r = records[i];
        failed += imported(r) ? 0 : 1;
        out +=
            base::format("{2,*0}  {3,*1}  {4,9}  {5,10}  {6,10}  {7,8:f2}  {8}\n", fw, sw, names[i],
                         r.status, r.objects(), r.vertices, r.faces, r.seconds, note(r));
    }
    const auto skipped =
        std::size_t(std::count_if(records.begin(), records.end(),
                                  [](const ImportRecord& r) { return r.status == "skipped"; }));
    out +=
        base::format("{} files: {} imported, ", records.size(), records.size() - failed - skipped);
    if (skipped)
        out += base::format("{} skipped, ", skipped);
    out += base::format("{} failed, {:f1} s\n", failed, seconds);
    return out;
}

base::string reportJson(std::span<const ImportRecord> records, double seconds, const Shard& shard) {
    rapidjson::StringBuffer buffer;
    rapidjson::PrettyWriter<rapidjson::StringBuffer> json(buffer);
    json.SetIndent(' ', 2);
    auto text = [&](const char* key, const base::string& value) {
        json.Key(key);
        json.String(value.data(), rapidjson::SizeType(value.size()));
    };
    std::size_t failed = 0, skipped = 0;
    for (const ImportRecord& r : records) {
        failed += imported(r) ? 0 : 1;
        skipped += r.status == "skipped" ? 1 : 0;
    }
    json.StartObject();
    json.Key("files");
    json.Uint64(records.size());
    json.Key("imported");
    json.Uint64(records.size() - failed - skipped);
    json.Key("skipped");
    json.Uint64(skipped);
    json.Key("failed");
    json.Uint64(failed);
    json.Key("shard");
    json.StartObject();
    json.Key("index");
    json.Uint(shard.index);
    json.Key("count");
    json.Uint(shard.count);
    json.EndObject();
    json.Key("seconds");
    json.Double(seconds);
    json.Key("records");
    json.StartArray();
    for (const ImportRecord& r : records) {
        json.StartObject();
        text("file", r.model);
        text("status", r.status);
        text("reason", r.reason);
        json.Key("types");
        json.StartObject();
        for (const auto& [type, count] : r.types) {
            json.Key(type.data(), rapidjson::SizeType(type.size()));
            json.Uint(count);
        }
        json.EndObject();
        json.Key("objects");
        json.Uint64(r.objects());
        json.Key("vertices");
        json.Uint64(r.vertices);
        json.Key("faces");
        json.Uint64(r.faces);
        json.Key("seconds");
        json.Double(r.seconds);
        json.Key("peakMemoryKiB");
        json.Uint64(r.peakKiB);
        json.Key("warnings");
        json.Uint(r.warnings);
        json.Key("errors");
        json.Uint(r.errors);
        text("firstWarning", r.firstWarning);
        text("output", r.output);
        json.EndObject();
    }
    json.EndArray();
    json.EndObject();
    base::string out(buffer.GetString(), buffer.GetSize());
    out += '\n';
    return out;
}

} // namespace host

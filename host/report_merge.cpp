#include "report_merge.h"

#include "b_format.h"
#include "html_report.h"
#include "output_file.h"

#include <rapidjson/document.h>
#include <rapidjson/prettywriter.h>
#include <rapidjson/stringbuffer.h>

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <map>
#include <sstream>

namespace host {

namespace {

std::uint32_t member(const rapidjson::Value& object, const char* key, std::uint32_t fallback) {
    const auto it = object.FindMember(key);
    return it != object.MemberEnd() && it->value.IsUint() ? it->value.GetUint() : fallback;
}

base::string text(const rapidjson::Value& object, const char* key) {
    const auto it = object.FindMember(key);
    return it != object.MemberEnd() && it->value.IsString()
               ? base::string(it->value.GetString(), it->value.GetStringLength())
               : base::string();
}

} // namespace

bool mergeReports(std::span<const ReportText> reports, MergedReport& merged, base::string& error) {
    rapidjson::Document out(rapidjson::kObjectType);
    auto& alloc = out.GetAllocator();
    // Keyed by file, so the merged records come in one order whatever the
    // shards' order; the records themselves are copied whole.
    std::map<base::string, rapidjson::Value> records;
    std::map<std::uint32_t, base::string> shards;
    std::uint32_t count = 0;
    double seconds = 0;
    for (const ReportText& report : reports) {
        rapidjson::Document doc;
        doc.Parse(report.text.data(), report.text.size());
        const auto list =
            doc.IsObject() ? doc.FindMember("records") : rapidjson::Value::MemberIterator();
        if (doc.HasParseError() || !doc.IsObject() || list == doc.MemberEnd() ||
            !list->value.IsArray()) {
            error = base::format("'{}' is not a batch report", report.name);
            return false;
        }
        std::uint32_t index = 1, of = 1;
        if (const auto shard = doc.FindMember("shard");
            shard != doc.MemberEnd() && shard->value.IsObject()) {
            index = member(shard->value, "index", 1);
            of = member(shard->value, "count", 1);
        }
        if (count && of != count) {
            error = base::format("'{}' is shard {}/{}, but '{}' splits the batch into {}",
                                 report.name, index, of, shards.begin()->second, count);
            return false;
        }
        count = of;
        if (const auto [it, added] = shards.emplace(index, report.name); !added)
            merged.problems.push_back(base::format("shard {}/{} is given twice: '{}' and '{}'",
                                                   index, of, it->second, report.name));
        if (const auto time = doc.FindMember("seconds");
            time != doc.MemberEnd() && time->value.IsNumber())
            seconds += time->value.GetDouble();
        for (rapidjson::Value& record : list->value.GetArray()) {
            if (!record.IsObject())
                continue;
            const base::string file = text(record, "file");
            if (records.contains(file)) {
                merged.problems.push_back(base::format(
                    "'{}' has a record in more than one report ('{}')", file, report.name));
                continue;
            }
            records.emplace(file, rapidjson::Value(record, alloc));
        }
    }
    rapidjson::Value missing(rapidjson::kArrayType);
    for (std::uint32_t k = 1; k <= count; ++k)
        if (!shards.contains(k)) {
            missing.PushBack(k, alloc);
            merged.problems.push_back(base::format("shard {}/{} has no report", k, count));
        }

    std::uint64_t imported = 0, skipped = 0;
    rapidjson::Value list(rapidjson::kArrayType);
    for (auto& [file, record] : records) {
        const base::string status = text(record, "status");
        imported += status == "imported" ? 1 : 0;
        skipped += status == "skipped" ? 1 : 0;
        list.PushBack(record, alloc);
    }
    rapidjson::Value problems(rapidjson::kArrayType);
    for (const base::string& problem : merged.problems)
        problems.PushBack(rapidjson::Value(problem.c_str(), alloc), alloc);
    const std::uint64_t files = list.Size();
    out.AddMember("files", files, alloc);
    out.AddMember("imported", imported, alloc);
    out.AddMember("skipped", skipped, alloc);
    out.AddMember("failed", files - imported - skipped, alloc);
    out.AddMember("seconds", seconds, alloc);
    rapidjson::Value whole(rapidjson::kObjectType);
    whole.AddMember("index", 1u, alloc);
    whole.AddMember("count", 1u, alloc);
    out.AddMember("shard", whole, alloc);
    out.AddMember("shards", count, alloc);
    out.AddMember("missingShards", missing, alloc);
    out.AddMember("problems", problems, alloc);
    out.AddMember("records", list, alloc);

    rapidjson::StringBuffer buffer;
    rapidjson::PrettyWriter<rapidjson::StringBuffer> writer(buffer);
    writer.SetIndent(' ', 2);
    out.Accept(writer);
    merged.json.assign(buffer.GetString(), buffer.GetSize());
    merged.json += '\n';
    return true;
}

bool recordsOfReport(std::string_view json, base::vector<ImportRecord>& records, double& seconds) {
    rapidjson::Document doc;
    doc.Parse(json.data(), json.size());
    if (doc.HasParseError() || !doc.IsObject())
        return false;
    const auto list = doc.FindMember("records");
    if (list == doc.MemberEnd() || !list->value.IsArray())
        return false;
    const auto total = doc.FindMember("seconds");
    seconds = total != doc.MemberEnd() && total->value.IsNumber() ? total->value.GetDouble() : 0;
    auto number = [](const rapidjson::Value& object, const char* key) -> double {
        const auto found = object.FindMember(key);
        return found != object.MemberEnd() && found->value.IsNumber() ? found->value.GetDouble()
                                                                      : 0;
    };
    records.clear();
    for (const rapidjson::Value& item : list->value.GetArray()) {
        if (!item.IsObject())
            continue;
        ImportRecord& r = records.emplace_back();
        r.model = text(item, "file");
        r.status = text(item, "status");
        r.reason = text(item, "reason");
        if (const auto types = item.FindMember("types");
            types != item.MemberEnd() && types->value.IsObject())
            for (const auto& type : types->value.GetObject())
                if (type.value.IsUint())
                    r.types.emplace_back(base::string(type.name.GetString()), type.value.GetUint());
        r.vertices = std::uint64_t(number(item, "vertices"));
        r.faces = std::uint64_t(number(item, "faces"));
        r.seconds = number(item, "seconds");
        r.peakKiB = std::uint64_t(number(item, "peakMemoryKiB"));
        r.warnings = std::uint32_t(number(item, "warnings"));
        r.errors = std::uint32_t(number(item, "errors"));
        r.firstWarning = text(item, "firstWarning");
        r.output = text(item, "output");
    }
    return true;
}

int mergeReportFiles(const base::string& output, std::span<const base::string> reports,
                     const base::string& page) {
    auto say = [](const base::string& message, int code) {
        std::fprintf(stderr, "scene-import: %s\n", message.c_str());
        return code;
    };
    if (reports.empty())
        return say("--merge-reports needs the reports to merge", 2);
    if (const base::string problem = outputProblem(output); !problem.empty())
        return say(problem, 1);
    base::vector<ReportText> texts;
    for (const base::string& name : reports) {
        std::ifstream in(name.c_str(), std::ios::binary);
        std::ostringstream content;
        content << in.rdbuf();
        if (!in)
            return say(base::format("cannot read the report '{}'", name), 1);
        texts.push_back({name, base::string(content.str())});
    }
    MergedReport merged;
    base::string error;
    if (!mergeReports(texts, merged, error))
        return say(error, 1);
    if (!writeAtomically(
            output,
            [&](base::Stream& stream) {
                return stream.write(merged.json.data(), merged.json.size()) == merged.json.size();
            },
            error))
        return say(error, 1);
    for (const base::string& problem : merged.problems)
        say(problem, 0);
    int code = merged.problems.empty() ? 0 : 1;
    if (!page.empty()) {
        base::vector<ImportRecord> records;
        double seconds = 0;
        recordsOfReport(merged.json, records, seconds);
        base::vector<base::string> names;
        for (const ImportRecord& record : records)
            names.push_back(record.model);
        const base::vector<base::vector<std::uint8_t>> pictures(records.size());
        const base::string html = reportHtml(records, names, pictures, seconds);
        if (!writeAtomically(
                page,
                [&](base::Stream& stream) {
                    return stream.write(html.data(), html.size()) == html.size();
                },
                error))
            code = say(error, 1);
    }
    return code;
}

} // namespace host

// Combines the --report documents of a batch's shards into one: every
// record once, one totals block, and what does not add up (a record in two
// reports, a shard given twice or missing) listed in the document and told
// to the user.
#pragma once

#include "b_memory.h"
#include "import_record.h"

#include <span>
#include <string_view>
#include <utility>

namespace host {

struct ReportText {
    base::string name;
    base::string text;
};

struct MergedReport {
    base::string json;
    // One line each: duplicates, shards given twice, missing shards.
    base::vector<base::string> problems;
};

// False with 'error' when a report cannot be parsed or the reports split
// the batch into different numbers of shards.
bool mergeReports(std::span<const ReportText> reports, MergedReport& merged, base::string& error);

// The records of a report document (a shard's or a merged one) and its
// seconds; false when it is not one.
bool recordsOfReport(std::string_view json, base::vector<ImportRecord>& records, double& seconds);

// scene-import --merge-reports OUT REPORT... [--report-html PAGE]: 0 when the
// reports make one whole batch, 1 when something is missing or doubled (the
// merged document is still written) or a report cannot be read, 2 when no
// report is given. With a page path, the whole library's page is written
// too (cards without thumbnails: the shards' children drew them).
int mergeReportFiles(const base::string& output, std::span<const base::string> reports,
                     const base::string& page = {});

} // namespace host

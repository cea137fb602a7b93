// What a batch shows: the progress on standard error while it runs, the table
// of the records at the end, and the records as JSON for --report.
#pragma once

#include "b_memory.h"
#include "batch_shard.h"
#include "import_record.h"

#include <chrono>
#include <cstdio>
#include <span>

namespace host {

// Whether a record counts as a success of the batch: imported, or skipped
// because its document was up to date.
bool imported(const ImportRecord& record) noexcept;

// The indices of 'records', failures first, each group in input order.
base::vector<std::size_t> failuresFirst(std::span<const ImportRecord> records);

// On a terminal one line redrawn in place (done/total, failures, elapsed,
// time left, the file being read), cleared at the end; elsewhere one plain
// line per finished file.
class BatchProgress {
public:
    enum Mode { off, live, lines };
    BatchProgress(std::FILE* to, Mode mode, std::size_t total);

    // The mode for standard error: off when quiet, live on a terminal.
    static Mode modeFor(bool quiet);

    void finished(const base::string& name, const ImportRecord& record);
    // Redraws the live line (at most a few times a second) naming 'reading'.
    void tick(const base::string& reading);
    void clear();

private:
    void draw(const base::string& reading);

    std::FILE* m_to;
    Mode m_mode;
    std::size_t m_total;
    std::size_t m_done = 0;
    std::size_t m_failed = 0;
    std::chrono::steady_clock::time_point m_started, m_drawn;
    bool m_shown = false;
};

// The table: file, status, objects, vertices, faces, seconds and the first
// warning (the reason of a failure), failures first; then a total line.
// 'names' holds the file shown for each record.
base::string formatTable(std::span<const ImportRecord> records, std::span<const base::string> names,
                         double seconds);

// The records as a JSON document, in input order, with the shard they are
// (so that merging the shards' reports can tell which are missing).
base::string reportJson(std::span<const ImportRecord> records, double seconds,
                        const Shard& shard = {});

} // namespace host

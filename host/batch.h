// Batch conversion: many models, each imported in its own isolated child
// (several at once), one crash, hang or failure never stopping the others.
// The inputs are the models named on the command line and every model file
// below the --batch folder; each becomes OUTDIR/<relative path>.json. At the
// end a table of the records goes to standard output and, with --report, the
// records as JSON to a file and, with --report-html, a page of
// thumbnails.
#pragma once

#include "b_cmdline.h"
#include "b_memory.h"
#include "batch_shard.h"
#include "host_log.h"
#include "import_record.h"
#include "isolation.h"
#include "scene_import.h"

#include <functional>

namespace host {

struct BatchSwitches {
    base::CmdLineValue<base::string>* folder = nullptr;
    base::CmdLineValue<std::int64_t>* jobs = nullptr;
    base::CmdLineValue<base::string>* report = nullptr;
    base::CmdLineValue<base::string>* reportHtml = nullptr;
    base::CmdLineValue<base::string>* shard = nullptr;
    base::CmdLineValue<bool>* shardFromEnv = nullptr;
    base::CmdLineValue<std::int64_t>* shardCount = nullptr;
    base::CmdLineValue<bool>* skipExisting = nullptr;
    base::CmdLineValue<base::string>* mergeReports = nullptr;
};

BatchSwitches registerBatchSwitches(base::CmdLineOptions& options);

// Whether the command line asks for a batch: --batch, more than one model,
// or an output that names a folder ("out/").
bool wantsBatch(const BatchSwitches& switches, std::size_t models, const base::string& output);

struct BatchInput {
    base::string model;
    // The path the table shows and the output is named after: relative to
    // the --batch folder, or the file name of a model given by name.
    base::string name;
    // Empty when the batch only summarises.
    base::string output;
};

// Every file below 'folder' whose extension (or, for a compressed file, that
// of its content) is in 'extensions' ("obj;ply"), sorted; the folder
// 'skip' (the output folder) is not entered. False with 'error' when the
// folder cannot be read.
bool collectModels(const base::string& folder, std::string_view extensions,
                   const base::string& skip, base::vector<BatchInput>& inputs, base::string& error);

// Names each input's output 'folder'/<name>.json. When two inputs map to the
// same name the later one gets "-2" (then "-3", ...) before ".json"; one line
// per such input is answered for the user.
base::vector<base::string> assignOutputs(base::vector<BatchInput>& inputs,
                                         const base::string& folder);

struct BatchSettings {
    base::vector<base::string> models;
    base::string folder;
    // Empty: the batch only summarises.
    base::string outputFolder;
    base::string report;
    // The HTML page; each child then also renders a thumbnail.
    base::string reportHtml;
    base::string modulePath;
    unsigned jobs = 1;
    IsolationLimits limits;
    // Progress off (-q); the children's own messages shown (-v).
    bool quiet = false;
    bool childMessages = false;
    Shard shard;
    // Leave an input whose document is newer than it (status "skipped").
    bool skipExisting = false;
};

// Reads --shard, --shard-from-env, --shard-count and --skip-existing into
// 'settings'. False with a message for the user when they do not fit.
bool readShardSwitches(const BatchSwitches& switches, BatchSettings& settings, base::string& error);

// The name of a switch given that only a batch takes (null when none is),
// so that a single import does not silently ignore it.
const char* batchOnlySwitch(const BatchSwitches& switches) noexcept;

// -j's default: the number of cores.
unsigned defaultJobs();

// Imports one model in the child: fills the record, answers the exit code.
using BatchImport = std::function<int(const ImportSettings&, ImportRecord&)>;

// Runs the batch; answers 0 when every file imported, 1 otherwise (also
// when the output folder or the report cannot be written, found before any
// import starts).
int runBatch(const BatchSettings& settings, const BatchImport& import);

} // namespace host

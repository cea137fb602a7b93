#include "batch.h"

#include "archive_input.h"
#include "b_exception.h"
#include "b_format.h"
#include "batch_report.h"
#include "html_report.h"
#include "module_loader.h"
#include "output_file.h"
#include "scene_importer.h"
#include "scene_interfaces.h"
#include "stream/b_fs_archive.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <set>
#include <thread>

namespace host {

namespace fs = std::filesystem;

namespace {

// The extensions the importer's descriptor lists, read in the host itself.
bool importerExtensions(const base::string& modulePath, base::string& extensions,
                        base::string& error) {
    ModuleLoader module;
    base::ref<base::PluginFactory> factory(new base::PluginFactory("batch"));
    scene::register_scene_schema(*factory);
    if (!module.load(modulePath, *factory, error))
        return false;
    base::ref<base::IPluginDesc> desc = factory->descriptor(base::name_id("AssimpImporter"));
    auto* importer = dynamic_cast<scene::IScenePluginDesc*>(desc.get());
    if (!importer) {
        error = base::format("the module '{}' offers no AssimpImporter importer", modulePath);
        return false;
    }
    extensions = importer->supportedExtensions();
    return true;
}

// Creates the output folder and proves it takes files, before any import.
base::string prepareFolder(const base::string& folder) {
    std::error_code failure;
    fs::create_directories(fs::path(folder.c_str()), failure);
    if (failure)
        return base::format("cannot create the output folder '{}': {}", folder, failure.message());
    base::string probe = base::format("{}/.scene-import-XXXXXX", folder);
    const int fd = ::mkstemp(probe.data());
    if (fd < 0)
        return base::format("cannot write into the output folder '{}': {}", folder,
                            std::strerror(errno));
    ::close(fd);
    ::unlink(probe.c_str());
    return {};
}

// A private folder below $TMPDIR (or /tmp); empty with 'error' when none can be made.
base::string temporaryFolder(base::string& error) {
    const char* tmp = std::getenv("TMPDIR");
    base::string folder =
        base::format("{}/scene-import-XXXXXX", tmp && *tmp ? base::string(tmp) : "/tmp");
    if (!::mkdtemp(folder.data())) {
        error = base::format("cannot create a temporary folder: {}", std::strerror(errno));
        return {};
    }
    return folder;
}

void silenceOutput() {
    const int null = ::open("/dev/null", O_WRONLY | O_CLOEXEC);
    if (null < 0)
        return;
    ::dup2(null, STDOUT_FILENO);
    ::dup2(null, STDERR_FILENO);
    ::close(null);
}

// Turns how the child ended into its record's status and reason.
void judge(const ChildEnd& end, ImportRecord& record) {
    const base::string model = record.model;
    decodeRecord(end.record, record);
    record.model = model;
    record.seconds = end.seconds;
    record.peakKiB = end.peakKiB;
    switch (end.kind) {
    case ChildEnd::exited:
        if (end.code == 0 && !imported(record)) {
            record.status = "failed";
            record.reason = "the import gave no record";
        } else if (end.code > 3) {
            // A code the import never answers (a sanitizer's report).
            record.status = "failed";
            record.reason = base::format("the import ended with code {}", end.code);
        }
        break;
    case ChildEnd::signalled:
        record.status = "crashed";
        record.reason = base::format("assimp crashed reading it ({})", signalText(end.code));
        break;
    case ChildEnd::timedOut:
        record.status = "timeout";
        record.reason = base::format("assimp hung reading it: gave up after {} s", end.code);
        break;
    case ChildEnd::notStarted:
        record.status = "failed";
        record.reason = end.failure;
        break;
    }
    if (!imported(record) && record.status != "invalid")
        record.output.clear();
}

} // namespace

BatchSwitches registerBatchSwitches(base::CmdLineOptions& options) {
    BatchSwitches s;
    s.folder = options.addValue<base::string>(
        "--batch", {},
        "Import every model file below this folder (with -o OUTDIR/, each to "
        "OUTDIR/<relative path>.json).");
    s.jobs = options.addValue<std::int64_t>(
        "-j", "--jobs", "Run this many imports at once in a batch (default: the number of cores).");
    s.report = options.addValue<base::string>(
        "--report", {}, "Write the batch's per-file records as JSON to this file.");
    s.reportHtml = options.addValue<base::string>(
        "--report-html", {},
        "Write one HTML page showing every file of the batch (thumbnail, status, counts).");
    s.shard = options.addValue<base::string>(
        "--shard", {},
        "Convert only shard K of N (K/N) of the batch's models, chosen by a hash of each "
        "model's path below the batch folder.");
    s.shardFromEnv = options.addValue<bool>(
        "--shard-from-env", {},
        "Take the shard from a Slurm array (SLURM_ARRAY_TASK_ID, _MIN, _MAX, _COUNT) or an "
        "indexed job (JOB_COMPLETION_INDEX with --shard-count).",
        0, 1);
    s.shardCount = options.addValue<std::int64_t>("--shard-count", {},
                                                  "The number of shards for --shard-from-env.");
    s.skipExisting = options.addValue<bool>(
        "--skip-existing", {},
        "Leave each model whose output document exists and is newer than the model.", 0, 1);
    s.mergeReports = options.addValue<base::string>(
        "--merge-reports", {},
        "Combine the --report documents given as arguments (one per shard) into this file.");
    return s;
}

bool readShardSwitches(const BatchSwitches& switches, BatchSettings& settings,
                       base::string& error) {
    const bool fromEnv = switches.shardFromEnv->isSet() && switches.shardFromEnv->value();
    if (fromEnv && switches.shard->isSet()) {
        error = "--shard and --shard-from-env exclude each other";
        return false;
    }
    std::uint32_t count = 0;
    if (switches.shardCount->isSet()) {
        const std::int64_t n = switches.shardCount->value();
        if (n < 1 || n > std::int64_t(UINT32_MAX) || !fromEnv) {
            error = fromEnv ? base::format("--shard-count wants a whole number above 0, not {}", n)
                            : base::string("--shard-count goes with --shard-from-env");
            return false;
        }
        count = std::uint32_t(n);
    }
    if (switches.shard->isSet() && !parseShard(switches.shard->value(), settings.shard, error))
        return false;
    if (fromEnv && !shardFromEnvironment(&std::getenv, count, settings.shard, error))
        return false;
    settings.skipExisting = switches.skipExisting->isSet() && switches.skipExisting->value();
    if (settings.skipExisting && settings.outputFolder.empty()) {
        error = "--skip-existing needs -o OUTDIR/";
        return false;
    }
    return true;
}

const char* batchOnlySwitch(const BatchSwitches& switches) noexcept {
    for (const base::CmdLineOption* option :
         {static_cast<const base::CmdLineOption*>(switches.report),
          static_cast<const base::CmdLineOption*>(switches.reportHtml),
          static_cast<const base::CmdLineOption*>(switches.shard),
          static_cast<const base::CmdLineOption*>(switches.shardFromEnv),
          static_cast<const base::CmdLineOption*>(switches.shardCount),
          static_cast<const base::CmdLineOption*>(switches.skipExisting)})
        if (option->isSet())
            return option->name().c_str();
    return nullptr;
}

bool wantsBatch(const BatchSwitches& switches, std::size_t models, const base::string& output) {
    return switches.folder->isSet() || models > 1 || (!output.empty() && output.back() == '/');
}

namespace {

// An archive in a batch folder is a folder too: each model inside is an
// input, named below the archive's name. One that cannot be listed stays an
// input itself, so its failure gets a record.
void addArchiveMembers(const base::string& archive, const base::string& name,
                       std::string_view extensions, base::vector<BatchInput>& found) {
    base::vector<base::string> members;
    try {
        if (base::fs::master().isFolder(archive))
            members = base::fs::listFilesBelow(archive);
        else
            members.push_back(archive);
    } catch (const base::exception&) {
        members.assign(1, archive);
    }
    for (const base::string& member : members) {
        if (member == archive) {
            found.push_back({archive, name, {}});
        } else if (base::fs::hasExtensionIn(base::fs::innerName(member), extensions)) {
            found.push_back({member, name + member.substr(archive.size()), {}});
        }
    }
}

} // namespace

bool collectModels(const base::string& folder, std::string_view extensions,
                   const base::string& skip, base::vector<BatchInput>& inputs,
                   base::string& error) {
    const fs::path root(folder.c_str());
    std::error_code failure;
    fs::recursive_directory_iterator it(root, fs::directory_options::skip_permission_denied,
                                        failure);
    if (failure) {
        error = base::format("cannot read the folder '{}': {}", folder, failure.message());
        return false;
    }
    base::vector<BatchInput> found;
    for (; it != fs::recursive_directory_iterator(); it.increment(failure)) {
        if (failure)
            break;
        const fs::directory_entry& entry = *it;
        std::error_code ignored;
        const base::string path(entry.path().string());
        if (entry.is_directory(ignored)) {
            // Documents written into a folder inside the input are not inputs.
            if (!skip.empty() && sameFile(path, skip))
                it.disable_recursion_pending();
            continue;
        }
        if (!entry.is_regular_file(ignored))
            continue;
        const base::string name(entry.path().lexically_relative(root).string());
        if (base::fs::isArchiveName(path)) {
            addArchiveMembers(path, name, extensions, found);
            continue;
        }
        if (base::fs::hasExtensionIn(base::fs::innerName(path), extensions))
            found.push_back({path, name, {}});
    }
    if (failure) {
        error = base::format("cannot read the folder '{}': {}", folder, failure.message());
        return false;
    }
    std::sort(found.begin(), found.end(),
              [](const BatchInput& a, const BatchInput& b) { return a.name < b.name; });
    inputs.insert(inputs.end(), found.begin(), found.end());
    return true;
}

base::vector<base::string> assignOutputs(base::vector<BatchInput>& inputs,
                                         const base::string& folder) {
    base::vector<base::string> notes;
    std::set<base::string> taken;
    base::string prefix = folder;
    if (!prefix.empty() && prefix.back() != '/')
        prefix += '/';
    for (BatchInput& input : inputs) {
        const base::string wanted = prefix + input.name + ".json";
        input.output = wanted;
        for (unsigned n = 2; !taken.insert(input.output).second; ++n)
            input.output = base::format("{}{}-{}.json", prefix, input.name, n);
        if (input.output != wanted)
            notes.push_back(base::format("'{}' would also be written to '{}'; it goes to '{}'",
                                         input.model, wanted, input.output));
    }
    return notes;
}

int runBatch(const BatchSettings& settings, const BatchImport& import) {
    base::string error;
    auto fail = [](const base::string& message) {
        std::fprintf(stderr, "scene-import: %s\n", message.c_str());
        return 1;
    };
    if (!settings.outputFolder.empty())
        if (const base::string problem = prepareFolder(settings.outputFolder); !problem.empty())
            return fail(problem);
    for (const base::string* report : {&settings.report, &settings.reportHtml})
        if (!report->empty())
            if (const base::string problem = outputProblem(*report); !problem.empty())
                return fail(problem);
    // The children leave their thumbnails here; removed when the batch ends.
    base::string thumbnails;
    if (!settings.reportHtml.empty()) {
        thumbnails = temporaryFolder(error);
        if (thumbnails.empty())
            return fail(error);
    }
    const std::unique_ptr<const base::string, void (*)(const base::string*)> removeThumbnails(
        &thumbnails, [](const base::string* folder) {
            std::error_code ignored;
            if (!folder->empty())
                fs::remove_all(fs::path(folder->c_str()), ignored);
        });

    base::vector<BatchInput> inputs;
    for (const base::string& model : settings.models)
        inputs.push_back({model, base::string(fs::path(model.c_str()).filename().string()), {}});
    if (!settings.folder.empty()) {
        base::string extensions;
        if (!importerExtensions(settings.modulePath, extensions, error) ||
            !collectModels(settings.folder, extensions, settings.outputFolder, inputs, error))
            return fail(error);
        if (inputs.empty())
            return fail(base::format("'{}' holds no model the importer reads", settings.folder));
    }
    if (!settings.outputFolder.empty())
        for (const base::string& note : assignOutputs(inputs, settings.outputFolder))
            if (!settings.quiet)
                std::fprintf(stderr, "scene-import: %s\n", note.c_str());
    // After the outputs are named, so that a collision's "-2" does not
    // depend on which shard runs.
    if (settings.shard.count > 1)
        std::erase_if(inputs, [&](const BatchInput& input) {
            return shardOf(input.name, settings.shard.count) != settings.shard.index;
        });

    const auto started = std::chrono::steady_clock::now();
    base::vector<ImportRecord> records(inputs.size());
    base::vector<base::string> names(inputs.size());
    base::vector<base::vector<std::uint8_t>> pictures(inputs.size());
    auto thumbnailOf = [&](std::size_t i) {
        return thumbnails.empty() ? base::string() : base::format("{}/{}.png", thumbnails, i);
    };
    BatchProgress progress(stderr, BatchProgress::modeFor(settings.quiet), inputs.size());

    struct Running {
        std::size_t index;
        std::unique_ptr<IsolatedChild> child;
    };
    base::vector<Running> running;
    std::size_t next = 0;
    auto start = [&](std::size_t i) {
        const BatchInput& input = inputs[i];
        ImportRecord& record = records[i];
        record.model = input.model;
        names[i] = input.name;
        // A member of an archive is checked when the archive is opened.
        base::string problem =
            insideArchive(input.model) ? base::string() : modelProblem(input.model);
        std::error_code failure;
        if (problem.empty() && !input.output.empty())
            if (fs::create_directories(fs::path(input.output.c_str()).parent_path(), failure);
                failure)
                problem = base::format("cannot create the folder of '{}': {}", input.output,
                                       failure.message());
        if (problem.empty() && settings.skipExisting && upToDate(input.model, input.output)) {
            record.status = "skipped";
            record.output = input.output;
            progress.finished(input.name, record);
            return;
        }
        if (!problem.empty()) {
            record.reason = std::move(problem);
            progress.finished(input.name, record);
            return;
        }
        const ImportSettings one{input.model, input.output, settings.modulePath, thumbnailOf(i)};
        const ChildJob job = [&, one](int recordFd) {
            if (!settings.childMessages)
                silenceOutput();
            ImportRecord own;
            const int code = import(one, own);
            sendRecord(recordFd, own);
            return code;
        };
        running.push_back({i, std::make_unique<IsolatedChild>(settings.limits, job)});
    };
    auto fill = [&] {
        while (next < inputs.size() && running.size() < std::max(1u, settings.jobs))
            start(next++);
    };
    fill();
    while (!running.empty()) {
        base::vector<IsolatedChild*> children;
        for (const Running& r : running)
            children.push_back(r.child.get());
        IsolatedChild::waitAny(children, std::chrono::milliseconds(100));
        for (auto it = running.begin(); it != running.end();) {
            if (!it->child->done()) {
                ++it;
                continue;
            }
            const ChildEnd& end = it->child->end();
            ImportRecord& record = records[it->index];
            judge(end, record);
            // A child that died may have left half a file.
            if (!thumbnails.empty())
                if (base::vector<std::uint8_t> png = takeThumbnail(thumbnailOf(it->index));
                    end.kind == ChildEnd::exited)
                    pictures[it->index] = std::move(png);
            // The partial document of a child that died.
            if (end.kind != ChildEnd::exited && !inputs[it->index].output.empty())
                ::unlink(temporaryPath(inputs[it->index].output, end.pid).c_str());
            progress.finished(names[it->index], record);
            it = running.erase(it);
        }
        // The next files start before the line names what is being read.
        fill();
        progress.tick(running.empty() ? base::string() : names[running.front().index]);
    }
    progress.clear();

    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
    const base::string table = formatTable(records, names, seconds);
    std::fwrite(table.data(), 1, table.size(), stdout);
    std::fflush(stdout);
    int code = std::all_of(records.begin(), records.end(), imported) ? 0 : 1;
    auto write = [&](const base::string& path, const base::string& text) {
        if (!writeAtomically(
                path,
                [&](base::Stream& stream) {
                    return stream.write(text.data(), text.size()) == text.size();
                },
                error))
            code = fail(error);
    };
    if (!settings.report.empty())
        write(settings.report, reportJson(records, seconds, settings.shard));
    if (!settings.reportHtml.empty())
        write(settings.reportHtml, reportHtml(records, names, pictures, seconds));
    return code;
}

unsigned defaultJobs() {
    return std::max(1u, std::thread::hardware_concurrency());
}

} // namespace host

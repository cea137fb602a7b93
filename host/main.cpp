// scene-import: the stand-alone host. Parses the command line and dispatches:
// one model imported (in an isolated child process unless --no-isolation)
// and handed to the features the switches ask for. Each feature lives in its
// own file under host/ and is one function called with the imported scene
// (scene_import.h); adding one is a switch in registerFeatureSwitches and a
// line in sceneFeatures.
//
// Exit codes: 0 imported, 1 the model (or the module, or the output) failed,
// 2 usage error, 3 a mesh failed validation.
#include "animation_view.h"
#include "archive_input.h"
#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"
#include "batch.h"
#include "host_log.h"
#include "host_options.h"
#include "html_report.h"
#include "isolation.h"
#include "listing.h"
#include "module_loader.h"
#include "output_file.h"
#include "preview_switches.h"
#include "read_back.h"
#include "report_merge.h"
#include "scene_cmdline.h"
#include "scene_features.h"
#include "scene_import.h"
#include "scene_interfaces.h"
#include "stream/b_fs_archive.h"
#include "texture_extract.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <clocale>
#include <csignal>
#include <cstdio>

namespace {

enum ExitCode : int { exitImported = 0, exitFailed = 1, exitUsage = 2, exitInvalid = 3 };

void printUsage(std::FILE* to) {
    std::fputs("usage: scene-import [switches] MODEL [-o OUT.json]\n"
               "       scene-import [switches] MODEL... [-o OUTDIR/]\n"
               "       scene-import [switches] --batch DIR [-o OUTDIR/]\n"
               "Imports MODEL with the assimp importer module and writes the scene as JSON\n"
               "(-o - writes it to standard output). Several models, or --batch, convert\n"
               "each one in its own process and print a table of the results.\n",
               to);
}

int usageError(std::string_view message) {
    std::fprintf(stderr, "scene-import: %.*s\nTry 'scene-import --help'.\n", int(message.size()),
                 message.data());
    return exitUsage;
}

int failure(std::string_view message) {
    std::fprintf(stderr, "scene-import: %.*s\n", int(message.size()), message.data());
    return exitFailed;
}

// Switches of the features beyond the host's own.
struct FeatureSwitches {
    base::CmdLineValue<base::string>* read = nullptr;
    base::CmdLineValue<base::string>* list = nullptr;
    host::AnimationSwitches animation;
    host::preview::PreviewSwitches preview;
    base::CmdLineValue<base::string>* extractTextures = nullptr;
};

FeatureSwitches registerFeatureSwitches(base::CmdLineOptions& options) {
    FeatureSwitches s;
    s.read = options.addValue<base::string>(
        "--read", {},
        "Read a scene document written by this program (instead of importing a model) and, "
        "with -o, write it again.");
    s.list = options.addValue<base::string>(
        "--list", {},
        "Print one line per object of the kinds given, separated by commas: cameras and lights "
        "(name, node path, world position and view direction, lens or light values), nodes "
        "(world position of every node), poses (local translate, rotate and scale).");
    s.animation = host::registerAnimationSwitches(options);
    s.preview = host::preview::registerSwitches(options);
    s.extractTextures = host::registerExtractTextures(options);
    return s;
}

// What the feature switches ask for, checked before anything is imported.
struct FeatureRequests {
    base::vector<host::ListKind> listed;
    host::preview::PreviewRequest preview;
    // --list or --frames print on standard output; the summary moves aside.
    bool reports = false;
};

// The features the switches ask for, in the order they run: play the
// animation at --time, validate, write the document, then the reports.
base::vector<host::SceneFeature> sceneFeatures(const host::HostSwitches& switches,
                                               const FeatureSwitches& more,
                                               const FeatureRequests& requests,
                                               const base::string& output, bool wantSummary) {
    base::vector<host::SceneFeature> features;
    if (more.animation.time->isSet())
        features.emplace_back([time = more.animation.time->value()](host::ImportedScene& scene) {
            host::playAt(scene.factory, time);
            return 0;
        });
    if (host::isOn(switches.validate))
        features.emplace_back(host::validateMeshes);
    if (!output.empty())
        features.emplace_back(
            [output, layout = host::jsonLayout(switches)](host::ImportedScene& scene) {
                return host::writeDocument(scene, output, layout);
            });
    if (!requests.preview.path.empty())
        features.emplace_back([preview = requests.preview](host::ImportedScene& scene) {
            return host::preview::previewFeature(scene.factory, preview);
        });
    if (requests.reports)
        features.emplace_back(
            [animation = more.animation, listed = requests.listed](host::ImportedScene& scene) {
                const base::string report = host::animationReport(scene.factory, animation, listed);
                std::fwrite(report.data(), 1, report.size(), scene.text);
                return 0;
            });
    if (more.extractTextures->isSet())
        features.emplace_back([option = more.extractTextures](host::ImportedScene& scene) {
            return host::runExtractTextures(option, scene.factory, scene.text) ? 1 : 0;
        });
    if (wantSummary)
        features.emplace_back([reports = requests.reports](host::ImportedScene& scene) {
            // Beside a report on standard output, the summary goes to standard error.
            if (reports)
                scene.text = stderr;
            return host::printSummary(scene);
        });
    return features;
}

host::IsolationLimits isolationLimits(const host::HostSwitches& switches) {
    host::IsolationLimits limits;
    if (switches.timeout->isSet())
        limits.timeoutSeconds = std::uint32_t(switches.timeout->value());
    if (switches.maxMemory->isSet())
        limits.maxMemoryMiB = std::uint64_t(switches.maxMemory->value());
    return limits;
}

// One model, isolated: the child imports and runs the features; the host
// reports a child that crashed or ran out of time, and removes what it left.
int importIsolated(const host::ImportSettings& settings, const base::CmdLineOptions& options,
                   host::HostLog& log, std::span<const host::SceneFeature> features,
                   const host::IsolationLimits& limits) {
    const host::ChildEnd end = host::runIsolated(limits, [&](int recordFd) {
        host::ImportRecord record;
        const int code = host::importScene(settings, options, log, features, record);
        host::sendRecord(recordFd, record);
        return code;
    });
    if (end.kind == host::ChildEnd::exited && end.code <= exitInvalid)
        return end.code;
    if (end.kind == host::ChildEnd::notStarted)
        return failure(end.failure);
    // The child's partial document, if it got that far.
    if (!settings.output.empty() && settings.output != "-")
        ::unlink(host::temporaryPath(settings.output, end.pid).c_str());
    switch (end.kind) {
    case host::ChildEnd::signalled:
        return failure(base::format("assimp crashed reading '{}' ({})", settings.model,
                                    host::signalText(end.code)));
    case host::ChildEnd::timedOut:
        return failure(
            base::format("assimp hung reading '{}': gave up after {} s", settings.model, end.code));
    default:
        // A code the host never answers (a sanitizer's report): passed on.
        std::fprintf(stderr, "scene-import: the import of '%s' ended with code %d\n",
                     settings.model.c_str(), end.code);
        return end.code;
    }
}

// Option values that do not fit their attribute are usage errors; find them
// before the import rather than after it.
bool optionsFit(const base::CmdLineOptions& options, base::string& error) {
    base::AttribMap probe;
    return scene::apply_command_line(options, probe, scene::scene_schema::type(), error) &&
           scene::apply_command_line(options, probe, scene::sceneImporter_schema::type(), error);
}

// Several models: each child imports one with the features a batch allows
// (--time, --validate, the document).
int runBatch(const host::HostSwitches& switches, const FeatureSwitches& more,
             const host::BatchSwitches& batch, const base::CmdLineOptions& options,
             const base::vector<base::string>& positional, host::HostLog& hostLog) {
    for (const base::CmdLineOption* single :
         {static_cast<const base::CmdLineOption*>(more.list),
          static_cast<const base::CmdLineOption*>(more.animation.frames),
          static_cast<const base::CmdLineOption*>(more.preview.output),
          static_cast<const base::CmdLineOption*>(more.extractTextures),
          static_cast<const base::CmdLineOption*>(switches.summary),
          static_cast<const base::CmdLineOption*>(switches.noIsolation)})
        if (single->isSet())
            return usageError(base::format("{} takes a single model", single->name()));
    host::BatchSettings settings;
    settings.models = positional;
    if (batch.folder->isSet())
        settings.folder = batch.folder->value();
    if (switches.output->isSet()) {
        settings.outputFolder = switches.output->values().front();
        if (settings.outputFolder.empty() || settings.outputFolder == "-")
            return usageError("-o names a folder when converting several models");
        struct stat info {};
        if (::stat(settings.outputFolder.c_str(), &info) == 0 && !S_ISDIR(info.st_mode))
            return usageError(base::format("-o '{}' is not a folder; several models need one",
                                           settings.outputFolder));
    }
    if (batch.report->isSet())
        settings.report = batch.report->value();
    if (settings.report.empty() && batch.report->isSet())
        return usageError("--report needs a file name");
    if (batch.reportHtml->isSet())
        settings.reportHtml = batch.reportHtml->value();
    if (settings.reportHtml.empty() && batch.reportHtml->isSet())
        return usageError("--report-html needs a file name");
    settings.modulePath =
        switches.plugin->isSet() ? switches.plugin->value() : host::ModuleLoader::defaultPath();
    settings.jobs = batch.jobs->isSet() ? unsigned(batch.jobs->value()) : host::defaultJobs();
    settings.limits = isolationLimits(switches);
    settings.quiet = host::isOn(switches.quiet);
    settings.childMessages = switches.verbose->isSet();
    if (base::string error; !host::readShardSwitches(batch, settings, error))
        return usageError(error);
    const FeatureRequests requests;
    return host::runBatch(
        settings, [&](const host::ImportSettings& one, host::ImportRecord& record) {
            base::vector<host::SceneFeature> features =
                sceneFeatures(switches, more, requests, one.output, false);
            if (!one.thumbnail.empty())
                features.emplace_back([&one](host::ImportedScene& scene) {
                    return host::thumbnailFeature(scene.factory, one.model, one.thumbnail);
                });
            return host::importScene(one, options, hostLog, features, record);
        });
}

int run(int argc, char** argv, host::HostLog& hostLog) {
    base::CmdLineOptions options;
    const host::HostSwitches switches = host::registerHostSwitches(options);
    const FeatureSwitches more = registerFeatureSwitches(options);
    const host::BatchSwitches batch = host::registerBatchSwitches(options);
    base::string error;
    base::vector<base::string> positional;
    if (!host::parseCommandLine(options, argc, argv, positional, error))
        return usageError(error);
    if (host::isOn(switches.help)) {
        printUsage(stdout);
        std::fputs("\n", stdout);
        const base::string help = options.helpText(100);
        std::fwrite(help.data(), 1, help.size(), stdout);
        return exitImported;
    }
    if (switches.verbose->isSet())
        hostLog.setShownLevel(switches.verbose->values().empty() ? int(base::logInfo)
                                                                 : switches.verbose->value());
    else if (host::isOn(switches.quiet))
        hostLog.setShownLevel(base::logError);
    // What an archive member may expand to follows the memory cap, so a
    // decompression bomb fails at the cap the user gave.
    if (switches.maxMemory->isSet() && switches.maxMemory->value() > 0)
        base::fs::setArchiveMemoryLimit(std::uint64_t(switches.maxMemory->value()) << 20);

    if (const auto* read = more.read; read->isSet()) {
        if (!positional.empty())
            return usageError("--read takes no model");
        const base::string output =
            switches.output->isSet() ? switches.output->values().front() : base::string();
        if (!output.empty() && output != "-" && host::sameFile(read->value(), output))
            return usageError(base::format("the output '{}' is the document itself", output));
        const bool summary = switches.summary->isSet() ? switches.summary->value() : output.empty();
        return host::readBack(read->value(), output, summary, hostLog, host::jsonLayout(switches));
    }
    if (batch.mergeReports->isSet())
        return host::mergeReportFiles(batch.mergeReports->value(), positional,
                                      batch.reportHtml->isSet() ? batch.reportHtml->value()
                                                                : base::string());
    if (host::wantsBatch(batch, positional.size(),
                         switches.output->isSet() ? switches.output->values().front()
                                                  : base::string())) {
        if (!optionsFit(options, error))
            return usageError(error);
        return runBatch(switches, more, batch, options, positional, hostLog);
    }
    // A report lists the files of a batch; with one model and -o FILE the
    // document's path would be taken for a folder.
    if (const char* only = host::batchOnlySwitch(batch))
        return usageError(
            base::format("{} needs a batch: several models, --batch DIR or -o OUTDIR/", only));
    if (positional.empty())
        return usageError("no model given");

    host::ImportSettings settings;
    settings.model = positional.front();
    settings.modulePath =
        switches.plugin->isSet() ? switches.plugin->value() : host::ModuleLoader::defaultPath();
    if (switches.output->isSet()) {
        settings.output = switches.output->values().front();
        if (settings.output.empty())
            return usageError("-o needs a file name or '-'");
    }
    const bool toFile = !settings.output.empty() && settings.output != "-";
    if (toFile && host::sameFile(settings.model, settings.output))
        return usageError(base::format("the output '{}' is the model itself", settings.output));

    if (!optionsFit(options, error))
        return usageError(error);

    FeatureRequests requests;
    if (!host::preview::readSwitches(more.preview, settings.model, requests.preview, error))
        return usageError(error);
    if (more.list->isSet() && !host::parseListKinds(more.list->value(), requests.listed, error))
        return usageError(error);
    requests.reports = !requests.listed.empty() || more.animation.frames->isSet();

    // A member of an archive is checked when the archive is opened.
    if (!host::insideArchive(settings.model))
        if (const base::string problem = host::modelProblem(settings.model); !problem.empty())
            return failure(problem);
    if (toFile)
        if (const base::string problem = host::outputProblem(settings.output); !problem.empty())
            return failure(problem);

    // Listing stands in for the summary unless --summary asks for both.
    const bool wantSummary = switches.summary->isSet()
                                 ? switches.summary->value()
                                 : settings.output.empty() && requests.listed.empty();
    const base::vector<host::SceneFeature> features =
        sceneFeatures(switches, more, requests, settings.output, wantSummary);
    if (host::isOn(switches.noIsolation)) {
        host::ImportRecord record;
        return host::importScene(settings, options, hostLog, features, record);
    }
    return importIsolated(settings, options, hostLog, features, isolationLimits(switches));
}

} // namespace

int main(int argc, char** argv) {
    std::setlocale(LC_ALL, "");
    // A closed pipe or a file-size limit ends a write with an error the host
    // reports, instead of killing it.
    std::signal(SIGPIPE, SIG_IGN);
    std::signal(SIGXFSZ, SIG_IGN);
    host::HostLog hostLog;
    base::ScopedLog scoped(hostLog);
    try {
        return run(argc, argv, hostLog);
    } catch (const base::exception& e) {
        return failure(e.message());
    } catch (const std::exception& e) {
        return failure(e.what());
    } catch (...) {
        return failure("unknown failure");
    }
}

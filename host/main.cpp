// scene-import: the stand-alone host. Loads the importer module, imports one
// model into a fresh factory, optionally validates its meshes, writes the
// factory as JSON and prints a summary.
//
// Exit codes: 0 imported, 1 the model (or the module, or the output) failed,
// 2 usage error, 3 a mesh failed validation.
#include "animation_view.h"
#include "archive_input.h"
#include "b_cmdline.h"
#include "b_exception.h"
#include "b_format.h"
#include "b_json.h"
#include "b_log.h"
#include "listing.h"
#include "module_loader.h"
#include "preview_switches.h"
#include "scene_cmdline.h"
#include "scene_importer.h"
#include "scene_interfaces.h"
#include "scene_stats.h"
#include "stdout_stream.h"
#include "stream/b_fs.h"
#include "texture_extract.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <clocale>
#include <concepts>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <mutex>

namespace {

enum ExitCode : int { exitImported = 0, exitFailed = 1, exitUsage = 2, exitInvalid = 3 };

constexpr std::string_view importerType = "AssimpImporter";

struct HostSwitches {
    base::CmdLineValue<bool>* help = nullptr;
    base::CmdLineValue<base::string>* output = nullptr;
    base::CmdLineValue<base::string>* plugin = nullptr;
    base::CmdLineValue<bool>* summary = nullptr;
    base::CmdLineValue<bool>* validate = nullptr;
    base::CmdLineValue<int>* verbose = nullptr;
    base::CmdLineValue<bool>* quiet = nullptr;
    base::CmdLineValue<bool>* flipTextureCoordinates = nullptr;
    base::CmdLineValue<bool>* flipFaceWinding = nullptr;
    host::preview::PreviewSwitches preview;
    base::CmdLineValue<base::string>* list = nullptr;
};

HostSwitches registerSwitches(base::CmdLineOptions& options) {
    HostSwitches s;
    s.help = options.addValue<bool>("--help", "-h", "Print this help and exit.", 0, 1);
    s.output = options.addValue<base::string>(
        "-o", "--output",
        "Write the imported scene as JSON to this file; '-' writes it to standard output.");
    s.plugin = options.addValue<base::string>(
        "--plugin", {},
        "Load the importer module from this file instead of scene_assimp.so "
        "beside the executable.");
    s.summary = options.addValue<bool>(
        "--summary", {},
        "Print the object count per type, the vertices, faces and joints and the time taken. "
        "On by default when no -o is given.",
        0, 1);
    s.validate = options.addValue<bool>(
        "--validate", {},
        "Validate every imported mesh, print the findings and exit with 3 when one fails.", 0, 1);
    s.verbose = options.addValue<int>("-v", "--verbose",
                                      "Log more: information, or the level given (0 to 5).", 0, 1);
    s.quiet = options.addValue<bool>("-q", "--quiet", "Log errors only.", 0, 1);
    scene::register_importer_options(options);
    scene::register_scene_options(options);
    s.flipTextureCoordinates = options.addValue<bool>(
        "-importFlipTextureCoordinates", {},
        "Whether to flip the texture coordinates vertically (v becomes 1 - v).");
    s.flipFaceWinding = options.addValue<bool>(
        "-importFlipFaceWinding", {}, "Whether to reverse the vertex order of every face.");
    s.preview = host::preview::registerSwitches(options);
    s.list = options.addValue<base::string>(
        "--list", {},
        "Print one line per object of the kinds given, separated by commas: cameras and lights "
        "(name, node path, world position and view direction, lens or light values), nodes "
        "(world position of every node), poses (local translate, rotate and scale).");
    return s;
}

// Forwards to the standard-error log up to the level the user asked for, and
// keeps the last error so a failed import can name its reason in one line.
class HostLog final : public base::ILog {
public:
    void setShownLevel(int level) {
        m_shown = level;
        // Errors always reach log() so the reason of a failure is known.
        setMaxLevel(std::max(level, int(base::logError)));
    }
    int shownLevel() const noexcept { return m_shown; }

    void log(base::name_id channel, int level, std::string_view message) override {
        {
            std::lock_guard lock(m_mutex);
            if (level >= base::logCritical && level <= base::logError)
                m_lastError.assign(message.data(), message.size());
        }
        if (level <= m_shown)
            m_out.log(channel, level, message);
    }

    base::string lastError() const {
        std::lock_guard lock(m_mutex);
        return m_lastError;
    }
    void clearLastError() {
        std::lock_guard lock(m_mutex);
        m_lastError.clear();
    }

private:
    base::StdErrLog m_out;
    int m_shown = base::logWarning;
    mutable std::mutex m_mutex;
    base::string m_lastError;
};

void printUsage(std::FILE* to) {
    std::fputs("usage: scene-import [switches] MODEL [-o OUT.json]\n"
               "Imports MODEL with the assimp importer module and writes the scene as JSON\n"
               "(-o - writes it to standard output).\n",
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

// The reasons a model cannot be imported that the host can tell before
// assimp runs. Anything but a regular file is refused so that a FIFO or a
// device cannot stall the import.
bool checkModel(const base::string& path, base::string& reason) {
    struct stat info {};
    if (::stat(path.c_str(), &info) != 0) {
        reason = base::format("cannot open '{}': {}", path, std::strerror(errno));
        return false;
    }
    if (S_ISDIR(info.st_mode)) {
        reason = base::format("'{}' is a directory", path);
        return false;
    }
    if (!S_ISREG(info.st_mode)) {
        reason = base::format("'{}' is not a regular file", path);
        return false;
    }
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        reason = base::format("cannot read '{}': {}", path, std::strerror(errno));
        return false;
    }
    ::close(fd);
    if (info.st_size == 0) {
        reason = base::format("'{}' is empty", path);
        return false;
    }
    return true;
}

// Texture paths come out relative to the factory's name, so the factory is
// named after the folder the document is saved in.
base::string factoryName(const base::string& model, const base::string* output) {
    std::error_code ignored;
    std::filesystem::path where = std::filesystem::absolute(
        std::filesystem::path(output ? output->c_str() : model.c_str()), ignored);
    base::string folder(where.parent_path().string());
    if (folder.empty() || folder.back() != '/')
        folder += '/';
    return folder;
}

base::IPlugin* newestOfType(const base::PluginFactory& factory, base::name_id type) {
    for (std::uint32_t id = factory.pluginCount(); id-- > 0;)
        if (base::ref<base::IPlugin> plugin = factory.plugin(id);
            plugin && plugin->className() == type)
            return plugin.get();
    return nullptr;
}

template <class Mesh>
concept Validatable = requires(const Mesh& mesh) {
    { mesh.validate() } -> std::convertible_to<bool>;
};

struct ValidationResult {
    std::uint32_t checked = 0;
    std::uint32_t failed = 0;
    bool available = true;
};

template <class Mesh>
ValidationResult validateMeshes(const base::PluginFactory& factory) {
    ValidationResult result;
    if constexpr (Validatable<Mesh>) {
        for (std::uint32_t id = 0; id < factory.pluginCount(); ++id) {
            base::ref<base::IPlugin> plugin = factory.plugin(id);
            const auto* mesh = dynamic_cast<const Mesh*>(plugin.get());
            if (!mesh)
                continue;
            ++result.checked;
            if (!mesh->validate())
                ++result.failed;
        }
    } else {
        result.available = false;
    }
    return result;
}

int run(int argc, char** argv, HostLog& hostLog) {
    base::CmdLineOptions options;
    const HostSwitches switches = registerSwitches(options);
    const host::AnimationSwitches animation = host::registerAnimationSwitches(options);
    const auto* extractTextures = host::registerExtractTextures(options);
    base::string error;
    base::vector<base::string> positional;
    if (!options.parse(argc, argv, error, &positional))
        return usageError(error);
    if (switches.help->isSet() && switches.help->value()) {
        printUsage(stdout);
        std::fputs("\n", stdout);
        const base::string help = options.helpText(100);
        std::fwrite(help.data(), 1, help.size(), stdout);
        return exitImported;
    }
    if (positional.size() != 1)
        return usageError(positional.empty() ? "no model given" : "more than one model given");
    base::string model = positional.front();

    if (switches.verbose->isSet())
        hostLog.setShownLevel(switches.verbose->values().empty()
                                  ? int(base::logInfo)
                                  : std::clamp(switches.verbose->value(), 0, int(base::logDebug)));
    else if (switches.quiet->isSet() && switches.quiet->value())
        hostLog.setShownLevel(base::logError);

    const base::string* output = nullptr;
    if (switches.output->isSet()) {
        output = &switches.output->values().front();
        if (output->empty())
            return usageError("-o needs a file name or '-'");
    }
    const bool toStdout = output && *output == "-";
    host::preview::PreviewRequest preview;
    if (!host::preview::readSwitches(switches.preview, model, preview, error))
        return usageError(error);
    base::vector<host::ListKind> listed;
    if (switches.list->isSet() && !host::parseListKinds(switches.list->value(), listed, error))
        return usageError(error);
    const bool wantSummary =
        switches.summary->isSet() ? switches.summary->value() : !output && listed.empty();

    // Option values that do not fit their attribute are usage errors; find
    // them before the import rather than after it.
    base::AttribMap probe;
    if (!scene::apply_command_line(options, probe, scene::scene_schema::type(), error) ||
        !scene::apply_command_line(options, probe, scene::sceneImporter_schema::type(), error))
        return usageError(error);

    if (!host::insideArchive(model) && !checkModel(model, error))
        return failure(error);

    // The module must outlive the factory: the factory's descriptors live in it.
    host::ModuleLoader module;
    base::ref<base::PluginFactory> factory(
        new base::PluginFactory(factoryName(model, toStdout ? nullptr : output)));
    scene::register_scene_schema(*factory);
    const base::string modulePath =
        switches.plugin->isSet() ? switches.plugin->value() : host::ModuleLoader::defaultPath();
    if (!module.load(modulePath, *factory, error))
        return failure(error);

    base::ref<base::IPlugin> importer =
        factory->create(importerType, base::PluginFactory::createNullIfUnknown |
                                          base::PluginFactory::createReportUnknown |
                                          base::PluginFactory::createUnregistered);
    auto* sceneImporter = importer ? static_cast<scene::ISceneImporter*>(importer->queryInterface(
                                         scene::ISceneImporter::interfaceName()))
                                   : nullptr;
    if (!sceneImporter)
        return failure(
            base::format("the module '{}' offers no {} importer", modulePath, importerType));

    if (!host::chooseArchiveModel(*factory, base::name_id(importerType), model, error))
        return failure(error);
    sceneImporter->describeOptions(*importer);
    if (!scene::apply_command_line(options, *importer, scene::sceneImporter_schema::type(), error))
        return usageError(error);
    // Options only this importer reads; set only when given so its own
    // defaults stay in charge otherwise.
    if (switches.flipTextureCoordinates->isSet())
        importer->setAttribute<bool>(base::name_id("importFlipTextureCoordinates"),
                                     switches.flipTextureCoordinates->value());
    if (switches.flipFaceWinding->isSet())
        importer->setAttribute<bool>(base::name_id("importFlipFaceWinding"),
                                     switches.flipFaceWinding->value());

    hostLog.clearLastError();
    const auto started = std::chrono::steady_clock::now();
    const bool imported = sceneImporter->import(*factory, model);
    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
    if (!imported) {
        const base::string reason = hostLog.lastError();
        return failure(reason.empty()
                           ? base::format("cannot import '{}': assimp does not read it", model)
                           : base::format("cannot import '{}': {}", model, reason));
    }

    if (base::IPlugin* sceneObject = newestOfType(*factory, scene::names::scene))
        if (!scene::apply_command_line(options, *sceneObject, scene::scene_schema::type(), error))
            return usageError(error);

    if (animation.time->isSet())
        host::playAt(*factory, animation.time->value());

    int code = exitImported;
    if (switches.validate->isSet() && switches.validate->value()) {
        // Findings are warnings and errors; show them even under -q.
        const int shown = hostLog.shownLevel();
        hostLog.setShownLevel(std::max(shown, int(base::logWarning)));
        const ValidationResult result = validateMeshes<scene::IMesh>(*factory);
        hostLog.setShownLevel(shown);
        std::FILE* to = toStdout ? stderr : stdout;
        if (!result.available)
            std::fputs("validate: mesh validation is not available in this build\n", to);
        else
            std::fprintf(to, "validate: %u meshes checked, %u failed\n", result.checked,
                         result.failed);
        if (result.failed)
            code = exitInvalid;
    }

    if (output) {
        base::Stream stream;
        if (toStdout) {
            stream = host::stdoutStream();
        } else {
            try {
                stream = base::fs::master().open(
                    *output, base::fs::openWrite | base::fs::openCreate | base::fs::openTruncate);
            } catch (const base::exception& e) {
                return failure(base::format("cannot write '{}': {}", *output, e.message()));
            }
        }
        const bool written = base::writeFactory(*factory, stream);
        stream.close();
        if (!written)
            return failure(base::format("writing '{}' failed", toStdout ? "<stdout>" : *output));
    }

    if (!preview.path.empty()) {
        const base::IPlugin* sceneObject = newestOfType(*factory, scene::names::scene);
        if (!sceneObject)
            return failure(base::format("'{}' gave no scene to preview", model));
        if (!host::preview::writePreview(*factory, *sceneObject, preview.path, preview.options,
                                         error))
            return failure(error);
    }

    // --list and --frames print on standard output after the scene is written
    // (on standard error when the scene itself goes to standard output).
    const base::string report = host::animationReport(*factory, animation, listed);
    std::fwrite(report.data(), 1, report.size(), toStdout ? stderr : stdout);
    if (host::runExtractTextures(extractTextures, *factory, toStdout ? stderr : stdout))
        code = exitFailed;

    if (wantSummary) {
        const base::string text = host::formatSummary(host::collectStats(*factory), seconds) +
                                  host::animationSummary(*factory);
        std::fwrite(text.data(), 1, text.size(), toStdout || !report.empty() ? stderr : stdout);
    }
    return code;
}

} // namespace

int main(int argc, char** argv) {
    std::setlocale(LC_ALL, "");
    HostLog hostLog;
    base::ScopedLog scoped(hostLog);
    try {
        return run(argc, argv, hostLog);
    } catch (const base::exception& e) {
        // The log line is the one-line reason; it reaches standard error.
        base::logFormatted(base::logAll, base::logCritical, "scene-import| {} ({})", e.message(),
                           e.function());
        return exitFailed;
    } catch (const std::exception& e) {
        return failure(e.what());
    } catch (...) {
        return failure("unknown failure");
    }
}

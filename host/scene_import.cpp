#include "scene_import.h"

#include "archive_input.h"
#include "b_format.h"
#include "module_loader.h"
#include "scene_cmdline.h"
#include "scene_importer.h"
#include "scene_interfaces.h"
#include "scene_stats.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>

namespace host {

namespace {

constexpr std::string_view importerType = "AssimpImporter";

// Texture paths come out relative to the factory's name, so the factory is
// named after the folder the document is saved in.
base::string factoryName(const ImportSettings& settings) {
    const bool toFile = !settings.output.empty() && settings.output != "-";
    std::error_code ignored;
    std::filesystem::path where = std::filesystem::absolute(
        std::filesystem::path(toFile ? settings.output.c_str() : settings.model.c_str()), ignored);
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

// The one line that states why the import failed.
int failed(ImportRecord& record, base::string reason, int code = 1) {
    std::fprintf(stderr, "scene-import: %s\n%s", reason.c_str(),
                 code == 2 ? "Try 'scene-import --help'.\n" : "");
    record.status = "failed";
    record.reason = std::move(reason);
    return code;
}

} // namespace

base::string modelProblem(const base::string& path) {
    // Anything but a regular file is refused so that a FIFO or a device
    // cannot stall the import.
    struct stat info {};
    if (::stat(path.c_str(), &info) != 0)
        return base::format("cannot open '{}': {}", path, std::strerror(errno));
    if (S_ISDIR(info.st_mode))
        return base::format("'{}' is a directory", path);
    if (!S_ISREG(info.st_mode))
        return base::format("'{}' is not a regular file", path);
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return base::format("cannot read '{}': {}", path, std::strerror(errno));
    ::close(fd);
    if (info.st_size == 0)
        return base::format("'{}' is empty", path);
    return {};
}

int importScene(const ImportSettings& settings, const base::CmdLineOptions& options, HostLog& log,
                std::span<const SceneFeature> features, ImportRecord& record) {
    record.model = settings.model;
    base::string error;
    // The module must outlive the factory: the factory's descriptors live in it.
    ModuleLoader module;
    base::ref<base::PluginFactory> factory(new base::PluginFactory(factoryName(settings)));
    scene::register_scene_schema(*factory);
    if (!module.load(settings.modulePath, *factory, error))
        return failed(record, error);

    base::ref<base::IPlugin> importer =
        factory->create(importerType, base::PluginFactory::createNullIfUnknown |
                                          base::PluginFactory::createReportUnknown |
                                          base::PluginFactory::createUnregistered);
    auto* sceneImporter = importer ? static_cast<scene::ISceneImporter*>(importer->queryInterface(
                                         scene::ISceneImporter::interfaceName()))
                                   : nullptr;
    if (!sceneImporter)
        return failed(record, base::format("the module '{}' offers no {} importer",
                                           settings.modulePath, importerType));

    // An archive given as the model stands for the one model inside it.
    base::string model = settings.model;
    if (!chooseArchiveModel(*factory, base::name_id(importerType), model, error))
        return failed(record, error);

    sceneImporter->describeOptions(*importer);
    if (!scene::apply_command_line(options, *importer, scene::sceneImporter_schema::type(), error))
        return failed(record, error, 2);
    // Options only this importer reads; set only when given so that its own
    // defaults stay in charge otherwise.
    for (const char* name : {"-importFlipTextureCoordinates", "-importFlipFaceWinding"})
        if (const auto* flip = options.findValue<bool>(name); flip && flip->isSet())
            importer->setAttribute<bool>(base::name_id(std::string_view(name + 1)), flip->value());

    log.beginImport();
    const auto started = std::chrono::steady_clock::now();
    const bool imported = sceneImporter->import(*factory, model);
    record.seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
    record.warnings = log.warnings();
    record.errors = log.errors();
    record.firstWarning = log.firstWarning();
    if (!imported) {
        const base::string reason = log.lastError();
        log.dropPendingError();
        return failed(record, reason.empty()
                                  ? base::format("cannot import '{}': assimp does not "
                                                 "read it",
                                                 model)
                                  : base::format("cannot import '{}': {}", model, reason));
    }
    log.flushPendingError();

    if (base::IPlugin* sceneObject = newestOfType(*factory, scene::names::scene))
        if (!scene::apply_command_line(options, *sceneObject, scene::scene_schema::type(), error))
            return failed(record, error, 2);

    record.status = "imported";
    const SceneStats stats = collectStats(*factory);
    record.types = stats.types;
    record.vertices = stats.vertices;
    record.faces = stats.faces;

    ImportedScene scene{*factory, settings.model, options,
                        log,      record.seconds, settings.output == "-" ? stderr : stdout,
                        record};
    int code = 0;
    for (const SceneFeature& feature : features) {
        const int answer = feature(scene);
        if (code == 0)
            code = answer;
    }
    return code;
}

} // namespace host

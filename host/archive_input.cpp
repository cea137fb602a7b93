#include "archive_input.h"

#include "b_format.h"
#include "scene_importer.h"
#include "stream/b_fs_archive.h"

#include <string_view>

namespace host {

bool insideArchive(const base::string& path) {
    return base::fs::innerName(path) != path || base::fs::archivesOnTheWay(path) > 0;
}

bool chooseArchiveModel(const base::PluginFactory& factory, base::name_id importerType,
                        base::string& model, base::string& error) {
    if (!base::fs::isArchiveName(model) || !base::fs::master().isFolder(model))
        return true;
    base::ref<base::IPluginDesc> desc = factory.descriptor(importerType);
    auto* importer = dynamic_cast<scene::IScenePluginDesc*>(desc.get());
    const base::string extensions = importer ? importer->supportedExtensions() : base::string();
    // Compressed members count by the name of their content.
    base::vector<base::string> models;
    for (const base::string& file : base::fs::listFilesBelow(model))
        if (base::fs::hasExtensionIn(base::fs::innerName(file), extensions))
            models.push_back(file);
    if (models.size() == 1) {
        model = models.front();
        return true;
    }
    if (models.empty()) {
        error = base::format("'{}' holds no model this importer reads", model);
        return false;
    }
    error = base::format("'{}' holds {} models; name one of them:", model, models.size());
    for (const base::string& file : models)
        error += base::format("\n  {}", file);
    return false;
}

} // namespace host

#include "archive_input.h"

#include "b_format.h"
#include "scene_importer.h"
#include "stream/b_fs_archive.h"

#include <string_view>

namespace host {

namespace {

bool readable(std::string_view path, std::string_view extensions) {
    const std::size_t slash = path.find_last_of('/');
    const std::string_view leaf = path.substr(slash == std::string_view::npos ? 0 : slash + 1);
    const std::size_t dot = leaf.rfind('.');
    if (dot == std::string_view::npos || dot == 0)
        return false;
    const base::string extension = [&] {
        base::string e(leaf.substr(dot + 1));
        for (char& c : e)
            c = char(c >= 'A' && c <= 'Z' ? c + 32 : c);
        return e;
    }();
    while (!extensions.empty()) {
        const std::size_t end = extensions.find(';');
        if (extensions.substr(0, end) == extension)
            return true;
        if (end == std::string_view::npos)
            break;
        extensions.remove_prefix(end + 1);
    }
    return false;
}

} // namespace

bool insideArchive(const base::string& path) {
    if (base::fs::innerName(path) != path)
        return true;
    for (std::size_t end = path.find_first_of("/\\"); end != base::string::npos;
         end = path.find_first_of("/\\", end + 1)) {
        const std::string_view folder(path.data(), end);
        if (base::fs::isArchiveName(folder) || base::fs::innerName(folder).size() != folder.size())
            return true;
    }
    return false;
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
        if (readable(base::fs::innerName(file), extensions))
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

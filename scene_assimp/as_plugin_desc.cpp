#include "as_plugin_desc.h"

#include "as_importer.h"
#include "b_exception.h"
#include "b_format.h"
#include "b_log.h"

#include <assimp/Importer.hpp>
#include <assimp/version.h>

#include <mutex>
#include <string>

AssimpPluginDesc::AssimpPluginDesc() {
    setTypeName(base::name_id("AssimpImporter"));
    setLegalText(aiGetLegalString());
}

base::IPlugin* AssimpPluginDesc::create(base::PluginFactory& factory, std::uint32_t id) {
    // The factory runs in the host: a failure is reported as no object.
    try {
        return new as::AssimpImporter(this, &factory, id);
    } catch (const base::exception& e) {
        e.log(base::log());
    } catch (...) {
        base::logFormatted(base::logSystem, base::logError,
                           "assimp| Unable to create an importer object!");
    }
    return nullptr;
}

const base::string& AssimpPluginDesc::supportedExtensions() {
    static base::string extensions;
    static std::mutex filling;
    std::lock_guard<std::mutex> guard(filling);
    if (extensions.empty()) {
        // An empty answer (or a failure) is asked again on the next request.
        try {
            std::string list;
            Assimp::Importer().GetExtensionList(list);
            extensions = as::stripExtensionList(list);
        } catch (...) {
            extensions.clear();
        }
    }
    return extensions;
}

const base::string& AssimpPluginDesc::secondaryText() {
    static const base::string empty;
    return empty;
}

namespace as {

base::string stripExtensionList(std::string_view list) {
    base::string out;
    out.reserve(list.size());
    for (char c : list)
        if (c != '*' && c != '.')
            out.push_back(c);
    return out;
}

} // namespace as

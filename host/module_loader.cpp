#include "module_loader.h"

#include "b_format.h"

#include <dlfcn.h>
#include <unistd.h>

#include <climits>

namespace host {

namespace {

using LoadEntry = int (*)(base::PluginFactory&);
using UnloadEntry = int (*)();

} // namespace

ModuleLoader::~ModuleLoader() {
    if (m_unload)
        m_unload();
    if (m_handle)
        dlclose(m_handle);
}

base::string ModuleLoader::defaultPath() {
    char buffer[PATH_MAX];
    const ssize_t length = readlink("/proc/self/exe", buffer, sizeof buffer - 1);
    if (length <= 0)
        return "scene_assimp.so";
    std::string_view exe(buffer, std::size_t(length));
    const std::size_t slash = exe.rfind('/');
    base::string path(slash == std::string_view::npos ? std::string_view{}
                                                      : exe.substr(0, slash + 1));
    path += "scene_assimp.so";
    return path;
}

bool ModuleLoader::load(std::string_view path, base::PluginFactory& factory, base::string& error) {
    const base::string file(path);
    // A bare file name would make dlopen search the library path instead.
    const base::string opened = file.find('/') == base::string::npos ? "./" + file : file;
    // Never unmapped: assimp keeps the module's logger installed after a
    // failed read, so the module's code may be reached until the process ends.
    m_handle = dlopen(opened.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
    if (!m_handle) {
        const char* reason = dlerror();
        error = base::format("cannot load the importer module '{}': {}", file,
                             reason ? reason : "unknown error");
        return false;
    }
    auto load = reinterpret_cast<LoadEntry>(dlsym(m_handle, "loadScenePlugin"));
    auto unload = reinterpret_cast<UnloadEntry>(dlsym(m_handle, "unloadScenePlugin"));
    if (!load || !unload) {
        error = base::format("'{}' is not an importer module (entry points missing)", file);
        return false;
    }
    const int answer = load(factory);
    m_unload = unload;
    if (answer != 0) {
        error = base::format("the importer module '{}' failed to load ({})", file, answer);
        return false;
    }
    return true;
}

} // namespace host

#include "scene_module.h"

#include "b_format.h"

#include <dlfcn.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstdlib>

namespace scene {

namespace {

using LoadEntry = int (*)(base::PluginFactory&);
using UnloadEntry = int (*)();

bool isFile(const base::string& path) {
    struct stat info;
    return stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode);
}

// The folder part of a path, with its trailing slash; empty for a bare name.
base::string folderOf(std::string_view path) {
    const std::size_t slash = path.rfind('/');
    return base::string(slash == std::string_view::npos ? std::string_view{}
                                                        : path.substr(0, slash + 1));
}

} // namespace

ModuleLoader::~ModuleLoader() {
    if (m_unload)
        m_unload();
    if (m_handle)
        dlclose(m_handle);
}

base::string ModuleLoader::defaultPath() {
    if (const char* named = std::getenv(pathVariable); named && *named)
        return named;
    // This library's own file: the installed module lives below its folder.
    Dl_info info{};
    if (dladdr(reinterpret_cast<void*>(&ModuleLoader::defaultPath), &info) && info.dli_fname) {
        base::string installed = folderOf(info.dli_fname) + "scene_assimp/plugins/scene_assimp.so";
        if (isFile(installed))
            return installed;
    }
    char buffer[PATH_MAX];
    const ssize_t length = readlink("/proc/self/exe", buffer, sizeof buffer - 1);
    if (length <= 0)
        return "scene_assimp.so";
    return folderOf(std::string_view(buffer, std::size_t(length))) + "scene_assimp.so";
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

} // namespace scene

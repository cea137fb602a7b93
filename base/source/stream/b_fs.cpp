#include "stream/b_fs.h"

#include "stream/b_fs_archive.h"

#include "b_exception.h"
#include "b_stack_walker.h"

#include <algorithm>

namespace base::fs {

// ---- IPlugin defaults ----

bool IPlugin::symLinksPermitted() const {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::symbolicLinks");
}
void IPlugin::setSymLinksPermitted(bool) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::symbolicLinks");
}
bool IPlugin::isFolder(std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::isFolder");
}
vector<string> IPlugin::findFiles(std::string_view, std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::findFiles");
}
vector<string> IPlugin::findFolders(std::string_view, std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::findFolders");
}
bool IPlugin::remove(std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::remove");
}
bool IPlugin::rename(std::string_view, std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::rename");
}
bool IPlugin::copy(std::string_view, std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::copy");
}
bool IPlugin::touch(std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::touch");
}
string IPlugin::readLink(std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::readLink");
}
bool IPlugin::mkdir(std::string_view) {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::mkdir");
}
string IPlugin::curdir() {
    throw unsupported_interface(__FILE__, __LINE__, "fs::Plugin::curdir");
}

// ---- Aliases ----

void AliasRegistry::set(std::string_view name, std::string_view target) {
    if (name.empty() || name.find(':') != std::string_view::npos)
        throw invalid_argument(format("invalid alias name"), __FILE__, __LINE__,
                               "base::fs::AliasRegistry::set", string(name));
    WriteGuard guard(m_lock);
    m_aliases.insert_or_assign(string(name), string(target));
}

bool AliasRegistry::remove(std::string_view name) {
    WriteGuard guard(m_lock);
    auto it = m_aliases.find(string(name));
    if (it == m_aliases.end())
        return false;
    m_aliases.erase(it);
    return true;
}

std::optional<string> AliasRegistry::find(std::string_view name) const {
    ReadGuard guard(m_lock);
    auto it = m_aliases.find(string(name));
    if (it == m_aliases.end())
        return std::nullopt;
    return it->second;
}

void AliasRegistry::clear() {
    WriteGuard guard(m_lock);
    m_aliases.clear();
}

string AliasRegistry::expand(std::string_view path) const {
    string result(path);
    ReadGuard guard(m_lock);
    if (m_aliases.empty())
        return result;
    vector<const string*> applied;
    for (;;) {
        std::size_t colon = result.find(':');
        if (colon == string::npos || colon == 0)
            break;
        auto it = m_aliases.find(result.substr(0, colon));
        if (it == m_aliases.end())
            break;
        // A second use of the same alias means the chain is a cycle.
        if (std::find(applied.begin(), applied.end(), &it->first) != applied.end())
            break;
        applied.push_back(&it->first);
        result.replace(0, colon + 1, it->second);
    }
    return result;
}

AliasRegistry& aliases() {
    // Never destroyed: paths may still be expanded during static destruction.
    static AliasRegistry* registry = new AliasRegistry();
    return *registry;
}

// ---- MasterFS ----

namespace {

class MasterDesc : public PluginDesc {
public:
    const char* name() const override { return "master"; }
    const char* description() const override { return "master file system"; }
    ref<IPlugin> create() const override { return ref<IPlugin>(new MasterFS()); }
};

bool sameAscii(std::string_view a, std::string_view b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) {
        auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? char(c - 'A' + 'a') : c; };
        return lower(x) == lower(y);
    });
}

// The extension of the path's last component, without the dot.
std::string_view extensionOf(std::string_view path) {
    std::size_t slash = path.find_last_of("/\\");
    std::string_view leaf = slash == std::string_view::npos ? path : path.substr(slash + 1);
    std::size_t dot = leaf.rfind('.');
    return dot == std::string_view::npos ? std::string_view() : leaf.substr(dot + 1);
}

bool listHasExtension(std::string_view list, std::string_view extension) {
    while (!list.empty()) {
        std::size_t end = list.find(';');
        if (sameAscii(list.substr(0, end), extension))
            return true;
        if (end == std::string_view::npos)
            break;
        list.remove_prefix(end + 1);
    }
    return false;
}

void appendNew(vector<string>& into, vector<string>&& names) {
    for (string& name : names)
        if (std::find(into.begin(), into.end(), name) == into.end())
            into.push_back(std::move(name));
}

} // namespace

MasterFS::MasterFS() = default;

const PluginDesc& MasterFS::pluginDesc() const {
    static MasterDesc* desc = [] {
        auto* d = new MasterDesc();
        d->addRef();
        return d;
    }();
    return *desc;
}

vector<MasterFS::Attached> MasterFS::attached() const {
    ReadGuard guard(m_lock);
    return m_attached;
}

bool MasterFS::symLinksPermitted() const {
    for (const Attached& a : attached())
        if ((a.flags & attachSymLinks) && a.plugin->symLinksPermitted())
            return true;
    return false;
}

void MasterFS::setSymLinksPermitted(bool permitted) {
    for (const Attached& a : attached())
        if (a.flags & attachSymLinks)
            a.plugin->setSymLinksPermitted(permitted);
}

bool MasterFS::isArchive() const {
    for (const Attached& a : attached())
        if (a.plugin->isArchive())
            return true;
    return false;
}

bool MasterFS::isEncrypted() const {
    for (const Attached& a : attached())
        if (a.plugin->isEncrypted())
            return true;
    return false;
}

namespace {

// Whether one of 'list' answers 'probe' for the alias-expanded path. Probing
// is routine (assimp asks for optional files), so no call stack is captured,
// and a file system that cannot tell does not have the path.
bool anyHas(const vector<MasterFS::Attached>& list, std::string_view path,
            bool (IPlugin::*probe)(std::string_view)) {
    if (path.empty())
        return false;
    const string expanded = aliases().expand(path);
    ScopedStackCapture noCapture(false);
    for (const MasterFS::Attached& a : list) {
        try {
            if ((a.plugin.get()->*probe)(expanded))
                return true;
        } catch (const exception&) {
        }
    }
    return false;
}

} // namespace

bool MasterFS::exists(std::string_view path) {
    return anyHas(attached(), path, &IPlugin::exists);
}

bool MasterFS::isFolder(std::string_view path) {
    return anyHas(attached(), path, &IPlugin::isFolder);
}

Stream MasterFS::open(std::string_view path, std::uint32_t flags) {
    if (path.empty())
        BASE_THROW_IN(invalid_argument, "base::fs::MasterFS::open", "file name not provided");
    string expanded = aliases().expand(path);
    vector<Attached> list = attached();

    auto opened = [](Stream stream) {
        stream.setFlags(stream.flags() | streamOpened);
        return stream;
    };

    if ((flags & openWrite) && (flags & openByExtension)) {
        std::string_view extension = extensionOf(expanded);
        if (!extension.empty()) {
            for (const Attached& a : list) {
                if (!listHasExtension(a.plugin->pluginDesc().extensions(), extension))
                    continue;
                Stream stream = a.plugin->open(expanded, flags);
                if (!stream)
                    BASE_THROW_IN(file_not_found, "base::fs::MasterFS::open", "file '{}' not found",
                                  expanded);
                return opened(std::move(stream));
            }
        }
        // No file system claims the extension: any of them may take the path.
    }

    ScopedStackCapture noCapture(false);
    string notFound;
    std::optional<wrong_password> password;
    for (const Attached& a : list) {
        try {
            if (Stream stream = a.plugin->open(expanded, flags))
                return opened(std::move(stream));
        } catch (const file_not_found& e) {
            if (!e.message().empty()) {
                if (!notFound.empty())
                    notFound += "; ";
                notFound += e.message();
            }
        } catch (const wrong_password& e) {
            if (!password)
                password.emplace(e);
        }
    }
    if (password && notFound.empty())
        throw wrong_password(*password);
    if (notFound.empty())
        BASE_THROW_IN(file_not_found, "base::fs::MasterFS::open", "file '{}' not found", expanded);
    throw file_not_found(std::move(notFound), __FILE__, __LINE__, "base::fs::MasterFS::open");
}

namespace {
// Asks each file system until one answers true; those lacking the operation
// are skipped.
template <class Op>
bool passOn(const vector<MasterFS::Attached>& list, Op op) {
    for (const MasterFS::Attached& a : list) {
        try {
            if (op(*a.plugin))
                return true;
        } catch (const unsupported_interface&) {
        }
    }
    return false;
}

template <class Op>
vector<string> mergeListings(const vector<MasterFS::Attached>& list, Op op) {
    vector<string> names;
    for (const MasterFS::Attached& a : list) {
        try {
            appendNew(names, op(*a.plugin));
        } catch (const unsupported_interface&) {
        }
    }
    return names;
}
} // namespace

vector<string> MasterFS::findFiles(std::string_view folder, std::string_view pattern) {
    string expanded = aliases().expand(folder);
    return mergeListings(attached(), [&](IPlugin& p) { return p.findFiles(expanded, pattern); });
}

vector<string> MasterFS::findFolders(std::string_view folder, std::string_view pattern) {
    string expanded = aliases().expand(folder);
    return mergeListings(attached(), [&](IPlugin& p) { return p.findFolders(expanded, pattern); });
}

bool MasterFS::remove(std::string_view path) {
    string expanded = aliases().expand(path);
    return passOn(attached(), [&](IPlugin& p) { return p.remove(expanded); });
}

bool MasterFS::rename(std::string_view from, std::string_view to) {
    string a = aliases().expand(from), b = aliases().expand(to);
    return passOn(attached(), [&](IPlugin& p) { return p.rename(a, b); });
}

bool MasterFS::copy(std::string_view from, std::string_view to) {
    string a = aliases().expand(from), b = aliases().expand(to);
    return passOn(attached(), [&](IPlugin& p) { return p.copy(a, b); });
}

bool MasterFS::touch(std::string_view path) {
    string expanded = aliases().expand(path);
    return passOn(attached(), [&](IPlugin& p) { return p.touch(expanded); });
}

bool MasterFS::mkdir(std::string_view path) {
    string expanded = aliases().expand(path);
    return passOn(attached(), [&](IPlugin& p) { return p.mkdir(expanded); });
}

string MasterFS::curdir() {
    for (const Attached& a : attached()) {
        try {
            string dir = a.plugin->curdir();
            if (!dir.empty())
                return dir;
        } catch (const unsupported_interface&) {
        }
    }
    return {};
}

void MasterFS::registerFS(ref<PluginDesc> desc) {
    if (!desc)
        return;
    WriteGuard guard(m_lock);
    for (ref<PluginDesc>& kind : m_kinds) {
        if (std::string_view(kind->name()) == desc->name()) {
            kind = std::move(desc);
            return;
        }
    }
    m_kinds.push_back(std::move(desc));
}

IPlugin& MasterFS::attachFS(std::string_view name, std::uint32_t flags) {
    auto findAttached = [&]() -> IPlugin* {
        for (const Attached& a : m_attached)
            if (a.plugin->pluginDesc().name() == name)
                return a.plugin.get();
        return nullptr;
    };
    ref<PluginDesc> kind;
    {
        ReadGuard guard(m_lock);
        if (IPlugin* present = findAttached())
            return *present;
        for (const ref<PluginDesc>& k : m_kinds)
            if (k->name() == name)
                kind = k;
    }
    // Created outside the lock: a file system may use the master while it sets up.
    ref<IPlugin> plugin = kind ? kind->create() : ref<IPlugin>();
    if (!plugin)
        throw invalid_argument(format("file system with name {} can't be found", name), __FILE__,
                               __LINE__, "base::fs::MasterFS::attachFS");
    WriteGuard guard(m_lock);
    if (IPlugin* present = findAttached())
        return *present;
    m_attached.push_back({plugin, flags});
    return *plugin;
}

void MasterFS::attach(ref<IPlugin> plugin, std::uint32_t flags) {
    if (!plugin)
        return;
    WriteGuard guard(m_lock);
    m_attached.push_back({std::move(plugin), flags});
}

MasterFS& master() {
    // Never destroyed: streams and exists() may be used during static destruction.
    static MasterFS* fs = [] {
        auto* m = new MasterFS();
        m->addRef();
        m->registerFS(ref<PluginDesc>(&nativeFileSystem()));
        m->attachFS("native", attachSymLinks);
        attachArchiveFileSystems(*m);
        return m;
    }();
    return *fs;
}

} // namespace base::fs

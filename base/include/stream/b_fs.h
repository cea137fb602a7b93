// The virtual file system. Every file access goes through the master file
// system, master(): an ordered list of attached file-system plug-ins (the native
// one first, archives after it) that it asks in turn. Paths may start with an
// alias ("data:models/a.obj"), rewritten through aliases() before the plug-ins
// see them.
//
// A file-system plug-in answers open() with a Stream, or with an empty Stream
// when it simply does not have the path. It throws fs::file_not_found with a
// message of its own when it recognises the path but cannot find the member
// (an archive's "path not found!"), fs::wrong_password for an encrypted member
// it cannot unlock, and other base::exception types for real failures. The
// master turns that into its own contract: open() answers a stream or throws
// file_not_found / wrong_password / invalid_argument; exists() never throws.
//
// Probing throws and catches exceptions as a matter of course, so the master
// switches the process-wide call-stack capture off while it asks the plug-ins
// and restores the previous setting on every way out.
//
// The attached list is meant to be built during start-up; it is guarded all
// the same, and the master iterates over a snapshot so a plug-in may call back
// into the master (an archive opening its container file).
#pragma once

#include "b_attrib_map.h"
#include "b_lock.h"
#include "b_memory.h"
#include "b_refcnt.h"
#include "stream/b_stream.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace base::fs {

// Open flags.
enum OpenFlags : std::uint32_t {
    openRead = 1u << 0,
    // Without openRead this also implies openCreate.
    openWrite = 1u << 1,
    // Sharing; the native file system on this platform accepts and ignores them.
    openShareRead = 1u << 2,
    openShareWrite = 1u << 3,
    // Create the file if missing, open it if present.
    openCreate = 1u << 5,
    // With openCreate: always start from an empty file. Without: open only an
    // existing file and empty it.
    openTruncate = 1u << 6,
    // With openWrite: the target file system is chosen by the path's extension.
    openByExtension = 1u << 7,
};

// Attach flags: the file system takes part in the symbolic-link setting.
inline constexpr std::uint32_t attachSymLinks = 1u << 3;

class IPlugin;

// Describes a kind of file system and makes instances of it.
class PluginDesc : public RefCntAtomic, public AllocObject<>, NonCopyable {
public:
    // The name attachFS() looks for ("master", "native", "zip", ...).
    virtual const char* name() const = 0;
    virtual const char* description() const { return ""; }
    // Extensions routed to this file system by openByExtension, separated by
    // ';' ("zip;jar;war;pk3"); empty for file systems that take any path.
    virtual const char* extensions() const { return ""; }
    virtual ref<IPlugin> create() const = 0;
};

// A file system. Operations a file system does not offer throw
// unsupported_interface naming the operation ("fs::Plugin::readLink").
class IPlugin : public AttribMap, public RefCntAtomic {
public:
    IPlugin() = default;

    virtual const PluginDesc& pluginDesc() const = 0;
    virtual bool symLinksPermitted() const;
    virtual void setSymLinksPermitted(bool permitted);
    // Whether the file system presents the members of archives / holds
    // encrypted content. The native file system answers false to both.
    virtual bool isArchive() const { return false; }
    virtual bool isEncrypted() const { return false; }
    // True for a file that open() could answer; false for folders.
    virtual bool exists(std::string_view path) = 0;
    virtual bool isFolder(std::string_view path);
    // A stream, or an empty one when the file system does not have the path.
    virtual Stream open(std::string_view path, std::uint32_t flags) = 0;
    // Names (not paths) of the files / folders directly inside 'folder' that
    // match the shell pattern ("*" matches every name).
    virtual vector<string> findFiles(std::string_view folder, std::string_view pattern);
    virtual vector<string> findFolders(std::string_view folder, std::string_view pattern);
    // The changing operations answer whether they took effect.
    virtual bool remove(std::string_view path);
    virtual bool rename(std::string_view from, std::string_view to);
    virtual bool copy(std::string_view from, std::string_view to);
    // Creates an empty file when missing, else marks it modified now.
    virtual bool touch(std::string_view path);
    virtual string readLink(std::string_view path);
    // Creates the folder and any missing parents; true when it exists after.
    virtual bool mkdir(std::string_view path);
    virtual string curdir();
};

// Path aliases: "name:rest" becomes target + "rest". Thread-safe.
class AliasRegistry : NonCopyable {
public:
    // Adds or replaces an alias. An empty name or one holding ':' throws
    // invalid_argument.
    void set(std::string_view name, std::string_view target);
    bool remove(std::string_view name);
    std::optional<string> find(std::string_view name) const;
    void clear();

    // Replaces known alias prefixes while the path starts with one. Each alias
    // is applied at most once, so aliases that refer to each other (or to
    // themselves) stop instead of looping; the path is then left as reached.
    string expand(std::string_view path) const;

private:
    mutable LockWord m_lock{0};
    map<string, string> m_aliases;
};

AliasRegistry& aliases();

// The descriptor of the native file system ("native"): the operating
// system's files, with both '/' and '\' taken as separators.
PluginDesc& nativeFileSystem();

class MasterFS : public IPlugin {
public:
    struct Attached {
        ref<IPlugin> plugin;
        std::uint32_t flags = 0;
    };

    MasterFS();

    // ---- IPlugin ----
    // Named "master".
    const PluginDesc& pluginDesc() const override;
    // Asked of the file systems attached with attachSymLinks.
    bool symLinksPermitted() const override;
    void setSymLinksPermitted(bool permitted) override;
    bool isArchive() const override;
    bool isEncrypted() const override;
    // The first file system that has the path; never throws.
    bool exists(std::string_view path) override;
    bool isFolder(std::string_view path) override;
    // A stream with streamOpened set. Throws invalid_argument for an empty
    // path, wrong_password when only a password stood in the way, else
    // file_not_found when no file system opened the path.
    Stream open(std::string_view path, std::uint32_t flags) override;
    // Listings merge the attached file systems' answers, first seen first.
    vector<string> findFiles(std::string_view folder, std::string_view pattern) override;
    vector<string> findFolders(std::string_view folder, std::string_view pattern) override;
    // Passed on in order until a file system answers true; file systems that
    // do not offer the operation are skipped.
    bool remove(std::string_view path) override;
    bool rename(std::string_view from, std::string_view to) override;
    bool copy(std::string_view from, std::string_view to) override;
    bool touch(std::string_view path) override;
    bool mkdir(std::string_view path) override;
    // The first file system that knows one.
    string curdir() override;

    // ---- Attaching ----
    // Makes the file system kind known to attachFS(); a kind of the same name
    // is replaced.
    void registerFS(ref<PluginDesc> desc);
    // Attaches a new file system of the registered kind unless one of that
    // name is attached already; answers the attached one. An unknown name
    // throws invalid_argument "file system with name {} can't be found".
    IPlugin& attachFS(std::string_view name, std::uint32_t flags = 0);
    // Appends a file system instance.
    void attach(ref<IPlugin> plugin, std::uint32_t flags = 0);
    vector<Attached> attached() const;

private:
    mutable LockWord m_lock{0};
    vector<Attached> m_attached;
    vector<ref<PluginDesc>> m_kinds;
};

// The process-wide master file system, with the native file system attached.
MasterFS& master();

} // namespace base::fs

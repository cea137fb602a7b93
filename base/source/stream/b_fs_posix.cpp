// The native file system on POSIX: plain file descriptors. Paths written on
// other systems name folders with '\', so both separators are accepted (a file
// name can therefore not hold a backslash here).
#include "stream/b_fs.h"

#include "b_exception.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <system_error>

#include <dirent.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <sys/stat.h>
#include <unistd.h>

namespace base::fs {

namespace {

// Set on every native worker besides the access bits.
constexpr std::uint32_t nativeCaps = capSeek | (1u << 3) | (1u << 7) | (1u << 9);
// Larger transfers are split: the kernel moves at most about 2 GB per call.
constexpr std::uint64_t maxTransfer = std::uint64_t(1) << 30;

string nativePath(std::string_view path) {
    string p(path);
    std::replace(p.begin(), p.end(), '\\', '/');
    return p;
}

[[noreturn]] void throwApi(const char* function, std::string_view call, std::string_view name,
                           int error) {
    std::string text = std::generic_category().message(error);
    throw api_exception(format("{} on '{}' failed: {}", call, name, std::string_view(text)), error,
                        __FILE__, __LINE__, function);
}

class NativeStreamWorker final : public StreamWorker {
public:
    NativeStreamWorker(std::string_view name, int fd, std::uint32_t caps, std::uint32_t openFlags,
                       bool followLinks)
        : StreamWorker(name, caps), m_fd(fd), m_openFlags(openFlags), m_followLinks(followLinks) {}
    ~NativeStreamWorker() override { closeHandle(); }

    std::uint64_t read(void* buffer, std::uint64_t bytes) override {
        if (!(m_caps & capRead))
            return 0;
        auto* out = static_cast<char*>(buffer);
        std::uint64_t done = 0;
        while (done < bytes) {
            ssize_t n = ::read(m_fd, out + done, std::min(bytes - done, maxTransfer));
            if (n > 0) {
                done += std::uint64_t(n);
                continue;
            }
            if (n == 0)
                break;
            if (errno == EINTR)
                continue;
            // Hand over what arrived; the failure shows again on the next call.
            if (done)
                break;
            throwApi("base::fs::NativePlugin::readFile", "read", m_name, errno);
        }
        return done;
    }

    std::uint64_t write(const void* buffer, std::uint64_t bytes) override {
        if (!(m_caps & capWrite))
            return 0;
        const auto* in = static_cast<const char*>(buffer);
        std::uint64_t done = 0;
        while (done < bytes) {
            ssize_t n = ::write(m_fd, in + done, std::min(bytes - done, maxTransfer));
            if (n > 0) {
                done += std::uint64_t(n);
                continue;
            }
            if (n < 0 && errno == EINTR)
                continue;
            if (done || n == 0)
                break;
            throwApi("base::fs::NativePlugin::writeFile", "write", m_name, errno);
        }
        return done;
    }

    std::uint64_t setPosition(std::int64_t offset, std::uint32_t origin) override {
        int whence = origin == seekBegin ? SEEK_SET : origin == seekCurrent ? SEEK_CUR : SEEK_END;
        off_t position = ::lseek(m_fd, off_t(offset), whence);
        if (position < 0)
            throwApi("base::fs::NativePlugin::setFilePosition", "lseek", m_name, errno);
        return std::uint64_t(position);
    }

    std::uint64_t getPosition() override {
        off_t position = ::lseek(m_fd, 0, SEEK_CUR);
        if (position < 0)
            throwApi("base::fs::NativePlugin::fileGetPosition", "lseek", m_name, errno);
        return std::uint64_t(position);
    }

    std::uint64_t getSize() override {
        struct stat st;
        if (::fstat(m_fd, &st) != 0)
            throwApi("base::fs::NativePlugin::fileGetSize", "fstat", m_name, errno);
        return std::uint64_t(st.st_size);
    }

    void setSize(std::uint64_t size) override {
        int result;
        do
            result = ::ftruncate(m_fd, off_t(size));
        while (result != 0 && errno == EINTR);
        if (result != 0)
            throwApi("base::fs::NativePlugin::fileTrunc", "ftruncate", m_name, errno);
    }

    void flush(std::uint32_t) override {
        // Nothing of ours to write out on a stream opened without write access.
        if (!(m_caps & capWrite))
            return;
        // EINVAL: the file (a pipe, a device) cannot be synchronised.
        if (::fsync(m_fd) != 0 && errno != EINVAL)
            throwApi("base::fs::NativePlugin::fileFlush", "fsync", m_name, errno);
    }

    void close() override {
        closeHandle();
        StreamWorker::close();
    }

    ref<StreamWorker> reopen() override;

private:
    void closeHandle() noexcept {
        // Not retried on EINTR: the descriptor is released either way.
        if (m_fd >= 0)
            ::close(m_fd);
        m_fd = -1;
    }

    int m_fd;
    std::uint32_t m_openFlags;
    bool m_followLinks;
};

// A stream on the file, or an empty one when there is no such file (a folder
// counts as none).
Stream openNative(std::string_view path, std::uint32_t flags, bool followLinks) {
    bool read = flags & openRead;
    bool write = flags & openWrite;
    int oflags = O_CLOEXEC | (read && write ? O_RDWR : write ? O_WRONLY : O_RDONLY);
    if ((flags & openCreate) || (write && !read))
        oflags |= O_CREAT;
    if (flags & openTruncate) {
        // Some file systems would empty a file opened for reading only.
        if (!write)
            throw invalid_argument(format("emptying a file needs write access"), __FILE__, __LINE__,
                                   "base::fs::NativePlugin::open", string(path));
        oflags |= O_TRUNC;
    }
    if (!followLinks)
        oflags |= O_NOFOLLOW;

    string native = nativePath(path);
    int fd;
    do
        fd = ::open(native.c_str(), oflags, 0666);
    while (fd < 0 && errno == EINTR);
    if (fd < 0) {
        int error = errno;
        if (error == ENOENT || error == ENOTDIR || error == EISDIR)
            return {};
        throwApi("base::fs::NativePlugin::open", "open", path, error);
    }
    struct stat st;
    if (::fstat(fd, &st) == 0 && S_ISDIR(st.st_mode)) {
        ::close(fd);
        return {};
    }
    ::posix_fadvise(fd, 0, 0, POSIX_FADV_SEQUENTIAL);

    std::uint32_t caps = nativeCaps;
    if (read)
        caps |= capRead;
    if (write)
        caps |= capWrite | capResize;
    NativeStreamWorker* worker;
    try {
        worker = new NativeStreamWorker(path, fd, caps, flags, followLinks);
    } catch (...) {
        ::close(fd);
        throw;
    }
    return Stream(ref<StreamWorker>(worker), streamOpened);
}

ref<StreamWorker> NativeStreamWorker::reopen() {
    // Reopening must not empty the file this stream may have written.
    Stream again = openNative(m_name, m_openFlags & ~std::uint32_t(openTruncate), m_followLinks);
    return ref<StreamWorker>(again.worker());
}

bool statPath(std::string_view path, bool followLinks, struct stat& st) {
    string native = nativePath(path);
    return (followLinks ? ::stat(native.c_str(), &st) : ::lstat(native.c_str(), &st)) == 0;
}

class NativePlugin final : public IPlugin {
public:
    const PluginDesc& pluginDesc() const override { return nativeFileSystem(); }

    bool symLinksPermitted() const override { return m_followLinks; }
    void setSymLinksPermitted(bool permitted) override { m_followLinks = permitted; }

    bool exists(std::string_view path) override {
        struct stat st;
        return !path.empty() && statPath(path, m_followLinks, st) && !S_ISDIR(st.st_mode) &&
               !S_ISLNK(st.st_mode);
    }

    bool isFolder(std::string_view path) override {
        struct stat st;
        return !path.empty() && statPath(path, m_followLinks, st) && S_ISDIR(st.st_mode);
    }

    Stream open(std::string_view path, std::uint32_t flags) override {
        return openNative(path, flags, m_followLinks);
    }

    vector<string> findFiles(std::string_view folder, std::string_view pattern) override {
        return list(folder, pattern, false);
    }
    vector<string> findFolders(std::string_view folder, std::string_view pattern) override {
        return list(folder, pattern, true);
    }

    bool remove(std::string_view path) override { return ::remove(nativePath(path).c_str()) == 0; }

    bool rename(std::string_view from, std::string_view to) override {
        return ::rename(nativePath(from).c_str(), nativePath(to).c_str()) == 0;
    }

    bool copy(std::string_view from, std::string_view to) override {
        struct stat source, target;
        if (!statPath(from, true, source) || S_ISDIR(source.st_mode))
            return false;
        // Emptying the target first would destroy a source that is the same file.
        if (statPath(to, true, target) && target.st_dev == source.st_dev &&
            target.st_ino == source.st_ino)
            return false;
        Stream in = openNative(from, openRead, true);
        Stream out = openNative(to, openWrite | openCreate | openTruncate, true);
        if (!in || !out)
            return false;
        vector<char> buffer(std::size_t(1) << 16);
        while (std::uint64_t n = in.read(buffer.data(), buffer.size()))
            if (out.write(buffer.data(), n) != n)
                return false;
        return true;
    }

    bool touch(std::string_view path) override {
        string native = nativePath(path);
        if (::utimensat(AT_FDCWD, native.c_str(), nullptr, 0) == 0)
            return true;
        if (errno != ENOENT)
            return false;
        int fd = ::open(native.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0666);
        if (fd < 0)
            return false;
        ::close(fd);
        return true;
    }

    string readLink(std::string_view path) override {
        string native = nativePath(path);
        string target(256, '\0');
        for (;;) {
            ssize_t n = ::readlink(native.c_str(), target.data(), target.size());
            if (n < 0)
                return {};
            if (std::size_t(n) < target.size()) {
                target.resize(std::size_t(n));
                return target;
            }
            target.resize(target.size() * 2);
        }
    }

    bool mkdir(std::string_view path) override {
        string native = nativePath(path);
        for (std::size_t i = 1; i <= native.size(); ++i) {
            if (i < native.size() && native[i] != '/')
                continue;
            string part = native.substr(0, i);
            if (::mkdir(part.c_str(), 0777) != 0 && errno != EEXIST)
                return false;
        }
        return isFolder(path);
    }

    string curdir() override {
        char* dir = ::getcwd(nullptr, 0);
        if (!dir)
            return {};
        string result(dir);
        std::free(dir);
        return result;
    }

private:
    vector<string> list(std::string_view folder, std::string_view pattern, bool folders) {
        vector<string> names;
        string native = nativePath(folder.empty() ? std::string_view(".") : folder);
        DIR* dir = ::opendir(native.c_str());
        if (!dir)
            return names;
        string glob(pattern.empty() ? std::string_view("*") : pattern);
        while (dirent* entry = ::readdir(dir)) {
            std::string_view name(entry->d_name);
            if (name == "." || name == "..")
                continue;
            if (::fnmatch(glob.c_str(), entry->d_name, 0) != 0)
                continue;
            bool isDir = entry->d_type == DT_DIR;
            if (entry->d_type == DT_UNKNOWN || (entry->d_type == DT_LNK && m_followLinks)) {
                struct stat st;
                isDir = ::fstatat(::dirfd(dir), entry->d_name, &st, 0) == 0 && S_ISDIR(st.st_mode);
            }
            if (isDir == folders)
                names.emplace_back(name);
        }
        ::closedir(dir);
        std::sort(names.begin(), names.end());
        return names;
    }

    bool m_followLinks = true;
};

class NativeDesc final : public PluginDesc {
public:
    const char* name() const override { return "native"; }
    const char* description() const override { return "native file system"; }
    ref<IPlugin> create() const override { return ref<IPlugin>(new NativePlugin()); }
};

} // namespace

PluginDesc& nativeFileSystem() {
    static NativeDesc* desc = [] {
        auto* d = new NativeDesc();
        d->addRef();
        return d;
    }();
    return *desc;
}

} // namespace base::fs

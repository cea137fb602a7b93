// Zip archives on libzip, presented as folders: "car.zip/car/scene.gltf".
// The archive is read through the master file system, so an archive inside
// another one, or behind an alias, opens like any file. Archives read from
// native files stay open in a small cache while the file is unchanged, so the
// files a model refers to do not each re-read the central directory.
#include "b_fs_decoded.h"

#include "b_log.h"

#include <zip.h>

#include <algorithm>
#include <cstring>
#include <mutex>

#include <fnmatch.h>
#include <sys/stat.h>

namespace base::fs {

namespace {

constexpr const char* prefix = "zip fs| ";
constexpr std::size_t cacheSize = 8;

// One open archive. libzip's archive object is not thread-safe, so every call
// into it takes the archive's mutex.
class ZipArchive final : public RefCntAtomic, public AllocObject<> {
public:
    struct Entry {
        string name; // normalised, '/' separated
        zip_uint64_t index;
        zip_uint64_t size;
        bool encrypted;
        bool supported; // compression method
    };

    ZipArchive(string path, Stream source) : m_path(std::move(path)), m_source(std::move(source)) {
        zip_error_init(&m_sourceError);
        m_sourceSize = m_source.getSize();
        zip_error_t error;
        zip_error_init(&error);
        zip_source_t* src = zip_source_function_create(&ZipArchive::callback, this, &error);
        if (src)
            m_zip = zip_open_from_source(src, ZIP_RDONLY | ZIP_CHECKCONS, &error);
        if (!m_zip) {
            if (src)
                zip_source_free(src);
            const int code = zip_error_code_zip(&error);
            string message =
                code == ZIP_ER_NOZIP || code == ZIP_ER_INCONS
                    ? format("{}Can't find the central dir record of '{}'", prefix, m_path)
                    : format("{}Can't open '{}': {}", prefix, m_path, zip_error_strerror(&error));
            zip_error_fini(&error);
            archive::fail("base::fs::ZipPlugin::open", std::move(message));
        }
        zip_error_fini(&error);
        readEntries();
    }

    ~ZipArchive() override {
        if (m_zip)
            zip_discard(m_zip);
        zip_error_fini(&m_sourceError);
    }

    const string& path() const noexcept { return m_path; }
    std::mutex& mutex() noexcept { return m_mutex; }
    zip_t* zip() noexcept { return m_zip; }

    const Entry* find(std::string_view name) const {
        auto it = std::lower_bound(m_entries.begin(), m_entries.end(), name,
                                   [](const Entry& e, std::string_view n) { return e.name < n; });
        return it != m_entries.end() && it->name == name ? &*it : nullptr;
    }

    // Files (or folders) directly inside 'folder' ("" for the root).
    vector<string> list(std::string_view folder, std::string_view pattern, bool folders) const {
        vector<string> names;
        const string stem = folder.empty() ? string() : string(folder) + '/';
        const string glob(pattern.empty() ? std::string_view("*") : pattern);
        for (const Entry& e : m_entries) {
            if (e.name.compare(0, stem.size(), stem) != 0)
                continue;
            std::string_view rest = std::string_view(e.name).substr(stem.size());
            const std::size_t slash = rest.find('/');
            if (folders != (slash != std::string_view::npos))
                continue;
            const string name(rest.substr(0, slash));
            if (::fnmatch(glob.c_str(), name.c_str(), 0) == 0 &&
                (names.empty() || names.back() != name))
                names.push_back(name);
        }
        return names;
    }

    bool hasFolder(std::string_view folder) const {
        if (folder.empty())
            return true;
        const string stem = string(folder) + '/';
        auto it = std::lower_bound(m_entries.begin(), m_entries.end(), stem,
                                   [](const Entry& e, const string& n) { return e.name < n; });
        return it != m_entries.end() && it->name.compare(0, stem.size(), stem) == 0;
    }

private:
    void readEntries() {
        const zip_int64_t count = zip_get_num_entries(m_zip, 0);
        for (zip_int64_t i = 0; i < count; ++i) {
            zip_stat_t st;
            if (zip_stat_index(m_zip, zip_uint64_t(i), 0, &st) != 0 || !(st.valid & ZIP_STAT_NAME))
                continue;
            const std::string_view raw(st.name);
            if (raw.empty() || raw.back() == '/' || raw.back() == '\\')
                continue; // a folder entry
            std::optional<string> name = archive::normalise(raw);
            // Names that climb out, start at a root or name a drive are not
            // members anyone may address: listing them would invite writing
            // them outside the folder they are unpacked into.
            const bool rooted =
                raw.front() == '/' || raw.front() == '\\' || (raw.size() > 1 && raw[1] == ':');
            if (!name || name->empty() || rooted || climbs(raw)) {
                logFormatted(logIO, logWarning,
                             "{}Skipping the member '{}' of '{}': its path leaves the archive",
                             prefix, raw, m_path);
                continue;
            }
            m_entries.push_back(
                {std::move(*name), zip_uint64_t(i), (st.valid & ZIP_STAT_SIZE) ? st.size : 0,
                 (st.valid & ZIP_STAT_ENCRYPTION_METHOD) && st.encryption_method != ZIP_EM_NONE,
                 !(st.valid & ZIP_STAT_COMP_METHOD) ||
                     zip_compression_method_supported(st.comp_method, 0)});
        }
        // Sorted for lookups; of two entries with one name the first stays.
        std::stable_sort(m_entries.begin(), m_entries.end(),
                         [](const Entry& a, const Entry& b) { return a.name < b.name; });
        m_entries.erase(
            std::unique(m_entries.begin(), m_entries.end(),
                        [](const Entry& a, const Entry& b) { return a.name == b.name; }),
            m_entries.end());
    }

    static bool climbs(std::string_view raw) {
        while (!raw.empty()) {
            const std::size_t end = raw.find_first_of("/\\");
            if (raw.substr(0, end) == "..")
                return true;
            if (end == std::string_view::npos)
                break;
            raw.remove_prefix(end + 1);
        }
        return false;
    }

    // libzip reads the archive through this; no exception may cross it.
    static zip_int64_t callback(void* state, void* data, zip_uint64_t length,
                                zip_source_cmd_t command) {
        auto* self = static_cast<ZipArchive*>(state);
        try {
            switch (command) {
            case ZIP_SOURCE_OPEN:
                self->m_source.setPosition(0);
                return 0;
            case ZIP_SOURCE_READ:
                return zip_int64_t(self->m_source.read(data, length));
            case ZIP_SOURCE_CLOSE:
            case ZIP_SOURCE_FREE:
                return 0;
            case ZIP_SOURCE_STAT: {
                auto* st = static_cast<zip_stat_t*>(data);
                zip_stat_init(st);
                st->size = self->m_sourceSize;
                st->valid |= ZIP_STAT_SIZE;
                return sizeof(*st);
            }
            case ZIP_SOURCE_ERROR:
                return zip_error_to_data(&self->m_sourceError, data, length);
            case ZIP_SOURCE_SEEK: {
                const zip_int64_t to = zip_source_seek_compute_offset(
                    zip_uint64_t(self->m_source.getPosition()), self->m_sourceSize, data, length,
                    &self->m_sourceError);
                if (to < 0)
                    return -1;
                self->m_source.setPosition(to);
                return 0;
            }
            case ZIP_SOURCE_TELL:
                return zip_int64_t(self->m_source.getPosition());
            case ZIP_SOURCE_SUPPORTS:
                return zip_source_make_command_bitmap(
                    ZIP_SOURCE_OPEN, ZIP_SOURCE_READ, ZIP_SOURCE_CLOSE, ZIP_SOURCE_STAT,
                    ZIP_SOURCE_ERROR, ZIP_SOURCE_FREE, ZIP_SOURCE_SEEK, ZIP_SOURCE_TELL,
                    ZIP_SOURCE_SUPPORTS, -1);
            default:
                zip_error_set(&self->m_sourceError, ZIP_ER_OPNOTSUPP, 0);
                return -1;
            }
        } catch (const exception& e) {
            e.log(log());
        } catch (...) {
        }
        zip_error_set(&self->m_sourceError, ZIP_ER_READ, EIO);
        return -1;
    }

    string m_path;
    Stream m_source;
    std::uint64_t m_sourceSize = 0;
    zip_error_t m_sourceError;
    zip_t* m_zip = nullptr;
    std::mutex m_mutex;
    vector<Entry> m_entries;
};

class ZipMemberDecoder final : public archive::Decoder {
public:
    ZipMemberDecoder(ref<ZipArchive> archive, const ZipArchive::Entry& entry, std::string_view path)
        : m_archive(std::move(archive)), m_index(entry.index), m_size(entry.size), m_path(path) {}
    ~ZipMemberDecoder() override { closeFile(); }

    void restart() override { closeFile(); }

    std::uint64_t decode(std::uint8_t* out, std::uint64_t bytes) override {
        std::lock_guard<std::mutex> lock(m_archive->mutex());
        if (!m_file) {
            m_file = zip_fopen_index(m_archive->zip(), m_index, 0);
            if (!m_file)
                archive::failCorrupt(prefix, m_path, zip_strerror(m_archive->zip()));
        }
        const zip_int64_t n = zip_fread(m_file, out, bytes);
        if (n < 0)
            archive::failCorrupt(prefix, m_path, zip_file_strerror(m_file));
        return std::uint64_t(n);
    }

    std::optional<std::uint64_t> declaredSize() const override { return m_size; }

private:
    void closeFile() {
        if (!m_file)
            return;
        std::lock_guard<std::mutex> lock(m_archive->mutex());
        zip_fclose(m_file);
        m_file = nullptr;
    }

    ref<ZipArchive> m_archive;
    zip_uint64_t m_index;
    std::uint64_t m_size;
    string m_path;
    zip_file_t* m_file = nullptr;
};

// Where a path meets an archive: the archive's path and the member's path
// inside it ("" for the archive itself; nullopt when it climbs out).
struct Located {
    string archive;
    std::optional<string> member;
};

class ZipPlugin final : public IPlugin {
public:
    const PluginDesc& pluginDesc() const override { return zipFileSystem(); }
    bool isArchive() const override { return true; }

    bool exists(std::string_view path) override {
        archive::NestingGuard guard;
        if (guard.tooDeep())
            return false;
        std::optional<Located> at = locate(path, false);
        if (!at || !at->member)
            return false;
        try {
            return archiveAt(at->archive)->find(*at->member) != nullptr;
        } catch (const exception&) {
            // The path is this archive's, which cannot be read: open() says why.
            return true;
        }
    }

    bool isFolder(std::string_view path) override {
        archive::NestingGuard guard;
        if (guard.tooDeep())
            return false;
        std::optional<Located> at = locate(path, true);
        return at && at->member && archiveAt(at->archive)->hasFolder(*at->member);
    }

    Stream open(std::string_view path, std::uint32_t flags) override {
        archive::NestingGuard guard;
        if (guard.tooDeep() || archivesOnTheWay(path) > archiveMaxNesting) {
            if (archivesOnTheWay(path) == 0)
                return {};
            archive::fail("base::fs::ZipPlugin::open",
                          format("{}Archives are nested too deeply in '{}'", prefix, path));
        }
        std::optional<Located> at = locate(path, false);
        if (!at)
            return {};
        archive::refuseWrite(flags, prefix, path);
        if (!at->member)
            notFound(path);
        ref<ZipArchive> zip = archiveAt(at->archive);
        const ZipArchive::Entry* entry = zip->find(*at->member);
        if (!entry)
            notFound(path);
        if (entry->encrypted)
            archive::fail("base::fs::ZipPlugin::open",
                          format("{}Unsupported encryption in '{}'", prefix, path));
        if (!entry->supported)
            archive::fail("base::fs::ZipPlugin::open",
                          format("{}Unsupported compression for '{}'", prefix, path));
        archive::DecoderPtr decoder(new ZipMemberDecoder(zip, *entry, path));
        return Stream(archive::decodedStream(path, std::move(decoder), prefix), streamOpened);
    }

    vector<string> findFiles(std::string_view folder, std::string_view pattern) override {
        return listing(folder, pattern, false);
    }
    vector<string> findFolders(std::string_view folder, std::string_view pattern) override {
        return listing(folder, pattern, true);
    }

private:
    [[noreturn]] static void notFound(std::string_view path) {
        throw file_not_found(format("{}'{}' path not found!", prefix, path), __FILE__, __LINE__,
                             "base::fs::ZipPlugin::open");
    }

    vector<string> listing(std::string_view folder, std::string_view pattern, bool folders) {
        archive::NestingGuard guard;
        if (guard.tooDeep())
            return {};
        std::optional<Located> at = locate(folder, true);
        if (!at || !at->member)
            return {};
        return archiveAt(at->archive)->list(*at->member, pattern, folders);
    }

    // The innermost archive the path goes through, tried from the right so
    // that "a.zip/b.zip/c.obj" finds "b.zip" inside "a.zip". With 'whole',
    // the path may name the archive itself.
    std::optional<Located> locate(std::string_view path, bool whole) {
        if (path.find('\0') != std::string_view::npos || archivesOnTheWay(path) > archiveMaxNesting)
            return std::nullopt;
        std::size_t end = whole ? path.size() : path.find_last_of("/\\");
        while (end != std::string_view::npos && end > 0) {
            const std::string_view archivePath = path.substr(0, end);
            if (isArchiveName(archivePath) && master().exists(archivePath)) {
                const std::string_view rest =
                    end < path.size() ? path.substr(end + 1) : std::string_view();
                return Located{string(archivePath), archive::normalise(rest)};
            }
            end = path.find_last_of("/\\", end - 1);
        }
        return std::nullopt;
    }

    // The archive at 'path', from the cache when its native file is unchanged.
    ref<ZipArchive> archiveAt(const string& path) {
        struct stat st {};
        string native(path);
        std::replace(native.begin(), native.end(), '\\', '/');
        const bool cacheable = ::stat(native.c_str(), &st) == 0 && S_ISREG(st.st_mode);
        if (cacheable) {
            std::lock_guard<std::mutex> lock(m_cacheMutex);
            for (auto it = m_cache.begin(); it != m_cache.end(); ++it) {
                if (it->archive->path() != path)
                    continue;
                if (sameFile(it->stamp, st)) {
                    std::rotate(it, it + 1, m_cache.end()); // most recent last
                    return m_cache.back().archive;
                }
                m_cache.erase(it);
                break;
            }
        }
        // Opened outside the lock: an archive inside an archive comes back here.
        ref<ZipArchive> zip(new ZipArchive(path, master().open(path, openRead | openShareRead)));
        logFormatted(logIO, logInfo, "{}'{}' added to the file system.", prefix, path);
        if (cacheable) {
            std::lock_guard<std::mutex> lock(m_cacheMutex);
            if (m_cache.size() == cacheSize)
                m_cache.erase(m_cache.begin());
            m_cache.push_back({zip, st});
        }
        return zip;
    }

    static bool sameFile(const struct stat& a, const struct stat& b) {
        return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_size == b.st_size &&
               a.st_mtim.tv_sec == b.st_mtim.tv_sec && a.st_mtim.tv_nsec == b.st_mtim.tv_nsec;
    }

    struct Cached {
        ref<ZipArchive> archive;
        struct stat stamp;
    };
    std::mutex m_cacheMutex;
    vector<Cached> m_cache;
};

class ZipDesc final : public PluginDesc {
public:
    const char* name() const override { return "zip"; }
    const char* description() const override { return "zip archives"; }
    const char* extensions() const override { return "zip;jar;war;pk3"; }
    ref<IPlugin> create() const override { return ref<IPlugin>(new ZipPlugin()); }
};

} // namespace

PluginDesc& zipFileSystem() {
    static ZipDesc* desc = [] {
        auto* d = new ZipDesc();
        d->addRef();
        return d;
    }();
    return *desc;
}

} // namespace base::fs

// Archive file systems: models travel zipped with their textures or as single
// compressed files, and are read without unpacking by hand.
//
// Addressing: a member of an archive is the archive's path followed by the
// member's path, as if the archive were a folder ("models/car.zip/car/a.gltf",
// either separator). A single compressed file presents its content as the file
// without the compression suffix: "scan.ply" opens the content of "scan.ply.gz"
// when no plain "scan.ply" is found first. Archives may hold archives, up to
// archiveMaxNesting in one path.
//
// Members are read-only: opening one for writing throws, a write answers 0
// bytes, and the changing operations are not offered.
//
// Seeking: a member whose size is unknown or at most archiveStreamThreshold is
// extracted into memory on first use, so seeks and the size are free. A larger
// member whose container declares its size is decoded as it is read, and a
// backward seek decodes again from the start. No member may grow past
// archiveMemoryLimit() bytes: a larger one is refused with a clear error, which
// bounds what a decompression bomb can make anyone allocate.
#pragma once

#include "stream/b_fs.h"

#include <cstdint>
#include <string_view>

namespace base::fs {

inline constexpr std::uint32_t archiveMaxNesting = 4;
inline constexpr std::uint64_t archiveStreamThreshold = std::uint64_t(64) << 20;

// The largest member content the archive file systems produce (4 GiB unless set).
std::uint64_t archiveMemoryLimit() noexcept;
void setArchiveMemoryLimit(std::uint64_t bytes) noexcept;

// The descriptors: "zip", "gzip", "lz4", "lzma", "zst".
PluginDesc& zipFileSystem();
PluginDesc& gzipFileSystem();
PluginDesc& lz4FileSystem();
PluginDesc& lzmaFileSystem();
PluginDesc& zstFileSystem();

// Registers the archive kinds with 'master' and attaches them after what is
// attached already (the native file system first, so plain files win).
void attachArchiveFileSystems(MasterFS& master);

// The name under which the content of a single compressed file is read:
// "dir/scan.ply.gz" gives "dir/scan.ply"; other paths come back unchanged.
string innerName(std::string_view path);

// Whether the extension of the path's last component is one of 'list'
// ("zip;jar"), in any case.
bool hasExtensionIn(std::string_view path, std::string_view list);

// Whether the path's last component names a zip-like archive (by extension).
bool isArchiveName(std::string_view path);

// How many folders of the path are, by their names, archives or compressed
// files ("a.zip/b.zip.gz/c.obj": 2).
std::uint32_t archivesOnTheWay(std::string_view path);

// The paths of every file inside 'folder' and its subfolders, through the
// master file system, sorted; for an archive path, all its members.
vector<string> listFilesBelow(std::string_view folder);

} // namespace base::fs

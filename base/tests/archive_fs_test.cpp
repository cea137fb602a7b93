// The archive file systems behind the master file system, over archives built
// in a temporary folder: addressing, reading and seeking, listings, and the
// bad inputs they must refuse cleanly.
#include "archive_maker.h"

#include "b_exception.h"
#include "b_log.h"
#include "b_memory.h"
#include "stream/b_fs_archive.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <random>
#include <string>

using namespace base;
using archive_maker::Bytes;
namespace stdfs = std::filesystem;

namespace {

Bytes sampleBytes(std::size_t size, unsigned seed = 7) {
    // Compressible but not trivial: short random runs of a small alphabet.
    std::mt19937 random(seed);
    Bytes bytes(size);
    for (std::size_t i = 0; i < size;) {
        const std::uint8_t value = std::uint8_t('a' + random() % 16);
        for (std::size_t n = 1 + random() % 8; n-- && i < size;)
            bytes[i++] = value;
    }
    return bytes;
}

std::string str(std::string_view text) {
    return std::string(text);
}

Bytes readAll(Stream& s) {
    Bytes out(std::size_t(s.getSize()));
    out.resize(std::size_t(s.read(out.data(), out.size())));
    return out;
}

// The message of what opening and reading the whole path throws, or "".
std::string failureOf(const std::string& path) {
    try {
        Stream s = fs::master().open(path, fs::openRead);
        readAll(s);
        return {};
    } catch (const exception& e) {
        return std::string(e.message());
    }
}

class ArchiveFS : public ::testing::Test {
protected:
    void SetUp() override {
        std::string pattern = (stdfs::temp_directory_path() / "archive_test_XXXXXX").string();
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        m_dir = pattern;
    }
    void TearDown() override {
        fs::setArchiveMemoryLimit(std::uint64_t(4) << 30);
        std::error_code ignored;
        stdfs::remove_all(m_dir, ignored);
    }
    std::string path(const std::string& name) const { return m_dir + "/" + name; }

    std::string m_dir;
};

TEST_F(ArchiveFS, SingleCompressedFilesReadSeekAndRefuseWrites) {
    const Bytes content = sampleBytes(300000);
    for (const char* ext : {"gz", "lz4", "lzma", "zst"}) {
        SCOPED_TRACE(ext);
        const std::string inner = path(std::string("scan_") + ext + ".ply");
        archive_maker::writeFile(inner + "." + ext, archive_maker::compress(ext, content));
        EXPECT_EQ(str(fs::innerName(inner + "." + ext)), inner);
        EXPECT_TRUE(fs::master().exists(inner));
        EXPECT_FALSE(fs::master().exists(inner + ".missing"));

        Stream s = fs::master().open(inner, fs::openRead);
        EXPECT_EQ(s.caps() & capWrite, 0u);
        EXPECT_EQ(s.getSize(), content.size());
        EXPECT_EQ(readAll(s), content);
        // Backwards, from the end and past the end.
        std::uint8_t byte = 0;
        EXPECT_EQ(s.setPosition(1000), 1000u);
        ASSERT_EQ(s.read(&byte, 1), 1u);
        EXPECT_EQ(byte, content[1000]);
        EXPECT_EQ(s.setPosition(-1, seekEnd), content.size() - 1);
        ASSERT_EQ(s.read(&byte, 1), 1u);
        EXPECT_EQ(byte, content.back());
        EXPECT_EQ(s.setPosition(10, seekEnd), content.size());
        EXPECT_EQ(s.read(&byte, 1), 0u);
        EXPECT_EQ(s.write("x", 1), 0u);

        EXPECT_THROW(fs::master().open(inner, fs::openRead | fs::openWrite), exception);
    }
    // A plain file of the inner name is found first.
    archive_maker::writeFile(path("scan_gz.ply"), archive_maker::textBytes("plain"));
    Stream s = fs::master().open(path("scan_gz.ply"), fs::openRead);
    EXPECT_EQ(readAll(s), archive_maker::textBytes("plain"));
    EXPECT_EQ(str(fs::innerName("dir/.gz")), "dir/.gz");
    EXPECT_EQ(str(fs::innerName("model.obj")), "model.obj");
}

TEST_F(ArchiveFS, ZipMembersAreAddressedAsFilesOfAFolder) {
    const Bytes big = sampleBytes(200000);
    archive_maker::writeZip(path("car.zip"), {{"car/scene.gltf", archive_maker::textBytes("gltf")},
                                              {"car/tex/a.png", big, true},
                                              {"readme.txt", archive_maker::textBytes("hi")}});
    CaptureLog capture;
    ScopedLog scoped(capture);
    const std::string zip = path("car.zip");
    for (const std::string& p :
         {zip + "/car/scene.gltf", zip + "\\car\\scene.gltf", zip + "/car/./tex/../scene.gltf"}) {
        SCOPED_TRACE(p);
        EXPECT_TRUE(fs::master().exists(p));
        Stream s = fs::master().open(p, fs::openRead | fs::openShareRead);
        EXPECT_EQ(readAll(s), archive_maker::textBytes("gltf"));
    }
    Stream stored = fs::master().open(zip + "/car/tex/a.png", fs::openRead);
    EXPECT_EQ(readAll(stored), big);
    // Two members read in turn through one cached archive.
    Stream a = fs::master().open(zip + "/car/tex/a.png", fs::openRead);
    Stream b = fs::master().open(zip + "/readme.txt", fs::openRead);
    Bytes half(100);
    ASSERT_EQ(a.read(half.data(), 100), 100u);
    EXPECT_EQ(readAll(b), archive_maker::textBytes("hi"));
    ASSERT_EQ(a.read(half.data(), 100), 100u);
    EXPECT_TRUE(std::equal(half.begin(), half.end(), big.begin() + 100));
    EXPECT_EQ(capture.count("zip fs| '" + zip + "' added to the file system."), 1u);

    EXPECT_TRUE(fs::master().isFolder(zip));
    EXPECT_TRUE(fs::master().isFolder(zip + "/car"));
    EXPECT_FALSE(fs::master().isFolder(zip + "/nothing"));
    EXPECT_EQ(fs::master().findFiles(zip, "*"), (vector<string>{"readme.txt"}));
    EXPECT_EQ(fs::master().findFolders(zip + "/car", "*"), (vector<string>{"tex"}));
    EXPECT_EQ(fs::listFilesBelow(zip),
              (vector<string>{string(zip) + "/car/scene.gltf", string(zip) + "/car/tex/a.png",
                              string(zip) + "/readme.txt"}));

    try {
        fs::master().open(zip + "/car/missing.bin", fs::openRead);
        FAIL() << "opened a missing member";
    } catch (const fs::file_not_found& e) {
        EXPECT_EQ(str(e.message()), "zip fs| '" + zip + "/car/missing.bin' path not found!");
    }
    EXPECT_THROW(fs::master().open(zip + "/readme.txt", fs::openWrite), exception);
    EXPECT_FALSE(fs::master().remove(zip + "/readme.txt"));
}

TEST_F(ArchiveFS, ArchivesInsideArchivesAndCompressedArchives) {
    const std::string inner = path("inner.zip");
    archive_maker::writeZip(inner, {{"m.obj", archive_maker::textBytes("o")}});
    archive_maker::writeZip(path("outer.zip"), {{"in/inner.zip", archive_maker::readFile(inner)}});
    archive_maker::writeFile(path("packed.zip.gz"),
                             archive_maker::gzip(archive_maker::readFile(inner)));
    archive_maker::writeZip(path("gz.zip"),
                            {{"a.ply.zst", archive_maker::zstd(archive_maker::textBytes("ply"))}});
    for (auto [p, want] :
         {std::pair{path("outer.zip/in/inner.zip/m.obj"), "o"},
          std::pair{path("packed.zip/m.obj"), "o"}, std::pair{path("gz.zip/a.ply"), "ply"}}) {
        SCOPED_TRACE(p);
        Stream s = fs::master().open(p, fs::openRead);
        EXPECT_EQ(readAll(s), archive_maker::textBytes(want));
    }
}

TEST_F(ArchiveFS, LargeMembersStreamAndSeekBackByDecodingAgain) {
    Bytes large = sampleBytes(std::size_t(fs::archiveStreamThreshold) + 4096, 3);
    // Stored: deflating 64 MiB would take most of the test's time.
    archive_maker::writeZip(path("large.zip"), {{"big.bin", large, true}});
    resetHeapPeak();
    const std::size_t before = heapStats().liveBytes;
    Stream s = fs::master().open(path("large.zip/big.bin"), fs::openRead);
    EXPECT_EQ(s.getSize(), large.size());
    Bytes piece(4096);
    EXPECT_EQ(s.setPosition(std::int64_t(large.size() - piece.size())),
              large.size() - piece.size());
    ASSERT_EQ(s.read(piece.data(), piece.size()), piece.size());
    EXPECT_TRUE(std::equal(piece.begin(), piece.end(), large.end() - 4096));
    EXPECT_EQ(s.setPosition(5), 5u);
    ASSERT_EQ(s.read(piece.data(), piece.size()), piece.size());
    EXPECT_TRUE(std::equal(piece.begin(), piece.end(), large.begin() + 5));
    // Decoded as it is read: never a buffer of the member's size.
    EXPECT_LT(heapStats().peakBytes - before, std::size_t(8) << 20);
}

// Writes a bad input into the folder and answers the path to open.
struct BadInput {
    const char* name;
    std::function<std::string(const std::string& dir)> make;
    const char* message; // a part of the expected failure; "" for not found
};

std::string corrupt(const std::string& dir, const char* ext, std::function<void(Bytes&)> damage) {
    Bytes packed = archive_maker::compress(ext, sampleBytes(100000));
    damage(packed);
    archive_maker::writeFile(dir + "/d." + ext, packed);
    return dir + "/d";
}

void halve(Bytes& b) {
    b.erase(b.begin() + std::ptrdiff_t(b.size() / 2), b.end());
}

std::string zipWith(const std::string& dir, std::vector<archive_maker::Member> members,
                    std::function<void(Bytes&)> damage = {}) {
    archive_maker::writeZip(dir + "/bad.zip", members);
    if (damage) {
        Bytes bytes = archive_maker::readFile(dir + "/bad.zip");
        damage(bytes);
        archive_maker::writeFile(dir + "/bad.zip", bytes);
    }
    return dir + "/bad.zip/" + members.front().name;
}

// The central directory entry of the first member (signature PK\1\2).
std::size_t centralEntry(const Bytes& zip) {
    for (std::size_t i = zip.size() - 4; i-- > 0;)
        if (zip[i] == 'P' && zip[i + 1] == 'K' && zip[i + 2] == 1 && zip[i + 3] == 2)
            return i;
    return 0;
}

const BadInput badInputs[] = {
    {"TruncatedGzip", [](auto& d) { return corrupt(d, "gz", halve); }, "gzip fs| '"},
    {"TruncatedLz4", [](auto& d) { return corrupt(d, "lz4", halve); }, "is truncated"},
    {"TruncatedLzma", [](auto& d) { return corrupt(d, "lzma", halve); }, "lzma fs| '"},
    {"TruncatedZst", [](auto& d) { return corrupt(d, "zst", halve); }, "is truncated"},
    {"GzipBadCrc", [](auto& d) { return corrupt(d, "gz", [](Bytes& b) { b[b.size() - 6] ^= 1; }); },
     "is corrupt"},
    {"Lz4BadChecksum",
     [](auto& d) { return corrupt(d, "lz4", [](Bytes& b) { b[b.size() - 2] ^= 1; }); },
     "is corrupt"},
    {"NotGzip", [](auto& d) { return corrupt(d, "gz", [](Bytes& b) { b[0] = 'X'; }); },
     "gzip fs| Can't open file!"},
    {"ZipTruncatedCentralDirectory",
     [](auto& d) {
         return zipWith(d, {{"a.obj", sampleBytes(5000)}},
                        [](Bytes& b) { b.erase(b.end() - 30, b.end()); });
     },
     "zip fs| Can't find the central dir record of '"},
    {"ZipBadCrc",
     [](auto& d) {
         return zipWith(d, {{"a.obj", sampleBytes(5000), true}}, [](Bytes& b) { b[100] ^= 0x55; });
     },
     "zip fs| '"},
    {"ZipMemberLiesAboutItsSize",
     [](auto& d) {
         // Uncompressed size: +22 in the local header, +24 in the central one.
         return zipWith(d, {{"a.obj", sampleBytes(5000)}}, [](Bytes& b) {
             for (std::size_t at : {std::size_t(22), centralEntry(b) + 24}) {
                 b[at] = 0x10;
                 b[at + 1] = 0;
             }
         });
     },
     "zip fs| '"},
    {"ZipEncrypted",
     [](auto& d) {
         return zipWith(d, {{"a.obj", sampleBytes(500), false, "secret"}});
     },
     "zip fs| Unsupported encryption in '"},
    {"ZipMemberClimbsOut",
     [](auto& d) {
         return zipWith(d, {{"../evil.obj", archive_maker::textBytes("x")}});
     },
     ""},
    {"ZipMemberIsAbsolute",
     [](auto& d) {
         return zipWith(d, {{"/etc/evil.obj", archive_maker::textBytes("x")}});
     },
     ""},
    {"PathClimbsOutOfTheArchive",
     [](auto& d) {
         zipWith(d, {{"a.obj", archive_maker::textBytes("x")}});
         archive_maker::writeFile(d + "/outside.obj", archive_maker::textBytes("secret"));
         return d + "/bad.zip/../outside.obj";
     },
     ""},
    {"PathHoldsNul",
     [](auto& d) {
         zipWith(d, {{"a.obj", archive_maker::textBytes("x")}});
         return d + "/bad.zip/a.obj" + std::string(1, '\0') + "x";
     },
     ""},
    {"NestedTenDeep",
     [](auto& d) {
         Bytes level = archive_maker::textBytes("deep");
         std::string name = "m.obj", inside = name;
         for (int i = 0; i < 10; ++i) {
             archive_maker::writeZip(d + "/level.zip", {{name, level}});
             level = archive_maker::readFile(d + "/level.zip");
             name = "l" + std::to_string(i) + ".zip";
             inside = name + "/" + inside;
         }
         stdfs::rename(d + "/level.zip", d + "/top.zip");
         return d + "/top.zip/" + inside.substr(inside.find('/') + 1);
     },
     "zip fs| Archives are nested too deeply in '"},
};

void PrintTo(const BadInput& input, std::ostream* out) {
    *out << input.name;
}

class ArchiveBadInput : public ArchiveFS, public ::testing::WithParamInterface<BadInput> {};

TEST_P(ArchiveBadInput, FailsWithAClearError) {
    CaptureLog capture;
    ScopedLog scoped(capture);
    const std::string target = GetParam().make(m_dir);
    const std::string message = failureOf(target);
    if (*GetParam().message) {
        EXPECT_NE(message.find(GetParam().message), std::string::npos) << message;
    } else {
        EXPECT_FALSE(fs::master().exists(target));
        EXPECT_TRUE(message.empty() || message.find("not found") != std::string::npos) << message;
        EXPECT_FALSE(message.empty());
    }
}

INSTANTIATE_TEST_SUITE_P(Archives, ArchiveBadInput, ::testing::ValuesIn(badInputs),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(ArchiveFS, DecompressionBombsStopAtTheMemoryLimit) {
    const Bytes zeros(std::size_t(48) << 20, 0);
    archive_maker::writeZip(path("bomb.zip"), {{"bomb.ply", zeros}});
    archive_maker::writeFile(path("bomb.ply.gz"), archive_maker::gzip(zeros));
    archive_maker::writeFile(path("bomb.ply.zst"), archive_maker::zstd(zeros));
    stdfs::create_directory(path("z"));
    stdfs::rename(path("bomb.ply.zst"), path("z/bomb.ply.zst"));
    fs::setArchiveMemoryLimit(std::uint64_t(8) << 20);
    resetHeapPeak();
    const std::size_t before = heapStats().liveBytes;
    for (const std::string& p : {path("bomb.zip/bomb.ply"), path("bomb.ply"), path("z/bomb.ply")}) {
        SCOPED_TRACE(p);
        EXPECT_NE(failureOf(p).find("expands to more than the memory limit of 8388608 bytes"),
                  std::string::npos)
            << failureOf(p);
    }
    EXPECT_LT(heapStats().peakBytes - before, std::size_t(10) << 20);
}

} // namespace

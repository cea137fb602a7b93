// Models read straight out of archives and compressed files: the scene must
// come out as from the unpacked files (paths apart), and bad archives must
// fail the import with their clear message.
#include "archive_maker.h"

#include "child_run.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;
namespace am = archive_maker;

const fs::path corpus = "/usr/share/assimp/models";

using ImportRun = hosttest::CommandRun;

ImportRun importModel(const fs::path& model, const fs::path& errFile,
                      const std::string& switches = {}) {
    const std::string command = "'" SCENE_IMPORT_EXE "' " + switches + " '" + model.string() +
                                "' -o - 2>'" + errFile.string() + "' </dev/null";
    return hosttest::runCommand(command, errFile);
}

std::string replaced(std::string text, const std::string& from, const std::string& to) {
    for (std::size_t at = 0; (at = text.find(from, at)) != std::string::npos; at += to.size())
        text.replace(at, from.size(), to);
    return text;
}

class ArchiveImport : public ::testing::Test {
protected:
    void SetUp() override {
        const std::string test = ::testing::UnitTest::GetInstance()->current_test_info()->name();
        m_dir = fs::temp_directory_path() /
                ("archive_import_" + std::to_string(::getpid()) + "_" + test);
        fs::remove_all(m_dir);
        fs::create_directories(m_dir / "plain");
    }
    void TearDown() override { fs::remove_all(m_dir); }

    // Copies corpus files into plain/<folder> and answers them as zip members.
    std::vector<am::Member> unpacked(const std::string& folder, const fs::path& from,
                                     const std::vector<std::string>& names) {
        std::vector<am::Member> members;
        fs::create_directories(m_dir / "plain" / folder);
        for (const std::string& name : names) {
            fs::copy_file(from / name, m_dir / "plain" / folder / name);
            members.push_back({folder + "/" + name, am::readFile((from / name).string())});
        }
        return members;
    }

    // Imports both and compares the documents with the folders made equal.
    void expectSameScene(const fs::path& plainModel, const fs::path& packedModel,
                         const std::string& plainFolder, const std::string& packedFolder) {
        const ImportRun plain = importModel(plainModel, m_dir / "plain.err");
        const ImportRun packed = importModel(packedModel, m_dir / "packed.err");
        ASSERT_EQ(plain.code, 0) << plain.err;
        ASSERT_EQ(packed.code, 0) << packed.err;
        ASSERT_GT(plain.out.size(), 100u);
        EXPECT_EQ(replaced(packed.out, packedFolder, "<folder>"),
                  replaced(plain.out, plainFolder, "<folder>"));
    }

    fs::path m_dir;
};

TEST_F(ArchiveImport, ZippedModelsWithTheirSideFilesMatchTheUnpackedOnes) {
    struct Case {
        const char* folder;
        fs::path from;
        std::vector<std::string> files;
    };
    const Case cases[] = {
        {"box",
         corpus / "glTF2/BoxTextured-glTF",
         {"BoxTextured.gltf", "BoxTextured0.bin", "CesiumLogoFlat.png"}},
        {"spider", corpus / "OBJ", {"spider.obj", "spider.mtl", "SpiderTex.jpg"}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.folder);
        const std::vector<am::Member> members = unpacked(c.folder, c.from, c.files);
        const fs::path zip = m_dir / (std::string(c.folder) + ".zip");
        am::writeZip(zip.string(), members);
        const std::string plainFolder = (m_dir / "plain").string() + "/" + c.folder;
        const std::string packedFolder = zip.string() + "/" + c.folder;
        expectSameScene(plainFolder + "/" + c.files[0], packedFolder + "/" + c.files[0],
                        plainFolder, packedFolder);
        // The archive alone: its one model is imported.
        const ImportRun whole = importModel(zip, m_dir / "whole.err");
        EXPECT_EQ(whole.code, 0) << whole.err;
        EXPECT_EQ(replaced(whole.out, zip.string(), "<zip>").size() > 100, true);
    }
}

TEST_F(ArchiveImport, CompressedPlyMatchesThePlainOne) {
    fs::copy_file(corpus / "PLY/Wuson.ply", m_dir / "plain/Wuson.ply");
    const am::Bytes ply = am::readFile((corpus / "PLY/Wuson.ply").string());
    for (const char* ext : {"gz", "lz4", "lzma", "zst"}) {
        SCOPED_TRACE(ext);
        const fs::path folder = m_dir / ext;
        fs::create_directories(folder);
        am::writeFile((folder / ("Wuson.ply." + std::string(ext))).string(),
                      am::compress(ext, ply));
        expectSameScene(m_dir / "plain/Wuson.ply", folder / ("Wuson.ply." + std::string(ext)),
                        (m_dir / "plain").string(), folder.string());
    }
}

TEST_F(ArchiveImport, ArchivesThatCannotBeImported) {
    const am::Bytes obj = am::readFile((corpus / "OBJ/box.obj").string());
    am::writeZip((m_dir / "two.zip").string(), {{"a/box.obj", obj}, {"b/box.obj", obj}});
    am::writeZip((m_dir / "locked.zip").string(), {{"box.obj", obj, false, "secret"}});
    am::writeZip((m_dir / "cut.zip").string(), {{"box.obj", obj}});
    am::Bytes cut = am::readFile((m_dir / "cut.zip").string());
    cut.erase(cut.end() - 10, cut.end());
    am::writeFile((m_dir / "cut.zip").string(), cut);
    struct Case {
        const char* model;
        const char* message;
    };
    const Case cases[] = {
        {"two.zip", "holds 2 models; name one of them:"},
        {"locked.zip/box.obj", "zip fs| Unsupported encryption in '"},
        {"locked.zip", "zip fs| Unsupported encryption in '"},
        {"cut.zip/box.obj", "zip fs| Can't find the central dir record of '"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.model);
        const ImportRun run = importModel(m_dir / c.model, m_dir / "err");
        EXPECT_NE(run.code, 0);
        EXPECT_NE(run.err.find(c.message), std::string::npos) << run.err;
    }
    const ImportRun chosen = importModel(m_dir / "two.zip/b/box.obj", m_dir / "err");
    EXPECT_EQ(chosen.code, 0) << chosen.err;

    // Content beyond --max-memory is refused while it is decoded (in-process
    // here: the address-space cap of an isolated child does not mix with the
    // sanitizers' shadow memory).
    am::writeFile((m_dir / "bomb.ply.gz").string(),
                  am::gzip(am::Bytes(std::size_t(20) << 20, std::uint8_t(0))));
    const ImportRun bomb =
        importModel(m_dir / "bomb.ply.gz", m_dir / "err", "--no-isolation --max-memory 16");
    EXPECT_EQ(bomb.code, 1);
    EXPECT_NE(bomb.err.find("expands to more than the memory limit of 16777216 bytes"),
              std::string::npos)
        << bomb.err;
}

} // namespace

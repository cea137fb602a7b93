// scene-import --extract-textures: the images a model carries come out as
// files, raw texels as PNG, each image once.
#include "b_plugin_attribute.h"
#include "scene_interfaces.h"
#include "scene_schema.h"
#include "texture_extract.h"

#include <gtest/gtest.h>
#include <png.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>

namespace {

namespace fs = std::filesystem;
namespace names = scene::names;
using PluginRef = base::ref<base::IPlugin>;

std::string readFile(const fs::path& path) {
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

// The texels of a PNG file in b, g, r, a order, or nothing when it does not read.
std::vector<std::uint8_t> readPng(const fs::path& path, std::uint32_t& width,
                                  std::uint32_t& height) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    if (!png_image_begin_read_from_file(&image, path.c_str()))
        return {};
    image.format = PNG_FORMAT_BGRA;
    std::vector<std::uint8_t> texels(PNG_IMAGE_SIZE(image));
    if (!png_image_finish_read(&image, nullptr, texels.data(), 0, nullptr))
        texels.clear();
    width = image.width;
    height = image.height;
    png_image_free(&image);
    return texels;
}

class ExtractTextures : public testing::Test {
protected:
    void SetUp() override {
        folder = fs::path(testing::TempDir()) /
                 ("extract_" + std::to_string(::getpid()) + "_" +
                  testing::UnitTest::GetInstance()->current_test_info()->name());
        scene::register_scene_schema(*factory);
    }
    void TearDown() override { fs::remove_all(folder); }

    // A buffer with 'bytes' and an adapter presenting them.
    scene::IBufferAdapter& adapterOver(const std::vector<std::uint8_t>& bytes) {
        PluginRef buffer = factory->create(names::buffer, 1);
        buffer->vecAttribute<std::uint8_t>(names::data)->items().assign(bytes.begin(), bytes.end());
        PluginRef adapter = factory->create(names::bufferAdapter, 1);
        adapter->setAttribute(names::inputBuffer, buffer);
        adapter->vecAttribute<std::uint8_t>(names::outputUint8);
        auto& typed = dynamic_cast<scene::IBufferAdapter&>(*adapter);
        typed.update();
        return typed;
    }
    // A texture of 'type' named 'name' that reads the adapter's bytes under 'member'.
    PluginRef texture(base::name_id type, const char* name, base::name_id member,
                      scene::IBufferAdapter& adapter) {
        PluginRef t = factory->create(type, 1);
        t->setAttribute<base::string>(names::name, name);
        base::AttribPath path;
        path.addPlugin(&adapter).addMember(names::outputUint8);
        t->attribute(member, new base::AttribLink(path));
        return t;
    }

    fs::path folder;
    base::ref<base::PluginFactory> factory{new base::PluginFactory("extract")};
};

TEST_F(ExtractTextures, EachImageOnceRawAsPngCompressedAsItCame) {
    std::vector<std::uint8_t> texels(3 * 2 * 4);
    for (std::size_t i = 0; i < texels.size(); ++i)
        texels[i] = std::uint8_t(i * 11);
    scene::IBufferAdapter& raw = adapterOver(texels);
    for (const char* name : {"skin", "skin1"}) {
        PluginRef t = texture(names::embeddedTexture, name, names::pixelData, raw);
        t->setAttribute<std::uint32_t>(names::width, 3);
        t->setAttribute<std::uint32_t>(names::height, 2);
    }
    const std::vector<std::uint8_t> jpeg = {0xFF, 0xD8, 0xFF, 0xE0, 1, 2, 3};
    scene::IBufferAdapter& compressed = adapterOver(jpeg);
    texture(names::fileTexture, "photo", names::embeddedFile, compressed)
        ->setAttribute<base::string>(names::file, "photo.jpg");
    // Another image of the same file name, and one that tries to leave the folder.
    scene::IBufferAdapter& other = adapterOver({9, 9});
    texture(names::fileTexture, "photo1", names::embeddedFile, other)
        ->setAttribute<base::string>(names::file, "photo.jpg");
    scene::IBufferAdapter& sneaky = adapterOver({7});
    texture(names::fileTexture, "x", names::embeddedFile, sneaky)
        ->setAttribute<base::string>(names::file, "../../x.bin");
    // A plain file reference has nothing to extract.
    factory->create(names::fileTexture, 1)->setAttribute<base::string>(names::file, "a.png");

    const host::ExtractResult result = host::extractTextures(*factory, folder.c_str());
    EXPECT_EQ(result.failed, 0u) << result.error;
    EXPECT_EQ(std::vector<std::string>(result.files.begin(), result.files.end()),
              (std::vector<std::string>{"skin.png", "photo.jpg", "photo-1.jpg", "_._.._x.bin"}));
    std::uint32_t width = 0, height = 0;
    EXPECT_EQ(readPng(folder / "skin.png", width, height), texels);
    EXPECT_EQ(width, 3u);
    EXPECT_EQ(height, 2u);
    EXPECT_EQ(readFile(folder / "photo.jpg"), std::string(jpeg.begin(), jpeg.end()));
    EXPECT_EQ(readFile(folder / "photo-1.jpg"), std::string("\x09\x09"));
    EXPECT_EQ(std::distance(fs::directory_iterator(folder), fs::directory_iterator()), 4);
}

TEST_F(ExtractTextures, TexelsThatDoNotFitTheirSizeAreReported) {
    scene::IBufferAdapter& raw = adapterOver(std::vector<std::uint8_t>(10));
    PluginRef t = texture(names::embeddedTexture, "odd", names::pixelData, raw);
    t->setAttribute<std::uint32_t>(names::width, 2);
    t->setAttribute<std::uint32_t>(names::height, 2);
    const host::ExtractResult result = host::extractTextures(*factory, folder.c_str());
    EXPECT_EQ(result.written, 0u);
    EXPECT_EQ(result.failed, 1u);
    EXPECT_EQ(result.error, "odd.png: the texels do not match the image size");
    EXPECT_FALSE(fs::exists(folder / "odd.png"));
}

// The whole way: a model whose skin is held in the file as raw texels.
TEST_F(ExtractTextures, HostWritesTheSkinOfAModel) {
    const fs::path model = "/usr/share/assimp/models/MDL/MDL (HL1)/chrome_sphere.mdl";
    if (!fs::exists(model))
        GTEST_SKIP() << "assimp's model corpus is not installed";
    const std::string command = std::string("'" SCENE_IMPORT_EXE "' -q --extract-textures '") +
                                folder.string() + "' '" + model.string() + "' > '" +
                                (folder.string() + ".out") + "'";
    EXPECT_EQ(std::system(command.c_str()), 0);
    EXPECT_NE(readFile(folder.string() + ".out")
                  .find("extract-textures: 1 images written to " + folder.string() + "\n"),
              std::string::npos);
    fs::remove(folder.string() + ".out");
    std::uint32_t width = 0, height = 0;
    EXPECT_EQ(readPng(folder / "chrome_texture.png", width, height).size(), 64u * 64u * 4u);
    EXPECT_EQ(width, 64u);
}

} // namespace

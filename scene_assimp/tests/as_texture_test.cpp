// The texture conversion: file references, embedded images shared through
// one buffer per import, the texture-space settings and the path rules.
#include "as_material_fixture.h"
#include "as_texture.h"

namespace {

using namespace as::materialtest;
using as::materialtest::MaterialTest;

std::vector<std::uint8_t> bytesOf(const base::IPlugin& texture, base::name_id name) {
    const auto* bytes = texture.findVecAttribute<std::uint8_t>(name);
    return bytes ? std::vector<std::uint8_t>(bytes->begin(), bytes->end())
                 : std::vector<std::uint8_t>();
}

std::vector<std::uint8_t> sourceBytes(const aiTexture& image) {
    const std::size_t n =
        image.mHeight ? std::size_t(image.mWidth) * image.mHeight * 4 : image.mWidth;
    const auto* data = reinterpret_cast<const std::uint8_t*>(image.pcData);
    return std::vector<std::uint8_t>(data, data + n);
}

TEST(TextureRules, PathsAndNames) {
    for (const char* path :
         {"C:\\x\\a.png", "c:a.png", "\\\\server\\share\\a.png", "file:///tmp/a.png", "/tmp/a.png"})
        EXPECT_TRUE(as::isAbsolutePath(path)) << path;
    for (const char* path : {"a.png", "textures/a.png", "..\\a.png", "*", "1:"})
        EXPECT_FALSE(as::isAbsolutePath(path)) << path;

    struct Row {
        const char* path;
        const char* base;
        const char* expected;
    };
    const Row rows[] = {
        {"/models/car/tex/a.png", "/models/car/", "tex/a.png"},
        {"/models/car/./tex/../tex/a.png", "/models/car", "tex/a.png"},
        {"/Models/CAR/a.png", "/models/car/", "a.png"},
        {"C:\\Models\\car\\tex\\a.png", "c:/models/car/", "tex/a.png"},
        {"file:///models/car/a.png", "/models/car/", "a.png"},
        // Outside the base, or a base that is no folder: kept whole, never
        // cut into a wrong relative path.
        {"/models/carpet/a.png", "/models/car/", "/models/carpet/a.png"},
        {"/other/a.png", "/models/car/", "/other/a.png"},
        {"/models/car/a.png", "test", "/models/car/a.png"},
        {"C:\\a.png", "/models/", "C:\\a.png"},
    };
    for (const Row& row : rows)
        EXPECT_EQ(as::relativeToBase(row.path, row.base), row.expected) << row.path;

    const std::pair<const char*, const char*> stems[] = {
        {"textures/brick.png", "brick"}, {"brick.diffuse.png", "brick"}, {"a.b.c.png", "a.b"},
        {"C:\\x\\wall", "wall"},         {"dir/.png", "texture"},        {"dir/", "texture"}};
    for (const auto& [path, stem] : stems)
        EXPECT_EQ(as::textureBaseName(path), stem) << path;

    EXPECT_EQ(as::embeddedNumber("0"), 0u);
    EXPECT_EQ(as::embeddedNumber("4294967295"), 4294967295u);
    for (const char* bad : {"", "-1", "a", "1a", " 1", "4294967296", "99999999999999999999"})
        EXPECT_EQ(as::embeddedNumber(bad), std::nullopt) << bad;

    EXPECT_EQ(as::embeddedByteCount(64, 32, true), 8192u);
    EXPECT_EQ(as::embeddedByteCount(5000, 0, true), 5000u);
    EXPECT_EQ(as::embeddedByteCount(64, 32, false), std::nullopt);
    EXPECT_EQ(as::embeddedByteCount(32768, 32768, true), std::nullopt); // exactly 4 GiB
    EXPECT_EQ(as::embeddedByteCount(0xFFFFFFFFu, 0xFFFFFFFFu, true), std::nullopt);
}

TEST(TextureRules, MappingAndWrapTables) {
    const std::pair<int, int> mappings[] = {{0, 0}, {1, 2}, {2, 3}, {3, 4},
                                            {4, 5}, {5, 0}, {-1, 0}};
    for (const auto& [source, expected] : mappings)
        EXPECT_EQ(as::textureMapping(source), expected) << source;
    const std::pair<int, int> modes[] = {{0, 0}, {0x2901, 0}, {2, 1}, {0x8370, 1},
                                         {1, 2}, {0x812F, 2}, {3, 3}, {0x812D, 3},
                                         {4, 0}, {-1, 0}};
    for (const auto& [source, expected] : modes)
        EXPECT_EQ(as::textureWrapMode(source), expected) << std::hex << source;
}

TEST_F(MaterialTest, FileTexturesCarryTheirReferenceSettings) {
    aiMaterial* m = namedMaterial("m");
    setTexture(*m, aiTextureType_DIFFUSE, "textures/brick.png");
    setInt(*m, _AI_MATKEY_MAPPING_BASE, aiTextureType_DIFFUSE, 0, aiTextureMapping_BOX);
    setInt(*m, _AI_MATKEY_MAPPINGMODE_U_BASE, aiTextureType_DIFFUSE, 0, aiTextureMapMode_Clamp);
    setInt(*m, _AI_MATKEY_MAPPINGMODE_V_BASE, aiTextureType_DIFFUSE, 0, aiTextureMapMode_Mirror);
    setInt(*m, _AI_MATKEY_TEXFLAGS_BASE, aiTextureType_DIFFUSE, 0, aiTextureFlags_Invert);
    const aiUVTransform transform = [] {
        aiUVTransform t;
        t.mTranslation = aiVector2D(0.5f, 0.25f);
        t.mScaling = aiVector2D(2, 2);
        t.mRotation = 0.1f;
        return t;
    }();
    m->AddProperty(&transform, 1, _AI_MATKEY_UVTRANSFORM_BASE, aiTextureType_DIFFUSE, 0);
    setTexture(*m, aiTextureType_SPECULAR, "textures/brick.png");
    setInt(*m, _AI_MATKEY_UVWSRC_BASE, aiTextureType_SPECULAR, 0, 2);
    setInt(*m, _AI_MATKEY_MAPPINGMODE_U_BASE, aiTextureType_SPECULAR, 0, 0x812D);
    setInt(*m, _AI_MATKEY_TEXFLAGS_BASE, aiTextureType_SPECULAR, 0, aiTextureFlags_UseAlpha);
    setTexture(*m, aiTextureType_AMBIENT, "/elsewhere/wall.diffuse.tga");
    setInt(*m, _AI_MATKEY_MAPPINGMODE_V_BASE, aiTextureType_AMBIENT, 0, aiTextureMapMode_Decal);
    setTexture(*m, aiTextureType_EMISSIVE, "*");
    start(materialScene({m}));

    const PluginRef brick = convertTexture(aiTextureType_DIFFUSE);
    ASSERT_TRUE(brick);
    EXPECT_EQ(brick->className(), names::fileTexture);
    EXPECT_EQ(text(*brick, names::file), "textures/brick.png");
    EXPECT_EQ(text(*brick, names::name), "brick");
    EXPECT_EQ(text(*brick, names::uvSet), "uvset0");
    EXPECT_EQ(value<std::uint8_t>(*brick, names::mapping), 4);
    EXPECT_EQ(value<std::uint8_t>(*brick, names::wrapModeU), 2);
    EXPECT_EQ(value<std::uint8_t>(*brick, names::wrapModeV), 1);
    EXPECT_FALSE(holds(*brick, names::borderAlpha));
    EXPECT_TRUE(value<bool>(*brick, names::colorInvert));
    EXPECT_EQ(value<std::uint8_t>(*brick, names::colorChannels), 1);
    const base::vec3f translate = value<base::vec3f>(*brick, names::translate);
    const base::vec3f scale = value<base::vec3f>(*brick, names::scale);
    const base::vec3f rotate = value<base::vec3f>(*brick, names::rotate);
    EXPECT_EQ(std::vector<float>({translate.x, translate.y, translate.z}),
              std::vector<float>({0.5f, 0.25f, 0}));
    EXPECT_EQ(std::vector<float>({scale.x, scale.y, scale.z}), std::vector<float>({2, 2, 1}));
    EXPECT_EQ(std::vector<float>({rotate.x, rotate.y, rotate.z}), std::vector<float>({0.1f, 0, 0}));

    // The same file again: a new object with the next name and its own UV
    // set (assimp reports one for UV mapping only); a GL border mode
    // is a decal; the use-alpha flag alone inverts nothing; no transform.
    const PluginRef again = convertTexture(aiTextureType_SPECULAR);
    ASSERT_TRUE(again);
    EXPECT_NE(again.get(), brick.get());
    EXPECT_EQ(text(*again, names::name), "brick1");
    EXPECT_EQ(text(*again, names::uvSet), "uvset2");
    EXPECT_EQ(value<std::uint8_t>(*again, names::wrapModeU), 3);
    EXPECT_EQ(value<float>(*again, names::borderAlpha), 0.0f);
    EXPECT_FALSE(holds(*again, names::colorInvert));
    EXPECT_FALSE(holds(*again, names::translate));
    EXPECT_FALSE(holds(*again, names::rotate));

    // An absolute path outside the factory's folder stays whole.
    const PluginRef wall = convertTexture(aiTextureType_AMBIENT);
    ASSERT_TRUE(wall);
    EXPECT_EQ(text(*wall, names::file), "/elsewhere/wall.diffuse.tga");
    EXPECT_EQ(text(*wall, names::name), "wall");
    EXPECT_EQ(value<std::uint8_t>(*wall, names::wrapModeV), 3);
    EXPECT_EQ(value<float>(*wall, names::borderAlpha), 0.0f);

    // "*" alone is a file name, not an embedded reference.
    const PluginRef star = convertTexture(aiTextureType_EMISSIVE);
    ASSERT_TRUE(star);
    EXPECT_EQ(text(*star, names::file), "*");
    EXPECT_FALSE(convertTexture(aiTextureType_OPACITY));
    EXPECT_FALSE(convertTexture(aiTextureType_DIFFUSE, 0, 1));
}

TEST_F(MaterialTest, AbsolutePathsUnderTheFactoryFolderBecomeRelative) {
    factory = new base::PluginFactory("/models/car/");
    scene::register_scene_schema(*factory);
    aiMaterial* m = namedMaterial("m");
    setTexture(*m, aiTextureType_DIFFUSE, "/models/car/tex/paint.png");
    start(materialScene({m}));
    const PluginRef paint = convertTexture(aiTextureType_DIFFUSE);
    ASSERT_TRUE(paint);
    EXPECT_EQ(text(*paint, names::file), "tex/paint.png");
}

// Embedded images: each is copied once into one buffer with one adapter, and
// every texture made for it, in any material, reads those bytes.
TEST_F(MaterialTest, EmbeddedImagesShareOneBufferPerImage) {
    aiMaterial* first = namedMaterial("first");
    setTexture(*first, aiTextureType_DIFFUSE, "*0");
    setTexture(*first, aiTextureType_EMISSIVE, "*1");
    aiMaterial* second = namedMaterial("second");
    setTexture(*second, aiTextureType_DIFFUSE, "*0");
    setTexture(*second, aiTextureType_NORMALS, "C:\\art\\paper.png");
    aiTexture* raw = makeImage(64, 32);
    aiTexture* jpeg = makeImage(5000, 0, "jpg");
    aiTexture* paper = makeImage(300, 0, "png", "..\\Primitives\\paper.png");
    start(materialScene({first, second}, {raw, jpeg, paper}));

    const base::ref<scene::IMaterial> a = convertMaterial(0);
    const base::ref<scene::IMaterial> b = convertMaterial(1);
    ASSERT_TRUE(a && b);
    const PluginRef rawA = plugin(*a, names::colorMap);
    const PluginRef rawB = plugin(*b, names::colorMap);
    ASSERT_TRUE(rawA && rawB);
    EXPECT_NE(rawA.get(), rawB.get());
    for (const PluginRef& t : {rawA, rawB}) {
        EXPECT_EQ(t->className(), names::embeddedTexture);
        EXPECT_EQ(value<std::uint32_t>(*t, names::width), 64u);
        EXPECT_EQ(value<std::uint32_t>(*t, names::height), 32u);
        EXPECT_EQ(value<std::uint32_t>(*t, names::format), 1u);
        EXPECT_EQ(value<std::uint8_t>(*t, names::type_), 0);
        EXPECT_EQ(bytesOf(*t, names::pixelData), sourceBytes(*raw));
        // The bytes are read through the adapter, not held by the texture.
        ASSERT_NE(t->findEntry(names::pixelData), nullptr);
        EXPECT_NE(const_cast<base::Attribute*>(t->findEntry(names::pixelData))->asLink(), nullptr);
    }
    // Named after the number, made unique: "*1" took the name 1 before.
    EXPECT_EQ(text(*rawA, names::name), "0");
    EXPECT_EQ(text(*rawB, names::name), "2");

    const PluginRef compressed = plugin(*a, names::emissionMap);
    ASSERT_TRUE(compressed);
    EXPECT_EQ(compressed->className(), names::fileTexture);
    EXPECT_EQ(text(*compressed, names::file), "1.jpg");
    EXPECT_EQ(bytesOf(*compressed, names::embeddedFile), sourceBytes(*jpeg));

    // Referenced by file name, as FBX does.
    const PluginRef byName = plugin(*b, names::bumpMap);
    ASSERT_TRUE(byName);
    EXPECT_EQ(text(*byName, names::name), "paper");
    EXPECT_EQ(text(*byName, names::file), "paper.png");
    EXPECT_EQ(bytesOf(*byName, names::embeddedFile), sourceBytes(*paper));

    const auto buffers = as::meshtest::objectsOf(*factory, names::buffer);
    ASSERT_EQ(buffers.size(), 3u);
    EXPECT_EQ(as::meshtest::objectsOf(*factory, names::bufferAdapter).size(), 3u);
    EXPECT_EQ(as::meshtest::items<std::uint8_t>(*buffers[0], names::data).size(), 8192u);
    EXPECT_EQ(as::meshtest::items<std::uint8_t>(*buffers[1], names::data).size(), 5000u);
    ASSERT_EQ(textures.size(), 3u);
    EXPECT_TRUE(textures[0] && textures[1] && textures[2]);
}

TEST_F(MaterialTest, BadEmbeddedReferencesAreOutOfRange) {
    struct Row {
        const char* path;
        const char* logged; // the number as the line shows it
    };
    const Row rows[] = {{"*7", "7"},
                        {"*3", "3"},
                        {"*-1", "-1"},
                        {"*a", "a"},
                        {"*1a", "1a"},
                        {"*99999999999999999999", "99999999999999999999"},
                        {"*4294967296", "4294967296"},
                        {"*2", "2"},  // raw texels whose size does not fit 32 bits
                        {"*1", "1"}}; // raw texels without data
    aiMaterial* m = namedMaterial("m");
    for (unsigned i = 0; i < std::size(rows); ++i)
        setTexture(*m, aiTextureType_DIFFUSE, rows[i].path, i);
    aiTexture* huge = makeImage(1, 1);
    huge->mWidth = 65536;
    huge->mHeight = 65536;
    aiTexture* empty = makeImage(4, 4);
    delete[] empty->pcData;
    empty->pcData = nullptr;
    start(materialScene({m}, {makeImage(2, 2), empty, huge}));

    for (unsigned i = 0; i < std::size(rows); ++i) {
        SCOPED_TRACE(rows[i].path);
        const std::size_t before = captured.entries().size();
        EXPECT_FALSE(convertTexture(aiTextureType_DIFFUSE, 0, i));
        ASSERT_EQ(captured.entries().size(), before + 1);
        const auto entries = captured.entries();
        const auto& line = entries.back();
        EXPECT_EQ(line.level, base::logWarning);
        EXPECT_TRUE(line.message.ends_with(base::format(
            "| Unable to read embedded texture number {}, out of range!", rows[i].logged)))
            << line.message;
    }
    EXPECT_TRUE(as::meshtest::objectsOf(*factory, names::buffer).empty());
    EXPECT_TRUE(as::meshtest::objectsOf(*factory, names::embeddedTexture).empty());
}

} // namespace

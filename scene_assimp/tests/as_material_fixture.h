// Shared set-up of the material and texture tests: hand-built assimp
// materials and scenes, and the importer's material and texture steps.
#pragma once

#include "as_mesh_fixture.h"

#include <assimp/material.h>
#include <assimp/texture.h>

#include <cstring>
#include <string>

namespace as {

struct MaterialTestAccess {
    using TextureList = AssimpImporter::TextureList;

    static base::ref<scene::IMaterial> material(AssimpImporter& importer, const aiScene& scene,
                                                unsigned index, TextureList& textures) {
        return importer.importMaterial(&scene, scene.mMaterials[index], textures);
    }
    static base::ref<base::IPlugin> texture(AssimpImporter& importer, const aiScene& scene,
                                            unsigned material, unsigned type, unsigned index,
                                            TextureList& textures) {
        return importer.importTexture(&scene, scene.mMaterials[material], type, index, textures);
    }
    static base::vector<base::ref<scene::IMaterial>>& materials(AssimpImporter& importer) {
        return importer.m_materials;
    }
};

namespace materialtest {

namespace names = scene::names;
using PluginRef = base::ref<base::IPlugin>;

// Properties written the way assimp's readers write them; the key triples
// (AI_MATKEY_...) are passed as spelled.
inline void setColor(aiMaterial& m, const char* key, unsigned type, unsigned index, float r,
                     float g, float b) {
    const aiColor4D color(r, g, b, 1);
    m.AddProperty(&color, 1, key, type, index);
}
inline void setFloat(aiMaterial& m, const char* key, unsigned type, unsigned index, float value) {
    m.AddProperty(&value, 1, key, type, index);
}
inline void setInt(aiMaterial& m, const char* key, unsigned type, unsigned index, int value) {
    m.AddProperty(&value, 1, key, type, index);
}
inline void setString(aiMaterial& m, const char* key, unsigned type, unsigned index,
                      const char* text) {
    const aiString value(text);
    m.AddProperty(&value, key, type, index);
}
inline void setTexture(aiMaterial& m, aiTextureType type, const char* path, unsigned index = 0) {
    setString(m, _AI_MATKEY_TEXTURE_BASE, type, index, path);
}
inline aiMaterial* namedMaterial(const char* name) {
    auto* m = new aiMaterial;
    if (name)
        setString(*m, AI_MATKEY_NAME, name);
    return m;
}

// An embedded image: raw texels when height is not 0, else 'width' bytes of
// a compressed file with the format hint.
inline aiTexture* makeImage(unsigned width, unsigned height, const char* hint = "",
                            const char* fileName = "") {
    auto* image = new aiTexture;
    image->mWidth = width;
    image->mHeight = height;
    std::strncpy(image->achFormatHint, hint, HINTMAXTEXTURELEN - 1);
    image->mFilename = aiString(fileName);
    const std::size_t bytes = height ? std::size_t(width) * height * 4 : width;
    image->pcData = new aiTexel[(bytes + 3) / 4];
    auto* data = reinterpret_cast<unsigned char*>(image->pcData);
    for (std::size_t i = 0; i < bytes; ++i)
        data[i] = static_cast<unsigned char>(i * 7 + 1);
    return image;
}

// A scene holding the materials and embedded images given.
inline aiScene* materialScene(std::initializer_list<aiMaterial*> materials,
                              std::initializer_list<aiTexture*> images = {}) {
    auto* scene = new aiScene;
    scene->mNumMaterials = unsigned(materials.size());
    scene->mMaterials = new aiMaterial*[materials.size()];
    std::copy(materials.begin(), materials.end(), scene->mMaterials);
    if (images.size()) {
        scene->mNumTextures = unsigned(images.size());
        scene->mTextures = new aiTexture*[images.size()];
        std::copy(images.begin(), images.end(), scene->mTextures);
    }
    return scene;
}

inline PluginRef plugin(const base::AttribMap& object, base::name_id name) {
    const PluginRef* found = object.findAttribute<PluginRef>(name);
    return found ? *found : PluginRef();
}

inline std::string text(const base::AttribMap& object, base::name_id name) {
    const base::string* found = object.findAttribute<base::string>(name);
    return found ? std::string(found->c_str()) : std::string("<absent>");
}

template <class T>
T value(const base::AttribMap& object, base::name_id name) {
    const T* found = object.findAttribute<T>(name);
    EXPECT_NE(found, nullptr) << name.view();
    return found ? *found : T{};
}

inline bool holds(const base::AttribMap& object, base::name_id name) {
    return object.findEntry(name) != nullptr;
}

// glTF's packed metal-rough image on a material: two texture objects over
// one file, reading blue and green in linear space, the metal one scaled by
// the metallic factor.
inline void expectPackedMaps(const base::IPlugin& material, const char* file, float metallic) {
    const PluginRef metal = plugin(material, names::metalMap);
    const PluginRef rough = plugin(material, names::roughnessMap);
    ASSERT_TRUE(metal && rough);
    EXPECT_NE(metal.get(), rough.get());
    EXPECT_EQ(text(*metal, names::file), file);
    EXPECT_EQ(text(*rough, names::file), file);
    EXPECT_EQ(value<std::uint8_t>(*metal, names::colorChannels), 5);
    EXPECT_EQ(value<std::uint8_t>(*rough, names::colorChannels), 4);
    EXPECT_EQ(value<std::uint8_t>(*metal, names::colorSpace), 1);
    EXPECT_EQ(value<std::uint8_t>(*rough, names::colorSpace), 1);
    const base::vec3f gain = value<base::vec3f>(*metal, names::colorGain);
    EXPECT_EQ(gain.x, metallic);
    EXPECT_EQ(gain.z, metallic);
    EXPECT_FALSE(holds(*rough, names::colorGain));
}

// A factory, an importer, a captured log and a scene whose materials and
// textures are converted one by one.
class MaterialTest : public meshtest::MeshTest {
protected:
    base::ref<scene::IMaterial> convertMaterial(unsigned index = 0) {
        return MaterialTestAccess::material(*importer, *source, index, textures);
    }
    PluginRef convertTexture(unsigned type, unsigned material = 0, unsigned index = 0) {
        return MaterialTestAccess::texture(*importer, *source, material, type, index, textures);
    }
    // Starts an import of 'scene' with an empty embedded-image list.
    void start(aiScene* scene) {
        textures.assign(scene->mNumTextures, {});
        begin(scene);
    }

    MaterialTestAccess::TextureList textures;
};

} // namespace materialtest
} // namespace as

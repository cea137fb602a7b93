// Texture conversion: one texture reference of a material becomes a
// "fileTexture" naming an image file, a "fileTexture" holding a compressed
// image of the model, or an "embeddedTexture" holding raw texels.
//
// The bytes of an embedded image are copied once per import into a "buffer"
// with a "bufferAdapter" over it; every texture made for that image, in any
// material or mesh, reads them through a link to the adapter's output rather
// than holding a copy.
#include "as_texture.h"
#include "as_importer.h"

#include "b_format.h"
#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_schema.h"

#include <assimp/material.h>
#include <assimp/scene.h>
#include <assimp/texture.h>

#include <cctype>
#include <cstring>
#include <limits>

namespace as {

namespace names = scene::names;

namespace {

constexpr std::uint32_t createNull =
    base::PluginFactory::createNullIfUnknown | base::PluginFactory::createReportUnknown;
// A placeholder object still receives the attributes of an image.
constexpr std::uint32_t createPlaceholder = base::PluginFactory::createReportUnknown;

bool sameLetters(char a, char b) {
    return std::tolower(static_cast<unsigned char>(a)) ==
           std::tolower(static_cast<unsigned char>(b));
}

// Forward slashes, no empty or "." steps, ".." applied; a leading '/' kept.
base::string normalisedPath(std::string_view path) {
    base::vector<std::string_view> steps;
    const bool rooted = !path.empty() && (path.front() == '/' || path.front() == '\\');
    std::size_t at = 0;
    while (at <= path.size()) {
        std::size_t end = path.find_first_of("/\\", at);
        if (end == std::string_view::npos)
            end = path.size();
        const std::string_view step = path.substr(at, end - at);
        if (step == "..") {
            if (!steps.empty() && steps.back() != "..")
                steps.pop_back();
            else if (!rooted)
                steps.push_back(step);
        } else if (!step.empty() && step != ".") {
            steps.push_back(step);
        }
        at = end + 1;
    }
    base::string out(rooted ? "/" : "");
    for (std::size_t i = 0; i < steps.size(); ++i) {
        if (i)
            out += '/';
        out.append(steps[i].data(), steps[i].size());
    }
    return out;
}

// What assimp compares when it looks an embedded texture up by file name.
std::string_view shortFileName(std::string_view path) {
    std::size_t slash = path.rfind('/');
    if (slash == std::string_view::npos)
        slash = path.rfind('\\');
    return slash == std::string_view::npos ? path : path.substr(slash + 1);
}

// The embedded texture that a plain path names by its file name (as
// aiScene::GetEmbeddedTexture finds it), or null.
std::optional<std::uint32_t> embeddedByFileName(const aiScene& scene, std::string_view path) {
    if (!scene.mTextures)
        return std::nullopt;
    const std::string_view wanted = shortFileName(path);
    for (std::uint32_t i = 0; i < scene.mNumTextures; ++i) {
        const aiTexture* texture = scene.mTextures[i];
        if (texture &&
            shortFileName({texture->mFilename.data, texture->mFilename.length}) == wanted)
            return i;
    }
    return std::nullopt;
}

const aiTexture* embeddedTexture(const aiScene& scene, std::uint32_t index) {
    return scene.mTextures && index < scene.mNumTextures ? scene.mTextures[index] : nullptr;
}

// A "buffer" holding a copy of the bytes and a "bufferAdapter" presenting them.
base::ref<scene::IBufferAdapter> makeAdapter(base::PluginFactory& factory,
                                             const std::uint8_t* bytes, std::uint32_t count) {
    base::ref<base::IPlugin> buffer = factory.create(names::buffer, createNull);
    if (!buffer)
        return {};
    if (auto* data = buffer->vecAttribute<std::uint8_t>(names::data); data && count)
        data->items().assign(bytes, bytes + count);

    base::ref<base::IPlugin> created = factory.create(names::bufferAdapter, createNull);
    auto* adapter = dynamic_cast<scene::IBufferAdapter*>(created.get());
    if (!adapter)
        return {};
    adapter->setAttribute(names::inputBuffer, buffer);
    adapter->vecAttribute<std::uint8_t>(names::outputUint8);
    adapter->update();
    return base::ref<scene::IBufferAdapter>(adapter);
}

// 'texture' reads the adapter's bytes under 'name' through a link to its
// output, never through a copy.
void linkOutput(base::IPlugin& texture, base::name_id name, scene::IBufferAdapter& adapter) {
    base::AttribPath path;
    path.addPlugin(&adapter).addMember(names::outputUint8);
    texture.attribute(name, new base::AttribLink(path));
}

void logOutOfRange(std::string_view name, std::string_view number) {
    base::logFormatted(base::logScene, base::logWarning,
                       "assimp import {}| Unable to read embedded texture number {}, out of range!",
                       name, number);
}

struct TextureReference {
    aiString path;
    aiTextureMapping mapping = aiTextureMapping_UV;
    unsigned uvIndex = 0;
    aiTextureMapMode modes[2] = {aiTextureMapMode(0), aiTextureMapMode(0)};
};

} // namespace

// ---- Rules ------------------------------------------------------------------------

bool isAbsolutePath(std::string_view path) {
    if (path.size() >= 2 && std::isalpha(static_cast<unsigned char>(path[0])) && path[1] == ':')
        return true;
    return path.starts_with("\\\\") || path.starts_with("file://") || path.starts_with('/');
}

base::string relativeToBase(std::string_view path, std::string_view base) {
    std::string_view local = path;
    if (local.starts_with("file://"))
        local.remove_prefix(7);
    const base::string file = normalisedPath(local);
    base::string folder = normalisedPath(base);
    if (!folder.empty() && folder.back() != '/')
        folder += '/';
    const bool under = isAbsolutePath(base) && file.size() > folder.size() &&
                       std::equal(folder.begin(), folder.end(), file.begin(), sameLetters);
    return under ? file.substr(folder.size()) : base::string(path);
}

std::string_view textureBaseName(std::string_view path) {
    std::string_view file = path;
    if (const std::size_t slash = file.find_last_of("/\\"); slash != std::string_view::npos)
        file.remove_prefix(slash + 1);
    if (const std::size_t last = file.rfind('.'); last != std::string_view::npos) {
        const std::size_t previous = last ? file.rfind('.', last - 1) : std::string_view::npos;
        file = file.substr(0, previous != std::string_view::npos ? previous : last);
    }
    return file.empty() ? std::string_view("texture") : file;
}

std::optional<std::uint32_t> embeddedNumber(std::string_view digits) {
    if (digits.empty())
        return std::nullopt;
    std::uint64_t value = 0;
    for (const char c : digits) {
        if (c < '0' || c > '9')
            return std::nullopt;
        value = value * 10 + std::uint64_t(c - '0');
        if (value > std::numeric_limits<std::uint32_t>::max())
            return std::nullopt;
    }
    return std::uint32_t(value);
}

std::optional<std::uint32_t> embeddedByteCount(std::uint32_t width, std::uint32_t height,
                                               bool hasData) {
    if (height == 0)
        return hasData || width == 0 ? std::optional<std::uint32_t>(width) : std::nullopt;
    const std::uint64_t texels = std::uint64_t(width) * height;
    if (!hasData || texels > std::numeric_limits<std::uint32_t>::max() / 4)
        return std::nullopt;
    return std::uint32_t(texels * 4);
}

std::uint8_t textureMapping(int source) {
    constexpr std::uint8_t byMapping[] = {0, 2, 3, 4, 5}; // UV, sphere, cylinder, box, plane
    return source >= 0 && source < int(std::size(byMapping)) ? byMapping[source] : 0;
}

std::uint8_t textureWrapMode(int source) {
    struct Row {
        int source;
        std::uint8_t mode;
    };
    // assimp's wrap, clamp, mirror and decal, then the OpenGL names for them.
    constexpr Row rows[] = {{aiTextureMapMode_Wrap, 0},
                            {aiTextureMapMode_Clamp, 2},
                            {aiTextureMapMode_Mirror, 1},
                            {aiTextureMapMode_Decal, wrapDecal},
                            {0x2901, 0},
                            {0x812F, 2},
                            {0x8370, 1},
                            {0x812D, wrapDecal}};
    for (const Row& row : rows)
        if (row.source == source)
            return row.mode;
    return 0;
}

// ---- Conversion -------------------------------------------------------------------

base::ref<base::IPlugin> AssimpImporter::importTexture(const aiScene* scene,
                                                       const aiMaterial* material, unsigned type,
                                                       unsigned index,
                                                       TextureList& embeddedTextures) {
    if (!scene || !material || !m_factory)
        return {};
    TextureReference source;
    if (aiGetMaterialTexture(material, aiTextureType(type), index, &source.path, &source.mapping,
                             &source.uvIndex, nullptr, nullptr, source.modes,
                             nullptr) != aiReturn_SUCCESS ||
        source.path.length == 0)
        return {};
    const std::string_view path(source.path.data, source.path.length);

    // An embedded image is named by number ("*N") or, as FBX does, by its
    // file name; anything else names a file.
    std::optional<std::uint32_t> embedded;
    base::string name;
    std::string_view number;
    if (path.size() > 1 && path.front() == '*') {
        number = path.substr(1);
        name = m_factory->uniqueName(number);
        embedded = embeddedNumber(number);
        if (!embedded || !embeddedTexture(*scene, *embedded)) {
            logOutOfRange(name, number);
            return {};
        }
    } else if ((embedded = embeddedByFileName(*scene, path))) {
        name = m_factory->uniqueName(textureBaseName(path));
    }

    base::ref<base::IPlugin> texture;
    if (embedded) {
        const aiTexture& image = *embeddedTexture(*scene, *embedded);
        const std::optional<std::uint32_t> bytes =
            embeddedByteCount(image.mWidth, image.mHeight, image.pcData != nullptr);
        if (!bytes) {
            // The number itself when the reference gave one, else the index found.
            const base::string shown = number.empty() ? base::format("{}", *embedded) : "";
            logOutOfRange(name, number.empty() ? std::string_view(shown) : number);
            return {};
        }
        if (embeddedTextures.size() < scene->mNumTextures)
            embeddedTextures.resize(scene->mNumTextures);
        base::ref<scene::IBufferAdapter>& adapter = embeddedTextures[*embedded];
        if (!adapter)
            adapter = makeAdapter(*m_factory, reinterpret_cast<const std::uint8_t*>(image.pcData),
                                  *bytes);
        if (!adapter)
            return {};

        if (image.mHeight != 0) {
            texture = m_factory->create(names::embeddedTexture, createPlaceholder);
            if (!texture)
                return {};
            texture->setAttribute<std::uint32_t>(names::width, image.mWidth);
            texture->setAttribute<std::uint32_t>(names::height, image.mHeight);
            texture->setAttribute<std::uint32_t>(names::format, 1);
            texture->setAttribute<std::uint8_t>(names::type_, 0);
            linkOutput(*texture, names::pixelData, *adapter);
        } else {
            texture = m_factory->create(names::fileTexture, createPlaceholder);
            if (!texture)
                return {};
            const std::string_view hint(image.achFormatHint,
                                        strnlen(image.achFormatHint, sizeof image.achFormatHint));
            texture->setAttribute<base::string>(
                names::file, hint.empty() ? name : base::format("{}.{}", name, hint));
            linkOutput(*texture, names::embeddedFile, *adapter);
        }
    } else {
        texture = m_factory->create(names::fileTexture, createNull);
        if (!texture)
            return {};
        texture->setAttribute<base::string>(
            names::file,
            isAbsolutePath(path) ? relativeToBase(path, m_factory->name()) : base::string(path));
        name = m_factory->uniqueName(textureBaseName(path));
    }

    texture->setAttribute<base::string>(names::name, name);
    texture->setAttribute<base::string>(names::uvSet, base::format("uvset{}", source.uvIndex));
    texture->setAttribute<std::uint8_t>(names::mapping, textureMapping(int(source.mapping)));
    texture->setAttribute<std::uint8_t>(names::wrapModeU, textureWrapMode(int(source.modes[0])));
    texture->setAttribute<std::uint8_t>(names::wrapModeV, textureWrapMode(int(source.modes[1])));
    if (textureWrapMode(int(source.modes[0])) == wrapDecal ||
        textureWrapMode(int(source.modes[1])) == wrapDecal)
        texture->setAttribute<float>(names::borderAlpha, 0.0f);

    // The transform and flags belong to index 0 of the type, whichever index
    // the image came from.
    float transform[5];
    unsigned count = 5;
    if (aiGetMaterialFloatArray(material, _AI_MATKEY_UVTRANSFORM_BASE, type, 0, transform,
                                &count) == aiReturn_SUCCESS &&
        count == 5) {
        texture->setAttribute(names::translate, base::vec3f{transform[0], transform[1], 0.0f});
        texture->setAttribute(names::scale, base::vec3f{transform[2], transform[3], 1.0f});
        texture->setAttribute(names::rotate, base::vec3f{transform[4], 0.0f, 0.0f});
    }
    int flags = 0;
    if (aiGetMaterialIntegerArray(material, _AI_MATKEY_TEXFLAGS_BASE, type, 0, &flags, nullptr) ==
            aiReturn_SUCCESS &&
        (flags & aiTextureFlags_Invert))
        texture->setAttribute(names::colorInvert, true);
    texture->setAttribute<std::uint8_t>(names::colorChannels, 1);
    return texture;
}

} // namespace as

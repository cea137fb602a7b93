// Material conversion: one assimp material becomes a "principalMaterial".
//
// Classic (Phong-style) materials and glTF metal-rough materials both land on
// the principal material: textures go to their slots by the table below,
// colours and scalars are converted so that a texture is never multiplied by
// a black colour and the result stays within the material's ranges.
#include "as_importer.h"

#include "b_log.h"
#include "b_plugin_attribute.h"
#include "scene_schema.h"

#include <assimp/material.h>
#include <assimp/scene.h>

#include <cctype>
#include <cmath>
#include <string_view>

namespace as {

namespace names = scene::names;

namespace {

// What a texture slot means for the rest of the material.
enum class Role : std::uint8_t {
    color,
    specular,
    ambient,
    emission,
    bump,
    shininess,
    opacity,
    lightmap,
    reflection,
    metal,
    roughness,
    count
};

struct Slot {
    aiTextureType type;
    const base::name_id* attribute;
    Role role;
    // Newer texture types fill the attribute only when the classic rows left
    // it empty: they never replace a texture found there.
    bool onlyWhenEmpty;
};

// In order: a later row naming the same attribute replaces the earlier texture
// (normals over height, lightmap over ambient, reflection over specular).
const Slot slots[] = {
    {aiTextureType_DIFFUSE, &names::colorMap, Role::color, false},
    {aiTextureType_SPECULAR, &names::reflectionAmountMap, Role::specular, false},
    {aiTextureType_AMBIENT, &names::ambientMap, Role::ambient, false},
    {aiTextureType_EMISSIVE, &names::emissionMap, Role::emission, false},
    {aiTextureType_HEIGHT, &names::bumpMap, Role::bump, false},
    {aiTextureType_NORMALS, &names::bumpMap, Role::bump, false},
    {aiTextureType_SHININESS, &names::roughnessMap, Role::shininess, false},
    {aiTextureType_OPACITY, &names::visibilityMap, Role::opacity, false},
    {aiTextureType_LIGHTMAP, &names::ambientMap, Role::lightmap, false},
    {aiTextureType_REFLECTION, &names::reflectionAmountMap, Role::reflection, false},
    {aiTextureType_BASE_COLOR, &names::colorMap, Role::color, true},
    {aiTextureType_NORMAL_CAMERA, &names::bumpMap, Role::bump, true},
    {aiTextureType_EMISSION_COLOR, &names::emissionMap, Role::emission, true},
    {aiTextureType_METALNESS, &names::metalMap, Role::metal, true},
    {aiTextureType_DIFFUSE_ROUGHNESS, &names::roughnessMap, Role::roughness, true},
    {aiTextureType_AMBIENT_OCCLUSION, &names::ambientMap, Role::ambient, true},
};

// glTF's packed image: metalness in blue, roughness in green, occlusion in red.
constexpr std::uint8_t channelRed = 3;
constexpr std::uint8_t channelGreen = 4;
constexpr std::uint8_t channelBlue = 5;
constexpr std::uint8_t colorSpaceLinear = 1;
constexpr std::uint8_t ambientFromOcclusion = 1;
constexpr std::uint8_t ambientFromLightmap = 2;
constexpr std::uint8_t modelWithoutEmission = 1;
// assimp's shading model number for physically based materials.
constexpr int shadingPbr = 11;

constexpr std::string_view defaultMaterialName = AI_DEFAULT_MATERIAL_NAME;

// The readers take assimp's key triples (AI_MATKEY_...) as they are spelled.
std::optional<float> readFloat(const aiMaterial& material, const char* key, unsigned type,
                               unsigned index) {
    float value = 0;
    if (aiGetMaterialFloatArray(&material, key, type, index, &value, nullptr) != aiReturn_SUCCESS)
        return std::nullopt;
    return value;
}

std::optional<aiColor4D> readColor(const aiMaterial& material, const char* key, unsigned type,
                                   unsigned index) {
    aiColor4D color;
    if (aiGetMaterialColor(&material, key, type, index, &color) != aiReturn_SUCCESS)
        return std::nullopt;
    return color;
}

bool hasProperty(const aiMaterial& material, const char* key, unsigned type, unsigned index) {
    const aiMaterialProperty* property = nullptr;
    return aiGetMaterialProperty(&material, key, type, index, &property) == aiReturn_SUCCESS;
}

bool isBlack(const aiColor4D& c) {
    constexpr double limit = 0.00001;
    return double(c.r) < limit && double(c.g) < limit && double(c.b) < limit;
}

base::vec3f rgb(const aiColor4D& c) {
    return {c.r, c.g, c.b};
}

// The mean the material keeps of a colour (the single-precision 0.33333).
float meanOf(const aiColor4D& c) {
    return (c.r + c.g + c.b) * 0.33333f;
}

bool isMaskOrBlend(std::string_view mode) {
    auto equalsLower = [mode](std::string_view word) {
        if (mode.size() != word.size())
            return false;
        for (std::size_t i = 0; i < word.size(); ++i)
            if (std::tolower(static_cast<unsigned char>(mode[i])) != word[i])
                return false;
        return true;
    };
    return equalsLower("mask") || equalsLower("blend");
}

// Sets a texture's channel selection and, for packed data images, its colour
// space.
void selectChannel(base::IPlugin& texture, std::uint8_t channel, bool linear) {
    texture.setAttribute<std::uint8_t>(names::colorChannels, channel);
    if (linear)
        texture.setAttribute<std::uint8_t>(names::colorSpace, colorSpaceLinear);
}

// What one conversion learns on the way.
struct MaterialState {
    bool gltf = false;
    bool diffuseUsesAlpha = false;
    bool emissionPresent = false;
    bool found[std::size_t(Role::count)] = {};

    bool has(Role role) const { return found[std::size_t(role)]; }
};

} // namespace

base::ref<scene::IMaterial> AssimpImporter::importMaterial(const aiScene* scene,
                                                           const aiMaterial* source,
                                                           TextureList& embeddedTextures) {
    if (!source || !m_factory)
        return {};
    const aiMaterial& material = *source;

    aiString sourceName;
    const bool named =
        aiGetMaterialString(&material, AI_MATKEY_NAME, &sourceName) == aiReturn_SUCCESS &&
        sourceName.length != 0;
    const std::string_view nameText(sourceName.data, named ? sourceName.length : 0);
    if (named && nameText == defaultMaterialName)
        return {};

    base::ref<base::IPlugin> created =
        m_factory->create(names::principalMaterial, base::PluginFactory::createNullIfUnknown |
                                                        base::PluginFactory::createReportUnknown);
    auto* result = dynamic_cast<scene::IMaterial*>(created.get());
    if (!result)
        return {};
    base::IPlugin& out = *result;
    out.setAttribute<base::string>(names::name,
                                   m_factory->uniqueName(named ? nameText : "Material"));

    if (hasProperty(material, AI_MATKEY_GLOSSINESS_FACTOR))
        base::logFormatted(base::logScene, base::logWarning,
                           "assimp import {}| Specular-glossiness material attributes are not "
                           "currently supported. Will use metallic-roughness if present.",
                           nameText);

    MaterialState state;
    int shading = 0;
    const std::optional<float> metallic = readFloat(material, AI_MATKEY_METALLIC_FACTOR);
    state.gltf = metallic &&
                 aiGetMaterialIntegerArray(&material, AI_MATKEY_SHADING_MODEL, &shading, nullptr) ==
                     aiReturn_SUCCESS &&
                 shading == shadingPbr;

    auto texture = [&](aiTextureType type, unsigned index) {
        return importTexture(scene, &material, unsigned(type), index, embeddedTextures);
    };
    auto applyRole = [&](Role role, base::IPlugin& map) {
        switch (role) {
        case Role::metal:
            selectChannel(map, channelBlue, true);
            if (metallic)
                map.setAttribute(names::colorGain, base::vec3f{*metallic, *metallic, *metallic});
            break;
        case Role::roughness:
            selectChannel(map, channelGreen, true);
            break;
        case Role::shininess:
            // A glossiness image read as roughness.
            map.setAttribute(names::colorInvert, true);
            break;
        case Role::emission:
            state.emissionPresent = true;
            break;
        case Role::lightmap:
            out.setAttribute<std::uint8_t>(names::ambientType,
                                           state.gltf ? ambientFromOcclusion : ambientFromLightmap);
            break;
        default:
            break;
        }
        if (state.gltf && (role == Role::ambient || role == Role::lightmap))
            selectChannel(map, channelRed, false);
    };

    if (state.gltf) {
        // The packed metallic-roughness image serves both maps, each through
        // its own texture object reading its own channel.
        for (const Role role : {Role::metal, Role::roughness})
            if (base::ref<base::IPlugin> map = texture(aiTextureType_UNKNOWN, 0)) {
                applyRole(role, *map);
                out.setAttribute(role == Role::metal ? names::metalMap : names::roughnessMap, map);
            }
        if (const std::optional<float> roughness = readFloat(material, AI_MATKEY_ROUGHNESS_FACTOR))
            out.setAttribute(names::roughness, *roughness);
    }

    for (const Slot& slot : slots) {
        if (aiGetMaterialTextureCount(&material, slot.type) == 0)
            continue;
        if (slot.onlyWhenEmpty && out.findEntry(*slot.attribute))
            continue;
        base::ref<base::IPlugin> map = texture(slot.type, 0);
        if (!map)
            continue;
        applyRole(slot.role, *map);
        out.setAttribute(*slot.attribute, map);
        state.found[std::size_t(slot.role)] = true;
        if (slot.role != Role::color)
            continue;
        aiString alphaMode;
        if (aiGetMaterialString(&material, "$mat.gltf.alphaMode", 0, 0, &alphaMode) ==
                aiReturn_SUCCESS &&
            isMaskOrBlend({alphaMode.data, alphaMode.length}))
            out.setAttribute(names::visibilityFromColorMap, true);
        int flags = 0;
        if (aiGetMaterialIntegerArray(&material, _AI_MATKEY_TEXFLAGS_BASE, slot.type, 0, &flags,
                                      nullptr) == aiReturn_SUCCESS &&
            (flags & aiTextureFlags_UseAlpha))
            state.diffuseUsesAlpha = true;
    }
    if (state.diffuseUsesAlpha && !out.findEntry(names::visibilityMap))
        out.setAttribute(names::visibilityFromColorMap, true);

    // A colour that has a texture is not allowed to darken it to black.
    auto colorFor = [](const aiColor4D& c, bool textured) {
        return textured && isBlack(c) ? aiColor4D(1, 1, 1, 1) : c;
    };
    if (const auto diffuse = readColor(material, AI_MATKEY_COLOR_DIFFUSE))
        out.setAttribute(names::color, rgb(colorFor(*diffuse, state.has(Role::color))));
    if (const auto specular = readColor(material, AI_MATKEY_COLOR_SPECULAR))
        out.setAttribute(names::reflectionAmount,
                         meanOf(colorFor(*specular, state.has(Role::specular))));
    if (auto reflective = readColor(material, AI_MATKEY_COLOR_REFLECTIVE)) {
        if (const std::optional<float> factor = readFloat(material, AI_MATKEY_REFLECTIVITY))
            *reflective = *reflective * *factor;
        out.setAttribute(names::reflectionAmount, meanOf(*reflective));
    }
    if (const auto emissive = readColor(material, AI_MATKEY_COLOR_EMISSIVE)) {
        out.setAttribute(names::emission, rgb(colorFor(*emissive, state.has(Role::emission))));
        state.emissionPresent = true;
    }

    // glTF materials carry their roughness; assimp's shininess derived from it
    // would only overwrite it.
    if (!state.gltf) {
        if (std::optional<float> shininess = readFloat(material, AI_MATKEY_SHININESS);
            shininess && *shininess > 0.001f) {
            if (const std::optional<float> strength =
                    readFloat(material, AI_MATKEY_SHININESS_STRENGTH))
                *shininess *= *strength;
            // A non-finite exponent, or a strength that drives it to -2 or
            // below, gives no roughness rather than 0 or NaN.
            const float roughness = std::sqrt(2.0f / (*shininess + 2.0f));
            if (std::isfinite(*shininess) && std::isfinite(roughness))
                out.setAttribute(names::roughness, roughness);
        }
    }

    // The opacity says how much light passes; the transparent colour only
    // tints it (OBJ writes a white one for every material, opaque or not), so
    // it counts only where no opacity is given.
    if (!state.has(Role::opacity)) {
        if (const std::optional<float> opacity = readFloat(material, AI_MATKEY_OPACITY)) {
            const float clear = 1.0f - *opacity;
            out.setAttribute(names::transparency, base::vec3f{clear, clear, clear});
        } else if (const auto transparent = readColor(material, AI_MATKEY_COLOR_TRANSPARENT)) {
            out.setAttribute(names::transparency, rgb(*transparent));
        }
    }

    if (const std::optional<float> ior = readFloat(material, AI_MATKEY_REFRACTI);
        ior && std::isfinite(*ior) && *ior > 0.000001f && *ior != 1.0f) {
        const float ratio = (*ior - 1.0f) / (*ior + 1.0f);
        const float fresnel = std::min(std::max(ratio * ratio, 0.02f), 0.17f);
        // 5.882352828979492 is 1 / 0.17 in single precision: the result lies in [0.1176, 1].
        out.setAttribute(names::reflectivity, fresnel * 5.882352828979492f);
    }

    if (!state.gltf && !state.emissionPresent)
        out.setAttribute<std::uint8_t>(names::model, modelWithoutEmission);
    return base::ref<scene::IMaterial>(result);
}

} // namespace as

// The material conversion on hand-built assimp materials: slots, colours,
// scalars and the glTF metal-rough mode.
#include "as_material_fixture.h"

#include <cmath>
#include <functional>
#include <limits>

namespace {

using namespace as::materialtest;
using as::materialtest::MaterialTest;
using Build = std::function<void(aiMaterial&)>;
using Check = std::function<void(const base::IPlugin&)>;

constexpr float nan = std::numeric_limits<float>::quiet_NaN();
constexpr float inf = std::numeric_limits<float>::infinity();

struct MaterialRow {
    const char* label;
    Build build;
    Check check;
};

void expectColor(const base::IPlugin& m, base::name_id name, float r, float g, float b) {
    const base::vec3f c = value<base::vec3f>(m, name);
    EXPECT_NEAR(c.x, r, 1e-7) << name.view();
    EXPECT_NEAR(c.y, g, 1e-7) << name.view();
    EXPECT_NEAR(c.z, b, 1e-7) << name.view();
}

Check roughnessIs(float expected) {
    return [expected](const base::IPlugin& m) {
        EXPECT_NEAR(value<float>(m, names::roughness), expected, 1e-4);
    };
}
Check reflectivityIs(float expected) {
    return [expected](const base::IPlugin& m) {
        EXPECT_NEAR(value<float>(m, names::reflectivity), expected, 1e-4);
    };
}
Check absent(const base::name_id& name) {
    return [&name](const base::IPlugin& m) { EXPECT_FALSE(holds(m, name)) << name.view(); };
}
Build shininess(float s) {
    return [s](aiMaterial& m) { setFloat(m, AI_MATKEY_SHININESS, s); };
}
Build refraction(float n) {
    return [n](aiMaterial& m) { setFloat(m, AI_MATKEY_REFRACTI, n); };
}
Build diffuse(float r, bool textured) {
    return [r, textured](aiMaterial& m) {
        setColor(m, AI_MATKEY_COLOR_DIFFUSE, r, 0, 0);
        if (textured)
            setTexture(m, aiTextureType_DIFFUSE, "d.png");
    };
}
Build alphaMode(const char* mode) {
    return [mode](aiMaterial& m) {
        setTexture(m, aiTextureType_DIFFUSE, "d.png");
        setString(m, "$mat.gltf.alphaMode", 0, 0, mode);
    };
}
// The file a map attribute's texture names.
std::string mapFile(const base::IPlugin& m, base::name_id map) {
    const PluginRef texture = plugin(m, map);
    return texture ? text(*texture, names::file) : "<no texture>";
}

// One case per row: a material named "m" built by the row, converted alone.
const MaterialRow materialRows[] = {
    // A texture is never multiplied by black; without one, black stays.
    MaterialRow{"BlackDiffuseWithTextureIsWhite", diffuse(0, true),
                [](auto& m) { expectColor(m, names::color, 1, 1, 1); }},
    MaterialRow{"BlackDiffuseWithoutTextureStays", diffuse(0, false),
                [](auto& m) { expectColor(m, names::color, 0, 0, 0); }},
    MaterialRow{"NearBlackCountsAsBlack", diffuse(0.000005f, true),
                [](auto& m) { expectColor(m, names::color, 1, 1, 1); }},
    MaterialRow{"DarkRedIsNotBlack", diffuse(0.00002f, true),
                [](auto& m) { expectColor(m, names::color, 0.00002f, 0, 0); }},
    MaterialRow{
        "SpecularMean",
        [](aiMaterial& m) { setColor(m, AI_MATKEY_COLOR_SPECULAR, 0.3f, 0.6f, 0.9f); },
        [](auto& m) { EXPECT_NEAR(value<float>(m, names::reflectionAmount), 0.599994f, 1e-6); }},
    MaterialRow{
        "ReflectiveReplacesSpecular",
        [](aiMaterial& m) {
            setColor(m, AI_MATKEY_COLOR_SPECULAR, 0.3f, 0.6f, 0.9f);
            setColor(m, AI_MATKEY_COLOR_REFLECTIVE, 1, 1, 1);
            setFloat(m, AI_MATKEY_REFLECTIVITY, 0.5f);
        },
        [](auto& m) { EXPECT_NEAR(value<float>(m, names::reflectionAmount), 0.499995f, 1e-6); }},
    MaterialRow{
        "BlackSpecularWithMapIsWhite",
        [](aiMaterial& m) {
            setColor(m, AI_MATKEY_COLOR_SPECULAR, 0, 0, 0);
            setTexture(m, aiTextureType_SPECULAR, "s.png");
        },
        [](auto& m) { EXPECT_NEAR(value<float>(m, names::reflectionAmount), 0.99999f, 1e-6); }},
    MaterialRow{"ShininessZero", shininess(0), absent(names::roughness)},
    MaterialRow{"ShininessAtThreshold", shininess(0.001f), absent(names::roughness)},
    MaterialRow{"Shininess98", shininess(98), roughnessIs(0.1414f)},
    MaterialRow{"ShininessWithStrength",
                [](aiMaterial& m) {
                    setFloat(m, AI_MATKEY_SHININESS, 100);
                    setFloat(m, AI_MATKEY_SHININESS_STRENGTH, 0.5f);
                },
                roughnessIs(0.1961f)},
    MaterialRow{"ShininessNaN", shininess(nan), absent(names::roughness)},
    MaterialRow{"ShininessInfinite", shininess(inf), absent(names::roughness)},
    MaterialRow{"StrengthMakesExponentNegative",
                [](aiMaterial& m) {
                    setFloat(m, AI_MATKEY_SHININESS, 100);
                    setFloat(m, AI_MATKEY_SHININESS_STRENGTH, -1);
                },
                absent(names::roughness)},
    MaterialRow{"Refraction15", refraction(1.5f), reflectivityIs(0.2353f)},
    MaterialRow{"Refraction1", refraction(1.0f), absent(names::reflectivity)},
    MaterialRow{"Refraction11RaisedTo002", refraction(1.1f), reflectivityIs(0.1176f)},
    MaterialRow{"Refraction3CutTo017", refraction(3.0f), reflectivityIs(1.0f)},
    MaterialRow{"RefractionNaN", refraction(nan), absent(names::reflectivity)},
    MaterialRow{"RefractionInfinite", refraction(inf), absent(names::reflectivity)},
    MaterialRow{"Opacity", [](aiMaterial& m) { setFloat(m, AI_MATKEY_OPACITY, 0.25f); },
                [](auto& m) { expectColor(m, names::transparency, 0.75f, 0.75f, 0.75f); }},
    // OBJ gives every material a white transparent colour: an opaque
    // one must not come in fully transparent.
    MaterialRow{"OpacityOverTransparentColour",
                [](aiMaterial& m) {
                    setFloat(m, AI_MATKEY_OPACITY, 1);
                    setColor(m, AI_MATKEY_COLOR_TRANSPARENT, 1, 1, 1);
                },
                [](auto& m) { expectColor(m, names::transparency, 0, 0, 0); }},
    MaterialRow{"TransparentColourAlone",
                [](aiMaterial& m) { setColor(m, AI_MATKEY_COLOR_TRANSPARENT, 0.1f, 0.2f, 0.3f); },
                [](auto& m) { expectColor(m, names::transparency, 0.1f, 0.2f, 0.3f); }},
    MaterialRow{"OpacityMapLeavesTransparencyAlone",
                [](aiMaterial& m) {
                    setFloat(m, AI_MATKEY_OPACITY, 0.25f);
                    setTexture(m, aiTextureType_OPACITY, "o.png");
                },
                [](auto& m) {
                    EXPECT_FALSE(holds(m, names::transparency));
                    EXPECT_EQ(mapFile(m, names::visibilityMap), "o.png");
                }},
    MaterialRow{"AlphaModeMask", alphaMode("MASK"),
                [](auto& m) { EXPECT_TRUE(value<bool>(m, names::visibilityFromColorMap)); }},
    MaterialRow{"AlphaModeBlendAnyCase", alphaMode("bLeNd"),
                [](auto& m) { EXPECT_TRUE(value<bool>(m, names::visibilityFromColorMap)); }},
    MaterialRow{"AlphaModeOpaque", alphaMode("OPAQUE"), absent(names::visibilityFromColorMap)},
    MaterialRow{"UseAlphaFlag",
                [](aiMaterial& m) {
                    setTexture(m, aiTextureType_DIFFUSE, "d.png");
                    setInt(m, _AI_MATKEY_TEXFLAGS_BASE, aiTextureType_DIFFUSE, 0,
                           aiTextureFlags_UseAlpha);
                },
                [](auto& m) { EXPECT_TRUE(value<bool>(m, names::visibilityFromColorMap)); }},
    MaterialRow{"UseAlphaFlagWithOpacityMap",
                [](aiMaterial& m) {
                    setTexture(m, aiTextureType_DIFFUSE, "d.png");
                    setTexture(m, aiTextureType_OPACITY, "o.png");
                    setInt(m, _AI_MATKEY_TEXFLAGS_BASE, aiTextureType_DIFFUSE, 0,
                           aiTextureFlags_UseAlpha);
                },
                absent(names::visibilityFromColorMap)},
    MaterialRow{
        "Lightmap",
        [](aiMaterial& m) {
            setTexture(m, aiTextureType_AMBIENT, "a.png");
            setTexture(m, aiTextureType_LIGHTMAP, "l.png");
        },
        [](auto& m) {
            EXPECT_EQ(value<std::uint8_t>(m, names::ambientType), 2);
            EXPECT_EQ(mapFile(m, names::ambientMap), "l.png");
            EXPECT_EQ(value<std::uint8_t>(*plugin(m, names::ambientMap), names::colorChannels), 1);
        }},
    MaterialRow{"LaterSlotsReplaceEarlier",
                [](aiMaterial& m) {
                    setTexture(m, aiTextureType_HEIGHT, "h.png");
                    setTexture(m, aiTextureType_NORMALS, "n.png");
                    setTexture(m, aiTextureType_SPECULAR, "s.png");
                    setTexture(m, aiTextureType_REFLECTION, "r.png");
                },
                [](auto& m) {
                    EXPECT_EQ(mapFile(m, names::bumpMap), "n.png");
                    EXPECT_EQ(mapFile(m, names::reflectionAmountMap), "r.png");
                }},
    MaterialRow{"ShininessMapIsInverted",
                [](aiMaterial& m) { setTexture(m, aiTextureType_SHININESS, "g.png"); },
                [](auto& m) {
                    EXPECT_TRUE(value<bool>(*plugin(m, names::roughnessMap), names::colorInvert));
                }},
    MaterialRow{"NoEmissionIsModel1", [](aiMaterial&) {},
                [](auto& m) { EXPECT_EQ(value<std::uint8_t>(m, names::model), 1); }},
    MaterialRow{"BlackEmissionIsStillEmission",
                [](aiMaterial& m) { setColor(m, AI_MATKEY_COLOR_EMISSIVE, 0, 0, 0); },
                [](auto& m) {
                    EXPECT_FALSE(holds(m, names::model));
                    expectColor(m, names::emission, 0, 0, 0);
                }},
    MaterialRow{"EmissionMapWhitensBlack",
                [](aiMaterial& m) {
                    setColor(m, AI_MATKEY_COLOR_EMISSIVE, 0, 0, 0);
                    setTexture(m, aiTextureType_EMISSIVE, "e.png");
                },
                [](auto& m) {
                    EXPECT_FALSE(holds(m, names::model));
                    expectColor(m, names::emission, 1, 1, 1);
                }},
    // Newer texture types fill only what the classic slots left empty,
    // with the settings of their classic counterparts.
    MaterialRow{"PhysicalTypesFillEmptySlots",
                [](aiMaterial& m) {
                    setColor(m, AI_MATKEY_COLOR_DIFFUSE, 0, 0, 0);
                    setTexture(m, aiTextureType_BASE_COLOR, "albedo.png");
                    setTexture(m, aiTextureType_NORMAL_CAMERA, "normal.png");
                    setTexture(m, aiTextureType_EMISSION_COLOR, "emission.png");
                    setTexture(m, aiTextureType_METALNESS, "metal.png");
                    setTexture(m, aiTextureType_DIFFUSE_ROUGHNESS, "rough.png");
                    setTexture(m, aiTextureType_AMBIENT_OCCLUSION, "ao.png");
                },
                [](auto& m) {
                    EXPECT_EQ(mapFile(m, names::colorMap), "albedo.png");
                    expectColor(m, names::color, 1, 1, 1);
                    EXPECT_EQ(mapFile(m, names::bumpMap), "normal.png");
                    EXPECT_EQ(mapFile(m, names::emissionMap), "emission.png");
                    EXPECT_FALSE(holds(m, names::model));
                    EXPECT_EQ(mapFile(m, names::ambientMap), "ao.png");
                    const PluginRef metal = plugin(m, names::metalMap);
                    const PluginRef rough = plugin(m, names::roughnessMap);
                    ASSERT_TRUE(metal && rough);
                    EXPECT_EQ(text(*metal, names::file), "metal.png");
                    EXPECT_EQ(value<std::uint8_t>(*metal, names::colorChannels), 5);
                    EXPECT_EQ(value<std::uint8_t>(*metal, names::colorSpace), 1);
                    EXPECT_EQ(text(*rough, names::file), "rough.png");
                    EXPECT_EQ(value<std::uint8_t>(*rough, names::colorChannels), 4);
                }},
    MaterialRow{"PhysicalTypesNeverReplaceClassic",
                [](aiMaterial& m) {
                    setTexture(m, aiTextureType_DIFFUSE, "diffuse.png");
                    setTexture(m, aiTextureType_BASE_COLOR, "albedo.png");
                    setTexture(m, aiTextureType_NORMALS, "n.png");
                    setTexture(m, aiTextureType_NORMAL_CAMERA, "normal.png");
                },
                [](auto& m) {
                    EXPECT_EQ(mapFile(m, names::colorMap), "diffuse.png");
                    EXPECT_EQ(mapFile(m, names::bumpMap), "n.png");
                }},
    // Hundreds of textures on one slot: index 0 is the one used.
    MaterialRow{"HundredsOfTextures",
                [](aiMaterial& m) {
                    for (unsigned i = 0; i < 300; ++i)
                        setTexture(m, aiTextureType_DIFFUSE,
                                   ("t" + std::to_string(i) + ".png").c_str(), i);
                },
                [](auto& m) { EXPECT_EQ(mapFile(m, names::colorMap), "t0.png"); }}};

TEST_F(MaterialTest, RulesOfTheConversion) {
    for (const MaterialRow& row : materialRows) {
        SCOPED_TRACE(row.label);
        aiMaterial* material = namedMaterial("m");
        row.build(*material);
        start(materialScene({material}));
        const base::ref<scene::IMaterial> converted = convertMaterial();
        ASSERT_TRUE(converted);
        EXPECT_EQ(converted->className(), names::principalMaterial);
        row.check(*converted);
    }
}

TEST_F(MaterialTest, DefaultMaterialIsSkippedAndNamesAreUnique) {
    start(materialScene({namedMaterial("DefaultMaterial"), namedMaterial("defaultmaterial"),
                         namedMaterial(nullptr), namedMaterial(""), namedMaterial("Material")}));
    EXPECT_FALSE(convertMaterial(0));
    std::vector<std::string> named;
    for (unsigned i = 1; i < 5; ++i) {
        const base::ref<scene::IMaterial> m = convertMaterial(i);
        ASSERT_TRUE(m);
        named.push_back(m->name().c_str());
    }
    EXPECT_EQ(named,
              (std::vector<std::string>{"defaultmaterial", "Material", "Material1", "Material2"}));
}

// A glTF metal-rough material: the packed image serves two maps through two
// texture objects; the factors and the occlusion channel are applied; the
// shininess assimp derives is not converted.
TEST_F(MaterialTest, MetalRoughMode) {
    aiMaterial* m = namedMaterial("gltf");
    setInt(*m, AI_MATKEY_SHADING_MODEL, aiShadingMode_PBR_BRDF);
    setFloat(*m, AI_MATKEY_METALLIC_FACTOR, 0.25f);
    setFloat(*m, AI_MATKEY_ROUGHNESS_FACTOR, 0.6f);
    setFloat(*m, AI_MATKEY_SHININESS, 98);
    setColor(*m, AI_MATKEY_COLOR_DIFFUSE, 0.5f, 0.5f, 0.5f);
    setFloat(*m, AI_MATKEY_GLOSSINESS_FACTOR, 1);
    setTexture(*m, aiTextureType_DIFFUSE, "base.png");
    setTexture(*m, aiTextureType_BASE_COLOR, "base.png");
    setTexture(*m, aiTextureType_UNKNOWN, "mr.png");
    setTexture(*m, aiTextureType_METALNESS, "mr.png");
    setTexture(*m, aiTextureType_DIFFUSE_ROUGHNESS, "mr.png");
    setTexture(*m, aiTextureType_LIGHTMAP, "occlusion.png");
    aiMaterial* plain = namedMaterial("plainGltf");
    setInt(*plain, AI_MATKEY_SHADING_MODEL, aiShadingMode_PBR_BRDF);
    setFloat(*plain, AI_MATKEY_METALLIC_FACTOR, 1);
    setFloat(*plain, AI_MATKEY_ROUGHNESS_FACTOR, 0.3f);
    start(materialScene({m, plain}));

    const base::ref<scene::IMaterial> gltf = convertMaterial(0);
    ASSERT_TRUE(gltf);
    EXPECT_EQ(captured.count("assimp import gltf| Specular-glossiness material attributes are "
                             "not currently supported. Will use metallic-roughness if present."),
              1u);
    expectPackedMaps(*gltf, "mr.png", 0.25f);
    EXPECT_EQ(value<float>(*gltf, names::roughness), 0.6f);
    EXPECT_EQ(mapFile(*gltf, names::colorMap), "base.png");
    const PluginRef occlusion = plugin(*gltf, names::ambientMap);
    ASSERT_TRUE(occlusion);
    EXPECT_EQ(value<std::uint8_t>(*occlusion, names::colorChannels), 3);
    EXPECT_EQ(value<std::uint8_t>(*gltf, names::ambientType), 1);
    EXPECT_FALSE(holds(*gltf, names::model));

    // Without a packed image the factor still gives the roughness.
    const base::ref<scene::IMaterial> second = convertMaterial(1);
    ASSERT_TRUE(second);
    EXPECT_EQ(value<float>(*second, names::roughness), 0.3f);
    EXPECT_FALSE(holds(*second, names::metalMap));
    EXPECT_FALSE(holds(*second, names::model));
}

// The driver fills the material list before the nodes, and a mesh takes its
// material and its displacement map from there.
TEST_F(MaterialTest, MeshesTakeTheirMaterialAndDisplacementMap) {
    aiMaterial* displaced = namedMaterial("displaced");
    setTexture(*displaced, aiTextureType_DISPLACEMENT, "height.png");
    aiMaterial* broken = namedMaterial("broken");
    setTexture(*broken, aiTextureType_DISPLACEMENT, "*5");
    aiMaterial* skipped = namedMaterial("DefaultMaterial");
    setTexture(*skipped, aiTextureType_DISPLACEMENT, "height.png");

    aiScene* scene =
        as::meshtest::makeScene({as::meshtest::makeLine("a", 3), as::meshtest::makeLine("b", 3),
                                 as::meshtest::makeLine("c", 3)});
    for (unsigned i = 0; i < 3; ++i)
        scene->mMeshes[i]->mMaterialIndex = i;
    scene->mNumMaterials = 3;
    scene->mMaterials = new aiMaterial* [3] { displaced, broken, skipped };
    start(scene);
    auto& materials = as::MaterialTestAccess::materials(*importer);
    for (unsigned i = 0; i < 3; ++i)
        materials[i] = convertMaterial(i);

    std::vector<base::IPlugin*> meshes;
    for (unsigned i = 0; i < 3; ++i)
        meshes.push_back(meshOf(convert(i)));
    const PluginRef map = plugin(*meshes[0], names::displaceMap);
    ASSERT_TRUE(map);
    EXPECT_EQ(text(*map, names::file), "height.png");
    EXPECT_TRUE(value<bool>(*meshes[0], names::displace));
    // The displacement image cannot be read: the mesh keeps its material only.
    EXPECT_TRUE(holds(*as::meshtest::item(*meshes[1], names::primitives, 0), names::materials));
    EXPECT_FALSE(holds(*meshes[1], names::displace));
    EXPECT_FALSE(holds(*meshes[1], names::displaceMap));
    // No material converted: neither materials nor displacement.
    EXPECT_FALSE(holds(*as::meshtest::item(*meshes[2], names::primitives, 0), names::materials));
    EXPECT_FALSE(holds(*meshes[2], names::displace));
}

} // namespace

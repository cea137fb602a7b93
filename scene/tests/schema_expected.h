// Published defaults of the scene model, typed by hand rather than taken from
// the schema rows, shared by the tests that check the rows and the objects.
#pragma once

#include "scene_schema.h"

#include <cstdint>
#include <optional>
#include <string_view>

namespace scene_tests {

using base::vec2f, base::vec3f, base::vec4f, base::vec3d, base::vec2i, base::quatf;
using scene::SchemaValue;

// Published defaults, typed by hand rather than taken from the rows; the value's type is the
// attribute's type, and nullopt means the attribute has no default.
struct Expected {
    std::string_view type, attr;
    std::optional<SchemaValue> value;
};

inline const Expected kExpected[] = {
    {"node", "visible", true},
    {"node", "inheritsTransform", true},
    {"node", "rotateMode", std::uint8_t(2)},
    {"node", "scale", vec3f{1, 1, 1}},
    {"node", "rotate", quatf{1, 0, 0, 0}},
    {"node", "distance", 10.0},
    {"node", "color", vec3f{1, 0, 0}},
    {"node", "translate", vec3d{0, 0, 0}},
    {"node", "rotateAxisAngle", vec4f{0, 1, 0, 0}},
    {"node", "bounds", std::nullopt},
    {"scene", "framesPerSecond", std::int32_t(30)},
    {"scene", "playSpeed", std::int32_t(100)},
    {"scene", "upAxis", std::uint8_t(1)},
    {"scene", "consoleVerbosity", std::uint8_t(4)},
    {"scene", "logVerbosity", std::uint8_t(3)},
    {"scene", "time", std::nullopt},
    {"bufferAdapter", "inputOffset", std::uint32_t(0)},
    {"bufferAdapter", "inputLength", std::uint32_t(0xFFFFFFFFu)},
    {"mesh", "visible", true},
    {"skin", "visible", true},
    {"morph", "visible", true},
    {"mesh", "bounds", std::nullopt},
    {"mesh", "computeNormalsAngle", 60.0f},
    {"mesh", "tessellation", std::uint8_t(2)},
    {"hair", "tessellation", std::uint8_t(1)},
    {"fur", "knots", std::int32_t(6)},
    {"metadata", "rating", std::uint8_t(255)},
    {"sceneReference", "mode", std::uint8_t(2)},
    {"principalMaterial", "color", vec3f{0.8f, 0.8f, 0.8f}},
    {"principalMaterial", "reflectivity", 0.2f},
    {"principalMaterial", "roughness", 0.2f},
    {"principalMaterial", "emissionAmount", 1.0f},
    {"principalMaterial", "coatTransparency", vec3f{1, 1, 1}},
    {"principalMaterial", "scatterAmount", 0.7f},
    {"principalMaterial", "smoothNormals", std::uint8_t(1)},
    {"principalMaterial", "bumpSpace", std::uint8_t(0)},
    {"fileTexture", "gamma", 2.2f},
    {"fileTexture", "colorGain", vec3f{1, 1, 1}},
    {"fileTexture", "scale", vec3f{1, 1, 1}},
    {"fileTexture", "borderAlpha", 1.0f},
    {"fileTexture", "rotate", vec3f{0, 0, 0}},
    {"cubistTexture", "minimum", -2.0f},
    {"cubistTexture", "maximum", 1.0f},
    {"toonMaterial", "shadowColor", vec3f{0.12f, 0.02f, 0.02f}},
    {"toonMaterial", "rimSmooth", 0.01f},
    {"camera", "focalLength", 50.0f},
    {"camera", "sensor", vec2f{36, 24}},
    {"camera", "sensorFit", std::uint8_t(3)},
    {"camera", "orthographicZoom", 1.0},
    {"camera", "shutter", vec2f{0, 0.5f}},
    {"camera", "sphericalAngle", vec2f{90, 90}},
    {"camera", "cubemapType", std::uint8_t(2)},
    {"light", "color", vec3f{1, 1, 1}},
    {"light", "intensity", 1.0f},
    {"light", "spotConeAngle", 90.0f},
    {"light", "spotPenumbraAngle", 5.0f},
    {"light", "size", 0.1f},
    {"light", "shadowMapBias", 2.0f},
    {"light", "shadowBlendMode", std::uint8_t(3)},
    {"renderOutput", "gamma", 2.2f},
    {"renderOutput", "tonemapping", std::uint8_t(4)},
    {"renderOutput", "jpgQuality", std::uint8_t(95)},
    {"renderOutput", "pngCompression", std::uint8_t(50)},
    {"renderOutput", "tiffCompression", std::uint8_t(70)},
    {"outputJob", "stillResolution", vec2i{1920, 1080}},
    {"environment", "zenithColor", vec3f{0.2f, 0.4f, 0.8f}},
    {"environment", "skyTurbidity", 4.0f},
    {"environment", "fogDistance", 10.0f},
    {"clipPlane", "normal", vec3f{0, 1, 0}},
    {"keyframeChannelCurve", "interpolation", std::uint8_t(1)},
    {"keyframeChannelCurve", "preExtrapolation", std::uint8_t(0)},
    {"keyframeChannelCurve", "postExtrapolation", std::uint8_t(0)},
    {"keyframeChannelCurve", "tension", 1.0f},
    {"keyframeChannelCurve", "tightness", 0.5f},
    {"animClip", "startTime", base::TimeCode(0)},
    {"animClip", "endTime", base::TimeCode(0)},
    {"animLayer", "time", base::TimeCode(0)},
    {"animLayerAction", "playAt", base::TimeCode(0)},
    {"animLayerAction", "playSpeed", std::uint8_t(100)},
    {"sceneImporter", "importNormals", std::uint8_t(2)},
    {"sceneImporter", "importTangents", std::uint8_t(1)},
    {"sceneImporter", "importMeshes", true},
    {"sceneImporter", "importTriangulateMeshes", false},
    {"sceneImporter", "computeNormalsAngle", 60.0f},
    {"sceneImporter", "hashMethod", base::string("xx")},
    {"sceneImporter", "compressionMethod", base::string("zip")},
    {"sceneImporter", "compressionLevel", std::int32_t(5)},
    {"sceneImporter", "textColumns", std::int32_t(180)},
    {"sceneImporter", "importFilename", std::nullopt},
    {"sceneExporter", "exportEdges", std::uint8_t(0)},
    {"sceneExporter", "exportImageMaxDim", std::int32_t(4096)},
    // Values without a row of their own, given to these attributes.
    {"lines", "indicesDeltaCompression", std::uint8_t(0)},
    {"meshPrimitive", "invisible", std::uint8_t(0)},
    {"meshPrimitive", "bounds", base::box3d::empty()},
    {"morph", "method", std::uint8_t(0)},
    {"morph", "targetsWeight", 1.0f},
    {"morph", "blend", std::uint8_t(1)},
    {"morph", "frame", std::nullopt},
    {"fileTexture", "framesPerSecond", 0.0},
    {"embeddedTexture", "alignment", std::uint8_t(1)},
    {"embeddedTexture", "depth", std::int32_t(1)},
    {"embeddedTexture", "type", std::nullopt},
    {"embeddedTexture", "format", std::nullopt},
};

} // namespace scene_tests

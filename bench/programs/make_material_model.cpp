// Writes a binary glTF for the material benchmark: many materials, each with
// a base-colour image file of its own and a normal map taken from a few large
// images held in the file, so every embedded image is shared by many
// materials.
//
//   make_material_model <out.glb> <materials> <embedded images> <image bytes>
//
// Every material is used by a one-triangle primitive (assimp reads only the
// materials that primitives use). The embedded images are filler bytes
// labelled image/png: assimp keeps them as compressed images and never
// decodes them.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace {

void append(std::vector<std::uint8_t>& out, const void* data, std::size_t size) {
    const auto* bytes = static_cast<const std::uint8_t*>(data);
    out.insert(out.end(), bytes, bytes + size);
}

void pad(std::vector<std::uint8_t>& out, std::uint8_t with) {
    while (out.size() % 4)
        out.push_back(with);
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 5) {
        std::fprintf(stderr, "usage: %s <out.glb> <materials> <embedded images> <image bytes>\n",
                     argv[0]);
        return 2;
    }
    const unsigned materials = unsigned(std::strtoul(argv[2], nullptr, 10));
    const unsigned images = unsigned(std::strtoul(argv[3], nullptr, 10));
    const std::size_t imageBytes = std::strtoull(argv[4], nullptr, 10);
    if (materials == 0 || images == 0 || imageBytes < 8) {
        std::fputs("make_material_model: need materials, images and at least 8 bytes each\n",
                   stderr);
        return 2;
    }

    std::vector<std::uint8_t> bin;
    const float triangle[] = {0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 1};
    append(bin, triangle, sizeof triangle);
    std::string views = R"({"buffer":0,"byteOffset":0,"byteLength":36},)"
                        R"({"buffer":0,"byteOffset":36,"byteLength":24})";
    std::string imageList, textureList;
    for (unsigned i = 0; i < images; ++i) {
        const std::size_t offset = bin.size();
        const std::uint8_t signature[] = {0x89, 'P', 'N', 'G', '\r', '\n', 0x1A, '\n'};
        append(bin, signature, sizeof signature);
        for (std::size_t b = sizeof signature; b < imageBytes; ++b)
            bin.push_back(std::uint8_t(b * 31 + i));
        pad(bin, 0);
        views += ",{\"buffer\":0,\"byteOffset\":" + std::to_string(offset) +
                 ",\"byteLength\":" + std::to_string(imageBytes) + "}";
        imageList.append(i ? "," : "").append("{\"bufferView\":").append(std::to_string(2 + i));
        imageList.append(",\"mimeType\":\"image/png\"}");
    }
    std::string primitives, materialList;
    for (unsigned m = 0; m < materials; ++m) {
        const std::string n = std::to_string(m);
        const char* comma = m ? "," : "";
        imageList.append(",{\"uri\":\"textures/color_").append(n).append(".png\"}");
        textureList.append(comma).append("{\"source\":").append(std::to_string(images + m));
        textureList.append("}");
        primitives.append(comma).append(R"({"attributes":{"POSITION":0,"TEXCOORD_0":1},)");
        primitives.append("\"material\":").append(n).append("}");
        materialList.append(comma).append("{\"name\":\"material_").append(n);
        materialList.append(R"(","pbrMetallicRoughness":{"baseColorTexture":{"index":)");
        materialList.append(n).append(R"(},"metallicFactor":0.5,"roughnessFactor":0.5},)");
        materialList.append(R"("normalTexture":{"index":)");
        materialList.append(std::to_string(materials + m % images)).append("}}");
    }
    for (unsigned i = 0; i < images; ++i)
        textureList += ",{\"source\":" + std::to_string(i) + "}";

    std::string json =
        R"({"asset":{"version":"2.0"},"scene":0,"scenes":[{"nodes":[0]}],"nodes":[{"mesh":0}],)"
        R"("meshes":[{"primitives":[)" +
        primitives + "]}]," + R"("buffers":[{"byteLength":)" + std::to_string(bin.size()) +
        "}],\"bufferViews\":[" + views + "]," +
        R"("accessors":[{"bufferView":0,"componentType":5126,"count":3,"type":"VEC3",)"
        R"("min":[0,0,0],"max":[1,1,0]},{"bufferView":1,"componentType":5126,"count":3,)"
        R"("type":"VEC2"}],"images":[)" +
        imageList + "],\"textures\":[" + textureList + "],\"materials\":[" + materialList + "]}";
    while (json.size() % 4)
        json += ' ';

    std::vector<std::uint8_t> glb;
    const std::uint32_t header[] = {0x46546C67, 2,
                                    std::uint32_t(12 + 8 + json.size() + 8 + bin.size())};
    append(glb, header, sizeof header);
    const std::uint32_t jsonChunk[] = {std::uint32_t(json.size()), 0x4E4F534A};
    append(glb, jsonChunk, sizeof jsonChunk);
    append(glb, json.data(), json.size());
    const std::uint32_t binChunk[] = {std::uint32_t(bin.size()), 0x004E4942};
    append(glb, binChunk, sizeof binChunk);
    append(glb, bin.data(), bin.size());

    std::FILE* out = std::fopen(argv[1], "wb");
    if (!out || std::fwrite(glb.data(), 1, glb.size(), out) != glb.size() || std::fclose(out)) {
        std::fprintf(stderr, "make_material_model: cannot write '%s'\n", argv[1]);
        return 1;
    }
    std::printf("%s: %u materials, %u textures, %u embedded images of %zu bytes\n", argv[1],
                materials, 2 * materials, images, imageBytes);
    return 0;
}

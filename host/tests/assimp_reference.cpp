// assimp's own answer for the corpus sweep, independent of the host and the
// module: reads MODEL with Assimp::Importer::ReadFile and the importer's
// default flag word (structure validation included), and answers 0 when assimp returns a scene with
// a root node, 1 otherwise.
//
// Given the host's JSON document as well, it checks the document: it must
// parse, and when it holds "mesh" objects, the meshes referenced by assimp's
// nodes must appear in it once each with assimp's vertex and face counts
// (arrays the shared-array pool replaced by links are followed).
//
//   assimp-reference MODEL [DOCUMENT.json]
//   exit 0 read (and the document matches), 1 assimp rejects MODEL,
//        4 mesh counts differ, 5 the document does not parse, 2 usage
//
// It links nothing of the project and is built without the sanitizers, so
// it can run under an address-space cap.
#include <assimp/Importer.hpp>
#include <assimp/postprocess.h>
#include <assimp/scene.h>
#include <rapidjson/document.h>
#include <rapidjson/error/en.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <set>
#include <sstream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace {

// What the importer asks of assimp with every option at its default.
constexpr unsigned defaultFlags = aiProcess_JoinIdenticalVertices | aiProcess_GenSmoothNormals |
                                  aiProcess_FindInstances | aiProcess_ValidateDataStructure;
static_assert(defaultFlags == 0x100442);

// ASSIMP_REFERENCE_FLAGS (a number, 0x for hex) replaces the flag word, to
// compare the corpus under other options.
unsigned readFlags() {
    const char* text = std::getenv("ASSIMP_REFERENCE_FLAGS");
    return text && *text ? unsigned(std::strtoul(text, nullptr, 0)) : defaultFlags;
}

// The rejections of the structure check that the importer tolerates: a
// scene without meshes, a point cloud, an empty mesh, a light or camera
// without a node, a hole in the node tree.
bool tolerable(std::string_view reason) {
    for (std::string_view text :
         {"aiScene::mNumMeshes is 0", "contains no faces", "contains no vertices",
          "has no corresponding node in the scene graph", "A node of the scene-graph is nullptr"})
        if (reason.find(text) != std::string_view::npos)
            return true;
    return false;
}

using Counts = std::pair<std::uint64_t, std::uint64_t>; // vertices, faces
using Value = rapidjson::Value;

void collectMeshes(const aiNode* node, std::set<unsigned>& used, int depth = 0) {
    if (!node || depth > 10000)
        return;
    for (unsigned i = 0; i < node->mNumMeshes; ++i)
        used.insert(node->mMeshes[i]);
    for (unsigned i = 0; i < node->mNumChildren; ++i)
        collectMeshes(node->mChildren[i], used, depth + 1);
}

// The document's structure: { "type": { "attribute^type": value, ... }, ... };
// an attribute array is an object with one member per item; a link is
// [kind, value, ...] with kinds 0 object (name or id), 1 member, 2 item,
// 3 component.
class Document {
public:
    explicit Document(const Value& root) : m_root(root) {}

    const Value* attribute(const Value& object, std::string_view name, int hops = 0) const {
        if (!object.IsObject() || hops > 64)
            return nullptr;
        for (auto m = object.MemberBegin(); m != object.MemberEnd(); ++m) {
            std::string_view key(m->name.GetString(), m->name.GetStringLength());
            const std::size_t caret = key.rfind('^');
            if (caret == std::string_view::npos || key.substr(0, caret) != name)
                continue;
            if (key.substr(caret + 1) == "link")
                return follow(m->value, hops + 1);
            return &m->value;
        }
        return nullptr;
    }

    std::vector<const Value*> objectsOfType(std::string_view type) const {
        std::vector<const Value*> out;
        for (auto m = m_root.MemberBegin(); m != m_root.MemberEnd(); ++m)
            if (std::string_view(m->name.GetString(), m->name.GetStringLength()) == type)
                out.push_back(&m->value);
        return out;
    }

private:
    const Value* objectNamed(const Value& key) const {
        std::size_t index = 0;
        for (auto m = m_root.MemberBegin(); m != m_root.MemberEnd(); ++m, ++index) {
            if (key.IsUint() && index == key.GetUint())
                return &m->value;
            if (!key.IsString())
                continue;
            const Value* name = attribute(m->value, "name");
            if (name && name->IsString() && std::string_view(name->GetString()) == key.GetString())
                return &m->value;
        }
        return nullptr;
    }

    const Value* follow(const Value& link, int hops) const {
        if (!link.IsArray() || link.Size() % 2)
            return nullptr;
        const Value* at = nullptr;
        for (rapidjson::SizeType i = 0; i + 1 < link.Size(); i += 2) {
            if (!link[i].IsUint())
                return nullptr;
            const Value& step = link[i + 1];
            switch (link[i].GetUint()) {
            case 0:
                at = objectNamed(step);
                break;
            case 1:
                at = at && step.IsString() ? attribute(*at, step.GetString(), hops) : nullptr;
                break;
            case 2:
                at = at ? item(*at, step) : nullptr;
                break;
            default:
                return at;
            }
            if (!at)
                return nullptr;
        }
        return at;
    }

    static const Value* item(const Value& array, const Value& index) {
        if (!index.IsUint())
            return nullptr;
        if (array.IsArray())
            return index.GetUint() < array.Size() ? &array[index.GetUint()] : nullptr;
        if (!array.IsObject() || index.GetUint() >= array.MemberCount())
            return nullptr;
        return &(array.MemberBegin() + index.GetUint())->value;
    }

    const Value& m_root;
};

std::uint64_t itemCount(const Value* value) {
    if (!value)
        return 0;
    if (value->IsArray())
        return value->Size();
    if (value->IsObject())
        return value->MemberCount();
    return 1;
}

std::uint64_t faceCount(const Document& doc, const Value& mesh) {
    const std::uint64_t indexTotal = itemCount(doc.attribute(mesh, "indices"));
    const Value* primitives = doc.attribute(mesh, "primitives");
    if (!primitives || !primitives->IsObject())
        return 0;
    std::uint64_t faces = 0;
    for (auto p = primitives->MemberBegin(); p != primitives->MemberEnd(); ++p) {
        const Value* vcounts = doc.attribute(p->value, "vcounts");
        if (!vcounts)
            continue;
        if (vcounts->IsArray()) {
            faces += vcounts->Size();
        } else if (vcounts->IsUint() && vcounts->GetUint() > 0) {
            const Value* range = doc.attribute(p->value, "indexCount");
            const std::uint64_t indices = range && range->IsUint() ? range->GetUint() : indexTotal;
            faces += indices / vcounts->GetUint();
        }
    }
    return faces;
}

int checkDocument(const char* path, const aiScene& scene) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    const std::string json = text.str();
    rapidjson::Document parsed;
    parsed.Parse<rapidjson::kParseNanAndInfFlag>(json.c_str(), json.size());
    if (parsed.HasParseError() || !parsed.IsObject()) {
        std::fprintf(stderr, "%s: JSON error at %zu: %s\n", path, parsed.GetErrorOffset(),
                     rapidjson::GetParseError_En(parsed.GetParseError()));
        return 5;
    }
    const Document doc(parsed);
    const std::vector<const Value*> meshes = doc.objectsOfType("mesh");
    if (meshes.empty()) {
        std::puts("meshes: none in the document, not compared");
        return 0;
    }
    std::set<unsigned> used;
    collectMeshes(scene.mRootNode, used);
    std::vector<Counts> expected, found;
    for (unsigned index : used)
        if (index < scene.mNumMeshes)
            expected.emplace_back(scene.mMeshes[index]->mNumVertices,
                                  scene.mMeshes[index]->mNumFaces);
    for (const Value* mesh : meshes)
        found.emplace_back(itemCount(doc.attribute(*mesh, "positions")), faceCount(doc, *mesh));
    std::sort(expected.begin(), expected.end());
    std::sort(found.begin(), found.end());
    if (expected == found) {
        std::printf("meshes: %zu match\n", found.size());
        return 0;
    }
    std::vector<Counts> missing, extra;
    std::set_difference(expected.begin(), expected.end(), found.begin(), found.end(),
                        std::back_inserter(missing));
    std::set_difference(found.begin(), found.end(), expected.begin(), expected.end(),
                        std::back_inserter(extra));
    std::printf("meshes: %zu expected, %zu found", expected.size(), found.size());
    for (const auto& [v, f] : missing)
        std::printf("; missing %llu/%llu", (unsigned long long)v, (unsigned long long)f);
    for (const auto& [v, f] : extra)
        std::printf("; unexpected %llu/%llu", (unsigned long long)v, (unsigned long long)f);
    std::puts("");
    return 4;
}

} // namespace

int main(int argc, char** argv) {
    if (argc < 2 || argc > 3) {
        std::fputs("usage: assimp-reference MODEL [DOCUMENT.json]\n", stderr);
        return 2;
    }
    try {
        Assimp::Importer importer;
        const unsigned flags = readFlags();
        const aiScene* scene = importer.ReadFile(argv[1], flags);
        // The importer reads again without the structure check when it
        // rejects a shape that valid files have; so does the reference.
        Assimp::Importer unchecked;
        if (!scene && (flags & aiProcess_ValidateDataStructure) &&
            tolerable(importer.GetErrorString()))
            scene = unchecked.ReadFile(argv[1], flags & ~aiProcess_ValidateDataStructure);
        if (!scene || !scene->mRootNode)
            return 1;
        return argc == 3 ? checkDocument(argv[2], *scene) : 0;
    } catch (const std::bad_alloc&) {
        // An allocation cap hit counts as a rejection, as assimp's own would.
        return 1;
    } catch (const std::exception& e) {
        std::fprintf(stderr, "assimp-reference: %s\n", e.what());
        return 1;
    }
}

#include "texture_extract.h"

#include "b_attrib_map.h"
#include "b_format.h"
#include "scene_schema.h"

#include <png.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <string_view>

namespace host {

namespace {

namespace names = scene::names;
using Bytes = base::ArrayOf<std::uint8_t>;

// The bytes an attribute shows (through the link the importer stores), or null.
const base::Attribute* imageBytes(const base::IPlugin& texture, base::name_id name) {
    if (!texture.findInherited(name))
        return nullptr;
    return texture.findOfType(name, base::TypeTraits<std::uint8_t>::n_array_name, true);
}

// A file name that stays inside the folder: separators and a leading dot
// become '_'.
base::string safeFileName(std::string_view name) {
    base::string out(name.empty() ? std::string_view("texture") : name);
    for (char& c : out)
        if (c == '/' || c == '\\' || c == '\0')
            c = '_';
    if (out.front() == '.')
        out.front() = '_';
    return out;
}

// 'wanted', or wanted with "-1", "-2"... before its extension when a file of
// this run already has that name.
base::string freeName(const base::string& wanted, std::set<base::string>& taken) {
    base::string name = wanted;
    const std::size_t dot = wanted.rfind('.');
    const std::string_view stem(wanted.data(), dot == base::string::npos ? wanted.size() : dot);
    const std::string_view extension =
        dot == base::string::npos ? std::string_view() : std::string_view(wanted).substr(dot);
    for (unsigned n = 1; !taken.insert(name).second; ++n)
        name = base::format("{}-{}{}", stem, n, extension);
    return name;
}

bool writeFile(const std::filesystem::path& path, const Bytes& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
    return bool(out);
}

// Raw texels are stored b, g, r, a per texel, as the model held them.
bool writePng(const std::filesystem::path& path, std::uint32_t width, std::uint32_t height,
              const Bytes& texels, base::string& error) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    image.width = width;
    image.height = height;
    image.format = PNG_FORMAT_BGRA;
    const bool ok =
        png_image_write_to_file(&image, path.c_str(), 0, texels.data(), 0, nullptr) != 0;
    if (!ok)
        error = base::format("{}: {}", path.string(), image.message);
    png_image_free(&image);
    return ok;
}

} // namespace

ExtractResult extractTextures(const base::PluginFactory& factory, const base::string& folder) {
    ExtractResult result;
    std::error_code failure;
    std::filesystem::create_directories(folder.c_str(), failure);
    if (failure) {
        result.error = base::format("cannot create '{}': {}", folder, failure.message());
        ++result.failed;
        return result;
    }
    std::set<const base::Attribute*> seen;
    std::set<base::string> taken;
    for (std::uint32_t id = 0; id < factory.pluginCount(); ++id) {
        const base::ref<base::IPlugin> texture = factory.plugin(id);
        if (!texture)
            continue;
        const bool raw = texture->className() == names::embeddedTexture;
        if (!raw && texture->className() != names::fileTexture)
            continue;
        const base::Attribute* bytes =
            imageBytes(*texture, raw ? names::pixelData : names::embeddedFile);
        if (!bytes || !seen.insert(bytes).second)
            continue;
        const Bytes& data = *static_cast<const Bytes*>(bytes->data());

        base::string error;
        bool ok = false;
        base::string name;
        if (raw) {
            const std::uint32_t* width = texture->findAttribute<std::uint32_t>(names::width);
            const std::uint32_t* height = texture->findAttribute<std::uint32_t>(names::height);
            name = freeName(safeFileName(texture->name()) + ".png", taken);
            if (!width || !height || *width == 0 || *height == 0 ||
                std::uint64_t(*width) * *height * 4 != data.size())
                error = base::format("{}: the texels do not match the image size", name);
            else
                ok = writePng(std::filesystem::path(folder.c_str()) / name.c_str(), *width, *height,
                              data, error);
        } else {
            const base::string* file = texture->findAttribute<base::string>(names::file);
            name = freeName(safeFileName(file ? std::string_view(*file) : texture->name()), taken);
            ok = writeFile(std::filesystem::path(folder.c_str()) / name.c_str(), data);
            if (!ok)
                error = base::format("cannot write '{}'", name);
        }
        if (ok) {
            ++result.written;
            result.files.push_back(name);
        } else {
            ++result.failed;
            if (result.error.empty())
                result.error = error;
        }
    }
    return result;
}

base::CmdLineValue<base::string>* registerExtractTextures(base::CmdLineOptions& options) {
    return options.addValue<base::string>(
        "--extract-textures", {},
        "Write every image the model carries inside itself to this folder: compressed images "
        "as they are, raw texels as PNG.");
}

int runExtractTextures(const base::CmdLineValue<base::string>* option,
                       const base::PluginFactory& factory, std::FILE* report) {
    if (!option || !option->isSet())
        return 0;
    const base::string& folder = option->value();
    const ExtractResult result = extractTextures(factory, folder);
    std::fprintf(report, "extract-textures: %u images written to %s", result.written,
                 folder.c_str());
    if (result.failed)
        std::fprintf(report, ", %u failed (%s)", result.failed, result.error.c_str());
    std::fputs("\n", report);
    return result.failed ? 1 : 0;
}

} // namespace host

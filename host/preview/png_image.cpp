#include "png_image.h"

#include <png.h>

namespace host::preview {

namespace {

constexpr std::uint64_t maxPixels = std::uint64_t(1) << 26;

// The simplified API keeps its state in 'image'; this frees it on every path.
struct PngImage {
    png_image image{};
    PngImage() { image.version = PNG_IMAGE_VERSION; }
    ~PngImage() { png_image_free(&image); }
    bool fail(base::string& error) const {
        error = image.message[0] ? image.message : "libpng failed";
        return false;
    }
};

} // namespace

bool encodePng(const RgbImage& image, base::vector<std::uint8_t>& png, base::string& error) {
    if (image.rgb.size() != std::size_t(image.width) * image.height * 3 || !image.width ||
        !image.height) {
        error = "the image has no pixels";
        return false;
    }
    PngImage out;
    out.image.width = image.width;
    out.image.height = image.height;
    out.image.format = PNG_FORMAT_RGB;
    const png_int_32 stride = png_int_32(image.width * 3);
    png_alloc_size_t size = 0;
    // The first call measures, the second writes.
    if (!png_image_write_to_memory(&out.image, nullptr, &size, 0, image.rgb.data(), stride,
                                   nullptr))
        return out.fail(error);
    png.resize(size);
    if (!png_image_write_to_memory(&out.image, png.data(), &size, 0, image.rgb.data(), stride,
                                   nullptr))
        return out.fail(error);
    png.resize(size);
    return true;
}

bool decodePng(std::span<const std::uint8_t> png, RgbImage& image, base::string& error) {
    PngImage in;
    if (!png_image_begin_read_from_memory(&in.image, png.data(), png.size()))
        return in.fail(error);
    // A header may claim any size; a preview never needs more than this.
    if (std::uint64_t(in.image.width) * in.image.height > maxPixels) {
        error = "the image is too large";
        return false;
    }
    in.image.format = PNG_FORMAT_RGB;
    image.width = in.image.width;
    image.height = in.image.height;
    image.rgb.resize(PNG_IMAGE_SIZE(in.image));
    png_color black{0, 0, 0};
    if (!png_image_finish_read(&in.image, &black, image.rgb.data(), 0, nullptr))
        return in.fail(error);
    return true;
}

} // namespace host::preview

// A small software rasteriser for preview images: depth-buffered, flat-shaded
// triangles seen through a pinhole camera, lit by one directional light plus
// ambient, with a dark outline where an object meets the background or
// another object.
//
// Geometry is given a mesh at a time: setVertices() moves the positions into
// the camera's space once, then triangle() draws faces by their corner
// indices. Nothing is kept per triangle, so memory depends on the image and
// the largest vertex array, never on the triangle count. Bad input (indices
// out of range, NaN or infinite positions, faces of zero area, faces behind
// the camera) draws nothing; faces seen from behind are drawn like front
// faces, since imported models often have mixed or mirrored winding.
#pragma once

#include "b_math.h"
#include "b_memory.h"

#include <cstdint>
#include <span>

namespace host::preview {

// A camera looking along its local -Z with +Y up; 'toCamera' holds the
// camera's x, y and z axes in world space as its rows.
struct View {
    base::vec3d eye{0, 0, 0};
    base::mat33d toCamera = base::mat33d::identity();
    // Distance of the image plane in pixels: half the image height over the
    // tangent of half the vertical field of view.
    double focal = 1;
    // Anything nearer than this (along the view direction) is clipped away.
    double nearDistance = 1e-3;
};

struct RasterStats {
    std::uint64_t triangles = 0; // faces that reached the screen
    std::uint64_t skipped = 0;   // faces refused: bad index, NaN, zero area, behind the camera
    std::uint64_t pixelsTested = 0;
    std::uint64_t pixelsWritten = 0;
};

class Raster {
public:
    Raster(std::uint32_t width, std::uint32_t height, const View& view,
           const base::vec3f& background);

    std::uint32_t width() const noexcept { return m_width; }
    std::uint32_t height() const noexcept { return m_height; }
    const View& view() const noexcept { return m_view; }

    // Moves 'positions' through 'toWorld' and the view; later triangle() calls
    // index this array.
    void setVertices(std::span<const base::vec3f> positions, const base::mat43& toWorld);
    // One face of the current vertices in a linear RGB colour (0..1);
    // 'object' tells objects apart for the outline (0 is reserved).
    void triangle(std::uint32_t a, std::uint32_t b, std::uint32_t c, const base::vec3f& color,
                  std::uint32_t object);
    // Points and line segments of the current vertices, one pixel wide (points
    // three in images of 256 pixels or more) and unlit; they get no outline.
    void point(std::uint32_t a, const base::vec3f& color, std::uint32_t object);
    void line(std::uint32_t a, std::uint32_t b, const base::vec3f& color, std::uint32_t object);
    // A square dot of 'radius' pixels around a world point, depth-tested.
    void dot(const base::vec3d& world, int radius, const base::vec3f& color, std::uint32_t object);
    // Darkens the outline pixels; call once after drawing.
    void finish();

    // 8-bit sRGB, three bytes per pixel, rows top to bottom.
    const base::vector<std::uint8_t>& pixels() const noexcept { return m_rgb; }
    bool covered(std::uint32_t x, std::uint32_t y) const noexcept {
        return m_object[std::size_t(y) * m_width + x] != 0;
    }
    const RasterStats& stats() const noexcept { return m_stats; }

private:
    // A vertex in camera space with its screen position and inverse depth.
    struct Vertex {
        float x, y, z;
        float sx, sy, iz;
    };
    struct ScreenPoint {
        double x, y, iz;
    };

    Vertex project(const base::vec3d& world) const noexcept;
    ScreenPoint toScreen(double x, double y, double depth) const noexcept;
    void fill(ScreenPoint a, ScreenPoint b, ScreenPoint c, const std::uint8_t* rgb,
              std::uint32_t object);
    // Corner coordinates in units of 1/'one' pixel.
    template <class T>
    void scan(T (&x)[3], T (&y)[3], double (&iz)[3], T one, const std::uint8_t* rgb,
              std::uint32_t object);
    void shade(const Vertex& a, const Vertex& b, const Vertex& c, const base::vec3f& color,
               std::uint8_t* rgb) const noexcept;
    // The pixels within 'radius' of a projected vertex.
    void square(const Vertex& v, int radius, const std::uint8_t* rgb, std::uint32_t object);
    // Writes pixel 'index' when 'depth' is nearer than what it holds.
    void plotAt(std::size_t index, float depth, const std::uint8_t* rgb, std::uint32_t object);
    void segment(ScreenPoint a, ScreenPoint b, const std::uint8_t* rgb, std::uint32_t object);

    std::uint32_t m_width, m_height;
    View m_view;
    base::vec3f m_light;
    base::vector<std::uint8_t> m_rgb;
    base::vector<float> m_depth; // inverse depth; 0 is infinitely far
    base::vector<std::uint32_t> m_object;
    base::vector<Vertex> m_vertices;
    RasterStats m_stats;
};

// Linear 0..1 to 8-bit sRGB, clamped; NaN gives 0.
std::uint8_t toSrgb8(float linear) noexcept;

} // namespace host::preview

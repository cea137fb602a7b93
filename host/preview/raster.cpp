#include "raster.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace host::preview {

namespace {

constexpr float ambient = 0.25f;
constexpr float diffuse = 0.75f;
// Outline pixels keep this share of their colour.
constexpr unsigned outlineShare = 77; // of 256
// Marks the objects of points and lines, which take no outline.
constexpr std::uint32_t thinObject = 0x80000000u;

bool finite(float x, float y, float z) noexcept {
    return std::isfinite(x) && std::isfinite(y) && std::isfinite(z);
}

// Twice the signed area of (a, b, p); positive when p lies left of a->b in a
// y-up frame, which on screen (y down) means right of it.
double edge(double ax, double ay, double bx, double by, double px, double py) noexcept {
    return (bx - ax) * (py - ay) - (by - ay) * (px - ax);
}

// Pixels exactly on an edge shared by two faces go to exactly one of them: the
// one whose inside lies in the chosen half-plane of the edge's normal.
bool ownsEdge(double ax, double ay, double bx, double by) noexcept {
    const double nx = -(by - ay), ny = bx - ax;
    return nx > 0 || (nx == 0 && ny > 0);
}

int clampPixel(double v, std::uint32_t limit) noexcept {
    if (!(v > -1))
        return -1;
    if (v > double(limit))
        return int(limit);
    return int(v);
}

} // namespace

std::uint8_t toSrgb8(float linear) noexcept {
    // 4096 steps keep every 8-bit output reachable; the table is built once.
    static const std::array<std::uint8_t, 4097> table = [] {
        std::array<std::uint8_t, 4097> t{};
        for (std::size_t i = 0; i < t.size(); ++i) {
            const double l = double(i) / 4096.0;
            const double s = l <= 0.0031308 ? 12.92 * l : 1.055 * std::pow(l, 1 / 2.4) - 0.055;
            t[i] = std::uint8_t(std::lround(std::clamp(s, 0.0, 1.0) * 255));
        }
        return t;
    }();
    if (!(linear > 0))
        return 0;
    if (linear >= 1)
        return 255;
    return table[std::size_t(linear * 4096.0f + 0.5f)];
}

Raster::Raster(std::uint32_t width, std::uint32_t height, const View& view,
               const base::vec3f& background)
    : m_width(width), m_height(height), m_view(view),
      m_light(base::vec3f{0.35f, 0.6f, 0.72f}.normalized()) {
    const std::size_t count = std::size_t(width) * height;
    m_rgb.resize(count * 3);
    const std::uint8_t bg[3] = {toSrgb8(background.x), toSrgb8(background.y),
                                toSrgb8(background.z)};
    for (std::size_t i = 0; i < count; ++i)
        std::copy(bg, bg + 3, m_rgb.data() + i * 3);
    m_depth.assign(count, 0.0f);
    m_object.assign(count, 0);
}

Raster::ScreenPoint Raster::toScreen(double x, double y, double depth) const noexcept {
    return {0.5 * m_width + m_view.focal * x / depth, 0.5 * m_height - m_view.focal * y / depth,
            1.0 / depth};
}

Raster::Vertex Raster::project(const base::vec3d& world) const noexcept {
    const base::vec3d p = m_view.toCamera * (world - m_view.eye);
    Vertex v{float(p.x), float(p.y), float(p.z), 0, 0, 0};
    if (!finite(v.x, v.y, v.z)) {
        v.z = NAN;
        return v;
    }
    if (-double(v.z) >= m_view.nearDistance) {
        const ScreenPoint s = toScreen(v.x, v.y, -double(v.z));
        v.sx = float(s.x);
        v.sy = float(s.y);
        v.iz = float(s.iz);
    }
    return v;
}

void Raster::setVertices(std::span<const base::vec3f> positions, const base::mat43& toWorld) {
    m_vertices.resize(positions.size());
    for (std::size_t i = 0; i < positions.size(); ++i) {
        const base::vec3f& p = positions[i];
        m_vertices[i] = project(toWorld.transformPoint({p.x, p.y, p.z}));
    }
}

void Raster::shade(const Vertex& a, const Vertex& b, const Vertex& c, const base::vec3f& color,
                   std::uint8_t* rgb) const noexcept {
    const base::vec3d ab{double(b.x) - a.x, double(b.y) - a.y, double(b.z) - a.z};
    const base::vec3d ac{double(c.x) - a.x, double(c.y) - a.y, double(c.z) - a.z};
    base::vec3d n{ab.y * ac.z - ab.z * ac.y, ab.z * ac.x - ab.x * ac.z, ab.x * ac.y - ab.y * ac.x};
    // Seen from behind: light the side the camera sees.
    if (n.x * a.x + n.y * a.y + n.z * a.z > 0)
        n = -n;
    const double length = n.length();
    const double facing = (n.x * m_light.x + n.y * m_light.y + n.z * m_light.z) / length;
    const float light = ambient + diffuse * float(std::max(0.0, facing));
    rgb[0] = toSrgb8(color.x * light);
    rgb[1] = toSrgb8(color.y * light);
    rgb[2] = toSrgb8(color.z * light);
}

void Raster::triangle(std::uint32_t ia, std::uint32_t ib, std::uint32_t ic,
                      const base::vec3f& color, std::uint32_t object) {
    const std::size_t count = m_vertices.size();
    if (ia >= count || ib >= count || ic >= count || object == 0) {
        ++m_stats.skipped;
        return;
    }
    const Vertex& a = m_vertices[ia];
    const Vertex& b = m_vertices[ib];
    const Vertex& c = m_vertices[ic];
    if (std::isnan(a.z) || std::isnan(b.z) || std::isnan(c.z)) {
        ++m_stats.skipped;
        return;
    }
    const float limit = float(-m_view.nearDistance);
    const int inFront = int(a.z <= limit) + int(b.z <= limit) + int(c.z <= limit);
    if (inFront == 0) {
        ++m_stats.skipped;
        return;
    }
    // A face of zero area has no normal and covers no pixel.
    const double cross = std::abs(edge(a.x, a.y, b.x, b.y, c.x, c.y)) +
                         std::abs(edge(a.y, a.z, b.y, b.z, c.y, c.z)) +
                         std::abs(edge(a.z, a.x, b.z, b.x, c.z, c.x));
    if (!(cross > 0) || !std::isfinite(cross)) {
        ++m_stats.skipped;
        return;
    }
    std::uint8_t rgb[3];
    shade(a, b, c, color, rgb);
    ++m_stats.triangles;

    if (inFront == 3) {
        fill({a.sx, a.sy, a.iz}, {b.sx, b.sy, b.iz}, {c.sx, c.sy, c.iz}, rgb, object);
        return;
    }
    // Cut the face at the near plane: one or two corners stay, giving a
    // triangle or a quadrilateral.
    const Vertex* corners[3] = {&a, &b, &c};
    ScreenPoint polygon[4];
    int n = 0;
    for (int i = 0; i < 3; ++i) {
        const Vertex& p = *corners[i];
        const Vertex& q = *corners[(i + 1) % 3];
        const bool pIn = p.z <= limit, qIn = q.z <= limit;
        if (pIn)
            polygon[n++] = {p.sx, p.sy, p.iz};
        if (pIn != qIn) {
            const double t = (double(limit) - p.z) / (double(q.z) - p.z);
            polygon[n++] = toScreen(p.x + t * (double(q.x) - p.x), p.y + t * (double(q.y) - p.y),
                                    -double(limit));
        }
    }
    for (int i = 1; i + 1 < n; ++i)
        fill(polygon[0], polygon[i], polygon[i + 1], rgb, object);
}

void Raster::fill(ScreenPoint a, ScreenPoint b, ScreenPoint c, const std::uint8_t* rgb,
                  std::uint32_t object) {
    double iz[3] = {a.iz, b.iz, c.iz};
    const ScreenPoint* corners[3] = {&a, &b, &c};
    // Snapped to 1/256 pixel, edge functions are exact integers, so faces that
    // share an edge neither overlap nor leave a crack. Corners far outside the
    // image (big faces cut at the near plane) would overflow: doubles then.
    constexpr double snapLimit = double(1 << 20);
    bool snap = true;
    for (const ScreenPoint* p : corners)
        snap = snap && std::abs(p->x) < snapLimit && std::abs(p->y) < snapLimit;
    if (snap) {
        std::int64_t x[3], y[3];
        for (int k = 0; k < 3; ++k) {
            x[k] = std::llround(corners[k]->x * 256);
            y[k] = std::llround(corners[k]->y * 256);
        }
        scan<std::int64_t>(x, y, iz, 256, rgb, object);
    } else {
        double x[3] = {a.x, b.x, c.x}, y[3] = {a.y, b.y, c.y};
        scan<double>(x, y, iz, 1, rgb, object);
    }
}

template <class T>
void Raster::scan(T (&x)[3], T (&y)[3], double (&iz)[3], T one, const std::uint8_t* rgb,
                  std::uint32_t object) {
    auto edgeOf = [](T ax, T ay, T bx, T by, T px, T py) {
        return (bx - ax) * (py - ay) - (by - ay) * (px - ax);
    };
    T area = edgeOf(x[0], y[0], x[1], y[1], x[2], y[2]);
    if (area < 0) {
        std::swap(x[1], x[2]);
        std::swap(y[1], y[2]);
        std::swap(iz[1], iz[2]);
        area = -area;
    }
    if (!(area > 0) || !std::isfinite(double(area)))
        return;
    // Pixel k's centre lies at k * one + half.
    const T half = one / 2;
    auto first = [&](const T(&v)[3], std::uint32_t limit) {
        return std::max(0,
                        clampPixel(std::ceil((double(std::min({v[0], v[1], v[2]})) - double(half)) /
                                             double(one)),
                                   limit));
    };
    auto last = [&](const T(&v)[3], std::uint32_t limit) {
        return std::min(
            int(limit) - 1,
            clampPixel(
                std::floor((double(std::max({v[0], v[1], v[2]})) - double(half)) / double(one)),
                limit));
    };
    const int x0 = first(x, m_width), x1 = last(x, m_width);
    const int y0 = first(y, m_height), y1 = last(y, m_height);
    if (x0 > x1 || y0 > y1)
        return;

    // Edge i is the one opposite corner i; its function is that corner's weight.
    static constexpr int from[3] = {1, 2, 0}, to[3] = {2, 0, 1};
    T stepX[3], stepY[3], start[3];
    bool owns[3];
    const T px = T(x0) * one + half, py = T(y0) * one + half;
    for (int i = 0; i < 3; ++i) {
        const int f = from[i], t = to[i];
        stepX[i] = -(y[t] - y[f]) * one;
        stepY[i] = (x[t] - x[f]) * one;
        start[i] = edgeOf(x[f], y[f], x[t], y[t], px, py);
        owns[i] = ownsEdge(double(x[f]), double(y[f]), double(x[t]), double(y[t]));
    }
    const double scale = 1 / double(area);
    const double za = iz[0] * scale, zb = iz[1] * scale, zc = iz[2] * scale;

    m_stats.pixelsTested += std::uint64_t(x1 - x0 + 1) * std::uint64_t(y1 - y0 + 1);
    for (int row = y0; row <= y1; ++row) {
        const T dy = T(row - y0);
        T w0 = start[0] + dy * stepY[0];
        T w1 = start[1] + dy * stepY[1];
        T w2 = start[2] + dy * stepY[2];
        std::size_t index = std::size_t(row) * m_width + std::size_t(x0);
        for (int col = x0; col <= x1;
             ++col, ++index, w0 += stepX[0], w1 += stepX[1], w2 += stepX[2]) {
            if ((w0 < 0 || (w0 == 0 && !owns[0])) || (w1 < 0 || (w1 == 0 && !owns[1])) ||
                (w2 < 0 || (w2 == 0 && !owns[2])))
                continue;
            plotAt(index, float(double(w0) * za + double(w1) * zb + double(w2) * zc), rgb, object);
        }
    }
}

void Raster::plotAt(std::size_t index, float depth, const std::uint8_t* rgb, std::uint32_t object) {
    if (!(depth > m_depth[index]))
        return;
    m_depth[index] = depth;
    m_object[index] = object;
    std::copy(rgb, rgb + 3, m_rgb.data() + index * 3);
    ++m_stats.pixelsWritten;
}

void Raster::dot(const base::vec3d& world, int radius, const base::vec3f& color,
                 std::uint32_t object) {
    const Vertex v = project(world);
    if (object == 0 || std::isnan(v.z) || -double(v.z) < m_view.nearDistance)
        return;
    const std::uint8_t rgb[3] = {toSrgb8(color.x), toSrgb8(color.y), toSrgb8(color.z)};
    square(v, radius, rgb, object);
}

void Raster::square(const Vertex& v, int radius, const std::uint8_t* rgb, std::uint32_t object) {
    const int cx = clampPixel(std::floor(v.sx), m_width),
              cy = clampPixel(std::floor(v.sy), m_height);
    for (int y = std::max(0, cy - radius); y <= std::min(int(m_height) - 1, cy + radius); ++y)
        for (int x = std::max(0, cx - radius); x <= std::min(int(m_width) - 1, cx + radius); ++x)
            plotAt(std::size_t(y) * m_width + std::size_t(x), v.iz, rgb, object);
}

void Raster::point(std::uint32_t a, const base::vec3f& color, std::uint32_t object) {
    if (a >= m_vertices.size() || object == 0) {
        ++m_stats.skipped;
        return;
    }
    const Vertex& v = m_vertices[a];
    if (std::isnan(v.z) || -double(v.z) < m_view.nearDistance || !(v.sx >= 0) || !(v.sy >= 0) ||
        v.sx >= float(m_width) || v.sy >= float(m_height)) {
        ++m_stats.skipped;
        return;
    }
    const std::uint8_t rgb[3] = {toSrgb8(color.x), toSrgb8(color.y), toSrgb8(color.z)};
    // A single pixel is hard to see in a large image.
    square(v, std::min(m_width, m_height) >= 256 ? 1 : 0, rgb, object | thinObject);
}

void Raster::line(std::uint32_t ia, std::uint32_t ib, const base::vec3f& color,
                  std::uint32_t object) {
    const std::size_t count = m_vertices.size();
    if (ia >= count || ib >= count || object == 0) {
        ++m_stats.skipped;
        return;
    }
    const Vertex& a = m_vertices[ia];
    const Vertex& b = m_vertices[ib];
    const float limit = float(-m_view.nearDistance);
    const bool aIn = a.z <= limit, bIn = b.z <= limit;
    if (std::isnan(a.z) || std::isnan(b.z) || (!aIn && !bIn)) {
        ++m_stats.skipped;
        return;
    }
    const std::uint8_t rgb[3] = {toSrgb8(color.x), toSrgb8(color.y), toSrgb8(color.z)};
    auto cut = [&](const Vertex& in, const Vertex& out) {
        const double t = (double(limit) - in.z) / (double(out.z) - in.z);
        return toScreen(in.x + t * (double(out.x) - in.x), in.y + t * (double(out.y) - in.y),
                        -double(limit));
    };
    const ScreenPoint sa = aIn ? ScreenPoint{a.sx, a.sy, a.iz} : cut(b, a);
    const ScreenPoint sb = bIn ? ScreenPoint{b.sx, b.sy, b.iz} : cut(a, b);
    segment(sa, sb, rgb, object | thinObject);
}

void Raster::segment(ScreenPoint a, ScreenPoint b, const std::uint8_t* rgb, std::uint32_t object) {
    // Each end outside the image is moved back to the border along the
    // segment, computed from the other end: an end far away cannot swamp the
    // result, and a segment across the image costs no more than its width.
    const double limits[2] = {double(m_width), double(m_height)};
    auto at = [](const ScreenPoint& p, int axis) { return axis ? p.y : p.x; };
    for (int axis = 0; axis < 2; ++axis)
        for (const double bound : {0.0, limits[axis]}) {
            auto outside = [&](const ScreenPoint& p) {
                return bound == 0 ? at(p, axis) < 0 : at(p, axis) > bound;
            };
            const bool aOut = outside(a), bOut = outside(b);
            if (aOut && bOut)
                return;
            if (!aOut && !bOut)
                continue;
            ScreenPoint& p = aOut ? a : b;
            const ScreenPoint& q = aOut ? b : a;
            const double r = (bound - at(q, axis)) / (at(p, axis) - at(q, axis));
            p = {q.x + (p.x - q.x) * r, q.y + (p.y - q.y) * r, q.iz + (p.iz - q.iz) * r};
            (axis ? p.y : p.x) = bound;
        }
    const double dx = b.x - a.x, dy = b.y - a.y;
    const double steps = std::ceil(std::max(std::abs(dx), std::abs(dy)));
    if (!std::isfinite(steps) || !std::isfinite(a.iz + b.iz))
        return;
    const int n = int(std::min(steps, limits[0] + limits[1]));
    for (int i = 0; i <= n; ++i) {
        const double t = n ? double(i) / n : 0;
        const double x = a.x + dx * t, y = a.y + dy * t;
        if (!(x >= 0 && y >= 0 && x < limits[0] && y < limits[1]))
            continue;
        plotAt(std::size_t(y) * m_width + std::size_t(x), float(a.iz + (b.iz - a.iz) * t), rgb,
               object);
    }
}

void Raster::finish() {
    // An outline pixel is a covered one beside the background, or beside a
    // nearer object: one pixel wide, on the far side of each contour.
    base::vector<std::uint32_t> outline;
    for (std::uint32_t y = 0; y < m_height; ++y)
        for (std::uint32_t x = 0; x < m_width; ++x) {
            const std::size_t index = std::size_t(y) * m_width + x;
            const std::uint32_t object = m_object[index];
            if (!object || (object & thinObject))
                continue;
            auto differs = [&](std::size_t other) {
                return m_object[other] != object &&
                       (m_object[other] == 0 || m_depth[other] > m_depth[index]);
            };
            if ((x > 0 && differs(index - 1)) || (x + 1 < m_width && differs(index + 1)) ||
                (y > 0 && differs(index - m_width)) ||
                (y + 1 < m_height && differs(index + m_width)))
                outline.push_back(std::uint32_t(index));
        }
    for (std::uint32_t index : outline)
        for (int k = 0; k < 3; ++k) {
            std::uint8_t& channel = m_rgb[std::size_t(index) * 3 + k];
            channel = std::uint8_t(channel * outlineShare / 256);
        }
}

} // namespace host::preview

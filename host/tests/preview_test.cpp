// Preview images: the rasteriser on exact cases and bad input, scenes built in
// memory (materials, textures, cameras, dots, coded indices, cycles), and the
// sample model's preview against a silhouette projected here from its JSON.
#include "b_json.h"
#include "b_log.h"
#include "b_memory.h"
#include "png_image.h"
#include "raster.h"
#include "scene_geometry.h"
#include "scene_interfaces.h"
#include "scene_preview.h"
#include "scene_schema.h"
#include "stream/b_fs.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <numbers>
#include <string>
#include <vector>

namespace {

using namespace host::preview;
using base::mat43, base::vec3d, base::vec3f, base::ref, base::IPlugin, base::PluginFactory;
using PluginRef = ref<IPlugin>;
namespace names = scene::names;

const vec3f red{1, 0, 0}, blue{0, 0, 1}, black{0, 0, 0};

// Eye at the origin looking down -Z; one world unit at depth 4 spans 16 pixels.
View straightView() {
    View view;
    view.focal = 64;
    return view;
}

// The quad x, y in [x0, x0 + side] at depth z, as two triangles over 4 vertices.
std::vector<vec3f> quad(double x0, double y0, double side, double z) {
    return {{float(x0), float(y0), float(z)},
            {float(x0 + side), float(y0), float(z)},
            {float(x0 + side), float(y0 + side), float(z)},
            {float(x0), float(y0 + side), float(z)}};
}

void drawQuad(Raster& raster, const std::vector<vec3f>& corners, vec3f color, std::uint32_t id,
              bool reversed = false) {
    raster.setVertices(corners, mat43::identity());
    if (reversed) {
        raster.triangle(0, 2, 1, color, id);
        raster.triangle(0, 3, 2, color, id);
    } else {
        raster.triangle(0, 1, 2, color, id);
        raster.triangle(0, 2, 3, color, id);
    }
}

std::size_t coveredCount(const Raster& raster) {
    std::size_t n = 0;
    for (std::uint32_t y = 0; y < raster.height(); ++y)
        for (std::uint32_t x = 0; x < raster.width(); ++x)
            n += raster.covered(x, y);
    return n;
}

const std::uint8_t* pixel(const Raster& raster, std::uint32_t x, std::uint32_t y) {
    return raster.pixels().data() + (std::size_t(y) * raster.width() + x) * 3;
}

// A pixel-aligned 16 x 16 square covers exactly 256 pixels wherever its edges
// fall between or on pixel centres: shared and boundary edges are owned once.
TEST(Raster, QuadCoversItsPixelsExactly) {
    for (double shift : {0.0, 0.25, 0.5, 0.75}) {
        for (bool reversed : {false, true}) {
            Raster raster(64, 64, straightView(), black);
            drawQuad(raster, quad(-0.5 + shift / 16, -0.5 - shift / 16, 1, -4), red, 1, reversed);
            EXPECT_EQ(coveredCount(raster), 256u) << "shift " << shift << " reversed " << reversed;
            // Inside: all pixels more than one pixel from the edge; nothing beyond one pixel out.
            for (std::uint32_t y = 0; y < 64; ++y)
                for (std::uint32_t x = 0; x < 64; ++x) {
                    const double cx = x + 0.5 - shift, cy = y + 0.5 - shift;
                    if (cx > 25 && cx < 39 && cy > 25 && cy < 39) {
                        EXPECT_TRUE(raster.covered(x, y)) << x << "," << y;
                    }
                    if (cx < 23 || cx > 41 || cy < 23 || cy > 41) {
                        EXPECT_FALSE(raster.covered(x, y)) << x << "," << y;
                    }
                }
        }
    }
}

TEST(Raster, NearerFaceHidesFartherInEitherOrder) {
    for (bool nearFirst : {false, true}) {
        Raster raster(64, 64, straightView(), black);
        const auto nearQuad = quad(-0.5, -0.5, 1, -4), farQuad = quad(-1, -1, 2, -6);
        if (nearFirst)
            drawQuad(raster, nearQuad, red, 1);
        drawQuad(raster, farQuad, blue, 2);
        if (!nearFirst)
            drawQuad(raster, nearQuad, red, 1);
        const std::uint8_t* centre = pixel(raster, 32, 32);
        EXPECT_GT(centre[0], 0);
        EXPECT_EQ(centre[2], 0) << "near first: " << nearFirst;
        const std::uint8_t* rim = pixel(raster, 32, 32 + 10); // beyond the near quad
        EXPECT_EQ(rim[0], 0);
        EXPECT_GT(rim[2], 0);
    }
}

// Faces seen from behind are lit like front faces; faces without area,
// with NaN or infinite corners, indices past the vertices or wholly behind
// the eye draw nothing; a face through the eye's plane is cut, not smeared.
TEST(Raster, BadFacesDrawNothingAndClippedFacesStayInPlace) {
    Raster front(64, 64, straightView(), black), back(64, 64, straightView(), black);
    drawQuad(front, quad(-0.5, -0.5, 1, -4), vec3f{0.5f, 0.5f, 0.5f}, 1);
    drawQuad(back, quad(-0.5, -0.5, 1, -4), vec3f{0.5f, 0.5f, 0.5f}, 1, true);
    EXPECT_EQ(front.pixels(), back.pixels());

    const float nan = std::nanf(""), inf = INFINITY;
    Raster raster(64, 64, straightView(), black);
    raster.setVertices(std::vector<vec3f>{{0, 0, -4},
                                          {1, 0, -4},
                                          {2, 0, -4},
                                          {nan, 0, -4},
                                          {0, inf, -4},
                                          {0, 1, 4},
                                          {1, 1, 4},
                                          {0, 1e38f, -4}},
                       mat43::identity());
    const std::uint32_t faces[][3] = {{0, 1, 2},  {0, 0, 1}, {0, 1, 3}, {0, 1, 4},
                                      {0, 1, 99}, {5, 6, 5}, {0, 1, 7}, {5, 6, 0xFFFFFFFF}};
    for (const auto& f : faces)
        raster.triangle(f[0], f[1], f[2], red, 1);
    // {0, 1, 7} is finite and large: it may draw, but only in red.
    for (std::uint32_t y = 0; y < 64; ++y)
        for (std::uint32_t x = 0; x < 64; ++x)
            if (raster.covered(x, y)) {
                EXPECT_EQ(pixel(raster, x, y)[2], 0);
            }
    EXPECT_GE(raster.stats().skipped, 7u);

    // A floor from behind the eye to far ahead: only the lower half of the image.
    Raster floor(64, 64, straightView(), black);
    floor.setVertices(std::vector<vec3f>{{-50, -1, 10}, {50, -1, 10}, {0, -1, -100}},
                      mat43::identity());
    floor.triangle(0, 1, 2, red, 1);
    EXPECT_GT(coveredCount(floor), 0u);
    for (std::uint32_t y = 0; y < 32; ++y)
        for (std::uint32_t x = 0; x < 64; ++x)
            EXPECT_FALSE(floor.covered(x, y)) << x << "," << y;
}

// Points and lines keep their colour (no outline), cut at the near plane and
// at the image's border, whatever their length.
TEST(Raster, PointsAndLines) {
    Raster raster(64, 64, straightView(), black);
    raster.setVertices(std::vector<vec3f>{{-1, 0.01f, -4},
                                          {1, 0.01f, -4},
                                          {0, 0.5f, -4},
                                          {0, 0.5f, 4},
                                          {1e30f, -0.5f, -4},
                                          {0, -0.5f, -4},
                                          {0.5f, 0.25f, 10},
                                          {0.5f, 0.25f, -100}},
                       mat43::identity());
    raster.line(0, 1, red, 1); // row 31, columns 16 to 48
    raster.point(2, red, 2);   // (32, 24)
    raster.point(3, red, 3);   // behind the eye
    raster.point(9, red, 4);   // no such vertex
    raster.line(4, 5, red, 5); // row 40, from column 32 to the border
    raster.line(6, 7, red, 6); // from behind the eye to far ahead
    raster.line(3, 6, red, 7); // wholly behind
    raster.finish();
    std::vector<std::pair<std::uint32_t, std::uint32_t>> expected;
    for (std::uint32_t x = 16; x <= 48; ++x)
        expected.push_back({x, 31});
    expected.push_back({32, 24});
    for (std::uint32_t x = 32; x < 64; ++x)
        expected.push_back({x, 40});
    for (const auto& [x, y] : expected) {
        ASSERT_TRUE(raster.covered(x, y)) << x << "," << y;
        EXPECT_EQ(pixel(raster, x, y)[0], 255) << x << "," << y;
    }
    // The last line runs from the image's edge towards (32.3, 31.8).
    const std::size_t others = coveredCount(raster) - expected.size();
    EXPECT_GT(others, 0u);
    EXPECT_LT(others, 64u);
    EXPECT_TRUE(raster.covered(32, 31));
    EXPECT_EQ(raster.stats().skipped, 3u);
}

// Ten million faces: drawing allocates nothing and tests few pixels per face.
TEST(Raster, TenMillionFacesInBoundedTimeAndMemory) {
    constexpr std::uint32_t side = 1001, repeats = 5;
    std::vector<vec3f> grid;
    grid.reserve(side * side);
    for (std::uint32_t y = 0; y < side; ++y)
        for (std::uint32_t x = 0; x < side; ++x)
            grid.push_back({float(x) / (side - 1) - 0.5f, float(y) / (side - 1) - 0.5f, -4});
    Raster raster(64, 64, straightView(), black);
    raster.setVertices(grid, mat43::identity());
    base::resetHeapPeak();
    const std::size_t before = base::heapStats().liveBytes;
    const auto started = std::chrono::steady_clock::now();
    for (std::uint32_t r = 0; r < repeats; ++r)
        for (std::uint32_t y = 0; y + 1 < side; ++y)
            for (std::uint32_t x = 0; x + 1 < side; ++x) {
                const std::uint32_t i = y * side + x;
                raster.triangle(i, i + 1, i + side + 1, red, 1);
                raster.triangle(i, i + side + 1, i + side, red, 1);
            }
    const double seconds =
        std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
    const RasterStats& stats = raster.stats();
    EXPECT_EQ(stats.triangles, std::uint64_t(repeats) * 2 * (side - 1) * (side - 1));
    EXPECT_GE(stats.triangles, 10'000'000u);
    EXPECT_EQ(coveredCount(raster), 256u);
    EXPECT_LE(stats.pixelsTested, stats.triangles);
    EXPECT_EQ(base::heapStats().peakBytes, before);
    EXPECT_LT(seconds, 120.0); // a hang guard; the speed itself is benchmarked
}

// ---- Scenes built in memory ----

PreviewOptions sized(std::uint32_t size, bool sceneCamera = false) {
    PreviewOptions options;
    options.size = size;
    options.sceneCamera = sceneCamera;
    return options;
}

class ScenePreview : public ::testing::Test {
protected:
    base::CaptureLog log;
    base::ScopedLog scoped{log};
    ref<PluginFactory> factory{new PluginFactory("/nonexistent/")};
    PluginRef sceneObject, root;

    ScenePreview() {
        scene::register_scene_schema(*factory);
        sceneObject = make("scene");
        root = make("node");
        sceneObject->setAttribute(names::root, root);
    }
    PluginRef make(std::string_view type) {
        return factory->create(type, PluginFactory::createNullIfUnknown);
    }
    static void adopt(IPlugin& parent, const PluginRef& child) {
        parent.appendAttributeItem<PluginRef>(names::children, child);
    }
    PluginRef node(IPlugin& parent, vec3d translate) {
        PluginRef n = make("node");
        n->setAttribute(names::translate, translate);
        adopt(parent, n);
        return n;
    }
    // A unit quad in the z = 0 plane, one primitive per material given.
    PluginRef quadMesh(std::vector<PluginRef> materials = {}) {
        PluginRef mesh = make("mesh");
        mesh->vecAttribute<vec3f>(names::positions)->items() = {
            {-0.5f, -0.5f, 0}, {0.5f, -0.5f, 0}, {0.5f, 0.5f, 0}, {-0.5f, 0.5f, 0}};
        mesh->vecAttribute<std::uint32_t>(names::indices)->items() = {0, 1, 2, 0, 2, 3};
        base::AttribMap* primitive = mesh->arrayAttribute(names::primitives)->appendMap();
        primitive->setAttribute(names::vcounts, std::uint16_t(3));
        for (PluginRef& m : materials)
            primitive->appendAttributeItem<PluginRef>(names::materials, m);
        return mesh;
    }
    PluginRef material(vec3f color, PluginRef colorMap = {}) {
        PluginRef m = make("principalMaterial");
        m->setAttribute(names::color, color);
        if (colorMap)
            m->setAttribute(names::colorMap, colorMap);
        return m;
    }
    RgbImage render(PreviewOptions options = sized(128)) {
        options.modelFolder = modelFolder;
        return renderPreview(*factory, *sceneObject, options);
    }
    base::string modelFolder;
};

// Every pixel that is not background, with the background taken from a corner.
std::vector<std::array<std::uint8_t, 3>> foreground(const RgbImage& image) {
    std::vector<std::array<std::uint8_t, 3>> out;
    const std::uint8_t* bg = image.rgb.data();
    for (std::size_t i = 0; i < image.rgb.size(); i += 3)
        if (!std::equal(bg, bg + 3, image.rgb.data() + i))
            out.push_back({image.rgb[i], image.rgb[i + 1], image.rgb[i + 2]});
    return out;
}

// The material's colour, tinted by the mean of its colour map (raw b, g, r, a
// pixels or a PNG held in the scene), reaches the pixels; no material is grey.
TEST_F(ScenePreview, PrimitivesTakeTheirMaterialColour) {
    PluginRef raw = make("embeddedTexture");
    raw->vecAttribute<std::uint8_t>(names::pixelData)->items() = {255, 0, 0, 255, 255, 0, 0, 255};
    PluginRef packed = make("fileTexture");
    RgbImage green{2, 1, {0, 255, 0, 0, 255, 0}};
    base::string error;
    ASSERT_TRUE(
        encodePng(green, packed->vecAttribute<std::uint8_t>(names::embeddedFile)->items(), error))
        << error;
    PluginRef missing = make("fileTexture");
    missing->setAttribute(names::file, base::string("nowhere.png"));
    // A file beside the model, named relative to it.
    const auto folder = std::filesystem::temp_directory_path() /
                        ("scene_preview_tint_" + std::to_string(::getpid()));
    std::filesystem::create_directories(folder);
    modelFolder = folder.string() + "/";
    base::vector<std::uint8_t> redPng;
    ASSERT_TRUE(encodePng(RgbImage{1, 1, {200, 0, 0}}, redPng, error));
    std::ofstream(folder / "red.png", std::ios::binary)
        .write(reinterpret_cast<const char*>(redPng.data()), std::streamsize(redPng.size()));
    PluginRef beside = make("fileTexture");
    beside->setAttribute(names::file, base::string("red.png"));

    struct Case {
        const char* what;
        std::vector<PluginRef> materials;
        int channel; // the one lit channel, -1 for grey
    };
    const Case cases[] = {{"red material", {material(red)}, 0},
                          {"null then red", {PluginRef(), material(red)}, 0},
                          {"no material", {}, -1},
                          {"raw blue map", {material({1, 1, 1}, raw)}, 2},
                          {"png green map", {material({1, 1, 1}, packed)}, 1},
                          {"png file map", {material({1, 1, 1}, beside)}, 0},
                          {"unreadable map", {material({0.8f, 0.8f, 0.8f}, missing)}, -1}};
    for (const Case& c : cases) {
        root->removeAttribute(names::children);
        adopt(*node(*root, {0, 0, 0}), quadMesh(c.materials));
        const auto pixels = foreground(render());
        ASSERT_FALSE(pixels.empty()) << c.what;
        for (const auto& p : pixels) {
            if (c.channel < 0) {
                EXPECT_TRUE(p[0] == p[1] && p[1] == p[2]) << c.what;
                continue;
            }
            for (int k = 0; k < 3; ++k)
                EXPECT_EQ(p[k] > 0, k == c.channel) << c.what << " channel " << k;
        }
    }
    std::filesystem::remove_all(folder);
}

// Skins draw their base mesh; coded indices draw what plain ones do; a node
// listing its ancestor is not entered twice.
TEST_F(ScenePreview, SkinsCodedIndicesAndCycles) {
    PluginRef mesh = quadMesh();
    PluginRef skin = make("skin");
    skin->setAttribute(names::baseMesh, mesh);
    PluginRef holder = node(*root, {0, 0, 0});
    adopt(*holder, skin);
    adopt(*node(*root, {1.5, 0, 0}), mesh);
    const RgbImage plain = render();
    EXPECT_GT(foreground(plain).size(), 500u);

    ASSERT_TRUE(dynamic_cast<scene::IMesh&>(*mesh).deltaCompressIndices());
    EXPECT_EQ(render().rgb, plain.rgb);

    adopt(*holder, root);
    EXPECT_EQ(render().rgb, plain.rgb);
}

// A camera 10 units from the quad, looking at it from either side or through
// a scaled parent, sees it centred, 64 / 0.36 pixels per unit at distance 10
// (sensor 36, focal length 50). Without a usable camera the framed view is
// taken and a warning says so.
TEST_F(ScenePreview, SceneCameraOrFramedView) {
    adopt(*node(*root, {0, 0, 0}), quadMesh());
    const RgbImage framed = render();
    EXPECT_EQ(render(sized(128, true)).rgb, framed.rgb);
    EXPECT_EQ(log.messages().size(), 1u);

    struct Case {
        const char* what;
        vec3d parentScale, translate;
        base::quatf rotate; // w, x, y, z
        float focalLength;
    };
    const Case cases[] = {{"in front", {1, 1, 1}, {0, 0, 10}, {1, 0, 0, 0}, 50},
                          {"behind, turned", {1, 1, 1}, {0, 0, -10}, {0, 0, 1, 0}, 50},
                          {"scaled parent", {2, 2, 2}, {0, 0, 5}, {1, 0, 0, 0}, 50},
                          {"no focal length", {1, 1, 1}, {0, 0, 10}, {1, 0, 0, 0}, 0}};
    for (const Case& c : cases) {
        root->removeAttribute(names::children);
        adopt(*node(*root, {0, 0, 0}), quadMesh());
        PluginRef parent = node(*root, {0, 0, 0});
        parent->setAttribute(names::scale, vec3f{float(c.parentScale.x), float(c.parentScale.y),
                                                 float(c.parentScale.z)});
        PluginRef eye = node(*parent, c.translate);
        eye->setAttribute(names::rotate, c.rotate);
        PluginRef camera = make("camera");
        camera->setAttribute(names::focalLength, c.focalLength);
        adopt(*eye, camera);
        log.clear();
        const RgbImage seen = render(sized(128, true));
        if (c.focalLength == 0) {
            EXPECT_EQ(seen.rgb, framed.rgb) << c.what;
            EXPECT_EQ(log.messages().size(), 1u) << c.what;
            continue;
        }
        std::size_t count = 0;
        double sx = 0, sy = 0;
        for (std::uint32_t i = 0; i < 128 * 128; ++i)
            if (seen.rgb[i * 3] != seen.rgb[0]) {
                ++count;
                sx += i % 128 + 0.5;
                sy += i / 128 + 0.5;
            }
        const double side = 64 / 0.36 / 10;
        ASSERT_GT(count, 0u) << c.what;
        EXPECT_NEAR(double(count), side * side, 4 * side + 4) << c.what;
        EXPECT_NEAR(sx / count, 64, 0.5) << c.what;
        EXPECT_NEAR(sy / count, 64, 0.5) << c.what;
    }
}

// Without a face to draw, the nodes show as dots: no geometry at all, or only
// NaN positions. A mesh of vertices without faces shows them as points.
TEST_F(ScenePreview, NodeDotsAndPointClouds) {
    node(*root, {-1, 0, 0});
    node(*node(*root, {1, 0, 0}), {0, 1, 0});
    // Four nodes (the root too), dots of 5 x 5 pixels, none hiding another.
    EXPECT_EQ(foreground(render()).size(), 4u * 25u);

    const float nan = std::nanf("");
    PluginRef broken = quadMesh();
    broken->vecAttribute<vec3f>(names::positions)->items().assign(4, vec3f{nan, nan, nan});
    adopt(*root, broken);
    EXPECT_EQ(foreground(render()).size(), 4u * 25u);

    PluginRef cloud = make("mesh");
    cloud->vecAttribute<vec3f>(names::positions)->items() = {{-1, 0, 0}, {0, 0, 0}, {1, 0, 0}};
    adopt(*root, cloud);
    EXPECT_EQ(foreground(render()).size(), 3u);
}

// ---- The sample model end to end ----

std::vector<std::uint8_t> readBytes(const std::filesystem::path& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

// Pixel centres inside the projection of a face, edges included.
void project(const View& view, const vec3d* world, std::uint32_t size, std::vector<bool>& mask) {
    double sx[3], sy[3];
    for (int k = 0; k < 3; ++k) {
        const vec3d p = view.toCamera * (world[k] - view.eye);
        if (-p.z < view.nearDistance)
            return;
        sx[k] = size / 2.0 + view.focal * p.x / -p.z;
        sy[k] = size / 2.0 - view.focal * p.y / -p.z;
    }
    const double area = (sx[1] - sx[0]) * (sy[2] - sy[0]) - (sy[1] - sy[0]) * (sx[2] - sx[0]);
    if (area == 0)
        return;
    for (std::uint32_t y = 0; y < size; ++y)
        for (std::uint32_t x = 0; x < size; ++x) {
            bool inside = true;
            for (int k = 0; k < 3 && inside; ++k) {
                const int j = (k + 1) % 3;
                const double e =
                    (sx[j] - sx[k]) * (y + 0.5 - sy[k]) - (sy[j] - sy[k]) * (x + 0.5 - sx[k]);
                inside = e * area >= 0;
            }
            if (inside)
                mask[std::size_t(y) * size + x] = true;
        }
}

void projectNode(const View& view, const IPlugin& node, const mat43& parent, std::uint32_t size,
                 std::vector<bool>& mask) {
    const mat43 world = parent * scene::query<scene::IHierarchical>(node)->localTransformation();
    for (const PluginRef& child : *node.findVecAttribute<PluginRef>(names::children)) {
        const IPlugin* mesh = child.get();
        if (mesh->className() == names::skin)
            mesh = mesh->findAttribute<PluginRef>(names::baseMesh)->get();
        if (mesh->className() == names::node) {
            projectNode(view, *mesh, world, size, mask);
            continue;
        }
        if (mesh->className() != names::mesh)
            continue; // cameras and lights draw nothing
        const auto& positions = *mesh->findVecAttribute<vec3f>(names::positions);
        const auto indices = scene::decodeMeshIndices(*mesh);
        for (std::size_t i = 0; i + 2 < indices.size(); i += 3) {
            vec3d corners[3];
            for (int k = 0; k < 3; ++k) {
                const vec3f& p = positions[indices[i + k]];
                corners[k] = world.transformPoint({p.x, p.y, p.z});
            }
            project(view, corners, size, mask);
        }
    }
}

// Exit codes of the preview switches: usage errors (2) are found before the
// import, a file that cannot be written fails the run (1).
TEST(SamplePreview, SwitchesAndExitCodes) {
    const auto dir = std::filesystem::temp_directory_path() /
                     ("scene_preview_cli_" + std::to_string(::getpid()));
    std::filesystem::create_directories(dir);
    const std::string png = "'" + (dir / "p.png").string() + "'";
    struct Case {
        std::string args;
        int code;
        bool written;
    };
    const Case cases[] = {{"--preview " + png + " --size 16 --preview-camera", 0, true},
                          {"--preview " + png + " --size 15", 2, false},
                          {"--preview " + png + " --size 4097", 2, false},
                          {"--size 64", 2, false},
                          {"--preview-camera", 2, false},
                          {"--preview ''", 2, false},
                          {"--preview '" + (dir / "no" / "p.png").string() + "'", 1, false}};
    for (const Case& c : cases) {
        std::filesystem::remove(dir / "p.png");
        const std::string command = std::string("'" SCENE_IMPORT_EXE "' -q --summary false '") +
                                    SCENE_SAMPLES_DIR + "/sample.gltf' " + c.args + " 2>/dev/null";
        const int status = std::system(command.c_str());
        EXPECT_EQ(WIFEXITED(status) ? WEXITSTATUS(status) : -1, c.code) << c.args;
        EXPECT_EQ(std::filesystem::exists(dir / "p.png"), c.written) << c.args;
    }
    std::filesystem::remove_all(dir);
}

TEST(SamplePreview, SilhouetteMatchesItsProjection) {
    const auto dir =
        std::filesystem::temp_directory_path() / ("scene_preview_" + std::to_string(::getpid()));
    std::filesystem::create_directories(dir);
    const std::string command = std::string("'" SCENE_IMPORT_EXE "' -q '") + SCENE_SAMPLES_DIR +
                                "/sample.gltf' --size 256 --preview '" + (dir / "s.png").string() +
                                "' -o '" + (dir / "s.json").string() + "'";
    ASSERT_EQ(std::system(command.c_str()), 0) << command;

    RgbImage image;
    base::string error;
    ASSERT_TRUE(decodePng(readBytes(dir / "s.png"), image, error)) << error;
    ASSERT_EQ(image.width, 256u);

    ref<PluginFactory> factory(new PluginFactory("read"));
    scene::register_scene_schema(*factory);
    base::Stream json = base::fs::master().open((dir / "s.json").string(), base::fs::openRead);
    ASSERT_TRUE(base::readFactory(*factory, json));
    std::filesystem::remove_all(dir);
    const IPlugin* sceneObject = nullptr;
    for (std::uint32_t id = 0; id < factory->pluginCount(); ++id)
        if (PluginRef p = factory->plugin(id); p && p->className() == names::scene)
            sceneObject = p.get();
    ASSERT_TRUE(sceneObject);

    const View view = previewView(*sceneObject, sized(256));
    std::vector<bool> expected(256 * 256, false);
    projectNode(view, *sceneObject->findAttribute<PluginRef>(names::root)->get(), mat43::identity(),
                256, expected);
    std::size_t both = 0, either = 0;
    for (std::size_t i = 0; i < expected.size(); ++i) {
        const bool drawn = !std::equal(image.rgb.data(), image.rgb.data() + 3, &image.rgb[i * 3]);
        both += drawn && expected[i];
        either += drawn || expected[i];
        // The sample's material is white or absent: every drawn pixel is grey.
        if (drawn) {
            EXPECT_TRUE(image.rgb[i * 3] == image.rgb[i * 3 + 1] &&
                        image.rgb[i * 3 + 1] == image.rgb[i * 3 + 2]);
        }
    }
    ASSERT_GT(either, 1000u);
    EXPECT_GE(double(both) / double(either), 0.95);
}

} // namespace

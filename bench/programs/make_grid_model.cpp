// Writes a large test model for the import benchmarks: one connected grid
// mesh (a gently waved sheet) with per-vertex normals and texture
// coordinates, as binary PLY or binary glTF.
//
// Every interior vertex is shared by six triangles. The PLY form stores them
// once and indexes them, which assimp's PLY reader expands per face, so
// vertex joining has real work; the glTF form keeps the index buffer as it is.
//
//   make_grid_model <out.ply|out.glb> <triangles>
//
// The triangle count is rounded to a grid of columns × rows cells (two
// triangles each) with twice as many columns as rows.
#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

namespace {

struct Grid {
    std::uint32_t columns = 0; // cells along x
    std::uint32_t rows = 0;    // cells along y
    std::vector<float> positions, normals, uvs;
    std::vector<std::uint32_t> indices;

    std::uint32_t vertexCount() const { return (columns + 1) * (rows + 1); }
    std::uint32_t triangleCount() const { return 2 * columns * rows; }
};

Grid makeGrid(std::uint64_t triangles) {
    Grid grid;
    // columns = 2 × rows and 2 × columns × rows ≈ triangles.
    grid.rows = std::max<std::uint32_t>(1, std::uint32_t(std::lround(std::sqrt(triangles / 4.0))));
    grid.columns = 2 * grid.rows;

    const std::uint32_t vertices = grid.vertexCount();
    grid.positions.reserve(3 * std::size_t(vertices));
    grid.normals.reserve(3 * std::size_t(vertices));
    grid.uvs.reserve(2 * std::size_t(vertices));
    // A cell size of 1 and a few waves across the sheet: every normal differs,
    // so nothing but the shared corners can be joined.
    const double amplitude = 4.0;
    const double kx = 6.0 * M_PI / grid.columns, ky = 4.0 * M_PI / grid.rows;
    for (std::uint32_t j = 0; j <= grid.rows; ++j) {
        for (std::uint32_t i = 0; i <= grid.columns; ++i) {
            const double x = i, y = j;
            const double z = amplitude * std::sin(kx * x) * std::cos(ky * y);
            const double dzdx = amplitude * kx * std::cos(kx * x) * std::cos(ky * y);
            const double dzdy = -amplitude * ky * std::sin(kx * x) * std::sin(ky * y);
            const double length = std::sqrt(dzdx * dzdx + dzdy * dzdy + 1.0);
            grid.positions.insert(grid.positions.end(), {float(x), float(y), float(z)});
            grid.normals.insert(grid.normals.end(), {float(-dzdx / length), float(-dzdy / length),
                                                     float(1.0 / length)});
            grid.uvs.insert(grid.uvs.end(),
                            {float(double(i) / grid.columns), float(double(j) / grid.rows)});
        }
    }

    grid.indices.reserve(3 * std::size_t(grid.triangleCount()));
    const std::uint32_t stride = grid.columns + 1;
    for (std::uint32_t j = 0; j < grid.rows; ++j) {
        for (std::uint32_t i = 0; i < grid.columns; ++i) {
            const std::uint32_t a = j * stride + i, b = a + 1, c = a + stride, d = c + 1;
            grid.indices.insert(grid.indices.end(), {a, b, d, a, d, c});
        }
    }
    return grid;
}

class Output {
public:
    explicit Output(const char* path) : m_file(std::fopen(path, "wb")), m_path(path) {
        if (!m_file) {
            std::perror(path);
            std::exit(1);
        }
    }
    ~Output() {
        if (std::fclose(m_file) != 0) {
            std::perror(m_path);
            std::exit(1);
        }
    }
    Output(const Output&) = delete;
    Output& operator=(const Output&) = delete;

    void write(const void* data, std::size_t bytes) {
        if (bytes && std::fwrite(data, 1, bytes, m_file) != bytes) {
            std::perror(m_path);
            std::exit(1);
        }
    }
    void write(std::string_view text) { write(text.data(), text.size()); }
    template <class T>
    void value(const T& v) {
        write(&v, sizeof v);
    }

private:
    std::FILE* m_file;
    const char* m_path;
};

// The files are little-endian; so is every machine this runs on.
static_assert(std::endian::native == std::endian::little);

void writePly(const Grid& grid, const char* path) {
    Output out(path);
    out.write("ply\nformat binary_little_endian 1.0\ncomment generated grid\n");
    out.write("element vertex " + std::to_string(grid.vertexCount()) + "\n");
    out.write("property float x\nproperty float y\nproperty float z\n"
              "property float nx\nproperty float ny\nproperty float nz\n"
              "property float s\nproperty float t\n");
    out.write("element face " + std::to_string(grid.triangleCount()) + "\n");
    out.write("property list uchar int vertex_indices\nend_header\n");

    // Interleaved as the header declares, written in blocks to keep it fast.
    std::vector<float> block;
    block.reserve(8 * 65536);
    for (std::uint32_t v = 0; v < grid.vertexCount(); ++v) {
        block.insert(block.end(), grid.positions.begin() + 3 * v,
                     grid.positions.begin() + 3 * v + 3);
        block.insert(block.end(), grid.normals.begin() + 3 * v, grid.normals.begin() + 3 * v + 3);
        block.insert(block.end(), grid.uvs.begin() + 2 * v, grid.uvs.begin() + 2 * v + 2);
        if (block.size() >= 8 * 65536) {
            out.write(block.data(), block.size() * sizeof(float));
            block.clear();
        }
    }
    out.write(block.data(), block.size() * sizeof(float));

    std::vector<std::uint8_t> faces;
    faces.reserve(13 * 65536);
    for (std::size_t t = 0; t < grid.triangleCount(); ++t) {
        faces.push_back(3);
        const std::size_t at = faces.size();
        faces.resize(at + 12);
        std::memcpy(faces.data() + at, grid.indices.data() + 3 * t, 12);
        if (faces.size() >= 13 * 65536) {
            out.write(faces.data(), faces.size());
            faces.clear();
        }
    }
    out.write(faces.data(), faces.size());
}

void writeGlb(const Grid& grid, const char* path) {
    const std::size_t positionBytes = grid.positions.size() * 4,
                      normalBytes = grid.normals.size() * 4, uvBytes = grid.uvs.size() * 4,
                      indexBytes = grid.indices.size() * 4;
    const std::size_t binBytes = positionBytes + normalBytes + uvBytes + indexBytes;

    float lo[3] = {HUGE_VALF, HUGE_VALF, HUGE_VALF}, hi[3] = {-HUGE_VALF, -HUGE_VALF, -HUGE_VALF};
    for (std::size_t i = 0; i < grid.positions.size(); ++i) {
        lo[i % 3] = std::min(lo[i % 3], grid.positions[i]);
        hi[i % 3] = std::max(hi[i % 3], grid.positions[i]);
    }
    char bounds[256];
    std::snprintf(bounds, sizeof bounds, "\"min\":[%.9g,%.9g,%.9g],\"max\":[%.9g,%.9g,%.9g]", lo[0],
                  lo[1], lo[2], hi[0], hi[1], hi[2]);

    const std::string vertices = std::to_string(grid.vertexCount());
    auto view = [](std::size_t offset, std::size_t length, int target) {
        return "{\"buffer\":0,\"byteOffset\":" + std::to_string(offset) +
               ",\"byteLength\":" + std::to_string(length) +
               ",\"target\":" + std::to_string(target) + "}";
    };
    std::string json =
        "{\"asset\":{\"version\":\"2.0\",\"generator\":\"make_grid_model\"},"
        "\"scene\":0,\"scenes\":[{\"nodes\":[0]}],"
        "\"nodes\":[{\"name\":\"grid\",\"mesh\":0}],"
        "\"meshes\":[{\"name\":\"grid\",\"primitives\":[{\"attributes\":"
        "{\"POSITION\":0,\"NORMAL\":1,\"TEXCOORD_0\":2},\"indices\":3,\"mode\":4}]}],"
        "\"accessors\":["
        "{\"bufferView\":0,\"componentType\":5126,\"count\":" +
        vertices + ",\"type\":\"VEC3\"," + bounds +
        "},"
        "{\"bufferView\":1,\"componentType\":5126,\"count\":" +
        vertices +
        ",\"type\":\"VEC3\"},"
        "{\"bufferView\":2,\"componentType\":5126,\"count\":" +
        vertices +
        ",\"type\":\"VEC2\"},"
        "{\"bufferView\":3,\"componentType\":5125,\"count\":" +
        std::to_string(grid.indices.size()) +
        ",\"type\":\"SCALAR\"}],"
        "\"bufferViews\":[" +
        view(0, positionBytes, 34962) + "," + view(positionBytes, normalBytes, 34962) + "," +
        view(positionBytes + normalBytes, uvBytes, 34962) + "," +
        view(positionBytes + normalBytes + uvBytes, indexBytes, 34963) +
        "],"
        "\"buffers\":[{\"byteLength\":" +
        std::to_string(binBytes) + "}]}";
    json.append((4 - json.size() % 4) % 4, ' ');

    const std::uint32_t total = std::uint32_t(12 + 8 + json.size() + 8 + binBytes);
    Output out(path);
    out.write("glTF");
    out.value<std::uint32_t>(2);
    out.value<std::uint32_t>(total);
    out.value<std::uint32_t>(std::uint32_t(json.size()));
    out.write("JSON");
    out.write(json);
    out.value<std::uint32_t>(std::uint32_t(binBytes));
    out.write("BIN\0", 4);
    out.write(grid.positions.data(), positionBytes);
    out.write(grid.normals.data(), normalBytes);
    out.write(grid.uvs.data(), uvBytes);
    out.write(grid.indices.data(), indexBytes);
}

bool endsWith(std::string_view text, std::string_view suffix) {
    return text.size() >= suffix.size() && text.substr(text.size() - suffix.size()) == suffix;
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 3) {
        std::fprintf(stderr, "usage: %s <out.ply|out.glb> <triangles>\n", argv[0]);
        return 2;
    }
    const std::string_view path = argv[1];
    char* end = nullptr;
    const unsigned long long triangles = std::strtoull(argv[2], &end, 10);
    // The glTF form indexes with 32 bits and sizes its file with 32 bits.
    if (!end || *end || triangles == 0 || triangles > 100'000'000ull) {
        std::fprintf(stderr, "%s: the triangle count must be 1 to 100000000\n", argv[0]);
        return 2;
    }
    const bool ply = endsWith(path, ".ply"), glb = endsWith(path, ".glb");
    if (!ply && !glb) {
        std::fprintf(stderr, "%s: the output must end in .ply or .glb\n", argv[0]);
        return 2;
    }

    const Grid grid = makeGrid(triangles);
    if (ply)
        writePly(grid, argv[1]);
    else
        writeGlb(grid, argv[1]);
    std::printf("%s: %u triangles, %u vertices (%u x %u cells)\n", argv[1], grid.triangleCount(),
                grid.vertexCount(), grid.columns, grid.rows);
    return 0;
}

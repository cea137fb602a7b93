#include "as_weld.h"

#include "b_memory.h"

#include <assimp/anim.h>
#include <assimp/mesh.h>

#include <algorithm>
#include <bit>
#include <cmath>

namespace as {

namespace {

constexpr std::uint32_t noVertex = 0xFFFFFFFFu;
constexpr float squareTolerance = weldTolerance * weldTolerance;

// -0 hashes like +0, since the two compare equal.
inline std::uint32_t canonicalBits(float value) {
    const auto bits = std::bit_cast<std::uint32_t>(value);
    return (bits & 0x7FFFFFFFu) == 0 ? 0 : bits;
}

class Records {
public:
    Records(std::span<const WeldStream> streams, const WeldInfluences& influences)
        : m_streams(streams), m_influences(influences) {}

    // The hash of the position, the one stream compared exactly.
    std::uint64_t hash(std::uint32_t v) const {
        const WeldStream& positions = m_streams[0];
        const float* values = positions.data + std::size_t(v) * positions.stride;
        std::uint64_t hash = 0x243F6A8885A308D3ull;
        for (std::uint32_t c = 0; c < positions.width; ++c) {
            hash = (hash ^ canonicalBits(values[c])) * 0x9E3779B97F4A7C15ull;
            hash ^= hash >> 32;
        }
        // The slot comes from the high bits and the tag from the low ones:
        // both must depend on every input bit.
        hash ^= hash >> 33;
        hash *= 0xFF51AFD7ED558CCDull;
        hash ^= hash >> 33;
        hash *= 0xC4CEB9FE1A85EC53ull;
        return hash ^ (hash >> 33);
    }

    bool same(std::uint32_t a, std::uint32_t b) const {
        if (!equal(at(m_streams[0], a), at(m_streams[0], b), m_streams[0].width))
            return false;
        for (const WeldStream& stream : m_streams.subspan(1)) {
            const float* x = at(stream, a);
            const float* y = at(stream, b);
            // In single precision, as the join our files were made with did:
            // a difference that rounds to the tolerance is still within it.
            float distance = 0;
            for (std::uint32_t c = 0; c < stream.width; ++c) {
                const float d = x[c] - y[c];
                distance += d * d;
            }
            // Also false for infinities of one sign (inf - inf is NaN)
            // unless the values are equal.
            if (!(distance <= squareTolerance) && !equal(x, y, stream.width))
                return false;
        }
        if (!m_influences.starts)
            return true;
        const std::uint32_t* starts = m_influences.starts;
        const std::uint32_t count = starts[a + 1] - starts[a];
        if (count != starts[b + 1] - starts[b])
            return false;
        const WeldInfluence* x = m_influences.entries + starts[a];
        const WeldInfluence* y = m_influences.entries + starts[b];
        for (std::uint32_t i = 0; i < count; ++i)
            if (x[i].joint != y[i].joint ||
                !(std::fabs(x[i].weight - y[i].weight) <= weldTolerance))
                return false;
        return true;
    }

private:
    static const float* at(const WeldStream& stream, std::uint32_t v) {
        return stream.data + std::size_t(v) * stream.stride;
    }
    static bool equal(const float* x, const float* y, std::uint32_t width) {
        for (std::uint32_t c = 0; c < width; ++c)
            if (!(x[c] == y[c]))
                return false;
        return true;
    }

    std::span<const WeldStream> m_streams;
    const WeldInfluences& m_influences;
};

// A table slot: the first vertex of a record and the high 32 bits of its
// position's hash. The slot index is the tag's top bits, so the table can
// grow without reading a vertex, and most probes are settled by the tag.
struct Slot {
    std::uint32_t vertex = noVertex;
    std::uint32_t tag = 0;
};

// Open addressing with linear probing, at most two thirds full. It grows
// with the records found rather than being sized for every vertex: meshes
// read per face repeat each vertex several times, and a smaller table
// misses the cache less.
class Table {
public:
    // Room for half the vertices: a mesh read per face needs no more, one
    // read indexed grows once.
    explicit Table(std::uint32_t count) {
        resize(std::bit_ceil(std::max<std::uint64_t>(16, count - count / 4)));
    }

    static std::uint32_t tagOf(std::uint64_t hash) { return std::uint32_t(hash >> 32); }

    void prefetch(std::uint64_t hash) const {
        __builtin_prefetch(&m_slots[tagOf(hash) >> m_shift]);
    }

    // The earliest vertex of the position 'hash' for which 'same' holds.
    template <class Same>
    std::uint32_t find(std::uint64_t hash, Same&& same) const {
        const std::uint32_t tag = tagOf(hash);
        for (std::size_t i = tag >> m_shift;; i = (i + 1) & m_mask) {
            const Slot& slot = m_slots[i];
            if (slot.vertex == noVertex)
                return noVertex;
            // For one position the probe order is the insertion order.
            if (slot.tag == tag && same(slot.vertex))
                return slot.vertex;
        }
    }

    void insert(std::uint64_t hash, std::uint32_t v) {
        if (3 * (m_used + 1) > 2 * m_slots.size())
            resize(2 * m_slots.size());
        place({v, tagOf(hash)});
        ++m_used;
    }

private:
    void place(Slot slot) {
        std::size_t i = slot.tag >> m_shift;
        while (m_slots[i].vertex != noVertex)
            i = (i + 1) & m_mask;
        m_slots[i] = slot;
    }

    void resize(std::size_t size) {
        base::vector<Slot> old(size);
        old.swap(m_slots);
        m_shift = 32 - std::countr_zero(size);
        m_mask = size - 1;
        // Entries of one position must keep their order: each run of full
        // slots is walked in probe order, starting after an empty slot so
        // that no run wraps around the walk's start.
        std::size_t start = 0;
        while (start < old.size() && old[start].vertex != noVertex)
            ++start;
        for (std::size_t n = 0; n < old.size(); ++n)
            if (const Slot& slot = old[(start + n) & (old.size() - 1)]; slot.vertex != noVertex)
                place(slot);
    }

    base::vector<Slot> m_slots;
    std::size_t m_used = 0;
    int m_shift = 32;
    std::size_t m_mask = 0;
};

// The influences of every vertex, gathered from the bones. Answers false
// (and gathers nothing) when there are more than 32-bit offsets can address.
bool gatherInfluences(const aiMesh& mesh, base::vector<std::uint32_t>& starts,
                      base::vector<WeldInfluence>& entries) {
    const std::uint32_t count = mesh.mNumVertices;
    starts.assign(std::size_t(count) + 1, 0);
    std::uint64_t total = 0;
    for (std::uint32_t b = 0; b < mesh.mNumBones; ++b) {
        const aiBone* bone = mesh.mBones[b];
        if (!bone || !bone->mWeights)
            continue;
        for (std::uint32_t w = 0; w < bone->mNumWeights; ++w)
            if (const std::uint32_t v = bone->mWeights[w].mVertexId; v < count) {
                ++starts[v + 1];
                ++total;
            }
    }
    if (total > 0xFFFFFFFFu)
        return false;
    for (std::uint32_t v = 0; v < count; ++v)
        starts[v + 1] += starts[v];
    entries.resize(total);
    base::vector<std::uint32_t> fill(starts.begin(), starts.end() - 1);
    for (std::uint32_t b = 0; b < mesh.mNumBones; ++b) {
        const aiBone* bone = mesh.mBones[b];
        if (!bone || !bone->mWeights)
            continue;
        for (std::uint32_t w = 0; w < bone->mNumWeights; ++w)
            if (const aiVertexWeight& weight = bone->mWeights[w]; weight.mVertexId < count)
                entries[fill[weight.mVertexId]++] = {b, weight.mWeight};
    }
    // A fixed order per vertex, so equal sets compare equal. Weights order by
    // their bits, which stays a strict order even with NaN.
    for (std::uint32_t v = 0; v < count; ++v)
        std::sort(entries.begin() + starts[v], entries.begin() + starts[v + 1],
                  [](const WeldInfluence& a, const WeldInfluence& b) {
                      const auto x = std::bit_cast<std::uint32_t>(a.weight);
                      const auto y = std::bit_cast<std::uint32_t>(b.weight);
                      return a.joint < b.joint || (a.joint == b.joint && x < y);
                  });
    return true;
}

// All three components take part, also of two-component texture
// coordinates: what the file stored is what is compared.
void addVectors(base::vector<WeldStream>& streams, aiVector3D* data) {
    if (data)
        streams.push_back({&data->x, 3, 3});
}

// The streams of one vertex set (the mesh, or one of its morph targets),
// positions first.
template <class Mesh>
void addStreams(base::vector<WeldStream>& streams, Mesh& mesh) {
    addVectors(streams, mesh.mVertices);
    addVectors(streams, mesh.mNormals);
    addVectors(streams, mesh.mTangents);
    addVectors(streams, mesh.mBitangents);
    for (std::uint32_t i = 0; i < AI_MAX_NUMBER_OF_TEXTURECOORDS; ++i)
        addVectors(streams, mesh.mTextureCoords[i]);
    for (std::uint32_t c = 0; c < AI_MAX_NUMBER_OF_COLOR_SETS; ++c)
        if (mesh.mColors[c])
            streams.push_back({&mesh.mColors[c]->r, 4, 4});
}

} // namespace

std::uint32_t findDistinctVertices(std::span<const WeldStream> streams,
                                   const WeldInfluences& influences, std::uint32_t count,
                                   std::uint32_t* remap) {
    if (count == 0 || streams.empty())
        return 0;
    const Records records(streams, influences);
    Table table(count);

    // Hashes are worked out a few vertices ahead and their slots fetched, so
    // the table's cache misses overlap instead of coming one by one.
    constexpr std::uint32_t ahead = 16;
    std::uint64_t hashes[ahead];
    auto stage = [&](std::uint32_t v) {
        hashes[v % ahead] = records.hash(v);
        table.prefetch(hashes[v % ahead]);
    };
    for (std::uint32_t v = 0; v < std::min(ahead, count); ++v)
        stage(v);

    std::uint32_t kept = 0;
    for (std::uint32_t v = 0; v < count; ++v) {
        const std::uint64_t hash = hashes[v % ahead];
        if (v + ahead < count)
            stage(v + ahead);
        // A record holding a NaN fails every comparison, so it is never
        // found, not even by a copy of itself.
        if (remap[v] == weldUnused)
            continue;
        const std::uint32_t match =
            table.find(hash, [&](std::uint32_t other) { return records.same(other, v); });
        if (match != noVertex) {
            remap[v] = remap[match] | weldRepeat;
        } else {
            table.insert(hash, v);
            remap[v] = kept++;
        }
    }
    return kept;
}

void compactStream(const WeldStream& stream, std::span<const std::uint32_t> remap) {
    const std::size_t stride = stream.stride;
    for (std::size_t v = 0; v < remap.size(); ++v) {
        const std::uint32_t target = remap[v];
        // Kept vertices only move down, so a move never overwrites one still to come.
        if ((target & weldRepeat) || target == v)
            continue;
        std::copy_n(stream.data + v * stride, stride, stream.data + target * stride);
    }
}

std::uint32_t weldMesh(aiMesh& mesh) {
    const std::uint32_t count = mesh.mNumVertices;
    if (!mesh.mVertices || !mesh.mFaces || mesh.mNumFaces == 0 || count == 0 || count >= weldRepeat)
        return count;

    base::vector<WeldStream> streams;
    addStreams(streams, mesh);
    // Morph targets are per vertex too: a vertex is only the same when it
    // moves the same way. A target of another size cannot be kept in step.
    for (std::uint32_t a = 0; mesh.mAnimMeshes && a < mesh.mNumAnimMeshes; ++a) {
        if (aiAnimMesh* target = mesh.mAnimMeshes[a]) {
            if (target->mNumVertices != count)
                return count;
            addStreams(streams, *target);
        }
    }

    base::vector<std::uint32_t> starts;
    base::vector<WeldInfluence> entries;
    WeldInfluences influences;
    if (mesh.mBones && mesh.mNumBones > 0) {
        if (!gatherInfluences(mesh, starts, entries))
            return count;
        influences = {starts.data(), entries.data()};
    }

    base::vector<std::uint32_t> remap(count, weldUnused);
    for (std::uint32_t f = 0; f < mesh.mNumFaces; ++f) {
        const aiFace& face = mesh.mFaces[f];
        for (std::uint32_t i = 0; face.mIndices && i < face.mNumIndices; ++i)
            if (face.mIndices[i] < count)
                remap[face.mIndices[i]] = 0;
    }
    const std::uint32_t kept = findDistinctVertices(streams, influences, count, remap.data());
    base::vector<std::uint32_t>().swap(starts);
    base::vector<WeldInfluence>().swap(entries);
    if (kept == count)
        return count;

    for (const WeldStream& stream : streams)
        compactStream(stream, remap);
    mesh.mNumVertices = kept;
    for (std::uint32_t a = 0; mesh.mAnimMeshes && a < mesh.mNumAnimMeshes; ++a)
        if (aiAnimMesh* target = mesh.mAnimMeshes[a])
            target->mNumVertices = kept;

    for (std::uint32_t f = 0; f < mesh.mNumFaces; ++f) {
        aiFace& face = mesh.mFaces[f];
        for (std::uint32_t i = 0; face.mIndices && i < face.mNumIndices; ++i)
            if (face.mIndices[i] < count)
                face.mIndices[i] = remap[face.mIndices[i]] & ~weldRepeat;
    }

    // A vertex dropped or merged into an earlier one (whose influences are
    // the same) loses its weights; the others follow their vertex.
    for (std::uint32_t b = 0; mesh.mBones && b < mesh.mNumBones; ++b) {
        aiBone* bone = mesh.mBones[b];
        if (!bone || !bone->mWeights)
            continue;
        std::uint32_t left = 0;
        for (std::uint32_t w = 0; w < bone->mNumWeights; ++w) {
            aiVertexWeight weight = bone->mWeights[w];
            if (weight.mVertexId < count) {
                if (remap[weight.mVertexId] & weldRepeat)
                    continue;
                weight.mVertexId = remap[weight.mVertexId];
            }
            bone->mWeights[left++] = weight;
        }
        bone->mNumWeights = left;
    }
    return kept;
}

} // namespace as

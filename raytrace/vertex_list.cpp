#include "raytrace/vertex_list.h"

#include "core/message.h"

namespace ox {
namespace {

// The one shared entry that a list without sets answers with.
const Vec2 kZeroUv{};
const Vec3 kZeroVec3{};

// The set-access rule shared by UV, tangent and bitangent sets: k < n gives set k; with no sets
// the shared zero entry; with k out of range a debug message and set 0.
template <typename T>
VertexSet<T> accessSet(const std::vector<std::vector<T>> &sets, int k, const T &zero,
                       const char *what) {
    const int n = static_cast<int>(sets.size());
    if (n == 0) return {&zero, 0u};
    if (k < 0 || k >= n) {
        message(kMsgDebug, 6, "Accessing %s %d on vertexlist with only %d sets!", what, k, n);
        k = 0;
    }
    const auto &set = sets[static_cast<size_t>(k)];
    if (set.empty()) return {&zero, 0u};
    return {set.data(), ~0u};
}

}  // namespace

void VertexList::resize(uint32_t count, uint32_t uvSets, bool colors) {
    x_.assign(count, 0.0f);
    y_.assign(count, 0.0f);
    z_.assign(count, 0.0f);
    normals_.assign(count, Vec3{});
    colors_.assign(colors ? count : 0, Color{});
    uv_.assign(uvSets, std::vector<Vec2>(count));
    tangents_.assign(uvSets, std::vector<Vec3>(count));
    bitangents_.assign(uvSets, std::vector<Vec3>(count));
}

void VertexList::clear() { *this = VertexList(); }

void VertexList::enableColors() {
    if (colors_.empty()) colors_.assign(size(), Color{});
}

VertexSet<Vec2> VertexList::uvSet(int k) const { return accessSet(uv_, k, kZeroUv, "uvset"); }

VertexSet<Vec3> VertexList::tangentSet(int k) const {
    return accessSet(tangents_, k, kZeroVec3, "tangentset");
}

VertexSet<Vec3> VertexList::bitangentSet(int k) const {
    return accessSet(bitangents_, k, kZeroVec3, "bitangentset");
}

int VertexList::findUvSet(const std::string &name) const {
    for (size_t i = 0; i < uvSetNames_.size() && i < uv_.size(); ++i)
        if (uvSetNames_[i] == name) return static_cast<int>(i);
    return -1;
}

size_t VertexList::memoryBytes() const {
    size_t bytes = (x_.capacity() + y_.capacity() + z_.capacity()) * sizeof(float) +
                   normals_.capacity() * sizeof(Vec3) + colors_.capacity() * sizeof(Color);
    for (const auto &s : uv_) bytes += s.capacity() * sizeof(Vec2);
    for (const auto &s : tangents_) bytes += s.capacity() * sizeof(Vec3);
    for (const auto &s : bitangents_) bytes += s.capacity() * sizeof(Vec3);
    return bytes;
}

}  // namespace ox

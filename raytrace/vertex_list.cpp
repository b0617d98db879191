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
    colorsOn_ = colors;
    colors_.assign(colors ? count : 0, Color{});
    uv_.assign(uvSets, std::vector<Vec2>(count));
    tangents_.assign(uvSets, std::vector<Vec3>(count));
    bitangents_.assign(uvSets, std::vector<Vec3>(count));
}

void VertexList::reserve(uint32_t count) {
    x_.reserve(count);
    y_.reserve(count);
    z_.reserve(count);
    normals_.reserve(count);
    if (colorsOn_) colors_.reserve(count);
    for (auto &s : uv_) s.reserve(count);
    for (auto &s : tangents_) s.reserve(count);
    for (auto &s : bitangents_) s.reserve(count);
}

uint32_t VertexList::append(const Vec3 &p, const Vec3 &n, const Color &color, const Vec2 *uvs,
                            const Vec3 &tangent, const Vec3 &bitangent) {
    const uint32_t index = size();
    x_.push_back(p.x);
    y_.push_back(p.y);
    z_.push_back(p.z);
    normals_.push_back(n);
    if (colorsOn_) colors_.push_back(color);
    for (size_t k = 0; k < uv_.size(); ++k) {
        uv_[k].push_back(uvs[k]);
        tangents_[k].push_back(k == 0 ? tangent : Vec3{});
        bitangents_[k].push_back(k == 0 ? bitangent : Vec3{});
    }
    return index;
}

uint32_t VertexList::appendCopy(uint32_t i) {
    const uint32_t index = size();
    x_.push_back(x_[i]);
    y_.push_back(y_[i]);
    z_.push_back(z_[i]);
    normals_.push_back(normals_[i]);
    if (colorsOn_) colors_.push_back(colors_[i]);
    for (size_t k = 0; k < uv_.size(); ++k) {
        uv_[k].push_back(uv_[k][i]);
        tangents_[k].push_back(tangents_[k][i]);
        bitangents_[k].push_back(bitangents_[k][i]);
    }
    return index;
}

namespace {
template <typename T>
void keepIn(std::vector<T> &a, const std::vector<uint32_t> &order) {
    if (a.empty()) return;
    // order is strictly increasing, so every target slot is at or before its source.
    for (size_t i = 0; i < order.size(); ++i) a[i] = a[order[i]];
    a.resize(order.size());
}
}  // namespace

void VertexList::keep(const std::vector<uint32_t> &order) {
    keepIn(x_, order);
    keepIn(y_, order);
    keepIn(z_, order);
    keepIn(normals_, order);
    keepIn(colors_, order);
    for (auto &s : uv_) keepIn(s, order);
    for (auto &s : tangents_) keepIn(s, order);
    for (auto &s : bitangents_) keepIn(s, order);
}

void VertexList::copyFirstFrameToAllSets() {
    for (size_t k = 1; k < tangents_.size(); ++k) {
        tangents_[k] = tangents_[0];
        bitangents_[k] = bitangents_[0];
    }
}

void VertexList::shrinkToFit() {
    x_.shrink_to_fit();
    y_.shrink_to_fit();
    z_.shrink_to_fit();
    normals_.shrink_to_fit();
    colors_.shrink_to_fit();
    for (auto &s : uv_) s.shrink_to_fit();
    for (auto &s : tangents_) s.shrink_to_fit();
    for (auto &s : bitangents_) s.shrink_to_fit();
}

void VertexList::clear() { *this = VertexList(); }

void VertexList::enableColors() {
    if (!colorsOn_) colors_.assign(size(), Color{});
    colorsOn_ = true;
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

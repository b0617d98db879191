#include "tools/imported_model.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <numbers>
#include <unordered_map>
#include <unordered_set>

namespace ox {

BBox ImportedShape::bounds() const {
    BBox box;
    for (const ImportedGroup &g : groups)
        for (uint32_t i : g.indices)
            if (i < positions.size()) box.extend(positions[i]);
    return box;
}

size_t ImportedShape::triangleCount() const {
    size_t n = 0;
    for (const ImportedGroup &g : groups) n += g.indices.size() / 3;
    return n;
}

namespace {

// A unit vector perpendicular to n, the same choice the mesh builder makes when it repairs.
Vec3 perpendicular(const Vec3 &n) {
    Vec3 t = std::fabs(n.x) > std::fabs(n.y) ? Vec3(n.z, 0.0f, -n.x) : Vec3(0.0f, n.z, -n.y);
    if (t.lengthSquared() == 0.0f) t = Vec3(1.0f, 0.0f, 0.0f);
    return t.normalize();
}

float cornerAngle(const Vec3 &a, const Vec3 &b) {
    float c = std::clamp(dot(a.normalized(), b.normalized()), -1.0f, 1.0f);
    float angle = std::acos(c);
    return std::isfinite(angle) ? angle / std::numbers::pi_v<float> : 0.0f;
}

}  // namespace

void completeTangentFrames(ImportedShape &shape) {
    const size_t n = shape.positions.size();
    shape.normals.resize(n);
    shape.tangents.resize(n);
    shape.bitangents.resize(n);
    std::vector<uint8_t> missing(n, 0);
    bool any = false;
    for (size_t i = 0; i < n; ++i)
        if (shape.tangents[i].lengthSquared() <= 1e-10f) missing[i] = 1, any = true;
    if (!any) return;

    std::vector<Vec3> t(n), b(n);
    if (!shape.uvSets.empty()) {
        const std::vector<Vec2> &uv = shape.uvSets[0];
        for (const ImportedGroup &g : shape.groups)
            for (size_t k = 0; k + 2 < g.indices.size(); k += 3) {
                uint32_t i0 = g.indices[k], i1 = g.indices[k + 1], i2 = g.indices[k + 2];
                const Vec3 &p0 = shape.positions[i0], &p1 = shape.positions[i1],
                           &p2 = shape.positions[i2];
                Vec3 e1 = p1 - p0, e2 = p2 - p0;
                float du1 = uv[i1].x - uv[i0].x, dv1 = uv[i1].y - uv[i0].y;
                float du2 = uv[i2].x - uv[i0].x, dv2 = uv[i2].y - uv[i0].y;
                float det = du1 * dv2 - du2 * dv1;
                if (!(std::fabs(det) > 1e-12f)) continue;
                Vec3 ft = (e1 * dv2 - e2 * dv1) / det;
                Vec3 fb = (e2 * du1 - e1 * du2) / det;
                if (!isFinite(ft) || !isFinite(fb)) continue;
                float w[3] = {cornerAngle(e1, e2), cornerAngle(p0 - p1, p2 - p1),
                              cornerAngle(p0 - p2, p1 - p2)};
                uint32_t idx[3] = {i0, i1, i2};
                for (int c = 0; c < 3; ++c) {
                    t[idx[c]] += ft * w[c];
                    b[idx[c]] += fb * w[c];
                }
            }
    }
    for (size_t i = 0; i < n; ++i) {
        if (!missing[i]) continue;
        Vec3 nn = shape.normals[i].normalized();
        Vec3 tt = t[i] - nn * dot(nn, t[i]);
        if (tt.lengthSquared() <= 1e-20f) tt = perpendicular(nn);
        tt.normalize();
        // Keep the bitangent on the side the UVs put it, so mirrored UVs stay mirrored.
        Vec3 bb = cross(nn, tt);
        if (dot(bb, b[i]) < 0.0f) bb = -bb;
        shape.tangents[i] = tt;
        shape.bitangents[i] = bb;
    }
}

void appendCornerUVSet(ImportedShape &shape, const std::string &name,
                       const std::vector<Vec2> &cornerUVs) {
    const size_t oldCount = shape.positions.size();
    // The first corner that reaches a vertex keeps it; a corner with other coordinates gets a
    // copy, shared with later corners of the same vertex and the same coordinates.
    std::vector<Vec2> uv(oldCount);
    std::vector<uint8_t> assigned(oldCount, 0);
    struct Key {
        uint32_t vertex;
        float u, v;
        bool operator==(const Key &o) const { return vertex == o.vertex && u == o.u && v == o.v; }
    };
    struct KeyHash {
        size_t operator()(const Key &k) const {
            uint32_t a, b;
            std::memcpy(&a, &k.u, 4);
            std::memcpy(&b, &k.v, 4);
            return (size_t(k.vertex) * 0x9E3779B97F4A7C15ull) ^ (size_t(a) << 21) ^ b;
        }
    };
    std::unordered_map<Key, uint32_t, KeyHash> copies;
    std::vector<uint32_t> source;  // original vertex of each copy
    size_t corner = 0;
    for (ImportedGroup &g : shape.groups)
        for (uint32_t &index : g.indices) {
            const Vec2 c = cornerUVs[corner++];
            if (!assigned[index]) {
                assigned[index] = 1;
                uv[index] = c;
                continue;
            }
            if (uv[index] == c) continue;
            Key key{index, c.x, c.y};
            auto it = copies.find(key);
            if (it != copies.end()) {
                index = it->second;
                continue;
            }
            uint32_t copy = uint32_t(oldCount + source.size());
            source.push_back(index);
            uv.push_back(c);
            copies.emplace(key, copy);
            index = copy;
        }
    for (uint32_t s : source) {
        shape.positions.push_back(shape.positions[s]);
        if (s < shape.normals.size()) shape.normals.push_back(shape.normals[s]);
        if (s < shape.tangents.size()) shape.tangents.push_back(shape.tangents[s]);
        if (s < shape.bitangents.size()) shape.bitangents.push_back(shape.bitangents[s]);
        if (shape.hasColors()) shape.colors.push_back(shape.colors[s]);
        for (std::vector<Vec2> &set : shape.uvSets) set.push_back(set[s]);
    }
    shape.uvSetNames.push_back(name);
    shape.uvSets.push_back(std::move(uv));
}

std::string uniqueName(const std::string &base, std::unordered_set<std::string> &taken) {
    std::string name = base;
    for (int k = 2; taken.count(name); ++k) name = base + "_" + std::to_string(k);
    taken.insert(name);
    return name;
}

}  // namespace ox

#include "scene/mesh_builder.h"

#include <algorithm>
#include <cmath>
#include <cstring>

#include "core/message.h"

namespace ox {
namespace {

const char *const kRepairText[RepairLog::kKindCount] = {
    "Degenerated triangle found, skipping it",
    "Degenerated normal found, setting it to the face normal",
    "Invalid UV added to meshificator, setting it to 0",
    "Calculated degenerated angle, setting it to 0",
    "Computed degenerated tangent or bitangent, skipping them",
    "Degenerated tangent found, repairing it",
    "Degenerated bitangent found, repairing it",
};

constexpr uint32_t kNone = ~0u;
// A vertex is compared with at most this many candidates; only absurd weld thresholds (many
// distinct vertices within one threshold) reach it, and the cut keeps the build linear.
constexpr uint32_t kMaxWeldCandidates = 4096;

uint64_t mixKey(int64_t x, int64_t y, int64_t z) {
    uint64_t h = static_cast<uint64_t>(x) * 0x9E3779B97F4A7C15ull;
    h ^= static_cast<uint64_t>(y) * 0xC2B2AE3D27D4EB4Full + (h << 6) + (h >> 2);
    h ^= static_cast<uint64_t>(z) * 0x165667B19E3779F9ull + (h << 6) + (h >> 2);
    h ^= h >> 33;
    h *= 0xFF51AFD7ED558CCDull;
    h ^= h >> 33;
    return h;
}

int64_t floatKey(float v) {
    // +0 and -0 are one position.
    float c = v + 0.0f;
    uint32_t bits;
    std::memcpy(&bits, &c, 4);
    return bits;
}

bool colorComponentMatches(float a, float b) {
    float m = std::max(std::fabs(a), std::fabs(b));
    float tol = m > 1.0f ? 1e-5f * m : 1e-5f;
    return std::fabs(a - b) <= tol;
}

// The spatial index of the weld: cells of several weld distances, or exact positions when the
// distance is 0.
struct WeldGrid {
    Vec3 origin;
    double cell = 0.0;  // 0: exact positions
    struct Key {
        int64_t x, y, z;
        bool operator==(const Key &o) const = default;
    };

    Key key(const Vec3 &p) const {
        if (cell == 0.0) return {floatKey(p.x), floatKey(p.y), floatKey(p.z)};
        return {axis(p.x, origin.x), axis(p.y, origin.y), axis(p.z, origin.z)};
    }
    int64_t axis(double v, double o) const {
        double c = std::floor((v - o) / cell);
        return static_cast<int64_t>(std::clamp(c, -1.0, 1099511627776.0));
    }
};

}  // namespace

void RepairLog::report(Kind kind) {
    if (counts_[kind]++ == 0) message(kMsgWarning, 6, "%s", kRepairText[kind]);
}

void RepairLog::summarize(const std::string &shapeName) const {
    for (int k = 0; k < kKindCount; ++k)
        if (counts_[k] > 1)
            message(kMsgWarning, 6, "Repeated %llu more times in shape %s: %s",
                    static_cast<unsigned long long>(counts_[k] - 1), shapeName.c_str(),
                    kRepairText[k]);
}

void repairTangentFrame(Vec3 &n, Vec3 &t, Vec3 &b, const TangentSpaceOptions &options,
                        RepairLog &log) {
    if (!isFinite(t)) {
        log.report(RepairLog::kDegeneratedTangent);
        if (isFinite(b)) {
            t = cross(b, n);
        } else {
            t = std::fabs(n.x) > std::fabs(n.y) ? Vec3(n.z, 0.0f, -n.x) : Vec3(0.0f, n.z, -n.y);
            t.normalize();
        }
    }
    if (!isFinite(b)) {
        log.report(RepairLog::kDegeneratedBitangent);
        b = cross(n, t);
    }
    if (options.orthogonalize) {
        Vec3 nn = n.normalized();
        t -= nn * dot(nn, t);
        t.normalize();
        b = b - nn * dot(nn, b) - t * dot(t, b);
    }
    n.normalize();
    if (options.normalize) {
        t.normalize();
        b.normalize();
    }
}

MeshBuilder::MeshBuilder(bool colors, uint32_t uvSets, const MeshBuildOptions &options)
    : options_(options), uvSets_(uvSets), colors_(colors) {
    verts_.resize(0, uvSets, colors);
}

void MeshBuilder::reserve(uint32_t vertices, uint64_t triangles) {
    verts_.reserve(vertices);
    badNormal_.reserve(vertices);
    tris_.reserve(triangles);
}

uint32_t MeshBuilder::addVertex(const Vec3 &p, const Vec3 &n, const Vec3 &tangent,
                                const Vec3 &bitangent, const Color &color, const Vec2 *uvs) {
    Vec2 fixed[16];
    std::vector<Vec2> many;
    Vec2 *uv = fixed;
    if (uvSets_ > 16) {
        many.resize(uvSets_);
        uv = many.data();
    }
    for (uint32_t k = 0; k < uvSets_; ++k) {
        uv[k] = uvs[k];
        if (!std::isfinite(uv[k].x) || !std::isfinite(uv[k].y)) {
            log_.report(RepairLog::kInvalidUv);
            if (!std::isfinite(uv[k].x)) uv[k].x = 0.0f;
            if (!std::isfinite(uv[k].y)) uv[k].y = 0.0f;
        }
    }
    const float l2 = n.lengthSquared();
    badNormal_.push_back(!(l2 >= 0.01f) || !isFinite(n) ? 1 : 0);
    return verts_.append(p, n, color, uv, tangent, bitangent);
}

bool MeshBuilder::addTriangle(uint32_t i0, uint32_t i1, uint32_t i2, uint32_t material) {
    const Vec3 p0 = verts_.position(i0), p1 = verts_.position(i1), p2 = verts_.position(i2);
    Vec3 n = cross(p1 - p0, p2 - p0);
    const float len = n.length();
    if (len <= 0.0f) {
        message(kMsgDebug, 6, "Empty triangle found, skipping it");
        return false;
    }
    if (!std::isfinite(len)) {
        log_.report(RepairLog::kDegeneratedTriangle);
        return false;
    }
    n.normalize();
    Triangle t{{i0, i1, i2}, material};
    for (uint32_t &idx : t.v) {
        if (!badNormal_[idx]) continue;
        // The corner gets its own copy with the face normal; equal copies weld again later.
        log_.report(RepairLog::kDegeneratedNormal);
        uint32_t copy = verts_.appendCopy(idx);
        verts_.normal(copy) = n;
        badNormal_.push_back(0);
        idx = copy;
    }
    tris_.push_back(t);
    return true;
}

bool MeshBuilder::attributesMatch(uint32_t a, uint32_t b) const {
    const float tol2 = options_.normalTolerance * options_.normalTolerance;
    if ((verts_.normal(a) - verts_.normal(b)).lengthSquared() >= tol2) return false;
    for (uint32_t k = 0; k < uvSets_; ++k) {
        auto uv = verts_.uvSet(static_cast<int>(k));
        Vec2 d = uv[a] - uv[b];
        if (!(d.x * d.x + d.y * d.y < 1e-14f)) return false;
    }
    if (colors_) {
        const Color &ca = verts_.color(a), &cb = verts_.color(b);
        if (!colorComponentMatches(ca.r, cb.r) || !colorComponentMatches(ca.g, cb.g) ||
            !colorComponentMatches(ca.b, cb.b) || !colorComponentMatches(ca.a, cb.a))
            return false;
    }
    if (useGivenFrames_ && uvSets_ > 0) {
        auto t = verts_.tangentSet(0), bt = verts_.bitangentSet(0);
        if (!((t[a] - t[b]).lengthSquared() < tol2)) return false;
        if (!((bt[a] - bt[b]).lengthSquared() < tol2)) return false;
    }
    return true;
}

void MeshBuilder::weld(std::vector<uint32_t> &remap, std::vector<uint32_t> &order) {
    // order holds the referenced vertices (increasing); it is replaced by the representatives.
    BBox box;
    for (uint32_t v : order) box.extend(verts_.position(v));
    const Vec3 c = box.center();
    const Vec3 h = box.extent() * 0.5f;
    WeldGrid grid;
    grid.origin = c - (h * 1.002f + Vec3(0.01f, 0.01f, 0.01f));
    float thr = options_.mergeThreshold;
    if (!(thr > 0.0f) || !std::isfinite(thr)) thr = 0.0f;
    // Cells of eight weld distances: a vertex's neighbourhood mostly stays inside its own cell
    // (one cell in about 70 % of the cases, never more than two per axis).
    grid.cell = 8.0 * double(thr);
    const double thr2 = double(thr) * double(thr);

    struct Slot {
        uint32_t head = kNone;
        uint32_t tag = 0;
    };
    // The table grows with the representatives (load at most one half), so a mesh that welds
    // well never pays for a table sized by its unwelded vertices.
    size_t slots = 1024;
    std::vector<Slot> table(slots);
    std::vector<uint32_t> next;
    std::vector<uint32_t> reps;
    std::vector<WeldGrid::Key> repKeys;  // the cell of each representative
    size_t usedSlots = 0;

    auto findSlot = [&](const WeldGrid::Key &k, bool &found) -> size_t {
        const uint64_t hsh = mixKey(k.x, k.y, k.z);
        const uint32_t tag = static_cast<uint32_t>(hsh >> 32);
        size_t i = hsh & (slots - 1);
        for (;;) {
            const Slot &s = table[i];
            if (s.head == kNone) {
                found = false;
                return i;
            }
            if (s.tag == tag && repKeys[s.head] == k) {
                found = true;
                return i;
            }
            i = (i + 1) & (slots - 1);
        }
    };
    auto grow = [&] {
        std::vector<Slot> old;
        old.swap(table);
        slots *= 2;
        table.assign(slots, Slot{});
        for (const Slot &s : old) {
            if (s.head == kNone) continue;
            bool found;
            table[findSlot(repKeys[s.head], found)] = s;
        }
    };

    for (uint32_t v : order) {
        const Vec3 p = verts_.position(v);
        uint32_t best = kNone;
        uint32_t compared = 0;
        auto scanCell = [&](const WeldGrid::Key &k) {
            bool found;
            size_t si = findSlot(k, found);
            if (!found) return;
            for (uint32_t r = table[si].head; r != kNone && compared < kMaxWeldCandidates;
                 r = next[r]) {
                ++compared;
                if (r >= best) continue;
                const Vec3 q = verts_.position(reps[r]);
                const double dx = double(p.x) - q.x, dy = double(p.y) - q.y, dz = double(p.z) - q.z;
                const bool close = (p == q) || dx * dx + dy * dy + dz * dz < thr2;
                if (close && attributesMatch(v, reps[r])) best = r;
            }
        };
        if (grid.cell == 0.0) {
            scanCell(grid.key(p));
        } else {
            const WeldGrid::Key lo = grid.key(p - Vec3(thr, thr, thr));
            const WeldGrid::Key hi = grid.key(p + Vec3(thr, thr, thr));
            for (int64_t z = lo.z; z <= hi.z; ++z)
                for (int64_t y = lo.y; y <= hi.y; ++y)
                    for (int64_t x = lo.x; x <= hi.x; ++x) scanCell({x, y, z});
        }
        if (best != kNone) {
            remap[v] = best;
            continue;
        }
        const uint32_t r = static_cast<uint32_t>(reps.size());
        const WeldGrid::Key k = grid.key(p);
        reps.push_back(v);
        repKeys.push_back(k);
        next.push_back(kNone);
        bool found;
        size_t si = findSlot(k, found);
        if (!found) {
            if (2 * (usedSlots + 1) > slots) {
                grow();
                si = findSlot(k, found);
            }
            ++usedSlots;
            table[si].tag = static_cast<uint32_t>(mixKey(k.x, k.y, k.z) >> 32);
        }
        next[r] = table[si].head;
        table[si].head = r;
        remap[v] = r;
    }
    order.swap(reps);
}

void MeshBuilder::computeTangents() {
    const uint32_t nv = verts_.size();
    for (uint32_t k = 0; k < uvSets_; ++k) {
        std::fill_n(verts_.tangentData(k), nv, Vec3{});
        std::fill_n(verts_.bitangentData(k), nv, Vec3{});
    }
    constexpr float kInvPi = 0.318309886183790671538f;
    for (const Triangle &tri : tris_) {
        const Vec3 p[3] = {verts_.position(tri.v[0]), verts_.position(tri.v[1]),
                           verts_.position(tri.v[2])};
        // Edge c runs from corner c to corner c+1; the angle at corner c lies between the edge
        // arriving (c+2) and the edge leaving (c).
        Vec3 e[3];
        for (int c = 0; c < 3; ++c) e[c] = (p[(c + 1) % 3] - p[c]).normalized();
        float w[3];
        for (int c = 0; c < 3; ++c) {
            float d = std::clamp(-dot(e[(c + 2) % 3], e[c]), -1.0f, 1.0f);
            float a = std::acos(d);
            if (!std::isfinite(a)) {
                log_.report(RepairLog::kDegeneratedAngle);
                a = 0.0f;
            }
            w[c] = a * kInvPi;
        }
        const Vec3 e1 = p[1] - p[0], e2 = p[2] - p[0];
        for (uint32_t k = 0; k < uvSets_; ++k) {
            const Vec2 *uv = verts_.uvSet(static_cast<int>(k)).data;
            const Vec2 d1 = uv[tri.v[1]] - uv[tri.v[0]], d2 = uv[tri.v[2]] - uv[tri.v[0]];
            const float det = d1.x * d2.y - d2.x * d1.y;
            Vec3 t, b;
            if (std::fabs(det) > 1e-7f) {
                t = (e1 * d2.y - e2 * d1.y) / det;
                b = (e2 * d1.x - e1 * d2.x) / det;
            }
            if (options_.tangentSpace.oddUVFlipping && det <= 0.0f) {
                t = -t;
                b = -b;
            }
            if (!isFinite(t) || !isFinite(b)) {
                log_.report(RepairLog::kDegeneratedTangentSum);
                continue;
            }
            Vec3 *ts = verts_.tangentData(k);
            Vec3 *bs = verts_.bitangentData(k);
            for (int c = 0; c < 3; ++c) {
                ts[tri.v[c]] += t * w[c];
                bs[tri.v[c]] += b * w[c];
            }
        }
    }
}

void MeshBuilder::repairFrames() {
    const uint32_t nv = verts_.size();
    for (uint32_t i = 0; i < nv; ++i) {
        Vec3 &n = verts_.normal(i);
        if (uvSets_ == 0 || !options_.tangentFrames) {
            n.normalize();
            continue;
        }
        for (uint32_t k = 0; k < uvSets_; ++k)
            repairTangentFrame(n, verts_.tangentData(k)[i], verts_.bitangentData(k)[i],
                               options_.tangentSpace, log_);
    }
}

void MeshBuilder::finish(Shape &shape, const std::string &shapeName) {
    const uint32_t nv = verts_.size();
    std::vector<uint32_t> remap(nv, kNone);
    std::vector<uint32_t> order;
    {
        // Only vertices of accepted triangles survive.
        std::vector<uint8_t> used(nv, 0);
        uint32_t count = 0;
        for (const Triangle &t : tris_)
            for (uint32_t v : t.v) count += used[v] ? 0 : (used[v] = 1);
        order.reserve(count);
        for (uint32_t v = 0; v < nv; ++v)
            if (used[v]) order.push_back(v);
    }
    badNormal_.clear();
    badNormal_.shrink_to_fit();
    if (options_.weld) {
        weld(remap, order);
    } else {
        for (uint32_t i = 0; i < order.size(); ++i) remap[order[i]] = i;
    }
    verts_.keep(order);
    order.clear();
    order.shrink_to_fit();

    // Triangles whose corners were welded together no longer have an area: drop them.
    size_t kept = 0;
    for (const Triangle &t : tris_) {
        Triangle r{{remap[t.v[0]], remap[t.v[1]], remap[t.v[2]]}, t.material};
        if (r.v[0] == r.v[1] || r.v[1] == r.v[2] || r.v[0] == r.v[2]) continue;
        tris_[kept++] = r;
    }
    if (kept != tris_.size())
        message(kMsgDebug, 6, "Welding collapsed %llu triangles of shape %s",
                static_cast<unsigned long long>(tris_.size() - kept), shapeName.c_str());
    tris_.resize(kept);
    remap.clear();
    remap.shrink_to_fit();

    if (uvSets_ > 0 && options_.tangentFrames) {
        if (useGivenFrames_)
            verts_.copyFirstFrameToAllSets();
        else
            computeTangents();
    }
    repairFrames();
    log_.summarize(shapeName);

    verts_.shrinkToFit();
    tris_.shrink_to_fit();
    shape.vertices() = std::move(verts_);
    shape.triangles() = std::move(tris_);
    shape.computeBounds();
    verts_ = VertexList();
    verts_.resize(0, uvSets_, colors_);
    tris_ = {};
}

}  // namespace ox

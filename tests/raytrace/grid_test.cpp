#include "raytrace/grid.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <map>
#include <string>
#include <vector>

#include "core/message.h"
#include "raytrace/complete_grid.h"
#include "raytrace/instance.h"
#include "raytrace/motion_blur.h"
#include "raytrace/shape.h"
#include "tests/raytrace/test_meshes.h"

namespace ox {
namespace {

using testmesh::Mesh;
using testmesh::Rng;

constexpr uint32_t kAllFlags = 0x1 | 0x2 | 0x4 | 0x8 | 0x10 | 0x20 | 0x40 | 0x80 | 0x100 | 0x400 |
                               0x800 | 0x2000 | 0x4000 | 0x8000 | 0x40000;

InstanceInput instanceOf(const Mesh &m, uint32_t shape, const Mtx4 &placement, uint32_t flags,
                         uint32_t index, const std::string &name = "inst") {
    InstanceInput in;
    in.name = name;
    in.shape = shape;
    in.mesh.positions = m.positions.data();
    in.mesh.vertexCount = m.positions.size();
    in.mesh.indices = m.indices.data();
    in.mesh.triangleCount = m.triangleCount();
    in.objectToWorld = placement;
    in.flags = flags;
    in.index = index;
    return in;
}

Mtx4 rotationY(float a) {
    Mtx4 m;
    m.m[0][0] = std::cos(a), m.m[0][2] = -std::sin(a);
    m.m[2][0] = std::sin(a), m.m[2][2] = std::cos(a);
    return m;
}

// How the structure holds an instance: as world copies of its triangles, as a shape grid seen
// through the placement, or as moving triangles (per-step placements).
enum class Held { kCopied, kInstanced, kMoving };

// The whole closest hit as the structure must report it. p0 is the first corner of the triangle
// hit as stored (object space for instanced shapes, world space for copies).
struct Reference {
    float t = -1.0f, u = 0.0f, v = 0.0f;
    uint32_t id = 0, instance = kNoInstance, flags = 0;
    bool moving = false;
    Vec3 p0;
};

// How each instance is held under the parameters (the structure's own rule, motion first).
std::vector<Held> heldAs(const std::vector<InstanceInput> &ins, const ADSParameters &params) {
    std::map<uint64_t, size_t> uses;
    for (const InstanceInput &in : ins) ++uses[in.shape];
    std::vector<Held> held;
    for (const InstanceInput &in : ins)
        held.push_back(!in.stepTransforms.empty() ? Held::kMoving
                       : CompleteGrid::choosesInstancing(params.useInstancing,
                                                         params.instancingThreshold, uses[in.shape],
                                                         in.mesh.triangleCount)
                           ? Held::kInstanced
                           : Held::kCopied);
    return held;
}

// Brute force over every triangle of every instance with the same single-triangle test and the
// same arithmetic the structure uses: world copies for copied instances, the object-space ray
// for instanced ones, the corners at the ray's time for moving ones. first/count restrict the
// triangles tested (for checking ties).
Reference bruteForce(const std::vector<InstanceInput> &ins, const std::vector<Held> &held,
                     const Ray &ray, float tmax, size_t first = 0, size_t count = SIZE_MAX) {
    Reference best;
    float limit = tmax;
    TraceRay world;
    if (!world.prepare(ray.origin, ray.direction, rayTypeRequiredFlags(ray.type), ray.time))
        return best;
    for (size_t k = 0; k < ins.size(); ++k) {
        const InstanceInput &in = ins[k];
        TraceRay local = world;
        uint32_t flags = in.flags;
        if (held[k] == Held::kInstanced) {
            IntersectInstanceGrid ig;
            if (!in.objectToWorld.inverse(ig.worldToObject)) continue;
            ig.testFlags = in.objectToWorld.determinant3() < 0 ? flags ^ kFlagOpposite : flags;
            if (!flagsVisible(flags, world.required) || !instanceRay(ig, world, local)) continue;
            flags = ig.testFlags;
        }
        size_t steps = in.stepTransforms.size() - 1;
        std::vector<Vec3> corners;
        for (size_t i = first; i < in.mesh.triangleCount && i - first < count; ++i) {
            Vec3 p[3];
            for (int c = 0; c < 3; ++c) p[c] = in.mesh.positions[in.mesh.indices[3 * i + c]];
            if (held[k] == Held::kCopied) {
                for (Vec3 &q : p) q = affinePoint(in.objectToWorld, q);
            } else if (held[k] == Held::kMoving) {
                corners.clear();
                for (const Mtx4 &m : in.stepTransforms)
                    for (const Vec3 &q : p) corners.push_back(affinePoint(m, q));
                MotionHitInterpolator::cornersAt(corners.data(), uint32_t(steps), world.time, p);
            }
            float t, u, v;
            if (intersectTriangle(p[0], p[1] - p[0], p[2] - p[0], flags, local, limit, t, u, v)) {
                limit = t;
                best = {t, u, v, uint32_t(i), in.index, in.flags, held[k] == Held::kMoving, p[0]};
            }
        }
    }
    return best;
}

// The hit on one named triangle (ties between triangles are legitimate).
Reference hitOf(const std::vector<InstanceInput> &ins, const std::vector<Held> &held,
                const Ray &ray, uint32_t instance, uint32_t id) {
    for (size_t k = 0; k < ins.size(); ++k)
        if (ins[k].index == instance)
            return bruteForce({ins[k]}, {held[k]}, ray, kInfiniteDistance, id, 1);
    return Reference();
}

// Every field of the hit against the reference; the primitive must be the triangle hit.
void expectSameHit(const Hit &hit, const Reference &ref, int ray) {
    EXPECT_EQ(hit.t, ref.t) << "ray " << ray;
    EXPECT_EQ(hit.u, ref.u) << "ray " << ray;
    EXPECT_EQ(hit.v, ref.v) << "ray " << ray;
    EXPECT_EQ(hit.w, 0.0f) << "ray " << ray;
    EXPECT_EQ(hit.id, ref.id) << "ray " << ray;
    EXPECT_EQ(hit.instance, ref.instance) << "ray " << ray;
    EXPECT_EQ(hit.flags, ref.flags) << "ray " << ray;
    ASSERT_EQ(hit.moving, ref.moving) << "ray " << ray;
    ASSERT_NE(hit.primitive, nullptr);
    if (hit.moving) {
        const auto *mt = static_cast<const MotionTriangle *>(hit.primitive);
        EXPECT_EQ(mt->id, ref.id) << "ray " << ray;
        EXPECT_EQ(mt->instance, ref.instance) << "ray " << ray;
    } else {
        const auto *tri = static_cast<const IntersectTriangle *>(hit.primitive);
        EXPECT_EQ(tri->id, ref.id) << "ray " << ray;
        EXPECT_EQ(tri->p0, ref.p0) << "ray " << ray;
    }
}

// The closest hit of one ray on both paths (the four-wide one must report the very hit of the
// eight-wide one, where the processor has it) against brute force, and occlusion below tmax.
// Returns whether the ray hits.
bool compareWithBruteForce(const CompleteGrid &grid, const std::vector<InstanceInput> &ins,
                           const std::vector<Held> &held, const Ray &ray, float tmax, int i) {
    Hit hit, narrow;
    setWideTests(false);
    bool foundNarrow = grid.intersect(ray, narrow, kInfiniteDistance, nullptr);
    setWideTests(true);
    bool found = grid.intersect(ray, hit, kInfiniteDistance, nullptr);
    EXPECT_EQ(found, foundNarrow) << "ray " << i;
    EXPECT_EQ(hit.t, narrow.t) << "ray " << i;
    EXPECT_EQ(hit.primitive, narrow.primitive) << "ray " << i;
    Reference ref = bruteForce(ins, held, ray, kInfiniteDistance);
    EXPECT_EQ(found, ref.t >= 0.0f) << "ray " << i;
    if (found && ref.t >= 0.0f) {
        // Another triangle at exactly the same distance may be reported: then the whole hit
        // must be that triangle's.
        if (hit.id != ref.id || hit.instance != ref.instance) {
            Reference other = hitOf(ins, held, ray, hit.instance, hit.id);
            EXPECT_EQ(other.t, ref.t) << "ray " << i;
            ref = other;
        }
        expectSameHit(hit, ref, i);
    }
    bool occluded = bruteForce(ins, held, ray, tmax).t >= 0.0f;
    for (bool wide : {false, true}) {
        setWideTests(wide);
        bool occ = grid.occluded(ray, tmax, nullptr);
        setWideTests(true);
        EXPECT_EQ(occ, occluded) << "ray " << i << " wide " << wide;
    }
    return found;
}

// Compares whole closest hits and occlusion answers on random rays, most from inside the scene
// box, at random shutter times. At least minHits rays must hit (default a sixth), so that the
// comparison means something.
void checkAgainstBruteForce(const std::vector<InstanceInput> &ins, const ADSParameters &params,
                            int rays, uint64_t seed, int minHits = -1,
                            const MotionBlurHandler *motion = nullptr) {
    CompleteGrid grid;
    ASSERT_TRUE(grid.build(ins, params, motion));
    std::vector<Held> held = heldAs(ins, params);
    Rng rng(seed);
    BBox box = grid.bounds();
    float diag = box.extent().length();
    BBox outer(box.center() - box.extent() * 1.5f, box.center() + box.extent() * 1.5f);
    int hits = 0;
    for (int i = 0; i < rays; ++i) {
        Ray ray;
        // Most rays start inside the scene box, every fourth one outside it.
        ray.origin = i % 4 == 0 ? rng.inBox(outer) : rng.inBox(box);
        ray.direction = rng.direction();
        // Some rays move along one or two axes only: the walk must pick its empty-space data
        // for such directions too.
        if (i % 5 == 1) ray.direction[i % 3] = 0.0f;
        if (i % 5 == 2) ray.direction[i % 3] = ray.direction[(i + 1) % 3] = 0.0f;
        if (ray.direction.lengthSquared() == 0.0f) ray.direction = {0.0f, 1.0f, 0.0f};
        ray.direction = ray.direction.normalized();
        ray.type = i % 3 == 0 ? kRayShadow : kRayPrimary;
        ray.time = rng.uniform();
        hits += compareWithBruteForce(grid, ins, held, ray, diag * rng.uniform() * 0.5f, i);
        if (::testing::Test::HasFailure()) return;
    }
    EXPECT_GT(hits, minHits < 0 ? rays / 6 : minHits);
}

TEST(CompleteGridTest, MatchesBruteForceOnOneMeshWithAndWithoutPackingAndNesting) {
    Mesh blob = testmesh::blob(40, 40);
    for (bool sse : {true, false})
        for (uint32_t depth : {0u, 4u})
            for (uint32_t flags : {kAllFlags, kAllFlags & ~kFlagDoubleSided}) {
                SCOPED_TRACE(::testing::Message()
                             << "sse " << sse << " depth " << depth << " flags " << flags);
                ADSParameters p;
                p.useSSE = sse;
                p.gridMaxDepth = depth;
                p.gridThreshold = 2;  // crowded cells everywhere: nesting is exercised
                p.gridDensity = 0.2f;
                CompleteGrid g;
                ASSERT_TRUE(g.build({instanceOf(blob, 0, Mtx4(), flags, 0)}, p));
                EXPECT_EQ(g.grid().nestedGridCount() > 0, depth > 0);
                checkAgainstBruteForce({instanceOf(blob, 0, Mtx4(), flags, 0)}, p, 1500,
                                       depth + sse);
            }
}

TEST(CompleteGridTest, MatchesBruteForceOverLargeEmptySpacesWithDefaultSettings) {
    // Two coils far apart and a small blob: most cells are empty, so rays cross them in long
    // jumps; the default settings give a fine top-level grid with shared packets.
    Mesh coil = testmesh::coil(300, 24, 0.6f), blob = testmesh::blob(30, 40, 0.3f);
    std::vector<InstanceInput> ins = {
        instanceOf(coil, 0, Mtx4(), kAllFlags, 0, "near"),
        instanceOf(coil, 0, rotationY(0.7f) * Mtx4::translation({9.0f, 4.0f, -6.0f}), kAllFlags, 1,
                   "far"),
        instanceOf(blob, 1, Mtx4::translation({4.0f, 2.0f, -3.0f}), kAllFlags, 2, "blob")};
    ADSParameters p;
    p.useInstancing = 0;
    checkAgainstBruteForce(ins, p, 3000, 77, 100);
}

TEST(CompleteGridTest, MatchesBruteForceInCoarseCellsOfManyPacketGroups) {
    // A few cells hold thousands of triangles each, with long ones that cross them all: a cell's
    // packets lie far apart in the store and fill many groups, and rays pass through cells
    // whose groups are too many to be collected before testing.
    Mesh blob = testmesh::blob(60, 64);
    for (uint32_t k = 0; k < 24; ++k) {
        uint32_t base = uint32_t(blob.positions.size());
        float a = 0.26f * float(k);
        blob.positions.insert(blob.positions.end(),
                              {{-1.5f * std::cos(a), -1.5f * std::sin(a), -0.9f},
                               {1.5f * std::cos(a), 1.5f * std::sin(a), 0.9f},
                               {1.5f * std::cos(a), 1.5f * std::sin(a) + 0.05f, 0.95f}});
        blob.indices.insert(blob.indices.end(), {base, base + 1, base + 2});
    }
    for (float density : {0.001f, 0.01f}) {
        SCOPED_TRACE(::testing::Message() << "density " << density);
        ADSParameters p;
        p.gridMaxDepth = 0;
        p.gridDensity = density;
        checkAgainstBruteForce({instanceOf(blob, 0, Mtx4(), kAllFlags, 0)}, p, 400, 5);
    }
}

TEST(CompleteGridTest, MatchesBruteForceOnPlatesAlongCellPlanesAndPartialPackets) {
    // Square plates in the planes z = k / 4 and x = k / 4 (on cell planes of the grid and of its
    // nested grids, where the packed boxes are clipped and stored in steps of the cell), rays
    // along the axes among them, and 1 to 3 loose triangles so that the last packet of four is
    // incomplete.
    for (uint32_t loose : {1u, 2u, 3u}) {
        SCOPED_TRACE(::testing::Message() << "loose " << loose);
        Mesh m;
        auto quad = [&](Vec3 a, Vec3 b, Vec3 c, Vec3 d) {
            uint32_t base = uint32_t(m.positions.size());
            m.positions.insert(m.positions.end(), {a, b, c, d});
            m.indices.insert(m.indices.end(), {base, base + 1, base + 2, base, base + 2, base + 3});
        };
        for (int k = 0; k <= 8; ++k) {
            float w = float(k) * 0.25f;
            quad({0, 0, w}, {2, 0, w}, {2, 2, w}, {0, 2, w});
            quad({w, 0, 0}, {w, 0, 2}, {w, 2, 2}, {w, 2, 0});
        }
        for (uint32_t i = 0; i < loose; ++i) {
            uint32_t base = uint32_t(m.positions.size());
            float f = 0.3f + 0.5f * float(i);
            m.positions.insert(m.positions.end(),
                               {{f, 0.1f, 0.1f}, {f, 1.9f, 0.2f}, {f, 1.0f, 1.9f}});
            m.indices.insert(m.indices.end(), {base, base + 1, base + 2});
        }
        ASSERT_EQ(m.triangleCount() % 4, (36 + loose) % 4);
        for (uint32_t depth : {0u, 2u}) {
            ADSParameters p;
            p.gridMaxDepth = depth;
            p.gridThreshold = 3;
            checkAgainstBruteForce({instanceOf(m, 0, Mtx4(), kAllFlags, 0)}, p, 1200, 11 + loose);
        }
    }
}

TEST(CompleteGridTest, MatchesBruteForceWithInstancesCopiedOrInstanced) {
    Mesh blob = testmesh::blob(30, 36), coil = testmesh::coil(80, 10, 0.5f);
    std::vector<InstanceInput> ins;
    Mtx4 mirror = Mtx4::scale({-1.0f, 1.0f, 1.0f}) * Mtx4::translation({3.0f, 0.0f, 0.0f});
    ins.push_back(instanceOf(blob, 0, Mtx4(), kAllFlags, 0));
    ins.push_back(instanceOf(blob, 0, rotationY(0.7f) * Mtx4::translation({2.5f, 0.5f, 0.0f}),
                             kAllFlags & ~kFlagDoubleSided, 1));
    ins.push_back(instanceOf(blob, 0, mirror, kAllFlags & ~kFlagDoubleSided, 2));
    ins.push_back(
        instanceOf(coil, 1, Mtx4::scale({1.0f, 0.5f, 1.0f}), kAllFlags & ~kFlagCastShadows, 3));
    ins.push_back(instanceOf(coil, 1, rotationY(1.3f) * Mtx4::translation({0.0f, 2.0f, 1.0f}),
                             (kAllFlags & ~kFlagDoubleSided) | kFlagOpposite, 4));
    for (int mode : {kInstancingNever, kInstancingAlways})
        for (bool sse : {true, false}) {
            SCOPED_TRACE(::testing::Message() << "instancing " << mode << " sse " << sse);
            ADSParameters p;
            p.useInstancing = mode;
            p.useSSE = sse;
            p.gridThreshold = 4;
            checkAgainstBruteForce(ins, p, 1500, 7 + mode + sse);
        }
}

TEST(CompleteGridTest, MatchesBruteForceWhenCopiedInstancedAndMovingShapesMeet) {
    // Default instancing: the blob, placed three times, is instanced (one placement mirrored);
    // the coil, used twice but small, and the single sphere are copied; one blob moves and is
    // copied as moving triangles. They interpenetrate, so rays meet packets of copies, shape
    // grids and moving triangles in the same cells, one after the other.
    Mesh blob = testmesh::blob(24, 30), coil = testmesh::coil(40, 8, 0.4f),
         ball = testmesh::blob(10, 12, 0.7f);
    Mtx4 mirror = Mtx4::scale({-1.0f, 1.0f, 1.0f}) * Mtx4::translation({1.2f, 0.3f, 0.0f});
    uint32_t single = kAllFlags & ~kFlagDoubleSided;
    std::vector<InstanceInput> ins = {
        instanceOf(blob, 0, Mtx4(), single, 0),
        instanceOf(blob, 0, rotationY(0.9f) * Mtx4::translation({0.8f, 0.4f, 0.2f}), kAllFlags, 1),
        instanceOf(blob, 0, mirror, single, 2),
        instanceOf(coil, 1, Mtx4::translation({0.3f, 0.1f, 0.0f}), kAllFlags, 3),
        instanceOf(coil, 1, rotationY(1.3f) * Mtx4::translation({0.6f, -0.2f, 0.4f}), single, 4),
        instanceOf(ball, 2, Mtx4::translation({0.5f, 0.2f, -0.1f}), kAllFlags, 5),
        instanceOf(blob, 3, Mtx4::translation({0.2f, -0.3f, 0.3f}), kAllFlags, 6)};
    ins[6].stepTransforms = {Mtx4::translation({0.2f, -0.3f, 0.3f}),
                             rotationY(0.4f) * Mtx4::translation({0.7f, 0.0f, 0.1f})};
    MotionBlurHandler motion(MotionBlurHandler::k3D, 1);
    for (bool sse : {true, false})
        for (uint32_t depth : {0u, 4u}) {
            SCOPED_TRACE(::testing::Message() << "sse " << sse << " depth " << depth);
            ADSParameters p;
            p.useSSE = sse;
            p.gridMaxDepth = depth;
            p.gridThreshold = 4;
            p.instancingThreshold = 1000;
            std::vector<Held> held = heldAs(ins, p);
            ASSERT_EQ(held[0], Held::kInstanced);
            ASSERT_EQ(held[3], Held::kCopied);
            ASSERT_EQ(held[5], Held::kCopied);
            checkAgainstBruteForce(ins, p, 3000, 31 + depth + sse, -1, &motion);
        }
}

TEST(CompleteGridTest, MirroredInstanceCullsTheSameFacesAsItsCopy) {
    Mesh blob = testmesh::blob(16, 16);
    Mtx4 mirror = Mtx4::scale({-1.0f, 1.0f, 1.0f});
    std::vector<InstanceInput> ins = {instanceOf(blob, 0, mirror, kAllFlags & ~kFlagDoubleSided, 0),
                                      instanceOf(blob, 0, mirror * Mtx4::translation({5, 0, 0}),
                                                 kAllFlags & ~kFlagDoubleSided, 1)};
    ADSParameters copied, instanced;
    copied.useInstancing = kInstancingNever;
    instanced.useInstancing = kInstancingAlways;
    CompleteGrid a, b;
    ASSERT_TRUE(a.build(ins, copied));
    ASSERT_TRUE(b.build(ins, instanced));
    EXPECT_EQ(b.shapeGridCount(), 2u);
    EXPECT_EQ(b.shapeBaseGridCount(), 1u);
    Rng rng(3);
    int agree = 0, hits = 0;
    for (int i = 0; i < 2000; ++i) {
        Ray ray;
        ray.origin = rng.inBox(a.bounds());
        ray.direction = rng.direction();
        Hit ha, hb;
        bool fa = a.intersect(ray, ha, nullptr), fb = b.intersect(ray, hb, nullptr);
        // Copy and instance differ by rounding only: grazing hits aside, the same face is hit.
        if (fa == fb && (!fa || (ha.id == hb.id && ha.instance == hb.instance))) ++agree;
        hits += fa;
    }
    EXPECT_GT(hits, 200);
    EXPECT_GE(agree, 1990);
}

TEST(CompleteGridTest, RayTypeRulesAndCulling) {
    // One triangle in the plane z = 0, facing +z (counter-clockwise seen from +z).
    Mesh tri;
    tri.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}};
    tri.indices = {0, 1, 2};
    auto build = [&](uint32_t flags, CompleteGrid &g) {
        return g.build({instanceOf(tri, 0, Mtx4(), flags, 0)}, ADSParameters());
    };
    Ray down;
    down.origin = {0.25f, 0.25f, 1.0f};
    down.direction = {0, 0, -1};
    Ray up = down;
    up.origin.z = -1.0f;
    up.direction = {0, 0, 1};

    CompleteGrid g;
    ASSERT_TRUE(build(kAllFlags, g));
    // The zero z-extent is widened, so the flat grid works.
    EXPECT_GT(g.grid().box().extent().z, 0.0f);
    Hit h;
    EXPECT_TRUE(g.intersect(down, h, nullptr));
    EXPECT_FLOAT_EQ(h.t, 1.0f);
    EXPECT_FLOAT_EQ(h.u, 0.25f);
    EXPECT_FLOAT_EQ(h.v, 0.25f);
    EXPECT_EQ(h.flags, kAllFlags);
    EXPECT_TRUE(g.intersect(up, h, nullptr));

    // Environment rays hit nothing, and are counted.
    RayCounter counter;
    Ray env = down;
    env.type = kRayEnvironment;
    EXPECT_FALSE(g.intersect(env, h, &counter));
    EXPECT_FALSE(g.occluded(env, 10.0f, &counter));
    EXPECT_EQ(counter.count(kRayEnvironment), 2u);
    EXPECT_EQ(h.t, -1.0f);

    // A hit closer than 1e-6 is ignored; tmax is exclusive.
    Ray close = down;
    close.origin.z = 1e-7f;
    EXPECT_FALSE(g.intersect(close, h, nullptr));
    EXPECT_FALSE(g.intersect(down, h, 1.0f, nullptr));
    EXPECT_TRUE(g.intersect(down, h, 1.0001f, nullptr));

    // Shadow rays pass through objects that do not cast shadows.
    CompleteGrid noShadow;
    ASSERT_TRUE(build(kAllFlags & ~kFlagCastShadows, noShadow));
    Ray shadow = down;
    shadow.type = kRayShadow;
    EXPECT_FALSE(noShadow.occluded(shadow, 10.0f, nullptr));
    EXPECT_TRUE(noShadow.intersect(down, h, nullptr));
    EXPECT_TRUE(g.occluded(shadow, 10.0f, nullptr));

    // Single-sided: the back (seen from below) is culled; Opposite culls the front instead.
    CompleteGrid single, opposite;
    ASSERT_TRUE(build(kAllFlags & ~kFlagDoubleSided, single));
    ASSERT_TRUE(build((kAllFlags & ~kFlagDoubleSided) | kFlagOpposite, opposite));
    EXPECT_TRUE(single.intersect(down, h, nullptr));
    EXPECT_FALSE(single.intersect(up, h, nullptr));
    EXPECT_FALSE(opposite.intersect(down, h, nullptr));
    EXPECT_TRUE(opposite.intersect(up, h, nullptr));

    // Non-finite rays miss.
    Ray bad = down;
    bad.origin.x = std::numeric_limits<float>::quiet_NaN();
    EXPECT_FALSE(g.intersect(bad, h, nullptr));
    bad = down;
    bad.direction = {0, 0, -std::numeric_limits<float>::infinity()};
    EXPECT_FALSE(g.occluded(bad, 10.0f, nullptr));
    bad.direction = {0, 0, 0};
    EXPECT_FALSE(g.intersect(bad, h, nullptr));
    EXPECT_FALSE(g.intersect(down, h, std::numeric_limits<float>::quiet_NaN(), nullptr));
}

TEST(CompleteGridTest, BrokenSceneBoxFailsTheBuildAndBadTrianglesAreSkipped) {
    // Two finite triangles so far apart that the box extent overflows.
    Mesh huge;
    huge.positions = {{-3e38f, 0, 0}, {-3e38f, 1, 0}, {-3e38f, 0, 1},
                      {3e38f, 0, 0},  {3e38f, 1, 0},  {3e38f, 0, 1}};
    huge.indices = {0, 1, 2, 3, 4, 5};
    CompleteGrid g;
    testing::internal::CaptureStdout();
    EXPECT_FALSE(g.build({instanceOf(huge, 0, Mtx4(), kAllFlags, 0)}, ADSParameters()));
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Scene Bounding Box is broken, not rendering"), std::string::npos);
    Ray r;
    r.direction = {0, 0, -1};
    r.origin = {0, 0.5f, 1};
    Hit h;
    EXPECT_FALSE(g.intersect(r, h, nullptr));

    Mesh mixed;
    float nan = std::numeric_limits<float>::quiet_NaN();
    mixed.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {nan, 0, 0}};
    mixed.indices = {0, 1, 2, 0, 3, 1, 0, 7, 2};
    CompleteGrid m;
    testing::internal::CaptureStdout();
    EXPECT_TRUE(m.build({instanceOf(mixed, 0, Mtx4(), kAllFlags, 0, "mixed")}, ADSParameters()));
    out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Skipped 2 triangles"), std::string::npos) << out;
    EXPECT_EQ(m.primitiveCount(), 1u);
    r.origin = {0.2f, 0.2f, 1.0f};
    EXPECT_TRUE(m.intersect(r, h, nullptr));

    // Singular and non-finite placements are skipped with a warning.
    Mesh tri;
    tri.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}};
    tri.indices = {0, 1, 2};
    Mtx4 flat = Mtx4::scale({1, 1, 0});
    Mtx4 inf;
    inf.m[3][0] = std::numeric_limits<float>::infinity();
    CompleteGrid s;
    testing::internal::CaptureStdout();
    EXPECT_TRUE(s.build({instanceOf(tri, 0, flat, kAllFlags, 0, "flat"),
                         instanceOf(tri, 0, inf, kAllFlags, 1, "far"),
                         instanceOf(tri, 0, Mtx4(), kAllFlags, 2, "good")},
                        ADSParameters()));
    out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Instance flat has a singular"), std::string::npos);
    EXPECT_NE(out.find("Instance far has a singular"), std::string::npos);
    EXPECT_EQ(s.primitiveCount(), 1u);
    EXPECT_TRUE(s.intersect(r, h, nullptr));
    EXPECT_EQ(h.instance, 2u);

    // An empty scene builds and every ray misses.
    CompleteGrid none;
    EXPECT_TRUE(none.build({}, ADSParameters()));
    EXPECT_FALSE(none.intersect(r, h, nullptr));
    EXPECT_FALSE(none.occluded(r, 1e30f, nullptr));
}

TEST(CompleteGridTest, InstancingDecisionsAndMessages) {
    EXPECT_FALSE(CompleteGrid::choosesInstancing(kInstancingAutoDetect, 500, 10, 499));
    EXPECT_TRUE(CompleteGrid::choosesInstancing(kInstancingAutoDetect, 500, 10, 500));
    EXPECT_FALSE(CompleteGrid::choosesInstancing(kInstancingAutoDetect, 500, 1, 5000));
    EXPECT_TRUE(CompleteGrid::choosesInstancing(kInstancingAlways, 500, 1, 1));
    EXPECT_FALSE(CompleteGrid::choosesInstancing(kInstancingNever, 0, 10, 5000));
    EXPECT_FALSE(CompleteGrid::choosesInstancing(17, 0, 10, 5000));

    Mesh big = testmesh::blob(11, 25), small = big;
    small.indices.resize(small.indices.size() - 3);
    ASSERT_EQ(small.triangleCount(), 499u);
    ASSERT_EQ(big.triangleCount(), 500u);
    auto tenOf = [&](const Mesh &m) {
        std::vector<InstanceInput> ins;
        for (uint32_t i = 0; i < 10; ++i)
            ins.push_back(instanceOf(m, 0, Mtx4::translation({3.0f * i, 0, 0}), kAllFlags, i));
        return ins;
    };
    CompleteGrid a, b;
    ASSERT_TRUE(a.build(tenOf(small), ADSParameters()));
    EXPECT_EQ(a.shapeGridCount(), 0u);
    EXPECT_EQ(a.primitiveCount(), 4990u);
    testing::internal::CaptureStdout();
    setTypeEnabled(kMsgVerbose, true);
    ASSERT_TRUE(b.build(tenOf(big), ADSParameters()));
    setTypeEnabled(kMsgVerbose, false);
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(b.shapeGridCount(), 10u);
    EXPECT_EQ(b.shapeBaseGridCount(), 1u);
    EXPECT_EQ(b.primitiveCount(), 10u);
    for (const char *text :
         {"Inserting Shapes into ADS", "Building ADS structure",
          "Building ADS: ", "Built CompleteGrid with 10 primitives",
          "Number of shape grids      : 10", "Number of shape base grids : 1",
          "Number of voxels                    : ", "Max elements in a voxel             : "})
        EXPECT_NE(out.find(text), std::string::npos) << text;

    // Displaced or moving instances are copied even when instancing is chosen.
    std::vector<InstanceInput> ins = tenOf(big);
    ins[3].displaced = true;
    ins[4].stepTransforms = {Mtx4(), Mtx4::translation({0, 1, 0})};
    MotionBlurHandler motion(MotionBlurHandler::k3D, 1);
    CompleteGrid c;
    testing::internal::CaptureStdout();
    ASSERT_TRUE(c.build(ins, ADSParameters(), &motion));
    out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Instancing and Render Time Displacement Mapping is not compatible, the "
                       "shape will be copied (inst)"),
              std::string::npos);
    EXPECT_NE(out.find("Instancing and 3D Motion Blur is not compatible, the shape will be copied "
                       "(inst)"),
              std::string::npos);
    EXPECT_EQ(c.shapeGridCount(), 8u);
    EXPECT_EQ(c.primitiveCount(), 8u + 2 * 500u);
}

TEST(GridTest, ResolutionRuleAndBounds) {
    // Near-cubic cells, about density x N of them.
    GridResolution r = Grid::resolution(1000, 1.0, 1.0, 1.0, 1.0f);
    EXPECT_EQ(r.nx, 10);
    EXPECT_EQ(r.ny, 10);
    EXPECT_EQ(r.nz, 10);
    r = Grid::resolution(1000, 4.0, 1.0, 1.0, 1.0f);
    EXPECT_GE(r.nx, 3 * r.ny);
    // Density not positive or NaN is 1.
    for (float d : {0.0f, -3.0f, std::numeric_limits<float>::quiet_NaN()}) {
        GridResolution q = Grid::resolution(1000, 1.0, 1.0, 1.0, d);
        EXPECT_EQ(q.total(), 1000);
    }
    // Huge densities and flat boxes stay within 8 N and 2^28 cells per axis and in total.
    r = Grid::resolution(100, 1.0, 1.0, 1.0, 1e30f);
    EXPECT_LE(r.total(), 800);
    r = Grid::resolution(100, 1e6, 0.003, 0.003, 1.0f);
    EXPECT_LE(r.nx, 800);
    EXPECT_GE(r.ny, 1);
    r = Grid::resolution(uint64_t(1) << 27, 1.0, 1.0, 1.0, 1e9f);
    EXPECT_LE(r.total(), int64_t(1) << 28);
    EXPECT_EQ(Grid::resolution(0, 1, 1, 1, 1).total(), 0);

    BBox w = Grid::widen(BBox({0, 0, 0}, {2, 1, 0}));
    EXPECT_FLOAT_EQ(w.max.x - w.min.x, 2.002f);
    EXPECT_FLOAT_EQ(w.max.z - w.min.z, 0.003f);
    EXPECT_FALSE(Grid::boxUsable(BBox({0, 0, 0}, {-1, 1, 1})));
    EXPECT_FALSE(Grid::boxUsable(BBox({0, 0, 0}, {std::numeric_limits<float>::infinity(), 1, 1})));
    EXPECT_TRUE(Grid::boxUsable(BBox({0, 0, 0}, {0, 0, 0})));
}

TEST(GridTest, RefinementFollowsDepthAndAcceptanceRules) {
    // A small dense blob among scattered triangles: a few crowded cells.
    Mesh m = testmesh::blob(40, 40, 0.05f);
    Rng rng(5);
    for (int i = 0; i < 300; ++i) {
        uint32_t base = uint32_t(m.positions.size());
        Vec3 c = rng.inBox(BBox({-5, -5, -5}, {5, 5, 5}));
        m.positions.insert(m.positions.end(), {c, c + Vec3(0.05f, 0, 0), c + Vec3(0, 0.05f, 0)});
        m.indices.insert(m.indices.end(), {base, base + 1, base + 2});
    }
    for (uint32_t depth : {0u, 1u, 4u, 99u}) {
        ADSParameters p;
        p.gridMaxDepth = depth;
        CompleteGrid g;
        ASSERT_TRUE(g.build({instanceOf(m, 0, Mtx4(), kAllFlags, 0)}, p));
        if (depth == 0)
            EXPECT_EQ(g.grid().nestedGridCount(), 0u);
        else
            EXPECT_GT(g.grid().nestedGridCount(), 0u);
        EXPECT_LE(g.grid().nestingDepth(), std::min(depth, Grid::kMaxDepthLimit));
    }
    // Triangles that all cross one point cannot be separated: refinement is refused.
    Mesh fan;
    fan.positions.push_back({0, 0, 0});
    for (int i = 0; i < 400; ++i) {
        float a = 6.2831853f * i / 400.0f;
        fan.positions.push_back({std::cos(a), std::sin(a), 0.3f * std::sin(3 * a)});
    }
    for (uint32_t i = 1; i <= 400; ++i) fan.indices.insert(fan.indices.end(), {0, i, i % 400 + 1});
    ADSParameters p;
    p.gridDensity = 0.0001f;  // one cell holding all 400
    CompleteGrid g;
    ASSERT_TRUE(g.build({instanceOf(fan, 0, Mtx4(), kAllFlags, 0)}, p));
    EXPECT_EQ(g.grid().cells().total(), 1);
    EXPECT_EQ(g.grid().nestedGridCount(), 0u);
    EXPECT_EQ(g.grid().stats().maxElements, 400u);
}

// Whether a triangle meets a closed box, by clipping the triangle against the box's six planes
// in double precision (independent of the structure's separating-axis test).
bool clippedOverlap(const Vec3 corners[3], const double lo[3], const double hi[3]) {
    std::vector<std::array<double, 3>> poly, next;
    for (int c = 0; c < 3; ++c) poly.push_back({corners[c].x, corners[c].y, corners[c].z});
    for (int a = 0; a < 3 && !poly.empty(); ++a)
        for (int side = 0; side < 2 && !poly.empty(); ++side) {
            auto inside = [&](const std::array<double, 3> &p) {
                return side == 0 ? p[a] >= lo[a] : p[a] <= hi[a];
            };
            const double plane = side == 0 ? lo[a] : hi[a];
            next.clear();
            for (size_t i = 0; i < poly.size(); ++i) {
                const auto &p = poly[i], &q = poly[(i + 1) % poly.size()];
                if (inside(p)) next.push_back(p);
                if (inside(p) != inside(q)) {
                    double f = (plane - p[a]) / (q[a] - p[a]);
                    std::array<double, 3> x;
                    for (int k = 0; k < 3; ++k) x[k] = p[k] + f * (q[k] - p[k]);
                    x[a] = plane;
                    next.push_back(x);
                }
            }
            poly.swap(next);
        }
    return !poly.empty();
}

// Checks every cell of the grid and of its nested grids against every triangle: a cell that the
// triangle meets clearly inside (the cell shrunk by 1e-4 of its size) must list it, one that
// the triangle misses clearly (the cell grown by 5% of its smallest side, more than the cell
// margin) must not. Counts the cases of each kind.
void checkCellContents(const Grid &grid, const PrimitiveStore &store, size_t &held, size_t &apart) {
    const GridResolution n = grid.cells();
    const BBox box = grid.box();
    const Vec3 size = grid.cellSize();
    const float minSide = std::min({size.x, size.y, size.z});
    for (int64_t z = 0; z < n.nz; ++z)
        for (int64_t y = 0; y < n.ny; ++y)
            for (int64_t x = 0; x < n.nx; ++x) {
                const std::vector<uint32_t> items = grid.cellItems(x, y, z);
                if (items.size() == 1 && (items[0] >> kItemIndexBits) == kItemChild) {
                    checkCellContents(*grid.child(items[0] & kItemIndexMask), store, held, apart);
                    continue;
                }
                const int64_t i[3] = {x, y, z}, last[3] = {n.nx - 1, n.ny - 1, n.nz - 1};
                double lo[3], hi[3], inLo[3], inHi[3], outLo[3], outHi[3];
                for (int a = 0; a < 3; ++a) {
                    lo[a] = box.min[a] + float(i[a]) * size[a];
                    hi[a] = i[a] == last[a] ? box.max[a] : box.min[a] + float(i[a] + 1) * size[a];
                    inLo[a] = lo[a] + 1e-4 * (hi[a] - lo[a]);
                    inHi[a] = hi[a] - 1e-4 * (hi[a] - lo[a]);
                    outLo[a] = lo[a] - 0.05 * minSide;
                    outHi[a] = hi[a] + 0.05 * minSide;
                }
                for (uint32_t k = 0; k < store.triangles.size(); ++k) {
                    const IntersectTriangle &t = store.triangles[k];
                    const Vec3 c[3] = {t.p0, t.p0 + t.e1, t.p0 + t.e2};
                    const bool listed = std::find(items.begin(), items.end(),
                                                  itemCode(kItemTriangle, k)) != items.end();
                    if (clippedOverlap(c, inLo, inHi)) {
                        ++held;
                        ASSERT_TRUE(listed) << "triangle " << t.id << " missing from cell " << x
                                            << " " << y << " " << z << " depth " << grid.depth();
                    } else if (!clippedOverlap(c, outLo, outHi)) {
                        ++apart;
                        ASSERT_FALSE(listed) << "triangle " << t.id << " listed in far cell " << x
                                             << " " << y << " " << z << " depth " << grid.depth();
                    }
                }
            }
}

TEST(GridTest, CellsHoldExactlyTheTrianglesThatMeetThem) {
    // Triangles of every shape the insertion treats apart: inside one cell, thin ones along one
    // axis (one row of cells), flat ones across an axis (one layer), skewed ones through all
    // three axes, long diagonal slivers whose box covers many cells they miss, degenerate ones
    // (collinear corners) and ones on the grid's outer cells.
    Rng rng(17);
    PrimitiveStore store;
    auto add = [&](Vec3 a, Vec3 b, Vec3 c) {
        IntersectTriangle t;
        t.p0 = a, t.e1 = b - a, t.e2 = c - a;
        t.id = uint32_t(store.triangles.size());
        store.triangles.push_back(t);
    };
    const BBox scene({-1, -1, -1}, {1, 1, 1});
    for (int i = 0; i < 300; ++i) {
        const Vec3 p = rng.inBox(scene);
        const float s = i % 3 == 0 ? 0.02f : (i % 3 == 1 ? 0.2f : 0.9f);
        auto jitter = [&](float e) {
            return Vec3(rng.uniform(), rng.uniform(), rng.uniform()) * e;
        };
        const int a = i % 3;
        Vec3 along;
        along[a] = s;
        switch (i % 6) {
            case 0:  // thin along one axis
                add(p, p + along + jitter(0.002f), p + along * 0.5f + jitter(0.004f));
                break;
            case 1: {  // flat across an axis
                Vec3 q = p + jitter(s), r = p + jitter(s);
                q[a] = r[a] = p[a];
                add(p, q, r);
                break;
            }
            case 2:  // any orientation
                add(p, p + jitter(s) - jitter(s), p + jitter(s) - jitter(s));
                break;
            case 3: {  // long diagonal sliver
                Vec3 d = rng.direction() * (2.0f * s);
                add(p - d, p + d, p + d + jitter(0.01f));
                break;
            }
            case 4: {  // collinear corners
                Vec3 d = rng.direction() * s;
                add(p, p + d, p + d * 2.0f);
                break;
            }
            default:  // at the scene's edge
                add({1.0f, p.y, p.z}, {1.0f - 0.1f * s, p.y + s, p.z}, {1.0f, p.y, p.z + s});
                break;
        }
    }
    std::vector<uint32_t> codes;
    for (uint32_t k = 0; k < store.triangles.size(); ++k)
        codes.push_back(itemCode(kItemTriangle, k));
    for (uint32_t depth : {0u, 2u})
        for (float density : {1.0f, 8.0f}) {
            SCOPED_TRACE(::testing::Message() << "depth " << depth << " density " << density);
            GridParams params;
            params.sse = false;  // cells list their triangles themselves
            params.maxDepth = depth;
            params.threshold = 4;
            params.density = density;
            Grid grid;
            ASSERT_TRUE(grid.build(store, codes, store.boundsOf(codes), params));
            EXPECT_EQ(grid.nestedGridCount() > 0, depth > 0);
            size_t held = 0, apart = 0;
            checkCellContents(grid, store, held, apart);
            EXPECT_GT(held, 500u);
            EXPECT_GT(apart, 50000u);
        }
}

TEST(PrimitiveStoreTest, PacketOrderKeepsTrianglesAndListsCodesInStoreOrder) {
    // Small triangles on a long thin strip, shuffled, with duplicates, among moving-triangle and
    // instance codes: the strip's grid has thousands of cells along x (curve positions of many
    // radix digits).
    Rng rng(23);
    PrimitiveStore store;
    std::vector<uint32_t> codes;
    const int kCount = 6000;
    for (int i = 0; i < kCount; ++i) {
        IntersectTriangle t;
        const float x = float((i * 7919) % kCount) * 0.01f;
        t.p0 = {x, 0.1f * rng.uniform(), 0.1f * rng.uniform()};
        t.e1 = {0.005f, 0.001f, 0.0f};
        t.e2 = {0.0f, 0.001f, 0.004f};
        t.id = uint32_t(i);
        store.triangles.push_back(t);
        codes.push_back(itemCode(kItemTriangle, uint32_t(i)));
        if (i % 500 == 0) codes.push_back(itemCode(kItemMotion, uint32_t(i)));
        if (i % 700 == 0) codes.push_back(itemCode(kItemInstance, uint32_t(i)));
    }
    // Copies of triangle 0 (same corners, later ids) must follow it in id order.
    for (uint32_t k = 1; k <= 5; ++k) {
        IntersectTriangle t = store.triangles[0];
        t.id = uint32_t(kCount) + k - 1;
        codes.insert(codes.begin() + 3 * k, itemCode(kItemTriangle, uint32_t(kCount) + k - 1));
        store.triangles.push_back(t);
    }
    const std::vector<uint32_t> before = codes;
    store.sortForPackets(codes, 1.0f);
    ASSERT_EQ(codes.size(), before.size());
    std::vector<char> seen(store.triangles.size(), 0);
    uint32_t next = 0;
    for (size_t k = 0; k < codes.size(); ++k) {
        if ((before[k] >> kItemIndexBits) != kItemTriangle) {
            EXPECT_EQ(codes[k], before[k]) << k;  // other codes stay in place
            continue;
        }
        ASSERT_EQ(codes[k] >> kItemIndexBits, uint32_t(kItemTriangle));
        EXPECT_EQ(codes[k] & kItemIndexMask, next++);  // ascending, each once
        seen[store.triangles[codes[k] & kItemIndexMask].id] = 1;
    }
    EXPECT_EQ(next, store.triangles.size());
    EXPECT_EQ(std::count(seen.begin(), seen.end(), 1), kCount + 5);
    // Stable among equals: the copies right after the original, in id order.
    size_t first = 0;
    while (store.triangles[first].id != 0) ++first;
    for (uint32_t k = 1; k <= 5; ++k) EXPECT_EQ(store.triangles[first + k].id, kCount + k - 1);
    // Packets hold neighbours: the four of a packet lie within a few triangle spacings along
    // the strip (shuffled, they would lie over half the strip apart).
    double spread = 0.0;
    for (size_t p = 0; p + 4 <= store.triangles.size(); p += 4) {
        float lo = 1e30f, hi = -1e30f;
        for (size_t k = p; k < p + 4; ++k)
            lo = std::min(lo, store.triangles[k].p0.x), hi = std::max(hi, store.triangles[k].p0.x);
        spread += hi - lo;
    }
    EXPECT_LT(spread / double(store.triangles.size() / 4), 0.5);
}

TEST(CompleteGridTest, RaysAimedAtSparseTrianglesFindThem) {
    // Small triangles scattered through a box of mostly empty cells, in rows of all lengths
    // (below, at and above sixteen cells), and rays from all over aimed at each triangle's
    // centre: a walk that jumps too far over empty space misses them. At the highest density
    // the grid is large enough for the walk to fetch cells ahead along the ray.
    for (float density : {1.0f, 8.0f, 300.0f}) {
        SCOPED_TRACE(::testing::Message() << "density " << density);
        Rng rng(41);
        Mesh m;
        for (int i = 0; i < 1200; ++i) {
            uint32_t base = uint32_t(m.positions.size());
            Vec3 c = rng.inBox(BBox({-3, -1, -2}, {3, 1, 2}));
            m.positions.insert(m.positions.end(), {c + Vec3(-0.003f, -0.002f, 0.001f),
                                                   c + Vec3(0.003f, -0.001f, -0.002f),
                                                   c + Vec3(0.0f, 0.003f, 0.002f)});
            m.indices.insert(m.indices.end(), {base, base + 1, base + 2});
        }
        const std::vector<InstanceInput> ins = {instanceOf(m, 0, Mtx4(), kAllFlags, 0)};
        ADSParameters p;
        p.gridDensity = density;
        p.gridMaxDepth = 0;
        CompleteGrid grid;
        ASSERT_TRUE(grid.build(ins, p));
        const std::vector<Held> held = heldAs(ins, p);
        int hits = 0;
        for (uint32_t t = 0; t < m.triangleCount(); ++t) {
            Vec3 centre = (m.positions[3 * t] + m.positions[3 * t + 1] + m.positions[3 * t + 2]) *
                          (1.0f / 3.0f);
            for (int k = 0; k < 4; ++k) {
                Ray ray;
                ray.origin = rng.inBox(BBox({-4, -2, -3}, {4, 2, 3}));
                ray.direction = (centre - ray.origin).normalized();
                Hit hit;
                bool found = grid.intersect(ray, hit, kInfiniteDistance, nullptr);
                Reference ref = bruteForce(ins, held, ray, kInfiniteDistance);
                ASSERT_EQ(found, ref.t >= 0.0f) << "triangle " << t << " ray " << k;
                if (found) {
                    ASSERT_EQ(hit.t, ref.t) << "triangle " << t << " ray " << k;
                }
                hits += found;
            }
        }
        EXPECT_GT(hits, 3600);
    }
}

// A strip folded like an accordion: columns of quads of width w whose ridges alternate between
// heights -a and a, so that neighbouring triangles (and the packets they form) face steeply
// different ways; with a second sheet at height gap below the first (facing the other way) when
// gap > 0.
Mesh accordion(uint32_t columns, uint32_t rows, float w, float a, float gap) {
    Mesh m;
    for (int sheet = 0; sheet < (gap > 0.0f ? 2 : 1); ++sheet) {
        uint32_t base = uint32_t(m.positions.size());
        for (uint32_t j = 0; j <= rows; ++j)
            for (uint32_t i = 0; i <= columns; ++i)
                m.positions.push_back(
                    {float(i) * w, float(j) * w, (i % 2 ? a : -a) - float(sheet) * gap});
        for (uint32_t j = 0; j < rows; ++j)
            for (uint32_t i = 0; i < columns; ++i) {
                uint32_t c = base + j * (columns + 1) + i, d = c + columns + 1;
                if (sheet == 0)
                    m.indices.insert(m.indices.end(), {c, c + 1, d + 1, c, d + 1, d});
                else
                    m.indices.insert(m.indices.end(), {c, d + 1, c + 1, c, d, d + 1});
            }
    }
    return m;
}

TEST(CompleteGridTest, RaysThatGrazeOrTouchTrianglesFindThem) {
    // Rays aimed at corners, edges and insides of triangles, from every side and along the
    // surface (in its plane or nearly): the group tests drop packets the ray passes beside,
    // which must never be a packet the ray hits. Folded packets, two sheets close together,
    // nested grids of tiny cells and coordinates far larger than the cells.
    struct Case {
        const char *name;
        Mesh mesh;
        Vec3 offset;
        float density;
        uint32_t depth, threshold;
    };
    const Case cases[] = {
        {"folded", accordion(40, 30, 0.05f, 0.04f, 0.0f), {0, 0, 0}, 0.05f, 0, 25},
        {"two sheets", accordion(30, 30, 0.05f, 0.01f, 1e-4f), {0, 0, 0}, 0.05f, 0, 25},
        {"far away", accordion(30, 20, 0.02f, 0.015f, 0.0f), {1.2e4f, -0.8e4f, 1e4f}, 0.05f, 0, 25},
        {"nested", testmesh::blob(30, 40), {0, 0, 0}, 0.2f, 3, 2},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<InstanceInput> ins = {
            instanceOf(c.mesh, 0, Mtx4::translation(c.offset), kAllFlags, 0)};
        ADSParameters p;
        p.gridDensity = c.density;
        p.gridMaxDepth = c.depth;
        p.gridThreshold = c.threshold;
        CompleteGrid grid;
        ASSERT_TRUE(grid.build(ins, p));
        const std::vector<Held> held = heldAs(ins, p);
        const float diag = grid.bounds().extent().length();
        Rng rng(17);
        int rays = 0, hits = 0;
        for (uint32_t t = 0; t < c.mesh.triangleCount(); t += 5) {
            Vec3 q[3];
            for (int k = 0; k < 3; ++k)
                q[k] = c.mesh.positions[c.mesh.indices[3 * t + k]] + c.offset;
            const Vec3 e1 = q[1] - q[0], e2 = q[2] - q[0];
            const Vec3 n = cross(e1, e2).normalized();
            const float u = rng.uniform(), v = rng.uniform() * (1.0f - u);
            const Vec3 targets[] = {q[0], q[1], q[0] + e1 * 0.5f, q[1] + (q[2] - q[1]) * u,
                                    q[0] + e1 * u + e2 * v};
            for (const Vec3 &target : targets) {
                // From anywhere, then along an edge or the surface with a small slope (a
                // ten-thousandth, a thousandth, a hundredth) from either side; exactly in the
                // plane the triangle test itself is ill-conditioned.
                Vec3 along = (rng.uniform() < 0.5f ? e1 : e2 - e1 * rng.uniform()).normalized();
                const float slopes[] = {1e-4f, 1e-3f, -1e-3f, 1e-2f};
                Vec3 dirs[5] = {rng.direction()};
                for (int k = 0; k < 4; ++k) dirs[k + 1] = (along + n * slopes[k]).normalized();
                for (const Vec3 &d : dirs) {
                    Ray ray;
                    const float length = diag * (0.05f + 1.5f * rng.uniform());
                    ray.direction = d;
                    ray.origin = target - d * length;
                    ray.type = rays % 3 == 0 ? kRayShadow : kRayPrimary;
                    // Occlusion up to just short of or just beyond the point aimed at.
                    const float tmax = length * (rays % 2 ? 1.001f : 0.999f);
                    hits += compareWithBruteForce(grid, ins, held, ray, tmax, rays);
                    ASSERT_FALSE(::testing::Test::HasFailure())
                        << "triangle " << t << " target " << target.x << " " << target.y << " "
                        << target.z;
                    ++rays;
                }
            }
        }
        EXPECT_GT(hits, rays / 2);
    }
}

TEST(MotionBlurTest, MovingTrianglesFollowTheRayTime) {
    Mesh tri;
    tri.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}};
    tri.indices = {0, 1, 2};
    InstanceInput in = instanceOf(tri, 0, Mtx4(), kAllFlags, 0, "mover");
    in.stepTransforms = {Mtx4(), Mtx4::translation({0, 0, 1}), Mtx4::translation({0, 0, 4})};
    MotionBlurHandler motion(MotionBlurHandler::k3D, 2);
    CompleteGrid g;
    ASSERT_TRUE(g.build({in}, ADSParameters(), &motion));
    Ray r;
    r.origin = {0.2f, 0.2f, 10.0f};
    r.direction = {0, 0, -1};
    Hit h;
    for (auto [time, z] : {std::pair{0.0f, 0.0f},
                           {0.25f, 0.5f},
                           {0.5f, 1.0f},
                           {0.75f, 2.5f},
                           {1.0f, 4.0f},
                           {7.0f, 4.0f},
                           {-1.0f, 0.0f}}) {
        r.time = time;
        ASSERT_TRUE(g.intersect(r, h, nullptr)) << time;
        EXPECT_FLOAT_EQ(h.t, 10.0f - z) << time;
        EXPECT_TRUE(h.moving);
        const MotionTriangle *mt = static_cast<const MotionTriangle *>(h.primitive);
        Vec3 p =
            MotionHitInterpolator::interpolate(&g.motionCorners(*mt), mt->steps, time, h.u, h.v);
        EXPECT_NEAR(p.z, z, 1e-5f);
        EXPECT_NEAR(p.x, 0.2f, 1e-6f);
        Vec3 mv = MotionBlurHandler::MotionVectorExtractor::extract(&g.motionCorners(*mt),
                                                                    mt->steps, h.u, h.v);
        EXPECT_EQ(mv, Vec3(0, 0, 4));
    }
    // Without the MotionBlur flag the instance stays put.
    in.flags &= ~kFlagMotionBlur;
    CompleteGrid still;
    ASSERT_TRUE(still.build({in}, ADSParameters(), &motion));
    r.time = 1.0f;
    ASSERT_TRUE(still.intersect(r, h, nullptr));
    EXPECT_FALSE(h.moving);
    EXPECT_FLOAT_EQ(h.t, 10.0f);

    // Step counts below 1 are 1; the ray time is clamped.
    EXPECT_EQ(MotionBlurHandler(MotionBlurHandler::k3D, 0).steps(), 1u);
    EXPECT_EQ(MotionBlurHandler(MotionBlurHandler::k3D, -5).steps(), 1u);
    uint32_t k;
    float w;
    MotionBlurHandler::stepOf(4, 1.0f, k, w);
    EXPECT_EQ(k, 3u);
    EXPECT_FLOAT_EQ(w, 1.0f);
    MotionBlurHandler::stepOf(4, 0.3f, k, w);
    EXPECT_EQ(k, 1u);
    EXPECT_NEAR(w, 0.2f, 1e-5f);
    EXPECT_EQ(MotionBlurHandler::clampTime(std::numeric_limits<float>::quiet_NaN()), 0.0f);
}

}  // namespace
}  // namespace ox

namespace ox {
namespace {

TEST(CompleteGridTest, BuildsFromSceneInstancesAndSharesTheirShapes) {
    Mesh blob = testmesh::blob(11, 25);
    Shape shape("blob");
    shape.vertices().resize(uint32_t(blob.positions.size()), 0, false);
    for (uint32_t i = 0; i < blob.positions.size(); ++i)
        shape.vertices().setPosition(i, blob.positions[i]);
    for (size_t t = 0; t < blob.triangleCount(); ++t)
        shape.triangles().push_back(
            {{blob.indices[3 * t], blob.indices[3 * t + 1], blob.indices[3 * t + 2]}, 0});
    std::vector<std::unique_ptr<Instance>> owned;
    std::vector<InstanceInput> ins;
    for (uint32_t i = 0; i < 3; ++i) {
        owned.push_back(Instance::create("i" + std::to_string(i),
                                         Mtx4::translation({4.0f * i, 0, 0}), &shape, nullptr,
                                         kAllFlags));
        ins.push_back(instanceInput(*owned.back(), i));
    }
    CompleteGrid g;
    ASSERT_TRUE(g.build(ins, ADSParameters()));
    EXPECT_EQ(g.shapeBaseGridCount(), 1u);
    EXPECT_EQ(g.shapeGridCount(), 3u);
    Ray r;
    r.origin = {8.0f, 0.05f, 10.0f};
    r.direction = {0, 0, -1};
    Hit h;
    ASSERT_TRUE(g.intersect(r, h, nullptr));
    EXPECT_EQ(h.instance, 2u);
    Vec3 p = r.origin + r.direction * h.t;
    Vec3 q = owned[2]->objectToWorld().transformPoint(shape.corner(h.id, 0) * (1 - h.u - h.v) +
                                                      shape.corner(h.id, 1) * h.u +
                                                      shape.corner(h.id, 2) * h.v);
    EXPECT_NEAR((p - q).length(), 0.0f, 1e-5f);
}

}  // namespace
}  // namespace ox

namespace ox {
namespace {

TEST(CompleteGridTest, SecondStructureHoldsEnvelopeInstancesOnly) {
    Mesh tri;
    tri.positions = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}};
    tri.indices = {0, 1, 2};
    std::vector<InstanceInput> ins = {
        instanceOf(tri, 0, Mtx4(), kAllFlags, 0, "plain"),
        instanceOf(tri, 0, Mtx4::translation({0, 0, 2}), kAllFlags | kFlagEnvelop, 1, "cage")};
    CompleteGrid g;
    ASSERT_TRUE(g.build(ins, ADSParameters()));
    Ray r;
    r.origin = {0.2f, 0.2f, 5.0f};
    r.direction = {0, 0, -1};
    r.type = kRayEnvelope;
    Hit h;
    // Envelope rays see only the cage, in either structure.
    ASSERT_TRUE(g.intersectSecond(r, h, kInfiniteDistance, nullptr));
    EXPECT_EQ(h.instance, 1u);
    EXPECT_FLOAT_EQ(h.t, 3.0f);
    ASSERT_TRUE(g.intersect(r, h, nullptr));
    EXPECT_EQ(h.instance, 1u);
    // Primary rays see both in the main structure and only the cage in the second one.
    r.type = kRayPrimary;
    r.origin.z = 1.0f;
    ASSERT_TRUE(g.intersect(r, h, nullptr));
    EXPECT_EQ(h.instance, 0u);
    EXPECT_FALSE(g.intersectSecond(r, h, kInfiniteDistance, nullptr));
    r.origin.z = 5.0f;
    ASSERT_TRUE(g.intersectSecond(r, h, kInfiniteDistance, nullptr));
    EXPECT_EQ(h.instance, 1u);
    ADSParameters none;
    none.secondStructureMask = 0;
    CompleteGrid empty;
    ASSERT_TRUE(empty.build(ins, none));
    EXPECT_FALSE(empty.intersectSecond(r, h, kInfiniteDistance, nullptr));
}

}  // namespace
}  // namespace ox

// Small arrays come from the ordinary heap, large ones 2 MiB aligned; both keep their contents
// through growth and release cleanly (the sanitizer build checks the pairing).
TEST(LargeArrayAllocator, AlignsAndKeepsContents) {
    std::vector<uint32_t, ox::LargeArrayAllocator<uint32_t>> v(100);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(v.data()) % 16, 0u);
    for (uint32_t i = 0; i < 100; ++i) v[i] = i * 7u;
    v.resize(size_t(3) << 20);  // 12 MiB
    EXPECT_EQ(reinterpret_cast<uintptr_t>(v.data()) % (size_t(2) << 20), 0u);
    EXPECT_EQ(v[99], 693u);
    v.resize(10);
    v.shrink_to_fit();
    EXPECT_EQ(v[9], 63u);
    ox::LargeArrayAllocator<uint32_t> a;
    EXPECT_THROW((void)a.allocate(size_t(-1) / 2), std::bad_alloc);
}

#include "raytrace/complete_grid.h"

#include <chrono>
#include <cmath>
#include <exception>
#include <map>
#include <stdexcept>

#include "core/message.h"
#include "raytrace/instance.h"
#include "raytrace/motion_blur.h"
#include "raytrace/shape.h"

namespace ox {

namespace {

std::string elapsedText(std::chrono::steady_clock::time_point start) {
    double s = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    char buf[64];
    std::snprintf(buf, sizeof buf, "%.3f s", s);
    return buf;
}

// Appends the instance's triangles, transformed by m, to the store; returns the number skipped
// for bad indices or non-finite corners.
size_t addTriangles(PrimitiveStore &store, std::vector<uint32_t> &codes, const MeshInput &mesh,
                    const Mtx4 &m, bool transform, uint32_t flags, uint32_t instance) {
    size_t skipped = 0;
    for (size_t i = 0; i < mesh.triangleCount; ++i) {
        uint32_t ix[3] = {mesh.corner(i, 0), mesh.corner(i, 1), mesh.corner(i, 2)};
        if (ix[0] >= mesh.vertexCount || ix[1] >= mesh.vertexCount || ix[2] >= mesh.vertexCount) {
            ++skipped;
            continue;
        }
        Vec3 p[3];
        for (int c = 0; c < 3; ++c)
            p[c] = transform ? affinePoint(m, mesh.position(ix[c])) : mesh.position(ix[c]);
        IntersectTriangle t;
        t.p0 = p[0];
        t.e1 = p[1] - p[0];
        t.e2 = p[2] - p[0];
        if (!isFinite(p[0]) || !isFinite(p[1]) || !isFinite(p[2]) || !isFinite(t.e1) ||
            !isFinite(t.e2) || store.triangles.size() >= kMaxItemIndex) {
            ++skipped;
            continue;
        }
        t.flags = flags;
        t.id = uint32_t(i);
        t.instance = instance;
        codes.push_back(itemCode(kItemTriangle, uint32_t(store.triangles.size())));
        store.triangles.push_back(t);
    }
    return skipped;
}

bool matrixUsable(const Mtx4 &m, Mtx4 &inverse) {
    if (!m.isFinite()) return false;
    float det = m.determinant3();
    if (!std::isfinite(det) || det == 0.0f) return false;
    if (!m.inverse(inverse) || !inverse.isFinite()) return false;
    return true;
}

// Moving triangles of an instance: corners at every step.
size_t addMotionTriangles(PrimitiveStore &store, std::vector<uint32_t> &codes,
                          const InstanceInput &in, const MotionBlurHandler &motion) {
    uint32_t steps = motion.steps();
    const auto &own = motion.stepTransforms();
    size_t skipped = 0;
    const MeshInput &mesh = in.mesh;
    for (size_t i = 0; i < mesh.triangleCount; ++i) {
        uint32_t ix[3] = {mesh.corner(i, 0), mesh.corner(i, 1), mesh.corner(i, 2)};
        bool bad =
            ix[0] >= mesh.vertexCount || ix[1] >= mesh.vertexCount || ix[2] >= mesh.vertexCount;
        for (const MeshInput &sm : in.stepMeshes)
            bad = bad || !sm.usable() || sm.triangleCount != mesh.triangleCount ||
                  sm.vertexCount != mesh.vertexCount;
        if (bad) {
            ++skipped;
            continue;
        }
        MotionTriangle mt;
        mt.firstCorner = uint32_t(store.motionCorners.size());
        mt.steps = steps;
        mt.flags = in.flags;
        mt.id = uint32_t(i);
        mt.instance = in.index;
        bool ok = store.motion.size() < kMaxItemIndex;
        for (uint32_t k = 0; k <= steps && ok; ++k) {
            const MeshInput *pos = &in.mesh;
            if (!in.stepMeshes.empty())
                pos = &in.stepMeshes[std::min<size_t>(k, in.stepMeshes.size() - 1)];
            Mtx4 m = in.objectToWorld;
            if (!in.stepTransforms.empty())
                m = in.stepTransforms[std::min<size_t>(k, in.stepTransforms.size() - 1)];
            if (!own.empty()) m = m * own[std::min<size_t>(k, own.size() - 1)];
            for (int c = 0; c < 3; ++c) {
                Vec3 p = affinePoint(m, pos->position(ix[c]));
                if (!isFinite(p)) ok = false;
                store.motionCorners.push_back(p);
                mt.box.extend(p);
            }
        }
        if (!ok) {
            store.motionCorners.resize(mt.firstCorner);
            ++skipped;
            continue;
        }
        codes.push_back(itemCode(kItemMotion, uint32_t(store.motion.size())));
        store.motion.push_back(mt);
    }
    return skipped;
}

GridParams gridParams(const ADSParameters &p) {
    GridParams g;
    g.density = p.gridDensity;
    g.threshold = p.gridThreshold;
    g.maxDepth = std::min(p.gridMaxDepth, Grid::kMaxDepthLimit);
    g.sse = p.useSSE;
    return g;
}

}  // namespace

ADSInterface::~ADSInterface() = default;

InstanceInput instanceInput(const Instance &instance, uint32_t index) {
    InstanceInput in;
    const Shape &shape = instance.shape();
    in.name = instance.name();
    in.shape = uint64_t(reinterpret_cast<uintptr_t>(&shape));
    in.mesh.px = shape.vertices().px();
    in.mesh.py = shape.vertices().py();
    in.mesh.pz = shape.vertices().pz();
    in.mesh.vertexCount = shape.vertices().size();
    in.mesh.triangleCount = shape.triangleCount();
    in.mesh.triangles = shape.triangles().data();
    in.objectToWorld = instance.objectToWorld();
    in.flags = instance.flags();
    in.index = index;
    return in;
}

CompleteGrid::CompleteGrid() = default;
CompleteGrid::~CompleteGrid() = default;

bool CompleteGrid::choosesInstancing(int useInstancing, uint32_t instancingThreshold,
                                     size_t shapeUses, size_t shapeTriangles) {
    switch (useInstancing) {
        case kInstancingAlways:
            return true;
        case kInstancingAutoDetect:
            return shapeUses > 1 && shapeTriangles >= instancingThreshold;
        default:
            return false;
    }
}

size_t CompleteGrid::primitiveCount() const {
    return store_.triangles.size() + store_.motion.size() + store_.instances.size();
}

size_t CompleteGrid::sizeBytes() const {
    size_t n = sizeof(*this) + store_.sizeBytes() + grid_.sizeBytes() + secondStore_.sizeBytes() +
               second_.sizeBytes();
    for (const auto &s : shapes_)
        n += sizeof(ShapeGrid) + s->store.sizeBytes() + s->grid.sizeBytes();
    return n;
}

bool CompleteGrid::build(const std::vector<InstanceInput> &instances, const ADSParameters &params,
                         const MotionBlurHandler *motion) {
    // A scene beyond the structure's limits (more cell references than its 32-bit lists can
    // index) or beyond the memory ends the build with one message that says which.
    const char *failure = nullptr;
    try {
        return buildStructure(instances, params, motion);
    } catch (const std::length_error &) {
        failure = "The scene is too large for the acceleration structure: too many cell references";
    } catch (const std::exception &) {
        failure = "Not enough memory to build the acceleration structure";
    }
    store_ = PrimitiveStore();
    secondStore_ = PrimitiveStore();
    shapes_.clear();
    grid_.build(store_, {}, BBox(), GridParams());
    second_.build(secondStore_, {}, BBox(), GridParams());
    message(kMsgError, 1, "%s", failure);
    return false;
}

bool CompleteGrid::buildStructure(const std::vector<InstanceInput> &instances,
                                  const ADSParameters &params, const MotionBlurHandler *motion) {
    auto start = std::chrono::steady_clock::now();
    store_ = PrimitiveStore();
    secondStore_ = PrimitiveStore();
    shapes_.clear();
    box_ = BBox();
    GridParams gp = gridParams(params);
    bool threeD = motion && motion->threeD();

    // Instancing decisions.
    std::map<uint64_t, size_t> uses;
    for (const auto &in : instances) ++uses[in.shape];
    std::vector<char> instanced(instances.size(), 0), moving(instances.size(), 0),
        usable(instances.size(), 1);
    std::vector<Mtx4> inverses(instances.size());
    size_t countDisplaced = 0, countMoving = 0, countPlain = 0, countInstanced = 0;
    for (size_t i = 0; i < instances.size(); ++i) {
        const InstanceInput &in = instances[i];
        if (!matrixUsable(in.objectToWorld, inverses[i]) || !in.mesh.usable()) {
            message(kMsgWarning, 1, "Instance %s has a singular or non-finite placement, skipped",
                    in.name.c_str());
            usable[i] = 0;
            continue;
        }
        moving[i] = threeD && motion->instanceMoves(in.flags, !in.stepTransforms.empty(),
                                                    !in.stepMeshes.empty());
        bool inst = choosesInstancing(params.useInstancing, params.instancingThreshold,
                                      uses[in.shape], in.mesh.triangleCount);
        if (inst && in.displaced) {
            message(kMsgWarning, 1,
                    "Instancing and Render Time Displacement Mapping is not compatible, the "
                    "shape will be copied (%s)",
                    in.name.c_str());
            inst = false;
        }
        if (inst && moving[i]) {
            message(kMsgWarning, 1,
                    "Instancing and 3D Motion Blur is not compatible, the shape will be copied "
                    "(%s)",
                    in.name.c_str());
            inst = false;
        }
        instanced[i] = inst;
        if (inst)
            ++countInstanced;
        else if (in.displaced)
            countDisplaced += in.mesh.triangleCount;
        else if (moving[i])
            countMoving += in.mesh.triangleCount;
        else
            countPlain += in.mesh.triangleCount;
    }
    store_.triangles.reserve(countPlain + countDisplaced);
    store_.motion.reserve(countMoving);
    store_.instances.reserve(countInstanced);

    message(kMsgProgress, 1, "Inserting Shapes into ADS");
    std::vector<uint32_t> codes, secondCodes;
    codes.reserve(countPlain + countDisplaced + countMoving + countInstanced);
    std::map<uint64_t, ShapeGrid *> shapeGrids;
    for (size_t i = 0; i < instances.size(); ++i) {
        if (!usable[i]) continue;
        const InstanceInput &in = instances[i];
        size_t skipped = 0;
        if (instanced[i]) {
            ShapeGrid *&sg = shapeGrids[in.shape];
            if (!sg) {
                auto owned = std::make_unique<ShapeGrid>();
                std::vector<uint32_t> shapeCodes;
                skipped =
                    addTriangles(owned->store, shapeCodes, in.mesh, Mtx4(), false, 0u, kNoInstance);
                if (gp.sse) owned->store.sortForPackets(shapeCodes, gp.density);
                if (!owned->grid.build(owned->store, shapeCodes, owned->store.boundsOf(shapeCodes),
                                       gp, 0, true))
                    return false;
                sg = owned.get();
                shapes_.push_back(std::move(owned));
            }
            if (sg->grid.empty()) continue;
            IntersectInstanceGrid ig;
            ig.objectToWorld = in.objectToWorld;
            ig.worldToObject = inverses[i];
            ig.flags = in.flags;
            ig.testFlags =
                in.objectToWorld.determinant3() < 0.0f ? in.flags ^ kFlagOpposite : in.flags;
            ig.instance = in.index;
            ig.grid = &sg->grid;
            ig.store = &sg->store;
            const BBox &sb = sg->grid.box();
            for (int c = 0; c < 8; ++c)
                ig.box.extend(affinePoint(in.objectToWorld,
                                          {c & 1 ? sb.max.x : sb.min.x, c & 2 ? sb.max.y : sb.min.y,
                                           c & 4 ? sb.max.z : sb.min.z}));
            if (!isFinite(ig.box.min) || !isFinite(ig.box.max)) {
                message(kMsgWarning, 1,
                        "Instance %s has a singular or non-finite placement, skipped",
                        in.name.c_str());
                continue;
            }
            codes.push_back(itemCode(kItemInstance, uint32_t(store_.instances.size())));
            store_.instances.push_back(ig);
        } else if (moving[i]) {
            skipped = addMotionTriangles(store_, codes, in, *motion);
        } else {
            skipped =
                addTriangles(store_, codes, in.mesh, in.objectToWorld, true, in.flags, in.index);
        }
        if (skipped)
            message(kMsgWarning, 1,
                    "Skipped %zu triangles with bad indices or non-finite corners (%s)", skipped,
                    in.name.c_str());
        if (in.flags & params.secondStructureMask) {
            size_t s2 = addTriangles(secondStore_, secondCodes, in.mesh, in.objectToWorld, true,
                                     in.flags, in.index);
            (void)s2;
        }
    }

    message(kMsgProgress, 1, "Building ADS structure");
    if (gp.sse) {
        store_.sortForPackets(codes, gp.density);
        secondStore_.sortForPackets(secondCodes, gp.density);
    }
    box_ = store_.boundsOf(codes);
    if (!grid_.build(store_, codes, box_, gp, 0, true)) return false;
    if (!second_.build(secondStore_, secondCodes, secondStore_.boundsOf(secondCodes), gp, 0, true))
        return false;

    message(kMsgBench, 1, "Building ADS: %s", elapsedText(start).c_str());
    message(kMsgInfo, 1, "Built CompleteGrid with %d primitives", int(primitiveCount()));
    message(kMsgVerbose, 1, "Number of shape grids      : %d", int(store_.instances.size()));
    message(kMsgVerbose, 1, "Number of shape base grids : %d", int(shapes_.size()));
    GridStats st = grid_.stats();
    message(kMsgVerbose, 1, "Number of voxels                    : %d", int(st.voxels));
    message(kMsgVerbose, 1, "Number of occupied voxels           : %d", int(st.occupied));
    message(kMsgVerbose, 1, "Average elements per voxel          : %f",
            st.voxels ? double(st.elements) / double(st.voxels) : 0.0);
    message(kMsgVerbose, 1, "Average elements per occupied voxel : %f",
            st.occupied ? double(st.elements) / double(st.occupied) : 0.0);
    message(kMsgVerbose, 1, "Max elements in a voxel             : %d", int(st.maxElements));
    return true;
}

template <bool kAny>
bool CompleteGrid::query(const Grid &grid, const PrimitiveStore &store, const Ray &ray, Hit *hit,
                         float tmax, RayCounter *counter) const {
    if (counter) counter->add(ray.type);
    // The record is written field by field: a whole-record copy of a fresh Hit stalls on its
    // overlapping stores in every query.
    if constexpr (!kAny) {
        hit->t = -1.0f;
        hit->u = hit->v = hit->w = 0.0f;
        hit->id = 0;
        hit->instance = kNoInstance;
        hit->flags = 0;
        hit->primitive = nullptr;
        hit->moving = false;
    }
    if (ray.type == kRayEnvironment || !(tmax > 0.0f)) return false;
    TraceRay r;
    if (!r.prepare(ray.origin, ray.direction, rayTypeRequiredFlags(ray.type), ray.time))
        return false;
    TraceState s;
    s.limit = tmax;
    if (!grid.traverse<kAny>(r, s)) return false;
    if constexpr (!kAny) {
        hit->t = s.limit;
        hit->u = s.u;
        hit->v = s.v;
        switch (s.kind) {
            case kItemMotion: {
                const MotionTriangle &m = store.motion[s.prim];
                hit->id = m.id, hit->instance = m.instance, hit->flags = m.flags;
                hit->primitive = &m;
                hit->moving = true;
                break;
            }
            case kItemInstance: {
                const IntersectInstanceGrid &ig = store.instances[s.inst];
                const IntersectTriangle &t = ig.store->triangles[s.prim];
                hit->id = s.id;
                hit->instance = ig.instance, hit->flags = ig.flags;
                hit->primitive = &t;
                break;
            }
            default: {
                // The triangle was just tested: its record is still in the cache.
                const IntersectTriangle *t = &store.triangles[s.prim];
                hit->id = t->id, hit->instance = t->instance, hit->flags = t->flags;
                hit->primitive = t;
                break;
            }
        }
    }
    return true;
}

bool CompleteGrid::intersect(const Ray &ray, Hit &hit, float tmax, RayCounter *counter) const {
    return query<false>(grid_, store_, ray, &hit, tmax, counter);
}

bool CompleteGrid::intersectSecond(const Ray &ray, Hit &hit, float tmax,
                                   RayCounter *counter) const {
    return query<false>(second_, secondStore_, ray, &hit, tmax, counter);
}

bool CompleteGrid::occluded(const Ray &ray, float tmax, RayCounter *counter) const {
    return query<true>(grid_, store_, ray, nullptr, tmax, counter);
}

}  // namespace ox

#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "core/types.h"
#include "raytrace/intersect.h"
#include "raytrace/large_allocator.h"

namespace ox {

class Grid;
struct PrimitiveStore;

/// Primitive kinds a grid cell refers to; the kind sits in the top three bits of an item code.
enum ItemKind : uint32_t {
    kItemPacket = 0,    ///< Four store triangles tested together: index k names 4k to 4k + 3.
    kItemTriangle = 1,  ///< An IntersectTriangle of the store.
    kItemMotion = 2,    ///< A MotionTriangle of the store.
    kItemInstance = 3,  ///< An IntersectInstanceGrid of the store.
    kItemChild = 4,     ///< A DynamicVoxel: a nested grid of the grid itself.
    kItemGroup = 5,     ///< The first of a cell's packet groups (index into the grid's groups).
    kItemEmpty = 6,     ///< A cell word only: an empty cell with its distances (see Grid).
    kItemList = 7,      ///< A cell word only: offset of the cell's count and codes in the list.
};

/// Up to four packets with the boxes of the cell's triangles in them (clipped to the cell),
/// tested together so that a ray only runs the triangle kernel on packets whose box it passes
/// through. The boxes are stored in 1/255 steps of the cell's frame (the cell grown by the
/// grid's frame pad), rounded outwards by one more step. A cell's groups follow each other; the
/// first one's `run` counts them. Three groups to two cache lines.
struct alignas(16) PacketGroup {
    uint8_t lo[3][4];  ///< Per axis, per packet.
    uint8_t hi[3][4];
    uint32_t packet[4] = {0, 0, 0, 0};  ///< Packet indexes.
    uint32_t run = 1;                   ///< Groups of the cell from this one on.
    uint32_t lanes = 0;  ///< Bit j set for each packet slot j in use (the first one to four).
};
static_assert(sizeof(PacketGroup) == 48, "three groups to two cache lines");
constexpr uint32_t kItemIndexBits = 29;
constexpr uint32_t kItemIndexMask = (1u << kItemIndexBits) - 1u;
/// Largest number of primitives of one kind a store can address.
constexpr uint32_t kMaxItemIndex = kItemIndexMask;

/// Item code of a primitive of a kind.
constexpr uint32_t itemCode(ItemKind kind, uint32_t index) {
    return (uint32_t(kind) << kItemIndexBits) | index;
}

/// A triangle whose corners move over the shutter interval: (steps + 1) * 3 corners, step-major,
/// in the store's motion corner list.
struct MotionTriangle {
    uint32_t firstCorner = 0;
    uint32_t steps = 1;
    uint32_t flags = 0;
    uint32_t id = 0;
    uint32_t instance = kNoInstance;
    BBox box;  ///< Box over every step.
};

/// An instance of a shared shape: its placement, flag word and the shape grid in object space.
struct IntersectInstanceGrid {
    Mtx4 objectToWorld, worldToObject;
    uint32_t flags = 0;      ///< The instance's flag word (reported in hits).
    uint32_t testFlags = 0;  ///< The flags its triangles are tested with (Opposite toggled when
                             ///< the placement mirrors, so the same faces are culled as a copy).
    uint32_t instance = kNoInstance;        ///< Scene instance index.
    const Grid *grid = nullptr;             ///< The shape grid (owned by the complete grid).
    const PrimitiveStore *store = nullptr;  ///< The shape grid's triangles.
    BBox box;                               ///< World-space box.
};

/// Everything a hierarchy of grids indexes: world (or object) triangles, moving triangles and
/// instances. With SSE packing, triangles 4k to 4k + 3 form packet k: the triangles are stored
/// in an order that keeps each packet's four close together (sortForPackets).
struct PrimitiveStore {
    std::vector<IntersectTriangle, LargeArrayAllocator<IntersectTriangle>> triangles;
    std::vector<MotionTriangle> motion;
    std::vector<Vec3> motionCorners;
    std::vector<IntersectInstanceGrid> instances;

    /// Box of the primitive an item code names.
    BBox bounds(uint32_t code) const;
    /// Box of the primitives the item codes name (finite boxes, as stores hold).
    BBox boundsOf(const std::vector<uint32_t> &codes) const;
    /// Bytes held.
    size_t sizeBytes() const;
    /// Reorders the triangles along a space-filling curve over the cells of a grid of the given
    /// density (inside one cell along the same curve), so that four consecutive triangles lie
    /// close together, and renames the triangle codes in codes to match; the renamed codes are
    /// put back in ascending order into the places that held triangle codes. Deterministic: ties
    /// keep the earlier triangle first.
    void sortForPackets(std::vector<uint32_t> &codes, float density);
};

/// Parameters shared by a grid and its nested grids.
struct GridParams {
    float density = 1.0f;     ///< Cells per primitive (not positive or NaN: 1).
    uint32_t threshold = 25;  ///< Primitives per cell before refinement.
    uint32_t maxDepth = 4;    ///< Nesting limit (clamped to 16).
    bool sse = true;          ///< Pack triangles four to a block; four times the threshold.
};

/// Cell counts of a grid.
struct GridResolution {
    int64_t nx = 0, ny = 0, nz = 0;
    int64_t total() const { return nx * ny * nz; }
};

/// Voxel statistics of a grid (its own cells; a refined cell counts one element).
struct GridStats {
    uint64_t voxels = 0, occupied = 0, elements = 0, maxElements = 0;
};

/// Uniform voxel grid over primitives; crowded cells are refined into nested grids.
class Grid final {
public:
    static constexpr uint32_t kMaxDepthLimit = 16;

    Grid() = default;
    Grid(const Grid &) = delete;
    Grid &operator=(const Grid &) = delete;

    /// Widens a box as the top-level grid does: half-extents times 1.001, plus 0.0015 when the
    /// extent is below 0.0015.
    static BBox widen(const BBox &box);
    /// True when every extent is finite and not negative.
    static bool boxUsable(const BBox &box);
    /// Cell counts for n primitives over a box with the given extents (all positive), each axis
    /// and the total bounded by 8 n and 2^28.
    static GridResolution resolution(uint64_t n, double dx, double dy, double dz, float density);

    /// Builds over the primitives (item codes into store) inside box; widen for top-level grids.
    /// False (with an error message) when the box is broken; the grid is then empty.
    bool build(const PrimitiveStore &store, const std::vector<uint32_t> &prims, const BBox &box,
               const GridParams &params, uint32_t depth = 0, bool widenBox = true);

    /// Closest hit below state.limit; updates state and returns true when one was found.
    bool intersect(const TraceRay &ray, TraceState &state) const {
        return traverse<false>(ray, state);
    }
    BBox bounds() const { return box_; }
    /// True when anything lies between 1e-6 and tmax.
    bool occluded(const TraceRay &ray, float tmax) const {
        TraceState s;
        s.limit = tmax;
        return traverse<true>(ray, s);
    }
    /// The walk itself; kAny stops at the first hit.
    template <bool kAny>
    bool traverse(const TraceRay &ray, TraceState &state) const;

    bool empty() const { return cells_.empty(); }
    const BBox &box() const { return box_; }
    GridResolution cells() const { return {nx_, ny_, nz_}; }
    Vec3 cellSize() const { return cellSize_; }
    /// Per-grid tolerance max(0.001, 1e-5 |cell diagonal|).
    float tolerance() const { return tolerance_; }
    uint32_t depth() const { return depth_; }
    /// Voxel statistics of this grid's own cells.
    GridStats stats() const { return stats_; }
    /// Number of nested grids below this one (all levels).
    size_t nestedGridCount() const;
    /// Deepest nesting level below this grid (0 = none).
    uint32_t nestingDepth() const;
    /// Bytes held by this grid and its nested grids.
    size_t sizeBytes() const;
    /// Item codes of the cell (x, y, z) (for tests).
    std::vector<uint32_t> cellItems(int64_t x, int64_t y, int64_t z) const;
    /// The nested grid of a kItemChild code (for tests).
    const Grid *child(uint32_t index) const { return children_[index].get(); }

private:
    bool prepare(const PrimitiveStore &store, const std::vector<uint32_t> &prims, const BBox &box,
                 const GridParams &params, uint32_t depth, bool widenBox);
    void insertAll(const std::vector<uint32_t> &prims);
    BBox cellBox(int64_t x, int64_t y, int64_t z) const;
    void refine();
    void finalize();
    /// Build-time lists groupCell reuses from cell to cell.
    struct GroupScratch {
        std::vector<std::pair<uint32_t, BBox>> used;
    };
    void groupCell(std::vector<uint32_t> &tris, int64_t x, int64_t y, int64_t z,
                   GroupScratch &scratch);
    /// Lower corner of the frame of cell (x, y, z) in which its groups' boxes are stored.
    Vec3 frameOrigin(int64_t x, int64_t y, int64_t z) const {
        return {box_.min.x + float(x) * cellSize_.x - framePad_,
                box_.min.y + float(y) * cellSize_.y - framePad_,
                box_.min.z + float(z) * cellSize_.z - framePad_};
    }
    /// Start of the data an item code names (a group, a packet or a cell's list), for fetching
    /// it early; nullptr for other kinds.
    const char *itemData(uint32_t code) const {
        const uint32_t index = code & kItemIndexMask;
        switch (code >> kItemIndexBits) {
            case kItemGroup:
                return reinterpret_cast<const char *>(groups_.data() + index);
            case kItemPacket:
                return reinterpret_cast<const char *>(store_->triangles.data() + size_t(index) * 4);
            case kItemList:
                return reinterpret_cast<const char *>(items_.data() + index);
            default:
                return nullptr;
        }
    }
    template <bool kAny>
    bool testGroups(uint32_t index, const TraceRay &ray, TraceState &state,
                    const Vec3 &frame) const;
    /// testGroups<true> and testGroups<false> with eight-wide box tests of two groups at a time
    /// (processors with AVX2 only); any-hit queries also test two packets at a time.
    bool anyHitInGroupsWide(uint32_t index, const TraceRay &ray, TraceState &state,
                            const Vec3 &frame) const;
    bool closestInGroupsWide(uint32_t index, const TraceRay &ray, TraceState &state,
                             const Vec3 &frame) const;
    template <bool kAny>
    bool testItems(const TraceRay &ray, TraceState &state, const uint32_t *first,
                   const uint32_t *last, const Vec3 &frame) const;

    const PrimitiveStore *store_ = nullptr;
    GridParams params_;
    uint32_t depth_ = 0;
    int64_t nx_ = 0, ny_ = 0, nz_ = 0;
    Vec3 cellSize_, invCellSize_;
    float tolerance_ = 0.001f;
    float margin_ = 0.0f;
    float framePad_ = 0.0f;  ///< Frames of group boxes: the cell grown by this on every side.
    Vec3 frameStep_;         ///< One 1/255 step of a frame per axis.
    BBox box_;
    /// What the walk's set-up reads, x, y and z in lanes 0 to 2: the lower bound, the cell size
    /// and its reciprocal, the last cell index (as float and as integer) and the cell strides.
    struct WalkFrame {
        float4 lo, size, invSize, top;
        int4 last, stride;
    };
    WalkFrame walk_;
    /// What the fetch ahead reads: per axis the lower bound, the reciprocal cell size and the
    /// last cell index in all four lanes, the strides of y and z and the last cell's index (as
    /// floats, the last index rounded down).
    struct FetchFrame {
        float4 lo[3], invSize[3], top[3];
        float4 strideY, strideZ, lastCell;
    };
    FetchFrame fetch_;
    // Per cell one word: the only item's code, or a kItemList code with the offset in items_ of
    // the cell's item count followed by its codes (most cells reach their data without the
    // list), or for an empty cell a kItemEmpty code with three bits per direction octant (bits
    // 3o to 3o + 2 for octant o; bit a of o set when the ray goes down axis a): the code of the
    // side, in cells, of the largest empty cube that starts at the cell and extends the way such
    // rays go (kCubeSide, rounded down), or kEmptyAhead when no cell such a ray can still reach
    // holds items. The walk jumps over the cube, or stops; one load per cell tells it both.
    static constexpr uint32_t kEmptyAhead = 7;
    static constexpr uint8_t kCubeSide[7] = {1, 2, 3, 5, 8, 13, 21};
    /// What the walk reads of a code: the cube side, or 255 for kEmptyAhead.
    static constexpr uint8_t kWalkDistance[8] = {1, 2, 3, 5, 8, 13, 21, 255};
    static_assert(kEmptyAhead == 7 && [] {
        for (int i = 0; i < 7; ++i)
            if (kWalkDistance[i] != kCubeSide[i]) return false;
        return true;
    }());
    /// Points along a ray whose cells the walk fetches before it starts, kFetchAheadSpacing
    /// crossings of the smallest cell side apart, in grids of at least kFetchAheadMinCells cells
    /// (1 MiB of cell words).
    static constexpr int kFetchAhead = 4;
    static constexpr float kFetchAheadSpacing = 3.0f;
    static constexpr int64_t kFetchAheadMinCells = int64_t(1) << 18;
    std::vector<uint32_t, LargeArrayAllocator<uint32_t>> cells_;
    void computeDistances(const std::vector<uint8_t> &occupied);
    std::vector<uint32_t, LargeArrayAllocator<uint32_t>> items_;
    // Packets are the store's triangles four by four; cells name them through groups (or
    // directly when a cell needs a single packet).
    std::vector<PacketGroup, LargeArrayAllocator<PacketGroup>> groups_;
    std::vector<std::unique_ptr<Grid>> children_;
    GridStats stats_;
    // Build-time lists, released by finalize.
    std::vector<uint32_t> buildBegin_, buildItems_, refinedChild_;
};

/// Transforms a world ray into an instance's object space (direction not renormalised, so the
/// distance along the ray is the same in both spaces).
inline Vec3 affinePoint(const Mtx4 &m, const Vec3 &p) {
    return {p.x * m.m[0][0] + p.y * m.m[1][0] + p.z * m.m[2][0] + m.m[3][0],
            p.x * m.m[0][1] + p.y * m.m[1][1] + p.z * m.m[2][1] + m.m[3][1],
            p.x * m.m[0][2] + p.y * m.m[1][2] + p.z * m.m[2][2] + m.m[3][2]};
}

/// Prepares the object-space ray of an instance; false when it can hit nothing.
bool instanceRay(const IntersectInstanceGrid &inst, const TraceRay &world, TraceRay &local);

}  // namespace ox

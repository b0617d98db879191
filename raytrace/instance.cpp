#include "raytrace/instance.h"

namespace ox {

std::unique_ptr<Instance> Instance::create(std::string name, const Mtx4 &objectToWorld,
                                           const Shape *shape, const MaterialHandle *overrideMaterial,
                                           uint32_t flags) {
    if (!shape || !objectToWorld.isFinite()) return nullptr;
    Mtx4 inv;
    if (!objectToWorld.inverse(inv)) return nullptr;
    std::unique_ptr<Instance> inst(new Instance());
    inst->name_ = std::move(name);
    inst->objectToWorld_ = objectToWorld;
    inst->worldToObject_ = inv;
    inst->shape_ = shape;
    inst->override_ = overrideMaterial;
    inst->flags_ = flags;
    return inst;
}

BBox transformBox(const BBox &box, const Mtx4 &m) {
    BBox out;
    if (box.isEmpty()) return out;
    for (int c = 0; c < 8; ++c) {
        Vec3 p{(c & 1) ? box.max.x : box.min.x, (c & 2) ? box.max.y : box.min.y,
               (c & 4) ? box.max.z : box.min.z};
        out.extend(m.transformPoint(p));
    }
    return out;
}

BBox Instance::worldBounds() const { return transformBox(shape_->bounds(), objectToWorld_); }

}  // namespace ox

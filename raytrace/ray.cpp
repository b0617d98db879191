#include "raytrace/ray.h"

namespace ox {

const char *rayTypeName(int type) {
    static const char *const kNames[kRayTypeCount] = {
        "Primary",           "Reflection",  "Refraction", "Shadow",   "Photon",     "Final Gather",
        "Glossy Reflection", "Environment", "Occlusion",  "Envelope", "Image Plane"};
    return type >= 0 && type < kRayTypeCount ? kNames[type] : "Unknown";
}

}  // namespace ox

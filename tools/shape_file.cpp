#include "tools/shape_file.h"

#include <limits>

#include "core/message.h"
#include "scene/vtm.h"

namespace ox {

bool writeShapeFile(const std::string &path, const ImportedShape &shape) {
    vtm::TempMesh mesh;
    mesh.name = shape.name;
    mesh.uvSetNames = shape.uvSetNames;
    mesh.colors = shape.hasColors();
    mesh.bounds = shape.bounds();
    // Only vertices that a triangle uses are stored, in order of first use.
    const uint32_t kUnused = std::numeric_limits<uint32_t>::max();
    std::vector<uint32_t> remap(shape.positions.size(), kUnused);
    std::vector<uint32_t> order;
    for (const ImportedGroup &g : shape.groups) {
        if (g.indices.size() / 3 > std::numeric_limits<uint32_t>::max()) {
            message(kMsgError, 6, "Shape %s has too many triangles for one mesh file",
                    shape.name.c_str());
            return false;
        }
        mesh.groups.push_back({g.material, uint32_t(g.indices.size() / 3)});
        for (uint32_t i : g.indices) {
            if (remap[i] == kUnused) {
                remap[i] = uint32_t(order.size());
                order.push_back(i);
            }
            mesh.indices.push_back(remap[i]);
        }
    }
    const size_t floats = mesh.colors ? 16 : 12;
    mesh.vertices.reserve(order.size() * floats);
    mesh.uvs.reserve(order.size() * shape.uvSets.size() * 2);
    for (uint32_t i : order) {
        for (const Vec3 *v :
             {&shape.positions[i], &shape.normals[i], &shape.tangents[i], &shape.bitangents[i]})
            mesh.vertices.insert(mesh.vertices.end(), {v->x, v->y, v->z});
        if (mesh.colors) {
            const Color &c = shape.colors[i];
            mesh.vertices.insert(mesh.vertices.end(), {c.r, c.g, c.b, c.a});
        }
        for (const std::vector<Vec2> &set : shape.uvSets)
            mesh.uvs.insert(mesh.uvs.end(), {set[i].x, set[i].y});
    }
    std::string error;
    if (!vtm::writeTempMesh(path, mesh, mesh.colors ? 2 : 1, &error)) {
        message(kMsgError, 6, "Cannot write mesh file %s: %s", path.c_str(), error.c_str());
        return false;
    }
    return true;
}

}  // namespace ox

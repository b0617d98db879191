#include "scene/temp_shape.h"

#include <new>

#include "core/message.h"

namespace ox {

ShapeBuildStatus buildTempShape(vtm::VornTempMeshBase &reader,
                                ShapeMaterialResolverInterface &materials,
                                const MeshBuildOptions &options, std::unique_ptr<Shape> &shape,
                                std::string &failure) {
    shape.reset();
    if (reader.isEmpty()) return ShapeBuildStatus::kEmpty;
    const std::string &name = reader.shapeName();
    auto fail = [&](std::string text) {
        messageText(kMsgError, 6, text);
        failure = std::move(text);
        return ShapeBuildStatus::kFailed;
    };

    const uint32_t u = reader.uvSetCount();
    const uint32_t v = reader.vertexCount();
    const uint64_t t = reader.triangleCount();
    std::unique_ptr<MeshBuilder> builder;
    try {
        // One vertex index per triangle is 32 bits wide, and so is the triangle count.
        if (t > UINT32_MAX) throw std::bad_alloc();
        builder = std::make_unique<MeshBuilder>(reader.hasVertexColors(), u, options);
        builder->reserve(v, t);
    } catch (const std::bad_alloc &) {
        return fail("Out of memory: Too many triangles. Lower the tessellation settings!");
    }

    std::vector<const Material *> slots;
    if (reader.groups().empty()) {
        const Material *m = materials.resolve("default", reader.uvSetNames());
        if (!m) return fail("Material default not defined when loading shape " + name);
        slots.push_back(m);
    }
    for (const auto &g : reader.groups()) {
        const Material *m = materials.resolve(g.name, reader.uvSetNames());
        if (!m) return fail("Material " + g.name + " not defined when loading shape " + name);
        slots.push_back(m);
    }

    try {
        const uint32_t floats = reader.vertexFloats();
        float rec[16];
        std::vector<Vec2> uvs(u);
        bool givenFrames = false;
        for (uint32_t i = 0; i < v; ++i) {
            bool ok = reader.readVertex(rec);
            for (uint32_t k = 0; ok && k < u; ++k) ok = reader.readUV(&uvs[k].x);
            if (!ok)
                return fail("Temporary mesh file " + reader.path() +
                            " is damaged: " + reader.error());
            const Vec3 tangent(rec[6], rec[7], rec[8]), bitangent(rec[9], rec[10], rec[11]);
            if (tangent.lengthSquared() > 1e-5f || bitangent.lengthSquared() > 1e-5f)
                givenFrames = true;
            Color c = floats == 16 ? Color(rec[12], rec[13], rec[14], rec[15]) : Color();
            builder->addVertex({rec[0], rec[1], rec[2]}, {rec[3], rec[4], rec[5]}, tangent,
                               bitangent, c, uvs.data());
        }
        builder->setUseGivenFrames(givenFrames);

        uint64_t index = 0;
        for (size_t g = 0; g < reader.groups().size(); ++g) {
            const uint32_t count = reader.groups()[g].triangleCount;
            for (uint32_t i = 0; i < count; ++i, ++index) {
                uint32_t tri[3];
                if (!reader.readTriangle(tri))
                    return fail("Temporary mesh file " + reader.path() +
                                " is damaged: " + reader.error());
                for (uint32_t corner : tri)
                    if (corner >= v)
                        return fail("Triangle " + std::to_string(index) + " of shape " + name +
                                    " refers to vertex " + std::to_string(corner) +
                                    ", but the shape has " + std::to_string(v) + " vertices");
                builder->addTriangle(tri[0], tri[1], tri[2], static_cast<uint32_t>(g));
            }
        }
        auto result = std::make_unique<Shape>(name);
        builder->finish(*result, name);
        builder.reset();
        result->vertices().setUvSetNames(reader.uvSetNames());
        result->materials().assign(slots.begin(), slots.end());
        shape = std::move(result);
    } catch (const std::bad_alloc &) {
        return fail("Out of memory: Too many triangles. Lower the tessellation settings!");
    }
    return ShapeBuildStatus::kBuilt;
}

}  // namespace ox

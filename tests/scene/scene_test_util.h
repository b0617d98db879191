#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "core/message.h"
#include "scene/vtm.h"
#include "tests/support/test_support.h"

namespace ox::test {

/// A fresh directory under the test temp dir, removed with its files at the end.
class TempDir {
public:
    TempDir() {
        std::string templ = testing::TempDir() + "oxsceneXXXXXX";
        path_ = mkdtemp(templ.data()) ? templ : std::string();
    }
    ~TempDir() {
        if (!path_.empty()) std::filesystem::remove_all(path_);
    }
    std::string file(const std::string &name) const { return path_ + "/" + name; }
    const std::string &path() const { return path_; }

private:
    std::string path_;
};

inline std::vector<unsigned char> readBytes(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

inline void writeBytes(const std::string &path, const std::vector<unsigned char> &bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char *>(bytes.data()), std::streamsize(bytes.size()));
}

/// Captures what the message function prints while f runs (debug messages on).
template <typename F>
std::string captureMessages(F &&f) {
    return oxtest::captureOutput(f, kMsgDebug | kMsgVerbose);
}

using oxtest::countOf;

/// A mesh in file order: vertex i at (x, y, 0) with normal +z, frame zero, UV (x, y) per set.
struct MeshMaker {
    vtm::TempMesh mesh;
    MeshMaker(const std::string &name, uint32_t uvSets, bool colors = false) {
        mesh.name = name;
        mesh.colors = colors;
        for (uint32_t k = 0; k < uvSets; ++k) mesh.uvSetNames.push_back("uv" + std::to_string(k));
    }
    uint32_t vertex(Vec3 p, Vec3 n = {0, 0, 1}, Vec3 t = {}, Vec3 b = {}, Color c = {},
                    std::vector<Vec2> uv = {}) {
        float rec[16] = {p.x, p.y, p.z, n.x, n.y, n.z, t.x, t.y,
                         t.z, b.x, b.y, b.z, c.r, c.g, c.b, c.a};
        mesh.vertices.insert(mesh.vertices.end(), rec, rec + (mesh.colors ? 16 : 12));
        for (size_t k = 0; k < mesh.uvSetNames.size(); ++k) {
            Vec2 q = k < uv.size() ? uv[k] : Vec2(p.x, p.y);
            mesh.uvs.push_back(q.x);
            mesh.uvs.push_back(q.y);
        }
        mesh.bounds.extend(p);
        return mesh.vertexCount() - 1;
    }
    void group(const std::string &material, std::vector<uint32_t> indices) {
        mesh.groups.push_back({material, static_cast<uint32_t>(indices.size() / 3)});
        mesh.indices.insert(mesh.indices.end(), indices.begin(), indices.end());
    }
    /// A w x h grid of quads in z = 0 with shared vertices, all in one group.
    void grid(uint32_t w, uint32_t h, const std::string &material) {
        uint32_t base = mesh.vertexCount();
        for (uint32_t y = 0; y <= h; ++y)
            for (uint32_t x = 0; x <= w; ++x) vertex({float(x), float(y), 0});
        std::vector<uint32_t> idx;
        for (uint32_t y = 0; y < h; ++y)
            for (uint32_t x = 0; x < w; ++x) {
                uint32_t a = base + y * (w + 1) + x, b = a + 1, c = a + w + 1, d = c + 1;
                idx.insert(idx.end(), {a, b, d, a, d, c});
            }
        group(material, idx);
    }
};

}  // namespace ox::test

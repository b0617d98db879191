#include "scene/vtm.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <bit>
#include <cmath>
#include <tuple>

#include "scene_test_util.h"

namespace ox {
namespace {

using test::MeshMaker;
using test::TempDir;

// Appends little-endian values the way the file layout lists them.
struct Bytes {
    std::vector<unsigned char> b;
    Bytes &str(const std::string &s) {
        b.insert(b.end(), s.begin(), s.end());
        b.push_back(0);
        return *this;
    }
    Bytes &u32(uint32_t v) {
        for (int i = 0; i < 4; ++i) b.push_back((v >> (8 * i)) & 0xFF);
        return *this;
    }
    Bytes &f32(float v) { return u32(std::bit_cast<uint32_t>(v)); }
};

// The header of a small valid file up to the box (version given, one UV set "map1", one group
// of one triangle over three vertices, the box's upper y given).
Bytes smallHeader(uint32_t version, uint32_t vertices = 3, uint32_t triangles = 1, float boxY = 1) {
    Bytes h;
    h.str("VTM").u32(version).str("tri").u32(vertices).u32(1).str("map1").u32(1).str("mat").u32(
        triangles);
    for (float f : {0.f, 0.f, 0.f, 1.f, boxY, 0.f}) h.f32(f);
    return h;
}

Bytes smallFile(uint32_t version, float boxY = 1) {
    Bytes f = smallHeader(version, 3, 1, boxY);
    if (version == 2) f.u32(0);
    const float pos[3][2] = {{0, 0}, {1, 0}, {0, 1}};
    for (auto &p : pos) {
        for (float v : {p[0], p[1], 0.f, 0.f, 0.f, 1.f, 0.f, 0.f, 0.f, 0.f, 0.f, 0.f}) f.f32(v);
        f.f32(p[0]).f32(p[1]);
    }
    f.u32(0).u32(1).u32(2);
    return f;
}

TEST(Vtm, WriterEmitsTheExactLayout) {
    TempDir dir;
    MeshMaker m("tri", 1);
    for (Vec3 p : {Vec3(0, 0, 0), Vec3(1, 0, 0), Vec3(0, 1, 0)}) m.vertex(p);
    m.group("mat", {0, 1, 2});
    m.mesh.uvSetNames = {"map1"};
    m.mesh.bounds = BBox(Vec3(0, 0, 0), Vec3(1, 1, 0));
    for (uint32_t version : {1u, 2u}) {
        std::string path = dir.file("v" + std::to_string(version) + ".vtm");
        ASSERT_TRUE(vtm::writeTempMesh(path, m.mesh, version));
        EXPECT_EQ(test::readBytes(path), smallFile(version).b) << "version " << version;
    }
    // Version 2 with colours: 16 floats, then the UV pair, and the flag set.
    MeshMaker c("c", 0, true);
    c.vertex({1, 2, 3}, {0, 0, 1}, {}, {}, Color(0.1f, 0.2f, 0.3f, 0.4f));
    c.mesh.groups.push_back({"m", 0});
    std::string path = dir.file("c.vtm");
    ASSERT_TRUE(vtm::writeTempMesh(path, c.mesh, 2));
    Bytes want = Bytes().str("VTM").u32(2).str("c").u32(1).u32(0).u32(1).str("m").u32(0);
    for (float f : {1.f, 2.f, 3.f, 1.f, 2.f, 3.f}) want.f32(f);
    want.u32(1);
    for (float f :
         {1.f, 2.f, 3.f, 0.f, 0.f, 1.f, 0.f, 0.f, 0.f, 0.f, 0.f, 0.f, 0.1f, 0.2f, 0.3f, 0.4f})
        want.f32(f);
    EXPECT_EQ(test::readBytes(path), want.b);
}

TEST(Vtm, RoundTripsBothVersionsColoursAndUvSets) {
    TempDir dir;
    for (uint32_t version : {1u, 2u})
        for (bool colors : {false, true})
            for (uint32_t sets = 0; sets <= 3; ++sets) {
                MeshMaker m("shape_" + std::to_string(sets), sets, colors);
                for (int i = 0; i < 5; ++i) {
                    std::vector<Vec2> uv;
                    for (uint32_t k = 0; k < sets; ++k) uv.push_back({i * 0.1f + k, -float(k)});
                    m.vertex({float(i), float(i * i), -1.5f}, {0, 1, 0}, {1, 0, 0}, {0, 0, 1},
                             Color(i * 0.25f, 1, 0.5f, 1), uv);
                }
                m.group("a", {0, 1, 2, 1, 3, 4});
                m.group("b", {});
                m.group("c", {2, 3, 4});
                // What was read writes the same bytes again: nothing is lost or changed on the
                // way (the exact layout of the writer is pinned above).
                std::string path = dir.file("m.vtm"), again = dir.file("again.vtm"), err;
                ASSERT_TRUE(vtm::writeTempMesh(path, m.mesh, version, &err)) << err;
                vtm::TempMesh back;
                ASSERT_TRUE(vtm::readTempMesh(path, back, &err)) << err;
                // Version 1 cannot carry colours: the writer drops them.
                EXPECT_EQ(back.colors, colors && version == 2);
                EXPECT_EQ(back.groups, m.mesh.groups);
                ASSERT_TRUE(vtm::writeTempMesh(again, back, version, &err)) << err;
                EXPECT_EQ(test::readBytes(again), test::readBytes(path))
                    << "version " << version << " colours " << colors << " sets " << sets;
            }
}

TEST(Vtm, WriterLeavesNothingBehindUntilCommitted) {
    TempDir dir;
    std::string path = dir.file("half.vtm");
    test::writeBytes(path, {'o', 'l', 'd'});
    {
        auto w = vtm::createWriter(path, 2);
        ASSERT_TRUE(w);
        w->setShapeName("x");
        ASSERT_TRUE(w->writeHeader());
        // Dropped without commit: the old file stays and no temporary file is left.
    }
    EXPECT_EQ(test::readBytes(path), std::vector<unsigned char>({'o', 'l', 'd'}));
    EXPECT_EQ(std::system(("test $(ls '" + dir.path() + "' | wc -l) -eq 1").c_str()), 0);
    EXPECT_FALSE(vtm::createWriter(path, 3));
    EXPECT_FALSE(vtm::createWriter(dir.file("no/such/dir.vtm"), 1));
    // A name longer than the reader accepts is refused by the writer too.
    MeshMaker m(std::string(5000, 'n'), 0);
    std::string err;
    EXPECT_FALSE(vtm::writeTempMesh(dir.file("long.vtm"), m.mesh, 1, &err));
}

// Opens a byte string as a mesh file and returns the status.
vtm::OpenStatus openBytes(const TempDir &dir, const std::vector<unsigned char> &bytes,
                          std::string *why = nullptr) {
    std::string path = dir.file("h.vtm");
    test::writeBytes(path, bytes);
    vtm::OpenStatus status = vtm::OpenStatus::kOk;
    auto r = vtm::TempMeshReaderFactory::instance().open(path, &status, why);
    EXPECT_EQ(r != nullptr, status == vtm::OpenStatus::kOk);
    return status;
}

TEST(Vtm, HostileHeadersFailCleanly) {
    TempDir dir;
    using S = vtm::OpenStatus;
    EXPECT_EQ(openBytes(dir, smallFile(1).b), S::kOk);
    EXPECT_EQ(openBytes(dir, smallFile(2).b), S::kOk);
    EXPECT_EQ(vtm::TempMeshReaderFactory::instance().open(dir.file("missing.vtm")), nullptr);
    // A named pipe without a writer, a directory and a device are refused at once, not waited
    // on or read without end.
    ASSERT_EQ(mkfifo(dir.file("pipe.vtm").c_str(), 0600), 0);
    for (const std::string &path : {dir.file("pipe.vtm"), dir.path(), std::string("/dev/zero")}) {
        vtm::OpenStatus status = S::kOk;
        std::string why;
        EXPECT_EQ(vtm::TempMeshReaderFactory::instance().open(path, &status, &why), nullptr);
        EXPECT_EQ(status, S::kCannotOpen) << path;
        EXPECT_EQ(why, "not a regular file") << path;
    }

    // A fourth letter before the 0 byte, a lower-case magic, version 3 and 0.
    const std::tuple<size_t, unsigned char, S> damaged[] = {{3, 'X', S::kBadMagic},
                                                            {0, 'v', S::kBadMagic},
                                                            {4, 3, S::kBadVersion},
                                                            {4, 0, S::kBadVersion}};
    for (auto [offset, value, want] : damaged) {
        auto f = smallFile(1).b;
        f[offset] = value;
        EXPECT_EQ(openBytes(dir, f), want) << offset;
    }

    // Truncation at every offset of a small file of either version fails, never crashes.
    for (uint32_t version : {1u, 2u}) {
        auto full = smallFile(version).b;
        for (size_t n = 0; n < full.size(); ++n) {
            std::vector<unsigned char> cut(full.begin(), full.begin() + n);
            EXPECT_NE(openBytes(dir, cut), S::kOk) << "version " << version << " cut at " << n;
        }
    }

    // Names without terminator or longer than 4096 bytes; huge counts (more vertices, UV sets,
    // groups or triangles than the file can hold; many groups of 2^32-1 triangles must not wrap
    // the total); non-finite and inverted boxes: each a bad header whose reason starts so.
    Bytes noTerm = Bytes().str("VTM").u32(1);
    noTerm.b.insert(noTerm.b.end(), 100, 'a');
    Bytes manyG = Bytes().str("VTM").u32(1).str("s").u32(0).u32(0).u32(3);
    for (int i = 0; i < 3; ++i) manyG.str("m").u32(0xFFFFFFFFu);
    for (float v : {0.f, 0.f, 0.f, 1.f, 1.f, 1.f}) manyG.f32(v);
    const std::string kShort = "file is shorter than its header says (";
    const std::string kBox = "bounding box is not finite or inverted";
    const std::pair<Bytes, std::string> bad[] = {
        {noTerm, "string without terminator"},
        {Bytes().str("VTM").u32(1).str(std::string(5000, 'a')), "string longer than 4096 bytes"},
        {smallHeader(1, 0xFFFFFFFFu), kShort},
        {smallHeader(2, 3, 0xFFFFFFFFu).u32(0), kShort},
        {manyG, kShort},
        {Bytes().str("VTM").u32(1).str("s").u32(3).u32(0xFFFFFFFFu).str("a"),
         "UV-set count larger than the file"},
        {Bytes().str("VTM").u32(1).str("s").u32(3).u32(0).u32(0x40000000u).str("m").u32(1),
         "material-group count larger than the file"},
        {smallFile(1, std::nanf("")), kBox},
        {smallFile(1, INFINITY), kBox},
        {smallFile(1, -2.0f), kBox}};
    for (const auto &[bytes, reason] : bad) {
        std::string why;
        EXPECT_EQ(openBytes(dir, bytes.b, &why), S::kBadHeader) << reason;
        EXPECT_EQ(why.substr(0, reason.size()), reason);
    }
    // The empty box is the honest box of a mesh without triangles.
    Bytes empty = Bytes().str("VTM").u32(1).str("e").u32(0).u32(0).u32(0);
    for (int i = 0; i < 6; ++i) empty.f32(i < 3 ? 3.4028235e38f : -3.4028235e38f);
    EXPECT_EQ(openBytes(dir, empty.b), S::kOk);

    // Bytes after the last triangle: a warning, and the file still opens.
    auto longer = smallFile(2).b;
    longer.push_back(7);
    std::string out = test::captureMessages([&] { EXPECT_EQ(openBytes(dir, longer), S::kOk); });
    EXPECT_NE(out.find("has 1 bytes after its last triangle"), std::string::npos) << out;
}

}  // namespace
}  // namespace ox

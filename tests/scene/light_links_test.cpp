#include "scene/light_links.h"

#include <gtest/gtest.h>

#include "scene_test_util.h"

namespace ox {
namespace {

using M = LinkMode;

TEST(LightLinks, EveryModeCombination) {
    // One instance and one light per pair of modes and list contents; the light reaches the
    // instance when:
    //   the instance's own list decides first (INCLUSIVE: named; EXCLUSIVE: not named;
    //   NONE: nothing), then the light's mode: INCLUSIVE adds the instances it names,
    //   EXCLUSIVE removes the instances it names (the others keep what their own list gave),
    //   NONE adds every instance whose mode is NONE.
    for (M im : {M::kInclusive, M::kExclusive, M::kNone})
        for (M lm : {M::kInclusive, M::kExclusive, M::kNone})
            for (bool instNames : {false, true})
                for (bool lightNames : {false, true}) {
                    std::vector<LightLinkEntry> inst = {{"i", im, {}}, {"other", M::kNone, {}}};
                    std::vector<LightLinkEntry> lights = {{"x", M::kNone, {}}, {"l", lm, {}}};
                    if (instNames) inst[0].links = {"l"};
                    if (lightNames) lights[1].links = {"i"};
                    LightLinkTable t;
                    t.build(inst, lights);
                    bool want = im == M::kInclusive   ? instNames
                                : im == M::kExclusive ? !instNames
                                                      : false;
                    if (lm == M::kInclusive) want = want || lightNames;
                    if (lm == M::kExclusive) want = want && !lightNames;
                    if (lm == M::kNone) want = want || im == M::kNone;
                    SCOPED_TRACE(testing::Message()
                                 << "instance mode " << int(im) << " names " << instNames
                                 << ", light mode " << int(lm) << " names " << lightNames);
                    EXPECT_EQ(t.reaches(0, 1), want);
                    // The untouched NONE light reaches exactly the instances whose mode is NONE,
                    // plus an EXCLUSIVE instance that does not name it.
                    EXPECT_EQ(t.reaches(0, 0), im == M::kNone || im == M::kExclusive);
                    EXPECT_TRUE(t.reaches(1, 0));
                    // An instance without links of its own gets only the lights without links.
                    EXPECT_EQ(t.reaches(1, 1), lm == M::kNone);
                }
}

TEST(LightLinks, EdgeCases) {
    // All NONE: every light reaches every instance (more than one word of lights).
    std::vector<LightLinkEntry> inst(3), lights(70);
    for (size_t i = 0; i < inst.size(); ++i) inst[i].name = "i" + std::to_string(i);
    for (size_t l = 0; l < lights.size(); ++l) lights[l].name = "l" + std::to_string(l);
    LightLinkTable t;
    t.build(inst, lights);
    for (uint32_t i = 0; i < 3; ++i)
        for (uint32_t l = 0; l < 70; ++l) EXPECT_TRUE(t.reaches(i, l));

    // EXCLUSIVE with an empty list: everything, except what a light's EXCLUSIVE list removes.
    inst[1].mode = M::kExclusive;
    lights[65].mode = M::kExclusive;
    lights[65].links = {"i1"};
    // INCLUSIVE with an empty list: only lights whose INCLUSIVE list names it.
    inst[2].mode = M::kInclusive;
    lights[3].mode = M::kInclusive;
    lights[3].links = {"i2", "ghost"};
    std::string out = test::captureMessages([&] { t.build(inst, lights); });
    EXPECT_NE(out.find("[WARNING]  Light linked instance ghost not present"), std::string::npos);
    for (uint32_t l = 0; l < 70; ++l) {
        EXPECT_EQ(t.reaches(1, l), l != 65) << l;
        EXPECT_EQ(t.reaches(2, l), l == 3) << l;
        // Lights with links of their own reach an unlinked instance only when they name it.
        EXPECT_EQ(t.reaches(0, l), l != 3 && l != 65) << l;
    }
    // Bits beyond the last light stay clear after inversions.
    EXPECT_EQ(t.row(1)[1] >> 6, 0u);

    inst[0].mode = M::kInclusive;
    inst[0].links = {"nolight"};
    out = test::captureMessages([&] { t.build(inst, lights); });
    EXPECT_NE(out.find("[WARNING]  Light linked light nolight not present"), std::string::npos);

    // No lights: rows without bits, nothing to invert.
    t.build(inst, {});
    EXPECT_EQ(t.lightCount(), 0u);
    EXPECT_EQ(t.instanceCount(), 3u);
    EXPECT_EQ(t.sizeBytes(), 0u);
    // No instances.
    t.build({}, lights);
    EXPECT_EQ(t.instanceCount(), 0u);
}

}  // namespace
}  // namespace ox

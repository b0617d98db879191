#include "scene/light_links.h"

#include <gtest/gtest.h>

#include "scene_test_util.h"

namespace ox {
namespace {

using M = LinkMode;

TEST(LightLinks, EveryModeCombination) {
    // Instance "i" and light "l" per pair of modes and list contents; the light reaches the
    // instance when:
    //   the instance's own list decides first (INCLUSIVE: named; EXCLUSIVE: not named;
    //   NONE: nothing), then the light's mode: INCLUSIVE adds the instances it names,
    //   EXCLUSIVE removes the instances it names (the others keep what their own list gave),
    //   NONE adds every instance whose mode is NONE.
    // Seventy lights, "l" in the second word of a row, the others NONE and without links.
    const uint32_t kL = 65;
    for (M im : {M::kInclusive, M::kExclusive, M::kNone})
        for (M lm : {M::kInclusive, M::kExclusive, M::kNone})
            for (bool instNames : {false, true})
                for (bool lightNames : {false, true}) {
                    std::vector<LightLinkEntry> inst = {{"i", im, {}}, {"other", M::kNone, {}}};
                    std::vector<LightLinkEntry> lights(70);
                    for (size_t l = 0; l < lights.size(); ++l) lights[l].name = std::to_string(l);
                    lights[kL] = {"l", lm, {}};
                    if (instNames) inst[0].links = {"l"};
                    if (lightNames) lights[kL].links = {"i"};
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
                    EXPECT_EQ(t.reaches(0, kL), want);
                    // An untouched NONE light reaches exactly the instances whose mode is NONE,
                    // plus an EXCLUSIVE instance that does not name it.
                    EXPECT_EQ(t.reaches(0, 0), im == M::kNone || im == M::kExclusive);
                    EXPECT_TRUE(t.reaches(1, 69));
                    // An instance without links of its own gets only the lights without links.
                    EXPECT_EQ(t.reaches(1, kL), lm == M::kNone);
                    // Bits beyond the last light stay clear after inversions.
                    EXPECT_EQ(t.row(0)[1] >> 6, 0u);
                }
}

TEST(LightLinks, MissingNamesAndEmptySides) {
    std::vector<LightLinkEntry> inst = {{"i", M::kInclusive, {"nolight"}}};
    std::vector<LightLinkEntry> lights = {{"l", M::kInclusive, {"i", "ghost"}}};
    LightLinkTable t;
    std::string out = test::captureMessages([&] { t.build(inst, lights); });
    EXPECT_NE(out.find("[WARNING]  Light linked instance ghost not present"), std::string::npos);
    EXPECT_NE(out.find("[WARNING]  Light linked light nolight not present"), std::string::npos);
    EXPECT_TRUE(t.reaches(0, 0));

    // No lights: rows without bits, nothing to invert.
    t.build(inst, {});
    EXPECT_EQ(t.lightCount(), 0u);
    EXPECT_EQ(t.instanceCount(), 1u);
    EXPECT_EQ(t.sizeBytes(), 0u);
    // No instances.
    t.build({}, lights);
    EXPECT_EQ(t.instanceCount(), 0u);
}

}  // namespace
}  // namespace ox

#include "core/half.h"

#include <Imath/half.h>
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <string>

#include "core/random.h"

namespace {

TEST(HalfTest, ValuesClampingAndNaN) {
    struct Case {
        float value;
        uint16_t half;
    };
    const Case cases[] = {
        {0.0f, 0x0000},          {-0.0f, 0x8000},    {1.0f, 0x3c00},      {-2.0f, 0xc000},
        {0.5f, 0x3800},          {65503.0f, 0x7bff}, {-65503.0f, 0xfbff}, {5.9604645e-8f, 0x0001},
        {6.1035156e-5f, 0x0400}, {1e-10f, 0x0000},   {1.0e-45f, 0x0000},  // a float denormal
    };
    for (const Case &c : cases) {
        bool clamped = true;
        EXPECT_EQ(ox::halfFromFloatQuiet(c.value, clamped), c.half) << c.value;
        EXPECT_FALSE(clamped);
    }
    bool clamped = false;
    const uint16_t nan = ox::halfFromFloatQuiet(std::numeric_limits<float>::quiet_NaN(), clamped);
    EXPECT_EQ(nan & 0x7c00, 0x7c00);
    EXPECT_NE(nan & 0x03ff, 0);

    // Beyond the limit: the largest finite half, one warning per call or per buffer.
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::halfFromFloat(70000.0f), 0x7bff);
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Clamping value of 70000.000000 to 65503.000000 to avoid -inf in half "
                       "float framebuffer"),
              std::string::npos)
        << out;
    const float values[5] = {1e9f, -1e9f, 2.0f, INFINITY, -INFINITY};
    uint16_t halves[5];
    testing::internal::CaptureStdout();
    EXPECT_EQ(ox::halfFromFloat(values, halves, 5), 4u);
    out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(halves[1], 0xfbff);
    EXPECT_EQ(halves[3], 0x7bff);
    EXPECT_EQ(halves[2], 0x4000);
    EXPECT_NE(out.find("Clamped 4 values"), std::string::npos) << out;
    EXPECT_EQ(out.find('\n'), out.size() - 1) << out;
}

TEST(HalfTest, AgreesWithTheImathConversionAwayFromTies) {
    ox::Random rng(7);
    int compared = 0;
    for (int i = 0; i < 200000; ++i) {
        // Magnitudes across the whole half range, both signs.
        const float v = (rng.next() - 0.5f) * std::ldexp(1.0f, int(rng.next() * 40.0f) - 24);
        uint32_t bits;
        std::memcpy(&bits, &v, 4);
        // Exact ties round up here and to even in Imath.
        if ((bits & 0x1fff) == 0x1000) continue;
        if (std::fabs(v) > 65503.0f || std::fabs(v) < 6.2e-5f) continue;
        bool clamped;
        ASSERT_EQ(ox::halfFromFloatQuiet(v, clamped), imath_float_to_half(v)) << v;
        ++compared;
    }
    EXPECT_GT(compared, 100000);
}

}  // namespace

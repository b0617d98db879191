#include "core/random.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <thread>
#include <vector>

namespace {

// The same generator written out plainly: 64-bit products instead of Schrage's method.
struct PlainGenerator {
    int64_t state, last;
    int64_t table[32];

    explicit PlainGenerator(int64_t seed) : state(seed) {
        for (int round = 39; round >= 0; --round) {
            state = state * 16807 % 2147483647;
            if (round < 32) table[round] = state;
        }
        last = table[0];
    }
    float next() {
        state = state * 16807 % 2147483647;
        int64_t slot = last / 67108864;
        last = table[slot];
        table[slot] = state;
        float r = float(last) * 4.656613e-10f;
        return r > 1.0f ? 1.0f : r;
    }
};

TEST(RandomTest, MatchesPlainRecurrence) {
    // The process-wide generator, freshly seeded as at its first use.
    ox::reseedProcessRandom(ox::kProcessRandomSeed);
    PlainGenerator plain(262484787);
    for (int i = 0; i < 20000; ++i) ASSERT_EQ(ox::processRandom(), plain.next()) << "draw " << i;
}

TEST(RandomTest, EverySeedGivesAWorkingGenerator) {
    auto firstDraws = [](uint64_t seed) {
        ox::Random r(seed);
        std::vector<float> v;
        for (int i = 0; i < 8; ++i) v.push_back(r.next());
        return v;
    };
    EXPECT_EQ(firstDraws(0), firstDraws(1));
    EXPECT_EQ(firstDraws(2147483647ull), firstDraws(1));  // 2^31 - 1 reduces to 0, then 1
    EXPECT_EQ(firstDraws(2147483648ull), firstDraws(1));  // 2^31 reduces to 1
    EXPECT_EQ(firstDraws(2147483647ull + 5), firstDraws(5));
    EXPECT_EQ(firstDraws(UINT32_MAX), firstDraws(1));
    EXPECT_EQ(firstDraws(UINT64_MAX), firstDraws(3));  // 2^64 - 1 reduces to 3
    // Reseeding restarts the sequence.
    ox::Random a(42);
    float first = a.next();
    a.next();
    a.seed(42);
    EXPECT_EQ(a.next(), first);
}

TEST(RandomTest, IndexOfADrawIsClamped) {
    EXPECT_EQ(ox::Random::indexOf(1.0f, 10), 9);  // a draw can be exactly 1
    EXPECT_EQ(ox::Random::indexOf(0.95f, 10), 9);
}

TEST(RandomTest, ProcessGeneratorHandsEachDrawToOneThread) {
    // Four threads drawing at once take disjoint pieces of one sequence: together they see
    // exactly the draws of a single generator, none twice and none lost.
    ox::reseedProcessRandom(12345);
    std::vector<std::vector<float>> drawn(4);
    std::vector<std::thread> threads;
    for (auto &d : drawn)
        threads.emplace_back([&d] {
            for (int i = 0; i < 5000; ++i) d.push_back(ox::processRandom());
        });
    for (auto &t : threads) t.join();
    std::vector<float> all, expected;
    for (auto &d : drawn) all.insert(all.end(), d.begin(), d.end());
    ox::Random single(12345);
    for (int i = 0; i < 20000; ++i) expected.push_back(single.next());
    std::sort(all.begin(), all.end());
    std::sort(expected.begin(), expected.end());
    EXPECT_EQ(all, expected);
}

}  // namespace

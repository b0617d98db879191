#pragma once

#include <cstdint>

/// The shared random generator: a minimal-standard multiplicative generator (16807 modulo
/// 2^31 - 1, Schrage's method) behind a 32-entry shuffle table, giving floats in [0, 1].
namespace ox {

/// One generator. Not thread-safe: each thread owns its own instance, and the process-wide
/// instance is reached only through the locked functions below.
class Random {
public:
    static constexpr int32_t kModulus = 2147483647;  ///< 2^31 - 1
    static constexpr int32_t kMultiplier = 16807;    ///< the minimal-standard multiplier
    static constexpr int kTableSize = 32;            ///< entries of the shuffle table
    static constexpr float kScale = 4.656613e-10f;   ///< turns an output into [0, 1]

    /// A generator seeded with `seed` (see seed()).
    explicit Random(uint64_t seed = 1) { this->seed(seed); }

    /// Restarts the sequence. Seeds at or above 2^31 - 1 are reduced modulo 2^31 - 1 and 0
    /// becomes 1, so every seed gives a working generator.
    void seed(uint64_t seed);

    /// The next draw in [0, 1]; exactly 1.0 can occur.
    float next() {
        state_ = advance(state_);
        int slot = int(last_ >> 26);  // last_ < 2^31, so the slot is 0 to 31
        last_ = table_[slot];
        table_[slot] = state_;
        float r = float(last_) * kScale;
        return r < 1.0f ? r : 1.0f;
    }

    /// A draw turned into an index 0 to n - 1 (floor(r * n), with r = 1.0 clamped to n - 1).
    /// n must be at least 1.
    int64_t nextIndex(int64_t n) { return indexOf(next(), n); }

    /// floor(r * n) clamped to [0, n - 1]: the safe way to index with a draw.
    static int64_t indexOf(float r, int64_t n) {
        int64_t i = int64_t(double(r) * double(n));
        return i < 0 ? 0 : (i >= n ? n - 1 : i);
    }

    /// One step of the recurrence state * 16807 mod (2^31 - 1) by Schrage's method; the state
    /// must lie in [1, 2^31 - 2].
    static int32_t advance(int32_t state) {
        constexpr int32_t kQuotient = 127773;  // kModulus / kMultiplier
        constexpr int32_t kRemainder = 2836;   // kModulus % kMultiplier
        int32_t hi = state / kQuotient;
        int32_t s = kMultiplier * (state - hi * kQuotient) - kRemainder * hi;
        return s < 0 ? s + kModulus : s;
    }

    /// The current state of the recurrence (for tests and diagnostics).
    int32_t state() const { return state_; }

private:
    int32_t state_ = 1;
    int32_t last_ = 0;
    int32_t table_[kTableSize] = {};
};

/// The seed of stream `stream` of a run seeded with `seed`: both mixed (SplitMix64 finaliser) so
/// that neighbouring streams start far apart in the generator's cycle. A tile's generator is
/// seeded with its run's seed and its index, so its numbers do not depend on which thread
/// renders it or when.
constexpr uint64_t streamSeed(uint64_t seed, uint64_t stream) {
    uint64_t z = seed + 0x9E3779B97F4A7C15ull * (stream + 1);
    z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
    z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
    return z ^ (z >> 31);
}

/// Seed of the process-wide generator when it is first used.
constexpr uint64_t kProcessRandomSeed = 262484787;

/// A draw from the process-wide generator, under its lock.
float processRandom();
/// Reseeds the process-wide generator, under its lock.
void reseedProcessRandom(uint64_t seed);

}  // namespace ox

#include "core/random.h"

#include <mutex>

namespace ox {

void Random::seed(uint64_t seed) {
    // A state of 0 would stay 0 forever and one of 2^31 - 1 is outside the recurrence, so
    // the seed is brought into [1, 2^31 - 2].
    int32_t s = int32_t(seed % uint64_t(kModulus));
    state_ = s == 0 ? 1 : s;
    // Eight warm-up rounds, then 32 rounds that fill the table from its last entry down.
    for (int round = kTableSize + 7; round >= 0; --round) {
        state_ = advance(state_);
        if (round < kTableSize) table_[round] = state_;
    }
    last_ = table_[0];
}

namespace {

struct ProcessRandom {
    std::mutex mutex;
    Random generator{kProcessRandomSeed};
};

ProcessRandom &processInstance() {
    static ProcessRandom instance;
    return instance;
}

}  // namespace

float processRandom() {
    ProcessRandom &p = processInstance();
    std::lock_guard<std::mutex> lock(p.mutex);
    return p.generator.next();
}

void reseedProcessRandom(uint64_t seed) {
    ProcessRandom &p = processInstance();
    std::lock_guard<std::mutex> lock(p.mutex);
    p.generator.seed(seed);
}

}  // namespace ox

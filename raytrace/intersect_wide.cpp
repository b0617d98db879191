#include "raytrace/intersect_wide.h"

namespace ox {

namespace {

bool processorHasAvx2() {
    __builtin_cpu_init();
    return __builtin_cpu_supports("avx2");
}

}  // namespace

std::atomic<bool> detail::wideTests{processorHasAvx2()};

bool wideTestsAvailable() {
    static const bool available = processorHasAvx2();
    return available;
}

bool setWideTests(bool on) {
    bool wide = on && wideTestsAvailable();
    detail::wideTests.store(wide, std::memory_order_relaxed);
    return wide;
}

}  // namespace ox

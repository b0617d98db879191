#include "platform/system.h"

#include <sched.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>

#include "core/message.h"

#if defined(__SSE__) || defined(__x86_64__)
#include <pmmintrin.h>
#include <xmmintrin.h>
#define OX_HAVE_SSE_CSR 1
#endif

namespace ox {

int processorCount() {
    cpu_set_t set;
    CPU_ZERO(&set);
    // The affinity mask is what this process may use (containers and taskset narrow it).
    if (sched_getaffinity(0, sizeof set, &set) == 0) {
        const int n = CPU_COUNT(&set);
        if (n > 0) return n;
    }
    const long online = sysconf(_SC_NPROCESSORS_ONLN);
    return online > 0 ? static_cast<int>(online) : 1;
}

int processNiceValue() {
    errno = 0;
    const int value = getpriority(PRIO_PROCESS, 0);
    return errno == 0 ? value : 0;
}

bool setProcessPriority(int priority) {
    int nice = 0;
    switch (priority) {
        case kPriorityLow:
            nice = 10;
            break;
        case kPriorityNormal:
            nice = 0;
            break;
        case kPriorityHigh:
            nice = -5;
            break;
        default:
            message(kMsgWarning, 6, "Unknown process priority %d, the priority stays", priority);
            return false;
    }
    if (setpriority(PRIO_PROCESS, 0, nice) == 0) return true;
    const int code = errno;
    message(kMsgWarning, 6, "Unable to set the process priority to nice %d (%s), it stays at %d",
            nice, std::strerror(code), processNiceValue());
    return false;
}

void setFlushDenormalsToZero() {
#if defined(OX_HAVE_SSE_CSR)
    _MM_SET_FLUSH_ZERO_MODE(_MM_FLUSH_ZERO_ON);
    _MM_SET_DENORMALS_ZERO_MODE(_MM_DENORMALS_ZERO_ON);
#elif defined(__aarch64__)
    uint64_t fpcr;
    __asm__ __volatile__("mrs %0, fpcr" : "=r"(fpcr));
    fpcr |= (uint64_t(1) << 24);  // FZ
    __asm__ __volatile__("msr fpcr, %0" : : "r"(fpcr));
#endif
}

bool flushDenormalsToZero() {
#if defined(OX_HAVE_SSE_CSR)
    return _MM_GET_FLUSH_ZERO_MODE() == _MM_FLUSH_ZERO_ON &&
           _MM_GET_DENORMALS_ZERO_MODE() == _MM_DENORMALS_ZERO_ON;
#elif defined(__aarch64__)
    uint64_t fpcr;
    __asm__ __volatile__("mrs %0, fpcr" : "=r"(fpcr));
    return (fpcr & (uint64_t(1) << 24)) != 0;
#else
    return false;
#endif
}

}  // namespace ox

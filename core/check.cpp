#include "core/check.h"

#include <cstdlib>

#include "core/message.h"

namespace ox {

void checkFailed(const char *condition, const char *file, int line) {
    message(kMsgError, 0, "Internal check failed: %s (%s:%d)", condition, file, line);
    std::abort();
}

}  // namespace ox

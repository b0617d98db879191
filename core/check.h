#pragma once

/// Always-on check of a programming invariant (never of user input): reports the failed
/// condition as an error message and aborts the process.
#define OX_CHECK(cond) ((cond) ? (void)0 : ::ox::checkFailed(#cond, __FILE__, __LINE__))

namespace ox {

/// Reports a failed OX_CHECK and aborts; called only through the macro.
[[noreturn]] void checkFailed(const char *condition, const char *file, int line);

}  // namespace ox

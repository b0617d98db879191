#pragma once

namespace ox {

/// Process priority classes of setProcessPriority.
enum ProcessPriority {
    kPriorityLow = 0,     ///< nice 10
    kPriorityNormal = 1,  ///< nice 0
    kPriorityHigh = 2,    ///< nice -5
};

/// The number of logical processors this process may run on (at least 1).
int processorCount();

/// Sets the process priority (0 low, 1 normal, 2 high → nice 10, 0, -5). A change the system
/// refuses (raising needs privileges) is a warning and the priority stays; returns whether the
/// new priority took effect.
bool setProcessPriority(int priority);

/// The process's current nice value.
int processNiceValue();

/// Turns on flush-to-zero and denormals-are-zero for the calling thread (every thread that
/// computes should call it once at its start).
void setFlushDenormalsToZero();

/// True when flush-to-zero and denormals-are-zero are on for the calling thread.
bool flushDenormalsToZero();

}  // namespace ox

// How much of the machine the process claims.
#pragma once

namespace vesk {

/// What a process's work is worth to the user who waits for it.
enum class SchedulingClass : int {
  /// Work that nobody watches: batch scheduling (it does not preempt whoever is running), niceness 5,
  /// best-effort disk priority 6 of 0 to 7.
  Utility = 17,
};

/// Puts the calling thread, and every thread made later, into the class. `relativePriority` (-15 to 0) lowers
/// it further, one step of niceness each. A niceness that is higher already stays, and so does a batch, idle
/// or realtime policy that an administrator has chosen. What the kernel refuses costs one level-4 line and
/// changes nothing else.
void enterSchedulingClass(SchedulingClass schedulingClass, int relativePriority);

}  // namespace vesk

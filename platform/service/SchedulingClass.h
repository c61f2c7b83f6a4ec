// The process's share of the machine.
#pragma once

namespace vesk {

/// How urgent a process's work is to the user.
enum class SchedulingClass : int {
  /// Background work: batch scheduling (does not preempt running threads), niceness 5, best-effort disk
  /// priority 6 of 0 to 7.
  Utility = 17,
};

/// Moves the calling thread, and every thread created later, into the class. `relativePriority` (-15 to 0)
/// lowers the priority further, by one step of niceness each. Keeps a higher niceness, and a batch, idle or
/// realtime policy that an administrator has chosen. A refusal by the kernel causes one level-4 line and is
/// otherwise ignored.
void enterSchedulingClass(SchedulingClass schedulingClass, int relativePriority);

}  // namespace vesk

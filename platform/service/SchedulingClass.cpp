#include "platform/service/SchedulingClass.h"

#include <sched.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr int kUtilityNice = 5;
constexpr int kLowestNice = 19;
constexpr int kUtilityDiskLevel = 6;

// The kernel's constants for ioprio_set. Some versions of its own header don't compile as C++, because of a
// parameter named "class".
constexpr int kPriorityOfProcess = 1;
constexpr int kDiskClassShift = 13;
constexpr int kDiskClassBestEffort = 2;
constexpr int kDiskClassIdle = 3;

void warn(const char* what) {
  VESK_LOG_WARNING("enterSchedulingClass: %s: %s", what, std::generic_category().message(errno).c_str());
}

void lowerNiceness(int nice) {
  errno = 0;
  int current = ::getpriority(PRIO_PROCESS, 0);
  if (errno == 0 && current >= nice) return;
  if (::setpriority(PRIO_PROCESS, 0, nice) != 0) warn("niceness");
}

void chooseBatchPolicy() {
  if (::sched_getscheduler(0) != SCHED_OTHER) return;
  sched_param parameters{};
  if (::sched_setscheduler(0, SCHED_BATCH, &parameters) != 0) warn("batch policy");
}

void lowerDiskPriority() {
  long current = ::syscall(SYS_ioprio_get, kPriorityOfProcess, 0);
  if (current >= 0 && (current >> kDiskClassShift & 7) == kDiskClassIdle) return;
  int priority = kDiskClassBestEffort << kDiskClassShift | kUtilityDiskLevel;
  if (::syscall(SYS_ioprio_set, kPriorityOfProcess, 0, priority) != 0) warn("disk priority");
}

}  // namespace

void enterSchedulingClass(SchedulingClass schedulingClass, int relativePriority) {
  switch (schedulingClass) {
    case SchedulingClass::Utility:
      lowerNiceness(std::clamp(kUtilityNice - relativePriority, kUtilityNice, kLowestNice));
      chooseBatchPolicy();
      lowerDiskPriority();
      break;
  }
}

}  // namespace vesk

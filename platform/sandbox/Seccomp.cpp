#include "platform/sandbox/Seccomp.h"

#include <fcntl.h>
#include <linux/netlink.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <initializer_list>
#include <memory>
#include <system_error>

namespace vesk {

namespace {

/// A filter under construction. The first error sticks.
class Filter {
 public:
  Filter() : _context(seccomp_init(SCMP_ACT_ALLOW), &seccomp_release) {
    if (!_context) {
      note(-ENOMEM);
      return;
    }
    note(seccomp_attr_set(_context.get(), SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_KILL_PROCESS));
    note(seccomp_attr_set(_context.get(), SCMP_FLTATR_CTL_TSYNC, 1));
    note(seccomp_attr_set(_context.get(), SCMP_FLTATR_CTL_OPTIMIZE, 2));
  }

  /// By name, because a build machine's headers need not know every call that the library knows. A call that
  /// this architecture does not have is none to deny.
  void deny(std::initializer_list<const char*> calls, std::initializer_list<scmp_arg_cmp> when = {},
            int error = EPERM) {
    for (const char* call : calls) {
      int number = seccomp_syscall_resolve_name(call);
      if (!_context || number < 0) continue;
      note(seccomp_rule_add_array(_context.get(), SCMP_ACT_ERRNO(static_cast<std::uint32_t>(error)), number,
                                  static_cast<unsigned>(when.size()), when.begin()));
    }
  }

  /// The error number, or 0.
  int load() {
    if (_error == 0) note(seccomp_load(_context.get()));
    return -_error;
  }

 private:
  void note(int result) {
    if (result < 0 && _error == 0) _error = result;
  }

  std::unique_ptr<void, void (*)(scmp_filter_ctx)> _context;
  int _error = 0;
};

// The comparisons of libseccomp's macros, without their compound literals, which C++ lacks.
scmp_arg_cmp isEqual(unsigned argument, std::uint64_t value) {
  return {argument, SCMP_CMP_MASKED_EQ, 0xffffffff, value};
}
scmp_arg_cmp isOther(unsigned argument, std::uint64_t value) { return {argument, SCMP_CMP_NE, value, 0}; }
scmp_arg_cmp hasBits(unsigned argument, std::uint64_t mask, std::uint64_t bits) {
  return {argument, SCMP_CMP_MASKED_EQ, mask, bits};
}
scmp_arg_cmp hasBits(unsigned argument, std::uint64_t bits) { return hasBits(argument, bits, bits); }

// Of the kernel's headers, one of which is C in some versions.
constexpr std::uint64_t kPriorityOfProcess = 1;
constexpr std::uint64_t kAskForPersonality = 0xffffffff;

void denyExecute(Filter& filter) { filter.deny({"execve", "execveat"}); }

// Threads are made with clone. The flags of clone3 stand in memory, where a filter can't see them.
constexpr unsigned kCloneFlags =
#if defined(__s390x__)
    1;
#else
    0;
#endif

void denyProcesses(Filter& filter) {
  filter.deny({"fork", "vfork"});
  filter.deny({"clone"}, {hasBits(kCloneFlags, CLONE_THREAD, 0)});
  filter.deny({"clone3"}, {}, ENOSYS);
}

void denyNamespaces(Filter& filter) {
  filter.deny({"unshare", "setns"});
  for (unsigned flag : {CLONE_NEWNS, CLONE_NEWCGROUP, CLONE_NEWUTS, CLONE_NEWIPC, CLONE_NEWUSER, CLONE_NEWPID,
                        CLONE_NEWNET}) {
    filter.deny({"clone"}, {hasBits(kCloneFlags, flag)});
  }
  filter.deny({"clone3"}, {}, ENOSYS);
}

void denyOtherProcesses(Filter& filter) {
  auto self = static_cast<std::uint64_t>(::getpid());
  filter.deny({"kill", "tgkill", "rt_sigqueueinfo", "rt_tgsigqueueinfo"}, {isOther(0, self)});
  filter.deny({"prlimit64", "migrate_pages", "move_pages", "sched_setscheduler", "sched_setparam",
               "sched_setattr", "sched_setaffinity"},
              {isOther(0, 0)});
  // The first argument says whether the second is a process, a group or a user.
  filter.deny({"setpriority", "ioprio_set"}, {isOther(1, 0)});
  filter.deny({"setpriority"}, {isOther(0, PRIO_PROCESS)});
  filter.deny({"ioprio_set"}, {isOther(0, kPriorityOfProcess)});
  filter.deny({"tkill", "pidfd_send_signal", "process_mrelease"});
}

void denyTrace(Filter& filter) {
  filter.deny({"ptrace", "process_vm_readv", "process_vm_writev", "process_madvise", "pidfd_getfd", "kcmp",
               "perf_event_open"});
}

void denyMounts(Filter& filter) {
  filter.deny({"mount", "umount", "umount2", "pivot_root", "chroot", "move_mount", "open_tree", "fsopen",
               "fsconfig", "fsmount", "fspick", "mount_setattr", "swapon", "swapoff", "quotactl",
               "quotactl_fd"});
}

void denyKernel(Filter& filter) {
  filter.deny({"kexec_load", "kexec_file_load", "init_module",   "finit_module",   "delete_module",
               "bpf",        "reboot",          "iopl",          "ioperm",         "syslog",
               "acct",       "sethostname",     "setdomainname", "lookup_dcookie", "uselib",
               "vm86",       "vm86old",         "modify_ldt",    "_sysctl",        "nfsservctl",
               "vhangup",    "fanotify_init"});
}

void denyClock(Filter& filter) {
  filter.deny({"settimeofday", "clock_settime", "clock_settime64", "clock_adjtime", "clock_adjtime64",
               "adjtimex", "stime"});
}

void denyIdentity(Filter& filter) {
  filter.deny({"setuid", "setuid32", "setgid", "setgid32", "setreuid", "setreuid32", "setregid", "setregid32",
               "setresuid", "setresuid32", "setresgid", "setresgid32", "setfsuid", "setfsuid32", "setfsgid",
               "setfsgid32", "setgroups", "setgroups32", "capset"});
}

void denyOwnership(Filter& filter) {
  filter.deny({"chown", "chown32", "lchown", "lchown32", "fchownat", "setxattr", "lsetxattr", "removexattr",
               "lremovexattr"});
}

void denyModes(Filter& filter) { filter.deny({"chmod", "fchmod", "fchmodat", "fchmodat2"}); }

void denyTruncation(Filter& filter) {
  filter.deny({"truncate", "truncate64"});
  // A file that is open for reading only gets truncated all the same, with no right to write.
  filter.deny({"open"}, {hasBits(1, O_ACCMODE | O_TRUNC, O_RDONLY | O_TRUNC)});
  filter.deny({"openat"}, {hasBits(2, O_ACCMODE | O_TRUNC, O_RDONLY | O_TRUNC)});
  filter.deny({"openat2"}, {}, ENOSYS);
}

void denyHandles(Filter& filter) { filter.deny({"open_by_handle_at"}); }

void denyDevices(Filter& filter) {
  filter.deny({"mknod", "mknodat"});
  filter.deny({"ioctl"}, {isEqual(1, TIOCSTI)});
}

void denyKeys(Filter& filter) { filter.deny({"add_key", "request_key", "keyctl"}); }

void denyFaults(Filter& filter) { filter.deny({"userfaultfd"}); }

void denyIoUring(Filter& filter) { filter.deny({"io_uring_setup", "io_uring_enter", "io_uring_register"}); }

void denySockets(Filter& filter) {
  // One comparison per argument and rule: "none of these" has to be spelt out.
  for (std::uint64_t family = 0; family <= AF_MAX; ++family) {
    if (family == AF_UNIX || family == AF_INET || family == AF_INET6 || family == AF_NETLINK) continue;
    filter.deny({"socket"}, {isEqual(0, family)});
  }
  filter.deny({"socket"}, {{0, SCMP_CMP_GT, AF_MAX, 0}});
  filter.deny({"socket"}, {isEqual(0, AF_NETLINK), isOther(2, NETLINK_ROUTE)});
  for (std::uint64_t family : {AF_INET, AF_INET6}) {
    filter.deny({"socket"}, {isEqual(0, family), hasBits(1, 0xf, SOCK_RAW)});
  }
}

void denyWritableCode(Filter& filter) {
  filter.deny({"mmap", "mmap2"}, {hasBits(2, PROT_WRITE | PROT_EXEC)});
  // A file could be mapped twice, to write and to execute. Libraries are mapped privately.
  filter.deny({"mmap", "mmap2"}, {hasBits(2, PROT_EXEC), hasBits(3, MAP_TYPE, MAP_SHARED)});
  filter.deny({"mmap", "mmap2"}, {hasBits(2, PROT_EXEC), hasBits(3, MAP_TYPE, MAP_SHARED_VALIDATE)});
  filter.deny({"memfd_create", "memfd_secret"});
  filter.deny({"personality"}, {isOther(0, kAskForPersonality)});  // READ_IMPLIES_EXEC is one
  filter.deny({"mprotect", "pkey_mprotect"}, {hasBits(2, PROT_EXEC)});
  filter.deny({"shmat"}, {hasBits(2, SHM_EXEC)});
}

void denyNewCode(Filter& filter) { filter.deny({"mmap", "mmap2"}, {hasBits(2, PROT_EXEC)}); }

struct Group {
  std::string_view name;
  void (*deny)(Filter&);
};
constexpr Group kGroups[] = {
    {"execute", denyExecute},
    {"processes", denyProcesses},
    {"other-processes", denyOtherProcesses},
    {"trace", denyTrace},
    {"namespaces", denyNamespaces},
    {"mounts", denyMounts},
    {"kernel", denyKernel},
    {"clock", denyClock},
    {"identity", denyIdentity},
    {"ownership", denyOwnership},
    {"modes", denyModes},
    {"truncation", denyTruncation},
    {"handles", denyHandles},
    {"devices", denyDevices},
    {"keys", denyKeys},
    {"faults", denyFaults},
    {"io-uring", denyIoUring},
    {"sockets", denySockets},
    {"writable-code", denyWritableCode},
    {"new-code", denyNewCode},
};

const Group* groupNamed(std::string_view name) {
  for (const Group& group : kGroups) {
    if (group.name == name) return &group;
  }
  return nullptr;
}

}  // namespace

bool isCallGroup(std::string_view name) { return groupNamed(name) != nullptr; }

std::optional<std::string> denyCalls(const std::vector<std::string>& groups) {
  if (groups.empty()) return std::nullopt;
  Filter filter;
  for (const std::string& name : groups) {
    const Group* group = groupNamed(name);
    if (!group) return "unknown group of calls \"" + name + "\"";
    group->deny(filter);
  }
  if (int error = filter.load(); error != 0) {
    return "the system-call filter can't be loaded: " + std::generic_category().message(error);
  }
  return std::nullopt;
}

}  // namespace vesk

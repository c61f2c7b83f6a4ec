#include "platform/sandbox/Seccomp.h"

#include <fcntl.h>
#include <linux/capability.h>
#include <linux/netlink.h>
#include <sched.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/shm.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <memory>

namespace vesk {

namespace {

/// Denied calls of a group: always, or only if all conditions on the arguments hold.
struct Rule {
  std::string_view group;
  std::vector<const char*> calls;
  std::vector<scmp_arg_cmp> when = {};
  int error = EPERM;
};

// The comparisons of libseccomp's macros, which use compound literals, unavailable in C++.
scmp_arg_cmp isEqual(unsigned argument, std::uint64_t value) {
  return {argument, SCMP_CMP_MASKED_EQ, 0xffffffff, value};
}
scmp_arg_cmp isOther(unsigned argument, std::uint64_t value) { return {argument, SCMP_CMP_NE, value, 0}; }
scmp_arg_cmp hasBits(unsigned argument, std::uint64_t mask, std::uint64_t bits) {
  return {argument, SCMP_CMP_MASKED_EQ, mask, bits};
}
scmp_arg_cmp hasBits(unsigned argument, std::uint64_t bits) { return hasBits(argument, bits, bits); }

// Defined here because some versions of the kernel's header are valid only in C.
constexpr std::uint64_t kPriorityOfProcess = 1;
constexpr std::uint64_t kAskForPersonality = 0xffffffff;

constexpr unsigned kCloneFlags =
#if defined(__s390x__)
    1;
#else
    0;
#endif

// Calls are given by name, because a build machine's headers may lack calls that the library knows.
std::vector<Rule> allRules() {
  const auto self = static_cast<std::uint64_t>(::getpid());
  std::vector<Rule> rules = {
      {"execute", {"execve", "execveat"}},

      // Threads are created with clone. The flags of clone3 are in memory, which a filter can't inspect.
      {"processes", {"fork", "vfork"}},
      {"processes", {"clone"}, {hasBits(kCloneFlags, CLONE_THREAD, 0)}},
      {"processes", {"clone3"}, {}, ENOSYS},

      {"other-processes", {"kill", "tgkill", "rt_sigqueueinfo", "rt_tgsigqueueinfo"}, {isOther(0, self)}},
      {"other-processes",
       {"prlimit64", "migrate_pages", "move_pages", "sched_setscheduler", "sched_setparam", "sched_setattr",
        "sched_setaffinity"},
       {isOther(0, 0)}},
      // The first argument says whether the second is a process, a group or a user.
      {"other-processes", {"setpriority", "ioprio_set"}, {isOther(1, 0)}},
      {"other-processes", {"setpriority"}, {isOther(0, PRIO_PROCESS)}},
      {"other-processes", {"ioprio_set"}, {isOther(0, kPriorityOfProcess)}},
      {"other-processes", {"tkill", "pidfd_send_signal", "process_mrelease"}},

      {"trace",
       {"ptrace", "process_vm_readv", "process_vm_writev", "process_madvise", "pidfd_getfd", "kcmp",
        "perf_event_open"}},

      {"namespaces", {"unshare", "setns"}},
      {"namespaces", {"clone3"}, {}, ENOSYS},

      {"mounts",
       {"mount", "umount", "umount2", "pivot_root", "chroot", "move_mount", "open_tree", "fsopen", "fsconfig",
        "fsmount", "fspick", "mount_setattr", "swapon", "swapoff", "quotactl", "quotactl_fd"}},

      {"kernel", {"kexec_load", "kexec_file_load", "init_module",   "finit_module",   "delete_module",
                  "bpf",        "reboot",          "iopl",          "ioperm",         "syslog",
                  "acct",       "sethostname",     "setdomainname", "lookup_dcookie", "uselib",
                  "vm86",       "vm86old",         "modify_ldt",    "_sysctl",        "nfsservctl",
                  "vhangup",    "fanotify_init"}},

      // Not adjtimex, which tells whether the clock is synchronised. It sets it only with the capability that
      // the process gives up.
      {"clock", {"settimeofday", "clock_settime", "clock_settime64", "stime"}},

      {"identity",
       {"setuid", "setuid32", "setgid", "setgid32", "setreuid", "setreuid32", "setregid", "setregid32",
        "setresuid", "setresuid32", "setresgid", "setresgid32", "setfsuid", "setfsuid32", "setfsgid",
        "setfsgid32", "setgroups", "setgroups32", "capset"}},

      {"ownership",
       {"chown", "chown32", "lchown", "lchown32", "fchownat", "setxattr", "lsetxattr", "removexattr",
        "lremovexattr"}},

      {"modes", {"chmod", "fchmod", "fchmodat", "fchmodat2"}},

      // Opening a file for reading only can still truncate it, without the right to write.
      {"truncation", {"truncate", "truncate64"}},
      {"truncation", {"open"}, {hasBits(1, O_ACCMODE | O_TRUNC, O_RDONLY | O_TRUNC)}},
      {"truncation", {"openat"}, {hasBits(2, O_ACCMODE | O_TRUNC, O_RDONLY | O_TRUNC)}},
      {"truncation", {"openat2"}, {}, ENOSYS},

      {"handles", {"open_by_handle_at"}},
      {"devices", {"mknod", "mknodat"}},
      {"devices", {"ioctl"}, {isEqual(1, TIOCSTI)}},
      {"keys", {"add_key", "request_key", "keyctl"}},
      {"faults", {"userfaultfd"}},
      {"io-uring", {"io_uring_setup", "io_uring_enter", "io_uring_register"}},

      {"sockets", {"socket"}, {{0, SCMP_CMP_GT, AF_MAX, 0}}},
      {"sockets", {"socket"}, {isEqual(0, AF_NETLINK), isOther(2, NETLINK_ROUTE)}},
      {"sockets", {"socket"}, {isEqual(0, AF_INET), hasBits(1, 0xf, SOCK_RAW)}},
      {"sockets", {"socket"}, {isEqual(0, AF_INET6), hasBits(1, 0xf, SOCK_RAW)}},

      {"writable-code", {"mmap", "mmap2"}, {hasBits(2, PROT_WRITE | PROT_EXEC)}},
      // A file could be mapped twice, once to write and once to execute. Libraries are mapped privately.
      {"writable-code", {"mmap", "mmap2"}, {hasBits(2, PROT_EXEC), hasBits(3, MAP_TYPE, MAP_SHARED)}},
      {"writable-code",
       {"mmap", "mmap2"},
       {hasBits(2, PROT_EXEC), hasBits(3, MAP_TYPE, MAP_SHARED_VALIDATE)}},
      {"writable-code", {"memfd_create", "memfd_secret"}},
      {"writable-code", {"personality"}, {isOther(0, kAskForPersonality)}},  // includes READ_IMPLIES_EXEC
      {"writable-code", {"mprotect", "pkey_mprotect"}, {hasBits(2, PROT_EXEC)}},
      {"writable-code", {"shmat"}, {hasBits(2, SHM_EXEC)}},

      {"new-code", {"mmap", "mmap2"}, {hasBits(2, PROT_EXEC)}},
  };
  for (unsigned flag : {CLONE_NEWNS, CLONE_NEWCGROUP, CLONE_NEWUTS, CLONE_NEWIPC, CLONE_NEWUSER, CLONE_NEWPID,
                        CLONE_NEWNET}) {
    rules.push_back({"namespaces", {"clone"}, {hasBits(kCloneFlags, flag)}});
  }
  // A rule allows one comparison per argument, so every other family is denied individually.
  for (std::uint64_t family = 0; family <= AF_MAX; ++family) {
    if (family == AF_UNIX || family == AF_INET || family == AF_INET6 || family == AF_NETLINK) continue;
    rules.push_back({"sockets", {"socket"}, {isEqual(0, family)}});
  }
  return rules;
}

/// Returns 0 or a negative error number, as the library does.
int add(scmp_filter_ctx filter, const Rule& rule) {
  for (const char* call : rule.calls) {
    const int number = seccomp_syscall_resolve_name(call);
    if (number < 0) continue;  // this architecture doesn't have it
    const int result =
        seccomp_rule_add_array(filter, SCMP_ACT_ERRNO(static_cast<std::uint32_t>(rule.error)), number,
                               static_cast<unsigned>(rule.when.size()), rule.when.data());
    if (result < 0) return result;
  }
  return 0;
}

int load(const std::vector<std::string>& groups) {
  const std::unique_ptr<void, void (*)(scmp_filter_ctx)> filter(seccomp_init(SCMP_ACT_ALLOW),
                                                                &seccomp_release);
  if (!filter) return -ENOMEM;
  int result = seccomp_attr_set(filter.get(), SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_KILL_PROCESS);
  if (result == 0) result = seccomp_attr_set(filter.get(), SCMP_FLTATR_CTL_TSYNC, 1);
  if (result == 0) result = seccomp_attr_set(filter.get(), SCMP_FLTATR_CTL_OPTIMIZE, 2);
  for (const Rule& rule : allRules()) {
    if (result == 0 && std::ranges::find(groups, rule.group) != groups.end())
      result = add(filter.get(), rule);
  }
  return result == 0 ? seccomp_load(filter.get()) : result;
}

/// Gives up the capability to set the clock, for a daemon that root starts without the service manager.
int giveUpSettingTheClock() {
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct sets[_LINUX_CAPABILITY_U32S_3] = {};
  if (::syscall(SYS_capget, &header, sets) != 0) return -errno;
  for (auto* set : {&sets[0].effective, &sets[0].permitted, &sets[0].inheritable})
    *set &= ~(1U << CAP_SYS_TIME);
  return ::syscall(SYS_capset, &header, sets) == 0 ? 0 : -errno;
}

}  // namespace

bool isCallGroup(std::string_view name) {
  const auto rules = allRules();
  return std::ranges::find(rules, name, &Rule::group) != rules.end();
}

Result<void> denyCalls(const std::vector<std::string>& groups) {
  const bool deniesClock = std::ranges::find(groups, "clock") != groups.end();
  int result = deniesClock ? giveUpSettingTheClock() : 0;  // before the filter, which denies capset
  if (result == 0 && !groups.empty()) result = load(groups);
  if (result == 0) return {};
  return systemError(-result, "the system-call filter can't be loaded");
}

}  // namespace vesk

// The sandbox of the daemon that really runs: the test takes hold of its threads as a debugger does, and has
// them make system calls that the daemon would never make itself.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/user.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "tests/support/DaemonHarness.h"

#if defined(__x86_64__)

namespace vesk::test {
namespace {

/// One thread of another process, stopped while this object lives. It has to be asleep in a system call.
class HeldThread {
 public:
  explicit HeldThread(pid_t thread) : _thread(thread) {
    _held = ::ptrace(PTRACE_ATTACH, thread, nullptr, nullptr) == 0 && stopped() &&
            ::ptrace(PTRACE_GETREGS, thread, nullptr, &_before) == 0;
  }
  ~HeldThread() {
    if (!_held) return;
    ::ptrace(PTRACE_SETREGS, _thread, nullptr, &_before);
    ::ptrace(PTRACE_DETACH, _thread, nullptr, nullptr);
  }
  HeldThread(const HeldThread&) = delete;
  HeldThread& operator=(const HeldThread&) = delete;

  explicit operator bool() const { return _held; }

  /// Makes the thread do the system call; its result, or minus the error number.
  long call(long number, unsigned long long a = 0, unsigned long long b = 0, unsigned long long c = 0) {
    user_regs_struct registers = _before;
    registers.rip -= 2;  // back to the `syscall` instruction in which it sleeps
    registers.orig_rax = static_cast<unsigned long long>(-1);
    registers.rax = static_cast<unsigned long long>(number);
    registers.rdi = a;
    registers.rsi = b;
    registers.rdx = c;
    if (::ptrace(PTRACE_SETREGS, _thread, nullptr, &registers) != 0) return -1000;
    if (::ptrace(PTRACE_SINGLESTEP, _thread, nullptr, nullptr) != 0 || !stopped()) return -1001;
    ::ptrace(PTRACE_GETREGS, _thread, nullptr, &registers);
    return static_cast<long>(registers.rax);
  }

  /// Puts the text on the thread's stack, beyond what it uses; its address there.
  unsigned long long text(const std::string& text) {
    const unsigned long long address = (_before.rsp - 4096) & ~15ULL;
    for (std::size_t at = 0; at <= text.size(); at += sizeof(long)) {
      long word = 0;
      std::memcpy(&word, text.c_str() + at, std::min(sizeof word, text.size() + 1 - at));
      ::ptrace(PTRACE_POKEDATA, _thread, address + at, word);
    }
    return address;
  }

 private:
  bool stopped() const {
    int status = 0;
    return ::waitpid(_thread, &status, __WALL) == _thread && WIFSTOPPED(status);
  }

  const pid_t _thread;
  bool _held = false;
  user_regs_struct _before{};
};

TEST(SandboxedDaemon, CanDoNoHarmFromAnyThread) {
  DaemonHarness harness;
  harness.startDaemon();
  RoadClient client(harness);
  const auto self = static_cast<unsigned long long>(::getpid());
  int threads = 0;
  const std::string tasks = "/proc/" + std::to_string(harness.daemon().pid()) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    HeldThread thread(std::stoi(task.path().filename().string()));
    if (!thread) continue;
    ++threads;
    long allowed = thread.call(SYS_open, thread.text("/proc/self/status"), O_RDONLY);
    EXPECT_GE(allowed, 0) << std::strerror(static_cast<int>(-allowed));
    EXPECT_EQ(thread.call(SYS_close, static_cast<unsigned long long>(allowed)), 0);
    EXPECT_EQ(thread.call(SYS_open, thread.text("/etc/shadow"), O_RDONLY), -EACCES);
    EXPECT_EQ(thread.call(SYS_open, thread.text("/etc/new"), O_WRONLY | O_CREAT, 0600), -EACCES);
    EXPECT_EQ(thread.call(SYS_execve, thread.text("/bin/true")), -EPERM);
    EXPECT_EQ(thread.call(SYS_fork), -EPERM);
    EXPECT_EQ(thread.call(SYS_ptrace, PTRACE_ATTACH, self), -EPERM);
    EXPECT_EQ(thread.call(SYS_kill, self, 0), -EPERM);
  }
  EXPECT_GE(threads, 4) << "main, listener, connection, HTTP";
  EXPECT_EQ(client.reporting.sendMessage(Dictionary{{"category", 3}, {"type", 1}}), ReportingStatus::Queued);
  EXPECT_TRUE(client.reporting.flushMessagesAndWait()) << "it goes on as if nothing had been";
  EXPECT_EQ(harness.stopDaemon(), 0);
}

}  // namespace
}  // namespace vesk::test

#endif

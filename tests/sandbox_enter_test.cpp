// What a process may do within the sandbox that is shipped for the daemon.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/landlock.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/timex.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <csignal>
#include <cstring>
#include <thread>

#include "platform/files/FileDescriptor.h"
#include "platform/files/RootPrefix.h"
#include "platform/sandbox/Sandbox.h"
#include "platform/sandbox/SandboxProfile.h"
#include "tests/support/TempDirectory.h"

namespace vesk {
namespace {

namespace fs = std::filesystem;

constexpr const char* kProfile = "com.corvane.veskreportingd";

/// Runs `body` in a child process, since its effects on the process can't be undone. Returns its text.
std::string inChild(const std::function<std::string()>& body) {
  const test::TempDirectory directory;
  std::ofstream out(directory / "text");
  pid_t child = ::fork();
  if (child == 0) {
    out << body() << std::flush;
    ::_exit(out ? 0 : 1);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  return directory.read("text") + (status == 0 ? "" : "child ended with status " + std::to_string(status));
}

class SandboxTest : public testing::Test {
 protected:
  void SetUp() override {
#ifdef __SANITIZE_THREAD__
    GTEST_SKIP() << "the sanitizer has a thread of its own, which could not be confined";
#endif
  }
  SandboxTest() {
    directory.write("outside/file", "outside");
    fs::create_directories(profilePath().parent_path());
    fs::copy_file(fs::path(VESK_SANDBOX_PROFILES) / profilePath().filename(), profilePath());
    fs::permissions(profilePath(), fs::perms{0644});
  }

  fs::path profilePath() const {
    return root / "usr/share/veskreporting/sandbox/com.corvane.veskreportingd.toml";
  }

  /// Returns the result of `body` inside the sandbox, on a new thread, or the reason why entering it failed.
  std::string inside(const std::function<std::string()>& body) const {
    return inChild([&] {
      setRootPrefix(root.string());
      if (auto entered = enterSandbox(kProfile); !entered) return entered.error().text;
      std::string text;
      std::thread([&] { text = body(); }).join();
      return text;
    });
  }

  const test::TempDirectory directory;
  const fs::path root = directory.path();
};

/// An attempt; the result is that of a system call.
struct Probe {
  const char* name;
  std::function<long()> call;
};

/// A line for each probe for which `isWrong` returns true, given its error number (0: it succeeded).
std::string faults(const std::vector<Probe>& probes, bool (*isWrong)(int error)) {
  std::string text;
  for (const Probe& probe : probes) {
    errno = 0;
    int error = probe.call() < 0 ? errno : 0;
    if (isWrong(error)) text += std::string(probe.name) + ": " + std::strerror(error) + "\n";
  }
  return text;
}

long opens(const fs::path& path, int flags) {
  return FileDescriptor(::open(path.c_str(), flags, 0600)).get();
}

FileDescriptor socketBoundTo(const fs::path& path) {
  FileDescriptor descriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  if (::bind(descriptor.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) != 0)
    descriptor.reset();
  return descriptor;
}

long maps(int protection, int flags, int file) {
  return ::mmap(nullptr, 4096, protection, flags, file, 0) == MAP_FAILED ? -1 : 0;
}

TEST_F(SandboxTest, DeniesWhatIsNotGranted) {
  pid_t parent = ::getpid();
  const std::string proc = "/proc/" + std::to_string(parent);
  const fs::path outside = root / "outside" / "file";
  const fs::path waiting = directory.write("var/spool/veskreporting/file", "to be uploaded");
  const FileDescriptor program(::open("/bin/true", O_RDONLY | O_CLOEXEC));
  void* page = ::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  const std::vector<Probe> probes = {
      {"read /etc/shadow", [] { return opens("/etc/shadow", O_RDONLY); }},
      {"read another file", [&] { return opens(outside, O_RDONLY); }},
      {"make another file", [&] { return opens(root / "outside" / "new", O_WRONLY | O_CREAT); }},
      {"write the profile", [&] { return opens(profilePath(), O_WRONLY); }},
      {"truncate a file by reading", [&] { return opens(profilePath(), O_RDONLY | O_TRUNC); }},
      {"move a file in",
       [&] { return ::rename(outside.c_str(), (root / "var/lib/veskreportingd/file").c_str()); }},
      {"read a file to be uploaded", [&] { return opens(waiting, O_RDONLY); }},
      {"put a file with those", [&] { return opens(waiting.parent_path() / "new", O_WRONLY | O_CREAT); }},
      {"remove another file", [&] { return ::unlink(outside.c_str()); }},
      {"own another file", [&] { return ::chown(outside.c_str(), 1, 1); }},
      {"open its files to all", [&] { return ::chmod((root / "run/veskreportingd").c_str(), 0777); }},
      {"bind a socket elsewhere", [&] { return socketBoundTo(root / "outside" / "socket").get(); }},
      {"read another process's environment", [&] { return opens(proc + "/environ", O_RDONLY); }},
      {"run a program", [&] { return ::execl("", "", nullptr); }},
      {"fork", [] { return ::fork(); }},
      {"trace a process", [&] { return ::ptrace(PTRACE_ATTACH, parent, nullptr, nullptr); }},
      {"signal a process", [&] { return ::kill(parent, 0); }},
      {"make a namespace", [] { return ::unshare(CLONE_NEWNET); }},
      {"change the root", [] { return ::chroot("/"); }},
      {"set the clock",
       [] {
         timex change{};
         change.modes = ADJ_OFFSET;
         return ::adjtimex(&change);
       }},
      {"become a user", [] { return ::setuid(::getuid()); }},
      {"load a BPF program", [] { return ::syscall(SYS_bpf, 0, nullptr, 0); }},
      {"use a key ring", [] { return ::syscall(SYS_keyctl, 0, 0, 0); }},
      {"handle page faults", [] { return ::syscall(SYS_userfaultfd, 0); }},
      {"use io_uring", [] { return ::syscall(SYS_io_uring_setup, 1, nullptr); }},
      {"open a file by handle", [] { return ::syscall(SYS_open_by_handle_at, -1, nullptr, 0); }},
      {"make a device", [&] { return ::mknod((root / "run/veskreportingd/x").c_str(), S_IFCHR, 0); }},
      {"type into a terminal", [&] { return ::ioctl(0, TIOCSTI, "x"); }},
      {"open a packet socket", [] { return ::socket(AF_PACKET, SOCK_DGRAM, 0); }},
      {"open a raw socket", [] { return ::socket(AF_INET, SOCK_RAW, IPPROTO_ICMP); }},
      {"make a page executable", [&] { return ::mprotect(page, 4096, PROT_READ | PROT_EXEC); }},
      {"map writable code", [&] { return maps(PROT_WRITE | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1); }},
      {"map code that is written elsewhere", [&] { return maps(PROT_EXEC, MAP_SHARED, program.get()); }},
      {"make a file in memory", [] { return ::memfd_create("code", 0); }},
  };
  EXPECT_EQ(
      inside([&] { return faults(probes, [](int e) { return e != EPERM && e != EACCES && e != EXDEV; }); }),
      "");
  std::ofstream(profilePath()) << "[calls]\ndeny = [\"new-code\"]";
  const std::vector<Probe> loading = {{"", [&] { return maps(PROT_EXEC, MAP_PRIVATE, program.get()); }}};
  EXPECT_EQ(inside([&] { return faults(loading, [](int error) { return error != EPERM; }); }), "");
  ::munmap(page, 4096);
}

TEST_F(SandboxTest, DeniesPortsAndSocketsOfOthersWhereTheKernelKnowsHow) {
  if (::syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION) < 6)
    GTEST_SKIP() << "this kernel does not";
  sockaddr_un abstract{AF_UNIX, "\0vesk-test"};
  std::to_string(::getpid()).copy(abstract.sun_path + 10, 10);
  const auto calls = [](auto call, int family, const auto& address) {
    FileDescriptor socket(::socket(family, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const int result = call(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
    return std::pair(result == 0 ? std::string("yes ") : std::string(strerrorname_np(errno)) + " ",
                     std::move(socket));
  };
  const FileDescriptor outside = calls(::bind, AF_UNIX, abstract).second;
  ASSERT_EQ(::listen(outside.get(), 1), 0);
  const auto loopback = [](std::uint16_t port) {
    return sockaddr_in{AF_INET, htons(port), {htonl(INADDR_LOOPBACK)}, {}};
  };
  const struct {
    const char* profile;
    const char* manager;
    const char* outcome;
  } cases[] = {
      {"", "/run/notify", "ECONNREFUSED ECONNREFUSED EACCES EPERM "},
      {"", "@notify", "ECONNREFUSED ECONNREFUSED EACCES yes "},
      {"[network]\nconnect = [1]\n", "", "ECONNREFUSED EACCES EACCES EPERM "},
      {"[network]\nconnect = []\n", "", "EACCES EACCES EACCES EPERM "},
  };
  for (const auto& test : cases) {
    std::ofstream(profilePath()) << test.profile;
    ::setenv("NOTIFY_SOCKET", test.manager, 1);
    EXPECT_EQ(inside([&] {
                return calls(::connect, AF_INET, loopback(1)).first +
                       calls(::connect, AF_INET, loopback(2)).first +
                       calls(::bind, AF_INET, loopback(0)).first + calls(::connect, AF_UNIX, abstract).first;
              }),
              test.outcome);
    ::unsetenv("NOTIFY_SOCKET");
  }
}

TEST_F(SandboxTest, SaysWhyItCannotBeEntered) {
  const auto why = [&] { return inside([] { return std::string("entered"); }); };
  const std::string path = profilePath().string() + ": ";
  const struct {
    const char* profile;
    std::string error;
  } cases[] = {
      {"landlock = \"perhaps\"", path + R"(landlock: must be "required" or "if-available")"},
      {"[machine]\nraed = [\"/x\"]", path + "machine.raed: unknown key"},
      {"[machine]\nread = [\"/no/such/file\"]", "/no/such/file: No such file or directory"},
      {"[root]\nwrite = [\"/outside/file/below\"]",
       (root / "outside/file/below").string() + ": Not a directory"},
      {"[network]\nconnect = [0]", path + "network.connect: must be a list of ports"},
      {"[calls]\ndeny = [\"treason\"]", path + "calls.deny: unknown group \"treason\""},
  };
  for (const auto& [profile, error] : cases) {
    std::ofstream(profilePath()) << profile;
    EXPECT_EQ(why().substr(0, error.size()), error);
  }
  std::ofstream(profilePath()) << "";
  EXPECT_EQ(why(), "entered");
  EXPECT_EQ(inChild([&] {
              setRootPrefix(root.string());
              std::string text;
              std::thread([&] { text = enterSandbox(kProfile).error().text; }).join();
              return text;
            }),
            "threads of the process can't be confined any more");
  fs::permissions(profilePath(), fs::perms{0664});
  EXPECT_EQ(why(), path + "others than its owner can write to it (mode 0664)");
  fs::remove(profilePath());
  EXPECT_EQ(why(), path + "no such file");
  EXPECT_EQ(enterSandbox("../etc/passwd").error().text, "\"../etc/passwd\" is no name of a profile");
  EXPECT_TRUE(parseSandboxProfile("")->landlockRequired);
  EXPECT_FALSE(parseSandboxProfile("landlock = \"if-available\"")->landlockRequired);
}

}  // namespace
}  // namespace vesk

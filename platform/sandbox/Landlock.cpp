#include "platform/sandbox/Landlock.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>

#include "platform/files/FileDescriptor.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr std::uint64_t kFileRights =
    LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_WRITE_FILE;
constexpr std::uint64_t kFirstVersionRights = (LANDLOCK_ACCESS_FS_MAKE_SYM << 1) - 1;  // its last right

// Not defined in the kernel headers of some build machines.
constexpr int kPortRule = 2;
constexpr std::uint64_t kBindTCP = 1 << 0;
constexpr std::uint64_t kConnectTCP = 1 << 1;
constexpr std::uint64_t kAbstractSockets = 1 << 0;
constexpr std::uint64_t kSignals = 1 << 1;
struct Ruleset {
  std::uint64_t files = 0;
  std::uint64_t network = 0;
  std::uint64_t scopes = 0;
};
struct PortRule {
  std::uint64_t rights = 0;
  std::uint64_t port = 0;
};

long version() { return ::syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION); }

/// A service manager may receive its services' notifications on an abstract socket.
bool hasAbstractManager() {
  const char* socket = std::getenv("NOTIFY_SOCKET");
  return socket && *socket == '@';
}

/// Covers every right known here that the kernel can restrict. Moving a file to another directory (version 2)
/// is never granted. Truncation by path became a right only with version 3, so the system-call group
/// "truncation" covers it on every kernel. A kernel accepts an overlong ruleset if the rest is zero.
FileDescriptor makeRuleset(long kernelVersion, bool restrictsConnections) {
  Ruleset ruleset;
  ruleset.files = kFirstVersionRights;
  if (kernelVersion >= 2) ruleset.files |= LANDLOCK_ACCESS_FS_REFER;
  if (kernelVersion >= 4) ruleset.network = kBindTCP | (restrictsConnections ? kConnectTCP : 0);
  if (kernelVersion >= 6) ruleset.scopes = kSignals | (hasAbstractManager() ? 0 : kAbstractSockets);
  return FileDescriptor(
      static_cast<int>(::syscall(SYS_landlock_create_ruleset, &ruleset, sizeof ruleset, 0)));
}

Result<void> addRule(int ruleset, int kind, const void* rule, const std::string& subject) {
  if (::syscall(SYS_landlock_add_rule, ruleset, kind, rule, 0) == 0) return {};
  return systemError(errno, "landlock_add_rule: " + subject);
}

/// A rule applies to the current inode. The kernel creates inodes below /proc on demand, and creates a new
/// one once the directory entry is unused. So the entry is held open for the life of the process.
void keepIfMadeUp(FileDescriptor& descriptor, const std::string& path) {
  if (path.starts_with("/proc/")) [[maybe_unused]]
    int kept = descriptor.release();
}

Result<void> addPath(int ruleset, const SandboxPath& path) {
  FileDescriptor target(::open(path.path.c_str(), O_PATH | O_CLOEXEC));
  if (!target) {
    bool nothingToGrant = errno == ENOENT || errno == ENOTDIR || errno == EACCES;
    if (path.isOptional && nothingToGrant) return {};
    return systemError(errno, path.path);
  }
  struct stat status {};
  if (::fstat(target.get(), &status) != 0) return systemError(errno, path.path);
  landlock_path_beneath_attr rule{};
  rule.allowed_access = path.rights;
  if (!S_ISDIR(status.st_mode)) rule.allowed_access &= kFileRights;
  rule.parent_fd = target.get();
  auto added = addRule(ruleset, LANDLOCK_RULE_PATH_BENEATH, &rule, path.path);
  if (added) keepIfMadeUp(target, path.path);
  return added;
}

}  // namespace

Result<void> enterLandlock(const SandboxProfile& profile) {
  const long kernelVersion = version();
  if (kernelVersion < 1) {
    Error error = systemError(errno, "this kernel offers no Landlock");
    if (profile.landlockRequired) return error;
    VESK_LOG_WARNING("restrictFiles: %s; files are not restricted", error.text.c_str());
    return {};
  }
  FileDescriptor ruleset = makeRuleset(kernelVersion, profile.connectPorts.has_value());
  if (!ruleset) return systemError(errno, "landlock_create_ruleset");
  for (const SandboxPath& path : profile.paths) {
    if (auto added = addPath(ruleset.get(), path); !added) return added;
  }
  if (kernelVersion >= 4 && profile.connectPorts) {
    for (std::uint16_t port : *profile.connectPorts) {
      const PortRule rule{kConnectTCP, port};
      auto added = addRule(ruleset.get(), kPortRule, &rule, "port " + std::to_string(port));
      if (!added) return added;
    }
  }
  if (::syscall(SYS_landlock_restrict_self, ruleset.get(), 0) != 0) {
    return systemError(errno, "landlock_restrict_self");
  }
  return {};
}

}  // namespace vesk

#include "platform/sandbox/Sandbox.h"

#include <sys/prctl.h>

#include <cerrno>
#include <filesystem>
#include <iterator>
#include <system_error>

#include "platform/files/RootPrefix.h"
#include "platform/files/TrustedFile.h"
#include "platform/sandbox/Landlock.h"
#include "platform/sandbox/SandboxProfile.h"
#include "platform/sandbox/Seccomp.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumProfile = std::size_t{64} << 10;

/// Landlock confines only the calling thread and the threads that it creates.
bool hasOtherThreads() {
  std::error_code error;
  const std::filesystem::directory_iterator threads("/proc/self/task", error);
  return error || std::distance(begin(threads), end(threads)) != 1;
}

std::optional<std::string> enter(const SandboxProfile& profile) {
  if (hasOtherThreads()) return "threads of the process can't be confined any more";
  if (auto error = makeDirectories(profile.paths)) return error;
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
    return "no_new_privs: " + std::generic_category().message(errno);
  }
  if (auto error = enterLandlock(profile)) return error;
  return denyCalls(profile.deniedCalls);
}

}  // namespace

std::optional<std::string> enterSandbox(std::string_view profileName) {
  if (!isPlainFileName(profileName)) return "\"" + std::string(profileName) + "\" is no name of a profile";
  std::string path = pathUnderRoot("/usr/share/veskreporting/sandbox/" + std::string(profileName) + ".toml");
  SmallFile file = readTrustedFile(path, kMaximumProfile);
  if (!file.bytes) return path + ": " + (file.missing ? "no such file" : file.error);
  SandboxProfileOutcome outcome = parseSandboxProfile(*file.bytes);
  if (!outcome.profile) return path + ": " + outcome.error;
  return enter(*outcome.profile);
}

}  // namespace vesk

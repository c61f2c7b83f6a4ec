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

namespace fs = std::filesystem;

constexpr std::size_t kMaximumProfile = std::size_t{64} << 10;

/// Landlock confines only the calling thread and the threads that it creates.
bool hasOtherThreads() {
  std::error_code error;
  const fs::directory_iterator threads("/proc/self/task", error);
  return error || std::distance(begin(threads), end(threads)) != 1;
}

Result<void> makeDirectories(const std::vector<SandboxPath>& paths) {
  for (const SandboxPath& each : paths) {
    std::error_code error;
    if (each.created == fs::perms::none || fs::exists(each.path, error)) continue;
    fs::create_directories(each.path, error);
    if (!error) fs::permissions(each.path, each.created, error);
    if (error) return systemError(error.value(), each.path);
  }
  return {};
}

Result<void> enter(const SandboxProfile& profile) {
  if (hasOtherThreads())
    return Error{Error::Kind::Failed, "threads of the process can't be confined any more"};
  if (auto made = makeDirectories(profile.paths); !made) return made;
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return systemError(errno, "no_new_privs");
  if (auto entered = enterLandlock(profile); !entered) return entered;
  return denyCalls(profile.deniedCalls);
}

}  // namespace

Result<void> enterSandbox(std::string_view profileName) {
  if (!isPlainFileName(profileName))
    return malformed("\"" + std::string(profileName) + "\" is no name of a profile");
  std::string path = pathUnderRoot("/usr/share/veskreporting/sandbox/" + std::string(profileName) + ".toml");
  const auto file = readTrustedFile(path, kMaximumProfile);
  const auto profile = file ? parseSandboxProfile(*file) : file.error();
  if (profile) return enter(*profile);
  Error error = profile.error();
  error.text = path + ": " + (error.kind == Error::Kind::Missing ? "no such file" : error.text);
  return error;
}

}  // namespace vesk

#include "tools/veskreport/DevProgram.h"

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sstream>
#include <stdexcept>
#include <system_error>

namespace vesk {

namespace {

constexpr int kNotRun = 127;

[[noreturn]] void execute(const DevProgram::Options& options, pid_t parent, int output) {
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (::getppid() != parent) ::_exit(kNotRun);  // the parent ended before that
  if (options.isServer) {
    ::setpgid(0, 0);
    ::umask(077);
    ::dup2(::open("/dev/null", O_RDONLY | O_CLOEXEC), STDIN_FILENO);
    ::dup2(output, STDOUT_FILENO);
    ::dup2(output, STDERR_FILENO);
  }
  for (const auto& [name, value] : options.environment) ::setenv(name.c_str(), value.c_str(), 1);
  ::signal(SIGPIPE, SIG_DFL);
  ::sigprocmask(SIG_SETMASK, &options.signals, nullptr);
  std::vector<char*> arguments;
  for (const auto& argument : options.command) arguments.push_back(const_cast<char*>(argument.c_str()));
  arguments.push_back(nullptr);
  ::execvp(arguments[0], arguments.data());
  std::fprintf(stderr, "veskreport: can't run %s: %s\n", arguments[0], std::strerror(errno));
  ::_exit(kNotRun);
}

}  // namespace

std::filesystem::path findProgram(const std::string& name) {
  const auto own = std::filesystem::read_symlink("/proc/self/exe").parent_path();
  const char* path = std::getenv("PATH");
  std::istringstream directories(own.string() + ":" + own.string() + "/../sbin:" + (path ? path : "") +
                                 ":/usr/sbin");
  for (std::string directory; std::getline(directories, directory, ':');) {
    auto file = std::filesystem::path(directory) / name;
    if (file.is_absolute() && std::filesystem::is_regular_file(file) && ::access(file.c_str(), X_OK) == 0)
      return file;
  }
  throw std::runtime_error("there is no " + name +
                           " beside veskreport, in ../sbin or in PATH: install the package " + name);
}

DevProgram::DevProgram(const Options& options) {
  int ends[2] = {-1, -1};
  if (options.isServer && ::pipe2(ends, O_CLOEXEC) != 0)
    throw std::system_error(errno, std::generic_category(), "no pipe");
  _output = FileDescriptor(ends[0]);
  const FileDescriptor written(ends[1]);
  const pid_t parent = ::getpid();
  _pid = ::fork();
  if (_pid < 0) throw std::system_error(errno, std::generic_category(), "no further process");
  if (_pid == 0) execute(options, parent, written.get());
}

DevProgram::~DevProgram() {
  if (status()) return;
  signal(SIGKILL);
  ::waitpid(_pid, nullptr, 0);
}

void DevProgram::signal(int number) const {
  if (!_status) ::kill(_pid, number);
}

std::optional<int> DevProgram::status() {
  int status = 0;
  if (!_status && ::waitpid(_pid, &status, WNOHANG) == _pid)
    _status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  return _status;
}

void DevProgram::readOutput(const std::function<void(const std::string& line)>& handler) {
  char bytes[16384];
  const ssize_t count = ::read(_output.get(), bytes, sizeof bytes);
  if (count <= 0) return _output.reset();
  _partial.append(bytes, static_cast<std::size_t>(count));
  std::size_t begin = 0;
  for (std::size_t end; (end = _partial.find('\n', begin)) != std::string::npos; begin = end + 1)
    handler(_partial.substr(begin, end - begin));
  _partial.erase(0, begin);
}

}  // namespace vesk

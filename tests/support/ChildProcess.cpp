#include "tests/support/ChildProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <stdexcept>

extern char** environ;

namespace vesk::test {

namespace {

/// Opened for appending, because threads that write don't lock the position of a file in memory.
FileDescriptor fileHolding(const std::string& text = {}) {
  FileDescriptor file(::memfd_create("child", MFD_CLOEXEC));
  if (!file || ::write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size()))
    throw std::runtime_error("no file for a child process");
  ::lseek(file.get(), 0, SEEK_SET);
  ::fcntl(file.get(), F_SETFL, O_APPEND);
  return file;
}

std::string contentsOf(const FileDescriptor& file) {
  struct stat status {};
  ::fstat(file.get(), &status);
  std::string text(static_cast<std::size_t>(status.st_size), '\0');
  text.resize(static_cast<std::size_t>(::pread(file.get(), text.data(), text.size(), 0)));
  return text;
}

std::vector<std::string> environmentWith(const std::map<std::string, std::string>& added) {
  std::vector<std::string> all;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    std::string text = *entry;
    if (!added.contains(text.substr(0, text.find('=')))) all.push_back(std::move(text));
  }
  for (const auto& [name, value] : added) all.push_back(name + "=" + value);
  return all;
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (auto& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

}  // namespace

ChildProcess::ChildProcess(Options options) : _output(fileHolding()), _errors(fileHolding()) {
  FileDescriptor input = fileHolding(options.input);
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_adddup2(&actions, input.get(), STDIN_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, _errors.get(), STDERR_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, _output.get(), STDOUT_FILENO);
  if (options.outputClosed) ::posix_spawn_file_actions_addclose(&actions, STDOUT_FILENO);
  auto environment = environmentWith(options.environment);
  auto arguments = pointersTo(options.command);
  int error = ::posix_spawnp(&_pid, arguments[0], &actions, nullptr, arguments.data(),
                             pointersTo(environment).data());
  ::posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::runtime_error("can't start " + options.command[0] + ": " + std::strerror(error));
  _process = FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, _pid, 0)));
}

ChildProcess::~ChildProcess() {
  signal(SIGKILL);
  if (!_status) ::waitpid(_pid, nullptr, 0);
}

void ChildProcess::signal(int number) const {
  if (!_status) ::kill(_pid, number);
}

bool ChildProcess::hasEnded(std::chrono::milliseconds patience) const {
  pollfd ended{_process.get(), POLLIN, 0};
  return ::poll(&ended, 1, static_cast<int>(patience.count())) > 0;
}

std::optional<int> ChildProcess::wait(std::chrono::milliseconds patience) {
  if (_status || !hasEnded(patience)) return _status;
  int status = 0;
  ::waitpid(_pid, &status, 0);
  return _status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

std::string ChildProcess::output() const { return contentsOf(_output); }

std::string ChildProcess::errors() const { return contentsOf(_errors); }

bool ChildProcess::waitForText(std::string_view text, int count) const {
  int found = 0;
  eventually([&] {
    const bool isLastLook = hasEnded({});
    const std::string all = output() + errors();
    found = 0;
    for (std::size_t at = 0; (at = all.find(text, at)) != std::string::npos; at += text.size()) ++found;
    return found >= count || isLastLook;
  });
  return found >= count;
}

}  // namespace vesk::test

#include "tests/support/ChildProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/eventfd.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <stdexcept>

extern char** environ;

namespace vesk::test {

namespace {

using Clock = std::chrono::steady_clock;

int millisecondsUntil(Clock::time_point end) {
  auto left = std::chrono::ceil<std::chrono::milliseconds>(end - Clock::now()).count();
  return static_cast<int>(std::max<long>(0, left));
}

FileDescriptor inputHolding(const std::string& text) {
  FileDescriptor file(::memfd_create("input", MFD_CLOEXEC));
  if (!file || ::write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size()))
    throw std::runtime_error("no standard input for a child process");
  ::lseek(file.get(), 0, SEEK_SET);
  return file;
}

/// The reading and the writing end.
std::array<FileDescriptor, 2> makePipe() {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) throw std::runtime_error("no pipe for a child process");
  return {FileDescriptor(ends[0]), FileDescriptor(ends[1])};
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

ChildProcess::ChildProcess(Options options) : _stop(::eventfd(0, EFD_CLOEXEC)) {
  FileDescriptor input = inputHolding(options.input);
  auto output = makePipe();
  auto errors = makePipe();
  posix_spawn_file_actions_t actions;
  ::posix_spawn_file_actions_init(&actions);
  ::posix_spawn_file_actions_adddup2(&actions, input.get(), STDIN_FILENO);
  ::posix_spawn_file_actions_adddup2(&actions, errors[1].get(), STDERR_FILENO);
  if (options.outputClosed) {
    ::posix_spawn_file_actions_addclose(&actions, STDOUT_FILENO);
  } else {
    ::posix_spawn_file_actions_adddup2(&actions, output[1].get(), STDOUT_FILENO);
  }
  auto environment = environmentWith(options.environment);
  auto arguments = pointersTo(options.command);
  int error = ::posix_spawnp(&_pid, arguments[0], &actions, nullptr, arguments.data(),
                             pointersTo(environment).data());
  ::posix_spawn_file_actions_destroy(&actions);
  if (error != 0) throw std::runtime_error("can't start " + options.command[0] + ": " + std::strerror(error));
  _process = FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, _pid, 0)));
  _output = std::move(output[0]);
  _errors = std::move(errors[0]);
  _collector = std::thread([this] { collect(); });
}

ChildProcess::~ChildProcess() {
  if (!_status) {
    signal(SIGKILL);
    ::waitpid(_pid, nullptr, 0);
  }
  ::eventfd_write(_stop.get(), 1);
  _collector.join();
}

void ChildProcess::signal(int number) const {
  if (!_status) ::kill(_pid, number);
}

std::optional<int> ChildProcess::wait(std::chrono::milliseconds patience) {
  if (_status) return _status;
  auto end = Clock::now() + patience;
  pollfd ended{_process.get(), POLLIN, 0};
  while (::poll(&ended, 1, millisecondsUntil(end)) < 0 && errno == EINTR) {
  }
  int status = 0;
  if (::waitpid(_pid, &status, WNOHANG) != _pid) return std::nullopt;
  _status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  std::unique_lock lock(_mutex);
  _changed.wait_until(lock, end, [&] { return _collected; });
  return _status;
}

std::string ChildProcess::output() const {
  std::lock_guard lock(_mutex);
  return _outputText;
}

std::string ChildProcess::errors() const {
  std::lock_guard lock(_mutex);
  return _errorText;
}

bool ChildProcess::waitForText(std::string_view text, int count, std::chrono::milliseconds patience) const {
  auto occurrences = [&](const std::string& in) {
    int found = 0;
    for (std::size_t at = 0; (at = in.find(text, at)) != std::string::npos; at += text.size()) ++found;
    return found;
  };
  auto seen = [&] { return occurrences(_outputText) + occurrences(_errorText) >= count; };
  std::unique_lock lock(_mutex);
  _changed.wait_for(lock, patience, [&] { return _collected || seen(); });
  return seen();
}

void ChildProcess::collect() {
  bool outputOpen = true;
  bool errorsOpen = true;
  while (outputOpen || errorsOpen) {
    std::array<pollfd, 3> waits{pollfd{outputOpen ? _output.get() : -1, POLLIN, 0},
                                pollfd{errorsOpen ? _errors.get() : -1, POLLIN, 0},
                                pollfd{_stop.get(), POLLIN, 0}};
    if (::poll(waits.data(), waits.size(), -1) < 0) continue;
    if (waits[0].revents != 0) outputOpen = collectFrom(_output.get(), _outputText);
    if (waits[1].revents != 0) errorsOpen = collectFrom(_errors.get(), _errorText);
    if (waits[2].revents != 0) break;
  }
  std::lock_guard lock(_mutex);
  _collected = true;
  _changed.notify_all();
}

bool ChildProcess::collectFrom(int descriptor, std::string& text) {
  std::array<char, 64 * 1024> piece;
  ssize_t count = ::read(descriptor, piece.data(), piece.size());
  if (count < 0) return errno == EINTR || errno == EAGAIN;
  std::lock_guard lock(_mutex);
  text.append(piece.data(), static_cast<std::size_t>(count));
  _changed.notify_all();
  return count > 0;
}

bool waitForFile(const std::string& path, std::chrono::milliseconds patience) {
  for (auto end = Clock::now() + patience; !std::filesystem::exists(path);) {
    if (Clock::now() > end) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(5));  // between two looks
  }
  return true;
}

}  // namespace vesk::test

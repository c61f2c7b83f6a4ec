#include "tools/collector/Console.h"

#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <string>

#include "tools/text/Printable.h"

namespace vesk {

namespace {

/// 0, or the error number.
int writeLine(int descriptor, std::string_view line) {
  std::string bytes = std::string(line) + "\n";
  std::string_view rest = bytes;
  while (!rest.empty()) {
    ssize_t count = ::write(descriptor, rest.data(), rest.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    rest.remove_prefix(static_cast<std::size_t>(count));
  }
  return 0;
}

}  // namespace

void Console::event(std::string_view lines) {
  MutexLock lock(_mutex);
  writeOutput(lines);
}

void Console::note(std::string_view line) {
  MutexLock lock(_mutex);
  if (_style == Style::JSON) {
    writeLine(STDERR_FILENO, printable(line));
  } else {
    writeOutput(printable(line));
  }
}

void Console::problem(std::string_view line) {
  MutexLock lock(_mutex);
  writeLine(STDERR_FILENO, printable(line));
}

void Console::writeOutput(std::string_view line) {
  if (_outputClosed) return;
  int error = writeLine(STDOUT_FILENO, line);
  if (error == 0) return;
  _outputClosed = true;
  writeLine(STDERR_FILENO, std::string("standard output is gone, going on without: ") + std::strerror(error));
}

}  // namespace vesk

#include "tools/collector/Console.h"

#include <unistd.h>

#include <cstring>
#include <string>

#include "platform/files/WriteAll.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

/// Returns 0 or the error number.
int writeLine(int descriptor, std::string_view line) {
  return writeAll(descriptor, std::string(line) + "\n");
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

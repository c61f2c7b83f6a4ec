#include "tools/collector/Console.h"

#include <unistd.h>

#include <string>

#include "platform/files/WriteAll.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

Result<void> writeLine(int descriptor, std::string_view line) {
  return writeAll(descriptor, std::string(line) + "\n");
}

}  // namespace

void Console::event(std::string_view lines) {
  MutexLock lock(_mutex);
  writeOutput(lines);
}

void Console::note(std::string_view line) {
  if (_style == Style::JSON) return problem(line);
  MutexLock lock(_mutex);
  writeOutput(printable(line));
}

void Console::problem(std::string_view line) {
  MutexLock lock(_mutex);
  static_cast<void>(writeLine(STDERR_FILENO, printable(line)));
}

void Console::writeOutput(std::string_view line) {
  if (_outputClosed) return;
  const auto written = writeLine(STDOUT_FILENO, line);
  if (written) return;
  _outputClosed = true;
  static_cast<void>(
      writeLine(STDERR_FILENO, "standard output is gone, going on without: " + written.error().text));
}

}  // namespace vesk

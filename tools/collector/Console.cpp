#include "tools/collector/Console.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

#include "platform/unicode/Unicode.h"

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

void appendCode(std::string& shown, char c) {
  char code[8];
  std::snprintf(code, sizeof code, "\\x%02x", static_cast<unsigned char>(c));
  shown += code;
}

/// U+0080 to U+009F, which terminals obey as they do the first 32.
bool isSecondControlSet(std::string_view text) {
  return text.size() > 1 && text[0] == '\xc2' && static_cast<unsigned char>(text[1]) < 0xa0;
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

std::string printable(std::string_view text) {
  const bool isUTF8 = isValidUTF8(text);
  std::string shown;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (isUTF8 && isSecondControlSet(text.substr(i))) {
      appendCode(shown, text[i++]);
      appendCode(shown, text[i]);
    } else if (auto byte = static_cast<unsigned char>(text[i]);
               byte < 0x20 || byte == 0x7f || (byte > 0x7f && !isUTF8)) {
      appendCode(shown, text[i]);
    } else {
      shown += text[i];
    }
  }
  return shown;
}

}  // namespace vesk

#include "tools/veskreport/Output.h"

#include <cstdio>

#include "platform/json/JSONWriter.h"

namespace vesk {

namespace {

// One write for a line: others may write at the same time.
void printLine(std::FILE* file, std::string line) {
  line += '\n';
  std::fwrite(line.data(), 1, line.size(), file);
  std::fflush(file);
}

}  // namespace

int Output::done(std::string_view line, const Dictionary& fields) const {
  return done(std::vector<std::string>{std::string(line)}, fields);
}

int Output::done(const std::vector<std::string>& lines, const Dictionary& fields) const {
  if (_json) {
    object("done", {}, fields);
  } else {
    for (const std::string& line : lines) printLine(stdout, line);
  }
  return kExitDone;
}

int Output::failed(std::string_view cause, const Dictionary& fields) const {
  printLine(stderr, "veskreport: " + std::string(cause));
  if (_json) object("failed", cause, fields);
  return kExitFailed;
}

void Output::note(std::string_view words) const { printLine(stderr, "veskreport: " + std::string(words)); }

int Output::raw(std::string_view bytes) const {
  bool isWritten =
      std::fwrite(bytes.data(), 1, bytes.size(), stdout) == bytes.size() && std::fflush(stdout) == 0;
  return isWritten ? kExitDone : failed("cannot write to standard output");
}

void Output::object(const char* status, std::string_view cause, const Dictionary& fields) const {
  MutableDictionary entries;
  entries.append(Text::literal("status"), status);
  if (!cause.empty()) entries.append(Text::literal("error"), cause);
  entries.setAll(fields);
  auto line = toJSON(entries.share(), JSONStyle::Compact);
  printLine(stdout, line ? *line : R"({"status":"failed","error":"no JSON can carry the outcome"})");
}

}  // namespace vesk

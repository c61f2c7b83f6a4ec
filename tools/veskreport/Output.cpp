#include "tools/veskreport/Output.h"

#include <algorithm>
#include <cstdio>

#include "platform/json/JSONWriter.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

bool print(std::FILE* file, std::string_view bytes) {
  return std::fwrite(bytes.data(), 1, bytes.size(), file) == bytes.size() && std::fflush(file) == 0;
}

// A single write per line, since others may write to the same file at the same time.
bool printLine(std::FILE* file, std::string line) { return print(file, line += '\n'); }

/// Makes the tool's own text, which may contain file names, valid for JSON.
Value carried(const Value& value) {
  const Text* text = value.text();
  return text ? Value(printableUTF8(text->view())) : value;
}

}  // namespace

int Output::done(std::string_view line, const Dictionary& fields) const {
  return done(std::vector<std::string>{std::string(line)}, fields);
}

int Output::done(const std::vector<std::string>& lines, const Dictionary& fields) const {
  if (std::ferror(stdout)) return kExitFailed;  // already reported
  const bool isWritten =
      _json ? object("done", {}, fields)
            : std::ranges::all_of(lines, [](const auto& line) { return printLine(stdout, line); });
  return isWritten ? kExitDone : failed("cannot write to standard output");
}

int Output::failed(std::string_view cause, const Dictionary& fields) const {
  printLine(stderr, "veskreport: " + std::string(cause));
  if (_json) object("failed", cause, fields);
  return kExitFailed;
}

void Output::note(std::string_view words) const { printLine(stderr, "veskreport: " + std::string(words)); }

int Output::raw(std::string_view bytes) const {
  return print(stdout, bytes) ? kExitDone : failed("cannot write to standard output");
}

bool Output::object(const char* status, std::string_view cause, const Dictionary& fields) const {
  MutableDictionary entries;
  entries.append(Text::literal("status"), status);
  if (!cause.empty()) entries.append(Text::literal("error"), printableUTF8(cause));
  for (const DictionaryEntry& field : fields) entries.set(field.key, carried(field.value));
  auto line = toJSON(entries.share(), JSONStyle::Compact);
  const bool isPrinted =
      printLine(stdout, line ? *line : R"({"status":"failed","error":"no JSON can carry the outcome"})");
  return line && isPrinted;
}

}  // namespace vesk

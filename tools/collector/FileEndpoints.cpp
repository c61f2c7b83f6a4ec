#include "tools/collector/FileEndpoints.h"

#include "platform/text/ASCII.h"
#include "platform/text/PercentCode.h"
#include "tools/files/WholeFile.h"
#include "tools/plist/KeyedArchiveReader.h"

namespace vesk {

namespace {

constexpr std::size_t kLongestName = 200;
constexpr std::size_t kMaximumContents = std::size_t{1} << 30;

/// The name from the query, sanitised for use in our directory; empty if there is none.
std::string nameIn(const HTTPReceived& received) {
  std::string name = percentDecoded(received.query("filename").value_or("")).value_or("");
  for (char& c : name) {
    if (c == '/' || isControl(c)) c = '_';
  }
  return name.substr(0, kLongestName);
}

}  // namespace

std::filesystem::path NumberedFiles::save(std::string_view bytes, const std::string& ending) {
  std::filesystem::create_directories(_directory);
  std::filesystem::path path;
  do {
    path = _directory / (std::to_string(++_last) + ending);
  } while (std::filesystem::exists(path));
  writeWholeFile(path, bytes, 0644);
  return path;
}

HTTPAnswer UploadsEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  requireMethod(received, "POST");
  const std::string name = nameIn(received);
  if (name.empty()) throw Refusal{400, "the query names no file"};
  if (received.header("Content-Encoding") != "gzip") throw Refusal{400, "the file is not gzip"};
  auto contents = received.decodedBody(kMaximumContents);
  if (!contents.body) throw Refusal{400, contents.problem};
  const auto path = _files.save(received.body, "-" + name);
  ++_stats.uploads;
  _console.note("file " + name + " (" + std::to_string(contents.body->size()) + " bytes, " +
                std::to_string(received.body.size()) + " as sent) of session " +
                std::string(received.query("sequence").value_or("?")) + " saved as " + path.string());
  return HTTPAnswer::of("application/json", _goodAnswer + "\n");
}

HTTPAnswer LogDataEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  requireMethod(received, "POST");
  if (received.header("Content-Type") != "application/octet-stream")
    throw Refusal{400, "the header Content-Type must be application/octet-stream"};
  auto archive = unarchiveValue(received.body, archiveLimits());
  if (!archive) throw Refusal{400, archive.error().text};
  const auto path = _files.save(received.body, ".archive");
  ++_stats.logData;
  _console.note("log data of " + std::to_string(received.body.size()) + " bytes from " + received.peer +
                " in " + path.string());
  return HTTPAnswer::of("text/plain; charset=utf-8", path.string());
}

}  // namespace vesk

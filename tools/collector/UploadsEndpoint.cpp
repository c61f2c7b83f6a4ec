#include "tools/collector/UploadsEndpoint.h"

#include <exception>

#include "platform/text/ASCII.h"
#include "platform/text/PercentCode.h"

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

UploadsEndpoint::UploadsEndpoint(const CollectorServices& services, std::filesystem::path directory,
                                 std::string goodAnswer)
    : FaultyEndpoint(services, FaultTarget::Upload),
      _files(std::move(directory)),
      _goodAnswer(std::move(goodAnswer)) {}

HTTPAnswer UploadsEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  if (received.method != "POST") return _refuse.wrongMethod(received, "POST");
  std::string name = nameIn(received);
  if (name.empty()) return _refuse(received, 400, "the query names no file");
  if (received.header("Content-Encoding") != "gzip") return _refuse(received, 400, "the file is not gzip");
  auto contents = received.decodedBody(kMaximumContents);
  if (!contents.body) return _refuse(received, 400, contents.problem);
  std::filesystem::path path;
  try {
    path = _files.save(received.body, "-" + name);
  } catch (const std::exception& error) {
    return _refuse(received, 500, error.what());
  }
  ++_stats.uploads;
  _console.note("file " + name + " (" + std::to_string(contents.body->size()) + " bytes, " +
                std::to_string(received.body.size()) + " as sent) of session " +
                std::string(received.query("sequence").value_or("?")) + " saved as " + path.string());
  HTTPAnswer answer;
  answer.headers = {{"Content-Type", "application/json"}};
  answer.body = _goodAnswer + "\n";
  return answer;
}

}  // namespace vesk

#include "tools/collector/LogDataEndpoint.h"

#include "tools/collector/ArchiveText.h"

namespace vesk {

LogDataEndpoint::LogDataEndpoint(const CollectorServices& services, std::filesystem::path directory)
    : FaultyEndpoint(services, FaultTarget::LogData), _files(std::move(directory)) {}

HTTPAnswer LogDataEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  if (received.method != "POST") return _refuse.wrongMethod(received, "POST");
  if (received.header("Content-Type") != "application/octet-stream")
    return _refuse(received, 400, "the header Content-Type must be application/octet-stream");
  auto archive = unarchiveValue(received.body, archiveLimits());
  if (!archive) return _refuse(received, 400, archive.error().text);
  try {
    const auto file = _files.save(received.body, ".archive");
    ++_stats.logData;
    _console.note("log data of " + std::to_string(received.body.size()) + " bytes from " + received.peer +
                  " in " + file.string());
    HTTPAnswer answer;
    answer.headers = {{"Content-Type", "text/plain; charset=utf-8"}};
    answer.body = file.string();
    return answer;
  } catch (const std::exception& error) {
    return _refuse(received, 500, error.what());
  }
}

}  // namespace vesk

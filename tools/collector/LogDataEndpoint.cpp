#include "tools/collector/LogDataEndpoint.h"

#include "tools/collector/ArchiveText.h"
#include "tools/files/WholeFile.h"

namespace vesk {

LogDataEndpoint::LogDataEndpoint(Parts parts, std::filesystem::path directory)
    : _parts(parts),
      _refuse(parts.console, parts.stats),
      _faulty(parts.console, parts.stats, parts.faults, FaultTarget::LogData),
      _directory(std::move(directory)) {}

HTTPAnswer LogDataEndpoint::answer(const HTTPReceived& received) {
  return _faulty(received, [&](const CollectorFault*) { return take(received); });
}

HTTPAnswer LogDataEndpoint::take(const HTTPReceived& received) {
  if (received.method != "POST") return _refuse.wrongMethod(received, "POST");
  if (received.header("Content-Type") != "application/octet-stream")
    return _refuse(received, 400, "the header Content-Type must be application/octet-stream");
  auto archive = unarchiveValue(received.body, archiveLimits());
  if (!archive.value) return _refuse(received, 400, archive.error);
  try {
    const auto file = store(received);
    ++_parts.stats.logData;
    _parts.console.note("log data of " + std::to_string(received.body.size()) + " bytes from " +
                        received.peer + " in " + file.string());
    HTTPAnswer answer;
    answer.headers = {{"Content-Type", "text/plain; charset=utf-8"}};
    answer.body = file.string();
    return answer;
  } catch (const std::exception& error) {
    return _refuse(received, 500, error.what());
  }
}

std::filesystem::path LogDataEndpoint::store(const HTTPReceived& received) {
  std::filesystem::create_directories(_directory);
  std::filesystem::path file;
  do {
    file = _directory / (std::to_string(_next++) + ".archive");
  } while (std::filesystem::exists(file));
  writeWholeFile(file, received.body, 0644);
  return file;
}

}  // namespace vesk

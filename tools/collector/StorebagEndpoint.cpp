#include "tools/collector/StorebagEndpoint.h"

#include <algorithm>

#include "tools/storebag/StorebagSigning.h"

namespace vesk {

namespace {

// Names of days and months are English because the program never sets a locale.
constexpr char kHTTPDate[] = "%a, %d %b %Y %H:%M:%S GMT";

std::string httpDate(std::time_t time) {
  std::tm calendar{};
  ::gmtime_r(&time, &calendar);
  char text[64];
  return std::string(text, std::strftime(text, sizeof text, kHTTPDate, &calendar));
}

bool isUnchangedSince(const HTTPReceived& received, std::time_t lastModified) {
  const std::string since(received.header("If-Modified-Since").value_or(""));
  std::tm calendar{};
  const char* end = ::strptime(since.c_str(), kHTTPDate, &calendar);
  return end != nullptr && *end == '\0' && lastModified <= ::timegm(&calendar);
}

bool isPlainName(std::string_view name) {
  constexpr std::string_view kPlain = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_";
  return !name.empty() && name.size() <= 100 && name.find_first_not_of(kPlain) == name.npos;
}

bool isSameVersion(const struct stat& a, const struct stat& b) {
  return a.st_size == b.st_size && a.st_ino == b.st_ino && a.st_mtim.tv_sec == b.st_mtim.tv_sec &&
         a.st_mtim.tv_nsec == b.st_mtim.tv_nsec;
}

}  // namespace

HTTPAnswer StorebagEndpoint::serve(const HTTPReceived& received, const CollectorFault* fault) {
  requireMethod(received, "GET");
  const bool signWell = fault == nullptr || !fault->badSignature;
  std::string_view path = received.path();
  std::string name(path.substr(path.rfind('/') + 1));
  const auto found = find(name);
  if (!found) throw Refusal{404, "no " + name + ".toml or " + name + ".json in " + _directory.string()};
  HTTPAnswer answer;
  answer.headers = {{"Last-Modified", httpDate(found->lastModified)}};
  if (_maximumAge)
    answer.headers.emplace_back("Cache-Control", "max-age=" + std::to_string(_maximumAge->count()));
  if (signWell && isUnchangedSince(received, found->lastModified)) {
    ++_stats.storebagsUnchanged;
    _console.note(describeRequest(received) + ": unchanged");
    answer.status = 304;
    return answer;
  }
  answer.headers.emplace_back("Content-Type", "application/xml");
  const StorebagSource source = readStorebagSource(found->file, _checks);
  if (found->isNew)
    for (const auto& warning : source.warnings) _console.problem("warning: " + warning);
  answer.body = signWell ? signStorebag(source.payload, _key) : signStorebagBadly(source.payload, _key);
  ++_stats.storebagsSent;
  auto version = source.payload.text("version");
  _console.note(describeRequest(received) + ": " + std::to_string(answer.body.size()) + " bytes, version " +
                (version ? version->string() : "none"));
  return answer;
}

std::optional<StorebagEndpoint::Found> StorebagEndpoint::find(std::string_view name) {
  if (!isPlainName(name)) return std::nullopt;
  struct stat status {};
  std::filesystem::path file = _directory / (std::string(name) + ".toml");
  if (::stat(file.c_str(), &status) != 0) file.replace_extension(".json");
  if (::stat(file.c_str(), &status) != 0) return std::nullopt;

  MutexLock lock(_mutex);
  auto [entry, isFirst] = _versions.try_emplace(file);
  Version& version = entry->second;
  const bool isNew = isFirst || !isSameVersion(version.status, status);
  const std::time_t modified = status.st_mtim.tv_sec;
  if (isNew) version = {status, isFirst ? modified : std::max(version.lastModified + 1, modified)};
  return Found{file, version.lastModified, isNew};
}

}  // namespace vesk

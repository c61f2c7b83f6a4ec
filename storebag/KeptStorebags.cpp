#include "storebag/KeptStorebags.h"

#include <sys/stat.h>
#include <unistd.h>

#include <utility>

#include "platform/files/PrivateFile.h"
#include "platform/files/TrustedFile.h"
#include "platform/log/SystemLog.h"
#include "platform/plist/PropertyList.h"
#include "platform/text/PercentCode.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumFile = std::size_t{5} << 20;  // an answer of 4 MiB with its first line

}  // namespace

void KeptStorebags::keep(std::string_view name, std::string_view document,
                         const std::optional<std::string>& lastModified) const {
  std::string bytes = lastModified.value_or("");
  (bytes += '\n') += document;
  const std::string path = pathFor(name);
  ::mkdir(_directory.c_str(), 0700);
  if (const auto written = replacePrivateFile(path, bytes); !written) {
    VESK_LOG_WARNING("KeptStorebags: cannot write %s: %s", path.c_str(), written.error().text.c_str());
  }
}

std::optional<KeptStorebags::Kept> KeptStorebags::load(std::string_view name) const {
  const std::string path = pathFor(name);
  const auto file = readTrustedFile(path, kMaximumFile, TrustedOwner::OwnUser);
  if (!file && file.error().kind == Error::Kind::Missing) return std::nullopt;
  auto kept = file ? parse(*file) : file.error();
  if (kept) {
    const auto accepted = _acceptance ? _acceptance->accept(name, kept->payload) : Result<void>();
    if (accepted) return *std::move(kept);
    // The file stays: after the next start, its serial still keeps older ones out.
    VESK_LOG_ERROR("KeptStorebags: %s is not used: %s", path.c_str(), accepted.error().text.c_str());
    return std::nullopt;
  }
  VESK_LOG_ERROR("KeptStorebags: %s is removed: %s", path.c_str(), kept.error().text.c_str());
  ::unlink(path.c_str());
  return std::nullopt;
}

std::string KeptStorebags::pathFor(std::string_view name) const {
  return _directory + "/" + percentEncoded(name, "") + ".storebag";
}

// The first line is the server's date, which may be empty.
Result<KeptStorebags::Kept> KeptStorebags::parse(std::string_view file) const {
  const auto end = file.find('\n');
  if (end == std::string_view::npos) return malformed("it is incomplete");
  const auto document = parsePropertyList(file.substr(end + 1));
  if (!document) return document.error();
  if (!document->dictionary()) return malformed("it is no signed document");
  auto verification = verifySignedDocument(*document->dictionary(), _publicKeys());
  if (verification.verdict != Verification::Verdict::Good)
    return malformed("its signature can not be verified");
  Kept kept{.payload = std::move(verification.payload), .lastModified = std::nullopt};
  if (end > 0) kept.lastModified = std::string(file.substr(0, end));
  return kept;
}

}  // namespace vesk

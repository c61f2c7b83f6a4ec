#include <VeskReporting/VeskReporting.h>

#include <sstream>
#include <stdexcept>
#include <string>

#include "platform/preferences/TomlFile.h"
#include "tools/files/WholeFile.h"
#include "tools/storebag/StorebagSigning.h"
#include "tools/storebag/StorebagSource.h"
#include "tools/veskreport/CommandLine.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumStorebag = std::size_t{1} << 20;
constexpr std::size_t kMaximumKey = std::size_t{64} << 10;
constexpr mode_t kReadableByAll = 0644;

std::string publicKeyOf(const Invocation& invocation) {
  if (!invocation.key.empty()) return readWholeFile(invocation.key, kMaximumKey);
  auto installed = VeskReporting::publicKey();
  if (!installed) throw std::runtime_error("no public key is installed: name one with --key");
  return *installed;
}

/// Midnight of UTC if only a day is given.
Value dateMeantBy(const std::string& text) {
  const bool isDay = text.find('T') == std::string::npos;
  const auto toml = text.find_first_not_of("0123456789-:TZ") == std::string::npos
                        ? parseToml("date = " + text +
                                    (isDay                ? "T00:00:00Z"
                                     : text.back() == 'Z' ? ""
                                                          : "Z"))
                        : Result<Dictionary>(malformed("no date"));
  const Value* date = toml ? toml->find("date") : nullptr;
  if (date == nullptr || date->date() == nullptr) {
    throw std::runtime_error("--expires: '" + text +
                             "' is no date such as 2027-01-31 or 2027-01-31T12:00:00");
  }
  return *date;
}

Dictionary withSignedKeys(const Dictionary& payload, const Invocation& invocation) {
  MutableDictionary all(payload);
  if (invocation.storebagName && invocation.storebagName->empty())
    throw std::runtime_error("--name: it is empty");
  if (invocation.storebagName) all.set("name", *invocation.storebagName);
  if (invocation.serial) all.set("serial", *invocation.serial);
  if (invocation.expires) all.set("expires", dateMeantBy(*invocation.expires));
  return all.share();
}

}  // namespace

int runStorebagKeygen(const Invocation& invocation, const Output& output) {
  const std::string& directory = invocation.directory;
  SigningKey::generate().save(directory);
  std::string privateKey = SigningKey::privateKeyFile(directory);
  std::string publicKey = SigningKey::publicKeyFile(directory);
  return output.done({"private key: " + privateKey, "public key: " + publicKey},
                     {{"privateKey", privateKey}, {"publicKey", publicKey}});
}

int runStorebagSign(const Invocation& invocation, const Output& output) {
  auto checks = invocation.lenient ? StorebagChecks::Lenient : StorebagChecks::Strict;
  StorebagSource source = readStorebagSource(invocation.source, checks);
  for (const std::string& warning : source.warnings) output.note("warning: " + warning);
  std::string document =
      signStorebag(withSignedKeys(source.payload, invocation), SigningKey::fromFile(invocation.key));
  if (invocation.output.empty()) return output.raw(document);
  writeWholeFile(invocation.output, document, kReadableByAll);
  return output.done("signed " + invocation.output, {{"output", invocation.output}});
}

int runStorebagVerify(const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.source;
  std::string document = readWholeFile(path, kMaximumStorebag);
  auto inspection = inspectStorebag(document, publicKeyOf(invocation));
  if (!inspection.isValid()) return output.failed(path + ": " + inspection.problem);
  const Dictionary& payload = *inspection.payload;
  auto version = payload.text("version");
  std::string line = path + ": valid, " + (version ? "version " + version->string() : "no version");
  MutableDictionary signedKeys;
  for (const char* key : {"name", "serial", "expires"}) {
    if (const Value* value = payload.find(key)) signedKeys.set(key, *value);
  }
  std::istringstream keyLines(storebagAsTOML(signedKeys.share()));
  for (std::string each; std::getline(keyLines, each);) {
    if (!each.empty()) line += ", " + each;
  }
  return output.done(line, {{"storebag", path}});
}

int runStorebagShow(const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.source;
  auto inspection = inspectStorebag(readWholeFile(path, kMaximumStorebag), {});
  if (!inspection.payload) return output.failed(path + ": no storebag that can be read");
  return output.raw(output.isJSON() ? storebagAsJSON(*inspection.payload)
                                    : storebagAsTOML(*inspection.payload));
}

}  // namespace vesk

#include <VeskReporting/VeskReporting.h>

#include <stdexcept>
#include <string>

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
  std::string document = signStorebag(source.payload, SigningKey::fromFile(invocation.key));
  if (invocation.output.empty()) return output.raw(document);
  writeWholeFile(invocation.output, document, kReadableByAll);
  return output.done("signed " + invocation.output, {{"output", invocation.output}});
}

int runStorebagVerify(const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.source;
  std::string document = readWholeFile(path, kMaximumStorebag);
  auto inspection = inspectStorebag(document, publicKeyOf(invocation));
  if (!inspection.isValid()) return output.failed(path + ": " + inspection.problem);
  auto version = inspection.payload->text("version");
  return output.done(path + ": valid, " + (version ? "version " + version->string() : "no version"),
                     {{"storebag", path}});
}

int runStorebagShow(const Invocation& invocation, const Output& output) {
  const std::string& path = invocation.source;
  auto inspection = inspectStorebag(readWholeFile(path, kMaximumStorebag), {});
  if (!inspection.payload) return output.failed(path + ": no storebag that can be read");
  return output.raw(output.isJSON() ? storebagAsJSON(*inspection.payload)
                                    : storebagAsTOML(*inspection.payload));
}

}  // namespace vesk

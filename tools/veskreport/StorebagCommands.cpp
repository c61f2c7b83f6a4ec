#include "tools/veskreport/StorebagCommands.h"

#include <VeskReporting/VeskReporting.h>

#include <exception>
#include <stdexcept>
#include <string>

#include "tools/files/WholeFile.h"
#include "tools/storebag/SigningKey.h"
#include "tools/storebag/StorebagDocument.h"
#include "tools/storebag/StorebagSource.h"
#include "tools/storebag/StorebagText.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumStorebag = std::size_t{1} << 20;
constexpr std::size_t kMaximumKey = std::size_t{64} << 10;
constexpr mode_t kReadableByAll = 0644;

// The storebag code throws runtime errors with messages meant for the user.
template <class Work>
int reporting(const Output& output, const Work& work) {
  try {
    return work();
  } catch (const std::exception& error) {
    return output.failed(error.what());
  }
}

std::string publicKeyOf(const StorebagArguments& arguments) {
  if (!arguments.publicKey.empty()) return readWholeFile(arguments.publicKey, kMaximumKey);
  auto installed = VeskReporting::publicKey();
  if (!installed) throw std::runtime_error("no public key is installed: name one with --key");
  return *installed;
}

std::string describeVersion(const Dictionary& payload) {
  auto version = payload.text("version");
  return version ? "version " + version->string() : "no version";
}

}  // namespace

int runStorebagKeygen(const StorebagArguments& arguments, const Output& output) {
  return reporting(output, [&] {
    SigningKey::generate().save(arguments.directory);
    std::string privateKey = SigningKey::privateKeyFile(arguments.directory);
    std::string publicKey = SigningKey::publicKeyFile(arguments.directory);
    return output.done({"private key: " + privateKey, "public key: " + publicKey},
                       {{"privateKey", privateKey}, {"publicKey", publicKey}});
  });
}

int runStorebagSign(const StorebagArguments& arguments, const Output& output) {
  return reporting(output, [&] {
    auto checks = arguments.lenient ? StorebagChecks::Lenient : StorebagChecks::Strict;
    StorebagSource source = readStorebagSource(arguments.source, checks);
    for (const std::string& warning : source.warnings) output.note("warning: " + warning);
    std::string document = signStorebag(source.payload, SigningKey::fromFile(arguments.privateKey));
    if (arguments.output.empty()) return output.raw(document);
    writeWholeFile(arguments.output, document, kReadableByAll);
    return output.done("signed " + arguments.output, {{"output", arguments.output}});
  });
}

int runStorebagVerify(const StorebagArguments& arguments, const Output& output) {
  return reporting(output, [&] {
    auto inspection =
        inspectStorebag(readWholeFile(arguments.source, kMaximumStorebag), publicKeyOf(arguments));
    if (!inspection.isValid()) {
      return output.failed(arguments.source + ": " + std::string(explain(inspection.verdict)));
    }
    return output.done(arguments.source + ": valid, " + describeVersion(*inspection.payload),
                       {{"storebag", arguments.source}});
  });
}

int runStorebagShow(const StorebagArguments& arguments, const Output& output) {
  return reporting(output, [&] {
    auto inspection = inspectStorebag(readWholeFile(arguments.source, kMaximumStorebag), {});
    if (!inspection.payload) return output.failed(arguments.source + ": no storebag that can be read");
    std::string text =
        output.isJSON() ? storebagAsJSON(*inspection.payload) : storebagAsTOML(*inspection.payload);
    if (!text.ends_with('\n')) text += '\n';
    return output.raw(text);
  });
}

}  // namespace vesk

#include "tools/storebag/StorebagSource.h"

#include <stdexcept>

#include "platform/preferences/TomlFile.h"
#include "tools/files/WholeFile.h"
#include "tools/json/JSONReader.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumSize = std::size_t{1} << 20;  // the daemon's limit for a storebag

Dictionary parse(const std::filesystem::path& file) {
  const std::string text = readWholeFile(file, kMaximumSize);
  const auto refuse = [&](const std::string& why) { throw std::runtime_error(file.string() + ": " + why); };
  if (file.extension() == ".toml") {
    auto document = parseToml(text);
    if (!document) refuse(document.error().text);
    return *std::move(document);
  }
  if (file.extension() != ".json") refuse("the name must end in .toml or .json");
  const auto value = parseJSON(text);
  if (!value) refuse(value.error().text);
  if (value->dictionary() == nullptr) refuse("the storebag must be an object");
  return *value->dictionary();
}

}  // namespace

StorebagSource readStorebagSource(const std::filesystem::path& file, StorebagChecks checks) {
  StorebagSource source{parse(file), {}};
  const StorebagFindings findings = checkStorebag(source.payload);
  std::string errors;
  for (const auto& line : findings.errors) {
    source.warnings.push_back(file.string() + ": " + line);
    errors += (errors.empty() ? "" : "\n") + source.warnings.back();
  }
  if (!errors.empty() && checks == StorebagChecks::Strict) throw std::runtime_error(errors);
  for (const auto& line : findings.warnings) source.warnings.push_back(file.string() + ": " + line);
  return source;
}

}  // namespace vesk

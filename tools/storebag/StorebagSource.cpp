#include "tools/storebag/StorebagSource.h"

#include <stdexcept>

#include "platform/preferences/TomlFile.h"
#include "tools/files/WholeFile.h"
#include "tools/json/JSONReader.h"
#include "tools/storebag/StorebagRules.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumSize = std::size_t{1} << 20;  // the daemon's limit for a storebag

Dictionary fromJSON(const std::string& text) {
  const auto value = parseJSON(text);
  if (!value) throw std::runtime_error(value.error().text);
  const Dictionary* dictionary = value->dictionary();
  if (dictionary == nullptr) throw std::runtime_error("the storebag must be an object");
  return *dictionary;
}

Dictionary fromTOML(const std::string& text) {
  auto document = parseToml(text);
  if (!document) throw std::runtime_error(document.error().text);
  return *std::move(document);
}

Dictionary parse(const std::filesystem::path& file) {
  std::string text = readWholeFile(file, kMaximumSize);
  try {
    if (file.extension() == ".json") return fromJSON(text);
    if (file.extension() == ".toml") return fromTOML(text);
    throw std::runtime_error("the name must end in .toml or .json");
  } catch (const std::runtime_error& error) {
    throw std::runtime_error(file.string() + ": " + error.what());
  }
}

std::vector<std::string> prefixed(const std::filesystem::path& file, const std::vector<std::string>& lines) {
  std::vector<std::string> all;
  for (const auto& line : lines) all.push_back(file.string() + ": " + line);
  return all;
}

std::string joined(const std::vector<std::string>& lines) {
  std::string all;
  for (const auto& line : lines) all.append(all.empty() ? "" : "\n").append(line);
  return all;
}

}  // namespace

StorebagSource readStorebagSource(const std::filesystem::path& file, StorebagChecks checks) {
  StorebagSource source;
  source.payload = parse(file);
  StorebagFindings findings = checkStorebag(source.payload);
  auto errors = prefixed(file, findings.errors);
  if (!errors.empty() && checks == StorebagChecks::Strict) throw std::runtime_error(joined(errors));
  source.warnings = prefixed(file, findings.warnings);
  source.warnings.insert(source.warnings.begin(), errors.begin(), errors.end());
  return source;
}

}  // namespace vesk

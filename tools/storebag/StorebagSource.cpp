#include "tools/storebag/StorebagSource.h"

#include <stdexcept>

#include "platform/preferences/TomlFile.h"
#include "tools/files/WholeFile.h"
#include "tools/json/JSONReader.h"
#include "tools/storebag/StorebagSigning.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumSize = std::size_t{1} << 20;  // the daemon's limit for a storebag

bool isSource(const std::filesystem::path& file) {
  return file.extension() == ".toml" || file.extension() == ".json";
}

}  // namespace

Dictionary readTomlOrJSON(const std::filesystem::path& file) {
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
  if (value->dictionary() == nullptr) refuse("the document must be an object");
  return *value->dictionary();
}

Dictionary readAnyStorebag(const std::filesystem::path& file) {
  if (isSource(file)) return readTomlOrJSON(file);
  auto inspection = inspectStorebag(readWholeFile(file, kMaximumSize), {});
  if (!inspection.payload)
    throw std::runtime_error(file.string() + ": neither a signed storebag nor a .toml or .json file");
  return *std::move(inspection.payload);
}

StorebagSource readStorebagSource(const std::filesystem::path& file, StorebagChecks checks) {
  StorebagSource source{readTomlOrJSON(file), {}};
  std::vector<std::string> others;
  std::string errors;
  for (const auto& finding : checkStorebag(source.payload)) {
    const bool isWrongType = finding.kind == StorebagFinding::Kind::WrongType;
    auto& lines = isWrongType ? source.warnings : others;
    lines.push_back(file.string() + ": " + finding.line());
    if (isWrongType) errors += (errors.empty() ? "" : "\n") + lines.back();
  }
  if (!errors.empty() && checks == StorebagChecks::Strict) throw std::runtime_error(errors);
  source.warnings.insert(source.warnings.end(), others.begin(), others.end());
  return source;
}

}  // namespace vesk

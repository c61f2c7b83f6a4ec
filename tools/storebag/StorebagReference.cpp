#include "tools/storebag/StorebagReference.h"

#include <cctype>

#include "protocol/StorebagName.h"
#include "storebag/StorebagNaming.h"
#include "tools/storebag/StorebagKeys.h"

namespace vesk {

namespace {

constexpr std::int32_t kLastClientType = 11;

std::string typeOf(const StorebagKey& key) {
  switch (key.type) {
    case KeyType::URL:
      return "text, a URL";
    case KeyType::Address:
      return "text, an IPv4 address";
    case KeyType::Integer:
    case KeyType::Serial:
      return "integer";
    case KeyType::Flag:
      return "0 or 1";
    case KeyType::IntegerOrText:
      return "integer or text";
    case KeyType::Boolean:
      return "boolean";
    default: {
      const std::string_view name = nameOf(key.type);
      return std::string(name.substr(name.find(' ') + 1));
    }
  }
}

/// A default that is a value, not words.
bool isValue(std::string_view absent) {
  return !absent.empty() && (absent.front() == '"' || absent.front() == '-' || absent == "false" ||
                             (std::isdigit(static_cast<unsigned char>(absent.front())) != 0));
}

std::string clientTypesOf(std::string_view name) {
  std::string types;
  for (std::int32_t type = 0; type <= kLastClientType; ++type) {
    if (storebagNameForClientType(type) == name) types += (types.empty() ? "" : ", ") + std::to_string(type);
  }
  return types;
}

/// Calls `row` with each storebag name and its client types, in the order of the types.
template <class Row>
void forEachName(const Row& row) {
  for (std::int32_t type = 0; type <= kLastClientType; ++type) {
    const auto name = storebagNameForClientType(type);
    if (!name) continue;
    const std::string types = clientTypesOf(*name);
    if (types.starts_with(std::to_string(type))) row(std::string(*name), types);
  }
}

// --- Markdown

std::string code(std::string_view text) { return text.empty() ? "" : "`" + std::string(text) + "`"; }

std::string markdownRow(const StorebagKey& key) {
  const std::string unit = key.unit.empty() ? "" : ", " + std::string(key.unit);
  return "| " + code(key.key) + " | " + typeOf(key) + unit + " | " +
         (isValue(key.absent) ? code(key.absent) : std::string(key.absent)) + " | " +
         std::string(key.effect) + " | " + code(key.example) + " |\n";
}

// --- mdoc

std::string mdocText(std::string_view text) {
  std::string escaped;
  for (const char c : text) {
    if (c == '\\') escaped += "\\e";
    if (c == '"') escaped += "\\(dq";
    if (c != '\\' && c != '"') escaped += c;
  }
  return escaped;
}

/// One sentence a line, as in the other pages.
std::string mdocSentences(std::string_view text) {
  std::string lines;
  while (!text.empty()) {
    const auto end = text.find(". ");
    const std::string line = mdocText(text.substr(0, end == std::string_view::npos ? text.size() : end + 1));
    lines += (line.front() == '.' || line.front() == '\'' ? "\\&" : "") + line + "\n";
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 2);
  }
  return lines;
}

std::string mdocItem(const StorebagKey& key) {
  std::string item = ".It Li " + std::string(key.key) + "\n" + mdocSentences(key.effect) +
                     "Type: " + mdocText(typeOf(key)) +
                     (key.unit.empty() ? "" : " (" + std::string(key.unit) + ")") + ".\n";
  if (!key.absent.empty()) item += "Without it: " + mdocText(key.absent) + ".\n";
  if (!key.example.empty())
    item += "Example:\n.Li \"" + mdocText(std::string(key.key) + " = " + std::string(key.example)) + "\"\n";
  return item;
}

}  // namespace

std::string storebagReferenceAsMarkdown() {
  std::string page = "### Environments\n\n| `environmentType` | section |\n|---|---|\n";
  for (std::int32_t type = 1; const auto name = environmentNameForType(type); ++type)
    page += "| " + std::to_string(type) + " | " + code(*name) + " |\n";
  page += "\n### Client types\n\n| storebag | client types |\n|---|---|\n";
  forEachName([&](const std::string& name, const std::string& types) {
    page += "| " + code(name) + " | " + types + " |\n";
  });
  for (const auto& group : storebagKeyGroups()) {
    page += "\n### " + std::string(group.title) + "\n\n" + std::string(group.where) +
            "\n\n| key | type, unit | without it | effect | example |\n|---|---|---|---|---|\n";
    for (const auto& key : group.keys) page += markdownRow(key);
  }
  return page;
}

std::string storebagReferenceAsMdoc() {
  std::string page = ".Ss Environments\n.Bl -tag -width corvane_internal -compact\n";
  for (std::int32_t type = 1; const auto name = environmentNameForType(type); ++type)
    page += ".It Li " + std::string(*name) + "\nenvironment type " + std::to_string(type) + "\n";
  page += ".El\n.Ss Client types\n.Bl -tag -width corvane_internal -compact\n";
  forEachName([&](const std::string& name, const std::string& types) {
    page += ".It Li " + name + "\nclient types " + types + "\n";
  });
  page += ".El\n";
  for (const auto& group : storebagKeyGroups()) {
    page += ".Ss " + std::string(group.title) + "\n" + mdocText(group.where) + "\n.Bl -tag -width Ds\n";
    for (const auto& key : group.keys) page += mdocItem(key);
    page += ".El\n";
  }
  return page;
}

}  // namespace vesk

#include "tools/veskreport/PayloadParser.h"

#include <cmath>

#include "platform/unicode/UTF8.h"
#include "tools/json/JSONReader.h"

namespace vesk {

namespace {

bool isSendableText(std::string_view text) noexcept { return isValidUTF8(text, false); }

// Null, or the reason why the value can't be sent.
const char* complaintAbout(const Value& value) {
  if (const Text* text = value.text(); text && !isSendableText(text->view())) return "a text holds a NUL";
  if (const double* number = value.real(); number && !std::isfinite(*number))
    return "a number is out of range";
  if (const List* list = value.list()) {
    for (const Value& item : *list) {
      if (const char* complaint = complaintAbout(item)) return complaint;
    }
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    for (const auto& entry : *dictionary) {
      if (!isSendableText(entry.key.view())) return "a key holds a NUL";
      if (const char* complaint = complaintAbout(entry.value)) return complaint;
    }
  }
  return nullptr;
}

Parsed<DictionaryEntry> parsePair(const std::string& argument) {
  std::size_t equals = argument.find('=');
  if (equals == std::string::npos) return {std::nullopt, "neither key=text nor key:=json"};
  bool isJSON = equals > 0 && argument[equals - 1] == ':';
  std::string key = argument.substr(0, isJSON ? equals - 1 : equals);
  std::string_view rest = std::string_view(argument).substr(equals + 1);
  if (key.empty()) return {std::nullopt, "the key is missing"};
  if (!isSendableText(argument)) return {std::nullopt, "not UTF-8"};
  if (!isJSON) return {DictionaryEntry{key, rest}, {}};
  auto parsed = parsePayloadValue(rest);
  if (!parsed.value) return {std::nullopt, std::move(parsed.error)};
  return {DictionaryEntry{key, std::move(*parsed.value)}, {}};
}

}  // namespace

Parsed<Value> parsePayloadValue(std::string_view json) {
  JSONOutcome outcome = parseJSON(json);
  if (!outcome.value) return {std::nullopt, "no valid JSON: " + outcome.error};
  if (const char* complaint = complaintAbout(*outcome.value)) return {std::nullopt, complaint};
  return {std::move(outcome.value), {}};
}

Parsed<Dictionary> parsePayloadObject(std::string_view json) {
  auto parsed = parsePayloadValue(json);
  if (!parsed.value) return {std::nullopt, std::move(parsed.error)};
  if (!parsed.value->dictionary()) return {std::nullopt, "no JSON object"};
  return {*parsed.value->dictionary(), {}};
}

Parsed<Dictionary> parsePairs(const std::vector<std::string>& arguments) {
  MutableDictionary dictionary;
  dictionary.reserve(arguments.size());
  for (const std::string& argument : arguments) {
    auto pair = parsePair(argument);
    if (pair.value && dictionary.contains(pair.value->key.view())) {
      pair = {std::nullopt, "the key is given twice"};
    }
    if (!pair.value) return {std::nullopt, "\"" + argument + "\": " + pair.error};
    dictionary.append(std::move(pair.value->key), std::move(pair.value->value));
  }
  return {dictionary.share(), {}};
}

}  // namespace vesk

#include "tools/veskreport/PayloadParser.h"

#include <cmath>

#include "platform/unicode/UTF8.h"
#include "tools/json/JSONReader.h"

namespace vesk {

namespace {

bool isSendableText(std::string_view text) noexcept { return isValidUTF8(text, false); }

/// Succeeds if the value can be sent.
Result<void> check(const Value& value) {
  if (const Text* text = value.text(); text && !isSendableText(text->view()))
    return malformed("a text holds a NUL");
  if (const double* number = value.real(); number && !std::isfinite(*number))
    return malformed("a number is out of range");
  if (const List* list = value.list()) {
    for (const Value& item : *list)
      if (auto checked = check(item); !checked) return checked;
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    for (const auto& entry : *dictionary) {
      if (!isSendableText(entry.key.view())) return malformed("a key holds a NUL");
      if (auto checked = check(entry.value); !checked) return checked;
    }
  }
  return {};
}

Result<DictionaryEntry> parsePair(const std::string& argument) {
  std::size_t equals = argument.find('=');
  if (equals == std::string::npos) return malformed("neither key=text nor key:=json");
  bool isJSON = equals > 0 && argument[equals - 1] == ':';
  std::string key = argument.substr(0, isJSON ? equals - 1 : equals);
  std::string_view rest = std::string_view(argument).substr(equals + 1);
  if (key.empty()) return malformed("the key is missing");
  if (!isSendableText(argument)) return malformed("not UTF-8");
  if (!isJSON) return DictionaryEntry{key, rest};
  auto value = parsePayloadValue(rest);
  if (!value) return value.error();
  return DictionaryEntry{key, *std::move(value)};
}

}  // namespace

Result<Value> parsePayloadValue(std::string_view json) {
  auto value = parseJSON(json);
  if (!value) return malformed("no valid JSON: " + value.error().text);
  if (auto checked = check(*value); !checked) return checked.error();
  return value;
}

Result<Dictionary> parsePayloadObject(std::string_view json) {
  const auto value = parsePayloadValue(json);
  if (!value) return value.error();
  if (!value->dictionary()) return malformed("no JSON object");
  return *value->dictionary();
}

Result<Dictionary> parsePairs(const std::vector<std::string>& arguments) {
  MutableDictionary dictionary;
  dictionary.reserve(arguments.size());
  for (const std::string& argument : arguments) {
    auto pair = parsePair(argument);
    if (pair && dictionary.contains(pair->key.view())) pair = malformed("the key is given twice");
    if (!pair) return malformed("\"" + argument + "\": " + pair.error().text);
    dictionary.append(std::move(pair->key), std::move(pair->value));
  }
  return dictionary.share();
}

}  // namespace vesk

#include <cmath>
#include <stdexcept>

#include "platform/json/JSONWriter.h"
#include "tools/json/JSONReader.h"
#include "tools/storebag/StorebagKeys.h"
#include "tools/storebag/StorebagReference.h"

namespace vesk {

namespace {

List textList(std::initializer_list<const char*> texts) {
  return List(std::vector<Value>(texts.begin(), texts.end()));
}

Dictionary objectOf(std::span<const StorebagKey> keys);

/// What JSON Schema says of a type. Numbers may be booleans, which the daemon takes as 0 and 1.
MutableDictionary typeOf(const StorebagKey& key) {
  switch (key.type) {
    case KeyType::Text:
      return MutableDictionary(Dictionary{{"type", "string"}});
    case KeyType::URL:
      return MutableDictionary(
          Dictionary{{"type", "string"}, {"pattern", "^[Hh][Tt][Tt][Pp][Ss]?://[^/?#:]"}});
    case KeyType::Address:
      return MutableDictionary(Dictionary{{"type", "string"}, {"pattern", "^[0-9]{1,3}(\\.[0-9]{1,3}){3}$"}});
    case KeyType::Number:
    case KeyType::Integer:
      return MutableDictionary(Dictionary{{"type", textList({"number", "boolean"})}});
    case KeyType::Flag:
      return MutableDictionary(
          Dictionary{{"type", textList({"number", "boolean"})}, {"minimum", 0}, {"maximum", 1}});
    case KeyType::IntegerOrText:
      return MutableDictionary(Dictionary{{"type", textList({"number", "boolean", "string"})}});
    case KeyType::Serial:
      return MutableDictionary(Dictionary{{"type", "integer"}});
    case KeyType::Date:
      return MutableDictionary(Dictionary{{"type", "string"}, {"format", "date-time"}});
    case KeyType::Boolean:
      return MutableDictionary(Dictionary{{"type", "boolean"}});
    case KeyType::Texts:
      return MutableDictionary(Dictionary{{"type", "array"}, {"items", Dictionary{{"type", "string"}}}});
    case KeyType::Tables:
      return MutableDictionary(Dictionary{{"type", "array"}, {"items", objectOf(key.contents)}});
    case KeyType::Table:
      return MutableDictionary(objectOf(key.contents));
  }
  return {};
}

std::string descriptionOf(const StorebagKey& key) {
  std::string text(key.effect);
  if (!key.unit.empty()) text += " Unit: " + std::string(key.unit) + ".";
  if (!key.absent.empty()) text += " Without it: " + std::string(key.absent) + ".";
  if (!key.example.empty()) text += " Example: " + std::string(key.key) + " = " + std::string(key.example);
  return text;
}

Dictionary schemaOf(const StorebagKey& key) {
  MutableDictionary schema = typeOf(key);
  schema.set("description", descriptionOf(key));
  if (const auto value = parseJSON(key.absent)) schema.set("default", *value);
  if (!key.words.empty()) schema.set("enum", List(std::vector<Value>(key.words.begin(), key.words.end())));
  if (std::isfinite(key.least)) schema.set("minimum", static_cast<std::int64_t>(key.least));
  if (std::isfinite(key.most)) schema.set("maximum", static_cast<std::int64_t>(key.most));
  return schema.share();
}

/// An object with these keys and no others, of which those whose absence disables a backend are required.
Dictionary objectOf(std::span<const StorebagKey> keys) {
  MutableDictionary properties;
  std::vector<Value> required;
  for (const auto& key : keys) {
    properties.set(key.key, schemaOf(key));
    if (key.withoutIt == kNotBuilt) required.emplace_back(key.key);
  }
  MutableDictionary object(
      Dictionary{{"type", "object"}, {"properties", properties.share()}, {"additionalProperties", false}});
  if (!required.empty()) object.set("required", List(std::move(required)));
  return object.share();
}

}  // namespace

std::string storebagSchema() {
  MutableDictionary properties;
  for (const auto& key : topLevelKeys()) properties.set(key.key, schemaOf(key));
  for (const auto name : environmentNames()) {
    properties.set(name, Dictionary{{"$ref", "#/definitions/section"},
                                    {"description", "What devices in this environment do."}});
  }
  const Dictionary schema{{"$schema", "http://json-schema.org/draft-07/schema#"},
                          {"title", "Storebag of veskreportingd"},
                          {"type", "object"},
                          {"properties", properties.share()},
                          {"additionalProperties", false},
                          {"definitions", Dictionary{{"section", objectOf(backendKeys())}}}};
  auto text = toJSON(schema, JSONStyle::Pretty);
  if (!text) throw std::runtime_error("the schema can't be written as JSON");
  return *std::move(text) + "\n";
}

}  // namespace vesk

#include "tools/storebag/StorebagKeys.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>

#include "platform/text/NearestWord.h"

namespace vesk {

namespace {

bool isText(const Value& value) { return value.text() != nullptr; }
bool isDictionary(const Value& value) { return value.dictionary() != nullptr; }

bool isListOf(const Value& value, bool (*fits)(const Value&)) {
  const List* list = value.list();
  return list != nullptr && std::all_of(list->begin(), list->end(), fits);
}

bool isSerial(const Value& value) {
  return value.real() == nullptr && value.boolean() == nullptr && value.asInteger().value_or(-1) >= 0;
}

}  // namespace

std::vector<StorebagKeyGroup> storebagKeyGroups() {
  const auto contents = [](std::span<const StorebagKey> keys, std::string_view name) {
    return keyNamed(keys, name)->contents;
  };
  const auto post = contents(backendKeys(), kVeskReportingBackendHTTPPost);
  const auto clients = contents(post, "clients");
  return {
      {"The storebag itself", "At the top of the file.", topLevelKeys()},
      {"Backends", "Tables in an environment's section, such as [release.httpPost].", backendKeys()},
      {"HTTPS backends", "In [release.httpPost] and [release.httpPost2].", post},
      {"Client entries", "In each [[release.httpPost.clients]].", clients},
      {"Filters", "In each table of a client entry's filters.", contents(clients, "filters")},
      {"Dashboard", "In [release.dashboard].", contents(backendKeys(), kVeskReportingBackendDashboard)},
      {"Upload server", "In [release.uploadServer].",
       contents(backendKeys(), kVeskReportingBackendUploadServer)},
      {"Adaptor and power log", "In [release.wren] and [release.kilnar].",
       contents(backendKeys(), kVeskReportingBackendWren)},
      {"Device facts", "In /etc/veskreporting/device.toml. Every key is optional.", deviceFactKeys()},
      {"Preferences", "In /etc/veskreporting/preferences/com.corvane.veskreporting.toml.", preferenceKeys()},
  };
}

const StorebagKey* keyNamed(std::span<const StorebagKey> keys, std::string_view name) {
  const auto found = std::ranges::find(keys, name, &StorebagKey::key);
  return found == keys.end() ? nullptr : &*found;
}

bool hasType(const Value& value, KeyType type) {
  switch (type) {
    case KeyType::Text:
    case KeyType::URL:
    case KeyType::Address:
      return isText(value);
    case KeyType::Number:
    case KeyType::Integer:
    case KeyType::Flag:
      return value.isNumber();
    case KeyType::IntegerOrText:
      return value.isNumber() || isText(value);
    case KeyType::Serial:
      return isSerial(value);
    case KeyType::Date:
      return value.date() != nullptr;
    case KeyType::Boolean:
      return value.boolean() != nullptr;
    case KeyType::Texts:
      return isListOf(value, isText);
    case KeyType::Tables:
      return isListOf(value, isDictionary);
    case KeyType::Table:
      return isDictionary(value);
  }
  return false;
}

std::string_view nameOf(KeyType type) {
  switch (type) {
    case KeyType::Text:
    case KeyType::URL:
    case KeyType::Address:
      return "a text";
    case KeyType::Number:
    case KeyType::Integer:
    case KeyType::Flag:
      return "a number";
    case KeyType::IntegerOrText:
      return "a number or a text";
    case KeyType::Serial:
      return "an integer from 0";
    case KeyType::Date:
      return "a date";
    case KeyType::Boolean:
      return "true or false";
    case KeyType::Texts:
      return "a list of texts";
    case KeyType::Tables:
      return "a list of tables";
    case KeyType::Table:
      return "a table";
  }
  return "";
}

std::string nearestWord(std::string_view word, std::span<const std::string_view> words) {
  const std::string_view nearest = nearestOf(word, words);
  return nearest.empty() ? "" : "; did you mean '" + std::string(nearest) + "'?";
}

std::string nearestKey(std::string_view name, std::span<const StorebagKey> keys) {
  std::vector<std::string_view> names;
  for (const auto& each : keys) names.push_back(each.key);
  return nearestWord(name, names);
}

}  // namespace vesk

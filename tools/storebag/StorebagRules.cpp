#include "tools/storebag/StorebagRules.h"

#include <algorithm>
#include <array>
#include <span>
#include <string_view>

#include <VeskReporting/VeskReportingKeys.h>
#include "platform/net/UDPSocket.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

enum class Shape : unsigned char { Text, Number, NumberOrText, Boolean, Texts, Dictionaries, Dictionary };

struct KeyRule {
  std::string_view key;
  Shape shape;
  std::string_view withoutIt = {};  // the consequence of a missing key, if it deserves a warning
};

constexpr std::int64_t kSensibleTick = 50;  // ms, of a dashboard: its server may be 100 ms away

constexpr std::array kEnvironments{"development", "corvane_internal", "seed", "release"};

constexpr std::array kPostProfile{
    KeyRule{"clients", Shape::Dictionaries, "the backend is not built"},
    KeyRule{"display_url", Shape::Text},
};

constexpr std::string_view kReportsNothing = "sessions that require user info report nothing here";
constexpr std::array kClientEntry{
    KeyRule{"client", Shape::Text},
    KeyRule{"service", Shape::Text},
    KeyRule{"expedite", Shape::Number},
    KeyRule{"hierarchy", Shape::Number},
    KeyRule{"override_dnu", Shape::Number},
    KeyRule{"locale_whitelist", Shape::Texts, kReportsNothing},
    KeyRule{"device_whitelist", Shape::Texts},
    KeyRule{"filters", Shape::Dictionaries, kReportsNothing},
    KeyRule{"sampling_threshold", Shape::Number, kReportsNothing},
    KeyRule{"override_sampling", Shape::Number},
    KeyRule{"event_threshold", Shape::Number},
    KeyRule{"extras_on_internal", Shape::Number},
    KeyRule{"post_url", Shape::Text},
    KeyRule{"realtime_post_url", Shape::Text},
};

constexpr std::array kFilter{
    KeyRule{"method", Shape::Number},
    KeyRule{"status", Shape::Number},
    KeyRule{"key", Shape::Text, "the filter acts on nothing"},
    KeyRule{"action", Shape::Text, "the filter changes nothing"},
};

constexpr std::array kDashboardProfile{
    KeyRule{"ip", Shape::Text, "the backend is not built"},
    KeyRule{"port", Shape::NumberOrText, "the backend is not built"},
    KeyRule{"display_url", Shape::Text},
    KeyRule{"post_url", Shape::Text},
    KeyRule{"reliable", Shape::NumberOrText},
};

constexpr std::array kUploadProfile{
    KeyRule{"post_url", Shape::Text, "the backend is not built"},
    KeyRule{"display_url", Shape::Text},
};

constexpr std::array kActiveProfile{
    KeyRule{"active", Shape::Boolean},
};

struct BackendRule {
  std::string_view name;
  std::span<const KeyRule> profile;
};
constexpr std::array kBackends{
    BackendRule{kVeskReportingBackendHTTPPost, kPostProfile},
    BackendRule{kVeskReportingBackendHTTPPost2, kPostProfile},
    BackendRule{kVeskReportingBackendDashboard, kDashboardProfile},
    BackendRule{kVeskReportingBackendUploadServer, kUploadProfile},
    BackendRule{kVeskReportingBackendWren, kActiveProfile},
    BackendRule{kVeskReportingBackendKilnar, kActiveProfile},
};

std::string_view nameOf(Shape shape) {
  switch (shape) {
    case Shape::Text:
      return "a text";
    case Shape::Number:
      return "a number";
    case Shape::NumberOrText:
      return "a number or a text";
    case Shape::Boolean:
      return "true or false";
    case Shape::Texts:
      return "a list of texts";
    case Shape::Dictionaries:
      return "a list of tables";
    case Shape::Dictionary:
      return "a table";
  }
  return "";
}

template <class Test>
bool isListOf(const Value& value, Test test) {
  const List* list = value.list();
  return list != nullptr && std::all_of(list->begin(), list->end(), test);
}

bool hasShape(const Value& value, Shape shape) {
  switch (shape) {
    case Shape::Text:
      return value.text() != nullptr;
    case Shape::Number:
      return value.isNumber();
    case Shape::NumberOrText:
      return value.isNumber() || value.text() != nullptr;
    case Shape::Boolean:
      return value.boolean() != nullptr;
    case Shape::Texts:
      return isListOf(value, [](const Value& item) { return item.text() != nullptr; });
    case Shape::Dictionaries:
      return isListOf(value, [](const Value& item) { return item.dictionary() != nullptr; });
    case Shape::Dictionary:
      return value.dictionary() != nullptr;
  }
  return false;
}

const BackendRule* ruleNamed(std::string_view backend) {
  const auto* found = std::find_if(kBackends.begin(), kBackends.end(),
                                   [&](const BackendRule& rule) { return rule.name == backend; });
  return found == kBackends.end() ? nullptr : found;
}

bool isAmong(std::span<const KeyRule> rules, std::string_view key) {
  return std::any_of(rules.begin(), rules.end(), [&](const KeyRule& rule) { return rule.key == key; });
}

class Checker {
 public:
  StorebagFindings run(const Dictionary& payload) {
    checkTop(payload);
    bool anySection = false;
    for (const auto& [name, value] : payload) {
      if (!isEnvironment(name.view())) continue;
      anySection = true;
      if (require("", name.view(), value, Shape::Dictionary))
        checkSection(name.string(), *value.dictionary());
    }
    if (!anySection) warn("no environment section: no device finds anything in it");
    return std::move(_findings);
  }

 private:
  static bool isEnvironment(std::string_view name) {
    return std::find(kEnvironments.begin(), kEnvironments.end(), name) != kEnvironments.end();
  }

  static std::string join(const std::string& place, std::string_view key) {
    return place.empty() ? std::string(key) : place + "." + std::string(key);
  }

  void warn(std::string line) { _findings.warnings.push_back(std::move(line)); }

  bool require(const std::string& place, std::string_view key, const Value& value, Shape shape) {
    if (hasShape(value, shape)) return true;
    _findings.errors.push_back(join(place, key) + ": must be " + std::string(nameOf(shape)) + ", is " +
                               describe(value, 60));
    return false;
  }

  void checkTop(const Dictionary& payload) {
    static constexpr std::array kTop{KeyRule{"version", Shape::Text, "the storebag has no version"},
                                     KeyRule{"refresh_cycle", Shape::Number}};
    for (const auto& rule : kTop) checkKey("", payload, rule);
    for (const auto& [key, value] : payload) {
      if (isEnvironment(key.view()) || key == "version" || key == "refresh_cycle") continue;
      warn(key.string() +
           (value.dictionary() != nullptr ? ": no environment has this name" : ": unknown key"));
    }
  }

  void checkSection(const std::string& place, const Dictionary& section) {
    for (const auto& [name, value] : section) {
      const BackendRule* known = ruleNamed(name.view());
      if (known == nullptr) {
        warn(join(place, name.view()) + ": no backend has this name");
        continue;
      }
      if (!require(place, name.view(), value, Shape::Dictionary)) continue;
      checkKeys(join(place, name.view()), *value.dictionary(), known->profile);
    }
  }

  void checkKey(const std::string& place, const Dictionary& dictionary, const KeyRule& rule) {
    if (const Value* value = dictionary.find(rule.key)) {
      if (require(place, rule.key, *value, rule.shape)) checkInside(place, rule.key, *value);
    } else if (!rule.withoutIt.empty()) {
      warn(join(place, rule.key) + ": missing, " + std::string(rule.withoutIt));
    }
  }

  void checkKeys(const std::string& place, const Dictionary& dictionary, std::span<const KeyRule> rules) {
    for (const auto& rule : rules) checkKey(place, dictionary, rule);
    for (const auto& [key, value] : dictionary) {
      if (!isAmong(rules, key.view())) warn(join(place, key.view()) + ": unknown key");
    }
  }

  void checkInside(const std::string& place, std::string_view key, const Value& value) {
    if (key == "action" && *value.text() != "remove" && *value.text() != "sha256")
      warn(join(place, key) + ": neither \"remove\" nor \"sha256\", the filter changes nothing");
    if (key == "ip" && !IPv4Endpoint::parse(value.text()->view(), 0))
      warn(join(place, key) + ": not four decimal numbers between dots, the backend is not built");
    if (key == "reliable" && integerForm(value) < 1)
      warn(join(place, key) + ": not 1 ms or more, 500 is used");
    else if (key == "reliable" && integerForm(value) < kSensibleTick)
      warn(join(place, key) + ": ticks of " + std::to_string(integerForm(value)) +
           " ms, datagrams are sent again before a server far away can acknowledge them");
    if (key != "clients" && key != "filters") return;
    for (std::size_t i = 0; i < value.list()->size(); ++i) {
      std::string item = join(place, key) + "[" + std::to_string(i) + "]";
      const Dictionary& dictionary = *(*value.list())[i].dictionary();
      key == "clients" ? checkKeys(item, dictionary, kClientEntry) : checkKeys(item, dictionary, kFilter);
    }
  }

  StorebagFindings _findings;
};

}  // namespace

StorebagFindings checkStorebag(const Dictionary& payload) { return Checker().run(payload); }

}  // namespace vesk

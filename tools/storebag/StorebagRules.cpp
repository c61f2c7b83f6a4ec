#include <algorithm>
#include <array>
#include <span>
#include <string_view>

#include <VeskReporting/VeskReportingKeys.h>
#include "platform/net/UDPSocket.h"
#include "tools/storebag/StorebagSource.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

/// What a value must be.
struct Shape {
  std::string_view name;
  bool (*fits)(const Value& value);
};

bool isText(const Value& value) { return value.text() != nullptr; }
bool isDictionary(const Value& value) { return value.dictionary() != nullptr; }

template <bool (*fits)(const Value&)>
bool isListOf(const Value& value) {
  const List* list = value.list();
  return list != nullptr && std::all_of(list->begin(), list->end(), fits);
}

constexpr Shape kText{"a text", isText};
constexpr Shape kNumber{"a number", [](const Value& value) { return value.isNumber(); }};
constexpr Shape kNumberOrText{"a number or a text",
                              [](const Value& value) { return value.isNumber() || isText(value); }};
constexpr Shape kSerial{"an integer from 0", [](const Value& value) {
                          return value.real() == nullptr && value.boolean() == nullptr &&
                                 value.asInteger().value_or(-1) >= 0;
                        }};
constexpr Shape kDate{"a date", [](const Value& value) { return value.date() != nullptr; }};
constexpr Shape kBoolean{"true or false", [](const Value& value) { return value.boolean() != nullptr; }};
constexpr Shape kTexts{"a list of texts", isListOf<isText>};
constexpr Shape kTables{"a list of tables", isListOf<isDictionary>};
constexpr Shape kTable{"a table", isDictionary};

struct KeyRule {
  std::string_view key;
  Shape shape;
  std::string_view withoutIt = {};         // the consequence of a missing key, if it deserves a warning
  std::span<const KeyRule> contents = {};  // of a table, or of each table in a list
};

constexpr std::int64_t kSensibleTick = 50;  // ms, of a dashboard: its server may be 100 ms away

constexpr std::array kEnvironments{"development", "corvane_internal", "seed", "release"};

constexpr std::array kFilter{
    KeyRule{"method", kNumber},
    KeyRule{"status", kNumber},
    KeyRule{"key", kText, "the filter acts on nothing"},
    KeyRule{"action", kText, "the filter changes nothing"},
};

constexpr std::string_view kReportsNothing = "sessions that require user info report nothing here";
constexpr std::array kClientEntry{
    KeyRule{"client", kText},
    KeyRule{"service", kText},
    KeyRule{"expedite", kNumber},
    KeyRule{"hierarchy", kNumber},
    KeyRule{"override_dnu", kNumber},
    KeyRule{"locale_whitelist", kTexts, kReportsNothing},
    KeyRule{"device_whitelist", kTexts},
    KeyRule{"filters", kTables, kReportsNothing, kFilter},
    KeyRule{"sampling_threshold", kNumber, kReportsNothing},
    KeyRule{"override_sampling", kNumber},
    KeyRule{"event_threshold", kNumber},
    KeyRule{"extras_on_internal", kNumber},
    KeyRule{"post_url", kText},
    KeyRule{"realtime_post_url", kText},
};

constexpr std::array kPostProfile{
    KeyRule{"clients", kTables, "the backend is not built", kClientEntry},
    KeyRule{"display_url", kText},
};

constexpr std::array kDashboardProfile{
    KeyRule{"ip", kText, "the backend is not built"},
    KeyRule{"port", kNumberOrText, "the backend is not built"},
    KeyRule{"display_url", kText},
    KeyRule{"post_url", kText},
    KeyRule{"reliable", kNumberOrText},
};

constexpr std::array kUploadProfile{
    KeyRule{"post_url", kText, "the backend is not built"},
    KeyRule{"display_url", kText},
};

constexpr std::array kActiveProfile{
    KeyRule{"active", kBoolean},
};

constexpr std::array kBackends{
    KeyRule{kVeskReportingBackendHTTPPost, kTable, {}, kPostProfile},
    KeyRule{kVeskReportingBackendHTTPPost2, kTable, {}, kPostProfile},
    KeyRule{kVeskReportingBackendDashboard, kTable, {}, kDashboardProfile},
    KeyRule{kVeskReportingBackendUploadServer, kTable, {}, kUploadProfile},
    KeyRule{kVeskReportingBackendWren, kTable, {}, kActiveProfile},
    KeyRule{kVeskReportingBackendKilnar, kTable, {}, kActiveProfile},
};

constexpr std::array kTop{
    KeyRule{"version", kText, "the storebag has no version"},
    KeyRule{"refresh_cycle", kNumber},
    KeyRule{"name", kText},
    KeyRule{"serial", kSerial},
    KeyRule{"expires", kDate},
};

const KeyRule* ruleFor(std::span<const KeyRule> rules, std::string_view key) {
  const auto found = std::ranges::find(rules, key, &KeyRule::key);
  return found == rules.end() ? nullptr : &*found;
}

bool isEnvironment(std::string_view name) {
  return std::ranges::find(kEnvironments, name) != kEnvironments.end();
}

class Checker {
 public:
  StorebagFindings run(const Dictionary& payload) {
    checkPresent("", payload, kTop);
    for (const auto& [key, value] : payload) {
      if (isEnvironment(key.view()) || ruleFor(kTop, key.view()) != nullptr) continue;
      warn(key.string() +
           (value.dictionary() != nullptr ? ": no environment has this name" : ": unknown key"));
    }
    bool anySection = false;
    for (const auto& [key, value] : payload) {
      if (!isEnvironment(key.view())) continue;
      anySection = true;
      checkSection(key.string(), value);
    }
    if (!anySection) warn("no environment section: no device finds anything in it");
    return std::move(_findings);
  }

 private:
  static std::string join(const std::string& place, std::string_view key) {
    return place.empty() ? std::string(key) : place + "." + std::string(key);
  }

  void warn(std::string line) { _findings.warnings.push_back(std::move(line)); }

  bool require(const std::string& place, const Value& value, const Shape& shape) {
    if (shape.fits(value)) return true;
    _findings.errors.push_back(place + ": must be " + std::string(shape.name) + ", is " +
                               describe(value, 60));
    return false;
  }

  void checkSection(const std::string& place, const Value& section) {
    if (!require(place, section, kTable)) return;
    for (const auto& [name, value] : *section.dictionary()) {
      if (const KeyRule* rule = ruleFor(kBackends, name.view())) {
        check(join(place, name.view()), value, *rule);
      } else {
        warn(join(place, name.view()) + ": no backend has this name");
      }
    }
  }

  void checkPresent(const std::string& place, const Dictionary& dictionary, std::span<const KeyRule> rules) {
    for (const auto& rule : rules) {
      if (const Value* value = dictionary.find(rule.key)) {
        check(join(place, rule.key), *value, rule);
      } else if (!rule.withoutIt.empty()) {
        warn(join(place, rule.key) + ": missing, " + std::string(rule.withoutIt));
      }
    }
  }

  void checkTable(const std::string& place, const Dictionary& dictionary, std::span<const KeyRule> rules) {
    checkPresent(place, dictionary, rules);
    for (const auto& entry : dictionary)
      if (ruleFor(rules, entry.key.view()) == nullptr) warn(join(place, entry.key.view()) + ": unknown key");
  }

  void check(const std::string& place, const Value& value, const KeyRule& rule) {
    if (!require(place, value, rule.shape)) return;
    if (rule.key == "action" && *value.text() != "remove" && *value.text() != "sha256")
      warn(place + ": neither \"remove\" nor \"sha256\", the filter changes nothing");
    if (rule.key == "ip" && !IPv4Endpoint::parse(value.text()->view(), 0))
      warn(place + ": not four decimal numbers between dots, the backend is not built");
    if (rule.key == "reliable" && integerForm(value) < 1)
      warn(place + ": not 1 ms or more, 500 is used");
    else if (rule.key == "reliable" && integerForm(value) < kSensibleTick)
      warn(place + ": ticks of " + std::to_string(integerForm(value)) +
           " ms, datagrams are sent again before a server far away can acknowledge them");
    if (rule.contents.empty()) return;
    if (const Dictionary* table = value.dictionary()) return checkTable(place, *table, rule.contents);
    std::size_t index = 0;
    for (const Value& item : *value.list())
      checkTable(place + "[" + std::to_string(index++) + "]", *item.dictionary(), rule.contents);
  }

  StorebagFindings _findings;
};

}  // namespace

StorebagFindings checkStorebag(const Dictionary& payload) { return Checker().run(payload); }

}  // namespace vesk

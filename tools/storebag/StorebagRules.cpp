#include <algorithm>
#include <optional>
#include <string_view>

#include "platform/net/UDPSocket.h"
#include "tools/storebag/StorebagFindings.h"
#include "tools/storebag/StorebagKeys.h"
#include "util/URLQuery.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

using Kind = StorebagFinding::Kind;

constexpr std::int64_t kSensibleTick = 50;  // ms, of a dashboard: its server may be 100 ms away

std::string quoted(std::string_view word) { return "\"" + std::string(word) + "\""; }

/// Such as "neither "remove" nor "sha256"".
std::string noneOf(std::span<const std::string_view> words) {
  std::string text = words.size() == 2 ? "neither " : "none of ";
  for (std::size_t i = 0; i < words.size(); ++i)
    text += (i == 0 ? "" : words.size() == 2 ? " nor " : ", ") + quoted(words[i]);
  return text;
}

/// The port in a URL that is otherwise good; nullopt if it has none, -1 if it is no port.
std::optional<std::int64_t> portIn(std::string_view url) {
  constexpr std::int64_t kLastPort = 65535;
  std::string_view host = url.substr(url.find("//") + 2);
  host = host.substr(0, host.find_first_of("/?#"));
  if (const auto at = host.rfind('@'); at != std::string_view::npos) host.remove_prefix(at + 1);
  const auto colon = host.find(':', host.starts_with('[') ? std::min(host.find(']'), host.size()) : 0);
  if (colon == std::string_view::npos || colon + 1 == host.size()) return std::nullopt;
  const std::string_view digits = host.substr(colon + 1);
  const bool isNumber = digits.find_first_not_of("0123456789") == std::string_view::npos;
  const std::int64_t port = leadingInteger(digits);
  return isNumber && port >= 1 && port <= kLastPort ? port : -1;
}

class Checker {
 public:
  StorebagFindings run(const Dictionary& payload) {
    checkPresent("", payload, topLevelKeys());
    bool anySection = false;
    for (const auto& [key, value] : payload) {
      if (std::ranges::find(environmentNames(), key.view()) != environmentNames().end()) {
        anySection = true;
        checkSection(key.string(), value);
      } else if (keyNamed(topLevelKeys(), key.view()) == nullptr) {
        const bool isTable = value.dictionary() != nullptr;
        add(Kind::Doubtful, key.string(),
            isTable ? "no environment has this name" + nearestWord(key.view(), environmentNames())
                    : "unknown key" + nearestKey(key.view(), topLevelKeys()));
      }
    }
    if (!anySection) add(Kind::Doubtful, "", "no environment section: no device finds anything in it");
    return std::move(_findings);
  }

 private:
  static std::string join(const std::string& place, std::string_view key) {
    return place.empty() ? std::string(key) : place + "." + std::string(key);
  }

  void add(Kind kind, std::string place, std::string text) {
    _findings.push_back({kind, std::move(place), std::move(text)});
  }

  bool require(const std::string& place, const Value& value, KeyType type) {
    if (hasType(value, type)) return true;
    add(Kind::WrongType, place, "must be " + std::string(nameOf(type)) + ", is " + describe(value, 60));
    return false;
  }

  void checkSection(const std::string& place, const Value& section) {
    if (!require(place, section, KeyType::Table)) return;
    for (const auto& [name, value] : *section.dictionary()) {
      if (const StorebagKey* backend = keyNamed(backendKeys(), name.view())) {
        check(join(place, name.view()), value, *backend);
      } else {
        add(Kind::Doubtful, join(place, name.view()),
            "no backend has this name" + nearestKey(name.view(), backendKeys()));
      }
    }
  }

  void checkPresent(const std::string& place, const Dictionary& dictionary,
                    std::span<const StorebagKey> keys) {
    for (const auto& key : keys) {
      if (const Value* value = dictionary.find(key.key)) {
        check(join(place, key.key), *value, key);
      } else if (!key.withoutIt.empty()) {
        add(Kind::Doubtful, join(place, key.key), "missing, " + std::string(key.withoutIt));
      }
    }
  }

  void checkTable(const std::string& place, const Dictionary& dictionary, std::span<const StorebagKey> keys) {
    checkPresent(place, dictionary, keys);
    for (const auto& [key, value] : dictionary) {
      if (keyNamed(keys, key.view()) == nullptr)
        add(Kind::Doubtful, join(place, key.view()), "unknown key" + nearestKey(key.view(), keys));
    }
  }

  void check(const std::string& place, const Value& value, const StorebagKey& key) {
    if (!require(place, value, key.type)) return;
    checkUse(place, value, key);
    if (key.contents.empty()) return;
    if (const Dictionary* table = value.dictionary()) return checkTable(place, *table, key.contents);
    std::size_t index = 0;
    for (const Value& item : *value.list())
      checkTable(place + "[" + std::to_string(index++) + "]", *item.dictionary(), key.contents);
  }

  /// Checks a value of the right type.
  void checkUse(const std::string& place, const Value& value, const StorebagKey& key) {
    if (!key.words.empty() && std::ranges::find(key.words, value.text()->view()) == key.words.end())
      add(Kind::Doubtful, place,
          noneOf(key.words) + ", " + std::string(key.withoutIt) +
              nearestWord(value.text()->view(), key.words));
    if (key.type == KeyType::URL) checkURL(place, value.text()->view());
    if (key.type == KeyType::Address && !IPv4Endpoint::parse(value.text()->view(), 0))
      add(Kind::Impossible, place, "not four decimal numbers between dots, " + std::string(kNotBuilt));
    if (key.key == "reliable") return checkTick(place, integerForm(value));
    checkRange(place, value, key);
  }

  void checkURL(const std::string& place, std::string_view url) {
    const std::string shown = "'" + std::string(url.substr(0, 60)) + "' ";
    if (!isWebURL(url)) {
      add(Kind::Impossible, place, shown + "is not an http or https URL; begin it with https:// and a host");
    } else if (portIn(url) == -1) {
      add(Kind::Impossible, place, shown + "has a port that is not from 1 to 65535");
    }
  }

  void checkTick(const std::string& place, std::int64_t tick) {
    if (tick < 1) {
      add(Kind::Doubtful, place, "not 1 ms or more, 500 is used");
    } else if (tick < kSensibleTick) {
      add(Kind::Doubtful, place,
          "ticks of " + std::to_string(tick) +
              " ms, datagrams are sent again before a server far away can acknowledge them");
    }
  }

  void checkRange(const std::string& place, const Value& value, const StorebagKey& key) {
    const double number = value.isNumber() ? *value.asDouble() : static_cast<double>(integerForm(value));
    const std::string_view effect = number < key.least ? key.below : number > key.most ? key.above : "";
    if (effect.empty()) return;
    add(key.mustBeWithin ? Kind::Impossible : Kind::Doubtful, place,
        "is " + describe(value, 60) + ", " + std::string(effect));
  }

  StorebagFindings _findings;
};

}  // namespace

StorebagFindings checkStorebag(const Dictionary& payload) { return Checker().run(payload); }

}  // namespace vesk

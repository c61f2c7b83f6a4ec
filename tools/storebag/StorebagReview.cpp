#include "tools/storebag/StorebagReview.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "backends/https/FilterCompiler.h"
#include "backends/https/ListMatching.h"
#include "backends/https/PostExplanation.h"
#include "platform/net/UDPSocket.h"
#include "platform/time/Clock.h"
#include "platform/unicode/Unicode.h"
#include "storebag/StorebagAcceptance.h"
#include "tools/storebag/StorebagKeys.h"

namespace vesk {

namespace {

using Kind = StorebagFinding::Kind;

std::string at(const std::string& place, std::string_view list, std::size_t index) {
  return place + "." + std::string(list) + "[" + std::to_string(index) + "]";
}

/// The names that an entry's key lists; a single absent name if the entry is for every name. An absent name
/// is one that only entries without names are for, so it reaches an entry if any name does.
std::vector<std::optional<Text>> namesIn(const Dictionary& entry, std::string_view key) {
  const auto names = entry.text(key);
  if (!names) return {std::nullopt};
  std::vector<std::optional<Text>> all;
  for (const Value& name : componentsSeparatedByComma(names->view())) all.emplace_back(*name.text());
  return all;
}

/// User info for each pair of names that an entry lists.
std::vector<Dictionary> sessionsFor(const Dictionary& entry) {
  std::vector<Dictionary> sessions;
  for (const auto& client : namesIn(entry, "client")) {
    for (const auto& service : namesIn(entry, "service")) {
      MutableDictionary userInfo;
      if (client) userInfo.set(kVeskReportingUserInfoClientName, *client);
      if (service) userInfo.set(kVeskReportingUserInfoServiceName, *service);
      sessions.push_back(userInfo.share());
    }
  }
  return sessions;
}

/// The decision about a session on the device that is most likely to report: a region that no list excludes,
/// consent, and the lowest draw.
PostPolicy::Decision decideAtBest(const Dictionary& profile, const Dictionary& userInfo,
                                  std::string productFamily) {
  return PostPolicy::decide({.profile = profile,
                             .userInfo = userInfo,
                             .requireUserInfo = true,
                             .productFamily = std::move(productFamily),
                             .regionCode = std::nullopt,
                             .dnuEnabled = true,
                             .samplingFactor = 0},
                            {});
}

class Reviewer {
 public:
  StorebagFindings run(const Dictionary& payload) {
    if (const Value* expires = payload.find("expires");
        expires != nullptr && expires->date() != nullptr &&
        wallTimeAt(*expires->date()) <= WallClock::system().now())
      warn("expires", "is past, daemons refuse the storebag");
    if (std::ranges::none_of(environmentNames(), [&](auto name) { return payload.contains(name); }))
      return std::move(_findings);
    for (const auto name : environmentNames()) {
      const Value* section = payload.find(name);
      const bool usesRelease = name == "seed" && payload.contains("release");
      if (section == nullptr && !usesRelease) {
        warn(std::string(name),
             "no section, devices in this environment report nothing; an empty section says that this is "
             "meant");
      }
      if (section != nullptr && section->dictionary() != nullptr)
        reviewSection(std::string(name), *section->dictionary());
    }
    return std::move(_findings);
  }

 private:
  void warn(std::string place, std::string text) {
    _findings.push_back({Kind::Doubtful, std::move(place), std::move(text)});
  }

  void reviewSection(const std::string& place, const Dictionary& section) {
    bool reports = section.empty();
    std::string reasons;
    for (const auto& [name, profile] : section) {
      std::string reason = "the backend is not built";
      if (isBuilt(name.view(), profile) &&
          (!isPostBackend(name.view()) ||
           reviewPosts(place + "." + name.string(), *profile.dictionary(), reason))) {
        reports = true;
      } else {
        reasons += "; " + name.string() + ": " + reason;
      }
    }
    if (!reports) warn(place, "no session that requires user info reports" + reasons);
  }

  /// Returns whether a session can report at all, otherwise stores a reason against the last one.
  bool reviewPosts(const std::string& place, const Dictionary& profile, std::string& reason) {
    const List clients = profile.list("clients").value_or(List());
    bool reports = false;
    reason = "there are no client entries";
    for (std::size_t i = 0; i < clients.size(); ++i) {
      const Dictionary* entry = clients[i].dictionary();
      if (entry == nullptr || !hasReadableNames(*entry)) continue;
      const std::string own = at(place, "clients", i);
      reviewThresholds(own, *entry);
      reviewFilters(own, *entry);
      const auto userInfo = sessionReaching(own, profile, *entry, i);
      if (userInfo && reportsAnywhere(own, profile, *entry, *userInfo, reason)) reports = true;
    }
    return reports;
  }

  static bool hasReadableNames(const Dictionary& entry) {
    return std::ranges::all_of(std::initializer_list<const char*>{"client", "service"}, [&](const char* key) {
      return !entry.contains(key) || entry.text(key).has_value();
    });
  }

  /// A session that the entry decides about. If there is none, says why.
  std::optional<Dictionary> sessionReaching(const std::string& place, const Dictionary& profile,
                                            const Dictionary& entry, std::size_t index) {
    std::optional<std::size_t> earlier;
    for (const Dictionary& userInfo : sessionsFor(entry)) {
      const auto decided = decideAtBest(profile, userInfo, "").entry();
      if (decided == index) return userInfo;
      if (decided && *decided < index) earlier = decided;
    }
    warn(place, earlier ? "is never reached, clients[" + std::to_string(*earlier) +
                              "] before it is for all of its sessions; put it first or limit the other one"
                        : "is never reached, no session has such names");
    return std::nullopt;
  }

  bool reportsAnywhere(const std::string& place, const Dictionary& profile, const Dictionary& entry,
                       const Dictionary& userInfo, std::string& reason) {
    std::vector<std::string> families;
    for (const Value& family : entry.list("device_whitelist").value_or(List()))
      if (family.text() != nullptr) families.push_back(family.text()->string());
    if (families.empty()) families.emplace_back("Device");
    for (const std::string& family : families) {
      const auto decision = decideAtBest(profile, userInfo, family);
      if (decision.state == BackendStateDisabled) {
        if (const auto* step = decision.reason()) reason = reasonAgainst(*step);
        continue;
      }
      if (!decision.settings._postURL)
        warn(place + ".post_url",
             "missing, events are dropped unless the device's preferences have an httpsPostURL");
      return true;
    }
    return false;
  }

  static std::string reasonAgainst(const PostPolicy::Step& step) {
    const List* regions = step.rule == "locale_whitelist" ? step.expected.list() : nullptr;
    return regions != nullptr && regions->empty() ? "the locale_whitelist is empty" : reasonOf(step);
  }

  void reviewThresholds(const std::string& place, const Dictionary& entry) {
    const auto threshold = doubleForKey(entry, "sampling_threshold");
    const auto band = doubleForKey(entry, "override_sampling");
    if (!threshold || !band || *band >= *threshold) return;
    warn(place + ".override_sampling", "is " + describe(*entry.find("override_sampling")) +
                                           ", below the sampling_threshold " +
                                           describe(*entry.find("sampling_threshold")) +
                                           ", so no session is between them and holds messages back");
  }

  void reviewFilters(const std::string& place, const Dictionary& entry) {
    const auto filters = compileFilters(entry.list("filters").value_or(List()), place);
    for (std::size_t i = 0; i < filters.size(); ++i) {
      const auto earlier =
          std::find_if(filters.begin(), filters.begin() + static_cast<std::ptrdiff_t>(i),
                       [&](const filterTag& each) { return decidesFirst(each, filters[i]); });
      const auto index = static_cast<std::size_t>(earlier - filters.begin());
      if (index == i) continue;
      warn(at(place, "filters", i), "never applies, filters[" + std::to_string(index) + "] decides about '" +
                                        filters[i].key->string() + "' first");
    }
  }

  static bool decidesFirst(const filterTag& earlier, const filterTag& later) {
    return earlier.key && later.key && equalsIgnoringCase(earlier.key->view(), later.key->view()) &&
           (earlier.method < 0 || earlier.method == later.method) &&
           (earlier.status < 0 || earlier.status == later.status);
  }

  StorebagFindings _findings;
};

}  // namespace

StorebagFindings reviewStorebag(const Dictionary& payload) { return Reviewer().run(payload); }

bool isBuilt(std::string_view backend, const Value& profile) {
  const StorebagKey* known = keyNamed(backendKeys(), backend);
  if (known == nullptr) return false;
  const Dictionary entries = profile.dictionary() != nullptr ? *profile.dictionary() : Dictionary();
  if (profile.dictionary() == nullptr && isPostBackend(backend)) return false;
  return std::ranges::all_of(known->contents, [&](const StorebagKey& key) {
    if (key.withoutIt != kNotBuilt) return true;
    const Value* value = entries.find(key.key);
    if (value == nullptr) return false;
    // A list may hold what it should not.
    if (!(key.type == KeyType::Tables ? value->list() != nullptr : hasType(*value, key.type))) return false;
    return key.type != KeyType::Address || IPv4Endpoint::parse(value->text()->view(), 0).has_value();
  });
}

}  // namespace vesk

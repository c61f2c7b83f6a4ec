#include "tools/storebag/StorebagAudience.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <map>

#include "backends/https/ListMatching.h"
#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

// Neither is likely to be in a list.
constexpr std::string_view kOtherRegion = "ZZ";
constexpr std::string_view kOtherFamily = "\x01";

std::vector<Dictionary> entriesIn(const std::vector<Dictionary>& profiles) {
  std::vector<Dictionary> entries;
  for (const auto& profile : profiles) {
    for (const Value& entry : profile.list("clients").value_or(List()))
      if (entry.dictionary() != nullptr) entries.push_back(*entry.dictionary());
  }
  return entries;
}

/// Texts by their lower case, in which names are compared.
using Names = std::map<std::string, std::string>;

Names namesUnder(std::string_view key, const std::vector<Dictionary>& entries) {
  Names names;
  for (const auto& entry : entries) {
    const auto listed = entry.text(key);
    if (!listed) continue;
    for (const Value& name : componentsSeparatedByComma(listed->view()))
      names.emplace(lowercase(name.text()->view()), name.text()->string());
  }
  names.erase("");
  return names;
}

/// The texts of an entry's list.
List textsIn(const Dictionary& entry, std::string_view key) {
  std::vector<Value> texts;
  for (const Value& each : entry.list(key).value_or(List()))
    if (each.text() != nullptr) texts.push_back(each);
  return List(std::move(texts));
}

/// Values that every entry's list treats alike.
struct Alike {
  std::string value;  ///< one of them
  std::string names;  ///< all of them; empty for those that no list names
};

std::vector<Alike> groupsUnder(std::string_view key, std::string_view other,
                               const std::vector<Dictionary>& entries) {
  Names values;
  std::vector<List> lists;
  for (const auto& entry : entries) {
    lists.push_back(textsIn(entry, key));
    for (const Value& each : lists.back())
      values.emplace(lowercase(each.text()->view()), each.text()->string());
  }
  const auto treatmentOf = [&](std::string_view value) {
    std::string treatment;
    for (const List& list : lists) treatment += matchStringWithList(list, value, true) ? '1' : '0';
    return treatment;
  };
  std::map<std::string, Alike> groups;
  for (const auto& [folded, value] : values) {
    auto& group = groups[treatmentOf(value)];
    group.value = value;
    group.names += (group.names.empty() ? "" : ", ") + value;
  }
  std::vector<Alike> all;
  all.reserve(groups.size() + 1);
  for (auto& [treatment, group] : groups) all.push_back(std::move(group));
  all.push_back({std::string(other), ""});
  return all;
}

NamedDevice deviceFor(const Alike& region, const Alike& family, bool consents) {
  NamedDevice named;
  named.region = region.names.empty() ? "in other regions" : "in " + region.names;
  named.family = family.names.empty() ? "on other devices" : "on " + family.names;
  named.consent = consents ? "with consent" : "without consent";
  named.device.regionCode = region.value;
  named.device.productFamily = family.value;
  named.device.dnuEnabled = consents;
  return named;
}

NamedSession sessionFor(const std::string& client, const std::string& service) {
  NamedSession named;
  MutableDictionary userInfo;
  if (!client.empty()) userInfo.set(kVeskReportingUserInfoClientName, client);
  if (!service.empty()) userInfo.set(kVeskReportingUserInfoServiceName, service);
  named.name =
      (client.empty() ? "other clients" : client) + (service.empty() ? "" : " with service " + service);
  named.session.userInfo = userInfo.share();
  return named;
}

}  // namespace

std::vector<NamedSession> sessionsIn(const std::vector<Dictionary>& profiles) {
  const auto entries = entriesIn(profiles);
  Names clients = namesUnder("client", entries), services = namesUnder("service", entries);
  std::vector<NamedSession> all;
  for (const auto& [foldedService, service] : services) {
    for (const auto& [folded, client] : clients) all.push_back(sessionFor(client, service));
    all.push_back(sessionFor("", service));
  }
  for (const auto& [folded, client] : clients) all.push_back(sessionFor(client, ""));
  all.push_back(sessionFor("", ""));
  all.push_back({"sessions that do not require user info", {.requireUserInfo = false}});
  return all;
}

std::vector<NamedDevice> devicesIn(const std::vector<Dictionary>& profiles) {
  const auto entries = entriesIn(profiles);
  const auto regions = groupsUnder("locale_whitelist", kOtherRegion, entries);
  const auto families = groupsUnder("device_whitelist", kOtherFamily, entries);
  std::vector<NamedDevice> all;
  for (const bool consents : {true, false}) {
    for (const auto& region : regions) {
      for (const auto& family : families) all.push_back(deviceFor(region, family, consents));
    }
  }
  return all;
}

}  // namespace vesk

#include "tools/storebag/StorebagComparison.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <set>

#include "backends/https/PostExplanation.h"
#include "storebag/StorebagNaming.h"
#include "storebag/StorebagSection.h"
#include "tools/storebag/FieldChanges.h"
#include "tools/storebag/StorebagReview.h"

namespace vesk {

namespace {

std::string textIn(const Dictionary& from, std::string_view key) {
  const auto text = from.text(key);
  return text ? text->string() : "";
}

/// Whether at least the session with the lowest draw has events sent.
bool isReporting(const Dictionary& explanation) {
  const std::string state = textIn(explanation, "state");
  return state == "enabled" || state == "override";
}

std::string shareIn(const Dictionary& explanation) {
  const auto share = doubleForKey(explanation, "samplingShare");
  if (!share || *share >= 1) return "all sessions";
  const double percent = std::round(*share * 100'000) / 1000;
  std::string text = std::to_string(percent);
  text.erase(text.find_last_not_of('0') + 1);
  if (text.back() == '.') text.pop_back();
  return text + " % of the sessions";
}

/// Adds "… A instead of B" if two explanations differ in a text.
void compareTexts(const Dictionary& before, const Dictionary& after, std::string_view key,
                  const std::string& words, std::vector<std::string>& changes) {
  const std::string old = textIn(before, key), now = textIn(after, key);
  if (old == now) return;
  const auto shown = [](const std::string& text) { return text.empty() ? "nowhere" : text; };
  changes.push_back(words + " " + shown(now) + " instead of " + shown(old));
}

std::vector<std::string> changesBetween(const Dictionary& before, const Dictionary& after) {
  const bool was = isReporting(before), is = isReporting(after);
  if (!was && !is) return {};
  if (!is) {
    const std::string reason = textIn(after, "reason");
    return {"stops reporting, since " + (reason.empty() ? "the backend is gone" : reason)};
  }
  const bool wasHeld = textIn(before, "state") == "override", isHeld = textIn(after, "state") == "override";
  if (!was && isHeld) return {"starts to hold messages back until one overrides sampling"};
  if (!was) {
    const std::string url = textIn(after, "postURL");
    return {"starts to report for " + shareIn(after) + (url.empty() ? ", but has no URL" : ", to " + url)};
  }
  std::vector<std::string> changes;
  if (isHeld && !wasHeld) changes.emplace_back("holds messages back now until one overrides sampling");
  if (shareIn(before) != shareIn(after))
    changes.push_back("reports for " + shareIn(after) + " instead of " + shareIn(before));
  compareTexts(before, after, "postURL", "posts to", changes);
  compareTexts(before, after, "realtimePostURL", "posts realtime events to", changes);
  if (booleanForKey(before, "batchEvents") != booleanForKey(after, "batchEvents"))
    changes.emplace_back(*booleanForKey(after, "batchEvents") ? "collects batches now"
                                                              : "posts events at once now");
  for (auto& change :
       fieldChanges(before.list("filters").value_or(List()), after.list("filters").value_or(List())))
    changes.push_back(std::move(change));
  return changes;
}

/// A change with the parts of its device apart.
struct Row {
  StorebagChange change;
  std::string region;
  std::string family;
  std::string consent;
};

std::string deviceOf(const Row& row) {
  std::string device;
  for (const auto* part : {&row.region, &row.family, &row.consent})
    if (!part->empty()) device += (device.empty() ? "" : " ") + *part;
  return device.empty() ? "every device" : device;
}

/// What a row is, apart from one part of it that `field` returns.
template <class Field>
std::string withoutField(Row row, const Field& field) {
  field(row).clear();
  std::string key;
  for (const auto* part : {&row.change.environment, &row.change.backend, &row.change.clients,
                           &row.change.text, &row.region, &row.family, &row.consent})
    key += *part + "\n";
  return key;
}

/// Joins the rows that differ only in that part. Where all of `everything` are joined, `whole` takes its
/// place.
template <class Field>
void fold(std::vector<Row>& rows, const Field& field, std::size_t everything, const std::string& whole) {
  struct Joined {
    std::size_t place;
    std::size_t count = 1;
  };
  std::vector<Row> folded;
  std::map<std::string, Joined> all;
  for (Row& row : rows) {
    const auto [joined, isNew] = all.emplace(withoutField(row, field), Joined{folded.size()});
    if (isNew) {
      folded.push_back(row);
    } else {
      field(folded[joined->second.place]) += ", " + field(row);
      ++joined->second.count;
    }
    if (joined->second.count == everything) field(folded[joined->second.place]) = whole;
  }
  rows = std::move(folded);
}

std::size_t numberOf(const std::vector<NamedDevice>& devices, std::string NamedDevice::*part) {
  std::set<std::string> names;
  for (const auto& device : devices) names.insert(device.*part);
  return names.size();
}

class Comparison {
 public:
  Comparison(const Dictionary& before, const Dictionary& after, const std::vector<NamedDevice>& devices)
      : _before(before), _after(after), _devices(devices) {}

  std::vector<StorebagChange> run() && {
    for (std::int32_t type = 1; const auto name = environmentNameForType(type); ++type) {
      const auto before = sectionOf(_before, type), after = sectionOf(_after, type);
      if (before == after) continue;
      _environment = type;
      _name = *name;
      for (const auto& [backend, profile] : after)
        compare(backend.string(), before.find(backend.view()), &profile);
      for (const auto& [backend, profile] : before)
        if (!after.contains(backend.view())) compare(backend.string(), &profile, nullptr);
    }
    fold(
        _rows, [](Row& row) -> std::string& { return row.change.environment; }, 0, "");
    std::vector<StorebagChange> changes;
    for (Row& row : _rows) {
      if (!row.change.clients.empty()) row.change.devices = deviceOf(row);
      changes.push_back(std::move(row.change));
    }
    return changes;
  }

 private:
  static Dictionary sectionOf(const Dictionary& payload, std::int32_t type) {
    return storebagSectionForEnvironment(payload, type, 0).value_or(Dictionary());
  }

  void compare(const std::string& backend, const Value* before, const Value* after) {
    if (before != nullptr && after != nullptr && *before == *after) return;
    if (isPostBackend(backend)) return comparePosts(backend, before, after);
    const bool was = before != nullptr && isBuilt(backend, *before);
    const bool is = after != nullptr && isBuilt(backend, *after);
    if (was != is) add(backend, is ? "starts to report" : "stops reporting");
    if (was && is) compareProfiles(backend, *before, *after);
  }

  void compareProfiles(const std::string& backend, const Value& before, const Value& after) {
    const Dictionary none, &old = before.dictionary() != nullptr ? *before.dictionary() : none,
                           &now = after.dictionary() != nullptr ? *after.dictionary() : none;
    MutableDictionary both(now);
    for (const auto& entry : old)
      if (!now.contains(entry.key.view())) both.append(entry.key, entry.value);
    for (const auto& [key, value] : both.entries()) {
      const Value* was = old.find(key.view());
      const Value* is = now.find(key.view());
      if (was != nullptr && is != nullptr && *was == *is) continue;
      add(backend, key.string() + " is " + (is != nullptr ? describe(*is, 80) : "absent") + " instead of " +
                       (was != nullptr ? describe(*was, 80) : "absent"));
    }
  }

  void add(const std::string& backend, std::string text) {
    _rows.push_back({.change = {_name, backend, "", "", std::move(text)}});
  }

  void comparePosts(const std::string& backend, const Value* before, const Value* after) {
    const auto old = profileOf(backend, before), now = profileOf(backend, after);
    std::vector<Dictionary> profiles;
    for (const auto& profile : {old, now})
      if (profile) profiles.push_back(*profile);
    const auto sessions = sessionsIn(profiles);
    const auto devices = _devices.empty() ? devicesIn(profiles) : _devices;
    std::vector<Row> rows;
    for (const auto& session : sessions) compareFor(session, devices, {backend, old, now}, rows);
    fold(
        rows, [](Row& row) -> std::string& { return row.change.clients; }, sessions.size(), "every client");
    _rows.insert(_rows.end(), rows.begin(), rows.end());
  }

  struct Profiles {
    const std::string& backend;
    const std::optional<Dictionary>& before;
    const std::optional<Dictionary>& after;
  };

  static std::optional<Dictionary> profileOf(const std::string& backend, const Value* profile) {
    return profile != nullptr && isBuilt(backend, *profile) ? std::optional(*profile->dictionary())
                                                            : std::nullopt;
  }

  void compareFor(const NamedSession& session, const std::vector<NamedDevice>& devices,
                  const Profiles& profiles, std::vector<Row>& rows) {
    std::vector<NamedDevice> compared;
    for (const auto& device : devices)
      if (!device.isOfOneEnvironment || device.device.environmentType == _environment)
        compared.push_back(device);
    std::vector<Row> own;
    for (const auto& device : compared) {
      for (auto& change : changesBetween(explained(profiles.before, device, session),
                                         explained(profiles.after, device, session)))
        own.push_back({{_name, profiles.backend, session.name, "", std::move(change)},
                       device.region,
                       device.family,
                       device.consent});
    }
    fold(
        own, [](Row& row) -> std::string& { return row.family; }, numberOf(compared, &NamedDevice::family),
        "");
    fold(
        own, [](Row& row) -> std::string& { return row.region; },
        _devices.empty() ? numberOf(compared, &NamedDevice::region) : 0, "");
    fold(
        own, [](Row& row) -> std::string& { return row.consent; }, numberOf(compared, &NamedDevice::consent),
        "");
    rows.insert(rows.end(), own.begin(), own.end());
  }

  static Dictionary explained(const std::optional<Dictionary>& profile, const NamedDevice& device,
                              const NamedSession& session) {
    if (!profile) return {};
    return explainPosts(policyFacts(*profile, device.device, session.session), device.device.initial);
  }

  const Dictionary& _before;
  const Dictionary& _after;
  const std::vector<NamedDevice>& _devices;
  std::int32_t _environment = 0;  // being compared
  std::string _name;
  std::vector<Row> _rows;
};

}  // namespace

std::string StorebagChange::line() const {
  std::string words = environment;
  for (const std::string* part : {&backend, &clients, &devices}) words += part->empty() ? "" : ": " + *part;
  return words + ": " + this->text;
}

std::vector<StorebagChange> compareStorebags(const Dictionary& before, const Dictionary& after,
                                             const std::vector<NamedDevice>& devices) {
  return Comparison(before, after, devices).run();
}

}  // namespace vesk

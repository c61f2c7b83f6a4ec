#include "daemon/Diagnostics.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <grp.h>
#include <unistd.h>

#include <algorithm>

#include "backends/BackendFactory.h"
#include "backends/https/PostExplanation.h"
#include "storebag/Settings.h"
#include "storebag/StorebagNaming.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

constexpr char kGroup[] = "veskreporting";
constexpr char kMessageLog[] = "message-log";
constexpr double kNearlyFull = 0.8;

std::optional<gid_t> idOfGroup(const char* name) {
  group entry{};
  group* found = nullptr;
  std::vector<char> buffer(4096);
  if (::getgrnam_r(name, &entry, buffer.data(), buffer.size(), &found) != 0 || found == nullptr)
    return std::nullopt;
  return found->gr_gid;
}

double secondsBetween(std::chrono::steady_clock::time_point from, std::chrono::steady_clock::time_point to) {
  return std::chrono::duration<double>(to - from).count();
}

Value number(std::uint64_t value) { return Value(static_cast<std::int64_t>(value)); }

/// Numbers may come with any sign and width.
bool isSame(const Value& a, const Value& b) {
  const auto number = a.asInteger(), other = b.asInteger();
  return number && other ? *number == *other : a == b;
}

Dictionary problem(const std::string& text) { return Dictionary{{"problem", text}}; }

List described(const std::vector<Counters::Count>& counts) {
  std::vector<Value> all;
  all.reserve(counts.size());
  for (const auto& [backend, reason, count] : counts) {
    all.emplace_back(Dictionary{{"backend", backend},
                                {"reason", std::string(nameOfDropReason(reason))},
                                {"count", number(count)},
                                {"lost", isLoss(reason)}});
  }
  return List(std::move(all));
}

}  // namespace

Diagnostics::Diagnostics(Sources sources) : _sources(std::move(sources)), _group(idOfGroup(kGroup)) {}

Dictionary Diagnostics::status(const IPCPeer& viewer) const {
  std::vector<Value> problems;
  const auto add = [&problems](const List& more) {
    problems.insert(problems.end(), more.begin(), more.end());
  };
  if (_sources.publicKeys().empty())
    problems.emplace_back("no usable public key is installed, so no storebag is accepted");
  List found;
  const List bags = storebags(found);
  add(found);
  for (const auto& [backend, reason, count] : _sources.services.counters.snapshot()) {
    if (backend == kMessageLog) problems.emplace_back("the local message log can't be written");
  }
  const Dictionary outbox = outboxStatus(found);
  add(found);
  const auto now = std::chrono::steady_clock::now();
  MutableDictionary status(Dictionary{
      {"health", problems.empty() ? "ok" : "degraded"},
      {"reasons", List(std::move(problems))},
      {"version", VESK_VERSION},
      {"process", static_cast<std::int64_t>(::getpid())},
      {"uptime", secondsBetween(_begun, now)},
      {"environment", std::string(environmentNameForType(currentEnvironmentType()).value_or("(none)"))},
      {"sessions", sessions(viewer)},
      {"counters", described(_sources.services.counters.snapshot())},
      {"total", described(_sources.history.total())}});
  if (seesAll(viewer)) {
    status.setAll({{"settings", _sources.settings},
                   {"storebags", bags},
                   {"outbox", outbox},
                   {"lastPosts", lastPosts()}});
  }
  return status.share();
}

bool Diagnostics::seesAll(const IPCPeer& viewer) const {
  return viewer.user == 0 || viewer.user == ::geteuid() ||
         (_group && std::find(viewer.groups.begin(), viewer.groups.end(), *_group) != viewer.groups.end());
}

// By host: how long ago a server last accepted a post.
Dictionary Diagnostics::lastPosts() const {
  MutableDictionary ages;
  const auto now = std::chrono::steady_clock::now();
  for (const auto& [host, time] : _sources.services.acceptedPosts->all())
    ages.set(host, secondsBetween(time, now));
  return ages.share();
}

List Diagnostics::storebags(List& problems) const {
  std::vector<Value> all, wrong;
  const WallTime now = _sources.services.clock.now();
  for (const auto& status : _sources.agent.storebagStatus()) {
    MutableDictionary bag(Dictionary{{"name", status.name},
                                     {"state", !status.section ? "none"
                                               : status.isGood ? "current"
                                                               : "old"},
                                     {"maxAge", static_cast<std::int64_t>(status.maxAge)}});
    if (status.version) bag.set("version", *status.version);
    if (!status.origin.empty()) bag.set("origin", status.origin);
    if (!status.key.empty()) bag.set("key", status.key);
    if (status.fetched) bag.set("age", std::chrono::duration<double>(now - *status.fetched).count());
    all.emplace_back(bag.share());
    if (!status.section) {
      wrong.emplace_back("there is no storebag '" + status.name + "', so its clients report nothing");
    } else if (!status.isGood) {
      wrong.emplace_back("the last fetch of the storebag '" + status.name + "' failed");
    }
  }
  problems = List(std::move(wrong));
  return List(std::move(all));
}

List Diagnostics::sessions(const IPCPeer& viewer) const {
  std::vector<Value> all;
  const bool everything = seesAll(viewer);
  for (const auto& session : _sources.agent.sessions()) {
    // A connection that never configured its session, such as the operator's own, is of no interest.
    if (!session->sessionInfo() || (!everything && session->user() != viewer.user)) continue;
    all.emplace_back(session->diagnosis());
  }
  return List(std::move(all));
}

Dictionary Diagnostics::outboxStatus(List& problems) const {
  problems = {};
  if (!_sources.outbox) return {};
  const auto status = _sources.outbox->status();
  const auto now = std::chrono::steady_clock::now();
  std::vector<Value> hosts, wrong;
  for (const auto& [name, host] : status.hosts) {
    const double wait = std::max(0.0, secondsBetween(now, host.next));
    hosts.emplace_back(Dictionary{{"host", name}, {"posts", number(host.posts)}, {"nextAttempt", wait}});
    wrong.emplace_back(std::to_string(host.posts) + " posts wait for " + name + ", which has been away for " +
                       std::to_string(static_cast<long>(secondsBetween(host.since, now))) + " s");
  }
  const double used = static_cast<double>(status.bytes) /
                      static_cast<double>(std::max<std::uint64_t>(status.maximumBytes, 1));
  if (used >= kNearlyFull) {
    wrong.emplace_back("the outbox is " + std::to_string(static_cast<int>(used * 100)) + " % full");
  }
  if (status.isHeld) wrong.emplace_back("an operator holds the outbox");
  problems = List(std::move(wrong));
  return Dictionary{{"posts", number(status.posts)},
                    {"isHeld", status.isHeld},
                    {"bytes", number(status.bytes)},
                    {"maximumBytes", number(status.maximumBytes)},
                    {"hosts", List(std::move(hosts))}};
}

Dictionary Diagnostics::explain(const Dictionary& request) const {
  const auto type = integerForKey(request, kVeskReportingSessionInfoClientType);
  if (!type) return problem("the request has no clientType");
  const auto name = storebagNameForClientType(static_cast<std::int32_t>(*type));
  if (!name) return problem("client type " + std::to_string(*type) + " has no storebag");
  const auto known = _sources.agent.storebagStatus();
  const auto bag =
      std::find_if(known.begin(), known.end(), [&](const auto& each) { return each.name == *name; });
  if (bag == known.end())
    return problem("the storebag '" + std::string(*name) +
                   "' was not fetched yet, since no such client started");
  if (!bag->section) return problem("there is no storebag '" + std::string(*name) + "': its fetch failed");
  const Dictionary other = request.dictionary("device").value_or(Dictionary());
  const auto region = other.text("RegionCode");
  const auto consent = booleanForKey(other, "diagnosticsSubmission");
  const auto named = other.text("DeviceName");
  const auto family = named ? named : deviceName();
  if (!family)
    return problem("the device has no product family (DeviceName), so there are no HTTPS backends");

  MutableDictionary backends;
  for (const auto& [key, profile] : *bag->section) {
    if (profile.dictionary() == nullptr || !isBackendName(key.view())) continue;
    if (!isPostBackend(key.view())) {  // no policy governs it
      backends.set(key, Dictionary{{"state", std::string(nameOfState(BackendStateEnabled))}});
      continue;
    }
    const auto draw = request.find("draw");
    backends.set(
        key,
        explainPosts({.profile = *profile.dictionary(),
                      .userInfo = request.dictionary("userInfo"),
                      .requireUserInfo =
                          booleanForKey(request, kVeskReportingSessionInfoRequireUserInfo).value_or(true),
                      .productFamily = family->string(),
                      .regionCode = region ? std::optional(region->string()) : _sources.services.regionCode(),
                      .dnuEnabled = consent.value_or(_sources.services.diagnosticsSubmissionConsent()),
                      .samplingFactor = draw ? draw->asDouble().value_or(0) : 0},
                     initialPostSettings(false), explainedMessageIn(request)));
  }
  MutableDictionary answer(Dictionary{{"storebag", std::string(*name)}, {"backends", backends.share()}});
  if (bag->version) answer.set("version", *bag->version);
  return answer.share();
}

std::shared_ptr<DeliveryTap::Reader> Diagnostics::openTap(const IPCPeer& viewer,
                                                          const Dictionary& filter) const {
  MutableDictionary wanted(filter, 1);
  const DeliveryTap::Wishes wishes{.messages = booleanForKey(filter, "messages").value_or(false),
                                   .bodies = booleanForKey(filter, "bodies").value_or(false)};
  for (const char* wish : {"messages", "bodies", "wait"}) wanted.remove(wish);
  const bool everything = seesAll(viewer);
  if (!everything) wanted.set("user", static_cast<std::int64_t>(viewer.user));
  const auto matches = [wanted = wanted.share()](const Dictionary& record) {
    return std::all_of(wanted.begin(), wanted.end(), [&record](const auto& each) {
      const Value* value = record.find(each.key.view());
      return value != nullptr && isSame(*value, each.value);
    });
  };
  // Others must not take the operators' places.
  const std::size_t most = DeliveryTap::kMostReaders / (everything ? 1 : 2);
  return _sources.services.tap->open(matches, wishes, most);
}

}  // namespace vesk

#include "backends/https/PostExplanation.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>

#include "backends/VeskReportingBackend.h"
#include "backends/https/EventFilters.h"
#include "storebag/Settings.h"

namespace vesk {

namespace {

using enum PostPolicy::Verdict;

std::string_view nameOfVerdict(PostPolicy::Verdict verdict) {
  switch (verdict) {
    case Ignored:
      return "ignored";
    case Skips:
      return "skips";
    case Passes:
      return "passes";
    case Sets:
      return "sets";
    case Defaults:
      return "defaults";
    case Holds:
      return "holds";
    case Stops:
      return "stops";
  }
  return "";
}

bool isNone(const Value& value) { return value.isNone(); }

std::string shown(const Value& value) {
  if (const Text* text = value.text()) return "'" + text->string() + "'";
  if (const List* list = value.list()) {
    std::string names;
    for (const Value& each : *list) names += (names.empty() ? "" : ", ") + shown(each);
    return names.empty() ? "(none)" : names;
  }
  return describe(value);
}

Dictionary filtered(const ExplainedMessage& message, const List& list) {
  EventFilters filters;
  filters.createFiltersFromArray(list, "explain");
  // Filters may be for one category and type.
  MutableDictionary event(message.payload, 2);
  event.set("_method", static_cast<unsigned>(message.category));
  event.set("_status", static_cast<unsigned>(message.type));
  filters.filterEvent(event);
  MutableDictionary left;
  for (const auto& [key, value] : message.payload) {
    if (const Value* now = event.find(key.view())) left.set(key, *now);
  }
  return left.share();
}

Dictionary described(const PostPolicy::Step& step) {
  MutableDictionary all(
      Dictionary{{"rule", std::string(step.rule)}, {"verdict", std::string(nameOfVerdict(step.verdict))}});
  if (step.entry) all.set("entry", static_cast<std::int64_t>(*step.entry));
  if (!isNone(step.value)) all.set("value", step.value);
  if (!isNone(step.expected)) all.set("expected", step.expected);
  return all.share();
}

}  // namespace

bool isPostBackend(std::string_view name) {
  return name == kVeskReportingBackendHTTPPost || name == kVeskReportingBackendHTTPPost2;
}

std::string reasonOf(const PostPolicy::Step& step) {
  const std::string value = shown(step.value), expected = shown(step.expected);
  if (step.rule == "userInfo") return "the session has not sent its user info";
  if (step.rule == "clients") {
    return (isNone(step.value) ? "a client without a name" : "client " + value) + " is in no entry";
  }
  if (step.rule == "override_dnu") return "the user did not agree to the submission of diagnostics";
  if (step.rule == "locale_whitelist") {
    return isNone(step.expected) ? "the entry has no locale_whitelist"
                                 : "the region " + value + " is not among " + expected;
  }
  if (step.rule == "device_whitelist") return "the device " + value + " is not among " + expected;
  if (step.rule == "filters") return "the entry has no filters";
  if (step.rule == "sampling_threshold") {
    return isNone(step.expected) ? "the entry has no sampling_threshold"
                                 : "the draw " + value + " is above the sampling_threshold " + expected;
  }
  if (step.verdict == Holds)
    return "the draw " + value + " is in the band where only messages that override sampling are sent";
  return "the draw " + value + " is above the sampling_threshold and override_sampling " + expected;
}

std::optional<ExplainedMessage> explainedMessageIn(const Dictionary& request) {
  const auto payload = request.dictionary("payload");
  if (!payload) return std::nullopt;
  const auto number = [&](const char* key) {
    return static_cast<std::uint16_t>(integerForKey(request, key).value_or(0));
  };
  return ExplainedMessage{*payload, number("category"), number("type")};
}

Dictionary explainPosts(const PostPolicy::Facts& facts, const PostPolicy::Settings& initial,
                        const std::optional<ExplainedMessage>& message) {
  const auto decision = PostPolicy::decide(facts, initial);
  MutableDictionary all(Dictionary{{"state", std::string(nameOfState(decision.state))},
                                   {"batchEvents", decision.settings._batchEvents}});
  const auto* reason = decision.state == BackendStateEnabled ? nullptr : decision.reason();
  if (reason != nullptr) all.set("reason", reasonOf(*reason));
  if (decision.settings._postURL) all.set("postURL", *decision.settings._postURL);
  if (decision.settings._realtimePostURL) all.set("realtimePostURL", *decision.settings._realtimePostURL);
  if (decision.filters) all.set("filters", *decision.filters);
  if (decision.filters && message) all.set("payload", filtered(*message, *decision.filters));
  if (decision.samplingThreshold) {
    all.set("samplingShare", std::clamp(decision.samplingThreshold->asDouble().value_or(0), 0.0, 1.0));
  }
  std::vector<Value> steps;
  for (const auto& step : decision.steps) steps.emplace_back(described(step));
  all.set("steps", List(std::move(steps)));
  return all.share();
}

PostPolicy::Settings initialPostSettings(bool batchEvents) {
  PostPolicy::Settings settings{._postURL = preferenceStringForKey("httpsPostURL"),
                                ._realtimePostURL = preferenceStringForKey("httpsRealtimePostURL"),
                                ._batchEvents = batchEvents};
  settings._useDefaultPostURL = settings._postURL.has_value();
  settings._useDefaultRealtimePostURL = settings._realtimePostURL.has_value();
  return settings;
}

}  // namespace vesk

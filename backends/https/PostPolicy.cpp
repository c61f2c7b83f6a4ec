#include "backends/https/PostPolicy.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <limits>

#include "backends/VeskReportingBackend.h"
#include "backends/https/ListMatching.h"

namespace vesk {

namespace {

using enum PostPolicy::Verdict;

template <class T>
Value valueOrNone(const std::optional<T>& value) {
  return value ? Value(*value) : Value();
}

std::int32_t clamped(std::int64_t number) {
  using Limits = std::numeric_limits<std::int32_t>;
  return static_cast<std::int32_t>(std::clamp<std::int64_t>(number, Limits::min(), Limits::max()));
}

bool isNumber(const Value& value) { return value.isNumber(); }
bool isText(const Value& value) { return value.text() != nullptr; }
bool isList(const Value& value) { return value.list() != nullptr; }
bool isDictionary(const Value& value) { return value.dictionary() != nullptr; }

/// One decision in progress.
class Evaluation {
 public:
  Evaluation(const PostPolicy::Facts& facts, const PostPolicy::Settings& previous) : _facts(facts) {
    _decision.settings = previous;
    if (!facts.userInfo) return;
    _clientName = facts.userInfo->text(kVeskReportingUserInfoClientName);
    _serviceName = facts.userInfo->text(kVeskReportingUserInfoServiceName);
  }

  PostPolicy::Decision decide() && {
    _decision.state = state();
    return std::move(_decision);
  }

 private:
  std::int32_t state() {
    _dictionary = _facts.profile;
    const Value* clients = read("clients", isList);
    if (!clients) return stop("clients");
    for (const Value& element : *clients->list()) {
      if (!isDictionary(element)) note("clients", Ignored, {}, element);
    }
    const bool hasMatch = goToMatchIn(*clients->list());
    if (hasMatch) updateExpedite();
    if (!_facts.requireUserInfo) return stateWithoutUserInfo(*clients->list());
    if (!_facts.userInfo) {
      note("userInfo", Holds);
      return BackendStatePending;
    }
    return hasMatch ? stateForEntry() : stop("clients", valueOrNone(_clientName));
  }

  bool goTo(const List& clients, std::size_t index) {
    const Dictionary* entry = clients[index].dictionary();
    if (!entry) return false;
    _entry = index;
    _dictionary = *entry;
    return true;
  }

  bool goToMatchIn(const List& clients) {
    for (std::size_t i = 0; i < clients.size(); ++i) {
      if (goTo(clients, i) && matchClientNameAndServiceID()) return true;
    }
    _entry.reset();
    return false;
  }

  bool matchClientNameAndServiceID() {
    return matchesName("client", _clientName, matchExactStringWithList) &&
           matchesName("service", _serviceName, matchStringWithList);
  }

  bool matchesName(std::string_view key, const std::optional<Text>& name,
                   decltype(matchStringWithList) matches) {
    const Value* wanted = read(key, isText);
    NameList names;
    if (wanted) names = componentsSeparatedByComma(wanted->text()->view());
    // A restriction of the wrong type must not let every client pass.
    const bool isUnreadable = !wanted && _dictionary.contains(key);
    const auto view = name ? std::optional(name->view()) : std::nullopt;
    const bool does = !isUnreadable && matches(names, view, true);
    note(key, does ? Passes : Skips, valueOrNone(name), wanted ? *wanted : Value());
    return does;
  }

  std::int32_t stateWithoutUserInfo(const List& clients) {
    for (std::size_t i = 0; i < clients.size(); ++i) {
      if (!goTo(clients, i) || !updatePostLink()) continue;
      updateExtrasOnInternal();
      break;
    }
    return BackendStateEnabled;
  }

  std::int32_t stateForEntry() {
    _decision.settings._hierarchy = clamped(integer("hierarchy").value_or(0));
    if (!consentAllows() || !regionAllows() || !deviceAllows()) return BackendStateDisabled;
    const Value* filters = read("filters", isList);
    if (!filters) return stop("filters");
    note("filters", Passes, {}, *filters);
    _decision.filters = *filters->list();

    const std::int32_t state = stateForSampling();
    updateEventThreshold();
    updateExtrasOnInternal();
    note("state", Sets, state, valueOrNone(_clientName));
    updatePostLink();
    return state;
  }

  void updateExpedite() {
    const auto expedite = integer("expedite");
    if (!expedite) return;
    _decision.settings._batchEvents = *expedite == 0;
    note("expedite", Sets, *expedite == 0, *expedite);
  }

  bool consentAllows() {
    const auto override = integer("override_dnu");
    const bool overrides = override == 1;
    _decision.settings._dnuType = !overrides ? 0 : _facts.dnuEnabled ? 2 : 1;
    return pass("override_dnu", overrides || _facts.dnuEnabled, _facts.dnuEnabled, valueOrNone(override));
  }

  bool regionAllows() {
    const NameList regions = textList("locale_whitelist");
    return pass("locale_whitelist", matchStringWithList(regions, _facts.regionCode, false),
                valueOrNone(_facts.regionCode), valueOrNone(regions));
  }

  bool deviceAllows() {
    constexpr std::string_view kKey = "device_whitelist";
    NameList devices = textList(kKey);
    // A list without readable names must not let every device pass.
    const Value* said = _dictionary.find(kKey);
    const bool namesNone = !devices || devices->empty();
    if (said && namesNone && !(said->list() && said->list()->empty())) devices = List{""};
    return pass(kKey, matchStringWithList(devices, _facts.productFamily, true), _facts.productFamily,
                valueOrNone(devices));
  }

  std::int32_t stateForSampling() {
    const double draw = _facts.samplingFactor;
    const Value* threshold = read("sampling_threshold", isNumber);
    if (!threshold) return stop("sampling_threshold", draw);
    _decision.samplingThreshold = *threshold;
    if (pass("sampling_threshold", draw <= *threshold->asDouble(), draw, *threshold))
      return BackendStateEnabled;

    const Value* band = read("override_sampling", isNumber);
    _decision.settings._overrideSampling = band ? std::optional(*band) : std::nullopt;
    const bool isInside = band ? draw <= *band->asDouble() : !_dictionary.contains("override_sampling");
    if (!isInside) return stop("override_sampling", draw, band ? *band : Value());
    note("override_sampling", Holds, draw, band ? *band : Value());
    return BackendStateOverride;
  }

  void updateEventThreshold() {
    const auto threshold = integer("event_threshold");
    auto& current = _decision.settings._eventThreshold;
    current = threshold ? clamped(*threshold) : PostPolicy::Settings()._eventThreshold;
    note("event_threshold", threshold ? Sets : Defaults, current);
  }

  void updateExtrasOnInternal() {
    const auto extras = integer("extras_on_internal");
    if (!extras) return;
    _decision.settings._extrasOnInternal = clamped(*extras);
    note("extras_on_internal", Sets, clamped(*extras));
  }

  bool updatePostLink() {
    PostPolicy::Settings& settings = _decision.settings;
    bool suppliesPostURL = false;
    if (!(settings._useDefaultPostURL && settings._postURL)) {
      settings._useDefaultPostURL = false;
      if (const Value* url = read("post_url", isText)) {
        settings._postURL = url->text()->string();
        note("post_url", Sets, *url);
        suppliesPostURL = true;
      }
    }
    if (!(settings._useDefaultRealtimePostURL && settings._realtimePostURL)) {
      settings._useDefaultRealtimePostURL = false;
      const Value* url = read("realtime_post_url", isText);
      settings._realtimePostURL = url ? url->text()->string() : settings._postURL;
      note("realtime_post_url", url ? Sets : Defaults, valueOrNone(settings._realtimePostURL));
    }
    return suppliesPostURL;
  }

  // --- Reading the entry; a value of the wrong type counts as absent

  const Value* read(std::string_view key, bool (*accepts)(const Value&)) {
    const Value* value = _dictionary.find(key);
    if (!value || accepts(*value)) return value;
    note(key, Ignored, {}, *value);
    return nullptr;
  }

  std::optional<std::int64_t> integer(std::string_view key) {
    const Value* number = read(key, isNumber);
    return number ? number->asInteger() : std::nullopt;
  }

  NameList textList(std::string_view key) {
    const Value* list = read(key, isList);
    if (!list) return std::nullopt;
    std::vector<Value> texts;
    const Value* wrong = nullptr;
    for (const Value& element : *list->list()) {
      if (isText(element)) {
        texts.push_back(element);
      } else if (!wrong) {
        wrong = &element;
      }
    }
    if (wrong) note(key, Ignored, {}, *wrong);
    return List(std::move(texts));
  }

  // --- Noting what was decided

  void note(std::string_view rule, PostPolicy::Verdict verdict, Value value = {}, Value expected = {}) {
    _decision.steps.push_back({rule, _entry, verdict, std::move(value), std::move(expected)});
  }

  bool pass(std::string_view rule, bool passes, Value value, Value expected) {
    note(rule, passes ? Passes : Stops, std::move(value), std::move(expected));
    return passes;
  }

  std::int32_t stop(std::string_view rule, Value value = {}, Value expected = {}) {
    note(rule, Stops, std::move(value), std::move(expected));
    return BackendStateDisabled;
  }

  const PostPolicy::Facts& _facts;
  std::optional<Text> _clientName;
  std::optional<Text> _serviceName;
  PostPolicy::Decision _decision;
  Dictionary _dictionary;  // being read: the profile, then each client entry in turn
  std::optional<std::size_t> _entry;
};

}  // namespace

PostPolicy::Decision PostPolicy::decide(const Facts& facts, const Settings& previous) {
  return Evaluation(facts, previous).decide();
}

const PostPolicy::Step* PostPolicy::Decision::reason() const {
  const auto step = std::find_if(steps.begin(), steps.end(), [](const Step& each) {
    return each.verdict == Holds || each.verdict == Stops;
  });
  return step == steps.end() ? nullptr : &*step;
}

std::optional<std::size_t> PostPolicy::Decision::entry() const {
  // The service is looked at last, and only if the client passes.
  const auto step = std::find_if(steps.begin(), steps.end(), [](const Step& each) {
    return each.rule == "service" && each.verdict == Passes;
  });
  return step == steps.end() ? std::nullopt : step->entry;
}

}  // namespace vesk

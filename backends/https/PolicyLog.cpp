#include "backends/https/PolicyLog.h"

#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"
#include "storebag/StorebagProfile.h"

namespace vesk {

namespace {

constexpr std::size_t kMaxNameInLog = 256;

int number(const Value& value) { return static_cast<int>(value.asInteger().value_or(0)); }

std::string textOrNone(const Value& value) { return value.text() ? value.text()->string() : "(none)"; }

std::string printed(const Value& list) {
  std::string text;
  if (!list.list()) return "()";
  for (const Value& element : *list.list()) text += (text.empty() ? "" : ", ") + element.text()->string();
  return "(" + text + ")";
}

}  // namespace

void logPolicyStep(const PostPolicy::Step& step, const std::string& backendName, double samplingFactor) {
  using enum PostPolicy::Verdict;
  const auto is = [&step](std::string_view rule, PostPolicy::Verdict verdict) {
    return step.rule == rule && step.verdict == verdict;
  };
  if (step.verdict == Ignored) {
    reportWrongType(backendName, step.rule, step.expected);
  } else if (is("expedite", Sets)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=%d",
                   number(step.value));
  } else if (is("override_dnu", Stops)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): reporting disabled by DNU: %d.",
                   number(step.expected));
  } else if (is("locale_whitelist", Stops)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): (%s) isn't in locale list %s",
                   textOrNone(step.value).c_str(), printed(step.expected).c_str());
  } else if (is("device_whitelist", Stops)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): (%s) isn't in device list %s",
                   textOrNone(step.value).c_str(), printed(step.expected).c_str());
  } else if (is("filters", Stops)) {
    VESK_LOG_WARNING("HTTPSPostBackend(updateBackendState): filters are required.");
  } else if (is("event_threshold", Sets)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): event_threshold set to %d", number(step.value));
  } else if (is("event_threshold", Defaults)) {
    VESK_LOG_DEBUG(
        "HTTPSPostBackend(updateBackendState): event_threshold value not found in storebag - defaulting to "
        "%d",
        number(step.value));
  } else if (is("extras_on_internal", Sets)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): extras on internal is set to %d",
                   number(step.value));
  } else if (is("state", Sets)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): %s: client found %s, state? %d, %f",
                   backendName.c_str(),
                   cutToWholeCharacters(textOrNone(step.expected), kMaxNameInLog).c_str(), number(step.value),
                   samplingFactor);
  } else if (is("post_url", Sets)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): Storebag '%s' for postURL",
                   textOrNone(step.value).c_str());
  } else if (is("realtime_post_url", Sets)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): Storebag '%s' for realtimePostURL",
                   textOrNone(step.value).c_str());
  } else if (is("realtime_post_url", Defaults)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): realtimePostURL defaults to postURL '%s'",
                   textOrNone(step.value).c_str());
  }
}

}  // namespace vesk

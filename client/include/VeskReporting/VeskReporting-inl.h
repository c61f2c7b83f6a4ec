// The functions of VeskReporting.h.
#pragma once

#include <VeskReporting/values/ValueViews.h>

#include <exception>
#include <type_traits>
#include <utility>

#include "VeskReporting.h"

namespace vesk {

namespace detail {

static_assert(static_cast<int>(ReportingStatus::TooManyConnections) == VESK_TOO_MANY_CONNECTIONS);

template <class Answer>
ReportingResult<Answer> resultOf(const vesk_result* result) {
  ReportingResult<Answer> copy{
      static_cast<ReportingStatus>(vesk_result_status(result)), {}, vesk_result_detail(result)};
  if constexpr (std::is_same_v<Answer, bool>) {
    copy.answer = vesk_result_accepted(result) != 0;
  } else if constexpr (std::is_same_v<Answer, BackendNamesAnswer>) {
    if (vesk_result_accepted(result) == 0) return copy;
    copy.answer.emplace();
    for (std::size_t i = 0; i < vesk_result_backend_count(result); ++i) {
      copy.answer->emplace_back(vesk_result_backend(result, i));
    }
  } else if constexpr (!std::is_same_v<Answer, std::monostate>) {
    if (const char* text = vesk_result_text(result)) copy.answer = text;
  }
  return copy;
}

/// Owns the callback of a call. The library calls `deliver` exactly once if the call returned Queued.
template <class Answer>
void deliver(void* context, const vesk_result* result) {
  const std::unique_ptr<ReportingCallback<Answer>> callback(static_cast<ReportingCallback<Answer>*>(context));
  ReportingResult<Answer> copy;
  try {
    copy = resultOf<Answer>(result);
  } catch (const std::exception&) {
    // Still calls the callback, but without the text and the answer.
    copy = {ReportingStatus::OutOfResources, {}, {}};
  }
  (*callback)(std::move(copy));
}

/// Makes a one-way call: `call` receives no completion. Catches its exceptions.
template <class Call>
ReportingStatus post(const Call& call) noexcept {
  try {
    return static_cast<ReportingStatus>(call(static_cast<const vesk_completion*>(nullptr)));
  } catch (const std::exception&) {
    return ReportingStatus::OutOfResources;
  }
}

template <class Answer, class Call>
ReportingStatus ask(ReportingCallback<Answer>& callback, std::chrono::milliseconds timeout,
                    const Call& call) noexcept {
  if (!callback) return post(call);
  try {
    auto kept = std::make_unique<ReportingCallback<Answer>>(std::move(callback));
    const vesk_completion completion{deliver<Answer>, kept.get(), timeout.count()};
    const vesk_status status = call(&completion);
    if (status == VESK_QUEUED) static_cast<void>(kept.release());
    return static_cast<ReportingStatus>(status);
  } catch (const std::exception&) {
    return ReportingStatus::OutOfResources;
  }
}

/// `call` receives the address for its result.
template <class Answer, class Call>
ReportingResult<Answer> wait(const Call& call) noexcept {
  try {
    vesk_result* made = nullptr;
    const vesk_status status = call(&made);
    const std::unique_ptr<vesk_result, void (*)(vesk_result*)> result(made, vesk_result_free);
    if (!result) return {static_cast<ReportingStatus>(status), {}, {}};
    return resultOf<Answer>(result.get());
  } catch (const std::exception&) {
    return {ReportingStatus::OutOfResources, {}, {}};
  }
}

/// The views of a dictionary that may be absent.
class OptionalView {
 public:
  explicit OptionalView(const std::optional<Dictionary>& dictionary) {
    if (dictionary) _views.emplace(*dictionary);
  }
  const VeskDictionaryView* get() const noexcept { return _views ? &_views->dictionary() : nullptr; }

 private:
  std::optional<ValueViews> _views;
};

inline std::optional<Dictionary> optionalCopyOf(const VeskDictionaryView* view) {
  return view ? copyOf(*view) : std::nullopt;
}

inline vesk_options optionsOf(const ReportingOptions& options) noexcept {
  vesk_options copy;
  vesk_options_init(&copy, sizeof copy);
  if (!options.socketPath.empty()) copy.socket_path = options.socketPath.c_str();
  copy.maximum_queued_messages = options.maximumQueuedMessages;
  copy.maximum_queued_bytes = options.maximumQueuedBytes;
  copy.drain_ms = options.drainTime.count();
  copy.first_reconnect_ms = options.firstReconnectWait.count();
  copy.last_reconnect_ms = options.lastReconnectWait.count();
  copy.refresh_ms = options.refreshInterval.count();
  return copy;
}

inline void handleAggregated(void* context, const vesk_aggregated* message) {
  AggregatedMessage copy;
  copy.sessionInfo = optionalCopyOf(message->session_info);
  copy.timestamp = message->timestamp;
  copy.category = message->category;
  copy.type = message->type;
  copy.payload = optionalCopyOf(message->payload);
  (*static_cast<const AggregationHandler*>(context))(copy);
}

inline void releaseHandler(void* context) { delete static_cast<const AggregationHandler*>(context); }

/// Calls a function that fills a buffer and returns the length that it wanted.
template <class Fill>
std::string filled(const Fill& fill) {
  std::string text;
  for (std::size_t size = fill(text.data(), 0); size != text.size(); size = fill(text.data(), size)) {
    text.resize(size);
  }
  return text;
}

}  // namespace detail

inline VeskReporting::VeskReporting(const ReportingOptions& options) noexcept
    : _session([&] {
        const vesk_options copy = detail::optionsOf(options);
        return vesk_session_new(&copy);
      }()) {}

inline ReportingResult<std::monostate> VeskReporting::connect(std::chrono::milliseconds timeout) noexcept {
  return detail::wait<std::monostate>([&](vesk_result** result) {
    return vesk_session_connect_wait(_session.get(), timeout.count(), result);
  });
}

inline bool VeskReporting::isConnected() const noexcept {
  return vesk_session_is_connected(_session.get()) != 0;
}

inline ReportingDrops VeskReporting::drops() const noexcept {
  return {vesk_session_drops(_session.get(), VESK_DROPPED_QUEUE_FULL),
          vesk_session_drops(_session.get(), VESK_DROPPED_INVALID),
          vesk_session_drops(_session.get(), VESK_DROPPED_UNSENT)};
}

inline ReportingStatus VeskReporting::setSessionInfo(Dictionary sessionInfo,
                                                     std::optional<Dictionary> userInfo,
                                                     std::vector<std::string> frameworksToCheck,
                                                     AggregationHandler aggregationHandler) noexcept {
  return detail::post([&](const vesk_completion*) {
    std::vector<const char*> frameworks;
    frameworks.reserve(frameworksToCheck.size());
    for (const auto& framework : frameworksToCheck) frameworks.push_back(framework.c_str());
    const ValueViews info(sessionInfo);
    const detail::OptionalView user(userInfo);
    vesk_aggregation aggregation{};
    if (aggregationHandler) {
      aggregation = {detail::handleAggregated, detail::releaseHandler,
                     std::make_unique<AggregationHandler>(std::move(aggregationHandler)).release()};
    }
    return vesk_session_configure(_session.get(), &info.dictionary(), user.get(), frameworks.data(),
                                  frameworks.size(), &aggregation);
  });
}

inline ReportingStatus VeskReporting::setSessionInfo(const ReportingSession& session) noexcept {
  vesk_identity identity{};
  identity.size = sizeof identity;
  identity.client_type = session.clientType;
  identity.client_name = session.clientName.c_str();
  identity.service_name = session.serviceName.c_str();
  identity.session_id = session.sessionID;
  identity.client_version = session.clientVersion;
  identity.batch_events = session.batchEvents ? 1 : 0;
  identity.no_user_info = session.requireUserInfo ? 0 : 1;
  return static_cast<ReportingStatus>(vesk_session_identify(_session.get(), &identity));
}

inline ReportingResult<BackendNamesAnswer> VeskReporting::startConfig(
    std::chrono::milliseconds timeout) noexcept {
  return detail::wait<BackendNamesAnswer>(
      [&](vesk_result** result) { return vesk_session_start_wait(_session.get(), timeout.count(), result); });
}

inline ReportingStatus VeskReporting::startConfig(ReportingCallback<BackendNamesAnswer> callback,
                                                  std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    return vesk_session_start(_session.get(), completion);
  });
}

inline ReportingResult<BackendNamesAnswer> VeskReporting::fetchStates(
    std::optional<Dictionary> userInfo, std::chrono::milliseconds timeout) noexcept {
  return detail::wait<BackendNamesAnswer>([&](vesk_result** result) {
    const detail::OptionalView user(userInfo);
    return vesk_session_fetch_states_wait(_session.get(), user.get(), timeout.count(), result);
  });
}

inline ReportingStatus VeskReporting::fetchStates(std::optional<Dictionary> userInfo,
                                                  ReportingCallback<BackendNamesAnswer> callback,
                                                  std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    const detail::OptionalView user(userInfo);
    return vesk_session_fetch_states(_session.get(), user.get(), completion);
  });
}

inline ReportingResult<std::string> VeskReporting::fetchDisplayURL(
    std::chrono::milliseconds timeout) noexcept {
  return detail::wait<std::string>([&](vesk_result** result) {
    return vesk_session_fetch_display_url_wait(_session.get(), timeout.count(), result);
  });
}

inline ReportingStatus VeskReporting::fetchDisplayURL(ReportingCallback<std::string> callback,
                                                      std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    return vesk_session_fetch_display_url(_session.get(), completion);
  });
}

inline ReportingStatus VeskReporting::sendMessage(std::uint16_t category, std::uint16_t type,
                                                  std::optional<Dictionary> payload) noexcept {
  return sendMessage(category, type, std::move(payload), nullptr);
}

inline ReportingStatus VeskReporting::sendMessage(std::uint16_t category, std::uint16_t type,
                                                  std::optional<Dictionary> payload,
                                                  ReportingCallback<MessageAnswer> callback,
                                                  std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    const detail::OptionalView view(payload);
    return vesk_session_send(_session.get(), category, type, view.get(), completion);
  });
}

inline ReportingResult<MessageAnswer> VeskReporting::sendMessageAndWait(
    std::uint16_t category, std::uint16_t type, std::optional<Dictionary> payload,
    std::chrono::milliseconds timeout) noexcept {
  return detail::wait<MessageAnswer>([&](vesk_result** result) {
    const detail::OptionalView view(payload);
    return vesk_session_send_wait(_session.get(), category, type, view.get(), timeout.count(), result);
  });
}

inline ReportingStatus VeskReporting::sendMessage(Dictionary parameters) noexcept {
  return sendMessage(std::move(parameters), nullptr);
}

inline ReportingStatus VeskReporting::sendMessage(Dictionary parameters,
                                                  ReportingCallback<MessageAnswer> callback,
                                                  std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    const ValueViews views(parameters);
    return vesk_session_send_parameters(_session.get(), &views.dictionary(), completion);
  });
}

inline ReportingResult<MessageAnswer> VeskReporting::sendMessageAndWait(
    Dictionary parameters, std::chrono::milliseconds timeout) noexcept {
  return detail::wait<MessageAnswer>([&](vesk_result** result) {
    const ValueViews views(parameters);
    return vesk_session_send_parameters_wait(_session.get(), &views.dictionary(), timeout.count(), result);
  });
}

inline ReportingStatus VeskReporting::flushMessages() noexcept { return flushMessages(nullptr); }

inline ReportingStatus VeskReporting::flushMessages(ReportingCallback<MessageAnswer> callback,
                                                    std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    return vesk_session_flush(_session.get(), completion);
  });
}

inline ReportingResult<MessageAnswer> VeskReporting::flushMessagesAndWait(
    std::chrono::milliseconds timeout) noexcept {
  return detail::wait<MessageAnswer>(
      [&](vesk_result** result) { return vesk_session_flush_wait(_session.get(), timeout.count(), result); });
}

inline ReportingResult<bool> VeskReporting::uploadFile(const std::string& path,
                                                       std::chrono::milliseconds timeout) noexcept {
  return detail::wait<bool>([&](vesk_result** result) {
    return vesk_session_upload_file_wait(_session.get(), path.c_str(), timeout.count(), result);
  });
}

inline ReportingStatus VeskReporting::uploadFile(const std::string& path, ReportingCallback<bool> callback,
                                                 std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    return vesk_session_upload_file(_session.get(), path.c_str(), completion);
  });
}

inline ReportingResult<bool> VeskReporting::uploadLogData(List logData,
                                                          std::chrono::milliseconds timeout) noexcept {
  return detail::wait<bool>([&](vesk_result** result) {
    const ValueViews views(logData);
    return vesk_session_upload_log_data_wait(_session.get(), &views.list(), timeout.count(), result);
  });
}

inline ReportingStatus VeskReporting::uploadLogData(List logData, ReportingCallback<bool> callback,
                                                    std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    const ValueViews views(logData);
    return vesk_session_upload_log_data(_session.get(), &views.list(), completion);
  });
}

inline ReportingStatus VeskReporting::sendMessageOnce(Dictionary sessionInfo,
                                                      std::optional<Dictionary> userInfo,
                                                      std::uint16_t category, std::uint16_t type,
                                                      std::optional<Dictionary> payload) noexcept {
  return sendMessageOnce(std::move(sessionInfo), std::move(userInfo), category, type, std::move(payload),
                         nullptr);
}

inline ReportingStatus VeskReporting::sendMessageOnce(Dictionary sessionInfo,
                                                      std::optional<Dictionary> userInfo,
                                                      std::uint16_t category, std::uint16_t type,
                                                      std::optional<Dictionary> payload,
                                                      ReportingCallback<std::string> callback,
                                                      std::chrono::milliseconds timeout) noexcept {
  return detail::ask(callback, timeout, [&](const vesk_completion* completion) {
    const ValueViews info(sessionInfo);
    const detail::OptionalView user(userInfo), view(payload);
    return vesk_session_send_once(_session.get(), &info.dictionary(), user.get(), category, type, view.get(),
                                  completion);
  });
}

inline ReportingResult<std::string> VeskReporting::sendMessageOnceAndWait(
    Dictionary sessionInfo, std::optional<Dictionary> userInfo, std::uint16_t category, std::uint16_t type,
    std::optional<Dictionary> payload, std::chrono::milliseconds timeout) noexcept {
  return detail::wait<std::string>([&](vesk_result** result) {
    const ValueViews info(sessionInfo);
    const detail::OptionalView user(userInfo), view(payload);
    return vesk_session_send_once_wait(_session.get(), &info.dictionary(), user.get(), category, type,
                                       view.get(), timeout.count(), result);
  });
}

inline std::string VeskReporting::getPersistentIdentifierForDNU(bool respectsConsent) noexcept {
  return detail::filled([&](char* buffer, std::size_t size) {
    return vesk_persistent_identifier(respectsConsent ? 1 : 0, buffer, size);
  });
}

inline std::string VeskReporting::version() noexcept { return detail::filled(vesk_version); }

inline std::optional<std::string> VeskReporting::publicKey() noexcept {
  std::string key = detail::filled(vesk_public_key);
  return key.empty() ? std::nullopt : std::optional(std::move(key));
}

}  // namespace vesk

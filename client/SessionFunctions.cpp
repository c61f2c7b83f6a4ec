// The sessions of the C API.
#include <VeskReporting/VeskReportingKeys.h>
#include <VeskReporting/values/ValueViews.h>
#include <VeskReporting/veskreporting.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <exception>
#include <new>
#include <optional>
#include <utility>

#include "client/CallBuilding.h"
#include "client/ClientSession.h"
#include "platform/log/SystemLog.h"

using namespace vesk;

struct vesk_session {
  explicit vesk_session(const ReportingOptions& options) : session(options) {}
  ClientSession session;
};

namespace {

// Descriptors are scarcer than memory: with the default limit, 16 may wait.
constexpr std::size_t kMemoryOfDescriptor = std::size_t{512} << 10;

vesk_status numberOf(ReportingStatus status) noexcept { return static_cast<vesk_status>(status); }

// The three forms of a call, which `make` builds.

template <class Make>
vesk_status post(vesk_session* session, const Make& make) noexcept {
  return session ? numberOf(session->session.post(make)) : VESK_OUT_OF_RESOURCES;
}

template <class Make>
vesk_status post(vesk_session* session, AnswerKind kind, const vesk_completion* completion,
                 const Make& make) noexcept {
  if (!completion || !completion->callback) return post(session, make);
  if (!session) return VESK_OUT_OF_RESOURCES;
  const auto deliver = [callback = completion->callback, context = completion->context](
                           ReportingAnswer& answer) { callback(context, &answer); };
  return numberOf(
      session->session.ask(make, kind, deliver, std::chrono::milliseconds(completion->timeout_ms)));
}

vesk_status give(ReportingAnswer answer, vesk_result** result) noexcept {
  const vesk_status status = numberOf(answer.status);
  if (result) *result = new (std::nothrow) vesk_result(std::move(answer));
  return status;
}

template <class Make>
vesk_status wait(vesk_session* session, AnswerKind kind, std::int64_t timeout, vesk_result** result,
                 const Make& make) noexcept {
  if (!session) return give({ReportingStatus::OutOfResources}, result);
  return give(session->session.wait(make, kind, std::chrono::milliseconds(timeout)), result);
}

// What each operation sends.

std::optional<VeskDictionaryView> viewOf(const VeskDictionaryView* view) noexcept {
  return view ? std::optional(*view) : std::nullopt;
}

/// Throws InvalidCall if the view is null or can't be copied.
Dictionary ownedCopy(const VeskDictionaryView* view) {
  auto copy = view ? copyOf(*view) : std::nullopt;
  if (!copy) throw InvalidCall();
  return *std::move(copy);
}

std::optional<Dictionary> optionalCopy(const VeskDictionaryView* view) {
  return view ? std::optional(ownedCopy(view)) : std::nullopt;
}

ClientCall start() { return makeCall(CallEffect::Starts, wire::kStartConfig); }

auto states(const VeskDictionaryView* userInfo) {
  return [=] { return makeCall(CallEffect::ChangesUserInfo, wire::kFetchStates, optionalCopy(userInfo)); };
}

ClientCall displayURL() { return makeCall(wire::kFetchDisplayURL); }

auto message(std::uint16_t category, std::uint16_t type, const VeskDictionaryView* payload) {
  return [=] { return makeCall(wire::kSendMessageWithCategory, category, type, viewOf(payload)); };
}

auto messageOf(const VeskDictionaryView* parameters) {
  return [=] {
    if (!parameters) throw InvalidCall();
    return makeCall(wire::kSendMessageWithDictionary, *parameters);
  };
}

ClientCall flush() { return makeCall(wire::kFlushMessages); }

auto logDataUpload(const VeskListView* logData) {
  return [=] {
    auto copy = logData ? copyOf(*logData) : std::nullopt;
    if (!copy) throw InvalidCall();
    return makeCall(wire::kUploadLogData, *std::move(copy));
  };
}

auto messageOnce(const VeskDictionaryView* sessionInfo, const VeskDictionaryView* userInfo,
                 std::uint16_t category, std::uint16_t type, const VeskDictionaryView* payload) {
  return [=] {
    if (!sessionInfo) throw InvalidCall();
    return makeCall(wire::kSendMessageWithSessionInfo, *sessionInfo, viewOf(userInfo), category, type,
                    viewOf(payload));
  };
}

auto fileUpload(FileToUpload& file) {
  return [&file] {
    const IPCDescriptor descriptor{file.descriptor.get()};
    ClientCall call = makeCall(wire::kUploadFile, std::move(file.url), descriptor);
    call.call.descriptor = descriptor;
    call.descriptor = GuardedDescriptor(std::move(file.descriptor));
    call.memory = std::max(call.memory, kMemoryOfDescriptor);
    return call;
  };
}

/// Opens the file and has `send` send it.
template <class Send>
ReportingAnswer withFile(const char* path, const Send& send) noexcept {
  try {
    if (!path) return {ReportingStatus::InvalidArgument};
    auto file = openToUpload(path);
    if (file) return send(*file);
    const int number = file.error().number;
    const bool isScarce = number == EMFILE || number == ENFILE || number == ENOMEM;
    return {isScarce ? ReportingStatus::OutOfResources : ReportingStatus::FileUnavailable, file.error().text};
  } catch (const std::exception&) {
    return {ReportingStatus::OutOfResources};
  }
}

AggregationHandler handlerOf(const vesk_aggregation& aggregation) {
  const std::shared_ptr<void> context(
      aggregation.context, aggregation.release ? aggregation.release : [](void*) {});
  if (!aggregation.handle) return nullptr;
  return [handle = aggregation.handle, context](const AggregatedMessage& message) {
    std::optional<ValueViews> info, payload;
    if (message.sessionInfo) info.emplace(*message.sessionInfo);
    if (message.payload) payload.emplace(*message.payload);
    const vesk_aggregated view{sizeof view,       info ? &info->dictionary() : nullptr,
                               message.timestamp, message.category,
                               message.type,      payload ? &payload->dictionary() : nullptr};
    handle(context.get(), &view);
  };
}

ClientCall setInfo(Dictionary sessionInfo, std::optional<Dictionary> userInfo,
                   std::vector<std::string> frameworks, AggregationHandler handler) {
  ClientCall call = makeCall(CallEffect::Configures, wire::kSetSessionInfo, std::move(sessionInfo),
                             std::move(userInfo), std::move(frameworks), static_cast<bool>(handler));
  if (handler) call.aggregation = std::make_shared<const AggregationHandler>(std::move(handler));
  return call;
}

/// The defaults, replaced by what the caller's version of the structure has.
ReportingOptions optionsOf(const vesk_options* given) {
  ReportingOptions options;
  if (!given || given->size < sizeof(vesk_options)) return options;
  if (given->socket_path) options.socketPath = given->socket_path;
  options.maximumQueuedMessages = given->maximum_queued_messages;
  options.maximumQueuedBytes = given->maximum_queued_bytes;
  options.drainTime = std::chrono::milliseconds(given->drain_ms);
  options.firstReconnectWait = std::chrono::milliseconds(given->first_reconnect_ms);
  options.lastReconnectWait = std::chrono::milliseconds(given->last_reconnect_ms);
  options.refreshInterval = std::chrono::milliseconds(given->refresh_ms);
  return options;
}

}  // namespace

// The members that the first version of the structure has: later versions append some.
void vesk_options_init(vesk_options* options, size_t size) {
  if (!options || size < sizeof(vesk_options)) return;
  const ReportingOptions defaults;
  std::memset(options, 0, size);
  options->size = size;
  options->maximum_queued_messages = defaults.maximumQueuedMessages;
  options->maximum_queued_bytes = defaults.maximumQueuedBytes;
  options->drain_ms = defaults.drainTime.count();
  options->first_reconnect_ms = defaults.firstReconnectWait.count();
  options->last_reconnect_ms = defaults.lastReconnectWait.count();
  options->refresh_ms = defaults.refreshInterval.count();
}

vesk_session* vesk_session_new(const vesk_options* options) {
  try {
    return new vesk_session(optionsOf(options));
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("VeskReporting: no session could be made: %s", error.what());
    return nullptr;
  }
}

void vesk_session_free(vesk_session* session) {
  // In a forked process the thread is gone, along with any locks it held: the session must be leaked.
  if (session && session->session.isOurs()) delete session;
}

int vesk_session_is_connected(const vesk_session* session) {
  return session && session->session.isConnected() ? 1 : 0;
}

uint64_t vesk_session_drops(const vesk_session* session, int32_t reason) {
  const ReportingDrops drops = session ? session->session.drops() : ReportingDrops{};
  switch (reason) {
    case VESK_DROPPED_QUEUE_FULL:
      return drops.queueFull;
    case VESK_DROPPED_INVALID:
      return drops.invalid;
    case VESK_DROPPED_UNSENT:
      return drops.unsent;
    default:
      return 0;
  }
}

vesk_status vesk_session_connect_wait(vesk_session* session, int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::Nothing, timeout, result, [] { return ClientCall{}; });
}

vesk_status vesk_session_configure(vesk_session* session, const VeskDictionaryView* session_info,
                                   const VeskDictionaryView* user_info, const char* const* frameworks,
                                   size_t framework_count, const vesk_aggregation* aggregation) {
  try {
    AggregationHandler handler = aggregation ? handlerOf(*aggregation) : nullptr;
    return post(session, [&] {
      return setInfo(ownedCopy(session_info), optionalCopy(user_info),
                     std::vector<std::string>(frameworks, frameworks + framework_count), std::move(handler));
    });
  } catch (const std::exception&) {
    return VESK_OUT_OF_RESOURCES;
  }
}

vesk_status vesk_session_identify(vesk_session* session, const vesk_identity* identity) {
  if (!identity || identity->size < sizeof(vesk_identity)) return VESK_INVALID_ARGUMENT;
  return post(session, [&] {
    MutableDictionary userInfo;
    const auto set = [&](const char* key, const char* text) {
      if (text && *text) userInfo.set(key, text);
    };
    set(kVeskReportingUserInfoClientName, identity->client_name);
    set(kVeskReportingUserInfoServiceName, identity->service_name);
    return setInfo({{kVeskReportingSessionInfoSessionID, identity->session_id},
                    {kVeskReportingSessionInfoClientType, identity->client_type},
                    {kVeskReportingSessionInfoClientVersion, int{identity->client_version}},
                    {kVeskReportingSessionInfoRequireUserInfo, identity->no_user_info == 0},
                    {kVeskReportingSessionInfoBatchEvent, identity->batch_events != 0}},
                   userInfo.empty() ? std::nullopt : std::optional(userInfo.share()), {}, nullptr);
  });
}

vesk_status vesk_session_start(vesk_session* session, const vesk_completion* completion) {
  return post(session, AnswerKind::Backends, completion, start);
}

vesk_status vesk_session_start_wait(vesk_session* session, int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::Backends, timeout, result, start);
}

vesk_status vesk_session_fetch_states(vesk_session* session, const VeskDictionaryView* user_info,
                                      const vesk_completion* completion) {
  return post(session, AnswerKind::Backends, completion, states(user_info));
}

vesk_status vesk_session_fetch_states_wait(vesk_session* session, const VeskDictionaryView* user_info,
                                           int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::Backends, timeout, result, states(user_info));
}

vesk_status vesk_session_fetch_display_url(vesk_session* session, const vesk_completion* completion) {
  return post(session, AnswerKind::Text, completion, displayURL);
}

vesk_status vesk_session_fetch_display_url_wait(vesk_session* session, int64_t timeout,
                                                vesk_result** result) {
  return wait(session, AnswerKind::Text, timeout, result, displayURL);
}

vesk_status vesk_session_send(vesk_session* session, uint16_t category, uint16_t type,
                              const VeskDictionaryView* payload, const vesk_completion* completion) {
  return post(session, AnswerKind::OptionalText, completion, message(category, type, payload));
}

vesk_status vesk_session_send_wait(vesk_session* session, uint16_t category, uint16_t type,
                                   const VeskDictionaryView* payload, int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::OptionalText, timeout, result, message(category, type, payload));
}

vesk_status vesk_session_send_parameters(vesk_session* session, const VeskDictionaryView* parameters,
                                         const vesk_completion* completion) {
  return post(session, AnswerKind::OptionalText, completion, messageOf(parameters));
}

vesk_status vesk_session_send_parameters_wait(vesk_session* session, const VeskDictionaryView* parameters,
                                              int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::OptionalText, timeout, result, messageOf(parameters));
}

vesk_status vesk_session_flush(vesk_session* session, const vesk_completion* completion) {
  return post(session, AnswerKind::OptionalText, completion, flush);
}

vesk_status vesk_session_flush_wait(vesk_session* session, int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::OptionalText, timeout, result, flush);
}

vesk_status vesk_session_upload_file(vesk_session* session, const char* path,
                                     const vesk_completion* completion) {
  const auto answer = withFile(path, [&](FileToUpload& file) {
    const auto status = post(session, AnswerKind::Accepted, completion, fileUpload(file));
    return ReportingAnswer{static_cast<ReportingStatus>(status)};
  });
  return numberOf(answer.status);
}

vesk_status vesk_session_upload_file_wait(vesk_session* session, const char* path, int64_t timeout,
                                          vesk_result** result) {
  if (!session) return give({ReportingStatus::OutOfResources}, result);
  return give(withFile(path,
                       [&](FileToUpload& file) {
                         return session->session.wait(fileUpload(file), AnswerKind::Accepted,
                                                      std::chrono::milliseconds(timeout));
                       }),
              result);
}

vesk_status vesk_session_upload_log_data(vesk_session* session, const VeskListView* log_data,
                                         const vesk_completion* completion) {
  return post(session, AnswerKind::Accepted, completion, logDataUpload(log_data));
}

vesk_status vesk_session_upload_log_data_wait(vesk_session* session, const VeskListView* log_data,
                                              int64_t timeout, vesk_result** result) {
  return wait(session, AnswerKind::Accepted, timeout, result, logDataUpload(log_data));
}

vesk_status vesk_session_send_once(vesk_session* session, const VeskDictionaryView* session_info,
                                   const VeskDictionaryView* user_info, uint16_t category, uint16_t type,
                                   const VeskDictionaryView* payload, const vesk_completion* completion) {
  return post(session, AnswerKind::Text, completion,
              messageOnce(session_info, user_info, category, type, payload));
}

vesk_status vesk_session_send_once_wait(vesk_session* session, const VeskDictionaryView* session_info,
                                        const VeskDictionaryView* user_info, uint16_t category, uint16_t type,
                                        const VeskDictionaryView* payload, int64_t timeout,
                                        vesk_result** result) {
  return wait(session, AnswerKind::Text, timeout, result,
              messageOnce(session_info, user_info, category, type, payload));
}

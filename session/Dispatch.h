// Operations of a session on all of its backends.
#pragma once

#include <sys/time.h>
#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "backends/Outcomes.h"
#include "session/BackendSet.h"
#include "session/SessionServices.h"

namespace vesk {

/// A message, parsed from a client's dictionary.
struct MessageParameters {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
  std::int32_t flag = 0;
};

/// Returns nullopt, and logs a line, if category or type is missing.
std::optional<MessageParameters> messageFrom(const Dictionary& parameters);

/// These two return the answer for the client: that of the HTTP-post backend, otherwise the dashboard's,
/// otherwise none. The answers of all backends go to the local message log.
std::optional<std::string> dispatchMessage(const BackendSet& backends, const MessageParameters& message,
                                           const timeval& timestamp);
std::optional<std::string> flushBackends(const BackendSet& backends);

/// Cuts an answer to the limit of its length.
std::optional<std::string> fittingAnswer(std::optional<std::string> answer);

void cleanupBackends(const BackendSet& backends);

/// Returns true if a backend accepted the file or data. `backends` may be null. May block until servers have
/// answered.
bool uploadFileWithURL(const BackendSet* backends, const std::string& fileURL,
                       const std::string& extensionToken, const Outcomes& outcomes);
bool uploadLogData(const BackendSet* backends, const List& logData, const Outcomes& outcomes);

/// Sends one message through backends created for it alone. Without session info or storebag the message is
/// lost, with a line of level 3.
void sendMessageWithSessionInfo(const SessionServices& services, const BackendClient& client,
                                const std::optional<Dictionary>& sessionInfo,
                                const std::optional<Dictionary>& userInfo,
                                const std::optional<Dictionary>& storebag, std::uint16_t category,
                                std::uint16_t type, const std::optional<Dictionary>& payload);

}  // namespace vesk

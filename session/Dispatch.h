// What a session has all of its backends do.
#pragma once

#include <sys/time.h>
#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "session/BackendSet.h"
#include "session/SessionServices.h"
#include "util/Counters.h"

namespace vesk {

/// A message as a client's dictionary describes it.
struct MessageParameters {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::optional<Dictionary> payload;
  std::int32_t flag = 0;
};

/// Nothing, and a line, without category or type.
std::optional<MessageParameters> messageFrom(const Dictionary& parameters);

/// These two return the answer for the client: the HTTP-post backend's, else the dashboard's, else none.
/// Answers of all backends go to the local message log.
std::optional<std::string> dispatchMessage(const BackendSet& backends, const MessageParameters& message,
                                           const timeval& timestamp);
std::optional<std::string> flushBackends(const BackendSet& backends);

/// Cuts an answer that is longer than an answer may be.
std::optional<std::string> fittingAnswer(std::optional<std::string> answer);

void cleanupBackends(const BackendSet& backends);

/// True when a backend took the file or the data. `backends` may be null. May block for servers' answers.
bool uploadFileWithURL(const BackendSet* backends, const std::string& fileURL,
                       const std::string& extensionToken, Counters& counters);
bool uploadLogData(const BackendSet* backends, const List& logData, Counters& counters);

/// Sends one message through backends that are made for it and end with it. Without session info or storebag
/// it is lost, with a line of level 3. `user`: whose the client is.
void sendMessageWithSessionInfo(const SessionServices& services, uid_t user,
                                const std::optional<Dictionary>& sessionInfo,
                                const std::optional<Dictionary>& userInfo,
                                const std::optional<Dictionary>& storebag, std::uint16_t category,
                                std::uint16_t type, const std::optional<Dictionary>& payload);

}  // namespace vesk

// The operations that the daemon exports to each client. docs/wire.md describes their encoding.
#pragma once

#include <VeskReporting/VeskReportingTypes.h>

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "platform/files/FileDescriptor.h"
#include "platform/ipc/Reply.h"

namespace vesk {

/// The limit, in bytes, of the text that answers a message or a flush, so that it fits into one D-Bus
/// message. Longer text is cut after a whole character, and its last line says so.
inline constexpr std::size_t kMaxAnswerBytes = std::size_t{1} << 20;

/// Implemented by the daemon's session. All calls of one connection arrive in order on that connection's
/// thread. Arguments that a caller may omit are optional. Implementations must not throw.
class ClientSessionInterface {
 public:
  virtual ~ClientSessionInterface() = default;

  virtual void setSessionInfo(const Dictionary& sessionInfo, const std::optional<Dictionary>& userInfo,
                              const List& frameworksToCheck, bool hasAggregationBlock) = 0;
  virtual void startConfigWithCompletionHandler(Reply<std::optional<BackendNames>> reply) = 0;
  virtual void fetchStatesWithUserInfo(const std::optional<Dictionary>& userInfo,
                                       Reply<std::optional<BackendNames>> completionHandler) = 0;
  virtual void fetchDisplayURL(Reply<std::string> reply) = 0;
  virtual void sendMessageWithCategory(std::uint16_t category, std::uint16_t type,
                                       const std::optional<Dictionary>& payload,
                                       Reply<std::optional<std::string>> reply) = 0;
  virtual void sendMessageWithDictionary(const Dictionary& parameters,
                                         Reply<std::optional<std::string>> reply) = 0;
  virtual void flushMessagesWithReply(Reply<std::optional<std::string>> reply) = 0;
  /// `extensionToken` names the descriptor that came with the call; it is empty if none came.
  virtual void uploadFileAtPath(const std::string& fileURL, const std::string& extensionToken,
                                Reply<bool> completionHandler) = 0;
  /// The reply's text is meant for an error description; it is always absent.
  virtual void uploadLogData(const List& logData,
                             Reply<bool, std::optional<std::string>> completionHandler) = 0;
  virtual void sendMessageWithSessionInfo(const Dictionary& sessionInfo,
                                          const std::optional<Dictionary>& userInfo, std::uint16_t category,
                                          std::uint16_t type, const std::optional<Dictionary>& payload,
                                          Reply<std::string> reply) = 0;
};

}  // namespace vesk

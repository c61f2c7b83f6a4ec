// The origin of a backend's messages.
#pragma once

#include <sys/time.h>
#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/HeldBytes.h"
#include "backends/upload/UploadGate.h"
#include "platform/http/PostBudget.h"

namespace vesk {

/// The client process of a session.
struct BackendClient {
  uid_t user = UploadGate::kNobody;  ///< charged for posts and uploads that wait
  pid_t process = 0;
  std::shared_ptr<PostAccount> posts{};  ///< of its connection. Null: its posts are not limited.
};

/// The session, its client and the device, as they are when the session makes its backends. The same for all
/// of them, and constant.
struct BackendIdentity {
  std::uint32_t _sessionID = 0;  ///< the client's number for the session
  std::int32_t _compType = 0;    ///< the client type
  std::uint16_t _clientVersion = 0;
  std::string _udid{};
  std::optional<Text> _productVersion{};  ///< of the operating system, as is the build
  std::optional<Text> _buildVersion{};
  std::optional<Text> _hardwareType{};
  std::optional<Text> _productFamily{};
  bool _isInternal = false;       ///< an internal build of the operating system
  bool _requireUserInfo = false;  ///< the client sends user info before anything may be reported
  bool _batchEvents = false;
  std::uint8_t _selfVersionMajor = 0;  ///< of the client library
  std::uint8_t _selfVersionMinor = 0;
  double _startTimeStamp = 0;  ///< seconds since 1970
  BackendClient _client{};
  HeldBytes _heldBytes = std::make_shared<HeldAccount>(HeldBudget::Limits().ofSession);

  /// "7.2.9" gives 7 and 2; numbers are truncated to 8 bits.
  void setSelfVersion(std::string_view version);
};

}  // namespace vesk

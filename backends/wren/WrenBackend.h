// The backend that passes messages to the device's wireless diagnostics.
#pragma once

#include <VeskReporting/WrenAdaptor.h>

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "platform/bundle/LoadableBundle.h"

namespace vesk {

/// Forwards every message to an adaptor that a shared library creates. The adaptor runs on the thread that
/// sends the message, one message at a time. If it is slow, the session's next message waits, but no other
/// operation of the backend does. If the adaptor or its forwarding operation is missing, each message is
/// dropped with a line in the log.
class WrenBackend final : public VeskReportingBackend {
 public:
  /// Returns null, with a line in the log, for a client type without an adaptor.
  static std::shared_ptr<WrenBackend> create(const std::string& name,
                                             const std::optional<Dictionary>& profile,
                                             const BackendIdentity& identity,
                                             const BackendServices& services);

 private:
  struct ReleaseAdaptor {
    void operator()(VeskWrenAdaptor* adaptor) const noexcept;
  };

  WrenBackend(const std::string& name, const std::optional<Dictionary>& profile,
              const BackendIdentity& identity, const BackendServices& services, std::string bundlePath);

  std::optional<std::string> sendMessageInTurn(const std::optional<Dictionary>& payload,
                                               const timeval& timestamp, std::uint16_t method,
                                               std::uint16_t respCode, std::uint16_t eventID,
                                               std::int32_t flag) override VESK_REQUIRES(_sendMutex)
      VESK_EXCLUDES(_mutex);
  void makeAdaptor();
  Result<void> forwardTo(VeskWrenSendMessage forward, std::uint16_t method, std::uint16_t respCode,
                         const std::optional<Dictionary>& payload) VESK_REQUIRES(_sendMutex);
  VeskWrenSendMessage forwardingOperation() const noexcept;
  const char* adaptorDescription() const noexcept;

  // Constant after construction.
  LoadableBundle _clientBundle;
  const std::string _stateDirectory;
  const VeskWrenHost _host;
  VeskWrenAdaptorFactory _wrenAdaptorClass = nullptr;
  std::unique_ptr<VeskWrenAdaptor, ReleaseAdaptor> _wrenAdaptor;
};

}  // namespace vesk

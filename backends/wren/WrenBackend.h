// Hands messages to the device's wireless diagnostics.
#pragma once

#include <VeskReporting/WrenAdaptor.h>

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "platform/bundle/LoadableBundle.h"

namespace vesk {

/// Forwards every message to an adaptor that a shared library makes; what that does with it is not known
/// here. The adaptor runs on the thread that sends the message, one message at a time, and may take its time:
/// until it returns the session's next message waits, but nothing else that is asked of the backend. Without
/// an adaptor, or without its forwarding operation, each message costs a line in the log and is dropped.
class WrenBackend final : public VeskReportingBackend {
 public:
  /// Nothing, and a line in the log, for a client type that has no adaptor.
  static std::shared_ptr<WrenBackend> create(const std::string& name,
                                             const std::optional<Dictionary>& profile,
                                             const std::optional<Text>& productFamily,
                                             std::int32_t clientType, const BackendServices& services);
  /// Without a client type: nothing.
  static std::shared_ptr<WrenBackend> create(const std::string& name,
                                             const std::optional<Dictionary>& profile,
                                             const std::optional<Text>& productFamily,
                                             const BackendServices& services);

 private:
  struct ReleaseAdaptor {
    void operator()(VeskWrenAdaptor* adaptor) const noexcept;
  };

  WrenBackend(const std::string& name, const Dictionary& profile, const Text& productFamily,
              const BackendServices& services, std::string bundlePath);

  std::optional<std::string> sendMessageInTurn(const std::optional<Dictionary>& payload,
                                               const timeval& timestamp, std::uint16_t method,
                                               std::uint16_t respCode, std::uint16_t eventID,
                                               std::int32_t flag) override VESK_REQUIRES(_sendMutex)
      VESK_EXCLUDES(_mutex);
  void makeAdaptor() noexcept;
  /// What went wrong comes back; nothing: all went well.
  std::optional<std::string> forwardTo(VeskWrenSendMessage forward, std::uint16_t method,
                                       std::uint16_t respCode,
                                       const std::optional<Dictionary>& payload) noexcept
      VESK_REQUIRES(_sendMutex);
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

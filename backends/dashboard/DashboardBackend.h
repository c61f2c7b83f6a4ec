// The backend that reports each message as a UDP datagram to a dashboard.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "backends/dashboard/DashboardDelivery.h"

namespace vesk {

/// Encodes messages on the session's thread and passes the datagrams to its delivery, which works on its own
/// queue and may outlive the backend (DashboardDelivery.h). The answer to a message is the datagram's text.
class DashboardBackend final : public VeskReportingBackend {
 public:
  /// Creates a backend from a storebag's profile. Returns null, with a level-3 line, if the profile is
  /// unusable or the system refuses.
  static std::shared_ptr<DashboardBackend> create(const std::string& name,
                                                  const std::optional<Dictionary>& profile,
                                                  const BackendIdentity& identity,
                                                  const BackendServices& services);
  /// Creates a backend without a profile; its delivery is reliable. Returns null, without a line, if there is
  /// no address.
  static std::shared_ptr<DashboardBackend> create(const std::string& name,
                                                  const std::optional<std::string>& serverIP,
                                                  std::uint16_t serverPort, const BackendIdentity& identity,
                                                  const BackendServices& services);
  ~DashboardBackend() override;

  /// Uploads `logData` as keyed archive and reports the location that the server returns. Waits for its turn
  /// among the uploads of its size (UploadGate.h) and then for the server, at most 120 s. Holds no lock
  /// meanwhile.
  bool uploadLogData(const List& logData) override;

  bool isReliable() const noexcept { return _delivery->isReliable(); }

 protected:
  std::optional<std::string> sendMessageInTurn(const std::optional<Dictionary>& payload,
                                               const timeval& timestamp, std::uint16_t method,
                                               std::uint16_t respCode, std::uint16_t eventID,
                                               std::int32_t flag) override VESK_REQUIRES(_sendMutex)
      VESK_EXCLUDES(_mutex);
  void cleanupInTurn() override VESK_REQUIRES(_sendMutex) { _delivery->cleanup(); }

 private:
  DashboardBackend(const std::string& name, const std::optional<Dictionary>& profile,
                   const BackendIdentity& identity, std::shared_ptr<DashboardDelivery> delivery,
                   const BackendServices& services, std::shared_ptr<Outcomes> outcomes);

  static std::shared_ptr<DashboardBackend> createConnected(const std::string& name,
                                                           const std::optional<Dictionary>& profile,
                                                           const std::optional<std::string>& serverIP,
                                                           std::uint16_t serverPort,
                                                           const BackendIdentity& identity,
                                                           const BackendServices& services);

  /// The header without the length.
  DashboardHeader headerFor(const timeval& timestamp, std::uint16_t method, std::uint16_t respCode,
                            std::uint16_t eventID) const;

  // Constant after construction.
  const bool _usingProfile;
  const std::optional<std::string> _postURL;
  const std::shared_ptr<DashboardDelivery> _delivery;
};

}  // namespace vesk

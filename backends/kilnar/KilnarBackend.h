// Records messages in the device's power log.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"

namespace vesk {

/// Records every message with a method and a payload as one event of the power log. Stateless. Never produces
/// text for the message log.
class KilnarBackend final : public VeskReportingBackend {
 public:
  static std::shared_ptr<KilnarBackend> create(const std::string& name,
                                               const std::optional<Dictionary>& profile,
                                               const BackendIdentity& identity,
                                               const BackendServices& services);

 private:
  using VeskReportingBackend::VeskReportingBackend;

  std::optional<std::string> sendMessageInTurn(const std::optional<Dictionary>& payload,
                                               const timeval& timestamp, std::uint16_t method,
                                               std::uint16_t respCode, std::uint16_t eventID,
                                               std::int32_t flag) override VESK_REQUIRES(_sendMutex)
      VESK_EXCLUDES(_mutex);
};

}  // namespace vesk

// The client's side of telemetry reporting.
#pragma once

#include <VeskReporting/VeskReportingKeys.h>
#include <VeskReporting/values/Export.h>

#include <optional>
#include <string>

namespace vesk {

/// One session with veskreportingd.
class VESK_API VeskReporting {
 public:
  /// A stable identifier of this device for events (UUID text): the one that respects the user's diagnostics
  /// consent when `respectsConsent`, else the one that overrides it. Made once and kept in
  /// /var/lib/veskreportingd; one that can't be kept there is stable for the process's life. Thread-safe.
  /// Empty only when there is no memory.
  [[nodiscard]] static std::string getPersistentIdentifierForDNU(bool respectsConsent) noexcept;

  /// The version that the installed library declares; "7.0" when it declares none.
  [[nodiscard]] static std::string version() noexcept;

  /// The RSA public key (DER) that storebags are verified with; nothing when none is installed.
  [[nodiscard]] static std::optional<std::string> publicKey() noexcept;
};

}  // namespace vesk

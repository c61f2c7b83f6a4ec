// Type-safe formats for the message log.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <variant>

#include <VeskReporting/values/Text.h>

namespace vesk {

/// One value for a placeholder of a log format. It knows its own type, so it is printed even if the
/// placeholder doesn't fit it.
class LogArgument {
 public:
  LogArgument(std::string_view text) noexcept : _value(text) {}                                 // NOLINT
  LogArgument(const std::string& text) noexcept : _value(std::string_view(text)) {}             // NOLINT
  LogArgument(const char* text) noexcept : _value(std::string_view(text ? text : "(null)")) {}  // NOLINT
  LogArgument(const Text& text) noexcept : _value(text.view()) {}                               // NOLINT
  LogArgument(double number) noexcept : _value(number) {}                                       // NOLINT
  LogArgument(bool value) noexcept : _value(static_cast<std::int64_t>(value)) {}                // NOLINT
  template <class Integer, std::enable_if_t<std::is_integral_v<Integer>, int> = 0>
  LogArgument(Integer number) noexcept {  // NOLINT
    if constexpr (std::is_signed_v<Integer>) {
      _value = static_cast<std::int64_t>(number);
    } else {
      _value = static_cast<std::uint64_t>(number);
    }
  }
  /// An empty optional prints "(null)".
  template <class T>
  LogArgument(const std::optional<T>& value) noexcept  // NOLINT
      : LogArgument(value ? LogArgument(*value) : LogArgument(std::string_view("(null)"))) {}

  const std::variant<std::string_view, std::int64_t, std::uint64_t, double>& value() const noexcept {
    return _value;
  }

 private:
  std::variant<std::string_view, std::int64_t, std::uint64_t, double> _value;
};

/// Replaces the placeholders of `format` by `arguments`, in order:
/// - "%@" and "%s" print any value in its plain form.
/// - "%d", "%i", "%u", "%x", "%X", "%o", "%f", "%e" and "%g" print a number like printf, with flags, width
///   and precision, and text unchanged. Length modifiers ("%ld") have no effect.
/// - "%%" prints a percent sign.
/// A placeholder without a value is printed unchanged; values without a placeholder are ignored.
std::string formatLogMessage(std::string_view format, std::span<const LogArgument> arguments);

}  // namespace vesk

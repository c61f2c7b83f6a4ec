// Formats of the message log, filled by type and not by trust.
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

/// One value for a placeholder of a log format. It remembers its own type, so a format that does not fit it
/// still prints the value.
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
  /// What is none prints "(null)".
  template <class T>
  LogArgument(const std::optional<T>& value) noexcept  // NOLINT
      : LogArgument(value ? LogArgument(*value) : LogArgument(std::string_view("(null)"))) {}

  const std::variant<std::string_view, std::int64_t, std::uint64_t, double>& value() const noexcept {
    return _value;
  }

 private:
  std::variant<std::string_view, std::int64_t, std::uint64_t, double> _value;
};

/// Fills the placeholders of `format` with `arguments`, in order:
/// - "%@" and "%s" show any value in its plain form;
/// - "%d", "%i", "%u", "%x", "%X", "%o", "%f", "%e" and "%g" show a number as printf does, with its flags,
/// width
///   and precision, and a text as it is. Length modifiers ("%ld") have no effect: a value knows its own size;
/// - "%%" is a percent sign.
/// A placeholder without a value stays as it stands; values without a placeholder are left out.
std::string formatLogMessage(std::string_view format, std::span<const LogArgument> arguments);

}  // namespace vesk

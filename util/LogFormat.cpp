#include "util/LogFormat.h"

#include <algorithm>
#include <charconv>
#include <cstdio>

namespace vesk {

namespace {

constexpr std::string_view kFlags = "-+ #0";
constexpr std::string_view kLengthModifiers = "hlqjzt";
constexpr std::string_view kConversions = "@sdiuxXofFeEgG";
constexpr int kWidest = 256;

struct Placeholder {
  std::string flags;       // also width and precision: what goes between "%" and the conversion
  char conversion = 0;     // 0: not a placeholder
  std::size_t length = 0;  // length of the placeholder in the format
};

/// Removes the leading characters of `rest` that are in `set`, and returns them.
std::string_view takeAll(std::string_view set, std::string_view& rest) {
  const std::string_view taken = rest.substr(0, rest.find_first_not_of(set));
  rest.remove_prefix(taken.size());
  return taken;
}

// Reads a width or precision, limited so that it can't fill the log with blanks.
std::string takeNumber(std::string_view& rest) {
  const std::string_view digits = takeAll("0123456789", rest);
  if (digits.empty()) return {};
  int number = kWidest;
  std::from_chars(digits.data(), digits.data() + digits.size(), number);  // stays unchanged if out of range
  return std::to_string(std::min(number, kWidest));
}

/// `format` must start with "%".
Placeholder parsePlaceholder(std::string_view format) {
  Placeholder placeholder;
  std::string_view rest = format.substr(1);
  for (char flag : takeAll(kFlags, rest)) {
    if (placeholder.flags.find(flag) == std::string::npos) placeholder.flags += flag;
  }
  placeholder.flags += takeNumber(rest);
  if (rest.starts_with('.')) {
    rest.remove_prefix(1);
    placeholder.flags += "." + takeNumber(rest);
  }
  takeAll(kLengthModifiers, rest);
  if (!rest.empty() && kConversions.find(rest.front()) != std::string_view::npos) {
    placeholder.conversion = rest.front();
    placeholder.length = format.size() - rest.size() + 1;
  }
  return placeholder;
}

// The format was built here from checked parts and fits the type of `value`.
template <class T>
std::string printed(const std::string& format, T value) {
  char buffer[1024] = "";  // the largest double with 256 decimals takes 566
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
  std::snprintf(buffer, sizeof buffer, format.c_str(), value);
#pragma GCC diagnostic pop
  return buffer;
}

struct PlainForm {
  std::string operator()(std::string_view text) const { return std::string(text); }
  std::string operator()(std::int64_t number) const { return std::to_string(number); }
  std::string operator()(std::uint64_t number) const { return std::to_string(number); }
  std::string operator()(double number) const { return printed("%.15g", number); }
};

struct NumericForm {
  const Placeholder& placeholder;

  std::string operator()(std::string_view text) const { return std::string(text); }
  std::string operator()(double number) const {
    return wants("fFeEgG") ? converted("", placeholder.conversion, number) : PlainForm{}(number);
  }
  std::string operator()(std::int64_t number) const {
    if (wants("fFeEgG")) return (*this)(static_cast<double>(number));
    // "%u" would show a negative number as a huge one.
    if (wants("diu")) return converted("ll", 'd', static_cast<long long>(number));
    return (*this)(static_cast<std::uint64_t>(number));
  }
  std::string operator()(std::uint64_t number) const {
    if (wants("fFeEgG")) return (*this)(static_cast<double>(number));
    return converted("ll", wants("di") ? 'u' : placeholder.conversion,
                     static_cast<unsigned long long>(number));
  }

 private:
  bool wants(std::string_view conversions) const {
    return conversions.find(placeholder.conversion) != std::string_view::npos;
  }
  template <class T>
  std::string converted(const char* lengthModifier, char conversion, T number) const {
    return printed("%" + placeholder.flags + lengthModifier + conversion, number);
  }
};

}  // namespace

std::string formatLogMessage(std::string_view format, std::span<const LogArgument> arguments) {
  std::string out;
  std::size_t next = 0;
  while (!format.empty()) {
    std::size_t percent = format.find('%');
    out += format.substr(0, percent);
    if (percent == std::string_view::npos) break;
    format.remove_prefix(percent);
    if (format.substr(0, 2) == "%%") {
      out += '%';
      format.remove_prefix(2);
      continue;
    }
    Placeholder placeholder = parsePlaceholder(format);
    if (placeholder.conversion == 0 || next == arguments.size()) {
      std::size_t length = std::max<std::size_t>(placeholder.length, 1);
      out += format.substr(0, length);
      format.remove_prefix(length);
      continue;
    }
    const bool isPlain = placeholder.conversion == '@' || placeholder.conversion == 's';
    const auto& value = arguments[next++].value();
    out += isPlain ? std::visit(PlainForm{}, value) : std::visit(NumericForm{placeholder}, value);
    format.remove_prefix(placeholder.length);
  }
  return out;
}

}  // namespace vesk

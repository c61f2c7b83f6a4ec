#include "util/LogFormat.h"

#include <algorithm>
#include <cstdio>

namespace vesk {

namespace {

constexpr std::string_view kFlags = "-+ #0";
constexpr std::string_view kLengthModifiers = "hlqjzt";
constexpr int kWidest = 256;

struct Placeholder {
  std::string flags;       // with width and precision: what printf gets between "%" and the conversion
  char conversion = 0;     // 0: this is no placeholder
  std::size_t length = 0;  // of the whole placeholder in the format
};

// A width or a precision; what would fill the log with blanks is cut.
std::string takeNumber(std::string_view format, std::size_t& at) {
  int number = -1;
  for (; at < format.size() && format[at] >= '0' && format[at] <= '9'; ++at) {
    number = std::min(kWidest, std::max(number, 0) * 10 + (format[at] - '0'));
  }
  return number < 0 ? std::string() : std::to_string(number);
}

/// `format` starts with "%".
Placeholder parsePlaceholder(std::string_view format) {
  Placeholder placeholder;
  std::size_t at = 1;
  while (at < format.size() && kFlags.find(format[at]) != std::string_view::npos) {
    if (placeholder.flags.find(format[at]) == std::string::npos) placeholder.flags += format[at];
    ++at;
  }
  placeholder.flags += takeNumber(format, at);
  if (at < format.size() && format[at] == '.') {
    ++at;
    placeholder.flags += "." + takeNumber(format, at);
  }
  while (at < format.size() && kLengthModifiers.find(format[at]) != std::string_view::npos) ++at;
  if (at < format.size() && std::string_view("@sdiuxXofFeEgG").find(format[at]) != std::string_view::npos) {
    placeholder.conversion = format[at];
    placeholder.length = at + 1;
  }
  return placeholder;
}

// The format is built here, from checked parts and for the very type of `value`.
template <class T>
std::string printed(const std::string& format, T value) {
  char buffer[1024];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
  int size = std::snprintf(buffer, sizeof buffer, format.c_str(), value);
#pragma GCC diagnostic pop
  return size < 0
             ? std::string()
             : std::string(buffer, std::min<std::size_t>(static_cast<std::size_t>(size), sizeof buffer - 1));
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
    // A negative number is not shown as the huge one that "%u" would make of it.
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

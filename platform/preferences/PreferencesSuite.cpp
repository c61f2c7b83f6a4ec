#include "platform/preferences/PreferencesSuite.h"

#include <charconv>
#include <cstdlib>

#include "platform/files/RootPrefix.h"
#include "platform/preferences/TomlFile.h"

namespace vesk {

namespace {

std::optional<std::string> userConfigurationDirectory() {
  const char* config = std::getenv("XDG_CONFIG_HOME");
  if (config && config[0] == '/') return std::string(config);
  const char* home = std::getenv("HOME");
  if (home && home[0] == '/') return std::string(home) + "/.config";
  return std::nullopt;
}

Dictionary readSuite(const std::string& directory, std::string_view suite) {
  return readTomlFile(
      pathUnderRoot(directory + "/veskreporting/preferences/" + std::string(suite) + ".toml"));
}

std::string_view withoutLeadingSpace(std::string_view text) {
  std::size_t start = text.find_first_not_of(" \t\n\v\f\r");
  return start == std::string_view::npos ? std::string_view() : text.substr(start);
}

std::int64_t leadingInteger(std::string_view text) {
  text = withoutLeadingSpace(text);
  if (text.size() > 1 && text[0] == '+' && text[1] != '-') text.remove_prefix(1);
  std::int64_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error == std::errc::result_out_of_range) return text[0] == '-' ? INT64_MIN : INT64_MAX;
  return number;
}

template <class Number>
std::string decimal(Number number) {
  char digits[64];
  auto [end, error] = std::to_chars(digits, digits + sizeof digits, number);
  return error == std::errc{} ? std::string(digits, end) : std::string();
}

// With an exponent only where people would write one: who reads a value as an integer gets 100000, not 1.
std::string decimal(double number) {
  const double size = std::abs(number);
  const bool isPlain = size == 0 || (size >= 1e-4 && size < 1e16);
  char digits[64];
  auto [end, error] = std::to_chars(digits, digits + sizeof digits, number,
                                    isPlain ? std::chars_format::fixed : std::chars_format::scientific);
  return error == std::errc{} ? std::string(digits, end) : std::string();
}

}  // namespace

PreferencesSuite::PreferencesSuite(std::string_view suite) {
  if (suite.size() > 128 || !isPlainFileName(suite)) return;
  _system = readSuite("/etc", suite);
  if (auto user = userConfigurationDirectory()) _user = readSuite(*user, suite);
}

std::optional<Value> PreferencesSuite::valueForKey(std::string_view key) const {
  if (const Value* value = _user.find(key)) return *value;
  if (const Value* value = _system.find(key)) return *value;
  return std::nullopt;
}

std::optional<std::string> stringForm(const Value& value) {
  switch (value.kind()) {
    case Value::Kind::Text:
      return value.text()->string();
    case Value::Kind::Boolean:
      return *value.boolean() ? "1" : "0";
    case Value::Kind::Signed:
      return decimal(*value.signedInteger());
    case Value::Kind::Unsigned:
      return decimal(*value.unsignedInteger());
    case Value::Kind::Double:
      return decimal(*value.real());
    default:
      return std::nullopt;
  }
}

std::int64_t integerForm(const Value& value) {
  if (const Text* text = value.text()) return leadingInteger(text->view());
  return value.asInteger().value_or(0);
}

}  // namespace vesk

#include "platform/plist/PropertyListScalars.h"

#include <charconv>
#include <chrono>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

/// Parses all of `text`, digits only, as a number.
std::optional<std::uint64_t> digits(std::string_view text, int base) {
  std::uint64_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return number;
}

/// Removes `count` digits and the character after them from `text`.
std::optional<unsigned> takeField(std::string_view& text, std::size_t count, char after) {
  if (text.size() <= count || text[count] != after) return std::nullopt;
  auto number = digits(text.substr(0, count), 10);
  text.remove_prefix(count + 1);
  return number ? std::optional<unsigned>(static_cast<unsigned>(*number)) : std::nullopt;
}

}  // namespace

std::optional<Value> integerFromPropertyListText(std::string_view text) {
  text = trimmed(text);
  bool isNegative = false;
  if (!text.empty() && (text[0] == '-' || text[0] == '+')) {
    isNegative = text[0] == '-';
    text.remove_prefix(1);
  }
  const bool isHexadecimal = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
  auto magnitude = isHexadecimal ? digits(text.substr(2), 16) : digits(text, 10);
  if (!magnitude) return std::nullopt;
  constexpr std::uint64_t kSignedLimit = std::uint64_t{1} << 63;
  if (isNegative) {
    if (*magnitude > kSignedLimit) return std::nullopt;
    return Value(static_cast<std::int64_t>(0 - *magnitude));
  }
  return *magnitude < kSignedLimit ? Value(static_cast<std::int64_t>(*magnitude)) : Value(*magnitude);
}

std::optional<double> realFromPropertyListText(std::string_view text) {
  text = trimmed(text);
  if (text.size() > 1 && text[0] == '+' && text[1] != '-') text.remove_prefix(1);
  double number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<Date> dateFromPropertyListText(std::string_view text) {
  using namespace std::chrono;
  text = trimmed(text);
  auto yearNumber = takeField(text, 4, '-');
  auto monthNumber = takeField(text, 2, '-');
  auto dayNumber = takeField(text, 2, 'T');
  auto hour = takeField(text, 2, ':');
  auto minute = takeField(text, 2, ':');
  auto second = takeField(text, 2, 'Z');
  if (!yearNumber || !monthNumber || !dayNumber || !hour || !minute || !second || !text.empty()) {
    return std::nullopt;
  }
  const auto date = year(static_cast<int>(*yearNumber)) / month(*monthNumber) / day(*dayNumber);
  if (!date.ok() || *hour > 23 || *minute > 59 || *second > 59) return std::nullopt;
  const auto time = sys_days(date) + hours(*hour) + minutes(*minute) + seconds(*second);
  return Date{static_cast<double>(sys_seconds(time).time_since_epoch().count())};
}

}  // namespace vesk

#include "tools/collector/ArchiveText.h"

#include <cmath>
#include <cstdio>
#include <stdexcept>

#include "platform/time/CivilTime.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

constexpr std::size_t kShownOfData = 64;                 // bytes
constexpr double kLongestCivilTime = 8'000'000'000'000;  // seconds either side of 1970

std::string dateText(Date date) {
  if (!(std::abs(date.secondsSince1970) < kLongestCivilTime)) return "no date";
  const double seconds = std::floor(date.secondsSince1970);
  char fraction[8];
  std::snprintf(fraction, sizeof fraction, ".%03d",
                static_cast<int>((date.secondsSince1970 - seconds) * 1000));
  const WallTime time{std::chrono::seconds(static_cast<std::int64_t>(seconds))};
  return civilTime(time) + fraction + " UTC";
}

std::string dataText(std::string_view bytes) {
  std::string text = std::to_string(bytes.size()) + " bytes:";
  for (char c : bytes.substr(0, kShownOfData)) {
    char hex[4];
    std::snprintf(hex, sizeof hex, " %02x", static_cast<unsigned>(static_cast<unsigned char>(c)));
    text += hex;
  }
  return bytes.size() > kShownOfData ? text + " …" : text;
}

class Printer {
 public:
  /// Appends `value` to the current line.
  void add(const Value& value, std::size_t indent) {
    if (const List* list = value.list()) {
      line("list of " + std::to_string(list->size()));
      for (const Value& item : *list) begin(indent, "- ", item);
    } else if (const Dictionary* dictionary = value.dictionary()) {
      line("dictionary of " + std::to_string(dictionary->size()));
      for (const auto& entry : *dictionary) begin(indent, printable(entry.key.view()) + " = ", entry.value);
    } else if (const Date* date = value.date()) {
      line(dateText(*date));
    } else if (const Bytes* bytes = value.bytes()) {
      line(dataText(bytes->view()));
    } else {
      line(printable(describe(value, SIZE_MAX)));
    }
  }
  std::string text;

 private:
  void begin(std::size_t indent, const std::string& name, const Value& value) {
    text.append(2 * (indent + 1), ' ').append(name);
    add(value, indent + 1);
  }
  void line(std::string_view rest) { text.append(rest).append("\n"); }
};

}  // namespace

PropertyListLimits archiveLimits() {
  PropertyListLimits limits;
  limits.bytes = std::size_t{64} << 20;
  limits.nodes = 5'000'000;
  limits.contentBytes = std::size_t{256} << 20;
  return limits;
}

std::string archiveText(std::string_view archive) {
  auto value = unarchiveValue(archive, archiveLimits());
  if (!value) throw std::runtime_error(value.error().text);
  Printer printer;
  printer.add(*value, 0);
  return std::move(printer.text);
}

}  // namespace vesk

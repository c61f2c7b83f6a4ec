#include "tools/plist/XMLPropertyListWriter.h"

#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>

#include "platform/crypto/Base64.h"
#include "platform/plist/PropertyList.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

std::string textFromReal(double number) {
  char text[64];
  auto [end, error] = std::to_chars(text, text + sizeof text, number);
  return {text, end};
}

std::optional<std::string> textFromDate(Date date) {
  using namespace std::chrono;
  constexpr sys_seconds kFirst = sys_days(year(1) / 1 / 1);
  constexpr sys_seconds kAfterLast = sys_days(year(10000) / 1 / 1);
  const double wholeSeconds = std::floor(date.secondsSince1970);
  if (!(wholeSeconds >= static_cast<double>(kFirst.time_since_epoch().count())) ||
      !(wholeSeconds < static_cast<double>(kAfterLast.time_since_epoch().count()))) {
    return std::nullopt;
  }
  const sys_seconds time{seconds(static_cast<std::int64_t>(wholeSeconds))};
  const auto dayStart = floor<days>(time);
  const year_month_day calendar(dayStart);
  const hh_mm_ss clock(time - dayStart);
  char text[32];
  std::snprintf(text, sizeof text, "%04d-%02u-%02uT%02d:%02d:%02dZ", static_cast<int>(calendar.year()),
                static_cast<unsigned>(calendar.month()), static_cast<unsigned>(calendar.day()),
                static_cast<int>(clock.hours().count()), static_cast<int>(clock.minutes().count()),
                static_cast<int>(clock.seconds().count()));
  return text;
}

/// Writes one value. Every operation returns false if it can't.
class XMLWriter {
 public:
  bool write(const Value& value, std::size_t indent) {
    switch (value.kind()) {
      case Value::Kind::None:
        return false;
      case Value::Kind::Boolean:
        return writeLine(*value.boolean() ? "<true/>" : "<false/>", indent);
      case Value::Kind::Signed:
        return writeElement("integer", std::to_string(*value.signedInteger()), indent);
      case Value::Kind::Unsigned:
        return writeElement("integer", std::to_string(*value.unsignedInteger()), indent);
      case Value::Kind::Double:
        return writeElement("real", textFromReal(*value.real()), indent);
      case Value::Kind::Text:
        return writeText("string", value.text()->view(), indent);
      case Value::Kind::Bytes:
        return writeElement("data", base64Encode(value.bytes()->view()), indent);
      case Value::Kind::Date: {
        auto text = textFromDate(*value.date());
        return text && writeElement("date", *text, indent);
      }
      case Value::Kind::List:
        return writeList(*value.list(), indent);
      case Value::Kind::Dictionary:
        return writeDictionary(*value.dictionary(), indent);
    }
    return false;
  }

  std::string take() { return std::move(_out); }

 private:
  static constexpr std::size_t kDeepest = PropertyListLimits{}.depth;

  bool writeLine(std::string_view line, std::size_t indent) {
    _out.append(indent, '\t').append(line).append("\n");
    return true;
  }

  bool writeElement(std::string_view name, std::string_view content, std::size_t indent) {
    _out.append(indent, '\t').append("<").append(name).append(">");
    _out.append(content).append("</").append(name).append(">\n");
    return true;
  }

  bool writeText(std::string_view name, std::string_view text, std::size_t indent) {
    auto escaped = escape(text);
    return escaped && writeElement(name, *escaped, indent);
  }

  bool writeList(const List& list, std::size_t indent) {
    if (indent >= kDeepest) return false;
    if (list.empty()) return writeLine("<array/>", indent);
    writeLine("<array>", indent);
    for (const Value& value : list) {
      if (!write(value, indent + 1)) return false;
    }
    return writeLine("</array>", indent);
  }

  bool writeDictionary(const Dictionary& dictionary, std::size_t indent) {
    if (indent >= kDeepest) return false;
    if (dictionary.empty()) return writeLine("<dict/>", indent);
    writeLine("<dict>", indent);
    for (const auto& entry : dictionary) {
      if (!writeText("key", entry.key.view(), indent + 1) || !write(entry.value, indent + 1)) return false;
    }
    return writeLine("</dict>", indent);
  }

  static std::optional<std::string> escape(std::string_view text) {
    // XML excludes the last two characters of the plane, and readers refuse them.
    if (!isValidUTF8(text) || text.find("\xEF\xBF\xBE") != std::string_view::npos ||
        text.find("\xEF\xBF\xBF") != std::string_view::npos) {
      return std::nullopt;
    }
    std::string escaped;
    escaped.reserve(text.size());
    for (char c : text) {
      if (c == '&') {
        escaped += "&amp;";
      } else if (c == '<') {
        escaped += "&lt;";
      } else if (c == '>') {
        escaped += "&gt;";
      } else if (c == '\r') {
        // A plain carriage return would be read as a line feed.
        escaped += "&#13;";
      } else if (static_cast<unsigned char>(c) < 0x20 && c != '\t' && c != '\n') {
        return std::nullopt;
      } else {
        escaped += c;
      }
    }
    return escaped;
  }

  std::string _out;
};

}  // namespace

std::optional<std::string> writeXMLPropertyList(const Value& value) {
  XMLWriter writer;
  if (!writer.write(value, 0)) return std::nullopt;
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n" + writer.take() +
         "</plist>\n";
}

}  // namespace vesk

#include "tools/plist/XMLPropertyListWriter.h"

#include <charconv>
#include <cmath>

#include "platform/crypto/Base64.h"
#include "platform/plist/PropertyList.h"
#include "platform/unicode/UTF8.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

/// Thrown for what XML can't represent.
struct Unrepresentable {};

std::string realText(double number) {
  char text[64];
  auto [end, error] = std::to_chars(text, text + sizeof text, number);
  return {text, end};
}

std::string dateText(Date date) {
  constexpr double kYear1 = -62'135'596'800;
  constexpr double kYear10000 = 253'402'300'800;
  const double seconds = std::floor(date.secondsSince1970);
  if (!(seconds >= kYear1 && seconds < kYear10000)) throw Unrepresentable();
  return isoTime(WallTime(std::chrono::seconds(static_cast<std::int64_t>(seconds))));
}

std::string escaped(std::string_view text) {
  // XML excludes the last two characters of the plane, and readers refuse them.
  if (!isValidUTF8(text) || text.find("\xEF\xBF\xBE") != std::string_view::npos ||
      text.find("\xEF\xBF\xBF") != std::string_view::npos)
    throw Unrepresentable();
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
      escaped += "&#13;";  // a plain carriage return would be read as a line feed
    } else if (static_cast<unsigned char>(c) < 0x20 && c != '\t' && c != '\n') {
      throw Unrepresentable();
    } else {
      escaped += c;
    }
  }
  return escaped;
}

void write(const Value& value, std::size_t indent, std::string& out) {
  const auto line = [&](std::string_view text) { out.append(indent, '\t').append(text).append("\n"); };
  const auto element = [&](const std::string& name, const std::string& content) {
    line("<" + name + ">" + content + "</" + name + ">");
  };
  const auto container = [&](const std::string& name, const auto& items, const auto& writeItem) {
    if (indent >= PropertyListLimits{}.depth) throw Unrepresentable();
    if (items.empty()) return line("<" + name + "/>");
    line("<" + name + ">");
    for (const auto& item : items) writeItem(item);
    line("</" + name + ">");
  };
  if (const bool* boolean = value.boolean()) return line(*boolean ? "<true/>" : "<false/>");
  if (const auto* number = value.signedInteger()) return element("integer", std::to_string(*number));
  if (const auto* number = value.unsignedInteger()) return element("integer", std::to_string(*number));
  if (const double* number = value.real()) return element("real", realText(*number));
  if (const Text* text = value.text()) return element("string", escaped(text->view()));
  if (const Bytes* bytes = value.bytes()) return element("data", base64Encode(bytes->view()));
  if (const Date* date = value.date()) return element("date", dateText(*date));
  if (const List* list = value.list())
    return container("array", *list, [&](const Value& item) { write(item, indent + 1, out); });
  if (const Dictionary* dictionary = value.dictionary())
    return container("dict", *dictionary, [&](const DictionaryEntry& entry) {
      out.append(indent + 1, '\t').append("<key>" + escaped(entry.key.view()) + "</key>\n");
      write(entry.value, indent + 1, out);
    });
  throw Unrepresentable();
}

}  // namespace

std::optional<std::string> writeXMLPropertyList(const Value& value) {
  std::string text = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
  try {
    write(value, 0, text);
  } catch (const Unrepresentable&) {
    return std::nullopt;
  }
  return text + "</plist>\n";
}

}  // namespace vesk

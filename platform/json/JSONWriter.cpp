#include "platform/json/JSONWriter.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <utility>

#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

constexpr std::size_t kMaxDepth = 64;

/// The number of leading characters of `text` that are ASCII and need no escape in a JSON string.
std::size_t plainPrefix(std::string_view text) {
  constexpr std::uint64_t kOnes = 0x0101010101010101u;
  std::size_t at = 0;
  for (; text.size() - at >= sizeof(std::uint64_t); at += sizeof(std::uint64_t)) {
    std::uint64_t eight;
    std::memcpy(&eight, text.data() + at, sizeof eight);
    // Each term sets a byte's high bit: for control characters, quotes, backslashes and non-ASCII bytes.
    const std::uint64_t special = (eight - kOnes * 0x20) | ((eight ^ (kOnes * '"')) - kOnes) |
                                  ((eight ^ (kOnes * '\\')) - kOnes) | eight;
    if ((special & (kOnes * 0x80)) != 0) break;
  }
  auto isPlain = [](unsigned char c) { return c >= 0x20 && c < 0x80 && c != '"' && c != '\\'; };
  while (at < text.size() && isPlain(static_cast<unsigned char>(text[at]))) ++at;
  return at;
}

void appendEscaped(std::string& text, char c) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  constexpr std::string_view kSpecial = "\"\\\b\f\n\r\t";
  if (auto at = kSpecial.find(c); at != kSpecial.npos) {
    text += {'\\', "\"\\bfnrt"[at]};
  } else if (static_cast<unsigned char>(c) < 0x20) {
    text += {'\\', 'u', '0', '0', kDigits[c >> 4], kDigits[c & 15]};
  } else {
    text += c;
  }
}

}  // namespace

JSONWriter::JSONWriter(JSONStyle style, std::size_t reserve) : _isPretty(style == JSONStyle::Pretty) {
  _text.reserve(reserve);
}

void JSONWriter::breakLine() {
  if (_isPretty) _text.append(1, '\n').append(4 * _depth, ' ');
}

/// Writes the separator before a value or a key.
void JSONWriter::separate() {
  if (std::exchange(_isMember, false)) return;
  if (!std::exchange(_isFirst, false)) _text += ',';
  if (_depth > 0) breakLine();
}

bool JSONWriter::open(char bracket) {
  if (_depth == kMaxDepth) _isGood = false;
  if (!_isGood) return false;
  separate();
  _text += bracket;
  ++_depth;
  _isFirst = true;
  return true;
}

void JSONWriter::close(char bracket) {
  if (!_isGood) return;
  --_depth;
  if (!std::exchange(_isFirst, false)) breakLine();
  _text += bracket;
}

void JSONWriter::quote(std::string_view text) {
  _text += '"';
  for (bool isChecked = false; !text.empty();) {
    const std::size_t plain = plainPrefix(text);
    _text.append(text.data(), plain);
    text.remove_prefix(plain);
    if (text.empty()) break;
    if (!std::exchange(isChecked, true) && !isValidUTF8(text)) _isGood = false;
    appendEscaped(_text, text.front());
    text.remove_prefix(1);
  }
  _text += '"';
}

void JSONWriter::key(std::string_view key) {
  separate();
  quote(key);
  _text += ':';
  if (_isPretty) _text += ' ';
  _isMember = true;
}

void JSONWriter::real(double number) {
  _isGood = _isGood && std::isfinite(number);
  const double size = std::fabs(number);
  const bool isShort = size == 0 || (size >= 1e-6 && size < 1e21);
  const auto format = isShort ? std::chars_format::fixed : std::chars_format::scientific;
  char digits[32];
  const std::string_view written(digits, std::to_chars(digits, std::end(digits), number, format).ptr);
  _text.append(written);
  // So that readers recognise a double.
  if (isShort && written.find('.') == written.npos) _text.append(".0");
}

void JSONWriter::value(const Value& value) {
  if (!_isGood) return;
  if (const Dictionary* dictionary = value.dictionary()) {
    return object(dictionary->begin(), dictionary->end());
  }
  if (const List* list = value.list()) {
    if (!open('[')) return;
    for (const Value& item : *list) this->value(item);
    return close(']');
  }
  separate();
  if (const Text* text = value.text()) return quote(text->view());
  if (const auto* number = value.signedInteger()) _text += std::to_string(*number);
  if (const auto* number = value.unsignedInteger()) _text += std::to_string(*number);
  if (const double* number = value.real()) return real(*number);
  if (const Date* date = value.date()) return real(date->secondsSince1970);
  if (const bool* flag = value.boolean()) _text.append(*flag ? "true" : "false");
  if (value.isNone()) _text.append("null");
  if (value.bytes()) _isGood = false;
}

void JSONWriter::value(const MutableDictionary& dictionary) {
  object(dictionary.entries().data(), dictionary.entries().data() + dictionary.size());
}

void JSONWriter::object(const DictionaryEntry* begin, const DictionaryEntry* end) {
  if (!open('{')) return;
  for (const DictionaryEntry* entry = begin; entry != end; ++entry) {
    key(entry->key.view());
    value(entry->value);
  }
  close('}');
}

std::optional<std::string> JSONWriter::finish() {
  if (!_isGood) return std::nullopt;
  return std::move(_text);
}

std::optional<std::string> toJSON(const Value& value, JSONStyle style) {
  JSONWriter writer(style);
  writer.value(value);
  return writer.finish();
}

}  // namespace vesk

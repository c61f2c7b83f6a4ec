#include "backends/dashboard/DashboardText.h"

#include <algorithm>
#include <cstring>
#include <vector>

#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::string_view kSpecial = "\n\\=";

/// A pair to be written. Refers to its text without a copy.
struct Pair {
  explicit Pair(const DictionaryEntry& entry) : key(entry.key.view()) {
    if (const Text* valueText = entry.value.text()) {
      referred = valueText->view();
      isReferred = true;
    } else {
      made = descriptionForObject(entry.value);
    }
    units = unitsIn(description());
  }

  std::string_view description() const { return isReferred ? referred : std::string_view(made); }

  /// UTF-16 code units: one per character, two for those above U+FFFF.
  static std::size_t unitsIn(std::string_view utf8) {
    std::size_t count = 0;
    for (char c : utf8) {
      const auto byte = static_cast<unsigned char>(c);
      count += (byte & 0xC0) != 0x80;
      count += byte >= 0xF0;
    }
    return count;
  }

  std::string_view key;
  std::string_view referred;
  std::string made;
  bool isReferred = false;
  std::size_t units = 0;
};

/// A fixed buffer that cuts off what doesn't fit.
class Area {
 public:
  Area(char* start, std::size_t size) : _start(start), _room(size - 1) {}
  void append(std::string_view text) {
    const std::size_t count = std::min(text.size(), _room - _length);
    std::memcpy(_start + _length, text.data(), count);
    _length += count;
  }
  bool isFull() const { return _length == _room; }
  std::size_t length() const { return _length; }

 private:
  char* const _start;
  const std::size_t _room;
  std::size_t _length = 0;
};

bool needsSanitizing(std::string_view text) {
  return text.empty() || text.find_first_of(kSpecial) != std::string_view::npos;
}

}  // namespace

std::string descriptionForObject(const std::optional<Value>& object) {
  return (object ? stringForm(*object) : std::nullopt).value_or("null");
}

std::string sanitize(std::string_view text) {
  std::string clean;
  clean.reserve(text.size() + 8);
  for (char c : text) {
    if (c == '\n') continue;
    if (c == '\\' || c == '=') clean += '\\';
    clean += c;
  }
  return clean.empty() ? "empty" : clean;
}

std::size_t writePayloadText(const Dictionary& payload, char* area, std::size_t size) {
  std::vector<Pair> pairs;
  pairs.reserve(payload.size());
  for (const auto& entry : payload) pairs.emplace_back(entry);
  std::stable_sort(pairs.begin(), pairs.end(),
                   [](const Pair& a, const Pair& b) { return a.units < b.units; });
  Area text(area, size);
  for (const Pair& pair : pairs) {
    if (text.isFull()) break;
    text.append(" ");
    text.append(pair.key);
    text.append("=");
    const std::string_view description = pair.description();
    text.append(needsSanitizing(description) ? std::string_view(sanitize(description)) : description);
  }
  return text.length();
}

}  // namespace vesk

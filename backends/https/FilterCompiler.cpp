#include "backends/https/FilterCompiler.h"

#include <charconv>
#include <cstdint>
#include <limits>
#include <string>
#include <unordered_set>

#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"
#include "platform/text/ASCII.h"

namespace vesk {

namespace {

constexpr std::size_t kShown = 64;  // bytes of a value in a log line
constexpr std::size_t kMostRemembered = 256;
constexpr std::int32_t kAny = -1;

/// The faults found in one list of filters, one line each.
class Faults {
 public:
  explicit Faults(std::string_view backendName) : _backendName(backendName) {}

  void add(std::size_t index, const std::string& problem, const Value& value, std::string_view consequence) {
    _lines.push_back(_backendName + ": filter " + std::to_string(index) + ": " + problem + ": " +
                     describe(value, kShown) + "; the filter " + std::string(consequence));
  }

  /// Logs the faults unless the same filters were reported before.
  void report(const List& filters) const {
    if (_lines.empty() || !isNew(filters)) return;
    for (const std::string& line : _lines) {
      VESK_LOG_WARNING("HTTPSPostBackend(createFiltersFromArray): %s", line.c_str());
    }
  }

 private:
  bool isNew(const List& filters) const {
    static Mutex mutex;
    static std::unordered_set<std::size_t> reported;
    constexpr std::size_t kWhole = std::numeric_limits<std::size_t>::max();
    const std::size_t identity = std::hash<std::string>()(_backendName + describe(filters, kWhole));
    MutexLock lock(mutex);
    if (reported.contains(identity)) return false;
    if (reported.size() >= kMostRemembered) reported.clear();
    return reported.insert(identity).second;
  }

  const std::string _backendName;
  std::vector<std::string> _lines;
};

std::optional<std::int32_t> numberOf32Bits(std::string_view text) {
  text = trimmed(text);
  std::int32_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<std::int32_t> numberOf32Bits(const Value& value) {
  if (const Text* text = value.text()) return numberOf32Bits(text->view());
  const auto number = value.asDouble();  // holds every 32-bit integer
  using Limits = std::numeric_limits<std::int32_t>;
  if (!number || !(*number >= Limits::min() && *number <= Limits::max())) return std::nullopt;
  return static_cast<std::int32_t>(*number);
}

std::int32_t actionOf(const Dictionary& source, std::size_t index, Faults& faults) {
  const Value* value = source.find("action");
  if (!value) return filterTag::Leave;
  const Text* text = value->text();
  if (text && *text == Text::literal("remove")) return filterTag::Remove;
  if (text && *text == Text::literal("sha256")) return filterTag::Digest;
  faults.add(index, "'action' is unknown", *value, "leaves values as they are");
  return filterTag::Leave;
}

void setKey(filterTag& filter, const Dictionary& source, std::size_t index, Faults& faults) {
  const Value* value = source.find("key");
  if (!value) return;
  if (const Text* text = value->text()) {
    filter.key = *text;
  } else {
    faults.add(index, "'key' is not a text", *value, "applies to nothing");
  }
}

/// The method or status that the filter is limited to.
std::int32_t limitOf(filterTag& filter, const Dictionary& source, std::string_view field, std::size_t index,
                     Faults& faults) {
  const Value* value = source.find(field);
  if (!value) return kAny;
  if (auto number = numberOf32Bits(*value)) return *number;
  const bool hides = filter.action != filterTag::Leave;
  if (!hides) filter.key.reset();  // otherwise it would shield every value from later filters
  faults.add(index, "'" + std::string(field) + "' is not an integer of 32 bits", *value,
             hides ? "applies to any" : "applies to nothing");
  return kAny;
}

filterTag compile(const Value& element, std::size_t index, Faults& faults) {
  filterTag filter;
  const Dictionary* source = element.dictionary();
  if (!source) {
    faults.add(index, "not a dictionary", element, "applies to nothing");
    return filter;
  }
  filter.action = actionOf(*source, index, faults);
  setKey(filter, *source, index, faults);
  filter.method = limitOf(filter, *source, "method", index, faults);
  filter.status = limitOf(filter, *source, "status", index, faults);
  return filter;
}

}  // namespace

std::vector<filterTag> compileFilters(const List& filters, std::string_view backendName) {
  std::vector<filterTag> table;
  table.reserve(filters.size());
  Faults faults{backendName};
  for (const Value& element : filters) table.push_back(compile(element, table.size(), faults));
  faults.report(filters);
  return table;
}

}  // namespace vesk

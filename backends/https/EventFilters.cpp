#include "backends/https/EventFilters.h"

#include <algorithm>

#include "backends/VeskReportingBackend.h"
#include "backends/https/FilterCompiler.h"
#include "platform/unicode/Unicode.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

bool isASCII(std::string_view text) {
  return std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

// A key in ASCII matches only keys of the same length, or longer keys that are not ASCII (the Kelvin sign
// folds to k). This decides most cases without a comparison.
bool matchesKey(const filterTag& filter, std::string_view key) {
  if (!filter.key) return false;
  std::size_t wanted = filter.key->size();
  if (filter.keyIsASCII && (key.size() < wanted || (key.size() > wanted && isASCII(key)))) return false;
  return equalsIgnoringCase(key, filter.key->view());
}

std::int32_t numberIn(const MutableDictionary& event, std::string_view key) {
  const Value* value = event.find(key);
  return value ? static_cast<std::int32_t>(integerForm(*value)) : 0;
}

// Texts are digested as they are, numbers and dates as the decimal text of the number that the body would
// carry. Other values have no text to digest and are removed, because a value that should be hidden must not
// leave in the clear.
std::optional<Value> digested(const Value& value) {
  if (const Text* text = value.text()) return Value(VeskReportingBackend::convertIntoSHA256(text->view()));
  if (const Date* date = value.date()) return digested(finiteOrMinusOne(date->secondsSince1970));
  if (value.isNumber()) return Value(VeskReportingBackend::convertIntoSHA256(*stringForm(value)));
  return std::nullopt;
}

}  // namespace

void EventFilters::createFiltersFromArray(const List& filters, std::string_view backendName) {
  if (filters.empty()) return;
  _filters = compileFilters(filters, backendName);
  for (filterTag& filter : _filters) filter.keyIsASCII = filter.key && isASCII(filter.key->view());
}

const filterTag* EventFilters::decidingFilter(const Text& key, std::int32_t method,
                                              std::int32_t status) const {
  for (const filterTag& filter : _filters) {
    if (filter.method >= 0 && filter.method != method) continue;
    if (filter.status >= 0 && filter.status != status) continue;
    if (matchesKey(filter, key.view())) return &filter;
  }
  return nullptr;
}

void EventFilters::filterEvent(MutableDictionary& event) const {
  if (_filters.empty()) return;
  std::int32_t method = numberIn(event, "_method");
  std::int32_t status = numberIn(event, "_status");
  std::erase_if(event.entries(), [&](DictionaryEntry& entry) {
    const filterTag* filter = decidingFilter(entry.key, method, status);
    if (!filter || filter->action == filterTag::Leave) return false;
    if (filter->action == filterTag::Remove) return true;
    auto digest = digested(entry.value);
    if (!digest) return true;
    entry.value = std::move(*digest);
    return false;
  });
}

}  // namespace vesk

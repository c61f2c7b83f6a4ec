#include "tools/storebag/FieldChanges.h"

#include <algorithm>
#include <cstdint>
#include <map>
#include <set>
#include <utility>

#include "backends/https/FilterCompiler.h"
#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

enum class Fate : unsigned char { Leaves, LeavesDigested, Removed };

/// A category and a type of messages; -1 is any that no filter names.
using MessageKind = std::pair<std::int32_t, std::int32_t>;

std::string changeTo(Fate before, Fate after) {
  if (after == Fate::Removed)
    return before == Fate::Leaves ? "no longer leaves" : "no longer leaves as a digest";
  if (after == Fate::LeavesDigested)
    return before == Fate::Leaves ? "leaves only as a digest now" : "leaves as a digest now";
  return before == Fate::Removed ? "leaves now" : "leaves in the clear now";
}

std::string nameOf(const MessageKind& kind) {
  if (kind.first < 0 && kind.second < 0) return "all other messages";
  std::string name = "messages of";
  if (kind.first >= 0) name += " category " + std::to_string(kind.first);
  if (kind.second >= 0) name += " type " + std::to_string(kind.second);
  return name;
}

/// The filters before and after a change, with the questions to ask both.
class Comparison {
 public:
  Comparison(const List& before, const List& after) {
    _before.createFiltersFromArray(before, "storebag");
    _after.createFiltersFromArray(after, "storebag");
    for (const List* filters : {&before, &after}) {
      for (const filterTag& filter : compileFilters(*filters, "storebag")) note(filter);
    }
    while (_numbers.contains(_unnamed)) --_unnamed;
  }

  std::vector<std::string> changes() const {
    std::vector<std::string> all;
    for (const auto& [folded, key] : _spellings) {
      for (auto& change : changesOf(folded, key)) all.push_back(std::move(change));
    }
    return all;
  }

 private:
  void note(const filterTag& filter) {
    if (!filter.key) return;
    const std::string folded = lowercase(filter.key->view());
    _spellings.emplace(folded, *filter.key);
    auto& kinds = _kinds[folded];
    kinds.insert({-1, -1});
    kinds.insert({std::max(filter.method, -1), std::max(filter.status, -1)});
    _numbers.insert({filter.method, filter.status});
  }

  std::vector<std::string> changesOf(const std::string& folded, const Text& key) const {
    const auto& kinds = _kinds.at(folded);
    std::map<std::string, std::vector<MessageKind>> byChange;
    for (const MessageKind& kind : kinds) {
      const Fate before = fateOf(_before, key, kind), after = fateOf(_after, key, kind);
      if (before != after) byChange[changeTo(before, after)].push_back(kind);
    }
    std::vector<std::string> all;
    for (const auto& [change, changed] : byChange) {
      std::string text = "'" + key.string() + "' " + change;
      if (changed.size() < kinds.size()) {
        std::string names;
        for (const auto& kind : changed) names += (names.empty() ? "" : ", ") + nameOf(kind);
        text += " in " + names;
      }
      all.push_back(std::move(text));
    }
    return all;
  }

  Fate fateOf(const EventFilters& filters, const Text& key, const MessageKind& kind) const {
    const auto numberOf = [&](std::int32_t number) { return number < 0 ? _unnamed : number; };
    MutableDictionary event(
        Dictionary{{"_method", numberOf(kind.first)}, {"_status", numberOf(kind.second)}});
    if (!event.contains(key.view())) event.set(key, "value");
    const Value sent = *event.find(key.view());
    filters.filterEvent(event);
    const Value* left = event.find(key.view());
    if (left == nullptr) return Fate::Removed;
    return *left == sent ? Fate::Leaves : Fate::LeavesDigested;
  }

  EventFilters _before;
  EventFilters _after;
  std::map<std::string, Text> _spellings;  // by their lower case
  std::map<std::string, std::set<MessageKind>> _kinds;
  std::set<std::int32_t> _numbers;
  std::int32_t _unnamed = 65535;  // a category and type that no filter names
};

}  // namespace

std::vector<std::string> fieldChanges(const List& before, const List& after) {
  return Comparison(before, after).changes();
}

}  // namespace vesk

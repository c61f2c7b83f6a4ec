// A payload in the form that adaptors receive.
#pragma once

#include <VeskReporting/WrenAdaptor.h>

#include <deque>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The C view of a dictionary. Refers to the dictionary's text and bytes, so the dictionary must outlive it.
class WrenPayload {
 public:
  explicit WrenPayload(const Dictionary& dictionary) : _view(viewOf(dictionary)) {}
  WrenPayload(const WrenPayload&) = delete;
  WrenPayload& operator=(const WrenPayload&) = delete;

  const VeskDictionaryView& view() const noexcept { return _view; }

 private:
  VeskDictionaryView viewOf(const Dictionary& dictionary);
  VeskListView viewOf(const List& list);
  VeskValueView viewOf(const Value& value);

  // The targets of the views' pointers; a deque never moves its elements.
  std::deque<std::vector<VeskEntryView>> _entries;
  std::deque<std::vector<VeskValueView>> _values;
  VeskDictionaryView _view;
};

}  // namespace vesk

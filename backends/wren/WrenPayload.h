// A payload as adaptors see it.
#pragma once

#include <VeskReporting/WrenAdaptor.h>

#include <deque>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The C view of a dictionary. It borrows the dictionary's texts and bytes, which must outlive it.
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

  // What the views point to; nothing in them moves once it is pointed to.
  std::deque<std::vector<VeskEntryView>> _entries;
  std::deque<std::vector<VeskValueView>> _values;
  VeskDictionaryView _view;
};

}  // namespace vesk

// The text form of a value.
#pragma once

#include <cstdio>
#include <string>

#include "Value.h"

namespace vesk {

namespace detail {

class Describer {
 public:
  explicit Describer(std::size_t limit) : _limit(limit) {}

  void add(const Value& value) {
    if (!full()) value.visit(*this);
  }

  void operator()(std::monostate) { _out += "null"; }
  void operator()(bool flag) { _out += flag ? "true" : "false"; }
  void operator()(std::int64_t number) { _out += std::to_string(number); }
  void operator()(std::uint64_t number) { _out += std::to_string(number); }
  void operator()(double number) {
    char buffer[32];
    std::snprintf(buffer, sizeof buffer, "%.15g", number);
    _out += buffer;
  }
  void operator()(const Bytes& bytes) { _out += "<" + std::to_string(bytes.size()) + " bytes>"; }
  void operator()(Date date) {
    _out += '@';
    (*this)(date.secondsSince1970);
  }

  void operator()(const Text& text) {
    _out += '"';
    for (char c : text.view()) {
      if (full()) return;
      // Control characters must not split a log line.
      const auto byte = static_cast<unsigned char>(c);
      if (byte < 0x20 || byte == 0x7f) {
        char buffer[8];
        std::snprintf(buffer, sizeof buffer, "\\x%02x", byte);
        _out += buffer;
      } else {
        _out += c;
      }
    }
    _out += '"';
  }

  void operator()(const List& list) {
    addItems('[', list, [this](const Value& value) { add(value); });
    if (!full()) _out += ']';
  }

  void operator()(const Dictionary& dictionary) {
    addItems('{', dictionary, [this](const DictionaryEntry& entry) {
      (*this)(entry.key);
      _out += ": ";
      add(entry.value);
    });
    if (!full()) _out += '}';
  }

  std::string finish() {
    if (_out.size() > _limit) {
      _out.resize(_limit);
      while (!_out.empty() && (static_cast<unsigned char>(_out.back()) & 0xC0) == 0x80) _out.pop_back();
      if (!_out.empty() && static_cast<unsigned char>(_out.back()) >= 0xC0) _out.pop_back();
      _out += "…";
    }
    return std::move(_out);
  }

 private:
  bool full() const { return _out.size() > _limit; }

  template <class Items, class AddItem>
  void addItems(char bracket, const Items& items, const AddItem& addItem) {
    _out += bracket;
    for (const auto& item : items) {
      if (full()) return;
      if (&item != items.begin()) _out += ", ";
      addItem(item);
    }
  }

  std::size_t _limit;
  std::string _out;
};

}  // namespace detail

VESK_VALUES_INLINE std::string describe(const Value& value, std::size_t limit) {
  detail::Describer describer(limit);
  describer.add(value);
  return describer.finish();
}

}  // namespace vesk

#include <cstdio>

#include <VeskReporting/values/Value.h>

namespace vesk {

namespace {

class Describer {
 public:
  explicit Describer(std::size_t limit) : _limit(limit) {}

  void add(const Value& value) {
    if (full()) return;
    switch (value.kind()) {
      case Value::Kind::None:
        _out += "null";
        break;
      case Value::Kind::Boolean:
        _out += *value.boolean() ? "true" : "false";
        break;
      case Value::Kind::Signed:
        _out += std::to_string(*value.signedInteger());
        break;
      case Value::Kind::Unsigned:
        _out += std::to_string(*value.unsignedInteger());
        break;
      case Value::Kind::Double:
        addNumber(*value.real());
        break;
      case Value::Kind::Text:
        addText(value.text()->view());
        break;
      case Value::Kind::Bytes:
        _out += "<" + std::to_string(value.bytes()->size()) + " bytes>";
        break;
      case Value::Kind::Date:
        _out += "@";
        addNumber(value.date()->secondsSince1970);
        break;
      case Value::Kind::List:
        addList(*value.list());
        break;
      case Value::Kind::Dictionary:
        addDictionary(*value.dictionary());
        break;
    }
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

  void addNumber(double number) {
    char buffer[32];
    std::snprintf(buffer, sizeof buffer, "%.15g", number);
    _out += buffer;
  }

  void addText(std::string_view text) {
    _out += '"';
    for (char c : text) {
      if (full()) return;
      // Control characters must not split a log line.
      if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) {
        char buffer[8];
        std::snprintf(buffer, sizeof buffer, "\\x%02x", static_cast<unsigned char>(c));
        _out += buffer;
      } else {
        _out += c;
      }
    }
    _out += '"';
  }

  void addList(const List& list) {
    _out += "[";
    bool first = true;
    for (const auto& value : list) {
      if (full()) return;
      if (!std::exchange(first, false)) _out += ", ";
      add(value);
    }
    _out += "]";
  }

  void addDictionary(const Dictionary& dictionary) {
    _out += "{";
    bool first = true;
    for (const auto& entry : dictionary) {
      if (full()) return;
      if (!std::exchange(first, false)) _out += ", ";
      addText(entry.key.view());
      _out += ": ";
      add(entry.value);
    }
    _out += "}";
  }

  std::size_t _limit;
  std::string _out;
};

}  // namespace

std::string describe(const Value& value, std::size_t limit) {
  Describer describer(limit);
  describer.add(value);
  return describer.finish();
}

}  // namespace vesk

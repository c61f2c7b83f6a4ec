#include "platform/json/JSONWriter.h"

#include <algorithm>
#include <array>
#include <limits>

#include "platform/json/JSONOutput.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

constexpr std::size_t kDeepest = 64;

}  // namespace

/// Follows the order of calls, so that RapidJSON, which asserts it, never sees a wrong one.
class JSONWriter::Impl {
 public:
  virtual ~Impl() = default;

  bool good() const { return _isGood; }
  virtual std::string take() = 0;

  void key(std::string_view key) {
    const bool isInOrder = _depth > 0 && !_levels[_depth - 1].isArray && !_levels[_depth - 1].hasKey;
    if (!check(isInOrder)) return;
    _levels[_depth - 1].hasKey = true;
    check(writeKey(key));
  }

  void open(bool isArray) {
    if (!beginValue() || !check(_depth < kDeepest)) return;
    _levels[_depth++] = {isArray, false};
    check(isArray ? writeStartArray() : writeStartObject());
  }

  void close(bool isArray) {
    if (!check(_depth > 0 && _levels[_depth - 1].isArray == isArray && !_levels[_depth - 1].hasKey)) return;
    --_depth;
    check(isArray ? writeEndArray() : writeEndObject());
  }

  /// Writes one value with `write` when one may stand here.
  template <class Write>
  void value(Write write) {
    if (beginValue()) check(write(*this, _depth));
  }

  bool isComplete() const { return _isGood && _hasRoot && _depth == 0; }

  // One value or part, without a look at the order; false when it can't be written.
  virtual bool writeKey(std::string_view key) = 0;
  virtual bool writeText(std::string_view text) = 0;
  virtual bool writeScalar(const Value& value) = 0;
  virtual bool writeValue(const Value& value, std::size_t depth) = 0;
  virtual bool writeEntries(const DictionaryEntry* begin, const DictionaryEntry* end, std::size_t depth) = 0;
  virtual bool writeList(const List& list, std::size_t depth) = 0;
  virtual bool writeStartObject() = 0;
  virtual bool writeEndObject() = 0;
  virtual bool writeStartArray() = 0;
  virtual bool writeEndArray() = 0;

 private:
  struct Level {
    bool isArray;
    bool hasKey;
  };

  bool check(bool isGood) {
    _isGood = _isGood && isGood;
    return _isGood;
  }

  bool beginValue() {
    if (_depth == 0) {
      if (!check(!_hasRoot)) return false;
      _hasRoot = true;
      return true;
    }
    Level& level = _levels[_depth - 1];
    if (!check(level.isArray || level.hasKey)) return false;
    level.hasKey = false;
    return true;
  }

  bool _isGood = true;
  bool _hasRoot = false;
  std::size_t _depth = 0;
  std::array<Level, kDeepest> _levels{};
};

namespace {

template <class Writer>
class StyledImpl final : public JSONWriter::Impl {
 public:
  explicit StyledImpl(std::size_t reserve) : _output(reserve), _writer(_output) {}

  std::string take() override { return _output.take(); }

  bool writeKey(std::string_view key) override { return writeText(key); }

  bool writeText(std::string_view text) override {
    if (text.size() > kLongestText) return false;
    if (text.empty()) return _writer.String("", 0);
    // RapidJSON validates as it goes, but takes as many bytes as the first of a sequence announces, be they
    // beyond the end of the text.
    const std::string_view end = text.substr(text.size() - std::min<std::size_t>(text.size(), 3));
    const bool mayRunOver = std::any_of(end.begin(), end.end(), [](char c) { return (c & 0x80) != 0; });
    if (mayRunOver && !isValidUTF8(text)) return false;
    return _writer.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
  }

  bool writeReal(double number) { return std::isfinite(number) && _writer.Double(number); }

  bool writeScalar(const Value& value) override {
    switch (value.kind()) {
      case Value::Kind::None:
        return _writer.Null();
      case Value::Kind::Boolean:
        return _writer.Bool(*value.boolean());
      case Value::Kind::Signed:
        return _writer.Int64(*value.signedInteger());
      case Value::Kind::Unsigned:
        return _writer.Uint64(*value.unsignedInteger());
      case Value::Kind::Double:
        return writeReal(*value.real());
      case Value::Kind::Date:
        return writeReal(value.date()->secondsSince1970);
      case Value::Kind::Text:
        return writeText(value.text()->view());
      default:
        return false;
    }
  }

  bool writeValue(const Value& value, std::size_t depth) override {
    if (const Dictionary* dictionary = value.dictionary()) {
      return writeEntries(dictionary->begin(), dictionary->end(), depth);
    }
    if (const List* list = value.list()) return writeList(*list, depth);
    return writeScalar(value);
  }

  bool writeEntries(const DictionaryEntry* begin, const DictionaryEntry* end, std::size_t depth) override {
    if (depth >= kDeepest || !_writer.StartObject()) return false;
    for (const DictionaryEntry* entry = begin; entry != end; ++entry) {
      if (!writeText(entry->key.view()) || !writeValue(entry->value, depth + 1)) return false;
    }
    return _writer.EndObject();
  }

  bool writeList(const List& list, std::size_t depth) override {
    if (depth >= kDeepest || !_writer.StartArray()) return false;
    for (const Value& value : list) {
      if (!writeValue(value, depth + 1)) return false;
    }
    return _writer.EndArray();
  }

  bool writeStartObject() override { return _writer.StartObject(); }
  bool writeEndObject() override { return _writer.EndObject(); }
  bool writeStartArray() override { return _writer.StartArray(); }
  bool writeEndArray() override { return _writer.EndArray(); }

 private:
  // RapidJSON counts in 32 bits and reserves up to six bytes for one.
  static constexpr std::size_t kLongestText = std::numeric_limits<rapidjson::SizeType>::max() / 8;

  JSONOutput _output;
  Writer _writer;
};

}  // namespace

JSONWriter::JSONWriter(JSONStyle style, std::size_t reserve) {
  if (style == JSONStyle::Pretty) {
    _impl = std::make_unique<StyledImpl<PrettyJSONWriter>>(reserve);
  } else {
    _impl = std::make_unique<StyledImpl<CompactJSONWriter>>(reserve);
  }
}

JSONWriter::JSONWriter(JSONWriter&&) noexcept = default;
JSONWriter& JSONWriter::operator=(JSONWriter&&) noexcept = default;
JSONWriter::~JSONWriter() = default;

void JSONWriter::beginObject() { _impl->open(false); }
void JSONWriter::endObject() { _impl->close(false); }
void JSONWriter::beginArray() { _impl->open(true); }
void JSONWriter::endArray() { _impl->close(true); }
void JSONWriter::key(std::string_view key) { _impl->key(key); }

void JSONWriter::value(const Value& value) {
  _impl->value([&](Impl& impl, std::size_t depth) { return impl.writeValue(value, depth); });
}

void JSONWriter::value(const Dictionary& dictionary) {
  _impl->value([&](Impl& impl, std::size_t depth) {
    return impl.writeEntries(dictionary.begin(), dictionary.end(), depth);
  });
}

void JSONWriter::value(const MutableDictionary& dictionary) {
  _impl->value([&](Impl& impl, std::size_t depth) {
    const auto& entries = dictionary.entries();
    return impl.writeEntries(entries.data(), entries.data() + entries.size(), depth);
  });
}

void JSONWriter::value(const List& list) {
  _impl->value([&](Impl& impl, std::size_t depth) { return impl.writeList(list, depth); });
}

void JSONWriter::text(std::string_view text) {
  _impl->value([&](Impl& impl, std::size_t) { return impl.writeText(text); });
}

void JSONWriter::number(double number) { value(Value(number)); }

std::optional<std::string> JSONWriter::finish() {
  if (!_impl->isComplete()) return std::nullopt;
  return _impl->take();
}

std::optional<std::string> toJSON(const Value& value, JSONStyle style) {
  JSONWriter writer(style);
  writer.value(value);
  return writer.finish();
}

}  // namespace vesk

#include "platform/json/JSONWriter.h"

// The flags parameter of PrettyWriter itself does not compile in this version of the library.
#define RAPIDJSON_WRITE_DEFAULT_FLAGS kWriteValidateEncodingFlag
#include <rapidjson/prettywriter.h>
#include <rapidjson/writer.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <limits>
#include <utility>

namespace vesk {

namespace {

constexpr std::size_t kDeepest = 64;

/// Where the text goes: the string that the caller gets in the end. Its size runs ahead of what is written.
class Output {
 public:
  using Ch = char;

  explicit Output(std::size_t reserve) { grow(std::max<std::size_t>(reserve, 64)); }

  void Put(char c) { *Push(1) = c; }
  void PutUnsafe(char c) { *_at++ = c; }
  void Reserve(std::size_t count) {
    if (static_cast<std::size_t>(_end - _at) < count) grow(count);
  }
  void Flush() {}

  /// Room for `count` characters, which count as written; `Pop` takes unused ones back.
  char* Push(std::size_t count) {
    Reserve(count);
    return std::exchange(_at, _at + count);
  }
  void Pop(std::size_t count) { _at -= count; }

  /// Copies what has been reserved before.
  void appendUnsafe(const char* text, std::size_t size) {
    std::memcpy(_at, text, size);
    _at += size;
  }

  std::string take() {
    _text.resize(static_cast<std::size_t>(_at - _text.data()));
    return std::move(_text);
  }

 private:
  void grow(std::size_t count) {
    const std::size_t written = _at ? static_cast<std::size_t>(_at - _text.data()) : 0;
    _text.resize(std::max(written + count, 2 * _text.size()));
    _at = _text.data() + written;
    _end = _text.data() + _text.size();
  }

  std::string _text;
  char* _at = nullptr;
  char* _end = nullptr;
};

// RapidJSON finds these by argument and so reserves once a text instead of asking at every character.
[[maybe_unused]] void PutReserve(Output& output, std::size_t count) { output.Reserve(count); }
[[maybe_unused]] void PutUnsafe(Output& output, char c) { output.PutUnsafe(c); }

using CompactWriter = rapidjson::Writer<Output>;
using PrettyWriter = rapidjson::PrettyWriter<Output>;

bool isPlain(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return byte >= 0x20 && byte < 0x80 && byte != '"' && byte != '\\';
}

bool areEightPlain(const char* text) {
  constexpr std::uint64_t kOnes = 0x0101010101010101u;
  constexpr std::uint64_t kHigh = 0x8080808080808080u;
  std::uint64_t eight;
  std::memcpy(&eight, text, sizeof eight);
  // A byte's high bit comes out set when that byte is a control character, a quote, a backslash, or not
  // ASCII.
  auto equals = [&](char c) {
    const std::uint64_t zeroWhereEqual = eight ^ (kOnes * static_cast<unsigned char>(c));
    return zeroWhereEqual - kOnes;
  };
  return (((eight - kOnes * 0x20) | equals('"') | equals('\\') | eight) & kHigh) == 0;
}

}  // namespace

}  // namespace vesk

// The places that RapidJSON keeps for output streams that can do better than one character at a time, as its
// own string buffer does.
namespace rapidjson {

/// Copies up to the next character that needs a closer look; false at the end of the text.
template <>
inline bool vesk::CompactWriter::ScanWriteUnescapedString(StringStream& text, std::size_t length) {
  const char* const end = text.head_ + length;
  const char* plainEnd = text.src_;
  while (end - plainEnd >= 8 && vesk::areEightPlain(plainEnd)) plainEnd += 8;
  while (plainEnd != end && vesk::isPlain(*plainEnd)) ++plainEnd;
  os_->appendUnsafe(text.src_, static_cast<std::size_t>(plainEnd - text.src_));
  text.src_ = plainEnd;
  return plainEnd != end;
}

template <>
inline bool vesk::CompactWriter::WriteInt64(std::int64_t number) {
  char* const start = os_->Push(21);
  os_->Pop(static_cast<std::size_t>(start + 21 - internal::i64toa(number, start)));
  return true;
}

template <>
inline bool vesk::CompactWriter::WriteUint64(std::uint64_t number) {
  char* const start = os_->Push(20);
  os_->Pop(static_cast<std::size_t>(start + 20 - internal::u64toa(number, start)));
  return true;
}

template <>
inline bool vesk::CompactWriter::WriteDouble(double number) {
  if (!std::isfinite(number)) return false;
  char* const start = os_->Push(25);
  os_->Pop(static_cast<std::size_t>(start + 25 - internal::dtoa(number, start, maxDecimalPlaces_)));
  return true;
}

}  // namespace rapidjson

namespace vesk {

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
    return text.size() <= kLongestText &&
           _writer.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
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

  Output _output;
  Writer _writer;
};

}  // namespace

JSONWriter::JSONWriter(JSONStyle style, std::size_t reserve) {
  if (style == JSONStyle::Pretty) {
    _impl = std::make_unique<StyledImpl<PrettyWriter>>(reserve);
  } else {
    _impl = std::make_unique<StyledImpl<CompactWriter>>(reserve);
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

void JSONWriter::integer(std::int64_t number) { value(Value(number)); }
void JSONWriter::unsignedInteger(std::uint64_t number) { value(Value(number)); }
void JSONWriter::number(double number) { value(Value(number)); }
void JSONWriter::boolean(bool boolean) { value(Value(boolean)); }
void JSONWriter::null() { value(Value()); }

bool JSONWriter::good() const noexcept { return _impl->good(); }

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

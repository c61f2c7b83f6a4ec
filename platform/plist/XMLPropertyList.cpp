#include <expat.h>

#include <array>
#include <charconv>
#include <chrono>
#include <memory>
#include <optional>
#include <vector>

#include "platform/crypto/Base64.h"
#include "platform/plist/PropertyListFormats.h"
#include "platform/text/ASCII.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

constexpr std::size_t kShown = 64;  // bytes shown of a faulty text

enum class Element { Unknown, PList, Dict, Array, Key, String, Integer, Real, True, False, Date, Data };

Element elementNamed(std::string_view name) {
  struct Name {
    std::string_view name;
    Element element;
  };
  constexpr std::array<Name, 11> kNames = {{{"key", Element::Key},
                                            {"string", Element::String},
                                            {"dict", Element::Dict},
                                            {"integer", Element::Integer},
                                            {"true", Element::True},
                                            {"false", Element::False},
                                            {"array", Element::Array},
                                            {"real", Element::Real},
                                            {"date", Element::Date},
                                            {"data", Element::Data},
                                            {"plist", Element::PList}}};
  for (const auto& known : kNames) {
    if (known.name == name) return known.element;
  }
  return Element::Unknown;
}

bool isContainer(Element element) { return element <= Element::Array; }

/// Parses all of `text`, digits only, as a number.
std::optional<std::uint64_t> digits(std::string_view text, int base) {
  std::uint64_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return number;
}

/// Removes `count` digits and the character after them from `text`.
std::optional<unsigned> takeField(std::string_view& text, std::size_t count, char after) {
  if (text.size() <= count || text[count] != after) return std::nullopt;
  auto number = digits(text.substr(0, count), 10);
  text.remove_prefix(count + 1);
  return number ? std::optional<unsigned>(static_cast<unsigned>(*number)) : std::nullopt;
}

/// Decimal or, after "0x", hexadecimal. Signed if it fits.
std::optional<Value> integerIn(std::string_view text) {
  text = trimmed(text);
  bool isNegative = false;
  if (!text.empty() && (text[0] == '-' || text[0] == '+')) {
    isNegative = text[0] == '-';
    text.remove_prefix(1);
  }
  const bool isHexadecimal = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
  auto magnitude = isHexadecimal ? digits(text.substr(2), 16) : digits(text, 10);
  if (!magnitude) return std::nullopt;
  constexpr std::uint64_t kSignedLimit = std::uint64_t{1} << 63;
  if (isNegative) {
    if (*magnitude > kSignedLimit) return std::nullopt;
    return Value(static_cast<std::int64_t>(0 - *magnitude));
  }
  return *magnitude < kSignedLimit ? Value(static_cast<std::int64_t>(*magnitude)) : Value(*magnitude);
}

std::optional<double> realIn(std::string_view text) {
  text = trimmed(text);
  if (text.size() > 1 && text[0] == '+' && text[1] != '-') text.remove_prefix(1);
  double number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return number;
}

/// "2026-11-24T20:31:29Z".
std::optional<Date> dateIn(std::string_view text) {
  using namespace std::chrono;
  text = trimmed(text);
  auto yearNumber = takeField(text, 4, '-');
  auto monthNumber = takeField(text, 2, '-');
  auto dayNumber = takeField(text, 2, 'T');
  auto hour = takeField(text, 2, ':');
  auto minute = takeField(text, 2, ':');
  auto second = takeField(text, 2, 'Z');
  if (!yearNumber || !monthNumber || !dayNumber || !hour || !minute || !second || !text.empty()) {
    return std::nullopt;
  }
  const auto date = year(static_cast<int>(*yearNumber)) / month(*monthNumber) / day(*dayNumber);
  if (!date.ok() || *hour > 23 || *minute > 59 || *second > 59) return std::nullopt;
  const auto time = sys_days(date) + hours(*hour) + minutes(*minute) + seconds(*second);
  return Date{static_cast<double>(sys_seconds(time).time_since_epoch().count())};
}

/// Builds the value from Expat's events. The first error stops the parser and is kept.
class XMLReader {
 public:
  XMLReader(XML_Parser parser, const PropertyListLimits& limits) : _parser(parser), _budget(limits) {
    XML_SetUserData(parser, this);
    XML_SetElementHandler(parser, onStart, onEnd);
    XML_SetCharacterDataHandler(parser, onText);
    XML_SetStartDoctypeDeclHandler(parser, onDoctype);
    XML_SetSkippedEntityHandler(parser, onSkippedEntity);
  }

  Result<Value> read(std::string_view bytes) {
    const XML_Status status = XML_Parse(_parser, bytes.data(), static_cast<int>(bytes.size()), XML_TRUE);
    if (status != XML_STATUS_OK || !_error.empty()) return malformed(errorWithPlace());
    if (!_root) return malformed("no value");
    return *std::move(_root);
  }

 private:
  /// An open element.
  struct Frame {
    Element element;
    std::vector<Value> values;     // of an array
    MutableDictionary entries;     // of a dictionary
    std::optional<Text> key = {};  // of a dictionary: the key waiting for its value
    std::string text = {};         // of anything else
  };

  std::string errorWithPlace() const {
    std::string error = _error.empty() ? XML_ErrorString(XML_GetErrorCode(_parser)) : _error;
    return "line " + std::to_string(XML_GetCurrentLineNumber(_parser)) + ", column " +
           std::to_string(XML_GetCurrentColumnNumber(_parser)) + ": " + error;
  }

  void fail(std::string error) {
    if (!_error.empty()) return;
    _error = std::move(error);
    XML_StopParser(_parser, XML_FALSE);
  }

  void start(std::string_view name) {
    const Element element = elementNamed(name);
    if (element == Element::Unknown)
      return fail("unknown element <" + cutToWholeCharacters(name, kShown) + ">");
    if (!mayStart(element)) return fail("element <" + std::string(name) + "> may not stand here");
    // The plist element itself doesn't count as a container.
    if (element != Element::PList) {
      const auto added = isContainer(element) ? _budget.addContainer(_frames.size()) : _budget.addLeaf(0);
      if (!added) return fail(added.error().text);
    }
    _frames.push_back({element, {}, {}});
  }

  bool mayStart(Element element) const {
    if (_frames.empty()) return element == Element::PList;
    if (element == Element::PList) return false;
    const Frame& parent = _frames.back();
    switch (parent.element) {
      case Element::PList:
        return !_root && element != Element::Key;
      case Element::Array:
        return element != Element::Key;
      case Element::Dict:
        return (element == Element::Key) != parent.key.has_value();
      default:
        return false;
    }
  }

  void text(std::string_view text) {
    if (_frames.empty()) return;
    Frame& frame = _frames.back();
    if (!isContainer(frame.element)) {
      frame.text += text;
    } else if (text.find_first_not_of(" \t\r\n") != std::string_view::npos) {
      fail("text outside of a value");
    }
  }

  void end() {
    Frame frame = std::move(_frames.back());
    _frames.pop_back();
    if (frame.element == Element::PList) return;
    if (frame.element == Element::Key) {
      _frames.back().key = Text(frame.text);
      return;
    }
    if (frame.key) return fail("key without a value");
    auto value = valueOf(frame);
    if (value) {
      place(*std::move(value));
    } else {
      fail("not a valid value: " + cutToWholeCharacters(frame.text, kShown));
    }
  }

  static std::optional<Value> valueOf(Frame& frame) {
    switch (frame.element) {
      case Element::Dict:
        return frame.entries.shareUnique();
      case Element::Array:
        return List(std::move(frame.values));
      case Element::String:
        return Text(frame.text);
      case Element::Integer:
        return integerIn(frame.text);
      case Element::Real:
        return optionalValue(realIn(frame.text));
      case Element::True:
      case Element::False:
        if (!frame.text.empty()) return std::nullopt;
        return frame.element == Element::True;
      case Element::Date:
        return optionalValue(dateIn(frame.text));
      case Element::Data: {
        auto bytes = base64Decode(frame.text);
        return bytes ? std::optional<Value>(Bytes(*std::move(bytes))) : std::nullopt;
      }
      default:
        return std::nullopt;
    }
  }

  template <class T>
  static std::optional<Value> optionalValue(const std::optional<T>& value) {
    return value ? std::optional<Value>(*value) : std::nullopt;
  }

  void place(Value value) {
    Frame& parent = _frames.back();
    if (parent.element == Element::Array) {
      parent.values.push_back(std::move(value));
    } else if (parent.element == Element::Dict) {
      parent.entries.append(*std::move(parent.key), std::move(value));
      parent.key.reset();
    } else {
      _root = std::move(value);
    }
  }

  // --- Called by Expat, even after a failure. Must not throw through it.

  template <class Handle>
  static void handle(void* self, Handle handle) noexcept {
    auto& reader = *static_cast<XMLReader*>(self);
    if (reader._error.empty()) handle(reader);
  }
  static void onStart(void* self, const XML_Char* name, const XML_Char**) {
    handle(self, [&](XMLReader& reader) { reader.start(name); });
  }
  static void onEnd(void* self, const XML_Char*) {
    handle(self, [](XMLReader& reader) { reader.end(); });
  }
  static void onText(void* self, const XML_Char* text, int size) {
    handle(self, [&](XMLReader& reader) { reader.text({text, static_cast<std::size_t>(size)}); });
  }
  static void onDoctype(void* self, const XML_Char*, const XML_Char*, const XML_Char*,
                        int hasInternalSubset) {
    // Only declarations in the document itself could define entities: an external DTD is never fetched.
    handle(self, [&](XMLReader& reader) {
      if (hasInternalSubset) reader.fail("declarations are not allowed");
    });
  }
  static void onSkippedEntity(void* self, const XML_Char*, int) {
    handle(self, [](XMLReader& reader) { reader.fail("unknown entity"); });
  }

  XML_Parser _parser;
  PropertyListBudget _budget;
  std::vector<Frame> _frames;
  std::optional<Value> _root;
  std::string _error;
};

struct ParserDeleter {
  void operator()(XML_Parser parser) const { XML_ParserFree(parser); }
};

}  // namespace

Result<Value> parseXMLPropertyList(std::string_view bytes, const PropertyListLimits& limits) {
  std::unique_ptr<XML_ParserStruct, ParserDeleter> parser(XML_ParserCreate(nullptr));
  if (!parser) return Error{Error::Kind::Failed, "out of memory"};
  return XMLReader(parser.get(), limits).read(bytes);
}

}  // namespace vesk

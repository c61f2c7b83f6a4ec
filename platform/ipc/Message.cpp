#include "platform/ipc/Message.h"

#include <cstring>
#include <iterator>

#include "platform/ipc/MessageReader.h"
#include "platform/ipc/Signature.h"
#include "platform/ipc/WireCursor.h"

namespace vesk {

namespace {

constexpr std::size_t kMaximumName = 255;

/// Accepts non-empty elements of letters, digits, underscores and `others`. Elements may start with a digit
/// only if `mayStartWithDigit`.
bool areElements(std::string_view name, char separator, bool mayStartWithDigit,
                 std::string_view others = "") {
  char before = separator;
  for (const char c : name) {
    const bool isFirst = before == separator;
    const bool isDigit = c >= '0' && c <= '9';
    const bool isLetter = c == '_' || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
    const bool isAllowed = isLetter || (isDigit && (mayStartWithDigit || !isFirst)) ||
                           others.find(c) != others.npos || (c == separator && !isFirst);
    if (!isAllowed) return false;
    before = c;
  }
  return before != separator;
}

bool isMember(std::string_view name) noexcept {
  return name.size() <= kMaximumName && name.find('.') == name.npos && areElements(name, '.', false);
}

/// The name of an interface or an error, with at least two elements.
bool isInterface(std::string_view name) noexcept {
  return name.size() <= kMaximumName && name.find('.') != name.npos && areElements(name, '.', false);
}

/// A name that other peers may give themselves; messages here need none.
bool isBusName(std::string_view name) noexcept {
  if (name.starts_with(':')) name.remove_prefix(1);
  return name.size() <= kMaximumName && name.find('.') != name.npos && areElements(name, '.', true, "-");
}

/// Whether a call, an answer, an error or a signal has all required fields.
bool isComplete(const MessageHeader& header) {
  switch (header.type) {
    case MessageType::Call:
      return !header.path.empty() && !header.member.empty();
    case MessageType::Signal:
      return !header.path.empty() && !header.interfaceName.empty() && !header.member.empty();
    case MessageType::Answer:
      return header.replySerial != 0;
    case MessageType::Error:
      return header.replySerial != 0 && !header.errorName.empty();
  }
  return true;
}

struct KnownField {
  std::string_view type;
  bool (*isValid)(std::string_view) noexcept = nullptr;  // for a text
  std::string MessageHeader::*text = nullptr;            // where the text is stored
};

// In the order of HeaderField.
constexpr KnownField kKnownFields[] = {{"o", isObjectPath, &MessageHeader::path},
                                       {"s", isInterface, &MessageHeader::interfaceName},
                                       {"s", isMember, &MessageHeader::member},
                                       {"s", isInterface, &MessageHeader::errorName},
                                       {"u"},
                                       {"s", isBusName},
                                       {"s", isBusName},
                                       {"g", isValidSignature, &MessageHeader::signature},
                                       {"u"}};
static_assert(std::size(kKnownFields) == kUnixDescriptors);

class FieldReader {
 public:
  FieldReader(std::string_view bytes, MessageHeader& header) noexcept
      : _cursor(bytes, header.isBigEndian), _header(header) {}

  bool readAll() {
    while (!_cursor.atEnd()) {
      std::uint8_t field = 0;
      std::string_view type;
      if (!_cursor.align(8) || !_cursor.number(field) || !_cursor.signature(type)) return false;
      if (field == 0 || completeTypeLength(type) != type.size()) return false;
      if (field <= kUnixDescriptors) {
        const unsigned bit = 1U << field;
        if ((_seen & bit) != 0) return false;
        _seen |= bit;
        if (!readKnown(field, type)) return false;
      } else if (!skip(type)) {
        return false;
      }
    }
    return true;
  }

 private:
  bool readKnown(std::uint8_t field, std::string_view type) {
    const KnownField& known = kKnownFields[field - 1];
    if (type != known.type) return false;
    if (field == kReplySerial) return _cursor.number(_header.replySerial) && _header.replySerial != 0;
    if (field == kUnixDescriptors) return _cursor.number(_header.descriptors);
    std::string_view text;
    const bool isWhole = field == kSignature ? _cursor.signature(text) : _cursor.text(text);
    if (!isWhole || !known.isValid(text)) return false;
    if (known.text) _header.*known.text = text;
    return true;
  }

  /// Fields of later versions of the format are ignored, but their values must be well-formed.
  bool skip(std::string_view type) {
    MessageReader reader(_cursor, type);
    Value ignored;
    if (!reader.read(ignored)) return false;
    _cursor = reader.cursor();
    return true;
  }

  WireCursor _cursor;
  MessageHeader& _header;
  unsigned _seen = 0;
};

std::uint32_t numberAt(std::string_view bytes, std::size_t at) noexcept {
  WireCursor cursor(bytes.substr(at, 4), bytes[0] == kBigEndian);
  std::uint32_t number = 0;
  cursor.number(number);
  return number;
}

}  // namespace

bool isObjectPath(std::string_view path) noexcept {
  return path == "/" || (path.starts_with('/') && areElements(path.substr(1), '/', true));
}

std::optional<std::uint64_t> messageSize(std::string_view bytes) noexcept {
  if (bytes[0] != kLittleEndian && bytes[0] != kBigEndian) return std::nullopt;
  if (bytes[1] == 0 || bytes[3] != kProtocolVersion || numberAt(bytes, kSerialAt) == 0) return std::nullopt;
  const std::uint64_t fields = numberAt(bytes, kFieldsSizeAt);
  return kFixedHeader + (fields + 7) / 8 * 8 + numberAt(bytes, kBodySizeAt);
}

const MessageHeader* HeaderParser::parse(std::string_view bytes) {
  const std::size_t bodySize = numberAt(bytes, kBodySizeAt);
  _serial = numberAt(bytes, kSerialAt);
  const auto fields = bytes.substr(kFieldsSizeAt, bytes.size() - kFieldsSizeAt - bodySize);
  const bool isLast = !_fields.empty() && fields == _fields && bytes.starts_with({_start, sizeof _start});
  if (isLast && (bodySize == 0 || !_header.signature.empty())) return &_header;

  _fields.clear();
  _header = {};
  _header.type = static_cast<MessageType>(bytes[1]);
  _header.isBigEndian = bytes[0] == kBigEndian;
  _header.expectsReply = _header.type == MessageType::Call && (bytes[kFlagsAt] & kNoReplyExpected) == 0;
  const std::size_t fieldsSize = numberAt(bytes, kFieldsSizeAt);
  // Fields are aligned relative to the message, and they begin at a multiple of 8.
  const auto contents = bytes.substr(kFixedHeader, fieldsSize);
  const auto padding = fields.substr(kFixedHeader - kFieldsSizeAt + fieldsSize);
  if (padding.find_first_not_of('\0') != padding.npos) return nullptr;
  if (!FieldReader(contents, _header).readAll() || !isComplete(_header)) return nullptr;
  if (bodySize > 0 && _header.signature.empty()) return nullptr;
  std::memcpy(_start, bytes.data(), sizeof _start);
  _fields = fields;
  return &_header;
}

}  // namespace vesk

#include <algorithm>
#include <bit>
#include <unordered_map>
#include <vector>

#include "platform/plist/PropertyListFormats.h"
#include "platform/text/ASCII.h"
#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

void appendBigEndian(std::string& out, std::uint64_t number, std::size_t size) {
  for (std::size_t i = size; i-- > 0;) out += static_cast<char>(number >> (8 * i) & 0xFF);
}

/// The number of bytes that `number` needs: 1, 2, 4 or 8.
std::size_t sizeFor(std::uint64_t number) {
  if (number <= 0xFF) return 1;
  if (number <= 0xFFFF) return 2;
  return number <= 0xFFFF'FFFF ? 4 : 8;
}

std::string objectMarker(unsigned kind, unsigned low) { return {static_cast<char>(kind << 4 | low)}; }

std::string unsignedObject(std::uint64_t number) {
  const std::size_t size = sizeFor(number);
  // Eight-byte integers are signed, so the upper half of the range takes sixteen bytes.
  const bool takesSixteen = number > static_cast<std::uint64_t>(INT64_MAX);
  std::string object = objectMarker(0x1, takesSixteen ? 4 : static_cast<unsigned>(std::countr_zero(size)));
  if (takesSixteen) appendBigEndian(object, 0, 8);
  appendBigEndian(object, number, size);
  return object;
}

std::string signedObject(std::int64_t number) {
  if (number >= 0) return unsignedObject(static_cast<std::uint64_t>(number));
  std::string object = objectMarker(0x1, 3);
  appendBigEndian(object, static_cast<std::uint64_t>(number), 8);
  return object;
}

std::string eightByteObject(unsigned kind, double number) {
  std::string object = objectMarker(kind, 3);
  appendBigEndian(object, std::bit_cast<std::uint64_t>(number), 8);
  return object;
}

/// The start of an object with `count` bytes, characters or entries.
std::string countedObject(unsigned kind, std::size_t count) {
  if (count < 0xF) return objectMarker(kind, static_cast<unsigned>(count));
  return objectMarker(kind, 0xF) + unsignedObject(count);
}

std::string textObject(std::string_view text) {
  const auto units = utf16BEFromUTF8(text);
  if (!units || text.find('\0') != std::string_view::npos) throw Unwritable();
  return isASCII(text) ? countedObject(0x5, text.size()).append(text)
                       : countedObject(0x6, units->size() / 2).append(*units);
}

/// Lists all objects first, because their number determines the size of a reference.
class BinaryWriter {
 public:
  explicit BinaryWriter(PropertyListFlavor flavor) : _flavor(flavor) {}

  std::string write(const Value& root) {
    add(root, 1);
    const std::size_t referenceSize = sizeFor(_objects.size() - 1);
    std::string out(kBinaryPropertyListMagic);
    std::vector<std::size_t> offsets;
    offsets.reserve(_objects.size());
    for (const Object& object : _objects) {
      offsets.push_back(out.size());
      out += object.bytes;
      for (std::size_t reference : object.references) appendBigEndian(out, reference, referenceSize);
    }
    const std::size_t table = out.size();
    const std::size_t offsetSize = sizeFor(table);
    for (std::size_t offset : offsets) appendBigEndian(out, offset, offsetSize);
    out.append(6, '\0');
    appendBigEndian(out, offsetSize, 1);
    appendBigEndian(out, referenceSize, 1);
    for (std::size_t number : {_objects.size(), std::size_t{0}, table}) appendBigEndian(out, number, 8);
    return out;
  }

 private:
  struct Object {
    std::string bytes;
    std::vector<std::size_t> references = {};
  };

  // These return the object's index.

  std::size_t addBytes(std::string bytes) {
    _objects.push_back({std::move(bytes)});
    return _objects.size() - 1;
  }

  std::size_t add(const Value& value, std::size_t depth) {
    switch (value.kind()) {
      case Value::Kind::None:
        return addBytes(objectMarker(0x0, 0x0));
      case Value::Kind::Boolean:
        return addBytes(objectMarker(0x0, *value.boolean() ? 0x9 : 0x8));
      case Value::Kind::Signed:
        return addBytes(signedObject(*value.signedInteger()));
      case Value::Kind::Unsigned:
        return addBytes(unsignedObject(*value.unsignedInteger()));
      case Value::Kind::Double:
        return addBytes(eightByteObject(0x2, *value.real()));
      case Value::Kind::Date:
        return addBytes(eightByteObject(0x3, value.date()->secondsSince1970 - kBinaryPropertyListEpoch));
      case Value::Kind::Bytes:
        return addBytes(countedObject(0x4, value.bytes()->size()).append(value.bytes()->view()));
      case Value::Kind::Text:
        return addText(*value.text());
      case Value::Kind::List:
        return addList(*value.list(), depth);
      case Value::Kind::Dictionary:
        return addDictionary(*value.dictionary(), depth);
    }
    throw Unwritable();
  }

  std::size_t addText(const Text& text) {
    const auto [known, isNew] = _texts.try_emplace(text, _objects.size());
    return isNew ? addBytes(textObject(text.view())) : known->second;
  }

  std::size_t addContainer(unsigned kind, std::size_t count, std::size_t depth) {
    if (depth > kDeepest) throw Unwritable();
    return addBytes(countedObject(kind, count));
  }

  std::size_t addList(const List& list, std::size_t depth) {
    const std::size_t index = addContainer(0xA, list.size(), depth);
    std::vector<std::size_t> references;
    for (const Value& value : list) references.push_back(add(value, depth + 1));
    _objects[index].references = std::move(references);
    return index;
  }

  std::size_t addDictionary(const Dictionary& dictionary, std::size_t depth) {
    if (auto uid = uidOf(dictionary)) return addBytes(*std::move(uid));
    const std::size_t index = addContainer(0xD, dictionary.size(), depth);
    std::vector<std::size_t> references;
    for (const auto& entry : dictionary) references.push_back(addText(entry.key));
    for (const auto& entry : dictionary) references.push_back(add(entry.value, depth + 1));
    _objects[index].references = std::move(references);
    return index;
  }

  std::optional<std::string> uidOf(const Dictionary& dictionary) const {
    if (_flavor != PropertyListFlavor::KeyedArchive || dictionary.size() != 1) return std::nullopt;
    const Value* value = dictionary.find(kUIDKey);
    if (!value || (!value->signedInteger() && !value->unsignedInteger())) return std::nullopt;
    if (value->signedInteger() && *value->signedInteger() < 0) return std::nullopt;
    const auto number = static_cast<std::uint64_t>(*value->asInteger());
    const std::size_t size = sizeFor(number);
    std::string object = objectMarker(0x8, static_cast<unsigned>(size - 1));
    appendBigEndian(object, number, size);
    return object;
  }

  static constexpr std::size_t kDeepest = PropertyListLimits{}.depth;
  const PropertyListFlavor _flavor;
  std::vector<Object> _objects;
  std::unordered_map<Text, std::size_t> _texts;
};

}  // namespace

std::optional<std::string> writeBinaryPropertyList(const Value& value, PropertyListFlavor flavor) {
  try {
    return BinaryWriter(flavor).write(value);
  } catch (const Unwritable&) {
    return std::nullopt;
  }
}

}  // namespace vesk

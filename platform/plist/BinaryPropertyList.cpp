#include <algorithm>
#include <bit>
#include <utility>
#include <vector>

#include "platform/plist/PropertyListFormats.h"
#include "platform/unicode/Unicode.h"

namespace vesk {

namespace {

constexpr std::size_t kTrailerSize = 32;

std::uint64_t bigEndian(std::string_view bytes) {
  std::uint64_t number = 0;
  for (char c : bytes) number = number << 8 | static_cast<unsigned char>(c);
  return number;
}

/// The contents of the last 32 bytes, which describe the rest.
struct Trailer {
  std::size_t offsetSize = 0;
  std::size_t referenceSize = 0;
  std::size_t objectCount = 0;
  std::size_t rootObject = 0;
  std::size_t offsetTable = 0;
};

/// Returns the trailer if the offset table that it describes exactly fills the space before it.
std::optional<Trailer> readTrailer(std::string_view bytes) {
  if (bytes.size() < kBinaryPropertyListMagic.size() + kTrailerSize) return std::nullopt;
  const std::string_view tail = bytes.substr(bytes.size() - kTrailerSize);
  const Trailer trailer{bigEndian(tail.substr(6, 1)), bigEndian(tail.substr(7, 1)),
                        bigEndian(tail.substr(8, 8)), bigEndian(tail.substr(16, 8)),
                        bigEndian(tail.substr(24, 8))};
  const std::size_t end = bytes.size() - kTrailerSize;
  auto isSize = [](std::size_t size) { return size >= 1 && size <= 8; };
  if (!isSize(trailer.offsetSize) || !isSize(trailer.referenceSize)) return std::nullopt;
  if (trailer.offsetTable < kBinaryPropertyListMagic.size() || trailer.offsetTable > end) return std::nullopt;
  if (trailer.rootObject >= trailer.objectCount) return std::nullopt;
  const std::size_t tableSize = end - trailer.offsetTable;
  if (tableSize % trailer.offsetSize != 0 || tableSize / trailer.offsetSize != trailer.objectCount) {
    return std::nullopt;
  }
  return trailer;
}

/// Reads the objects from the root down, and reads an object again for each reference to it.
class BinaryReader {
 public:
  BinaryReader(std::string_view bytes, const Trailer& trailer, PropertyListFlavor flavor,
               const PropertyListLimits& limits)
      : _objects(bytes.substr(0, trailer.offsetTable)),
        _offsets(bytes.substr(trailer.offsetTable, trailer.objectCount * trailer.offsetSize)),
        _trailer(trailer),
        _flavor(flavor),
        _budget(limits) {}

  Result<Value> read() { return readObject(_trailer.rootObject, 1); }

 private:
  /// An object's payload offset and the contents of its marker.
  struct Marker {
    unsigned kind;
    std::uint64_t count;  // the marker's low half, or the length that follows it
    std::size_t payload;
  };

  Result<Value> readObject(std::uint64_t index, std::size_t depth) {
    if (index >= _trailer.objectCount) return malformed("reference to no object");
    auto marker = readMarker(bigEndian(_offsets.substr(index * _trailer.offsetSize, _trailer.offsetSize)));
    if (!marker) return marker.error();
    if (marker->kind == 0xA) return readList(*marker, depth);
    if (marker->kind == 0xD) return readDictionary(*marker, depth);
    auto value = leafAt(*marker);
    if (!value) return malformed("an object that can't be read");
    if (auto added = _budget.addLeaf(*value); !added) return added.error();
    return *std::move(value);
  }

  Result<Value> readList(const Marker& list, std::size_t depth) {
    if (auto begun = beginContainer(list, 1, depth); !begun) return begun.error();
    std::vector<Value> values;
    for (std::size_t i = 0; i < list.count; ++i) {
      auto item = readObject(referenceAt(list, i), depth + 1);
      if (!item) return item;
      values.push_back(*std::move(item));
    }
    return List(std::move(values));
  }

  Result<Value> readDictionary(const Marker& dictionary, std::size_t depth) {
    if (auto begun = beginContainer(dictionary, 2, depth); !begun) return begun.error();
    MutableDictionary entries;
    for (std::size_t i = 0; i < dictionary.count; ++i) {
      auto key = readObject(referenceAt(dictionary, i), depth + 1);
      if (key && !key->text()) return malformed("a key that is no text");
      auto item = key ? readObject(referenceAt(dictionary, dictionary.count + i), depth + 1) : key;
      if (!item) return item;
      entries.append(*key->text(), *std::move(item));
    }
    return entries.shareUnique();
  }

  /// Succeeds if the container is allowed at `depth` and all its references are present.
  Result<void> beginContainer(const Marker& container, std::size_t referencesPerEntry, std::size_t depth) {
    const std::size_t room = (_objects.size() - std::min(container.payload, _objects.size())) /
                             (_trailer.referenceSize * referencesPerEntry);
    if (container.count > room) return malformed("a container that reaches over the end");
    return _budget.addContainer(depth);
  }

  std::uint64_t referenceAt(const Marker& container, std::size_t place) const {
    return bigEndian(
        _objects.substr(container.payload + place * _trailer.referenceSize, _trailer.referenceSize));
  }

  Result<Marker> readMarker(std::uint64_t offset) {
    // Objects must lie between the magic number and the offset table.
    if (offset < kBinaryPropertyListMagic.size() || offset >= _objects.size()) {
      return malformed("an offset outside of the objects");
    }
    const unsigned byte = static_cast<unsigned char>(_objects[offset]);
    Marker marker{byte >> 4, byte & 0xF, offset + 1};
    const bool hasLength = marker.kind == 0x4 || marker.kind == 0x5 || marker.kind == 0x6 ||
                           marker.kind == 0xA || marker.kind == 0xD;
    if (!hasLength || marker.count != 0xF) return marker;
    auto sizeMarker = bytesAt(marker.payload, 1);
    const unsigned exponent = sizeMarker ? static_cast<unsigned char>((*sizeMarker)[0]) ^ 0x10u : 4;
    auto length = exponent <= 3 ? bytesAt(marker.payload + 1, std::size_t{1} << exponent) : std::nullopt;
    if (!length) return malformed("a length that can't be read");
    marker.count = bigEndian(*length);
    marker.payload += 1 + length->size();
    return marker;
  }

  std::optional<std::string_view> bytesAt(std::size_t start, std::uint64_t count) const {
    if (start > _objects.size() || count > _objects.size() - start) return std::nullopt;
    return _objects.substr(start, count);
  }

  std::optional<Value> leafAt(const Marker& marker) {
    switch (marker.kind) {
      case 0x0:
        if (marker.count == 0x0) return Value();
        if (marker.count == 0x8 || marker.count == 0x9) return Value(marker.count == 0x9);
        return std::nullopt;
      case 0x1:
        return marker.count <= 4 ? readInteger(bytesAt(marker.payload, 1u << marker.count)) : std::nullopt;
      case 0x2:
        return marker.count == 2 || marker.count == 3 ? readReal(bytesAt(marker.payload, 1u << marker.count))
                                                      : std::nullopt;
      case 0x3:
        return marker.count == 3 ? readDate(bytesAt(marker.payload, 8)) : std::nullopt;
      case 0x4: {
        auto data = bytesAt(marker.payload, marker.count);
        return data ? std::optional<Value>(Bytes(std::string(*data))) : std::nullopt;
      }
      case 0x5:
        return readASCII(bytesAt(marker.payload, marker.count));
      case 0x6:
        return marker.count <= _objects.size() ? readUTF16(bytesAt(marker.payload, 2 * marker.count))
                                               : std::nullopt;
      case 0x8:
        return readUID(bytesAt(marker.payload, marker.count + 1));
      default:
        return std::nullopt;
    }
  }

  static std::optional<Value> readInteger(std::optional<std::string_view> bytes) {
    if (!bytes) return std::nullopt;
    // Integers of up to 4 bytes are unsigned, those of 8 are signed; those of 16 are signed but hold no more
    // than 64 bits' worth.
    if (bytes->size() < 8) return Value(static_cast<std::int64_t>(bigEndian(*bytes)));
    const auto low = static_cast<std::int64_t>(bigEndian(bytes->substr(bytes->size() - 8)));
    if (bytes->size() == 8) return Value(low);
    const std::uint64_t high = bigEndian(bytes->substr(0, 8));
    if (high == 0) return low >= 0 ? Value(low) : Value(static_cast<std::uint64_t>(low));
    if (high == ~std::uint64_t{0} && low < 0) return Value(low);
    return std::nullopt;
  }

  static std::optional<Value> readReal(std::optional<std::string_view> bytes) {
    if (!bytes) return std::nullopt;
    const std::uint64_t bits = bigEndian(*bytes);
    if (bytes->size() == 8) return Value(std::bit_cast<double>(bits));
    return Value(static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(bits))));
  }

  static std::optional<Value> readDate(std::optional<std::string_view> bytes) {
    if (!bytes) return std::nullopt;
    return Value(Date{std::bit_cast<double>(bigEndian(*bytes)) + kBinaryPropertyListEpoch});
  }

  static std::optional<Value> readASCII(std::optional<std::string_view> bytes) {
    const bool isText = bytes && std::all_of(bytes->begin(), bytes->end(), [](char c) {
                          return static_cast<unsigned char>(c) - 1u < 0x7Fu;
                        });
    return isText ? std::optional<Value>(*bytes) : std::nullopt;
  }

  static std::optional<Value> readUTF16(std::optional<std::string_view> bytes) {
    auto text = bytes ? utf8FromUTF16BE(*bytes) : std::nullopt;
    if (!text || text->find('\0') != std::string::npos) return std::nullopt;
    return Value(*text);
  }

  std::optional<Value> readUID(std::optional<std::string_view> bytes) const {
    if (_flavor != PropertyListFlavor::KeyedArchive || !bytes || bytes->size() > 8) return std::nullopt;
    return Value(Dictionary{{Text(kUIDKey), Value(bigEndian(*bytes))}});
  }

  const std::string_view _objects;  // the magic number and the objects
  const std::string_view _offsets;
  const Trailer _trailer;
  const PropertyListFlavor _flavor;
  PropertyListBudget _budget;
};

}  // namespace

Result<Value> parseBinaryPropertyList(std::string_view bytes, PropertyListFlavor flavor,
                                      const PropertyListLimits& limits) {
  auto trailer = readTrailer(bytes);
  if (!trailer) return malformed("no valid trailer");
  return BinaryReader(bytes, *trailer, flavor, limits).read();
}

}  // namespace vesk

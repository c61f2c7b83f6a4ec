#include <algorithm>
#include <bit>
#include <utility>
#include <vector>

#include "platform/plist/PropertyListFormats.h"
#include "platform/text/ASCII.h"
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

// The functions below throw an Error for what is wrong with the document.

void require(bool holds, const char* otherwise) {
  if (!holds) throw malformed(otherwise);
}

void require(const Result<void>& outcome) {
  if (!outcome) throw outcome.error();
}

Value integerIn(std::string_view bytes) {
  // Integers of up to 4 bytes are unsigned, those of 8 are signed; those of 16 are signed but hold no more
  // than 64 bits' worth.
  if (bytes.size() < 8) return static_cast<std::int64_t>(bigEndian(bytes));
  const auto low = static_cast<std::int64_t>(bigEndian(bytes.substr(bytes.size() - 8)));
  if (bytes.size() == 8) return low;
  const std::uint64_t high = bigEndian(bytes.substr(0, 8));
  if (high == 0) return low >= 0 ? Value(low) : Value(static_cast<std::uint64_t>(low));
  require(high == ~std::uint64_t{0} && low < 0, "an integer of more than 64 bits");
  return low;
}

double realIn(std::string_view bytes) {
  const std::uint64_t bits = bigEndian(bytes);
  if (bytes.size() == 8) return std::bit_cast<double>(bits);
  return std::bit_cast<float>(static_cast<std::uint32_t>(bits));
}

std::string_view asciiIn(std::string_view bytes) {
  const bool isText = std::ranges::all_of(bytes, [](char c) { return isASCII(c) && c != '\0'; });
  require(isText, "a text that is not ASCII");
  return bytes;
}

std::string utf16In(std::string_view bytes) {
  auto text = utf8FromUTF16BE(bytes);
  require(text && text->find('\0') == std::string::npos, "a text that is not UTF-16");
  return *std::move(text);
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

  Value read() { return readObject(_trailer.rootObject, 1); }

 private:
  /// An object's payload offset and the contents of its marker.
  struct Marker {
    unsigned kind;
    std::uint64_t count;  // the marker's low half, or the length that follows it
    std::size_t payload;
  };

  Value readObject(std::uint64_t index, std::size_t depth) {
    require(index < _trailer.objectCount, "reference to no object");
    const Marker marker =
        readMarker(bigEndian(_offsets.substr(index * _trailer.offsetSize, _trailer.offsetSize)));
    if (marker.kind == 0xA) return readList(marker, depth);
    if (marker.kind == 0xD) return readDictionary(marker, depth);
    Value value = readLeaf(marker);
    require(_budget.addLeaf(value));
    return value;
  }

  List readList(const Marker& list, std::size_t depth) {
    beginContainer(list, 1, depth);
    std::vector<Value> values;
    for (std::size_t i = 0; i < list.count; ++i)
      values.push_back(readObject(referenceAt(list, i), depth + 1));
    return List(std::move(values));
  }

  Dictionary readDictionary(const Marker& dictionary, std::size_t depth) {
    beginContainer(dictionary, 2, depth);
    MutableDictionary entries;
    for (std::size_t i = 0; i < dictionary.count; ++i) {
      const Value key = readObject(referenceAt(dictionary, i), depth + 1);
      require(key.text() != nullptr, "a key that is no text");
      entries.append(*key.text(), readObject(referenceAt(dictionary, dictionary.count + i), depth + 1));
    }
    return entries.shareUnique();
  }

  /// Requires that the container is allowed at `depth` and that all its references are present.
  void beginContainer(const Marker& container, std::size_t referencesPerEntry, std::size_t depth) {
    const std::size_t room = (_objects.size() - std::min(container.payload, _objects.size())) /
                             (_trailer.referenceSize * referencesPerEntry);
    require(container.count <= room, "a container that reaches over the end");
    require(_budget.addContainer(depth));
  }

  std::uint64_t referenceAt(const Marker& container, std::size_t place) const {
    return bigEndian(
        _objects.substr(container.payload + place * _trailer.referenceSize, _trailer.referenceSize));
  }

  Marker readMarker(std::uint64_t offset) const {
    // Objects must lie between the magic number and the offset table.
    require(offset >= kBinaryPropertyListMagic.size() && offset < _objects.size(),
            "an offset outside of the objects");
    const unsigned byte = static_cast<unsigned char>(_objects[offset]);
    Marker marker{byte >> 4, byte & 0xF, offset + 1};
    constexpr std::string_view kCounted = "\x4\x5\x6\xA\xD";
    if (marker.count != 0xF || kCounted.find(static_cast<char>(marker.kind)) == kCounted.npos) return marker;
    const unsigned exponent = static_cast<unsigned char>(bytesAt(marker.payload, 1)[0]) ^ 0x10u;
    require(exponent <= 3, "a length that can't be read");
    const std::string_view length = bytesAt(marker.payload + 1, std::size_t{1} << exponent);
    return {marker.kind, bigEndian(length), marker.payload + 1 + length.size()};
  }

  std::string_view bytesAt(std::size_t start, std::uint64_t count) const {
    require(start <= _objects.size() && count <= _objects.size() - start,
            "an object that reaches over the end");
    return _objects.substr(start, count);
  }

  Value readLeaf(const Marker& marker) const {
    const auto [kind, count, payload] = marker;
    if (kind == 0x0 && count == 0x0) return {};
    if (kind == 0x0 && (count == 0x8 || count == 0x9)) return count == 0x9;
    if (kind == 0x1 && count <= 4) return integerIn(bytesAt(payload, 1u << count));
    if (kind == 0x2 && (count == 2 || count == 3)) return realIn(bytesAt(payload, 1u << count));
    if (kind == 0x3 && count == 3) return Date{realIn(bytesAt(payload, 8)) + kBinaryPropertyListEpoch};
    if (kind == 0x4) return Bytes(std::string(bytesAt(payload, count)));
    if (kind == 0x5) return asciiIn(bytesAt(payload, count));
    if (kind == 0x6 && count <= _objects.size()) return utf16In(bytesAt(payload, 2 * count));
    const bool isUID = kind == 0x8 && count < 8 && _flavor == PropertyListFlavor::KeyedArchive;
    require(isUID, "an object that can't be read");
    return Dictionary{{Text(kUIDKey), bigEndian(bytesAt(payload, count + 1))}};
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
  const auto trailer = readTrailer(bytes);
  if (!trailer) return malformed("no valid trailer");
  try {
    return BinaryReader(bytes, *trailer, flavor, limits).read();
  } catch (const Error& error) {
    return error;
  }
}

}  // namespace vesk

// The two encodings of property lists, and the limits that their readers share.
#pragma once

#include <string>
#include <string_view>

#include "platform/plist/PropertyList.h"

namespace vesk {

inline constexpr std::string_view kBinaryPropertyListMagic = "bplist00";
inline constexpr std::string_view kUIDKey = "CF$UID";

/// Seconds from the start of 1970 to the start of 2001, the epoch of the binary encoding.
inline constexpr double kBinaryPropertyListEpoch = 978'307'200;

Result<Value> parseXMLPropertyList(std::string_view bytes, const PropertyListLimits& limits);
Result<Value> parseBinaryPropertyList(std::string_view bytes, PropertyListFlavor flavor,
                                      const PropertyListLimits& limits);

/// Thrown within a writer for what it can't write.
struct Unwritable {};

/// Counts a document's cost. Each operation fails once a limit is exceeded; the error names the limit.
class PropertyListBudget {
 public:
  explicit PropertyListBudget(const PropertyListLimits& limits) : _limits(limits) {}

  Result<void> addContainer(std::size_t depth) {
    if (depth > _limits.depth) return malformed("nested deeper than " + std::to_string(_limits.depth));
    return addLeaf(0);
  }
  Result<void> addLeaf(std::size_t contentBytes) {
    if (++_nodes > _limits.nodes) return malformed("more than " + std::to_string(_limits.nodes) + " values");
    _contentBytes += contentBytes;
    if (_contentBytes <= _limits.contentBytes) return {};
    return malformed("more than " + std::to_string(_limits.contentBytes) + " bytes of content");
  }
  Result<void> addLeaf(const Value& value) {
    const Text* text = value.text();
    const Bytes* bytes = value.bytes();
    return addLeaf(text ? text->size() : bytes ? bytes->size() : 0);
  }

 private:
  const PropertyListLimits& _limits;
  std::size_t _nodes = 0;
  std::size_t _contentBytes = 0;
};

}  // namespace vesk

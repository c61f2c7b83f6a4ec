// The two encodings of property lists, for PropertyList.cpp.
#pragma once

#include <string>
#include <string_view>

#include "platform/plist/PropertyList.h"

namespace vesk {

inline constexpr std::string_view kBinaryPropertyListMagic = "bplist00";
inline constexpr std::string_view kUIDKey = "CF$UID";

/// Seconds from the start of 1970 to that of 2001, from which the binary encoding counts.
inline constexpr double kBinaryPropertyListEpoch = 978'307'200;

PropertyListOutcome parseXMLPropertyList(std::string_view bytes, const PropertyListLimits& limits);
PropertyListOutcome parseBinaryPropertyList(std::string_view bytes, PropertyListFlavor flavor,
                                            const PropertyListLimits& limits);

/// Counts what a document costs and says when it is too much.
class PropertyListBudget {
 public:
  explicit PropertyListBudget(const PropertyListLimits& limits) : _limits(limits) {}

  bool add(std::size_t nodes, std::size_t contentBytes) {
    _nodes += nodes;
    _contentBytes += contentBytes;
    return _nodes <= _limits.nodes && _contentBytes <= _limits.contentBytes;
  }
  bool allowsDepth(std::size_t depth) const { return depth <= _limits.depth; }

  std::string depthError() const { return "nested deeper than " + std::to_string(_limits.depth); }
  std::string sizeError() const {
    return _nodes > _limits.nodes ? "more than " + std::to_string(_limits.nodes) + " values"
                                  : "more than " + std::to_string(_limits.contentBytes) + " bytes of content";
  }

 private:
  const PropertyListLimits& _limits;
  std::size_t _nodes = 0;
  std::size_t _contentBytes = 0;
};

}  // namespace vesk

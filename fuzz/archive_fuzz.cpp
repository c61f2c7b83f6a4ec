// Keyed archives: whatever is read can be archived again and reads back in the same shape.
#include <cstdint>
#include <cstdlib>

#include "tools/collector/ArchiveText.h"

namespace {

void require(bool condition) {
  if (!condition) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace vesk;
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  const auto outcome = unarchiveValue(bytes);
  require(outcome.value.has_value() == outcome.error.empty());
  if (!outcome.value) return 0;
  const auto archive = archiveValue(*outcome.value);
  require(archive.has_value());
  require(archiveText(*archive) == archiveText(bytes));
  return 0;
}

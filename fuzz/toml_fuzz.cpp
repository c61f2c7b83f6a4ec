// TOML documents: preferences and device facts.
#include <cstdint>
#include <cstdlib>

#include "platform/preferences/TomlFile.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const auto document = vesk::parseToml(text);
  if (!document && document.error().text.empty()) std::abort();
  // Any document can be described.
  if (document) (void)vesk::describe(*document, 4096);
  return 0;
}

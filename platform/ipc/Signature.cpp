#include "platform/ipc/Signature.h"

namespace vesk {

namespace {

constexpr int kMaximumNesting = 32;

std::size_t typeLength(std::string_view signature, int arrays, int structures) noexcept {
  if (signature.empty()) return 0;
  const char type = signature[0];
  if (type == 'v' || isBasicType(type)) return 1;
  if (type == 'a') {
    if (arrays == kMaximumNesting) return 0;
    auto element = signature.substr(1);
    if (!element.starts_with('{')) {
      const std::size_t length = typeLength(element, arrays + 1, structures);
      return length == 0 ? 0 : 1 + length;
    }
    // A dictionary: a basic key and one value.
    if (structures == kMaximumNesting || element.size() < 2) return 0;
    if (!isBasicType(element[1])) return 0;
    const std::size_t value = typeLength(element.substr(2), arrays + 1, structures + 1);
    if (value == 0 || 2 + value >= element.size() || element[2 + value] != '}') return 0;
    return 1 + 2 + value + 1;
  }
  if (type != '(' || structures == kMaximumNesting) return 0;
  std::size_t at = 1;
  while (at < signature.size() && signature[at] != ')') {
    const std::size_t member = typeLength(signature.substr(at), arrays, structures + 1);
    if (member == 0) return 0;
    at += member;
  }
  return at == 1 || at == signature.size() ? 0 : at + 1;
}

}  // namespace

std::size_t completeTypeLength(std::string_view signature) noexcept { return typeLength(signature, 0, 0); }

bool isValidSignature(std::string_view signature) noexcept {
  if (signature.size() > 255) return false;
  while (!signature.empty()) {
    const std::size_t length = completeTypeLength(signature);
    if (length == 0) return false;
    signature.remove_prefix(length);
  }
  return true;
}

std::size_t alignmentOf(char type) noexcept {
  struct Alignment {
    std::string_view types;
    std::size_t bytes;
  };
  constexpr Alignment kAlignments[] = {{"nq", 2}, {"biusoah", 4}, {"xtd({", 8}};
  for (const auto& alignment : kAlignments) {
    if (alignment.types.find(type) != std::string_view::npos) return alignment.bytes;
  }
  return 1;
}

}  // namespace vesk

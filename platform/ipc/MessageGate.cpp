#include "platform/ipc/MessageGate.h"

#include <algorithm>

#include "platform/ipc/WireFormat.h"

namespace vesk {

namespace {

std::uint32_t numberAt(std::string_view header, std::size_t at, bool bigEndian) {
  std::uint32_t number = 0;
  for (std::size_t i = 0; i < 4; ++i) {
    auto byte = static_cast<unsigned char>(header[at + (bigEndian ? i : 3 - i)]);
    number = number << 8 | byte;
  }
  return number;
}

}  // namespace

std::optional<std::uint64_t> MessageGate::messageSize(std::string_view header) noexcept {
  bool bigEndian = header[0] == kBigEndian;
  if (!bigEndian && header[0] != kLittleEndian) return std::nullopt;
  if (header[1] == 0 || header[3] != kProtocolVersion) return std::nullopt;
  if (numberAt(header, kSerialAt, bigEndian) == 0) return std::nullopt;
  std::uint64_t fields = numberAt(header, kFieldsSizeAt, bigEndian);
  std::uint64_t body = numberAt(header, kBodySizeAt, bigEndian);
  return kFixedHeader + (fields + 7) / 8 * 8 + body;
}

MessageGate::Result MessageGate::pass(std::string_view data) {
  Result result;
  for (;;) {
    auto step = static_cast<std::size_t>(std::min<std::uint64_t>(_remaining, data.size() - result.passed));
    result.passed += step;
    _remaining -= step;
    if (step > 0 && _remaining == 0) ++_finished;
    auto rest = data.substr(result.passed);
    if (rest.size() < kFixedHeader) return result;
    auto size = messageSize(rest);
    if (!size || *size > _maximumMessage) {
      result.verdict = size ? Verdict::TooLarge : Verdict::Malformed;
      return result;
    }
    result.lastStart = result.passed;
    _remaining = *size;
  }
}

}  // namespace vesk

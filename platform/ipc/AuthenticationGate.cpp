#include "platform/ipc/AuthenticationGate.h"

#include <unistd.h>

#include <algorithm>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

constexpr std::string_view kLineEnd = "\r\n";

std::string hexOf(std::string_view text) {
  return hexLower({reinterpret_cast<const unsigned char*>(text.data()), text.size()});
}

}  // namespace

/// A claim is the decimal user number, written as hexadecimal digits of its characters; an empty one means
/// "who I am" and is always true.
std::string AuthenticationGate::claimFor(std::string_view claim) const {
  if (claim.empty()) return {};
  auto alike = [](char a, char b) { return a == b || (a >= 'A' && a <= 'F' && a + ('a' - 'A') == b); };
  const std::string truth = hexOf(std::to_string(_peer));
  bool isTrue = std::equal(claim.begin(), claim.end(), truth.begin(), truth.end(), alike);
  return hexOf(isTrue ? std::to_string(::geteuid()) : "nobody");
}

std::string AuthenticationGate::translated(std::string_view line) const {
  for (std::string_view command : {"AUTH EXTERNAL ", "DATA "}) {
    if (line.starts_with(command)) return std::string(command) + claimFor(line.substr(command.size()));
  }
  return std::string(line);
}

AuthenticationGate::Result AuthenticationGate::pass(std::string_view data) {
  Result result;
  if (!_seenFirstByte && !data.empty()) {
    if (data[0] != '\0') return {Verdict::Refused};
    _seenFirstByte = true;
    result.passedOn = std::string(1, '\0');
    result.taken = 1;
  }
  for (;;) {
    auto rest = data.substr(result.taken);
    auto end = rest.find(kLineEnd);
    if (end == std::string_view::npos) {
      if (rest.size() > kMaximumLine) result.verdict = Verdict::Refused;
      return result;
    }
    auto line = rest.substr(0, end);
    if (line.size() > kMaximumLine || ++_lines > kMaximumLines) {
      result.verdict = Verdict::Refused;
      return result;
    }
    result.taken += end + kLineEnd.size();
    result.passedOn.append(translated(line)).append(kLineEnd);
    if (line == "BEGIN") {
      result.verdict = Verdict::Begun;
      return result;
    }
  }
}

}  // namespace vesk

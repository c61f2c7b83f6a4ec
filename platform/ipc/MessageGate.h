// Where messages begin and end in what a client sends. Private to platform/ipc.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace vesk {

/// Follows the stream from header to header, so that no message is larger than the limit and it is known
/// whether a peer that hangs up does so in mid-message. Looks at the fixed part of headers only; the rest is
/// sd-bus's.
class MessageGate {
 public:
  enum class Verdict { Pass, TooLarge, Malformed };

  struct Result {
    Verdict verdict = Verdict::Pass;
    std::size_t passed = 0;  ///< bytes from the front that may go on; what is left is part of a header
    std::optional<std::size_t> lastStart;  ///< where the last message starts among them
  };

  explicit MessageGate(std::size_t maximumMessage) : _maximumMessage(maximumMessage) {}

  /// Size of the message whose first kFixedHeader bytes these are; nothing when they begin none.
  static std::optional<std::uint64_t> messageSize(std::string_view header) noexcept;

  /// `data`: all that has come and was not passed yet. On a refusal `passed` covers the messages before.
  Result pass(std::string_view data);

  bool insideMessage() const noexcept { return _remaining > 0; }
  /// Messages that have been passed whole.
  std::uint64_t finished() const noexcept { return _finished; }

 private:
  const std::size_t _maximumMessage;
  std::uint64_t _finished = 0;
  std::uint64_t _remaining = 0;  // of the message whose start has been passed
};

}  // namespace vesk

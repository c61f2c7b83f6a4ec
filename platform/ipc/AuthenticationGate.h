// What a client may say before it is authenticated. Private to platform/ipc.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

namespace vesk {

/// Stands in front of sd-bus's own authentication, which sees whole lines only and nothing behind BEGIN.
///
/// EXTERNAL means that a client is who the kernel says it is. sd-bus would compare the claim with the process
/// at the other end of its input, which is this one (see BusRelay), so the claim is compared here, and sd-bus
/// is shown a claim to this process's user when it is true and a claim to no user when it is not.
class AuthenticationGate {
 public:
  enum class Verdict { Continue, Begun, Refused };

  struct Result {
    Verdict verdict = Verdict::Continue;
    std::size_t taken = 0;   ///< bytes of the input that are dealt with
    std::string passedOn{};  ///< what sd-bus is to see of them
  };

  // A well-behaved client needs six lines at most; one that tries every mechanism in vain a few more.
  static constexpr std::size_t kMaximumLine = 1024;
  static constexpr std::size_t kMaximumLines = 32;

  explicit AuthenticationGate(uid_t peer) : _peer(peer) {}

  /// `data`: all that has come and was not yet taken.
  Result pass(std::string_view data);

 private:
  std::string translated(std::string_view line) const;
  std::string claimFor(std::string_view claim) const;

  const uid_t _peer;
  bool _seenFirstByte = false;
  std::size_t _lines = 0;
};

}  // namespace vesk

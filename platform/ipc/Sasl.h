// D-Bus authentication: lines in, lines out. Private to platform/ipc.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

namespace vesk {

/// The server side. A client's identity is the one reported by the kernel (mechanism EXTERNAL); claims to
/// another identity and all other mechanisms are rejected. Needs no socket and no clock.
class SaslServer {
 public:
  // A well-behaved client needs at most six lines; one that tries every mechanism in vain needs a few more.
  static constexpr std::size_t kMaximumLine = 1024;
  static constexpr std::size_t kMaximumLines = 32;

  enum class Verdict { Continue, Begun, Refused };

  struct Step {
    Verdict verdict = Verdict::Continue;
    std::size_t taken = 0;  ///< bytes of the input that were processed
    std::string answer{};   ///< to be sent
  };

  /// `peer`: the user at the other end.
  explicit SaslServer(uid_t peer) : _peer(peer) {}

  /// `data`: all input not yet taken. Must not be called again once begun.
  Step step(std::string_view data);

 private:
  enum class State { WantsAuth, WantsData, WantsBegin, Begun, Refused };

  std::string answerTo(std::string_view line);
  std::string check(std::string_view claim);
  std::string reject();

  const uid_t _peer;
  State _state = State::WantsAuth;
  bool _seenFirstByte = false;
  std::size_t _lines = 0;
};

/// The client side. Sends everything at once, then reads the answers.
class SaslClient {
 public:
  enum class Verdict { Continue, Accepted, Refused };

  struct Step {
    Verdict verdict = Verdict::Continue;
    std::size_t taken = 0;  ///< bytes of the input that were processed
  };

  /// To be sent first. Claims no user, so that it holds in any user namespace.
  static std::string_view greeting() noexcept;

  /// `data`: all input not yet taken. Must not be called again once accepted.
  Step step(std::string_view data);

  /// The server's last line if it refused, for error messages; empty if there was none.
  const std::string& refusal() const noexcept { return _refusal; }

 private:
  std::size_t _answers = 0;
  std::string _refusal;
};

}  // namespace vesk

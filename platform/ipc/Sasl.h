// D-Bus authentication: lines in, lines out. Private to platform/ipc.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>
#include <string_view>

namespace vesk {

/// The server's side. A client is who the kernel says it is (mechanism EXTERNAL); a claim to be somebody
/// else, and every other mechanism, is rejected. Needs no socket and no clock.
class SaslServer {
 public:
  // A well-behaved client needs six lines at most; one that tries every mechanism in vain a few more.
  static constexpr std::size_t kMaximumLine = 1024;
  static constexpr std::size_t kMaximumLines = 32;

  enum class Verdict { Continue, Begun, Refused };

  struct Step {
    Verdict verdict = Verdict::Continue;
    std::size_t taken = 0;  ///< bytes of the input that are dealt with
    std::string answer{};   ///< to be sent
  };

  /// `peer`: the user at the other end.
  explicit SaslServer(uid_t peer) : _peer(peer) {}

  /// `data`: all that has come and was not taken yet. Once begun, not to be called again.
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

/// The client's side, which says everything at once and then reads the answers.
class SaslClient {
 public:
  enum class Verdict { Continue, Accepted, Refused };

  struct Step {
    Verdict verdict = Verdict::Continue;
    std::size_t taken = 0;  ///< bytes of the input that are dealt with
  };

  /// To be sent first. Claims no user, so that it holds in any user namespace.
  static std::string_view greeting() noexcept;

  /// `data`: all that has come and was not taken yet. Once accepted, not to be called again.
  Step step(std::string_view data);

  /// The server's last word, for a person, when it has refused; empty when it said nothing.
  const std::string& refusal() const noexcept { return _refusal; }

 private:
  std::size_t _answers = 0;
  std::string _refusal;
};

}  // namespace vesk

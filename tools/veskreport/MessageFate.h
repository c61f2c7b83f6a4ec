// What became of a message that the tool sent.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "tools/veskreport/DiagnosticsClient.h"

namespace vesk {

/// Watches a session's messages from its construction on, if the daemon lets it.
class MessageWatch {
 public:
  /// `outcome`: only these; empty: all. `waits`: for what has not happened yet.
  MessageWatch(const Invocation& invocation, const Output& output, const Dictionary& sessionInfo,
               const char* outcome = "", bool waits = true);

  struct Fate {
    std::string backend;
    std::string outcome;  ///< "sent", "held until a flush", "deferred", "dropped" or "not answered yet"
    std::string cause;    ///< of a drop or a delay
  };
  /// The fate of the last message with that category and type, for each backend. Call it once the daemon has
  /// answered the message. Waits for the servers' answers, at most for the command's time. Empty if the
  /// daemon does not tell.
  std::vector<Fate> fates(std::uint16_t category, std::uint16_t type);

  /// How many messages the backends have dropped so far, and why the first.
  struct Drops {
    std::uint64_t count = 0;
    std::string cause;
  };
  Drops drops();

 private:
  struct Message {
    Fate fate;
    std::int64_t eventID;
    bool isDone;
  };
  std::vector<Dictionary> next(std::uint64_t& lost);
  void take(const Dictionary& record, std::uint16_t category, std::uint16_t type);
  bool isWaiting() const;
  std::string storebagVersion();

  const Invocation& _invocation;
  const Value _sessionID;
  DiagnosticsClient _daemon;
  bool _isOpen = false;
  std::vector<Message> _messages;
};

/// Reports the fates: one line each, or one object. Returns kExitFailed if all backends have dropped it.
int reportFates(const std::vector<MessageWatch::Fate>& fates, const std::optional<std::string>& answer,
                const Output& output);

}  // namespace vesk

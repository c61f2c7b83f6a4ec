// Injected faults: which requests get which bad answer.
#pragma once

#include <array>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/sync/Mutex.h"
#include "tools/collector/HTTPMessage.h"

namespace vesk {

enum class FaultTarget : unsigned char { Post, Storebag, Upload, LogData };
/// In the order of FaultTarget.
inline constexpr std::array<std::string_view, 4> kFaultTargetNames{"post", "storebag", "upload", "logdata"};

struct CollectorFault {
  enum class Kind : unsigned char {
    Answer,        ///< `status` with a line of text
    EmptyBody,     ///< the normal answer with an empty body
    BadSignature,  ///< storebags only: a signature over other bytes
    Transport,     ///< a fault of the connection, given by `transport`
  };
  Kind kind = Kind::Answer;
  unsigned status = 0;
  HTTPAnswer::Fault transport = HTTPAnswer::Fault::None;

  /// True if only the answer is affected: the events of such a post are accepted.
  bool isOnlyInTheAnswer() const;
  /// Turns the good answer into the bad one. Does nothing for BadSignature, which was applied while signing.
  void applyTo(HTTPAnswer& answer) const;
};

/// The pending faults of each target, in the order in which they were added. Thread-safe.
class FaultPlan {
 public:
  /// Adds a fault written as "target=fault" or "target=fault*times". The target is one of
  /// `kFaultTargetNames`; the fault is a status ("503", "answer=503") or a name listed by `faultNames`.
  /// Without "*times" the fault stays until another is added. "target=none" removes the target's faults.
  /// Returns an error message if the text is invalid.
  [[nodiscard]] std::optional<std::string> add(std::string_view text);
  void clear();

  /// Removes and returns the fault for the next request.
  std::optional<CollectorFault> take(FaultTarget target);

  /// The pending faults, each in the form that `add` accepts.
  std::vector<std::string> describe() const;

  /// "post=FAULT, storebag=FAULT, … or …", for help and error messages.
  static std::string forms();
  /// "500, stall, reset, …", for help and error messages.
  static std::string faultNames();

 private:
  struct Planned {
    CollectorFault fault;
    std::string name;
    std::optional<unsigned> times;  // nullopt: until another is added
  };

  mutable Mutex _mutex;
  std::array<std::deque<Planned>, kFaultTargetNames.size()> _planned VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk

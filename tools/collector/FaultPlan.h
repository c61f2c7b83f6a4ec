// Faults on demand: which request is to be answered how badly.
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
/// In the order of the targets.
inline constexpr std::array<std::string_view, 4> kFaultTargetNames{"post", "storebag", "upload", "logdata"};

struct CollectorFault {
  enum class Kind : unsigned char {
    Answer,        ///< `status` and a line of text
    EmptyBody,     ///< as without the fault, but nothing in the body
    BadSignature,  ///< storebags only: signed over other bytes
    Transport,     ///< as `transport` says
  };
  Kind kind = Kind::Answer;
  unsigned status = 0;
  HTTPAnswer::Fault transport = HTTPAnswer::Fault::None;

  /// The server did its work and only the answer suffers: events of such a post have been taken.
  bool isOnlyInTheAnswer() const;
  /// Turns the good answer into the bad one (BadSignature: leaves it, the storebag was signed badly already).
  void applyTo(HTTPAnswer& answer) const;
};

/// The faults still to come, per target in the order in which they were added. Thread-safe.
class FaultPlan {
 public:
  /// Adds one fault written as "target=fault" or "target=fault*times", where target is one of
  /// `kFaultTargetNames` and fault a status ("503", "answer=503") or one of the names that `faultNames`
  /// lists. Without "*times" it stays until another is added; "target=none" forgets that target's. What is
  /// wrong with the text comes back.
  [[nodiscard]] std::optional<std::string> add(std::string_view text);
  void clear();

  /// The fault for the next request, which counts as used.
  std::optional<CollectorFault> take(FaultTarget target);

  /// One text a fault still to come, as for `add`.
  std::vector<std::string> describe() const;

  /// "post=FAULT, storebag=FAULT, … or …", for help and messages.
  static std::string forms();
  /// "500, stall, reset, …", likewise.
  static std::string faultNames();

 private:
  struct Planned {
    CollectorFault fault;
    std::string name;
    std::optional<unsigned> times;  // none: until another is added
  };

  mutable Mutex _mutex;
  std::array<std::deque<Planned>, kFaultTargetNames.size()> _planned VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk

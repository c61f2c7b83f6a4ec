// Injected faults: which requests get which bad answer.
#pragma once

#include <array>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/sync/Mutex.h"
#include "tools/collector/HTTPMessage.h"

namespace vesk {

struct CollectorFault {
  unsigned status = 0;  ///< answered with a line of text; 0: the normal answer
  HTTPAnswer::Fault transport = HTTPAnswer::Fault::None;
  bool emptyBody = false;
  bool badSignature = false;  ///< storebags only: a signature over other bytes, made while signing
  /// Only the answer is affected: the events of such a post are accepted.
  bool isOnlyInTheAnswer = false;

  /// Turns the good answer into the bad one.
  void applyTo(HTTPAnswer& answer) const;
};

/// The pending faults of each target ("post", "storebag", "upload" and "logdata"), in the order in which they
/// were added. Thread-safe.
class FaultPlan {
 public:
  /// Adds a fault written as "target=fault" or "target=fault*times". The fault is a status ("503",
  /// "answer=503") or a name listed by `faultNames`.
  /// Without "*times" the fault stays until another is added. "target=none" removes the target's faults.
  /// Returns an error message if the text is invalid.
  [[nodiscard]] std::optional<std::string> add(std::string_view text);
  void clear();

  /// Removes and returns the fault for the next request.
  std::optional<CollectorFault> take(std::string_view target);

  /// The pending faults, each in the form that `add` accepts.
  std::vector<std::string> describe() const;

  /// How faults are written, for help and error messages.
  static constexpr std::string_view kForms = "post=FAULT, storebag=FAULT, upload=FAULT or logdata=FAULT";
  /// "500, stall, reset, …", for help and error messages.
  static std::string faultNames();

 private:
  struct Planned {
    CollectorFault fault;
    std::string name;
    std::optional<unsigned> times;  // nullopt: until another is added
  };

  using Target = std::pair<std::string_view, std::deque<Planned>>;
  Target* find(std::string_view name) VESK_REQUIRES(_mutex);

  mutable Mutex _mutex;
  std::array<Target, 4> _targets VESK_GUARDED_BY(_mutex){
      {{"post", {}}, {"storebag", {}}, {"upload", {}}, {"logdata", {}}}};
};

}  // namespace vesk

// Decides whether, where to and how an HTTPS backend reports.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The rules of a storebag's client entries, as a pure function of the values below. A decision lists every
/// rule that was applied, to explain why a backend reports or doesn't.
struct PostPolicy {
  struct Facts {
    Dictionary profile;  ///< the backend's, from the storebag
    std::optional<Dictionary> userInfo;
    bool requireUserInfo = false;
    std::string productFamily;
    std::optional<std::string> regionCode;
    bool dnuEnabled = false;    ///< the user agreed to the submission of diagnostics
    double samplingFactor = 0;  ///< the backend's draw, in [0, 1)
  };

  /// The settings that a decision makes. It starts from those of the previous decision, and a rule that isn't
  /// reached leaves its setting unchanged.
  struct Settings {
    std::optional<std::string> _postURL{};
    std::optional<std::string> _realtimePostURL{};
    bool _useDefaultPostURL = false;  ///< the URL comes from the preferences; storebags don't replace it
    bool _useDefaultRealtimePostURL = false;
    bool _batchEvents = false;
    std::int32_t _hierarchy = 0;
    std::int32_t _dnuType = 0;          ///< 0: consent respected; overridden: 1 without consent, 2 with it
    std::int32_t _eventThreshold = 49;  ///< messages of one method that a batch takes beyond the first
    std::int32_t _extrasOnInternal = 0;
    std::optional<Value> _overrideSampling{};  ///< a number
  };

  enum class Verdict {
    Ignored,   ///< the storebag's value has the wrong type and counts as absent
    Skips,     ///< the entry is for other clients
    Passes,    ///< reporting may continue
    Sets,      ///< the entry sets what the rule is about
    Defaults,  ///< the entry says nothing, and a default is set
    Holds,     ///< messages are held back
    Stops,     ///< reporting is off or, for the sampling threshold, left to the override band
  };

  /// One applied rule.
  struct Step {
    std::string_view rule;             ///< the storebag's key; "userInfo" and "state" have none
    std::optional<std::size_t> entry;  ///< index of the client entry in the profile's list
    Verdict verdict;
    Value value;     ///< the value of the device, user or draw, or the value that was set
    Value expected;  ///< what the entry says
  };

  struct Decision {
    std::int32_t state = 0;
    Settings settings;
    /// Set if the entry got as far as sampling; otherwise the earlier filters and threshold stay in force.
    std::optional<List> filters;
    std::optional<Value> samplingThreshold;  ///< a number; goes with `filters`
    std::vector<Step> steps;                 ///< in the order of the rules

    /// The first rule that held reporting back, or null.
    const Step* reason() const;
    /// The first client entry that is for the session, as an index; nullopt if there is none.
    std::optional<std::size_t> entry() const;
  };

  static Decision decide(const Facts& facts, const Settings& previous);
};

}  // namespace vesk

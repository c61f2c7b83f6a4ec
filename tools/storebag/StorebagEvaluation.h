// Decides about a storebag without a daemon, with the daemon's code.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/https/PostExplanation.h"
#include "platform/result/Result.h"
#include "tools/storebag/StorebagDevice.h"

namespace vesk {

/// A session to decide about.
struct StorebagSession {
  std::int32_t clientType = 5;
  std::optional<Dictionary> userInfo{};
  bool requireUserInfo = true;
  bool batchEvents = false;
  double draw = 0;
  std::optional<ExplainedMessage> message{};  ///< to explain
};

/// One of its messages.
struct StorebagMessage {
  std::optional<Dictionary> payload{};
  std::uint16_t category = 1;
  std::uint16_t type = 0;
};

/// The section of the storebag that applies to the device. Fails if there is none, or if no daemon would
/// accept the storebag for clients of that type. Expiry is left out.
Result<Dictionary> sectionFor(const Dictionary& payload, const StorebagDevice& device,
                              std::int32_t clientType);

/// The policy's input for a backend with that profile.
PostPolicy::Facts policyFacts(const Dictionary& profile, const StorebagDevice& device,
                              const StorebagSession& session);

/// What the daemon's `explain` would answer: `storebag` (its name), `version` and `backends`, each with the
/// entries of `explainPosts`; or `problem`.
Dictionary evaluateStorebag(const Dictionary& payload, const StorebagDevice& device,
                            const StorebagSession& session);

/// The event as it would be posted by the HTTPS backend with that profile; nullopt if the backend drops the
/// message or holds it back.
std::optional<Dictionary> eventThatLeaves(const Dictionary& profile, const StorebagDevice& device,
                                          const StorebagSession& session, const StorebagMessage& message);

}  // namespace vesk

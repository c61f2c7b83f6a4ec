// Puts a policy's decision into words and values for operators.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "backends/https/PostPolicy.h"

namespace vesk {

/// Whether backends of that name are HTTPS backends, which a policy governs.
bool isPostBackend(std::string_view name);

/// Why the rule held reporting back, as a clause such as "the region DE is not among FR, US".
std::string reasonOf(const PostPolicy::Step& step);

/// What an HTTPS backend would do: `state`, `reason` if it isn't enabled, `postURL`, `realtimePostURL`,
/// `batchEvents`, `filters`, `samplingShare` (of the sessions, 0 to 1), and `steps` with `rule`, `entry`,
/// `verdict`, `value` and `expected`. With a message, also `payload`: what the filters leave of its payload.
struct ExplainedMessage {
  Dictionary payload;
  std::uint16_t category = 0;
  std::uint16_t type = 0;
};
Dictionary explainPosts(const PostPolicy::Facts& facts, const PostPolicy::Settings& initial,
                        const std::optional<ExplainedMessage>& message = std::nullopt);
/// The message in a request, if it has a `payload`; with `category` and `type`.
std::optional<ExplainedMessage> explainedMessageIn(const Dictionary& request);

/// The settings that a backend begins with: URLs from the preferences replace those of storebags.
PostPolicy::Settings initialPostSettings(bool batchEvents);

}  // namespace vesk

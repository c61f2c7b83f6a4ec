#include "tools/storebag/StorebagEvaluation.h"

#include <VeskReporting/VeskReportingKeys.h>

#include "backends/VeskReportingBackend.h"
#include "backends/https/EventRecord.h"
#include "backends/https/PostBody.h"
#include "backends/https/PostExplanation.h"
#include "platform/time/Clock.h"
#include "protocol/StorebagName.h"
#include "storebag/Settings.h"
#include "storebag/StorebagAcceptance.h"
#include "storebag/StorebagProfile.h"
#include "storebag/StorebagSection.h"
#include "tools/storebag/StorebagKeys.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

constexpr std::uint16_t kSessionTypeStop = 1;

PostPolicy::Settings initialSettings(const StorebagDevice& device, const StorebagSession& session) {
  PostPolicy::Settings settings = device.initial;
  settings._batchEvents = session.batchEvents;
  return settings;
}

/// Whether such a device makes backends of that name.
bool hasBackend(const StorebagDevice& device, std::string_view name) {
  const bool hasNone = name == kVeskReportingBackendWren && device.hardwareType == Text::literal("Bramble");
  return keyNamed(backendKeys(), name) != nullptr && !hasNone;
}

BackendIdentity identityOf(const StorebagDevice& device, const StorebagSession& session) {
  BackendIdentity identity;
  identity._compType = session.clientType;
  identity._productVersion = device.productVersion;
  identity._buildVersion = device.buildVersion;
  identity._hardwareType = device.hardwareType;
  identity._productFamily = Text(device.productFamily);
  identity._isInternal = device.isInternal;
  identity._requireUserInfo = session.requireUserInfo;
  identity._batchEvents = session.batchEvents;
  identity._startTimeStamp = secondsFromTimeval(timevalFrom(WallClock::system().now()));
  return identity;
}

}  // namespace

Result<Dictionary> sectionFor(const Dictionary& payload, const StorebagDevice& device,
                              std::int32_t clientType) {
  const auto name = storebagNameForClientType(clientType);
  if (!name) return malformed("client type " + std::to_string(clientType) + " has no storebag");
  StorebagAcceptance acceptance(WallClock::system(), [] { return false; });
  if (const auto accepted = acceptance.accept(*name, payload); !accepted)
    return malformed("daemons refuse the storebag '" + std::string(*name) + "': " + accepted.error().text);
  auto section = storebagSectionForEnvironment(payload, device.environmentType, clientType);
  if (!section) return malformed("the storebag has no section for the environment " + device.environment());
  return *std::move(section);
}

PostPolicy::Facts policyFacts(const Dictionary& profile, const StorebagDevice& device,
                              const StorebagSession& session) {
  return {.profile = profile,
          .userInfo = session.userInfo,
          .requireUserInfo = session.requireUserInfo,
          .productFamily = device.productFamily,
          .regionCode = device.regionCode,
          .dnuEnabled = device.dnuEnabled,
          .samplingFactor = session.draw};
}

Dictionary evaluateStorebag(const Dictionary& payload, const StorebagDevice& device,
                            const StorebagSession& session) {
  const auto section = sectionFor(payload, device, session.clientType);
  if (!section) return {{"problem", section.error().text}};
  MutableDictionary backends;
  for (const auto& [name, profile] : *section) {
    if (profile.dictionary() == nullptr || !hasBackend(device, name.view())) continue;
    backends.set(name, isPostBackend(name.view())
                           ? explainPosts(policyFacts(*profile.dictionary(), device, session),
                                          initialSettings(device, session), session.message)
                           // No policy governs it.
                           : Dictionary{{"state", std::string(nameOfState(BackendStateEnabled))}});
  }
  MutableDictionary answer(
      Dictionary{{"storebag", std::string(*storebagNameForClientType(session.clientType))},
                 {"backends", backends.share()}});
  if (const auto version = profileText("storebag", payload, "version")) answer.set("version", *version);
  return answer.share();
}

std::optional<Dictionary> eventThatLeaves(const Dictionary& profile, const StorebagDevice& device,
                                          const StorebagSession& session, const StorebagMessage& message) {
  const auto decision =
      PostPolicy::decide(policyFacts(profile, device, session), initialSettings(device, session));
  if (decision.state != BackendStateEnabled) return std::nullopt;
  EventFilters filters;
  if (decision.filters) filters.createFiltersFromArray(*decision.filters, "storebag");
  const BackendIdentity identity = identityOf(device, session);
  const auto payload =
      message.type == kSessionTypeStop
          ? payloadWithStopEntries(message.payload, decision.settings, decision.samplingThreshold)
          : message.payload;
  auto event = createEventDictfromPayload({.payload = payload,
                                           .timestamp = timevalFrom(WallClock::system().now()),
                                           .method = message.category,
                                           .respCode = message.type,
                                           .eventID = 1,
                                           .identity = identity,
                                           .combinedSessionID = std::nullopt,
                                           .hasExtrasOnInternal = decision.settings._extrasOnInternal != 0},
                                          0);
  // The record describes the machine that this runs on.
  event.set("_internal", device.environmentType == kSeedEnvironment ? 2 : device.isInternal ? 1 : 0);
  prepareEventForMessage(event, session.userInfo, filters);
  EventBatch batch(identity._heldBytes, std::move(event));
  if (!createMessageForPostAndLogging(batch, "", WallClock::system().now(), false)) return std::nullopt;
  return batch.events().front().event.share();
}

}  // namespace vesk

// What the backends of a process share.
#pragma once

#include <atomic>
#include <cstddef>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "backends/HeldBytes.h"
#include "backends/dashboard/DashboardLinger.h"
#include "backends/https/AcceptedPosts.h"
#include "backends/https/RefusedPosts.h"
#include "backends/https/UnlistedClients.h"
#include "backends/upload/UploadGate.h"
#include "platform/http/HTTPClient.h"
#include "platform/queue/TimedQueue.h"
#include "platform/time/Clock.h"
#include "util/Counters.h"
#include "util/DeliveryTap.h"

namespace vesk {

class PowerLog;

/// Built once, by the daemon (`Daemon`). Everything in it outlives every backend.
struct BackendServices {
  HTTPClient& http;
  const WallClock& clock;
  Counters& counters;
  /// The queues on which datagrams are sent and acknowledgements received.
  TimedQueueMaker& networkQueues;
  /// A stable identifier of this installation. For true, the one that respects the user's diagnostics
  /// consent; for false, the one that is used if a storebag overrides it.
  std::function<std::string(bool respectsConsent)> persistentIdentifierForDNU{};
  /// Whether the user agreed to the submission of diagnostics.
  std::function<bool()> diagnosticsSubmissionConsent{};
  /// The two-letter country code of the current locale, if it has one.
  std::function<std::optional<std::string>()> regionCode{};
  /// Limits uploads; closed when the daemon stops.
  std::shared_ptr<UploadGate> uploads = std::make_shared<UploadGate>();
  /// Where power-log backends record events. If null, they record none.
  std::shared_ptr<PowerLog> powerLog = nullptr;
  /// How many dashboards may outlive their sessions.
  std::shared_ptr<DashboardLinger> dashboardLinger = std::make_shared<DashboardLinger>(kMaximumLingering);
  /// How many bytes of events may be held back.
  std::shared_ptr<HeldBudget> heldBudget = std::make_shared<HeldBudget>();
  /// How many bytes of posts may wait for servers that answer.
  std::shared_ptr<PostBudget> postBudget = std::make_shared<PostBudget>();
  /// Those who look at what becomes of messages.
  std::shared_ptr<DeliveryTap> tap = std::make_shared<DeliveryTap>();
  /// Set once the user withdrew consent: sessions that had it may not post by it any more.
  std::shared_ptr<std::atomic<bool>> consentWithdrawn = std::make_shared<std::atomic<bool>>(false);
  /// When servers accepted posts.
  std::shared_ptr<AcceptedPosts> acceptedPosts = std::make_shared<AcceptedPosts>();
  /// Logs clients that storebags do not list.
  std::shared_ptr<UnlistedClients> unlistedClients = std::make_shared<UnlistedClients>();
  /// Logs refused posts.
  std::shared_ptr<RefusedPosts> refusedPosts = std::make_shared<RefusedPosts>();
};

}  // namespace vesk

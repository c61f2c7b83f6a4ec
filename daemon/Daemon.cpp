#include "daemon/Daemon.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <time.h>

#include <algorithm>
#include <chrono>
#include <random>
#include <utility>

#include "common/PersistentIdentifiers.h"
#include "common/Resources.h"
#include "daemon/DiagnosticsObject.h"
#include "daemon/ReportingdAgent.h"
#include "daemon/SetupProblems.h"
#include "platform/device/DeviceInformation.h"
#include "platform/files/RootPrefix.h"
#include "platform/http/HTTPClient.h"
#include "platform/ipc/IPCListener.h"
#include "platform/log/SystemLog.h"
#include "platform/outbox/PostOutbox.h"
#include "platform/powerlog/PowerLog.h"
#include "platform/queue/QueueThread.h"
#include "platform/service/DescriptorLimit.h"
#include "protocol/WireNames.h"
#include "storebag/Settings.h"
#include "util/Counters.h"

namespace vesk {

namespace {

// Each connection takes four descriptors and its dashboard one more. The rest are for posts, files and so on.
constexpr std::size_t kDescriptorsOfConnection = 4;
constexpr std::size_t kOtherDescriptors = 256;

// The number of lines that one call site may log for one user in ten seconds.
constexpr std::uint64_t kLogRateLimit = 200;

constexpr char kKeptStorebags[] = "/var/lib/veskreportingd/storebags";
constexpr char kCountersPath[] = "/var/lib/veskreportingd/counters.toml";
constexpr char kOutboxPath[] = "/var/lib/veskreportingd/outbox.sqlite";
constexpr std::uint64_t kMostOutboxDays = 3650;

/// The wanted number of connections, or fewer if the process's descriptors don't suffice.
std::size_t maximumConnections(std::size_t wanted) {
  const std::size_t limit = descriptorLimit();
  const std::size_t fitting = std::max<std::size_t>(
      limit > kOtherDescriptors ? (limit - kOtherDescriptors) / kDescriptorsOfConnection : 0, 16);
  if (limit == 0 || wanted <= fitting) return wanted;
  VESK_LOG_WARNING("main: %zu descriptors are enough for %zu connections only", limit, fitting);
  return fitting;
}

IPCListener::Options listenerOptions(ServiceManager& serviceManager) {
  IPCListener::Options options;
  options.maximumConnections =
      maximumConnections(preferenceNumberForKey("maxConnections", 1).value_or(options.maximumConnections));
  options.maximumConnectionsPerUser =
      preferenceNumberForKey("maxConnectionsPerUser", 1).value_or(options.maximumConnectionsPerUser);
  options.socketPath = pathUnderRoot(wire::kSocketPath);
  options.objectPath = wire::kObjectPath;
  options.inherited = serviceManager.takeListeningSocket();
  return options;
}

void countFate(const PostOutbox::Fate& fate, RefusedPosts& refusedPosts) {
  using Outcome = PostOutbox::Outcome;
  DropReason reason = DropReason::DeliveredLate;
  switch (fate.outcome) {
    case Outcome::Delivered:
      break;
    case Outcome::Refused:
      refusedPosts.note(std::string(fate.source), fate.status, fate.events);
      reason = DropReason::RefusedLate;
      break;
    case Outcome::Expired:
      reason = DropReason::Expired;
      break;
    case Outcome::OverQuota:
      reason = DropReason::OverQuota;
      break;
    case Outcome::ConsentWithdrawn:
      reason = DropReason::ConsentWithdrawn;
      break;
    case Outcome::Damaged:
      reason = DropReason::Damaged;
      break;
    case Outcome::NotWritten:
      reason = DropReason::NotWritten;
      break;
    case Outcome::Exported:
      reason = DropReason::Exported;
      break;
  }
  Counters::shared().count(fate.source, reason, fate.events);
}

std::size_t bytesOfMiB(const char* preference, std::size_t byDefault) {
  constexpr std::uint64_t kMost = 1 << 30;
  auto wanted = preferenceNumberForKey(preference, 1);
  return wanted ? std::min(*wanted, kMost) << 20 : byDefault;
}

HeldBudget::Limits heldLimits() {
  HeldBudget::Limits limits;
  limits.ofUser = bytesOfMiB("maxHeldMiBPerUser", limits.ofUser);
  limits.ofAll = bytesOfMiB("maxHeldMiB", limits.ofAll);
  return limits;
}

/// Returns null unless the preference "keepStorebags" is set.
std::unique_ptr<const KeptStorebags> makeKeptStorebags(StorebagAcceptance& acceptance) {
  if (!preferenceFlagForKey("keepStorebags")) return nullptr;
  return std::make_unique<KeptStorebags>(pathUnderRoot(kKeptStorebags), publicKeysDER, &acceptance);
}

/// Called with the agent's monitor held.
double uniformlyRandom() {
  static std::minstd_rand generator{std::random_device{}()};
  return std::uniform_real_distribution<double>()(generator);
}

/// Since the device's start, including the time that it was suspended.
std::chrono::seconds uptime() {
  timespec now{};
  ::clock_gettime(CLOCK_BOOTTIME, &now);
  return std::chrono::seconds(now.tv_sec);
}

enum class OutboxMode { Off, Outage, Always };

OutboxMode outboxMode() {
  const std::string mode = preferenceStringForKey("outbox").value_or("outage");
  if (mode == "off") return OutboxMode::Off;
  if (mode == "always") return OutboxMode::Always;
  if (mode != "outage") {
    VESK_LOG_WARNING("main: preference 'outbox': '%s' is none of \"always\", \"outage\" and \"off\"",
                     mode.c_str());
  }
  return OutboxMode::Outage;
}

// In the mode "always" callers wait for this long, so that many of them share a transaction.
constexpr std::chrono::milliseconds kGroupCommit{50};

/// Returns null in the mode "off".
std::unique_ptr<PostOutbox> makeOutbox(OutboxMode mode, BusyMarker& busyMarker, RefusedPosts& refusedPosts) {
  if (mode == OutboxMode::Off) return nullptr;
  PostOutbox::Options options;
  options.path = pathUnderRoot(kOutboxPath);
  options.maximumBytes = bytesOfMiB("outboxMiB", options.maximumBytes);
  if (auto days = preferenceNumberForKey("outboxDays", 1)) {
    options.maximumAge = std::chrono::days(std::min<std::uint64_t>(*days, kMostOutboxDays));
  }
  if (mode == OutboxMode::Always) options.writeWithin = kGroupCommit;
  options.onWaiting = [&busyMarker](bool waiting) { waiting ? busyMarker.begin() : busyMarker.end(); };
  options.onFate = [&refusedPosts](const PostOutbox::Fate& fate) { countFate(fate, refusedPosts); };
  return std::make_unique<PostOutbox>(std::move(options));
}

// In this time a post is tried again from memory. Then it is put aside, and the session gets its result.
constexpr std::chrono::seconds kPutAsideAfter{5};

HTTPClient::Options httpOptions(OutboxMode mode, BusyMarker& busyMarker, PostOutbox* outbox) {
  HTTPClient::Options options;
  options.keeper = outbox;
  options.keepsFirst = mode == OutboxMode::Always;
  if (outbox) options.retryFor = kPutAsideAfter;
  options.userAgent = "veskreportingd/" VESK_VERSION;
  options.onIdle = [&busyMarker] { busyMarker.touch(); };
  return options;
}

PowerLog::Options powerLogOptions() {
  PowerLog::Options options;
  options.path = pathUnderRoot(kPowerLogPath);
  options.onLost = [](std::uint64_t events) {
    Counters::shared().count(kVeskReportingBackendKilnar, DropReason::NotRecorded, events);
  };
  return options;
}

/// Of every eight descriptors, a connection with a dashboard takes five and the dashboards that it creates
/// anew take two. The eighth is for a dashboard that waits for acknowledgements.
std::shared_ptr<DashboardLinger> dashboardLinger() {
  return std::make_shared<DashboardLinger>(
      static_cast<std::ptrdiff_t>(std::min(kMaximumLingering, descriptorLimit() / 8)));
}

void logLosses() {
  for (const auto& [backend, reason, count] : Counters::shared().snapshot()) {
    VESK_LOG_INFO("main: %s since the start: %s %s %llu", isLoss(reason) ? "Lost" : "Delayed",
                  backend.c_str(), std::string(nameOfDropReason(reason)).c_str(),
                  static_cast<unsigned long long>(count));
  }
}

}  // namespace

struct Daemon::Parts {
  Parts(ServiceManager& manager, BusyMarker& busyMarker, std::function<void()> reload)
      : serviceManager(manager),
        backendServices{.http = http,
                        .clock = WallClock::system(),
                        .counters = Counters::shared(),
                        .networkQueues = networkQueues,
                        .persistentIdentifierForDNU =
                            [](bool respectsConsent) { return persistentIdentifierForDNU(respectsConsent); },
                        .diagnosticsSubmissionConsent = [this] { return consent(); },
                        .regionCode = regionCode,
                        .powerLog = std::make_shared<PowerLog>(powerLogOptions()),
                        .dashboardLinger = dashboardLinger()},
        sessionServices{.backends = backendServices, .libraryVersion = clientLibraryVersion()},
        keptStorebags(makeKeptStorebags(acceptance)),
        mode(outboxMode()),
        outbox(makeOutbox(mode, busyMarker, *backendServices.refusedPosts)),
        http(httpOptions(mode, busyMarker, outbox.get())),
        agent(std::make_shared<ReportingdAgent>(
            sessionServices, storebagFetcher(), busyMarker, keptStorebagSource(),
            [this](std::string_view name) { return acceptance.hasExpired(name); })),
        diagnostics(std::make_shared<Diagnostics>(Diagnostics::Sources{.agent = *agent,
                                                                       .services = backendServices,
                                                                       .outbox = outbox.get(),
                                                                       .settings = settingsInForce(),
                                                                       .publicKeys = publicKeysDER,
                                                                       .history = history})),
        operations(std::make_shared<Operations>(Operations::Sources{.agent = *agent,
                                                                    .services = backendServices,
                                                                    .outbox = outbox.get(),
                                                                    .reload = std::move(reload)})),
        listener(listenerOptions(serviceManager)) {
    backendServices.heldBudget = std::make_shared<HeldBudget>(heldLimits());
    backendServices.postBudget = std::make_shared<PostBudget>(PostBudget::Limits{}, outbox.get());
    listener.setDelegate(agent.get());
    agent->setDiagnostics(wire::kDiagnosticsPath, [this](const IPCPeer& peer) {
      return diagnosticsObject(diagnostics, operations, peer);
    });
    if (!outbox) return;
    outbox->setConsent(diagnosticsSubmissionConsent());
    outbox->start(http);
  }

  /// Also called for each new session, so that a withdrawal reaches the posts that wait.
  bool consent() const {
    const bool consent = diagnosticsSubmissionConsent();
    if (consent) *backendServices.consentWithdrawn = false;
    if (outbox) outbox->setConsent(consent);
    return consent;
  }

  /// Ends the client and writes what it could not deliver.
  void stopPosting() {
    if (outbox) outbox->stopSending();
    http.stop();
    if (outbox) outbox->stop();
  }

  StorebagFetcher storebagFetcher() {
    return [this](std::int32_t clientType, std::int32_t& maxAge, std::optional<std::string>& version,
                  bool& notModified, std::optional<std::string>& lastModified, FetchFacts& facts) {
      const LibraryFacts library{sessionServices.libraryVersion, publicKeysDER, &acceptance, &facts};
      auto section = fetchStorebagForEnvironmentAndClientType(
          http, library, clientType, maxAge, version, notModified, &lastModified, keptStorebags.get());
      if (!section && !notModified) fetchProblems.note({clientType, facts.status, !publicKeysDER().empty()});
      return section;
    };
  }

  std::optional<KeptStorebagSource> keptStorebagSource() const {
    if (!keptStorebags) return std::nullopt;
    return KeptStorebagSource{
        .load =
            [this](std::int32_t clientType) { return keptStorebagForClientType(*keptStorebags, clientType); },
        .random = uniformlyRandom,
        .uptime = uptime};
  }

  ServiceManager& serviceManager;
  // Sending a datagram doesn't block, so one thread serves all backends.
  QueueThread networkQueues;
  // Declared before the client: posts that complete while the client ends still use the services.
  BackendServices backendServices;
  SessionServices sessionServices;
  FetchProblems fetchProblems;  // used with the agent's monitor held
  StorebagAcceptance acceptance{WallClock::system(), kernelClockIsSet};
  std::unique_ptr<const KeptStorebags> keptStorebags;  // null: storebags are kept in memory only
  const OutboxMode mode;
  // Null: posts that can't be delivered for a minute are lost. Declared before the client, whose posts it
  // keeps.
  std::unique_ptr<PostOutbox> outbox;
  HTTPClient http;
  std::shared_ptr<ReportingdAgent> agent;
  CounterHistory history{pathUnderRoot(kCountersPath), Counters::shared()};
  std::shared_ptr<const Diagnostics> diagnostics;
  std::shared_ptr<Operations> operations;
  IPCListener listener;
};

Daemon::Daemon(ServiceManager& serviceManager, BusyMarker& busyMarker, std::function<void()> reload)
    : _parts(std::make_unique<Parts>(serviceManager, busyMarker, std::move(reload))) {
  warnOfUnknownSettings();
  SystemLog::setRateLimit(preferenceNumberForKey("logRateLimit", 0).value_or(kLogRateLimit));
}

Daemon::~Daemon() {
  if (!stop()) _parts->listener.stop();
}

void Daemon::resume() { _parts->listener.resume(); }

void Daemon::takeStock() {
  _parts->history.save();
  std::uint64_t lost = 0;
  for (const auto& [backend, reason, count] : Counters::shared().snapshot())
    lost += isLoss(reason) ? count : 0;
  const auto outbox = _parts->outbox ? _parts->outbox->status() : PostOutbox::Status{};
  _parts->serviceManager.notifyStatus(std::to_string(_parts->agent->sessions().size()) + " connections, " +
                                      std::to_string(outbox.posts) + " posts wait, " + std::to_string(lost) +
                                      " messages lost since the start");
}

bool Daemon::stop() {
  if (std::exchange(_stopped, true)) return !_parts;
  // Connection threads may be waiting for a server that does not answer.
  _parts->http.stopAllButPosts();
  _parts->backendServices.uploads->close();
  const bool haveEnded = _parts->listener.stopWithin(kSessionWait);
  if (!haveEnded) {
    VESK_LOG_WARNING("main: Stopping although sessions have not ended after %d seconds.",
                     static_cast<int>(kSessionWait.count()));
  }
  const auto begun = std::chrono::steady_clock::now();
  if (!_parts->http.waitUntilIdle(kPostWait)) {
    VESK_LOG_WARNING("main: Stopping although posts are still outstanding after %d seconds.",
                     static_cast<int>(kPostWait.count()));
  }
  const auto waited =
      std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - begun);
  if (!_parts->networkQueues.waitUntilUnused(kDatagramWait - std::min(waited, kDatagramWait))) {
    VESK_LOG_WARNING("main: Stopping although datagrams are still unacknowledged after %d ms.",
                     static_cast<int>(kDatagramWait.count()));
  }
  _parts->stopPosting();  // puts aside, or abandons and counts, what is left
  _parts->history.save();
  if (haveEnded) _parts.reset();
  logLosses();
  return haveEnded;
}

}  // namespace vesk

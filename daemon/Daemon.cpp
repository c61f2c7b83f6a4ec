#include "daemon/Daemon.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <chrono>
#include <utility>

#include "common/PersistentIdentifiers.h"
#include "common/Resources.h"
#include "daemon/ReportingdAgent.h"
#include "platform/device/DeviceInformation.h"
#include "platform/files/RootPrefix.h"
#include "platform/http/HTTPClient.h"
#include "platform/ipc/IPCListener.h"
#include "platform/log/SystemLog.h"
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

HTTPClient::Options httpOptions(BusyMarker& busyMarker) {
  HTTPClient::Options options;
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
  for (const auto& loss : Counters::shared().snapshot()) {
    VESK_LOG_INFO("main: Lost since the start: %s %s %llu", loss.backend.c_str(),
                  std::string(nameOfDropReason(loss.reason)).c_str(),
                  static_cast<unsigned long long>(loss.count));
  }
}

}  // namespace

struct Daemon::Parts {
  Parts(ServiceManager& serviceManager, BusyMarker& busyMarker)
      : backendServices{.http = http,
                        .clock = WallClock::system(),
                        .counters = Counters::shared(),
                        .networkQueues = networkQueues,
                        .persistentIdentifierForDNU =
                            [](bool respectsConsent) { return persistentIdentifierForDNU(respectsConsent); },
                        .diagnosticsSubmissionConsent = diagnosticsSubmissionConsent,
                        .regionCode = regionCode,
                        .powerLog = std::make_shared<PowerLog>(powerLogOptions()),
                        .dashboardLinger = dashboardLinger()},
        sessionServices{.backends = backendServices, .libraryVersion = clientLibraryVersion()},
        http(httpOptions(busyMarker)),
        agent(std::make_shared<ReportingdAgent>(sessionServices, storebagFetcher(), busyMarker)),
        listener(listenerOptions(serviceManager)) {
    backendServices.heldBudget = std::make_shared<HeldBudget>(heldLimits());
    listener.setDelegate(agent.get());
  }

  StorebagFetcher storebagFetcher() {
    return [this, library = LibraryFacts{sessionServices.libraryVersion, publicKeyDER}](
               std::int32_t clientType, std::int32_t& maxAge, std::optional<std::string>& version,
               bool& notModified, std::optional<std::string>& lastModified) {
      return fetchStorebagForEnvironmentAndClientType(http, library, clientType, maxAge, version, notModified,
                                                      &lastModified);
    };
  }

  // Sending a datagram doesn't block, so one thread serves all backends.
  QueueThread networkQueues;
  // Declared before the client: posts that complete while the client ends still use the services.
  BackendServices backendServices;
  SessionServices sessionServices;
  HTTPClient http;
  std::shared_ptr<ReportingdAgent> agent;
  IPCListener listener;
};

Daemon::Daemon(ServiceManager& serviceManager, BusyMarker& busyMarker)
    : _parts(std::make_unique<Parts>(serviceManager, busyMarker)) {
  SystemLog::setRateLimit(preferenceNumberForKey("logRateLimit", 0).value_or(kLogRateLimit));
}

Daemon::~Daemon() {
  if (!stop()) _parts->listener.stop();
}

void Daemon::resume() { _parts->listener.resume(); }

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
  if (haveEnded) _parts.reset();  // abandons and counts what is left
  logLosses();
  return haveEnded;
}

}  // namespace vesk

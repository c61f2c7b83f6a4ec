#include "backends/dashboard/DashboardBackend.h"

#include <algorithm>
#include <exception>
#include <utility>

#include "backends/dashboard/DashboardText.h"
#include "platform/log/SystemLog.h"
#include "storebag/StorebagProfile.h"

namespace vesk {

namespace {

constexpr char kQueueLabel[] = "com.corvane.VeskReporting.networkProc";
/// The longest tick: longer than any process runs, but within the clock's range.
constexpr auto kLongestTick =
    std::chrono::duration_cast<std::chrono::milliseconds>(TimedQueue::Clock::duration::max()) / 4;
constexpr std::int64_t kMicrosecondsPerStep = 4000;

/// The server and delivery settings of a profile.
struct Settings {
  IPv4Endpoint server;
  bool isReliable = true;
  std::chrono::milliseconds tick = DashboardDelivery::kDefaultTick;
};

/// Invalid addresses map to 255.255.255.255, to which connecting fails.
IPv4Endpoint serverAt(std::string_view ip, std::uint16_t port) {
  return IPv4Endpoint::parse(ip, port).value_or(IPv4Endpoint{0xFFFF'FFFF, port});
}

std::chrono::milliseconds tickFrom(std::int64_t reliable) {
  if (reliable > 0) return std::min(std::chrono::milliseconds(reliable), kLongestTick);
  VESK_LOG_WARNING("DashboardBackend(initWithName): 'reliable' can't be %lld ms, using %d ms",
                   static_cast<long long>(reliable),
                   static_cast<int>(DashboardDelivery::kDefaultTick.count()));
  return DashboardDelivery::kDefaultTick;
}

/// Returns nullopt, and logs a line, if the profile does not specify the server.
std::optional<Settings> settingsFrom(const std::string& name, const Dictionary& profile) {
  auto ip = profileText(name, profile, "ip");
  if (!ip) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): can't resolve server IP");
    return std::nullopt;
  }
  auto port = profileIntegerOrNumericText(name, profile, "port");
  if (!port) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): can't resolve server port");
    return std::nullopt;
  }
  auto reliable = profileIntegerOrNumericText(name, profile, "reliable");
  return Settings{serverAt(*ip, static_cast<std::uint16_t>(*port)), reliable.has_value(),
                  reliable ? tickFrom(*reliable) : DashboardDelivery::kDefaultTick};
}

std::optional<Settings> settingsFrom(const std::optional<std::string>& serverIP, std::uint16_t serverPort) {
  if (!serverIP) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): initWitName with all null params.");
    return std::nullopt;
  }
  return Settings{serverAt(*serverIP, serverPort)};
}

std::shared_ptr<TimedQueue> networkQueue(const BackendServices& services) {
  try {
    return services.networkQueues.makeQueue(kQueueLabel);
  } catch (const std::exception&) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): can't create timer source.");
    return nullptr;
  }
}

}  // namespace

std::shared_ptr<DashboardBackend> DashboardBackend::create(const std::string& name,
                                                           const std::optional<Dictionary>& profile,
                                                           const BackendIdentity& identity,
                                                           const BackendServices& services) {
  return createConnected(name, profile, std::nullopt, 0, identity, services);
}

std::shared_ptr<DashboardBackend> DashboardBackend::create(const std::string& name,
                                                           const std::optional<std::string>& serverIP,
                                                           std::uint16_t serverPort,
                                                           const BackendIdentity& identity,
                                                           const BackendServices& services) {
  if (!serverIP) return nullptr;
  return createConnected(name, std::nullopt, serverIP, serverPort, identity, services);
}

std::shared_ptr<DashboardBackend> DashboardBackend::createConnected(
    const std::string& name, const std::optional<Dictionary>& profile,
    const std::optional<std::string>& serverIP, std::uint16_t serverPort, const BackendIdentity& identity,
    const BackendServices& services) {
  auto settings = profile ? settingsFrom(name, *profile) : std::nullopt;
  if (profile && !settings) return nullptr;
  UDPSocket socket;
  if (const auto opened = socket.open(); !opened) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): socket() failed (%d)", opened.error().number);
    return nullptr;
  }
  auto queue = networkQueue(services);
  if (!queue) return nullptr;
  auto outcomes = std::make_shared<Outcomes>(name, identity, services.counters, services.tap);
  auto delivery = std::make_shared<DashboardDelivery>(std::move(socket), std::move(queue),
                                                      services.dashboardLinger, outcomes);
  std::shared_ptr<DashboardBackend> backend(
      new DashboardBackend(name, profile, identity, delivery, services, std::move(outcomes)));
  if (!profile) settings = settingsFrom(serverIP, serverPort);
  if (!settings) return nullptr;  // here and below, the destructor cleans up
  if (settings->isReliable) delivery->useReliableUDP();
  if (!delivery->connect(settings->server)) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): socket connect() failed.");
    return nullptr;
  }
  if (!delivery->start(settings->tick)) {
    VESK_LOG_ERROR("DashboardBackend(initWithName): can't create timer source.");
    return nullptr;
  }
  return backend;
}

DashboardBackend::DashboardBackend(const std::string& name, const std::optional<Dictionary>& profile,
                                   const BackendIdentity& identity,
                                   std::shared_ptr<DashboardDelivery> delivery,
                                   const BackendServices& services, std::shared_ptr<Outcomes> outcomes)
    : VeskReportingBackend(name, profile, identity, services, std::move(outcomes)),
      _usingProfile(profile.has_value()),
      _postURL(profileText(name, _profile, "post_url")),
      _delivery(std::move(delivery)) {
  MutexLock lock(_mutex);
  _displayURL = profileText(name, _profile, "display_url");
}

// For a backend whose session never cleaned it up.
DashboardBackend::~DashboardBackend() { _delivery->cleanup(); }

DashboardHeader DashboardBackend::headerFor(const timeval& timestamp, std::uint16_t method,
                                            std::uint16_t respCode, std::uint16_t eventID) const {
  DashboardHeader header;
  header.subsecond = static_cast<std::uint8_t>(timestamp.tv_usec / kMicrosecondsPerStep);
  header.seconds = static_cast<std::uint32_t>(timestamp.tv_sec);
  header.method = method;
  header.respCode = respCode;
  header.eventID = eventID;
  header.isReliable = _delivery->isReliable();
  header.isWithoutProfile = !_usingProfile;
  header.libraryVersionMajor = _identity._selfVersionMajor;
  header.clientType = static_cast<std::uint8_t>(_identity._compType);
  header.sessionID = _identity._sessionID;
  header.clientVersion = _identity._clientVersion;
  const std::string& udid = _identity._udid;
  std::copy_n(udid.begin(), std::min(udid.size(), header.deviceID.size()), header.deviceID.begin());
  return header;
}

std::optional<std::string> DashboardBackend::sendMessageInTurn(const std::optional<Dictionary>& payload,
                                                               const timeval& timestamp, std::uint16_t method,
                                                               std::uint16_t respCode, std::uint16_t eventID,
                                                               std::int32_t) {
  auto buffer = std::make_unique_for_overwrite<DashboardDelivery::Buffer>();
  if (!buffer) {
    VESK_LOG_ERROR("DashboardBackend(sendMessage): can't malloc.");
    return std::nullopt;
  }
  DashboardHeader header = headerFor(timestamp, method, respCode, eventID);
  const std::size_t textLength =
      payload ? writePayloadText(*payload, buffer->data() + kDashboardHeaderSize, kDashboardTextArea) : 0;
  header.length = static_cast<std::uint16_t>(kDashboardHeaderSize + textLength);
  encodeDashboardHeader(header, buffer->data());
  auto line = writeLocalLog({buffer->data(), header.length});
  if (_outcomes->watchesMessages()) {
    _outcomes->show("message", "posted", {{"category", method}, {"type", respCode}, {"eventID", eventID}},
                    line.value_or(""));
  }
  _delivery->send(std::move(buffer), header.length, eventID);
  return line;
}

}  // namespace vesk

#include "tools/collector/Collector.h"

#include <stdexcept>

#include "tools/collector/CertificateAuthority.h"
#include "tools/collector/ControlEndpoint.h"
#include "tools/collector/EventsEndpoint.h"
#include "tools/collector/LogDataEndpoint.h"
#include "tools/collector/StorebagEndpoint.h"
#include "tools/collector/UploadsEndpoint.h"

namespace vesk {

namespace {

constexpr char kEventsPath[] = "/events";
constexpr char kGeneralStorebagsPath[] = "/bags";
constexpr char kPartnersStorebagsPath[] = "/storebags";
constexpr char kStorebagBase[] = "/bags/sorrel";
constexpr char kLogDataPath[] = "/logdata";
constexpr char kUploadsPath[] = "/uploads";
constexpr char kControlPath[] = "/_control";

CollectorOptions completed(CollectorOptions options) {
  namespace fs = std::filesystem;
  options.directory = fs::absolute(options.directory);
  if (options.storebags.empty()) options.storebags = options.directory / "storebags";
  if (options.events.empty()) options.events = options.directory / "events.jsonl";
  if (options.uploads.empty()) options.uploads = options.directory / "uploads";
  options.storebags = fs::absolute(options.storebags);
  options.events = fs::absolute(options.events);
  options.uploads = fs::absolute(options.uploads);
  fs::create_directories(options.directory);
  fs::create_directories(options.storebags);
  fs::create_directories(options.events.parent_path());
  return options;
}

}  // namespace

struct Collector::Parts {
  Parts(CollectorOptions given, Console& theConsole)
      : options(completed(std::move(given))),
        console(theConsole),
        authority(CertificateAuthority::openOrCreate(options.directory)),
        key(SigningKey::openOrCreate(options.directory)),
        folder(options.storebags, options.checks),
        events({console, stats, faults}, options.events),
        uploads({console, stats, faults}, options.uploads, options.uploadAnswer),
        storebags({console, stats, faults}, folder, key, options.maximumAge),
        logData({console, stats, faults}, options.directory / "logdata"),
        control(console, stats, faults),
        securePaths(Refusals(console, stats)),
        plainPaths(Refusals(console, stats)) {
    for (const auto& fault : options.faults)
      if (auto problem = faults.add(fault)) throw std::runtime_error(*problem);
    // Further HTTP endpoints are created above and get their paths here.
    for (EndpointTable* paths : {&securePaths, &plainPaths}) {
      paths->add(kEventsPath, events);
      paths->add(kLogDataPath, logData);
      paths->add(kUploadsPath, uploads);
      paths->add(kGeneralStorebagsPath, storebags);
      paths->add(kPartnersStorebagsPath, storebags);
    }
    plainPaths.add(kControlPath, control);
    secure = serve(securePaths, options.httpsPort, authority.issueServerIdentity(options.names));
    plain = serve(plainPaths, options.httpPort, std::nullopt);
    // Dashboards only support IPv4.
    if (IPv4Endpoint::parse(options.address, 0)) {
      datagrams = std::make_unique<DashboardReceiver>(DashboardReceiver::Parts{console, stats},
                                                      options.address, options.udpPort, options.datagramLoss,
                                                      options.directory / "datagrams.jsonl");
    }
  }

  std::unique_ptr<HTTPServer> serve(const EndpointTable& paths, std::uint16_t port,
                                    std::optional<TLSIdentity> identity) {
    HTTPServer::Options server;
    server.address = options.address;
    server.port = port;
    server.tls = std::move(identity);
    server.maximumBody = UploadsEndpoint::kMaximumBody;
    server.onRefused = [this](const std::string& line) {
      ++stats.notHTTP;
      console.problem("refused " + line);
    };
    return std::make_unique<HTTPServer>(
        server, [&paths](const HTTPReceived& received) { return paths.answer(received); });
  }

  const CollectorOptions options;
  Console& console;
  CollectorStats stats;
  FaultPlan faults;
  const CertificateAuthority authority;
  const SigningKey key;
  StorebagFolder folder;
  EventsEndpoint events;
  UploadsEndpoint uploads;
  StorebagEndpoint storebags;
  LogDataEndpoint logData;
  ControlEndpoint control;
  EndpointTable securePaths;
  EndpointTable plainPaths;

  // Last, since their threads use all of the above.
  std::unique_ptr<HTTPServer> secure;
  std::unique_ptr<HTTPServer> plain;
  std::unique_ptr<DashboardReceiver> datagrams;
};

Collector::Collector(CollectorOptions options, Console& console)
    : _parts(std::make_unique<Parts>(std::move(options), console)) {}

Collector::~Collector() = default;

Dictionary Collector::facts() const {
  const auto& directory = _parts->options.directory;
  std::string https = _parts->secure->baseURL();
  std::string http = _parts->plain->baseURL();
  return Dictionary{
      {"httpsPort", static_cast<int>(_parts->secure->port())},
      {"httpPort", static_cast<int>(_parts->plain->port())},
      {"udpPort", static_cast<int>(_parts->datagrams ? _parts->datagrams->port() : 0)},
      {"eventsURL", https + kEventsPath},
      {"logDataURL", https + kLogDataPath},
      {"uploadsURL", https + kUploadsPath},
      {"storebagURL", https + kStorebagBase},
      {"controlURL", http + kControlPath},
      {"authorityFile", CertificateAuthority::certificateFile(directory).string()},
      {"publicKeyFile", SigningKey::publicKeyFile(directory).string()},
      {"signingKeyFile", SigningKey::privateKeyFile(directory).string()},
      {"storebags", _parts->options.storebags.string()},
      {"events", _parts->options.events.string()},
      {"datagrams", (directory / "datagrams.jsonl").string()},
      {"uploads", _parts->options.uploads.string()},
  };
}

std::string Collector::introduction() const {
  Dictionary all = facts();
  auto fact = [&](const char* key) { return all.text(key)->string(); };
  std::string http = _parts->plain->baseURL();
  return "veskcollector takes events at " + fact("eventsURL") + " and " + http + kEventsPath +
         "\n  and saves them to " + fact("events") + "\nIt takes files at " + fact("uploadsURL") +
         " and saves them in " + fact("uploads") + "\nIt serves storebags at " + fact("storebagURL") +
         " and " + http + kStorebagBase + "\n  from NAME.toml and NAME.json in " + fact("storebags") +
         (_parts->datagrams ? "\nIt takes dashboards' datagrams on UDP port " +
                                  std::to_string(_parts->datagrams->port()) + "\n  and saves them to " +
                                  fact("datagrams") + "; their log data goes to " + fact("logDataURL")
                            : std::string()) +
         "\nClients trust it with    SSL_CERT_FILE=" + fact("authorityFile") +
         "\nStorebags are verified with publicKey.der from " + fact("publicKeyFile") +
         "\nThe daemon finds it with the preference    veskreporting_storebag_url = \"" +
         fact("storebagURL") + "\"\nFaults are set and counters read at " + fact("controlURL");
}

}  // namespace vesk

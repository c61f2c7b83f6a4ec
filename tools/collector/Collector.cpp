#include "tools/collector/Collector.h"

#include <stdexcept>

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

Collector::Collector(CollectorOptions options, Console& console)
    : _options(completed(std::move(options))),
      _services{console, _stats, _faults},
      _authority(CertificateAuthority::openOrCreate(_options.directory)),
      _key(SigningKey::openOrCreate(_options.directory)),
      _events(_services, _options.events),
      _uploads(_services, _options.uploads, _options.uploadAnswer),
      _storebags(_services, _options.storebags, _options.checks, _key, _options.maximumAge),
      _logData(_services, _options.directory / "logdata"),
      _control(_services),
      _securePaths(_services),
      _plainPaths(_services) {
  for (const auto& fault : _options.faults)
    if (auto problem = _faults.add(fault)) throw std::runtime_error(*problem);
  // Further HTTP endpoints are created above and get their paths here.
  for (EndpointTable* paths : {&_securePaths, &_plainPaths}) {
    paths->add(kEventsPath, _events);
    paths->add(kLogDataPath, _logData);
    paths->add(kUploadsPath, _uploads);
    paths->add(kGeneralStorebagsPath, _storebags);
    paths->add(kPartnersStorebagsPath, _storebags);
  }
  _plainPaths.add(kControlPath, _control);
  _secure = serve(_securePaths, _options.httpsPort, _authority.issueServerIdentity(_options.names));
  _plain = serve(_plainPaths, _options.httpPort, std::nullopt);
  // Dashboards only support IPv4.
  if (IPv4Endpoint::parse(_options.address, 0))
    _datagrams =
        std::make_unique<DashboardReceiver>(_services, _options.address, _options.udpPort,
                                            _options.datagramLoss, _options.directory / "datagrams.jsonl");
}

std::unique_ptr<HTTPServer> Collector::serve(EndpointTable& paths, std::uint16_t port,
                                             std::optional<TLSIdentity> identity) {
  HTTPServer::Options server;
  server.address = _options.address;
  server.port = port;
  server.tls = std::move(identity);
  server.maximumBody = UploadsEndpoint::kMaximumBody;
  server.onRefused = [this](const std::string& line) {
    ++_stats.notHTTP;
    _services.console.problem("refused " + line);
  };
  return std::make_unique<HTTPServer>(
      server, [&paths](const HTTPReceived& received) { return paths.answer(received); });
}

Dictionary Collector::facts() const {
  const auto& directory = _options.directory;
  std::string https = _secure->baseURL();
  std::string http = _plain->baseURL();
  return Dictionary{
      {"httpsPort", static_cast<int>(_secure->port())},
      {"httpPort", static_cast<int>(_plain->port())},
      {"udpPort", static_cast<int>(_datagrams ? _datagrams->port() : 0)},
      {"eventsURL", https + kEventsPath},
      {"logDataURL", https + kLogDataPath},
      {"uploadsURL", https + kUploadsPath},
      {"storebagURL", https + kStorebagBase},
      {"controlURL", http + kControlPath},
      {"authorityFile", CertificateAuthority::certificateFile(directory).string()},
      {"publicKeyFile", SigningKey::publicKeyFile(directory).string()},
      {"signingKeyFile", SigningKey::privateKeyFile(directory).string()},
      {"storebags", _options.storebags.string()},
      {"events", _options.events.string()},
      {"datagrams", (directory / "datagrams.jsonl").string()},
      {"uploads", _options.uploads.string()},
  };
}

std::string Collector::introduction() const {
  Dictionary all = facts();
  auto fact = [&](const char* key) { return all.text(key)->string(); };
  std::string http = _plain->baseURL();
  return "veskcollector takes events at " + fact("eventsURL") + " and " + http + kEventsPath +
         "\n  and saves them to " + fact("events") + "\nIt takes files at " + fact("uploadsURL") +
         " and saves them in " + fact("uploads") + "\nIt serves storebags at " + fact("storebagURL") +
         " and " + http + kStorebagBase + "\n  from NAME.toml and NAME.json in " + fact("storebags") +
         (_datagrams ? "\nIt takes dashboards' datagrams on UDP port " + std::to_string(_datagrams->port()) +
                           "\n  and saves them to " + fact("datagrams") + "; their log data goes to " +
                           fact("logDataURL")
                     : std::string()) +
         "\nClients trust it with    SSL_CERT_FILE=" + fact("authorityFile") +
         "\nStorebags are verified with publicKey.der from " + fact("publicKeyFile") +
         "\nThe daemon finds it with the preference    veskreporting_storebag_url = \"" +
         fact("storebagURL") + "\"\nFaults are set and counters read at " + fact("controlURL");
}

std::string Collector::summary() const {
  return "events taken: " + std::to_string(_stats.events) + ", posts: " + std::to_string(_stats.posts) +
         ", repeated events left out: " + std::to_string(_stats.eventsRepeated);
}

}  // namespace vesk

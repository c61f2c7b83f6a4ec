#include "tests/support/DaemonHarness.h"

#include <algorithm>
#include <csignal>
#include <cstdio>
#include <sstream>
#include <stdexcept>

#include "tests/support/ProcessFacts.h"

namespace vesk::test {

namespace {

constexpr char kReleaseStorebag[] = R"(
version = "2024.1"
refresh_cycle = 3600
[[release.httpPost.clients]]
post_url = "@EVENTS@"
)";

std::string replaced(std::string text, std::string_view what, const std::string& with) {
  for (std::size_t at; (at = text.find(what)) != std::string::npos;) text.replace(at, what.size(), with);
  return text;
}

std::string quoted(const std::string& text) { return "\"" + text + "\""; }

std::string tomlLines(const std::map<std::string, std::string>& entries) {
  std::string lines;
  for (const auto& [key, value] : entries) {
    if (!value.empty()) lines += key + " = " + value + "\n";
  }
  return lines;
}

}  // namespace

DaemonHarness::DaemonHarness(std::vector<std::string> collectorArguments) {
  std::filesystem::create_directories(root / "usr/share");
  std::filesystem::copy(VESK_SHARE_DIRECTORY, root / "usr/share/veskreporting",
                        std::filesystem::copy_options::recursive);
  for (const auto& file : std::filesystem::recursive_directory_iterator(root / "usr/share")) {
    using std::filesystem::perms;  // a checkout's group may have write permission
    permissions(file.path(), perms::group_write | perms::others_write, std::filesystem::perm_options::remove);
  }
  for (const char* directory :
       {"run", "var/lib/veskreportingd", "var/mobile/Library/Logs/Dunmore", "storebags"}) {
    std::filesystem::create_directories(root / directory);
  }
  collectorArguments.insert(collectorArguments.end(),
                            {"--https-port", "0", "--http-port", "0", "--udp-port", "0"});
  startCollector(std::move(collectorArguments));
  std::filesystem::copy_file(fact("publicKeyFile"), root / "usr/share/veskreporting/publicKey.der");
  setPreference("veskreporting_storebag_url", quoted(fact("storebagURL")));
  setPreference("environmentType", "4");
  setPreference("diagnosticsSubmission", "true");
  setDeviceFact("DeviceName", quoted("Phone"));
  setDeviceFact("RegionCode", quoted("US"));
  writeStorebag("zelko", kReleaseStorebag);
}

void DaemonHarness::startCollector(std::vector<std::string> arguments) {
  std::vector<std::string> command{VESK_BIN_DIRECTORY "/veskcollector",
                                   "--directory",
                                   (root / "collector").string(),
                                   "--storebags",
                                   (root / "storebags").string(),
                                   "--events",
                                   (root / "events.jsonl").string(),
                                   "--ready-file",
                                   (root / "ready").string()};
  if (arguments.empty()) {
    arguments = {"--https-port", std::to_string(_facts.at("httpsPort").as_int64()),
                 "--http-port",  std::to_string(_facts.at("httpPort").as_int64()),
                 "--udp-port",   std::to_string(_facts.at("udpPort").as_int64())};
  }
  command.insert(command.end(), arguments.begin(), arguments.end());
  std::filesystem::remove(root / "ready");
  _collector = std::make_unique<ChildProcess>(std::move(command));
  if (!eventually([&] { return std::filesystem::exists(root / "ready"); }))
    throw std::runtime_error("no collector: " + _collector->errors());
  _facts = boost::json::parse(root.read("ready")).as_object();
}

void DaemonHarness::stopCollector() {
  if (!_collector) return;
  _collector->signal(SIGTERM);
  (void)_collector->wait();
  _collector.reset();
}

void DaemonHarness::startDaemon(std::vector<std::string> arguments) {
  launchDaemon(std::move(arguments));
  if (!_daemon->waitForText("start loop.")) throw std::runtime_error("no daemon: " + _daemon->errors());
}

void DaemonHarness::launchDaemon(std::vector<std::string> arguments) {
  root.write("etc/veskreporting/preferences/com.corvane.veskreporting.toml", tomlLines(_preferences));
  root.write("etc/veskreporting/device.toml", tomlLines(_deviceFacts));
  std::vector<std::string> command{VESK_BIN_DIRECTORY "/veskreportingd", "--root", root.path().string()};
  if (std::find(arguments.begin(), arguments.end(), "--log-level") == arguments.end())
    command.insert(command.end(), {"--log-level", "7"});
  command.insert(command.end(), arguments.begin(), arguments.end());
  // LeakSanitizer needs tracing, which the sandbox forbids.
  const char* asan = std::getenv("ASAN_OPTIONS");
  const std::string withoutLeaks = (asan ? std::string(asan) + ":" : std::string()) + "detect_leaks=0";
  _daemon = std::make_unique<ChildProcess>(ChildProcess::Options{
      .command = std::move(command),
      .environment = {{"SSL_CERT_FILE", fact("authorityFile")}, {"ASAN_OPTIONS", withoutLeaks}}});
}

int DaemonHarness::stopDaemon() {
  _daemon->signal(SIGTERM);
  int status = _daemon->wait().value_or(-1);
  if (status != 0) std::fprintf(stderr, "%s\n", _daemon->errors().c_str());
  return status;
}

void DaemonHarness::writeStorebag(const std::string& name, std::string source, const char* ending) {
  source = replaced(std::move(source), "@EVENTS@", fact("eventsURL"));
  source = replaced(std::move(source), "@LOGDATA@", fact("logDataURL"));
  source = replaced(std::move(source), "@UDPPORT@", std::to_string(_facts.at("udpPort").as_int64()));
  std::filesystem::remove(root / ("storebags/" + name + ".toml"));
  root.write("storebags/" + name + ending, source);
}

std::string DaemonHarness::socketPath() const {
  return (root / "run/veskreportingd/com.corvane.veskreportingd").string();
}

ReportingOptions DaemonHarness::clientOptions() const {
  ReportingOptions options;
  options.socketPath = socketPath();
  options.drainTime = ChildProcess::kPatience;
  return options;
}

std::vector<boost::json::object> DaemonHarness::linesOf(const std::string& file) const {
  std::vector<boost::json::object> all;
  std::istringstream lines(root.read(file));
  for (std::string line; std::getline(lines, line);) {
    if (lines.eof()) break;  // incomplete line
    all.push_back(boost::json::parse(line).as_object());
  }
  return all;
}

std::vector<boost::json::object> DaemonHarness::waitForLines(const std::string& file, const Enough& enough) {
  std::vector<boost::json::object> all;
  auto isEnough = [&] { return enough(all = linesOf(file)); };
  if (eventually(isEnough)) return all;
  throw std::runtime_error("after waiting there are " + std::to_string(all.size()) + " lines in " + file +
                           "; daemon:\n" + _daemon->errors());
}

std::vector<boost::json::object> DaemonHarness::waitForEventsOfMethod(int method, std::size_t count) {
  std::vector<boost::json::object> matching;
  waitForEvents([&](const auto& all) {
    matching.clear();
    for (const auto& line : all) {
      if (line.at("event").at("_method") == method) matching.push_back(line);
    }
    return matching.size() >= count;
  });
  return matching;
}

void DaemonHarness::setFault(const std::string& fault) {
  if (WebClient().post(fact("controlURL") + "/fault", fault).status >= 300)
    throw std::runtime_error("fault " + fault);
}

std::int64_t DaemonHarness::collectorCount(const std::string& counter) {
  return boost::json::parse(WebClient().get(fact("controlURL") + "/stats").body).at(counter).as_int64();
}

RoadClient::RoadClient(const DaemonHarness& harness, Dictionary moreSessionInfo,
                       std::optional<Dictionary> userInfo, AggregationHandler aggregationHandler,
                       const std::optional<ReportingOptions>& options)
    : reporting(options.value_or(harness.clientOptions())) {
  MutableDictionary info(Dictionary{{kVeskReportingSessionInfoSessionID, 77},
                                    {kVeskReportingSessionInfoClientType, 5},
                                    {kVeskReportingSessionInfoClientVersion, 3}});
  info.setAll(moreSessionInfo);
  if (!queued(reporting.setSessionInfo(info.share(), std::move(userInfo), {}, std::move(aggregationHandler))))
    throw std::runtime_error("the session can't be configured");
  auto started = reporting.startConfig(ChildProcess::kPatience);
  if (!started)
    throw std::runtime_error("the session does not start: " + started.detail + "; daemon:\n" +
                             harness.daemon().errors());
  enabled = started.answer;
}

}  // namespace vesk::test

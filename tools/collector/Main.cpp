// veskcollector: parses arguments, starts the collector and waits for the signal to end.
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cstdlib>
#include <iostream>

#include "platform/json/JSONWriter.h"
#include "tools/collector/Collector.h"
#include "tools/collector/FaultPlan.h"
#include "tools/files/WholeFile.h"
#include "tools/plist/KeyedArchiveReader.h"

namespace vesk {

namespace {

constexpr int kFailed = 1;
constexpr int kUsage = 2;

struct Arguments {
  CollectorOptions collector;
  std::string readyFile;
  bool json = false;
  std::string archive;  // archive to show
};

/// Opens standard descriptors that the parent left closed. Otherwise the next opened file would get one of
/// them and receive the program's output.
void occupyStandardDescriptors() {
  for (int descriptor : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO})
    if (::fcntl(descriptor, F_GETFD) < 0) ::open("/dev/null", O_RDWR);
}

/// Blocks the signals that end the collector, for all threads started later.
sigset_t blockEndingSignals() {
  ::signal(SIGPIPE, SIG_IGN);
  sigset_t ending;
  sigemptyset(&ending);
  sigaddset(&ending, SIGINT);
  sigaddset(&ending, SIGTERM);
  ::pthread_sigmask(SIG_BLOCK, &ending, nullptr);
  return ending;
}

std::filesystem::path defaultDirectory() {
  if (const char* data = std::getenv("XDG_DATA_HOME"); data != nullptr && *data == '/')
    return std::filesystem::path(data) / "veskcollector";
  if (const char* home = std::getenv("HOME"); home != nullptr && *home == '/')
    return std::filesystem::path(home) / ".local/share/veskcollector";
  throw std::runtime_error("there is no home directory: name one for the collector's files with --directory");
}

void define(CLI::App& app, Arguments& arguments) {
  auto& collector = arguments.collector;
  app.set_version_flag("--version", std::string("veskcollector ") + VESK_VERSION);
  app.add_option("--directory", collector.directory,
                 "Keep authority, keys and, by default, storebags and events here "
                 "(default: ~/.local/share/veskcollector)")
      ->type_name("DIR");
  app.add_option("--address", collector.address, "Listen on this numeric address")->capture_default_str();
  app.add_option("--name", collector.names, "A further name or address for the certificate (repeatable)")
      ->type_name("HOST");
  app.add_option("--https-port", collector.httpsPort, "0 takes any free port")->capture_default_str();
  app.add_option("--http-port", collector.httpPort, "0 takes any free port")->capture_default_str();
  app.add_option("--udp-port", collector.udpPort, "For dashboards' datagrams; 0 takes any free port")
      ->capture_default_str();
  app.add_option("--ack-loss", collector.datagramLoss.probability,
                 "Lose each datagram, and each acknowledgement, with this probability")
      ->check(CLI::Range(0.0, 1.0))
      ->type_name("P");
  app.add_option("--seed", collector.datagramLoss.seed, "Decides which of them are lost")
      ->capture_default_str();
  app.add_option("--storebags", collector.storebags, "Folder of NAME.toml and NAME.json")->type_name("DIR");
  app.add_option("--events", collector.events, "Append events to this file of JSON lines")->type_name("FILE");
  app.add_option("--uploads", collector.uploads, "Save uploaded files in this folder")->type_name("DIR");
  app.add_option("--upload-answer", collector.uploadAnswer, "Answer every uploaded file with this")
      ->capture_default_str();
  const auto setMaximumAge = [&](unsigned seconds) { collector.maximumAge = std::chrono::seconds(seconds); };
  app.add_option_function<unsigned>("--max-age", setMaximumAge,
                                    "Send storebags with this Cache-Control max-age")
      ->type_name("SECONDS");
  app.add_flag_callback(
      "--lenient", [&] { collector.checks = StorebagChecks::Lenient; },
      "Also serve storebags with values of the wrong type");
  app.add_flag("--json", arguments.json, "Write one JSON line per event, with its headers");
  app.add_option("--fault", collector.faults,
                 "Inject faults: " + std::string(FaultPlan::kForms) +
                     ", with *N for N times only (repeatable); FAULT is " + FaultPlan::faultNames())
      ->check([](const std::string& fault) { return FaultPlan().add(fault).value_or(""); })
      ->type_name("FAULT");
  app.add_option("--ready-file", arguments.readyFile, "Write ports and paths here as JSON once listening")
      ->type_name("FILE");
  app.add_subcommand("show", "Print an archive of log data and exit")
      ->add_option("FILE", arguments.archive)
      ->required();
}

std::string ready(const Collector& collector) {
  MutableDictionary facts(collector.facts(), 1);
  facts.append("pid", static_cast<int>(::getpid()));
  return toJSON(facts.share(), JSONStyle::Pretty).value_or("") + "\n";
}

void run(Arguments& arguments) {
  sigset_t ending = blockEndingSignals();
  Console console(arguments.json ? Console::Style::JSON : Console::Style::Readable);
  Collector collector(std::move(arguments.collector), console);
  std::istringstream introduction(collector.introduction());
  for (std::string line; std::getline(introduction, line);) console.note(line);
  if (!arguments.readyFile.empty()) writeWholeFile(arguments.readyFile, ready(collector), 0644);
  int signal = 0;
  ::sigwait(&ending, &signal);
  console.note(collector.summary());
}

int main(int count, char** texts) {
  occupyStandardDescriptors();
  CLI::App app("A collector of events and server of storebags, for development");
  Arguments arguments;
  define(app, arguments);
  try {
    app.parse(count, texts);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? 0 : kUsage;
  }
  try {
    if (!arguments.archive.empty()) {
      std::cout << archiveText(readWholeFile(arguments.archive, archiveLimits().bytes)) << std::flush;
      return std::cout ? 0 : kFailed;
    }
    if (arguments.collector.directory.empty()) arguments.collector.directory = defaultDirectory();
    run(arguments);
    return 0;
  } catch (const std::exception& error) {
    std::cerr << "veskcollector: " << error.what() << "\n";
    return kFailed;
  }
}

}  // namespace

}  // namespace vesk

int main(int count, char** texts) { return vesk::main(count, texts); }

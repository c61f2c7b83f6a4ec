#include "tools/veskreport/CommandLine.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <iterator>
#include <limits>
#include <utility>

#include "platform/text/NearestWord.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/Completion.h"

namespace vesk {

namespace {

constexpr double kLongestTimeout = 86'400;
constexpr std::string_view kStorebag = "storebag";
constexpr double kUploadTimeout = 600;  // a file may be large and the connection slow

/// Rejects NaN, which a range check would accept.
std::string isNumber(const std::string& text) {
  return std::isnan(std::strtod(text.c_str(), nullptr)) ? text + " is no number" : "";
}

// CLI11 would split "[a,b]" into two values where an option or argument takes several. A mark appended to the
// text prevents that; it is removed when the value is used.
constexpr char kMark = '\0';

void mark(std::string& argument) {
  if (argument.starts_with('[') && argument.ends_with(']')) argument += kMark;
}

std::string unmark(std::string& value) {
  if (value.ends_with(kMark)) value.pop_back();
  return "";
}

void unmarkValues(CLI::App& app) {
  for (CLI::Option* option : app.get_options()) option->transform(CLI::Validator(unmark, ""));
  for (CLI::App* sub : app.get_subcommands({})) unmarkValues(*sub);
}

/// Throws if `argument` is not a command of `app` but should be. CLI11 would only say that a command is
/// required.
void checkCommand(const CLI::App& app, const std::string& argument) {
  if (argument.starts_with('-')) return;
  std::vector<std::string> names;
  for (const CLI::App* sub : app.get_subcommands([](auto) { return true; })) names.push_back(sub->get_name());
  if (std::find(names.begin(), names.end(), argument) != names.end()) return;
  const std::string nearest(nearestOf(argument, names));
  std::string message = "unknown command '" + printable(argument) + "'";
  if (!nearest.empty()) message += ": did you mean '" + nearest + "'?";
  throw CLI::ParseError(message, CLI::ExitCodes::ExtrasError);
}

using Command = int(const Invocation&, const Output&);

class Reader {
 public:
  Reader() : _app("Talks to veskreportingd as a client, and makes storebags.", "veskreport") {
    _app.set_version_flag("--version", "veskreport " VESK_VERSION);
    _app.require_subcommand(1);
    _app.footer("Exit status: 0 done, 1 failed, 2 wrong usage. See veskreport(1).");
    addSessionCommands();
    addMessageCommands();
    addUploadCommands();
    addPowerLogCommand();
    addDiagnosticsCommands();
    addStorebagCommands();
    addDev();
    addCompletion();
    unmarkValues(_app);
  }

  Invocation read(int argc, char** argv) {
    std::vector<std::string> backwards(std::reverse_iterator(argv + argc), std::reverse_iterator(argv + 1));
    for (std::string& argument : backwards) mark(argument);
    try {
      if (argc > 1) checkCommand(_app, argv[1]);
      if (argc > 2 && argv[1] == kStorebag) checkCommand(*_app.get_subcommand(argv[1]), argv[2]);
      parse(std::move(backwards));
    } catch (const CLI::ParseError& error) {
      throw Exit{_app.exit(error) == 0 ? kExitDone : kExitUsage};
    }
    if (!_invocation.shell.empty()) _invocation.completion = completionScript(_app, _invocation.shell);
    _invocation.timeout = std::chrono::milliseconds(static_cast<long>(_timeout * 1000));
    _invocation.flag = (_realtime ? 1U : 0U) | (_overrideSampling ? 2U : 0U);
    return std::move(_invocation);
  }

 private:
  void parse(std::vector<std::string> backwards) {
    try {
      _app.parse(std::move(backwards));
    } catch (const CLI::ParseError& error) {
      if (error.get_exit_code() == 0) throw;  // help or version
      // A misspelt option may be the reason why another one is missing.
      for (const auto& argument : _app.remaining(true)) {
        if (!argument.starts_with("--")) continue;
        throw CLI::ParseError(
            "unknown option '" + printable(argument) + "'" + meantOption(argument.substr(2)),
            CLI::ExitCodes::ExtrasError);
      }
      throw;
    }
  }

  /// A hint at the nearest option of the command that was given.
  std::string meantOption(const std::string& name) const {
    std::vector<std::string> names;
    for (const CLI::App* app = &_app; app != nullptr;) {
      for (const CLI::Option* option : app->get_options())
        names.insert(names.end(), option->get_lnames().begin(), option->get_lnames().end());
      const auto below = app->get_subcommands();
      app = below.empty() ? nullptr : below.front();
    }
    const std::string nearest(nearestOf(name.substr(0, name.find('=')), names));
    return nearest.empty() ? "" : ": did you mean '--" + nearest + "'?";
  }

  CLI::App* add(CLI::App& parent, const char* name, const char* description, Command* command) {
    CLI::App* sub = parent.add_subcommand(name, description);
    sub->callback([this, command] { _invocation.command = command; });
    sub->add_flag("--json", _invocation.json, "Print one JSON object per line");
    return sub;
  }

  CLI::App* addConnected(const char* name, const char* description, Command* command) {
    CLI::App* sub = add(_app, name, description, command);
    sub->add_option("--root", _invocation.root, "Directory to use as / (default: $VESKREPORTINGD_ROOT)");
    sub->add_option("--socket", _invocation.socket, "The daemon's socket")->excludes("--root");
    sub->add_option("--timeout", _timeout, "Seconds to wait for each answer")
        ->check(CLI::Range(0.001, kLongestTimeout) & CLI::Validator(isNumber, "", "NUMBER"))
        ->capture_default_str();
    return sub;
  }

  void addUserInfo(CLI::App& sub) {
    sub.add_option("--client-name", _invocation.clientName, "Client name of the user info");
    sub.add_option("--service-name", _invocation.serviceName, "Service name of the user info");
    sub.add_option("--user-info", _invocation.userInfo, "Further user info, key=text or key:=json")
        ->take_all()
        ->allow_extra_args(false);
  }

  void addDiagnosticsCommands() {
    CLI::App* status = addConnected("status", "Show what the daemon does, and what is wrong", runStatus);
    status->add_flag("--openmetrics", _invocation.openMetrics, "Print metrics for a textfile collector")
        ->excludes("--json");
    CLI::App* explain =
        addConnected("explain", "Show whether a client's messages are reported, and why", runExplain);
    explain->add_option("--client-type", _invocation.clientType, "Client type; selects the storebag")
        ->required();
    addUserInfo(*explain);
    status->add_flag("--no-color", _invocation.noColor, "Use no colours, even on a terminal");
    addConnected("top", "Show the status as a live page; q quits", runTop);
    addTap();
    addConnected("drops", "Show what was lost or delayed, and why", runDrops);
    addConnected("reload", "Make the daemon read its settings: it ends in order and is started anew",
                 runReload);
    CLI::App* outbox =
        addConnected("outbox", "Show what waits to be sent, or hold, release or export it", runOutbox);
    outbox->require_subcommand(0, 1);
    addAction(*outbox, "show", "Show what waits");
    addAction(*outbox, "hold", "Send nothing of it, for example over a metered link");
    addAction(*outbox, "release", "Send it again");
    addAction(*outbox, "export", "Append it to a file as JSON lines, and remove it once written")
        ->add_option("file", _invocation.output, "The file")
        ->required();
    CLI::App* consent =
        addConnected("consent", "Show, grant or withdraw the user's consent to diagnostics", runConsent);
    consent->require_subcommand(0, 1);
    addAction(*consent, "show", "Show it");
    addAction(*consent, "grant", "Store it, and let sessions start anew with it");
    addAction(*consent, "withdraw", "Store it, delete what waits because of it, and make new identifiers");
    explain->add_option("--draw", _invocation.draw, "The session's draw for sampling, from 0 to 1")
        ->check(CLI::Range(0.0, 1.0))
        ->capture_default_str();
    explain->add_option("payload", _invocation.payload, "A message's payload, key=text and key:=json");
    explain->add_option("-c,--category", _invocation.category, "The message's category, for filters");
    explain->add_option("-t,--type", _invocation.type, "The message's type, for filters");
    addOfflineExplain(*explain, _invocation);
  }

  void addCompletion() {
    CLI::App* completion = add(_app, "completion", "Print a completion script for a shell", runCompletion);
    completion->add_option("shell", _invocation.shell, "bash, zsh or fish")
        ->required()
        ->check(CLI::IsMember({"bash", "zsh", "fish"}));
  }

  void addDev() {
    CLI::App* dev =
        add(_app, "dev", "Run a daemon and a collector to try things out, and show all events", runDev);
    dev->add_option("--directory", _invocation.keptRoot,
                    "Keep keys, storebags and events here (default: a temporary directory)")
        ->type_name("DIR");
    dev->add_option("program", _invocation.program,
                    "After --: a program to run with VESKREPORTINGD_ROOT set; dev ends with it");
  }

  CLI::App* addAction(CLI::App& command, const char* name, const char* description) {
    CLI::App* action = command.add_subcommand(name, description);
    action->callback([this, name] { _invocation.action = name; });
    action->fallthrough();
    return action;
  }

  void addTap() {
    CLI::App* tap =
        addConnected("tap", "Show what leaves the device, and what becomes of it, as it happens", runTap);
    tap->add_option("--client-type", _invocation.tap.clientType, "Only of this client type");
    tap->add_option("--client-name", _invocation.clientName, "Only of clients with this name");
    tap->add_option("--backend", _invocation.tap.backend, "Only of this backend, such as httpPost");
    tap->add_option("--outcome", _invocation.tap.outcome, "Only what ended so")
        ->check(CLI::IsMember({"held", "posted", "sent", "delivered", "deferred", "dropped"}));
    tap->add_flag("--messages", _invocation.tap.messages, "Show what becomes of each message, too");
    tap->add_flag("--bodies", _invocation.tap.bodies, "Show what was sent, too");
    tap->add_option("--count", _invocation.tap.count, "Exit after this many lines (default: never)")
        ->check(CLI::NonNegativeNumber);
  }

  CLI::App* addClient(const char* name, const char* description, Command* command) {
    CLI::App* sub = addConnected(name, description, command);
    sub->add_option("--client-type", _invocation.clientType, "Client type; selects the storebag")->required();
    sub->add_option("--client-version", _invocation.clientVersion, "Client version")->capture_default_str();
    sub->add_option("--session-id", _invocation.sessionID, "Session ID (default: a random one)");
    addUserInfo(*sub);
    sub->add_flag("!--no-require-user-info,--require-user-info", _invocation.requireUserInfo,
                  "Report without asking for consent, client entry, region, sampling and filters");
    sub->add_flag("--batch", _invocation.batch, "Make backends collect messages into batches");
    return sub;
  }

  void addSessionCommands() {
    CLI::App* states = addClient("states", "Show the names of the backends that a client gets", runStates);
    states->add_flag("--start", _invocation.start, "Start a session to find out; it reports its start");
    addClient("display-url", "Show where the session's messages can be viewed", runDisplayURL);
    addClient("flush", "Make the backends send what they hold back", runFlush);
    addClient("aggregate", "Show the messages of this session and of those below it as they are sent",
              runAggregate)
        ->add_option("--count", _invocation.aggregateCount, "Exit after this many messages (default: never)")
        ->check(CLI::NonNegativeNumber);
  }

  /// Such a message would be held back for ever.
  void checkUserInfo(const char* command) const {
    if (!_invocation.requireUserInfo || !_invocation.clientName.empty() || !_invocation.serviceName.empty() ||
        !_invocation.userInfo.empty())
      return;
    throw CLI::ValidationError(command,
                               "--client-name is required, since without user info nothing is reported "
                               "(or --no-require-user-info)");
  }

  void addMessageCommands() {
    for (bool isOnce : {false, true}) {
      CLI::App* sub = isOnce ? addClient("send-once", "Send one message without a session", runSendOnce)
                             : addClient("send", "Send messages in a session", runSend);
      auto* category = sub->add_option("-c,--category", _invocation.category, "Category, 0 to 65535");
      auto* type = sub->add_option("-t,--type", _invocation.type, "Type, 0 to 65535");
      auto* payload = sub->add_option("payload", _invocation.payload, "key=text and key:=json");
      if (isOnce) {
        category->required();
        type->required();
        sub->callback([this] {
          _invocation.command = runSendOnce;
          checkUserInfo("send-once");
        });
        continue;
      }
      sub->add_flag("--realtime", _realtime, "Post at once, without batching");
      sub->add_flag("--override-sampling", _overrideSampling, "Send even if sampling excludes this device");
      auto* noWait =
          sub->add_flag("--no-wait", _invocation.noWait, "Send one way, without waiting for an answer");
      sub->add_flag(
             "--stdin", _invocation.fromStandardInput,
             "Send a message for each line of standard input: a JSON object, which is the payload when\n"
             "category and type are given, otherwise {\"category\":…,\"type\":…,\"payload\":{…},\"flag\":…}")
          ->excludes(payload)
          ->excludes(noWait);
      category->needs(type);
      type->needs(category);
      sub->callback([this] {
        _invocation.command = runSend;
        if (!_invocation.category && !_invocation.fromStandardInput)
          throw CLI::ValidationError("send", "--category and --type are required");
        checkUserInfo("send");
      });
    }
  }

  void addUploadCommands() {
    CLI::App* file = addClient("upload-file", "Upload a file", runUploadFile);
    file->add_option("path", _invocation.upload, "The file")->required();
    file->get_option("--timeout")->default_str("600");
    file->preparse_callback([this](std::size_t) { _timeout = kUploadTimeout; });
    CLI::App* log = addClient("upload-log", "Upload log data", runUploadLog);
    auto* texts = log->add_option("text", _invocation.logData, "Entries of the log data");
    log->add_flag("--stdin", _invocation.fromStandardInput,
                  "Take a JSON value from each line of standard input")
        ->excludes(texts);
  }

  void addPowerLogCommand() {
    CLI::App* log = add(_app, "power-log", "Show what was recorded in the device's power log", runPowerLog);
    log->add_option("--root", _invocation.root, "Directory to use as / (default: $VESKREPORTINGD_ROOT)");
    log->add_option("--since", _invocation.since,
                    "Only from then on: an age (30s, 15m, 2h, 7d) or a UTC time (2026-11-24T18:30:00Z)")
        ->type_name("WHEN");
  }

  void addStorebagCommands() {
    CLI::App* storebag = _app.add_subcommand(std::string(kStorebag), "Make and examine storebags");
    storebag->require_subcommand(1);
    CLI::App* keygen = add(*storebag, "keygen", "Make a key pair", runStorebagKeygen);
    keygen
        ->add_option("directory", _invocation.directory,
                     "Where to put storebag-signing.key and publicKey.der")
        ->capture_default_str();
    CLI::App* sign = add(*storebag, "sign", "Sign a readable storebag", runStorebagSign);
    sign->add_option("source", _invocation.source, "Storebag as TOML or JSON")->required();
    sign->add_option("--key", _invocation.key, "Private key (PEM)")->required();
    sign->add_option("-o,--output", _invocation.output, "Where to write it (default: standard output)");
    sign->add_flag("--lenient", _invocation.lenient, "Sign even if values have the wrong type");
    sign->add_option("--name", _invocation.storebagName,
                     "The only name under which daemons accept it, such as zelko");
    sign->add_option("--serial", _invocation.serial, "Daemons that accepted a higher one refuse it")
        ->check(CLI::Range(std::int64_t{0}, std::numeric_limits<std::int64_t>::max()));
    sign->add_option("--expires", _invocation.expires,
                     "When it ends, as 2027-01-31 or 2027-01-31T12:00:00 (UTC)");
    CLI::App* verify = add(*storebag, "verify", "Check a signed storebag", runStorebagVerify);
    verify->add_option("storebag", _invocation.source, "Signed storebag")->required();
    verify->add_option("--key", _invocation.key, "Public key (DER; default: the installed one)");
    CLI::App* show = add(*storebag, "show", "Show what a signed storebag holds", runStorebagShow);
    show->add_option("storebag", _invocation.source, "Signed storebag")->required();
    addStorebagAuthoring(*storebag, _invocation);
  }

  CLI::App _app;
  Invocation _invocation;
  double _timeout = 30;
  bool _realtime = false;
  bool _overrideSampling = false;
};

}  // namespace

int runCompletion(const Invocation& invocation, const Output& output) {
  return output.raw(invocation.completion);
}

Invocation parseCommandLine(int argc, char** argv) { return Reader().read(argc, argv); }

}  // namespace vesk

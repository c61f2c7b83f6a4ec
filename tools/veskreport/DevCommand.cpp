#include <poll.h>
#include <sys/signalfd.h>

#include <algorithm>
#include <deque>
#include <memory>

#include "platform/ipc/BusClient.h"
#include "tools/json/JSONReader.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DevProgram.h"
#include "tools/veskreport/DevRoot.h"
#include "tools/veskreport/DiagnosticsClient.h"

namespace vesk {

namespace {

constexpr int kReadyFilePollMilliseconds = 20;
constexpr std::size_t kLastLines = 10;
constexpr std::chrono::seconds kTapTimeout{30};

std::string eventLine(const Dictionary& saved) {
  const auto event = dictionaryIn(saved, "event");
  const auto category = textIn(event, "_method"), type = textIn(event, "_status");
  std::string line = clockIn(saved, "received") + " event " + category + "/" + type;
  for (const char* name : {"clientName", "serviceName"}) {
    if (const auto text = textIn(event, name); !text.empty()) line += " " + text;
  }
  if (category == "0") return line + (type == "0" ? ", a session starts" : ", a session ends");
  // The payload comes with what the daemon adds.
  constexpr std::string_view kAdded[] = {"Opt",       "SamplingThreshold", "OverrideSampling", "Batch",
                                         "eventTime", "clientName",        "serviceName"};
  for (const auto& [key, value] : event) {
    if (!key.view().starts_with('_') && std::ranges::find(kAdded, key.view()) == std::end(kAdded))
      line += " " + printable(key.view()) + "=" + textIn(event, key.string().c_str());
  }
  return line;
}

/// Runs collector, daemon and the user's program, all watched by one loop.
class Dev {
 public:
  Dev(const Invocation& invocation, const Output& output)
      : _invocation(invocation), _output(output), _root(invocation.keptRoot) {
    ::signal(SIGPIPE, SIG_IGN);
    sigset_t watched;
    ::sigemptyset(&watched);
    for (int each : {SIGINT, SIGTERM, SIGCHLD}) ::sigaddset(&watched, each);
    struct sigaction hangUp {};
    ::sigaction(SIGHUP, nullptr, &hangUp);
    if (hangUp.sa_handler != SIG_IGN) ::sigaddset(&watched, SIGHUP);  // nohup ignores it
    ::sigprocmask(SIG_BLOCK, &watched, &_mask);
    _signals = FileDescriptor(::signalfd(-1, &watched, SFD_CLOEXEC | SFD_NONBLOCK));
  }

  int run(const std::string& collector, const std::string& daemon) {
    int status = _invocation.program.empty() ? kExitDone : kExitFailed;
    startCollector(collector);
    if (_endings == 0) startDaemon(daemon);
    if (_endings == 0) status = _invocation.program.empty() ? wait() : runProgram();
    for (auto* server : {&_daemon, &_collector}) stop(*server);
    return _isOutputClosed ? kExitFailed : status;
  }

 private:
  struct Server {
    const char* name;
    std::unique_ptr<DevProgram> program{};
    std::deque<std::string> lastLines{};
  };

  void startCollector(const std::string& path) {
    std::vector<std::string> command{path,     "--directory",  _root.collector(),
                                     "--json", "--ready-file", _root.readyFile()};
    for (auto& option : _root.portOptions()) command.push_back(std::move(option));
    _collector.program = std::make_unique<DevProgram>(DevProgram::Options{command, {}, _mask, true});
    const auto pid = std::to_string(_collector.program->pid());
    const auto isReady = [&] { return _endings > 0 || textIn(_root.facts(), "pid") == pid; };
    waitUntil(isReady, kReadyFilePollMilliseconds);
  }

  void startDaemon(const std::string& path) {
    _root.prepare();
    // Posts to the collector must not go through the user's proxy.
    _daemon.program = std::make_unique<DevProgram>(
        DevProgram::Options{{path, "--root", _root.path()},
                            {{"SSL_CERT_FILE", textIn(_root.facts(), "authorityFile")}, {"no_proxy", "*"}},
                            _mask,
                            true});
    waitUntil([this] { return _endings > 0 || _isDaemonReady; });
    if (_endings > 0) return;
    _bus = std::make_unique<BusClient>(
        BusClient::Options{_root.path().string() + wire::kSocketPath, {}, wire::kDiagnosticsPath});
    ask(wire::kOpenTap, {Dictionary{{"messages", true}}}, [](BusAnswer&) {});
    readTap();
  }

  int wait() {
    const std::string variable = "VESKREPORTINGD_ROOT=" + _root.path().string();
    show("export " + variable, {{"root", _root.path().string()}});
    _output.note("all messages are reported, and shown here; Ctrl-C ends it. From another terminal:\n  " +
                 variable +
                 " veskreport send --client-type 5 --client-name Camera --category 3 --type 1 frames:=240");
    waitUntil([this] { return _endings > 0; });
    return kExitDone;
  }

  /// Returns the program's exit status once its drops were shown; `stop` shows the last events.
  int runProgram() {
    _program = std::make_unique<DevProgram>(DevProgram::Options{
        _invocation.program, {{"VESKREPORTINGD_ROOT", _root.path().string()}}, _mask, false});
    waitUntil([this] { return _program->status().has_value(); });
    waitUntil([this] { return _isTapDrained; });
    return *_program->status();
  }

  void readTap() {
    // All drops were shown once a request made after the program's end returns nothing.
    ask(wire::kReadTap, {}, [this, isLate = _program && _program->status()](BusAnswer& answer) {
      Dictionary batch;
      const bool isOpen = answer.read(batch);
      const auto records = listIn(batch, "records");
      for (const auto& record : records) {
        const auto outcome = textIn(record, "outcome");
        if (outcome == "dropped" || outcome == "deferred") show(tapLine(record), record);
      }
      _isTapDrained = !isOpen || (isLate && records.empty());
      if (isOpen) readTap();
    });
  }

  void ask(const wire::Member& member, std::vector<IPCArgument> arguments, BusClient::AnswerHandler handler) {
    const IPCOutgoingCall call{wire::kDiagnosticsInterface, member.name, std::move(arguments)};
    if (_bus->send(call, std::move(handler), kTapTimeout) != BusClient::SendResult::Sent)
      _isTapDrained = true;
  }

  void show(const std::string& line, const Dictionary& fields) {
    if (_isOutputClosed || _output.done(line, fields) == kExitDone) return;
    _isOutputClosed = true;
    ++_endings;
  }

  /// The collector writes an event as a JSON object and everything else as text. The daemon's warnings may
  /// say why something is not reported.
  void readOutput(Server& server) {
    server.program->readOutput([&](const std::string& line) {
      if (const auto saved = parseJSON(line); saved && saved->dictionary())
        return show(eventLine(*saved->dictionary()), *saved->dictionary());
      server.lastLines.push_back(printable(line));
      if (server.lastLines.size() > kLastLines) server.lastLines.pop_front();
      if (&server != &_daemon) return;
      _isDaemonReady = _isDaemonReady || line.ends_with("start loop.");
      const auto level = std::min(line.find("<3> "), line.find("<4> "));
      if (level != std::string::npos && !_isStopping)
        _output.note("veskreportingd: " + printable(line.substr(level + 4)));
    });
  }

  /// Fails if a server ends first.
  template <class Condition>
  void waitUntil(Condition isSo, int milliseconds = -1) {
    while (!isSo()) {
      turn(milliseconds);
      for (Server* server : {&_collector, &_daemon}) {
        if (server->program && server->program->status()) fail(*server);
      }
    }
  }

  [[noreturn]] void fail(Server& server) {
    while (server.program->output() >= 0) readOutput(server);
    std::string text =
        std::string(server.name) + " has ended with status " + std::to_string(*server.program->status());
    for (const auto& line : server.lastLines) text += "\n  " + line;
    _output.fail(text);
  }

  /// Ends the server in order, and handles what it still writes. A further signal kills it.
  void stop(Server& server) {
    if (!server.program) return;
    _isStopping = true;
    server.program->signal(SIGTERM);
    for (const int before = _endings; !server.program->status() || server.program->output() >= 0;) {
      turn(-1);
      if (_endings != before) server.program->signal(SIGKILL);
    }
  }

  /// Waits for the next event and handles it.
  void turn(int milliseconds) {
    pollfd sources[] = {{_signals.get(), POLLIN, 0}, {-1, POLLIN, 0}, {-1, POLLIN, 0}, {-1, 0, 0}};
    Server* const servers[] = {&_collector, &_daemon};
    for (int i : {0, 1}) sources[1 + i].fd = servers[i]->program ? servers[i]->program->output() : -1;
    if (_bus) {
      sources[3] = {_bus->fd(), _bus->events(), 0};
      if (milliseconds < 0) milliseconds = _bus->timeout();
    }
    ::poll(sources, std::size(sources), milliseconds);
    readSignals();
    for (int i : {0, 1}) {
      if (sources[1 + i].revents != 0) readOutput(*servers[i]);
    }
    if (_bus && _bus->process() == BusClient::Progress::Disconnected) _bus.reset();
  }

  void readSignals() {
    signalfd_siginfo info;
    while (::read(_signals.get(), &info, sizeof info) == sizeof info) {
      if (info.ssi_signo == SIGCHLD) continue;
      ++_endings;
      // The terminal signals the program itself.
      if (_program && info.ssi_code <= 0) _program->signal(static_cast<int>(info.ssi_signo));
    }
  }

  const Invocation& _invocation;
  const Output& _output;
  const DevRoot _root;  // removed after the programs have ended
  sigset_t _mask{};     ///< before this program's own
  FileDescriptor _signals;
  Server _collector{"veskcollector"};
  Server _daemon{"veskreportingd"};
  std::unique_ptr<DevProgram> _program;
  std::unique_ptr<BusClient> _bus;
  bool _isDaemonReady = false;
  bool _isTapDrained = false;
  bool _isOutputClosed = false;
  bool _isStopping = false;
  int _endings = 0;  ///< signals and failures that ask for the end
};

}  // namespace

int runDev(const Invocation& invocation, const Output& output) {
  const auto collector = findProgram("veskcollector"), daemon = findProgram("veskreportingd");
  return Dev(invocation, output).run(collector, daemon);
}

}  // namespace vesk

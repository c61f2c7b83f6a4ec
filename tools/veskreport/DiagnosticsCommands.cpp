#include <cstdio>

#include "protocol/WireNames.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DiagnosticsClient.h"
#include "tools/veskreport/Terminal.h"

namespace vesk {

namespace {

/// What was lost or delayed, by backend and reason.
std::vector<std::string> dropLines(const Dictionary& status, const char* key, const char* since) {
  std::vector<std::string> lines;
  for (const auto& counter : listIn(status, key)) {
    lines.push_back(std::string(booleanForKey(counter, "lost").value_or(true) ? "lost" : "delayed") + since +
                    textIn(counter, "count") + " " + textIn(counter, "backend") + " " +
                    textIn(counter, "reason"));
  }
  return lines;
}

/// What is wrong in red, if the output takes that.
std::vector<std::string> colored(std::vector<std::string> lines, bool takesColor) {
  for (auto& line : lines) {
    if (takesColor && line.starts_with("  ! ")) line = "\x1b[31m" + line + "\x1b[0m";
  }
  return lines;
}

/// For node_exporter's textfile collector.
std::string openMetrics(const Dictionary& status) {
  const auto outbox = dictionaryIn(status, "outbox");
  const auto number = [](const std::string& text) { return text.empty() ? std::string("0") : text; };
  std::string text = "# TYPE veskreporting_healthy gauge\nveskreporting_healthy " +
                     std::string(textIn(status, "health") == "ok" ? "1" : "0") +
                     "\n# TYPE veskreporting_sessions gauge\nveskreporting_sessions " +
                     std::to_string(listIn(status, "sessions").size()) +
                     "\n# TYPE veskreporting_outbox_posts gauge\nveskreporting_outbox_posts " +
                     number(textIn(outbox, "posts")) +
                     "\n# TYPE veskreporting_outbox_bytes gauge\nveskreporting_outbox_bytes " +
                     number(textIn(outbox, "bytes")) + "\n# TYPE veskreporting_events counter\n";
  for (const auto& counter : listIn(status, "total")) {
    text += "veskreporting_events_total{backend=\"" + textIn(counter, "backend") + "\",outcome=\"" +
            textIn(counter, "reason") + "\"} " + textIn(counter, "count") + "\n";
  }
  return text + "# EOF\n";
}

/// What filters make of each entry of the payload.
std::vector<std::string> payloadLines(const Dictionary& payload, const Dictionary& left) {
  std::vector<std::string> lines;
  for (const auto& [key, value] : payload) {
    const Value* now = left.find(key.view());
    std::string fate = " is removed";
    if (now)
      fate = *now == value ? " leaves as it is" : " is digested: " + textIn(left, key.string().c_str());
    lines.push_back("  " + printable(key.view()) + fate);
  }
  return lines;
}

std::vector<std::string> explanationLines(const Dictionary& explanation, const Dictionary& payload) {
  std::vector<std::string> lines{"storebag " + textIn(explanation, "storebag") + ", version " +
                                 textIn(explanation, "version")};
  for (const auto& [name, value] : dictionaryIn(explanation, "backends")) {
    const Dictionary* backend = value.dictionary();
    if (backend == nullptr) continue;
    const auto reason = textIn(*backend, "reason");
    lines.push_back(printable(name.view()) + ": " + textIn(*backend, "state") +
                    (reason.empty() ? "" : ", since " + reason));
    for (const auto& step : listIn(*backend, "steps")) {
      const auto entry = textIn(step, "entry"), found = textIn(step, "value"),
                 expected = textIn(step, "expected");
      lines.push_back("  " + (entry.empty() ? "" : "clients[" + entry + "].") + textIn(step, "rule") + " " +
                      textIn(step, "verdict") + (found.empty() ? "" : ": " + found) +
                      (expected.empty() ? "" : " (storebag: " + expected + ")"));
    }
    if (const Value* share = backend->find("samplingShare")) {
      char text[64];
      std::snprintf(text, sizeof text, "  reports for %.4g %% of the sessions",
                    100 * share->asDouble().value_or(0));
      lines.emplace_back(text);
    }
    if (backend->find("payload") != nullptr) {
      for (auto& line : payloadLines(payload, dictionaryIn(*backend, "payload")))
        lines.push_back(std::move(line));
    }
    if (const auto url = textIn(*backend, "postURL"); !url.empty()) lines.push_back("  posts to " + url);
  }
  return lines;
}

}  // namespace

std::vector<std::string> statusLines(const Dictionary& status) {
  std::vector<std::string> lines{"veskreportingd " + textIn(status, "version") + ": " +
                                 textIn(status, "health") + ", up " + durationIn(status, "uptime") +
                                 ", environment " + textIn(status, "environment")};
  if (const Value* reasons = status.find("reasons"); reasons && reasons->list()) {
    for (const Value& each : *reasons->list())
      lines.push_back("  ! " + printable(each.text() ? each.text()->string() : describe(each)));
  }
  for (const auto& bag : listIn(status, "storebags")) {
    lines.push_back("storebag " + textIn(bag, "name") + ": " + textIn(bag, "state") + ", version " +
                    textIn(bag, "version") + ", fetched " + durationIn(bag, "age") + " ago, good for " +
                    durationIn(bag, "maxAge"));
  }
  for (const auto& session : listIn(status, "sessions")) {
    std::string line =
        "session " + textIn(session, "sessionID") + ": client type " + textIn(session, "clientType");
    for (const char* key : {"clientName", "serviceName"}) {
      if (const auto name = textIn(session, key); !name.empty()) line += " " + name;
    }
    lines.push_back(line + " (user " + textIn(session, "user") + ", process " + textIn(session, "process") +
                    ")");
    for (const auto& [name, backend] : dictionaryIn(session, "backends")) {
      if (backend.dictionary() == nullptr) continue;
      const auto reason = textIn(*backend.dictionary(), "reason");
      lines.push_back("  " + printable(name.view()) + ": " + textIn(*backend.dictionary(), "state") +
                      (reason.empty() ? "" : ", since " + reason));
    }
  }
  for (const auto& host : listIn(dictionaryIn(status, "outbox"), "hosts")) {
    lines.push_back("outbox: " + textIn(host, "posts") + " posts for " + textIn(host, "host") +
                    ", next attempt in " + durationIn(host, "nextAttempt"));
  }
  for (const auto& [host, age] : dictionaryIn(status, "lastPosts")) {
    lines.push_back("last post accepted by " + printable(host.view()) + " " +
                    durationIn(dictionaryIn(status, "lastPosts"), host.string().c_str()) + " ago");
  }
  for (const auto& line : dropLines(status, "counters", " since the start: ")) lines.push_back(line);
  return lines;
}

int runStatus(const Invocation& invocation, const Output& output) {
  const auto status = DiagnosticsClient(invocation, output).ask(wire::kGetStatus);
  const int written =
      invocation.openMetrics
          ? output.raw(openMetrics(status))
          : output.done(colored(statusLines(status), !invocation.noColor && takesColor()), status);
  return written == kExitDone && textIn(status, "health") == "ok" ? kExitDone : kExitFailed;
}

int runDrops(const Invocation& invocation, const Output& output) {
  DiagnosticsClient daemon(invocation, output);
  const auto status = daemon.ask(wire::kGetStatus);
  auto lines = dropLines(status, "counters", " since the start: ");
  for (const auto& line : dropLines(status, "total", " since the installation: ")) lines.push_back(line);
  if (lines.empty()) lines.emplace_back("nothing was lost or delayed");
  const Value *counters = status.find("counters"), *total = status.find("total");
  return output.done(lines, {{"sinceStart", counters ? *counters : Value()},
                             {"sinceInstallation", total ? *total : Value()}});
}

int runReload(const Invocation& invocation, const Output& output) {
  DiagnosticsClient(invocation, output).ask(wire::kReload);
  return output.done("the daemon ends, to be started anew", {});
}

int runExplain(const Invocation& invocation, const Output& output) {
  const Dictionary request = explanationRequest(invocation, output);
  const auto explanation = invocation.authoring.storebag.empty()
                               ? DiagnosticsClient(invocation, output).ask(wire::kExplain, {request})
                               : explainOffline(invocation, request);
  if (const auto problem = textIn(explanation, "problem"); !problem.empty())
    return output.failed(problem, explanation);
  return output.done(explanationLines(explanation, dictionaryIn(request, "payload")), explanation);
}

}  // namespace vesk

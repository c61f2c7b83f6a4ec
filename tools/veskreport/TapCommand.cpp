#include <VeskReporting/VeskReportingKeys.h>

#include <cstdio>
#include <ctime>

#include "protocol/WireNames.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DiagnosticsClient.h"

namespace vesk {

namespace {

std::string subjectOf(const Dictionary& record) {
  std::string text = textIn(record, "what");
  if (const auto category = textIn(record, "category"); !category.empty())
    text += " " + category + "/" + textIn(record, "type");
  for (const char* key : {"events", "count"}) {
    if (const auto number = textIn(record, key); !number.empty()) return text + " of " + number;
  }
  return text;
}

Dictionary filterOf(const Invocation& invocation) {
  MutableDictionary filter(
      Dictionary{{"messages", invocation.tap.messages}, {"bodies", invocation.tap.bodies}});
  if (invocation.tap.clientType) filter.set("clientType", *invocation.tap.clientType);
  if (!invocation.clientName.empty()) filter.set("clientName", invocation.clientName);
  if (!invocation.tap.backend.empty()) filter.set("backend", invocation.tap.backend);
  if (!invocation.tap.outcome.empty()) filter.set("outcome", invocation.tap.outcome);
  return filter.share();
}

}  // namespace

std::string clockIn(const Dictionary& from, const char* key) {
  const Value* seconds = from.find(key);
  const double all = seconds ? seconds->asDouble().value_or(0) : 0;
  const auto whole = static_cast<std::time_t>(all);
  std::tm parts{};
  ::gmtime_r(&whole, &parts);
  char text[32];
  std::snprintf(text, sizeof text, "%02d:%02d:%02d.%03d", parts.tm_hour, parts.tm_min, parts.tm_sec,
                static_cast<int>((all - static_cast<double>(whole)) * 1000));
  return text;
}

std::string tapLine(const Dictionary& record) {
  std::string line = clockIn(record, "time") + " " + textIn(record, "backend") + ": " + subjectOf(record) +
                     " " + textIn(record, "outcome");
  if (const auto reason = textIn(record, "reason"); !reason.empty()) line += ", " + reason;
  if (const auto because = textIn(record, "because"); !because.empty()) line += " (" + because + ")";
  if (const auto status = textIn(record, "httpStatus"); !status.empty()) line += ", status " + status;
  if (const auto url = textIn(record, "url"); !url.empty()) line += ", " + url;
  if (const auto type = textIn(record, "clientType"); !type.empty()) {
    const auto name = textIn(record, "clientName");
    line += " [client type " + type + (name.empty() ? "" : " " + name) + ", session " +
            textIn(record, "sessionID") + "]";
  }
  return line;
}

int runTap(const Invocation& invocation, const Output& output) {
  DiagnosticsClient daemon(invocation, output);
  const auto opened = daemon.ask(wire::kOpenTap, {filterOf(invocation)});
  if (const auto problem = textIn(opened, "problem"); !problem.empty()) return output.failed(problem);
  if (!invocation.json) output.note("watching; Ctrl-C ends it");
  for (std::uint64_t seen = 0;;) {
    const auto batch = daemon.ask(wire::kReadTap);
    for (const auto& record : listIn(batch, "records")) {
      std::vector<std::string> lines{tapLine(record)};
      if (const auto body = textIn(record, "body"); invocation.tap.bodies && !body.empty())
        lines.push_back("  " + body);
      if (output.done(lines, record) != kExitDone) return kExitFailed;
      if (++seen == invocation.tap.count) return kExitDone;
    }
    if (const auto lost = integerForKey(batch, "lost").value_or(0); lost > 0)
      output.note(std::to_string(lost) + " lines were lost, since they were not read in time");
  }
}

}  // namespace vesk

#include "tools/veskreport/StorebagAuthoring.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <CLI/CLI.hpp>
#include <filesystem>
#include <stdexcept>

#include "platform/log/SystemLog.h"
#include "tools/storebag/StorebagCases.h"
#include "tools/storebag/StorebagComparison.h"
#include "tools/storebag/StorebagEvaluation.h"
#include "tools/storebag/StorebagReference.h"
#include "tools/storebag/StorebagReview.h"
#include "tools/storebag/StorebagSource.h"
#include "tools/text/Printable.h"
#include "tools/veskreport/CommandLine.h"

namespace vesk {

namespace {

// The commands say themselves what the daemon would log.
constexpr int kSilent = 0;

int runSchema(const Invocation&, const Output& output) { return output.raw(storebagSchema()); }

int runReference(const Invocation& invocation, const Output& output) {
  return output.raw(invocation.authoring.asManual ? storebagReferenceAsMdoc()
                                                  : storebagReferenceAsMarkdown());
}

template <class T>
T valueOf(Result<T> result, const std::string& place) {
  if (!result) throw std::runtime_error(place + ": " + result.error().text);
  return *std::move(result);
}

std::string counted(std::size_t number, const std::string& thing) {
  return std::to_string(number) + " " + thing + (number == 1 ? "" : "s");
}

/// Prints the findings and returns the number of errors.
std::size_t report(const StorebagFindings& findings, const Invocation& invocation, const Output& output) {
  std::size_t errors = 0;
  for (const auto& finding : findings) {
    const bool isError = finding.isError() || invocation.authoring.strict;
    if (isError) ++errors;
    const std::string severity = isError ? "error" : "warning";
    const int written =
        output.done(printable(severity + ": " + finding.line()),
                    {{"severity", severity}, {"place", finding.place}, {"text", finding.text}});
    if (written != kExitDone) throw Exit{written};
  }
  return errors;
}

/// The devices on the command line.
std::vector<NamedDevice> devicesOf(const Invocation& invocation) {
  std::vector<NamedDevice> devices;
  for (const std::string& argument : invocation.authoring.devices) {
    const Dictionary facts = valueOf(deviceFactsIn(argument), "--device");
    devices.push_back(
        {.region = argument,
         .device = valueOf(storebagDevice(facts), "--device"),
         .isOfOneEnvironment = facts.contains("environment") || facts.contains("environmentType")});
  }
  return devices;
}

/// Prints what the storebag changes, and returns the number of changes.
std::size_t reportChanges(const Dictionary& payload, const Invocation& invocation, const Output& output) {
  const auto changes =
      compareStorebags(readAnyStorebag(invocation.authoring.against), payload, devicesOf(invocation));
  for (const auto& change : changes) {
    const int written =
        output.done(printable("change: " + change.line()), {{"environment", change.environment},
                                                            {"backend", change.backend},
                                                            {"clients", change.clients},
                                                            {"devices", change.devices},
                                                            {"change", change.text}});
    if (written != kExitDone) throw Exit{written};
  }
  return changes.size();
}

int runCheck(const Invocation& invocation, const Output& output) {
  SystemLog::setLevel(kSilent);
  const Dictionary payload = readAnyStorebag(invocation.source);
  StorebagFindings findings = checkStorebag(payload);
  for (auto& finding : reviewStorebag(payload)) findings.push_back(std::move(finding));
  const std::size_t errors = report(findings, invocation, output), warnings = findings.size() - errors;
  std::string summary =
      invocation.source + ": " + counted(errors, "error") + ", " + counted(warnings, "warning");
  MutableDictionary all(Dictionary{{"errors", errors}, {"warnings", warnings}});
  if (!invocation.authoring.against.empty()) {
    const std::size_t changes = reportChanges(payload, invocation, output);
    summary += ", " + counted(changes, "change");
    all.set("changes", changes);
  }
  const Dictionary counts = all.share();
  return errors == 0 ? output.done(summary, counts) : output.failed(summary, counts);
}

/// Prints whether the case holds, and returns whether it does.
bool reportCase(const StorebagCase& tested, const Dictionary& payload, const Output& output) {
  const auto failures = failuresOf(tested, payload);
  std::vector<std::string> lines;
  lines.reserve(failures.size() + 1);
  for (const auto& failure : failures) lines.push_back(printable("failed: " + tested.name + ": " + failure));
  if (failures.empty()) lines.push_back(printable("ok: " + tested.name));
  const Dictionary fields{{"case", tested.name},
                          {"passed", failures.empty()},
                          {"failures", List(std::vector<Value>(failures.begin(), failures.end()))}};
  if (const int written = output.done(lines, fields); written != kExitDone) throw Exit{written};
  return failures.empty();
}

int runTest(const Invocation& invocation, const Output& output) {
  SystemLog::setLevel(kSilent);
  const std::filesystem::path file = invocation.source;
  const auto all = valueOf(storebagCasesIn(file), file);
  const std::string& chosen = invocation.authoring.storebag;
  if (chosen.empty() && !all.storebag)
    return output.failed(file.string() + ": names no storebag; add storebag = \"FILE\" or use --storebag");
  const Dictionary payload = readAnyStorebag(chosen.empty() ? all.storebag->string() : chosen);
  std::size_t failed = 0;
  for (std::size_t i = 0; i < all.cases.size(); ++i) {
    const auto tested = valueOf(storebagCaseAt(all, i, clientTypeFor(payload), file.parent_path()), file);
    if (!reportCase(tested, payload, output)) ++failed;
  }
  const std::string summary =
      file.string() + ": " + counted(all.cases.size(), "case") + ", " + std::to_string(failed) + " failed";
  const Dictionary counts{{"cases", all.cases.size()}, {"failed", failed}};
  return failed == 0 ? output.done(summary, counts) : output.failed(summary, counts);
}

CLI::App* add(CLI::App& storebag, Invocation& invocation, const char* name, const char* description,
              int (*command)(const Invocation&, const Output&)) {
  CLI::App* sub = storebag.add_subcommand(name, description);
  sub->callback([&invocation, command] { invocation.command = command; });
  return sub;
}

}  // namespace

void addOfflineExplain(CLI::App& explain, Invocation& invocation) {
  explain.add_option("--storebag", invocation.authoring.storebag,
                     "Decide by this storebag, without a daemon (see --device)");
  explain
      .add_option("--device", invocation.authoring.devices,
                  "The device to decide for: RegionCode=DE,DeviceName=Pine,… or a file with such facts")
      ->expected(1);
}

std::optional<Dictionary> explainedDevice(const Invocation& invocation) {
  const auto& devices = invocation.authoring.devices;
  if (devices.empty()) return std::nullopt;
  return valueOf(deviceFactsIn(devices.front()), "--device");
}

Dictionary explainOffline(const Invocation& invocation, const Dictionary& request) {
  SystemLog::setLevel(kSilent);
  const Dictionary facts = explainedDevice(invocation).value_or(Dictionary());
  return evaluateStorebag(
      readAnyStorebag(invocation.authoring.storebag), valueOf(storebagDevice(facts), "--device"),
      {.clientType = invocation.clientType,
       .userInfo = request.dictionary("userInfo"),
       .requireUserInfo = booleanForKey(request, kVeskReportingSessionInfoRequireUserInfo).value_or(true),
       .draw = invocation.draw,
       .message = explainedMessageIn(request)});
}

void addStorebagAuthoring(CLI::App& storebag, Invocation& invocation) {
  CLI::App* check = add(storebag, invocation, "check", "Find mistakes in a storebag", runCheck);
  check->add_option("storebag", invocation.source, "Storebag as TOML or JSON, or a signed one")->required();
  check->add_flag("--strict", invocation.authoring.strict, "Count warnings as errors");
  CLI::Option* against = check->add_option("--against", invocation.authoring.against,
                                           "Show what changes for whom, compared with this storebag");
  check
      ->add_option(
          "--device", invocation.authoring.devices,
          "Compare for this device: RegionCode=DE,DeviceName=Pine,… or a file with such facts; may be "
          "repeated (default: all that differ)")
      ->allow_extra_args(false)
      ->needs(against);
  check->add_flag("--json", invocation.json, "Print one JSON object per line");
  CLI::App* test = add(storebag, invocation, "test", "Check examples of what a storebag does", runTest);
  test->add_option("cases", invocation.source, "Cases as TOML or JSON")->required();
  test->add_option("--storebag", invocation.authoring.storebag,
                   "Storebag (default: the one that the file names)");
  test->add_flag("--json", invocation.json, "Print one JSON object per line");
  add(storebag, invocation, "schema", "Print a JSON Schema of storebags, for editors", runSchema);
  add(storebag, invocation, "reference", "Print every key as Markdown tables", runReference)
      ->add_flag("--man", invocation.authoring.asManual, "As sections of a manual page");
}

}  // namespace vesk

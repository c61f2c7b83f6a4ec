#include "tools/veskreport/StorebagAuthoring.h"

#include <CLI/CLI.hpp>

#include "platform/log/SystemLog.h"
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

int runCheck(const Invocation& invocation, const Output& output) {
  SystemLog::setLevel(kSilent);
  const Dictionary payload = readAnyStorebag(invocation.source);
  StorebagFindings findings = checkStorebag(payload);
  for (auto& finding : reviewStorebag(payload)) findings.push_back(std::move(finding));
  const std::size_t errors = report(findings, invocation, output), warnings = findings.size() - errors;
  const std::string summary =
      invocation.source + ": " + counted(errors, "error") + ", " + counted(warnings, "warning");
  const Dictionary counts{{"errors", errors}, {"warnings", warnings}};
  return errors == 0 ? output.done(summary, counts) : output.failed(summary, counts);
}

CLI::App* add(CLI::App& storebag, Invocation& invocation, const char* name, const char* description,
              int (*command)(const Invocation&, const Output&)) {
  CLI::App* sub = storebag.add_subcommand(name, description);
  sub->callback([&invocation, command] { invocation.command = command; });
  return sub;
}

}  // namespace

void addStorebagAuthoring(CLI::App& storebag, Invocation& invocation) {
  CLI::App* check = add(storebag, invocation, "check", "Find mistakes in a storebag", runCheck);
  check->add_option("storebag", invocation.source, "Storebag as TOML or JSON, or a signed one")->required();
  check->add_flag("--strict", invocation.authoring.strict, "Count warnings as errors");
  check->add_flag("--json", invocation.json, "Print one JSON object per line");
  add(storebag, invocation, "schema", "Print a JSON Schema of storebags, for editors", runSchema);
  add(storebag, invocation, "reference", "Print every key as Markdown tables", runReference)
      ->add_flag("--man", invocation.authoring.asManual, "As sections of a manual page");
}

}  // namespace vesk

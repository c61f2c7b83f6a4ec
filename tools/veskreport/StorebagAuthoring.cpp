#include "tools/veskreport/StorebagAuthoring.h"

#include <CLI/CLI.hpp>

#include "tools/storebag/StorebagReference.h"
#include "tools/storebag/StorebagSource.h"
#include "tools/veskreport/CommandLine.h"

namespace vesk {

namespace {

int runSchema(const Invocation&, const Output& output) { return output.raw(storebagSchema()); }

int runReference(const Invocation& invocation, const Output& output) {
  return output.raw(invocation.authoring.asManual ? storebagReferenceAsMdoc()
                                                  : storebagReferenceAsMarkdown());
}

CLI::App* add(CLI::App& storebag, Invocation& invocation, const char* name, const char* description,
              int (*command)(const Invocation&, const Output&)) {
  CLI::App* sub = storebag.add_subcommand(name, description);
  sub->callback([&invocation, command] { invocation.command = command; });
  return sub;
}

}  // namespace

void addStorebagAuthoring(CLI::App& storebag, Invocation& invocation) {
  add(storebag, invocation, "schema", "Print a JSON Schema of storebags, for editors", runSchema);
  add(storebag, invocation, "reference", "Print every key as Markdown tables", runReference)
      ->add_flag("--man", invocation.authoring.asManual, "As sections of a manual page");
}

}  // namespace vesk

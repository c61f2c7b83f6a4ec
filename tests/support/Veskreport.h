// Runs the veskreport program.
#pragma once

#include <string>
#include <utility>
#include <vector>

#include "tests/support/ChildProcess.h"

namespace vesk::test {

struct ToolOutcome {
  int status = -1;
  std::string output;
  std::string errors;

  bool says(const std::string& text) const { return (output + errors).find(text) != std::string::npos; }
};

inline ToolOutcome veskreport(std::vector<std::string> arguments) {
  arguments.insert(arguments.begin(), VESK_BIN_DIRECTORY "/veskreport");
  ChildProcess process(ChildProcess::Options{.command = std::move(arguments)});
  return {process.wait().value_or(-1), process.output(), process.errors()};
}

}  // namespace vesk::test

// veskoracle: looks for messages that are lost but should not be. Runs clients, daemon and collector,
// disturbs them by a plan, and judges the result (see Ledger.h).
#include <CLI/CLI.hpp>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <random>
#include <string_view>

#include "tests/oracle/FaultRun.h"
#include "tests/oracle/OracleClient.h"

int main(int argc, char** argv) {
  using namespace vesk::test;
  if (argc == 5 && std::string_view(argv[1]) == "--client")
    return OracleClient(argv[2], argv[3], std::strtoll(argv[4], nullptr, 10)).run();
  FaultRun::Options options{.seed = std::random_device()()};
  CLI::App app("Are messages lost that should not be?");
  app.add_option("--seed", options.seed,
                 "what the faults and the clients follow from; else another each time");
  app.add_option("--seconds", options.seconds, "how long there are faults")->capture_default_str();
  app.add_option("--clients", options.clients, "client processes at a time")->check(CLI::PositiveNumber);
  app.add_flag("--always", options.always, "the daemons write each post before they send it");
  CLI11_PARSE(app, argc, argv);
  const auto seed = static_cast<unsigned long long>(options.seed);
  std::printf("oracle: --seed %llu\n", seed);
  bool isGood = false;
  try {
    FaultRun run(options);
    run.disturb();
    isGood = run.judge();
  } catch (const std::exception& error) {
    std::printf("oracle: %s\n", error.what());
  }
  std::printf("oracle: %s (--seed %llu)\n", isGood ? "nothing was lost" : "FAILED", seed);
  return isGood ? 0 : 1;
}

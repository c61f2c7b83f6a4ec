// veskoracle: are messages lost that should not be? Runs clients, daemon and collector, disturbs them by a
// plan, and judges (Ledger.h says how).
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <random>
#include <string_view>

#include "tests/oracle/FaultRun.h"
#include "tests/oracle/OracleClient.h"

namespace {

constexpr char kUsage[] =
    "Usage: veskoracle [--seed N] [--seconds N] [--clients N]\n"
    "  --seed N     what the faults and the clients follow from; without it, another one each time\n"
    "  --seconds N  how long there are faults (25)\n"
    "  --clients N  client processes at a time (4)\n";

bool readOptions(int argc, char** argv, vesk::test::FaultRun::Options& options) {
  for (int i = 1; i + 1 < argc; i += 2) {
    const std::string_view name = argv[i];
    const auto number = std::strtoull(argv[i + 1], nullptr, 10);
    if (name == "--seed") {
      options.seed = number;
    } else if (name == "--seconds") {
      options.duration = std::chrono::seconds(number);
    } else if (name == "--clients" && number > 0) {
      options.clients = number;
    } else {
      return false;
    }
  }
  return argc % 2 == 1;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace vesk::test;
  if (argc == 5 && std::string_view(argv[1]) == "--client")
    return OracleClient(argv[2], argv[3], std::strtoll(argv[4], nullptr, 10)).run();
  FaultRun::Options options{.seed = std::random_device()()};
  if (!readOptions(argc, argv, options)) {
    std::fputs(kUsage, stderr);
    return 2;
  }
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

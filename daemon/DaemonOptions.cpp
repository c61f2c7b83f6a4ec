#include "daemon/DaemonOptions.h"

#include <getopt.h>

#include <charconv>
#include <cstdio>
#include <cstring>

namespace vesk {

namespace {

constexpr int kUsageError = 2;

constexpr char kHelp[] =
    "Usage: veskreportingd [--root DIR] [--log-level N] [--idle-exit SECONDS] [--no-sandbox]\n"
    "Accepts reporting messages from local clients and delivers them as the signed configuration says.\n"
    "\n"
    "  --root DIR           stands for / in every path (also: VESKREPORTINGD_ROOT)\n"
    "  --log-level N        3 errors, 4 warnings, 6 information (default), 7 debugging\n"
    "  --idle-exit SECONDS  stop after this time without a client\n"
    "  --no-sandbox         stay unconfined\n"
    "  --help, --version\n";

std::optional<int> number(const char* text, int minimum, int maximum) {
  int value = 0;
  const char* end = text + std::strlen(text);
  auto [at, error] = std::from_chars(text, end, value);
  if (error != std::errc() || at != end || value < minimum || value > maximum) return std::nullopt;
  return value;
}

int usageError(const char* option, const char* value, const char* wanted) {
  std::fprintf(stderr, "veskreportingd: %s: \"%s\" is not %s\n", option, value, wanted);
  return kUsageError;
}

}  // namespace

std::variant<DaemonOptions, int> parseDaemonOptions(int argc, char** argv) {
  static constexpr option kOptions[] = {{"root", required_argument, nullptr, 'r'},
                                        {"log-level", required_argument, nullptr, 'l'},
                                        {"idle-exit", required_argument, nullptr, 'i'},
                                        {"no-sandbox", no_argument, nullptr, 's'},
                                        {"help", no_argument, nullptr, 'h'},
                                        {"version", no_argument, nullptr, 'v'},
                                        {nullptr, 0, nullptr, 0}};
  DaemonOptions options;
  for (int c; (c = ::getopt_long(argc, argv, "", kOptions, nullptr)) != -1;) {
    switch (c) {
      case 'r':
        if (optarg[0] != '/') return usageError("--root", optarg, "an absolute path");
        options.root = optarg;
        break;
      case 'l': {
        auto level = number(optarg, 3, 7);
        if (!level || *level == 5) return usageError("--log-level", optarg, "3, 4, 6 or 7");
        options.logLevel = *level;
        break;
      }
      case 'i': {
        auto seconds = number(optarg, 1, 86400);
        if (!seconds) return usageError("--idle-exit", optarg, "a number of seconds from 1 to 86400");
        options.idleExit = std::chrono::seconds(*seconds);
        break;
      }
      case 's':
        options.sandbox = false;
        break;
      case 'h':
        std::fputs(kHelp, stdout);
        return 0;
      case 'v':
        std::puts("veskreportingd " VESK_VERSION);
        return 0;
      default:
        std::fputs("Try: veskreportingd --help\n", stderr);
        return kUsageError;
    }
  }
  if (optind < argc) {
    std::fprintf(stderr, "veskreportingd: unexpected argument \"%s\"\nTry: veskreportingd --help\n",
                 argv[optind]);
    return kUsageError;
  }
  return options;
}

}  // namespace vesk

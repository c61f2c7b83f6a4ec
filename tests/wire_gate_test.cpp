// The gates in front of sd-bus, piece by piece.
#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/ipc/AuthenticationGate.h"
#include "platform/ipc/MessageGate.h"

namespace vesk {
namespace {

using namespace std::string_literals;
using Verdict = MessageGate::Verdict;

/// The fixed part of a header.
std::string header(std::uint32_t body, std::uint32_t fields, char order = 'l') {
  std::string bytes = {order, 1, 0, 1};
  for (std::uint32_t number : {body, std::uint32_t{1}, fields}) {
    for (int i = 0; i < 4; ++i) bytes += static_cast<char>(number >> (order == 'l' ? 8 * i : 24 - 8 * i));
  }
  return bytes;
}

TEST(MessageGate, RefusesWhatIsTooLargeOrNoHeader) {
  struct Case {
    const char* what;
    std::string bytes;
    Verdict verdict;
  };
  std::string noType = header(0, 8);
  noType[1] = 0;
  std::string noSerial = header(0, 8);
  noSerial[8] = 0;
  const Case cases[] = {
      {"at the limit", header(76, 8), Verdict::Pass},
      {"above the limit", header(77, 8), Verdict::TooLarge},
      {"body beyond 32 bits together", header(0xffffffff, 0xffffffff), Verdict::TooLarge},
      {"fields", header(0, 0xffffffff), Verdict::TooLarge},
      {"byte order", header(0, 8, 'x'), Verdict::Malformed},
      {"type", noType, Verdict::Malformed},
      {"serial", noSerial, Verdict::Malformed},
  };
  const std::string before = header(0, 8) + std::string(8, 'x');
  for (const auto& test : cases) {
    MessageGate gate(100);
    auto result = gate.pass(before + test.bytes);
    EXPECT_EQ(result.verdict, test.verdict) << test.what;
    EXPECT_EQ(result.passed, before.size() + (test.verdict == Verdict::Pass ? 16 : 0)) << test.what;
  }
}

TEST(AuthenticationGate, ComparesClaimsWithThePeerAndPassesTheOutcomeOn) {
  auto passedOn = [](const std::string& data) {
    AuthenticationGate gate(1234);
    return gate.pass(data).passedOn;
  };
  std::string own;
  for (char c : std::to_string(::geteuid())) own += std::string("3") + c;
  EXPECT_EQ(passedOn("\0AUTH EXTERNAL 31323334\r\n"s), "\0AUTH EXTERNAL "s + own + "\r\n");
  EXPECT_EQ(passedOn("\0DATA 31323334\r\n"s), "\0DATA "s + own + "\r\n");
  EXPECT_EQ(passedOn("\0AUTH EXTERNAL 30\r\n"s), "\0AUTH EXTERNAL 6e6f626f6479\r\n"s);
  EXPECT_EQ(passedOn("\0AUTH EXTERNAL\r\nDATA\r\nAUTH\r\nCANCEL\r\n"s),
            "\0AUTH EXTERNAL\r\nDATA\r\nAUTH\r\nCANCEL\r\n"s);
}

}  // namespace
}  // namespace vesk

#include "tests/oracle/OracleMessage.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <boost/json.hpp>

namespace vesk::test {

namespace {

// Steele, Lea and Flood's mixer, so that consecutive numbers give unrelated messages.
std::uint64_t mixed(std::uint64_t number) {
  number += 0x9e3779b97f4a7c15U;
  number = (number ^ (number >> 30)) * 0xbf58476d1ce4e5b9U;
  number = (number ^ (number >> 27)) * 0x94d049bb133111ebU;
  return number ^ (number >> 31);
}

// Text that a body must escape, and text that it must not.
constexpr const char* kPieces[] = {"plain ", "\"quoted\" ", "back\\slash ",     "line\nfeed ",
                                   "\x01",   "ünïcödé ",    "\xf0\x9f\x9a\x80", "</tag>"};

}  // namespace

OracleMessage::OracleMessage(std::int64_t id) : _id(id), _hash(mixed(static_cast<std::uint64_t>(id))) {}

std::string OracleMessage::text() const {
  std::string text;
  // Sometimes a long message, which is processed differently from ordinary ones.
  const std::size_t pieces = _hash % 97 == 0 ? 2000 : _hash % 20;
  for (std::uint64_t i = 0; i < pieces; ++i) text += kPieces[mixed(_hash + i) % std::size(kPieces)];
  return text;
}

Dictionary OracleMessage::payload() const {
  return Dictionary{{kIDKey, _id},
                    {"oracleText", text()},
                    {"oracleNegative", negative()},
                    {"oracleLarge", large()},
                    {"oracleRatio", ratio()},
                    {"oracleOdd", isOdd()},
                    {"oracleWhen", Date{ratio()}}};
}

Dictionary OracleMessage::parameters(int flag) const {
  return Dictionary{{kVeskReportingMessageParametersCategory, static_cast<unsigned>(category())},
                    {kVeskReportingMessageParametersType, static_cast<unsigned>(type())},
                    {kVeskReportingMessageParametersPayload, payload()},
                    {kVeskReportingMessageParametersFlag, flag}};
}

std::string OracleMessage::changeIn(const boost::json::object& event) const {
  const boost::json::object expected{{kIDKey, _id},
                                     {"oracleText", text()},
                                     {"oracleNegative", negative()},
                                     {"oracleLarge", large()},
                                     {"oracleRatio", ratio()},
                                     {"oracleOdd", isOdd()},
                                     {"oracleWhen", ratio()},
                                     {"_method", category()},
                                     {"_status", type()}};
  for (const auto& [key, value] : expected) {
    const auto* found = event.if_contains(key);
    if (found == nullptr || *found != value) return key;
  }
  return "";
}

}  // namespace vesk::test

// The messages that the oracle follows.
#pragma once

#include <VeskReporting/values/Value.h>

#include <boost/json/fwd.hpp>
#include <cstdint>
#include <string>

namespace vesk::test {

/// Everything in a message follows from its number: whoever finds one can tell whether it arrived unchanged.
class OracleMessage {
 public:
  static constexpr char kIDKey[] = "oracleID";

  explicit OracleMessage(std::int64_t id);

  /// As the client library takes it. `flag`: 1 realtime, else 0.
  Dictionary parameters(int flag) const;
  std::uint16_t category() const { return static_cast<std::uint16_t>(2 + _hash % 7); }
  std::uint16_t type() const { return static_cast<std::uint16_t>(2 + _hash % 5); }
  Dictionary payload() const;

  /// The first entry of the event that is not what it should be; empty when it is unchanged.
  std::string changeIn(const boost::json::object& event) const;

 private:
  std::string text() const;
  std::int64_t negative() const { return -static_cast<std::int64_t>(_hash >> 1) - 1; }
  std::uint64_t large() const { return _hash | (std::uint64_t{1} << 63); }
  double ratio() const { return static_cast<double>(_hash % 100'000) / 8; }
  bool isOdd() const { return _hash % 2 == 1; }

  std::int64_t _id;
  std::uint64_t _hash;
};

}  // namespace vesk::test

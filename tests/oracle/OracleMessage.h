// The messages that the oracle follows.
#pragma once

#include <VeskReporting/values/Value.h>

#include <boost/json/fwd.hpp>
#include <cstdint>
#include <string>

namespace vesk::test {

/// Everything in a message depends on its number, so anyone who finds one can tell whether it is unchanged.
class OracleMessage {
 public:
  static constexpr char kIDKey[] = "oracleID";

  explicit OracleMessage(std::int64_t id);

  /// In the client library's form. `flag`: 1 realtime, otherwise 0.
  Dictionary parameters(int flag) const;
  std::uint16_t category() const { return static_cast<std::uint16_t>(2 + _hash % 7); }
  std::uint16_t type() const { return static_cast<std::uint16_t>(2 + _hash % 5); }
  Dictionary payload() const;

  /// The name of the first entry of the event that has changed; empty if it is unchanged.
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

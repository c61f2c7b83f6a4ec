// Which datagrams and acknowledgements are lost on demand.
#pragma once

#include <cstdint>

namespace vesk {

/// Loses with a probability, and the same ones in every run: what is lost depends on the seed, on the event
/// ID and on how often its datagram has been sent, not on when it arrives.
class DatagramLoss {
 public:
  enum class What : unsigned char { Datagram, Acknowledgement };

  /// `probability`: 0 to 1.
  explicit DatagramLoss(double probability = 0, std::uint32_t seed = 1)
      : _probability(probability), _seed(seed) {}

  /// `attempt`: how often this datagram was sent before.
  bool takes(What what, std::uint16_t eventID, std::uint32_t attempt) const noexcept;

 private:
  double _probability;
  std::uint32_t _seed;
};

}  // namespace vesk

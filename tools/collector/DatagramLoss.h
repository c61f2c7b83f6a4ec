// Decides which datagrams and acknowledgements are dropped on request.
#pragma once

#include <cstdint>

namespace vesk {

/// Drops datagrams with a given probability but reproducibly: the decision depends only on the seed, the
/// event ID and how often the datagram was sent.
class DatagramLoss {
 public:
  enum class What : unsigned char { Datagram, Acknowledgement };

  /// `probability`: 0 to 1.
  explicit DatagramLoss(double probability = 0, std::uint32_t seed = 1)
      : _probability(probability), _seed(seed) {}

  /// Returns true if the datagram is dropped. `attempt`: how often it was sent before.
  bool takes(What what, std::uint16_t eventID, std::uint32_t attempt) const noexcept;

 private:
  double _probability;
  std::uint32_t _seed;
};

}  // namespace vesk

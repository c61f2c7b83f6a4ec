// A datagram that still has to be sent or acknowledged.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace vesk {

/// Only used on its backend's network queue.
class UDPPacketToSend {
 public:
  enum State : std::int32_t {
    Unsent = 0,  ///< not yet sent completely
    Sent = 1,    ///< waiting for its acknowledgement
  };

  /// Copies the datagram.
  UDPPacketToSend(std::string_view bytes, std::uint16_t eventNumber)
      : _eventNumber(eventNumber), _data(bytes) {}

  State state() const noexcept { return _state; }
  void setState(State state) noexcept { _state = state; }
  /// Ticks counted since the last transmission.
  std::int32_t numberOfChecks() const noexcept { return _numberOfChecks; }
  void setNumberOfChecks(std::int32_t count) noexcept { _numberOfChecks = count; }
  std::int32_t numberOfRetransmits() const noexcept { return _numberOfRetransmits; }
  void setNumberOfRetransmits(std::int32_t count) noexcept { _numberOfRetransmits = count; }
  std::uint16_t eventNumber() const noexcept { return _eventNumber; }
  std::string_view data() const noexcept { return _data; }

 private:
  State _state = Unsent;
  std::int32_t _numberOfChecks = 0;
  std::int32_t _numberOfRetransmits = 0;
  std::uint16_t _eventNumber;
  std::string _data;
};

}  // namespace vesk

#include "tools/collector/DashboardReceiver.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <stdexcept>

#include "tools/collector/LinesFile.h"

namespace vesk {

namespace {

constexpr std::size_t kLargestUDPPayload = 65'536;
constexpr std::size_t kRemembered = 65'536;  // datagrams

[[noreturn]] void cannotListen(const std::string& address, std::uint16_t port, const std::string& why) {
  throw std::runtime_error("can't listen on " + address + ":" + std::to_string(port) + " (UDP): " + why);
}

}  // namespace

DashboardReceiver::DashboardReceiver(Parts parts, const std::string& address, std::uint16_t port,
                                     DatagramLoss loss, std::filesystem::path file)
    : _parts(parts), _loss(loss), _file(std::move(file)) {
  auto endpoint = IPv4Endpoint::parse(address, port);
  if (!endpoint) cannotListen(address, port, "datagrams come over IPv4");
  auto bound = _socket.open();
  if (bound) bound = _socket.bind(*endpoint);
  if (!bound && bound.error().number == EADDRINUSE)
    throw std::runtime_error("can't listen on " + address + ": UDP port " + std::to_string(port) +
                             " is in use");
  if (!bound) cannotListen(address, port, bound.error().text);
  _port = _socket.localEndpoint().value().port;
  _stop = FileDescriptor(::eventfd(0, EFD_CLOEXEC));
  if (!_stop) cannotListen(address, port, std::strerror(errno));
  _thread = std::thread([this] { serve(); });
}

DashboardReceiver::~DashboardReceiver() {
  ::eventfd_write(_stop.get(), 1);
  _thread.join();
}

void DashboardReceiver::serve() {
  std::string buffer(kLargestUDPPayload, '\0');
  while (true) {
    pollfd watched[] = {{_socket.descriptor(), POLLIN, 0}, {_stop.get(), POLLIN, 0}};
    ::poll(watched, 2, -1);
    if (watched[1].revents != 0) return;
    IPv4Endpoint peer;
    if (auto size = _socket.receive(buffer, &peer)) take({buffer.data(), *size}, peer);
  }
}

void DashboardReceiver::take(std::string_view bytes, const IPv4Endpoint& peer) {
  auto outcome = readDashboardDatagram(bytes);
  if (!outcome.datagram) {
    ++_parts.stats.datagramsMalformed;
    return _parts.console.problem("refused a datagram of " + std::to_string(bytes.size()) + " bytes from " +
                                  peer.text() + ": " + outcome.problem);
  }
  ReceivedDatagram& datagram = *outcome.datagram;
  const std::uint16_t eventID = datagram.header.eventID;
  Known& history = known(bytes);
  const std::uint32_t attempt = history.sent++;
  if (_loss.takes(DatagramLoss::What::Datagram, eventID, attempt)) {
    ++_parts.stats.datagramsLost;
    return _parts.console.note("lost on demand: datagram of event " + std::to_string(eventID));
  }
  datagram.peer = peer.text();
  datagram.received = _parts.clock.now();
  datagram.isAgain = history.taken++ > 0;
  ++_parts.stats.datagrams;
  if (datagram.isAgain) ++_parts.stats.datagramsAgain;
  record(datagram);
  if (datagram.header.isReliable) acknowledge(bytes, eventID, attempt, peer);
}

void DashboardReceiver::record(const ReceivedDatagram& datagram) {
  std::string line = jsonLine(datagram);
  if (int error = appendLines(_file, line))
    _parts.console.problem("can't save a datagram to " + _file.string() + ": " + std::strerror(error));
  line.pop_back();
  _parts.console.event(_parts.console.style() == Console::Style::JSON ? line : readableText(datagram));
}

void DashboardReceiver::acknowledge(std::string_view bytes, std::uint16_t eventID, std::uint32_t attempt,
                                    const IPv4Endpoint& peer) {
  if (_loss.takes(DatagramLoss::What::Acknowledgement, eventID, attempt)) {
    ++_parts.stats.acknowledgementsLost;
    return _parts.console.note("lost on demand: acknowledgement of event " + std::to_string(eventID));
  }
  if (_socket.sendTo(peer, bytes.substr(0, kDashboardHeaderSize))) ++_parts.stats.acknowledgements;
}

DashboardReceiver::Known& DashboardReceiver::known(std::string_view bytes) {
  const std::size_t digest = std::hash<std::string_view>{}(bytes);
  auto [at, isNew] = _known.try_emplace(digest);
  if (!isNew) return at->second;
  _recent.push_back(digest);
  if (_recent.size() > kRemembered) {
    _known.erase(_recent.front());
    _recent.pop_front();
  }
  return at->second;
}

}  // namespace vesk

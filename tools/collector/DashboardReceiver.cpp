#include "tools/collector/DashboardReceiver.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <stdexcept>

#include "backends/https/SenderCodes.h"
#include "platform/json/JSONWriter.h"
#include "tools/files/WholeFile.h"
#include "tools/text/Printable.h"

namespace vesk {

namespace {

constexpr std::size_t kShownOfAPayload = 1200;  // bytes

/// Finds the next equals sign that is not escaped, that is, not preceded by an odd number of backslashes.
std::size_t findPlainEquals(std::string_view text, std::size_t from) {
  bool isEscaped = false;
  for (std::size_t i = from; i < text.size(); ++i) {
    if (text[i] == '=' && !isEscaped) return i;
    isEscaped = text[i] == '\\' && !isEscaped;
  }
  return std::string_view::npos;
}

std::string withoutEscapes(std::string_view value) {
  std::string plain;
  for (std::size_t i = 0; i < value.size(); ++i) {
    if (value[i] == '\\' && i + 1 < value.size()) ++i;
    plain += value[i];
  }
  return plain;
}

/// " a=y b=xx": a key extends from the last space before its equals sign; the first key from the start.
Dictionary payloadFrom(std::string_view text) {
  MutableDictionary payload;
  std::size_t keyStart = 1;
  std::size_t equals = findPlainEquals(text, 0);
  while (equals != std::string_view::npos) {
    std::size_t next = findPlainEquals(text, equals + 1);
    std::size_t end = text.size();
    while (next != std::string_view::npos) {
      end = text.rfind(' ', next);
      if (end != std::string_view::npos && end > equals) break;
      next = findPlainEquals(text, next + 1);  // this equals sign is part of the key
      end = text.size();
    }
    keyStart = std::min(keyStart, equals);
    payload.append(printableUTF8(text.substr(keyStart, equals - keyStart)),
                   printableUTF8(withoutEscapes(text.substr(equals + 1, end - equals - 1))));
    keyStart = end + 1;
    equals = next;
  }
  return payload.shareUnique();
}

double sentAt(const DashboardHeader& header) { return header.seconds + header.milliseconds() / 1000.0; }

std::string_view senderOf(const DashboardHeader& header) {
  return senderCodeForClientType(header.clientType).value_or("-");
}

constexpr std::size_t kLargestUDPPayload = 65'536;

[[noreturn]] void cannotListen(const std::string& address, std::uint16_t port, const std::string& why) {
  throw std::runtime_error("can't listen on " + address + ":" + std::to_string(port) + " (UDP): " + why);
}

}  // namespace

DatagramOutcome readDashboardDatagram(std::string_view bytes) {
  if (bytes.size() < kDashboardHeaderSize) return {std::nullopt, "it is shorter than a header"};
  if (bytes.size() > kDashboardLongestDatagram) return {std::nullopt, "it is longer than any datagram"};
  auto header = decodeDashboardHeader(bytes);
  if (!header) return {std::nullopt, "its header is of another version, or states another length"};
  const std::string_view text = bytes.substr(kDashboardHeaderSize);
  if (!text.empty() && text[0] != ' ') return {std::nullopt, "its text does not begin with a space"};
  ReceivedDatagram datagram{*header, payloadFrom(text), {}, {}};
  datagram.isCut = bytes.size() == kDashboardLongestDatagram;
  return {std::move(datagram), {}};
}

std::string readableText(const ReceivedDatagram& datagram) {
  const DashboardHeader& header = datagram.header;
  std::string line = clockText(datagram.received) + " datagram from " + datagram.peer + ": " +
                     std::string(senderOf(header)) + " session " + std::to_string(header.sessionID) +
                     " event " + std::to_string(header.eventID) + " method " + std::to_string(header.method) +
                     " status " + std::to_string(header.respCode);
  if (header.isReliable) line += ", reliable";
  if (datagram.isAgain) line += ", again";
  if (datagram.isCut) line += ", cut";
  return line + ", " + printable(describe(datagram.payload, kShownOfAPayload));
}

std::string jsonLine(const ReceivedDatagram& datagram) {
  const DashboardHeader& header = datagram.header;
  auto line = toJSON(Dictionary{{"received", secondsFrom(datagram.received)},
                                {"sent", sentAt(header)},
                                {"peer", datagram.peer},
                                {"again", datagram.isAgain},
                                {"cut", datagram.isCut},
                                {"reliable", header.isReliable},
                                {"device", printableUTF8(header.deviceIDText())},
                                {"sender", std::string(senderOf(header))},
                                {"clientType", static_cast<unsigned>(header.clientType)},
                                {"clientVersion", static_cast<unsigned>(header.clientVersion)},
                                {"sessionID", header.sessionID},
                                {"eventID", static_cast<unsigned>(header.eventID)},
                                {"method", static_cast<unsigned>(header.method)},
                                {"status", static_cast<unsigned>(header.respCode)},
                                {"payload", datagram.payload}},
                     JSONStyle::Compact);
  return line.value_or("null") + "\n";
}

DashboardReceiver::DashboardReceiver(const CollectorServices& services, const std::string& address,
                                     std::uint16_t port, DatagramLoss loss, std::filesystem::path file)
    : _console(services.console), _stats(services.stats), _loss(loss), _file(std::move(file)) {
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
    ++_stats.datagramsMalformed;
    return _console.problem("refused a datagram of " + std::to_string(bytes.size()) + " bytes from " +
                            peer.text() + ": " + outcome.problem);
  }
  ReceivedDatagram& datagram = *outcome.datagram;
  const std::uint16_t eventID = datagram.header.eventID;
  Known& history = _known.at(std::hash<std::string_view>{}(bytes));
  const std::uint32_t attempt = history.sent++;
  if (_loss.takes(DatagramLoss::What::Datagram, eventID, attempt)) {
    ++_stats.datagramsLost;
    return _console.note("lost on demand: datagram of event " + std::to_string(eventID));
  }
  datagram.peer = peer.text();
  datagram.received = WallClock::system().now();
  datagram.isAgain = history.taken++ > 0;
  ++_stats.datagrams;
  if (datagram.isAgain) ++_stats.datagramsAgain;
  record(datagram);
  if (datagram.header.isReliable) acknowledge(bytes, eventID, attempt, peer);
}

void DashboardReceiver::record(const ReceivedDatagram& datagram) {
  std::string line = jsonLine(datagram);
  if (int error = appendLines(_file, line))
    _console.problem("can't save a datagram to " + _file.string() + ": " + std::strerror(error));
  line.pop_back();
  _console.event(_console.style() == Console::Style::JSON ? line : readableText(datagram));
}

void DashboardReceiver::acknowledge(std::string_view bytes, std::uint16_t eventID, std::uint32_t attempt,
                                    const IPv4Endpoint& peer) {
  if (_loss.takes(DatagramLoss::What::Acknowledgement, eventID, attempt)) {
    ++_stats.acknowledgementsLost;
    return _console.note("lost on demand: acknowledgement of event " + std::to_string(eventID));
  }
  if (_socket.sendTo(peer, bytes.substr(0, kDashboardHeaderSize))) ++_stats.acknowledgements;
}

}  // namespace vesk

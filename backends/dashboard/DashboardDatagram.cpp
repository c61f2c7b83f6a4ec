#include "backends/dashboard/DashboardDatagram.h"

#include <algorithm>
#include <cstdio>

#include "backends/https/SenderCodes.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

constexpr char kFormatVersion = 1;
constexpr std::uint16_t kReliableFlag = 1;
constexpr std::uint16_t kWithoutProfileFlag = 2;
constexpr std::size_t kLongestLine = 1151;

void put16(char* out, std::uint16_t number) noexcept {
  out[0] = static_cast<char>(number >> 8);
  out[1] = static_cast<char>(number);
}

void put32(char* out, std::uint32_t number) noexcept {
  put16(out, static_cast<std::uint16_t>(number >> 16));
  put16(out + 2, static_cast<std::uint16_t>(number));
}

std::uint16_t get16(std::string_view bytes, std::size_t offset) noexcept {
  return static_cast<std::uint16_t>(static_cast<unsigned char>(bytes[offset]) << 8 |
                                    static_cast<unsigned char>(bytes[offset + 1]));
}

std::uint32_t get32(std::string_view bytes, std::size_t offset) noexcept {
  return static_cast<std::uint32_t>(get16(bytes, offset)) << 16 | get16(bytes, offset + 2);
}

std::uint16_t complement(std::uint16_t number) noexcept { return static_cast<std::uint16_t>(~number); }

}  // namespace

std::string_view DashboardHeader::deviceIDText() const noexcept {
  const std::string_view all(deviceID.data(), deviceID.size());
  return all.substr(0, all.find('\0'));
}

void encodeDashboardHeader(const DashboardHeader& header, char* out) noexcept {
  out[0] = static_cast<char>(header.libraryVersionMajor);
  out[1] = static_cast<char>(header.clientType);
  out[2] = kFormatVersion;
  out[3] = static_cast<char>(header.subsecond);
  put32(out + 4, header.seconds);
  put32(out + 8, ~header.sessionID);
  put16(out + 12, complement(header.clientVersion));
  put16(out + 14, complement(header.length));
  put16(out + 16, header.method);
  put16(out + 18, header.respCode);
  std::copy(header.deviceID.begin(), header.deviceID.end(), out + 20);
  put16(out + kDashboardEventIDOffset, header.eventID);
  put16(out + 62, static_cast<std::uint16_t>((header.isReliable ? kReliableFlag : 0) |
                                             (header.isWithoutProfile ? kWithoutProfileFlag : 0)));
}

std::optional<DashboardHeader> decodeDashboardHeader(std::string_view datagram) noexcept {
  if (datagram.size() < kDashboardHeaderSize || datagram[2] != kFormatVersion) return std::nullopt;
  DashboardHeader header;
  header.libraryVersionMajor = static_cast<std::uint8_t>(datagram[0]);
  header.clientType = static_cast<std::uint8_t>(datagram[1]);
  header.subsecond = static_cast<std::uint8_t>(datagram[3]);
  header.seconds = get32(datagram, 4);
  header.sessionID = ~get32(datagram, 8);
  header.clientVersion = complement(get16(datagram, 12));
  header.length = complement(get16(datagram, 14));
  if (header.length != datagram.size()) return std::nullopt;
  header.method = get16(datagram, 16);
  header.respCode = get16(datagram, 18);
  std::copy_n(datagram.begin() + 20, kDashboardDeviceIDSize, header.deviceID.begin());
  header.eventID = get16(datagram, kDashboardEventIDOffset);
  const std::uint16_t flags = get16(datagram, 62);
  header.isReliable = (flags & kReliableFlag) != 0;
  header.isWithoutProfile = (flags & kWithoutProfileFlag) != 0;
  return header;
}

std::optional<std::uint16_t> eventIDOfAcknowledgement(std::string_view datagram) noexcept {
  if (datagram.size() < kDashboardShortestAcknowledgement) return std::nullopt;
  return get16(datagram, kDashboardEventIDOffset);
}

std::optional<std::string> writeLocalLog(std::string_view datagram) {
  const auto header = decodeDashboardHeader(datagram);
  if (!header) return std::nullopt;
  const std::string_view device = header->deviceIDText();
  const std::string_view sender = senderCodeForClientType(header->clientType).value_or("-");
  const std::string_view text = datagram.substr(kDashboardHeaderSize);
  char line[kLongestLine + 1];
  const int size = std::snprintf(
      line, sizeof line, "%u.%03d %.*s 127.0.0.1 %.*s %5u %5u %5u %5u %5u %.*s", header->seconds,
      static_cast<int>(header->milliseconds()), static_cast<int>(device.size()), device.data(),
      static_cast<int>(sender.size()), sender.data(), header->clientVersion, header->sessionID,
      header->eventID, header->method, header->respCode, static_cast<int>(text.size()), text.data());
  if (size < 0) return std::nullopt;
  const std::string_view shown(line, std::min<std::size_t>(static_cast<std::size_t>(size), kLongestLine));
  if (!isValidUTF8(shown)) return std::nullopt;
  return std::string(shown);
}

}  // namespace vesk

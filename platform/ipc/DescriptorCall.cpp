#include "platform/ipc/DescriptorCall.h"

#include <systemd/sd-bus.h>

#include <cstdint>
#include <cstring>
#include <optional>
#include <string>

#include "platform/ipc/WireFormat.h"

namespace vesk {

namespace {

/// What a header's fields say; absent ones are empty.
struct Fields {
  std::string path, interfaceName, member, signature;
  std::optional<std::uint32_t> descriptors;
};

/// Reads a header's fields under D-Bus's alignment. Every function returns whether it found what it looks
/// for, whole and by the rules.
class FieldReader {
 public:
  explicit FieldReader(std::string_view header) : _header(header) {}

  bool readAll(Fields& out) {
    while (_at < _header.size()) {
      if (!readOne(out)) return false;
    }
    return true;
  }

 private:
  bool readOne(Fields& out) {
    std::uint8_t code = 0;
    std::string type;
    if (!align(8) || !number(code) || !signature(type)) return false;
    if (code == kPath && type == "o") return text(out.path);
    if (code == kInterface && type == "s") return text(out.interfaceName);
    if (code == kMember && type == "s") return text(out.member);
    if (code == kSignature && type == "g") return out.signature.empty() && signature(out.signature);
    if (code == kDescriptors && type == "u" && !out.descriptors) return number(out.descriptors.emplace());
    return false;
  }
  bool align(std::size_t to) {
    for (; _at % to != 0; ++_at) {
      if (_at >= _header.size() || _header[_at] != '\0') return false;
    }
    return true;
  }
  template <class Number>
  bool number(Number& out) {
    if (!align(sizeof out) || _header.size() - _at < sizeof out) return false;
    std::memcpy(&out, _header.data() + _at, sizeof out);
    _at += sizeof out;
    return true;
  }
  bool signature(std::string& out) {
    std::uint8_t size = 0;
    return number(size) && terminated(size, out);
  }
  bool text(std::string& out) {
    std::uint32_t size = 0;
    return out.empty() && number(size) && terminated(size, out);
  }
  bool terminated(std::size_t size, std::string& out) {
    if (_header.size() - _at <= size || _header[_at + size] != '\0') return false;
    out = _header.substr(_at, size);
    _at += size + 1;
    return !out.empty() && out.find('\0') == out.npos;
  }

  const std::string_view _header;
  std::size_t _at = kFixedHeader;  // alignment counts from the message's first byte
};

/// Basic types and arrays of them, among them a descriptor.
bool takesDescriptor(std::string_view signature) {
  for (std::size_t i = 0; i < signature.size(); ++i) {
    if (signature[i] == 'a') ++i;
    if (i == signature.size() || !std::strchr("ybnqiuxtdsogh", signature[i])) return false;
  }
  return signature.find('h') != signature.npos;
}

}  // namespace

bool isDescriptorCall(std::string_view message, std::string_view objectPath, std::size_t descriptors) {
  if (message.size() < kFixedHeader || message[0] != kLittleEndian || message[1] != kMethodCall) return false;
  std::uint32_t size = 0;
  std::memcpy(&size, message.data() + kFieldsSizeAt, sizeof size);
  if (size > message.size() - kFixedHeader) return false;
  const std::size_t end = kFixedHeader + size;
  const std::size_t body = (end + 7) / 8 * 8;
  if (body >= message.size() || message.substr(end, body - end).find_first_not_of('\0') != message.npos) {
    return false;
  }
  Fields fields;
  if (!FieldReader(message.substr(0, end)).readAll(fields)) return false;
  const std::string& interfaceName = fields.interfaceName;
  return fields.path == objectPath && sd_bus_member_name_is_valid(fields.member.c_str()) > 0 &&
         (interfaceName.empty() || (sd_bus_interface_name_is_valid(interfaceName.c_str()) > 0 &&
                                    interfaceName != "org.freedesktop.DBus.Local")) &&
         fields.descriptors == descriptors && takesDescriptor(fields.signature);
}

}  // namespace vesk

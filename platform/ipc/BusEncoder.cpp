#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstring>

#include "platform/ipc/BusCodec.h"
#include "platform/ipc/WireFormat.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

bool BusEncoder::fail(CodecResult result) noexcept {
  if (ok()) _result = result;
  return false;
}

// The calls below name their types themselves, so what sd-bus refuses is what it has no room for: memory, the
// duplicate of a descriptor, or a container too many.
bool BusEncoder::failWith(int error) noexcept {
  bool isScarce = error == -ENOMEM || error == -EMFILE;
  return fail(isScarce ? CodecResult::OutOfResources : CodecResult::LimitExceeded);
}

bool BusEncoder::count(std::size_t content) {
  if (!ok()) return false;
  _content += content;
  if (++_nodes > _limits.nodes || _content > _limits.content) return fail(CodecResult::LimitExceeded);
  return true;
}

bool BusEncoder::open(char type, const char* contents) {
  if (!ok()) return false;
  int r = sd_bus_message_open_container(_message, type, contents);
  return r >= 0 || failWith(r);
}

bool BusEncoder::close() {
  if (!ok()) return false;
  int r = sd_bus_message_close_container(_message);
  return r >= 0 || failWith(r);
}

bool BusEncoder::basic(char type, const void* value) {
  if (!ok()) return false;
  int r = sd_bus_message_append_basic(_message, type, value);
  return r >= 0 || failWith(r);
}

bool BusEncoder::variant(const char* contents, char type, const void* value) {
  return open(SD_BUS_TYPE_VARIANT, contents) && basic(type, value) && close();
}

bool BusEncoder::append(const std::vector<IPCArgument>& arguments) {
  for (const auto& argument : arguments) {
    if (!std::visit([this](const auto& value) { return append(value); }, argument)) return false;
  }
  return true;
}

bool BusEncoder::append(bool value) {
  int number = value ? 1 : 0;
  return basic(SD_BUS_TYPE_BOOLEAN, &number);
}

bool BusEncoder::append(std::uint16_t value) { return basic(SD_BUS_TYPE_UINT16, &value); }

bool BusEncoder::append(double value) { return basic(SD_BUS_TYPE_DOUBLE, &value); }

bool BusEncoder::append(std::string_view value) {
  if (!count(value.size())) return false;
  // sd-bus does not look at the texts that it sends.
  if (!isValidUTF8(value, false)) return fail(CodecResult::Malformed);
  char* space = nullptr;
  int r = sd_bus_message_append_string_space(_message, value.size(), &space);
  if (r < 0) return failWith(r);
  if (!value.empty()) std::memcpy(space, value.data(), value.size());
  return true;
}

bool BusEncoder::append(const Dictionary& value) {
  if (!count(kNodeContent) || !open(SD_BUS_TYPE_ARRAY, "{sv}")) return false;
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  for (const auto& entry : value) {
    if (!open(SD_BUS_TYPE_DICT_ENTRY, "sv") || !append(entry.key.view()) || !append(entry.value) ||
        !close()) {
      return false;
    }
  }
  --_depth;
  return close();
}

bool BusEncoder::append(const List& value) {
  if (!count(kNodeContent) || !open(SD_BUS_TYPE_ARRAY, "v")) return false;
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  for (const auto& item : value) {
    if (!append(item)) return false;
  }
  --_depth;
  return close();
}

template <class T>
bool BusEncoder::optional(const std::optional<T>& value, const char* contents) {
  return open(SD_BUS_TYPE_ARRAY, contents) && (!value || append(*value)) && close();
}

bool BusEncoder::append(const std::optional<Dictionary>& value) { return optional(value, "a{sv}"); }

bool BusEncoder::append(const std::optional<std::string>& value) { return optional(value, "s"); }

bool BusEncoder::append(const std::optional<std::vector<std::string>>& value) {
  return optional(value, "as");
}

bool BusEncoder::append(const std::vector<std::string>& value) {
  if (!open(SD_BUS_TYPE_ARRAY, "s")) return false;
  for (const auto& text : value) {
    if (!append(std::string_view(text))) return false;
  }
  return close();
}

bool BusEncoder::append(IPCDescriptor value) {
  if (!open(SD_BUS_TYPE_ARRAY, "h")) return false;
  if (value.borrowed >= 0 && !basic(SD_BUS_TYPE_UNIX_FD, &value.borrowed)) return false;
  return close();
}

bool BusEncoder::append(const Value& value) {
  if (!count(kNodeContent)) return false;
  switch (value.kind()) {
    case Value::Kind::None:
      return variant("g", SD_BUS_TYPE_SIGNATURE, "");
    case Value::Kind::Boolean:
      return open(SD_BUS_TYPE_VARIANT, "b") && append(*value.boolean()) && close();
    case Value::Kind::Signed:
      return variant("x", SD_BUS_TYPE_INT64, value.signedInteger());
    case Value::Kind::Unsigned:
      return variant("t", SD_BUS_TYPE_UINT64, value.unsignedInteger());
    case Value::Kind::Double:
      return variant("d", SD_BUS_TYPE_DOUBLE, value.real());
    case Value::Kind::Text:
      return open(SD_BUS_TYPE_VARIANT, "s") && append(value.text()->view()) && close();
    case Value::Kind::Bytes: {
      auto bytes = value.bytes()->view();
      if (!count(bytes.size()) || !open(SD_BUS_TYPE_VARIANT, "ay")) return false;
      int r = sd_bus_message_append_array(_message, SD_BUS_TYPE_BYTE, bytes.data(), bytes.size());
      return r < 0 ? failWith(r) : close();
    }
    case Value::Kind::Date:
      return open(SD_BUS_TYPE_VARIANT, "(d)") && open(SD_BUS_TYPE_STRUCT, "d") &&
             append(value.date()->secondsSince1970) && close() && close();
    case Value::Kind::List:
      return open(SD_BUS_TYPE_VARIANT, "av") && append(*value.list()) && close();
    case Value::Kind::Dictionary:
      return open(SD_BUS_TYPE_VARIANT, "a{sv}") && append(*value.dictionary()) && close();
  }
  return fail(CodecResult::WrongType);
}

}  // namespace vesk

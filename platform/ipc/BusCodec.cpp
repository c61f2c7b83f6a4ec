#include "platform/ipc/BusCodec.h"

#include <systemd/sd-bus.h>

#include <cerrno>
#include <cstring>

#include "platform/ipc/WireFormat.h"

namespace vesk {

namespace {

CodecResult resultFor(int error) noexcept {
  switch (error) {
    case -ENXIO:
    case -EINVAL:
      return CodecResult::WrongType;
    case -ENOMEM:
    case -E2BIG:
      return CodecResult::LimitExceeded;
    default:
      return CodecResult::Malformed;
  }
}

}  // namespace

const char* describe(CodecResult result) noexcept {
  switch (result) {
    case CodecResult::Ok:
      return "no error";
    case CodecResult::WrongType:
      return "an argument is of the wrong type";
    case CodecResult::LimitExceeded:
      return "the arguments are too deep, too many or too large";
    case CodecResult::Malformed:
      return "the arguments are malformed";
    case CodecResult::OutOfResources:
      return "no memory or no descriptor is left for the arguments";
  }
  return "unknown error";
}

bool BusDecoder::fail(CodecResult result) noexcept {
  if (ok()) _result = result;
  return false;
}

bool BusDecoder::failWith(int error) noexcept { return fail(resultFor(error)); }

bool BusDecoder::count(std::size_t content) {
  _content += content;
  if (_nodes > _limits.nodes || _content > _limits.content) return fail(CodecResult::LimitExceeded);
  return true;
}

bool BusDecoder::enter(char type, const char* contents) {
  if (!ok()) return false;
  // Counted here so that the caller is told what was wrong.
  if (_containers >= kMaximumContainers) return fail(CodecResult::LimitExceeded);
  int r = sd_bus_message_enter_container(_message, type, contents);
  if (r <= 0) return failWith(r == 0 ? -ENXIO : r);
  ++_containers;
  return true;
}

bool BusDecoder::exit() {
  int r = sd_bus_message_exit_container(_message);
  if (r < 0) return failWith(r);
  --_containers;
  return true;
}

template <class Basic>
bool BusDecoder::basic(char type, Basic& out) {
  if (!ok()) return false;
  int r = sd_bus_message_read_basic(_message, type, &out);
  return r > 0 || failWith(r == 0 ? -ENXIO : r);
}

// sd-bus has checked that a text is UTF-8, ends with a NUL and holds no other before it hands it out.
bool BusDecoder::textView(char type, std::string_view& out) {
  const char* text = nullptr;
  if (!basic(type, text)) return false;
  out = text;
  return count(out.size());
}

bool BusDecoder::read(bool& out) {
  int value = 0;
  if (!basic(SD_BUS_TYPE_BOOLEAN, value)) return false;
  out = value != 0;
  return true;
}

bool BusDecoder::read(std::uint16_t& out) { return basic(SD_BUS_TYPE_UINT16, out); }

bool BusDecoder::read(double& out) { return basic(SD_BUS_TYPE_DOUBLE, out); }

bool BusDecoder::read(std::string& out) {
  std::string_view text;
  if (!textView(SD_BUS_TYPE_STRING, text)) return false;
  out = text;
  return true;
}

bool BusDecoder::read(Dictionary& out) { return dictionary("{sv}", out); }

bool BusDecoder::read(List& out) {
  if (!ok()) return false;
  char type = 0;
  const char* contents = nullptr;
  int r = sd_bus_message_peek_type(_message, &type, &contents);
  if (r < 0) return failWith(r);
  if (r == 0 || type != SD_BUS_TYPE_ARRAY) return fail(CodecResult::WrongType);
  return items(type, contents, out);
}

bool BusDecoder::read(Value& out) {
  bool found = false;
  if (!next(out, found)) return false;
  return found || fail(CodecResult::WrongType);
}

template <class T>
bool BusDecoder::optional(std::optional<T>& out, const char* contents) {
  out.reset();
  if (!enter(SD_BUS_TYPE_ARRAY, contents)) return false;
  int end = sd_bus_message_at_end(_message, false);
  if (end < 0) return failWith(end);
  if (end == 0 && !read(out.emplace())) return false;
  end = sd_bus_message_at_end(_message, false);
  if (end < 0) return failWith(end);
  if (end == 0) return fail(CodecResult::WrongType);
  return exit();
}

bool BusDecoder::read(std::optional<Dictionary>& out) { return optional(out, "a{sv}"); }

bool BusDecoder::read(std::optional<std::string>& out) { return optional(out, "s"); }

bool BusDecoder::read(std::optional<std::vector<std::string>>& out) { return optional(out, "as"); }

bool BusDecoder::read(std::vector<std::string>& out) {
  out.clear();
  if (!enter(SD_BUS_TYPE_ARRAY, "s")) return false;
  const char* text = nullptr;
  int r = 0;
  while ((r = sd_bus_message_read_basic(_message, SD_BUS_TYPE_STRING, &text)) > 0) {
    ++_nodes;
    if (!count(kNodeContent + std::strlen(text))) return false;
    out.emplace_back(text);
  }
  return r < 0 ? failWith(r) : exit();
}

bool BusDecoder::readDescriptor(int& out) {
  out = -1;
  if (!enter(SD_BUS_TYPE_ARRAY, "h")) return false;
  int r = sd_bus_message_read_basic(_message, SD_BUS_TYPE_UNIX_FD, &out);
  if (r < 0) return failWith(r);
  int end = sd_bus_message_at_end(_message, false);
  if (end < 0) return failWith(end);
  if (end == 0) return fail(CodecResult::WrongType);
  return exit();
}

// --- Values

/// `found` is false, and nothing wrong, at the end of the enclosing container.
bool BusDecoder::next(Value& out, bool& found) {
  found = false;
  if (!ok()) return false;
  char type = 0;
  const char* contents = nullptr;
  int r = sd_bus_message_peek_type(_message, &type, &contents);
  if (r < 0) return failWith(r);
  if (r == 0) return true;
  found = true;
  return value(type, contents, out);
}

bool BusDecoder::value(char type, const char* contents, Value& out) {
  switch (type) {
    case SD_BUS_TYPE_VARIANT:
      return variant(out);
    case SD_BUS_TYPE_STRUCT:
      return structure(contents, out);
    case SD_BUS_TYPE_STRING:
    case SD_BUS_TYPE_OBJECT_PATH:
    case SD_BUS_TYPE_SIGNATURE: {
      std::string_view text;
      ++_nodes;
      if (!textView(type, text) || !count(kNodeContent)) return false;
      // The empty signature, which means nothing anywhere else, is the null marker.
      out = type == SD_BUS_TYPE_SIGNATURE && text.empty() ? Value() : Value(_arena.add(text));
      return true;
    }
    case SD_BUS_TYPE_ARRAY: {
      if (contents[0] == SD_BUS_TYPE_BYTE) return bytes(out);
      if (contents[0] == SD_BUS_TYPE_DICT_ENTRY_BEGIN && contents[1] == SD_BUS_TYPE_STRING) {
        Dictionary entries;
        if (!dictionary(contents, entries)) return false;
        out = std::move(entries);
        return true;
      }
      List list;
      if (!items(type, contents, list)) return false;
      out = std::move(list);
      return true;
    }
    case SD_BUS_TYPE_DICT_ENTRY: {
      List list;
      if (!items(type, contents, list)) return false;
      out = std::move(list);
      return true;
    }
    default:
      return number(type, out);
  }
}

bool BusDecoder::number(char type, Value& out) {
  // sd-bus fills as many bytes as the type has; a boolean fills an int.
  union {
    std::uint8_t y;
    std::int16_t n;
    std::uint16_t q;
    std::int32_t i;
    std::uint32_t u;
    std::int64_t x;
    std::uint64_t t;
    double d;
  } raw{};
  if (type == SD_BUS_TYPE_UNIX_FD) return fail(CodecResult::WrongType);
  ++_nodes;
  if (!count(kNodeContent) || !basic(type, raw)) return false;
  switch (type) {
    case SD_BUS_TYPE_BOOLEAN:
      out = raw.i != 0;
      return true;
    case SD_BUS_TYPE_BYTE:
      out = std::uint64_t{raw.y};
      return true;
    case SD_BUS_TYPE_INT16:
      out = std::int64_t{raw.n};
      return true;
    case SD_BUS_TYPE_UINT16:
      out = std::uint64_t{raw.q};
      return true;
    case SD_BUS_TYPE_INT32:
      out = std::int64_t{raw.i};
      return true;
    case SD_BUS_TYPE_UINT32:
      out = std::uint64_t{raw.u};
      return true;
    case SD_BUS_TYPE_INT64:
      out = raw.x;
      return true;
    case SD_BUS_TYPE_UINT64:
      out = raw.t;
      return true;
    case SD_BUS_TYPE_DOUBLE:
      out = raw.d;
      return true;
    default:
      return fail(CodecResult::WrongType);
  }
}

bool BusDecoder::variant(Value& out) {
  char type = 0;
  const char* contents = nullptr;
  int r = sd_bus_message_peek_type(_message, &type, &contents);
  if (r < 0) return failWith(r);
  if (r == 0 || type != SD_BUS_TYPE_VARIANT) return fail(CodecResult::WrongType);
  if (!enter(type, contents)) return false;
  switch (contents[0]) {
    case SD_BUS_TYPE_ARRAY:
      return value(SD_BUS_TYPE_ARRAY, contents + 1, out) && exit();
    case SD_BUS_TYPE_STRUCT_BEGIN:
      return read(out) && exit();
    default:
      return value(contents[0], nullptr, out) && exit();
  }
}

bool BusDecoder::bytes(Value& out) {
  const void* data = nullptr;
  std::size_t size = 0;
  int r = sd_bus_message_read_array(_message, SD_BUS_TYPE_BYTE, &data, &size);
  if (r < 0) return failWith(r);
  ++_nodes;
  if (!count(kNodeContent + size)) return false;
  out = Bytes(std::string(static_cast<const char*>(data), size));
  return true;
}

bool BusDecoder::dictionary(const char* contents, Dictionary& out) {
  ++_nodes;
  if (!count(kNodeContent)) return false;
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  const std::string entry(contents + 1, std::strlen(contents) - 2);
  if (!enter(SD_BUS_TYPE_ARRAY, contents)) return false;
  MutableDictionary building;
  int r = 0;
  while ((r = sd_bus_message_enter_container(_message, SD_BUS_TYPE_DICT_ENTRY, entry.c_str())) > 0) {
    ++_containers;
    std::string_view key;
    Value value;
    if (!textView(SD_BUS_TYPE_STRING, key) || !read(value) || !exit()) return false;
    if (building.empty()) building.reserve(8);
    building.append(_arena.add(key), std::move(value));
  }
  if (r < 0) return failWith(r);
  out = building.shareUnique();
  --_depth;
  return exit();
}

bool BusDecoder::items(char container, const char* contents, List& out) {
  ++_nodes;
  if (!count(kNodeContent)) return false;
  if (++_depth > _limits.depth) return fail(CodecResult::LimitExceeded);
  if (!enter(container, contents)) return false;
  std::vector<Value> values;
  for (;;) {
    Value value;
    bool found = false;
    if (!next(value, found)) return false;
    if (!found) break;
    values.push_back(std::move(value));
  }
  out = List(std::move(values));
  --_depth;
  return exit();
}

bool BusDecoder::structure(const char* contents, Value& out) {
  if (std::strcmp(contents, "d") == 0) {
    Date date;
    ++_nodes;
    if (!count(kNodeContent) || !enter(SD_BUS_TYPE_STRUCT, contents)) return false;
    if (!basic(SD_BUS_TYPE_DOUBLE, date.secondsSince1970)) return false;
    out = date;
    return exit();
  }
  List members;
  if (!items(SD_BUS_TYPE_STRUCT, contents, members)) return false;
  out = std::move(members);
  return true;
}

}  // namespace vesk

#include "platform/ipc/CallRouter.h"

#include <cstring>

#include "platform/ipc/IPCIncomingCall.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr const char* kIntrospectable = "org.freedesktop.DBus.Introspectable";

constexpr const char* kDoctype =
    "<!DOCTYPE node PUBLIC \"-//freedesktop//DTD D-BUS Object Introspection 1.0//EN\"\n"
    " \"http://www.freedesktop.org/standards/dbus/1.0/introspect.dtd\">\n";

constexpr const char* kStandardInterfaces =
    "  <interface name=\"org.freedesktop.DBus.Peer\">\n"
    "    <method name=\"Ping\"/>\n"
    "    <method name=\"GetMachineId\"><arg type=\"s\" direction=\"out\"/></method>\n"
    "  </interface>\n"
    "  <interface name=\"org.freedesktop.DBus.Introspectable\">\n"
    "    <method name=\"Introspect\"><arg type=\"s\" direction=\"out\"/></method>\n"
    "  </interface>\n";

/// The name of the next node on the way from `path` to `target`; empty when `target` is not below `path`.
std::string_view childTowards(std::string_view path, std::string_view target) {
  if (path == "/") path = "";
  if (!target.starts_with(path) || target.size() <= path.size() || target[path.size()] != '/') return {};
  auto rest = target.substr(path.size() + 1);
  return rest.substr(0, rest.find('/'));
}

}  // namespace

CallRouter::CallRouter(std::string objectPath, std::string connectionName,
                       std::shared_ptr<BusReplies> replies, const ExtensionOwner& owner, CodecLimits limits)
    : _objectPath(std::move(objectPath)),
      _connectionName(std::move(connectionName)),
      _replies(std::move(replies)),
      _owner(owner),
      _limits(limits),
      _decoder(_objectPath, limits) {}

void CallRouter::warn(std::string_view member, const char* what) {
  if (_warnings.begins()) {
    VESK_LOG_WARNING("ipc: %s: Dropped the one-way call %.*s: %s", _connectionName.c_str(),
                     static_cast<int>(member.size()), member.data(), what);
  }
}

void CallRouter::refuse(sd_bus_message* message, const char* errorName, const char* text) {
  if (sd_bus_message_get_expect_reply(message) <= 0) warn(sd_bus_message_get_member(message), text);
  _replies->sendError(message, errorName, text);
}

void CallRouter::route(sd_bus_message* message) {
  std::uint8_t type = 0;
  if (sd_bus_message_get_type(message, &type) < 0 || type != SD_BUS_MESSAGE_METHOD_CALL) return;
  const char* interface = sd_bus_message_get_interface(message);
  const std::string_view path = sd_bus_message_get_path(message);
  if (interface && std::strcmp(interface, kIntrospectable) == 0) return introspect(message, path);
  if (path != _objectPath || !_object) {
    return refuse(message, SD_BUS_ERROR_UNKNOWN_OBJECT, "There is no such object");
  }
  // D-Bus lets a caller leave the interface out.
  if (interface && std::strcmp(interface, _object->interfaceName()) != 0) {
    return refuse(message, SD_BUS_ERROR_UNKNOWN_INTERFACE, "The object has no such interface");
  }
  IPCIncomingCall call(message, _replies, _owner, _limits);
  serve(call);
}

bool CallRouter::routeOneWay(std::string_view message) {
  if (!_object) return false;
  auto oneWay = _decoder.decode(message);
  if (!oneWay) return false;
  if (!oneWay->interfaceName.empty() && oneWay->interfaceName != _object->interfaceName()) return false;
  IPCIncomingCall call(*oneWay, _replies, _limits);
  serve(call);
  return true;
}

void CallRouter::serve(IPCIncomingCall& call) {
  // The object stays alive during its call, also when the call makes the connection drop it.
  auto object = _object;
  auto fail = [&](const char* what) {
    VESK_LOG_ERROR("ipc: %s: %.*s failed%s", _connectionName.c_str(), static_cast<int>(call.member().size()),
                   call.member().data(), what);
    call.refuse(SD_BUS_ERROR_FAILED, "The call failed");
  };
  try {
    object->handle(call);
    if (call.expectsReply() && !call.isSettled())
      call.refuse(SD_BUS_ERROR_FAILED, "The call was not answered");
  } catch (const std::exception& error) {
    return fail((std::string(": ") + error.what()).c_str());
  } catch (...) {
    return fail("");
  }
  if (call.complaint()) warn(call.member(), call.complaint());
}

void CallRouter::introspect(sd_bus_message* message, std::string_view path) {
  if (std::strcmp(sd_bus_message_get_member(message), "Introspect") != 0) {
    return refuse(message, SD_BUS_ERROR_UNKNOWN_METHOD, "The interface has no such method");
  }
  std::string xml = kDoctype;
  xml += "<node>\n";
  if (path == _objectPath && _object) {
    xml += kStandardInterfaces;
    xml += _object->introspection();
  } else if (auto child = childTowards(path, _objectPath); !child.empty()) {
    xml.append("  <node name=\"").append(child).append("\"/>\n");
  } else {
    return refuse(message, SD_BUS_ERROR_UNKNOWN_OBJECT, "There is no such object");
  }
  xml += "</node>\n";
  _replies->send(message, {IPCArgument(std::move(xml))});
}

}  // namespace vesk

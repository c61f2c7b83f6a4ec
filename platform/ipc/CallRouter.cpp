#include "platform/ipc/CallRouter.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <set>

#include "platform/ipc/IPCIncomingCall.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr const char* kPeer = "org.freedesktop.DBus.Peer";
constexpr const char* kIntrospectable = "org.freedesktop.DBus.Introspectable";
constexpr const char* kProperties = "org.freedesktop.DBus.Properties";

constexpr const char* kNoSuchMethod = "The interface has no such method";
constexpr const char* kNoSuchInterface = "The object has no such interface";
constexpr const char* kNoSuchObject = "There is no such object";

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
    "  </interface>\n"
    "  <interface name=\"org.freedesktop.DBus.Properties\">\n"
    "    <method name=\"Get\"><arg type=\"s\"/><arg type=\"s\"/><arg type=\"v\" "
    "direction=\"out\"/></method>\n"
    "    <method name=\"GetAll\"><arg type=\"s\"/><arg type=\"a{sv}\" direction=\"out\"/></method>\n"
    "    <method name=\"Set\"><arg type=\"s\"/><arg type=\"s\"/><arg type=\"v\"/></method>\n"
    "  </interface>\n";

/// The name of the next node on the path from `path` to `target`; empty if `target` is not below `path`.
std::string_view childTowards(std::string_view path, std::string_view target) {
  if (path == "/") path = "";
  if (!target.starts_with(path) || target.size() <= path.size() || target[path.size()] != '/') return {};
  auto rest = target.substr(path.size() + 1);
  return rest.substr(0, rest.find('/'));
}

/// Returns 32 hexadecimal digits, or an empty string if the machine has no ID or the sandbox hides it.
std::string machineID() {
  std::string line;
  for (const char* path : {"/etc/machine-id", "/var/lib/dbus/machine-id"}) {
    std::ifstream file(path);
    if (std::getline(file, line) && line.size() == 32) return line;
  }
  return {};
}

}  // namespace

CallRouter::CallRouter(std::string objectPath, std::string connectionName, std::shared_ptr<Outbox> outbox,
                       const ExtensionOwner& owner, CodecLimits limits)
    : _objectPath(std::move(objectPath)),
      _connectionName(std::move(connectionName)),
      _outbox(std::move(outbox)),
      _owner(owner),
      _limits(limits) {}

void CallRouter::warn(std::string_view member, const char* what) {
  if (_warnings.begins()) {
    VESK_LOG_WARNING("ipc: %s: Dropped the one-way call %.*s: %s", _connectionName.c_str(),
                     static_cast<int>(member.size()), member.data(), what);
  }
}

void CallRouter::setExportedObject(std::shared_ptr<IPCExportedObject> object, Objects others) {
  _objects = std::move(others);
  if (object) _objects[_objectPath] = std::move(object);
}

std::shared_ptr<IPCExportedObject> CallRouter::objectAt(std::string_view path) const {
  const auto found = _objects.find(path);
  return found == _objects.end() ? nullptr : found->second;
}

void CallRouter::route(Message& message) {
  const MessageHeader& header = *message.header;
  if (header.type != MessageType::Call) return;
  IPCIncomingCall call(message, _outbox, _owner, _limits);
  // Keeps the object alive during its call, even if the call makes the connection drop it.
  const auto object = objectAt(header.path);
  if (header.interfaceName == kPeer) {
    servePeer(call);
  } else if (header.interfaceName == kIntrospectable) {
    serveIntrospectable(call, header.path);
  } else if (!object) {
    call.refuse(kErrorUnknownObject, kNoSuchObject);
  } else if (header.interfaceName == kProperties) {
    serveProperties(call, *object);
  } else if (!header.interfaceName.empty() && header.interfaceName != object->interfaceName()) {
    call.refuse(kErrorUnknownInterface, kNoSuchInterface);
  } else {  // D-Bus allows callers to omit the interface
    serveObject(call, *object);
  }
  if (call.complaint()) warn(call.member(), call.complaint());
}

void CallRouter::serveObject(IPCIncomingCall& call, IPCExportedObject& object) {
  auto fail = [&](const char* what) {
    VESK_LOG_ERROR("ipc: %s: %.*s failed%s", _connectionName.c_str(), static_cast<int>(call.member().size()),
                   call.member().data(), what);
    if (call.expectsReply()) call.refuse(kErrorFailed, "The call failed");
  };
  try {
    object.handle(call);
    if (call.expectsReply() && !call.isSettled()) call.refuse(kErrorFailed, "The call was not answered");
  } catch (const std::exception& error) {
    fail((std::string(": ") + error.what()).c_str());
  } catch (...) {
    fail("");
  }
}

void CallRouter::servePeer(IPCIncomingCall& call) {
  if (call.member() == "Ping") {
    if (call.read("")) call.answer();
  } else if (call.member() == "GetMachineId") {
    if (!call.read("")) return;
    std::string id = machineID();
    if (id.empty()) return call.refuse(kErrorFailed, "The machine has no ID");
    call.answer({IPCArgument(std::move(id))});
  } else {
    call.refuse(kErrorUnknownMethod, kNoSuchMethod);
  }
}

void CallRouter::serveIntrospectable(IPCIncomingCall& call, std::string_view path) {
  if (call.member() != "Introspect") return call.refuse(kErrorUnknownMethod, kNoSuchMethod);
  std::string xml = kDoctype;
  xml += "<node>\n";
  std::set<std::string_view> children;
  for (const auto& [each, exported] : _objects) {
    if (const auto child = childTowards(path, each); !child.empty()) children.insert(child);
  }
  if (const auto object = objectAt(path)) {
    xml += kStandardInterfaces;
    xml += object->introspection();
  } else if (children.empty()) {
    return call.refuse(kErrorUnknownObject, kNoSuchObject);
  }
  for (const auto child : children) xml.append("  <node name=\"").append(child).append("\"/>\n");
  xml += "</node>\n";
  call.answer({IPCArgument(std::move(xml))});
}

/// The interfaces here have no properties.
void CallRouter::serveProperties(IPCIncomingCall& call, const IPCExportedObject& object) {
  std::string interfaceName;
  std::string property;
  Value value;
  if (call.member() == "GetAll") {
    if (!call.read("s", interfaceName)) return;
  } else if (call.member() == "Get") {
    if (!call.read("ss", interfaceName, property)) return;
  } else if (call.member() == "Set") {
    if (!call.read("ssv", interfaceName, property, value)) return;
  } else {
    return call.refuse(kErrorUnknownMethod, kNoSuchMethod);
  }
  const std::string_view known[] = {"", object.interfaceName(), kPeer, kIntrospectable, kProperties};
  if (std::find(std::begin(known), std::end(known), interfaceName) == std::end(known)) {
    return call.refuse(kErrorUnknownInterface, kNoSuchInterface);
  }
  if (call.member() == "GetAll") return call.answer({IPCArgument(Dictionary())});
  call.refuse(kErrorUnknownProperty, "The interface has no such property");
}

}  // namespace vesk

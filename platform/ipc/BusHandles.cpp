#include "platform/ipc/BusHandles.h"

#include <system_error>

namespace vesk {

void checkBus(int result, const char* what) {
  if (result < 0) throw std::system_error(-result, std::generic_category(), what);
}

BusHandle newBus(FileDescriptor socket) {
  sd_bus* raw = nullptr;
  checkBus(sd_bus_new(&raw), "sd_bus_new");
  BusHandle bus(raw);
  checkBus(sd_bus_set_fd(raw, socket.get(), socket.get()), "sd_bus_set_fd");
  static_cast<void>(socket.release());
  checkBus(sd_bus_negotiate_fds(raw, 1), "sd_bus_negotiate_fds");
  return bus;
}

BusMessageHandle newCall(sd_bus* bus, const std::string& objectPath, const IPCOutgoingCall& call,
                         bool expectReply) {
  sd_bus_message* raw = nullptr;
  if (sd_bus_message_new_method_call(bus, &raw, nullptr, objectPath.c_str(), call.interfaceName,
                                     call.member) < 0) {
    return {};
  }
  BusMessageHandle message(raw);
  if (!expectReply) sd_bus_message_set_expect_reply(raw, 0);
  return message;
}

}  // namespace vesk

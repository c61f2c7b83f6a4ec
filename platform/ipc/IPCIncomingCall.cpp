#include "platform/ipc/IPCIncomingCall.h"

#include <fcntl.h>

#include "platform/ipc/BusReplies.h"
#include "platform/log/SystemLog.h"

namespace vesk {

IPCIncomingCall::IPCIncomingCall(sd_bus_message* message, const std::shared_ptr<BusReplies>& replies,
                                 const ExtensionOwner& owner, const CodecLimits& limits)
    : _message(message),
      _replies(replies),
      _owner(owner),
      _limits(limits),
      _member(sd_bus_message_get_member(message)),
      _expectsReply(sd_bus_message_get_expect_reply(message) > 0) {}

IPCIncomingCall::IPCIncomingCall(OneWayCall& call, const std::shared_ptr<BusReplies>& replies,
                                 const CodecLimits& limits)
    : _message(nullptr),
      _oneWay(&call),
      _replies(replies),
      _owner{},
      _limits(limits),
      _member(call.member),
      _expectsReply(false) {}

bool IPCIncomingCall::checkSignature(const char* signature) {
  if (_oneWay ? _oneWay->signature == signature : sd_bus_message_has_signature(_message, signature) > 0)
    return true;
  return refuseArguments(CodecResult::WrongType);
}

bool IPCIncomingCall::refuseArguments(CodecResult result) {
  bool tooLarge = result == CodecResult::LimitExceeded;
  refuse(tooLarge ? SD_BUS_ERROR_LIMITS_EXCEEDED : SD_BUS_ERROR_INVALID_ARGS, describe(result));
  return false;
}

bool IPCIncomingCall::readOne(BusDecoder& decoder, FileDescriptor& out) {
  int borrowed = -1;
  if (!decoder.readDescriptor(borrowed)) return false;
  out.reset();
  if (borrowed < 0) return true;
  out = FileDescriptor(::fcntl(borrowed, F_DUPFD_CLOEXEC, 3));
  // Without one to spare the call goes on as if the client had sent none.
  if (!out) VESK_LOG_WARNING("ipc: A descriptor that came with a call is lost (%d)", errno);
  return true;
}

std::string IPCIncomingCall::grant(FileDescriptor descriptor) {
  return ExtensionTokens::shared().add(_owner, std::move(descriptor));
}

void IPCIncomingCall::answer(std::vector<IPCArgument> arguments) {
  if (std::exchange(_settled, true)) return;
  if (_expectsReply) _replies->send(_message, arguments);
}

void IPCIncomingCall::refuse(const char* errorName, const char* text) {
  if (std::exchange(_settled, true)) return;
  if (!_expectsReply) {
    _complaint = text;
  } else {
    _replies->sendError(_message, errorName, text);
  }
}

bool IPCIncomingCall::keep(std::uint64_t& ticket) {
  if (std::exchange(_settled, true) || !_expectsReply) return false;
  auto kept = _replies->keep(_message);
  if (!kept) {
    _replies->sendError(_message, SD_BUS_ERROR_LIMITS_EXCEEDED, "Too many calls wait for their answers");
    return false;
  }
  ticket = *kept;
  return true;
}

void IPCIncomingCall::sendKept(BusReplies& replies, std::uint64_t ticket,
                               std::vector<IPCArgument> arguments) noexcept {
  replies.answer(ticket, std::move(arguments));
}

void IPCIncomingCall::abandonKept(BusReplies& replies, std::uint64_t ticket) noexcept {
  replies.refuse(ticket, SD_BUS_ERROR_NO_REPLY, "The call was given up without an answer");
}

}  // namespace vesk

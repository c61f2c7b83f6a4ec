#include "platform/ipc/IPCIncomingCall.h"

namespace vesk {

bool IPCIncomingCall::refuseArguments(CodecResult result) {
  const bool isTooLarge = result == CodecResult::LimitExceeded;
  refuse(isTooLarge ? kErrorLimitsExceeded : kErrorInvalidArguments, describe(result));
  return false;
}

bool IPCIncomingCall::readOne(MessageReader& reader, FileDescriptor& out) {
  std::optional<std::uint32_t> index;
  if (!reader.readDescriptor(index)) return false;
  out.reset();
  if (!index) return true;
  if (*index >= _message.descriptors.size()) return false;
  out = std::move(_message.descriptors[*index]);
  return true;
}

std::string IPCIncomingCall::grant(FileDescriptor descriptor) {
  return ExtensionTokens::shared().add(_owner, std::move(descriptor));
}

void IPCIncomingCall::answer(const std::vector<IPCArgument>& arguments) {
  if (std::exchange(_settled, true)) return;
  if (expectsReply()) _outbox->send(_message.serial, arguments);
}

void IPCIncomingCall::refuse(const char* errorName, const char* text) {
  if (std::exchange(_settled, true)) return;
  if (expectsReply()) {
    _outbox->sendError(_message.serial, errorName, text);
  } else {
    _complaint = text;
  }
}

bool IPCIncomingCall::owe() {
  if (std::exchange(_settled, true) || !expectsReply()) return false;
  if (_outbox->owe()) return true;
  _outbox->sendError(_message.serial, kErrorLimitsExceeded, "Too many calls wait for their answers");
  return false;
}

void IPCIncomingCall::abandon(Outbox& outbox, std::uint32_t call) noexcept {
  outbox.settleWithError(call, kErrorNoReply, "The call was given up without an answer");
}

}  // namespace vesk

#include "platform/ipc/BusReplies.h"

#include "platform/ipc/BusCodec.h"
#include "platform/log/SystemLog.h"

namespace vesk {

void BusReplies::open(sd_bus* bus) {
  _thread = std::this_thread::get_id();
  _bus = bus;
}

std::optional<BusReplies::Ticket> BusReplies::keep(sd_bus_message* call) {
  if (_owed.size() >= kMaximumOwed) return std::nullopt;
  _owed.emplace(++_lastTicket, sd_bus_message_ref(call));
  return _lastTicket;
}

void BusReplies::send(sd_bus_message* call, const std::vector<IPCArgument>& arguments) noexcept {
  if (!_bus || sd_bus_message_get_expect_reply(call) <= 0) return;
  sd_bus_message* raw = nullptr;
  if (sd_bus_message_new_method_return(call, &raw) < 0) return;
  BusMessageHandle reply(raw);
  BusEncoder encoder(raw);
  if (!encoder.append(arguments)) {
    VESK_LOG_ERROR("ipc: The answer to %s can't be sent: %s", sd_bus_message_get_member(call),
                   describe(encoder.result()));
    sendError(call, SD_BUS_ERROR_FAILED, "The answer can't be sent");
    return;
  }
  // A failure means that the connection is ending, which its thread notices by itself.
  sd_bus_send(_bus, raw, nullptr);
}

void BusReplies::sendError(sd_bus_message* call, const char* errorName, const char* text) noexcept {
  if (!_bus || sd_bus_message_get_expect_reply(call) <= 0) return;
  const sd_bus_error error{errorName, text, 0};
  sd_bus_reply_method_error(call, &error);
}

void BusReplies::sendNow(const Answer& answer) noexcept {
  auto owed = _owed.find(answer.ticket);
  if (owed == _owed.end()) return;
  BusMessageHandle call = std::move(owed->second);
  _owed.erase(owed);
  if (answer.errorName) {
    sendError(call.get(), answer.errorName, answer.errorText);
  } else {
    send(call.get(), answer.arguments);
  }
}

void BusReplies::sendWaiting() {
  std::vector<Answer> waiting;
  {
    MutexLock lock(_mutex);
    waiting.swap(_waiting);
  }
  for (const auto& answer : waiting) sendNow(answer);
}

void BusReplies::close() {
  {
    MutexLock lock(_mutex);
    _closed = true;
    _waiting.clear();
  }
  _owed.clear();
  _bus = nullptr;
}

void BusReplies::settle(Answer answer) noexcept {
  if (std::this_thread::get_id() == _thread) return sendNow(answer);
  try {
    MutexLock lock(_mutex);
    // There are no more of them than calls that are owed an answer.
    if (_closed) return;
    _waiting.push_back(std::move(answer));
  } catch (const std::exception& error) {
    VESK_LOG_ERROR("ipc: An answer is lost: %s", error.what());
    return;
  }
  if (_wake) _wake();
}

void BusReplies::answer(Ticket ticket, std::vector<IPCArgument> arguments) noexcept {
  settle({ticket, std::move(arguments)});
}

void BusReplies::refuse(Ticket ticket, const char* errorName, const char* text) noexcept {
  settle({ticket, {}, errorName, text});
}

}  // namespace vesk

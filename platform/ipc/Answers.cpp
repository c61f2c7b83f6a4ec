#include "platform/ipc/Answers.h"

#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

CodecResult Answers::write(const OutgoingHeader& header, const std::vector<IPCArgument>& arguments) {
  std::string message;
  const auto result = appendMessage(header, ++_lastSerial, arguments, message);
  MutexLock lock(_mutex);
  if (result == CodecResult::Ok && !_closed) _waiting.push_back(std::move(message));
  return result;
}

void Answers::lose(const std::exception& error) noexcept {
  VESK_LOG_ERROR("ipc: An answer is lost: %s", error.what());
  _isBroken = true;
}

void Answers::send(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept try {
  const auto result = write({.type = MessageType::Answer, .replySerial = call}, arguments);
  if (result == CodecResult::Ok) return;
  VESK_LOG_ERROR("ipc: An answer can't be sent: %s", describe(result));
  sendError(call, kErrorFailed, "The answer can't be sent");
} catch (const std::exception& error) {
  lose(error);
}

void Answers::sendError(std::uint32_t call, const char* errorName, const char* text) noexcept try {
  write({.type = MessageType::Error, .errorName = errorName, .replySerial = call},
        {IPCArgument(std::string(text))});
} catch (const std::exception& error) {
  lose(error);
}

bool Answers::owe() {
  MutexLock lock(_mutex);
  if (_owed >= kMaximumOwed) return false;
  ++_owed;
  return true;
}

void Answers::settle(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept {
  send(call, arguments);
  paid();
}

void Answers::settleWithError(std::uint32_t call, const char* errorName, const char* text) noexcept {
  sendError(call, errorName, text);
  paid();
}

void Answers::paid() noexcept {
  {
    MutexLock lock(_mutex);
    --_owed;
    if (_closed) return;
  }
  if (_wake && _thread.load() != std::this_thread::get_id()) _wake();
}

void Answers::moveTo(Channel& channel) {
  std::vector<std::string> waiting;
  {
    MutexLock lock(_mutex);
    if (_waiting.empty()) return;
    waiting.swap(_waiting);
  }
  for (const std::string& message : waiting) {
    channel.output() += message;
    channel.queued();
  }
}

void Answers::close() noexcept {
  std::vector<std::string> dropped;  // released after the lock
  MutexLock lock(_mutex);
  _closed = true;
  dropped.swap(_waiting);
}

}  // namespace vesk

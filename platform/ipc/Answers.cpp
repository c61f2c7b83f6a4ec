#include "platform/ipc/Answers.h"

#include <exception>
#include <utility>

#include "platform/ipc/MessageWriter.h"
#include "platform/log/SystemLog.h"

namespace vesk {

void Answers::send(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept try {
  std::string message;
  const auto result =
      appendMessage({.type = MessageType::Answer, .replySerial = call}, ++_lastSerial, arguments, message);
  if (result == CodecResult::Ok) return add(std::move(message));
  VESK_LOG_ERROR("ipc: An answer can't be sent: %s", describe(result));
  sendError(call, kErrorFailed, "The answer can't be sent");
} catch (const std::exception& error) {
  VESK_LOG_ERROR("ipc: An answer is lost: %s", error.what());
  _isBroken = true;
}

void Answers::sendError(std::uint32_t call, const char* errorName, const char* text) noexcept try {
  std::string message;
  const auto result = appendMessage({.type = MessageType::Error, .errorName = errorName, .replySerial = call},
                                    ++_lastSerial, {IPCArgument(std::string(text))}, message);
  if (result == CodecResult::Ok) add(std::move(message));
} catch (const std::exception& error) {
  VESK_LOG_ERROR("ipc: An answer is lost: %s", error.what());
  _isBroken = true;
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

void Answers::add(std::string message) {
  MutexLock lock(_mutex);
  if (!_closed) _waiting.push_back(std::move(message));
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

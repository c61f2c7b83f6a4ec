#include "platform/ipc/Outbox.h"

#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

CodecResult Outbox::write(const OutgoingHeader& header, const std::vector<IPCArgument>& arguments) {
  std::string message;
  const auto result = appendMessage(header, ++_lastSerial, arguments, message);
  MutexLock lock(_mutex);
  if (result == CodecResult::Ok && !_closed) _answers.push_back(std::move(message));
  return result;
}

void Outbox::lose(const std::exception& error) noexcept {
  VESK_LOG_ERROR("ipc: An answer is lost: %s", error.what());
  _isBroken = true;
}

void Outbox::send(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept try {
  const auto result = write({.type = MessageType::Answer, .replySerial = call}, arguments);
  if (result == CodecResult::Ok) return;
  VESK_LOG_ERROR("ipc: An answer can't be sent: %s", describe(result));
  sendError(call, kErrorFailed, "The answer can't be sent");
} catch (const std::exception& error) {
  lose(error);
}

void Outbox::sendError(std::uint32_t call, const char* errorName, const char* text) noexcept try {
  write({.type = MessageType::Error, .errorName = errorName, .replySerial = call},
        {IPCArgument(std::string(text))});
} catch (const std::exception& error) {
  lose(error);
}

bool Outbox::owe() {
  MutexLock lock(_mutex);
  if (_owed >= kMaximumOwed) return false;
  ++_owed;
  return true;
}

void Outbox::settle(std::uint32_t call, const std::vector<IPCArgument>& arguments) noexcept {
  send(call, arguments);
  paid();
}

void Outbox::settleWithError(std::uint32_t call, const char* errorName, const char* text) noexcept {
  sendError(call, errorName, text);
  paid();
}

void Outbox::paid() noexcept {
  {
    MutexLock lock(_mutex);
    --_owed;
    if (_closed) return;
  }
  wake();
}

void Outbox::wake() const noexcept {
  if (_wake && _thread.load() != std::this_thread::get_id()) _wake();
}

const char* Outbox::put(std::string call) {
  stamp(call.data(), ++_lastSerial, false);
  {
    MutexLock lock(_mutex);
    if (_closed) return "the connection has ended";
    if (_calls.size() >= _maximumCalls || (!_calls.empty() && _memory + call.size() > kMaximumMemory)) {
      return "too many calls wait for the client";
    }
    _memory += call.size();
    _calls.push_back(std::move(call));
  }
  wake();
  return nullptr;
}

void Outbox::moveAnswersTo(Channel& channel) {
  std::vector<std::string> answers;
  {
    MutexLock lock(_mutex);
    if (_answers.empty()) return;
    answers.swap(_answers);
  }
  for (const std::string& message : answers) {
    channel.output() += message;
    channel.queued();
  }
}

std::string Outbox::takeCall() {
  MutexLock lock(_mutex);
  if (_calls.empty()) return {};
  std::string next = std::move(_calls.front());
  _calls.pop_front();
  _memory -= next.size();
  return next;
}

bool Outbox::hasCalls() const {
  MutexLock lock(_mutex);
  return !_calls.empty();
}

std::size_t Outbox::close() {
  std::deque<std::string> calls;  // destroyed after unlocking
  std::vector<std::string> answers;
  MutexLock lock(_mutex);
  _closed = true;
  _memory = 0;
  answers.swap(_answers);
  calls.swap(_calls);
  return calls.size();
}

}  // namespace vesk

#include "platform/powerlog/PowerLog.h"

#include <system_error>
#include <utility>

#include "platform/crypto/Base64.h"
#include "platform/json/JSONWriter.h"
#include "platform/log/SystemLog.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

Value forJSON(const Value& value);

Dictionary forJSON(const Dictionary& dictionary) {
  MutableDictionary result;
  result.reserve(dictionary.size());
  for (const DictionaryEntry& entry : dictionary) result.append(entry.key, forJSON(entry.value));
  return result.share();
}

Value forJSON(const Value& value) {
  if (const double* number = value.real()) return finiteOrMinusOne(*number);
  if (const Date* date = value.date()) return finiteOrMinusOne(date->secondsSince1970);
  if (const Bytes* bytes = value.bytes()) return base64Encode(bytes->view());
  if (const Dictionary* dictionary = value.dictionary()) return forJSON(*dictionary);
  const List* list = value.list();
  if (!list) return value;
  std::vector<Value> items;
  items.reserve(list->size());
  for (const Value& item : *list) items.push_back(forJSON(item));
  return List(std::move(items));
}

}  // namespace

PowerLog::PowerLog(Options options)
    : _options(std::move(options)), _file(_options.path, _options.maximumRows) {}

PowerLog::~PowerLog() {
  std::thread thread;
  {
    MutexLock lock(_mutex);
    _stopping = true;
    _changed.notify_all();
    thread = std::move(_thread);
  }
  if (thread.joinable()) thread.join();
}

void PowerLog::KLLogRegisteredEvent(std::uint32_t identifier, std::string_view name,
                                    const Dictionary& dictionary, const std::optional<Value>&) {
  auto json = toJSON(forJSON(dictionary), JSONStyle::Compact);
  const bool isSmall = json && json->size() <= _options.maximumEvent;
  if (!isSmall || !keep({identifier, std::string(name), _options.clock->now(), std::move(*json)})) lost(1);
}

bool PowerLog::keep(PowerLogEvent event) {
  MutexLock lock(_mutex);
  const std::size_t size = sizeof event + event.name.size() + event.dictionary.size();
  if (_stopping || _waitingBytes + size > _options.maximumWaiting) return false;
  try {
    if (!_thread.joinable()) _thread = std::thread([this] { run(); });
  } catch (const std::system_error&) {
    return false;
  }
  _waiting.push_back(std::move(event));
  _waitingBytes += size;
  if (!_isWriting) _changed.notify_all();
  return true;
}

void PowerLog::flush() {
  MutexLock lock(_mutex);
  while (!_waiting.empty() || _isWriting) _changed.wait(_mutex);
}

void PowerLog::lost(std::uint64_t events) const {
  if (_options.onLost) _options.onLost(events);
}

void PowerLog::run() {
  while (true) {
    std::vector<PowerLogEvent> batch;
    {
      MutexLock lock(_mutex);
      _isWriting = false;
      _changed.notify_all();
      while (_waiting.empty() && !_stopping) _changed.wait(_mutex);
      if (_waiting.empty()) return;
      batch.swap(_waiting);
      _waitingBytes = 0;
      _isWriting = true;
    }
    write(batch);
  }
}

void PowerLog::write(const std::vector<PowerLogEvent>& events) {
  const auto appended = _file.append(events, _options.clock->now());
  if (!appended) {
    lost(events.size());
    if (!_isFailing) {
      VESK_LOG_ERROR("PowerLog: %s: %s; events are lost", _options.path.c_str(),
                     appended.error().text.c_str());
    }
  }
  _isFailing = !appended;
}

}  // namespace vesk

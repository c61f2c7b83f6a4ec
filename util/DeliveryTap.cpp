#include "util/DeliveryTap.h"

#include <algorithm>

namespace vesk {

void DeliveryTap::tell(const Dictionary& record, const std::string& body, Clock::time_point now) {
  MutexLock lock(_mutex);
  for (Reader* reader : _readers) {
    if (reader->_filter(record)) reader->add(record, body, now);
  }
}

std::shared_ptr<DeliveryTap::Reader> DeliveryTap::open(Filter filter, Wishes wishes, std::size_t most) {
  auto reader = std::make_shared<Reader>(*this, std::move(filter), wishes);
  MutexLock lock(_mutex);
  if (_readers.size() >= most) return nullptr;
  _readers.push_back(reader.get());
  update();
  return reader;
}

void DeliveryTap::close(const Reader* reader) {
  MutexLock lock(_mutex);
  std::erase(_readers, reader);
  update();
}

void DeliveryTap::update() {
  _isOpen = !_readers.empty();
  _wantsMessages =
      std::ranges::any_of(_readers, [](const Reader* reader) { return reader->_wishes.messages; });
  _wantsBodies = std::ranges::any_of(_readers, [](const Reader* reader) { return reader->_wishes.bodies; });
}

bool DeliveryTap::Reader::takesBody(std::size_t bytes, Clock::time_point now) {
  if (now - _secondBegan >= std::chrono::seconds(1)) {
    _secondBegan = now;
    _bodyBytes = 0;
  }
  if (bytes > kBodyBytesInBatch || _bodyBytes + bytes > kBodyBytesPerSecond ||
      _waitingBodyBytes + bytes > kBodyBytesPerSecond)
    return false;
  _bodyBytes += bytes;
  _waitingBodyBytes += bytes;
  return true;
}

void DeliveryTap::Reader::add(const Dictionary& record, const std::string& body, Clock::time_point now) {
  MutexLock lock(_mutex);
  if (_waiting.size() >= kMostWaiting) {
    ++_lost;
    return;
  }
  if (body.empty() || !_wishes.bodies || !takesBody(body.size(), now)) {
    _waiting.push_back({record, 0});
  } else {
    MutableDictionary whole(record, 1);
    whole.set("body", body);
    _waiting.push_back({whole.share(), body.size()});
  }
  if (_waiting.size() == 1 || _waiting.size() == kMostInBatch) _added.notify_one();
}

void DeliveryTap::Reader::waitFor(std::size_t records, Clock::time_point deadline) {
  while (_waiting.size() < records && _lost == 0) {
    if (_added.wait_until(_mutex, deadline) == std::cv_status::timeout) return;
  }
}

DeliveryTap::Batch DeliveryTap::Reader::take(Clock::duration patience) {
  Batch batch;
  MutexLock lock(_mutex);
  waitFor(1, Clock::now() + patience);
  if (!_waiting.empty())
    waitFor(kMostInBatch, Clock::now() + std::min<Clock::duration>(patience, kGathering));
  for (std::size_t bytes = 0; !_waiting.empty() && batch.records.size() < kMostInBatch;) {
    bytes += _waiting.front().bodyBytes;
    if (!batch.records.empty() && bytes > kBodyBytesInBatch) break;
    _waitingBodyBytes -= _waiting.front().bodyBytes;
    batch.records.emplace_back(std::move(_waiting.front().record));
    _waiting.pop_front();
  }
  batch.lost = std::exchange(_lost, 0);
  return batch;
}

}  // namespace vesk

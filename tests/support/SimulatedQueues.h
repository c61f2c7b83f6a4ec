// A serial queue with simulated time, which the test advances.
#pragma once

#include <poll.h>

#include <algorithm>
#include <system_error>
#include <utility>

#include "platform/queue/TimedQueue.h"

namespace vesk::test {

/// Everything runs on the test's thread, within `run` and `advance`.
class SimulatedQueue final : public TimedQueue, public std::enable_shared_from_this<SimulatedQueue> {
 public:
  Clock::time_point now() const override { return _now; }
  void submit(Work work) override { submitAfter(std::chrono::milliseconds::zero(), std::move(work)); }
  void submitAfter(std::chrono::milliseconds delay, Work work) override {
    if (std::exchange(refusesWork, false)) throw std::system_error(EAGAIN, std::generic_category());
    if (_isStopped) return;
    _entries.push_back(
        std::make_shared<Entry>(Entry{_now + delay, {}, std::make_shared<const Work>(std::move(work))}));
  }
  std::unique_ptr<Source> makeTimer(std::chrono::milliseconds first, std::chrono::milliseconds interval,
                                    Work handler) override {
    submitAfter(first, std::move(handler));
    _entries.back()->interval = interval;
    return std::make_unique<Held>(_entries.back());
  }
  std::unique_ptr<Source> makeReadSource(std::shared_ptr<const FileDescriptor> descriptor,
                                         Work handler) override {
    if (refusesReadSources) throw std::system_error(EMFILE, std::generic_category());
    auto entry = std::make_shared<Entry>();
    entry->descriptor = descriptor->get();
    entry->work = std::make_shared<const Work>(std::move(handler));
    _readers.push_back(entry);
    return std::make_unique<Held>(entry);
  }

  /// Runs what is due and handles what is readable.
  void run() { advance(std::chrono::milliseconds::zero()); }
  void advance(std::chrono::milliseconds by) {
    const auto end = _now + by;
    readAll();
    while (auto entry = takeDue(end)) {
      _now = std::max(_now, entry->at);
      if (auto work = entry->work) (*work)();
      if (entry->work && entry->interval.count() > 0) {
        entry->at += entry->interval;
        _entries.push_back(entry);
      }
      readAll();
    }
    _now = end;
  }
  /// Drops all work, like a stopping pool: the work may hold this queue.
  void stop() {
    _isStopped = true;
    for (auto* list : {&_entries, &_readers}) {
      while (!list->empty()) {
        auto entry = std::move(list->back());
        list->pop_back();
        auto work = std::exchange(entry->work, nullptr);
      }
    }
  }
  /// The number of waiting timers and delayed tasks.
  std::size_t waiting() {
    std::erase_if(_entries, [](const auto& entry) { return !entry->work; });
    return _entries.size();
  }
  std::size_t readers() const {
    return static_cast<std::size_t>(std::count_if(
        _readers.begin(), _readers.end(), [](const auto& reader) { return reader->work != nullptr; }));
  }

  bool refusesReadSources = false;
  bool refusesWork = false;  ///< once

 private:
  struct Entry {
    Clock::time_point at{};
    std::chrono::milliseconds interval{};
    std::shared_ptr<const Work> work{};
    int descriptor = -1;
  };
  struct Held final : Source {
    explicit Held(std::shared_ptr<Entry> held) : entry(std::move(held)) {}
    ~Held() override { entry->work.reset(); }
    std::shared_ptr<Entry> entry;
  };

  std::shared_ptr<Entry> takeDue(Clock::time_point end) {
    auto first = std::min_element(_entries.begin(), _entries.end(),
                                  [](const auto& a, const auto& b) { return a->at < b->at; });
    if (first == _entries.end() || (*first)->at > end) return nullptr;
    auto entry = *first;
    _entries.erase(first);
    return entry;
  }
  void readAll() {
    for (std::size_t i = 0; i < _readers.size(); ++i) {
      auto reader = _readers[i];
      pollfd watched{reader->descriptor, POLLIN, 0};
      while (auto work = reader->work) {
        if (::poll(&watched, 1, 0) != 1) break;
        (*work)();
      }
    }
  }

  Clock::time_point _now = Clock::time_point(std::chrono::hours(1));
  std::vector<std::shared_ptr<Entry>> _entries;
  std::vector<std::shared_ptr<Entry>> _readers;
  bool _isStopped = false;
};

/// Gives every backend the same queue.
class SimulatedQueues final : public TimedQueueMaker {
 public:
  ~SimulatedQueues() override { queue->stop(); }
  std::shared_ptr<TimedQueue> makeQueue(const char*) override {
    if (refusesQueues) throw std::system_error(EAGAIN, std::generic_category());
    return queue;
  }
  bool refusesQueues = false;
  std::shared_ptr<SimulatedQueue> queue = std::make_shared<SimulatedQueue>();
};

}  // namespace vesk::test

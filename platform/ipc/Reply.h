// The pending answer to a call.
#pragma once

#include <functional>
#include <utility>

namespace vesk {

/// A reply closure. Called at most once, on any thread, by one owner at a time. If it is destroyed without
/// having been called, the caller gets an error reply, so that it doesn't wait for ever. Empty if the caller
/// wants no answer; calling an empty one has no effect.
template <class... Arguments>
class Reply {
 public:
  Reply() = default;
  /// `send` sends the answer. If it throws because memory is exhausted, `abandon` tells the caller that there
  /// will be no answer; it must not throw.
  Reply(std::function<void(const Arguments&...)> send, std::function<void()> abandon)
      : _send(std::move(send)), _abandon(std::move(abandon)) {}
  Reply(Reply&& other) noexcept
      : _send(std::exchange(other._send, nullptr)), _abandon(std::exchange(other._abandon, nullptr)) {}
  Reply& operator=(Reply&& other) noexcept {
    if (this != &other) {
      abandon();
      _send = std::exchange(other._send, nullptr);
      _abandon = std::exchange(other._abandon, nullptr);
    }
    return *this;
  }
  ~Reply() { abandon(); }

  explicit operator bool() const noexcept { return static_cast<bool>(_send); }

  void operator()(const Arguments&... arguments) {
    auto send = std::exchange(_send, nullptr);
    if (!send) return;
    send(arguments...);
    _abandon = nullptr;
  }

 private:
  void abandon() noexcept {
    _send = nullptr;
    if (auto tell = std::exchange(_abandon, nullptr)) tell();
  }

  std::function<void(const Arguments&...)> _send;
  std::function<void()> _abandon;
};

}  // namespace vesk

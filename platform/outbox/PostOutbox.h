// Keeps posts that could not be delivered, over outages and restarts, and sends them later.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <optional>
#include <random>
#include <set>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/http/HTTPClient.h"
#include "platform/http/PostKeeper.h"
#include "platform/net/NetworkMonitor.h"
#include "platform/outbox/HostBackoff.h"
#include "platform/outbox/OutboxStorage.h"
#include "platform/result/Result.h"
#include "platform/sync/Mutex.h"
#include "platform/sync/Wakeup.h"
#include "platform/time/Clock.h"

namespace vesk {

/// The HTTP client's keeper. Its own thread writes the posts to a file, which is created with the first one,
/// and sends them through the client: oldest first, over at most two connections a host. While the file can't
/// be used, posts are kept in memory.
///
/// The client is made with the outbox, then given to it with `start`. At the end: `stopSending`, the client's
/// `stop`, `stop`. Thread-safe.
class PostOutbox final : public PostKeeper {
 public:
  /// What became of a post after it was put aside.
  enum class Outcome : std::uint8_t {
    Delivered,         ///< the server accepted it
    Refused,           ///< the server answered with another status than 2xx
    Expired,           ///< it waited for longer than `maximumAge`
    OverQuota,         ///< it gave way to others
    ConsentWithdrawn,  ///< the user withdrew consent
    Damaged,           ///< its record could not be read
    NotWritten,        ///< it could not be written before the process ended
    Exported,          ///< an operator took it away
  };
  struct Fate {
    Outcome outcome;
    std::string_view source;  ///< the backend that made the post
    std::uint64_t events;
    long status = 0;  ///< the server's, if it was refused
  };

  struct Options {
    std::string path;
    std::uint64_t maximumBytes = std::uint64_t{64} << 20;
    std::uint64_t maximumBytesInMemory = std::uint64_t{8} << 20;  ///< while the file can't be used
    std::chrono::seconds maximumAge = std::chrono::days(7);
    /// Called on any thread. Must neither block nor throw.
    std::function<void(const Fate&)> onFate = [](const Fate&) {};
    /// Called on one thread at a time, with true when the first post waits and with false when none is left.
    std::function<void(bool)> onWaiting = [](bool) {};
    const WallClock* clock = &WallClock::system();
    /// How long changes are gathered before they are written together.
    std::chrono::milliseconds writeWithin{250};
  };

  /// Opens the file if there is one.
  explicit PostOutbox(Options options);
  /// Stops.
  ~PostOutbox() override;

  /// Starts the thread. `client` must live until `stopSending` has returned.
  void start(HTTPClient& client);
  /// Hands no further posts to the client. May be called more than once.
  void stopSending();
  /// Writes what was kept, closes the file and ends the thread. From now on nothing is kept. May be called
  /// more than once.
  void stop();

  /// While there is no consent, posts that respect it are not kept, and those that wait are deleted. Doesn't
  /// wait for the deletion.
  void setConsent(bool consent);

  /// What waits, for operators.
  struct Status {
    struct Host {
      std::uint64_t posts = 0;
      std::chrono::steady_clock::time_point next{};   ///< the next attempt; in the past if posts go out
      std::chrono::steady_clock::time_point since{};  ///< when the first of them was put aside, or the start
    };
    std::map<std::string, Host> hosts;
    std::uint64_t posts = 0;
    std::uint64_t bytes = 0;
    std::uint64_t maximumBytes = 0;
    bool isHeld = false;
  };
  Status status();

  // For operators. These wait for the outbox's thread, so they may wait for the disk.

  /// While it is held, nothing that waits is sent; new posts are still tried once. A file beside the outbox's
  /// keeps that over restarts.
  Result<void> setHeld(bool held);
  /// Deletes the posts that respect consent, and keeps no more of them until `setConsent(true)`.
  void withdrawConsent();
  /// Some of the posts for `host` after `id`, oldest first. None of them is being sent; hold the outbox so
  /// that it stays so.
  std::vector<WaitingPost> waiting(std::string_view host, std::int64_t id);
  /// Removes those of them up to `last`.
  void removeExported(std::string_view host, std::int64_t last);

  bool keep(HTTPRequest post, std::chrono::seconds delay) override;
  Ticket keepCopy(const HTTPRequest& post) override;
  void sendLater(Ticket ticket, std::chrono::seconds delay) override;
  void discard(Ticket ticket) override;
  Ticket writtenUpTo() const override { return _writtenUpTo; }
  void waitUntilWritten(Ticket ticket) override;
  void hostAnswered(std::string_view host) override;

 private:
  using Instant = HostBackoff::Instant;
  using Losses = OutboxStore::Losses;

  /// The result of a post that was sent from the outbox.
  struct Answer {
    std::int64_t id;
    std::string host;
    OutboxStore::Lost post;
    HTTPResult result;
  };
  struct Host {
    HostBackoff backoff;
    std::deque<WaitingPost> ready;  ///< read from the storage
    std::size_t sending = 0;
    std::int64_t lastRead = 0;  ///< posts up to this ID were read
    Instant readAgain{};        ///< when no more were found
    Instant since = std::chrono::steady_clock::now();
  };
  /// What other threads want from the outbox's thread.
  struct Inbox {
    OutboxStorage::Changes changes;
    std::vector<Answer> answers;
    std::set<std::string, std::less<>> hosts;  ///< those that answered
    bool consentWithdrawn = false;
    std::vector<std::function<void()>> tasks;
  };

  // Called on any thread.
  Ticket put(HTTPRequest post, std::chrono::seconds delay, bool isBeingSent);
  WallTime after(std::chrono::seconds delay) const { return _options.clock->now() + delay; }
  /// Runs the task on the outbox's thread and waits for it to finish. Does nothing if the thread was never
  /// started, since no post is kept then.
  void runOnThread(const std::function<void()>& task);

  /// Removes the posts that respect consent from `posts`.
  static Losses removeRespectingConsent(std::vector<WaitingPost>& posts);

  // Called on the outbox's thread only (PostOutboxThread.cpp).
  void run();
  void waitForWork(NetworkMonitor& network);
  std::optional<Instant> nextEvent() const;
  void tellWritten(Ticket upTo);
  void take(Inbox inbox);
  void take(const Answer& answer);
  void write();
  void expire();
  void deletePostsThatRespectConsent();
  std::vector<WaitingPost> readWaiting(std::string_view host, std::int64_t id);
  bool hasPostsToSend();
  void sendReady();
  void sendReady(const std::string& name, Host& host);
  void readMore(const std::string& name, Host& host);
  void send(const std::string& name, Host& host);
  void readAgainFromTheOldest(Host& host);
  void report(Outcome outcome, const Losses& lost) const;
  void report(const OutboxStorage::Lost& lost) const;
  double random() { return std::uniform_real_distribution<double>()(_random); }

  void publish();

  // Constant after construction.
  const Options _options;
  const Wakeup _wakeup;

  Mutex _clientMutex;  // taken before _mutex
  HTTPClient* _client VESK_GUARDED_BY(_clientMutex) = nullptr;

  Mutex _mutex;
  Inbox _inbox VESK_GUARDED_BY(_mutex);
  std::set<std::int64_t> _beingSent
      VESK_GUARDED_BY(_mutex);  ///< copies of posts that the client sends, until removed
  std::int64_t _lastID VESK_GUARDED_BY(_mutex) = 0;
  bool _isClosedToConsent VESK_GUARDED_BY(_mutex) = false;
  bool _isStopped VESK_GUARDED_BY(_mutex) = false;
  Status _status VESK_GUARDED_BY(_mutex);
  std::thread _thread VESK_GUARDED_BY(_mutex);  ///< started when the first post is kept

  std::atomic<bool> _isWaiting{false};  ///< a post is kept
  std::atomic<bool> _isHeld;
  std::atomic<Ticket> _writtenUpTo{0};
  std::condition_variable_any _written;  ///< `_writtenUpTo` grew; used with _mutex

  // Used by the outbox's thread only, and before it is started.
  OutboxStorage _storage;
  OutboxStorage::Changes _changes;  ///< to be written
  std::optional<Instant> _writeBy;  ///< if there are changes
  std::set<std::int64_t> _taken;    ///< read from the storage, not removed from it yet
  std::map<std::string, Host, std::less<>> _hosts;
  bool _mustSend = true;  ///< not all that is kept are copies of posts that the client sends
  Instant _nextExpiry{};
  std::minstd_rand _random;
};

}  // namespace vesk

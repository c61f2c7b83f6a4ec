// What the HTTP client needs from a store of posts that can't be delivered now.
#pragma once

#include <chrono>
#include <cstdint>
#include <string_view>

namespace vesk {

struct HTTPRequest;

/// Takes posts over from the client and sends them later. The client calls it on any of its threads; no
/// operation except `waitUntilWritten` blocks on a disk or a server. Must outlive the client.
class PostKeeper {
 public:
  /// A post that is kept while its attempt still runs. They grow. 0: it is not kept.
  using Ticket = std::uint64_t;

  virtual ~PostKeeper() = default;

  /// Takes the post over, to send it `delay` from now at the earliest. Returns false if it is not kept.
  [[nodiscard]] virtual bool keep(HTTPRequest post, std::chrono::seconds delay) = 0;

  /// Keeps a copy of a post that is going to be sent, or whose attempt goes on. The keeper doesn't send it in
  /// this process until `sendLater`. Each ticket is ended by one call of `sendLater` or `discard`.
  [[nodiscard]] virtual Ticket keepCopy(const HTTPRequest& post) = 0;
  /// The attempt failed: the keeper sends the post, `delay` from now at the earliest.
  virtual void sendLater(Ticket ticket, std::chrono::seconds delay) = 0;
  /// The attempt was answered: the post is done.
  virtual void discard(Ticket ticket) = 0;

  /// Copies up to this ticket are on disk, or can't be written.
  virtual Ticket writtenUpTo() const = 0;
  /// Waits until `ticket` is.
  virtual void waitUntilWritten(Ticket ticket) = 0;

  /// `host` (scheme, host and port, as in the URL) answered a request, and is not busy.
  virtual void hostAnswered(std::string_view host) = 0;
};

}  // namespace vesk

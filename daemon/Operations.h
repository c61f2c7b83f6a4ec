// What operators may do to the running daemon.
#pragma once

#include <functional>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "daemon/ReportingdAgent.h"
#include "platform/outbox/PostOutbox.h"

namespace vesk {

/// Thread-safe; the operations wait for the disk or for sessions to end. Their answers are documented in
/// docs/wire.md; `problem` tells why something was not done.
class Operations {
 public:
  /// Everything in it outlives this.
  struct Sources {
    ReportingdAgent& agent;
    const BackendServices& services;
    PostOutbox* outbox;            ///< null: there is none
    std::function<void()> reload;  ///< asks the process to end, so that it is started anew
  };
  explicit Operations(Sources sources) : _sources(std::move(sources)) {}

  Dictionary reload();

  /// `held` (boolean): whether what waits is kept back.
  Dictionary holdOutbox(const Dictionary& request);
  /// Some of the posts for `host` after the number `after`, as `posts`; none if there are no more.
  Dictionary readOutbox(const Dictionary& request);
  /// Removes the posts for `host` up to the number `last`, which `readOutbox` gave.
  Dictionary removeFromOutbox(const Dictionary& request);

  /// Acts on the consent in the preferences at once. Without it, posts that respect it are deleted, those
  /// that sessions still flush are dropped, and the device's identifiers are made anew. In either case the
  /// sessions end; clients start theirs again. Answers with `consent`, `deleted` (events) and `sessions`.
  Dictionary applyConsent();

 private:
  std::size_t endSessions();

  const Sources _sources;
};

}  // namespace vesk

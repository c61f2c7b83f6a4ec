// Takes posts of events.
#pragma once

#include <filesystem>

#include "platform/time/Clock.h"
#include "tools/collector/EventPost.h"
#include "tools/collector/FaultyEndpoint.h"

namespace vesk {

/// Appends every event of a good post to a file of JSON lines (opened for every post, so that it may be moved
/// away), shows it on the console and answers 200. Where the file can't be written, the connection is closed
/// without an answer and the post has not been taken. What is no post is refused with 400 or 405. A post that
/// meets a fault which comes instead of the answer is neither shown nor saved.
class EventsEndpoint : public FaultyEndpoint {
 public:
  EventsEndpoint(const CollectorServices& services, std::filesystem::path file,
                 const WallClock& clock = WallClock::system());

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  /// False when the events could not be saved.
  bool record(const EventPost& post, const HTTPReceived& received);

  const std::filesystem::path _file;
  const WallClock& _clock;
};

}  // namespace vesk

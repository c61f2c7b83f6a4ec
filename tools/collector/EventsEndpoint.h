// Receives posts of events.
#pragma once

#include <filesystem>

#include "platform/time/Clock.h"
#include "tools/collector/EventPost.h"
#include "tools/collector/FaultyEndpoint.h"

namespace vesk {

/// Appends every event of a valid post to a file of JSON lines, shows it on the console and answers 200.
/// Opens the file for each post, so that it may be moved away. If the file can't be written, closes the
/// connection without an answer and does not accept the post. Refuses invalid posts with 400 or 405. A post
/// hit by a fault that replaces the answer is neither shown nor saved.
class EventsEndpoint : public FaultyEndpoint {
 public:
  EventsEndpoint(const CollectorServices& services, std::filesystem::path file,
                 const WallClock& clock = WallClock::system());

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  /// Returns false if the events could not be saved.
  bool record(const EventPost& post, const HTTPReceived& received);

  const std::filesystem::path _file;
  const WallClock& _clock;
};

}  // namespace vesk

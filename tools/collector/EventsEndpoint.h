// Takes posts of events.
#pragma once

#include <filesystem>

#include "platform/time/Clock.h"
#include "tools/collector/EventPost.h"
#include "tools/collector/FaultyEndpoint.h"

namespace vesk {

/// Shows every event of a good post on the console and appends it to a file of JSON lines (opened for every
/// post, so that it may be moved away). What is no post is refused with 400 or 405. A post that meets a fault
/// which comes instead of the answer has not been taken: it is neither shown nor saved.
class EventsEndpoint : public FaultyEndpoint {
 public:
  EventsEndpoint(const CollectorServices& services, std::filesystem::path file,
                 const WallClock& clock = WallClock::system());

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  void record(const EventPost& post, const HTTPReceived& received);
  void save(const std::string& lines, std::size_t events);

  const std::filesystem::path _file;
  const WallClock& _clock;
};

}  // namespace vesk

// Takes posts of events.
#pragma once

#include <filesystem>

#include "platform/time/Clock.h"
#include "tools/collector/Endpoint.h"
#include "tools/collector/EventPost.h"

namespace vesk {

/// Shows every event of a good post on the console and appends it to a file of JSON lines (opened for every
/// post, so that it may be moved away). What is no post is refused with 400 or 405. A post that meets a fault
/// which comes instead of the answer has not been taken: it is neither shown nor saved.
class EventsEndpoint : public Endpoint {
 public:
  struct Parts {
    Console& console;
    CollectorStats& stats;
    FaultPlan& faults;
    const WallClock& clock = WallClock::system();
  };
  EventsEndpoint(Parts parts, std::filesystem::path file);

  HTTPAnswer answer(const HTTPReceived& received) override;

 private:
  HTTPAnswer take(const HTTPReceived& received);
  void record(const EventPost& post, const HTTPReceived& received);
  void save(const std::string& lines, std::size_t events);

  const Parts _parts;
  const Refusals _refuse;
  const FaultyAnswers _faulty;
  const std::filesystem::path _file;
};

}  // namespace vesk

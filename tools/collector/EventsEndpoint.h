// Receives posts of events.
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/sync/Mutex.h"
#include "tools/collector/Endpoint.h"
#include "tools/collector/RecentRecords.h"

namespace vesk {

struct EventPost;

/// Appends every event of a valid post to a file of JSON lines (with "received" in seconds since 1970,
/// "peer", "path", "headers", "postTime", "clientId" and "event"), shows it on the console and answers 200.
/// Opens the file for each post, so that it may be moved away. If the file can't be written, closes the
/// connection without an answer and does not accept the post. Refuses invalid posts with 400 or 405. A post
/// hit by a fault that replaces the answer is neither shown nor saved. An event that was taken before, as a
/// post that is sent again holds it, is counted and left out (docs/wire-https.md).
class EventsEndpoint : public Endpoint {
 public:
  EventsEndpoint(const CollectorServices& services, std::filesystem::path file)
      : Endpoint(services, "post"), _file(std::move(file)) {}

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;
  /// Removes the events that were taken before. Returns the keys of those that are taken now.
  std::vector<std::uint64_t> takeNewEvents(EventPost& post, const std::string& url) VESK_REQUIRES(_mutex);
  /// Returns false if the events could not be saved.
  bool record(const EventPost& post, const HTTPReceived& received);

  const std::filesystem::path _file;
  Mutex _mutex;
  RecentRecords<bool> _taken VESK_GUARDED_BY(_mutex){100'000};  // by an event's key
};

}  // namespace vesk

#include "tools/collector/EventsEndpoint.h"

#include <cstring>

#include "tools/collector/EventText.h"
#include "tools/collector/LinesFile.h"

namespace vesk {

EventsEndpoint::EventsEndpoint(const CollectorServices& services, std::filesystem::path file,
                               const WallClock& clock)
    : FaultyEndpoint(services, FaultTarget::Post), _file(std::move(file)), _clock(clock) {}

HTTPAnswer EventsEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  if (received.method != "POST") return _refuse.wrongMethod(received, "POST");
  EventPostOutcome outcome = readEventPost(received);
  if (!outcome.post) return _refuse(received, 400, outcome.problem);
  record(*outcome.post, received);
  HTTPAnswer answer;
  answer.headers = {{"Content-Type", "application/json"}};
  answer.body = "{\"accepted\":" + std::to_string(outcome.post->events.size()) + "}\n";
  return answer;
}

void EventsEndpoint::record(const EventPost& post, const HTTPReceived& received) {
  WallTime now = _clock.now();
  std::string lines = jsonLines(post, received, now);
  save(lines, post.events.size());
  if (_console.style() == Console::Style::JSON) {
    lines.pop_back();
    _console.event(lines);
  } else {
    _console.event(readableText(post, received, now));
  }
  ++_stats.posts;
  _stats.events += post.events.size();
}

void EventsEndpoint::save(const std::string& lines, std::size_t events) {
  const int error = appendLines(_file, lines);
  if (error == 0) return;
  _stats.eventsNotSaved += events;
  _console.problem("can't save " + std::to_string(events) + " events to " + _file.string() + ": " +
                   std::strerror(error));
}

}  // namespace vesk

#include "tools/collector/EventsEndpoint.h"

#include <cstring>

#include "tools/collector/EventText.h"
#include "tools/collector/LinesFile.h"

namespace vesk {

EventsEndpoint::EventsEndpoint(Parts parts, std::filesystem::path file)
    : _parts(parts),
      _refuse(parts.console, parts.stats),
      _faulty(parts.console, parts.stats, parts.faults, FaultTarget::Post),
      _file(std::move(file)) {}

HTTPAnswer EventsEndpoint::answer(const HTTPReceived& received) {
  return _faulty(received, [&](const CollectorFault*) { return take(received); });
}

HTTPAnswer EventsEndpoint::take(const HTTPReceived& received) {
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
  WallTime now = _parts.clock.now();
  std::string lines = jsonLines(post, received, now);
  save(lines, post.events.size());
  if (_parts.console.style() == Console::Style::JSON) {
    lines.pop_back();
    _parts.console.event(lines);
  } else {
    _parts.console.event(readableText(post, received, now));
  }
  ++_parts.stats.posts;
  _parts.stats.events += post.events.size();
}

void EventsEndpoint::save(const std::string& lines, std::size_t events) {
  const int error = appendLines(_file, lines);
  if (error == 0) return;
  _parts.stats.eventsNotSaved += events;
  _parts.console.problem("can't save " + std::to_string(events) + " events to " + _file.string() + ": " +
                         std::strerror(error));
}

}  // namespace vesk

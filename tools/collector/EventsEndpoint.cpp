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
  HTTPAnswer answer;
  if (!record(*outcome.post, received)) {
    // The sender keeps an unanswered post and sends it again. After a 4xx it would drop the post, and after a
    // 5xx it would stop posting.
    answer.fault = HTTPAnswer::Fault::CloseWithoutAnswer;
    return answer;
  }
  answer.headers = {{"Content-Type", "application/json"}};
  answer.body = "{\"accepted\":" + std::to_string(outcome.post->events.size()) + "}\n";
  return answer;
}

bool EventsEndpoint::record(const EventPost& post, const HTTPReceived& received) {
  WallTime now = _clock.now();
  std::string lines = jsonLines(post, received, now);
  if (const int error = appendLines(_file, lines)) {
    _stats.eventsNotSaved += post.events.size();
    _console.problem("can't save " + std::to_string(post.events.size()) + " events to " + _file.string() +
                     ", closing the connection without an answer: " + std::strerror(error));
    return false;
  }
  if (_console.style() == Console::Style::JSON) {
    lines.pop_back();
    _console.event(lines);
  } else {
    _console.event(readableText(post, received, now));
  }
  ++_stats.posts;
  _stats.events += post.events.size();
  return true;
}

}  // namespace vesk

#include "tools/collector/ControlEndpoint.h"

#include <sstream>

#include "platform/json/JSONWriter.h"

namespace vesk {

namespace {

HTTPAnswer jsonAnswer(const Value& value) {
  HTTPAnswer answer;
  answer.headers = {{"Content-Type", "application/json"}};
  answer.body = toJSON(value, JSONStyle::Compact).value_or("null") + "\n";
  return answer;
}

}  // namespace

HTTPAnswer ControlEndpoint::answer(const HTTPReceived& received) {
  if (received.path().ends_with("/fault")) return answerFault(received);
  if (!received.path().ends_with("/stats"))
    return _refuse(received, 404, "there is only fault and stats here");
  return received.method == "GET" ? counters() : _refuse.wrongMethod(received, "GET");
}

HTTPAnswer ControlEndpoint::answerFault(const HTTPReceived& received) {
  if (received.method == "GET") return plannedFaults();
  if (received.method == "DELETE") {
    _faults.clear();
    return plannedFaults();
  }
  if (received.method != "POST") return _refuse.wrongMethod(received, "GET, POST, DELETE");
  std::istringstream lines(received.body);
  for (std::string line; std::getline(lines, line);) {
    if (line.ends_with('\r')) line.pop_back();
    if (line.empty()) continue;
    if (auto problem = _faults.add(line)) return _refuse(received, 400, *problem);
  }
  return plannedFaults();
}

HTTPAnswer ControlEndpoint::plannedFaults() const {
  std::vector<Value> lines;
  for (const auto& line : _faults.describe()) lines.emplace_back(line);
  return jsonAnswer(List(std::move(lines)));
}

HTTPAnswer ControlEndpoint::counters() const {
  return jsonAnswer(Dictionary{{"posts", _stats.posts.load()},
                               {"events", _stats.events.load()},
                               {"eventsNotSaved", _stats.eventsNotSaved.load()},
                               {"storebagsSent", _stats.storebagsSent.load()},
                               {"storebagsUnchanged", _stats.storebagsUnchanged.load()},
                               {"datagrams", _stats.datagrams.load()},
                               {"datagramsAgain", _stats.datagramsAgain.load()},
                               {"datagramsMalformed", _stats.datagramsMalformed.load()},
                               {"datagramsLost", _stats.datagramsLost.load()},
                               {"acknowledgements", _stats.acknowledgements.load()},
                               {"acknowledgementsLost", _stats.acknowledgementsLost.load()},
                               {"logData", _stats.logData.load()},
                               {"uploads", _stats.uploads.load()},
                               {"refused", _stats.refused.load()},
                               {"notHTTP", _stats.notHTTP.load()},
                               {"faults", _stats.faults.load()}});
}

}  // namespace vesk

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
  MutableDictionary counters;
  for (const auto* counter : _stats.all) counters.append(counter->name, counter->load());
  return jsonAnswer(counters.share());
}

}  // namespace vesk

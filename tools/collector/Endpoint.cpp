#include "tools/collector/Endpoint.h"

#include <sstream>

#include "platform/json/JSONWriter.h"

namespace vesk {

namespace {

bool isAtOrBelow(std::string_view path, std::string_view root) {
  return path.starts_with(root) && (path.size() == root.size() || path[root.size()] == '/');
}

HTTPAnswer jsonAnswer(const Value& value) {
  return HTTPAnswer::of("application/json", toJSON(value, JSONStyle::Compact).value_or("null") + "\n");
}

}  // namespace

HTTPAnswer Endpoint::answer(const HTTPReceived& received) {
  const auto fault = _faults.take(_target);
  if (!fault) return serveOrRefuse(received, nullptr);
  HTTPAnswer answer;
  if (fault->isOnlyInTheAnswer) {
    answer = serveOrRefuse(received, &*fault);
    // The request was not accepted, so no fault may turn this into a good answer.
    if (answer.fault != HTTPAnswer::Fault::None) return answer;
  }
  ++_stats.faults;
  _console.note("fault on demand for " + describeRequest(received));
  fault->applyTo(answer);
  return answer;
}

HTTPAnswer Endpoint::serveOrRefuse(const HTTPReceived& received, const CollectorFault* fault) {
  try {
    return serve(received, fault);
  } catch (const Refusal& refusal) {
    return refuse(received, refusal);
  } catch (const std::exception& error) {
    return refuse(received, {500, error.what()});
  }
}

HTTPAnswer Endpoint::refuse(const HTTPReceived& received, const Refusal& refusal) {
  ++_stats.refused;
  _console.problem("refused " + describeRequest(received) + " (" + std::to_string(refusal.status) +
                   "): " + refusal.reason);
  HTTPAnswer answer = HTTPAnswer::text(refusal.status, refusal.reason);
  if (!refusal.allowedMethods.empty()) answer.headers.emplace_back("Allow", refusal.allowedMethods);
  return answer;
}

void requireMethod(const HTTPReceived& received, std::string_view method) {
  if (received.method != method)
    throw Refusal{405, "the method must be " + std::string(method), std::string(method)};
}

std::string describeRequest(const HTTPReceived& received) {
  return received.method + " " + received.target.substr(0, 200) + " from " + received.peer;
}

HTTPAnswer EndpointTable::serve(const HTTPReceived& received, const CollectorFault*) {
  for (const auto& [path, endpoint] : _endpoints)
    if (isAtOrBelow(received.path(), path)) return endpoint->answer(received);
  throw Refusal{404, "nothing is offered under this path"};
}

HTTPAnswer ControlEndpoint::serve(const HTTPReceived& received, const CollectorFault*) {
  if (received.path().ends_with("/fault")) {
    changeFaults(received);
    const auto planned = _faults.describe();
    return jsonAnswer(List(std::vector<Value>(planned.begin(), planned.end())));
  }
  if (!received.path().ends_with("/stats")) throw Refusal{404, "there is only fault and stats here"};
  requireMethod(received, "GET");
  return jsonAnswer(_stats.counters());
}

void ControlEndpoint::changeFaults(const HTTPReceived& received) {
  if (received.method == "GET") return;
  if (received.method == "DELETE") return _faults.clear();
  if (received.method != "POST") requireMethod(received, "GET, POST, DELETE");
  std::istringstream lines(received.body);
  for (std::string line; std::getline(lines, line);) {
    if (line.ends_with('\r')) line.pop_back();
    if (line.empty()) continue;
    if (auto problem = _faults.add(line)) throw Refusal{400, *problem};
  }
}

}  // namespace vesk

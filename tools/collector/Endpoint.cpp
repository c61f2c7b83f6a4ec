#include "tools/collector/Endpoint.h"

namespace vesk {

namespace {

bool isAtOrBelow(std::string_view path, std::string_view root) {
  return path.starts_with(root) && (path.size() == root.size() || path[root.size()] == '/');
}

}  // namespace

HTTPAnswer Refusals::operator()(const HTTPReceived& received, unsigned status,
                                std::string_view reason) const {
  ++_stats.refused;
  _console.problem("refused " + received.method + " " + received.target.substr(0, 200) + " from " +
                   received.peer + " (" + std::to_string(status) + "): " + std::string(reason));
  return HTTPAnswer::text(status, reason);
}

HTTPAnswer Refusals::wrongMethod(const HTTPReceived& received, std::string_view allowed) const {
  HTTPAnswer answer = (*this)(received, 405, "the method must be " + std::string(allowed));
  answer.headers.emplace_back("Allow", allowed);
  return answer;
}

HTTPAnswer EndpointTable::answer(const HTTPReceived& received) const {
  const std::pair<std::string, Endpoint*>* best = nullptr;
  for (const auto& entry : _endpoints) {
    if (!isAtOrBelow(received.path(), entry.first)) continue;
    if (best == nullptr || entry.first.size() > best->first.size()) best = &entry;
  }
  if (best != nullptr) return best->second->answer(received);
  return _refusals(received, 404, "nothing is offered under this path");
}

}  // namespace vesk

// The receiver for the end-to-end bench: counts the events with each message ID.
//
// Usage: event_sink FIRST-FILE [tls]
// Writes its URL (and, with tls, the authority's certificate beside it) to FIRST-FILE. Serves until standard
// input ends. Prints "events E distinct D last L" for each line of input, where L is the number of distinct
// events of the client with the highest number so far. A line "away" closes the port first, and "back" opens
// it again.
#include <cstdio>
#include <cstring>
#include <fstream>
#include <iostream>
#include <memory>
#include <mutex>
#include <unordered_set>

#include "tools/collector/CertificateAuthority.h"
#include "tools/collector/HTTPServer.h"

namespace {

class IdCounter {
 public:
  // Each event contains "msgid":N once. The rest of the body is ignored, to leave the cores to the others.
  void count(const std::string& body) {
    static constexpr char kKey[] = "\"msgid\":";
    std::lock_guard lock(_mutex);
    for (const char* at = body.c_str(); (at = std::strstr(at, kKey)) != nullptr;) {
      at += sizeof kKey - 1;
      if (*at == '"') ++at;
      ++_events;
      const long id = std::strtol(at, nullptr, 10);
      if (!_distinct.insert(id).second || id / kIdsPerClient < _last) continue;
      if (id / kIdsPerClient > _last) _ofLast = 0;
      _last = id / kIdsPerClient;
      ++_ofLast;
    }
  }
  void print() {
    std::lock_guard lock(_mutex);
    std::printf("events %zu distinct %zu last %zu\n", _events, _distinct.size(), _ofLast);
  }

 private:
  std::mutex _mutex;
  static constexpr long kIdsPerClient = 10'000'000;
  std::size_t _events = 0;
  long _last = 0;
  std::size_t _ofLast = 0;
  std::unordered_set<long> _distinct;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  const std::string file = argv[1];
  vesk::HTTPServer::Options options;
  if (argc > 2) {
    auto authority = vesk::CertificateAuthority::generate();
    options.tls = authority.issueServerIdentity();
    std::ofstream(file + ".ca") << authority.certificate();
  }
  IdCounter ids;
  std::unique_ptr<vesk::HTTPServer> server;
  const auto open = [&] {
    server = std::make_unique<vesk::HTTPServer>(options, [&](const vesk::HTTPReceived& request) {
      if (auto decoded = request.decodedBody(); decoded.body) ids.count(*decoded.body);
      return vesk::HTTPAnswer::text(200, "ok");
    });
    options.port = server->port();
  };
  open();
  std::ofstream(file + ".new") << server->baseURL() << "\n";
  std::rename((file + ".new").c_str(), file.c_str());
  for (std::string line; std::getline(std::cin, line);) {
    if (line == "away") server.reset();
    if (line == "back") open();
    ids.print();
    std::fflush(stdout);
  }
  return 0;
}

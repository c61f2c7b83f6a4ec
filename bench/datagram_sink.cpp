// The receiver for the dashboard bench: counts datagrams, and acknowledges those that ask for it.
//
// Usage: datagram_sink FIRST-FILE
// Writes its port to FIRST-FILE and prints "datagrams N" for each line of standard input, until its end.
#include <poll.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <string>

#include "backends/dashboard/DashboardDatagram.h"
#include "platform/net/UDPSocket.h"

int main(int argc, char** argv) {
  if (argc < 2) return 2;
  const std::string file = argv[1];
  vesk::UDPSocket socket;
  if (!socket.open() || !socket.bind({0x7F00'0001, 0})) return 1;
  std::ofstream(file + ".new") << socket.localEndpoint()->port << "\n";
  std::rename((file + ".new").c_str(), file.c_str());
  unsigned long count = 0;
  while (true) {
    pollfd watched[] = {{socket.descriptor(), POLLIN, 0}, {STDIN_FILENO, POLLIN, 0}};
    ::poll(watched, 2, -1);
    char buffer[2048];
    vesk::IPv4Endpoint peer;
    while (auto size = socket.receive(buffer, &peer)) {
      ++count;
      const auto header = vesk::decodeDashboardHeader({buffer, *size});
      if (header && header->isReliable) (void)socket.sendTo(peer, {buffer, vesk::kDashboardHeaderSize});
    }
    if (watched[1].revents == 0) continue;
    char line[64];
    if (::read(STDIN_FILENO, line, sizeof line) <= 0) return 0;
    std::printf("datagrams %lu\n", count);
    std::fflush(stdout);
  }
}

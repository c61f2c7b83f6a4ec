#include <poll.h>
#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>

#include "protocol/WireNames.h"
#include "tools/veskreport/CommandLine.h"
#include "tools/veskreport/DiagnosticsClient.h"
#include "tools/veskreport/Terminal.h"

namespace vesk {

namespace {

constexpr std::chrono::milliseconds kInterval{1000};

/// Takes over the terminal: keys come one by one and unseen, and the page is drawn on a screen of its own.
class Page {
 public:
  Page() {
    ::tcgetattr(STDIN_FILENO, &_before);
    termios raw = _before;
    raw.c_lflag &= ~static_cast<tcflag_t>(ICANON | ECHO);
    ::tcsetattr(STDIN_FILENO, TCSANOW, &raw);
    std::fputs("\x1b[?1049h\x1b[?25l", stdout);
  }
  ~Page() {
    std::fputs("\x1b[?25h\x1b[?1049l", stdout);
    std::fflush(stdout);
    ::tcsetattr(STDIN_FILENO, TCSANOW, &_before);
  }
  Page(const Page&) = delete;
  Page& operator=(const Page&) = delete;

  void draw(const std::vector<std::string>& lines) {
    winsize size{};
    ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size);
    const std::size_t rows = size.ws_row > 0 ? size.ws_row : 24, width = columns();
    std::string text = "\x1b[H";
    for (std::size_t i = 0; i < lines.size() && i + 1 < rows; ++i)
      text += lines[i].substr(0, width) + "\x1b[K\n";
    std::fputs((text + "\x1b[J").c_str(), stdout);
    std::fflush(stdout);
  }

  /// Returns false once a key asks for the end.
  bool wait() {
    pollfd input{STDIN_FILENO, POLLIN, 0};
    if (::poll(&input, 1, static_cast<int>(kInterval.count())) <= 0) return true;
    char key = 'q';
    return ::read(STDIN_FILENO, &key, 1) == 1 && key != 'q' && key != 'Q';
  }

 private:
  termios _before{};
};

std::vector<std::string> pageOf(const Dictionary& status) {
  std::vector<std::string> lines = statusLines(status);
  lines.insert(lines.begin() + 1, "");
  lines.emplace_back("");
  lines.emplace_back("q quits");
  return lines;
}

}  // namespace

int runTop(const Invocation& invocation, const Output& output) {
  if (::isatty(STDIN_FILENO) == 0 || ::isatty(STDOUT_FILENO) == 0)
    return output.failed("top needs a terminal; status prints the same once");
  DiagnosticsClient daemon(invocation, output);
  std::vector<std::string> lines = pageOf(daemon.ask(wire::kGetStatus));
  Page page;
  for (;;) {
    page.draw(lines);
    if (!page.wait()) return kExitDone;
    const auto status = daemon.call(wire::kGetStatus);
    lines = status ? pageOf(*status) : std::vector<std::string>{"the daemon has ended", "", "q quits"};
  }
}

}  // namespace vesk

#include "platform/log/SystemLog.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "platform/log/LogRateLimit.h"
#include "platform/log/LogUser.h"
#include "platform/log/StandardError.h"
#include "platform/sync/Mutex.h"
#include "platform/text/ASCII.h"
#include "platform/time/CivilTime.h"

namespace vesk {

namespace {

struct LogState {
  std::string processName;
  std::string facility;
  SystemLog::Sink sink;
  bool toJournal = false;
};

// Replaced as a whole and read without a lock, since lines are written from any thread, also under other
// locks. The few states are never freed, because a thread may still be reading an old one, even during
// process exit.
std::atomic<const LogState*>& state() {
  static const LogState* initial = new LogState;
  static std::atomic<const LogState*> current{initial};
  return current;
}

template <class Change>
void changeState(Change change) {
  static auto* mutex = new Mutex;
  static auto* kept = new std::vector<std::unique_ptr<const LogState>>;
  MutexLock lock(*mutex);
  auto next = std::make_unique<LogState>(*state().load());
  change(*next);
  state().store(next.get());
  kept->push_back(std::move(next));
}

bool stderrIsJournal() {
  const char* stream = std::getenv("JOURNAL_STREAM");
  if (!stream) return false;
  unsigned long long device = 0;
  unsigned long long inode = 0;
  if (std::sscanf(stream, "%llu:%llu", &device, &inode) != 2) return false;
  struct stat status {};
  return ::fstat(STDERR_FILENO, &status) == 0 && status.st_dev == device && status.st_ino == inode;
}

std::string printable(std::string_view text) {
  while (!text.empty() && text.back() == '\n') text.remove_suffix(1);
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    if (isControl(c) && c != '\t') {
      char escaped[8];
      std::snprintf(escaped, sizeof escaped, "\\x%02x", static_cast<unsigned char>(c));
      out += escaped;
    } else {
      out += c;
    }
  }
  return out;
}

std::string withHead(const LogState& log, LogLevel level, const std::string& line) {
  WallTime now = WallClock::system().now();
  auto fraction = now - std::chrono::floor<std::chrono::seconds>(now);
  char head[160];
  std::snprintf(head, sizeof head, "%s.%03d %.64s[%d] <%d> ", civilTime(now).c_str(),
                static_cast<int>(fraction.count() / 1000),
                log.processName.empty() ? "vesk" : log.processName.c_str(), ::getpid(),
                static_cast<int>(level));
  return head + line;
}

void emit(LogLevel level, std::string_view text, std::chrono::milliseconds patience) {
  const std::string line = printable(text);
  const LogState* log = state().load();
  if (log->sink) {
    log->sink(level, line);
  } else if (auto journal = SystemLog::journal(); log->toJournal && journal) {
    journal(level, line, log->processName, log->facility);
  } else if (log->toJournal) {
    writeToStandardError("<" + std::to_string(static_cast<int>(level)) + ">" + line, patience);
  } else {
    writeToStandardError(withHead(*log, level, line), patience);
  }
}

void emitLeftOut(const std::vector<LogRateLimit::LeftOut>& all, std::chrono::milliseconds patience) {
  for (const auto& leftOut : all) {
    std::string line = "log: Left out " + std::to_string(leftOut.lines) + " lines";
    if (leftOut.user != LogUser::kNobody) line += " of user " + std::to_string(leftOut.user);
    emit(leftOut.level, line + " like: " + leftOut.format, patience);
  }
}

// Null without a limit. Never freed, like the states.
std::atomic<LogRateLimit*> rateLimit{nullptr};

}  // namespace

std::atomic<int> SystemLog::_level{static_cast<int>(LogLevel::Info)};
std::atomic<int> SystemLog::_patience{0};

void SystemLog::open(std::string_view processName, std::string_view facility) {
  changeState([&](LogState& log) {
    log.processName = processName;
    log.facility = facility;
    log.toJournal = stderrIsJournal();
  });
}

void SystemLog::setRateLimit(std::uint64_t lines) {
  static auto* mutex = new Mutex;
  static auto* kept = new std::vector<std::unique_ptr<LogRateLimit>>;
  MutexLock lock(*mutex);
  rateLimit = lines > 0 ? kept->emplace_back(std::make_unique<LogRateLimit>(lines)).get() : nullptr;
}

void SystemLog::close() noexcept {
  try {
    if (auto* limit = rateLimit.load()) emitLeftOut(limit->takeAll(), patience());
    changeState([](LogState& log) { log = LogState{{}, {}, log.sink, false}; });
  } catch (...) {
    // Out of memory while closing: the old state stays.
  }
}

void SystemLog::setSink(Sink sink) {
  changeState([&](LogState& log) { log.sink = std::move(sink); });
}

void SystemLog::write(LogLevel level, const char& site, const char* format, ...) noexcept {
  try {
    if (auto* limit = rateLimit.load(std::memory_order_acquire); limit && level != LogLevel::Error) {
      auto verdict = limit->admit(&site, LogUser::current(), level, format, std::chrono::steady_clock::now());
      emitLeftOut(verdict.leftOut, patience());
      if (!verdict.mayWrite) return;
    }
    char shortLine[512];
    va_list arguments;
    va_start(arguments, format);
    va_list again;
    va_copy(again, arguments);
    int size = std::vsnprintf(shortLine, sizeof shortLine, format, arguments);
    va_end(arguments);
    std::string line;
    if (size >= static_cast<int>(sizeof shortLine)) {
      line.resize(static_cast<std::size_t>(size) + 1);
      std::vsnprintf(line.data(), line.size(), format, again);
      line.resize(static_cast<std::size_t>(size));
    } else if (size >= 0) {
      line.assign(shortLine, static_cast<std::size_t>(size));
    }
    va_end(again);
    emit(level, line, patience());
  } catch (...) {
    // Out of memory: the line is lost and the caller continues.
  }
}

}  // namespace vesk

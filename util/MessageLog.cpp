#include "util/MessageLog.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <charconv>
#include <ctime>
#include <filesystem>
#include <system_error>
#include <vector>

#include "platform/files/RootPrefix.h"
#include "platform/files/WriteAll.h"
#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"
#include "platform/time/CivilTime.h"

namespace vesk {

namespace {

constexpr std::string_view kNameStart = "veskreportingd";
constexpr std::string_view kNameEnd = "messageLog.diag";
constexpr std::chrono::seconds kExpiryAge{86400};

// Longer than a kernel clock tick: two changes within one tick leave the same modification time.
constexpr std::chrono::milliseconds kSettled{100};

using LogFile = MessageLogFile;

bool isLogFileName(std::string_view name) {
  const std::size_t first = name.find('_');
  if (first == std::string_view::npos) return false;
  const std::size_t second = name.find('_', first + 1);
  return second != std::string_view::npos && name.substr(0, first) == kNameStart &&
         name.substr(second + 1) == kNameEnd;
}

std::string newLogFileName(WallTime now) {
  auto seconds = std::chrono::duration_cast<std::chrono::seconds>(now.time_since_epoch()).count();
  return std::string(kNameStart) + "_" + std::to_string(static_cast<std::int32_t>(seconds)) + "_" +
         std::string(kNameEnd);
}

/// The seconds since 1970 in a log file's name, if they are a 32-bit number.
std::optional<WallTime> dateInName(std::string_view name) {
  name.remove_prefix(name.find('_') + 1);
  name = name.substr(0, name.find('_'));
  std::int32_t seconds = 0;
  const auto [end, error] = std::from_chars(name.data(), name.data() + name.size(), seconds);
  if (error != std::errc() || end != name.data() + name.size()) return std::nullopt;
  // The number is signed, so it is negative from 2038 on.
  return WallTime(std::chrono::seconds(static_cast<std::uint32_t>(seconds)));
}

/// The creation date of the file opened as `descriptor` or, without a descriptor, of the file at `path`. It
/// is its birth time if the file system records one, otherwise the seconds in its name, which stay the same
/// when lines are added, otherwise the time of its last change.
std::optional<WallTime> creationDate(const std::string& path, int descriptor = -1) {
  struct statx status {};
  const bool isOpen = descriptor >= 0;
  if (::statx(isOpen ? descriptor : AT_FDCWD, isOpen ? "" : path.c_str(),
              isOpen ? AT_EMPTY_PATH : AT_SYMLINK_NOFOLLOW, STATX_BTIME | STATX_MTIME, &status) != 0) {
    return std::nullopt;
  }
  const bool hasBirth = status.stx_mask & STATX_BTIME;
  if (!hasBirth) {
    if (auto named = dateInName(std::string_view(path).substr(path.rfind('/') + 1))) return named;
    if (!(status.stx_mask & STATX_MTIME)) return std::nullopt;
  }
  const auto& when = hasBirth ? status.stx_btime : status.stx_mtime;
  return WallTime(std::chrono::seconds(when.tv_sec) + std::chrono::microseconds(when.tv_nsec / 1000));
}

std::string dateText(const LogFile& file) { return file.created ? logDate(*file.created) : "unknown date"; }

void deleteLogFile(const LogFile& file) {
  ::unlink(file.path.c_str());
  VESK_LOG_INFO("writeToLogFile: Deleted expired veskreportingd log file %s (%s)", file.path.c_str(),
                dateText(file).c_str());
}

void createDirectoryWithParents(const std::string& directory) {
  for (std::size_t end = directory.find('/', 1);; end = directory.find('/', end + 1)) {
    ::mkdir(directory.substr(0, end).c_str(), 0750);
    if (end == std::string::npos) return;
  }
}

/// Whether the entry is a log file. Directories are not: the log never creates one under such a name and
/// could not delete it.
bool isLogFile(const std::filesystem::directory_entry& entry) {
  std::error_code unknown;
  return isLogFileName(entry.path().filename().native()) &&
         (entry.is_symlink(unknown) || !entry.is_directory(unknown));
}

/// Paths of the log files in `directory`, which is created if missing.
std::vector<std::string> listLogFiles(const std::string& directory) {
  std::vector<std::string> paths;
  std::error_code error;
  std::filesystem::directory_iterator entry(directory, error);
  for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
    if (isLogFile(*entry)) paths.push_back(entry->path().native());
  }
  if (!error) return paths;
  if (error == std::errc::no_such_file_or_directory) {
    VESK_LOG_INFO("writeToLogFile: Creating veskreportingd log directory at %s", directory.c_str());
    createDirectoryWithParents(directory);
  } else {
    VESK_LOG_ERROR("writeToLogFile: Error reading from log directory: %s", error.message().c_str());
  }
  return {};
}

/// Returns the newest file that has not expired and deletes all others.
std::optional<LogFile> chooseCurrentFile(const std::vector<std::string>& paths, WallTime now) {
  std::optional<LogFile> best;
  for (const auto& path : paths) {
    LogFile file{path, creationDate(path)};
    if (file.created && now - *file.created > kExpiryAge) {
      deleteLogFile(file);
    } else if (best && best->created) {
      if (file.created && *file.created > *best->created) std::swap(file, *best);
      deleteLogFile(file);
    } else {
      // If the date of the best file is unknown, the file is replaced here without being deleted.
      best = std::move(file);
    }
  }
  return best;
}

std::optional<LogFile> createLogFile(const std::string& directory, WallTime now) {
  const std::string path = directory + "/" + newLogFileName(now);
  // Keeps an existing file, which may be there if the directory can't be listed.
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0640));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) {
    VESK_LOG_ERROR("writeToLogFile: Failed to create new veskreportingd log file %s", path.c_str());
    return std::nullopt;
  }
  LogFile created{path, creationDate(path)};
  VESK_LOG_INFO("writeToLogFile: Created new veskreportingd log file %s (%s)", path.c_str(),
                dateText(created).c_str());
  return created;
}

enum class Appended : unsigned char { Yes, No, Full };

Appended append(int file, std::string_view line, std::int64_t maximumBytes) {
  struct stat status {};
  if (::fstat(file, &status) != 0 || !S_ISREG(status.st_mode)) return Appended::No;
  if (status.st_size + static_cast<std::int64_t>(line.size()) > maximumBytes) return Appended::Full;
  return writeAll(file, line) ? Appended::Yes : Appended::No;
}

std::chrono::nanoseconds sinceEpoch(const timespec& time) {
  return std::chrono::seconds(time.tv_sec) + std::chrono::nanoseconds(time.tv_nsec);
}

/// Whether every later change of the directory's entries will change its modification time.
bool isSettled(const struct stat& directory) {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  return sinceEpoch(now) - sinceEpoch(directory.st_mtim) > kSettled;
}

bool isSameState(const struct stat& one, const struct stat& other) {
  return one.st_dev == other.st_dev && one.st_ino == other.st_ino &&
         sinceEpoch(one.st_mtim) == sinceEpoch(other.st_mtim) &&
         sinceEpoch(one.st_ctim) == sinceEpoch(other.st_ctim);
}

}  // namespace

std::string logDate(WallTime time) { return civilTime(time) + " +0000"; }

MessageLog::MessageLog(std::string directory, const WallClock& clock, const Options& options)
    : _directory(std::move(directory)), _clock(clock), _options(options) {}

MessageLog::Current MessageLog::search(WallTime now) const {
  Current current;
  const bool isSettledNow =
      ::stat(_directory.c_str(), &current.directory) == 0 && isSettled(current.directory);
  const std::vector<std::string> paths = listLogFiles(_directory);
  current.file = chooseCurrentFile(paths, now);
  current.canStay = isSettledNow && current.file && paths.size() == 1;
  if (!current.file) current.file = createLogFile(_directory, now);
  if (current.file) {
    current.descriptor = FileDescriptor(
        ::open(current.file->path.c_str(), O_WRONLY | O_APPEND | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
  }
  return current;
}

bool MessageLog::isStillChosen(const Current& current, WallTime now) const {
  struct stat directory {};
  if (!current.canStay || ::stat(_directory.c_str(), &directory) != 0) return false;
  if (!isSameState(directory, current.directory)) return false;
  const auto created = creationDate(current.file->path, current.descriptor.get());
  return created && now - *created <= kExpiryAge;
}

void MessageLog::write(std::string_view message) try {
  // One lock for all logs, since two of them may use the same directory.
  static Mutex mutex;
  MutexLock lock(mutex);
  const WallTime now = _clock.now();
  if (!isStillChosen(_current, now)) {
    _current = {};
    _current = search(now);
  }
  if (!_current.file) return countLost();

  std::string line = "(" + logDate(now) + ") ";
  line.append(message).append("\n");
  const std::string& path = _current.file->path;
  switch (append(_current.descriptor.get(), line, _options.maximumBytes)) {
    case Appended::Yes:
      VESK_LOG_INFO("writeToLogFile: Saved log message to %s", path.c_str());
      break;
    case Appended::No:
      countLost();
      _current.canStay = false;
      deleteLogFile(*_current.file);
      break;
    case Appended::Full:
      countLost();
      if (_full.begins()) {
        VESK_LOG_WARNING("writeToLogFile: No room in %s until it expires; lines are lost", path.c_str());
      }
      break;
  }
  if (!_current.canStay) _current = {};
} catch (const std::exception& error) {
  countLost();
  VESK_LOG_ERROR("writeToLogFile: %s", error.what());
}

void MessageLog::countLost() const noexcept {
  _options.counters->count("message-log", DropReason::NotRecorded);
}

void writeToLogFile(std::string_view format, std::span<const LogArgument> arguments) {
  static auto* const log =
      new MessageLog(pathUnderRoot("/var/mobile/Library/Logs/Dunmore/Retired"), WallClock::system());
  log->write(formatLogMessage(format, arguments));
}

}  // namespace vesk

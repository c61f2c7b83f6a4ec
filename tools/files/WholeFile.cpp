#include "tools/files/WholeFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <vector>

#include "platform/files/FileDescriptor.h"

namespace vesk {

namespace {

[[noreturn]] void fail(const char* action, const std::filesystem::path& path, int error) {
  throw std::runtime_error(std::string("can't ") + action + " " + path.string() + ": " +
                           std::strerror(error));
}

/// A new file beside `path`, removed unless it was renamed to it.
class Replacement {
 public:
  explicit Replacement(const std::filesystem::path& path) : _path(path) {
    std::string pattern = path.string() + ".XXXXXX";
    _name.assign(pattern.c_str(), pattern.c_str() + pattern.size() + 1);
    _file = FileDescriptor(::mkostemp(_name.data(), O_CLOEXEC));
    if (!_file) fail("write", path, errno);
  }
  ~Replacement() {
    if (!_name.empty()) ::unlink(_name.data());
  }
  Replacement(const Replacement&) = delete;
  Replacement& operator=(const Replacement&) = delete;

  void fill(std::string_view contents, mode_t mode) {
    if (::fchmod(_file.get(), mode) != 0) fail("write", _path, errno);
    while (!contents.empty()) {
      ssize_t written = ::write(_file.get(), contents.data(), contents.size());
      if (written < 0 && errno == EINTR) continue;
      if (written < 0) fail("write", _path, errno);
      contents.remove_prefix(static_cast<std::size_t>(written));
    }
    if (::fsync(_file.get()) != 0) fail("write", _path, errno);
  }

  void commit() {
    if (::rename(_name.data(), _path.c_str()) != 0) fail("write", _path, errno);
    _name.clear();
  }

 private:
  const std::filesystem::path _path;
  std::vector<char> _name;
  FileDescriptor _file;
};

}  // namespace

std::string readWholeFile(const std::filesystem::path& path, std::size_t limit) {
  FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  if (!file) fail("read", path, errno);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) fail("read", path, errno);
  if (!S_ISREG(status.st_mode))
    throw std::runtime_error("can't read " + path.string() + ": not a regular file");

  std::string contents;
  std::vector<char> piece(64 * 1024);
  while (true) {
    ssize_t count = ::read(file.get(), piece.data(), piece.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) fail("read", path, errno);
    if (count == 0) return contents;
    contents.append(piece.data(), static_cast<std::size_t>(count));
    if (contents.size() > limit)
      throw std::runtime_error("can't read " + path.string() + ": more than " + std::to_string(limit) +
                               " bytes");
  }
}

void writeWholeFile(const std::filesystem::path& path, std::string_view contents, mode_t mode) {
  Replacement replacement(path);
  replacement.fill(contents, mode);
  replacement.commit();
}

}  // namespace vesk

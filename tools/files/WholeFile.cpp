#include "tools/files/WholeFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <vector>

#include "platform/files/FileDescriptor.h"
#include "platform/files/SmallFile.h"
#include "platform/files/WriteAll.h"

namespace vesk {

namespace {

[[noreturn]] void fail(const std::filesystem::path& path, int error) {
  throw std::runtime_error("can't write " + path.string() + ": " + std::strerror(error));
}

/// A new file beside `path`, removed unless it was renamed to `path`.
class Replacement {
 public:
  explicit Replacement(const std::filesystem::path& path) : _path(path) {
    std::string pattern = path.string() + ".XXXXXX";
    _name.assign(pattern.c_str(), pattern.c_str() + pattern.size() + 1);
    _file = FileDescriptor(::mkostemp(_name.data(), O_CLOEXEC));
    if (!_file) fail(path, errno);
  }
  ~Replacement() {
    if (!_name.empty()) ::unlink(_name.data());
  }
  Replacement(const Replacement&) = delete;
  Replacement& operator=(const Replacement&) = delete;

  void fill(std::string_view contents, mode_t mode) {
    if (::fchmod(_file.get(), mode) != 0) fail(_path, errno);
    if (auto written = writeAll(_file.get(), contents); !written) fail(_path, written.error().number);
    if (::fsync(_file.get()) != 0) fail(_path, errno);
  }

  void commit() {
    if (::rename(_name.data(), _path.c_str()) != 0) fail(_path, errno);
    _name.clear();
  }

 private:
  const std::filesystem::path _path;
  std::vector<char> _name;
  FileDescriptor _file;
};

}  // namespace

std::string readWholeFile(const std::filesystem::path& path, std::size_t limit) {
  auto bytes = readSmallFile(path.string(), limit);
  if (!bytes) throw std::runtime_error("can't read " + path.string() + ": " + bytes.error().text);
  return *std::move(bytes);
}

void writeWholeFile(const std::filesystem::path& path, std::string_view contents, mode_t mode) {
  Replacement replacement(path);
  replacement.fill(contents, mode);
  replacement.commit();
}

}  // namespace vesk

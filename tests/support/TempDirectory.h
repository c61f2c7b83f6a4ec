// A temporary directory that is removed after the test.
#pragma once

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <string_view>

namespace vesk::test {

class TempDirectory {
 public:
  TempDirectory() {
    ::umask(022);  // the daemon refuses files that others can write to
    std::string pattern = (std::filesystem::temp_directory_path() / "vesk-test-XXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory " + pattern);
    _path = pattern;
  }
  ~TempDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(_path, ignored);
  }
  TempDirectory(const TempDirectory&) = delete;
  TempDirectory& operator=(const TempDirectory&) = delete;

  const std::filesystem::path& path() const { return _path; }
  std::filesystem::path operator/(std::string_view name) const { return _path / name; }

  /// Writes a file, creating its parent directories, and returns its path.
  std::filesystem::path write(std::string_view name, std::string_view contents) const {
    auto file = _path / name;
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary) << contents;
    return file;
  }
  /// The contents of a file; "" if it doesn't exist.
  std::string read(std::string_view name) const {
    std::ifstream in(_path / name, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
  }
  /// The contents of all files of a directory, in arbitrary order; "" if it doesn't exist.
  std::string readAll(std::string_view directory) const {
    std::string all;
    std::error_code missing;
    for (const auto& file : std::filesystem::directory_iterator(_path / directory, missing))
      all += read(file.path().string());
    return all;
  }

 private:
  std::filesystem::path _path;
};

}  // namespace vesk::test

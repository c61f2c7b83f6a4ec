// A file descriptor that closes itself.
#pragma once

#include <unistd.h>

#include <utility>

namespace vesk {

/// Owns one descriptor, or none (-1).
class FileDescriptor {
 public:
  FileDescriptor() noexcept = default;
  explicit FileDescriptor(int descriptor) noexcept : _descriptor(descriptor) {}
  FileDescriptor(FileDescriptor&& other) noexcept : _descriptor(std::exchange(other._descriptor, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) {
      reset();
      _descriptor = std::exchange(other._descriptor, -1);
    }
    return *this;
  }
  ~FileDescriptor() { reset(); }

  int get() const noexcept { return _descriptor; }
  explicit operator bool() const noexcept { return _descriptor >= 0; }
  int release() noexcept { return std::exchange(_descriptor, -1); }
  void reset() noexcept {
    if (_descriptor >= 0) ::close(std::exchange(_descriptor, -1));
  }

 private:
  int _descriptor = -1;
};

}  // namespace vesk

// Descriptors of a library whose host process may close them.
#pragma once

#include <sys/stat.h>

#include <utility>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// Identifies the file behind a descriptor, to notice if another file took over its number. Not for files
/// without an inode of their own (eventfd, epoll).
class DescriptorIdentity {
 public:
  DescriptorIdentity() noexcept = default;
  explicit DescriptorIdentity(int descriptor) noexcept {
    struct stat status {};
    if (descriptor < 0 || ::fstat(descriptor, &status) != 0) return;
    _device = status.st_dev;
    _inode = status.st_ino;
  }
  bool isAt(int descriptor) const noexcept {
    const DescriptorIdentity now(descriptor);
    return _inode != 0 && now._device == _device && now._inode == _inode;
  }

 private:
  dev_t _device = 0;
  ino_t _inode = 0;
};

/// Owns a descriptor that the host may have closed with closefrom(3). If the host has reused the number for
/// another file, the destructor leaves that file open.
class GuardedDescriptor {
 public:
  GuardedDescriptor() noexcept = default;
  explicit GuardedDescriptor(FileDescriptor descriptor) noexcept
      : _identity(descriptor.get()), _descriptor(std::move(descriptor)) {}
  GuardedDescriptor(GuardedDescriptor&&) noexcept = default;
  GuardedDescriptor& operator=(GuardedDescriptor&& other) noexcept {
    if (this == &other) return *this;
    letGo();
    _identity = other._identity;
    _descriptor = std::move(other._descriptor);
    return *this;
  }
  ~GuardedDescriptor() { letGo(); }

  /// Whether it holds a descriptor, which the host may have closed.
  explicit operator bool() const noexcept { return static_cast<bool>(_descriptor); }
  /// Whether the descriptor is still open. The host may close it at any time.
  bool isOurs() const noexcept { return _identity.isAt(_descriptor.get()); }
  int get() const noexcept { return _descriptor.get(); }

 private:
  void letGo() noexcept {
    if (_descriptor && !isOurs()) static_cast<void>(_descriptor.release());
  }

  DescriptorIdentity _identity;
  FileDescriptor _descriptor;
};

}  // namespace vesk

#include "platform/ipc/UnixSocket.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>

namespace vesk {

namespace {

[[noreturn]] void fail(int error, const std::string& what) {
  throw std::system_error(error, std::generic_category(), what);
}

FileDescriptor newSocket() {
  FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket) fail(errno, "socket");
  return socket;
}

void makeDirectory(const std::filesystem::path& directory) {
  if (directory.empty() || std::filesystem::is_directory(directory)) return;
  makeDirectory(directory.parent_path());
  // Independent of the umask, since clients of every user pass through it.
  if (::mkdir(directory.c_str(), 0755) == 0) {
    ::chmod(directory.c_str(), 0755);
  } else if (errno != EEXIST) {
    fail(errno, "The directory " + directory.string() + " can't be made");
  }
}

/// Removes only sockets, and only if there is no server.
void removeStaleSocket(const std::string& path) {
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return;
  if (!S_ISSOCK(status.st_mode)) fail(EEXIST, path + " is no socket");
  try {
    connectUnixSocket(path);
  } catch (const std::system_error& error) {
    if (error.code().value() == ECONNREFUSED) {
      ::unlink(path.c_str());
      return;
    }
    if (error.code().value() != EAGAIN) throw;
  }
  fail(EADDRINUSE, "Another daemon answers on " + path);
}

}  // namespace

UnixSocketAddress::UnixSocketAddress(const std::string& path) {
  _address.sun_family = AF_UNIX;
  std::string reachable = path;
  if (path.size() >= sizeof _address.sun_path) {
    std::filesystem::path whole(path);
    _directory = FileDescriptor(::open(whole.parent_path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!_directory) fail(errno, whole.parent_path().string());
    reachable = "/proc/self/fd/" + std::to_string(_directory.get()) + "/" + whole.filename().string();
    if (reachable.size() >= sizeof _address.sun_path) fail(ENAMETOOLONG, path);
  }
  std::memcpy(_address.sun_path, reachable.c_str(), reachable.size() + 1);
}

FileDescriptor connectUnixSocket(const std::string& path) {
  UnixSocketAddress address(path);
  FileDescriptor socket = newSocket();
  if (::connect(socket.get(), address.get(), address.size()) != 0) fail(errno, path);
  return socket;
}

FileDescriptor listenOnUnixSocket(const std::string& path) {
  makeDirectory(std::filesystem::path(path).parent_path());
  removeStaleSocket(path);
  UnixSocketAddress address(path);
  FileDescriptor socket = newSocket();
  // Clients of every user connect to it. The sandbox denies changing the mode later.
  const mode_t mask = ::umask(0111);
  const int bound = ::bind(socket.get(), address.get(), address.size());
  const int error = errno;
  ::umask(mask);
  if (bound != 0) fail(error, path);
  if (::listen(socket.get(), SOMAXCONN) != 0) fail(errno, path);
  return socket;
}

IPCPeer peerOfSocket(int socket) {
  ucred credentials{};
  socklen_t size = sizeof credentials;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) fail(errno, "SO_PEERCRED");
  std::vector<gid_t> groups(256);
  size = static_cast<socklen_t>(groups.size() * sizeof groups[0]);
  const bool hasGroups = ::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size) == 0;
  groups.resize(hasGroups ? size / sizeof groups[0] : 0);
  return {credentials.uid, credentials.pid, std::vector<gid_t>(groups)};
}

}  // namespace vesk

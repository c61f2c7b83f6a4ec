#include "platform/files/PrivateFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

namespace vesk {

FileDescriptor makePrivateFile(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  struct stat directory {};
  if (file && ::geteuid() == 0 &&
      ::stat(std::filesystem::path(path).parent_path().c_str(), &directory) == 0) {
    // Only what was made just now is given away: what stood there before could be anybody's. Without the
    // right to do so it stays root's.
    static_cast<void>(::fchown(file.get(), directory.st_uid, directory.st_gid) == 0);
  }
  return file;
}

}  // namespace vesk

#include "platform/files/PrivateFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

namespace vesk {

Result<FileDescriptor> makePrivateFile(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  if (!file) return systemError(errno);
  struct stat directory {};
  if (::geteuid() == 0 && ::stat(std::filesystem::path(path).parent_path().c_str(), &directory) == 0) {
    // Changes the owner of a newly created file only; an existing file could be anyone's. If this is not
    // permitted, root keeps the file.
    static_cast<void>(::fchown(file.get(), directory.st_uid, directory.st_gid) == 0);
  }
  return file;
}

}  // namespace vesk

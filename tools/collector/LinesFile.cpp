#include "tools/collector/LinesFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "platform/files/FileDescriptor.h"

namespace vesk {

int appendLines(const std::filesystem::path& path, std::string_view lines) {
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
  if (!file) return errno;
  ssize_t written = ::write(file.get(), lines.data(), lines.size());
  if (written < 0) return errno;
  return static_cast<std::size_t>(written) == lines.size() ? 0 : ENOSPC;
}

}  // namespace vesk

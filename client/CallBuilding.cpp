#include "client/CallBuilding.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <system_error>

#include "platform/ipc/MessageWriter.h"
#include "platform/text/PercentCode.h"

namespace vesk {

ClientCall encoded(IPCOutgoingCall call, CallEffect effect) {
  // Fits most calls, so that no buffer has to grow.
  constexpr std::size_t kUsualSize = 512;
  ClientCall result;
  std::string& message = result.call.message;
  message.reserve(kUsualSize);
  if (appendCall(wire::kObjectPath, call, message) != CodecResult::Ok) throw InvalidCall();
  if (message.size() > kUsualSize) message.shrink_to_fit();
  result.memory = sizeof result + message.capacity();
  result.effect = effect;
  if (effect != CallEffect::None) result.arguments = std::move(call.arguments);
  return result;
}

Result<FileToUpload> openToUpload(const std::string& path) {
  FileToUpload file;
  file.descriptor = FileDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  struct stat status {};
  if (!file.descriptor || ::fstat(file.descriptor.get(), &status) != 0) return systemError(errno);
  if (!S_ISREG(status.st_mode)) return systemError(S_ISDIR(status.st_mode) ? EISDIR : EINVAL);
  std::error_code code;
  auto absolute = std::filesystem::absolute(path, code);
  if (code) return systemError(code.value());
  file.url = "file://" + percentEncoded(absolute.lexically_normal().string(), "/");
  return file;
}

}  // namespace vesk

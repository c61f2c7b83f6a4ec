#include "client/CallBuilding.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <type_traits>

namespace vesk {

namespace {

std::size_t contentOf(const std::string& text) noexcept { return text.size(); }
std::size_t contentOf(const Dictionary& dictionary) noexcept { return approximateMemory(dictionary); }
std::size_t contentOf(const List& list) noexcept {
  std::size_t size = 0;
  for (const Value& value : list) {
    size += sizeof(Value);
    if (const Text* text = value.text()) size += text->size();
    if (const Bytes* bytes = value.bytes()) size += bytes->size();
    if (const List* nested = value.list()) size += contentOf(*nested);
    if (const Dictionary* nested = value.dictionary()) size += contentOf(*nested);
  }
  return size;
}
std::size_t contentOf(const std::vector<std::string>& texts) noexcept {
  std::size_t size = 0;
  for (const auto& text : texts) size += sizeof(text) + text.size();
  return size;
}
template <class T>
std::size_t contentOf(const std::optional<T>& value) noexcept {
  return value ? contentOf(*value) : 0;
}
template <class T>
requires std::is_scalar_v<T> || std::is_same_v<T, IPCDescriptor> std::size_t contentOf(const T&)
noexcept { return 0; }

std::string urlOf(const std::string& path) {
  constexpr char kDigits[] = "0123456789ABCDEF";
  constexpr std::string_view kPlain = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-._~/";
  std::string url = "file://";
  for (char c : path) {
    if (kPlain.find(c) != std::string_view::npos) {
      url += c;
    } else {
      auto byte = static_cast<unsigned char>(c);
      url += {'%', kDigits[byte >> 4], kDigits[byte & 15]};
    }
  }
  return url;
}

}  // namespace

std::size_t memoryOf(const ClientCall& call) noexcept {
  std::size_t size = sizeof(ClientCall) + call.call.arguments.size() * sizeof(IPCArgument);
  for (const IPCArgument& argument : call.call.arguments) {
    size += std::visit([](const auto& value) { return contentOf(value); }, argument);
  }
  return size;
}

FileToUpload openToUpload(const std::string& path) {
  FileToUpload file;
  file.descriptor = FileDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  struct stat status {};
  if (!file.descriptor || ::fstat(file.descriptor.get(), &status) != 0) {
    file.error = errno;
  } else if (!S_ISREG(status.st_mode)) {
    file.error = S_ISDIR(status.st_mode) ? EISDIR : EINVAL;
  }
  std::error_code code;
  auto absolute = std::filesystem::absolute(path, code);
  if (file.error == 0 && code) file.error = code.value();
  if (file.error != 0) {
    file.descriptor.reset();
    return file;
  }
  file.url = urlOf(absolute.lexically_normal().string());
  return file;
}

}  // namespace vesk

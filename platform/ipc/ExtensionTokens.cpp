#include "platform/ipc/ExtensionTokens.h"

#include <sys/random.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

std::string freshToken() {
  unsigned char random[16];
  // For up to 256 bytes, the kernel always returns all of them.
  if (::getrandom(random, sizeof random, 0) != sizeof random) {
    throw std::system_error(errno, std::generic_category(), "getrandom");
  }
  return hexLower(random);
}

}  // namespace

ExtensionTokens& ExtensionTokens::shared() {
  static ExtensionTokens tokens;
  return tokens;
}

std::string ExtensionTokens::add(const ExtensionOwner& owner, FileDescriptor descriptor) {
  std::string token = freshToken();
  FileDescriptor displaced;
  MutexLock lock(_mutex);
  auto isOwners = [&owner](const Entry& entry) { return entry.owner.connection == owner.connection; };
  if (std::count_if(_entries.begin(), _entries.end(), isOwners) >= std::ptrdiff_t{kMaximumPerOwner}) {
    auto oldest = std::find_if(_entries.begin(), _entries.end(), isOwners);
    displaced = std::move(oldest->descriptor);
    _entries.erase(oldest);
  }
  _entries.push_back({owner, token, std::move(descriptor)});
  return token;
}

ExtensionHandle ExtensionTokens::consume(std::string_view token) {
  MutexLock lock(_mutex);
  auto entry =
      std::find_if(_entries.begin(), _entries.end(), [&](const Entry& e) { return e.token == token; });
  if (entry == _entries.end()) return {};
  ExtensionHandle handle{std::move(entry->descriptor), entry->owner.user};
  _entries.erase(entry);
  return handle;
}

void ExtensionTokens::drop(std::uint64_t connection) noexcept {
  std::list<Entry> dropped;  // closed after unlocking, because closing may wait for a file system
  MutexLock lock(_mutex);
  for (auto entry = _entries.begin(); entry != _entries.end();) {
    const auto at = entry++;
    if (at->owner.connection == connection) dropped.splice(dropped.end(), _entries, at);
  }
}

}  // namespace vesk

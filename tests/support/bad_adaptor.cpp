// Faulty adaptors. The build selects the fault.
#include <VeskReporting/WrenAdaptor.h>

#include <fcntl.h>
#include <unistd.h>

#include <stdexcept>
#include <string>

namespace {

std::string pipePath;

/// Blocks until the pipe has been opened and closed by its other end.
[[maybe_unused]] void hang(VeskWrenAdaptor*, uint16_t, uint16_t, const VeskDictionaryView*) {
  char byte = 0;
  const int pipe = ::open(pipePath.c_str(), O_RDONLY);
  while (::read(pipe, &byte, 1) > 0) continue;
  ::close(pipe);
}

[[maybe_unused]] void fail(VeskWrenAdaptor*, uint16_t, uint16_t respCode, const VeskDictionaryView*) {
  if (respCode == 1) throw 1;
  throw std::runtime_error("out of order");
}

#if defined(VESK_WITHOUT_OPERATION)
const VeskWrenOperation kOperations[] = {{"sendMessage", reinterpret_cast<VeskWrenFunction>(&fail)},
                                         {nullptr, nullptr}};
#elif defined(VESK_HANGING_OPERATION)
const VeskWrenOperation kOperations[] = {{VESK_WREN_SEND_MESSAGE, reinterpret_cast<VeskWrenFunction>(&hang)},
                                         {nullptr, nullptr}};
#else
[[maybe_unused]] const VeskWrenOperation kOperations[] = {
    {VESK_WREN_SEND_MESSAGE, reinterpret_cast<VeskWrenFunction>(&fail)}, {nullptr, nullptr}};
#endif

#if defined(VESK_OTHER_VERSION)
constexpr uint32_t kVersion = VESK_WREN_ADAPTOR_VERSION + 1;
#else
constexpr uint32_t kVersion = VESK_WREN_ADAPTOR_VERSION;
#endif

#if defined(VESK_WITHOUT_OPERATIONS)
[[maybe_unused]] VeskWrenAdaptor adaptor{kVersion, nullptr, nullptr, nullptr};
#else
[[maybe_unused]] VeskWrenAdaptor adaptor{kVersion, "Bad", kOperations, [](VeskWrenAdaptor*) { throw 2; }};
#endif

}  // namespace

#if !defined(VESK_WITHOUT_FACTORY)
VeskWrenAdaptor* WrenAdaptor(const VeskWrenHost* host) {
  if (host->version != VESK_WREN_ADAPTOR_VERSION) return nullptr;
  pipePath = std::string(host->stateDirectory) + "/pipe";
  for (int level : {3, 4, 6, 7, 5, 0}) host->log(level, "made");
  host->log(6, nullptr);
#if defined(VESK_THROWING_FACTORY)
  throw std::runtime_error("no antenna");
#endif
  return &adaptor;
}
#endif

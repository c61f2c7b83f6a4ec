#include "backends/kilnar/KilnarBackend.h"

#include "platform/powerlog/PowerLog.h"

namespace vesk {

namespace {

constexpr std::uint32_t kRegisteredEvent = 28;
constexpr char kEventName[] = "Rookery-Vesk";

}  // namespace

std::shared_ptr<KilnarBackend> KilnarBackend::create(const std::string& name,
                                                     const std::optional<Dictionary>& profile,
                                                     const BackendIdentity& identity,
                                                     const BackendServices& services) {
  return std::shared_ptr<KilnarBackend>(new KilnarBackend(name, profile, identity, services));
}

std::optional<std::string> KilnarBackend::sendMessageInTurn(const std::optional<Dictionary>& payload,
                                                            const timeval&, std::uint16_t method,
                                                            std::uint16_t respCode, std::uint16_t eventID,
                                                            std::int32_t) {
  if (method == 0 || !payload || payload->empty() || !_services.powerLog) return std::nullopt;
  MutableDictionary event(*payload, 3);
  event.set(Text::literal("method"), unsigned{method});
  event.set(Text::literal("respCode"), unsigned{respCode});
  event.set(Text::literal("event"), unsigned{eventID});
  _services.powerLog->KLLogRegisteredEvent(kRegisteredEvent, kEventName, event.share(), std::nullopt);
  if (_outcomes->watchesMessages()) {
    _outcomes->show("message", "delivered", {{"category", method}, {"type", respCode}, {"eventID", eventID}});
  }
  return std::nullopt;
}

}  // namespace vesk

#include "backends/Outcomes.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <chrono>
#include <utility>

namespace vesk {

Outcomes::Outcomes(std::string backend, const BackendIdentity& identity, Counters& counters,
                   std::shared_ptr<DeliveryTap> tap)
    : _backend(std::move(backend)),
      _user(identity._client.user),
      _process(identity._client.process),
      _counters(counters),
      _tap(std::move(tap)),
      _sessionID(identity._sessionID),
      _clientType(identity._compType) {}

void Outcomes::setSession(std::uint32_t sessionID, std::int32_t clientType) noexcept {
  _sessionID = sessionID;
  _clientType = clientType;
}

void Outcomes::setUserInfo(const std::optional<Dictionary>& userInfo) {
  const Value* name = userInfo ? userInfo->find(kVeskReportingUserInfoClientName) : nullptr;
  _clientName.store(name ? std::optional(*name) : std::nullopt);
}

void Outcomes::show(const char* what, const char* outcome, const Dictionary& facts,
                    const std::string& body) const {
  const std::chrono::duration<double> time = std::chrono::system_clock::now().time_since_epoch();
  MutableDictionary record(Dictionary{{"time", time.count()},
                                      {"what", what},
                                      {"outcome", outcome},
                                      {"backend", _backend},
                                      {"clientType", _clientType.load()},
                                      {"sessionID", static_cast<std::int64_t>(_sessionID.load())},
                                      {"user", _user},
                                      {"process", _process}});
  if (const auto name = _clientName.load()) record.set("clientName", *name);
  record.setAll(facts);
  _tap->tell(record.share(), body);
}

void Outcomes::showCounted(const char* what, DropReason reason, std::uint64_t n, const Dictionary& facts,
                           const std::string& body) const {
  MutableDictionary all(
      Dictionary{{"reason", std::string(nameOfDropReason(reason))}, {"count", static_cast<std::int64_t>(n)}});
  all.setAll(facts);
  show(what, isLoss(reason) ? "dropped" : "deferred", all.share(), body);
}

}  // namespace vesk

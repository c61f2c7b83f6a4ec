#include "backends/wren/WrenBackend.h"

#include <VeskReporting/values/ValueViews.h>

#include <cstring>
#include <exception>
#include <utility>

#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "util/SamplingDraw.h"

namespace vesk {

namespace {

constexpr char kAdaptorBundle[] =
    "/System/Library/PrivateFrameworks/ZelkoServices.framework/Frameworks/ZKSPerformance.framework";
constexpr char kLibraryInBundle[] = "/ZKSPerformance.so";
constexpr char kStateDirectory[] = "/var/lib/veskreportingd";

/// The path of the bundle with the adaptor for a client type.
std::optional<std::string> bundleForClientType(std::int32_t clientType) {
  if (clientType == 7 || clientType == 11) return pathUnderRoot(kAdaptorBundle) + kLibraryInBundle;
  return std::nullopt;
}

void writeLine(int level, const char* line) {
  if (level != 3 && level != 4 && level != 6) level = 7;
  VESK_LOG(static_cast<LogLevel>(level), "WrenAdaptor: %s", line ? line : "");
}

/// Runs an adaptor's code and catches all its exceptions.
template <class Call>
Result<void> guarded(const Call& call) {
  try {
    call();
    return {};
  } catch (const std::exception& error) {
    return Error{Error::Kind::Failed, error.what()};
  } catch (...) {
    return Error{Error::Kind::Failed, "an exception of its own"};
  }
}

}  // namespace

std::shared_ptr<WrenBackend> WrenBackend::create(const std::string& name,
                                                 const std::optional<Dictionary>& profile,
                                                 const BackendIdentity& identity,
                                                 const BackendServices& services) {
  VESK_LOG_INFO("WrenBackend(initWithName): Loading Wren adaptor class for client type %d",
                identity._compType);
  auto bundle = bundleForClientType(identity._compType);
  if (!bundle) {
    VESK_LOG_ERROR("WrenBackend(initWithName): No matching bundle found for client type %d",
                   identity._compType);
    nextSamplingDraw();  // a refused backend must still consume its draw
    return nullptr;
  }
  return std::shared_ptr<WrenBackend>(new WrenBackend(name, profile, identity, services, std::move(*bundle)));
}

WrenBackend::WrenBackend(const std::string& name, const std::optional<Dictionary>& profile,
                         const BackendIdentity& identity, const BackendServices& services,
                         std::string bundlePath)
    : VeskReportingBackend(name, profile, identity, services),
      _clientBundle(std::move(bundlePath)),
      _stateDirectory(pathUnderRoot(kStateDirectory)),
      _host{VESK_WREN_ADAPTOR_VERSION, _stateDirectory.c_str(), &writeLine} {
  makeAdaptor();
}

void WrenBackend::makeAdaptor() {
  const auto made = guarded([this] {
    if (const auto loaded = _clientBundle.load(); !loaded) {
      VESK_LOG_DEBUG("WrenBackend(initWithName): %s", loaded.error().text.c_str());
      return;
    }
    _wrenAdaptorClass =
        reinterpret_cast<VeskWrenAdaptorFactory>(_clientBundle.symbolNamed(VESK_WREN_ADAPTOR_FACTORY));
    if (!_wrenAdaptorClass) {
      VESK_LOG_DEBUG("WrenBackend(initWithName): %s exports no %s", _clientBundle.path().c_str(),
                     VESK_WREN_ADAPTOR_FACTORY);
      return;
    }
    VeskWrenAdaptor* adaptor = _wrenAdaptorClass(&_host);
    if (adaptor && adaptor->version != VESK_WREN_ADAPTOR_VERSION) {
      VESK_LOG_DEBUG("WrenBackend(initWithName): %s is made for version %u", _clientBundle.path().c_str(),
                     adaptor->version);
      return;  // it is not known how to release such an adaptor
    }
    _wrenAdaptor.reset(adaptor);
  });
  if (!made) {
    VESK_LOG_ERROR("WrenBackend(initWithName): Wren adaptor could not be made: %s",
                   made.error().text.c_str());
  }
}

std::optional<std::string> WrenBackend::sendMessageInTurn(const std::optional<Dictionary>& payload,
                                                          const timeval&, std::uint16_t method,
                                                          std::uint16_t respCode, std::uint16_t,
                                                          std::int32_t) {
  VeskWrenSendMessage forward = forwardingOperation();
  if (!forward) {
    VESK_LOG_ERROR("WrenBackend(sendMessage): Wren adaptor %s does not respond to forwarding selector %s",
                   adaptorDescription(), VESK_WREN_SEND_MESSAGE);
    _outcomes->count("message", DropReason::AdaptorFailed);
    return std::nullopt;
  }
  if (const auto forwarded = forwardTo(forward, method, respCode, payload); !forwarded) {
    VESK_LOG_ERROR("WrenBackend(sendMessage): Wren adaptor %s failed: %s", adaptorDescription(),
                   forwarded.error().text.c_str());
    _outcomes->count("message", DropReason::AdaptorFailed);
  } else if (_outcomes->watchesMessages()) {
    _outcomes->show("message", "delivered", {{"category", method}, {"type", respCode}});
  }
  return std::nullopt;
}

Result<void> WrenBackend::forwardTo(VeskWrenSendMessage forward, std::uint16_t method, std::uint16_t respCode,
                                    const std::optional<Dictionary>& payload) {
  return guarded([&] {
    const Dictionary dictionary = payload.value_or(Dictionary());
    ValueViews view(dictionary);
    forward(_wrenAdaptor.get(), method, respCode, &view.dictionary());
  });
}

VeskWrenSendMessage WrenBackend::forwardingOperation() const noexcept {
  const VeskWrenOperation* operation = _wrenAdaptor ? _wrenAdaptor->operations : nullptr;
  for (; operation && operation->name; ++operation) {
    if (std::strcmp(operation->name, VESK_WREN_SEND_MESSAGE) == 0) {
      return reinterpret_cast<VeskWrenSendMessage>(operation->function);
    }
  }
  return nullptr;
}

const char* WrenBackend::adaptorDescription() const noexcept {
  return _wrenAdaptor && _wrenAdaptor->description ? _wrenAdaptor->description : "(null)";
}

void WrenBackend::ReleaseAdaptor::operator()(VeskWrenAdaptor* adaptor) const noexcept {
  if (!adaptor->release) return;
  if (const auto released = guarded([adaptor] { adaptor->release(adaptor); }); !released) {
    VESK_LOG_ERROR("WrenBackend(dealloc): Wren adaptor failed: %s", released.error().text.c_str());
  }
}

}  // namespace vesk

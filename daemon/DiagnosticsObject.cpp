#include "daemon/DiagnosticsObject.h"

#include "platform/ipc/IPCIncomingCall.h"
#include "protocol/WireNames.h"

namespace vesk {

namespace {

// How long a call waits for records. The connection's end has to wait for it.
constexpr std::chrono::milliseconds kTapPatience{500};

Dictionary problem(const char* text) { return Dictionary{{"problem", text}}; }

class Object final : public IPCExportedObject {
 public:
  Object(std::shared_ptr<const Diagnostics> diagnostics, std::shared_ptr<Operations> operations,
         const IPCPeer& viewer)
      : _diagnostics(std::move(diagnostics)), _operations(std::move(operations)), _viewer(viewer) {}

  const char* interfaceName() const override { return wire::kDiagnosticsInterface; }
  const char* introspection() const override { return wire::kDiagnosticsIntrospection; }

  void handle(IPCIncomingCall& call) override {
    for (const Method& method : kMethods) {
      if (call.member() != method.member.name) continue;
      if (method.isOperation && !_diagnostics->seesAll(_viewer))
        return call.refuse("org.freedesktop.DBus.Error.AccessDenied",
                           "Only root, the daemon's user and the group veskreporting may do this");
      Dictionary request;
      const bool hasRequest = *method.member.arguments != '\0';
      if (hasRequest ? call.read(method.member.arguments, request) : call.read(""))
        call.answer({method.answer(*this, request)});
      return;
    }
    call.refuse("org.freedesktop.DBus.Error.UnknownMethod", "The interface has no such method");
  }

 private:
  struct Method {
    const wire::Member& member;
    bool isOperation;
    Dictionary (*answer)(Object& object, const Dictionary& request);
  };
  static const Method kMethods[9];

  Dictionary openTap(const Dictionary& filter) {
    _tap = nullptr;
    _tap = _diagnostics->openTap(_viewer, filter);
    _patience = booleanForKey(filter, "wait").value_or(true) ? kTapPatience : kTapPatience.zero();
    return _tap ? Dictionary() : problem("too many are looking already");
  }

  Dictionary readTap() {
    if (!_tap) return problem("openTap comes first");
    auto batch = _tap->take(_patience);
    return {{"records", List(std::move(batch.records))}, {"lost", batch.lost}};
  }

  const std::shared_ptr<const Diagnostics> _diagnostics;
  const std::shared_ptr<Operations> _operations;
  const IPCPeer _viewer;
  std::shared_ptr<DeliveryTap::Reader> _tap;
  std::chrono::milliseconds _patience = kTapPatience;
};

const Object::Method Object::kMethods[9] = {
    {wire::kGetStatus, false, [](auto& self, auto&) { return self._diagnostics->status(self._viewer); }},
    {wire::kExplain, false, [](auto& self, auto& request) { return self._diagnostics->explain(request); }},
    {wire::kOpenTap, false, [](auto& self, auto& filter) { return self.openTap(filter); }},
    {wire::kReadTap, false, [](auto& self, auto&) { return self.readTap(); }},
    {wire::kReload, true, [](auto& self, auto&) { return self._operations->reload(); }},
    {wire::kHoldOutbox, true,
     [](auto& self, auto& request) { return self._operations->holdOutbox(request); }},
    {wire::kReadOutbox, true,
     [](auto& self, auto& request) { return self._operations->readOutbox(request); }},
    {wire::kRemoveFromOutbox, true,
     [](auto& self, auto& request) { return self._operations->removeFromOutbox(request); }},
    {wire::kApplyConsent, true, [](auto& self, auto&) { return self._operations->applyConsent(); }},
};

}  // namespace

std::shared_ptr<IPCExportedObject> diagnosticsObject(std::shared_ptr<const Diagnostics> diagnostics,
                                                     std::shared_ptr<Operations> operations,
                                                     const IPCPeer& viewer) {
  return std::make_shared<Object>(std::move(diagnostics), std::move(operations), viewer);
}

}  // namespace vesk

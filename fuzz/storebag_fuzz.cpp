// Property lists as a storebag's settings for an HTTPS backend, which decides its state and takes messages.
#include <cstdint>

#include "backends/BackendFactory.h"
#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "platform/plist/PropertyList.h"
#include "tests/support/BackendHarness.h"

namespace {

using namespace vesk;

struct Harness : test::BackendHarness {
  Harness() {
    SystemLog::setLevel(static_cast<int>(LogLevel::Error));
    setRootPrefix("/nonexistent");  // the machine's own preferences may name a server
  }
};

/// The profile without addresses, so that the input chooses what is sent, but not where.
Value withoutAddresses(const Value& value) {
  if (const List* list = value.list()) {
    std::vector<Value> kept;
    for (const Value& element : *list) kept.push_back(withoutAddresses(element));
    return List(std::move(kept));
  }
  const Dictionary* dictionary = value.dictionary();
  if (!dictionary) return value;
  MutableDictionary kept;
  for (const auto& entry : *dictionary) {
    if (entry.key.view().find("url") == std::string_view::npos)
      kept.set(entry.key, withoutAddresses(entry.value));
  }
  return kept.share();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static Harness harness;
  const auto root = parsePropertyList({reinterpret_cast<const char*>(data), size});
  if (!root) return 0;
  const Value profile = withoutAddresses(*root);
  if (!profile.dictionary()) return 0;
  for (bool knowsUser : {false, true}) {
    auto backend = newBackendWithName(
        "httpPost", *profile.dictionary(),
        {._compType = 5, ._productFamily = Text("Phone"), ._requireUserInfo = knowsUser}, harness.services);
    if (!backend) continue;
    if (knowsUser) backend->setUserInfoDict(Dictionary{{"clientName", "Camera"}, {"serviceName", "Clips"}});
    backend->updateState();
    timeval now{1'700'000'000, 250'000};
    for (std::uint16_t i = 0; i < 4; ++i) {
      (void)backend->sendMessage(Dictionary{{"username", "someone"}, {"count", i}, {"real", 0.5}}, now, i, 1,
                                 i);
    }
    (void)backend->flushMessages();
    backend->cleanup();
  }
  return 0;
}

// A family: an application aggregates what the extensions below it report. Both are in one program here;
// usually each is a process of its own. Client type 6 is one level below 5 in examples/brannic.toml.
#include <VeskReporting/VeskReporting.h>

#include <chrono>
#include <cstdio>
#include <future>
#include <optional>

namespace {

using namespace vesk;
using namespace std::chrono_literals;

/// Families share the names of client and service.
const Dictionary kFamily{{kVeskReportingUserInfoClientName, "Camera"},
                         {kVeskReportingUserInfoServiceName, "Clips"}};

Dictionary member(int clientType, int sessionID) {
  return {{kVeskReportingSessionInfoSessionID, sessionID},
          {kVeskReportingSessionInfoClientType, clientType},
          {kVeskReportingSessionInfoRequireUserInfo, true}};
}

}  // namespace

int main() {
  std::promise<std::string> promise;
  bool isReceived = false;
  // On the session's thread, message by message. Must not take long.
  const auto onMessage = [&](const AggregatedMessage& message) {
    const auto text = message.payload ? message.payload->text("clip") : std::nullopt;
    if (text && !isReceived) promise.set_value(text->string());
    isReceived = isReceived || text;
  };

  VeskReporting application;
  if (application.setSessionInfo(member(5, 1), kFamily, {}, onMessage) != ReportingStatus::Queued) return 1;
  if (!application.startConfig(20s)) return 1;

  VeskReporting extension;
  if (extension.setSessionInfo(member(6, 2), kFamily) != ReportingStatus::Queued) return 1;
  if (!extension.startConfig(20s)) return 1;
  if (!extension.sendMessageAndWait(4, 1, Dictionary{{"clip", "sunset"}})) return 1;

  auto received = promise.get_future();
  if (received.wait_for(10s) != std::future_status::ready) {
    std::fprintf(stderr, "family: the extension's message did not reach the application\n");
    return 1;
  }
  std::printf("the application received: %s\n", received.get().c_str());
}

// A service that measures often and reports in few posts: the daemon holds its events and sends them
// together. The user info has keys of the service's own, which become part of every event. Takes the number
// of measurements.
#include <VeskReporting/VeskReporting.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>

int main(int argc, char** argv) {
  using namespace vesk;
  using namespace std::chrono_literals;
  const int count = argc > 1 ? std::atoi(argv[1]) : 100;

  VeskReporting reporting;
  auto status = reporting.setSessionInfo({{kVeskReportingSessionInfoSessionID, 1},
                                          {kVeskReportingSessionInfoClientType, 5},
                                          {kVeskReportingSessionInfoRequireUserInfo, true},
                                          {kVeskReportingSessionInfoBatchEvent, true}},
                                         Dictionary{{kVeskReportingUserInfoClientName, "Camera"},
                                                    {kVeskReportingUserInfoServiceName, "Focus"},
                                                    {"firmware", "2.4"}});
  // Nothing here waits for the daemon: what is sent before it has started the session waits in the queue.
  if (status == ReportingStatus::Queued) status = reporting.startConfig(nullptr);
  for (int i = 0; i < count && status == ReportingStatus::Queued; ++i) {
    status = reporting.sendMessage(3, 2, Dictionary{{"measurement", i}, {"sharpness", 0.5 + i % 10 * 0.05}});
  }
  if (status != ReportingStatus::Queued) {
    std::fprintf(stderr, "batch: %s\n", describe(status));
    return 1;
  }

  // An alarm should not wait for the batch: flag 1 sends it at once.
  auto alarm = reporting.sendMessageAndWait(
      {{kVeskReportingMessageParametersCategory, 9},
       {kVeskReportingMessageParametersType, 1},
       {kVeskReportingMessageParametersPayload, Dictionary{{"alarm", "lens blocked"}}},
       {kVeskReportingMessageParametersFlag, 1}},
      5s);
  // Before a long pause, what is held can be sent. At its end, a session sends it anyway.
  auto flushed = reporting.flushMessagesAndWait(5s);
  if (!alarm || !flushed) {
    std::fprintf(stderr, "batch: alarm: %s, flush: %s\n", describe(alarm.status), describe(flushed.status));
    return 1;
  }
  std::printf("%d measurements and an alarm, %llu not sent\n", count,
              static_cast<unsigned long long>(reporting.droppedMessages()));
}

// Unit tests of a program that reports: a recorder takes the daemon's place, so that neither a daemon nor a
// network is needed. Any test framework will do; this one uses none.
#include <VeskReporting/testing/Recorder.h>

#include <cstdio>
#include <cstdlib>

namespace {

/// The code under test: part of an application.
class Shutter {
 public:
  Shutter() {
    auto configured =
        _reporting.setSessionInfo(vesk::ReportingSession{.clientType = 5, .clientName = "Camera"});
    auto started = _reporting.startConfig(nullptr);
    if (configured != vesk::ReportingStatus::Queued || started != vesk::ReportingStatus::Queued) {
      std::fprintf(stderr, "not reporting\n");
    }
  }
  void release(double seconds) {
    _isReported = _reporting.sendMessage(3, 1, vesk::Dictionary{{"exposure", seconds}}) ==
                  vesk::ReportingStatus::Queued;
  }

 private:
  vesk::VeskReporting _reporting;
  bool _isReported = false;
};

void expect(bool isTrue, const char* what) {
  if (isTrue) return;
  std::fprintf(stderr, "unit_test: not so: %s\n", what);
  std::exit(1);
}

}  // namespace

int main() {
  vesk::testing::Recorder recorder;
  Shutter shutter;
  shutter.release(0.008);

  const auto messages = recorder.messages();
  expect(recorder.count(VESK_RECORDED_START) == 1, "the session was started");
  expect(messages.size() == 1, "one message was sent");
  expect(messages[0].category == 3 && messages[0].type == 1, "of the shutter's category and type");
  expect(messages[0].payload == vesk::Dictionary{{"exposure", 0.008}}, "with the exposure");
  expect(vesk::booleanForKey(*messages[0].sessionInfo, "requireUserInfo") == true, "user info is required");
  std::puts("passed");
}

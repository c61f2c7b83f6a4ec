#include "client/ClientSession.h"

#include <pthread.h>

#include <algorithm>
#include <csignal>
#include <exception>

#include "client/DrainBudget.h"
#include "client/Recorder.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// While it exists, new threads start with signals blocked, since handling them is up to the host. Signals
// raised by a fault in a callback stay unblocked; otherwise the kernel would kill the process without calling
// the host's handler.
class NoSignals {
 public:
  NoSignals() noexcept {
    sigset_t all;
    ::sigfillset(&all);
    for (int fault : {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGTRAP, SIGABRT, SIGSYS}) ::sigdelset(&all, fault);
    ::pthread_sigmask(SIG_SETMASK, &all, &_before);
  }
  ~NoSignals() { ::pthread_sigmask(SIG_SETMASK, &_before, nullptr); }
  NoSignals(const NoSignals&) = delete;
  NoSignals& operator=(const NoSignals&) = delete;

 private:
  sigset_t _before{};
};

std::thread startThread(const std::shared_ptr<SessionWorker>& worker) {
  NoSignals block;
  std::thread thread([worker] { worker->run(); });
  ::pthread_setname_np(thread.native_handle(), "vesk-reporting");
  return thread;
}

ReportingOptions withSocket(ReportingOptions options, const std::string& path) {
  if (!path.empty()) options.socketPath = path;
  return options;
}

}  // namespace

// Sessions that name no socket of their own connect to the recorder, if there is one.
ClientSession::ClientSession(const ReportingOptions& options)
    : ClientSession(options, options.socketPath.empty() ? Recorder::currentSocket() : std::string()) {}

ClientSession::ClientSession(const ReportingOptions& options, const std::string& recorderSocket)
    : _isRecorded(!recorderSocket.empty()),
      _drainTime(boundedWait(options.drainTime)),
      _worker(std::make_shared<SessionWorker>(withSocket(options, recorderSocket))),
      _thread(startThread(_worker)) {}

ClientSession::~ClientSession() {
  const auto begun = std::chrono::steady_clock::now();
  const auto granted = DrainBudget::shared().grant(_drainTime, begun);
  _worker->queue().close(begun + granted);
  if (isSessionThread()) {
    VESK_LOG_ERROR("VeskReporting: a session was destroyed by one of its callbacks");
    _thread.detach();
    return;
  }
  _thread.join();
  const auto now = std::chrono::steady_clock::now();
  DrainBudget::shared().spend(std::min<std::chrono::steady_clock::duration>(now - begun, granted), now);
}

CallEnd ClientSession::endFor(AnswerKind kind, Callback callback) {
  return [kind, callback = std::move(callback)](ReportingStatus status, BusAnswer* answer,
                                                std::string_view detail) {
    ReportingAnswer result{status};
    try {
      result.detail = detail;
      if (answer && !readAnswer(kind, *answer, result)) {
        result = {ReportingStatus::Refused, "the daemon's answer is of another type"};
      }
    } catch (const std::exception&) {
      // Still calls the callback, but without the text or without the answer.
      result = {answer ? ReportingStatus::OutOfResources : status};
    }
    callback(result);
  };
}

}  // namespace vesk

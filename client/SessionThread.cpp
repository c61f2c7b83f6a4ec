#include "client/SessionThread.h"

#include <pthread.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <system_error>

#include "client/BoundedWait.h"
#include "client/DrainBudget.h"
#include "client/ProcessMark.h"
#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

// While it lives, threads that are started take no signals: those are the host's business. Only what a fault
// in a callback raises stays as it is: the kernel would end the process past the host's handler.
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

std::shared_ptr<SessionWorker> makeWorker(const ReportingOptions& options) {
  auto worker = std::make_shared<SessionWorker>(options);
  if (!worker->queue().isUsable()) throw std::system_error(errno, std::generic_category(), "socketpair");
  return worker;
}

}  // namespace

SessionThread::SessionThread(const ReportingOptions& options)
    : _mark(processMark()),
      _drainTime(boundedWait(options.drainTime)),
      _worker(makeWorker(options)),
      _thread(startThread(_worker)) {}

SessionThread::~SessionThread() {
  const auto begun = std::chrono::steady_clock::now();
  const auto granted = DrainBudget::shared().grant(_drainTime, begun);
  _worker->stop(begun + granted);
  if (isCurrent()) {
    VESK_LOG_ERROR("VeskReporting: a session was destroyed by one of its callbacks");
    _thread.detach();
  } else {
    _thread.join();
    const auto now = std::chrono::steady_clock::now();
    DrainBudget::shared().spend(std::min<std::chrono::steady_clock::duration>(now - begun, granted), now);
  }
}

bool SessionThread::isOurs() const noexcept { return _mark == processMark(); }

}  // namespace vesk

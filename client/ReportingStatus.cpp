#include <VeskReporting/VeskReportingTypes.h>

namespace vesk {

const char* describe(ReportingStatus status) noexcept {
  switch (status) {
    case ReportingStatus::Done:
      return "done";
    case ReportingStatus::Queued:
      return "queued";
    case ReportingStatus::QueueFull:
      return "too much waits to be sent";
    case ReportingStatus::NotConnected:
      return "no connection to the daemon";
    case ReportingStatus::TimedOut:
      return "no answer in time";
    case ReportingStatus::Refused:
      return "refused by the daemon";
    case ReportingStatus::InvalidArgument:
      return "too large, nested too deeply or no valid text";
    case ReportingStatus::FileUnavailable:
      return "the file can't be opened";
    case ReportingStatus::ForkedProcess:
      return "the session belongs to the parent process";
    case ReportingStatus::OnSessionThread:
      return "a callback must not wait";
    case ReportingStatus::Closed:
      return "the session was closed";
    case ReportingStatus::OutOfResources:
      return "out of memory, descriptors or threads";
    case ReportingStatus::TooManyConnections:
      return "too many connections";
  }
  return "unknown";
}

}  // namespace vesk

#include "platform/service/Journal.h"

// Every line would have the same source location.
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

namespace vesk {

void writeToJournal(LogLevel level, const std::string& line, const std::string& processName,
                    const std::string& facility) {
  sd_journal_send("MESSAGE=%s", line.c_str(), "PRIORITY=%i", static_cast<int>(level), "SYSLOG_IDENTIFIER=%s",
                  processName.c_str(), "VESK_FACILITY=%s", facility.c_str(), nullptr);
}

}  // namespace vesk

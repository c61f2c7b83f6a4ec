// The system's journal.
#pragma once

#include <string>

#include "platform/log/LogLevel.h"

namespace vesk {

/// Writes one line to the journal, with the process's name and facility. Use with SystemLog::setJournal.
void writeToJournal(LogLevel level, const std::string& line, const std::string& processName,
                    const std::string& facility);

}  // namespace vesk

// The levels of log lines.
#pragma once

namespace vesk {

/// The values are syslog priorities.
enum class LogLevel : int { Error = 3, Warning = 4, Info = 6, Debug = 7 };

}  // namespace vesk

#include <VeskReporting/VeskLog.h>

#include <memory>
#include <string_view>

#include "platform/log/SystemLog.h"

void vesk_log_start(const char* process, const char* facility) {
  try {
    vesk::SystemLog::open(process ? process : "", facility ? facility : "");
  } catch (...) {
    // Out of memory: lines are logged without the names.
  }
}

void vesk_log_close() { vesk::SystemLog::close(); }

void vesk_log_set_level(std::int32_t level) { vesk::SystemLog::setLevel(level); }

void vesk_log_set_sink(vesk_log_sink sink, void (*release)(void* context), void* context) {
  try {
    const std::shared_ptr<void> kept(
        context, release ? release : [](void*) {});
    if (!sink) return vesk::SystemLog::setSink(nullptr);
    vesk::SystemLog::setSink([sink, kept](vesk::LogLevel level, std::string_view line) {
      sink(kept.get(), static_cast<std::int32_t>(level), line.data(), line.size());
    });
  } catch (...) {
    // Out of memory: the previous sink stays, and the context was released.
  }
}

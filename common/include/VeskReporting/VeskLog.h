/* The log of a process that uses the library, for C99 and later.
 *
 * Lines have the syslog priorities 3 (error), 4 (warning), 6 (info) and 7 (debug). They go to the journal if
 * standard error is connected to it, otherwise to standard error. Thread-safe. */
#ifndef VESKREPORTING_VESKLOG_H
#define VESKREPORTING_VESKLOG_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Marks what the shared library exports. */
#define VESK_API __attribute__((visibility("default")))

/* Sets the names of the process and of its logging part. Call once, at start-up. */
VESK_API void vesk_log_start(const char* process, const char* facility);
VESK_API void vesk_log_close(void);
/* Lines with a higher number are not formatted. Default: 6. */
VESK_API void vesk_log_set_level(int32_t level);

/* Receives a line, which is not NUL-terminated, on the thread that logs. Must not log. */
typedef void (*vesk_log_sink)(void* context, int32_t level, const char* line, size_t length);
/* Sends every line to `sink` instead; a null sink restores the default. `release`, if not null, is called
 * with the context once the sink is no longer used, also if memory runs out and the previous sink stays. */
VESK_API void vesk_log_set_sink(vesk_log_sink sink, void (*release)(void* context), void* context);

#ifdef __cplusplus
}
#endif

#endif

/* The adaptor through which veskreportingd passes messages to a device's wireless diagnostics.
 *
 * An adaptor is a shared library in the daemon's adaptor bundle. It exports one C function, WrenAdaptor,
 * which creates an adaptor: a table of operations that the daemon finds by name. docs/adaptor.md says where
 * to install the library and what it may do. For C99 and later, and C++. */
#ifndef VESKREPORTING_WRENADAPTOR_H
#define VESKREPORTING_WRENADAPTOR_H

#include <VeskReporting/VeskValues.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define VESK_WREN_ADAPTOR_VERSION 1u

/* A message's payload is a read-only view. Everything reachable from it belongs to the daemon and is valid
 * until the operation that received it returns. An adaptor that needs it longer must copy it. */

/* ---- Adaptor --------------------------------------------------------------------------------------------
 */

typedef struct VeskWrenAdaptor VeskWrenAdaptor;

/* Cast to the function type that belongs to the operation's name. */
typedef void (*VeskWrenFunction)(void);

typedef struct VeskWrenOperation {
  const char* name;
  VeskWrenFunction function;
} VeskWrenOperation;

/* The only operation that the daemon calls. */
#define VESK_WREN_SEND_MESSAGE "sendMessageWithMethod:respCode:dict:"
typedef void (*VeskWrenSendMessage)(VeskWrenAdaptor* adaptor, uint16_t method, uint16_t respCode,
                                    const VeskDictionaryView* dict); /* never null */

/* Usually the first member of the adaptor's own, larger structure. Must not change until it is released. */
struct VeskWrenAdaptor {
  uint32_t version;                          /* VESK_WREN_ADAPTOR_VERSION */
  const char* description;                   /* for log lines; may be null */
  const VeskWrenOperation* operations;       /* ends with a null name; may be null */
  void (*release)(VeskWrenAdaptor* adaptor); /* the last call; may be null */
};

/* What the daemon offers. Valid, with everything in it, until the adaptor has been released. */
typedef struct VeskWrenHost {
  uint32_t version;                         /* VESK_WREN_ADAPTOR_VERSION of the daemon */
  const char* stateDirectory;               /* where the daemon's sandbox lets an adaptor store files */
  void (*log)(int level, const char* line); /* 3 error, 4 warning, 6 info, 7 debug; thread-safe */
} VeskWrenHost;

/* The name and type of the function that the library exports. It returns an adaptor for one session, or null
 * if it can't create one. The daemon makes one call at a time to a session's adaptor; adaptors of different
 * sessions may run concurrently. */
#define VESK_WREN_ADAPTOR_FACTORY "WrenAdaptor"
typedef VeskWrenAdaptor* (*VeskWrenAdaptorFactory)(const VeskWrenHost* host);

#if defined(__GNUC__)
__attribute__((visibility("default")))
#endif
VeskWrenAdaptor*
WrenAdaptor(const VeskWrenHost* host);

#ifdef __cplusplus
}
#endif

#endif

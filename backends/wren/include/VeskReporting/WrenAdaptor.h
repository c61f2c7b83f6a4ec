/* The adaptor through which veskreportingd hands messages to a device's wireless diagnostics.
 *
 * An adaptor is a shared library in the daemon's adaptor bundle. It exports one C function, WrenAdaptor,
 * which makes an adaptor: a table of operations that the daemon finds by their names. docs/adaptor.md says
 * where the library goes and what it may do. For C99 and later, and C++. */
#ifndef VESKREPORTING_WRENADAPTOR_H
#define VESKREPORTING_WRENADAPTOR_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define VESK_WREN_ADAPTOR_VERSION 1u

/* ---- Payloads -------------------------------------------------------------------------------------------
 * What a message says, for reading only. Everything that can be reached from a view belongs to the daemon and
 * is gone when the operation that got the view returns: an adaptor that needs it longer copies it. */

enum VeskValueKind {
  VeskValueNone = 0, /* the null marker */
  VeskValueBoolean,
  VeskValueSigned,
  VeskValueUnsigned,
  VeskValueDouble,
  VeskValueText,
  VeskValueBytes,
  VeskValueDate,
  VeskValueList,
  VeskValueDictionary
};

typedef struct VeskValueView VeskValueView;
typedef struct VeskEntryView VeskEntryView;

/* Texts are UTF-8 without NUL inside; no NUL follows them. `data` may be null when `length` is 0. */
typedef struct VeskTextView {
  const char* data;
  size_t length; /* bytes */
} VeskTextView;

typedef struct VeskListView {
  const VeskValueView* values;
  size_t count;
} VeskListView;

/* Keys are unique and stand in the order in which the client gave them. */
typedef struct VeskDictionaryView {
  const VeskEntryView* entries;
  size_t count;
} VeskDictionaryView;

/* Skip a value whose kind is not known: later versions may add some. Lists and dictionaries are at most 64
 * levels deep. */
struct VeskValueView {
  uint32_t kind; /* an enum VeskValueKind */
  union {
    int boolean; /* 0 or 1 */
    int64_t signedInteger;
    uint64_t unsignedInteger;
    double real;
    double secondsSince1970; /* a date; any double */
    VeskTextView text;
    VeskTextView bytes; /* any bytes */
    VeskListView list;
    VeskDictionaryView dictionary;
  } as;
};

struct VeskEntryView {
  VeskTextView key;
  VeskValueView value;
};

/* ---- Adaptor --------------------------------------------------------------------------------------------
 */

typedef struct VeskWrenAdaptor VeskWrenAdaptor;

/* Cast to the type that belongs to the operation's name. */
typedef void (*VeskWrenFunction)(void);

typedef struct VeskWrenOperation {
  const char* name;
  VeskWrenFunction function;
} VeskWrenOperation;

/* The one operation that the daemon calls. */
#define VESK_WREN_SEND_MESSAGE "sendMessageWithMethod:respCode:dict:"
typedef void (*VeskWrenSendMessage)(VeskWrenAdaptor* adaptor, uint16_t method, uint16_t respCode,
                                    const VeskDictionaryView* dict); /* never null */

/* Usually the first member of a larger structure of the adaptor's own. Must stay as it is until it is
 * released. */
struct VeskWrenAdaptor {
  uint32_t version;                          /* VESK_WREN_ADAPTOR_VERSION */
  const char* description;                   /* for log lines; may be null */
  const VeskWrenOperation* operations;       /* ends with one whose name is null; may be null */
  void (*release)(VeskWrenAdaptor* adaptor); /* may be null; the last call that it gets */
};

/* What the daemon offers. It and all that is in it last until the adaptor was released. */
typedef struct VeskWrenHost {
  uint32_t version;                         /* VESK_WREN_ADAPTOR_VERSION of the daemon */
  const char* stateDirectory;               /* where the daemon's sandbox lets an adaptor keep files */
  void (*log)(int level, const char* line); /* 3 error, 4 warning, 6 information, 7 debugging; any thread */
} VeskWrenHost;

/* The name and the type of the function that the library exports. It makes an adaptor for one session, or
 * null when it can't; the daemon has a session's adaptor do one thing at a time, those of different sessions
 * may be at work at once. */
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

/* Views of dynamic values: what clients send and what adaptors receive. For C99 and later, and C++.
 *
 * A view owns nothing. Whoever receives one may read it until the function that received it returns. */
#ifndef VESKREPORTING_VESKVALUES_H
#define VESKREPORTING_VESKVALUES_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

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

/* UTF-8 text without NUL; not NUL-terminated. `data` may be null if `length` is 0. */
typedef struct VeskTextView {
  const char* data;
  size_t length; /* bytes */
} VeskTextView;

typedef struct VeskListView {
  const VeskValueView* values;
  size_t count;
} VeskListView;

/* Keys are unique and keep their order. */
typedef struct VeskDictionaryView {
  const VeskEntryView* entries;
  size_t count;
} VeskDictionaryView;

/* Skip values of unknown kinds when you read, since later versions may add some. They nest at most 64 levels
 * deep. What clients send may have 42 dictionaries inside each other, or 61 lists. */
struct VeskValueView {
  uint32_t kind; /* an enum VeskValueKind */
  union {
    int boolean; /* 0 or 1 */
    int64_t signedInteger;
    uint64_t unsignedInteger;
    double real;
    double secondsSince1970; /* a date; may be any double */
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

#ifdef __cplusplus
}
#endif

#endif

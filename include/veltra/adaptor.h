/* SPDX-License-Identifier: Apache-2.0 */
/* The interface of an adaptor bundle: it exports one table, `veltra_adaptor`, with its classes by name and
 * their operations by selector. See docs/adaptor.md for how to build and install a bundle, and
 * examples/adaptor.c for a complete one.
 *
 * Threads: functions of different instances may run at the same time on different threads, those of one
 * instance never do. An operation runs on the thread of the session that sends the message, which has a stack
 * of 256 KiB; the session's client waits until it returns.
 */
#ifndef VELTRA_ADAPTOR_H
#define VELTRA_ADAPTOR_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* The version of this header. The daemon refuses tables of other versions. */
#define VELTRA_ADAPTOR_VERSION 1

/* The class and the operation that the daemon looks for. */
#define VELTRA_ADAPTOR_CLASS "MivoAdaptor"
#define VELTRA_ADAPTOR_SEND "sendMessageWithMethod:respCode:dict:"

/* ---- The payload: a tree of values, at most 64 levels deep and valid until the operation returns ---- */

typedef enum veltra_adaptor_type {
  VELTRA_ADAPTOR_BOOLEAN = 1,
  VELTRA_ADAPTOR_SIGNED = 2,
  VELTRA_ADAPTOR_UNSIGNED = 3,
  VELTRA_ADAPTOR_REAL = 4,
  VELTRA_ADAPTOR_STRING = 5,
  VELTRA_ADAPTOR_DATE = 6,
  VELTRA_ADAPTOR_DATA = 7,
  VELTRA_ADAPTOR_ARRAY = 8,
  VELTRA_ADAPTOR_DICTIONARY = 9,
} veltra_adaptor_type;

typedef struct veltra_adaptor_value veltra_adaptor_value;
typedef struct veltra_adaptor_entry veltra_adaptor_entry;

struct veltra_adaptor_value {
  veltra_adaptor_type type;
  size_t count; /* of bytes in a string (without its NUL) or data, of items, or of entries; else 0 */
  union {
    bool boolean;
    int64_t signed_integer;
    uint64_t unsigned_integer;
    double real;        /* for a date: seconds since 1970 */
    const char* string; /* UTF-8 with a terminating NUL; may contain others */
    const void* data;
    const veltra_adaptor_value* items;   /* of an array */
    const veltra_adaptor_entry* entries; /* of a dictionary, in ascending order of the keys' bytes */
  } as;
};

struct veltra_adaptor_entry {
  const char* key; /* as a string */
  size_t key_length;
  veltra_adaptor_value value;
};

/* ---- The table ---- */

/* `dict` is a dictionary, or NULL if the message has no payload. */
typedef void (*veltra_adaptor_function)(void* instance, uint16_t method, uint16_t resp_code,
                                        const veltra_adaptor_value* dict);

typedef struct veltra_adaptor_operation {
  const char* selector;
  veltra_adaptor_function function;
} veltra_adaptor_operation;

typedef struct veltra_adaptor_class {
  const char* name;
  void* (*create)(void); /* returns an instance, or NULL on failure */
  void (*destroy)(void* instance);
  size_t operation_count;
  const veltra_adaptor_operation* operations;
} veltra_adaptor_class;

typedef struct veltra_adaptor_bundle {
  uint32_t version; /* VELTRA_ADAPTOR_VERSION; the first field in every version */
  size_t class_count;
  const veltra_adaptor_class* classes;
} veltra_adaptor_bundle;

/* Defined by the bundle. */
extern __attribute__((visibility("default"))) const veltra_adaptor_bundle veltra_adaptor;

#ifdef __cplusplus
}
#endif

#endif

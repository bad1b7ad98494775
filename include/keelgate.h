/* SPDX-License-Identifier: Apache-2.0 */
/**
 * Keelgate for C and for languages that call C: hands untrusted messages to a sandboxed service and
 * gets JSON back.
 *
 *     char *sentence = NULL;
 *     keelgate_client *client = keelgate_open(NULL, &sentence);
 *     char *reply = NULL;
 *     int status = keelgate_unpack(client, "PulseUserPayload", message, length, &reply);
 *     ...
 *     keelgate_free(reply);
 *     keelgate_close(client);
 *
 * No byte of a message is parsed in the calling process, and no exception leaves these functions.
 * Strings are UTF-8 and null-terminated. Those that the library allocates belong to the caller, who
 * frees them with keelgate_free.
 *
 * Unless stated otherwise, a function may be called from several threads at once, also with the
 * same client.
 */
#ifndef KEELGATE_H
#define KEELGATE_H

#include <stddef.h>
#include <stdint.h>

#if defined(__GNUC__)
#define KEELGATE_C_API __attribute__((visibility("default")))
#else
#define KEELGATE_C_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/** A running service. */
typedef struct keelgate_client keelgate_client;

/** What the functions that unpack return. */
enum {
  /** The reply holds a record. */
  KEELGATE_RECORD = 0,
  /** The message was rejected; the reply holds the error. */
  KEELGATE_REJECTED = 1,
  /** An unknown record, or a null pointer where none is allowed; there is no reply. */
  KEELGATE_WRONG_USE = 2,
  /** The host gave the message up; the reply holds the error. */
  KEELGATE_GIVEN_UP = 3
};

/**
 * The settings of a client. keelgate_options_init fills them in, so that a program that was built
 * with an older header works with a newer library: `size` says which fields the caller knows.
 */
typedef struct keelgate_options {
  size_t size;
  /** The path of the VespKeelgateService to start; NULL stands for the installed one. */
  const char* service_path;
  /** The path of an activated service's socket, used instead of starting one; or NULL. */
  const char* socket;
  /** How many messages are processed at the same time; 0 stands for the number of processors. */
  unsigned processes;
  /** How many messages a process may see before a fresh one takes its place; 0 counts as 1. */
  size_t messages_per_process;
  /** In bytes. A larger message is refused before anything is sent. */
  size_t max_message;
  /** In milliseconds, from the call until the reply; 0 lets every message time out. */
  unsigned time_limit_ms;
  /** If not 0, refuse to run where namespaces or Landlock are missing. */
  int require_layers;
} keelgate_options;

/**
 * Sets the defaults. `size` is sizeof(keelgate_options) as the caller knows it; nothing beyond it
 * is written.
 */
KEELGATE_C_API void keelgate_options_init(keelgate_options* options, size_t size);

/**
 * Starts a service, which has 10 s to get ready. `options` may be NULL for the defaults, and is not
 * needed after the call. On failure it returns NULL and sets `*error` to a sentence that says what
 * to do about it; otherwise it sets `*error` to NULL. `error` may be NULL.
 */
KEELGATE_C_API keelgate_client* keelgate_open(const keelgate_options* options, char** error);

/**
 * Unpacks the `length` bytes at `message`, which may be NULL if `length` is 0. `record` is a name
 * that `keelgate unpack --help` lists, e.g. "PulseUserPayload". Sets `*reply` to the reply object
 * as compact JSON, or to NULL with KEELGATE_WRONG_USE.
 */
KEELGATE_C_API int keelgate_unpack(keelgate_client* client, const char* record, const void* message,
                                   size_t length, char** reply);

/** The same for "PropertyList", with the type of each value, so that nothing is lost. */
KEELGATE_C_API int keelgate_unpack_typed(keelgate_client* client, const void* message,
                                         size_t length, char** reply);

/** The same for a client message, which comes with the service and command that it arrived under.
 */
KEELGATE_C_API int keelgate_unpack_client_message(keelgate_client* client, const char* service,
                                                  uint64_t command, const void* message,
                                                  size_t length, char** reply);

/** Frees a string that the library returned. NULL is allowed. */
KEELGATE_C_API void keelgate_free(char* text);

/** Ends the service within 200 ms. No call may be under way. NULL is allowed. */
KEELGATE_C_API void keelgate_close(keelgate_client* client);

/** The version of the library, e.g. "0.1.0". Must not be freed. */
KEELGATE_C_API const char* keelgate_version(void);

#ifdef __cplusplus
}
#endif

#endif

/* SPDX-License-Identifier: Apache-2.0 */
#pragma once

/* CGI session library: the appliance's store of login sessions. */

#include <stddef.h>

#define OVRA_CGI_EXPORT __attribute__((visibility("default")))

struct json_object;

/* Size of the user field of the login record, the closing NUL included. */
enum { OVRA_CGI_USER_SIZE = 492 };

/* Fields of a session record. */
enum {
    OVRA_CGI_FIELD_USER = 1,
    OVRA_CGI_FIELD_SID = 2,
    OVRA_CGI_FIELD_APP = 13,
    OVRA_CGI_FIELD_EXTRA = 14
};

/* Options of a login. The value is passed by address: a pointer to an int, or the text itself. */
enum {
    OVRA_CGI_OPT_SKIP_PASSWORD = 1, /* int, not 0: the caller has authenticated the user by other
                                       means; OvraCgiLoginNoAuth needs it */
    OVRA_CGI_OPT_MULTIPLE = 3,      /* int, not 0: further sessions of the user stay as they are;
                                       otherwise those of the same application end */
    OVRA_CGI_OPT_APP = 7,           /* text: the application that the session belongs to */
    OVRA_CGI_OPT_EXTRA = 9,         /* text of a JSON object, at most 4096 bytes, kept with the
                                       session */
    OVRA_CGI_OPT_TIMEOUT = 10,      /* int: seconds until the session ends; negative: never; 0 is
                                       refused; an hour when it is not set */
    OVRA_CGI_OPT_UI = 11            /* text of a JSON object, at most 4096 bytes: how the user's
                                       page shows the session */
};

#ifdef __cplusplus
extern "C" {
#endif

/* An opened store and the login record to fill. The caller owns the struct. */
typedef struct OvraCgi {
    char user[OVRA_CGI_USER_SIZE];
    struct OvraCgiStore *store;
} OvraCgi;

/* Opens the store. name: always "". A handle serves one thread. Returns 0 on success; a handle that
 * failed to open is safe to use (everything fails) and must be freed like any other. */
OVRA_CGI_EXPORT int OvraCgiInit(const char *name, OvraCgi *handle);
OVRA_CGI_EXPORT void OvraCgiFree(OvraCgi *handle);

/* Sets a login option; the value is copied. Returns 0 on failure. */
OVRA_CGI_EXPORT int OvraCgiSetOption(OvraCgi *handle, int option, const void *value);
/* JSON text of an object; valid for ever. */
OVRA_CGI_EXPORT const char *OvraCgiLoginUIJsonConfigTemplate(void);
/* Creates a session for handle->user and writes its id (at most 100 bytes with the closing NUL)
 * into sid. client: the numeric address to record; null takes that of OvraCgiGetRemoteIP. Returns 1
 * on success. */
OVRA_CGI_EXPORT int OvraCgiLoginNoAuth(OvraCgi *handle, char *sid, size_t size, const char *client);

/* Calls test(record, argument) for every live session and then removes, in one step, those for
 * which it returned 0. The record is valid during the call only. The store is not locked meanwhile:
 * test may use it. Returns 0 on success; otherwise nothing is removed. */
typedef int (*OvraCgiTest)(struct json_object *record, void *argument);
OVRA_CGI_EXPORT int OvraCgiRemoveSessionByFunc(OvraCgi *handle, OvraCgiTest test, void *argument);
/* Removes the session whose field equals value; field: OVRA_CGI_FIELD_SID, no other. Returns 0 on
 * success, also if there was none. */
OVRA_CGI_EXPORT int OvraCgiRemoveSessionByIndex(OvraCgi *handle, int field, const char *value);
/* Finds a live session; *record is then owned by the caller (json_object_put). Returns 1 if found.
 */
OVRA_CGI_EXPORT int OvraCgiGetSessionBySID(OvraCgi *handle, const char *sid,
                                           struct json_object **record);
/* Copies a field's text. Returns non-zero on success; 0 when absent or longer than the buffer. */
OVRA_CGI_EXPORT int OvraCgiJsonRecordGet(struct json_object *record, int field, char *buffer,
                                         size_t size);
/* The numeric address of the web client that the calling thread serves, else the environment
 * variable REMOTE_ADDR. Returns its length, or -1 if there is no client. */
OVRA_CGI_EXPORT int OvraCgiGetRemoteIP(char *buffer, size_t size);

#ifdef __cplusplus
}
#endif

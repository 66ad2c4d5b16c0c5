/* SPDX-License-Identifier: Apache-2.0 */
#pragma once

/* Core utilities: key-value files, serial number, host name, programs with a pipe. */

#include <stdio.h>

#define OVRA_CORE_EXPORT __attribute__((visibility("default")))

#ifdef __cplusplus
extern "C" {
#endif

/* Non-zero if the file exists. */
OVRA_CORE_EXPORT int OLIBCFileExist(const char *path);
/* Reads the value of a key (lines key=value or key="value"; # starts a comment). flag: 0. Returns
 * its length; -1 if the file or the key is missing or the value does not fit. */
OVRA_CORE_EXPORT int OLIBCFileGetKeyValue(const char *path, const char *key, char *buffer, int size,
                                          int flag);
/* Replaces or adds a key, keeping the other lines. The file is rewritten and renamed, so that a
 * crash leaves the old one or the new one. format takes key and value, e.g. "%s=\"%s\"\n"; a value
 * that would not read back unchanged is rejected. Returns a negative number on failure. */
OVRA_CORE_EXPORT int OLIBCFileSetKeyValue(const char *path, const char *key, const char *value,
                                          const char *format);
/* The appliance's serial number. Returns its length, or a negative number. */
OVRA_CORE_EXPORT int OLIBGetSerialNumber(char *buffer, int size);
/* The host name. Returns its length, or a negative number. */
OVRA_CORE_EXPORT int OVRALnxGetHostname(char *buffer, int size);

/* Runs a program with the given arguments (NULL-terminated), without a shell. mode "r": the stream
 * reads its standard output. Returns null if it cannot be started. */
OVRA_CORE_EXPORT FILE *OLIBCPopen(const char *path, const char *mode, ...);
/* Closes the stream and waits for the program. Returns the wait status, or -1. */
OVRA_CORE_EXPORT int OLIBCPclose(FILE *stream);

#ifdef __cplusplus
}
#endif

/* Observation events: one line per user action, written to the system log
 * (and, on a simulated host, to the host's observation log). */
#pragma once

#include <cstdarg>

/* Opens the library; 0 on success, otherwise an error number. */
int ObzUserLib_Init(void);
/* Adds one event; format is printf-style. Requires a successful init; 0 on
 * success, otherwise an error number. */
int ObzUserLib_AddObz(const char* format, ...) __attribute__((format(printf, 1, 2)));
int ObzUserLib_VAddObz(const char* format, va_list args);
/* Closes the library; a later add needs a new init. */
void ObzUserLib_Close(void);

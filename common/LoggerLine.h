#pragma once
// Formatting of one log line, apart from where the line goes.
//
//   2026-11-22 22:51:18.123456 -T- [tid] function (file:line) message\n
//
// The time is local time. Each thread keeps the date and time of its last second and its thread
// id, so the time zone is consulted (under the C library's lock) once a second per thread, not per
// line. Any thread; no shared state is written.

#include <cstdarg>
#include <cstddef>

// Formats one line into apBuffer (aCapacity bytes, at least 128) and returns its length, the final
// newline included. The message is cut to fit, trailing newlines are dropped and inner ones become
// spaces. Never writes past aCapacity; no terminating NUL is added.
size_t QNFormatLogLine(char* apBuffer, size_t aCapacity, const char* apTag, unsigned int aLine,
                       const char* apFunction, const char* apFile, const char* apFormat, va_list aArgs);

// The same from variable arguments.
size_t QNFormatLogLineV(char* apBuffer, size_t aCapacity, const char* apTag, unsigned int aLine,
                        const char* apFunction, const char* apFile, const char* apFormat, ...)
    __attribute__((format(printf, 7, 8)));

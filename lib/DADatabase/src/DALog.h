#ifndef DALOG_H
#define DALOG_H

// The library's one way of writing a log line: "%s: %s(%d) > message" with
// the source file's base name, the function name and the line, under the
// logger's tag on the main buffer. The format reaches __dlog_print as a
// literal, so the compiler checks every argument against it.

#include <cstring>

#include "DALogger.h"
#include "dlog.h"

// Base name of a source path, for the file field.
inline const char* DASourceFileName(const char* path)
{
    const char* slash = std::strrchr(path, '/');
    return slash != nullptr ? slash + 1 : path;
}

#ifdef __FILE_NAME__
#define DA_FILE_NAME __FILE_NAME__
#else
#define DA_FILE_NAME DASourceFileName(__FILE__)
#endif

// The line with every field given: for helpers that log on behalf of an
// operation in another source file.
#define DA_LOG_WHERE(prio, file, func, line, fmt, ...)                                                                 \
    __dlog_print(LOG_ID_MAIN, (prio), DALogger::GetInstance()->GetLogTag(), "%s: %s(%d) > " fmt, (file), (func),       \
                 (line), ##__VA_ARGS__)

// For helpers that log on behalf of another function of the same file.
#define DA_LOG_AT(prio, func, fmt, ...) DA_LOG_WHERE(prio, DA_FILE_NAME, func, __LINE__, fmt, ##__VA_ARGS__)

#define DA_LOG(prio, fmt, ...) DA_LOG_AT(prio, __func__, fmt, ##__VA_ARGS__)

#endif  // DALOG_H

/**
 * @file dlog.h
 * dlog.h - the platform log, as this library and its tests see it.
 *
 * __dlog_print() formats one line and hands it to the current sink. The
 * default sink writes "P/TAG: text" to standard error, one write per line,
 * where P is the priority letter (V D I W E F). Lines never interleave: the
 * whole line is formatted first and sinks are called one at a time.
 * Long lines are never cut: a line too large for the stack buffer is
 * formatted again into one of exactly its size.
 *
 * __dlog_print is an ordinary exported function of libdlog.so, so a program
 * may define its own __dlog_print and the dynamic linker will bind the
 * libraries' calls to it.
 */
#ifndef DLOG_H
#define DLOG_H

#ifdef __cplusplus
extern "C" {
#endif

/** Log buffers. The library writes to the main buffer only. */
typedef enum { LOG_ID_MAIN = 0, LOG_ID_RADIO, LOG_ID_SYSTEM, LOG_ID_APPS, LOG_ID_MAX } log_id_t;

/** Priorities. The library uses DLOG_INFO (4), DLOG_WARN (5), DLOG_ERROR (6). */
typedef enum {
    DLOG_UNKNOWN = 0,
    DLOG_DEFAULT,
    DLOG_VERBOSE,
    DLOG_DEBUG,
    DLOG_INFO,
    DLOG_WARN,
    DLOG_ERROR,
    DLOG_FATAL,
    DLOG_SILENT,
    DLOG_PRIO_MAX
} log_priority;

/**
 * Formats fmt with its arguments (printf rules) and delivers the line under
 * tag and priority prio. Returns the length of the formatted text, or a
 * negative value when fmt is null or formatting fails (nothing is written).
 */
int __dlog_print(log_id_t log_id, int prio, const char* tag, const char* fmt, ...)
    __attribute__((format(printf, 4, 5)));

/**
 * Receives every formatted line: the log id, the priority, the tag (never
 * null; "" when none was given) and the text, NUL-terminated, without a
 * trailing newline. Called with no other sink call in progress.
 */
typedef void (*dlog_sink_t)(int log_id, int prio, const char* tag, const char* text, void* user);

/**
 * Replaces the sink. A null sink restores the default (standard error).
 * user is passed back to every call of sink. Safe to call at any time from
 * any thread: a line being delivered finishes with the old sink.
 */
void dlog_set_sink(dlog_sink_t sink, void* user);

/** A sink that drops every line, for programs that want the log silent. */
void dlog_discard_sink(int log_id, int prio, const char* tag, const char* text, void* user);

#ifdef __cplusplus
}
#endif

#endif /* DLOG_H */

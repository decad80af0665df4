#ifndef KOVA_BASE_LOG_LINE_H
#define KOVA_BASE_LOG_LINE_H

/// @file The one place that writes the library's lines to the system log.
///
///     Log::error(kModule, 395, "mkdir %s path failed. %m", root.c_str());
///     // LOG_ERR "(812) [err] path/path_util:395 mkdir /tmp/kovabackup path failed. ..."
///
/// In the field, messages are identified by their module path and number. A number belongs to its
/// message and is not a source line: it is a literal at the call and stays when the code moves.
///
/// Failure:   none is reported. A line that cannot be built completely is truncated, for example
///            when memory runs out.
/// errno:     "%m" prints errno as it was at the call; errno is unchanged afterwards.
/// Threads:   as syslog(3): any thread.
/// Process:   opens the system log's socket on first use, as syslog(3) does.

namespace KOVA::Base::Log {

/// Writes a failure at LOG_ERR: "(<pid>) [err] <module>:<number> <text>".
void error(const char *module, int number, const char *format, ...)
    __attribute__((format(printf, 3, 4)));

/// Writes a trace at LOG_DEBUG: "(<pid>) [debug] <module>:<number> <text>".
void debug(const char *module, int number, const char *format, ...)
    __attribute__((format(printf, 3, 4)));

/// Writes "<module>:<number> <text>" at the given priority, without pid and tag. For the three
/// messages that have always been written this way, and for no others.
void bare(int priority, const char *module, int number, const char *format, ...)
    __attribute__((format(printf, 4, 5)));

} // namespace KOVA::Base::Log

#endif

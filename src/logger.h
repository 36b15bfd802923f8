// The log: patchlogs/orvpatch.log under the home, or standard output when PATCH_DEBUG is set.
//
// Every line is one open, one write and one close, so that it is in the file even when the tool is killed,
// and so that other programs may move the file between two lines. Sources log only through the macros below,
// after defining LOG_COMPONENT, the name of the unit in the log; it has no default on purpose. Nothing here
// ever stops a run: a line that cannot be written is reported on standard error (LOG_CANT_WRITE) and dropped.
#pragma once

#include <cstdarg>
#include <functional>
#include <string>
#include <string_view>

#include "nls.h"

/// Level of a line; every level is written.
enum logger_level { LEVEL_ERROR = 0, LEVEL_INFO = 1, LEVEL_TRACE = 2 };

extern std::string glbLogFileName; ///< full path of the log; empty when logging to standard output
extern bool glbLogToSTDOUT;        ///< PATCH_DEBUG was set, even to nothing
extern int glbCurLine;             ///< source line of the log call that follows

/// Chooses the destination (making patchlogs, mode 0755, when missing) and writes the header block.
/// Needs the home in the environment; called once, before any other log call.
void logInit();

/// Takes each finished text, a line with its line end, in place of the log file or standard output.
using LogSink = std::function<void(std::string_view text)>;

/// Redirects the log to `sink`; an empty one puts it back to where logInit sent it. Returns the sink before.
/// A program that reads a home but must not write to its log uses this in place of logInit.
LogSink setLogSink(LogSink sink);

/// Stores the source line that the next log call shows in its prefix.
void setLine(int line);

void logError(const char *component, const char *format, ...) __attribute__((format(printf, 2, 3)));
void logInfo(const char *component, const char *format, ...) __attribute__((format(printf, 2, 3)));
void logTrace(const char *component, const char *format, ...) __attribute__((format(printf, 2, 3)));

/// Writes "LEVEL HH:MM:SS (component,line): message" and a line end.
void logMsg(logger_level level, const char *component, const char *format, va_list arguments)
    __attribute__((format(printf, 3, 0)));

// No argument may call an operation that logs: it would overwrite the line.
#define LOG_ERROR(...) (setLine(__LINE__), logError(LOG_COMPONENT, __VA_ARGS__))
#define LOG_INFO(...) (setLine(__LINE__), logInfo(LOG_COMPONENT, __VA_ARGS__))
#define LOG_TRACE(...) (setLine(__LINE__), logTrace(LOG_COMPONENT, __VA_ARGS__))

// Catalogue texts: the key and its arguments. A failure that fills a record is logged by FAILURE.
#define LOG_ERROR_MESSAGE(...) LOG_ERROR("%s", NLS::getFormattedString(__VA_ARGS__).c_str())
#define LOG_INFO_MESSAGE(...) LOG_INFO("%s", NLS::getFormattedString(__VA_ARGS__).c_str())

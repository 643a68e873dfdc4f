#pragma once

/// The one log line of the whole system.
///
/// `MARU_LOG("Failed [%s]", text)` writes, to syslog with priority error,
///     source.cpp:12 (PID, EUID) (Function) Failed [text]
/// and, when `errno` is not zero, " [err: " + its text + "]" behind it; `errno` is zero afterwards.
/// A process that runs in the foreground calls `maru::OpenLog` with `foreground` once at its start.

namespace maru {

/// Writes one line; called through MARU_LOG only. Control characters in the message are written as
/// #ooo (octal), so that no text from outside can forge a line or drive a terminal. Thread-safe.
/// Out of memory it writes the bare format.
void LogLine(const char* file, int line, const char* function, const char* format, ...) noexcept
    __attribute__((format(printf, 4, 5)));

/// Opens the log under the program's name (kept by pointer); `foreground` copies every line to
/// standard error.
void OpenLog(const char* program, bool foreground);

/// From now on, until it is called again, this process writes at most `bytes` of messages: what one
/// request has to say must not fill the log. A message that is too long is cut, and the first that
/// is left out is told of.
void LimitLog(long bytes);

/// Lets go of the log's descriptor; the next line opens the log anew, as OpenLog said.
void ReopenLog();

}  // namespace maru

#define MARU_LOG(...) ::maru::LogLine(__FILE_NAME__, __LINE__, __func__, __VA_ARGS__)

// The one way the library reports a failure: a line to syslog at LOG_ERR.
//
// Messages are the system's own format strings, which begin with the unit and the line
// in one of two forms, "%s (%d) ..." or "%s:%d ...". TV_LOG supplies both from the
// calling file's kLogUnit and __LINE__, so every call site carries its text verbatim:
//
//     namespace { constexpr char kLogUnit[] = "sysconf"; }
//     TV_LOG("%s (%d) Bad parameters.");
#pragma once

namespace torvale {

void log_error(const char *fmt, ...) noexcept __attribute__((format(printf, 1, 2)));

// Tests observe the exact lines through a sink; syslog still receives every one.
using LogSink = void (*)(const char *line);
void log_set_sink(LogSink sink) noexcept;

} // namespace torvale

#define TV_LOG(fmt, ...) ::torvale::log_error(fmt, kLogUnit, __LINE__, ##__VA_ARGS__)

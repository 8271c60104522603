// platformSeams.h - the library's fixed file paths and its syslog output,
// each behind a narrow seam that tests redirect.
//
// platformPath prefixes the fixed kernel paths ("/proc/...", "/sys/...",
// "/dev/cgroup") with a root that is empty in production; tests set it to a
// temporary tree before (re)creating the process-wide objects.  logMessage
// goes to syslog unless a test installed a sink.  Neither is exported.
#pragma once

#include <string>

namespace pxalarms {

std::string platformPath(const char* path);

__attribute__((format(printf, 2, 3))) void logMessage(int priority, const char* format, ...);

namespace testing {

// Only while no exported function runs: the prefix is read without a lock.
void setRootPrefix(const std::string& prefix);

using LogSink = void (*)(int priority, const char* text);
// Null restores syslog.
void setLogSink(LogSink sink);

}  // namespace testing

}  // namespace pxalarms

// platformSeams.cpp - path prefix and syslog seam.
#include "platformSeams.h"

#include <syslog.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>

namespace pxalarms {

namespace {
std::string& rootPrefix()
{
    static std::string prefix;
    return prefix;
}
std::atomic<testing::LogSink> logSink{nullptr};
}  // namespace

std::string platformPath(const char* path)
{
    return rootPrefix() + path;
}

void logMessage(int priority, const char* format, ...)
{
    va_list args;
    va_start(args, format);
    if (testing::LogSink sink = logSink.load(std::memory_order_acquire)) {
        char text[256];
        std::vsnprintf(text, sizeof text, format, args);
        sink(priority, text);
    } else {
        vsyslog(priority, format, args);
    }
    va_end(args);
}

namespace testing {

void setRootPrefix(const std::string& prefix)
{
    rootPrefix() = prefix;
}

void setLogSink(LogSink sink)
{
    logSink.store(sink, std::memory_order_release);
}

}  // namespace testing

}  // namespace pxalarms

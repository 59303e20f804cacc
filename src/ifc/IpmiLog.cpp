#include "IpmiLog.h"

#include <errno.h>
#include <stdarg.h>
#include <stdio.h>

#include <atomic>
#include <mutex>

namespace Ipmi {

namespace {
std::mutex sinkMutex;
IpmiLogSink sinkFn = nullptr;
void* sinkContext = nullptr;
std::atomic<bool> sinkSet{false};  // lets a masked line return without the mutex
}  // namespace

void setLogSink(IpmiLogSink sink, void* context) {
    std::lock_guard<std::mutex> guard(sinkMutex);
    sinkFn = sink;
    sinkContext = context;
    sinkSet.store(sink != nullptr);
}

void ipmiLog(int priority, const char* format, ...) {
    const int callerErrno = errno;  // for "%m"
    // A priority the process's log mask drops costs no formatting: the
    // exchange paths log at debug, which production hosts mask.
    if (!sinkSet.load() && (setlogmask(0) & LOG_MASK(LOG_PRI(priority))) == 0) return;

    char text[1024];
    va_list args;
    va_start(args, format);
    errno = callerErrno;
    vsnprintf(text, sizeof text, format, args);  // glibc expands %m like syslog
    va_end(args);
    {
        std::lock_guard<std::mutex> guard(sinkMutex);
        if (sinkFn) {
            sinkFn(priority, text, sinkContext);
            return;
        }
    }
    syslog(priority, "%s", text);
}

}  // namespace Ipmi

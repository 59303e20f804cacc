#ifndef TAV_IPMI_IPMILOG_H
#define TAV_IPMI_IPMILOG_H

#include <syslog.h>

namespace Ipmi {

// Every log line of the library passes here. "%m" works as in syslog.
void ipmiLog(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));

// Tests read what was logged through a sink; while one is set, syslog is not used.
typedef void (*IpmiLogSink)(int priority, const char* text, void* context);
void setLogSink(IpmiLogSink sink, void* context);

}  // namespace Ipmi

#endif

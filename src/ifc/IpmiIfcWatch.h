#ifndef TAV_IPMI_IPMIIFCWATCH_H
#define TAV_IPMI_IPMIIFCWATCH_H

// What monitoring sees of the loop: exchange outcomes, pass times and cache
// refresh times. Not installed; IpmiIfc's observation getters read it.

#include <stdint.h>

#include "IpmiIfc.h"

namespace Ipmi {

// Counts one exchange, process-wide and for the calling thread.
void IpmiIfcWatchExchange(IpmiIfc::IPMI_EXCHANGE_RESULT result);

// Exchanges of the calling thread so far, by result: a refresh or a pass on
// the loop's thread measures its own exchanges, whatever other threads send.
struct IpmiThreadExchanges {
    uint64_t count[IpmiIfc::IPMI_EXCHANGE_RESULT_COUNT];
};
IpmiThreadExchanges IpmiIfcWatchThreadExchanges();

// Watches one refresh on the calling thread from construction on.
class IpmiRefreshWatch {
public:
    IpmiRefreshWatch();
    // Stamps the cache when the refresh succeeded, exchanged at least once
    // and had no exchange time out or fail.
    void finish(IpmiIfc::IPMI_CACHE cache, bool succeeded) const;
    // Whether any exchange since construction was answered by the controller.
    bool answered() const;

private:
    IpmiThreadExchanges before_;
};

// Watches one pass of the loop: its duration, and whether it reached the controller.
class IpmiPassWatch {
public:
    IpmiPassWatch();
    ~IpmiPassWatch();
    IpmiPassWatch(const IpmiPassWatch&) = delete;
    IpmiPassWatch& operator=(const IpmiPassWatch&) = delete;

private:
    IpmiRefreshWatch exchanges_;
    int64_t startedUs_;
};

}  // namespace Ipmi

#endif

#ifndef TAV_IPMI_TOOLS_LOOPHEALTH_H
#define TAV_IPMI_TOOLS_LOOPHEALTH_H

// The series that tell a fresh scrape from a stale one: whether the polling
// loop reaches the controller, when each cache was refreshed, how exchanges
// ended. Only `serve` has a loop to report on.

#include "Metrics.h"

namespace Tool {

// Adds the loop's series; `maxAge` (seconds) is published beside them so that
// alert rules compare ages with the figure the exporter applies.
void addLoopHealth(MetricSet& m, double maxAge);

}  // namespace Tool

#endif

#ifndef TAV_IPMI_BENCH_GENERATEDSERVER_H
#define TAV_IPMI_BENCH_GENERATEDSERVER_H

#include <stddef.h>

#include <memory>

#include "Bmc.h"

namespace Bench {

// `records` SDRs of a large server: of every five, a full threshold sensor,
// two compact discrete sensors, an event-only record and a FRU locator.
std::shared_ptr<Sim::Bmc> generatedServer(size_t records);

}  // namespace Bench

#endif

#ifndef TAV_IPMI_SIM_GENERATEDSERVER_H
#define TAV_IPMI_SIM_GENERATEDSERVER_H

#include <stddef.h>

#include <memory>
#include <string>

#include "Bmc.h"

namespace Sim {

// Record counts a generated server may have: 32 controllers of 250 sensors.
constexpr size_t kGeneratedMinRecords = 1;
constexpr size_t kGeneratedMaxRecords = 8000;

// `records` SDRs of a large server: of every five, a full threshold sensor,
// two compact discrete sensors, an event-only record and a FRU locator. Each
// controller (the BMC at 0x20, then 0x2C, 0x2E, ... on IPMB) owns 250
// sensors, so every record has a key of its own. The first two locators name
// the default server's FRU devices 0 and 1, which it serves; its SEL holds
// records/2 events of its sensors (at most what the log holds).
std::shared_ptr<Bmc> generatedServer(size_t records);

// True when `name` has the profile form "generated:N"; `records` is then N.
// Throws std::runtime_error when N is not a count of 1 to 8000.
bool generatedProfile(const std::string& name, size_t& records);

}  // namespace Sim

#endif

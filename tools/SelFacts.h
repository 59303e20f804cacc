#ifndef TAV_IPMI_TOOLS_SELFACTS_H
#define TAV_IPMI_TOOLS_SELFACTS_H

// SEL records as the tool shows them, and the count of SEL events by
// severity that the metrics carry.

#include <memory>
#include <string>
#include <vector>

#include "IpmiSelData.h"
#include "Output.h"

namespace Ipmi {
class IpmiSensor;
}

namespace Tool {

// Severity names of the CIM PerceivedSeverity values a record gives.
std::string severityName(int severity);

// One record: id, time, sensor, caption, severity, description.
Json selRecord(const Ipmi::IpmiSelData& r, const std::vector<std::shared_ptr<Ipmi::IpmiSensor>>& sensors);
std::vector<Column> selColumns();

// Counts one record by severity (a SEL event handler calls it once per
// record); safe from any thread.
void countSelEvent(const Ipmi::IpmiSelData& r);

}  // namespace Tool

#endif

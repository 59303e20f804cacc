// Any 16 bytes as a SEL record: the one-line description and the event text.

#include <stddef.h>
#include <stdint.h>
#include <string.h>

#include "IpmiSelData.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Ipmi::Event_log record;
    memset(&record, 0, sizeof record);
    memcpy(&record, data, size < sizeof record ? size : sizeof record);
    char line[256];
    // A short destination too: the description must be cut, never overrun.
    const int sizes[] = {static_cast<int>(sizeof line), 8, 1};
    for (int n : sizes) Ipmi::build_sel_desc(record, line, n);
    (void)Ipmi::GetMessage(record);
    return 0;
}

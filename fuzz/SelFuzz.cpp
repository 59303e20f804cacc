// A SEL record's every accessor on the first 16 bytes; then the rest of the
// input as the controller's SEL answers (Get SEL Info, Reserve SEL, Get SEL
// Entry and Get SEL Time, taken in the order the library asks), read by the
// cached reader that follows the log and by the direct synchroniser.

#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>

#include <algorithm>

#include "FuzzSupport.h"
#include "IpmiIfc.h"
#include "IpmiSel.h"
#include "IpmiSelData.h"

using namespace Ipmi;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzSupport::quietLog();
    sel_event_record record;
    memset(&record, 0, sizeof record);
    const size_t recordBytes = std::min(size, sizeof record);
    memcpy(&record, data, recordBytes);

    auto bmc = std::make_shared<Sim::Bmc>();
    FuzzSupport::AnswerScript script(data + recordBytes, size - recordBytes);
    for (uint8_t command : {cmd::getSelInfo, cmd::reserveSel, cmd::getSelEntry, cmd::getSelTime})
        script.answer(*bmc, netfn::storage, command);
    FuzzSupport::begin(bmc);

    const IpmiSelData one(&record, 0);
    std::string text = one.caption() + one.messageFormat() + one.recordDataString() + one.description() +
                       one.recordId(one.recordId());
    (void)(one.recordType() + one.isSelEventRecord() + one.getGeneratorId() + one.messageTimeStamp() +
           one.eventType() + one.severity() + one.alertType());

    // The first answer loads the log; later ones follow what changed.
    for (int pass = 0; pass < 3; ++pass) IpmiIfcSelGetInfo(0, nullptr);
    for (const auto& held : IpmiIfc::getSelData()) text += held->caption() + held->recordDataString();
    (void)IpmiIfc::getRawSelHeader(0);

    sel_state state;
    memset(&state, 0, sizeof state);
    for (int call = 0; call < 2; ++call) {
        Event_log* records = nullptr;
        int count = 0;
        if (sync_device_eventlog(&records, &count, &state)) {
            for (int i = 0; i < count; ++i) text += GetMessage(records[i]);
            free(records);
        }
    }

    // Nothing of this input may stay for the next one.
    g_IpmiNode[0].selRecords.clear();
    g_IpmiNode[0].sel.reset();
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcEntityCleanUpAll(0);
    FuzzSupport::end();
    return 0;
}

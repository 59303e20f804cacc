#ifndef TAV_IPMI_IPMIIFCSEL_H
#define TAV_IPMI_IPMIIFCSEL_H

// SEL interface code shared within the library and with the tests; not installed.

#include <stddef.h>
#include <stdint.h>

#include "IpmiSelData.h"

namespace Ipmi {

// What IpmiIfcSelReadEntry fills. In: next_id names the record to read (0:
// the first). Out: the controller's next record ID (0xFFFF after the last),
// so the same buffer reads the following record when fed back.
struct ipmiifc_sel_entry {
    uint8_t cc;
    uint8_t next_id[2];
    sel_event_record record;
} __attribute__((packed));
static_assert(sizeof(ipmiifc_sel_entry) == 19, "SEL entry buffer is 19 bytes");

uint32_t IpmiIfcSelReserve(int node);
uint32_t IpmiIfcSelReadEntry(int node, ipmiifc_sel_entry* entry);
uint32_t IpmiIfcSelReadAll(int node);
uint32_t IpmiIfcSelGetAll(int node);
// Hands the records not yet handled to the handlers, oldest first.
void IpmiIfcSelGenerateEvents(int node);
// Calls every registered handler with `record` (null from the polling loop's
// periodic call), newest registration first, with the handler mutex released
// around each call. A handler's exception ends the walk and passes on.
void IpmiIfcSelCallHandlers(IpmiSelData* record);
// The same for a record being delivered, but a handler's exception is logged
// and the walk goes on: no handler's fault costs another one a record.
void IpmiIfcSelDeliverToHandlers(IpmiSelData* record);
bool IpmiIfcSelHasHandlers();

// Requests on a descriptor of the caller's own, outside the node's transport:
// the direct synchroniser and the SEL clock use them.
int IpmiSelDirectOpen();
void IpmiSelDirectClose(int fd);
// Sends one request and waits for its answer (completion code first) into
// `answer`; false when nothing matching came back. `answerLen` is in/out.
bool IpmiSelDirectTransaction(int fd, uint8_t netfn, uint8_t cmd, const uint8_t* data, size_t dataLen,
                              uint8_t* answer, size_t* answerLen);

}  // namespace Ipmi

#endif

// SEL delivery and FRU inventory checks of the guest checker.

#include <stdio.h>
#include <stdlib.h>

#include <atomic>
#include <mutex>
#include <set>
#include <string>
#include <thread>

#include "IpmiFru.h"
#include "IpmiIfc.h"
#include "IpmiSel.h"
#include "VmCheck.h"

namespace VmCheck {

namespace {

int selEntries() {
    for (const std::string& line : lines(run("ipmitool -I open sel info").out))
        if (line.rfind("Entries", 0) == 0) return atoi(line.c_str() + line.find(':') + 1);
    return -1;
}

// The host loaded three records before the guest booted; two more arrive
// through ipmi_sim's console, and ipmitool sees all five.
void addSelRecords(Checks& checks) {
    const int before = selEntries();
    const bool added = proxy({kSelAdd, 2});
    const int after = selEntries();
    printf("%s", run("ipmitool -I open sel elist").out.c_str());
    checks.expect(added && before == 3 && after == 5, "two SEL records added through the ipmi_sim console",
                  "ipmitool counts " + std::to_string(before) + ", then " + std::to_string(after));
}

std::mutex deliveredMutex;
std::multiset<unsigned> delivered;  // record IDs handed to the handler

void onSelRecord(void*, Ipmi::IpmiSelData* record) {
    if (record == nullptr) return;  // the loop's per-pass call without a record
    std::lock_guard<std::mutex> lock(deliveredMutex);
    delivered.insert(record->recordId());
}

size_t deliveredCount() {
    std::lock_guard<std::mutex> lock(deliveredMutex);
    return delivered.size();
}

}  // namespace

void prepareSel() { Ipmi::IpmiIfc::registerSelEventHandler(0, onSelRecord, nullptr); }

// Records in the SEL before the guest booted are not news. Records added
// through ipmi_sim's console while the loop runs are handed over once each,
// however many passes follow.
void checkSel(Checks& checks) {
    fullPass();
    checks.expect(deliveredCount() == 0, "SEL records present at start are not delivered",
                  std::to_string(deliveredCount()) + " delivered");
    addSelRecords(checks);
    fullPass();
    fullPass();
    std::set<unsigned> distinct;
    {
        std::lock_guard<std::mutex> lock(deliveredMutex);
        distinct.insert(delivered.begin(), delivered.end());
    }
    checks.expect(deliveredCount() == 2 && distinct.size() == 2, "each added SEL record is delivered exactly once",
                  std::to_string(deliveredCount()) + " deliveries, " + std::to_string(distinct.size()) + " records");

    // A burst while the loop reads: 24 records, many within one second of
    // the controller's clock, added in groups between and during passes.
    std::atomic<bool> bursting{true};
    std::thread burst([&bursting] {
        for (int group = 0; group < 8; ++group) proxy({kSelAdd, 3});
        bursting = false;
    });
    while (bursting) fullPass();
    burst.join();
    fullPass();
    fullPass();
    {
        std::lock_guard<std::mutex> lock(deliveredMutex);
        distinct.clear();
        distinct.insert(delivered.begin(), delivered.end());
    }
    checks.expect(deliveredCount() == 26 && distinct.size() == 26 && selEntries() == 29,
                  "a burst of 24 SEL records added while the loop reads is delivered exactly once",
                  std::to_string(deliveredCount()) + " deliveries, " + std::to_string(distinct.size()) +
                      " records, ipmitool counts " + std::to_string(selEntries()));
}
// Every FRU device ipmitool prints is in the library's inventory, with the
// same board serial number where the board area has one.
void checkFru(Checks& checks) {
    fullPass();
    std::set<unsigned> ours;
    std::string mismatch;
    const auto frus = Ipmi::IpmiIfc::getFrus(0);
    for (const auto& fru : frus) ours.insert(fru->getDeviceId());
    // A device counts as shown when ipmitool decodes at least one field of it.
    std::set<int> shown;
    int device = -1;
    for (const std::string& line : lines(run("ipmitool -I open fru print").out)) {
        size_t id = line.find("(ID ");
        if (line.rfind("FRU Device Description", 0) == 0 && id != std::string::npos) {
            device = atoi(line.c_str() + id + 4);
            continue;
        }
        size_t colon = line.find(" : ");
        if (colon == std::string::npos || device < 0) continue;
        shown.insert(device);
        if (trim(line.substr(0, colon)) != "Board Serial") continue;
        const std::string theirs = trim(line.substr(colon + 3));
        for (const auto& fru : frus) {
            if (fru->getDeviceId() != device || !fru->getBoard()) continue;
            if (fru->getBoard()->getSerialNumber() != theirs)
                mismatch += " device " + std::to_string(device) + " serial '" + fru->getBoard()->getSerialNumber() +
                            "' vs '" + theirs + "'";
        }
    }
    for (int d : shown)
        if (!ours.count(static_cast<unsigned>(d))) mismatch += " missing " + std::to_string(d);
    if (!mismatch.empty()) printf("%s", run("ipmitool -I open fru print").out.c_str());
    checks.expect(!ours.empty() && mismatch.empty(), "FRU inventory matches ipmitool",
                  std::to_string(ours.size()) + " devices" + mismatch);
}

}  // namespace VmCheck

#ifndef TAV_IPMI_TESTS_VM_VMCHECK_H
#define TAV_IPMI_TESTS_VM_VMCHECK_H

// The checker that runs inside the test guest, on the kernel's IPMI driver,
// against a BMC that is not ours. Its verdicts are lines on the console that
// the host collects; it uses only the library's public headers.

#include <stdint.h>

#include <string>
#include <vector>

#include "Text.h"

namespace VmCheck {

using TestSupport::lines;
using TestSupport::trim;

class Checks {
public:
    void expect(bool ok, const std::string& what, const std::string& detail = std::string());
    void skip(const std::string& what, const std::string& why);
    int failed() const { return failed_; }
    void summary() const;

private:
    int passed_ = 0;
    int failed_ = 0;
    int skipped_ = 0;
};

struct Run {
    int status = -1;  // exit code, or 128 + signal
    std::string out;
};

// Runs a shell command in the guest, stdout and stderr together.
Run run(const std::string& command);
// The cells of an ipmitool table row, trimmed.
std::vector<std::string> cells(const std::string& row);

// Requests the host's proxy between QEMU and ipmi_sim answers itself.
enum ProxyOp : uint8_t { kDrop = 1, kDelay = 2, kSelAdd = 3, kConsole = 4 };
bool proxy(std::vector<uint8_t> request);

// One full pass of the polling loop, waited for.
void fullPass();

// SEL delivery and FRU inventory (VmInventory.cpp).
void prepareSel();
void checkSel(Checks& checks);
void checkFru(Checks& checks);

}  // namespace VmCheck

#endif

// An inventory dump: the board and product fields of every FRU device, read
// once in command-line mode, without a polling loop.
//
//   inventory_dump
//
// The library needs root and /dev/ipmi0.

#include <errno.h>
#include <stdio.h>
#include <string.h>

#include <IpmiFru.h>
#include <IpmiIfc.h>

namespace {

void printBoard(const Ipmi::IpmiFruBoard& board) {
    printf("  board manufacturer: %s\n", board.getManufacturer().c_str());
    printf("  board name:         %s\n", board.getName().c_str());
    printf("  board serial:       %s\n", board.getSerialNumber().c_str());
    printf("  board part number:  %s\n", board.getPartNumber().c_str());
    printf("  board made:         %s\n", board.getMfgDateTime8601().c_str());
}

void printProduct(const Ipmi::IpmiFruProduct& product) {
    printf("  product manufacturer: %s\n", product.getManufacturer().c_str());
    printf("  product name:         %s\n", product.getName().c_str());
    printf("  product part number:  %s\n", product.getPartNumber().c_str());
    printf("  product version:      %s\n", product.getVersion().c_str());
    printf("  product serial:       %s\n", product.getSerialNumber().c_str());
    printf("  product asset tag:    %s\n", product.getAssetTag().c_str());
}

}  // namespace

int main() {
    // Command-line mode: the caller opens the device, then prepares the node.
    if (Ipmi::IpmiIfcOpenIpmiOpen(0) < 0) {
        fprintf(stderr, "inventory_dump: cannot open /dev/ipmi0: %s\n", strerror(errno));
        return 1;
    }
    if (Ipmi::IpmiIfcInitForCLI(0) < 0) {
        fprintf(stderr, "inventory_dump: cannot prepare the IPMI interface\n");
        Ipmi::IpmiIfcOpenIpmiClose(0);
        return 1;
    }
    // The FRU devices are named by locator records in the SDR repository:
    // read it first, then every device it names.
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "inventory_dump: could not read the SDR repository\n");
    Ipmi::IpmiIfcFruInstantiateAll(0);

    for (const auto& fru : Ipmi::IpmiIfc::getFrus()) {
        const Ipmi::IpmiEntity& entity = fru->getEntity();
        printf("FRU %u \"%s\" (%s %u.%u)\n", fru->getDeviceId(), fru->getName().c_str(), entity.getName().c_str(),
               entity.getId(), entity.getInstance());
        // An area is null when the device has none or it failed its checksum.
        if (auto board = fru->getBoard()) printBoard(*board);
        if (auto product = fru->getProduct()) printProduct(*product);
    }

    Ipmi::IpmiIfcCloseForCLI(0);
    Ipmi::IpmiIfcOpenIpmiClose(0);
    return 0;
}

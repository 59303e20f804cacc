#include <stdio.h>

#include "IpmiIfc.h"
#include "Views.h"

namespace {

int setOs(const std::vector<std::string>& args) {
    if (args.size() != 2) {
        fprintf(stderr, "usage: tavipmi setos NAME VERSION\n");
        return 2;
    }
    // SetOSInfo opens the device itself and leaves it open.
    Ipmi::IpmiIfcOpenIpmiClose(0);
    if (!Ipmi::IpmiIfc::SetOSInfo(args[0], args[1])) {
        fprintf(stderr, "tavipmi: the controller did not take the OS name and version\n");
        return 1;
    }
    printf("OS name '%s' and version '%s' written\n", args[0].c_str(), args[1].c_str());
    return 0;
}

Tool::ViewRegistrar reg("setos", Tool::View{"NAME VERSION: write the host OS name and version", setOs, 100, false});

}  // namespace

#include <stdio.h>

#include <CLI/CLI.hpp>

#include "IpmiIfc.h"
#include "Views.h"

namespace {

std::string name, version;

void options(CLI::App& sub) {
    sub.add_option("NAME", name, "the host OS name")->required();
    sub.add_option("VERSION", version, "the host OS version")->required();
}

int setOs(std::vector<Tool::Section>& out) {
    // SetOSInfo opens the device itself and leaves it open.
    Ipmi::IpmiIfcOpenIpmiClose(0);
    if (!Ipmi::IpmiIfc::SetOSInfo(name, version)) {
        fprintf(stderr, "tavipmi: the controller did not take the OS name and version\n");
        return 1;
    }
    Tool::Section s;
    s.name = "setos";
    s.title = "Host OS written";
    s.layout = Tool::Section::Fields;
    s.single = true;
    s.columns = {{"os_name", "Host OS name"}, {"os_version", "Host OS version"}};
    s.records.push_back({{"os_name", name}, {"os_version", version}});
    out.push_back(std::move(s));
    return 0;
}

Tool::ViewRegistrar reg("setos", Tool::View{"NAME VERSION: write the host OS name and version", options, setOs, 100, false});

}  // namespace

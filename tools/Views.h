#ifndef TAV_IPMI_TOOLS_VIEWS_H
#define TAV_IPMI_TOOLS_VIEWS_H

#include <functional>
#include <map>
#include <string>
#include <vector>

// A view of the tool: prints one aspect of the controller. Each view file
// registers itself with a ViewRegistrar; main() dispatches by name.
namespace Tool {

struct View {
    std::string help;
    // Runs with the device open and the library in command-line mode.
    std::function<int(const std::vector<std::string>& args)> run;
    int order = 100;  // position in the default (all-views) output
    bool inDefault = false;
};

std::map<std::string, View>& views();

struct ViewRegistrar {
    ViewRegistrar(const std::string& name, View view) { views()[name] = std::move(view); }
};

}  // namespace Tool

#endif

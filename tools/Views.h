#ifndef TAV_IPMI_TOOLS_VIEWS_H
#define TAV_IPMI_TOOLS_VIEWS_H

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "Output.h"

namespace CLI {
class App;
}

// A view of the tool: one aspect of the controller, a subcommand of its own.
// Each view file registers itself with a ViewRegistrar; main() parses the
// command line and runs the chosen views.
namespace Tool {

struct View {
    std::string help;
    // Adds the view's own options and arguments to its subcommand.
    std::function<void(CLI::App&)> options;
    // Fills the view's sections, which main() renders in the chosen format.
    // Runs with the device open and the library in command-line mode, unless
    // the view runs the polling loop itself.
    std::function<int(std::vector<Section>&)> run;
    int order = 100;  // position in the default (all-views) output
    bool inDefault = false;
    bool ownsDevice = false;  // opens the device and runs the polling loop itself
};

std::map<std::string, View>& views();

struct ViewRegistrar {
    ViewRegistrar(const std::string& name, View view) { views()[name] = std::move(view); }
};

// The format chosen with --format, for views that print as they go.
Format outputFormat();

// The health rules next to an installed or build-tree tool, when /etc has none.
void loadHealthRules();

}  // namespace Tool

#endif

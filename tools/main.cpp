// tavipmi: views of the host's BMC through tav-ipmi, and a metrics endpoint.

#include <dlfcn.h>
#include <errno.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <initializer_list>
#include <map>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

#include "IpmiIfc.h"
#include "IpmiMapper.h"
#include "Views.h"

namespace Tool {
Format chosenFormat = Format::Table;
Format outputFormat() { return chosenFormat; }

std::map<std::string, View>& views() {
    static std::map<std::string, View> all;
    return all;
}
}  // namespace Tool

namespace {

// The running tool's own file, or "" when the system does not say.
std::string ownPath() {
    char self[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", self, sizeof self - 1);
    if (n <= 0) return "";
    self[n] = '\0';
    return self;
}

// The directory the running tool lies in, with a trailing slash.
std::string ownDirectory() {
    std::string path = ownPath();
    return path.empty() ? "./" : path.substr(0, path.rfind('/') + 1);
}

// The first of the places (relative to the tool) that holds a readable file.
std::string findBesideTool(std::initializer_list<const char*> relatives) {
    const std::string dir = ownDirectory();
    for (const char* r : relatives)
        if (access((dir + r).c_str(), R_OK) == 0) return dir + r;
    return "";
}

// Simulation is chosen at run time: the tool runs itself again with the
// simulator's preload library, so the binary never carries the interposer.
int reexecSimulated(char** argv, const std::string& profile) {
#ifdef TAV_IPMI_PRELOAD_FROM_BIN
    const char* preload = getenv("TAVIPMI_SIM_PRELOAD");
    std::string lib = preload ? preload : findBesideTool({TAV_IPMI_PRELOAD_FROM_BIN, "../sim/libtav-ipmi-sim-preload.so"});
    if (lib.empty() || access(lib.c_str(), R_OK) != 0) {
        fprintf(stderr, "tavipmi: simulator library libtav-ipmi-sim-preload.so not found\n");
        return 2;
    }
    setenv("LD_PRELOAD", lib.c_str(), 1);
    setenv("TAV_IPMI_SIM_PROFILE", profile.c_str(), 1);
    setenv("TAVIPMI_SIMULATED", "1", 1);
    const std::string self = ownPath();
    if (self.empty()) {
        perror("tavipmi: readlink");
        return 2;
    }
    execv(self.c_str(), argv);
    perror("tavipmi: execv");
    return 2;
#else
    (void)argv;
    (void)profile;
    fprintf(stderr, "tavipmi: built without the simulator\n");
    return 2;
#endif
}

// Where this run keeps its SDR cache. A simulated controller gets a
// directory per profile (and per version of the profile's file): its
// identity and stamps are made up, and must never meet a real controller's
// records or another profile's.
std::string sdrCacheDirectory(const std::string& chosen) {
    if (dlsym(RTLD_DEFAULT, "tavIpmiSimAddSelEvent") == nullptr) return chosen;
    const char* profile = getenv("TAV_IPMI_SIM_PROFILE");
    std::string identity = profile != nullptr ? profile : "default";
    struct stat st;
    if (stat(identity.c_str(), &st) == 0)
        identity += "\n" + std::to_string(st.st_size) + "\n" + std::to_string(st.st_mtim.tv_sec) + "." +
                    std::to_string(st.st_mtim.tv_nsec);
    uint64_t hash = 1469598103934665603ull;  // FNV-1a
    for (unsigned char c : identity) hash = (hash ^ c) * 1099511628211ull;
    char name[40];
    snprintf(name, sizeof name, "/simulated-%016llx", static_cast<unsigned long long>(hash));
    return chosen + name;
}

// Views in the order of the default output.
std::vector<std::string> defaultViews() {
    std::vector<std::pair<int, std::string>> order;
    for (const auto& v : Tool::views())
        if (v.second.inDefault) order.emplace_back(v.second.order, v.first);
    std::sort(order.begin(), order.end());
    std::vector<std::string> out;
    for (const auto& o : order) out.push_back(o.second);
    return out;
}

int runInCommandLineMode(const std::vector<std::string>& selected, Tool::Format format) {
    if (Ipmi::IpmiIfcOpenIpmiOpen(0) < 0) {
        fprintf(stderr, "tavipmi: cannot open /dev/ipmi0: %s\n", strerror(errno));
        return 1;
    }
    Tool::loadHealthRules();
    if (Ipmi::IpmiIfcInitForCLI(0) < 0) {
        fprintf(stderr, "tavipmi: cannot prepare the IPMI interface\n");
        Ipmi::IpmiIfcOpenIpmiClose(0);
        return 1;
    }
    int rc = 0;
    std::vector<Tool::Section> sections;
    for (const auto& name : selected) {
        int r = Tool::views()[name].run(sections);
        if (r != 0) rc = r;
    }
    if (!sections.empty()) Tool::render(sections, format, stdout);
    Ipmi::IpmiIfcCloseForCLI(0);
    Ipmi::IpmiIfcOpenIpmiClose(0);
    return rc;
}

}  // namespace

namespace Tool {

// The rules normally live in /etc. A tool installed under another prefix, or
// run from its build tree, uses the copy that came with it.
void loadHealthRules() {
    if (access("/etc/sfcb/tav/sensor_health", R_OK) == 0) return;
    std::string rules = findBesideTool({TAV_IPMI_RULES_FROM_BIN, "../etc/sfcb/tav/sensor_health"});
    if (!rules.empty()) Ipmi::LoadSensorHealthDataFile(rules.c_str());
}

}  // namespace Tool

int main(int argc, char** argv) {
    CLI::App app{"tavipmi: views of the host's baseboard management controller through tav-ipmi.\n"
                 "Without a view, every default view is shown.",
                 "tavipmi"};
    app.set_version_flag("--version", std::string("tavipmi (tav-ipmi) ") + TAV_IPMI_VERSION);
    std::string profile;
    app.add_option("--simulate", profile,
                   "talk to the simulated BMC: its default server, an ipmi_sim .emu, raw .sdr or SEL file, "
                   "the default server with a raw FRU image (.bin) as FRU device 0, or generated:N, "
                   "a large server of N SDR records")
        ->expected(0, 1)
        ->default_str("default");
    Tool::Format format = Tool::Format::Table;
    const std::map<std::string, Tool::Format> formats{
        {"table", Tool::Format::Table}, {"json", Tool::Format::Json}, {"csv", Tool::Format::Csv}};
    app.add_option("--format", format, "output format: table, json or csv (default table)")
        ->transform(CLI::CheckedTransformer(formats))
        ->option_text("table|json|csv");
    const char* cacheFromEnvironment = getenv("TAV_IPMI_SDR_CACHE_DIR");
    std::string sdrCache = cacheFromEnvironment != nullptr ? cacheFromEnvironment : "/var/cache/tav-ipmi";
    app.add_option("--sdr-cache", sdrCache,
                   "keep the SDR repository in this directory between runs (default "
                   "$TAV_IPMI_SDR_CACHE_DIR or /var/cache/tav-ipmi)")
        ->option_text("DIR");
    bool noSdrCache = false;
    app.add_flag("--no-sdr-cache", noSdrCache, "read the SDR repository afresh and keep no copy");
    app.require_subcommand(0, 1);
    app.fallthrough();  // the global options may follow the view
    std::map<CLI::App*, std::string> byCommand;
    for (auto& v : Tool::views()) {
        CLI::App* sub = app.add_subcommand(v.first, v.second.help);
        if (v.second.options) v.second.options(*sub);
        byCommand[sub] = v.first;
    }
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& e) {
        // Every refusal shows the usage, on stderr, with exit status 2.
        if (e.get_exit_code() != 0) {
            fprintf(stderr, "tavipmi: %s\n", e.what());
            fprintf(stderr, "%s", app.help().c_str());
            return 2;
        }
        return app.exit(e);
    }
    if (app.count("--simulate") && getenv("TAVIPMI_SIMULATED") == nullptr)
        return reexecSimulated(argv, profile.empty() ? "default" : profile);

    Tool::chosenFormat = format;
    Ipmi::IpmiIfc::setSdrCacheDir(noSdrCache || sdrCache.empty() ? "" : sdrCacheDirectory(sdrCache));
    std::vector<std::string> selected;
    for (CLI::App* sub : app.get_subcommands()) selected.push_back(byCommand[sub]);
    if (selected.empty()) selected = defaultViews();
    const Tool::View& first = Tool::views()[selected[0]];
    if (first.ownsDevice) {
        std::vector<Tool::Section> none;
        return first.run(none);
    }
    return runInCommandLineMode(selected, format);
}

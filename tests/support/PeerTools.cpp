#include "PeerTools.h"

#include <ftw.h>
#include <link.h>
#include <stdlib.h>
#include <string.h>
#include <sys/wait.h>
#include <unistd.h>

#include <sstream>

#include "TestSupport.h"

extern char** environ;

namespace TestSupport {

namespace {

// A sanitizer runtime this test runs under: a preload library built with the
// same flags needs it loaded first in the tool's process.
std::string sanitizerRuntime() {
    std::string found;
    dl_iterate_phdr(
        [](struct dl_phdr_info* info, size_t, void* data) {
            const char* name = info->dlpi_name;
            if (name && (strstr(name, "/libasan.so") || strstr(name, "/libtsan.so"))) {
                *static_cast<std::string*>(data) = name;
                return 1;
            }
            return 0;
        },
        &found);
    return found;
}

std::string readAll(int fd) {
    std::string text;
    char buffer[4096];
    ssize_t n;
    while ((n = read(fd, buffer, sizeof buffer)) > 0) text.append(buffer, static_cast<size_t>(n));
    return text;
}

std::vector<char*> pointers(std::vector<std::string>& strings) {
    std::vector<char*> out;
    for (auto& s : strings) out.push_back(&s[0]);
    out.push_back(nullptr);
    return out;
}

bool hasPrefix(const char* s, const char* prefix) { return strncmp(s, prefix, strlen(prefix)) == 0; }

}  // namespace

std::string toolPath(const std::string& name) {
    std::string dirs = getenv("PATH") ? getenv("PATH") : "";
    dirs += ":/usr/sbin:/sbin:/usr/bin:/bin";
    std::stringstream list(dirs);
    std::string dir;
    while (std::getline(list, dir, ':')) {
        std::string path = dir + "/" + name;
        if (!dir.empty() && access(path.c_str(), X_OK) == 0) return path;
    }
    return "";
}

ToolRun runTool(const std::string& profile, const std::string& tool, const std::vector<std::string>& args,
                const std::vector<std::string>& extraEnv, unsigned seconds) {
    ToolRun result;
    std::vector<std::string> env;
    for (char** e = environ; *e; ++e)
        if (!hasPrefix(*e, "LD_PRELOAD=") && !hasPrefix(*e, "TAV_IPMI_SIM_") && !hasPrefix(*e, "ASAN_OPTIONS="))
            env.push_back(*e);
    if (!profile.empty()) {
        std::string runtime = sanitizerRuntime();
        env.push_back("LD_PRELOAD=" + (runtime.empty() ? "" : runtime + ":") + TAV_IPMI_PRELOAD_LIB);
        env.push_back("TAV_IPMI_SIM_PROFILE=" + profile);
        env.push_back("TAV_IPMI_SIM_VIRTUAL_TIME=1");
        // The tools free little before they exit; their leaks are not ours to report.
        env.push_back("ASAN_OPTIONS=detect_leaks=0");
    }
    env.insert(env.end(), extraEnv.begin(), extraEnv.end());
    std::vector<std::string> argStrings{tool};
    argStrings.insert(argStrings.end(), args.begin(), args.end());
    std::vector<char*> envp = pointers(env), argv = pointers(argStrings);

    char errName[] = "/tmp/tav-peer-err-XXXXXX";
    int errFd = mkstemp(errName);
    int out[2];
    if (errFd < 0 || pipe(out) != 0) return result;
    unlink(errName);
    pid_t pid = fork();
    if (pid == 0) {
        dup2(out[1], 1);
        dup2(errFd, 2);
        close(out[0]);
        alarm(seconds);  // a hung tool ends the test instead of stalling it
        execve(argv[0], argv.data(), envp.data());
        _exit(127);
    }
    close(out[1]);
    result.out = readAll(out[0]);
    close(out[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    lseek(errFd, 0, SEEK_SET);
    result.err = readAll(errFd);
    close(errFd);
    return result;
}

ToolRun runIpmiSensors(const std::string& profile, const std::vector<std::string>& extraArgs) {
    char cache[] = "/tmp/tav-sdr-cache-XXXXXX";
    if (mkdtemp(cache) == nullptr) return ToolRun();
    std::vector<std::string> args{"--driver-type=OPENIPMI", std::string("--sdr-cache-directory=") + cache,
                                  "--quiet-cache"};
    args.insert(args.end(), extraArgs.begin(), extraArgs.end());
    ToolRun run = runTool(profile, toolPath("ipmi-sensors"), args);
    nftw(
        cache, [](const char* p, const struct stat*, int, struct FTW*) { return remove(p); }, 16,
        FTW_DEPTH | FTW_PHYS);
    return run;
}

std::vector<std::string> referenceSets() {
    std::vector<std::string> all;
    for (const auto& f : realDataFiles("sdr", ".sdr")) all.push_back(f.substr(0, f.size() - 4));
    return all;
}

std::string referenceProfile(const std::string& set) {
    const std::string emu = realDataPath("sim/" + set.substr(set.rfind('/') + 1) + ".emu");
    return emu.empty() ? set + ".sdr" : emu;
}

}  // namespace TestSupport

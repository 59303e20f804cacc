// `serve`: the polling loop on a thread of its own and an HTTP endpoint that
// answers GET /metrics from the library's caches; `metrics`: the same text once.

#include <errno.h>
#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <string.h>

#include <atomic>
#include <exception>
#include <string>
#include <thread>

#include <CLI/CLI.hpp>
#include <httplib.h>

#include "CmpiStatus.h"
#include "Identity.h"
#include "IpmiIfc.h"
#include "IpmiSelData.h"
#include "Metrics.h"
#include "SelCursorFile.h"
#include "SelFacts.h"
#include "Views.h"

namespace {

std::string listen = "127.0.0.1:9623";
int interval = 1;
Tool::SelCursorFile selState;

void serveOptions(CLI::App& sub) {
    sub.add_option("--listen", listen, "HOST:PORT to answer on (default 127.0.0.1:9623; port 0: any free port)");
    sub.add_option("--interval", interval, "polling interval in units of 16 seconds (default 1)")
        ->check(CLI::PositiveNumber);
    selState.addOption(sub, "serve.state");
}

bool splitListen(const std::string& text, std::string& host, int& port) {
    const size_t colon = text.rfind(':');
    if (colon == std::string::npos || colon == 0) return false;
    host = text.substr(0, colon);
    if (host.size() > 2 && host.front() == '[' && host.back() == ']') host = host.substr(1, host.size() - 2);
    char* end = nullptr;
    const long p = strtol(text.c_str() + colon + 1, &end, 10);
    if (*end != '\0' || p < 0 || p > 65535 || end == text.c_str() + colon + 1) return false;
    port = static_cast<int>(p);
    return true;
}

std::atomic<bool> loopReported{false};

void runLoop() {
    try {
        Ipmi::IpmiIfc::start(0, interval);
    } catch (const kelInt::CmpiStatus& e) {
        fprintf(stderr, "tavipmi: the polling loop stopped: %s\n", e.msg());
        loopReported = true;
    } catch (const std::exception& e) {
        fprintf(stderr, "tavipmi: the polling loop stopped: %s\n", e.what());
        loopReported = true;
    }
}

// Exactly once per record: the loop hands each new record over once.
void countEvent(void*, Ipmi::IpmiSelData* record) {
    if (record == nullptr) return;
    Tool::countSelEvent(*record);
    selState.save(*record);
}

int serve(std::vector<Tool::Section>&) {
    std::string host;
    int port = 0;
    if (!splitListen(listen, host, port)) {
        fprintf(stderr, "tavipmi: --listen wants HOST:PORT, not '%s'\n", listen.c_str());
        return 2;
    }
    // SIGTERM and SIGINT are taken by this thread alone, so every thread
    // started from here on inherits the block.
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stopSignals, nullptr);

    httplib::Server server;
    // One worker answers one request per connection: a scrape takes
    // milliseconds, and no client can hold the worker with an idle
    // keep-alive connection.
    server.new_task_queue = [] { return new httplib::ThreadPool(1); };
    server.set_keep_alive_max_count(1);
    server.Get("/metrics", [](const httplib::Request&, httplib::Response& res) {
        res.set_content(Tool::metricsText(), "text/plain; version=0.0.4; charset=utf-8");
    });
    server.Get("/", [](const httplib::Request&, httplib::Response& res) {
        res.set_content("tavipmi: metrics at /metrics\n", "text/plain; charset=utf-8");
    });
    // Port 0 takes any free port; the message below names the one taken.
    if (port == 0) port = server.bind_to_any_port(host.c_str());
    else if (!server.bind_to_port(host.c_str(), port)) port = -1;
    if (port <= 0) {
        fprintf(stderr, "tavipmi: cannot listen on %s: %s\n", listen.c_str(), strerror(errno));
        return 1;
    }

    Tool::loadHealthRules();
    selState.resume();
    std::thread loop(runLoop);
    const int state =
        Ipmi::IpmiIfc::waitState(0, Ipmi::IpmiIfc::IPMI_STATE_RUNNING | Ipmi::IpmiIfc::IPMI_STATE_STOPPED);
    if (state != Ipmi::IpmiIfc::IPMI_STATE_RUNNING) {
        loop.join();
        if (!loopReported) fprintf(stderr, "tavipmi: cannot open /dev/ipmi0\n");
        return 1;
    }
    // start() clears the handler list: the count starts once the loop runs.
    Ipmi::IpmiIfc::registerSelEventHandler(countEvent, nullptr);
    std::thread http([&server] { server.listen_after_bind(); });
    fprintf(stderr, "tavipmi: serving metrics on http://%s:%d/metrics\n",
            host.find(':') == std::string::npos ? host.c_str() : ("[" + host + "]").c_str(), port);

    int sig = 0;
    while (sigwait(&stopSignals, &sig) != 0) {
    }
    server.stop();
    http.join();
    Ipmi::IpmiIfc::stop(0);
    loop.join();
    return 0;
}

// Once, for node_exporter's textfile collector.
int metrics(std::vector<Tool::Section>&) {
    if (!Tool::readIdentity()) return 1;
    if (Ipmi::IpmiIfcSdrGetInfo(0) != 0) fprintf(stderr, "tavipmi: could not read the SDR repository\n");
    Ipmi::IpmiIfcFruInstantiateAll(0);
    // Without a loop handing records over, the count is of the records held.
    if (Ipmi::IpmiIfcSelGetInfo(0, nullptr) == 0)
        for (const auto& r : Ipmi::IpmiIfc::getSelData(0)) Tool::countSelEvent(*r);
    fputs(Tool::metricsText().c_str(), stdout);
    return 0;
}

Tool::ViewRegistrar regServe("serve", Tool::View{"run the polling loop and answer GET /metrics (Prometheus text)",
                                                 serveOptions, serve, 200, false, true});
Tool::ViewRegistrar regMetrics("metrics", Tool::View{"print the /metrics text once (node_exporter textfile collector)",
                                                     nullptr, metrics, 210, false});

}  // namespace

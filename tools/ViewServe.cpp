// `serve`: the polling loop on a thread of its own and an HTTP endpoint that
// answers GET /metrics from the library's caches; `metrics`: the same text once.

#include <errno.h>
#include <pthread.h>
#include <signal.h>
#include <stdio.h>
#include <string.h>

#include <atomic>
#include <exception>
#include <memory>
#include <string>
#include <thread>

#include <CLI/CLI.hpp>
#include <httplib.h>

#include "CmpiStatus.h"
#include "Identity.h"
#include "IpmiIfc.h"
#include "IpmiSelData.h"
#include "LoopHealth.h"
#include "Metrics.h"
#include "SelCursorFile.h"
#include "SelFacts.h"
#include "Views.h"
#include "WebConfig.h"

namespace {

std::string listen = "127.0.0.1:9623";
int interval = 1;
double maxAge = 0;
std::string webConfigFile;

// The loop reads sensors on one pass in eight, a pass every 16 s per unit of
// the interval: the default age allows three such periods.
constexpr int kSecondsPerReadingPeriod = 8 * 16;
constexpr int kDefaultPeriods = 3;
Tool::SelCursorFile selState;

void serveOptions(CLI::App& sub) {
    sub.add_option("--listen", listen, "HOST:PORT to answer on (default 127.0.0.1:9623; port 0: any free port)");
    sub.add_option("--interval", interval, "polling interval in units of 16 seconds (default 1)")
        ->check(CLI::PositiveNumber);
    sub.add_option("--max-age", maxAge,
                   "seconds after which a reading is not published as current (default three reading periods: "
                   "384 s per unit of --interval)")
        ->check(CLI::PositiveNumber);
    sub.add_option("--web.config.file", webConfigFile,
                   "Prometheus web configuration file: TLS certificate and key, client certificates, basic-auth "
                   "users with bcrypt hashes");
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
    Tool::WebConfig web;
    std::string error;
    if (!webConfigFile.empty() && !Tool::loadWebConfig(webConfigFile, web, error)) {
        fprintf(stderr, "tavipmi: --web.config.file %s\n", error.c_str());
        return 2;
    }
    if (maxAge <= 0) maxAge = static_cast<double>(kDefaultPeriods) * kSecondsPerReadingPeriod * interval;
    Tool::setReadingMaxAge(maxAge);
    Tool::addMetricSource([](Tool::MetricSet& m) { Tool::addLoopHealth(m, maxAge); });

    // SIGTERM and SIGINT are taken by this thread alone, so every thread
    // started from here on inherits the block.
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stopSignals, nullptr);

    std::unique_ptr<httplib::Server> made = Tool::makeServer(web, error);
    if (!made) {
        fprintf(stderr, "tavipmi: --web.config.file %s: %s\n", webConfigFile.c_str(), error.c_str());
        return 1;
    }
    httplib::Server& server = *made;
    // One worker answers one request per connection: a scrape takes
    // milliseconds, and no client can hold the worker with an idle
    // keep-alive connection.
    server.new_task_queue = [] { return new httplib::ThreadPool(1); };
    server.set_keep_alive_max_count(1);
    auto auth = std::make_shared<Tool::BasicAuth>(web.users);
    server.set_pre_routing_handler([auth](const httplib::Request& req, httplib::Response& res) {
        if (auth->allows(req.get_header_value("Authorization"))) return httplib::Server::HandlerResponse::Unhandled;
        res.status = 401;
        res.set_header("WWW-Authenticate", "Basic realm=\"tavipmi\"");
        res.set_content("Unauthorized\n", "text/plain; charset=utf-8");
        return httplib::Server::HandlerResponse::Handled;
    });
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
    fprintf(stderr, "tavipmi: serving metrics on %s://%s:%d/metrics\n", web.tls() ? "https" : "http",
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

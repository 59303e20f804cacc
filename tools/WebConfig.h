#ifndef TAV_IPMI_TOOLS_WEBCONFIG_H
#define TAV_IPMI_TOOLS_WEBCONFIG_H

// Who may scrape `serve`: Prometheus's web configuration file, as the
// ecosystem's exporters read it (--web.config.file). TLS with an optional
// client certificate, and basic-auth users with bcrypt password hashes.

#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>

namespace httplib {
class Server;
}

namespace Tool {

enum class ClientAuth { None, Request, RequireAny, VerifyIfGiven, RequireAndVerify };

struct WebConfig {
    std::string certFile, keyFile, clientCaFile;  // paths, relative ones taken from the file's directory
    ClientAuth clientAuth = ClientAuth::None;
    int minVersion = 0;  // OpenSSL protocol version; 0: TLS 1.2
    std::map<std::string, std::string> users;  // user -> bcrypt hash
    bool tls() const { return !certFile.empty(); }
};

// Reads the file; false with the reason in `error` ("FILE: reason").
bool loadWebConfig(const std::string& path, WebConfig& out, std::string& error);

// Checks an Authorization header against the users; true when the file names
// none. Remembers (as digests) the pairs it accepted, so that a scraper does
// not pay a bcrypt hash per scrape.
class BasicAuth {
public:
    explicit BasicAuth(std::map<std::string, std::string> users) : users_(std::move(users)) {}
    bool allows(const std::string& authorization);

private:
    std::map<std::string, std::string> users_;
    std::mutex mutex_;
    std::set<std::string> accepted_;
};

// A server for the configuration: plain HTTP, or TLS set up as the file asks.
// Null with the reason in `error` when the certificate, key or CA cannot be used.
std::unique_ptr<httplib::Server> makeServer(const WebConfig& config, std::string& error);

}  // namespace Tool

#endif

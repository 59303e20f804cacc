#include "WebConfig.h"

#include <crypt.h>
#include <string.h>

#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/ssl.h>
#include <yaml-cpp/yaml.h>

#include <httplib.h>

namespace Tool {

namespace {

// Go's names (crypto/tls), as the exporters' files spell them.
const std::map<std::string, ClientAuth> kClientAuth = {
    {"NoClientCert", ClientAuth::None},
    {"RequestClientCert", ClientAuth::Request},
    {"RequireAnyClientCert", ClientAuth::RequireAny},
    {"VerifyClientCertIfGiven", ClientAuth::VerifyIfGiven},
    {"RequireAndVerifyClientCert", ClientAuth::RequireAndVerify},
};
const std::map<std::string, int> kVersions = {
    {"TLS10", TLS1_VERSION}, {"TLS11", TLS1_1_VERSION}, {"TLS12", TLS1_2_VERSION}, {"TLS13", TLS1_3_VERSION}};

std::string besideFile(const std::string& file, const std::string& path) {
    if (path.empty() || path[0] == '/') return path;
    const size_t slash = file.rfind('/');
    return slash == std::string::npos ? path : file.substr(0, slash + 1) + path;
}

// Every key the file may hold; a misspelt key is an error, not a silent default.
bool onlyKeys(const YAML::Node& node, std::initializer_list<const char*> keys, const std::string& where,
              std::string& error) {
    if (!node.IsMap()) {
        error = where + " is not a mapping";
        return false;
    }
    for (const auto& item : node) {
        const std::string key = item.first.as<std::string>();
        bool known = false;
        for (const char* k : keys) known = known || key == k;
        if (!known) {
            error = "unknown or unsupported key '" + key + "' in " + where;
            return false;
        }
    }
    return true;
}

bool readTls(const YAML::Node& tls, const std::string& path, WebConfig& out, std::string& error) {
    if (!onlyKeys(tls, {"cert_file", "key_file", "client_auth_type", "client_ca_file", "min_version"},
                  "tls_server_config", error))
        return false;
    out.certFile = besideFile(path, tls["cert_file"].as<std::string>(""));
    out.keyFile = besideFile(path, tls["key_file"].as<std::string>(""));
    out.clientCaFile = besideFile(path, tls["client_ca_file"].as<std::string>(""));
    if (out.certFile.empty() || out.keyFile.empty()) {
        error = "tls_server_config needs cert_file and key_file";
        return false;
    }
    const std::string auth = tls["client_auth_type"].as<std::string>(out.clientCaFile.empty() ? "NoClientCert"
                                                                                             : "RequireAndVerifyClientCert");
    auto a = kClientAuth.find(auth);
    if (a == kClientAuth.end()) {
        error = "client_auth_type '" + auth + "' is not one of NoClientCert, RequestClientCert, "
                "RequireAnyClientCert, VerifyClientCertIfGiven, RequireAndVerifyClientCert";
        return false;
    }
    out.clientAuth = a->second;
    const bool verifies = out.clientAuth == ClientAuth::VerifyIfGiven || out.clientAuth == ClientAuth::RequireAndVerify;
    if (verifies && out.clientCaFile.empty()) {
        error = "client_auth_type " + auth + " needs client_ca_file";
        return false;
    }
    if (tls["min_version"]) {
        auto v = kVersions.find(tls["min_version"].as<std::string>());
        if (v == kVersions.end()) {
            error = "min_version is not one of TLS10, TLS11, TLS12, TLS13";
            return false;
        }
        out.minVersion = v->second;
    }
    return true;
}

bool readUsers(const YAML::Node& users, WebConfig& out, std::string& error) {
    if (!users.IsMap()) {
        error = "basic_auth_users is not a mapping";
        return false;
    }
    for (const auto& item : users) {
        const std::string user = item.first.as<std::string>();
        const std::string hash = item.second.as<std::string>("");
        // bcrypt only, as the exporters: a hash of another scheme is refused
        // rather than checked with weaker rules.
        if (hash.size() < 7 || hash[0] != '$' || hash[1] != '2' || (hash[2] != 'a' && hash[2] != 'b' && hash[2] != 'y') ||
            hash[3] != '$') {
            error = "the password of user '" + user + "' is not a bcrypt hash";
            return false;
        }
        out.users[user] = hash;
    }
    return true;
}

std::string decodeBase64(const std::string& in) {
    static const std::string alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string out;
    unsigned bits = 0, value = 0;
    for (char c : in) {
        if (c == '=') break;
        const size_t d = alphabet.find(c);
        if (d == std::string::npos) return std::string();
        value = (value << 6) | static_cast<unsigned>(d);
        bits += 6;
        if (bits >= 8) {
            bits -= 8;
            out += static_cast<char>((value >> bits) & 0xFF);
        }
    }
    return out;
}

std::string digest(const std::string& text) {
    unsigned char md[EVP_MAX_MD_SIZE];
    unsigned int len = 0;
    if (EVP_Digest(text.data(), text.size(), md, &len, EVP_sha256(), nullptr) != 1) return std::string();
    return std::string(reinterpret_cast<const char*>(md), len);
}

bool bcryptMatches(const std::string& password, const std::string& hash) {
    auto data = std::make_unique<crypt_data>();
    const char* result = crypt_r(password.c_str(), hash.c_str(), data.get());
    return result != nullptr && result[0] == '$' && strlen(result) == hash.size() &&
           CRYPTO_memcmp(result, hash.data(), hash.size()) == 0;
}

int acceptAnyCertificate(int, X509_STORE_CTX*) { return 1; }

}  // namespace

bool loadWebConfig(const std::string& path, WebConfig& out, std::string& error) {
    out = WebConfig();
    try {
        const YAML::Node root = YAML::LoadFile(path);
        if (root.IsNull()) return true;  // an empty file: plain HTTP, no users
        if (!onlyKeys(root, {"tls_server_config", "basic_auth_users", "http_server_config"}, "the file", error) ||
            (root["tls_server_config"] && !readTls(root["tls_server_config"], path, out, error)) ||
            (root["basic_auth_users"] && !readUsers(root["basic_auth_users"], out, error))) {
            error = path + ": " + error;
            return false;
        }
    } catch (const YAML::Exception& e) {
        error = path + ": " + e.what();
        return false;
    }
    return true;
}

bool BasicAuth::allows(const std::string& authorization) {
    if (users_.empty()) return true;
    static const std::string scheme = "Basic ";
    if (authorization.compare(0, scheme.size(), scheme) != 0) return false;
    const std::string pair = decodeBase64(authorization.substr(scheme.size()));
    const size_t colon = pair.find(':');
    if (colon == std::string::npos) return false;
    auto user = users_.find(pair.substr(0, colon));
    if (user == users_.end()) return false;
    const std::string key = digest(user->second + '\n' + pair);
    {
        std::lock_guard<std::mutex> guard(mutex_);
        if (!key.empty() && accepted_.count(key)) return true;
    }
    if (!bcryptMatches(pair.substr(colon + 1), user->second)) return false;
    std::lock_guard<std::mutex> guard(mutex_);
    if (accepted_.size() >= 64) accepted_.clear();  // bounded: a few scrapers, a few users
    if (!key.empty()) accepted_.insert(key);
    return true;
}

std::unique_ptr<httplib::Server> makeServer(const WebConfig& config, std::string& error) {
    if (!config.tls()) return std::make_unique<httplib::Server>();
    auto server = std::make_unique<httplib::SSLServer>([&config, &error](SSL_CTX& ctx) {
        SSL_CTX_set_min_proto_version(&ctx, config.minVersion ? config.minVersion : TLS1_2_VERSION);
        if (SSL_CTX_use_certificate_chain_file(&ctx, config.certFile.c_str()) != 1) {
            error = config.certFile + ": not a usable certificate";
            return false;
        }
        if (SSL_CTX_use_PrivateKey_file(&ctx, config.keyFile.c_str(), SSL_FILETYPE_PEM) != 1 ||
            SSL_CTX_check_private_key(&ctx) != 1) {
            error = config.keyFile + ": not the certificate's private key";
            return false;
        }
        if (!config.clientCaFile.empty() &&
            SSL_CTX_load_verify_locations(&ctx, config.clientCaFile.c_str(), nullptr) != 1) {
            error = config.clientCaFile + ": not a usable CA file";
            return false;
        }
        switch (config.clientAuth) {
        case ClientAuth::None: SSL_CTX_set_verify(&ctx, SSL_VERIFY_NONE, nullptr); break;
        case ClientAuth::Request: SSL_CTX_set_verify(&ctx, SSL_VERIFY_PEER, acceptAnyCertificate); break;
        case ClientAuth::RequireAny:
            SSL_CTX_set_verify(&ctx, SSL_VERIFY_PEER | SSL_VERIFY_FAIL_IF_NO_PEER_CERT, acceptAnyCertificate);
            break;
        case ClientAuth::VerifyIfGiven: SSL_CTX_set_verify(&ctx, SSL_VERIFY_PEER, nullptr); break;
        case ClientAuth::RequireAndVerify:
            SSL_CTX_set_verify(&ctx, SSL_VERIFY_PEER | SSL_VERIFY_FAIL_IF_NO_PEER_CERT, nullptr);
            break;
        }
        return true;
    });
    if (!server->is_valid()) {
        if (error.empty()) error = "cannot set up TLS";
        return nullptr;
    }
    return server;
}

}  // namespace Tool

// `serve --web.config.file`: what the file may say, and who the users let in.

#ifdef TAV_IPMI_TOOL_CORE

#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "WebConfig.h"

namespace {

// bcrypt (cost 10) of "scrape-secret".
const char* const kHash = "$2b$10$i6sTF0zw7C8UEMmymxtSMeMK1jQo8ScnxxBtxBAYL8rRDeIwwjPP.";

class WebConfigFile : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_NE(mkdtemp(dir_), nullptr); }
    void TearDown() override {
        unlink(path().c_str());
        rmdir(dir_);
    }
    std::string path() const { return std::string(dir_) + "/web.yml"; }
    bool load(const std::string& text, Tool::WebConfig& out, std::string& error) {
        FILE* f = fopen(path().c_str(), "w");
        fputs(text.c_str(), f);
        fclose(f);
        return Tool::loadWebConfig(path(), out, error);
    }
    char dir_[32] = "/tmp/webconfig-XXXXXX";
};

TEST_F(WebConfigFile, RelativePathsAreTakenFromTheFilesDirectory) {
    Tool::WebConfig c;
    std::string error;
    ASSERT_TRUE(load("tls_server_config:\n  cert_file: s.crt\n  key_file: /etc/s.key\n  client_ca_file: ca.crt\n"
                     "basic_auth_users:\n  prometheus: " + std::string(kHash) + "\n",
                     c, error))
        << error;
    EXPECT_EQ(c.certFile, std::string(dir_) + "/s.crt");
    EXPECT_EQ(c.keyFile, "/etc/s.key");
    EXPECT_EQ(c.clientCaFile, std::string(dir_) + "/ca.crt");
    EXPECT_EQ(c.clientAuth, Tool::ClientAuth::RequireAndVerify);  // a CA alone asks for verified certificates
    EXPECT_EQ(c.users.at("prometheus"), kHash);
}

TEST_F(WebConfigFile, MistakesAreRefusedWithTheirReason) {
    const struct {
        const char* text;
        const char* reason;
    } cases[] = {
        {"tls_config:\n  cert_file: a\n", "unknown or unsupported key 'tls_config' in the file"},
        {"tls_server_config:\n  cert_file: a\n", "tls_server_config needs cert_file and key_file"},
        {"tls_server_config:\n  cert_file: a\n  key_file: b\n  cipher_suites: [x]\n",
         "unknown or unsupported key 'cipher_suites' in tls_server_config"},
        {"tls_server_config:\n  cert_file: a\n  key_file: b\n  client_auth_type: VerifyClientCertIfGiven\n",
         "client_auth_type VerifyClientCertIfGiven needs client_ca_file"},
        {"tls_server_config:\n  cert_file: a\n  key_file: b\n  min_version: TLS9\n",
         "min_version is not one of TLS10, TLS11, TLS12, TLS13"},
        {"basic_auth_users:\n  u: plain\n", "the password of user 'u' is not a bcrypt hash"},
        {"basic_auth_users:\n  u: $1$md5$x\n", "the password of user 'u' is not a bcrypt hash"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.text);
        Tool::WebConfig config;
        std::string error;
        EXPECT_FALSE(load(c.text, config, error));
        EXPECT_EQ(error, path() + ": " + c.reason);
    }
}

TEST(BasicAuth, OnlyAUserWithTheRightPasswordIsLetIn) {
    Tool::BasicAuth auth(std::map<std::string, std::string>{{"prometheus", kHash}});
    const struct {
        const char* header;
        bool allowed;
    } cases[] = {
        {"Basic cHJvbWV0aGV1czpzY3JhcGUtc2VjcmV0", true},   // prometheus:scrape-secret
        {"Basic cHJvbWV0aGV1czpzY3JhcGUtc2VjcmV0", true},   // again, from the remembered pair
        {"Basic cHJvbWV0aGV1czp3cm9uZw==", false},          // prometheus:wrong
        {"Basic Z3JhZmFuYTpzY3JhcGUtc2VjcmV0", false},      // grafana:scrape-secret
        {"Basic cHJvbWV0aGV1cw==", false},                  // no colon
        {"Bearer cHJvbWV0aGV1czpzY3JhcGUtc2VjcmV0", false},
        {"", false},
    };
    for (const auto& c : cases) EXPECT_EQ(auth.allows(c.header), c.allowed) << c.header;
    EXPECT_TRUE(Tool::BasicAuth(std::map<std::string, std::string>()).allows(""));
}

}  // namespace

#endif

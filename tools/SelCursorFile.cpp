#include "SelCursorFile.h"

#include <errno.h>
#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "IpmiIfc.h"

namespace Tool {

namespace {

constexpr const char* kStateDir = "/var/lib/tav-ipmi";
constexpr int kFormat = 1;

bool simulated() { return getenv("TAVIPMI_SIMULATED") != nullptr; }

// The cursor in the file, or the reason there is none.
bool parse(const std::string& text, Ipmi::IpmiSelCursor& c, std::string& why) {
    const nlohmann::json j = nlohmann::json::parse(text, nullptr, false);
    if (j.is_discarded() || !j.is_object()) return why = "not JSON", false;
    if (j.value("format", 0) != kFormat) return why = "unknown format", false;
    const auto id = j.find("record_id"), stamp = j.find("timestamp"), digest = j.find("digest");
    if (id == j.end() || !id->is_number_unsigned() || *id > 0xFFFF || stamp == j.end() ||
        !stamp->is_number_unsigned() || *stamp > 0xFFFFFFFFu || digest == j.end() || !digest->is_string())
        return why = "fields missing or out of range", false;
    const std::string hex = *digest;
    char* end = nullptr;
    errno = 0;
    const unsigned long long d = strtoull(hex.c_str(), &end, 16);
    if (hex.empty() || hex.size() > 16 || *end != '\0' || errno != 0 || d == 0) return why = "bad digest", false;
    c.recordId = static_cast<uint16_t>(id->get<unsigned>());
    c.timestamp = stamp->get<uint32_t>();
    c.digest = d;
    return true;
}

}  // namespace

void SelCursorFile::addOption(CLI::App& sub, const std::string& name) {
    if (!simulated()) path_ = std::string(kStateDir) + "/" + name;
    sub.add_option("--state", path_,
                   "keep where SEL delivery stands in FILE, so a restart hands over what was logged meanwhile "
                   "(default /var/lib/tav-ipmi/" + name + "; none on a simulated controller)")
        ->option_text("FILE");
}

void SelCursorFile::resume() {
    if (path_.empty()) return;
    std::ifstream in(path_);
    if (!in) {
        fprintf(stderr, "tavipmi: no SEL delivery state in %s yet: delivering the records logged from now on\n",
                path_.c_str());
        return;
    }
    std::stringstream text;
    text << in.rdbuf();
    Ipmi::IpmiSelCursor cursor;
    std::string why;
    if (!parse(text.str(), cursor, why)) {
        fprintf(stderr, "tavipmi: SEL delivery state in %s is damaged (%s): delivering the records logged from now on\n",
                path_.c_str(), why.c_str());
        return;
    }
    Ipmi::IpmiIfc::resumeSelDelivery(0, cursor);
}

void SelCursorFile::save(const Ipmi::IpmiSelData& record) {
    if (path_.empty()) return;
    const Ipmi::IpmiSelCursor c = Ipmi::IpmiSelCursor::at(record);
    char digest[17];
    snprintf(digest, sizeof digest, "%016llx", static_cast<unsigned long long>(c.digest));
    const std::string text =
        nlohmann::json{{"format", kFormat}, {"record_id", c.recordId}, {"timestamp", c.timestamp}, {"digest", digest}}
            .dump() +
        "\n";
    const size_t slash = path_.rfind('/');
    if (slash != std::string::npos && slash > 0) mkdir(path_.substr(0, slash).c_str(), 0700);
    const std::string temporary = path_ + ".tmp." + std::to_string(getpid());
    const int fd = open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    bool ok = fd >= 0 && write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size()) && fsync(fd) == 0;
    if (fd >= 0) ok = close(fd) == 0 && ok;
    ok = ok && rename(temporary.c_str(), path_.c_str()) == 0;
    if (!ok) {
        if (!failedOnce_)
            fprintf(stderr, "tavipmi: cannot keep the SEL delivery state in %s: %s\n", path_.c_str(), strerror(errno));
        failedOnce_ = true;
        unlink(temporary.c_str());
    }
}

}  // namespace Tool

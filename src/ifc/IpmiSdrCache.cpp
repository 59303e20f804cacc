// The persistent SDR cache: a node's records written after a whole read, and
// read back instead of the repository when the controller and its repository
// info are the ones the file was written for. The file comes from disk, so
// it is checked as strictly as an answer from the controller.

#include "IpmiSdrCache.h"

#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <mutex>

#include "IpmiIfcInternal.h"
#include "SdrLayout.h"

namespace Ipmi {

namespace {


constexpr size_t kGuidBytes = 16;

// Key bytes that describe the repository; the rest describe the controller.
constexpr size_t kRepositoryKeyFirst = sdrcache::head::recordCount - sdrcache::head::keyFirst;
constexpr size_t kRepositoryKeyEnd = sdrcache::head::deviceId - sdrcache::head::keyFirst;

std::mutex directoryMutex;
bool directorySet = false;
std::string directory;

std::string cachePath(const std::string& dir, int node) {
    return dir + "/sdr" + std::to_string(node) + ".cache";
}

void logIgnored(const std::string& path, const std::string& why) {
    ipmiLog(LOG_DEBUG, "IpmiIfcSdrCache: %s ignored: %s", path.c_str(), why.c_str());
}

void logNotWritten(const std::string& path, const char* why) {
    ipmiLog(LOG_DEBUG, "IpmiIfcSdrCache: %s not written: %s", path.c_str(), why);
}

std::string errnoText(const char* what, int error) { return std::string(what) + ": " + strerror(error); }

// The file's bytes, read through a descriptor that follows no link and
// accepts only a regular file of ours no larger than any cache can be.
std::string readWhole(const std::string& path, std::vector<uint8_t>* out) {
    const int fd = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0) return errnoText("cannot be opened", errno);
    struct stat st;
    std::string why;
    if (fstat(fd, &st) != 0) why = errnoText("cannot be examined", errno);
    else if (!S_ISREG(st.st_mode)) why = "not a regular file";
    else if (st.st_uid != geteuid()) why = "owned by another user";
    else if (static_cast<unsigned long long>(st.st_size) > sdrcache::maxFileBytes) why = "too large";
    if (why.empty()) {
        out->resize(static_cast<size_t>(st.st_size));
        size_t got = 0;
        while (got < out->size()) {
            const ssize_t n = read(fd, out->data() + got, out->size() - got);
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) {
                why = errnoText("cannot be read", errno);
                break;
            }
            if (n == 0) break;  // shrank meanwhile: the checks below find it short
            got += static_cast<size_t>(n);
        }
        out->resize(got);
    }
    close(fd);
    return why;
}

// Creates the missing directories of `dir`, each for its owner alone.
int makeDirectories(const std::string& dir) {
    for (size_t slash = dir.find('/', 1);; slash = dir.find('/', slash + 1)) {
        const std::string part = dir.substr(0, slash);
        if (!part.empty() && mkdir(part.c_str(), 0700) != 0 && errno != EEXIST) return errno;
        if (slash == std::string::npos) return 0;
    }
}

bool writeAll(int fd, const std::vector<uint8_t>& bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t n = write(fd, bytes.data() + done, bytes.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

}  // namespace

SdrCacheKey sdrCacheKey(const uint8_t* info, const uint8_t* deviceId) {
    namespace h = sdrcache::head;
    SdrCacheKey key;
    memset(key.bytes, 0, sizeof key.bytes);
    // Key bytes by their offset in the file.
    auto at = [&key](size_t fileOffset) { return key.bytes + (fileOffset - h::keyFirst); };
    memcpy(at(h::recordCount), info + sdrInfoAnswer::recordCount, 2);
    memcpy(at(h::additionStamp), info + sdrInfoAnswer::additionStamp, 4);
    memcpy(at(h::eraseStamp), info + sdrInfoAnswer::eraseStamp, 4);
    *at(h::deviceId) = deviceId[deviceIdAnswer::deviceId];
    *at(h::deviceRevision) = deviceId[deviceIdAnswer::deviceRevision];
    *at(h::firmware1) = deviceId[deviceIdAnswer::fwRev1];
    *at(h::firmware2) = deviceId[deviceIdAnswer::fwRev2];
    memcpy(at(h::manufacturer), deviceId + deviceIdAnswer::manufacturer, 3);
    memcpy(at(h::product), deviceId + deviceIdAnswer::product, 2);
    memcpy(at(h::auxFirmware), deviceId + deviceIdAnswer::auxFirmware, 4);
    return key;
}

void sdrCacheKeyAddGuid(SdrCacheKey* key, const uint8_t* guid) {
    namespace h = sdrcache::head;
    key->bytes[h::flags - h::keyFirst] |= sdrcache::bits::hasGuid;
    memcpy(key->bytes + (h::guid - h::keyFirst), guid, kGuidBytes);
}

std::string sdrCacheParse(const uint8_t* bytes, size_t size, const SdrCacheKey& key, SdrCacheRecords* out) {
    const sdrcache::HeadView file(bytes, size);
    if (!file.complete()) return "truncated";
    if (!file.magicMatches()) return "not an SDR cache";
    if (file.formatVersion() != sdrcache::formatVersion) return "format version " + std::to_string(file.formatVersion());
    if (file.bodyLength() != file.bodyBytesPresent())
        return file.bodyLength() > file.bodyBytesPresent() ? "truncated" : "longer than its body";
    const uint8_t* body = file.body();
    const size_t bodyLength = file.bodyBytesPresent();
    if (sdrcache::crc32(body, bodyLength) != file.bodyChecksum()) return "checksum mismatch";
    if (memcmp(file.key() + kRepositoryKeyFirst, key.bytes + kRepositoryKeyFirst,
               kRepositoryKeyEnd - kRepositoryKeyFirst) != 0)
        return "the repository changed";
    if (memcmp(file.key(), key.bytes, sizeof key.bytes) != 0) return "written for another controller";
    // A walk never files more records than the repository info counts.
    const uint16_t claimed = sdrcache::le16(key.bytes + kRepositoryKeyFirst);
    if (file.records() > claimed) return "more records than the repository holds";

    SdrCacheRecords records;
    records.reserve(file.records());
    size_t at = 0;
    for (uint32_t i = 0; i < file.records(); ++i) {
        if (bodyLength - at < sdrcache::recordLengthByte) return "record " + std::to_string(i) + " cut short";
        const size_t length = body[at];
        at += sdrcache::recordLengthByte;
        // As from the wire: a whole header, and as many bytes as it says follow.
        if (length < sdr::header::length || bodyLength - at < length ||
            body[at + sdr::header::remainingLength] + sdr::header::length != length)
            return "record " + std::to_string(i) + " out of bounds";
        records.emplace_back(body + at, body + at + length);
        at += length;
    }
    if (at != bodyLength) return "longer than its records";
    *out = std::move(records);
    return "";
}

std::vector<uint8_t> sdrCacheImage(const SdrCacheKey& key, const SdrCacheRecords& records) {
    namespace h = sdrcache::head;
    std::vector<uint8_t> file(h::length, 0);
    uint16_t kept = 0;
    for (const auto& r : records) {
        // Only records a read can produce; the reader refuses any other.
        if (r.size() < sdr::header::length || r.size() > 0xFF || kept == sdrcache::maxRecords) continue;
        file.push_back(static_cast<uint8_t>(r.size()));
        file.insert(file.end(), r.begin(), r.end());
        ++kept;
    }
    memcpy(file.data() + h::magic, sdrcache::magic, sizeof sdrcache::magic);
    sdrcache::putLe16(file.data() + h::formatVersion, sdrcache::formatVersion);
    memcpy(file.data() + h::keyFirst, key.bytes, sizeof key.bytes);
    sdrcache::putLe16(file.data() + h::records, kept);
    const size_t bodyLength = file.size() - h::length;
    sdrcache::putLe32(file.data() + h::bodyLength, static_cast<uint32_t>(bodyLength));
    sdrcache::putLe32(file.data() + h::bodyChecksum, sdrcache::crc32(file.data() + h::length, bodyLength));
    return file;
}

std::string sdrCacheDirectory() {
    std::lock_guard<std::mutex> guard(directoryMutex);
    if (directorySet) return directory;
    const char* fromEnvironment = getenv("TAV_IPMI_SDR_CACHE_DIR");
    return fromEnvironment != nullptr ? fromEnvironment : "";
}

SdrCacheFile sdrCacheRead(int node) {
    SdrCacheFile file;
    file.path = cachePath(sdrCacheDirectory(), node);
    file.unreadable = readWhole(file.path, &file.bytes);
    return file;
}

bool sdrCacheHasGuid(const SdrCacheFile& file) {
    const sdrcache::HeadView head(file.bytes.data(), file.bytes.size());
    return file.unreadable.empty() && head.magicMatches() && (head.key()[0] & sdrcache::bits::hasGuid) != 0;
}

bool sdrCacheUse(const SdrCacheFile& file, const SdrCacheKey& key, SdrCacheRecords* out) {
    std::string why = file.unreadable;
    if (why.empty()) why = sdrCacheParse(file.bytes.data(), file.bytes.size(), key, out);
    if (!why.empty()) {
        logIgnored(file.path, why);
        return false;
    }
    ipmiLog(LOG_DEBUG, "IpmiIfcSdrCache: %zu records from %s", out->size(), file.path.c_str());
    return true;
}

void sdrCacheStore(int node, const SdrCacheKey& key, const SdrCacheRecords& records) {
    const std::string dir = sdrCacheDirectory();
    if (dir.empty()) return;
    const std::string path = cachePath(dir, node);
    const int dirError = makeDirectories(dir);
    if (dirError != 0) {
        logNotWritten(path, strerror(dirError));
        return;
    }
    // Written aside and renamed over the old file: a reader, or a second
    // writer, sees the old file or the new one, never a mix.
    std::string temporary = path + ".XXXXXX";
    const int fd = mkostemp(&temporary[0], O_CLOEXEC);
    if (fd < 0) {
        logNotWritten(path, strerror(errno));
        return;
    }
    const bool written = fchmod(fd, 0600) == 0 && writeAll(fd, sdrCacheImage(key, records));
    const int writeError = errno;
    if (close(fd) != 0 || !written || rename(temporary.c_str(), path.c_str()) != 0) {
        logNotWritten(path, strerror(written ? errno : writeError));
        unlink(temporary.c_str());
    }
}

void IpmiIfc::setSdrCacheDir(const std::string& dir) {
    std::lock_guard<std::mutex> guard(directoryMutex);
    directorySet = true;
    directory = dir;
}

std::string IpmiIfc::getSdrCacheDir() { return sdrCacheDirectory(); }

}  // namespace Ipmi

// The persistent SDR cache against the simulated controller: what a warm
// cache saves, what makes it be read afresh, and how a damaged or unwritable
// cache file costs the cache and never the read.

#include <dirent.h>
#include <fcntl.h>
#include <ftw.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <functional>
#include <iterator>

#include <gtest/gtest.h>

#include "IpmiSdrCache.h"
#include "IpmiSensor.h"
#include "SdrLayout.h"
#include "TestSupport.h"

using namespace Ipmi;

namespace {

using Bytes = std::vector<uint8_t>;

Bytes readBytes(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

void writeBytes(const std::string& path, const Bytes& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

// A body byte changed, with the checksum made to match again: what the
// reader must catch by its bounds, not by the checksum.
void rewriteBody(Bytes& file, size_t bodyOffset, uint8_t value) {
    namespace h = sdrcache::head;
    file[h::length + bodyOffset] = value;
    sdrcache::putLe32(file.data() + h::bodyChecksum, sdrcache::crc32(file.data() + h::length, file.size() - h::length));
}

class SdrCache : public TestSupport::SimTest {
protected:
    void SetUp() override {
        SimTest::SetUp();
        char dir[] = "/tmp/tav-sdr-cache-XXXXXX";
        ASSERT_NE(mkdtemp(dir), nullptr);
        root_ = dir;
        dir_ = root_ + "/cache";
        IpmiIfc::setSdrCacheDir(dir_);
        useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
    }
    void TearDown() override {
        IpmiIfc::setSdrCacheDir("");
        nftw(
            root_.c_str(), [](const char* p, const struct stat*, int, struct FTW*) { return remove(p); }, 16,
            FTW_DEPTH | FTW_PHYS);
        SimTest::TearDown();
    }
    std::string file() const { return dir_ + "/sdr0.cache"; }
    unsigned sdrReads() { return sim().exchanges(netfn::storage, cmd::getSdr); }
    unsigned reservations() { return sim().exchanges(netfn::storage, cmd::reserveSdrRepository); }
    // One refresh chain from a clean log and clean counters.
    void refresh() {
        sim().resetCounters();
        log.clear();
        ASSERT_EQ(IpmiIfcSdrGetInfo(0), 0u);
    }
    // Every sensor as callers see it: number and name, in list order.
    std::vector<std::string> sensors() {
        std::vector<std::string> out;
        for (const auto& s : IpmiIfc::getSensors(0))
            out.push_back(std::to_string(s->getSensorNumber()) + " " + s->getSensorIdString());
        return out;
    }
    std::string ignored(const std::string& why) const { return "IpmiIfcSdrCache: " + file() + " ignored: " + why; }

    std::string root_;
    std::string dir_;
};

TEST_F(SdrCache, WarmRefreshFilesTheSameRecordsWithoutReadingTheRepository) {
    refresh();
    const std::vector<std::string> cold = sensors();
    ASSERT_FALSE(cold.empty());
    EXPECT_GT(sdrReads(), 0u);
    struct stat dirStat, fileStat;
    ASSERT_EQ(stat(dir_.c_str(), &dirStat), 0);
    ASSERT_EQ(stat(file().c_str(), &fileStat), 0);
    EXPECT_EQ(dirStat.st_mode & 0777, 0700u);
    EXPECT_EQ(fileStat.st_mode & 0777, 0600u);

    refresh();
    EXPECT_EQ(sdrReads(), 0u);
    EXPECT_EQ(reservations(), 0u);
    EXPECT_EQ(sensors(), cold);
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getDeviceId), 1u);
    // The simulated controller has no GUID: the file says so, and it is not asked.
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getSystemGuid), 0u);
    EXPECT_TRUE(log.contains(LOG_DEBUG, "IpmiIfcSdrCache: " + std::to_string(bmc().sdr.records.size()) +
                                            " records from " + file()))
        << log.dump();
}

TEST_F(SdrCache, OffByDefaultTheExchangesAreTheRepositoryReadAlone) {
    IpmiIfc::setSdrCacheDir("");
    refresh();
    refresh();
    EXPECT_GT(sdrReads(), 0u);
    EXPECT_EQ(sim().exchanges(netfn::app, cmd::getDeviceId) + sim().exchanges(netfn::app, cmd::getSystemGuid), 0u);
    EXPECT_NE(access(root_.c_str(), F_OK), -1);
    EXPECT_EQ(access(dir_.c_str(), F_OK), -1);
}

TEST_F(SdrCache, WarmStartRunsAfterOneRepositoryInfoAndDiscovery) {
    refresh();
    const std::vector<std::string> cold = sensors();
    // start() clears the node record as a new process has it: nothing held.
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSdrCleanUpHeaders(0);
    IpmiIfcEntityCleanUpAll(0);
    IpmiIfcSensorInstantiateAll(0);
    sim().resetCounters();
    {
        TestSupport::LoopThread loop(0);
        ASSERT_EQ(IpmiIfc::waitState(12), IpmiIfc::IPMI_STATE_RUNNING);
        EXPECT_EQ(sim().exchanges(netfn::storage, cmd::getSdrRepositoryInfo), 1u);
        EXPECT_EQ(reservations(), 0u);
        EXPECT_EQ(sdrReads(), 0u);
        EXPECT_EQ(sensors(), cold);
    }
}

// Whatever changed about the repository or the controller, the records are
// read again, and the file written then serves the next refresh.
TEST_F(SdrCache, AChangedRepositoryOrControllerIsReadAfresh) {
    const struct {
        const char* change;
        std::function<void(Sim::Bmc&)> apply;
        const char* why;
    } cases[] = {
        {"another record count", [](Sim::Bmc& b) { b.sdr.records.pop_back(); }, "the repository changed"},
        {"another addition stamp", [](Sim::Bmc& b) { b.sdr.additionTimestamp += 1; }, "the repository changed"},
        {"another erase stamp", [](Sim::Bmc& b) { b.sdr.eraseTimestamp += 1; }, "the repository changed"},
        {"another manufacturer", [](Sim::Bmc& b) { b.identity.manufacturerId = 343; }, "written for another controller"},
        {"another product", [](Sim::Bmc& b) { b.identity.productId ^= 1; }, "written for another controller"},
        {"a firmware update", [](Sim::Bmc& b) { b.identity.fwMinor ^= 1; }, "written for another controller"},
        {"an auxiliary firmware update", [](Sim::Bmc& b) { b.identity.auxFw[3] ^= 1; },
         "written for another controller"},
        {"another device revision", [](Sim::Bmc& b) { b.identity.deviceRevision ^= 1; },
         "written for another controller"},
        {"another GUID", [](Sim::Bmc& b) { b.identity.guid[15] ^= 1; }, "written for another controller"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.change);
        useBmc(Sim::loadProfile(Sim::defaultProfilePath()));
        bmc().identity.guid = Bytes(16, 0xA5);
        unlink(file().c_str());
        refresh();
        c.apply(bmc());
        refresh();
        EXPECT_GT(sdrReads(), 0u);
        EXPECT_EQ(log.count(ignored(c.why)), 1u) << log.dump();
        refresh();
        EXPECT_EQ(sdrReads(), 0u);
    }
}

// A file that cannot be trusted is ignored with one debug line, the
// repository is read and the file replaced by a good one.
TEST_F(SdrCache, ADamagedFileIsIgnoredAndReplaced) {
    namespace h = sdrcache::head;
    const struct {
        const char* damage;
        std::function<void(const std::string&, Bytes&)> apply;
        std::string why;
    } cases[] = {
        {"missing", [](const std::string& p, Bytes&) { unlink(p.c_str()); },
         "cannot be opened: No such file or directory"},
        {"a symbolic link",
         [](const std::string& p, Bytes&) {
             EXPECT_EQ(rename(p.c_str(), (p + ".real").c_str()), 0);
             EXPECT_EQ(symlink((p + ".real").c_str(), p.c_str()), 0);
         },
         "cannot be opened: Too many levels of symbolic links"},
        {"a directory",
         [](const std::string& p, Bytes&) {
             unlink(p.c_str());
             EXPECT_EQ(mkdir(p.c_str(), 0700), 0);
         },
         "not a regular file"},
        {"another user's", [](const std::string& p, Bytes&) { EXPECT_EQ(chown(p.c_str(), 65534, 65534), 0); },
         "owned by another user"},
        {"cut in its header", [](const std::string&, Bytes& f) { f.resize(h::length - 1); }, "truncated"},
        {"cut in its body", [](const std::string&, Bytes& f) { f.pop_back(); }, "truncated"},
        {"longer than its body", [](const std::string&, Bytes& f) { f.push_back(0); }, "longer than its body"},
        {"no magic", [](const std::string&, Bytes& f) { f[h::magic] ^= 1; }, "not an SDR cache"},
        {"a later format", [](const std::string&, Bytes& f) { f[h::formatVersion] = 2; }, "format version 2"},
        {"a flipped body byte", [](const std::string&, Bytes& f) { f.back() ^= 0x40; }, "checksum mismatch"},
        {"a record shorter than a header", [](const std::string&, Bytes& f) { rewriteBody(f, 0, 4); },
         "record 0 out of bounds"},
        {"a record longer than its header says",
         [](const std::string&, Bytes& f) {
             const size_t remaining = sdrcache::recordLengthByte + sdr::header::remainingLength;
             rewriteBody(f, remaining, static_cast<uint8_t>(f[h::length + remaining] + 1));
         },
         "record 0 out of bounds"},
        {"more records than the repository",
         [](const std::string&, Bytes& f) { sdrcache::putLe16(f.data() + h::records, 0xFFFF); },
         "more records than the repository holds"},
        {"fewer records than its body holds",
         [](const std::string&, Bytes& f) { sdrcache::putLe16(f.data() + h::records, 1); }, "longer than its records"},
    };
    refresh();
    const std::vector<std::string> cold = sensors();
    const Bytes good = readBytes(file());
    for (const auto& c : cases) {
        SCOPED_TRACE(c.damage);
        Bytes damaged = good;
        c.apply(file(), damaged);
        if (damaged != good) writeBytes(file(), damaged);
        refresh();
        EXPECT_GT(sdrReads(), 0u);
        EXPECT_EQ(sensors(), cold);
        EXPECT_EQ(log.count(ignored(c.why)), 1u) << log.dump();
        unlink((file() + ".real").c_str());
        struct stat st;
        if (lstat(file().c_str(), &st) == 0 && S_ISDIR(st.st_mode)) {
            // A directory stays in the new file's way: nothing else is lost.
            EXPECT_EQ(log.count("IpmiIfcSdrCache: " + file() + " not written: Is a directory"), 1u) << log.dump();
            rmdir(file().c_str());
            writeBytes(file(), good);
        }
        EXPECT_EQ(readBytes(file()), good);
        refresh();
        EXPECT_EQ(sdrReads(), 0u);
    }
}

// A cache that cannot be written costs the cache: the read and the records
// are those of a run without one, and no temporary file is left behind.
TEST_F(SdrCache, AnUnwritableCacheCostsTheCacheNotTheRead) {
    const struct {
        const char* obstacle;
        std::function<void(const std::string&)> apply;
        std::function<void()> undo;
        const char* why;
    } cases[] = {
        {"the directory is a file", [](const std::string& d) { writeBytes(d, Bytes{1}); },
         [this] { unlink(dir_.c_str()); }, "Not a directory"},
        {"the disk is full",
         [](const std::string& d) {
             mkdir(d.c_str(), 0700);
             signal(SIGXFSZ, SIG_IGN);
             struct rlimit small = {64, RLIM_INFINITY};
             setrlimit(RLIMIT_FSIZE, &small);
         },
         [] {
             struct rlimit none = {RLIM_INFINITY, RLIM_INFINITY};
             setrlimit(RLIMIT_FSIZE, &none);
             signal(SIGXFSZ, SIG_DFL);
         },
         "File too large"},
    };
    IpmiIfc::setSdrCacheDir("");
    refresh();
    const std::vector<std::string> uncached = sensors();
    const unsigned reads = sdrReads();
    IpmiIfc::setSdrCacheDir(dir_);
    for (const auto& c : cases) {
        SCOPED_TRACE(c.obstacle);
        c.apply(dir_);
        refresh();
        c.undo();
        EXPECT_EQ(sdrReads(), reads);
        EXPECT_EQ(sensors(), uncached);
        EXPECT_EQ(log.count("IpmiIfcSdrCache: " + file() + " not written: " + c.why), 1u) << log.dump();
        struct stat st;
        if (stat(dir_.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) {
            DIR* d = opendir(dir_.c_str());
            size_t entries = 0;
            while (readdir(d) != nullptr) ++entries;
            closedir(d);
            EXPECT_EQ(entries, 2u);  // "." and ".."
        }
    }
}

TEST_F(SdrCache, ARecordsOnlyReadBuildsNoSensorsAndDescribingAsksNothing) {
    refresh();
    const std::vector<std::string> discovered = sensors();
    IpmiIfcSdrCleanUpAll(0);
    IpmiIfcSensorInstantiateAll(0);  // no records: no sensors
    sim().resetCounters();
    ASSERT_EQ(IpmiIfcSdrReadRecords(0), 0u);
    EXPECT_TRUE(sensors().empty());
    EXPECT_EQ(IpmiIfcSensorDescribeAll(0), 0);
    EXPECT_EQ(sensors(), discovered);
    EXPECT_EQ(sim().exchanges(netfn::sensorEvent, cmd::getSensorReading) +
                  sim().exchanges(netfn::sensorEvent, cmd::getSensorThresholds),
              0u);
}

}  // namespace

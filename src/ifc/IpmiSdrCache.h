#ifndef TAV_IPMI_IPMISDRCACHE_H
#define TAV_IPMI_IPMISDRCACHE_H

// The persistent SDR cache: a node's records as Get SDR walked them, kept in
// a file beside the key they are valid for. Not installed.

#include <stddef.h>
#include <stdint.h>

#include <string>
#include <vector>

#include "SdrCacheLayout.h"

namespace Ipmi {

// What the records of a cache file are valid for: the repository info's
// record count and stamps, and the controller's identity.
struct SdrCacheKey {
    uint8_t bytes[sdrcache::head::keyLength];
};

// Whole records (5-byte header included) in walk order.
using SdrCacheRecords = std::vector<std::vector<uint8_t>>;

// `info`: the 15-byte repository info answer; `deviceId`: the 16-byte Get
// Device ID answer (completion code first, missing bytes zero). The key has
// no GUID until one is added.
SdrCacheKey sdrCacheKey(const uint8_t* info, const uint8_t* deviceId);
// Adds the controller's 16-byte system GUID to the key.
void sdrCacheKeyAddGuid(SdrCacheKey* key, const uint8_t* guid);

// The records of a cache file's bytes when they are whole and valid for
// `key`. Returns "" on success, otherwise why the file is not used.
std::string sdrCacheParse(const uint8_t* bytes, size_t size, const SdrCacheKey& key, SdrCacheRecords* out);
// The bytes of a cache file holding `records` for `key`.
std::vector<uint8_t> sdrCacheImage(const SdrCacheKey& key, const SdrCacheRecords& records);

// The directory of the cache files, "" when the cache is off.
std::string sdrCacheDirectory();
// A node's cache file as read from disk.
struct SdrCacheFile {
    std::string path;
    std::vector<uint8_t> bytes;
    std::string unreadable;  // why it could not be read, "" when it was
};
SdrCacheFile sdrCacheRead(int node);
// Whether the file was written for a controller that answered Get System
// GUID: only then is a GUID part of the key to compare.
bool sdrCacheHasGuid(const SdrCacheFile& file);
// The file's records when it is valid for `key`; otherwise false, after one
// debug line.
bool sdrCacheUse(const SdrCacheFile& file, const SdrCacheKey& key, SdrCacheRecords* out);
// Replaces the node's cache file; a failure costs the cache (one debug line).
void sdrCacheStore(int node, const SdrCacheKey& key, const SdrCacheRecords& records);

}  // namespace Ipmi

#endif

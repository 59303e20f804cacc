#ifndef TAV_IPMI_IPMICOMMANDS_H
#define TAV_IPMI_IPMICOMMANDS_H

#include <stddef.h>
#include <stdint.h>

// IPMI v2.0 network functions, commands and completion codes, named once for
// the library, the simulated controller and the tests.
namespace Ipmi {
namespace netfn {
constexpr uint8_t chassis = 0x00;
constexpr uint8_t sensorEvent = 0x04;
constexpr uint8_t app = 0x06;
constexpr uint8_t storage = 0x0A;
constexpr uint8_t transport = 0x0C;
}  // namespace netfn

namespace cmd {
// Chassis
constexpr uint8_t chassisIdentify = 0x04;
// Sensor/Event
constexpr uint8_t setLastProcessedEventId = 0x14;
constexpr uint8_t getLastProcessedEventId = 0x15;
constexpr uint8_t setSensorHysteresis = 0x24;
constexpr uint8_t getSensorHysteresis = 0x25;
constexpr uint8_t setSensorThresholds = 0x26;
constexpr uint8_t getSensorThresholds = 0x27;
constexpr uint8_t setSensorEventEnable = 0x28;
constexpr uint8_t getSensorEventEnable = 0x29;
constexpr uint8_t rearmSensorEvents = 0x2A;
constexpr uint8_t getSensorReading = 0x2D;
constexpr uint8_t getDeviceSdrInfo = 0x20;
constexpr uint8_t getDeviceSdr = 0x21;
constexpr uint8_t reserveDeviceSdrRepository = 0x22;
// App
constexpr uint8_t getDeviceId = 0x01;
constexpr uint8_t getSelfTestResults = 0x04;
constexpr uint8_t getSystemGuid = 0x37;
constexpr uint8_t getChannelInfo = 0x42;
constexpr uint8_t setSystemInfoParameters = 0x58;
constexpr uint8_t getSystemInfoParameters = 0x59;
// Storage
constexpr uint8_t getFruInventoryAreaInfo = 0x10;
constexpr uint8_t readFruData = 0x11;
constexpr uint8_t getSdrRepositoryInfo = 0x20;
constexpr uint8_t reserveSdrRepository = 0x22;
constexpr uint8_t getSdr = 0x23;
constexpr uint8_t getSelInfo = 0x40;
constexpr uint8_t getSelAllocationInfo = 0x41;
constexpr uint8_t reserveSel = 0x42;
constexpr uint8_t getSelEntry = 0x43;
constexpr uint8_t addSelEntry = 0x44;
constexpr uint8_t deleteSelEntry = 0x46;
constexpr uint8_t clearSel = 0x47;
constexpr uint8_t getSelTime = 0x48;
constexpr uint8_t setSelTime = 0x49;
// Transport
constexpr uint8_t getLanConfigParameters = 0x02;
}  // namespace cmd

namespace cc {
constexpr uint8_t ok = 0x00;
constexpr uint8_t parameterNotSupported = 0x80;  // system info / LAN parameters
constexpr uint8_t eraseInProgress = 0x81;        // SEL commands while the log is being erased
constexpr uint8_t nodeBusy = 0xC0;
constexpr uint8_t invalidCommand = 0xC1;
constexpr uint8_t timeout = 0xC3;
constexpr uint8_t outOfSpace = 0xC4;
constexpr uint8_t reservationCancelled = 0xC5;
constexpr uint8_t requestDataTruncated = 0xC6;
constexpr uint8_t requestDataLengthInvalid = 0xC7;
constexpr uint8_t requestDataFieldLengthExceeded = 0xC8;
constexpr uint8_t parameterOutOfRange = 0xC9;
constexpr uint8_t cannotReturnRequestedBytes = 0xCA;
constexpr uint8_t requestedSensorNotPresent = 0xCB;
constexpr uint8_t invalidDataField = 0xCC;
constexpr uint8_t illegalForSensorType = 0xCD;
constexpr uint8_t responseNotProvided = 0xCE;
constexpr uint8_t unspecifiedError = 0xFF;
}  // namespace cc

// System information parameters (Get/Set System Info Parameters).
namespace sysInfoParam {
constexpr uint8_t osName = 4;
constexpr uint8_t osVersion = 5;
}  // namespace sysInfoParam

// LAN configuration parameters (Get/Set LAN Configuration Parameters).
namespace lanParam {
constexpr uint8_t setInProgress = 0;
constexpr uint8_t authTypeSupport = 1;
constexpr uint8_t authTypeEnables = 2;
constexpr uint8_t ipAddress = 3;
constexpr uint8_t ipAddressSource = 4;
constexpr uint8_t macAddress = 5;
constexpr uint8_t subnetMask = 6;
constexpr uint8_t ipv4HeaderParameters = 7;
constexpr uint8_t bmcArpControl = 10;
constexpr uint8_t gratuitousArpInterval = 11;
constexpr uint8_t defaultGatewayAddress = 12;
constexpr uint8_t defaultGatewayMac = 13;
constexpr uint8_t backupGatewayAddress = 14;
constexpr uint8_t backupGatewayMac = 15;
constexpr uint8_t communityString = 16;
constexpr uint8_t vlanId = 20;
constexpr uint8_t vlanPriority = 21;
constexpr uint8_t cipherSuiteEntrySupport = 22;
constexpr uint8_t cipherSuiteEntries = 23;
constexpr uint8_t cipherSuitePrivilegeLevels = 24;
constexpr uint8_t badPasswordThreshold = 26;
constexpr uint8_t ipv6StaticAddresses = 0x38;
}  // namespace lanParam

// IP address source byte of LAN parameter 4.
namespace ipSource {
constexpr uint8_t unspecified = 0;
constexpr uint8_t staticAddress = 1;
constexpr uint8_t dhcp = 2;
constexpr uint8_t bios = 3;
constexpr uint8_t other = 4;
}  // namespace ipSource

// Channel medium types (Get Channel Info).
namespace channelMedium {
constexpr uint8_t ipmb = 0x01;
constexpr uint8_t lan8023 = 0x04;
constexpr uint8_t asyncSerial = 0x05;
constexpr uint8_t otherLan = 0x06;
constexpr uint8_t systemInterface = 0x0C;
}  // namespace channelMedium

// Get Device ID answer, completion code first.
namespace deviceIdAnswer {
constexpr size_t completionCode = 0;
constexpr size_t deviceId = 1;
constexpr size_t deviceRevision = 2;
constexpr size_t fwRev1 = 3;
constexpr size_t fwRev2 = 4;
constexpr size_t ipmiVersion = 5;
constexpr size_t manufacturer = 7;  // three bytes, least significant first
constexpr size_t product = 10;      // two bytes
constexpr size_t auxFirmware = 12;  // four bytes
constexpr size_t size = 16;
}  // namespace deviceIdAnswer

// Get SDR Repository Info answer, completion code first.
namespace sdrInfoAnswer {
constexpr size_t version = 1;
constexpr size_t recordCount = 2;    // u16 LE
constexpr size_t additionStamp = 6;  // u32 LE
constexpr size_t eraseStamp = 10;    // u32 LE
constexpr size_t size = 15;
}  // namespace sdrInfoAnswer
}  // namespace Ipmi

#endif

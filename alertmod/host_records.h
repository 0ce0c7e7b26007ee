// The binary records through which the recording server (the host) and the
// alert module talk to each other, and the request classes and codes they use.
//
// This is the one header the module and any host share. The layouts are a
// binary contract: every offset below is checked with static_assert, and the
// bytes not named here belong to the host. The records are plain data; any
// thread may fill or read them.
//
// A host written in C (C11) includes it too: the records and constants keep
// their names, without the namespace (the constants are enumerators there),
// and MakeHostRequest is for C++ only.
#ifndef ALERTMOD_HOST_RECORDS_H_
#define ALERTMOD_HOST_RECORDS_H_

#ifdef __cplusplus
#include <cstddef>
#include <cstdint>
#define ALERTMOD_CONSTANT(type, name, value) constexpr type name = value
#else
#include <assert.h>
#include <stddef.h>
#include <stdint.h>
#define ALERTMOD_CONSTANT(type, name, value) enum { name = value }
typedef struct HostRequest HostRequest;
typedef struct LoadParmsIn LoadParmsIn;
typedef struct LoadParmsOut LoadParmsOut;
typedef struct WriteParmsIn WriteParmsIn;
typedef struct WriteParmsOut WriteParmsOut;
typedef struct ReadParmsIn ReadParmsIn;
typedef struct IoctlParmsIn IoctlParmsIn;
typedef struct ProcessMessageHeader ProcessMessageHeader;
#endif

#ifdef __cplusplus
namespace hx {
namespace core {

struct HostRequest;
#endif

// The host's request function. Result 0 means success; for the log-level query
// it is the host's current threshold. The module always passes 0 as `reserved`.
typedef int32_t (*HostCallbackFn)(HostRequest* request, void* reserved);

// Identifies the alert module in every request, log record and document.
ALERTMOD_CONSTANT(uint32_t, kModuleId, 0xC0000);
// Source identifier under which the clip writer logs.
ALERTMOD_CONSTANT(uint32_t, kClipWriterLogSource, 0x390000);

// Request classes of HostRequest::requestClass.
ALERTMOD_CONSTANT(uint32_t, kClassProfileStatus, 0x4);
ALERTMOD_CONSTANT(uint32_t, kClassWatchdogTick, 0x20);
ALERTMOD_CONSTANT(uint32_t, kClassLog, 0x40);
ALERTMOD_CONSTANT(uint32_t, kClassDocument, 0x100);
ALERTMOD_CONSTANT(uint32_t, kClassFrameRelease, 0x200);
ALERTMOD_CONSTANT(uint32_t, kClassProcess, 0x2000);
ALERTMOD_CONSTANT(uint32_t, kClassCrypto, 0x8000);

// Request codes of HostRequest::code.
ALERTMOD_CONSTANT(uint32_t, kCodeDocument, 0x01000010);  // classes 4 and 0x100
ALERTMOD_CONSTANT(uint32_t, kCodeTick, 0x01000000);
ALERTMOD_CONSTANT(uint32_t, kCodeLogLevelQuery, 0x01000001);
ALERTMOD_CONSTANT(uint32_t, kCodeLogWrite, 0x01000002);
ALERTMOD_CONSTANT(uint32_t, kCodeEncrypt, 0x01000002);
ALERTMOD_CONSTANT(uint32_t, kCodeDecrypt, 0x01000400);

// Write classes of WriteParmsIn::requestClass.
ALERTMOD_CONSTANT(uint32_t, kWriteClassFrame, 1);
ALERTMOD_CONSTANT(uint32_t, kWriteClassTick, 32);

// IOCTL control codes of IoctlParmsIn::code.
ALERTMOD_CONSTANT(uint32_t, kIoctlRunWorker, 1);
ALERTMOD_CONSTANT(uint32_t, kIoctlHostDocument, 2);
ALERTMOD_CONSTANT(uint32_t, kIoctlProcessMessage, 4);

// ReadParmsIn::mode that runs the watchdog loop.
ALERTMOD_CONSTANT(uint32_t, kReadModeWatchdog, 0);

// Frame type of a key frame (WriteParmsIn::frameType).
ALERTMOD_CONSTANT(uint8_t, kFrameTypeKey, 1);

// Constants written into LoadParmsOut.
ALERTMOD_CONSTANT(uint32_t, kCapabilityWord1, 0x0200006C);
ALERTMOD_CONSTANT(uint32_t, kCapabilityWord2, 0x02000010);
ALERTMOD_CONSTANT(uint32_t, kCapabilityWord3, 0x02000000);

// Values of the class-specific header of log and crypto requests.
ALERTMOD_CONSTANT(uint32_t, kRequestExtSize, 152);
ALERTMOD_CONSTANT(uint32_t, kRequestExtVersion, 1);

ALERTMOD_CONSTANT(uint32_t, kHostRequestSize, 192);
ALERTMOD_CONSTANT(uint32_t, kHostRequestVersion, 1);

// Process-service messages (request class 0x2000 and IOCTL code 4): a
// ProcessMessageHeader, then the payload; at most 65536 bytes in all.
ALERTMOD_CONSTANT(uint32_t, kProcessMessageMaxBytes, 65536);
// Message types: module to host.
ALERTMOD_CONSTANT(uint32_t, kProcessInput,
                  0);  // standard input; one shorter than the maximum ends it
ALERTMOD_CONSTANT(uint32_t, kProcessStart, 6);  // value: start flags; payload: the command
// Message types: host to module.
ALERTMOD_CONSTANT(uint32_t, kProcessOutput, 1);
ALERTMOD_CONSTANT(uint32_t, kProcessErrorOutput, 2);
ALERTMOD_CONSTANT(uint32_t, kProcessRunning, 3);
ALERTMOD_CONSTANT(uint32_t, kProcessFailed, 4);
ALERTMOD_CONSTANT(uint32_t, kProcessExited, 5);  // value: the exit code
// Start flags that put optional texts before the program.
ALERTMOD_CONSTANT(uint32_t, kProcessFlagFirstText, 8);
ALERTMOD_CONSTANT(uint32_t, kProcessFlagSecondText, 16);

// Host to module, read by Load.
struct LoadParmsIn {
  uint8_t hostReserved0[0x10];
  HostCallbackFn callback;  // 0x10
  uint8_t hostReserved1[0x20];
};

// Filled by Load; bytes not named are left as the host supplied them.
struct LoadParmsOut {
  uint8_t hostReserved0[0x08];
  uint32_t moduleId;         // 0x08
  uint32_t capabilityWord1;  // 0x0C
  uint8_t hostReserved1[0x04];
  uint32_t capabilityWord2;  // 0x14
  uint8_t hostReserved2[0x08];
  uint32_t capabilityWord3;  // 0x20
  uint8_t hostReserved3[0x10];
  uint8_t flag34;  // 0x34
  uint8_t hostReserved4;
  uint8_t flag36;  // 0x36
  uint8_t flag37;  // 0x37
  uint8_t hostReserved5[0x08];
};

// Host to module, read by Write.
struct WriteParmsIn {
  uint8_t hostReserved0[0x10];
  uint32_t length;  // 0x10
  uint8_t hostReserved1[0x04];
  const void* data;  // 0x18
  uint32_t source;   // 0x20: stream id (class 1) or sender module id
  uint8_t hostReserved2[0x04];
  uint32_t requestClass;  // 0x28
  uint32_t frameExtra;    // 0x2C: passed along, never used
  uint8_t hostReserved3[0x08];
  uint32_t payloadOffset;  // 0x38
  uint8_t hostReserved4[0x06];
  uint8_t frameType;  // 0x42
  uint8_t hostReserved5[0x05];
};

// Module to host, written by Write for class 1 only.
struct WriteParmsOut {
  uint8_t hostReserved0[0x1C];
  uint32_t frameKept;  // 0x1C
};

struct ReadParmsIn {
  uint8_t hostReserved0[0x10];
  uint32_t mode;  // 0x10
  uint8_t hostReserved1[0x04];
};

struct IoctlParmsIn {
  uint8_t hostReserved0[0x08];
  uint32_t code;  // 0x08
  uint8_t hostReserved1[0x0C];
  uint32_t length;  // 0x18
  uint8_t hostReserved2[0x04];
  const void* data;  // 0x20
};

// Both ways: the header of a process-service message, little-endian.
struct ProcessMessageHeader {
  uint32_t length;  // header plus payload, in bytes
  uint32_t id;      // the program run
  uint32_t type;
  uint32_t value;  // start flags, 1 for input, or the host's status
};
ALERTMOD_CONSTANT(uint32_t, kProcessHeaderBytes, 16);

// Module to host: every request the module makes. Zero-filled before use.
struct HostRequest {
  uint32_t size;     // 0x00: always 192
  uint32_t version;  // 0x04: always 1
  uint32_t length;   // 0x08: data length in bytes
  uint32_t reserved0;
  void* data;             // 0x10
  uint32_t requester;     // 0x18: module id of the requester
  uint32_t reserved1;     // 0x1C
  uint32_t requestClass;  // 0x20
  uint32_t code;          // 0x24
  uint32_t extSize;       // 0x28: class-specific; 152 for log and crypto
  uint32_t extVersion;    // 0x2C: 1 for log and crypto
  int32_t extValue;       // 0x30: log level, or crypto in/out length
  uint8_t extRest[0x8C];  // 0x34 to 0xBF
};

#ifdef __cplusplus
// Returns a zero-filled request with size, version, requester, class and code set.
inline HostRequest MakeHostRequest(uint32_t requester, uint32_t requestClass, uint32_t code) {
  HostRequest request{};
  request.size = kHostRequestSize;
  request.version = kHostRequestVersion;
  request.requester = requester;
  request.requestClass = requestClass;
  request.code = code;
  return request;
}
#endif

static_assert(offsetof(LoadParmsIn, callback) == 0x10, "LoadParmsIn layout");
static_assert(offsetof(LoadParmsOut, moduleId) == 0x08, "LoadParmsOut layout");
static_assert(offsetof(LoadParmsOut, capabilityWord1) == 0x0C, "LoadParmsOut layout");
static_assert(offsetof(LoadParmsOut, capabilityWord2) == 0x14, "LoadParmsOut layout");
static_assert(offsetof(LoadParmsOut, capabilityWord3) == 0x20, "LoadParmsOut layout");
static_assert(offsetof(LoadParmsOut, flag34) == 0x34, "LoadParmsOut layout");
static_assert(offsetof(LoadParmsOut, flag36) == 0x36, "LoadParmsOut layout");
static_assert(offsetof(LoadParmsOut, flag37) == 0x37, "LoadParmsOut layout");
static_assert(offsetof(WriteParmsIn, length) == 0x10, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsIn, data) == 0x18, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsIn, source) == 0x20, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsIn, requestClass) == 0x28, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsIn, frameExtra) == 0x2C, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsIn, payloadOffset) == 0x38, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsIn, frameType) == 0x42, "WriteParmsIn layout");
static_assert(offsetof(WriteParmsOut, frameKept) == 0x1C, "WriteParmsOut layout");
static_assert(offsetof(ReadParmsIn, mode) == 0x10, "ReadParmsIn layout");
static_assert(offsetof(IoctlParmsIn, code) == 0x08, "IoctlParmsIn layout");
static_assert(offsetof(IoctlParmsIn, length) == 0x18, "IoctlParmsIn layout");
static_assert(offsetof(IoctlParmsIn, data) == 0x20, "IoctlParmsIn layout");
static_assert(offsetof(HostRequest, length) == 0x08, "HostRequest layout");
static_assert(offsetof(HostRequest, data) == 0x10, "HostRequest layout");
static_assert(offsetof(HostRequest, requester) == 0x18, "HostRequest layout");
static_assert(offsetof(HostRequest, requestClass) == 0x20, "HostRequest layout");
static_assert(offsetof(HostRequest, code) == 0x24, "HostRequest layout");
static_assert(offsetof(HostRequest, extSize) == 0x28, "HostRequest layout");
static_assert(offsetof(HostRequest, extVersion) == 0x2C, "HostRequest layout");
static_assert(offsetof(HostRequest, extValue) == 0x30, "HostRequest layout");
static_assert(sizeof(HostRequest) == kHostRequestSize, "HostRequest is 192 bytes");
static_assert(offsetof(ProcessMessageHeader, id) == 0x04, "ProcessMessageHeader layout");
static_assert(offsetof(ProcessMessageHeader, type) == 0x08, "ProcessMessageHeader layout");
static_assert(offsetof(ProcessMessageHeader, value) == 0x0C, "ProcessMessageHeader layout");
static_assert(sizeof(ProcessMessageHeader) == kProcessHeaderBytes,
              "ProcessMessageHeader is 16 bytes");

#undef ALERTMOD_CONSTANT

#ifdef __cplusplus
}  // namespace core
}  // namespace hx
#define ALERTMOD_RECORD(name) hx::core::name
#else
#define ALERTMOD_RECORD(name) name
#endif

#define ALERTMOD_EXPORT __attribute__((visibility("default")))

// The seven entry points, with C linkage. Each returns 0.
#ifdef __cplusplus
extern "C" {
#endif
ALERTMOD_EXPORT int32_t Load(ALERTMOD_RECORD(LoadParmsIn) * in,
                             ALERTMOD_RECORD(LoadParmsOut) * out);
ALERTMOD_EXPORT int32_t Unload(void);
ALERTMOD_EXPORT int32_t Open(void);
ALERTMOD_EXPORT int32_t Close(void);
ALERTMOD_EXPORT int32_t Read(ALERTMOD_RECORD(ReadParmsIn) * in);
ALERTMOD_EXPORT int32_t Write(ALERTMOD_RECORD(WriteParmsIn) * in,
                              ALERTMOD_RECORD(WriteParmsOut) * out);
ALERTMOD_EXPORT int32_t IOCTL(ALERTMOD_RECORD(IoctlParmsIn) * in);
#ifdef __cplusplus
}
#endif
#undef ALERTMOD_RECORD

#endif  // ALERTMOD_HOST_RECORDS_H_

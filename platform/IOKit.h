// SPDX-License-Identifier: MIT
// The I/O registry and user clients in the manner of IOKit: the first service
// that matches a class name, a property copied as a new owned value, a
// connection opened with a return code, a structure method called with an
// input buffer, the connection closed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "base/Value.h"

namespace kolvrand {

using kern_return_t = int32_t;
using IOReturn = int32_t;
using mach_port_t = uint32_t;
using task_port_t = uint32_t;
// Registry services live as long as the process: a handle needs no release.
using io_service_t = uint32_t;
using io_connect_t = uint32_t;

inline constexpr kern_return_t KERN_SUCCESS = 0;
inline constexpr IOReturn kIOReturnSuccess = 0;
inline constexpr IOReturn kIOReturnError = static_cast<IOReturn>(0xe00002bc);
inline constexpr IOReturn kIOReturnNoMemory = static_cast<IOReturn>(0xe00002bd);
inline constexpr IOReturn kIOReturnNoDevice = static_cast<IOReturn>(0xe00002c0);
inline constexpr IOReturn kIOReturnNotPrivileged = static_cast<IOReturn>(0xe00002c1);
inline constexpr IOReturn kIOReturnBadArgument = static_cast<IOReturn>(0xe00002c2);
inline constexpr IOReturn kIOReturnNotOpen = static_cast<IOReturn>(0xe00002cd);
inline constexpr IOReturn kIOReturnUnsupported = static_cast<IOReturn>(0xe00002c7);
inline constexpr IOReturn kIOReturnBusy = static_cast<IOReturn>(0xe00002d5);
inline constexpr IOReturn kIOReturnAborted = static_cast<IOReturn>(0xe00002eb);
inline constexpr mach_port_t kIOMasterPortDefault = 0;

task_port_t mach_task_self();

// The battery-model driver's contract, shared by the upload and the simulated
// driver: its service class, the selector of its "setBatteryParams" method,
// the size of the record that method takes, and the property under which it
// publishes the record's SHA-1 (kBatteryModelKey / kParamsHashKey within it).
namespace kvr_driver {
inline constexpr const char* kServiceClass = "TesvarKVR";
inline constexpr uint32_t kSetBatteryParamsSelector = 24;
inline constexpr size_t kBatteryParamsSize = 29056;
inline constexpr const char* kVectorProperty = "KVRVector";
inline constexpr const char* kBatteryModelKey = "KVRBatteryModel";
inline constexpr const char* kParamsHashKey = "RCParamsHash";
}  // namespace kvr_driver

struct IOMatchingDictionary {
  std::string className;
};

IOMatchingDictionary IOServiceMatching(const char* className);
// The first matching service, or 0.
io_service_t IOServiceGetMatchingService(mach_port_t mainPort, IOMatchingDictionary matching);
// A copy of the property, or nullopt when the service has none by that name.
std::optional<Value> IORegistryEntryCreateCFProperty(io_service_t entry, const std::string& key);
kern_return_t IOServiceOpen(io_service_t service, task_port_t owningTask, uint32_t type,
                            io_connect_t* connect);
kern_return_t IOConnectCallStructMethod(io_connect_t connection, uint32_t selector,
                                        const void* inputStruct, size_t inputStructCnt,
                                        void* outputStruct, size_t* outputStructCnt);
kern_return_t IOServiceClose(io_connect_t connect);

}  // namespace kolvrand

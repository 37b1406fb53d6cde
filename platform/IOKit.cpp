// SPDX-License-Identifier: MIT
#include "platform/IOKit.h"

#include "platform/Backend.h"

namespace kolvrand {

task_port_t mach_task_self() {
  // Only identifies "this process" to IOServiceOpen; any non-zero value does.
  return 0x103;
}

IOMatchingDictionary IOServiceMatching(const char* className) {
  return IOMatchingDictionary{className ? className : ""};
}

io_service_t IOServiceGetMatchingService(mach_port_t, IOMatchingDictionary matching) {
  if (matching.className.empty()) return 0;
  return platform::backend().registry().findService(matching.className);
}

std::optional<Value> IORegistryEntryCreateCFProperty(io_service_t entry, const std::string& key) {
  if (entry == 0) return std::nullopt;
  return platform::backend().registry().property(entry, key);
}

kern_return_t IOServiceOpen(io_service_t service, task_port_t, uint32_t type,
                            io_connect_t* connect) {
  if (!connect) return kIOReturnBadArgument;
  *connect = 0;
  if (service == 0) return kIOReturnBadArgument;
  return platform::backend().registry().open(service, type, connect);
}

kern_return_t IOConnectCallStructMethod(io_connect_t connection, uint32_t selector,
                                        const void* inputStruct, size_t inputStructCnt,
                                        void* outputStruct, size_t* outputStructCnt) {
  // No driver method here returns a structure.
  if (outputStruct || (outputStructCnt && *outputStructCnt != 0)) return kIOReturnUnsupported;
  if (connection == 0) return kIOReturnNotOpen;
  if (!inputStruct && inputStructCnt != 0) return kIOReturnBadArgument;
  std::span<const uint8_t> input;
  if (inputStruct) input = {static_cast<const uint8_t*>(inputStruct), inputStructCnt};
  return platform::backend().registry().callStructMethod(connection, selector, input);
}

kern_return_t IOServiceClose(io_connect_t connect) {
  if (connect == 0) return kIOReturnNotOpen;
  platform::backend().registry().close(connect);
  return kIOReturnSuccess;
}

}  // namespace kolvrand

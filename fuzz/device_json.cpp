// SPDX-License-Identifier: MIT
// Feeds arbitrary text to the simulated device's device.json parser, then asks
// the device what the daemon asks: kernel variables, registry properties, the
// driver. Whatever the file holds, the device must come up, malformed input
// leaving it without services.
#include <cstdio>
#include <cstdlib>

#include "fuzz/Support.h"
#include "platform/Backend.h"
#include "platform/IOKit.h"

using namespace kolvrand;

static std::filesystem::path deviceDir;

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  fuzz::quietLogs();
  // Memory-backed where possible: every input is written as a file.
  char shm[] = "/dev/shm/kvr-fuzz.XXXXXX", tmp[] = "/tmp/kvr-fuzz.XXXXXX";
  deviceDir = mkdtemp(shm) ? shm : mkdtemp(tmp) ? tmp : "";
  fuzz::check(!deviceDir.empty());
  std::atexit([] { std::filesystem::remove_all(deviceDir); });
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FILE* f = std::fopen((deviceDir / "device.json").c_str(), "wb");
  fuzz::check(f && std::fwrite(data, 1, size, f) == size && std::fclose(f) == 0);
  auto device = platform::makeSimulatedDevice(deviceDir);
  for (const char* name : {"kern.bootsessionuuid", "hw.targettype", ""})
    fuzz::check(device->kernelVariables().value(name).value_or("").size() <= size);
  auto& registry = device->registry();
  for (const char* className : {"TesvarSmartBattery", "TesvarKVR", "Other"}) {
    const uint32_t service = registry.findService(className);
    for (const char* key : {"BatteryData", "KVRVector", ""})
      if (auto value = registry.property(service, key)) (void)value->description();
    uint32_t connection = 0;
    if (registry.open(service, 0, &connection) != kIOReturnSuccess) continue;
    fuzz::check(connection != 0);
    // A record of the wrong size is refused before the driver keeps anything.
    const uint8_t byte = 0;
    fuzz::check(registry.callStructMethod(connection, 24, {&byte, 1}) != kIOReturnSuccess);
    registry.close(connection);
  }
  return 0;
}

// Feeds arbitrary text to the simulated device's device.json parser, then asks
// the device what the daemon asks: kernel variables, registry properties, the
// driver. Whatever the file holds, the device must come up, malformed input
// leaving it without services.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string>

#include "fuzz/Support.h"
#include "platform/Backend.h"
#include "platform/IOKit.h"

using namespace kolvrand;
using namespace kolvrand::platform;
using fuzz::check;

namespace {

std::filesystem::path deviceDir;

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  fuzz::quietLogs();
  // Memory-backed: every input is written as a file.
  std::string pattern = "/dev/shm/kvr-fuzz.XXXXXX";
  if (!mkdtemp(pattern.data())) {
    pattern = "/tmp/kvr-fuzz.XXXXXX";
    check(mkdtemp(pattern.data()) != nullptr);
  }
  deviceDir = pattern;
  std::atexit([] { std::filesystem::remove_all(deviceDir); });
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  FILE* f = std::fopen((deviceDir / "device.json").c_str(), "wb");
  check(f && std::fwrite(data, 1, size, f) == size && std::fclose(f) == 0);
  auto device = makeSimulatedDevice(deviceDir);
  check(device != nullptr);
  for (const char* name : {"kern.bootsessionuuid", "hw.targettype", ""}) {
    auto v = device->kernelVariables().value(name);
    if (v) check(v->size() < size + 1);
  }
  Registry& registry = device->registry();
  for (const char* className : {"TesvarSmartBattery", "TesvarKVR", "Other"}) {
    const uint32_t service = registry.findService(className);
    for (const char* key : {"BatteryData", "KVRVector", ""}) {
      auto value = registry.property(service, key);
      if (value) (void)value->description();
    }
    uint32_t connection = 0;
    if (registry.open(service, 0, &connection) == kIOReturnSuccess) {
      check(connection != 0);
      // A record of the wrong size is refused before the driver keeps anything.
      const uint8_t byte = 0;
      check(registry.callStructMethod(connection, 24, {&byte, 1}) != kIOReturnSuccess);
      registry.close(connection);
    }
  }
  return 0;
}

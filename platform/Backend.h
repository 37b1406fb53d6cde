// SPDX-License-Identifier: MIT
// The seam between the platform operations and the system behind them: the
// Linux host, or the simulated device named by KOLVRAND_DEVICE. Tests install
// fakes with setBackend().
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "base/Value.h"

namespace kolvrand::platform {

// Kernel variables by name. A value is the exact bytes sysctl would return:
// a string value carries its terminating NUL.
class KernelVariables {
 public:
  virtual ~KernelVariables() = default;
  virtual std::optional<std::string> value(std::string_view name) = 0;
};

// The I/O registry and its user clients. Service and connection handles are
// non-zero; 0 means none.
class Registry {
 public:
  virtual ~Registry() = default;
  virtual uint32_t findService(std::string_view className) = 0;
  virtual std::optional<Value> property(uint32_t service, std::string_view key) = 0;
  virtual int32_t open(uint32_t service, uint32_t type, uint32_t* connection) = 0;
  virtual int32_t callStructMethod(uint32_t connection, uint32_t selector,
                                   std::span<const uint8_t> input) = 0;
  virtual void close(uint32_t connection) = 0;
};

class Backend {
 public:
  virtual ~Backend() = default;
  virtual KernelVariables& kernelVariables() = 0;
  virtual Registry& registry() = 0;
  // Root of KVR/BatteryModels; empty when there is none.
  virtual std::filesystem::path libraryDirectory() = 0;
  // Directory of the defaults suites.
  virtual std::filesystem::path stateDirectory() = 0;
};

// The backend in use. On first use: the simulated device when KOLVRAND_DEVICE
// is set, the Linux host otherwise.
Backend& backend();

// What is wrong with KOLVRAND_DEVICE, when it is set and names no directory.
// The daemon and rcmodel then stop before reading or writing anything: a
// mistyped device must never end up talking to the real drivers.
std::optional<std::string> deviceSelectionError();

// Installs `b` as the backend (nullptr: choose again on next use).
void setBackend(std::shared_ptr<Backend> b);

// The backends themselves, for tools and tests that want one explicitly.
std::shared_ptr<Backend> makeHostBackend();
// Reads DEVICE/device.json now; a missing or malformed file is logged and
// yields a device with no services and failing kernel variables.
std::shared_ptr<Backend> makeSimulatedDevice(const std::filesystem::path& device);

}  // namespace kolvrand::platform

// SPDX-License-Identifier: MIT
// The driver side of the boot path, in memory: the benchmark measures the
// daemon's work, not the simulated device's file writes (which stand for the
// kernel's).
#pragma once

#include <filesystem>
#include <memory>

#include "platform/Backend.h"

namespace kolvrand::bench {

// A device whose kernel variables and battery are those of the example
// device, whose Library directory is `library`, and whose TesvarKVR driver
// keeps the accepted record in memory and publishes its SHA-1.
std::shared_ptr<platform::Backend> makeInMemoryDevice(const std::filesystem::path& library);

}  // namespace kolvrand::bench

// SPDX-License-Identifier: MIT
// Helpers shared by the platform sources; not part of the platform's interface.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/FileManager.h"
#include "platform/Log.h"

namespace kolvrand::platform {

// The log subsystem of the platform layer's own messages.
inline constexpr const char* kPlatformSubsystem = "com.tesvar.kolvrand";

// A log of the platform layer, created once per category.
const os_log_t& platformLog(std::string_view category);

// The most any file of the platform's own (settings, a device description, a
// kernel value under /proc or /sys) may hold: a few hundred bytes each.
inline constexpr size_t kMaxSmallFileSize = 1024 * 1024;

// A small file whole as readRegularFile reads it (never waiting on a FIFO,
// never more than kMaxSmallFileSize bytes).
std::optional<std::string> readFile(const std::filesystem::path& path, FileError* error = nullptr);

}  // namespace kolvrand::platform

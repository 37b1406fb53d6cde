// SPDX-License-Identifier: MIT
// Helpers shared by the platform sources; not part of the platform's interface.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Log.h"

namespace kolvrand::platform {

// The log subsystem of the platform layer's own messages.
inline constexpr const char* kPlatformSubsystem = "com.tesvar.kolvrand";

// A log of the platform layer, created once per category.
const os_log_t& platformLog(std::string_view category);

// The most any file of the platform's own (settings, a device description, a
// kernel value under /proc or /sys) may hold: a few hundred bytes each.
inline constexpr size_t kMaxSmallFileSize = 1024 * 1024;

// The whole file, read with read(2) so that /proc and sysfs files (which
// report a size of 0) work, as readSmallFile reads it (never waiting on a
// FIFO, never more than kMaxSmallFileSize bytes); nullopt with *err set to
// errno on failure, EINVAL when it is no regular file, EFBIG when too large.
std::optional<std::string> readFile(const std::filesystem::path& path, int* err = nullptr);

// Replaces `path` with `bytes` so that a reader sees either the old or the new
// content and the new content survives a crash once this returns true:
// temporary file in the same directory, fsync, rename, fsync of the directory.
bool writeFileAtomically(const std::filesystem::path& path, std::string_view bytes,
                         std::string* error);

}  // namespace kolvrand::platform

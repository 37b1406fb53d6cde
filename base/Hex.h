// SPDX-License-Identifier: MIT
// Bytes as hexadecimal text and back.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace kolvrand {

// Lower-case hexadecimal, two digits a byte.
std::string hexString(const uint8_t* bytes, size_t size);

// Even-length hexadecimal text of either case; nullopt on anything else.
std::optional<std::string> fromHex(std::string_view hex);

}  // namespace kolvrand

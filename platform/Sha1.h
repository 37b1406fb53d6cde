// The SHA-1 compression function behind CommonCrypto.h: a portable version,
// and one on the x86 SHA extensions where the processor has them.
#pragma once

#include <cstddef>
#include <cstdint>

namespace kolvrand::platform::sha1 {

inline constexpr uint32_t kInitialState[5] = {0x67452301, 0xefcdab89, 0x98badcfe, 0x10325476,
                                              0xc3d2e1f0};

// Runs `blocks` 64-byte blocks at `data` through `state`.
void compressPortable(uint32_t state[5], const uint8_t* data, size_t blocks);
// Whether compressHardware can run here.
bool hasHardware();
// Requires hasHardware().
void compressHardware(uint32_t state[5], const uint8_t* data, size_t blocks);

// The version this processor runs best.
void compress(uint32_t state[5], const uint8_t* data, size_t blocks);

}  // namespace kolvrand::platform::sha1

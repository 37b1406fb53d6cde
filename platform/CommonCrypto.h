// SHA-1 in the manner of CC_SHA1_Init/Update/Final. Our own implementation
// (platform/Sha1.h): a general cryptography library would cost the daemon
// more resident memory at start than everything else it does.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

namespace kolvrand {

inline constexpr size_t CC_SHA1_DIGEST_LENGTH = 20;
using SHA1Digest = std::array<uint8_t, CC_SHA1_DIGEST_LENGTH>;

struct CC_SHA1_CTX {
  uint32_t state[5] = {};
  uint64_t length = 0;  // bytes hashed so far
  uint8_t buffer[64] = {};
  bool started = false;  // between Init and Final
};

// Each returns 1 on success and 0 on failure: a null argument, or a context
// that was not initialised (or is already finished).
int CC_SHA1_Init(CC_SHA1_CTX* c);
int CC_SHA1_Update(CC_SHA1_CTX* c, const void* data, size_t len);
int CC_SHA1_Final(uint8_t* md, CC_SHA1_CTX* c);

// One-shot digest.
SHA1Digest sha1(const void* data, size_t len);

}  // namespace kolvrand

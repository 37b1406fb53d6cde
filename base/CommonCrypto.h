// SPDX-License-Identifier: MIT
// SHA-1 in the manner of CC_SHA1_Init/Update/Final, over OpenSSL's libcrypto.
#pragma once

#include <openssl/sha.h>

#include <array>
#include <cstddef>
#include <cstdint>

namespace kolvrand {

inline constexpr size_t CC_SHA1_DIGEST_LENGTH = 20;
using SHA1Digest = std::array<uint8_t, CC_SHA1_DIGEST_LENGTH>;

// The digest's state lives in the context itself: nothing to allocate or free.
struct CC_SHA1_CTX {
  SHA_CTX state;
};

// Each returns 1 on success and 0 on failure.
int CC_SHA1_Init(CC_SHA1_CTX* c);
int CC_SHA1_Update(CC_SHA1_CTX* c, const void* data, size_t len);
int CC_SHA1_Final(uint8_t* md, CC_SHA1_CTX* c);

// One-shot digest.
SHA1Digest sha1(const void* data, size_t len);

}  // namespace kolvrand

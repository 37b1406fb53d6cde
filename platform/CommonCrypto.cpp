#include "platform/CommonCrypto.h"

#include <algorithm>
#include <cstring>

#include "platform/Sha1.h"

namespace kolvrand {

int CC_SHA1_Init(CC_SHA1_CTX* c) {
  if (!c) return 0;
  std::copy(std::begin(platform::sha1::kInitialState), std::end(platform::sha1::kInitialState),
            c->state);
  c->length = 0;
  c->started = true;
  return 1;
}

int CC_SHA1_Update(CC_SHA1_CTX* c, const void* data, size_t len) {
  if (!c || !c->started) return 0;
  if (len == 0) return 1;
  if (!data) return 0;
  auto* p = static_cast<const uint8_t*>(data);
  size_t buffered = c->length % 64;
  c->length += len;
  if (buffered) {
    const size_t take = std::min(len, 64 - buffered);
    std::memcpy(c->buffer + buffered, p, take);
    p += take;
    len -= take;
    if (buffered + take < 64) return 1;
    platform::sha1::compress(c->state, c->buffer, 1);
  }
  // Whole blocks straight from the caller's bytes.
  platform::sha1::compress(c->state, p, len / 64);
  std::memcpy(c->buffer, p + len / 64 * 64, len % 64);
  return 1;
}

int CC_SHA1_Final(uint8_t* md, CC_SHA1_CTX* c) {
  if (!md || !c || !c->started) return 0;
  // The padding: a one bit, zeros up to 56 bytes into a block, then the
  // length in bits as a big-endian 64-bit number.
  const uint64_t bits = c->length * 8;
  size_t used = c->length % 64;
  c->buffer[used++] = 0x80;
  if (used > 56) {
    std::memset(c->buffer + used, 0, 64 - used);
    platform::sha1::compress(c->state, c->buffer, 1);
    used = 0;
  }
  std::memset(c->buffer + used, 0, 56 - used);
  for (int i = 0; i < 8; ++i) c->buffer[56 + i] = static_cast<uint8_t>(bits >> (56 - 8 * i));
  platform::sha1::compress(c->state, c->buffer, 1);
  for (int i = 0; i < 5; ++i) {
    for (int j = 0; j < 4; ++j) md[4 * i + j] = static_cast<uint8_t>(c->state[i] >> (24 - 8 * j));
  }
  // A finished context cannot be updated again.
  *c = CC_SHA1_CTX{};
  return 1;
}

SHA1Digest sha1(const void* data, size_t len) {
  SHA1Digest out{};
  CC_SHA1_CTX c;
  CC_SHA1_Init(&c);
  static const uint8_t empty = 0;
  CC_SHA1_Update(&c, data ? data : &empty, data ? len : 0);
  CC_SHA1_Final(out.data(), &c);
  return out;
}

}  // namespace kolvrand

// SPDX-License-Identifier: MIT
// libcrypto's SHA-1 context functions rather than its EVP interface: the same
// digest code, without loading the provider machinery, which would more than
// double the daemon's resident memory for one hash per boot. They are
// deprecated in OpenSSL 3 in favour of EVP, which is why the warning is off.
#define OPENSSL_SUPPRESS_DEPRECATED
#include "base/CommonCrypto.h"

namespace kolvrand {

int CC_SHA1_Init(CC_SHA1_CTX* c) {
  return c && SHA1_Init(&c->state) == 1 ? 1 : 0;
}

int CC_SHA1_Update(CC_SHA1_CTX* c, const void* data, size_t len) {
  if (!c || (!data && len)) return 0;
  return len == 0 || SHA1_Update(&c->state, data, len) == 1 ? 1 : 0;
}

int CC_SHA1_Final(uint8_t* md, CC_SHA1_CTX* c) {
  return md && c && SHA1_Final(md, &c->state) == 1 ? 1 : 0;
}

SHA1Digest sha1(const void* data, size_t len) {
  SHA1Digest out{};
  CC_SHA1_CTX c;
  if (!CC_SHA1_Init(&c) || !CC_SHA1_Update(&c, data, len) || !CC_SHA1_Final(out.data(), &c))
    out.fill(0);
  return out;
}

}  // namespace kolvrand

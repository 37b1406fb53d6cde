#include "platform/CommonCrypto.h"

#include <openssl/evp.h>

namespace kolvrand {

struct CC_SHA1_CTX::Impl {
  EVP_MD_CTX* md = nullptr;
  ~Impl() { EVP_MD_CTX_free(md); }
};

namespace {

void destroyImpl(CC_SHA1_CTX::Impl* impl) {
  delete impl;
}

}  // namespace

int CC_SHA1_Init(CC_SHA1_CTX* c) {
  if (!c) return 0;
  c->impl.reset();
  std::unique_ptr<CC_SHA1_CTX::Impl, void (*)(CC_SHA1_CTX::Impl*)> impl(new CC_SHA1_CTX::Impl,
                                                                        &destroyImpl);
  impl->md = EVP_MD_CTX_new();
  if (!impl->md || EVP_DigestInit_ex(impl->md, EVP_sha1(), nullptr) != 1) return 0;
  c->impl = std::move(impl);
  return 1;
}

int CC_SHA1_Update(CC_SHA1_CTX* c, const void* data, size_t len) {
  if (!c || !c->impl) return 0;
  if (len == 0) return 1;
  if (!data) return 0;
  return EVP_DigestUpdate(c->impl->md, data, len) == 1 ? 1 : 0;
}

int CC_SHA1_Final(uint8_t* md, CC_SHA1_CTX* c) {
  if (!md || !c || !c->impl) return 0;
  unsigned int n = 0;
  int ok = EVP_DigestFinal_ex(c->impl->md, md, &n) == 1 && n == CC_SHA1_DIGEST_LENGTH;
  // A finished context cannot be updated again; it is released right away.
  c->impl.reset();
  return ok ? 1 : 0;
}

SHA1Digest sha1(const void* data, size_t len) {
  SHA1Digest out{};
  unsigned int n = 0;
  static const unsigned char empty = 0;
  if (!data) data = &empty;
  if (EVP_Digest(data, len, out.data(), &n, EVP_sha1(), nullptr) != 1) out.fill(0);
  return out;
}

}  // namespace kolvrand

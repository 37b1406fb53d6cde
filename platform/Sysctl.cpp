// SPDX-License-Identifier: MIT
#include "platform/Sysctl.h"

#include <cerrno>
#include <cstring>
#include <new>

#include "platform/Backend.h"

namespace kolvrand {

int sysctlbyname(const char* name, void* oldp, size_t* oldlenp, const void* newp, size_t) {
  if (newp) {
    errno = EPERM;
    return -1;
  }
  if (!oldlenp) {
    errno = EINVAL;
    return -1;
  }
  if (!name) {
    errno = ENOENT;
    return -1;
  }
  std::optional<std::string> value = platform::backend().kernelVariables().value(name);
  if (!value) {
    errno = ENOENT;
    return -1;
  }
  if (!oldp) {
    *oldlenp = value->size();
    return 0;
  }
  if (*oldlenp < value->size()) {
    errno = ENOMEM;
    return -1;
  }
  std::memcpy(oldp, value->data(), value->size());
  *oldlenp = value->size();
  return 0;
}

std::unique_ptr<char[]> allocateKernelStringBuffer(size_t size) {
  if (size > kMaxKernelStringSize) return nullptr;
  return std::unique_ptr<char[]>(new (std::nothrow) char[size + 1]());
}

}  // namespace kolvrand

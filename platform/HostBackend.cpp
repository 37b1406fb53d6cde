// SPDX-License-Identifier: MIT
#include <cstdlib>

#include "platform/Backend.h"
#include "platform/IOKit.h"
#include "platform/Internal.h"
#include "platform/LinuxRegistry.h"

namespace kolvrand::platform {

namespace {

std::string withoutTrailing(std::string s, std::string_view chars) {
  while (!s.empty() && chars.find(s.back()) != std::string_view::npos) s.pop_back();
  return s;
}

class HostKernelVariables final : public KernelVariables {
 public:
  std::optional<std::string> value(std::string_view name) override {
    std::string v;
    if (name == "kern.bootsessionuuid") {
      auto id = readFile("/proc/sys/kernel/random/boot_id");
      if (!id) return std::nullopt;
      v = withoutTrailing(*id, "\n");
    } else if (name == "hw.targettype") {
      // Device-tree boards name themselves in the model node; PCs in DMI.
      if (auto model = readFile("/proc/device-tree/model"))
        v = withoutTrailing(*model, std::string_view("\0", 1));
      if (v.empty()) {
        if (auto product = readFile("/sys/class/dmi/id/product_name"))
          v = withoutTrailing(*product, "\n");
      }
    } else {
      return std::nullopt;
    }
    if (v.empty()) return std::nullopt;
    v += '\0';
    return v;
  }
};

class HostBackend final : public Backend {
 public:
  KernelVariables& kernelVariables() override { return kernel_; }
  Registry& registry() override { return *registry_; }
  std::filesystem::path libraryDirectory() override { return KOLVRAND_LIBRARY_DIR; }
  std::filesystem::path stateDirectory() override {
    // Set by systemd's StateDirectory=; several directories are ':'-separated.
    if (const char* env = std::getenv("STATE_DIRECTORY"); env && *env) {
      std::string_view dirs(env);
      return std::filesystem::path(dirs.substr(0, dirs.find(':')));
    }
    return "/var/lib/kolvrand";
  }

 private:
  HostKernelVariables kernel_;
  std::unique_ptr<Registry> registry_ = makeLinuxRegistry();
};

}  // namespace

std::shared_ptr<Backend> makeHostBackend() {
  return std::make_shared<HostBackend>();
}

}  // namespace kolvrand::platform

// SPDX-License-Identifier: MIT
// The boot path: from the model file on disk to a verified upload (locate,
// read, decode, record, SHA-1, upload, verify), against its lower bound: read
// the file and take the SHA-1 of 29056 bytes.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <openssl/evp.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <vector>

#include "base/CommonCrypto.h"
#include "bench/AllocationCounter.h"
#include "bench/BootPath.h"
#include "bench/Fixture.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/IOKit.h"

namespace kolvrand::bench {

namespace {

// The driver: it copies the record in, as the kernel copies a structure
// argument, and publishes a SHA-1. Hashing is the kernel's work, not the
// daemon's, so the driver hashes the first record it receives and publishes
// that digest from then on: every iteration sends the same record, and one
// that differed would fail the verification and stop the benchmark.
class InMemoryDevice final : public platform::Backend,
                             public platform::KernelVariables,
                             public platform::Registry {
 public:
  explicit InMemoryDevice(std::filesystem::path library) : library_(std::move(library)) {}

  platform::KernelVariables& kernelVariables() override { return *this; }
  platform::Registry& registry() override { return *this; }
  std::filesystem::path libraryDirectory() override { return library_; }
  std::filesystem::path stateDirectory() override { return {}; }

  std::optional<std::string> value(std::string_view name) override {
    if (name == "hw.targettype") return std::string("T618e", 6);
    if (name == "kern.bootsessionuuid")
      return std::string("6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b", 37);
    return std::nullopt;
  }

  uint32_t findService(std::string_view className) override {
    if (className == "TesvarSmartBattery") return kBattery;
    if (className == "TesvarKVR") return kDriver;
    return 0;
  }

  std::optional<Value> property(uint32_t service, std::string_view key) override {
    if (service == kBattery && key == "BatteryData")
      return Value(Dictionary{{"AlgoChemID", Number::fromSigned(6439)},
                              {"BatterySerialNumber", std::string("F5D2470A1B2C3D4E5F")}});
    if (service != kDriver || key != "KVRVector" || !holds_) return std::nullopt;
    if (!hashed_) {
      digest_ = sha1(record_.data(), record_.size());
      hashed_ = true;
    }
    return Value(Dictionary{
        {"KVRBatteryModel", Dictionary{{"RCParamsHash", Data(digest_.begin(), digest_.end())}}}});
  }

  int32_t open(uint32_t service, uint32_t type, uint32_t* connection) override {
    if (service != kDriver || type != 0) return kIOReturnBadArgument;
    *connection = 1;
    return kIOReturnSuccess;
  }

  int32_t callStructMethod(uint32_t connection, uint32_t selector,
                           std::span<const uint8_t> input) override {
    if (connection != 1) return kIOReturnNotOpen;
    if (selector != 24 || input.size() != record_.size()) return kIOReturnBadArgument;
    std::memcpy(record_.data(), input.data(), input.size());
    holds_ = true;
    return kIOReturnSuccess;
  }

  void close(uint32_t) override {}

 private:
  static constexpr uint32_t kBattery = 1;
  static constexpr uint32_t kDriver = 2;

  std::filesystem::path library_;
  std::array<uint8_t, kKextBatteryModelSize> record_{};
  SHA1Digest digest_{};
  bool holds_ = false;
  bool hashed_ = false;
};

void BM_BootPath_Kolvrand(benchmark::State& state) {
  DeviceCopy device;
  platform::setBackend(makeInMemoryDevice(device.dir() / "Library"));
  auto handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create(DaemonIdentifier, "batteryModelDataHandling"));
  // Once outside the timing, so the driver has hashed the record before.
  if (!handler->moveBatteryModelDataFromDiskToKext(kChemID)) fail("the boot path fails");

  for (auto _ : state) {
    if (!handler->moveBatteryModelDataFromDiskToKext(kChemID))
      state.SkipWithError("the upload was not verified");
  }
  CountAllocations counted;
  handler->moveBatteryModelDataFromDiskToKext(kChemID);
  if (allocationCountEnabled()) {
    state.counters["allocs"] = static_cast<double>(counted.count().calls);
    state.counters["alloc_bytes"] = static_cast<double>(counted.count().bytes);
  }
  platform::setBackend(nullptr);
}

// The boot path's stages one by one, for reading the figures: locating the
// file, reading and decoding it, and hashing, uploading and verifying.
class Stages {
 public:
  Stages() {
    platform::setBackend(makeInMemoryDevice(device_.dir() / "Library"));
    handler_->setLog(os_log_create(DaemonIdentifier, "batteryModelDataHandling"));
  }
  ~Stages() { platform::setBackend(nullptr); }
  BatteryModelDataHandler& handler() { return *handler_; }
  std::string path() const { return device_.modelFile().string(); }

 private:
  DeviceCopy device_;
  std::shared_ptr<BatteryModelDataHandler> handler_ = std::make_shared<BatteryModelDataHandler>();
};

void BM_BootStage_Locate(benchmark::State& state) {
  Stages s;
  for (auto _ : state) {
    std::optional<std::string> path = s.handler().getBatteryModelFileURLString(kChemID);
    if (!path) state.SkipWithError("no model file");
    benchmark::DoNotOptimize(path);
  }
}

void BM_BootStage_ReadAndDecode(benchmark::State& state) {
  Stages s;
  const std::optional<std::string> path = s.path();
  for (auto _ : state) {
    std::shared_ptr<OTAParamRC> model = s.handler().loadProtobufModelWithFileName(path);
    if (!model) state.SkipWithError("the model does not load");
    benchmark::DoNotOptimize(model.get());
  }
}

void BM_BootStage_HashUploadVerify(benchmark::State& state) {
  Stages s;
  auto record = s.handler().createKextModelFromProtobufModel(referenceModel().get());
  for (auto _ : state) {
    if (!s.handler().setBatteryModelDataToKernel(record.get()))
      state.SkipWithError("the upload was not verified");
  }
}

// The least a boot path must do: read the model file (open, read, close) and
// hash a record's worth of bytes with libcrypto's SHA-1, its digest fetched
// once.
void BM_BootPath_LowerBound(benchmark::State& state) {
  DeviceCopy device;
  const std::string path = device.modelFile().string();
  std::vector<uint8_t> buffer(1 << 16);
  EVP_MD* md = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  EVP_MD_CTX* ctx = EVP_MD_CTX_new();
  std::array<uint8_t, EVP_MAX_MD_SIZE> digest{};
  for (auto _ : state) {
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    const ssize_t n = fd < 0 ? -1 : ::read(fd, buffer.data(), buffer.size());
    if (fd >= 0) ::close(fd);
    if (n < static_cast<ssize_t>(kKextBatteryModelSize)) {
      state.SkipWithError("cannot read the model file");
      break;
    }
    unsigned int size = 0;
    EVP_DigestInit_ex(ctx, md, nullptr);
    EVP_DigestUpdate(ctx, buffer.data(), kKextBatteryModelSize);
    EVP_DigestFinal_ex(ctx, digest.data(), &size);
    benchmark::DoNotOptimize(digest.data());
  }
  EVP_MD_CTX_free(ctx);
  EVP_MD_free(md);
}

// The two halves of the lower bound and our own SHA-1, for reading the figures.
void BM_SHA1_Kolvrand(benchmark::State& state) {
  std::vector<uint8_t> record(kKextBatteryModelSize, 0x5a);
  for (auto _ : state) {
    SHA1Digest d = sha1(record.data(), record.size());
    benchmark::DoNotOptimize(d.data());
  }
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * record.size()));
}

void BM_SHA1_Libcrypto(benchmark::State& state) {
  std::vector<uint8_t> record(kKextBatteryModelSize, 0x5a);
  EVP_MD* md = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  EVP_MD_CTX* ctx = EVP_MD_CTX_new();
  std::array<uint8_t, EVP_MAX_MD_SIZE> digest{};
  for (auto _ : state) {
    unsigned int size = 0;
    EVP_DigestInit_ex(ctx, md, nullptr);
    EVP_DigestUpdate(ctx, record.data(), record.size());
    EVP_DigestFinal_ex(ctx, digest.data(), &size);
    benchmark::DoNotOptimize(digest.data());
  }
  EVP_MD_CTX_free(ctx);
  EVP_MD_free(md);
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * record.size()));
}

void BM_ReadModelFile(benchmark::State& state) {
  const std::string path = exampleModelFile().string();
  std::vector<uint8_t> buffer(1 << 16);
  for (auto _ : state) {
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    const ssize_t n = fd < 0 ? -1 : ::read(fd, buffer.data(), buffer.size());
    if (fd >= 0) ::close(fd);
    benchmark::DoNotOptimize(n);
  }
}

}  // namespace

std::shared_ptr<platform::Backend> makeInMemoryDevice(const std::filesystem::path& library) {
  return std::make_shared<InMemoryDevice>(library);
}

BENCHMARK(BM_BootPath_Kolvrand)->UseRealTime();
BENCHMARK(BM_BootPath_LowerBound)->UseRealTime();
BENCHMARK(BM_BootStage_Locate)->UseRealTime();
BENCHMARK(BM_BootStage_ReadAndDecode)->UseRealTime();
BENCHMARK(BM_BootStage_HashUploadVerify)->UseRealTime();
BENCHMARK(BM_SHA1_Kolvrand)->UseRealTime();
BENCHMARK(BM_SHA1_Libcrypto)->UseRealTime();
BENCHMARK(BM_ReadModelFile)->UseRealTime();

}  // namespace kolvrand::bench

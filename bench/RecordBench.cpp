// SPDX-License-Identifier: MIT
// Building the 29056-byte kernel record from a decoded model, against the
// least any builder must do: copy 29056 bytes.
#include <benchmark/benchmark.h>

#include <cstring>
#include <memory>

#include "bench/Fixture.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"

namespace kolvrand::bench {

namespace {

std::shared_ptr<BatteryModelDataHandler> recordHandler() {
  // Only the log: building the record touches neither defaults nor driver.
  auto handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create(DaemonIdentifier, "batteryModelDataHandling"));
  return handler;
}

void setCounters(benchmark::State& state) {
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(kKextBatteryModelSize));
}

void BM_Record_Kolvrand(benchmark::State& state) {
  auto handler = recordHandler();
  const OTAParamRC* model = referenceModel().get();
  for (auto _ : state) {
    std::unique_ptr<KextBatteryModel> record = handler->createKextModelFromProtobufModel(model);
    if (!record) state.SkipWithError("the record was refused");
    benchmark::DoNotOptimize(record.get());
    benchmark::ClobberMemory();
  }
  setCounters(state);
}

// memcpy of a whole record into a buffer that already exists.
void BM_Record_PlainCopy(benchmark::State& state) {
  auto source = recordHandler()->createKextModelFromProtobufModel(referenceModel().get());
  auto target = std::make_unique<KextBatteryModel>();
  for (auto _ : state) {
    benchmark::DoNotOptimize(source.get());
    std::memcpy(target.get(), source.get(), kKextBatteryModelSize);
    benchmark::DoNotOptimize(target.get());
    benchmark::ClobberMemory();
  }
  setCounters(state);
}

// The same copy into a new buffer per record, as the builder hands one out.
void BM_Record_PlainCopyNewBuffer(benchmark::State& state) {
  auto source = recordHandler()->createKextModelFromProtobufModel(referenceModel().get());
  for (auto _ : state) {
    benchmark::DoNotOptimize(source.get());
    std::unique_ptr<KextBatteryModel> target(new KextBatteryModel);
    std::memcpy(target.get(), source.get(), kKextBatteryModelSize);
    benchmark::DoNotOptimize(target.get());
    benchmark::ClobberMemory();
  }
  setCounters(state);
}

}  // namespace

BENCHMARK(BM_Record_Kolvrand)->UseRealTime();
BENCHMARK(BM_Record_PlainCopy)->UseRealTime();
BENCHMARK(BM_Record_PlainCopyNewBuffer)->UseRealTime();

}  // namespace kolvrand::bench

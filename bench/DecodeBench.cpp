// SPDX-License-Identifier: MIT
// Decoding one full-size model: our reader against libprotobuf's generated
// parser and a hand-written protozero loop, on the same bytes, each building a
// fresh result per model and dropping it again.
#include <benchmark/benchmark.h>
#include <google/protobuf/arena.h>

#include <array>
#include <optional>
#include <protozero/pbf_reader.hpp>
#include <vector>

#include "bench/AllocationCounter.h"
#include "bench/Fixture.h"
#include "bench_packed.pb.h"
#include "bench_plain.pb.h"
#include "model/OTAParamRC.h"
#include "model/PBDataReader.h"

namespace kolvrand::bench {

namespace {

// Bytes per second (so G/s reads as bytes per ns), the model's size, and the
// heap allocations of one decode, counted outside the timing.
template <class Decode>
void finish(benchmark::State& state, const Encoding& e, Decode decode) {
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(e.bytes.size()));
  state.counters["bytes"] = static_cast<double>(e.bytes.size());
  CountAllocations counted;
  decode();
  if (allocationCountEnabled())
    state.counters["allocs"] = static_cast<double>(counted.count().calls);
}

void decodeKolvrand(benchmark::State& state, const Encoding& e) {
  auto decode = [&] {
    auto model = std::make_shared<OTAParamRC>();
    PBDataReader reader(e.bytes.data(), e.bytes.size());
    if (!model->readFrom(reader)) state.SkipWithError("our reader failed");
    benchmark::DoNotOptimize(model.get());
  };
  for (auto _ : state) decode();
  finish(state, e, decode);
}

// libprotobuf with an arena, its fastest way to parse, and a new arena per
// model as a process that decodes one model would have.
template <class Message>
void decodeLibprotobuf(benchmark::State& state, const Encoding& e) {
  auto decode = [&] {
    google::protobuf::Arena arena;
    auto* model = google::protobuf::Arena::CreateMessage<Message>(&arena);
    if (!model->ParseFromArray(e.bytes.data(), static_cast<int>(e.bytes.size())))
      state.SkipWithError("libprotobuf failed");
    benchmark::DoNotOptimize(model);
  };
  for (auto _ : state) decode();
  finish(state, e, decode);
}

// What a careful hand-written decoder on protozero gives: plain structs of
// vectors, lists accepted packed or not, unknown fields skipped.
struct ProtozeroTable {
  std::vector<float> resistance25C;
  std::vector<float> temperatureCoeff;
};

struct ProtozeroModel {
  static constexpr size_t kFields = 46;  // by field number, 0 unused
  std::array<std::optional<ProtozeroTable>, kFields> tables;
  std::array<std::vector<float>, kFields> lists;
  std::optional<std::array<float, 5>> bmuResistance;
  std::array<float, kFields> floats{};
  uint32_t chemID = 0;
  int32_t mLBConfig = 0;
};

enum class Kind : uint8_t { Unknown, Table, Bmu, List, Float, ChemID, Enum };

constexpr std::array<Kind, ProtozeroModel::kFields> kKinds = [] {
  std::array<Kind, ProtozeroModel::kFields> k{};
  for (int n : {1, 2, 3, 4, 5, 6, 7, 8, 16, 20, 28, 29, 30, 31, 32, 33, 34}) k[n] = Kind::Table;
  for (int n :
       {9, 10, 11, 12, 13, 14, 15, 19, 24, 25, 26, 27, 35, 36, 37, 38, 39, 40, 41, 42, 43, 44})
    k[n] = Kind::List;
  for (int n : {21, 22, 23}) k[n] = Kind::Float;
  k[17] = Kind::Bmu;
  k[18] = Kind::ChemID;
  k[45] = Kind::Enum;
  return k;
}();

void appendFloats(protozero::pbf_reader& r, std::vector<float>& list) {
  if (r.wire_type() == protozero::pbf_wire_type::length_delimited) {
    auto run = r.get_packed_float();
    list.insert(list.end(), run.begin(), run.end());
  } else {
    list.push_back(r.get_float());
  }
}

void readTable(protozero::pbf_reader r, ProtozeroTable& table) {
  while (r.next()) {
    switch (r.tag()) {
      case 1:
        appendFloats(r, table.resistance25C);
        break;
      case 2:
        appendFloats(r, table.temperatureCoeff);
        break;
      default:
        r.skip();
    }
  }
}

void readModel(protozero::pbf_reader r, ProtozeroModel& m) {
  while (r.next()) {
    const uint32_t n = r.tag();
    switch (n < ProtozeroModel::kFields ? kKinds[n] : Kind::Unknown) {
      case Kind::Table:
        readTable(r.get_message(), m.tables[n].emplace());
        break;
      case Kind::Bmu: {
        auto& bmu = m.bmuResistance.emplace();
        protozero::pbf_reader sub = r.get_message();
        while (sub.next()) {
          if (sub.tag() >= 1 && sub.tag() <= 5)
            bmu[sub.tag() - 1] = sub.get_float();
          else
            sub.skip();
        }
        break;
      }
      case Kind::List:
        appendFloats(r, m.lists[n]);
        break;
      case Kind::Float:
        m.floats[n] = r.get_float();
        break;
      case Kind::ChemID:
        m.chemID = r.get_uint32();
        break;
      case Kind::Enum:
        m.mLBConfig = r.get_enum();
        break;
      case Kind::Unknown:
        r.skip();
        break;
    }
  }
}

void decodeProtozero(benchmark::State& state, const Encoding& e) {
  // Checked once, outside the timing: it must see every element.
  {
    ProtozeroModel m;
    readModel(protozero::pbf_reader(reinterpret_cast<const char*>(e.bytes.data()), e.bytes.size()),
              m);
    size_t n = 0;
    for (const auto& list : m.lists) n += list.size();
    for (const auto& t : m.tables)
      if (t) n += t->resistance25C.size() + t->temperatureCoeff.size();
    if (n != e.floats || m.chemID != kChemID) fail("the protozero loop misses elements");
  }
  auto decode = [&] {
    ProtozeroModel m;
    try {
      readModel(
          protozero::pbf_reader(reinterpret_cast<const char*>(e.bytes.data()), e.bytes.size()), m);
    } catch (const protozero::exception&) {
      state.SkipWithError("protozero failed");
    }
    benchmark::DoNotOptimize(&m);
  };
  for (auto _ : state) decode();
  finish(state, e, decode);
}

void BM_Decode_Kolvrand_Unpacked(benchmark::State& s) {
  decodeKolvrand(s, unpackedModel());
}
void BM_Decode_Libprotobuf_Unpacked(benchmark::State& s) {
  decodeLibprotobuf<kolvrand_libprotobuf::OTAParamRC>(s, unpackedModel());
}
void BM_Decode_Protozero_Unpacked(benchmark::State& s) {
  decodeProtozero(s, unpackedModel());
}
void BM_Decode_Kolvrand_Packed(benchmark::State& s) {
  decodeKolvrand(s, packedModel());
}
void BM_Decode_Libprotobuf_Packed(benchmark::State& s) {
  decodeLibprotobuf<kolvrand_libprotobuf_packed::OTAParamRC>(s, packedModel());
}
void BM_Decode_Protozero_Packed(benchmark::State& s) {
  decodeProtozero(s, packedModel());
}

}  // namespace

BENCHMARK(BM_Decode_Kolvrand_Unpacked)->UseRealTime();
BENCHMARK(BM_Decode_Libprotobuf_Unpacked)->UseRealTime();
BENCHMARK(BM_Decode_Protozero_Unpacked)->UseRealTime();
BENCHMARK(BM_Decode_Kolvrand_Packed)->UseRealTime();
BENCHMARK(BM_Decode_Libprotobuf_Packed)->UseRealTime();
BENCHMARK(BM_Decode_Protozero_Packed)->UseRealTime();

}  // namespace kolvrand::bench

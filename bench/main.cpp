// SPDX-License-Identifier: MIT
// Runs every benchmark, then prints the ratios the targets are stated in,
// each from the medians of the repetitions of this one run.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "bench/Fixture.h"

namespace {

// What the summary needs of one benchmark: its real time per iteration in
// seconds and its counters, as the median of the repetitions (GB's median
// aggregate, or the median of the runs when there was only one).
struct Result {
  double seconds = 0;
  std::map<std::string, double> counters;
  std::map<std::string, double> maxCounters;  // the "max" aggregate, where one is computed
};

double median(std::vector<double> v) {
  std::sort(v.begin(), v.end());
  const size_t m = v.size() / 2;
  return v.size() % 2 ? v[m] : (v[m - 1] + v[m]) / 2;
}

class SummaryReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    ConsoleReporter::ReportRuns(runs);
    for (const Run& run : runs) {
      if (run.error_occurred) continue;
      const std::string& name = run.run_name.function_name;
      const double seconds =
          run.GetAdjustedRealTime() / benchmark::GetTimeUnitMultiplier(run.time_unit);
      if (run.run_type == Run::RT_Iteration) {
        runs_[name].push_back(seconds);
        for (const auto& [counter, value] : run.counters)
          runCounters_[name][counter].push_back(value);
      } else if (run.aggregate_name == "median") {
        Result& r = medians_[name];
        r.seconds = seconds;
        for (const auto& [counter, value] : run.counters) r.counters[counter] = value;
      } else if (run.aggregate_name == "max") {
        for (const auto& [counter, value] : run.counters)
          medians_[name].maxCounters[counter] = value;
      }
    }
  }

  std::optional<Result> find(const std::string& name) const {
    if (auto it = medians_.find(name); it != medians_.end() && it->second.seconds > 0)
      return it->second;
    auto it = runs_.find(name);
    if (it == runs_.end() || it->second.empty()) return std::nullopt;
    Result r;
    r.seconds = median(it->second);
    if (auto c = runCounters_.find(name); c != runCounters_.end()) {
      for (const auto& [counter, values] : c->second) {
        r.counters[counter] = median(values);
        r.maxCounters[counter] = *std::max_element(values.begin(), values.end());
      }
    }
    return r;
  }

 private:
  std::map<std::string, Result> medians_;
  std::map<std::string, std::vector<double>> runs_;
  std::map<std::string, std::map<std::string, std::vector<double>>> runCounters_;
};

std::string loadAverage() {
  std::ifstream in("/proc/loadavg");
  std::string one, five, fifteen;
  in >> one >> five >> fifteen;
  return one + " " + five + " " + fifteen;
}

double counter(const Result& r, const char* name) {
  auto it = r.counters.find(name);
  return it == r.counters.end() ? 0 : it->second;
}

enum class Target { FasterBy, AtMostTimes, None };

// One line: ours against a reference, as reference/ours (how many times
// faster ours is) or ours/reference (how many times the reference's time).
void printRatio(const SummaryReporter& r, const char* what, const char* ours, const char* reference,
                Target kind, double target, int* missed) {
  const std::optional<Result> a = r.find(ours), b = r.find(reference);
  if (!a || !b) {
    std::printf("  %-46s (not run)\n", what);
    return;
  }
  const bool speed = kind != Target::AtMostTimes;
  const double ratio = speed ? b->seconds / a->seconds : a->seconds / b->seconds;
  std::printf("  %-46s %9.2f us %9.2f us %7.2fx", what, a->seconds * 1e6, b->seconds * 1e6, ratio);
  if (kind == Target::None) {
    std::printf("\n");
    return;
  }
  const bool met = kind == Target::FasterBy ? ratio >= target : ratio <= target;
  if (!met) ++*missed;
  std::printf("   %s %.1fx  %s\n", kind == Target::FasterBy ? ">=" : "<=", target,
              met ? "met" : "MISSED");
}

void printSummary(const SummaryReporter& r, const std::string& loadBefore) {
  int missed = 0;
  std::printf("\nkolvrand against its references (medians of the repetitions, real time)\n");
  std::printf("  %-46s %12s %12s %8s   %s\n", "", "kolvrand", "reference", "ratio", "target");
  // What is compared with what, and the target of each ratio.
  const struct {
    const char* label;
    const char* ours;
    const char* reference;
    Target kind;
    double target;
  } rows[] = {
      {"decode unpacked, speed vs libprotobuf", "BM_Decode_Kolvrand_Unpacked",
       "BM_Decode_Libprotobuf_Unpacked", Target::FasterBy, 1.5},
      {"decode unpacked, speed vs protozero loop", "BM_Decode_Kolvrand_Unpacked",
       "BM_Decode_Protozero_Unpacked", Target::FasterBy, 1.0},
      {"decode packed, speed vs libprotobuf", "BM_Decode_Kolvrand_Packed",
       "BM_Decode_Libprotobuf_Packed", Target::FasterBy, 1.0},
      {"decode packed, speed vs protozero loop", "BM_Decode_Kolvrand_Packed",
       "BM_Decode_Protozero_Packed", Target::None, 0},
      {"record, time vs plain 29056-byte copy", "BM_Record_Kolvrand", "BM_Record_PlainCopy",
       Target::AtMostTimes, 2.0},
      {"boot path, time vs read + SHA-1 lower bound", "BM_BootPath_Kolvrand",
       "BM_BootPath_LowerBound", Target::AtMostTimes, 1.5},
  };
  for (const auto& row : rows)
    printRatio(r, row.label, row.ours, row.reference, row.kind, row.target, &missed);

  std::printf("\n");
  for (const char* name : {"BM_Decode_Kolvrand_Unpacked", "BM_Decode_Libprotobuf_Unpacked",
                           "BM_Decode_Protozero_Unpacked", "BM_Decode_Kolvrand_Packed",
                           "BM_Decode_Libprotobuf_Packed", "BM_Decode_Protozero_Packed"}) {
    if (const auto res = r.find(name)) {
      const double bytes = counter(*res, "bytes");
      std::printf("  %-46s %9.0f ns/model %6.2f bytes/ns %5.0f allocations\n",
                  name + std::string_view("BM_Decode_").size(), res->seconds * 1e9,
                  bytes / (res->seconds * 1e9), counter(*res, "allocs"));
    }
  }
  if (const auto res = r.find("BM_Daemon_PeakRSS")) {
    auto peak = res->maxCounters.find("VmHWM_KiB");
    const double hwm = peak != res->maxCounters.end() ? peak->second : counter(*res, "VmHWM_KiB");
    const bool met = hwm <= 4096;
    if (!met) ++missed;
    std::printf("  %-46s %9.0f KiB                <= 4096 KiB  %s\n",
                "daemon peak RSS (VmHWM, highest of the runs)", hwm, met ? "met" : "MISSED");
    std::printf("  %-46s %9.2f ms\n", "daemon start to verified upload", res->seconds * 1e3);
  }
  if (const auto res = r.find("BM_Task_Allocations"))
    std::printf("  %-46s %9.0f (%.0f bytes)\n", "heap allocations per battery-model task",
                counter(*res, "allocs"), counter(*res, "alloc_bytes"));
  if (const auto res = r.find("BM_BootPath_Kolvrand"))
    std::printf("  %-46s %9.0f (%.0f bytes)\n", "heap allocations per boot path",
                counter(*res, "allocs"), counter(*res, "alloc_bytes"));
  std::printf("  load average before %s, after %s\n", loadBefore.c_str(), loadAverage().c_str());
  std::printf("  targets missed: %d\n", missed);
}

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  // Built and checked before any timing.
  kolvrand::bench::unpackedModel();
  kolvrand::bench::packedModel();
  const std::string loadBefore = loadAverage();
  SummaryReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  printSummary(reporter, loadBefore);
  benchmark::Shutdown();
  return 0;
}

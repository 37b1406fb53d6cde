// Where each list of the record comes from in the model: one table shared by
// the record builder and by the tools that check a model against the record.
#pragma once

#include <cstddef>
#include <span>

namespace kolvrand {

class OTAParamRC;
class OTAResistanceData;

// A list of the model itself, carried at `offset` as its first `count` elements.
struct KextListSource {
  const char* field;
  size_t offset;
  size_t count;
  std::span<const float> (*elements)(const OTAParamRC&);
};

// A resistance table, carried as a KextResistanceTable at `offset`.
struct KextTableSource {
  const char* field;
  size_t offset;
  const OTAResistanceData* (*table)(const OTAParamRC&);
};

// The lists of a resistance table, in record order.
struct KextTableListSource {
  const char* field;
  size_t offset;  // within the KextResistanceTable
  size_t count;
  std::span<const float> (*elements)(const OTAResistanceData&);
};

std::span<const KextListSource> kextListSources();
std::span<const KextTableSource> kextTableSources();
std::span<const KextTableListSource> kextTableListSources();

}  // namespace kolvrand
